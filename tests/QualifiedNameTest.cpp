// Qualified names: the text form, the three comparison rules, editing, the flat form and its
// reader's behaviour on truncated or hostile bytes and when memory runs out.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "runtime/PXStrings.h"
#include "vellum/DataStreams.h"
#include "vellum/QualifiedName.h"

namespace {

using Bytes = std::vector<uint8_t>;
using Components = std::vector<std::string>;

constexpr uint32_t kVersion = 0x21008000;
const BigEndianizer kBigEndian;

QualifiedName Make(const Components& components) {
  QualifiedName name;
  for (const std::string& c : components) EXPECT_EQ(name.Insert(c, name.NumElts()), 0);
  return name;
}

Components ComponentsOf(const QualifiedName& name) {
  Components out;
  for (int32_t i = 0; i < name.NumElts(); ++i) out.push_back(name[i]);
  return out;
}

Bytes Flatten(const QualifiedName& name, int32_t* status = nullptr) {
  OutputBuf out;
  KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
  const int32_t result = name.Flatten(&writer);
  if (status) *status = result;
  return out.Bytes();
}

int32_t UnFlatten(const Bytes& bytes, QualifiedName* name, size_t* consumed = nullptr) {
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  const int32_t status = name->UnFlatten(&reader);
  EXPECT_EQ(status, reader.GetError());
  if (consumed) *consumed = reader.Position();
  return status;
}

std::string Text(const QualifiedName& name) {
  std::string text;
  EXPECT_EQ(name.ToDelimitedName(&text), 0);
  return text;
}

// ---- text form ----

struct ParseCase {
  const char* text;
  Components components;
};

const ParseCase kParseCases[] = {
    {"lib.x:sub:Item", {"lib.x", "sub", "Item"}},
    {"a:::b", {"a", "", "b"}},
    {"a::b", {"a", "b"}},
    {"a:b", {"a", "b"}},
    {"", {}},
    {"single", {"single"}},
    {"a:", {"a", ""}},
    {":a", {"", "a"}},
    {"::", {"", ""}},
    {" spaced : out ", {" spaced ", " out "}},
};

TEST(QualifiedNameTest, FromDelimitedName) {
  for (const ParseCase& c : kParseCases) {
    SCOPED_TRACE(c.text);
    QualifiedName name = Make({"stale"});
    EXPECT_EQ(name.FromDelimitedName(std::string(c.text)), 0);
    EXPECT_EQ(ComponentsOf(name), c.components);
  }
}

TEST(QualifiedNameTest, ToDelimitedNameGivesTheTextBack) {
  QualifiedName name;
  ASSERT_EQ(name.FromDelimitedName(std::string("lib.x:sub:Item")), 0);
  EXPECT_EQ(Text(name), "lib.x:sub:Item");
  EXPECT_EQ(Text(Make({"a", "", "b"})), "a::b");
  EXPECT_EQ(Text(QualifiedName()), "");
  EXPECT_EQ(name.ToDelimitedName(nullptr), kStatusBadArgument);
}

TEST(QualifiedNameTest, FromDelimitedNameOfACountedString) {
  LiveBlockCheck blocks;
  LStrHandle text = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("lib.x:sub:Item", &text), 0);
  QualifiedName name = Make({"stale"});
  EXPECT_EQ(name.FromDelimitedName(*text), 0);
  EXPECT_EQ(ComponentsOf(name), (Components{"lib.x", "sub", "Item"}));
  EXPECT_EQ(name.FromDelimitedName(static_cast<const LStr*>(nullptr)), 0);
  EXPECT_EQ(name.NumElts(), 0);

  (*text)->cnt = -1;
  name = Make({"stale"});
  EXPECT_EQ(name.FromDelimitedName(*text), kStatusBadArgument);
  EXPECT_EQ(name.NumElts(), 0);
  DSDisposeHandle(reinterpret_cast<UHandle>(text));
}

struct SanityCase {
  const char* text;
  int32_t status;
  Components components;
};

const SanityCase kSanityCases[] = {
    {"a: b", kStatusBadArgument, {"a"}},
    {"a:b ", kStatusBadArgument, {"a"}},
    {"a:b\t:c", kStatusBadArgument, {"a"}},
    {"\nx", kStatusBadArgument, {}},
    {"a:::b", kStatusBadArgument, {"a"}},
    {"a:", kStatusBadArgument, {"a"}},
    {"a::b", 0, {"a", "b"}},
    {"in side:x", 0, {"in side", "x"}},
    {"", 0, {}},
};

TEST(QualifiedNameTest, FromDelimitedNameWithSanityCheck) {
  for (const SanityCase& c : kSanityCases) {
    SCOPED_TRACE(c.text);
    QualifiedName name = Make({"stale"});
    EXPECT_EQ(name.FromDelimitedNameWithSanityCheck(std::string(c.text)), c.status);
    EXPECT_EQ(ComponentsOf(name), c.components);
  }
}

TEST(QualifiedNameTest, ToDebugStream) {
  DebugCapture capture;
  (DebugStream("QualifiedNameTest", 1, 0) << Make({"a", "b"})).Process();
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "[QualifiedName \"a:b]");
}

// ---- comparisons ----

enum Sign { kNegative = -1, kZero = 0, kPositive = 1 };

Sign SignOf(int32_t v) { return v < 0 ? kNegative : (v > 0 ? kPositive : kZero); }

struct CompareCase {
  const char* name;
  Components a;
  Components b;
  Sign exact;
  Sign fileSystem;
  Sign noCase;
};

const CompareCase kCompareCases[] = {
    {"Prefix", {"a"}, {"a", "b"}, kNegative, kNegative, kNegative},
    {"Longer", {"a", "b"}, {"a"}, kPositive, kPositive, kPositive},
    {"Same", {"lib", "x"}, {"lib", "x"}, kZero, kZero, kZero},
    {"Case", {"ABC"}, {"abc"}, kNegative, kZero, kZero},
    {"CaseDeeper", {"x", "Item"}, {"x", "ITEM"}, kPositive, kZero, kZero},
    {"ComponentBeforeCount", {"b"}, {"a", "z"}, kPositive, kPositive, kPositive},
    {"ShorterComponentFirst", {"ab"}, {"abc"}, kNegative, kNegative, kNegative},
    {"BytesAreUnsigned", {"\xff"}, {"a"}, kPositive, kPositive, kPositive},
    {"EmptyComponents", {""}, {"", ""}, kNegative, kNegative, kNegative},
    {"BothEmpty", {}, {}, kZero, kZero, kZero},
};

TEST(QualifiedNameTest, Comparisons) {
  for (const CompareCase& c : kCompareCases) {
    SCOPED_TRACE(c.name);
    const QualifiedName a = Make(c.a);
    const QualifiedName b = Make(c.b);
    EXPECT_EQ(SignOf(a.Compare(b)), c.exact);
    EXPECT_EQ(SignOf(a.CompareFS(b)), c.fileSystem);
    EXPECT_EQ(SignOf(a.CompareNC(b)), c.noCase);
    EXPECT_EQ(SignOf(b.Compare(a)), static_cast<Sign>(-c.exact));
    EXPECT_EQ(a.Equal(b), c.exact == kZero);
    EXPECT_EQ(a.EqualFS(b), c.fileSystem == kZero);
    EXPECT_EQ(a.EqualNC(b), c.noCase == kZero);
  }
}

TEST(QualifiedNameTest, ExactCompareAnswersOneStep) {
  EXPECT_EQ(Make({"a"}).Compare(Make({"z"})), -1);
  EXPECT_EQ(Make({"z"}).Compare(Make({"a"})), 1);
  EXPECT_EQ(Make({"a"}).Compare(Make({"a", "b", "c"})), -2);  // the count difference
}

TEST(QualifiedNameTest, EqualNEltsFS) {
  const QualifiedName a = Make({"Lib", "Sub", "x"});
  const QualifiedName b = Make({"lib", "SUB", "y"});
  EXPECT_TRUE(a.EqualNEltsFS(b, 0));
  EXPECT_TRUE(a.EqualNEltsFS(b, 2));
  EXPECT_FALSE(a.EqualNEltsFS(b, 3));
  EXPECT_FALSE(a.EqualNEltsFS(Make({"lib"}), 2)) << "fewer than n components";
  EXPECT_FALSE(Make({"lib"}).EqualNEltsFS(a, 2));
}

// ---- editing ----

TEST(QualifiedNameTest, ConstructorsMakeOneComponent) {
  EXPECT_EQ(ComponentsOf(QualifiedName(std::string("a:b"))), (Components{"a:b"}));
  const uint8_t pstr[] = {3, 'x', 'y', 'z'};
  EXPECT_EQ(ComponentsOf(QualifiedName(pstr)), (Components{"xyz"}));
  EXPECT_EQ(ComponentsOf(QualifiedName(static_cast<const uint8_t*>(nullptr))), (Components{""}));
}

TEST(QualifiedNameTest, ComponentAccess) {
  const QualifiedName name = Make({"lib", "file.ctl"});
  EXPECT_EQ(name.GetFileName(), "file.ctl");
  EXPECT_EQ(name[-1], "");
  EXPECT_EQ(name[2], "");
  EXPECT_EQ(QualifiedName().GetFileName(), "");
  EXPECT_EQ(QualifiedName::kEmpty().NumElts(), 0);
  EXPECT_EQ(&QualifiedName::kEmpty(), &QualifiedName::kEmpty());
  EXPECT_EQ(QualifiedName::kDoubleDelimiter(), "::");
}

struct InsertCase {
  int32_t position;
  Components result;
};

const InsertCase kInsertCases[] = {
    {-5, {"new", "a", "b"}}, {0, {"new", "a", "b"}}, {1, {"a", "new", "b"}},
    {2, {"a", "b", "new"}},  {99, {"a", "b", "new"}},
};

TEST(QualifiedNameTest, InsertPositions) {
  for (const InsertCase& c : kInsertCases) {
    SCOPED_TRACE(c.position);
    QualifiedName byString = Make({"a", "b"});
    EXPECT_EQ(byString.Insert(std::string("new"), c.position), 0);
    EXPECT_EQ(ComponentsOf(byString), c.result);

    QualifiedName byPStr = Make({"a", "b"});
    const uint8_t pstr[] = {3, 'n', 'e', 'w'};
    EXPECT_EQ(byPStr.Insert(pstr, c.position), 0);
    EXPECT_EQ(ComponentsOf(byPStr), c.result);

    QualifiedName byBuffer = Make({"a", "b"});
    const uint8_t bytes[] = {'n', 'e', 'w', '!'};
    EXPECT_EQ(byBuffer.InsertStringBuffer(bytes, 3, c.position), 0);
    EXPECT_EQ(ComponentsOf(byBuffer), c.result);
  }
}

TEST(QualifiedNameTest, InsertRefusesBadBuffers) {
  QualifiedName name = Make({"a"});
  EXPECT_EQ(name.InsertStringBuffer(nullptr, 3, 0), kStatusBadArgument);
  const uint8_t bytes[] = {'x'};
  EXPECT_EQ(name.InsertStringBuffer(bytes, -1, 0), kStatusBadArgument);
  EXPECT_EQ(name.InsertStringBuffer(nullptr, 0, 0), 0);
  EXPECT_EQ(name.Insert(static_cast<const uint8_t*>(nullptr), 9), 0);
  EXPECT_EQ(ComponentsOf(name), (Components{"", "a", ""}));
}

TEST(QualifiedNameTest, DeleteClamps) {
  const std::pair<int32_t, Components> kCases[] = {
      {-3, {"b", "c"}}, {0, {"b", "c"}}, {1, {"a", "c"}}, {2, {"a", "b"}}, {50, {"a", "b"}}};
  for (const auto& [index, result] : kCases) {
    SCOPED_TRACE(index);
    QualifiedName name = Make({"a", "b", "c"});
    name.Delete(index);
    EXPECT_EQ(ComponentsOf(name), result);
  }
  QualifiedName empty;
  empty.Delete(0);
  EXPECT_EQ(empty.NumElts(), 0);
}

TEST(QualifiedNameTest, PrependTakesTheLeadingComponents) {
  const std::pair<int32_t, Components> kCases[] = {
      {0, {"x", "y", "z", "a"}}, {1, {"x", "y", "a"}}, {3, {"a"}},
      {7, {"a"}},                {-2, {"x", "y", "z", "a"}}};
  for (const auto& [n, result] : kCases) {
    SCOPED_TRACE(n);
    QualifiedName name = Make({"a"});
    EXPECT_EQ(name.Prepend(Make({"x", "y", "z"}), n), 0);
    EXPECT_EQ(ComponentsOf(name), result);
  }
  QualifiedName self = Make({"p", "q"});
  EXPECT_EQ(self.Prepend(self, 0), 0);
  EXPECT_EQ(ComponentsOf(self), (Components{"p", "q", "p", "q"}));
}

TEST(QualifiedNameTest, CopyOfItself) {
  QualifiedName name = Make({"a", "b"});
  EXPECT_EQ(name.Copy(name), 0);
  EXPECT_EQ(ComponentsOf(name), (Components{"a", "b"}));
}

// ---- flat form ----

struct FlatCase {
  const char* name;
  Components components;
  Bytes bytes;
};

const FlatCase kFlatCases[] = {
    {"TwoComponents", {"ab", "c"}, {0x00, 0x00, 0x00, 0x02, 0x02, 0x61, 0x62, 0x01, 0x63}},
    {"Empty", {}, {0x00, 0x00, 0x00, 0x00}},
    {"EmptyComponent", {""}, {0x00, 0x00, 0x00, 0x01, 0x00}},
    {"ColonInside", {"a:b"}, {0x00, 0x00, 0x00, 0x01, 0x03, 0x61, 0x3A, 0x62}},
};

TEST(QualifiedNameTest, FlatFormGoldenBytesRoundTrip) {
  for (const FlatCase& c : kFlatCases) {
    SCOPED_TRACE(c.name);
    LiveBlockCheck blocks;
    const QualifiedName name = Make(c.components);
    int32_t status = -1;
    EXPECT_EQ(Flatten(name, &status), c.bytes);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(name.GetFlatSize(kVersion), static_cast<int32_t>(c.bytes.size()));

    QualifiedName back = Make({"stale"});
    size_t consumed = 0;
    EXPECT_EQ(UnFlatten(c.bytes, &back, &consumed), 0);
    EXPECT_EQ(consumed, c.bytes.size());
    EXPECT_TRUE(back.Equal(name));
  }
}

TEST(QualifiedNameTest, LongestComponentRoundTrips) {
  const QualifiedName name = Make({std::string(255, 'q'), "tail"});
  const Bytes bytes = Flatten(name);
  ASSERT_EQ(bytes.size(), 4u + 256u + 5u);
  EXPECT_EQ(bytes[4], 0xFF);
  QualifiedName back;
  EXPECT_EQ(UnFlatten(bytes, &back), 0);
  EXPECT_TRUE(back.Equal(name));
}

TEST(QualifiedNameTest, ComponentTooLongForTheFlatFormIsRefused) {
  DebugCapture capture;
  const QualifiedName name = Make({"a", std::string(256, 'q')});
  int32_t status = 0;
  OutputBuf out;
  {
    KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
    EXPECT_EQ(name.Flatten(&writer), kStatusBadArgument);
    EXPECT_EQ(writer.GetError(), kStatusBadArgument);
    status = writer.WriteI32(1);
  }
  EXPECT_EQ(status, kStatusBadArgument);
  EXPECT_TRUE(out.Bytes().empty());
  EXPECT_TRUE(
      capture.Contains("QualifiedName component longer than 255 bytes cannot be flattened"));
  EXPECT_EQ(name.GetFlatSize(kVersion), 0);
}

TEST(QualifiedNameTest, FlattenKeepsAnEarlierError) {
  OutputBuf out;
  DebugCapture capture;
  KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
  writer.SetError(kStatusCorruptData);
  EXPECT_EQ(Make({"a"}).Flatten(&writer), kStatusCorruptData);
  EXPECT_TRUE(out.Bytes().empty());
  EXPECT_EQ(Make({"a"}).Flatten(nullptr), kStatusBadArgument);
}

TEST(QualifiedNameTest, EveryTruncationOfTheFlatFormIsCorrupt) {
  const Bytes golden = {0x00, 0x00, 0x00, 0x02, 0x02, 0x61, 0x62, 0x01, 0x63};
  for (size_t size = 0; size < golden.size(); ++size) {
    SCOPED_TRACE(size);
    LiveBlockCheck blocks;
    DebugCapture capture;
    QualifiedName name = Make({"stale"});
    EXPECT_EQ(UnFlatten(Bytes(golden.begin(), golden.begin() + size), &name), kStatusCorruptData);
    EXPECT_EQ(name.NumElts(), 0) << "a failed read leaves the name empty";
  }
}

TEST(QualifiedNameTest, ImplausibleCountsAreRefusedBeforeAllocating) {
  const Bytes kHostile[] = {
      {0x7F, 0xFF, 0xFF, 0xFF, 0x00},        // two billion components in one byte
      {0x00, 0x00, 0x00, 0x03, 0x00, 0x00},  // three components in two bytes
      {0xFF, 0xFF, 0xFF, 0xFF, 0x00},        // negative
      {0x80, 0x00, 0x00, 0x00},
  };
  for (const Bytes& bytes : kHostile) {
    SCOPED_TRACE(testing::PrintToString(bytes));
    LiveBlockCheck blocks;
    DebugCapture capture;
    QualifiedName name;
    const int64_t before = DSAllocationCount();
    EXPECT_EQ(UnFlatten(bytes, &name), kStatusCorruptData);
    EXPECT_EQ(DSAllocationCount(), before);
    EXPECT_EQ(name.NumElts(), 0);
    ASSERT_EQ(capture.Messages().size(), 1u);
    EXPECT_EQ(capture.Messages()[0].level, 2);
    EXPECT_EQ(capture.Messages()[0].module, "QualifiedName");
  }
}

TEST(QualifiedNameTest, UnFlattenStopsAtAnEarlierReaderError) {
  const Bytes bytes = {0x00, 0x00, 0x00, 0x01, 0x01, 0x61};
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  reader.SetError(kStatusImplausibleData);
  QualifiedName name = Make({"stale"});
  EXPECT_EQ(name.UnFlatten(&reader), kStatusImplausibleData);
  EXPECT_EQ(name.NumElts(), 0);
  EXPECT_EQ(reader.Position(), 0u);
  EXPECT_EQ(name.UnFlatten(nullptr), kStatusBadArgument);
}

TEST(QualifiedNameTest, UnFlattenLeavesTheRestOfTheStream) {
  const Bytes bytes = {0x00, 0x00, 0x00, 0x01, 0x01, 0x61, 0x12, 0x34};
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  QualifiedName name;
  ASSERT_EQ(name.UnFlatten(&reader), 0);
  EXPECT_EQ(ComponentsOf(name), (Components{"a"}));
  uint16_t rest = 0;
  EXPECT_EQ(reader.ReadU16(&rest), 0);
  EXPECT_EQ(rest, 0x1234);
}

// ---- running out of memory ----


TEST(QualifiedNameTest, UnFlattenRunningOutOfMemory) {
  QualifiedName expected;
  for (int i = 0; i < 12; ++i) ASSERT_EQ(expected.Insert(std::string(20 + i, static_cast<char>('a' + i)), i), kStatusNoError);
  const Bytes bytes = Flatten(expected);
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    QualifiedName name;
    InputBuf in(bytes.data(), bytes.size());
    KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
    const int32_t status = name.UnFlatten(&reader);
    EXPECT_EQ(status, reader.GetError());
    if (status == 0) EXPECT_TRUE(name.Equal(expected));
    else EXPECT_EQ(name.NumElts(), 0);
    return status;
  });
}

TEST(QualifiedNameTest, EditingRunningOutOfMemory) {
  const QualifiedName other = Make({"x", "y", "z"});
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    QualifiedName name;
    if (int32_t s = name.FromDelimitedName(std::string("lib:sub:a:b:c")); s != 0) return s;
    if (int32_t s = name.Insert(std::string("mid"), 2); s != 0) return s;
    if (int32_t s = name.Prepend(other, 1); s != 0) return s;
    if (int32_t s = name.Copy(name); s != 0) return s;
    QualifiedName copy;
    if (int32_t s = copy.Copy(name); s != 0) return s;
    if (int32_t s = copy.Reserve(64); s != 0) return s;
    EXPECT_EQ(Text(copy), "x:y:lib:sub:mid:a:b:c");
    return 0;
  });
}

TEST(QualifiedNameTest, FailedPrependLeavesTheNameAsItWas) {
  QualifiedName name = Make({"a", "b"});
  const QualifiedName other = Make({"x"});
  ScopedAllocationFailure failure(1);
  EXPECT_EQ(name.Prepend(other, 0), kStatusOutOfMemory);
  EXPECT_EQ(ComponentsOf(name), (Components{"a", "b"}));
}

}  // namespace
