// Byte blocks and the CStr / PStr / LStr conversions and orderings.
#include "runtime/PXStrings.h"

#include <gtest/gtest.h>

#include <string>

#include "support/TestSupport.h"
#include "runtime/DSMemory.h"

namespace {


struct Owned {
  LStrHandle h = nullptr;
  explicit Owned(std::string_view s) { EXPECT_EQ(StringUtils::ToLStr(s, &h), kStatusNoError); }
  ~Owned() { DSDisposeHandle(reinterpret_cast<UHandle>(h)); }
  Owned(const Owned&) = delete;
  Owned& operator=(const Owned&) = delete;
};

TEST(PXStringsTest, Orderings) {
  struct Case {
    const char* a;
    const char* b;
    int32_t exact;  // StrCmp, PStrCmp, LHStrCmp
    int32_t folded;  // StrCaseCmp, CaseInsensitiveCompare
  };
  const Case kCases[] = {
      {"", "", 0, 0},        {"a", "", 1, 1},          {"abc", "abd", -1, -1},
      {"abc", "ab", 1, 1},   {"ABC", "abc", -1, 0},    {"Zeta", "alpha", -1, 1},
      {"\xFF", "a", 1, 1},   {"a_b", "A_B", 1, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(std::string(c.a) + " vs " + c.b);
    uint8_t pa[256];
    uint8_t pb[256];
    CToPStr(U(c.a), pa);
    CToPStr(U(c.b), pb);
    Owned la(c.a);
    Owned lb(c.b);
    EXPECT_EQ(StrCmp(U(c.a), U(c.b)), c.exact);
    EXPECT_EQ(PStrCmp(pa, pb), c.exact);
    EXPECT_EQ(LHStrCmp(la.h, lb.h), c.exact);
    EXPECT_EQ(StrCaseCmp(U(c.a), U(c.b)), c.folded);
    EXPECT_EQ(StringUtils::CaseInsensitiveCompare(c.a, c.b), c.folded);
  }
}

TEST(PXStringsTest, NullReadsAsEmpty) {
  LiveBlockCheck leaks;
  Owned empty("");
  EXPECT_EQ(StrLen(nullptr), 0);
  EXPECT_EQ(StrCmp(nullptr, U("")), 0);
  EXPECT_EQ(StrCaseCmp(U("a"), nullptr), 1);
  EXPECT_EQ(PStrCmp(nullptr, EmptyPStr()), 0);
  EXPECT_EQ(LHStrCmp(nullptr, empty.h), 0);
  EXPECT_EQ(LHStrLen(nullptr), 0);
  EXPECT_EQ(StringUtils::FromPStr(nullptr), "");
  EXPECT_EQ(StringUtils::FromLStr(nullptr), "");
  uint8_t c[4] = {'x', 'x', 'x', 'x'};
  EXPECT_EQ(PToCStr(nullptr, c)[0], 0);
  uint8_t p[256] = {9};
  EXPECT_EQ(CToPStr(nullptr, p)[0], 0);
  EXPECT_EQ(EmptyPStr()[0], 0);
}

TEST(PXStringsTest, PStrConversionsStopAt255Bytes) {
  const std::string longText(300, 'q');
  uint8_t p[256];
  CToPStr(U(longText.c_str()), p);
  EXPECT_EQ(p[0], 255);
  EXPECT_EQ(StringUtils::FromPStr(p), std::string(255, 'q'));
  EXPECT_EQ(StringUtils::ToPStr(longText, p), kStatusBadArgument);
  EXPECT_EQ(p[0], 255);
  EXPECT_EQ(StringUtils::ToPStr("name", p), kStatusNoError);
  uint8_t c[256];
  EXPECT_EQ(std::string(reinterpret_cast<char*>(PToCStr(p, c))), "name");
  uint8_t copy[256];
  PStrCpy(copy, p);
  EXPECT_EQ(PStrCmp(copy, p), 0);
}

TEST(PXStringsTest, CStrCopyAndConcatenate) {
  uint8_t buf[32];
  StrCpy(buf, U("data"));
  StrCat(buf, U("flow"));
  EXPECT_EQ(StrLen(buf), 8);
  EXPECT_EQ(StrCmp(buf, U("dataflow")), 0);
}

TEST(PXStringsTest, LStrConversionsAllocateOrResize) {
  LiveBlockCheck leaks;
  LStrHandle h = nullptr;
  ASSERT_EQ(CToLStr(U("vellum"), &h), kStatusNoError);
  EXPECT_EQ(LHStrLen(h), 6);
  EXPECT_EQ(StringUtils::FromLStr(h), "vellum");
  LStrHandle same = h;
  ASSERT_EQ(StringUtils::ToLStr(std::string(1000, 'z'), &h), kStatusNoError);
  EXPECT_EQ(h, same);
  EXPECT_EQ(LHStrLen(h), 1000);
  EXPECT_EQ(DSGetHandleSize(reinterpret_cast<UHandle>(h)), 1004u);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(StringUtils::ToLStr(std::string(5000, 'y'), &h), kStatusOutOfMemory);
  }
  EXPECT_EQ(StringUtils::FromLStr(h), std::string(1000, 'z')) << "a failed store leaves the old string";
  DSDisposeHandle(reinterpret_cast<UHandle>(h));

  LStrHandle none = nullptr;
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(CToLStr(U("x"), &none), kStatusOutOfMemory);
  }
  EXPECT_EQ(none, nullptr);
}

TEST(PXStringsTest, Blocks) {
  uint8_t buf[8] = {1, 2, 3, 4, 5, 6, 7, 8};
  MoveBlock(buf, buf + 2, 4);  // overlapping
  EXPECT_EQ(std::vector<uint8_t>(buf, buf + 8), (std::vector<uint8_t>{1, 2, 1, 2, 3, 4, 7, 8}));
  uint8_t a[3] = {1, 2, 3};
  uint8_t b[3] = {9, 8, 7};
  SwapBlock(a, b, 3);
  EXPECT_EQ(a[0], 9);
  EXPECT_EQ(b[2], 3);
  EXPECT_EQ(BlockCmp(a, b, 3), 1);
  const uint8_t high[1] = {0x80};
  const uint8_t low[1] = {0x7F};
  EXPECT_EQ(BlockCmp(low, high, 1), -1) << "bytes compare unsigned";
  ClearMem(buf, 8);
  EXPECT_EQ(BlockCmp(buf, std::vector<uint8_t>(8, 0).data(), 8), 0);
  MoveBlock(nullptr, buf, 0);
  ClearMem(nullptr, 0);
}

}  // namespace
