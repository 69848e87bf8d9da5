// Paths: building, ordering, sanity, and the flattened form with its bounded reader.
#include "runtime/PXPath.h"

#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "runtime/BinData.h"
#include "runtime/PXStrings.h"

namespace {

struct PathDeleter {
  void operator()(PathRef* p) const { FDestroyPath(&p); }
};
using OwnedPath = std::unique_ptr<PathRef, PathDeleter>;

uint8_t* P(const std::string& s, uint8_t* buf) {
  StringUtils::ToPStr(s, buf);
  return buf;
}

OwnedPath MakePath(int32_t type, const std::vector<std::string>& names) {
  Path p = nullptr;
  EXPECT_EQ(FEmptyPath(&p), kStatusNoError);
  EXPECT_EQ(FSetPathType(p, type), kStatusNoError);
  uint8_t buf[256];
  for (const std::string& n : names) EXPECT_EQ(FAppendName(p, P(n, buf)), kStatusNoError);
  return OwnedPath(p);
}

std::vector<uint8_t> Flatten(Path p) {
  OutputBuf out;
  BigEndianizer big;
  BinDataWriter w(&out, &big);
  EXPECT_EQ(FFlattenPath2(p, w), kStatusNoError);
  EXPECT_EQ(out.GetBytesWritten(), FFlattenedPath2Size(p));
  return out.Bytes();
}

int32_t Unflatten(const std::vector<uint8_t>& bytes, OwnedPath* out) {
  InputBuf in(bytes.data(), bytes.size());
  BigEndianizer big;
  BinDataReader r(&in, &big);
  Path p = nullptr;
  const int32_t status = FUnFlattenPath2(r, &p);
  EXPECT_EQ(status, r.GetError());
  if (status != 0) {
    EXPECT_EQ(p, nullptr);
  }
  out->reset(p);
  return status;
}

const std::vector<uint8_t> kEmptyPathBytes = {'P', 'T', 'H', '0', 0, 0, 0, 4, 0, 0, 0, 0};
// A relative path "lib", "Data", "x.bin".
const std::vector<uint8_t> kThreeNameBytes = {'P', 'T', 'H', '0', 0, 0, 0, 19, 0, 1, 0, 3,
                                              3,   'l', 'i', 'b', 4, 'D', 'a', 't', 'a',
                                              5,   'x', '.', 'b', 'i', 'n'};

TEST(PXPathTest, GoldenFlattenedForms) {
  LiveBlockCheck leaks;
  struct Case {
    const char* name;
    int32_t type;
    std::vector<std::string> names;
    std::vector<uint8_t> bytes;
  };
  const Case kCases[] = {
      {"EmptyAbsolute", kAbsPath, {}, kEmptyPathBytes},
      {"ThreeNamesRelative", kRelPath, {"lib", "Data", "x.bin"}, kThreeNameBytes},
      {"NotAPath", kNotAPath, {}, {'P', 'T', 'H', '0', 0, 0, 0, 4, 0, 2, 0, 0}},
      {"Unc", kUNCPath, {"server"}, {'P', 'T', 'H', '0', 0, 0, 0, 11, 0, 3, 0, 1, 6, 's', 'e', 'r', 'v', 'e', 'r'}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    OwnedPath p = MakePath(c.type, c.names);
    EXPECT_EQ(Flatten(p.get()), c.bytes);
    OwnedPath back;
    ASSERT_EQ(Unflatten(c.bytes, &back), kStatusNoError);
    EXPECT_EQ(FPathCmpExact(p.get(), back.get()), 0);
  }
  EXPECT_EQ(Flatten(nullptr), (std::vector<uint8_t>{'P', 'T', 'H', '0', 0, 0, 0, 4, 0, 2, 0, 0}))
      << "a null path is written as a not-a-path";
}

TEST(PXPathTest, MalformedInputsAreRefused) {
  LiveBlockCheck leaks;
  auto with = [](std::vector<uint8_t> bytes, size_t at, uint8_t value) {
    bytes[at] = value;
    return bytes;
  };
  std::vector<uint8_t> trailing = kThreeNameBytes;
  trailing[7] = 20;
  trailing.push_back(0);
  struct Case {
    const char* name;
    std::vector<uint8_t> bytes;
  };
  const Case kCases[] = {
      {"Empty", {}},
      {"WrongTag", with(kEmptyPathBytes, 3, '1')},
      {"CountBelowHeader", with(kEmptyPathBytes, 7, 3)},
      {"CountBeyondInput", with(kEmptyPathBytes, 7, 5)},
      {"HugeCount", with(kEmptyPathBytes, 4, 0xFF)},
      {"UnknownType", with(kEmptyPathBytes, 9, 4)},
      {"NotAPathWithNames", with(kThreeNameBytes, 9, 2)},
      {"TooManyNamesForBytes", with(kThreeNameBytes, 11, 9)},
      {"FewerNamesThanBytes", with(kThreeNameBytes, 11, 2)},
      {"EmptyName", with(kThreeNameBytes, 12, 0)},
      {"NameRunsPastCount", with(kThreeNameBytes, 21, 6)},
      {"SlashInName", with(kThreeNameBytes, 14, '/')},
      {"NulInName", with(kThreeNameBytes, 14, 0)},
      {"CountCoversTrailingByte", trailing},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    OwnedPath p;
    EXPECT_EQ(Unflatten(c.bytes, &p), kStatusCorruptData);
  }
}

TEST(PXPathTest, EveryTruncationIsRefused) {
  LiveBlockCheck leaks;
  for (size_t n = 0; n < kThreeNameBytes.size(); ++n) {
    SCOPED_TRACE(n);
    OwnedPath p;
    EXPECT_EQ(Unflatten(std::vector<uint8_t>(kThreeNameBytes.begin(), kThreeNameBytes.begin() + n), &p),
              kStatusCorruptData);
  }
}

TEST(PXPathTest, ReaderLeavesFollowingDataAndKeepsStickyError) {
  LiveBlockCheck leaks;
  std::vector<uint8_t> bytes = kEmptyPathBytes;
  bytes.push_back(0xAB);
  InputBuf in(bytes.data(), bytes.size());
  BinDataReader r(&in, nullptr);
  Path p = nullptr;
  ASSERT_EQ(r.ReadPath(&p), kStatusNoError);
  uint8_t next = 0;
  EXPECT_EQ(r.ReadU8(&next), kStatusNoError);
  EXPECT_EQ(next, 0xAB);
  FDestroyPath(&p);
  Path q = nullptr;
  EXPECT_EQ(r.ReadPath(&q), kStatusCorruptData);
  EXPECT_EQ(q, nullptr);
  EXPECT_EQ(FUnFlattenPath2(r, &q), kStatusCorruptData) << "the first error sticks";
}

TEST(PXPathTest, OrderIsTotalAndFoldsCase) {
  LiveBlockCheck leaks;
  OwnedPath absA = MakePath(kAbsPath, {"a"});
  OwnedPath absAUpper = MakePath(kAbsPath, {"A"});
  OwnedPath absAB = MakePath(kAbsPath, {"a", "b"});
  OwnedPath absB = MakePath(kAbsPath, {"b"});
  OwnedPath relA = MakePath(kRelPath, {"a"});
  struct Case {
    const char* name;
    Path a;
    Path b;
    int32_t folded;
    int32_t exact;
  };
  const Case kCases[] = {
      {"NullNull", nullptr, nullptr, 0, 0},
      {"NullFirst", nullptr, absA.get(), -1, -1},
      {"CaseFolded", absAUpper.get(), absA.get(), 0, -1},
      {"PrefixFirst", absA.get(), absAB.get(), -1, -1},
      {"ByName", absAB.get(), absB.get(), -1, -1},
      {"TypeFirst", relA.get(), absB.get(), 1, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(FPathCmp(c.a, c.b), c.folded);
    EXPECT_EQ(FPathCmp(c.b, c.a), -c.folded);
    EXPECT_EQ(FPathCmpExact(c.a, c.b), c.exact);
    EXPECT_EQ(FPathCmpExact(c.b, c.a), -c.exact);
  }
  EXPECT_TRUE(PathRef::NameEquals("Data", "DATA"));
}

TEST(PXPathTest, BuildingRulesAndSanity) {
  LiveBlockCheck leaks;
  OwnedPath p = MakePath(kAbsPath, {"C:", "Users"});
  EXPECT_EQ(FDepth(p.get()), 2);
  EXPECT_EQ(FIsSanePath(p.get()), 1);
  uint8_t buf[256];
  const char* kBadNames[] = {"", "a/b", "a\\b"};
  for (const char* name : kBadNames) {
    SCOPED_TRACE(name);
    EXPECT_EQ(FAppendName(p.get(), P(name, buf)), kStatusBadArgument);
  }
  EXPECT_EQ(FAppendName(p.get(), P(std::string(255, 'n'), buf)), kStatusNoError);
  EXPECT_EQ(FDepth(p.get()), 3);
  EXPECT_EQ(FAppendName(nullptr, P("x", buf)), kStatusNullHandle);
  EXPECT_EQ(FSetPathType(p.get(), 7), kStatusBadArgument);

  int32_t type = -1;
  EXPECT_EQ(FGetPathType(nullptr, &type), kStatusNullHandle);
  EXPECT_EQ(FSetPathType(p.get(), kNotAPath), kStatusNoError);
  EXPECT_EQ(FDepth(p.get()), 0) << "a not-a-path has no names";
  EXPECT_EQ(FAppendName(p.get(), P("x", buf)), kStatusBadArgument);
  EXPECT_EQ(FGetPathType(p.get(), &type), kStatusNoError);
  EXPECT_EQ(type, kNotAPath);
  EXPECT_EQ(FIsSanePath(p.get()), 1);
  EXPECT_EQ(FIsSanePath(nullptr), 0);
  p->type = 9;
  EXPECT_EQ(FIsSanePath(p.get()), 0);

  Path none = nullptr;
  EXPECT_EQ(FPathCopy(nullptr, &none), kStatusNoError);
  EXPECT_EQ(none, nullptr);
  EXPECT_EQ(FDestroyPath(&none), kStatusNoError);
  EXPECT_EQ(FDestroyPath(nullptr), kStatusBadArgument);
}

// Makes a not-a-path, a copy of a two-name path, and reads a flattened three-name path.
int32_t BuildPaths(std::vector<OwnedPath>* made) {
  Path p = nullptr;
  if (int32_t err = FNotAPath(&p)) return err;
  made->emplace_back(p);
  if (int32_t err = FEmptyPath(&p)) return err;
  made->emplace_back(p);
  uint8_t buf[256];
  for (const char* name : {"a-rather-long-directory-name", "another-long-file-name.dat"})
    if (int32_t err = FAppendName(p, P(name, buf))) return err;
  Path copy = nullptr;
  if (int32_t err = FPathCopy(p, &copy)) return err;
  made->emplace_back(copy);
  InputBuf in(kThreeNameBytes.data(), kThreeNameBytes.size());
  BinDataReader r(&in, nullptr);
  Path read = nullptr;
  if (int32_t err = FUnFlattenPath2(r, &read)) return err;
  made->emplace_back(read);
  return kStatusNoError;
}

TEST(PXPathTest, FailureSweepOverPathBuilding) {
  LiveBlockCheck leaks;
  for (int64_t n = 1;; ++n) {
    SCOPED_TRACE(n);
    std::vector<OwnedPath> made;
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      status = BuildPaths(&made);
      fired = failure.Fired();
    }
    if (!fired) {
      ASSERT_EQ(status, kStatusNoError);
      ASSERT_EQ(made.size(), 4u);
      EXPECT_EQ(FPathCmpExact(made[1].get(), made[2].get()), 0);
      EXPECT_EQ(FDepth(made[3].get()), 3);
      break;
    }
    EXPECT_EQ(status, kStatusOutOfMemory);
    ASSERT_LT(n, 100);
  }
}

}  // namespace

// Data verification meets path pointers in memory the library did not write: a pointer that is
// not a live path is refused without being read, and a path is never freed twice.
TEST(PXPathTest, OnlyLivePathsAreReadOrFreed) {
  LiveBlockCheck blocks;
  Path path = nullptr;
  ASSERT_EQ(FEmptyPath(&path), kStatusNoError);
  EXPECT_EQ(FIsSanePath(path), 1);
  Path stale = path;
  EXPECT_EQ(FDestroyPath(&path), kStatusNoError);
  EXPECT_EQ(FIsSanePath(stale), 0);
  EXPECT_EQ(FDestroyPath(&stale), kStatusBadArgument);
  alignas(16) unsigned char garbage[64];
  std::memset(garbage, 0xA5, sizeof(garbage));
  Path fake = reinterpret_cast<Path>(garbage);
  EXPECT_EQ(FIsSanePath(fake), 0);
  EXPECT_EQ(FDestroyPath(&fake), kStatusBadArgument);
}
