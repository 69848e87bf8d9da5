// Blocks: the factories' defaults, layout with and without a platform, the handles' setters,
// identity and order, the data of repeated blocks (handles inside included), conversion with its
// refusals, and the registered subarray record clusters.
#include "vellum/TDBlockHandles.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "vellum/TypeManagerHooks.h"
#include "vellum.h"

namespace {

class TDBlockTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    SetDSAlign(0);
    SetTDRaveProc(nullptr);
    TypeSystemTest::TearDown();
  }
};



TDR Block(int32_t size) {
  TDWBlock block;
  EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
  return block.CheckIn();
}

TDR AlignedBlock(int32_t size, uint16_t alignment) {
  TDWAlignedBlock block;
  EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
  EXPECT_EQ(block.SetAlignment(alignment), kStatusNoError);
  return block.CheckIn();
}

TDR TypeBlock(const TDR& element) {
  TDWTypeBlock block;
  EXPECT_EQ(block.SetEltTD(element), kStatusNoError);
  return block.CheckIn();
}

TDR VoidBlock(uint16_t alignment) {
  TDWVoidBlock block;
  EXPECT_EQ(block.SetAlignment(alignment), kStatusNoError);
  return block.CheckIn();
}

TDRRepeatedBlock Repeated(const TDR& element, uint32_t count) {
  TDWRepeatedBlock block;
  EXPECT_EQ(block.SetEltTD(element), kStatusNoError);
  EXPECT_EQ(block.SetNumBlocks(count), kStatusNoError);
  return block.CheckIn();
}

TEST_F(TDBlockTest, FactoriesMakeTheDefaults) {
  struct Case {
    int32_t code;
    int32_t size;
    int32_t alignment;
  };
  const Case kCases[] = {{0x60, 0, 1}, {0x63, 0, 0}, {0x61, 0, 1}, {0x62, 0, 1}, {0x64, 0, 1}, {0x65, 0, 1}, {0x50, 0, 0}};
  SetDSAlign(8);
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.code);
    TDTypeFactory* factory = GetTypeFactory(c.code);
    ASSERT_NE(factory, nullptr);
    int32_t status = -1;
    const TDW made(factory->CreateTD(nullptr, static_cast<uint16_t>(c.code), &status), 1);
    EXPECT_EQ(status, kStatusNoError);
    EXPECT_EQ(made.GetTypeCode(), c.code);
    EXPECT_EQ(made.DataSize(), c.size);
    if (c.code != 0x50) {
      EXPECT_EQ(made.GetAlignment(), c.alignment);
    }
  }
  EXPECT_EQ(TDRVoidBlock().GetAlignment(), 1);
  EXPECT_EQ(TDRRepeatedBlock().GetNumBlocks(), 0u);
  EXPECT_FALSE(TDRTypeBlock().GetEltTD());
  EXPECT_EQ(TDRBlock().GetBlockSize(), 0);
}

TEST_F(TDBlockTest, LayoutOfEachKind) {
  TestPlatform aggregate(4, 1, 4);
  TestPlatform capped(4, 0, 4);
  struct Case {
    const char* name;
    TDR type;
    int32_t dsAlign;
    ITargetPlatformAlignment* platform;
    int32_t size;
    int32_t alignment;
  };
  const Case kCases[] = {
      {"block", Block(5), 8, nullptr, 5, 1},
      {"aligned block", AlignedBlock(6, 4), 8, nullptr, 6, 4},
      {"type block", TypeBlock(GetfD()), 8, nullptr, 8, 8},
      {"void block", VoidBlock(8), 8, nullptr, 0, 8},
      {"repeated packed", Repeated(GetiW(), 3), 0, nullptr, 6, 1},
      {"repeated aligned", Repeated(GetiW(), 3), 8, nullptr, 6, 2},
      {"repeated aggregate", Repeated(GetiW(), 3), 8, &aggregate, 6, 4},
      {"repeated on a platform", Repeated(GetiW(), 3), 0, &capped, 6, 2},
      {"repeated empty", Repeated(GetfD(), 0), 8, nullptr, 0, 8},
      {"negative block", Block(-4), 8, nullptr, 0, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    SetDSAlign(c.dsAlign);
    EXPECT_EQ(c.type.DataSize(c.platform), c.size);
    EXPECT_EQ(c.type.GetAlignment(c.platform), c.alignment);
  }
  SetDSAlign(8);
  EXPECT_EQ(AlignedBlock(6, 4).AlignDatum(1), 4);
  EXPECT_EQ(VoidBlock(8).AlignDatum(1), 8);
}

TEST_F(TDBlockTest, SettersOnHandles) {
  EXPECT_EQ(TDRSizedBlock().GetBlockSize(), -1);
  EXPECT_EQ(TDWSizedBlock().GetBlockSize(), -1);
  EXPECT_EQ(TDWSizedBlock().SetBlockSize(3), kStatusNullHandle);
  EXPECT_EQ(TDWAlignedBlock(TDImpPtr(), 0).SetAlignment(2), kStatusNullHandle);
  EXPECT_EQ(TDWVoidBlock(TDImpPtr(), 0).SetAlignment(2), kStatusNullHandle);
  EXPECT_EQ(TDWRepeatedBlock(TDImpPtr(), 0).SetNumBlocks(2), kStatusNullHandle);
  TDWTypeBlock typeBlock;
  EXPECT_EQ(typeBlock.SetAlignment(8), kStatusNullHandle);
  EXPECT_EQ(typeBlock.GetAlignment(), 0);

  TDWVoidBlock voidBlock;
  const int32_t before = voidBlock.GetHashValue();
  EXPECT_EQ(voidBlock.SetAlignment(8), kStatusNoError);
  EXPECT_EQ(voidBlock.GetAlignment(), 8);
  EXPECT_EQ(static_cast<const TD&>(voidBlock).GetAlignment(nullptr), 8);
  EXPECT_NE(voidBlock.GetHashValue(), before);
  EXPECT_EQ(voidBlock.CheckIn().GetAlignment(), 8);

  TDWBlock block;
  const int32_t empty = block.GetHashValue();
  EXPECT_EQ(block.SetBlockSize(12), kStatusNoError);
  EXPECT_NE(block.GetHashValue(), empty);
  EXPECT_EQ(vellum::As<TDRSizedBlock>(block.CheckIn()).GetBlockSize(), 12);
  EXPECT_EQ(vellum::As<TDRRepeatedBlock>(Repeated(GetiL(), 4)).GetNumBlocks(), 4u);
}

TEST_F(TDBlockTest, IdentityAndOrder) {
  struct Case {
    const char* name;
    TDR a;
    TDR b;
    int32_t sign;
  };
  const Case kCases[] = {
      {"block size", Block(2), Block(3), -1},
      {"aligned size first", AlignedBlock(2, 8), AlignedBlock(3, 1), -1},
      {"aligned alignment", AlignedBlock(4, 2), AlignedBlock(4, 4), -1},
      {"repeated element", Repeated(GetiB(), 9), Repeated(GetiW(), 1), -1},
      {"repeated count", Repeated(GetiB(), 2), Repeated(GetiB(), 3), -1},
      {"type block element", TypeBlock(GetiB()), TypeBlock(GetiL()), -1},
      {"void block alignment", VoidBlock(2), VoidBlock(4), -1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_FALSE(c.a == c.b);
    const int32_t order = c.a.CompareForSorting(c.b);
    EXPECT_EQ((order > 0) - (order < 0), c.sign);
  }
  EXPECT_TRUE(Repeated(GetiB(), 2) == Repeated(GetiB(), 2));
  EXPECT_TRUE(AlignedBlock(4, 2) == AlignedBlock(4, 2));
  EXPECT_FALSE(Block(4) == AlignedBlock(4, 1));
  EXPECT_EQ(Block(4).CmpTD(Block(4), 0), 0);
  EXPECT_EQ(Block(4).CmpTD(Block(5), 0), kCmpIncompatible);
  EXPECT_EQ(AlignedBlock(4, 2).CmpTD(AlignedBlock(4, 4), 0), kCmpIncompatible);
  EXPECT_EQ(Repeated(GetiB(), 2).CmpTD(Repeated(GetiB(), 3), 0), kCmpIncompatible);
}

TEST_F(TDBlockTest, RepeatedBlockOfStringsLivesAndDiesLikeACluster) {
  SetDSAlign(8);
  const TDRRepeatedBlock repeated = Repeated(TDRString(nullptr, 3), 2);
  ASSERT_EQ(repeated.DataSize(), 16);
  EXPECT_EQ(repeated.DataShape(), kDataShapeHandles);
  const int64_t before = DSLiveBlockCount();
  LStrHandle data[2] = {};
  LStrHandle copy[2] = {};
  ASSERT_EQ(repeated.InflateDefData(data, 0, 1, 0), kStatusNoError);
  ASSERT_NE(data[0], nullptr);
  EXPECT_EQ(DSGetHandleSize(reinterpret_cast<UHandle>(data[1])), 7u);
  (*data[1])->cnt = 2;
  std::memcpy((*data[1])->str, "hi", 2);
  ASSERT_EQ(repeated.InflateDefData(copy, 0, 1, 0), kStatusNoError);
  ASSERT_EQ(repeated.CopyData(data, copy, nullptr, 0), kStatusNoError);
  EXPECT_EQ(StringUtils::FromLStr(copy[1]), "hi");
  EXPECT_EQ(repeated.VerifyData(copy, nullptr), kStatusNoError);
  EXPECT_EQ(repeated.ResetToDefaultData(copy), kStatusNoError);
  EXPECT_EQ(LHStrLen(copy[1]), 0);
  EXPECT_EQ(repeated.DeflateData(data, data + 1, 1, NormalHandleAllocator()), 7);
  EXPECT_EQ(data[0], nullptr);
  EXPECT_NE(data[1], nullptr);
  repeated.DeflateData(data, data + 2, 1, NormalHandleAllocator());
  repeated.DeflateData(copy, copy + 2, 1, NormalHandleAllocator());
  EXPECT_EQ(DSLiveBlockCount(), before);

  // Without handles a repeated block is its bytes.
  const TDRRepeatedBlock plain = Repeated(GetiW(), 3);
  const int16_t src[3] = {1, -2, 3};
  int16_t dst[3] = {};
  EXPECT_EQ(plain.CopyData(src, dst, nullptr, 0), kStatusNoError);
  EXPECT_EQ(dst[1], -2);
  EXPECT_EQ(plain.ResetToDefaultData(dst), kStatusNoError);
  EXPECT_EQ(dst[2], 0);
}

int32_t gRaveCode = 0;
void Rave(void*, void*, int32_t& status, int32_t code) {
  gRaveCode = code;
  status = code;
}

TEST_F(TDBlockTest, VerifyNamesTheDamagedBlock) {
  SetTDRaveProc(&Rave);
  const TDRRepeatedBlock repeated = Repeated(GetStringTD(), 3);
  LStrHandle data[3] = {};
  ASSERT_EQ(StringUtils::ToLStr("ok", &data[2]), kStatusNoError);
  EXPECT_EQ(repeated.VerifyData(data, nullptr), kStatusNoError);
  (*data[2])->cnt = -1;
  DebugCapture capture;
  EXPECT_EQ(repeated.VerifyData(data, nullptr), 1024);
  EXPECT_TRUE(capture.Contains("at type=0x0064"));
  EXPECT_TRUE(capture.Contains(", eltOffset=16"));
  (*data[2])->cnt = 2;
  repeated.DeflateData(data, data + 3, 1, NormalHandleAllocator());
}

TEST_F(TDBlockTest, FailedInflationOfARepeatedBlockLeavesNothing) {
  const TDRRepeatedBlock repeated = Repeated(TDRString(nullptr, 4), 4);
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    LStrHandle data[4];
    std::memset(data, 0x7F, sizeof data);
    const int64_t before = DSLiveBlockCount();
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      status = repeated.InflateDefData(data, 0, 1, 0);
      fired = failure.Fired();
    }
    if (!fired) {
      EXPECT_EQ(status, kStatusNoError);
      repeated.DeflateData(data, data + 4, 1, NormalHandleAllocator());
      EXPECT_EQ(DSLiveBlockCount(), before);
      break;
    }
    EXPECT_EQ(status, kStatusOutOfMemory);
    EXPECT_EQ(DSLiveBlockCount(), before);
    for (LStrHandle h : data) EXPECT_EQ(h, nullptr);
  }
}

TEST_F(TDBlockTest, ConversionOfBlocks) {
  const uint8_t src[8] = {1, 2, 3, 4, 5, 6, 7, 8};
  uint8_t dst[8] = {};
  EXPECT_EQ(Block(4).CopyDataConvert(Block(4), src, dst, 0), kStatusNoError);
  EXPECT_EQ(dst[3], 4);
  EXPECT_EQ(TypeBlock(GetiL()).CopyDataConvert(TypeBlock(GetiL()).CheckOut(), src, dst, 0), kStatusNoError);
  struct Refusal {
    const char* name;
    TDR from;
    TDR to;
    const char* message;
  };
  const Refusal kRefusals[] = {
      {"size", Block(4), Block(8), "CopyDataConvert sz=8, szSrc=4"},
      {"code", Block(4), AlignedBlock(4, 1), "CopyDataConvert tcDst=0x00000063, tcSrc=0x00000060"},
      {"type block grows", TypeBlock(GetiL()), TypeBlock(GetfD()),
       "CopyDataConvert block reallooc? tcDst=0x00000061, tcSrc=0x00000061"},
      {"type block into void block", TypeBlock(GetiL()), VoidBlock(1),
       "CopyDataConvert tcDst=0x00000062, tcSrc=0x00000061"},
      {"repeated into scalar", Repeated(GetiW(), 3), GetiL(), "CopyDataConvert:  destination is not a repeated block!"},
      {"repeated count", Repeated(GetiW(), 3), Repeated(GetiL(), 2), "CopyDataConvert elts=2, eltsSrc=3"},
  };
  for (const Refusal& r : kRefusals) {
    SCOPED_TRACE(r.name);
    std::memset(dst, 0xEE, sizeof dst);
    DebugCapture capture;
    EXPECT_EQ(r.from.CopyDataConvert(r.to, src, dst, 0), kStatusBadArgument);
    EXPECT_EQ(capture.Texts(), (std::vector<std::string>{r.message}));
    EXPECT_EQ(dst[0], 0xEE);
  }
  // A repeated block converts element by element.
  const int16_t shorts[3] = {-1, 2, 300};
  int32_t longs[3] = {};
  EXPECT_EQ(Repeated(GetiW(), 3).CopyDataConvert(Repeated(GetiL(), 3), shorts, longs, 0), kStatusNoError);
  EXPECT_EQ(longs[0], -1);
  EXPECT_EQ(longs[2], 300);
}

TEST_F(TDBlockTest, SubArrayRecordClusters) {
  const TDRCluster specifier = vellum::As<TDRCluster>(GetDimensionSpecifierTD());
  const TDRCluster record = vellum::As<TDRCluster>(GetSubArrayTD());
  ASSERT_TRUE(specifier);
  ASSERT_TRUE(record);
  EXPECT_TRUE(GetSubArrayTD() == GetSubArrayTD());
  std::string name;
  EXPECT_EQ(record.GetName(&name), kStatusNoError);
  EXPECT_EQ(name, "SubArray");
  EXPECT_EQ(record.GetEltPos(U("dimensionSpecifier")), 1);
  EXPECT_TRUE(vellum::As<TDRRepeatedBlock>(record.GetEltTD(1)).GetEltTD() == specifier);
  EXPECT_EQ(specifier.GetEltTD(1).IsPtr(), 1);

  TestPlatform wide(8, 0, 8);
  TestPlatform narrow(4, 0, 4);
  struct Case {
    const char* name;
    ITargetPlatformAlignment* platform;
    int32_t dsAlign;
    int32_t stride;
    int32_t specifierSize;
    int32_t dimensions;
    int32_t recordSize;
  };
  const Case kCases[] = {
      {"64-bit platform", &wide, 0, 8, 16, 8, 24},
      {"32-bit platform", &narrow, 0, 4, 8, 4, 12},
      {"running process aligned to 8", nullptr, 8, 8, 16, 8, 24},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    SetDSAlign(c.dsAlign);
    EXPECT_EQ(specifier.GetEltOffsetByName(U("stride"), c.platform), c.stride);
    EXPECT_EQ(specifier.DataSize(c.platform), c.specifierSize);
    EXPECT_EQ(record.GetEltOffsetByName(U("dimensionSpecifier"), c.platform), c.dimensions);
    EXPECT_EQ(record.DataSize(c.platform), c.recordSize);
  }
}

}  // namespace
