// Byte-order-aware writers and readers: golden big-endian forms, sticky errors, bounded reads.
#include "runtime/BinData.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "runtime/PXStrings.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes Written(const std::function<void(BinDataWriter&)>& write, const Endianizer* e = nullptr) {
  OutputBuf out;
  BinDataWriter w(&out, e);
  write(w);
  EXPECT_EQ(w.GetError(), kStatusNoError);
  return out.Bytes();
}

TEST(BinDataTest, GoldenBigEndianNumbers) {
  struct Case {
    const char* name;
    std::function<void(BinDataWriter&)> write;
    std::function<bool(BinDataReader&)> readBack;
    Bytes bytes;
  };
  const Case kCases[] = {
      {"I8", [](BinDataWriter& w) { w.WriteI8(-2); },
       [](BinDataReader& r) { int8_t v = 0; r.ReadI8(&v); return v == -2; }, {0xFE}},
      {"U16", [](BinDataWriter& w) { w.WriteU16(0x1234); },
       [](BinDataReader& r) { uint16_t v = 0; r.ReadU16(&v); return v == 0x1234; }, {0x12, 0x34}},
      {"I16", [](BinDataWriter& w) { w.WriteI16(-32768); },
       [](BinDataReader& r) { int16_t v = 0; r.ReadI16(&v); return v == -32768; }, {0x80, 0x00}},
      {"U32", [](BinDataWriter& w) { w.WriteU32(0xDEADBEEF); },
       [](BinDataReader& r) { uint32_t v = 0; r.ReadU32(&v); return v == 0xDEADBEEF; }, {0xDE, 0xAD, 0xBE, 0xEF}},
      {"I32", [](BinDataWriter& w) { w.WriteI32(-1); },
       [](BinDataReader& r) { int32_t v = 0; r.ReadI32(&v); return v == -1; }, {0xFF, 0xFF, 0xFF, 0xFF}},
      {"U64", [](BinDataWriter& w) { w.WriteU64(0x0102030405060708ull); },
       [](BinDataReader& r) { uint64_t v = 0; r.ReadU64(&v); return v == 0x0102030405060708ull; },
       {1, 2, 3, 4, 5, 6, 7, 8}},
      {"I64", [](BinDataWriter& w) { w.WriteI64(-256); },
       [](BinDataReader& r) { int64_t v = 0; r.ReadI64(&v); return v == -256; },
       {0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x00}},
      {"F32", [](BinDataWriter& w) { w.WriteF32(1.5f); },
       [](BinDataReader& r) { float v = 0; r.ReadF32(&v); return v == 1.5f; }, {0x3F, 0xC0, 0x00, 0x00}},
      {"F64", [](BinDataWriter& w) { w.WriteF64(-2.0); },
       [](BinDataReader& r) { double v = 0; r.ReadF64(&v); return v == -2.0; }, {0xC0, 0, 0, 0, 0, 0, 0, 0}},
      {"PStr", [](BinDataWriter& w) { w.WritePStr(reinterpret_cast<const uint8_t*>("\x02hi")); },
       [](BinDataReader& r) { uint8_t p[256]; r.ReadPStr(p); return StringUtils::FromPStr(p) == "hi"; },
       {2, 'h', 'i'}},
      {"NullPStr", [](BinDataWriter& w) { w.WritePStr(nullptr); },
       [](BinDataReader& r) { uint8_t p[256] = {7}; r.ReadPStr(p); return p[0] == 0; }, {0}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    BigEndianizer big;
    EXPECT_EQ(Written(c.write, &big), c.bytes);
    EXPECT_EQ(Written(c.write, nullptr), c.bytes) << "null endianizer means big-endian";
    InputBuf in(c.bytes.data(), c.bytes.size());
    BinDataReader r(&in, &big);
    EXPECT_TRUE(c.readBack(r));
    EXPECT_EQ(r.GetError(), kStatusNoError);
    EXPECT_EQ(r.BytesLeft(), 0u);

    // Native order reads back what it wrote.
    NativeEndianizer native;
    const Bytes nativeBytes = Written(c.write, &native);
    InputBuf nin(nativeBytes.data(), nativeBytes.size());
    BinDataReader nr(&nin, &native);
    EXPECT_TRUE(c.readBack(nr));
  }
}

TEST(BinDataTest, LStrRoundTripAndLimits) {
  LiveBlockCheck leaks;
  LStrHandle s = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abc", &s), kStatusNoError);
  const Bytes bytes = Written([&](BinDataWriter& w) { w.WriteLStr(s); w.WriteLStr(nullptr); });
  EXPECT_EQ(bytes, (Bytes{0, 0, 0, 3, 'a', 'b', 'c', 0, 0, 0, 0}));

  InputBuf in(bytes.data(), bytes.size());
  BinDataReader r(&in, nullptr);
  LStrHandle a = nullptr;
  LStrHandle b = s;  // live: reused
  ASSERT_EQ(r.ReadLStr(&a), kStatusNoError);
  ASSERT_EQ(r.ReadLStr(&b), kStatusNoError);
  EXPECT_EQ(StringUtils::FromLStr(a), "abc");
  EXPECT_EQ(b, s);
  EXPECT_EQ(LHStrLen(b), 0);

  struct Case {
    const char* name;
    Bytes bytes;
  };
  const Case kBad[] = {
      {"Negative", {0xFF, 0xFF, 0xFF, 0xFF}},
      {"BeyondInput", {0x7F, 0xFF, 0xFF, 0xFF, 'x'}},
      {"OneShort", {0, 0, 0, 2, 'x'}},
      {"TruncatedCount", {0, 0}},
  };
  for (const Case& c : kBad) {
    SCOPED_TRACE(c.name);
    InputBuf bad(c.bytes.data(), c.bytes.size());
    BinDataReader br(&bad, nullptr);
    LStrHandle fresh = reinterpret_cast<LStrHandle>(uintptr_t{0x40});  // not a handle: replaced
    EXPECT_EQ(br.ReadLStr(&fresh), kStatusCorruptData);
    EXPECT_EQ(fresh, nullptr);
    InputBuf again(c.bytes.data(), c.bytes.size());
    BinDataReader ar(&again, nullptr);
    EXPECT_EQ(ar.ReadLStr(&a), kStatusCorruptData);
    EXPECT_EQ(LHStrLen(a), 0) << "a live handle is left empty";
  }
  DSDisposeHandle(reinterpret_cast<UHandle>(a));
  DSDisposeHandle(reinterpret_cast<UHandle>(s));
}

TEST(BinDataTest, ReadingPastTheEndClearsAndSticks) {
  const Bytes bytes = {1, 2, 3};
  InputBuf in(bytes.data(), bytes.size());
  BinDataReader r(&in, nullptr);
  uint32_t big = 77;
  EXPECT_EQ(r.ReadU32(&big), kStatusCorruptData);
  EXPECT_EQ(big, 0u);
  EXPECT_EQ(r.Position(), 0u) << "a failed read consumes nothing";
  uint8_t small = 9;
  EXPECT_EQ(r.ReadU8(&small), kStatusCorruptData) << "the first error sticks";
  EXPECT_EQ(small, 0);
  uint8_t buf[2] = {5, 5};
  EXPECT_EQ(r.ReadBytes(buf, 2), kStatusCorruptData);
  EXPECT_EQ(buf[0], 0);
  double d = 1;
  EXPECT_EQ(r.ReadF64(&d), kStatusCorruptData);
  EXPECT_EQ(d, 0.0);
  r.SetError(kStatusTooNew);
  EXPECT_EQ(r.GetError(), kStatusCorruptData);

  BinDataReader none(nullptr, nullptr);
  int16_t v = 3;
  EXPECT_EQ(none.ReadI16(&v), kStatusNullHandle);
  EXPECT_EQ(v, 0);
}

TEST(BinDataTest, SkipAndAlignAreBounded) {
  const Bytes bytes = {1, 0xAA, 0xAA, 0xAA, 0, 0, 0, 9};
  InputBuf in(bytes.data(), bytes.size());
  BinDataReader r(&in, nullptr);
  uint8_t first = 0;
  uint32_t aligned = 0;
  r.ReadU8(&first);
  EXPECT_EQ(r.Align(4), kStatusNoError);
  EXPECT_EQ(r.ReadU32(&aligned), kStatusNoError);
  EXPECT_EQ(aligned, 9u);
  EXPECT_EQ(r.Align(8), kStatusNoError) << "already aligned";
  EXPECT_EQ(r.Skip(1), kStatusCorruptData);

  const Bytes written = Written([](BinDataWriter& w) {
    w.WriteU8(1);
    w.Align(4);
    w.WriteU8(2);
    w.Align(1);
    w.Align(0);
    w.Align(2);
  });
  EXPECT_EQ(written, (Bytes{1, 0, 0, 0, 2, 0}));
}

TEST(BinDataTest, PreflightCountsWhatAWriterWouldWrite) {
  LiveBlockCheck leaks;
  auto write = [](BinDataWriter& w) {
    w.WriteU16(1);
    w.WritePStr(reinterpret_cast<const uint8_t*>("\x03" "abc"));
    w.Align(8);
    w.WriteF64(0.5);
  };
  PreflightOutputBuf preflight;
  BinDataWriter counting(&preflight, nullptr);
  write(counting);
  EXPECT_TRUE(preflight.IsCounting());
  EXPECT_EQ(counting.GetBytesWritten(), Written(write).size());
  EXPECT_EQ(counting.GetBytesWritten(), 16u);
}

TEST(BinDataTest, WriterErrorsStick) {
  LiveBlockCheck leaks;
  OutputBuf out;
  BinDataWriter w(&out, nullptr);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(w.WriteU32(1), kStatusOutOfMemory);
  }
  EXPECT_EQ(w.WriteU8(1), kStatusOutOfMemory);
  EXPECT_EQ(out.GetBytesWritten(), 0u);
  w.SetError(kStatusBadArgument);
  EXPECT_EQ(w.GetError(), kStatusOutOfMemory);

  BinDataWriter none(nullptr, nullptr);
  EXPECT_EQ(none.WriteU8(1), kStatusNullHandle);
  OutputBuf other;
  BinDataWriter bad(&other, nullptr);
  EXPECT_EQ(bad.WriteBytes(nullptr, 3), kStatusBadArgument);
}

TEST(BinDataTest, SwapOutputBufAndCopyToHandle) {
  LiveBlockCheck leaks;
  OutputBuf first;
  OutputBuf second;
  BinDataWriter w(&first, nullptr);
  w.WriteU8(1);
  EXPECT_EQ(w.SwapOutputBuf(&second), &first);
  w.WriteU8(2);
  EXPECT_EQ(first.Bytes(), Bytes{1});
  EXPECT_EQ(second.Bytes(), Bytes{2});
  EXPECT_EQ(w.GetOutputBuf(), &second);

  UHandle h = nullptr;
  ASSERT_EQ(first.CopyToHandle(&h), kStatusNoError);
  ASSERT_EQ(DSGetHandleSize(h), 1u);
  EXPECT_EQ((*h)[0], 1);
  UHandle same = h;
  ASSERT_EQ(second.CopyToHandle(&h), kStatusNoError);
  EXPECT_EQ(h, same);
  EXPECT_EQ((*h)[0], 2);
  DSDisposeHandle(h);
  first.Clear();
  EXPECT_EQ(first.GetBytesWritten(), 0u);
}

TEST(BinDataTest, EndianizerSwapsOnlyAcrossOrders) {
  BigEndianizer big;
  NativeEndianizer native;
  EXPECT_EQ(native.Stream32(0x01020304), 0x01020304u);
  EXPECT_EQ(big.Stream16(big.Stream16(0xABCD)), 0xABCD);
  EXPECT_EQ(big.StreamF64(big.StreamF64(3.25)), 3.25);
  if (!native.IsBigEndian()) {
    EXPECT_EQ(big.Stream64(0x0102030405060708ull), 0x0807060504030201ull);
  }
}

}  // namespace
