// Names and typedef links: the string hash, interning through their handles, check-out and
// clone, the 255-byte limit, setters and their dump lines.
#include "vellum/TDAttributeHandles.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXPath.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

namespace {

class TDAttributesTest : public TypeSystemTest {};


std::string Text(const uint8_t* pString) {
  return std::string(reinterpret_cast<const char*>(pString + 1), pString[0]);
}

QualifiedName Name(const std::string& delimited) {
  QualifiedName name;
  EXPECT_EQ(name.FromDelimitedName(delimited), kStatusNoError);
  return name;
}

// An owned path for one test.
class OwnedPath {
 public:
  explicit OwnedPath(const char* component) {
    EXPECT_EQ(FEmptyPath(&path_), kStatusNoError);
    uint8_t pString[256] = {};
    EXPECT_EQ(StringUtils::ToPStr(component, pString), kStatusNoError);
    EXPECT_EQ(FAppendName(path_, pString), kStatusNoError);
  }
  ~OwnedPath() { FDestroyPath(&path_); }
  OwnedPath(const OwnedPath&) = delete;
  OwnedPath& operator=(const OwnedPath&) = delete;
  Path get() const { return path_; }

 private:
  Path path_ = nullptr;
};

TEST(TDAttributesHashTest, StringHashOfEveryForm) {
  struct Case {
    const char* name;
    std::string pString;  // with its length byte
    std::string cString;
    uint32_t hash;
  };
  const Case kCases[] = {
      {"TwoCharacters", std::string("\x02" "ab"), "ab", 0x490},
      {"SameHashOtherText", std::string("\x02" "b`"), "b`", 0x490},
      {"OneCharacter", std::string("\x01" "a"), "a", 0xC2},
      {"ZeroByteStops", std::string("\x03" "a\0b", 4), "a", 0xC2},
      {"HighByteIsUnsigned", std::string("\x01" "\xff"), "\xff", 0x1FE},
      {"RotationWrapsAfter32", std::string("\x24" "abcdefghijklmnopqrstuvwxyz0123456789"),
       "abcdefghijklmnopqrstuvwxyz0123456789", 0xBC6964A8},
      {"Empty", std::string(1, '\0'), "", 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const auto expected = static_cast<int32_t>(c.hash);
    EXPECT_EQ(GetPStrHashValue(U(c.pString.c_str())), expected);
    EXPECT_EQ(GetCStrHashValue(U(c.cString.c_str())), expected);
    EXPECT_EQ(GetNarrowStrHashValue(c.cString), expected);
  }
  EXPECT_EQ(GetNarrowStrHashValue(std::string("a\0b", 3)), 0xC2);
  EXPECT_EQ(GetPStrHashValue(U("\x01" "ab")), 0xC2) << "a Pascal string stops after its length";
  EXPECT_EQ(GetPStrHashValue(nullptr), 0);
  EXPECT_EQ(GetCStrHashValue(nullptr), 0);
}

TEST_F(TDAttributesTest, NameHandlesInternAndCopy) {
  const TDRName interned(U("label"));
  ASSERT_TRUE(interned);
  EXPECT_TRUE(TDRName(U("label")) == interned);
  EXPECT_EQ(Text(interned.GetNamePStr()), "label");
  EXPECT_EQ(interned.GetHashValue(), GetCStrHashValue(U("label")));
  EXPECT_FALSE(TDRName(U("")));
  EXPECT_FALSE(TDRName(static_cast<const uint8_t*>(nullptr)));
  EXPECT_EQ(TDRName().GetNamePStr()[0], 0);

  const TDWName out = interned.CheckOut();
  ASSERT_TRUE(out);
  EXPECT_FALSE(out == interned);
  EXPECT_EQ(Text(out.GetNamePStr()), "label");
  EXPECT_TRUE(out.CheckIn() == interned);
  const TDWName copy = out.Clone();
  ASSERT_TRUE(copy);
  EXPECT_FALSE(copy == out);
  EXPECT_TRUE(copy.CheckIn() == interned);
  EXPECT_TRUE(TDWName(U("label")).CheckIn() == interned);
  EXPECT_FALSE(TDWName(U("Label")).CheckIn() == interned);

  EXPECT_TRUE(TDRName().CheckOut().GetAttributeImpPtr() == TDAttributeImpPtr());
  EXPECT_FALSE(TDWName().CheckIn());
  EXPECT_FALSE(TDWName().Clone());
}

TEST_F(TDAttributesTest, CollidingNamesStayDistinct) {
  const TDRName ab(U("ab"));
  const TDRName other(U("b`"));
  ASSERT_EQ(ab.GetHashValue(), other.GetHashValue());
  EXPECT_FALSE(ab == other);
  EXPECT_EQ(Text(other.GetNamePStr()), "b`");
  const TDR first = TDRBoolean(U("ab"));
  const TDR second = TDRBoolean(U("b`"));
  EXPECT_EQ(first.GetHashValue(), second.GetHashValue());
  EXPECT_FALSE(first == second);
}

TEST_F(TDAttributesTest, KindQueries) {
  struct Case {
    const char* name;
    TDAttribute attribute;
    int32_t isName;
    int32_t isTypedef;
  };
  const Case kCases[] = {
      {"ReadOnlyName", TDRName(U("n")), 1, 0},
      {"WritableName", TDWName(U("n")), 1, 0},
      {"ReadOnlyTypedef", TDWTypedef(Name("a:b"), 0, nullptr).CheckIn(), 0, 1},
      {"WritableTypedef", TDWTypedef(Name("a:b"), 0, nullptr), 0, 1},
      {"Null", TDAttribute(), 0, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.attribute.IsNameAttribute(), c.isName);
    EXPECT_EQ(c.attribute.IsTypedefAttribute(), c.isTypedef);
    EXPECT_EQ(c.attribute.IsEnumAttribute(), 0);
    EXPECT_EQ(c.attribute.IsUnitsAttribute(), 0);
    EXPECT_EQ(c.attribute.ValidateImpClass(), c.isName + c.isTypedef);
  }
}

TEST_F(TDAttributesTest, LongNamesKeep255Bytes) {
  const std::string longText(300, 'x');
  const TDWName made(U(longText.c_str()));
  EXPECT_EQ(Text(made.GetNamePStr()), std::string(255, 'x'));
  TDWName set(U("short"));
  EXPECT_EQ(set.SetName(std::string(256, 'y')), kStatusNoError);
  EXPECT_EQ(Text(set.GetNamePStr()), std::string(255, 'y'));
  EXPECT_TRUE(TDRName(U(longText.c_str())) == TDRName(U(std::string(255, 'x').c_str())));
}

TEST_F(TDAttributesTest, NameSetterReplacesTheText) {
  TDWName name(U("a"));
  EXPECT_EQ(name.SetName(std::string("b")), kStatusNoError);
  EXPECT_EQ(Text(name.GetNamePStr()), "b");
  EXPECT_EQ(name.GetHashValue(), GetCStrHashValue(U("b")));
  EXPECT_EQ(name.SetName(U("cd")), kStatusNoError);
  EXPECT_EQ(Text(name.GetNamePStr()), "cd");
  EXPECT_EQ(name.SetNamePStr(U("\x02" "ef")), kStatusNoError);
  EXPECT_EQ(Text(name.GetNamePStr()), "ef");
  EXPECT_EQ(name.GetHashValue(), GetCStrHashValue(U("ef")));
  EXPECT_EQ(name.SetNamePStr(nullptr), kStatusNoError);
  EXPECT_EQ(name.GetNamePStr()[0], 0);
  EXPECT_EQ(name.GetHashValue(), 0);

  bool succeeded = false;
  for (int64_t n = 1; n <= 20 && !succeeded; ++n) {
    SCOPED_TRACE(n);
    TDWName swept(U("before"));
    LiveBlockCheck leaks;
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      status = swept.SetName(std::string("after"));
      fired = failure.Fired();
    }
    if (fired) {
      EXPECT_EQ(status, kStatusOutOfMemory);
      EXPECT_EQ(Text(swept.GetNamePStr()), "before") << "a failed change keeps the old text";
    } else {
      EXPECT_EQ(status, kStatusNoError);
      EXPECT_EQ(Text(swept.GetNamePStr()), "after");
      succeeded = true;
    }
  }
  EXPECT_TRUE(succeeded);
}

TEST_F(TDAttributesTest, SettersOnNullHandlesGive42) {
  OwnedPath path("p");
  struct Case {
    const char* name;
    std::function<int32_t()> set;
  };
  const Case kCases[] = {
      {"NameString", [] { return TDWName().SetName(std::string("x")); }},
      {"NameCString", [] { return TDWName().SetName(U("x")); }},
      {"NamePStr", [] { return TDWName().SetNamePStr(U("\x01x")); }},
      {"VIName", [] { return TDWTypedef().SetVIName(Name("a:b")); }},
      {"VIPath", [&] { return TDWTypedef().SetVIPath(path.get()); }},
      {"TimeStamp", [] { return TDWTypedef().SetTimeStamp(1); }},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.set(), kStatusNullHandle);
  }
  const TDRTypedef none;
  EXPECT_EQ(none.GetVIName().NumElts(), 0);
  EXPECT_EQ(none.GetTimeStamp(), 0u);
  EXPECT_EQ(none.GetVIPath(), nullptr);
  EXPECT_EQ(none.IsPathized(), 0);
  EXPECT_FALSE(none.CheckOut());
  EXPECT_FALSE(TDWTypedef().CheckIn());
  EXPECT_FALSE(TDWTypedef().Clone());
}

TEST_F(TDAttributesTest, PathAloneTellsTypedefLinksApart) {
  OwnedPath path("types.x");
  const TDWTypedef plain(Name("lib:t.ctl"), 5, nullptr);
  const TDWTypedef pathized(Name("lib:t.ctl"), 5, path.get());
  EXPECT_EQ(plain.IsPathized(), 0);
  EXPECT_EQ(pathized.IsPathized(), 1);
  EXPECT_NE(pathized.GetVIPath(), path.get()) << "the link keeps its own copy";
  EXPECT_EQ(FPathCmp(pathized.GetVIPath(), path.get()), 0);
  EXPECT_EQ(pathized.GetHashValue(), plain.GetHashValue() + 1);
  EXPECT_FALSE(plain.CheckIn() == pathized.CheckIn());

  TDW a = TDWBoolean();
  TDW b = TDWBoolean();
  ASSERT_EQ(a.SetTypedef(plain), kStatusNoError);
  ASSERT_EQ(b.SetTypedef(pathized), kStatusNoError);
  EXPECT_FALSE(a.CheckIn() == b.CheckIn());
}

TEST_F(TDAttributesTest, TypedefHash) {
  // Element count + each element's string hash + time stamp (+1 with a path).
  const TDWTypedef link(Name("a:b"), 5, nullptr);
  EXPECT_EQ(link.GetHashValue(), 2 + 0xC2 + 0xC4 + 5);
  const TDWTypedef wide(Name("lib"), 0xFFFFFFFF, nullptr);
  EXPECT_EQ(wide.GetHashValue(), 1 + 0x2B30 - 1) << "32-bit wrap";
}

TEST_F(TDAttributesTest, TypedefCheckInCheckOutAndClone) {
  OwnedPath path("types.x");
  const TDRTypedef interned = TDWTypedef(Name("lib:t.ctl"), 5, path.get()).CheckIn();
  ASSERT_TRUE(interned);
  EXPECT_TRUE(TDWTypedef(Name("lib:t.ctl"), 5, path.get()).CheckIn() == interned);
  EXPECT_FALSE(TDWTypedef(Name("lib:t.ctl"), 6, path.get()).CheckIn() == interned);
  EXPECT_FALSE(TDWTypedef(Name("lib:u.ctl"), 5, path.get()).CheckIn() == interned);

  TDWTypedef out = interned.CheckOut();
  ASSERT_TRUE(out);
  EXPECT_FALSE(out == interned);
  EXPECT_TRUE(out.GetVIName().Equal(Name("lib:t.ctl")));
  EXPECT_EQ(out.GetTimeStamp(), 5u);
  EXPECT_NE(out.GetVIPath(), interned.GetVIPath());
  EXPECT_EQ(FPathCmp(out.GetVIPath(), interned.GetVIPath()), 0);
  EXPECT_TRUE(out.CheckIn() == interned);

  TDWTypedef copy = out.Clone();
  ASSERT_TRUE(copy);
  EXPECT_FALSE(copy == out);
  EXPECT_EQ(copy.SetTimeStamp(9), kStatusNoError);
  EXPECT_EQ(copy.SetVIName(Name("lib:v.ctl")), kStatusNoError);
  EXPECT_EQ(copy.SetVIPath(nullptr), kStatusNoError);
  EXPECT_EQ(out.GetTimeStamp(), 5u);
  EXPECT_EQ(interned.GetTimeStamp(), 5u);
  EXPECT_TRUE(interned.GetVIName().Equal(Name("lib:t.ctl")));
  EXPECT_EQ(interned.IsPathized(), 1);
  EXPECT_EQ(copy.IsPathized(), 0);
  EXPECT_TRUE(copy.CheckIn() == TDWTypedef(Name("lib:v.ctl"), 9, nullptr).CheckIn());
}

TEST_F(TDAttributesTest, TypedefCheckInUnderAllocationFailure) {
  OwnedPath path("types.x");
  const TDWTypedef link(Name("lib:swept.ctl"), 3, path.get());
  ASSERT_TRUE(link.CheckIn()) << "the dictionary gets its table on first use and keeps it";
  GarbageCollectDictionaries();
  const int64_t settled = DSLiveBlockCount();
  bool succeeded = false;
  for (int64_t n = 1; n <= 50 && !succeeded; ++n) {
    SCOPED_TRACE(n);
    TDRTypedef result;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      result = link.CheckIn();
      fired = failure.Fired();
    }
    if (fired) {
      EXPECT_FALSE(result);
    } else {
      ASSERT_TRUE(result);
      EXPECT_EQ(result.GetTimeStamp(), 3u);
      EXPECT_EQ(result.IsPathized(), 1);
      succeeded = true;
    }
    result = TDRTypedef();
    GarbageCollectDictionaries();
    EXPECT_EQ(DSLiveBlockCount(), settled);
  }
  EXPECT_TRUE(succeeded);
}

TEST_F(TDAttributesTest, DumpLines) {
  struct Case {
    const char* name;
    TDAttribute attribute;
    std::vector<std::string> lines;
  };
  const Case kCases[] = {
      {"Name", TDRName(U("n m")), {"name = 'n m'"}},
      {"NameWithoutText", TDWName(static_cast<const uint8_t*>(nullptr)), {}},
      {"Typedef", TDWTypedef(Name("a:b"), 42, nullptr), {"control name = 'a:b'", "time stamp = 0x0000002a"}},
      {"TypedefWithoutTimeStamp", TDWTypedef(Name("lib:t.ctl"), 0, nullptr), {"control name = 'lib:t.ctl'"}},
      {"Null", TDAttribute(), {}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    DebugCapture capture;
    EXPECT_EQ(c.attribute.PrintDebugStr(), 0);
    EXPECT_EQ(capture.Texts(), c.lines);
    for (const DebugMessage& m : capture.Messages()) EXPECT_EQ(m.level, 0);
  }
}

}  // namespace
