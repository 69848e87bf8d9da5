// Numeric conversion through one wide intermediate: integers as 128-bit values (every 64-bit
// signed and unsigned value fits), floating values as long double. The 80-bit extended format
// is decoded and encoded in software so the same bytes mean the same value on every platform.
#include "runtime/PXNumbers.h"

#include <cmath>
#include <cstring>
#include <limits>

__extension__ typedef __int128 Int128;

namespace {

enum Code : int32_t {
  kInt8 = 0x01, kInt16, kInt32, kInt64, kUInt8, kUInt16, kUInt32, kUInt64,
  kFloat32, kFloat64, kFloatExt, kComplex64, kComplex128, kComplexExt
};

constexpr int32_t kModifier = 0x10;
constexpr int32_t kExtBias = 16383;
constexpr int32_t kExtMaxExponent = 0x7FFF;
constexpr uint64_t kExtIntegerBit = uint64_t{1} << 63;

struct Number {
  bool isInteger = false;
  Int128 integer = 0;
  long double re = 0;
  long double im = 0;
};

template <class T>
T Load(const void* p) {
  T v;
  std::memcpy(&v, p, sizeof v);
  return v;
}

template <class T>
void Store(void* p, T v) {
  std::memcpy(p, &v, sizeof v);
}

struct ExtendedParts {
  bool negative;
  int32_t exponent;  // biased
  uint64_t significand;
};

ExtendedParts SplitExtended(const uint8_t* ten) {
  uint64_t significand = 0;
  for (int i = 7; i >= 0; --i) significand = (significand << 8) | ten[i];
  const uint16_t top = static_cast<uint16_t>(ten[8] | (ten[9] << 8));
  return {(top & 0x8000) != 0, top & 0x7FFF, significand};
}

int32_t ClassifyExtended(const uint8_t* ten) {
  const ExtendedParts x = SplitExtended(ten);
  if (x.exponent == kExtMaxExponent)
    return x.significand == kExtIntegerBit ? kFloatClassInfinite : kFloatClassNaN;
  if (x.exponent == 0) return x.significand == 0 ? kFloatClassZero : kFloatClassFinite;
  return (x.significand & kExtIntegerBit) ? kFloatClassFinite : kFloatClassNaN;
}

int32_t ClassOf(long double v) {
  switch (std::fpclassify(v)) {
    case FP_ZERO: return kFloatClassZero;
    case FP_INFINITE: return kFloatClassInfinite;
    case FP_NAN: return kFloatClassNaN;
    default: return kFloatClassFinite;
  }
}

bool IntegerRange(int32_t base, Int128* lo, Int128* hi) {
  switch (base) {
    case kInt8: *lo = INT8_MIN; *hi = INT8_MAX; return true;
    case kInt16: *lo = INT16_MIN; *hi = INT16_MAX; return true;
    case kInt32: *lo = INT32_MIN; *hi = INT32_MAX; return true;
    case kInt64: *lo = INT64_MIN; *hi = INT64_MAX; return true;
    case kUInt8: *lo = 0; *hi = UINT8_MAX; return true;
    case kUInt16: *lo = 0; *hi = UINT16_MAX; return true;
    case kUInt32: *lo = 0; *hi = UINT32_MAX; return true;
    case kUInt64: *lo = 0; *hi = UINT64_MAX; return true;
    default: return false;
  }
}

// Rounds to nearest, ties to even, and saturates at [lo, hi]; NaN gives 0. Independent of the
// current floating-point rounding mode.
Int128 RoundToRange(long double x, Int128 lo, Int128 hi) {
  if (std::isnan(x)) return 0;
  constexpr long double kTwo64 = 18446744073709551616.0L;
  if (x >= kTwo64) return hi;
  if (x <= -kTwo64) return lo;
  long double f = std::floor(x);
  const long double fraction = x - f;  // exact: both lie in the same binade or below
  if (fraction > 0.5L || (fraction == 0.5L && std::fmod(f, 2.0L) != 0)) f += 1;
  const Int128 r = static_cast<Int128>(f);
  return r < lo ? lo : (r > hi ? hi : r);
}

bool Decode(int32_t base, const void* src, Number* n) {
  const auto* bytes = static_cast<const uint8_t*>(src);
  switch (base) {
    case kInt8: n->integer = Load<int8_t>(src); break;
    case kInt16: n->integer = Load<int16_t>(src); break;
    case kInt32: n->integer = Load<int32_t>(src); break;
    case kInt64: n->integer = Load<int64_t>(src); break;
    case kUInt8: n->integer = Load<uint8_t>(src); break;
    case kUInt16: n->integer = Load<uint16_t>(src); break;
    case kUInt32: n->integer = Load<uint32_t>(src); break;
    case kUInt64: n->integer = Load<uint64_t>(src); break;
    case kFloat32: n->re = Load<float>(src); return true;
    case kFloat64: n->re = Load<double>(src); return true;
    case kFloatExt: n->re = ExtendedToLongDouble(bytes); return true;
    case kComplex64:
      n->re = Load<float>(bytes);
      n->im = Load<float>(bytes + 4);
      return true;
    case kComplex128:
      n->re = Load<double>(bytes);
      n->im = Load<double>(bytes + 8);
      return true;
    case kComplexExt:
      n->re = ExtendedToLongDouble(bytes);
      n->im = ExtendedToLongDouble(bytes + 10);
      return true;
    default: return false;
  }
  n->isInteger = true;
  return true;
}

// The real part as the floating type T, rounding to nearest.
template <class T>
T RealAs(const Number& n) {
  return n.isInteger ? static_cast<T>(n.integer) : static_cast<T>(n.re);
}

void Encode(int32_t base, const Number& n, void* dst) {
  auto* bytes = static_cast<uint8_t*>(dst);
  Int128 lo = 0;
  Int128 hi = 0;
  if (IntegerRange(base, &lo, &hi)) {
    Int128 v = n.isInteger ? (n.integer < lo ? lo : (n.integer > hi ? hi : n.integer)) : RoundToRange(n.re, lo, hi);
    switch (base) {
      case kInt8: Store(dst, static_cast<int8_t>(v)); return;
      case kInt16: Store(dst, static_cast<int16_t>(v)); return;
      case kInt32: Store(dst, static_cast<int32_t>(v)); return;
      case kInt64: Store(dst, static_cast<int64_t>(v)); return;
      case kUInt8: Store(dst, static_cast<uint8_t>(v)); return;
      case kUInt16: Store(dst, static_cast<uint16_t>(v)); return;
      case kUInt32: Store(dst, static_cast<uint32_t>(v)); return;
      default: Store(dst, static_cast<uint64_t>(v)); return;
    }
  }
  switch (base) {
    case kFloat32: Store(dst, RealAs<float>(n)); return;
    case kFloat64: Store(dst, RealAs<double>(n)); return;
    case kFloatExt: LongDoubleToExtended(RealAs<long double>(n), bytes); return;
    case kComplex64:
      Store(bytes, RealAs<float>(n));
      Store(bytes + 4, static_cast<float>(n.im));
      return;
    case kComplex128:
      Store(bytes, RealAs<double>(n));
      Store(bytes + 8, static_cast<double>(n.im));
      return;
    default:
      LongDoubleToExtended(RealAs<long double>(n), bytes);
      LongDoubleToExtended(n.im, bytes + 10);
      return;
  }
}

}  // namespace

int32_t NumBaseCode(int32_t code) {
  if (code < 0 || code > 0xFF) return code;
  const bool modified = static_cast<uint8_t>(code - 1) < 30 && (code & kModifier) != 0;
  if (!modified) return code;
  const int32_t base = code & ~kModifier;
  // Only the unsigned integers (enumerations) and the floating kinds (units) carry it.
  const bool carries = (base >= kUInt8 && base <= kUInt32) || (base >= kFloat32 && base <= kComplexExt);
  return carries ? base : code;
}

int32_t NumSize(int32_t code) {
  static constexpr int32_t kSizes[] = {0, 1, 2, 4, 8, 1, 2, 4, 8, 4, 8, 10, 8, 16, 20};
  const int32_t base = NumBaseCode(code);
  return (base >= kInt8 && base <= kComplexExt) ? kSizes[base] : 0;
}

int32_t NumClass(int32_t code) {
  const int32_t base = NumBaseCode(code);
  if (base >= kInt8 && base <= kUInt64) return kNumClassInteger;
  if (base >= kFloat32 && base <= kFloatExt) return kNumClassReal;
  if (base >= kComplex64 && base <= kComplexExt) return kNumClassComplex;
  return kNumClassNone;
}

int32_t ConvertNum(int32_t srcCode, const void* src, int32_t dstCode, void* dst) {
  const int32_t from = NumBaseCode(srcCode);
  const int32_t to = NumBaseCode(dstCode);
  if (!src || !dst || NumClass(to) == kNumClassNone) return 1;
  Number n;
  if (!Decode(from, src, &n)) return 1;
  Encode(to, n, dst);
  return 0;
}

int32_t ClassifyFloatNumber(int32_t code, const void* value) {
  if (!value) return -1;
  switch (NumBaseCode(code)) {
    case kFloat32: return ClassOf(Load<float>(value));
    case kFloat64: return ClassOf(Load<double>(value));
    case kFloatExt: return ClassifyExtended(static_cast<const uint8_t*>(value));
    default: return -1;
  }
}

double DInfinity() { return std::numeric_limits<double>::infinity(); }

double DNegInfinity() { return -std::numeric_limits<double>::infinity(); }

long double ExtendedToLongDouble(const uint8_t* ten) {
  const ExtendedParts x = SplitExtended(ten);
  long double v = 0;
  switch (ClassifyExtended(ten)) {
    case kFloatClassZero: v = 0; break;
    case kFloatClassInfinite: v = std::numeric_limits<long double>::infinity(); break;
    case kFloatClassNaN: v = std::numeric_limits<long double>::quiet_NaN(); break;
    default: {
      // Denormals use the smallest exponent, without an implied integer bit.
      const int32_t exponent = (x.exponent == 0 ? 1 : x.exponent) - kExtBias - 63;
      v = std::ldexp(static_cast<long double>(x.significand), exponent);
      break;
    }
  }
  return x.negative ? -v : v;
}

void LongDoubleToExtended(long double v, uint8_t* ten) {
  const bool negative = std::signbit(v);
  uint32_t exponent = 0;
  uint64_t significand = 0;
  if (std::isnan(v)) {
    exponent = kExtMaxExponent;
    significand = kExtIntegerBit | (kExtIntegerBit >> 1);
  } else if (std::isinf(v)) {
    exponent = kExtMaxExponent;
    significand = kExtIntegerBit;
  } else if (v != 0) {
    int e = 0;
    const long double m = std::frexp(std::fabs(v), &e);  // |v| = m * 2^e, m in [0.5, 1)
    int32_t biased = e - 1 + kExtBias;
    if (biased >= kExtMaxExponent) {
      exponent = kExtMaxExponent;
      significand = kExtIntegerBit;
    } else if (biased <= 0) {
      significand = static_cast<uint64_t>(std::ldexp(std::fabs(v), kExtBias - 1 + 63));
      exponent = 0;
    } else {
      significand = static_cast<uint64_t>(std::ldexp(m, 64));
      exponent = static_cast<uint32_t>(biased);
    }
  }
  for (int i = 0; i < 8; ++i) ten[i] = static_cast<uint8_t>(significand >> (8 * i));
  const uint32_t top = exponent | (negative ? 0x8000u : 0u);
  ten[8] = static_cast<uint8_t>(top);
  ten[9] = static_cast<uint8_t>(top >> 8);
}
