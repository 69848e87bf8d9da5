// Flattened data: the stored bytes of values of every kind, reading them back, and the refusals
// that keep short or hostile input from costing memory it does not pay for.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <string>
#include <vector>

#include "support/RandomTypes.h"
#include "support/TestDatum.h"
#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXApp.h"
#include "runtime/PXNumbers.h"
#include "runtime/MoveBytes.h"
#include "runtime/PXStrings.h"
#include "vellum/DataStreams.h"
#include "vellum.h"

namespace {

class KoDataFlattenTest : public TypeSystemTest {};

std::string Flatten(const TDR& type, const void* data, uint32_t version = PXApp::Instance().GetVersion()) {
  OutputBuf out;
  KoDataWriter writer(&out, version, nullptr, 0);
  const int32_t status = writer.WriteData(type, data, 1);
  if (status != kStatusNoError) return "status " + std::to_string(status);
  EXPECT_EQ(type.FlatDataSize(&writer, data), out.GetBytesWritten());
  return HexBytes(out.Data(), out.GetBytesWritten());
}

// Reads `hex` into `data`, which must take every byte.
int32_t Unflatten(const TDR& type, const std::string& hex, void* data,
                  uint32_t version = PXApp::Instance().GetVersion()) {
  return vellum::UnflattenData(type, BytesFromHex(hex), data, version);
}

std::string Text(LStrHandle h) {
  return h == nullptr ? std::string("<null>") : std::string(reinterpret_cast<const char*>((*h)->str), static_cast<size_t>((*h)->cnt));
}

// --- the stored bytes --------------------------------------------------------------------------------

TEST_F(KoDataFlattenTest, GoldenValues) {
  const int32_t one = 1;
  EXPECT_EQ(Flatten(GetiL(), &one), "00 00 00 01");
  const double unit = 1.0;
  EXPECT_EQ(Flatten(GetfD(), &unit), "3F F0 00 00 00 00 00 00");
  const uint8_t yes = 1;
  EXPECT_EQ(Flatten(GetBoolTD(), &yes), "01");
  EXPECT_EQ(Flatten(GetBoolTD(), &yes, 0x04502003), "80 00");

  vellum::Value empty(GetStringTD());
  EXPECT_EQ(Flatten(GetStringTD(), empty.Data()), "00 00 00 00");
  vellum::Value abc(GetStringTD());
  LStrHandle text = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abc", &text), kStatusNoError);
  Store(abc.Data(), text);
  EXPECT_EQ(Flatten(GetStringTD(), abc.Data()), "00 00 00 03 61 62 63");

  const TDR shorts = TDRArray(1, GetiW());
  vellum::Value none(shorts);
  EXPECT_EQ(Flatten(shorts, none.Data()), "00 00 00 00");
  vellum::Value two(shorts);
  ASSERT_EQ(Unflatten(shorts, "00 00 00 02 00 01 00 02", two.Data()), kStatusNoError);
  EXPECT_EQ(Flatten(shorts, two.Data()), "00 00 00 02 00 01 00 02");

  TDWCluster pair;
  pair << GetiB() << GetiL();
  const TDR cluster = pair.CheckIn();
  vellum::Value packed(cluster);
  Store(packed.Data(), int8_t{-2});
  Store(static_cast<uint8_t*>(packed.Data()) + vellum::As<TDRCluster>(cluster).GetEltOffset(1), int32_t{0x01020304});
  EXPECT_EQ(Flatten(cluster, packed.Data()), "FE 01 02 03 04");
}

TEST_F(KoDataFlattenTest, EveryNumericKindRoundTrips) {
  for (int32_t code = 1; code <= 14; ++code) {
    SCOPED_TRACE(code);
    const TDR type = MakeDefaultTDRForTypeCode(code);
    std::vector<uint8_t> value(static_cast<size_t>(type.DataSize()));
    for (size_t i = 0; i < value.size(); ++i) value[i] = static_cast<uint8_t>(0x11 * (i + 1));
    const std::string flat = Flatten(type, value.data());
    std::vector<uint8_t> back(value.size(), 0);
    ASSERT_EQ(Unflatten(type, flat, back.data()), kStatusNoError);
    EXPECT_EQ(back, value);
  }
  // Big-endian integers, real part first.
  const float complex[2] = {1.0f, -2.0f};
  EXPECT_EQ(Flatten(GetcS(), complex), "3F 80 00 00 C0 00 00 00");
}

TEST_F(KoDataFlattenTest, ExtendedValuesTakeSixteenBytesAndKeepEveryBit) {
  uint8_t ten[10];
  LongDoubleToExtended(1.0L, ten);
  // 1.0 as binary128: sign and exponent 3FFF, every fraction bit zero.
  EXPECT_EQ(Flatten(GetfX(), ten), "3F FF 00 00 00 00 00 00 00 00 00 00 00 00 00 00");
  LongDoubleToExtended(-0.1L, ten);
  EXPECT_EQ(Flatten(GetfX(), ten), "BF FB 99 99 99 99 99 99 99 9A 00 00 00 00 00 00");
  // An unnormal (integer bit clear with a nonzero exponent) keeps its integer bit apart.
  const uint8_t unnormal[10] = {0x01, 0, 0, 0, 0, 0, 0, 0x40, 0xFF, 0x3F};
  const std::string flat = Flatten(GetfX(), unnormal);
  EXPECT_EQ(flat, "3F FF 80 00 00 00 00 00 00 02 00 00 00 00 00 01");
  uint8_t back[10] = {};
  ASSERT_EQ(Unflatten(GetfX(), flat, back), kStatusNoError);
  EXPECT_EQ(std::memcmp(back, unnormal, 10), 0);
  // Random bit patterns, all 80 bits.
  uint64_t state = 0x9E3779B97F4A7C15ull;
  for (int i = 0; i < 2000; ++i) {
    uint8_t value[10];
    for (uint8_t& byte : value) {
      state = state * 6364136223846793005ull + 1442695040888963407ull;
      byte = static_cast<uint8_t>(state >> 56);
    }
    uint8_t read[10] = {};
    ASSERT_EQ(Unflatten(GetfX(), Flatten(GetfX(), value), read), kStatusNoError);
    ASSERT_EQ(std::memcmp(read, value, 10), 0) << i;
  }
}

TEST_F(KoDataFlattenTest, StringsFollowTheirBound) {
  const TDR bounded = TDRString(nullptr, 2);
  vellum::Value two(bounded);
  ASSERT_EQ(Unflatten(bounded, "00 00 00 03 61 62 63", two.Data()), kStatusNoError);
  EXPECT_EQ(Text(Load<LStrHandle>(two.Data())), "ab");
  const TDR fixed = TDRString(nullptr, vellum::bound::Fixed(5));
  vellum::Value five(fixed);
  ASSERT_EQ(Unflatten(fixed, "00 00 00 03 61 62 63", five.Data()), kStatusNoError);
  EXPECT_EQ(Text(Load<LStrHandle>(five.Data())), std::string("abc\0\0", 5));
  // A length far beyond the input is refused before anything is allocated.
  vellum::Value big(GetStringTD());
  LiveBlockCheck blocks;
  EXPECT_EQ(Unflatten(GetStringTD(), "00 30 00 00 61 62", big.Data()), kStatusImplausibleData);
  EXPECT_EQ(Load<LStrHandle>(big.Data()), nullptr);
  EXPECT_EQ(Unflatten(GetStringTD(), "FF FF FF FF", big.Data()), kStatusImplausibleData);
}

TEST_F(KoDataFlattenTest, ArraysAreRefusedWhenTheirElementsCannotBeInTheInput) {
  const TDR doubles = TDRArray(1, GetfD());
  const TDR pointers = TDRArray(1, TDRPtr());
  const TDR square = TDRArray(2, GetiB());
  vellum::Value value(doubles);
  LiveBlockCheck blocks;
  DebugCapture capture;
  EXPECT_EQ(Unflatten(doubles, "00 01 FF FF 00 00", value.Data()), kStatusImplausibleData);
  EXPECT_EQ(Load<UHandle>(value.Data()), nullptr);
  // Elements that flatten to nothing are bounded by what a read may allocate.
  vellum::Value many(pointers);
  EXPECT_EQ(Unflatten(pointers, "01 00 00 00", many.Data()), kStatusImplausibleData);
  ASSERT_EQ(Unflatten(pointers, "00 00 10 00", many.Data()), kStatusNoError);
  // 64-bit products that overflow are refused.
  vellum::Value grid(square);
  EXPECT_EQ(Unflatten(square, "7F FF FF FF 7F FF FF FF", grid.Data()), kStatusImplausibleData);
}

TEST_F(KoDataFlattenTest, BoundedAndFixedArraysStayInTheirBlocks) {
  TDWArray bounded(0, GetiW());
  EXPECT_EQ(bounded.AddDim(2, 0), kStatusNoError);
  const TDR type = bounded.CheckIn();
  vellum::Value value(type);
  ASSERT_EQ(Unflatten(type, "00 00 00 03 00 01 00 02 00 03", value.Data()), kStatusNoError);
  EXPECT_EQ(Flatten(type, value.Data()), "00 00 00 02 00 01 00 02");
  TDWArray fixed(0, GetiW());
  EXPECT_EQ(fixed.AddDim(vellum::bound::Fixed(3), 0), kStatusNoError);
  const TDR fixedType = fixed.CheckIn();
  vellum::Value three(fixedType);
  DebugCapture capture;
  ASSERT_EQ(Unflatten(fixedType, "00 00 00 02 00 07 00 08", three.Data()), kStatusNoError);
  EXPECT_TRUE(capture.Contains("fixed size array prealloc'd wrong?"));
  EXPECT_EQ(Flatten(fixedType, three.Data()), "00 00 00 03 00 07 00 08 00 00");
}

TEST_F(KoDataFlattenTest, OldBooleansArePackedSixteenToAWord) {
  const TDR flags = TDRArray(1, GetBoolTD());
  vellum::Value value(flags);
  ASSERT_EQ(Unflatten(flags, "00 00 00 03 01 00 01", value.Data()), kStatusNoError);
  EXPECT_EQ(Flatten(flags, value.Data(), 0x04502003), "00 00 00 03 A0 00");
  vellum::Value back(flags);
  ASSERT_EQ(Unflatten(flags, "00 00 00 03 A0 00", back.Data(), 0x04502003), kStatusNoError);
  EXPECT_EQ(Flatten(flags, back.Data()), "00 00 00 03 01 00 01");
}

TEST_F(KoDataFlattenTest, PointersNeverTravel) {
  void* pointer = reinterpret_cast<void*>(0x1234);
  EXPECT_EQ(Flatten(TDRPtr(), &pointer), "");
  EXPECT_EQ(Flatten(TDRPtr(), &pointer, 0x08602025), "00 00 00 00");
  ASSERT_EQ(Unflatten(TDRPtr(), "00 00 00 00", &pointer, 0x08602025), kStatusNoError);
  EXPECT_EQ(pointer, nullptr);
}

TEST_F(KoDataFlattenTest, EveryPrefixOfEveryGoldenValueFailsCleanly) {
  TDWCluster record;
  record << GetiL() << GetStringTD() << TDRArray(1, GetStringTD()) << GetPathTD();
  TDWCluster pair;
  pair << GetiB() << GetiL();
  const std::vector<std::pair<TDR, std::string>> golden = {
      {GetiL(), "00 00 00 01"},
      {GetfD(), "3F F0 00 00 00 00 00 00"},
      {GetfX(), "3F FF 00 00 00 00 00 00 00 00 00 00 00 00 00 00"},
      {GetStringTD(), "00 00 00 03 61 62 63"},
      {TDRArray(1, GetiW()), "00 00 00 02 00 01 00 02"},
      {pair.CheckIn(), "FE 01 02 03 04"},
      {InterpretedStringToType("{iL,fD,S}"), "00 00 00 07 3F F0 00 00 00 00 00 00 00 00 00 02 68 69"},
      {record.CheckIn(),
       "00 00 00 07 00 00 00 02 68 69 00 00 00 02 00 00 00 01 61 00 00 00 00 50 54 48 30 00 00 00 04 00 00 00 00"},
  };
  for (const auto& [type, hex] : golden) {
    SCOPED_TRACE(hex);
    const int64_t before = DSLiveBlockCount();
    {
      vellum::Value whole(type);
      ASSERT_EQ(Unflatten(type, hex, whole.Data()), kStatusNoError);
      const std::vector<uint8_t> bytes = BytesFromHex(hex);
      for (size_t n = 0; n < bytes.size(); ++n) {
        SCOPED_TRACE(n);
        vellum::Value partial(type);
        InputBuf in(bytes.data(), n);
        KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
        // Input that ends early (74), or a length the input left cannot hold (116).
        const int32_t status = reader.ReadData(type, partial.Data(), 1);
        EXPECT_TRUE(status == kStatusCorruptData || status == kStatusImplausibleData) << status;
      }
    }
    EXPECT_EQ(DSLiveBlockCount(), before);
  }
}

TEST_F(KoDataFlattenTest, ValidLongValuesAreNeverRefused) {
  // A 3 MiB string whose bytes are all there: above the 2 MiB allowance, within 32 x the input.
  std::vector<uint8_t> bytes(4 + (size_t{3} << 20), 'x');
  bytes[0] = 0x00;
  bytes[1] = 0x30;
  bytes[2] = 0x00;
  bytes[3] = 0x00;
  vellum::Value text(GetStringTD());
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
  ASSERT_EQ(reader.ReadData(GetStringTD(), text.Data(), 1), kStatusNoError);
  EXPECT_EQ((*Load<LStrHandle>(text.Data()))->cnt, 3 << 20);
  // A million Int8 elements with their bytes.
  const TDR bytesType = TDRArray(1, GetiB());
  std::vector<uint8_t> array(4 + 1000000, 7);
  array[0] = 0x00;
  array[1] = 0x0F;
  array[2] = 0x42;
  array[3] = 0x40;
  vellum::Value million(bytesType);
  InputBuf arrayIn(array.data(), array.size());
  KoDataReader arrayReader(&arrayIn, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
  EXPECT_EQ(arrayReader.ReadData(bytesType, million.Data(), 1), kStatusNoError);
}

// --- random types and values -------------------------------------------------------------------------

TEST_F(KoDataFlattenTest, RandomValuesReadBackEqualAndWriteTheSameBytes) {
  uint32_t seed = std::random_device{}();
  if (const char* fixed = std::getenv("VELLUM_DATA_SEED")) seed = static_cast<uint32_t>(std::strtoul(fixed, nullptr, 10));
  std::printf("KoDataFlattenTest seed %u (set VELLUM_DATA_SEED to replay)\n", seed);
  RecordProperty("seed", static_cast<int>(seed));
  RandomTypes random(seed);
  // Bounded arrays are sound only where their room is preallocated.
  TDEnablePreAllocation(true);
  size_t bytesWritten = 0;
  for (int32_t round = 0; round < 2000; ++round) {
    SCOPED_TRACE("seed " + std::to_string(seed) + " round " + std::to_string(round));
    SetDSAlign(round % 2 == 0 ? 8 : 0);
    TDWCluster top;
    for (int32_t i = 0; i < 1 + random.Pick(4); ++i) top << random.Make(3);
    const TDR type = top.CheckIn();
    ASSERT_TRUE(type);
    const int64_t before = DSLiveBlockCount();
    {
      vellum::Value value(type);
      random.Fill(type, static_cast<uint8_t*>(value.Data()));
      const std::string flat = Flatten(type, value.Data());
      ASSERT_EQ(flat.find("status"), std::string::npos) << flat;
      vellum::Value back(type);
      ASSERT_EQ(Unflatten(type, flat, back.Data()), kStatusNoError) << flat;
      EXPECT_EQ(CompareDataTDR(type, value.Data(), back.Data(), 0, 0), 0) << flat;
      EXPECT_EQ(Flatten(type, back.Data()), flat);
      bytesWritten += flat.size() / 3;
    }
    EXPECT_EQ(DSLiveBlockCount(), before);
  }
  SetDSAlign(0);
  TDEnablePreAllocation(false);
  EXPECT_GT(bytesWritten, 20000u) << "the values are too small to test much";
}

TEST_F(KoDataFlattenTest, AllocationFailuresDuringAReadLeaveNoLeak) {
  TDWCluster record;
  record << GetiL() << GetStringTD() << TDRArray(1, GetStringTD()) << TDRArray(2, GetfD());
  const TDR type = record.CheckIn();
  const std::string flat = "00 00 00 07 00 00 00 02 68 69 00 00 00 02 00 00 00 01 61 00 00 00 00 00 00 00 01 00 00 00 01 3F F0 00 00 00 00 00 00";
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100) << "never succeeded";
    const int64_t before = DSLiveBlockCount();
    int32_t status = 0;
    bool fired = false;
    {
      vellum::Value value(type);
      ScopedAllocationFailure failure(nth);
      status = Unflatten(type, flat, value.Data());
      fired = failure.Fired();
    }
    EXPECT_EQ(DSLiveBlockCount(), before);
    if (!fired) {
      EXPECT_EQ(status, kStatusNoError);
      break;
    }
    EXPECT_TRUE(status == kStatusReadAllocationFailed || status == kStatusCorruptData || status == kStatusOutOfMemory)
        << status;
  }
}

}  // namespace
