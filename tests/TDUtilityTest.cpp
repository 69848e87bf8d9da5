// Type utilities: the scalar test, view removal, the context walk and the value text.
#include "vellum/TDUtility.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "vellum.h"

namespace {

using TDUtilityTest = TypeSystemTest;

TEST_F(TDUtilityTest, ScalarTypes) {
  TDWCluster cluster;
  cluster << GetiL();
  TDWRepeatedBlock repeated;
  EXPECT_EQ(repeated.SetEltTD(GetiL()), kStatusNoError);
  struct Case {
    const char* name;
    TDR type;
    int32_t scalar;
  };
  const Case kCases[] = {
      {"Int32", GetiL(), 1},       {"String", GetStringTD(), 1},       {"Boolean", GetBoolTD(), 1},
      {"cluster", cluster.CheckIn(), 0}, {"empty cluster", GetClust0TD(), 0}, {"repeated block", repeated.CheckIn(), 0},
      {"block", TDRBlock(), 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(IsScalarType(c.type), c.scalar);
  }
}

TEST_F(TDUtilityTest, ViewsAndWrappers) {
  EXPECT_TRUE(TDRFromSubType(GetSubStringTD()) == GetStringTD());
  const TDRSubString bounded(reinterpret_cast<const uint8_t*>("s"), 5);
  EXPECT_TRUE(TDRFromSubType(bounded) == TDRString(reinterpret_cast<const uint8_t*>("s"), 5));
  EXPECT_TRUE(TDRFromSubType(GetiL()) == GetiL());
  EXPECT_FALSE(TDRFromSubType(TDR()));
  EXPECT_TRUE(IgnoreMDTWrapper(GetiL()) == GetiL());
}

TEST_F(TDUtilityTest, ContextOfTheFirstDescriptorThatHoldsOne) {
  int marker = 0;
  const auto* context = reinterpret_cast<const KoContext*>(&marker);
  TDWTag tag;
  tag.SetContextRecursive(context);
  TDWCluster cluster;
  cluster << GetiL() << tag;
  const TDR type = cluster.CheckIn();
  EXPECT_EQ(TDRGetContextIfAvailable(type), context);
  EXPECT_EQ(TDRGetContextIfAvailable(GetiL()), nullptr);
  EXPECT_EQ(TDRGetContextIfAvailable(TDR()), nullptr);
}

TEST_F(TDUtilityTest, ValueText) {
  struct Case {
    const char* name;
    TDR type;
    uint64_t bits;
    const char* text;
  };
  double tenth = 0.1;
  uint64_t tenthBits = 0;
  std::memcpy(&tenthBits, &tenth, 8);
  float third = 1.0f / 3.0f;
  uint32_t thirdBits = 0;
  std::memcpy(&thirdBits, &third, 4);
  const Case kCases[] = {
      {"Int8", GetiB(), 0xFB, "-5"},
      {"UInt8", GetuB(), 200, "200"},
      {"Int16", GetiW(), 0x8000, "-32768"},
      {"UInt32", GetuL(), 0xFFFFFFFF, "4294967295"},
      {"Int64", GetiQ(), 0xFFFFFFFFFFFFFFFF, "-1"},
      {"UInt64", GetuQ(), 0xFFFFFFFFFFFFFFFF, "18446744073709551615"},
      {"Float64", GetfD(), tenthBits, "0.1"},
      {"Float32", GetfS(), thirdBits, "0.333333"},
      {"Boolean", GetBoolTD(), 1, "1"},
      {"Boolean false", GetBoolTD(), 0, "0"},
      {"String", GetStringTD(), 0, "?"},
      {"cluster", GetClust0TD(), 0, "?"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(ValueToString(c.type, &c.bits), c.text);
  }
  const uint64_t zero = 0;
  EXPECT_EQ(ValueToString(TDR(), &zero), "NULL");
  EXPECT_EQ(ValueToString(GetiL(), nullptr), "NULL");
}

}  // namespace
