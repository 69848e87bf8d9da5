// Tests of the fixed-point library: the listed edge cases, the assertion reports, the text forms
// and the range specifications, and seeded property runs against an exact rational oracle.
#include <gtest/gtest.h>

#include <cctype>
#include <chrono>
#include <cstring>
#include <cmath>
#include <cstdlib>
#include <iostream>
#include <string>
#include <vector>

#include "FixedPoint/fxp.h"
#include "support/oracle/FxpOracle.h"

namespace vellum {
namespace {

struct Format {
  int wl;
  int iwl;
  bool isSigned;
};

// Checks format and bits together, so a failure shows both.
void ExpectIdentical(const FXP& got, int wl, int iwl, bool isSigned, uint64_t bits) {
  EXPECT_EQ(got.wl(), wl);
  EXPECT_EQ(got.iwl(), iwl);
  EXPECT_EQ(got.isSigned(), isSigned);
  EXPECT_EQ(got.bits(), bits) << got.debugDump();
}

// Every report of the assertion hook during one test.
struct Assertion {
  std::string file;
  std::string condition;
  std::string message;
};
std::vector<Assertion> gAssertions;

void RecordAssertion(const char* file, uint32_t line, const char* condition, const char* message) {
  EXPECT_GT(line, 0u);
  gAssertions.push_back({file, condition, message});
}

class FxpHookTest : public ::testing::Test {
 protected:
  void SetUp() override {
    gAssertions.clear();
    FXP::registerAssertFunction(RecordAssertion);
  }
  void TearDown() override { FXP::registerAssertFunction(nullptr); }
};

// ----- Conversion -----

TEST(FxpConversion, QuantizationModesOnHalves) {
  struct Case {
    const char* name;
    FXP::QuantizationMode mode;
    int64_t plus;   // 2.5 becomes
    int64_t minus;  // -2.5 becomes
  };
  const Case kCases[] = {
      {"TowardNegInf", FXP::kRoundTowardNegInf, 2, -3}, {"TowardPosInf", FXP::kRoundTowardPosInf, 3, -2},
      {"HalfUp", FXP::kRoundHalfUp, 3, -2},             {"Convergent", FXP::kConvergent, 2, -2},
      {"TowardZero", FXP::kRoundTowardZero, 2, -2},     {"Truncate", FXP::kTruncate, 2, -3},
      {"ShouldntQuantize", FXP::kShouldntQuantize, 2, -2},
  };
  const FXP plus(int64_t{10}, 8, 6);  // 2.5 with two fraction bits
  const FXP minus(int64_t{-10}, 8, 6);
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    bool overflowed = true;
    ExpectIdentical(FXP(plus, 16, 16, true, FXP::kSaturate, c.mode, nullptr, nullptr, &overflowed), 16, 16, true,
                    static_cast<uint64_t>(c.plus));
    EXPECT_FALSE(overflowed);
    ExpectIdentical(FXP(minus, 16, 16, true, FXP::kSaturate, c.mode), 16, 16, true, static_cast<uint64_t>(c.minus));
  }
}

TEST(FxpConversion, OverflowModes) {
  const FXP v(int64_t{300});
  bool overflowed = false;
  ExpectIdentical(FXP(v, 8, 8, false, FXP::kSaturate, FXP::kConvergent, nullptr, nullptr, &overflowed), 8, 8, false, 255);
  EXPECT_TRUE(overflowed);
  overflowed = false;
  ExpectIdentical(FXP(v, 8, 8, false, FXP::kWrap, FXP::kConvergent, nullptr, nullptr, &overflowed), 8, 8, false, 44);
  EXPECT_TRUE(overflowed);
  ExpectIdentical(FXP(FXP(int64_t{-300}), 8, 8, true, FXP::kSaturate, FXP::kConvergent, nullptr, nullptr, &overflowed),
                  8, 8, true, static_cast<uint64_t>(-128));
  EXPECT_TRUE(overflowed);
  // -1 into an unsigned format wraps to all ones and overflows; 5 from a wide signed format does not.
  ExpectIdentical(FXP(FXP(int64_t{-1}), 8, 8, false, FXP::kWrap, FXP::kConvergent, nullptr, nullptr, &overflowed), 8, 8,
                  false, 255);
  EXPECT_TRUE(overflowed);
  ExpectIdentical(FXP(FXP(int64_t{5}), 8, 8, false, FXP::kWrap, FXP::kConvergent, nullptr, nullptr, &overflowed), 8, 8,
                  false, 5);
  EXPECT_FALSE(overflowed);
}

TEST(FxpConversion, SaturationRoundsTheLimitsInward) {
  const FXP lo(1.25);
  const FXP hi(5.75);
  bool overflowed = false;
  // Below the minimum: the minimum converted with ceiling; above the maximum: with floor.
  ExpectIdentical(FXP(FXP(int64_t{-3}), 8, 8, true, FXP::kSaturate, FXP::kConvergent, &lo, &hi, &overflowed), 8, 8, true, 2);
  EXPECT_TRUE(overflowed);
  ExpectIdentical(FXP(FXP(int64_t{100}), 8, 8, true, FXP::kSaturate, FXP::kConvergent, &lo, &hi, &overflowed), 8, 8, true, 5);
  EXPECT_TRUE(overflowed);
  ExpectIdentical(FXP(FXP(int64_t{3}), 8, 8, true, FXP::kSaturate, FXP::kConvergent, &lo, &hi, &overflowed), 8, 8, true, 3);
  EXPECT_FALSE(overflowed);
  // A limit beyond the format still leaves the result inside the format.
  const FXP wide(int64_t{1000});
  ExpectIdentical(FXP(FXP(int64_t{500}), 8, 8, false, FXP::kSaturate, FXP::kConvergent, nullptr, &wide, &overflowed), 8, 8,
                  false, 255);
  EXPECT_TRUE(overflowed);
}

TEST(FxpConversion, FarShifts) {
  // Dropping more than 64 bits: floor and ceiling of tiny values, and nearest giving zero.
  const FXP tinyPlus(uint64_t{1}, 1, -100, false);
  const FXP tinyMinus(int64_t{-1}, 1, -100);
  ExpectIdentical(FXP(tinyPlus, 8, 8, true, FXP::kSaturate, FXP::kRoundTowardPosInf), 8, 8, true, 1);
  ExpectIdentical(FXP(tinyMinus, 8, 8, true, FXP::kSaturate, FXP::kRoundTowardNegInf), 8, 8, true, ~uint64_t{0});
  ExpectIdentical(FXP(tinyMinus, 8, 8, true, FXP::kSaturate, FXP::kConvergent), 8, 8, true, 0);
  // Adding far more than 64 bits: a small integer moved into a format far above overflows.
  bool overflowed = false;
  ExpectIdentical(FXP(FXP(int64_t{1}), 8, 2000, true, FXP::kSaturate, FXP::kConvergent, nullptr, nullptr, &overflowed),
                  8, 2000, true, 0);
  EXPECT_FALSE(overflowed);
  ExpectIdentical(FXP(FXP(uint64_t{3}, 2, 2000, false), 8, 8, false, FXP::kWrap, FXP::kConvergent, nullptr, nullptr,
                      &overflowed),
                  8, 8, false, 0);
  EXPECT_TRUE(overflowed);
}

// ----- Arithmetic -----

TEST(FxpArithmetic, AddCarriesIntoANewBit) {
  bool lost = true;
  ExpectIdentical(FXP(~uint64_t{0}).add(FXP(uint64_t{1}), FXP::kConvergent, &lost), 1, 65, false, 1);
  EXPECT_FALSE(lost);
}

TEST(FxpArithmetic, ResultsTakeTheirSmallestFormat) {
  ExpectIdentical(FXP(int64_t{5}).sub(FXP(int64_t{5}), FXP::kConvergent), 1, 1, false, 0);
  ExpectIdentical(FXP(int64_t{3}).sub(FXP(int64_t{7}), FXP::kConvergent), 1, 3, true, ~uint64_t{0});  // -4
  ExpectIdentical(FXP(0.75).add(FXP(0.25), FXP::kConvergent), 1, 1, false, 1);
  ExpectIdentical(FXP(-0.5).mul(FXP(int64_t{-6}), FXP::kConvergent), 2, 2, false, 3);
}

TEST(FxpArithmetic, WideProductsRoundByMode) {
  // (2^63 - 1)^2 = 2^126 - 2^64 + 1: the top 64 bits are 2^64 - 4, then a tiny non-zero rest.
  const FXP a(INT64_MAX);
  struct Case {
    const char* name;
    FXP::QuantizationMode mode;
    Format format;
    uint64_t bits;
  };
  const Case kCases[] = {
      {"Floor", FXP::kRoundTowardNegInf, {62, 126, false}, (uint64_t{1} << 62) - 1},
      {"Truncate", FXP::kTruncate, {62, 126, false}, (uint64_t{1} << 62) - 1},
      {"Nearest", FXP::kConvergent, {62, 126, false}, (uint64_t{1} << 62) - 1},
      {"HalfUp", FXP::kRoundHalfUp, {62, 126, false}, (uint64_t{1} << 62) - 1},
      {"Ceiling", FXP::kRoundTowardPosInf, {64, 126, false}, ~uint64_t{0} - 2},
      {"TowardZero", FXP::kRoundTowardZero, {62, 126, false}, (uint64_t{1} << 62) - 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    bool lost = false;
    ExpectIdentical(a.mul(a, c.mode, &lost), c.format.wl, c.format.iwl, c.format.isSigned, c.bits);
    EXPECT_TRUE(lost);
  }
  // Negative: -(2^63 - 1) * (2^63 - 1) keeps 63 bits and a sign; toward zero is now a ceiling.
  bool lost = false;
  const FXP n = (-a).mul(a, FXP::kRoundTowardZero, &lost);
  EXPECT_TRUE(lost);
  EXPECT_EQ(n, FXP(-((int64_t{1} << 62) - 1), 64, 128));
  EXPECT_EQ((-a).mul(a, FXP::kRoundTowardNegInf), FXP(INT64_MIN + 1, 64, 127));
}

TEST(FxpArithmetic, UnknownModeIsReported) {
  gAssertions.clear();
  FXP::registerAssertFunction(RecordAssertion);
  const FXP r = FXP(int64_t{3}).add(FXP(int64_t{4}), static_cast<FXP::QuantizationMode>(9));
  FXP::registerAssertFunction(nullptr);
  ExpectIdentical(r, 3, 3, false, 7);
  ASSERT_EQ(gAssertions.size(), 1u);
  EXPECT_EQ(gAssertions[0].condition, "false");
  EXPECT_EQ(gAssertions[0].message, "Unexpected quantization mode: 9");
}

TEST(FxpArithmetic, ResultsBeyondTheStoredRange) {
  const FXP huge(~uint64_t{0}, 64, FXPMaxStoredIWL(), false);
  bool lost = false;
  const FXP r = huge.mul(huge, FXP::kConvergent, &lost);
  EXPECT_TRUE(lost);
  ExpectIdentical(r, 64, FXPMaxStoredIWL(), false, ~uint64_t{0});
  // Too small: rounded at the finest step.
  const FXP tiny(uint64_t{1}, 1, FXPMinStoredIWL(), false);
  EXPECT_TRUE(tiny.mul(tiny, FXP::kConvergent, &lost).isZero());
  EXPECT_TRUE(lost);
  ExpectIdentical(tiny.mul(tiny, FXP::kRoundTowardPosInf), 64, FXPMinStoredIWL(), false, 1);
}

// ----- Unary operations -----

TEST(FxpUnary, Negation) {
  struct Case {
    const char* name;
    FXP in;
    Format format;
    uint64_t bits;
  };
  const Case kCases[] = {
      {"SignedPositive", FXP(int64_t{5}, 8, 4), {8, 4, true}, static_cast<uint64_t>(-5)},
      {"SignedNegative", FXP(int64_t{-5}, 8, 4), {8, 4, false}, 5},
      {"MostNegative", FXP(int64_t{-128}, 8, 4), {8, 4, false}, 128},
      {"UnsignedZero", FXP(uint64_t{0}, 8, 4, false), {8, 4, false}, 0},
      {"Unsigned", FXP(uint64_t{200}, 8, 4, false), {9, 5, true}, static_cast<uint64_t>(-200)},
      {"Unsigned64Low", FXP(uint64_t{7}, 64, 10, false), {64, 10, true}, static_cast<uint64_t>(-7)},
      {"Unsigned64HighEven", FXP(uint64_t{1} << 63, 64, 10, false), {64, 11, true}, static_cast<uint64_t>(INT64_MIN) >> 1 | (uint64_t{1} << 63)},
      {"Unsigned64HighOddToEven", FXP((uint64_t{1} << 63) | 3, 64, 10, false), {64, 11, true}, uint64_t{0} - ((uint64_t{1} << 62) + 2)},
      {"Unsigned64HighOddStays", FXP((uint64_t{1} << 63) | 1, 64, 10, false), {64, 11, true}, uint64_t{0} - (uint64_t{1} << 62)},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    ExpectIdentical(-c.in, c.format.wl, c.format.iwl, c.format.isSigned, c.bits);
  }
  ExpectIdentical(FXP(int64_t{-5}, 8, 4).abs(), 8, 4, false, 5);
  ExpectIdentical(FXP(uint64_t{5}, 8, 4, false).abs(), 8, 4, false, 5);
}

TEST(FxpUnary, AddDeltaAndLimits) {
  ExpectIdentical(FXP(int64_t{5}, 8, 4).addDelta(), 8, 4, true, 6);
  ExpectIdentical(FXP(int64_t{127}, 8, 4).addDelta(), 1, 4, false, 1);              // 8
  ExpectIdentical(FXP(uint64_t{255}, 8, 4, false).addDelta(), 1, 5, false, 1);      // 16
  ExpectIdentical(FXP(uint64_t{255}, 8, 4, false).deltaValue(), 1, -3, false, 1);   // 2^-4
  ExpectIdentical(FXP(uint64_t{255}, 8, 4, false).scaleValue(), 1, 5, false, 1);    // 2^4
  ExpectIdentical(FXP(uint64_t{3}, 8, 4, true).maxValue(), 8, 4, true, 127);
  ExpectIdentical(FXP(uint64_t{3}, 8, 4, true).minValue(), 8, 4, true, static_cast<uint64_t>(-128));
  ExpectIdentical(FXP(-2.75).fracValue(), 3, 1, true, static_cast<uint64_t>(-3));    // -0.75
  ExpectIdentical(FXP(2.75).fracValue(), 2, 0, false, 3);
  ExpectIdentical(FXP(int64_t{12}).fracValue(), 1, 1, false, 0);
}

TEST(FxpUnary, Normalize) {
  ExpectIdentical(FXP(int64_t{0x0100}, 16, 8).normalize(), 1, 1, false, 1);
  ExpectIdentical(FXP(int64_t{0}, 16, 8).normalize(), 1, 1, false, 0);
  ExpectIdentical(FXP(int64_t{-0x0100}, 16, 8).normalize(), 1, 1, true, ~uint64_t{0});
  ExpectIdentical(FXP(int64_t{-3}, 16, 8).normalize(), 3, -5, true, static_cast<uint64_t>(-3));
}

TEST(FxpUnary, TruncateAndRound) {
  // 2.75 as (8, 4, signed): bits 0b00101100.
  const FXP x(int64_t{0x2C}, 8, 4);
  uint64_t lost = 1;
  ExpectIdentical(x.truncate(-6, &lost), 8, 4, true, 0x2C);  // below the least significant bit
  EXPECT_EQ(lost, 0u);
  ExpectIdentical(x.truncate(-1, &lost), 4, 4, true, 2);  // floor to a multiple of 1
  EXPECT_EQ(lost, uint64_t{0xC} << 60);
  ExpectIdentical(x.truncate(3, &lost), 1, 5, false, 0);  // at the most significant position
  EXPECT_EQ(lost, uint64_t{0x2C} << 56);
  const FXP m(int64_t{-0x2C}, 8, 4);  // -2.75
  ExpectIdentical(m.truncate(4, &lost), 1, 6, true, ~uint64_t{0});  // -32, the floor to a multiple of 32
  EXPECT_GT(lost, uint64_t{1} << 63);  // more than half of the step lies above the floor
  ExpectIdentical(m.convergentRound(4), 1, 6, true, 0);
  ExpectIdentical(m.roundToNearest(-1), 4, 4, true, static_cast<uint64_t>(-3));
  const FXP tie(int64_t{0x28}, 8, 4);  // 2.5
  EXPECT_EQ(tie.convergentRound(-1), FXP(int64_t{2}));
  EXPECT_EQ(tie.roundToNearest(-1), FXP(int64_t{3}));
  const FXP tie3(int64_t{0x38}, 8, 4);  // 3.5
  EXPECT_EQ(tie3.convergentRound(-1), FXP(int64_t{4}));
  EXPECT_EQ(FXP(int64_t{-0x28}, 8, 4).roundToNearest(-1), FXP(int64_t{-2}));
}

TEST(FxpUnary, Bits) {
  const FXP x(int64_t{-0x2C}, 8, 4);  // 1101.0100
  const int kExpected[] = {0, 0, 0, 1, 0, 1, 0, 1, 1, 1, 1};  // positions -5 ... 5
  for (int pos = -5; pos <= 5; ++pos) EXPECT_EQ(x.bit(pos), kExpected[pos + 5]) << pos;
  EXPECT_EQ(FXP(uint64_t{0x80}, 8, 4, false).bit(9), 0);
}

// ----- Comparison -----

TEST(FxpCompare, OrdersAcrossFormats) {
  struct Case {
    const char* name;
    FXP a;
    FXP b;
    int order;
  };
  const Case kCases[] = {
      {"SameValueOtherFormat", FXP(int64_t{0x0100}, 16, 8), FXP(uint64_t{1}, 1, 1, false), 0},
      {"NegativeBelowUnsigned", FXP(int64_t{-1}, 1, -100), FXP(uint64_t{0}, 1, 1, false), -1},
      {"Disjoint", FXP(uint64_t{1}, 1, 2000, false), FXP(~uint64_t{0}, 64, -2000, false), 1},
      {"Overlapping", FXP(uint64_t{3}, 4, 2, false), FXP(uint64_t{0x7}, 8, 1, false), 1},
      {"NegativeMagnitudes", FXP(int64_t{-3}, 4, 40), FXP(int64_t{-1}, 1, 41), 1},
      {"ZeroFormats", FXP(int64_t{0}, 64, -2048), FXP(uint64_t{0}, 1, 2047, false), 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(FXP::compare(c.a, c.b), c.order);
    EXPECT_EQ(FXP::compare(c.b, c.a), -c.order);
    EXPECT_EQ(c.a == c.b, c.order == 0);
    EXPECT_EQ(c.a < c.b, c.order < 0);
    EXPECT_EQ(c.a >= c.b, c.order >= 0);
  }
}

// ----- Doubles -----

TEST(FxpDouble, ExactConstruction) {
  ExpectIdentical(FXP(-4.0), 1, 3, true, ~uint64_t{0});
  ExpectIdentical(FXP(0.75), 2, 0, false, 3);
  ExpectIdentical(FXP(-3.0), 3, 3, true, static_cast<uint64_t>(-3));
  ExpectIdentical(FXP(std::nan("")), 1, 1, false, 0);
  ExpectIdentical(FXP(-0.0), 1, 1, false, 0);
  ExpectIdentical(FXP(INFINITY), 64, 32767, false, ~uint64_t{0});
  ExpectIdentical(FXP(-INFINITY), 64, 32767, true, uint64_t{1} << 63);
  ExpectIdentical(FXP(4.9406564584124654e-324), 1, -1073, false, 1);
  ExpectIdentical(FXP(1.7976931348623157e308), 53, 1024, false, (uint64_t{1} << 53) - 1);
}

TEST(FxpDouble, ToFloat64) {
  struct Case {
    const char* name;
    FXP in;
    double out;
  };
  const Case kCases[] = {
      {"Simple", FXP(int64_t{-0x2C}, 8, 4), -2.75},
      {"RoundsToEven", FXP((uint64_t{1} << 53) + 1, 64, 64, false), 9007199254740992.0},
      {"RoundsUp", FXP((uint64_t{1} << 53) + 3, 64, 64, false), 9007199254740996.0},
      {"SmallestSubnormal", FXP(uint64_t{1}, 1, -1073, false), 4.9406564584124654e-324},
      // A wide word whose step is below the subnormals still gives the exact subnormal.
      {"SubnormalFromWideWord", FXP(uint64_t{1} << 63, 64, -1074 - 63 + 64, false), 4.9406564584124654e-324},
      {"HalfOfSmallestIsEvenZero", FXP(uint64_t{1}, 1, -1074, false), 0.0},
      {"QuarterAboveSmallest", FXP(uint64_t{5}, 3, -1073, false), 4.9406564584124654e-324},
      {"OneAndAHalfOfSmallestIsEven", FXP(uint64_t{3}, 2, -1073, false), 9.8813129168249309e-324},
      {"ZeroWithHugeScale", FXP(uint64_t{0}, 8, 2047, false), 0.0},
      {"Largest", FXP((uint64_t{1} << 53) - 1, 53, 1024, false), 1.7976931348623157e308},
      {"Overflow", FXP(uint64_t{1}, 1, 1025, false), INFINITY},
      {"OverflowByRounding", FXP((uint64_t{1} << 54) - 1, 54, 1024, false), INFINITY},
      {"NegativeOverflow", FXP(int64_t{-1}, 1, 1025), -INFINITY},
      {"Infinity", FXP(INFINITY), INFINITY},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.in.to_float64(), c.out);
  }
  EXPECT_EQ(FXPMeta(8, 4, true).rangeMaxF64(0), 7.9375);
  EXPECT_EQ(FXPMeta(8, 4, true).rangeMinF64(0), -8.0);
  EXPECT_EQ(FXPMeta(64, 64, false).rangeMaxF64(-1), 18446744073709549568.0);
  EXPECT_EQ(FXPMeta(64, 64, false).rangeMaxF64(1), 18446744073709551616.0);
  EXPECT_EQ(FXPMeta(8, 4, true).deltaF64(), 0.0625);
  EXPECT_EQ(FXPMeta(8, 4, true).scaleF64(), 16.0);
  EXPECT_EQ(FXPMeta(1, -1100, true).deltaF64(), 0.0);
  EXPECT_EQ(FXPMeta(1, 1100, true).deltaF64(), INFINITY);
}

// ----- Assertion hook -----

TEST_F(FxpHookTest, ConstructorArgumentsOutOfRange) {
  struct Case {
    const char* name;
    FXP (*make)();
    Format format;
    uint64_t bits;
    const char* condition;
    const char* message;
  };
  const Case kCases[] = {
      {"WordLengthZero", [] { return FXP(int64_t{0}, 0, 4); }, {1, 4, true}, 0, "m_wl >= 1", "Wordlenth out of range"},
      {"WordLength65", [] { return FXP(uint64_t{1}, 65, 4, false); }, {64, 4, false}, 1,
       "!(m_wl <= 0 || kMaxWordLength < m_wl)", "Wordlength out of range"},
      {"SignedBitsOutside", [] { return FXP(int64_t{0xFF}, 8, 8); }, {8, 8, true}, ~uint64_t{0},
       "!(m_bits.s < sBits(minValueBits()) || sBits(maxValueBits()) < m_bits.s)", "Value out of range"},
      {"UnsignedBitsOutside", [] { return FXP(uint64_t{0x1FF}, 8, 8, false); }, {8, 8, false}, 0xFF,
       "maxValueBits() >= m_bits.u", "Value out of range"},
      {"IntegerWordLength", [] { return FXP(uint64_t{1}, 8, 1 << 20, false); }, {8, FXPMaxStoredIWL(), false}, 1,
       "!(m_iwl < FXPMinStoredIWL() || FXPMaxStoredIWL() < m_iwl)", "Integer word length out of range"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    gAssertions.clear();
    const FXP x = c.make();
    ExpectIdentical(x, c.format.wl, c.format.iwl, c.format.isSigned, c.bits);
    EXPECT_TRUE(x.check_invariant());
    ASSERT_EQ(gAssertions.size(), 1u);
    EXPECT_EQ(gAssertions[0].file, "dep_mirror\\deps\\FixedPoint\\includes\\fxp");
    EXPECT_EQ(gAssertions[0].condition, c.condition);
    EXPECT_EQ(gAssertions[0].message, c.message);
  }
}

TEST_F(FxpHookTest, ModeReports) {
  const FXP v(int64_t{300});
  struct Case {
    const char* name;
    int oMode;
    int qMode;
    FXP src;
    const char* condition;  // nullptr: no report
    const char* message;
  };
  const Case kCases[] = {
      {"ShouldntOverflowOverflows", 0, 3, FXP(int64_t{300}), "oMode != kShouldntOverflow",
       "Overflow though caller didn't think so."},
      {"ShouldntOverflowFits", 0, 3, FXP(int64_t{30}), nullptr, nullptr},
      {"ShouldntQuantizeDrops", 2, 0, FXP(0.5), "qMode != kShouldntQuantize",
       "Quantization possible though caller didn't think so."},
      {"ShouldntQuantizeDropsOnlyZeros", 2, 0, FXP(int64_t{0x0100}, 16, 8), nullptr, nullptr},
      {"UnknownOverflowMode", 7, 3, FXP(int64_t{30}), "false", "Unexpected Overflow Mode"},
      {"UnknownQuantizationMode", 2, 12, FXP(int64_t{30}), "false", "Unexpected Quantization Mode"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    gAssertions.clear();
    const FXP r(c.src, 8, 8, false, static_cast<FXP::OverflowMode>(c.oMode), static_cast<FXP::QuantizationMode>(c.qMode));
    EXPECT_TRUE(r.check_invariant());
    if (c.condition == nullptr) {
      EXPECT_TRUE(gAssertions.empty());
      continue;
    }
    ASSERT_EQ(gAssertions.size(), 1u);
    EXPECT_EQ(gAssertions[0].condition, c.condition);
    EXPECT_EQ(gAssertions[0].message, c.message);
  }
  // An unknown overflow mode wraps, masked to the format.
  gAssertions.clear();
  ExpectIdentical(FXP(v, 8, 8, false, static_cast<FXP::OverflowMode>(7), FXP::kConvergent), 8, 8, false, 44);
}

TEST(FxpHook, WithoutHookTheValueIsStillRepaired) {
  FXP::registerAssertFunction(nullptr);
  ExpectIdentical(FXP(int64_t{0xFF}, 0, 8), 1, 8, true, ~uint64_t{0});
  ExpectIdentical(FXP(uint64_t{0xFF}, 99, 8, false), 64, 8, false, 0xFF);
}

// ----- Text -----

TEST(FxpText, BinaryOctalHexadecimal) {
  struct Case {
    const char* name;
    FXP value;
    const char* binary;
    const char* octal;
    const char* hex;
  };
  const Case kCases[] = {
      {"AllFractionUnsigned", FXP(uint64_t{3}, 2, -3, false), "0.00011", "0.06", "0.18"},
      {"MixedSigned", FXP(int64_t{-1}, 8, 4), "1111.1111", "77.74", "F.F"},
      {"IntegerAboveZero", FXP(uint64_t{0xB}, 4, 6, false), "101100", "54", "2C"},
      {"NegativeAllFraction", FXP(int64_t{-1}, 2, -3), "1.11111", "7.76", "F.F8"},
      {"Zero", FXP(), "0", "0", "0"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    char buf[64];
    EXPECT_EQ(c.value.toBinaryString(sizeof buf, buf), static_cast<int>(std::strlen(c.binary)) + 1);
    EXPECT_STREQ(buf, c.binary);
    EXPECT_EQ(c.value.toOctalString(sizeof buf, buf), static_cast<int>(std::strlen(c.octal)) + 1);
    EXPECT_STREQ(buf, c.octal);
    EXPECT_EQ(c.value.toHexadecimalString(sizeof buf, buf), static_cast<int>(std::strlen(c.hex)) + 1);
    EXPECT_STREQ(buf, c.hex);
    const char* end = nullptr;
    EXPECT_TRUE(FXP::fromBinaryString(c.value, c.binary, &end).identical(c.value));
    EXPECT_EQ(*end, 0);
    EXPECT_TRUE(FXP::fromOctalString(c.value, c.octal, &end).identical(c.value));
    EXPECT_TRUE(FXP::fromHexadecimalString(c.value, c.hex, &end).identical(c.value));
  }
  char buf[64];
  const FXP x(int64_t{-1}, 8, 4);
  x.toBinaryString(sizeof buf, buf, ',', false);
  EXPECT_STREQ(buf, "11111111");
  EXPECT_TRUE(FXP::fromBinaryString(x, buf).identical(x));  // without a point: aligned to the lowest digit
  EXPECT_EQ(x.toBinaryString(5, buf), 10);  // truncated, the whole length returned
  EXPECT_STREQ(buf, "1111");
  EXPECT_EQ(x.toBinaryString(0, nullptr), 10);
  EXPECT_EQ(x.toHexadecimalString(1, buf), 4);
  EXPECT_STREQ(buf, "");
}

TEST(FxpText, RadixReadersRejectWhatDoesNotFit) {
  const FXPMeta u8(8, 8, false);
  const FXPMeta s8(8, 8, true);
  struct Case {
    const char* name;
    FXPMeta format;
    const char* text;
    size_t consumed;  // 0: rejected; kAll: the whole text
    uint64_t bits;
  };
  constexpr size_t kAll = SIZE_MAX;
  const Case kCases[] = {
      {"Plain", u8, "FF", 2, 0xFF},
      {"Lower", u8, "ff", 2, 0xFF},
      {"TrailingText", u8, "1Fz", 2, 0x1F},
      {"ShortSignedExtends", s8, "F", 1, ~uint64_t{0}},
      {"TooLarge", u8, "100", 0, 0},
      {"SignMismatch", s8, "0FF", 0, 0},
      {"FractionBelowFormat", u8, "1.8", 0, 0},
      {"ZeroFraction", u8, "1.0", 3, 1},
      {"Empty", u8, "", 0, 0},
      {"NotADigit", u8, "G", 0, 0},
      {"LonePoint", u8, ".", 0, 0},
      {"LeadingFill", u8, "000000000000000000000000000000000001", kAll, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const char* end = nullptr;
    const FXP r = FXP::fromHexadecimalString(c.format, c.text, &end);
    EXPECT_EQ(static_cast<size_t>(end - c.text), c.consumed == kAll ? std::strlen(c.text) : c.consumed);
    EXPECT_TRUE(r.sameFormat(c.format));
    EXPECT_EQ(r.bits(), c.bits);
  }
  EXPECT_TRUE(FXP::fromBinaryString(u8, nullptr).isZero());
  EXPECT_EQ(FXP::fromOctalString(u8, "8").bits(), 0u);
}

TEST(FxpText, DecimalLayouts) {
  const FXP x(int64_t{-3168}, 16, 8);  // -12.375
  struct Case {
    const char* name;
    FXP value;
    int digits;
    FXP::DecimalFormat format;
    char point;
    const char* text;
  };
  const Case kCases[] = {
      {"Plain", x, 0, FXP::kDecimalPlain, '.', "-12.375"},
      {"Comma", x, 0, FXP::kDecimalPlain, ',', "-12,375"},
      {"BadPointIgnored", x, 0, FXP::kDecimalPlain, '7', "-12.375"},
      {"Scientific", x, 0, FXP::kDecimalScientific, '.', "-1.2375e+1"},
      {"Tagged", x, 0, FXP::kDecimalTagged, '.', "-12.375<s,16,8>"},
      {"Rounded", x, 3, FXP::kDecimalPlain, '.', "-12.4"},
      {"RoundedTieToEven", FXP(2.5), 1, FXP::kDecimalPlain, '.', "2"},
      {"RoundedCarry", FXP(99.5), 2, FXP::kDecimalPlain, '.', "100"},
      {"EnoughDigitsIsExact", x, x.maxSignificantDecimalDigits(), FXP::kDecimalPlain, '.', "-12.375"},
      {"Zero", FXP(), 0, FXP::kDecimalPlain, '.', "0"},
      {"ZeroScientific", FXP(), 0, FXP::kDecimalScientific, '.', "0e+0"},
      {"SmallFraction", FXP(uint64_t{1}, 1, -9, false), 0, FXP::kDecimalPlain, '.', "0.0009765625"},
      {"SmallScientific", FXP(uint64_t{1}, 1, -9, false), 0, FXP::kDecimalScientific, '.', "9.765625e-4"},
      {"LargeInteger", FXP(uint64_t{1}, 1, 65, false), 0, FXP::kDecimalPlain, '.', "18446744073709551616"},
      {"UnsignedTag", FXP(uint64_t{5}, 4, 10, false), 0, FXP::kDecimalTagged, '.', "320<u,4,10>"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.value.toDecimalString(c.digits, c.format, c.point), c.text);
    char buf[8];
    EXPECT_EQ(c.value.toDecimalString(sizeof buf, buf, c.digits, c.format, c.point),
              static_cast<int>(std::strlen(c.text)) + 1);
    EXPECT_EQ(std::string(buf), std::string(c.text).substr(0, 7));
  }
  EXPECT_EQ(FXPMeta(8, 8, false).wl(), 8);
  EXPECT_EQ(FXP(uint64_t{0}, 64, 64, false).maxSignificantDecimalDigits(), 20);
  EXPECT_GE(FXP(uint64_t{0}, 64, -2048, true).maxSignificantDecimalDigits(), 1490);
}

TEST(FxpText, DecimalReaders) {
  struct Case {
    const char* name;
    int maxWordLength;
    const char* text;
    size_t consumed;  // 0: rejected
    Format format;
    uint64_t bits;
  };
  const Case kCases[] = {
      {"Integer", 64, "12", 2, {2, 4, false}, 3},
      {"Negative", 64, "-12.375", 7, {8, 5, true}, static_cast<uint64_t>(-99)},
      {"Blanks", 64, " \t+0.75", 7, {2, 0, false}, 3},
      {"CommaPoint", 64, "0,5", 3, {1, 0, false}, 1},
      {"Exponent", 64, "25e-2", 5, {1, -1, false}, 1},
      {"ExponentUnread", 64, "3e", 1, {2, 2, false}, 3},
      {"PointUnread", 64, "3.", 1, {2, 2, false}, 3},
      {"TaggedInFormat", 64, "3.5<s,16,8>", 11, {16, 8, true}, 0x380},
      {"PlusMinusTag", 64, "-1<+/-,4,2>", 11, {4, 2, true}, static_cast<uint64_t>(-4)},
      {"MalformedTagUnread", 64, "2<s,0,8>", 1, {1, 2, false}, 1},
      {"MinusZero", 64, "-0.000", 6, {1, 1, false}, 0},
      {"Empty", 64, "", 0, {1, 1, false}, 0},
      {"SignOnly", 64, "-", 0, {1, 1, false}, 0},
      {"Letters", 64, "abc", 0, {1, 1, false}, 0},
      {"TooLargeForTag", 64, "300<u,8,8>", 0, {1, 1, false}, 0},
      {"TooLargeForAnyFormat", 64, "1e100000", 0, {1, 1, false}, 0},
      {"TinyRoundsToZero", 64, "1e-100000", 9, {1, 1, false}, 0},
      {"TieToEvenInFourBits", 4, "17", 2, {1, 5, false}, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const char* end = nullptr;
    const FXP r = FXP::fromDecimalString(c.maxWordLength, c.text, &end, FXP::kConvergent);
    EXPECT_EQ(static_cast<size_t>(end - c.text), c.consumed);
    ExpectIdentical(r, c.format.wl, c.format.iwl, c.format.isSigned, c.bits);
  }
  const char* end = nullptr;
  // 0.1 has no finite binary form: rounded into the format.
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(16, 0, false), "0.1", &end), 16, 0, false, 6554);
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(16, 0, false), "0.1", &end, FXP::kRoundTowardNegInf), 16, 0, false, 6553);
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(8, 8, false), "300", &end), 8, 8, false, 0);
  EXPECT_STREQ(end, "300");
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(8, 8, false), "-0.4", &end), 8, 8, false, 0);
  EXPECT_EQ(*end, 0);
  // A long tail of digits only matters through whether it is zero.
  std::string longTie = "0.5" + std::string(60000, '0');
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(4, 4, false), longTie.c_str(), &end), 4, 4, false, 0);
  const std::string longAboveTie = longTie + "1";
  ExpectIdentical(FXP::fromDecimalString(FXPMeta(4, 4, false), longAboveTie.c_str(), &end), 4, 4, false, 1);
  EXPECT_EQ(*end, 0);
}

// ----- Formats from ranges -----

TEST(FxpRange, Specifications) {
  struct Case {
    const char* name;
    const char* spec;
    bool ok;
    Format format;
  };
  const Case kCases[] = {
      {"Lengths", "<s,16,8>", true, {16, 8, true}},
      {"Unsigned", "<u,16,8>", true, {16, 8, false}},
      {"AnyLetterIsUnsigned", "<x,16,-8>", true, {16, -8, false}},
      {"DescriptorText", "type <+/-,12,4>", true, {12, 4, true}},
      {"WordLengthCapped", "<s,100,8>", true, {64, 8, true}},
      {"MissingParts", "<u", true, {64, 64, false}},
      {"MissingLength", "<s,,3>", true, {64, 64, true}},
      {"Range", "[0,1]:0.25", true, {3, 1, false}},
      {"SignedRange", "[-1,1]:0.5", true, {3, 2, true}},
      {"ExcludedEnds", "(0,1):0.25", true, {2, 0, false}},
      {"MaximumMustFit", "[-4,3.9]:0.5", true, {5, 4, true}},
      {"SubnormalStep", "[0,1]:5e-324", true, {64, 1, false}},
      {"WordLengthZero", "<s,0,8>", false, {64, 64, true}},
      {"IntegerWordLengthOutside", "<s,8,99999999>", false, {64, 64, true}},
      {"NoStep", "[0,1]", false, {64, 64, true}},
      {"ZeroStep", "[0,1]:0", false, {64, 64, true}},
      {"Inverted", "[2,1]:1", false, {64, 64, true}},
      {"NotANumber", "[nan,1]:1", false, {64, 64, true}},
      {"Nothing", "plain text", false, {64, 64, true}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    bool isSigned = false;
    int wl = 0;
    int iwl = 0;
    EXPECT_EQ(FXP::signAndLengthsForRangeSpec(c.spec, &isSigned, &wl, &iwl), c.ok);
    EXPECT_EQ(isSigned, c.format.isSigned);
    EXPECT_EQ(wl, c.format.wl);
    EXPECT_EQ(iwl, c.format.iwl);
  }
  bool isSigned = false;
  int wl = 0;
  int iwl = 0;
  EXPECT_FALSE(FXP::signAndLengthsForRangeSpec(nullptr, &isSigned, &wl, &iwl));
  const char* end = nullptr;
  const char* spec = "<s,16,8> rest";
  EXPECT_TRUE(FXP::signAndLengthsForRangeSpec(spec, &isSigned, &wl, &iwl, &end));
  EXPECT_STREQ(end, " rest");
}

TEST(FxpRange, FormatsFromRangeAndStep) {
  bool isSigned = false;
  int wl = 0;
  int iwl = 0;
  ASSERT_TRUE(FXPMeta::signAndLengthsForRangeAndDeltaF64(0, 1, 0.25, &isSigned, &wl, &iwl));
  EXPECT_FALSE(isSigned);
  EXPECT_EQ(wl, 3);
  EXPECT_EQ(iwl, 1);
  EXPECT_EQ(wl - iwl, 2);
  // A step just below a power of two still gives that power's half.
  ASSERT_TRUE(FXPMeta::signAndLengthsForRangeAndDeltaF64(0, 1, std::nextafter(0.25, 0.0), &isSigned, &wl, &iwl));
  EXPECT_EQ(wl - iwl, 3);
  // Wide ranges are not capped here, but are by the format constructors.
  ASSERT_TRUE(FXPMeta::signAndLengthsForRangeAndDeltaF64(-1e30, 1e30, 1e-30, &isSigned, &wl, &iwl));
  EXPECT_TRUE(isSigned);
  EXPECT_GT(wl, 64);
  const FXPMeta capped(-1e30, 1e30, 1e-30);
  EXPECT_EQ(capped.wl(), 64);
  EXPECT_EQ(capped.iwl(), iwl);
  // [0, 0] still gets one bit; a range within one step below zero too.
  ASSERT_TRUE(FXPMeta::signAndLengthsForRangeAndDeltaF64(0, 0, 1, &isSigned, &wl, &iwl));
  EXPECT_EQ(wl, 1);
  ASSERT_TRUE(FXPMeta::signAndLengthsForRangeAndDeltaF64(-0.5, 0, 1, &isSigned, &wl, &iwl));
  EXPECT_TRUE(isSigned);
  EXPECT_EQ(wl, 1);
  EXPECT_EQ(iwl, 1);
  const FXPMeta m = FXP::fxpMetaFor(FXP(int64_t{-128}), FXP(int64_t{127}), FXP(int64_t{1}));
  EXPECT_TRUE(m.sameFormat(FXPMeta(8, 8, true)));
}

TEST_F(FxpHookTest, RangeConstructors) {
  const FXP lo(int64_t{-2});
  const FXP hi(int64_t{5});
  const FXP step(0.5);
  // [-2, 5] in halves: signed (5, 4); 7 is clamped to the range maximum.
  ExpectIdentical(FXP(FXP(int64_t{7}), lo, hi, step, FXP::kSaturate, FXP::kConvergent), 5, 4, true, 10);
  bool overflowed = false;
  ExpectIdentical(FXP(uint64_t{0x1E}, lo, hi, step, FXP::kSaturate, FXP::kConvergent, &overflowed), 5, 4, true,
                  static_cast<uint64_t>(-2));  // -1 lies inside
  EXPECT_FALSE(overflowed);
  ExpectIdentical(FXP(uint64_t{0x10}, lo, hi, step, FXP::kSaturate, FXP::kConvergent, &overflowed), 5, 4, true,
                  static_cast<uint64_t>(-4));  // -8 is below -2
  EXPECT_TRUE(overflowed);
  ExpectIdentical(FXP(FXP(2.75), "<s,8,4>", FXP::kSaturate, FXP::kConvergent), 8, 4, true, 0x2C);
  EXPECT_TRUE(gAssertions.empty());
  ExpectIdentical(FXP(FXP(2.75), "oops", FXP::kSaturate, FXP::kConvergent), 64, 64, true, 3);
  ASSERT_EQ(gAssertions.size(), 1u);
  EXPECT_EQ(gAssertions[0].message, "Malformed range specification");
  gAssertions.clear();
  const FXPMeta inverted(1.0, 0.0, 1.0);
  EXPECT_TRUE(inverted.sameFormat(FXPMeta(64, 64, true)));
  ASSERT_EQ(gAssertions.size(), 1u);
  EXPECT_EQ(gAssertions[0].message, "Invalid range or step");
}

// ----- Helpers and constants -----

TEST(FxpHelpers, BitHelpersAndLimits) {
  EXPECT_EQ(FXP::smax(8), 127);
  EXPECT_EQ(FXP::smin(8), -128);
  EXPECT_EQ(FXP::smax(64), INT64_MAX);
  EXPECT_EQ(FXP::smin(64), INT64_MIN);
  EXPECT_EQ(FXP::smax(65), 0);
  EXPECT_EQ(FXP::smin(65), 0);
  EXPECT_EQ(FXP::umax(8), 255u);
  EXPECT_EQ(FXP::umax(64), UINT64_MAX);
  EXPECT_EQ(FXP::umax(0), 0u);
  EXPECT_EQ(FXP::asr(int64_t{-8}, 2), -2);
  EXPECT_EQ(FXP::asr(int64_t{-8}, 200), -1);
  EXPECT_EQ(FXP::asr(uint64_t{8}, 2), 2u);
  EXPECT_EQ(FXP::asr(uint64_t{8}, 64), 0u);
  EXPECT_EQ(nlz(0), 64);
  EXPECT_EQ(ntz(0), 64);
  EXPECT_EQ(nlz(1), 63);
  EXPECT_EQ(ntz(8), 3);
  EXPECT_EQ(FXPMaxFractionalWordLength(), FXPMaxWordLength() - FXPMinIntegerWordLength());
  EXPECT_EQ(FXPMinFractionalWordLength(), FXPMinWordLength() - FXPMaxIntegerWordLength());
  EXPECT_EQ(FXPInvalidWordLength(), 0xFFFF);
  EXPECT_EQ(FXPInvalidPartLength(), -32768);
  EXPECT_EQ(FXPMetaMaxIWL(), 32767);
  EXPECT_EQ(FXPMetaMinIWL(), -32768);
  ExpectIdentical(FXPOne_(), 1, 1, false, 1);
  ExpectIdentical(FXPZero_(), 1, 1, false, 0);
  EXPECT_EQ(&FXPOne_(), &FXPOne_());
  ExpectIdentical(FXP(-3), 64, 64, true, static_cast<uint64_t>(-3));
  ExpectIdentical(FXP(3u), 64, 64, false, 3);
  EXPECT_EQ(FXP(int64_t{-0x2C}, 8, 4).debugDump(), "FXP<s,8,4> bits 0xffffffffffffffd4 = -2.75");
}

// ----- Property runs against the oracle -----

uint64_t Seed() {
  static const uint64_t seed = [] {
    if (const char* env = std::getenv("VELLUM_FXP_SEED")) return static_cast<uint64_t>(std::strtoull(env, nullptr, 0));
    return static_cast<uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
  }();
  return seed;
}

class FxpOracle : public ::testing::TestWithParam<size_t> {};

TEST_P(FxpOracle, AgreesWithExactArithmetic) {
  const fxporacle::NamedRun run = fxporacle::AllRuns()[GetParam()];
  constexpr uint64_t kCases = 1500;
  const uint64_t seed = Seed() + GetParam();
  std::cout << "[ seed     ] " << run.name << " VELLUM_FXP_SEED=" << Seed() << "\n";
  const fxporacle::Report r = run.run(seed, kCases);
  EXPECT_EQ(r.cases, kCases);
  EXPECT_EQ(r.mismatches, 0u) << run.name << " seed " << seed << ": " << r.firstMismatch;
}

INSTANTIATE_TEST_SUITE_P(Runs, FxpOracle, ::testing::Range<size_t>(0, fxporacle::AllRuns().size()),
                         [](const ::testing::TestParamInfo<size_t>& param) {
                           std::string name = fxporacle::AllRuns()[param.param].name;
                           for (char& c : name)
                             if (!std::isalnum(static_cast<unsigned char>(c))) c = '_';
                           return name;
                         });

}  // namespace
}  // namespace vellum
