// Data of the kinds that exist so far (numbers, Booleans, Void): sizes, alignment with and without
// SetDSAlign and for another platform, default data, clearing, copying, the copy-with-conversion
// dispatch, verification with the rave procedure, and the answers of a null handle.
#include <gtest/gtest.h>

#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "vellum/TDFlags.h"
#include "vellum.h"

namespace {

class TDDataManagerTest : public TypeSystemTest {
 protected:
  // SetDSAlign is process-wide: every test leaves it as the host found it.
  void TearDown() override {
    SetDSAlign(0);
    TypeSystemTest::TearDown();
  }
};

// A target whose largest alignment, pointer size and extended sizes the test chooses.
class TestPlatform final : public ITargetPlatformAlignment {
 public:
  TestPlatform(int32_t maxAlignment, int32_t extendedSize = 10) : max_(maxAlignment), extended_(extendedSize) {}
  int32_t MaxAlignment() const override { return max_; }
  int32_t AggregateAlignmentMode() const override { return 0; }
  int32_t PointerSize() const override { return 4; }
  int32_t IsBigEndian() const override { return 0; }
  int32_t NumericSize(int32_t typeCode) const override {
    const int32_t base = NumBaseCode(typeCode);
    if (base == 0x0B) return extended_;
    if (base == 0x0E) return 2 * extended_;
    return NumSize(typeCode);
  }

 private:
  int32_t max_;
  int32_t extended_;
};

struct LayoutCase {
  const char* name;
  int32_t code;
  int32_t size;
  int32_t alignment;
};

// Sizes and natural alignments; a complex value aligns like its component, FloatExt's ten bytes
// like two.
const LayoutCase kLayouts[] = {
    {"Void", 0x00, 0, 0},         {"Int8", 0x01, 1, 1},         {"Int16", 0x02, 2, 2},
    {"Int32", 0x03, 4, 4},        {"Int64", 0x04, 8, 8},        {"UInt8", 0x05, 1, 1},
    {"UInt16", 0x06, 2, 2},       {"UInt32", 0x07, 4, 4},       {"UInt64", 0x08, 8, 8},
    {"Float32", 0x09, 4, 4},      {"Float64", 0x0A, 8, 8},      {"FloatExt", 0x0B, 10, 2},
    {"Complex64", 0x0C, 8, 4},    {"Complex128", 0x0D, 16, 8},  {"ComplexExt", 0x0E, 20, 2},
    {"Boolean", 0x21, 1, 1},
};

TDR TypeOf(int32_t code) { return MakeDefaultTDRForTypeCode(code); }

int64_t RoundUp(int64_t offset, int64_t alignment) {
  if (alignment < 1) alignment = 1;
  return (offset + alignment - 1) / alignment * alignment;
}

TEST_F(TDDataManagerTest, SizesAndAlignmentWithoutSetDSAlignArePacked) {
  for (const LayoutCase& c : kLayouts) {
    SCOPED_TRACE(c.name);
    const TDR type = TypeOf(c.code);
    ASSERT_TRUE(type);
    EXPECT_EQ(type.DataSize(), c.size);
    EXPECT_EQ(type.GetAlignment(), c.alignment);
    for (int64_t offset = 0; offset < 20; ++offset) EXPECT_EQ(type.AlignDatum(offset), offset);
  }
  EXPECT_EQ(TDRBooleanU16().DataSize(), 2);
  EXPECT_EQ(TDRBooleanU16().GetAlignment(), 2);
}

TEST_F(TDDataManagerTest, SetDSAlignRoundsToTheNaturalAlignment) {
  SetDSAlign(8);
  for (const LayoutCase& c : kLayouts) {
    SCOPED_TRACE(c.name);
    const TDR type = TypeOf(c.code);
    for (int64_t offset = 0; offset < 20; ++offset) {
      EXPECT_EQ(type.AlignDatum(offset), RoundUp(offset, c.alignment)) << offset;
    }
  }
  // An absolute address is rounded the same way.
  EXPECT_EQ(GetfD().AlignDatum(0x1001), 0x1008);
  SetDSAlign(2);
  EXPECT_EQ(GetfD().AlignDatum(5), 6);
  EXPECT_EQ(GetiL().AlignDatum(7), 8);
  EXPECT_EQ(GetiB().AlignDatum(7), 7);
  SetDSAlign(1);
  EXPECT_EQ(GetfD().AlignDatum(5), 5);
}

// Elements laid out one after another, as a cluster places them.
std::vector<int64_t> Offsets(const std::vector<TDR>& elements, ITargetPlatformAlignment* platform, int64_t* end) {
  std::vector<int64_t> offsets;
  int64_t offset = 0;
  for (const TDR& element : elements) {
    offset = element.AlignDatum(offset, platform);
    offsets.push_back(offset);
    offset += element.DataSize(platform);
  }
  *end = offset;
  return offsets;
}

TEST_F(TDDataManagerTest, ElementOffsetsPackedAndAligned) {
  int64_t end = 0;
  EXPECT_EQ(Offsets({GetiB(), GetiL()}, nullptr, &end), (std::vector<int64_t>{0, 1}));
  EXPECT_EQ(end, 5);
  SetDSAlign(8);
  EXPECT_EQ(Offsets({GetiB(), GetiL()}, nullptr, &end), (std::vector<int64_t>{0, 4}));
  EXPECT_EQ(end, 8);
  EXPECT_EQ(Offsets({GetBoolTD(), GetfX(), GetiW(), GetcD()}, nullptr, &end),
            (std::vector<int64_t>{0, 2, 12, 16}));
  EXPECT_EQ(end, 32);
}

TEST_F(TDDataManagerTest, PlatformCapsAndSizesTheLayout) {
  SetDSAlign(8);  // a platform's own largest alignment replaces the process's
  TestPlatform four(4);
  struct Case {
    int32_t code;
    int64_t offset;
    int64_t expected;
  };
  const Case kCases[] = {
      {0x0A, 1, 4}, {0x0A, 4, 4}, {0x0A, 5, 8}, {0x0A, 9, 12}, {0x04, 6, 8},
      {0x0D, 2, 4}, {0x03, 3, 4}, {0x02, 3, 4}, {0x01, 3, 3},  {0x0B, 3, 4},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(std::to_string(c.code) + " at " + std::to_string(c.offset));
    EXPECT_EQ(TypeOf(c.code).AlignDatum(c.offset, &four), c.expected);
  }
  int64_t end = 0;
  EXPECT_EQ(Offsets({GetiB(), GetfD(), GetiW()}, &four, &end), (std::vector<int64_t>{0, 4, 12}));
  EXPECT_EQ(end, 14);

  // Extended values of 16 bytes: sizes and alignments from the platform, capped by it.
  TestPlatform wide(8, 16);
  EXPECT_EQ(GetfX().DataSize(&wide), 16);
  EXPECT_EQ(GetfX().GetAlignment(&wide), 16);
  EXPECT_EQ(GetcX().DataSize(&wide), 32);
  EXPECT_EQ(GetcX().GetAlignment(&wide), 16);
  EXPECT_EQ(GetfX().AlignDatum(3, &wide), 8);
  EXPECT_EQ(TDRFloatExt(TDWUnits(), nullptr).DataSize(&wide), 16);

  TestPlatform packed(1);
  EXPECT_EQ(GetfD().AlignDatum(3, &packed), 3);
}

TEST_F(TDDataManagerTest, DefaultDataAndClearing) {
  for (const LayoutCase& c : kLayouts) {
    SCOPED_TRACE(c.name);
    const TDR type = TypeOf(c.code);
    uint8_t data[24];
    auto fill = [&] { std::memset(data, 0xA5, sizeof data); };
    auto zeroed = [&](int32_t n) {
      for (int32_t i = 0; i < 24; ++i) {
        if (data[i] != (i < n ? 0 : 0xA5)) return false;
      }
      return true;
    };
    fill();
    EXPECT_EQ(type.InflateDefData(data, 0, 1, 0), 0);
    EXPECT_TRUE(zeroed(c.size));
    fill();
    EXPECT_EQ(type.InflateDefData(data, 0, 0, 0), 0);
    EXPECT_TRUE(zeroed(0));
    EXPECT_EQ(type.InflateDefData(data, 1, 1, 0), 0);
    EXPECT_TRUE(zeroed(0));
    EXPECT_EQ(type.ResetToDefaultData(data), 0);
    EXPECT_TRUE(zeroed(c.size));
    fill();
    TDImpClearMemory(data, type, 0);
    EXPECT_TRUE(zeroed(0));
    TDImpClearMemory(data, type, 1);
    EXPECT_TRUE(zeroed(c.size));
    fill();
    EXPECT_EQ(type.DeflateData(data, data + sizeof data, 1, NormalHandleAllocator()), 0);
    EXPECT_EQ(type.ShrinkData(data, data + sizeof data, 0, NormalHandleAllocator()), 0);
    EXPECT_EQ(type.VerifyData(data, nullptr), 0);
    EXPECT_EQ(type.DataShape(), kDataShapePlain);
    EXPECT_EQ(type.FlatDataShape(), kDataShapePlain);
    EXPECT_TRUE(zeroed(0));
  }
}

TEST_F(TDDataManagerTest, CopyDataMovesOneDatumWhateverTheFlags) {
  for (const LayoutCase& c : kLayouts) {
    for (const int32_t flags : {0, 1, 2, 7, -1}) {
      SCOPED_TRACE(std::string(c.name) + " flags " + std::to_string(flags));
      uint8_t src[48];
      uint8_t dst[48];
      for (int i = 0; i < 48; ++i) src[i] = static_cast<uint8_t>(i + 1);
      std::memset(dst, 0xEE, sizeof dst);
      EXPECT_EQ(TypeOf(c.code).CopyData(src, dst, nullptr, flags), 0);
      for (int i = 0; i < 48; ++i) EXPECT_EQ(dst[i], i < c.size ? src[i] : 0xEE) << i;
    }
  }
}

TEST_F(TDDataManagerTest, CopyDataConvertOfBooleans) {
  DebugCapture capture;
  const uint8_t yes = 1;
  uint8_t out[2] = {0x55, 0x55};
  EXPECT_EQ(GetBoolTD().CopyDataConvert(GetBoolTD(), &yes, out, 0), 0);
  EXPECT_EQ(out[0], 1);
  EXPECT_TRUE(capture.Texts().empty());
  out[0] = 0x55;
  EXPECT_EQ(GetBoolTD().CopyDataConvert(TDRBooleanU16(), &yes, out, 0), 1);
  EXPECT_EQ(GetBoolTD().CopyDataConvert(GetiL(), &yes, out, 0), 1);
  EXPECT_EQ(GetiL().CopyDataConvert(GetBoolTD(), out, out, 0), 1);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"CopyDataConvert tcDst=0x00000020, tcSrc=0x00000021",
                                                       "CopyDataConvert tcDst=0x00000003, tcSrc=0x00000021",
                                                       "CopyDataConvert tcDst=0x00000021, tcSrc=0x00000003"}));
  EXPECT_EQ(out[0], 0x55);
  // Void has no data to convert.
  EXPECT_EQ(GetVoidTD().CopyDataConvert(GetiL(), out, out, 0), 1);
}

TEST_F(TDDataManagerTest, NullHandleAnswers) {
  const TDR none;
  uint8_t data[8] = {9, 9, 9, 9, 9, 9, 9, 9};
  EXPECT_EQ(none.DataSize(), 0);
  EXPECT_EQ(none.GetAlignment(), 0);
  EXPECT_EQ(none.AlignDatum(5), 5);
  EXPECT_EQ(none.DataShape(), kDataShapePlain);
  EXPECT_EQ(none.FlatDataShape(), kDataShapePlain);
  EXPECT_EQ(none.InflateDefData(data, 0, 1, 0), 1);
  EXPECT_EQ(none.ResetToDefaultData(data), 42);
  EXPECT_EQ(none.VerifyData(data, nullptr), 0x100000);
  EXPECT_EQ(none.CopyData(data, data, nullptr, 0), 42);
  EXPECT_EQ(none.DeflateData(data, data + 8, 1, NormalHandleAllocator()), 0);
  EXPECT_EQ(none.ShrinkData(data, data + 8, 0, NormalHandleAllocator()), 0);
  EXPECT_EQ(none.CopyDataConvert(GetiL(), data, data, 0), 42);
  EXPECT_EQ(GetiL().CopyDataConvert(none, data, data, 0), 42);
  EXPECT_FALSE(none.ConversionIsLossless(GetiL()));
  TDImpClearMemory(data, none, 1);
  for (uint8_t byte : data) EXPECT_EQ(byte, 9);

  // Null data is refused before anything is touched.
  EXPECT_EQ(GetiL().InflateDefData(nullptr, 0, 1, 0), 1);
  EXPECT_EQ(GetiL().ResetToDefaultData(nullptr), 1);
  EXPECT_EQ(GetiL().CopyData(nullptr, data, nullptr, 0), 1);
  EXPECT_EQ(GetiL().CopyData(data, nullptr, nullptr, 0), 1);
  EXPECT_EQ(none.CopyData(data, nullptr, nullptr, 0), 1);
  EXPECT_EQ(GetiL().CopyDataConvert(GetfD(), data, nullptr, 0), 1);
  EXPECT_EQ(TDW().CopyDataConvert(GetiL(), data, data, 0), 42);
  TDImpClearMemory(nullptr, GetiL(), 1);
}

// --- damaged data -----------------------------------------------------------------------------------

struct RaveCall {
  void* first;
  void* second;
  int32_t code;
  int calls;
};
RaveCall gRave;
int32_t gRaveStatus = 0;

void RecordingRave(void* first, void* second, int32_t& status, int32_t code) {
  gRave = {first, second, code, gRave.calls + 1};
  status = gRaveStatus;
}

std::string Address(const void* p) {
  char text[32];
  std::snprintf(text, sizeof text, "0x%" PRIxPTR, reinterpret_cast<uintptr_t>(p));
  return text;
}

TEST_F(TDDataManagerTest, DamagedDataGoesToTheRaveProcedure) {
  // Strings are the first kind with handles that can be damaged.
  LStrHandle text = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abc", &text), kStatusNoError);
  (*text)->cnt = 4;  // one byte more than the handle holds
  DebugCapture capture;
  // Without a procedure the damage is still reported.
  SetTDRaveProc(nullptr);
  EXPECT_EQ(GetStringTD().VerifyData(&text, nullptr), 1);
  ASSERT_EQ(capture.Texts().size(), 1u);
  EXPECT_EQ(capture.Texts()[0], "##VerifyData err 0x00000001 at type=0x0030, data=" + Address(&text));
  EXPECT_EQ(capture.Messages()[0].module, "TDDataManager");
  capture.Clear();

  gRave = {};
  gRaveStatus = 0x1234;
  SetTDRaveProc(&RecordingRave);
  EXPECT_EQ(GetTDRaveProc(), &RecordingRave);
  EXPECT_EQ(GetPictTD().VerifyData(&text, nullptr), 0x1234);
  EXPECT_EQ(gRave.calls, 1);
  EXPECT_EQ(gRave.first, nullptr);
  EXPECT_EQ(gRave.second, nullptr);
  EXPECT_EQ(gRave.code, 1024);
  EXPECT_EQ(capture.Texts(),
            std::vector<std::string>{"##VerifyData err 0x00001234 at type=0x0033, data=" + Address(&text)});
  capture.Clear();

  // A procedure that accepts the data silences the report.
  gRaveStatus = 0;
  EXPECT_EQ(GetStringTD().VerifyData(&text, nullptr), 0);
  EXPECT_TRUE(capture.Texts().empty());

  // Inside a cluster the element reports first, then the cluster with the element's offset.
  gRaveStatus = 2;
  TDWCluster holder;
  holder << GetfD() << GetfD() << GetStringTD();
  alignas(8) uint8_t data[24] = {};
  std::memcpy(data + 16, &text, sizeof text);
  EXPECT_EQ(holder.CheckIn().VerifyData(data, nullptr), 2);
  EXPECT_EQ(capture.Texts(),
            (std::vector<std::string>{"##VerifyData err 0x00000002 at type=0x0030, data=" + Address(data + 16),
                                      "##VerifyData err 0x00000002 at type=0x0050, data=" + Address(data) +
                                          ", eltOffset=16"}));
  SetTDRaveProc(nullptr);
  (*text)->cnt = 3;
  DSDisposeHandle(reinterpret_cast<UHandle>(text));
}

}  // namespace
