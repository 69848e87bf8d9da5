// Numeric kinds, ConvertNum's rules, and a property test of every pair of kinds against wide
// reference arithmetic.
#include "runtime/PXNumbers.h"

#include <gtest/gtest.h>

#include <array>
#include <bit>
#include <cfenv>
#include <cfloat>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <limits>
#include <random>
#include <string>
#include <vector>

__extension__ typedef __int128 Int128;

namespace {

constexpr int32_t kInt8 = 0x01, kInt16 = 0x02, kInt32 = 0x03, kInt64 = 0x04, kUInt8 = 0x05, kUInt16 = 0x06,
                  kUInt32 = 0x07, kUInt64 = 0x08, kFloat32 = 0x09, kFloat64 = 0x0A, kFloatExt = 0x0B,
                  kComplex64 = 0x0C, kComplex128 = 0x0D, kComplexExt = 0x0E;

template <class D, class S>
D Convert(int32_t srcCode, S src, int32_t dstCode) {
  D dst{};
  EXPECT_EQ(ConvertNum(srcCode, &src, dstCode, &dst), 0);
  return dst;
}

TEST(PXNumbersTest, SizesAndClasses) {
  struct Case {
    int32_t code;
    int32_t size;
    int32_t numClass;
  };
  const Case kCases[] = {
      {0x00, 0, 0},  {0x01, 1, 1},  {0x02, 2, 1},  {0x03, 4, 1},  {0x04, 8, 1},  {0x05, 1, 1},
      {0x06, 2, 1},  {0x07, 4, 1},  {0x08, 8, 1},  {0x09, 4, 2},  {0x0A, 8, 2},  {0x0B, 10, 2},
      {0x0C, 8, 3},  {0x0D, 16, 3}, {0x0E, 20, 3}, {0x0F, 0, 0},  {0x10, 0, 0},  {0x11, 0, 0},
      {0x14, 0, 0},  {0x15, 1, 1},  {0x16, 2, 1},  {0x17, 4, 1},  {0x18, 0, 0},  {0x19, 4, 2},
      {0x1A, 8, 2},  {0x1B, 10, 2}, {0x1C, 8, 3},  {0x1D, 16, 3}, {0x1E, 20, 3}, {0x1F, 0, 0},
      {0x21, 0, 0},  {0x30, 0, 0},  {-1, 0, 0},    {0x10A, 0, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.code);
    EXPECT_EQ(NumSize(c.code), c.size);
    EXPECT_EQ(NumClass(c.code), c.numClass);
  }
}

TEST(PXNumbersTest, FloatToIntegerRoundsHalfToEvenAndSaturates) {
  struct Case {
    double value;
    int32_t dstCode;
    int64_t expected;
  };
  const double nan = std::numeric_limits<double>::quiet_NaN();
  const Case kCases[] = {
      {2.5, kInt32, 2},          {3.5, kInt32, 4},           {-2.5, kInt32, -2},
      {-0.5, kInt32, 0},         {0.49999999999999994, kInt32, 0}, {2.500001, kInt32, 3},
      {1e10, kInt16, 32767},     {-1e10, kInt16, -32768},    {DInfinity(), kUInt8, 255},
      {DNegInfinity(), kUInt32, 0}, {nan, kInt64, 0},        {-1.0, kUInt8, 0},
      {255.5, kUInt8, 255},      {254.5, kUInt8, 254},       {9.3e18, kInt64, INT64_MAX},
      {-9.3e18, kInt64, INT64_MIN}, {127.49, kInt8, 127},    {-128.5, kInt8, -128},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(std::to_string(c.value) + " -> " + std::to_string(c.dstCode));
    int64_t wide = 0;
    uint8_t dst[8] = {};
    ASSERT_EQ(ConvertNum(kFloat64, &c.value, c.dstCode, dst), 0);
    EXPECT_EQ(ConvertNum(c.dstCode, dst, kInt64, &wide), 0);
    EXPECT_EQ(wide, c.expected);
  }
  EXPECT_EQ(Convert<uint64_t>(kFloat64, 1.8446744073709552e19, kUInt64), UINT64_MAX);
  EXPECT_EQ(Convert<uint64_t>(kFloat32, 1e30f, kUInt64), UINT64_MAX);
}

TEST(PXNumbersTest, IntegerConversionsSaturate) {
  EXPECT_EQ(Convert<uint64_t>(kInt64, int64_t{-1}, kUInt64), 0u);
  EXPECT_EQ(Convert<int64_t>(kUInt64, UINT64_MAX, kInt64), INT64_MAX);
  EXPECT_EQ(Convert<uint8_t>(kInt32, int32_t{300}, kUInt8), 255);
  EXPECT_EQ(Convert<int16_t>(kInt8, int8_t{-128}, kInt16), -128);
  EXPECT_EQ(Convert<int8_t>(kUInt16, uint16_t{200}, kInt8), 127);
  EXPECT_EQ(Convert<uint32_t>(kUInt8, uint8_t{200}, kUInt32), 200u);
}

TEST(PXNumbersTest, IntegerToFloatRoundsToNearestEven) {
  EXPECT_EQ(Convert<double>(kUInt64, (uint64_t{1} << 53) + 1, kFloat64), 9007199254740992.0);
  EXPECT_EQ(Convert<double>(kUInt64, (uint64_t{1} << 53) + 3, kFloat64), 9007199254740996.0);
  EXPECT_EQ(Convert<float>(kInt32, int32_t{16777217}, kFloat32), 16777216.0f);
  EXPECT_EQ(Convert<float>(kUInt64, UINT64_MAX, kFloat32), 18446744073709551616.0f);
  EXPECT_EQ(Convert<double>(kInt64, INT64_MIN, kFloat64), -9223372036854775808.0);
}

TEST(PXNumbersTest, ComplexTakesTheRealPartAndRealsGetZeroImaginary) {
  const double pair[2] = {3.5, 2.0};
  int32_t i = 0;
  ASSERT_EQ(ConvertNum(kComplex128, pair, kInt32, &i), 0);
  EXPECT_EQ(i, 4);
  double real = 0;
  const float pair32[2] = {-1.25f, 9.0f};
  ASSERT_EQ(ConvertNum(kComplex64, pair32, kFloat64, &real), 0);
  EXPECT_EQ(real, -1.25);
  double out[2] = {7, 7};
  const int16_t small = -3;
  ASSERT_EQ(ConvertNum(kInt16, &small, kComplex128, out), 0);
  EXPECT_EQ(out[0], -3.0);
  EXPECT_EQ(out[1], 0.0);
  float narrowed[2] = {};
  ASSERT_EQ(ConvertNum(kComplex128, pair, kComplex64, narrowed), 0);
  EXPECT_EQ(narrowed[0], 3.5f);
  EXPECT_EQ(narrowed[1], 2.0f);
}

TEST(PXNumbersTest, ModifiedCodesAndRefusals) {
  const double v = 200.7;
  uint8_t e = 0;
  ASSERT_EQ(ConvertNum(0x1A, &v, 0x15, &e), 0);
  EXPECT_EQ(e, 201);
  uint8_t untouched[8] = {9, 9, 9, 9, 9, 9, 9, 9};
  for (int32_t code : {0x00, 0x11, 0x18, 0x21, 0x30, 0x1F, 300}) {
    SCOPED_TRACE(code);
    EXPECT_EQ(ConvertNum(code, &v, kInt32, untouched), 1);
    EXPECT_EQ(ConvertNum(kFloat64, &v, code, untouched), 1);
  }
  EXPECT_EQ(untouched[0], 9);
  EXPECT_EQ(ConvertNum(kFloat64, nullptr, kInt32, untouched), 1);
  EXPECT_EQ(ConvertNum(kFloat64, &v, kInt32, nullptr), 1);
}

TEST(PXNumbersTest, ConversionInPlace) {
  uint8_t buf[20] = {};
  const double v = 41.5;
  std::memcpy(buf, &v, sizeof v);
  ASSERT_EQ(ConvertNum(kFloat64, buf, kInt64, buf), 0);
  int64_t r = 0;
  std::memcpy(&r, buf, sizeof r);
  EXPECT_EQ(r, 42);
}

TEST(PXNumbersTest, ClassifyFloatNumber) {
  auto ext = [](std::initializer_list<uint8_t> bytes) {
    std::vector<uint8_t> v(bytes);
    return v;
  };
  const std::vector<uint8_t> extOne = ext({0, 0, 0, 0, 0, 0, 0, 0x80, 0xFF, 0x3F});
  const std::vector<uint8_t> extInf = ext({0, 0, 0, 0, 0, 0, 0, 0x80, 0xFF, 0xFF});
  const std::vector<uint8_t> extNaN = ext({1, 0, 0, 0, 0, 0, 0, 0xC0, 0xFF, 0x7F});
  const std::vector<uint8_t> extZero = ext({0, 0, 0, 0, 0, 0, 0, 0, 0, 0x80});
  const std::vector<uint8_t> extDenormal = ext({1, 0, 0, 0, 0, 0, 0, 0, 0, 0});
  const std::vector<uint8_t> extUnnormal = ext({0, 0, 0, 0, 0, 0, 0, 0x40, 0xFF, 0x3F});
  const float f = 1e-40f;  // denormal
  const double d = 0.0;
  const double inf = DNegInfinity();
  const float fnan = std::numeric_limits<float>::quiet_NaN();
  struct Case {
    const char* name;
    int32_t code;
    const void* value;
    int32_t expected;
  };
  const Case kCases[] = {
      {"FloatDenormal", kFloat32, &f, kFloatClassFinite},
      {"FloatNaN", 0x19, &fnan, kFloatClassNaN},
      {"DoubleZero", kFloat64, &d, kFloatClassZero},
      {"DoubleNegInfinity", 0x1A, &inf, kFloatClassInfinite},
      {"ExtOne", kFloatExt, extOne.data(), kFloatClassFinite},
      {"ExtInfinity", kFloatExt, extInf.data(), kFloatClassInfinite},
      {"ExtNaN", 0x1B, extNaN.data(), kFloatClassNaN},
      {"ExtNegativeZero", kFloatExt, extZero.data(), kFloatClassZero},
      {"ExtDenormal", kFloatExt, extDenormal.data(), kFloatClassFinite},
      {"ExtUnnormal", kFloatExt, extUnnormal.data(), kFloatClassNaN},
      {"NotAFloat", kInt32, &d, -1},
      {"Null", kFloat64, nullptr, -1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(ClassifyFloatNumber(c.code, c.value), c.expected);
  }
  EXPECT_EQ(ExtendedToLongDouble(extOne.data()), 1.0L);
  EXPECT_TRUE(std::isnan(ExtendedToLongDouble(extUnnormal.data())));
  EXPECT_EQ(Convert<double>(kFloatExt, [] {
    std::array<uint8_t, 10> big{};
    LongDoubleToExtended(1e4000L, big.data());
    return big;
  }(), kFloat64), DInfinity());
}

// ---- property test: every pair of kinds against reference arithmetic

constexpr int32_t kAllCodes[] = {kInt8,    kInt16,   kInt32,     kInt64,     kUInt8,      kUInt16,    kUInt32,
                                 kUInt64,  kFloat32, kFloat64,   kFloatExt,  kComplex64,  kComplex128, kComplexExt};

struct Reference {
  bool isInteger = false;
  Int128 integer = 0;
  long double re = 0;
  long double im = 0;
};

bool IsIntegerCode(int32_t c) { return c <= kUInt64; }

void Range(int32_t code, Int128* lo, Int128* hi) {
  const int bits = 8 * NumSize(code);
  if (code <= kInt64) {
    *hi = (Int128{1} << (bits - 1)) - 1;
    *lo = -*hi - 1;
  } else {
    *lo = 0;
    *hi = (Int128{1} << bits) - 1;
  }
}

long double LoadExt(const uint8_t* p) {
#if LDBL_MANT_DIG == 64
  long double v = 0;
  std::memcpy(&v, p, 10);  // the machine's own reading of the 80-bit format
  return v;
#else
  return ExtendedToLongDouble(p);
#endif
}

Reference Decode(int32_t code, const uint8_t* p) {
  Reference r;
  r.isInteger = IsIntegerCode(code);
  auto load = [p](auto v, size_t offset = 0) {
    std::memcpy(&v, p + offset, sizeof v);
    return v;
  };
  switch (code) {
    case kInt8: r.integer = load(int8_t{}); break;
    case kInt16: r.integer = load(int16_t{}); break;
    case kInt32: r.integer = load(int32_t{}); break;
    case kInt64: r.integer = load(int64_t{}); break;
    case kUInt8: r.integer = load(uint8_t{}); break;
    case kUInt16: r.integer = load(uint16_t{}); break;
    case kUInt32: r.integer = load(uint32_t{}); break;
    case kUInt64: r.integer = load(uint64_t{}); break;
    case kFloat32: r.re = load(float{}); break;
    case kFloat64: r.re = load(double{}); break;
    case kFloatExt: r.re = LoadExt(p); break;
    case kComplex64: r.re = load(float{}); r.im = load(float{}, 4); break;
    case kComplex128: r.re = load(double{}); r.im = load(double{}, 8); break;
    default: r.re = LoadExt(p); r.im = LoadExt(p + 10); break;
  }
  return r;
}

// Expected integer: saturating, and for floating sources the hardware's round-to-nearest.
Int128 ExpectedInteger(const Reference& r, int32_t dstCode) {
  Int128 lo = 0;
  Int128 hi = 0;
  Range(dstCode, &lo, &hi);
  if (r.isInteger) return r.integer < lo ? lo : (r.integer > hi ? hi : r.integer);
  if (std::isnan(r.re)) return 0;
  if (r.re <= static_cast<long double>(lo)) return lo;
  if (r.re >= static_cast<long double>(hi)) return hi;
  const long double rounded = std::nearbyint(r.re);
  const Int128 v = static_cast<Int128>(rounded);
  return v < lo ? lo : (v > hi ? hi : v);
}

template <class T>
bool SameFloat(T expected, const uint8_t* actual) {
  T a;
  std::memcpy(&a, actual, sizeof a);
  if (std::isnan(expected)) return std::isnan(a);
  return std::memcmp(&a, &expected, sizeof a) == 0;
}

bool SameExt(long double expected, const uint8_t* actual) {
  const long double a = ExtendedToLongDouble(actual);
  if (std::isnan(expected)) return std::isnan(a);
  return a == expected && std::signbit(a) == std::signbit(expected);
}

template <class T>
T RealAs(const Reference& r) {
  return r.isInteger ? static_cast<T>(r.integer) : static_cast<T>(r.re);
}

bool Matches(const Reference& r, int32_t dstCode, const uint8_t* out) {
  if (IsIntegerCode(dstCode)) {
    const Int128 expected = ExpectedInteger(r, dstCode);
    return Decode(dstCode, out).integer == expected;
  }
  switch (dstCode) {
    case kFloat32: return SameFloat(RealAs<float>(r), out);
    case kFloat64: return SameFloat(RealAs<double>(r), out);
    case kFloatExt: return SameExt(RealAs<long double>(r), out);
    case kComplex64: return SameFloat(RealAs<float>(r), out) && SameFloat(static_cast<float>(r.im), out + 4);
    case kComplex128: return SameFloat(RealAs<double>(r), out) && SameFloat(static_cast<double>(r.im), out + 8);
    default: return SameExt(RealAs<long double>(r), out) && SameExt(r.im, out + 10);
  }
}

long double RandomReal(std::mt19937_64& rng) {
  std::uniform_int_distribution<int> pick(0, 5);
  switch (pick(rng)) {
    case 0: return std::bit_cast<double>(rng());  // any double, NaN and infinities included
    case 1: return static_cast<long double>(static_cast<int64_t>(rng() % 2001) - 1000) / 2;  // halves
    case 2: return std::ldexp(static_cast<long double>(rng()), static_cast<int>(rng() % 160) - 80);
    case 3: return -std::ldexp(static_cast<long double>(rng()), static_cast<int>(rng() % 70) - 70);
    case 4: {
      const long double edges[] = {0.0L, -0.0L, 0.5L, -0.5L, 127.5L, 128.5L, 255.5L, 32767.5L, 65535.5L,
                                   2147483647.5L, 4294967295.5L, 9223372036854775807.5L,
                                   18446744073709551615.5L, -9223372036854775808.5L, 1e4000L, -1e-4940L};
      return edges[rng() % (sizeof edges / sizeof edges[0])];
    }
    default: return static_cast<long double>(static_cast<int64_t>(rng())) + 0.5L;
  }
}

void RandomValue(int32_t code, std::mt19937_64& rng, uint8_t* out) {
  const uint64_t bits = rng();
  switch (code) {
    case kFloat32: {
      const float f = static_cast<float>(static_cast<double>(RandomReal(rng)));
      std::memcpy(out, &f, 4);
      break;
    }
    case kFloat64: {
      const double d = static_cast<double>(RandomReal(rng));
      std::memcpy(out, &d, 8);
      break;
    }
    case kFloatExt: LongDoubleToExtended(RandomReal(rng), out); break;
    case kComplex64:
    case kComplex128:
    case kComplexExt: {
      const int32_t part = code == kComplex64 ? kFloat32 : (code == kComplex128 ? kFloat64 : kFloatExt);
      RandomValue(part, rng, out);
      RandomValue(part, rng, out + NumSize(part));
      break;
    }
    default: {
      // Mostly raw bits; sometimes small values near the narrow ranges.
      const uint64_t v = (bits & 3) == 0 ? (rng() % 600) - 300 : rng();
      std::memcpy(out, &v, static_cast<size_t>(NumSize(code)));
      break;
    }
  }
}

uint64_t TestSeed() {
  if (const char* s = std::getenv("VELLUM_TEST_SEED")) return std::strtoull(s, nullptr, 10);
  return std::random_device{}();
}

TEST(PXNumbersTest, PropertyEveryPairMatchesReferenceArithmetic) {
  ASSERT_EQ(std::fegetround(), FE_TONEAREST);
  const uint64_t seed = TestSeed();
  std::cout << "PXNumbersTest seed " << seed << " (set VELLUM_TEST_SEED to replay)\n";
  RecordProperty("seed", std::to_string(seed));
  std::mt19937_64 rng(seed);
  int failures = 0;
  for (int32_t src : kAllCodes) {
    for (int32_t dst : kAllCodes) {
      for (int i = 0; i < 400 && failures < 10; ++i) {
        uint8_t in[20] = {};
        uint8_t out[20] = {};
        RandomValue(src, rng, in);
        ASSERT_EQ(ConvertNum(src, in, dst, out), 0);
        // The modified codes behave as their base kinds.
        uint8_t outModified[20] = {};
        const int32_t modSrc = (src >= kUInt8 && src <= kUInt32) || src >= kFloat32 ? src | 0x10 : src;
        ASSERT_EQ(ConvertNum(modSrc, in, dst, outModified), 0);
        if (!Matches(Decode(src, in), dst, out) || std::memcmp(out, outModified, sizeof out) != 0) {
          ++failures;
          ADD_FAILURE() << "seed " << seed << ": code " << src << " -> " << dst << " mismatch";
        }
      }
    }
  }
}

}  // namespace
