// Alignment markers: their alignment with and without a platform, their place in a cluster's
// layout, the inheritance of a parent cluster's alignment, the handles and conversion.
#include "vellum/TDBlockHandles.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXNumbers.h"
#include "vellum.h"

namespace {

class TDAlignmentMarkerTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    SetDSAlign(0);
    TypeSystemTest::TearDown();
  }
};


class IdentifiedPlatform final : public ITargetPlatformAlignment {
 public:
  explicit IdentifiedPlatform(uint32_t identifier) : identifier_(identifier) {}
  int32_t MaxAlignment() const override { return 8; }
  int32_t AggregateAlignmentMode() const override { return 0; }
  int32_t PointerSize() const override { return 8; }
  int32_t IsBigEndian() const override { return 0; }
  int32_t NumericSize(int32_t typeCode) const override { return NumSize(typeCode); }
  uint32_t PlatformIdentifier() const override { return identifier_; }

 private:
  uint32_t identifier_;
};

TDRAlignmentMarker Marker(const TD& source) {
  TDWAlignmentMarker marker;
  EXPECT_EQ(marker.SetAlignmentSource(source), kStatusNoError);
  return marker.CheckIn();
}

TDW Named(const TDR& type, const char* name) {
  TDW copy = type.CheckOut();
  EXPECT_EQ(copy.SetName(std::string(name)), kStatusNoError);
  return copy;
}

TEST_F(TDAlignmentMarkerTest, AlignsAsItsSource) {
  const TDRAlignmentMarker marker = Marker(GetfD());
  IdentifiedPlatform other(0x12345678);
  IdentifiedPlatform matching(kAlignmentSourcePlatformId);
  EXPECT_EQ(marker.DataSize(), 0);
  EXPECT_EQ(marker.GetAlignment(), 8);
  EXPECT_EQ(marker.GetAlignment(&other), 1);
  EXPECT_EQ(marker.GetAlignment(&matching), 8);
  EXPECT_EQ(TDRAlignmentMarker().GetAlignment(), 1);
  EXPECT_TRUE(marker.GetAlignmentSource() == GetfD());
  EXPECT_FALSE(TDRAlignmentMarker().GetAlignmentSource());
}

TEST_F(TDAlignmentMarkerTest, PadsTheClusterLikeItsSource) {
  SetDSAlign(8);
  TDWCluster cluster;
  cluster << GetiB() << Marker(GetfD());
  EXPECT_EQ(cluster.GetEltOffset(1), 8);
  EXPECT_EQ(cluster.DataSize(), 8);
  EXPECT_EQ(cluster.GetAlignment(), 8);
  const TDRCluster interned = cluster.CheckIn();
  uint8_t src[8] = {5};
  uint8_t dst[8] = {};
  EXPECT_EQ(interned.CopyData(src, dst, nullptr, 0), kStatusNoError);
  EXPECT_EQ(dst[0], 5);
  EXPECT_EQ(interned.CopyDataConvert(interned.CheckOut(), src, dst, 0), kStatusNoError);
}

TEST_F(TDAlignmentMarkerTest, DerivedClusterKeepsItsParentsAlignment) {
  SetDSAlign(8);
  TDWCluster parentBuilder;
  parentBuilder << Named(GetfD(), "x") << Named(GetiB(), "y");
  const TDRCluster parent = parentBuilder.CheckIn();
  TDWCluster derived = InheritTDWFromParentTDR(parent);
  ASSERT_TRUE(derived);
  ASSERT_EQ(derived.GetNumElts(), 3);
  const TDW marker = derived.GetEltTD(2);
  ASSERT_EQ(marker.IsAlignmentMarker(), 1);
  EXPECT_EQ(vellum::As<TDWAlignmentMarker>(marker).GetAlignmentSource().IsSameAs(parent), 1);
  EXPECT_EQ(derived.AppendEltTD(Named(GetiB(), "z")), kStatusNoError);
  // The derived element starts where a whole parent would end, not right after "y".
  EXPECT_EQ(derived.GetEltOffsetByName(U("z")), 16);
  EXPECT_EQ(derived.DataSize(), 24);
  EXPECT_EQ(parent.GetNumElts(), 2);
  EXPECT_FALSE(InheritTDWFromParentTDR(TDRCluster(TDImpPtr(), 0)));
}

TEST_F(TDAlignmentMarkerTest, HandlesAndConversion) {
  TDWAlignmentMarker marker;
  TDWInt32 source;
  EXPECT_EQ(marker.SetAlignmentSource(source), kStatusNoError);
  EXPECT_TRUE(marker.GetAlignmentSource() == source);
  EXPECT_EQ(marker.RemoveAlignmentSource(), kStatusNoError);
  EXPECT_FALSE(marker.GetAlignmentSource());
  TDWAlignmentMarker null(TDImpPtr(), 0);
  EXPECT_EQ(null.SetAlignmentSource(source), kStatusNullHandle);
  EXPECT_EQ(null.RemoveAlignmentSource(), kStatusNullHandle);

  uint8_t byte = 0;
  EXPECT_EQ(Marker(GetiL()).CopyDataConvert(Marker(GetfD()), &byte, &byte, 0), kStatusNoError);
  DebugCapture capture;
  EXPECT_EQ(Marker(GetiL()).CopyDataConvert(GetiL(), &byte, &byte, 0), kStatusBadArgument);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"CopyDataConvert tcDst=0x00000003, tcSrc=0x00000065"}));
  EXPECT_FALSE(Marker(GetiL()) == Marker(GetfD()));
  EXPECT_TRUE(Marker(GetiL()) == Marker(GetiL()));
}

}  // namespace
