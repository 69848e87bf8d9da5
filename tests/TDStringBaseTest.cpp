// Strings, substrings, paths and pictures: kinds and identity, the exact default blocks, the copy
// routines at their edges, copy and conversion between the kinds, compatibility, verification
// of damaged handles, the life cycle of data and allocation failures.
#include "vellum/TDStringHandles.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

namespace {

class TDStringBaseTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    SetTDRaveProc(nullptr);
    TypeSystemTest::TearDown();
  }
};

using Bytes = std::vector<uint8_t>;

// One string datum that frees its handle.
struct Str {
  LStrHandle h = nullptr;
  Str() = default;
  explicit Str(std::string_view text) { EXPECT_EQ(StringUtils::ToLStr(text, &h), kStatusNoError); }
  ~Str() { DSDisposeHandle(reinterpret_cast<UHandle>(h)); }
  Str(const Str&) = delete;
  Str& operator=(const Str&) = delete;
  // The whole block: length word (native order) and every byte the handle holds.
  Bytes Block() const {
    if (h == nullptr) return {};
    const auto* p = reinterpret_cast<const uint8_t*>(*h);
    return Bytes(p, p + DSGetHandleSize(reinterpret_cast<UHandle>(h)));
  }
  std::string Text() const { return StringUtils::FromLStr(h); }
};

Bytes Block(int32_t length, std::string_view bytes) {
  Bytes out(4 + bytes.size());
  std::memcpy(out.data(), &length, 4);
  std::memcpy(out.data() + 4, bytes.data(), bytes.size());
  return out;
}

// A target whose pointer size and largest alignment the test chooses.

TEST_F(TDStringBaseTest, KindsAndSharedDefaults) {
  struct Case {
    const char* name;
    TDR type;
    int16_t code;
    int32_t isString;
    int32_t size;
    const char* text;
  };
  const Case kCases[] = {
      {"String", GetStringTD(), 0x30, 1, 8, "string"},
      {"SubString", GetSubStringTD(), 0x3F, 1, 24, "?"},
      {"Path", GetPathTD(), 0x32, 0, 8, "path"},
      {"Pict", GetPictTD(), 0x33, 0, 8, "?"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(c.type);
    EXPECT_EQ(c.type.GetTypeCode(), c.code);
    EXPECT_TRUE(MakeDefaultTDRForTypeCode(c.code) == c.type);
    EXPECT_EQ(c.type.IsStringBase(), 1);
    EXPECT_EQ(c.type.IsString(), c.isString);
    EXPECT_EQ(c.type.DataSize(), c.size);
    EXPECT_EQ(c.type.GetAlignment(), 8);
    EXPECT_EQ(c.type.DataShape(), kDataShapeStringLike);
    EXPECT_EQ(vellum::As<TDRStringBase>(c.type).GetBound(), -1);
    EXPECT_EQ(ToString(c.type), c.text);
  }
  EXPECT_TRUE(TDRString() == GetStringTD());
  EXPECT_TRUE(TDRSubString(nullptr, -1) == GetSubStringTD());
  EXPECT_EQ(GetSubStringTD().IsSubType(), 1);
  EXPECT_TRUE(vellum::As<TDRString>(GetPathTD()).IsNull()) << "admission by kind";
  EXPECT_TRUE(vellum::As<TDRStringBase>(GetiL()).IsNull());
}

TEST_F(TDStringBaseTest, BoundIsIdentityAndOrder) {
  const TDR variable = TDRString(nullptr, -1);
  const TDR bounded = TDRString(nullptr, 5);
  const TDR fixed = TDRString(nullptr, vellum::bound::Fixed(3));
  EXPECT_FALSE(variable == bounded);
  EXPECT_FALSE(bounded == fixed);
  EXPECT_TRUE(fixed == TDWString(nullptr, vellum::bound::Fixed(3)).CheckIn());
  EXPECT_NE(variable.GetHashValue(), bounded.GetHashValue());
  // Fixed sizes sort first, then variable, then bounds.
  EXPECT_LT(fixed.CompareForSorting(variable), 0);
  EXPECT_LT(variable.CompareForSorting(bounded), 0);
  EXPECT_EQ(bounded.CompareForSorting(TDRString(U("named"), 5)), 0) << "names take no part in the order";

  TDWString edit = vellum::As<TDWString>(bounded.CheckOut());
  EXPECT_EQ(edit.GetBound(), 5);
  EXPECT_EQ(edit.SetBound(-1), kStatusNoError);
  EXPECT_TRUE(edit.CheckIn() == variable);
  EXPECT_EQ(TDWStringBase().SetBound(1), kStatusNullHandle);
  // Only a fixed string's flattened size is known without data, so only a fixed array of fixed
  // strings counts its elements then.
  auto flatSizeOfTwo = [](const TDR& element) {
    TDWArray array(0, element);
    EXPECT_EQ(array.AddDim(vellum::bound::Fixed(2)), kStatusNoError);
    return array.CheckIn().FlatDataSize(nullptr, nullptr);
  };
  EXPECT_EQ(flatSizeOfTwo(fixed), 4u + 2 * (4 + 3));
  EXPECT_EQ(flatSizeOfTwo(bounded), 4u);
  EXPECT_EQ(flatSizeOfTwo(variable), 4u);
}

TEST_F(TDStringBaseTest, ConvertBetweenStringAndSubStringKeepsNameAndBound) {
  const TDRString named(U("label"), 7);
  const TDRSubString sub = named.ConvertToSubString();
  ASSERT_TRUE(sub);
  EXPECT_EQ(sub.GetBound(), 7);
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(sub.GetNamePStr() + 1), 5), "label");
  EXPECT_TRUE(sub.ConvertToString() == named);
  const TDWSubString writable = named.CheckOut().ConvertToSubString();
  EXPECT_EQ(writable.IsReadOnlyTD(), 0);
  EXPECT_TRUE(writable.CheckIn() == sub);
}

TEST_F(TDStringBaseTest, DefaultBlocksAreExact) {
  struct Case {
    const char* name;
    int32_t bound;
    int32_t onlyIfEmpty;
    bool allocated;
    Bytes block;
  };
  const Case kCases[] = {
      {"Fixed3", vellum::bound::Fixed(3), 0, true, {3, 0, 0, 0, 0, 0, 0}},
      {"Bounded5", 5, 0, true, {0, 0, 0, 0, 0, 0, 0, 0, 0}},
      {"Variable", -1, 0, false, {}},
      {"VariableOnlyIfEmpty", -1, 1, true, {0, 0, 0, 0}},
      {"Bounded0", 0, 0, false, {}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const TDRString type(nullptr, c.bound);
    Str datum;
    datum.h = reinterpret_cast<LStrHandle>(uintptr_t{0x40});  // uninitialised memory
    if (c.onlyIfEmpty != 0) datum.h = nullptr;
    ASSERT_EQ(type.InflateDefData(&datum.h, c.onlyIfEmpty, 1, 0), kStatusNoError);
    EXPECT_EQ(datum.h != nullptr, c.allocated);
    EXPECT_EQ(datum.Block(), c.block);
  }
  // Only-if-empty leaves a value alone.
  Str held("xy");
  const LStrHandle before = held.h;
  EXPECT_EQ(GetStringTD().InflateDefData(&held.h, 1, 1, 0), kStatusNoError);
  EXPECT_EQ(held.h, before);
  EXPECT_EQ(held.Text(), "xy");
}

// A packed cluster puts a handle or a record at any offset.
TEST_F(TDStringBaseTest, DataAtAnOddOffset) {
  alignas(8) uint8_t buffer[40] = {};
  void* handleAt = buffer + 1;
  void* recordAt = buffer + 11;
  const TDR fixed = TDRString(nullptr, vellum::bound::Fixed(2));
  ASSERT_EQ(fixed.InflateDefData(handleAt, 0, 1, 0), kStatusNoError);
  Str source("xyz");
  ASSERT_EQ(fixed.CopyData(&source.h, handleAt, nullptr, 0), kStatusNoError);
  EXPECT_EQ(fixed.VerifyData(handleAt, nullptr), kStatusNoError);
  ASSERT_EQ(GetStringTD().CopyDataConvert(GetSubStringTD(), &source.h, recordAt, 0), kStatusNoError);
  EXPECT_EQ(GetSubStringTD().VerifyData(recordAt, nullptr), kStatusNoError);
  ASSERT_EQ(GetSubStringTD().CopyDataConvert(fixed, recordAt, handleAt, 0), kStatusNoError);
  ASSERT_EQ(fixed.ResetToDefaultData(handleAt), kStatusNoError);
  EXPECT_EQ(fixed.DeflateData(handleAt, buffer + sizeof buffer, 1, NormalHandleAllocator()), 6);
  EXPECT_EQ(fixed.VerifyData(handleAt, nullptr), kStatusNoError) << "disposed: null again";
}

TEST_F(TDStringBaseTest, CopyLStr) {
  Str empty("");
  Str stays;
  EXPECT_EQ(CopyLStr(empty.h, &stays.h), kStatusNoError);
  EXPECT_EQ(stays.h, nullptr) << "an empty copy allocates nothing";
  EXPECT_EQ(CopyLStr(nullptr, &stays.h), kStatusNoError);
  EXPECT_EQ(stays.h, nullptr);

  Str source("abcde");
  Str dst;
  ASSERT_EQ(CopyLStr(source.h, &dst.h), kStatusNoError);
  EXPECT_EQ(dst.Block(), Block(5, "abcde"));
  Str other("vwxyz");
  const LStrHandle reused = dst.h;
  const int64_t allocations = DSAllocationCount();
  ASSERT_EQ(CopyLStr(other.h, &dst.h), kStatusNoError);
  EXPECT_EQ(dst.h, reused);
  EXPECT_EQ(DSAllocationCount(), allocations) << "equal lengths need no resize";
  EXPECT_EQ(dst.Text(), "vwxyz");
  ASSERT_EQ(CopyLStr(nullptr, &dst.h), kStatusNoError);
  EXPECT_EQ(dst.Block(), Block(0, ""));
  EXPECT_EQ(CopyLStr(source.h, nullptr), kStatusBadArgument);
}

TEST_F(TDStringBaseTest, CopyBndFixStringTruncatesAndZeroFills) {
  struct Case {
    const char* name;
    std::string_view source;
    int32_t bound;
    Bytes block;
  };
  const Case kCases[] = {
      {"BoundedTruncates", "abcde", 3, Block(3, "abc")},
      {"BoundedKeepsTheRest", "a", 3, Block(1, "azz")},
      {"FixedTruncates", "abcde", vellum::bound::Fixed(3), Block(3, "abc")},
      {"FixedZeroFills", "a", vellum::bound::Fixed(3), Block(3, std::string_view("a\0\0", 3))},
      {"FixedFromNull", "", vellum::bound::Fixed(3), Block(3, std::string_view("\0\0\0", 3))},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const TDRString type(nullptr, c.bound);
    Str dst;
    ASSERT_EQ(type.InflateDefData(&dst.h, 0, 1, 0), kStatusNoError);
    MoveBlock("zzz", reinterpret_cast<uint8_t*>(*dst.h) + 4, 3);  // stale bytes of an old value
    if (c.bound >= 0) (*dst.h)->cnt = 0;
    Str source(c.source);
    ASSERT_EQ(CopyBndFixString(c.source.empty() ? nullptr : source.h, &dst.h, c.bound), kStatusNoError);
    EXPECT_EQ(dst.Block(), c.block);
    // Through the descriptor, into a missing handle: inflated first, then filled.
    Str fresh;
    ASSERT_EQ(type.CopyData(&source.h, &fresh.h, nullptr, 0), kStatusNoError);
    EXPECT_EQ(fresh.Block().size(), 7u);
  }
}

TEST_F(TDStringBaseTest, CopyBndFixStringRefusesWrongPreallocation) {
  DebugCapture capture;
  Str source("abcdef");
  Str small("ab");
  const Bytes before = small.Block();
  EXPECT_EQ(CopyBndFixString(source.h, &small.h, 4), kStatusBadArgument);
  EXPECT_EQ(small.Block(), before) << "nothing written";
  Str wrongLength("abcd");
  (*wrongLength.h)->cnt = 2;
  EXPECT_EQ(CopyBndFixString(source.h, &wrongLength.h, vellum::bound::Fixed(4)), kStatusBadArgument);
  EXPECT_EQ(wrongLength.Text(), "ab");
  Str fourBytes("");
  EXPECT_EQ(CopyBndFixString(source.h, &fourBytes.h, 0), kStatusNoError);
  EXPECT_EQ(capture.Texts(),
            (std::vector<std::string>{
                "Preallocated string exists whose type thinks it needs more memory than what is preallocated.",
                "fixed string len prealloc'd wrong?", "empty bound/fixed string alloc'd?"}));
  Str none;
  EXPECT_EQ(CopyBndFixString(source.h, &none.h, 0), kStatusNoError);
  EXPECT_EQ(none.h, nullptr);
  EXPECT_EQ(CopyBndFixString(source.h, nullptr, 3), kStatusBadArgument);
}

TEST_F(TDStringBaseTest, CopySString) {
  Str dst("0123456789");
  SubStringRec inside{reinterpret_cast<uint8_t*>(*dst.h) + 4 + 3, 4, 1};
  ASSERT_EQ(CopySString(&inside, &dst.h), kStatusNoError);
  EXPECT_EQ(dst.Block(), Block(4, "3456")) << "moved down, handle shrunk";

  const char* text = "hello";
  SubStringRec outside{U(text), 5, 1};
  Str fresh;
  ASSERT_EQ(CopySString(&outside, &fresh.h), kStatusNoError);
  EXPECT_EQ(fresh.Block(), Block(5, "hello"));
  SubStringRec empty{nullptr, 0, 0};
  Str none;
  EXPECT_EQ(CopySString(&empty, &none.h), kStatusNoError);
  EXPECT_EQ(none.h, nullptr);

  const SubStringRec kBad[] = {{nullptr, 2, 1}, {U(text), -1, 1}, {U(text), 2, 2}};
  for (const SubStringRec& rec : kBad) EXPECT_EQ(CopySString(&rec, &fresh.h), kStatusBadArgument);
  EXPECT_EQ(CopySString(nullptr, &fresh.h), kStatusBadArgument);
  EXPECT_EQ(fresh.Text(), "hello");
}

TEST_F(TDStringBaseTest, CopySBndFixString) {
  DebugCapture capture;
  const char* text = "abcdef";
  Str dst;
  ASSERT_EQ(TDRString(nullptr, vellum::bound::Fixed(4)).InflateDefData(&dst.h, 0, 0, 0), kStatusNoError);
  SubStringRec rec{U(text), 2, 1};
  ASSERT_EQ(CopySBndFixString(&rec, &dst.h, vellum::bound::Fixed(4)), kStatusNoError);
  EXPECT_EQ(dst.Block(), Block(4, std::string_view("ab\0\0", 4)));
  rec.stride = 3;
  EXPECT_EQ(CopySBndFixString(&rec, &dst.h, vellum::bound::Fixed(4)), kStatusBadArgument);
  rec.stride = 1;
  EXPECT_EQ(CopySBndFixString(&rec, &dst.h, 9), kStatusOutOfMemory);
  EXPECT_EQ(capture.Texts(),
            (std::vector<std::string>{
                "substring stride=3?",
                "Preallocated string exists whose type thinks it needs more memory than what is preallocated."}));
}

TEST_F(TDStringBaseTest, CopyPath) {
  Path src = nullptr;
  ASSERT_EQ(FEmptyPath(&src), kStatusNoError);
  ASSERT_EQ(FAppendName(src, U("\x04" "data")), kStatusNoError);
  Path dst = nullptr;
  ASSERT_EQ(CopyPath(src, &dst), kStatusNoError);
  EXPECT_EQ(FPathCmpExact(src, dst), 0);
  EXPECT_NE(src, dst);
  ASSERT_EQ(CopyPath(nullptr, &dst), kStatusNoError);
  EXPECT_EQ(FDepth(dst), 0);
  EXPECT_EQ(CopyPath(src, nullptr), kStatusBadArgument);
  // Through the descriptor, and reset and deflation of path data.
  ASSERT_EQ(GetPathTD().CopyData(&src, &dst, nullptr, 0), kStatusNoError);
  EXPECT_EQ(FDepth(dst), 1);
  ASSERT_EQ(GetPathTD().ResetToDefaultData(&dst), kStatusNoError);
  EXPECT_EQ(FDepth(dst), 0);
  EXPECT_EQ(GetPathTD().VerifyData(&dst, nullptr), kStatusNoError);
  EXPECT_EQ(GetPathTD().DeflateData(&dst, &dst + 1, 1, NormalHandleAllocator()), 0);
  EXPECT_EQ(dst, nullptr);
  EXPECT_EQ(GetPathTD().DeflateData(&src, &src + 1, 1, NormalHandleAllocator()), 0);
}

TEST_F(TDStringBaseTest, ConversionsThroughTheSourceCore) {
  DebugCapture capture;
  Str source("abcdef");
  auto convert = [&](const TDR& from, const TDR& to, void* dst) {
    return from.CopyDataConvert(to, &source.h, dst, 0);
  };
  Str tag;
  EXPECT_EQ(convert(GetStringTD(), GetTagTD(), &tag.h), kStatusNoError);
  EXPECT_EQ(tag.Text(), "abcdef");
  Str back;
  EXPECT_EQ(GetTagTD().CopyDataConvert(GetStringTD(), &tag.h, &back.h, 0), kStatusNoError);
  EXPECT_EQ(back.Text(), "abcdef");
  Str bounded;
  EXPECT_EQ(convert(GetStringTD(), TDRString(nullptr, 4), &bounded.h), kStatusNoError);
  EXPECT_EQ(bounded.Block(), Block(4, "abcd")) << "preallocated to the destination's bound";

  Path path = nullptr;
  EXPECT_EQ(convert(GetStringTD(), GetPathTD(), &path), kStatusBadArgument);
  EXPECT_EQ(convert(GetPictTD(), GetStringTD(), &back.h), kStatusBadArgument);
  EXPECT_EQ(GetPathTD().CopyDataConvert(GetStringTD(), &path, &back.h, 0), kStatusBadArgument);
  EXPECT_EQ(path, nullptr);
  EXPECT_EQ(back.Text(), "abcdef");

  // String into SubString: a view of the source; a fixed bound never reaches past its bytes.
  SubStringRec rec{};
  EXPECT_EQ(convert(GetStringTD(), GetSubStringTD(), &rec), kStatusNoError);
  EXPECT_EQ(rec.dataPtr, reinterpret_cast<uint8_t*>(*source.h) + 4);
  EXPECT_EQ(rec.length, 6);
  EXPECT_EQ(rec.stride, 1);
  EXPECT_EQ(convert(GetStringTD(), TDRSubString(nullptr, vellum::bound::Fixed(9)), &rec), kStatusNoError);
  EXPECT_EQ(rec.length, 6);
  EXPECT_EQ(convert(GetStringTD(), TDRSubString(nullptr, 2), &rec), kStatusNoError);
  EXPECT_EQ(rec.length, 2);

  // SubString into String, Tag and SubString; anything else is refused.
  const TDR& sub = GetSubStringTD();
  EXPECT_EQ(sub.CopyDataConvert(GetStringTD(), &rec, &back.h, 0), kStatusNoError);
  EXPECT_EQ(back.Text(), "ab");
  Str fixed;
  EXPECT_EQ(sub.CopyDataConvert(TDRString(nullptr, vellum::bound::Fixed(3)), &rec, &fixed.h, 0), kStatusNoError);
  EXPECT_EQ(fixed.Block(), Block(3, std::string_view("ab\0", 3)));
  EXPECT_EQ(sub.CopyDataConvert(GetTagTD(), &rec, &tag.h, 0), kStatusNoError);
  EXPECT_EQ(tag.Text(), "ab");
  SubStringRec narrowed{};
  EXPECT_EQ(sub.CopyDataConvert(TDRSubString(nullptr, 1), &rec, &narrowed, 0), kStatusNoError);
  EXPECT_EQ(narrowed.length, 1);
  EXPECT_EQ(sub.CopyDataConvert(GetPathTD(), &rec, &path, 0), kStatusBadArgument);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"CopyDataConvert tcDst=0x00000032, tcSrc=0x00000030",
                                                       "CopyDataConvert tcDst=0x00000030, tcSrc=0x00000033",
                                                       "CopyDataConvert:  destination is not a path!",
                                                       "CopyDataConvert tcDst=0x0032, tcSrc=0x003f"}));
}

TEST_F(TDStringBaseTest, CmpTD) {
  const TDR fixed3 = TDRString(nullptr, vellum::bound::Fixed(3));
  const TDR fixed5 = TDRString(nullptr, vellum::bound::Fixed(5));
  struct Case {
    const char* name;
    TDR dst;
    TDR src;
    int32_t flags;
    int32_t result;
  };
  const Case kCases[] = {
      {"SubStringIntoString", GetStringTD(), GetSubStringTD(), 0, 0x8},
      {"SubStringIntoStringQuiet", GetStringTD(), GetSubStringTD(), 0x10, 0},
      {"TagIntoString", GetStringTD(), GetTagTD(), 0, 0x2},
      {"TagIntoSubString", GetSubStringTD(), GetTagTD(), 0, 0xA},
      {"PathIntoString", GetStringTD(), GetPathTD(), 0, 0x100},
      {"NumberIntoString", GetStringTD(), GetiL(), 0, 0x100},
      {"BoundsDiffer", GetStringTD(), TDRString(nullptr, 4), 0, 0x8},
      {"BoundsDifferQuiet", GetStringTD(), TDRString(nullptr, 4), 0x10, 0},
      {"BothFixedQuiet", fixed3, fixed5, 0x10, 0x8},
      {"IntoShorterFixedLoses", fixed3, fixed5, 0x2000, 0x80008},
      {"IntoLongerFixed", fixed5, fixed3, 0x2000, 0x8},
      {"VariableIntoFixedLoses", fixed5, GetStringTD(), 0x2000, 0x80008},
      {"PathPath", GetPathTD(), GetPathTD(), 0, 0},
      {"PictBounds", GetPictTD(), TDRPict(nullptr, 2), 0x10, 0x8},
      {"PictFixedLoses", TDRPict(nullptr, vellum::bound::Fixed(1)), GetPictTD(), 0x2000, 0x80008},
      {"PictIntoPath", GetPathTD(), GetPictTD(), 0, 0x100},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.dst.CmpTD(c.src, c.flags), c.result);
  }
}

int32_t gRaveCode = 0;
void Rave(void*, void*, int32_t& status, int32_t code) {
  gRaveCode = code;
  status = 0x55;
}

TEST_F(TDStringBaseTest, VerifyDataFindsDamageWithoutReadingPastTheHandle) {
  SetTDRaveProc(&Rave);
  Str sound("abc");
  Str none;
  EXPECT_EQ(GetStringTD().VerifyData(&sound.h, nullptr), kStatusNoError);
  EXPECT_EQ(GetStringTD().VerifyData(&none.h, nullptr), kStatusNoError);

  Str tooLong("abc");
  (*tooLong.h)->cnt = 4;
  Str negative("abc");
  (*negative.h)->cnt = -1;
  Str tiny;
  UHandle twoBytes = nullptr;
  ASSERT_EQ(DSNewHClr(2, &twoBytes), kStatusNoError);  // too small to hold a length word
  tiny.h = reinterpret_cast<LStrHandle>(twoBytes);
  LStrHandle notAHandle = reinterpret_cast<LStrHandle>(uintptr_t{0x40});
  for (LStrHandle* damaged : {&tooLong.h, &negative.h, &tiny.h, &notAHandle}) {
    DebugCapture capture;
    gRaveCode = 0;
    EXPECT_EQ(GetPictTD().VerifyData(damaged, nullptr), 0x55);
    EXPECT_EQ(gRaveCode, 1024);
    const std::vector<std::string> texts = capture.Texts();
    ASSERT_EQ(texts.size(), 1u);
    EXPECT_EQ(texts[0].rfind("##VerifyData err 0x00000055 at type=0x0033, data=0x", 0), 0u) << texts[0];
  }
  DebugCapture capture;
  SubStringRec bad{nullptr, 3, 1};
  EXPECT_EQ(GetSubStringTD().VerifyData(&bad, nullptr), 0x55);
  EXPECT_EQ(capture.Texts().size(), 1u);
}

TEST_F(TDStringBaseTest, ResetDeflateAndShrink) {
  const TDR fixed = TDRString(nullptr, vellum::bound::Fixed(3));
  const TDR bounded = TDRString(nullptr, 5);
  Str f("xyz");
  ASSERT_EQ(fixed.ResetToDefaultData(&f.h), kStatusNoError);
  EXPECT_EQ(f.Block(), Block(3, std::string_view("\0\0\0", 3)));
  Str b("xy");
  ASSERT_EQ(DSSetHandleSize(reinterpret_cast<UHandle>(b.h), 9), kStatusNoError);
  ASSERT_EQ(bounded.ResetToDefaultData(&b.h), kStatusNoError);
  EXPECT_EQ(b.Block().size(), 9u);
  EXPECT_EQ((*b.h)->cnt, 0);
  Str v("hello");
  ASSERT_EQ(GetStringTD().ResetToDefaultData(&v.h), kStatusNoError);
  EXPECT_EQ(v.Block(), Block(0, ""));
  Str missing;
  ASSERT_EQ(fixed.ResetToDefaultData(&missing.h), kStatusNoError);
  EXPECT_EQ(missing.Block(), Block(3, std::string_view("\0\0\0", 3)));
  EXPECT_EQ(GetStringTD().ResetToDefaultData(nullptr), kStatusBadArgument);

  const HandleAllocationInterface& allocator = NormalHandleAllocator();
  Str d("hello");
  EXPECT_EQ(GetStringTD().DeflateData(&d.h, &d.h, 0, allocator), 0) << "at the end pointer: untouched";
  EXPECT_EQ(GetStringTD().DeflateData(&d.h, &d.h + 1, 0, allocator), 5);
  EXPECT_EQ(d.Block(), Block(0, ""));
  Str db("ab");
  EXPECT_EQ(bounded.DeflateData(&db.h, &db.h + 1, 0, allocator), 0);
  EXPECT_EQ((*db.h)->cnt, 0);
  EXPECT_EQ(fixed.DeflateData(&f.h, &f.h + 1, 0, allocator), 0);
  EXPECT_EQ(f.Block().size(), 7u);
  EXPECT_EQ(fixed.DeflateData(&f.h, &f.h + 1, 1, allocator), 7);
  EXPECT_EQ(f.h, nullptr);

  Str s("hello");
  Str four("");
  EXPECT_EQ(GetStringTD().ShrinkData(&four.h, &four.h + 1, 0, allocator), 0);
  EXPECT_NE(four.h, nullptr);
  EXPECT_EQ(GetStringTD().ShrinkData(&s.h, &s.h + 1, 1, allocator), 0);
  EXPECT_EQ(GetStringTD().ShrinkData(&s.h, &s.h + 1, 0, allocator), 9);
  EXPECT_EQ(s.h, nullptr);
}

TEST_F(TDStringBaseTest, LayoutForAnotherPlatform) {
  struct Case {
    const char* name;
    int32_t maxAlignment;
    int32_t pointerSize;
    int32_t lengthOffset;
    int32_t subStringSize;
  };
  const Case kCases[] = {
      {"Pointer4", 4, 4, 4, 12},
      {"Pointer8", 8, 8, 8, 24},
      {"Packed", 1, 8, 8, 20},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    TestPlatform platform(c.maxAlignment, 0, c.pointerSize);
    EXPECT_EQ(GetStringTD().DataSize(&platform), c.pointerSize);
    EXPECT_EQ(GetSubStringTD().GetAlignment(&platform), c.pointerSize);
    EXPECT_EQ(GetSubStringTD().DataSize(&platform), c.subStringSize);
    const TDRSubString sub = vellum::As<TDRSubString>(GetSubStringTD());
    EXPECT_EQ(sub.GetStringPtrOffset(&platform), 0);
    EXPECT_EQ(sub.GetLengthOffset(&platform), c.lengthOffset);
  }
  const TDRSubString sub = vellum::As<TDRSubString>(GetSubStringTD());
  EXPECT_EQ(sub.GetLengthOffset(), 8);
  const TDRCluster record = vellum::As<TDRCluster>(GetSubStringRecTD());
  ASSERT_EQ(record.GetNumElts(), 3);
  TestPlatform platform(8, 0, 8);
  EXPECT_EQ(record.GetEltOffsetByName(U("stride"), &platform), 16);
}

TEST_F(TDStringBaseTest, DebugDump) {
  DebugCapture capture;
  TDRString(U("s"), 4).PrintDebugStr();
  const std::vector<std::string> texts = capture.Texts();
  ASSERT_GE(texts.size(), 4u);
  EXPECT_EQ(texts[1], "\ttype = string");
  EXPECT_EQ(texts[texts.size() - 2], "\tbound = 4");
}

TEST_F(TDStringBaseTest, AllocationFailuresLeakNothing) {
  Str source("some text");
  const TDR fixed = TDRString(nullptr, vellum::bound::Fixed(8));
  const TDR tag = TDRTag(nullptr, 20);
  const TDR string = GetStringTD();
  const TDR path = GetPathTD();
  const auto sweep = [](const char* name, auto operation) {
    SCOPED_TRACE(name);
    for (int64_t nth = 1; nth < 50; ++nth) {
      LiveBlockCheck check;
      ScopedAllocationFailure failure(nth);
      const int32_t status = operation();
      if (!failure.Fired()) {
        EXPECT_EQ(status, kStatusNoError);
        return;
      }
      EXPECT_EQ(status, kStatusOutOfMemory) << nth;
    }
    ADD_FAILURE() << "never succeeded";
  };
  sweep("InflateFixed", [&] {
    Str datum;
    return fixed.InflateDefData(&datum.h, 0, 0, 0);
  });
  sweep("CopyVariable", [&] {
    Str datum;
    return string.CopyData(&source.h, &datum.h, nullptr, 0);
  });
  sweep("ConvertIntoBoundedTag", [&] {
    Str datum;
    return string.CopyDataConvert(tag, &source.h, &datum.h, 0);
  });
  sweep("InflatePath", [&] {
    Path datum = nullptr;
    const int32_t status = path.InflateDefData(&datum, 0, 0, 0);
    FDestroyPath(&datum);
    return status;
  });
  // Interned objects stay until the service stops, where the fixture counts what is left.
  for (int64_t nth = 1; nth < 50; ++nth) {
    ScopedAllocationFailure failure(nth);
    const TDRString named(U("named"), 3);
    if (!failure.Fired()) {
      EXPECT_TRUE(named);
      break;
    }
  }
}

}  // namespace
