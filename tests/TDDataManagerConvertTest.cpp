// The copy and conversion entry points: the answers for null arguments, the dispatch to the
// source's converter, conversions across families, lossless conversion, the class-data comparison
// and the probe context slot.
#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXStrings.h"
#include "vellum/TDFlags.h"
#include "vellum.h"

namespace {

using TDDataManagerConvertTest = TypeSystemTest;

TEST_F(TDDataManagerConvertTest, NullArguments) {
  int32_t a = 1;
  int32_t b = 2;
  EXPECT_EQ(GetiL().CopyData(nullptr, &b, nullptr, 0), kStatusBadArgument);
  EXPECT_EQ(GetiL().CopyData(&a, nullptr, nullptr, 0), kStatusBadArgument);
  EXPECT_EQ(TDR().CopyData(&a, &b, nullptr, 0), kStatusNullHandle);
  EXPECT_EQ(b, 2);
  EXPECT_EQ(GetiL().CopyDataConvert(GetiL(), nullptr, &b, 0), kStatusBadArgument);
  EXPECT_EQ(GetiL().CopyDataConvert(GetiL(), &a, nullptr, 0), kStatusBadArgument);
  EXPECT_EQ(GetiL().CopyDataConvert(TDR(), &a, &b, 0), kStatusNullHandle);
  EXPECT_EQ(TDR().CopyDataConvert(GetiL(), &a, &b, 0), kStatusNullHandle);
  EXPECT_EQ(TDWInt32().CopyDataConvert(TDR(), &a, &b, 0), kStatusNullHandle);
  EXPECT_EQ(b, 2);
  EXPECT_EQ(GetiL().CopyData(&a, &b, nullptr, 0), kStatusNoError);
  EXPECT_EQ(b, 1);
}

// No kind of this library takes charge as a destination, so the source's family decides, and
// each direction of a refused pair is refused in the source's own words.
TEST_F(TDDataManagerConvertTest, TheSourceFamilyDecides) {
  struct Case {
    const char* name;
    TDR from;
    TDR to;
    std::string message;
  };
  const Case kCases[] = {
      {"Path into String", GetPathTD(), GetStringTD(), "CopyDataConvert:  destination is not a path!"},
      {"String into Path", GetStringTD(), GetPathTD(), "CopyDataConvert tcDst=0x00000032, tcSrc=0x00000030"},
      {"Void into Float64", GetVoidTD(), GetfD(), "CopyDataConvert tcDst=0x0000000a, tcSrc=0x00000000"},
      {"Cluster into Float64", GetClust0TD(), GetfD(), "CopyDataConvert:  destination is not a cluster!"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    DebugCapture capture;
    uint64_t src = 0;
    uint64_t dst = 0;
    EXPECT_EQ(c.from.CopyDataConvert(c.to, &src, &dst, 0), kStatusBadArgument);
    EXPECT_EQ(dst, 0u);
    EXPECT_EQ(capture.Texts(), std::vector<std::string>{c.message});
  }
}

TEST_F(TDDataManagerConvertTest, ConversionsAcrossFamilies) {
  const int32_t number = 7;
  double converted = 0;
  EXPECT_EQ(GetiL().CopyDataConvert(GetfD(), &number, &converted, 0), kStatusNoError);
  EXPECT_EQ(converted, 7.0);

  LStrHandle text = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("tag", &text), kStatusNoError);
  LStrHandle tag = nullptr;
  EXPECT_EQ(GetStringTD().CopyDataConvert(GetTagTD(), &text, &tag, 0), kStatusNoError);
  EXPECT_EQ(StringUtils::FromLStr(tag), "tag");

  DebugCapture capture;
  Path path = nullptr;
  LStrHandle into = nullptr;
  EXPECT_EQ(GetPathTD().CopyDataConvert(GetStringTD(), &path, &into, 0), kStatusBadArgument);
  EXPECT_EQ(into, nullptr);
  EXPECT_FALSE(capture.Texts().empty());

  // A cluster of numbers into a cluster of other numbers, through the same entry point.
  TDWCluster from;
  from << GetiL() << GetiW();
  TDWCluster to;
  to << GetfD() << GetiL();
  const int32_t pair[2] = {-4, 3};
  double out[2] = {};
  SetDSAlign(0);
  EXPECT_EQ(from.CheckIn().CopyDataConvert(to.CheckIn(), pair, out, 0), kStatusNoError);
  EXPECT_EQ(out[0], -4.0);
  int32_t second = 0;
  std::memcpy(&second, reinterpret_cast<uint8_t*>(out) + 8, 4);
  EXPECT_EQ(second, 3);
  DSDisposeHandle(reinterpret_cast<UHandle>(text));
  DSDisposeHandle(reinterpret_cast<UHandle>(tag));
}

TEST_F(TDDataManagerConvertTest, LosslessConversion) {
  struct Case {
    const char* name;
    TDR from;
    TDR to;
    bool lossless;
  };
  const Case kCases[] = {
      {"Int32 into Int32", GetiL(), GetiL(), true},
      {"Boolean into Boolean", GetBoolTD(), GetBoolTD(), true},
      {"Boolean into Int8", GetBoolTD(), GetiB(), false},
      {"String into String", GetStringTD(), GetStringTD(), true},
      {"Void into Void", GetVoidTD(), GetVoidTD(), true},
      {"Path into String", GetPathTD(), GetStringTD(), false},
      {"null", GetiL(), TDR(), false},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.from.ConversionIsLossless(c.to), c.lossless);
  }
  EXPECT_FALSE(TDR().ConversionIsLossless(GetiL()));
}

TEST_F(TDDataManagerConvertTest, ClassDataComparisonAndProbeSlot) {
  const int32_t value = 3;
  TDR found = GetiB();
  EXPECT_EQ(GetiL().CompareClassData(0, &value, GetiL(), &found), kStatusNoError);
  EXPECT_TRUE(found == GetiB());
  EXPECT_EQ(TDR().CompareClassData(0, &value, GetiL(), &found), kStatusNullHandle);

  EXPECT_EQ(GetCopyDataConvertSourceContextForProbe(), nullptr);
  int marker = 0;
  const auto* context = reinterpret_cast<const KoContext*>(&marker);
  SetCopyDataConvertSourceContextForProbe(context);
  EXPECT_EQ(GetCopyDataConvertSourceContextForProbe(), context);
  SetCopyDataConvertSourceContextForProbe(nullptr);
  EXPECT_EQ(GetCopyDataConvertSourceContextForProbe(), nullptr);
}

}  // namespace
