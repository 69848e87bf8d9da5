// Exact binary fixed-point numbers: format conversion with overflow and quantization rules, exact
// arithmetic fitted into 64 bits, ordering, formats from ranges, and the text forms.
#include "FixedPoint/fxp.h"

#include <algorithm>
#include <atomic>
#include <cfloat>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstring>

namespace vellum {

using fxpstorage::BitLength;
using fxpstorage::CutToWordLength;
using fxpstorage::MagnitudeBits;
using fxpstorage::ShiftLeft;
using fxpstorage::UnsignedBigInteger;

// Builds values without the argument checks, for results that are valid by construction.
struct FXPAccess {
  static FXP Make(int32_t wl, int32_t iwl, bool isSigned, uint64_t bits) {
    return FXP(FXP::RawTag{}, wl, iwl, isSigned, bits);
  }
};

namespace {

// The assertion reports name the fixed-point library's own header, as the reporter expects.
constexpr const char* kAssertFile = "dep_mirror\\deps\\FixedPoint\\includes\\fxp";

constexpr const char* kWordLengthBelowOne = "m_wl >= 1";
constexpr const char* kWordLengthBelowOneMessage = "Wordlenth out of range";
constexpr const char* kWordLengthInvariant = "!(m_wl <= 0 || kMaxWordLength < m_wl)";
constexpr const char* kWordLengthMessage = "Wordlength out of range";
constexpr const char* kSignedInvariant =
    "!(m_bits.s < sBits(minValueBits()) || sBits(maxValueBits()) < m_bits.s)";
constexpr const char* kUnsignedInvariant = "maxValueBits() >= m_bits.u";
constexpr const char* kValueMessage = "Value out of range";
constexpr const char* kIwlInvariant = "!(m_iwl < FXPMinStoredIWL() || FXPMaxStoredIWL() < m_iwl)";
constexpr const char* kIwlMessage = "Integer word length out of range";
constexpr const char* kShouldntOverflowCondition = "oMode != kShouldntOverflow";
constexpr const char* kShouldntOverflowMessage = "Overflow though caller didn't think so.";
constexpr const char* kShouldntQuantizeCondition = "qMode != kShouldntQuantize";
constexpr const char* kShouldntQuantizeMessage = "Quantization possible though caller didn't think so.";
constexpr const char* kUnexpected = "false";
constexpr const char* kUnexpectedOverflowMode = "Unexpected Overflow Mode";
constexpr const char* kUnexpectedQuantizationMode = "Unexpected Quantization Mode";
constexpr const char* kUnexpectedArithmeticMode = "Unexpected quantization mode: ";
constexpr const char* kRangeCondition = "rangeAndDeltaAreValid";
constexpr const char* kRangeMessage = "Invalid range or step";
constexpr const char* kRangeSpecCondition = "rangeSpecIsValid";
constexpr const char* kRangeSpecMessage = "Malformed range specification";

constexpr int32_t kMaxIwl = FXPMaxStoredIWL();
constexpr int32_t kMinIwl = FXPMinStoredIWL();
constexpr int64_t kMinLsb = FXPMinStoredBitPos();

// Set once at start-up and read by every check; atomic so that a late install is still safe.
std::atomic<FXPAssertFunction> gAssertFunction{nullptr};

void Report(uint32_t line, const char* condition, const char* message) {
  if (FXPAssertFunction fn = gAssertFunction.load(std::memory_order_acquire)) fn(kAssertFile, line, condition, message);
}

int32_t CheckWordLength(int wl) {
  if (wl < 1) {
    Report(__LINE__, kWordLengthBelowOne, kWordLengthBelowOneMessage);
    return 1;
  }
  if (wl > FXPMaxWordLength()) {
    Report(__LINE__, kWordLengthInvariant, kWordLengthMessage);
    return FXPMaxWordLength();
  }
  return wl;
}

int32_t CheckIwl(int iwl) {
  if (iwl < kMinIwl || iwl > kMaxIwl) {
    Report(__LINE__, kIwlInvariant, kIwlMessage);
    return std::clamp(iwl, kMinIwl, kMaxIwl);
  }
  return iwl;
}

// Bits outside the format are cut to it, so that every later operation sees a valid value.
uint64_t CheckBits(uint64_t bits, int wl, bool isSigned) {
  const uint64_t cut = CutToWordLength(bits, wl, isSigned);
  if (cut != bits) Report(__LINE__, isSigned ? kSignedInvariant : kUnsignedInvariant, kValueMessage);
  return cut;
}

FXP Zero() { return FXPAccess::Make(1, 1, false, 0); }

// The largest magnitude an FXP can hold, for results beyond every format.
FXP Saturated(bool negative) {
  return negative ? FXPAccess::Make(64, kMaxIwl, true, uint64_t{1} << 63) : FXPAccess::Make(64, kMaxIwl, false, ~uint64_t{0});
}

// The stored bits as a two's-complement number.
FXPInt128 Extended(const FXP& x) {
  return x.isSigned() ? FXPInt128{static_cast<int64_t>(x.bits())} : FXPInt128{x.bits()};
}

uint64_t Magnitude(const FXP& x) { return x.isNegative() ? uint64_t{0} - x.bits() : x.bits(); }

int64_t FloorDiv(int64_t a, int64_t b) { return a >= 0 ? a / b : -((-a + b - 1) / b); }

enum class Rounding { Floor, Ceil, HalfUp, HalfEven, TowardZero };

// round(v / 2^k) by the rule; *inexact tells whether any bit was dropped. |v| < 2^127.
FXPInt128 RoundShift(FXPInt128 v, int64_t k, Rounding rule, bool* inexact) {
  if (k <= 0) {
    *inexact = false;
    return v;
  }
  if (k > 127) {
    // |v| < 2^127 <= 2^(k-1): strictly less than half a step.
    *inexact = v != 0;
    if (v == 0) return 0;
    const FXPInt128 floor = v < 0 ? -1 : 0;
    switch (rule) {
      case Rounding::Floor: return floor;
      case Rounding::Ceil: return floor + 1;
      case Rounding::HalfUp:
      case Rounding::HalfEven:
      case Rounding::TowardZero: return 0;
    }
    return 0;
  }
  const FXPInt128 q = v >> k;
  const FXPUInt128 rem = static_cast<FXPUInt128>(v) & ((FXPUInt128{1} << k) - 1);
  *inexact = rem != 0;
  if (rem == 0) return q;
  const FXPUInt128 half = FXPUInt128{1} << (k - 1);
  switch (rule) {
    case Rounding::Floor: return q;
    case Rounding::Ceil: return q + 1;
    case Rounding::HalfUp: return rem >= half ? q + 1 : q;
    case Rounding::HalfEven: return (rem > half || (rem == half && (q & 1) != 0)) ? q + 1 : q;
    case Rounding::TowardZero: return v < 0 ? q + 1 : q;
  }
  return q;
}

// The rounding rule of the arithmetic operations: modes 0, 1 and 5 floor. FitWide has already
// reported and replaced an unknown mode.
Rounding ArithmeticRounding(int qMode) {
  switch (qMode) {
    case FXP::kShouldntQuantize:
    case FXP::kTruncate:
    case FXP::kRoundTowardNegInf: return Rounding::Floor;
    case FXP::kRoundHalfUp: return Rounding::HalfUp;
    case FXP::kRoundTowardZero: return Rounding::TowardZero;
    case FXP::kRoundTowardPosInf: return Rounding::Ceil;
    default: return Rounding::HalfEven;
  }
}

void ReportArithmeticMode(int qMode) {
  char message[64];
  std::snprintf(message, sizeof message, "%s%d", kUnexpectedArithmeticMode, qMode);
  Report(__LINE__, kUnexpected, message);
}

// Fits v * 2^p (|v| < 2^127) into at most maxBits significant bits (sign included for a negative
// value), rounding by qMode as the arithmetic does, and gives it in its smallest format within the
// stored range.
FXP FitWide(FXPInt128 v, int64_t p, int qMode, int maxBits, bool* precisionLost, bool* saturated = nullptr) {
  bool lost = false;
  if (saturated) *saturated = false;
  if (static_cast<uint32_t>(qMode) > FXP::kRoundTowardPosInf) {
    ReportArithmeticMode(qMode);
    qMode = FXP::kConvergent;
  }
  if (v != 0) {
    const int significant = MagnitudeBits(v) + (v < 0 ? 1 : 0);
    int64_t drop = significant - maxBits;
    if (kMinLsb - p > drop) drop = kMinLsb - p;
    if (drop > 0) {
      v = RoundShift(v, drop, ArithmeticRounding(qMode), &lost);
      p += drop;
      // A carry out of the top leaves a power of two; the trailing zeros go below.
    }
  }
  if (v == 0) {
    if (precisionLost) *precisionLost = lost;
    return Zero();
  }
  const uint64_t low = static_cast<uint64_t>(v);
  const int trailing = low != 0 ? ntz(low) : 64 + ntz(static_cast<uint64_t>(static_cast<FXPUInt128>(v) >> 64));
  v >>= trailing;
  p += trailing;
  int64_t width = MagnitudeBits(v) + (v < 0 ? 1 : 0);
  int64_t iwl = p + width;
  if (iwl > kMaxIwl) {
    if (precisionLost) *precisionLost = true;
    if (saturated) *saturated = true;
    return Saturated(v < 0);
  }
  if (iwl < kMinIwl) {
    // Too small for the smallest format: keep redundant leading bits instead.
    width = kMinIwl - p;
    iwl = kMinIwl;
  }
  if (precisionLost) *precisionLost = lost;
  return FXPAccess::Make(static_cast<int32_t>(width), static_cast<int32_t>(iwl), v < 0, static_cast<uint64_t>(v));
}

// Exact order of a * 2^pa and b * 2^pb (each below 2^120 in magnitude).
int CompareDyadic(FXPInt128 a, int64_t pa, FXPInt128 b, int64_t pb) {
  if ((a < 0) != (b < 0)) return a < 0 ? -1 : 1;
  if (a == 0 || b == 0) {
    if (a == b) return 0;
    return a == 0 ? -1 : 1;  // both non-negative here
  }
  const int64_t ta = pa + MagnitudeBits(a);
  const int64_t tb = pb + MagnitudeBits(b);
  if (ta != tb) {
    // Values with a higher top lie wholly above (positive) or below (negative) the others.
    const bool aHigher = ta > tb;
    return (aHigher != (a < 0)) ? 1 : -1;
  }
  // Same top: the shift is at most the length of the longer word.
  if (pa > pb) a = ShiftLeft(a, static_cast<int>(pa - pb));
  if (pb > pa) b = ShiftLeft(b, static_cast<int>(pb - pa));
  return a < b ? -1 : (a > b ? 1 : 0);
}

struct Converted {
  uint64_t bits;
  bool overflowed;
};

// v * 2^sL (|v| < 2^120) into (wl, iwl, isSigned), the heart of every format conversion.
Converted Convert(FXPInt128 v, int64_t sL, int32_t wl, int32_t iwl, bool isSigned, int oMode, int qMode,
                  const FXP* lo, const FXP* hi) {
  Rounding rule = Rounding::HalfEven;
  bool reportQuantization = false;
  switch (qMode) {
    case FXP::kShouldntQuantize: reportQuantization = true; break;
    case FXP::kTruncate:
    case FXP::kRoundTowardNegInf: rule = Rounding::Floor; break;
    case FXP::kRoundHalfUp: rule = Rounding::HalfUp; break;
    case FXP::kConvergent: break;
    case FXP::kRoundTowardZero: rule = v < 0 ? Rounding::Ceil : Rounding::Floor; break;
    case FXP::kRoundTowardPosInf: rule = Rounding::Ceil; break;
    default: Report(__LINE__, kUnexpected, kUnexpectedQuantizationMode); break;
  }
  const bool saturate = oMode == FXP::kSaturate || oMode == FXP::kShouldntOverflow;
  if (!saturate && oMode != FXP::kWrap) Report(__LINE__, kUnexpected, kUnexpectedOverflowMode);

  const int64_t dL = int64_t{iwl} - wl;
  FXPInt128 m = v;
  int64_t p = sL;
  if (dL > sL) {
    bool inexact = false;
    m = RoundShift(v, dL - sL, rule, &inexact);
    p = dL;
    if (inexact && reportQuantization) Report(__LINE__, kShouldntQuantizeCondition, kShouldntQuantizeMessage);
  }

  bool fits = true;
  if (m != 0) {
    if (m < 0 && !isSigned)
      fits = false;
    else
      fits = p + MagnitudeBits(m) <= iwl - (isSigned ? 1 : 0);
  }
  // When it fits, the shift is below the word length.
  const auto aligned = [&] { return m == 0 ? uint64_t{0} : static_cast<uint64_t>(ShiftLeft(m, static_cast<int>(p - dL))); };

  if (saturate) {
    const FXP* limit = nullptr;
    bool below = false;
    if (lo != nullptr && CompareDyadic(m, p, Extended(*lo), lo->minBitPos()) < 0) {
      limit = lo;
      below = true;
    } else if (hi != nullptr && CompareDyadic(m, p, Extended(*hi), hi->minBitPos()) > 0) {
      limit = hi;
    } else if (fits) {
      return {aligned(), false};
    } else {
      below = m < 0;
    }
    if (oMode == FXP::kShouldntOverflow) Report(__LINE__, kShouldntOverflowCondition, kShouldntOverflowMessage);
    if (limit != nullptr) {
      // The limit itself, rounded inward and held within the format.
      const Converted c = Convert(Extended(*limit), limit->minBitPos(), wl, iwl, isSigned, FXP::kSaturate,
                                  below ? FXP::kRoundTowardPosInf : FXP::kRoundTowardNegInf, nullptr, nullptr);
      return {c.bits, true};
    }
    if (below) return {isSigned ? static_cast<uint64_t>(FXP::smin(wl)) : 0, true};
    return {isSigned ? static_cast<uint64_t>(FXP::smax(wl)) : FXP::umax(wl), true};
  }

  if (fits) return {aligned(), false};
  const int64_t shift = p - dL;
  const uint64_t word = shift >= 64 ? 0 : static_cast<uint64_t>(ShiftLeft(m, static_cast<int>(shift)));
  return {CutToWordLength(word, wl, isSigned), true};
}

// A value as a two's-complement number and the position of its lowest bit, for exact steps.
struct Raw {
  FXPInt128 v;
  int64_t pos;
};
Raw ToRaw(const FXP& x) { return {Extended(x), x.minBitPos()}; }
int Compare(const Raw& a, const Raw& b) { return CompareDyadic(a.v, a.pos, b.v, b.pos); }

// Smallest format holding min ... max in steps of delta, all exact.
bool DeriveFormat(const FXP& min, const FXP& max, const FXP& delta, bool* isSigned, int* wl, int* iwl) {
  const Raw d = ToRaw(delta);
  Raw lo = ToRaw(min);
  Raw hi = ToRaw(max);
  if (d.v <= 0 || Compare(lo, hi) > 0) return false;
  // 2^-fwl is the largest power of two not above delta.
  const int64_t fwl = -(d.pos + MagnitudeBits(d.v) - 1);
  const bool sgn = lo.v < 0;
  const Raw negDelta{-d.v, d.pos};
  if (hi.v <= 0 && Compare(lo, negDelta) >= 0) lo = negDelta;
  if (hi.v > 0 && Compare(hi, d) <= 0) hi = d;

  // Bits for max: the length of ceil(max * 2^fwl), so that max <= (2^wl - 1) * 2^-fwl.
  int64_t bitsForMax = 0;
  if (hi.v > 0) {
    const int64_t e = hi.pos + fwl;
    if (e >= 0) {
      bitsForMax = MagnitudeBits(hi.v) + e;
    } else if (e <= -120) {
      bitsForMax = 1;
    } else {
      const int k = static_cast<int>(-e);
      const FXPInt128 up = (hi.v >> k) + ((static_cast<FXPUInt128>(hi.v) & ((FXPUInt128{1} << k) - 1)) != 0 ? 1 : 0);
      bitsForMax = MagnitudeBits(up);
    }
  }
  int64_t width = 0;
  const Raw negLo{-lo.v, lo.pos};
  if (lo.v >= 0 || Compare(negLo, hi) <= 0) {
    width = bitsForMax + (sgn ? 1 : 0);
  } else {
    // Bits for min: -2^(wl - fwl - 1) <= min. The maximum must fit as well.
    const FXPUInt128 magnitude = static_cast<FXPUInt128>(-lo.v);
    const int length = BitLength(magnitude);
    const int64_t ceilLog2 = lo.pos + ((magnitude & (magnitude - 1)) == 0 ? length - 1 : length);
    width = std::max<int64_t>(fwl + 1 + ceilLog2, bitsForMax + (sgn ? 1 : 0));
  }
  width = std::max<int64_t>(width, 1);
  *isSigned = sgn;
  *wl = static_cast<int>(width);
  *iwl = static_cast<int>(width - fwl);
  return true;
}

// The derived format with the word length capped at 64 and the integer word length kept.
FXPMeta CappedMeta(bool isSigned, int wl, int iwl) {
  return FXPMeta(std::min(wl, static_cast<int>(FXPMaxWordLength())), std::clamp(iwl, kMinIwl, kMaxIwl), isSigned);
}

FXPMeta MetaForRange(const FXP& min, const FXP& max, const FXP& delta, bool* valid) {
  bool isSigned = true;
  int wl = 64;
  int iwl = 64;
  *valid = DeriveFormat(min, max, delta, &isSigned, &wl, &iwl);
  if (!*valid) {
    Report(__LINE__, kRangeCondition, kRangeMessage);
    return FXPMeta(64, 64, true);
  }
  return CappedMeta(isSigned, wl, iwl);
}

// The value sign * magnitude * 2^pos rounded to a double: direction < 0 toward -inf, > 0 toward
// +inf, 0 to nearest with ties to even.
double ToDouble(bool negative, uint64_t magnitude, int64_t pos, int direction) {
  if (magnitude == 0) return 0.0;
  enum class Way { Nearest, Up, Down } way = Way::Nearest;
  if (direction != 0) way = ((direction > 0) != negative) ? Way::Up : Way::Down;
  const int64_t top = pos + (64 - nlz(magnitude));
  const int64_t lsb = std::max<int64_t>(top - 53, -1074);
  double r = 0.0;
  if (lsb <= pos) {
    r = std::ldexp(static_cast<double>(magnitude), static_cast<int>(std::min<int64_t>(pos, 1 << 20)));
  } else {
    const int64_t k = lsb - pos;
    uint64_t q = 0;
    bool up = false;
    if (k >= 64) {
      if (way == Way::Up) up = true;
      if (way == Way::Nearest && k == 64) up = magnitude > (uint64_t{1} << 63);
    } else {
      q = magnitude >> k;
      const uint64_t rem = magnitude & ((uint64_t{1} << k) - 1);
      const uint64_t half = uint64_t{1} << (k - 1);
      if (way == Way::Up) up = rem != 0;
      if (way == Way::Nearest) up = rem > half || (rem == half && (q & 1) != 0);
    }
    q += up ? 1 : 0;
    r = std::ldexp(static_cast<double>(q), static_cast<int>(std::min<int64_t>(lsb, 1 << 20)));
  }
  if (std::isinf(r) && way == Way::Down) r = DBL_MAX;
  return negative ? -r : r;
}

const char* SkipBlanks(const char* p) {
  while (*p == ' ' || *p == '\t') ++p;
  return p;
}

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

// Reads an integer as atoi does (blanks, sign, digits), saturating; false when there is no digit.
bool ReadInt(const char** cursor, int64_t* value) {
  const char* p = SkipBlanks(*cursor);
  bool negative = false;
  if (*p == '+' || *p == '-') negative = *p++ == '-';
  if (!IsDigit(*p)) return false;
  int64_t v = 0;
  for (; IsDigit(*p); ++p) v = std::min<int64_t>(v * 10 + (*p - '0'), int64_t{1} << 40);
  *value = negative ? -v : v;
  *cursor = p;
  return true;
}

// Reads a finite decimal number (blanks, an optional '+', then the usual forms).
bool ReadDouble(const char** cursor, double* value) {
  const char* p = SkipBlanks(*cursor);
  if (*p == '+' && p[1] != '-') ++p;
  const char* last = p + std::strlen(p);
  double d = 0;
  const std::from_chars_result r = std::from_chars(p, last, d, std::chars_format::general);
  if (r.ec != std::errc() || !std::isfinite(d)) return false;
  *value = d;
  *cursor = r.ptr;
  return true;
}

// Sign letter of a format tag: 's' or "+/-" signed; 'u' or '+' unsigned (strict form).
bool ReadTagSign(const char** cursor, bool* isSigned) {
  const char* p = *cursor;
  if (std::strncmp(p, "+/-", 3) == 0) {
    *isSigned = true;
    *cursor = p + 3;
    return true;
  }
  if (*p == 's' || *p == 'u' || *p == '+') {
    *isSigned = *p == 's';
    *cursor = p + 1;
    return true;
  }
  return false;
}

bool ParseRangeSpec(const char* spec, bool* isSigned, int* wl, int* iwl, const char** end) {
  *isSigned = true;
  *wl = 64;
  *iwl = 64;
  if (end) *end = spec;
  if (spec == nullptr) return false;
  const char* p = spec;
  while (*p != 0 && *p != '<' && *p != '[' && *p != '(') ++p;
  if (*p == 0) return false;
  bool sgn = true;
  int w = 64;
  int i = 64;
  if (*p == '<') {
    ++p;
    if (std::strncmp(p, "+/-", 3) == 0) {
      p += 3;
    } else if (*p != 0 && *p != ',' && *p != '>') {
      sgn = *p == 's';
      ++p;
    }
    if (*p == ',') {
      const char* q = p + 1;
      int64_t v = 0;
      if (ReadInt(&q, &v)) {
        if (v < 1) return false;
        w = static_cast<int>(std::min<int64_t>(v, FXPMaxWordLength()));
        p = q;
        if (*p == ',') {
          q = p + 1;
          if (ReadInt(&q, &v)) {
            if (v < kMinIwl || v > kMaxIwl) return false;
            i = static_cast<int>(v);
            p = q;
          }
        }
      }
    }
    if (*p == '>') ++p;
  } else {
    const bool excludeMin = *p == '(';
    ++p;
    double lo = 0;
    double hi = 0;
    double step = 0;
    if (!ReadDouble(&p, &lo)) return false;
    p = SkipBlanks(p);
    if (*p != ',') return false;
    ++p;
    if (!ReadDouble(&p, &hi)) return false;
    p = SkipBlanks(p);
    if (*p != ']' && *p != ')') return false;
    const bool excludeMax = *p == ')';
    p = SkipBlanks(p + 1);
    if (*p != ':') return false;
    ++p;
    if (!ReadDouble(&p, &step) || !(step > 0)) return false;
    const FXP delta(step);
    FXP min(lo);
    FXP max(hi);
    if (excludeMin) min = min.add(delta, FXP::kRoundTowardPosInf);
    if (excludeMax) max = max.sub(delta, FXP::kRoundTowardNegInf);
    if (!DeriveFormat(min, max, delta, &sgn, &w, &i)) return false;
    w = std::min(w, static_cast<int>(FXPMaxWordLength()));
    if (i < kMinIwl || i > kMaxIwl) return false;
  }
  *isSigned = sgn;
  *wl = w;
  *iwl = i;
  if (end) *end = p;
  return true;
}

// ----- Decimal text -----

// An exact decimal: digits (no leading or trailing zeros; empty for zero) times 10^exponent.
struct Decimal {
  bool negative = false;
  std::string digits;
  int64_t exponent = 0;
};

void StripTrailingZeros(Decimal* d) {
  size_t n = d->digits.size();
  while (n > 0 && d->digits[n - 1] == '0') --n;
  d->exponent += static_cast<int64_t>(d->digits.size() - n);
  d->digits.resize(n);
}

Decimal ExactDecimal(const FXP& x) {
  Decimal d;
  if (x.isZero()) return d;
  d.negative = x.isNegative();
  UnsignedBigInteger n(Magnitude(x));
  const int64_t pos = x.minBitPos();
  if (pos >= 0) {
    n.ShiftLeft(static_cast<size_t>(pos));
  } else {
    // m * 2^-k = m * 5^k / 10^k
    n.MultiplyByPowerOfFive(-pos);
    d.exponent = pos;
  }
  d.digits = n.ToDecimal();
  StripTrailingZeros(&d);
  return d;
}

// Rounds to `count` significant digits, ties to even.
void RoundDecimal(Decimal* d, int count) {
  if (count <= 0 || d->digits.size() <= static_cast<size_t>(count)) return;
  const size_t keep = static_cast<size_t>(count);
  const char first = d->digits[keep];
  bool rest = false;
  for (size_t i = keep + 1; i < d->digits.size(); ++i) rest = rest || d->digits[i] != '0';
  const bool odd = ((d->digits[keep - 1] - '0') & 1) != 0;
  const bool up = first > '5' || (first == '5' && (rest || odd));
  d->exponent += static_cast<int64_t>(d->digits.size() - keep);
  d->digits.resize(keep);
  if (up) {
    size_t i = keep;
    while (i > 0 && d->digits[i - 1] == '9') d->digits[--i] = '0';
    if (i == 0)
      d->digits.insert(d->digits.begin(), '1');
    else
      ++d->digits[i - 1];
  }
  StripTrailingZeros(d);
}

std::string PlainText(const Decimal& d, char point) {
  if (d.digits.empty()) return "0";
  std::string s = d.negative ? "-" : "";
  const int64_t n = static_cast<int64_t>(d.digits.size());
  if (d.exponent >= 0) {
    s += d.digits;
    s.append(static_cast<size_t>(d.exponent), '0');
  } else if (-d.exponent < n) {
    s.append(d.digits, 0, static_cast<size_t>(n + d.exponent));
    s += point;
    s.append(d.digits, static_cast<size_t>(n + d.exponent), std::string::npos);
  } else {
    s += '0';
    s += point;
    s.append(static_cast<size_t>(-d.exponent - n), '0');
    s += d.digits;
  }
  return s;
}

std::string ScientificText(const Decimal& d, char point) {
  if (d.digits.empty()) return "0e+0";
  std::string s = d.negative ? "-" : "";
  s += d.digits[0];
  if (d.digits.size() > 1) {
    s += point;
    s.append(d.digits, 1, std::string::npos);
  }
  const int64_t e = d.exponent + static_cast<int64_t>(d.digits.size()) - 1;
  s += e < 0 ? "e-" : "e+";
  s += std::to_string(e < 0 ? -e : e);
  return s;
}

std::string FormatTag(const FXPMeta& f) {
  return std::string("<") + (f.isSigned() ? "s," : "u,") + std::to_string(f.wl()) + "," + std::to_string(f.iwl()) + ">";
}

int CopyOut(const std::string& s, int size, char* buf) {
  if (buf != nullptr && size >= 1) {
    const size_t n = std::min(s.size(), static_cast<size_t>(size - 1));
    std::memcpy(buf, s.data(), n);
    buf[n] = 0;
  }
  return static_cast<int>(s.size() + 1);
}

// Beyond this many significant digits the rest only tells whether it is zero: every tie or step
// of a stored format has fewer significant digits, so the rounding cannot change.
constexpr size_t kMaxParsedDigits = 50000;

struct DecimalText {
  Decimal value;
  bool sticky = false;  // a non-zero digit beyond those kept
  const char* end = nullptr;
};

bool ScanDecimal(const char* text, DecimalText* out) {
  const char* p = SkipBlanks(text);
  bool negative = false;
  if (*p == '+' || *p == '-') negative = *p++ == '-';
  const char* intBegin = p;
  while (IsDigit(*p)) ++p;
  const char* intEnd = p;
  const char* fracBegin = p;
  const char* fracEnd = p;
  if ((*p == '.' || *p == ',') && IsDigit(p[1])) {
    fracBegin = ++p;
    while (IsDigit(*p)) ++p;
    fracEnd = p;
  }
  if (intBegin == intEnd && fracBegin == fracEnd) return false;
  int64_t exponent = 0;
  if (*p == 'e' || *p == 'E') {
    const char* q = p + 1;
    bool expNegative = false;
    if (*q == '+' || *q == '-') expNegative = *q++ == '-';
    if (IsDigit(*q)) {
      for (; IsDigit(*q); ++q) exponent = std::min<int64_t>(exponent * 10 + (*q - '0'), 1000000000);
      if (expNegative) exponent = -exponent;
      p = q;
    }
  }
  out->end = p;
  Decimal& d = out->value;
  d.negative = negative;
  d.exponent = exponent - (fracEnd - fracBegin);
  bool sticky = false;
  const auto take = [&](const char* b, const char* e) {
    for (const char* c = b; c != e; ++c) {
      if (d.digits.empty() && *c == '0') continue;
      if (d.digits.size() < kMaxParsedDigits) {
        d.digits += *c;
      } else {
        sticky = sticky || *c != '0';
        ++d.exponent;
      }
    }
  };
  take(intBegin, intEnd);
  take(fracBegin, fracEnd);
  StripTrailingZeros(&d);
  out->sticky = sticky;
  return true;
}

// floor(|value| / 2^g) and whether it was inexact; the caller keeps the quotient below 2^120.
FXPUInt128 ScaledQuotient(const DecimalText& t, int64_t g, bool* inexact) {
  UnsignedBigInteger num;
  int64_t e = t.value.exponent;
  for (size_t i = 0; i < t.value.digits.size(); i += 9) {
    const size_t n = std::min<size_t>(9, t.value.digits.size() - i);
    uint32_t chunk = 0;
    uint32_t scale = 1;
    for (size_t j = 0; j < n; ++j) {
      chunk = chunk * 10 + static_cast<uint32_t>(t.value.digits[i + j] - '0');
      scale *= 10;
    }
    num.MultiplySmall(scale);
    num.AddSmall(chunk);
  }
  if (t.sticky) {
    // A trailing 1 stands for the non-zero digits dropped: strictly between, on no tie.
    num.MultiplySmall(10);
    num.AddSmall(1);
    --e;
  }
  UnsignedBigInteger den(1);
  if (e >= 0)
    num.MultiplyByPowerOfFive(e);
  else
    den.MultiplyByPowerOfFive(-e);
  const int64_t twos = e - g;
  if (twos >= 0)
    num.ShiftLeft(static_cast<size_t>(twos));
  else
    den.ShiftLeft(static_cast<size_t>(-twos));
  return UnsignedBigInteger::DivideBounded(std::move(num), std::move(den), inexact);
}

// Bounds on the binary size of a non-zero decimal: 2^low <= |value| < 2^high.
void BinaryBounds(const Decimal& d, int64_t* low, int64_t* high) {
  constexpr double kLog2Of10 = 3.3219280948873623;
  const double x = static_cast<double>(d.exponent + static_cast<int64_t>(d.digits.size()) - 1);
  *low = static_cast<int64_t>(std::floor(x * kLog2Of10)) - 1;
  *high = static_cast<int64_t>(std::ceil((x + 1) * kLog2Of10)) + 1;
}

FXPInt128 Signed(bool negative, FXPUInt128 magnitude) {
  const FXPInt128 m = static_cast<FXPInt128>(magnitude);
  return negative ? -m : m;
}

// The value of t in (wl, iwl, isSigned), rounded by qMode; false when it does not fit.
bool DecimalIntoFormat(const DecimalText& t, int32_t wl, int32_t iwl, bool isSigned, int qMode, uint64_t* bits) {
  if (t.value.digits.empty()) {
    *bits = 0;
    return true;
  }
  int64_t low = 0;
  int64_t high = 0;
  BinaryBounds(t.value, &low, &high);
  if (low > int64_t{iwl} + 1) return false;
  const int64_t g = int64_t{iwl} - wl - 2;
  FXPInt128 v = 0;
  int64_t pos = g;
  if (high <= g) {
    // Below a quarter step: any such value rounds alike.
    v = t.value.negative ? -1 : 1;
    pos = g - 1;
  } else {
    bool inexact = false;
    const FXPUInt128 q = ScaledQuotient(t, g, &inexact);
    v = Signed(t.value.negative, q | (inexact ? 1 : 0));
  }
  const Converted c = Convert(v, pos, wl, iwl, isSigned, FXP::kSaturate, qMode, nullptr, nullptr);
  *bits = c.bits;
  return !c.overflowed;
}

// Tag "<s,wl,iwl>" in its strict form.
bool ReadFormatTag(const char** cursor, bool* isSigned, int* wl, int* iwl) {
  const char* p = *cursor;
  if (*p != '<') return false;
  ++p;
  if (!ReadTagSign(&p, isSigned) || *p != ',') return false;
  ++p;
  if (!IsDigit(*p)) return false;
  int64_t w = 0;
  if (!ReadInt(&p, &w) || w < 1 || w > FXPMaxWordLength() || *p != ',') return false;
  ++p;
  if (!IsDigit(*p) && !(*p == '-' && IsDigit(p[1]))) return false;
  int64_t i = 0;
  if (!ReadInt(&p, &i) || i < kMinIwl || i > kMaxIwl || *p != '>') return false;
  *wl = static_cast<int>(w);
  *iwl = static_cast<int>(i);
  *cursor = p + 1;
  return true;
}

// ----- Binary, octal and hexadecimal text -----

int DigitValue(char c, int bitsPerDigit) {
  int v = -1;
  if (c >= '0' && c <= '9') v = c - '0';
  if (c >= 'a' && c <= 'f') v = c - 'a' + 10;
  if (c >= 'A' && c <= 'F') v = c - 'A' + 10;
  return v >= 0 && v < (1 << bitsPerDigit) ? v : -1;
}

FXP FromRadix(int bitsPerDigit, const FXPMeta& f, const char* text, const char** end) {
  const FXP zero = FXPAccess::Make(f.wl(), f.iwl(), f.isSigned(), 0);
  if (end) *end = text;
  if (text == nullptr) return zero;
  const int k = bitsPerDigit;
  const char* p = text;
  const char* intBegin = p;
  while (DigitValue(*p, k) >= 0) ++p;
  const char* intEnd = p;
  const char* fracBegin = p;
  const char* fracEnd = p;
  const bool hasPoint = (*p == '.' || *p == ',') && DigitValue(p[1], k) >= 0;
  if (hasPoint) {
    fracBegin = ++p;
    while (DigitValue(*p, k) >= 0) ++p;
    fracEnd = p;
  }
  const int64_t nInt = intEnd - intBegin;
  const int64_t nFrac = fracEnd - fracBegin;
  if (nInt + nFrac == 0) return zero;
  const int64_t lsb = f.minBitPos();
  const int64_t msb = f.maxBitPos();
  const int64_t lastIndex = hasPoint ? -nFrac : std::min<int64_t>(FloorDiv(lsb, k), 0);
  const int64_t firstIndex = lastIndex + nInt + nFrac - 1;
  const char first = nInt > 0 ? *intBegin : *fracBegin;
  const int sign = f.isSigned() ? (DigitValue(first, k) >> (k - 1)) & 1 : 0;
  uint64_t word = 0;
  int64_t index = firstIndex;
  const auto take = [&](const char* b, const char* e) {
    for (const char* c = b; c != e; ++c, --index) {
      const int v = DigitValue(*c, k);
      for (int j = k - 1; j >= 0; --j) {
        const int bit = (v >> j) & 1;
        const int64_t pos = index * k + j;
        if (pos > msb || (pos == msb && f.isSigned())) {
          if (bit != sign) return false;
          if (pos > msb) continue;
        }
        if (pos < lsb) {
          if (bit != 0) return false;
          continue;
        }
        word |= static_cast<uint64_t>(bit) << (pos - lsb);
      }
    }
    return true;
  };
  if (!take(intBegin, intEnd) || !take(fracBegin, fracEnd)) return zero;
  const int64_t textTop = firstIndex * k + k - 1;
  if (sign != 0 && textTop < msb) {
    // The positions above the text repeat its sign.
    const int64_t from = std::max(textTop + 1, lsb) - lsb;
    word |= ~uint64_t{0} << from;
  }
  if (end) *end = p;
  return FXPAccess::Make(f.wl(), f.iwl(), f.isSigned(), CutToWordLength(word, f.wl(), f.isSigned()));
}

}  // namespace

// ----- FXPMeta -----

FXPMeta::FXPMeta(int wl, int iwl, bool isSigned) : wl_(CheckWordLength(wl)), iwl_(CheckIwl(iwl)), signed_(isSigned) {}

FXPMeta::FXPMeta(double min, double max, double delta) {
  bool isSigned = true;
  int wl = 64;
  int iwl = 64;
  if (!signAndLengthsForRangeAndDeltaF64(min, max, delta, &isSigned, &wl, &iwl)) {
    Report(__LINE__, kRangeCondition, kRangeMessage);
    isSigned = true;
    wl = 64;
    iwl = 64;
  }
  *this = CappedMeta(isSigned, wl, iwl);
}

double FXPMeta::deltaF64() const { return FXP::powerOf2(iwl_ - wl_); }
double FXPMeta::scaleF64() const { return FXP::powerOf2(wl_ - iwl_); }

double FXPMeta::rangeMaxF64(int roundDirection) const {
  const uint64_t top = signed_ ? static_cast<uint64_t>(FXP::smax(wl_)) : FXP::umax(wl_);
  return ToDouble(false, top, minBitPos(), roundDirection);
}

double FXPMeta::rangeMinF64(int roundDirection) const {
  if (!signed_) return 0.0;
  return ToDouble(true, uint64_t{1} << (wl_ - 1), minBitPos(), roundDirection);
}

bool FXPMeta::signAndLengthsForRangeAndDeltaF64(double min, double max, double delta, bool* isSigned, int* wl,
                                                int* iwl) {
  if (!std::isfinite(min) || !std::isfinite(max) || !std::isfinite(delta) || !(delta > 0) || min > max)
    return false;
  return DeriveFormat(FXP(min), FXP(max), FXP(delta), isSigned, wl, iwl);
}

// ----- FXP construction -----

FXP::FXP(int64_t v) : FXP(RawTag{}, 64, 64, true, static_cast<uint64_t>(v)) {}
FXP::FXP(uint64_t v) : FXP(RawTag{}, 64, 64, false, v) {}

FXP::FXP(int64_t bits, int wl, int iwl) {
  wl_ = CheckWordLength(wl);
  iwl_ = CheckIwl(iwl);
  signed_ = true;
  bits_ = CheckBits(static_cast<uint64_t>(bits), wl_, true);
}

FXP::FXP(uint64_t bits, int wl, int iwl, bool isSigned) {
  wl_ = CheckWordLength(wl);
  iwl_ = CheckIwl(iwl);
  signed_ = isSigned;
  bits_ = CheckBits(bits, wl_, isSigned);
}

FXP::FXP(double d) {
  if (std::isnan(d) || d == 0) return;
  if (std::isinf(d)) {
    *this = FXPAccess::Make(64, FXPMetaMaxIWL(), d < 0, d < 0 ? uint64_t{1} << 63 : ~uint64_t{0});
    return;
  }
  int e = 0;
  const double m = std::frexp(std::fabs(d), &e);
  const uint64_t significand = static_cast<uint64_t>(std::ldexp(m, 64));
  const int trailing = ntz(significand);
  const uint64_t b = significand >> trailing;
  const int wl = 64 - trailing;
  if (d > 0)
    *this = FXPAccess::Make(wl, e, false, b);
  else if (b == 1)
    *this = FXPAccess::Make(1, e, true, ~uint64_t{0});
  else
    *this = FXPAccess::Make(wl + 1, e + 1, true, uint64_t{0} - b);
}

FXP::FXP(const FXP& src, int wl, int iwl, bool isSigned, OverflowMode oMode, QuantizationMode qMode,
         const FXP* min, const FXP* max, bool* overflowed) {
  wl_ = CheckWordLength(wl);
  iwl_ = CheckIwl(iwl);
  signed_ = isSigned;
  const Converted c = Convert(Extended(src), src.minBitPos(), wl_, iwl_, signed_, oMode, qMode, min, max);
  bits_ = c.bits;
  if (overflowed) *overflowed = c.overflowed;
}

FXP::FXP(const FXP& src, const char* rangeSpec, OverflowMode oMode, QuantizationMode qMode) {
  bool isSigned = true;
  int wl = 64;
  int iwl = 64;
  if (!ParseRangeSpec(rangeSpec, &isSigned, &wl, &iwl, nullptr)) Report(__LINE__, kRangeSpecCondition, kRangeSpecMessage);
  *this = FXP(src, wl, iwl, isSigned, oMode, qMode);
}

FXP::FXP(const FXP& src, const FXP& rangeMin, const FXP& rangeMax, const FXP& delta, OverflowMode oMode,
         QuantizationMode qMode) {
  bool valid = false;
  const FXPMeta f = MetaForRange(rangeMin, rangeMax, delta, &valid);
  *this = FXP(src, f.wl(), f.iwl(), f.isSigned(), oMode, qMode, valid ? &rangeMin : nullptr,
              valid ? &rangeMax : nullptr);
}

FXP::FXP(uint64_t bits, const FXP& rangeMin, const FXP& rangeMax, const FXP& delta, OverflowMode oMode,
         QuantizationMode qMode, bool* overflowed) {
  bool valid = false;
  const FXPMeta f = MetaForRange(rangeMin, rangeMax, delta, &valid);
  const FXP raw = FXPAccess::Make(f.wl(), f.iwl(), f.isSigned(), CutToWordLength(bits, f.wl(), f.isSigned()));
  *this = FXP(raw, f.wl(), f.iwl(), f.isSigned(), oMode, qMode, valid ? &rangeMin : nullptr,
              valid ? &rangeMax : nullptr, overflowed);
}

// ----- Arithmetic -----

namespace {

// Places x * 2^px at window position w; bits below the window collapse into its lowest bit (set
// when any of them was), which keeps every later rounding decision exact.
FXPInt128 Align(FXPInt128 x, int64_t px, int64_t w) {
  if (px >= w) return ShiftLeft(x, static_cast<int>(px - w));
  const int64_t d = w - px;
  if (d > 126) return x < 0 ? -1 : (x != 0 ? 1 : 0);
  const FXPInt128 q = x >> d;
  const bool dropped = (static_cast<FXPUInt128>(x) & ((FXPUInt128{1} << d) - 1)) != 0;
  return dropped ? (q | 1) : q;
}

FXP AddWide(FXPInt128 a, int64_t pa, FXPInt128 b, int64_t pb, int qMode, bool* precisionLost) {
  const int64_t gap = pa - pb;
  if (gap >= -62 && gap <= 62) {
    // Binary points close together: the exact sum fits one 128-bit word.
    const int64_t w = gap >= 0 ? pb : pa;
    return FitWide(ShiftLeft(a, static_cast<int>(pa - w)) + ShiftLeft(b, static_cast<int>(pb - w)), w, qMode, 64,
                   precisionLost);
  }
  if (a == 0) return FitWide(b, pb, qMode, 64, precisionLost);
  if (b == 0) return FitWide(a, pa, qMode, 64, precisionLost);
  // A 126-bit window under the larger operand's top holds the sum; the smaller operand can only
  // fall below it when it is too small to matter beyond its sticky bit.
  const int64_t top = std::max(pa + MagnitudeBits(a), pb + MagnitudeBits(b));
  const int64_t w = std::max(std::min(pa, pb), top - 125);
  return FitWide(Align(a, pa, w) + Align(b, pb, w), w, qMode, 64, precisionLost);
}

}  // namespace

FXP FXP::add(const FXP& other, QuantizationMode qMode, bool* precisionLost) const {
  return AddWide(Extended(*this), minBitPos(), Extended(other), other.minBitPos(), qMode, precisionLost);
}

FXP FXP::sub(const FXP& other, QuantizationMode qMode, bool* precisionLost) const {
  return AddWide(Extended(*this), minBitPos(), -Extended(other), other.minBitPos(), qMode, precisionLost);
}

FXP FXP::mul(const FXP& other, QuantizationMode qMode, bool* precisionLost) const {
  int64_t p = int64_t{minBitPos()} + other.minBitPos();
  if (!signed_ && !other.signed_) {
    FXPUInt128 product = static_cast<FXPUInt128>(bits_) * other.bits_;
    if ((product >> 127) != 0) {
      // One bit more than a signed 128-bit word holds: fold the lowest into a sticky bit.
      product = (product >> 1) | (product & 1);
      ++p;
    }
    return FitWide(static_cast<FXPInt128>(product), p, qMode, 64, precisionLost);
  }
  return FitWide(Extended(*this) * Extended(other), p, qMode, 64, precisionLost);
}

FXP FXP::operator-() const {
  if (signed_) {
    const int64_t b = static_cast<int64_t>(bits_);
    if (b == smin(wl_)) return FXPAccess::Make(wl_, iwl_, false, uint64_t{1} << (wl_ - 1));
    return FXPAccess::Make(wl_, iwl_, b >= 0, uint64_t{0} - bits_);
  }
  if (bits_ == 0) return *this;
  if (wl_ < 64) {
    if (iwl_ + 1 > kMaxIwl) return FitWide(-FXPInt128{bits_}, minBitPos(), kConvergent, 64, nullptr);
    return FXPAccess::Make(wl_ + 1, iwl_ + 1, true, uint64_t{0} - bits_);
  }
  if (bits_ < (uint64_t{1} << 63)) return FXPAccess::Make(64, iwl_, true, uint64_t{0} - bits_);
  // 65 bits would be needed: one position coarser, the lowest bit rounded to even.
  if (iwl_ + 1 > kMaxIwl) return Saturated(true);
  uint64_t half = bits_ >> 1;
  if ((bits_ & 1) != 0 && (half & 1) != 0) ++half;
  return FXPAccess::Make(64, iwl_ + 1, true, uint64_t{0} - half);
}

FXP FXP::abs() const { return isNegative() ? -*this : *this; }

FXP FXP::addDelta() const {
  if (signed_) {
    if (static_cast<int64_t>(bits_) < smax(wl_)) return FXPAccess::Make(wl_, iwl_, true, bits_ + 1);
    return FXPAccess::Make(1, iwl_, false, 1);
  }
  if (bits_ < umax(wl_)) return FXPAccess::Make(wl_, iwl_, false, bits_ + 1);
  return FitWide(1, iwl_, kConvergent, 64, nullptr);
}

FXP FXP::deltaValue() const { return FitWide(1, minBitPos(), kConvergent, 64, nullptr); }
FXP FXP::scaleValue() const { return FitWide(1, int64_t{wl_} - iwl_, kConvergent, 64, nullptr); }

FXP FXP::maxValue() const {
  return FXPAccess::Make(wl_, iwl_, signed_, signed_ ? static_cast<uint64_t>(smax(wl_)) : umax(wl_));
}

FXP FXP::minValue() const {
  return FXPAccess::Make(wl_, iwl_, signed_, signed_ ? static_cast<uint64_t>(smin(wl_)) : 0);
}

FXP FXP::fracValue() const {
  const int64_t lsb = minBitPos();
  if (lsb >= 0) return Zero();
  const uint64_t m = Magnitude(*this);
  const uint64_t f = -lsb >= 64 ? m : (m & ((uint64_t{1} << -lsb) - 1));
  const FXPInt128 v = isNegative() ? -FXPInt128{f} : FXPInt128{f};
  return FitWide(v, lsb, kConvergent, 64, nullptr);
}

FXP FXP::truncate(int pos, uint64_t* lost) const {
  const int lsb = minBitPos();
  const int msb = maxBitPos();
  uint64_t dropped = 0;
  FXP r = *this;
  if (pos >= lsb) {
    pos = std::min(pos, kMaxIwl - 2);
    if (pos < msb) {
      const int k = pos + 1 - lsb;
      dropped = bits_ << (64 - k);
      const uint64_t kept = signed_ ? static_cast<uint64_t>(asr(static_cast<int64_t>(bits_), k)) : asr(bits_, k);
      r = FXPAccess::Make(wl_ - k, iwl_, signed_, kept);
    } else {
      const bool negative = isNegative();
      const uint64_t word = bits_ << (64 - wl_);
      const int64_t d = int64_t{pos} - msb;
      if (d == 0) {
        dropped = word;
      } else if (negative) {
        // The fraction of the step above a negative value: 1 minus its small magnitude.
        const uint64_t shifted = static_cast<uint64_t>(static_cast<int64_t>(word) >> std::min<int64_t>(d, 63));
        const bool below = d >= 64 || (word & ((uint64_t{1} << d) - 1)) != 0;
        dropped = shifted | (below ? 1 : 0);
      } else {
        dropped = d >= 64 ? (word != 0 ? 1 : 0) : ((word >> d) | ((word & ((uint64_t{1} << d) - 1)) != 0 ? 1 : 0));
      }
      // The zero keeps the step 2^(pos + 1), so that adding one step rounds up correctly.
      r = negative ? FXPAccess::Make(1, pos + 2, true, ~uint64_t{0}) : FXPAccess::Make(1, pos + 2, false, 0);
    }
  }
  if (lost) *lost = dropped;
  return r;
}

FXP FXP::convergentRound(int pos) const {
  uint64_t lost = 0;
  const FXP t = truncate(pos, &lost);
  constexpr uint64_t kHalf = uint64_t{1} << 63;
  if (lost > kHalf || (lost == kHalf && (t.bits_ & 1) != 0)) return t.addDelta();
  return t;
}

FXP FXP::roundToNearest(int pos) const {
  uint64_t lost = 0;
  const FXP t = truncate(pos, &lost);
  if (lost >= (uint64_t{1} << 63)) return t.addDelta();
  return t;
}

FXP FXP::normalize() const { return FitWide(Extended(*this), minBitPos(), kConvergent, 64, nullptr); }

int FXP::compare(const FXP& a, const FXP& b) {
  if (a.iwl_ - a.wl_ == b.iwl_ - b.wl_) {
    const FXPInt128 x = Extended(a);
    const FXPInt128 y = Extended(b);
    return x < y ? -1 : (x > y ? 1 : 0);
  }
  return CompareDyadic(Extended(a), a.minBitPos(), Extended(b), b.minBitPos());
}

bool FXP::check_invariant() const {
  if (wl_ < 1 || wl_ > FXPMaxWordLength()) {
    Report(__LINE__, kWordLengthInvariant, kWordLengthMessage);
    return false;
  }
  if (iwl_ < kMinIwl || iwl_ > kMaxIwl) {
    Report(__LINE__, kIwlInvariant, kIwlMessage);
    return false;
  }
  if (CutToWordLength(bits_, wl_, signed_) != bits_) {
    Report(__LINE__, signed_ ? kSignedInvariant : kUnsignedInvariant, kValueMessage);
    return false;
  }
  return true;
}

int FXP::bit(int pos) const {
  const int lsb = minBitPos();
  if (pos < lsb) return 0;
  if (pos > maxBitPos()) return isNegative() ? 1 : 0;
  return static_cast<int>((bits_ >> (pos - lsb)) & 1);
}

double FXP::to_float64() const { return ToDouble(isNegative(), Magnitude(*this), minBitPos(), 0); }

int FXP::maxSignificantDecimalDigits() const {
  const int magnitudeBits = signed_ ? wl_ - 1 : wl_;
  const int lsb = minBitPos();
  const double log10Of2 = 0.30102999566398120;
  const double log10Of5 = 0.69897000433601880;
  double digits = 0;
  if (lsb >= 0)
    digits = (magnitudeBits + lsb) * log10Of2;
  else
    digits = magnitudeBits * log10Of2 - lsb * log10Of5;
  return static_cast<int>(std::floor(digits)) + 1;
}

std::string FXP::debugDump() const {
  char word[32];
  std::snprintf(word, sizeof word, "0x%016llx", static_cast<unsigned long long>(bits_));
  return "FXP" + FormatTag(*this) + " bits " + word + " = " + toDecimalString();
}

// ----- Text -----

namespace {

int ToRadix(const FXP& x, int k, int size, char* buf, char point, bool showPoint) {
  static constexpr char kDigits[] = "0123456789ABCDEF";
  const int64_t top = std::max<int64_t>(FloorDiv(x.maxBitPos(), k), 0);
  const int64_t bottom = std::min<int64_t>(FloorDiv(x.minBitPos(), k), 0);
  const bool withPoint = showPoint && bottom < 0;
  const int64_t needed = (top - bottom + 1) + (withPoint ? 1 : 0) + 1;
  if (buf != nullptr && size >= 1) {
    const int64_t limit = size - 1;
    int64_t n = 0;
    for (int64_t d = top; d >= bottom && n < limit; --d) {
      if (d == -1 && withPoint) {
        buf[n++] = point;
        if (n >= limit) break;
      }
      int v = 0;
      for (int j = k - 1; j >= 0; --j) v = (v << 1) | x.bit(static_cast<int>(d * k + j));
      buf[n++] = kDigits[v];
    }
    buf[n] = 0;
  }
  return static_cast<int>(needed);
}

char UsablePoint(char point) {
  if (point == 0 || IsDigit(point) || point == '-' || point == '+' || point == 'e' || point == 'E' || point == '<')
    return '.';
  return point;
}

}  // namespace

int FXP::toBinaryString(int size, char* buf, char point, bool showPoint) const {
  return ToRadix(*this, 1, size, buf, point, showPoint);
}

int FXP::toOctalString(int size, char* buf) const { return ToRadix(*this, 3, size, buf, '.', true); }

int FXP::toHexadecimalString(int size, char* buf) const { return ToRadix(*this, 4, size, buf, '.', true); }

int FXP::toDecimalString(int size, char* buf, int digits, DecimalFormat format, char point) const {
  return CopyOut(toDecimalString(digits, format, point), size, buf);
}

std::string FXP::toDecimalString(int digits, DecimalFormat format, char point) const {
  point = UsablePoint(point);
  Decimal d = ExactDecimal(*this);
  RoundDecimal(&d, digits);
  switch (format) {
    case kDecimalScientific: return ScientificText(d, point);
    case kDecimalTagged: return PlainText(d, point) + FormatTag(*this);
    case kDecimalPlain: break;
  }
  return PlainText(d, point);
}

FXP FXP::fromBinaryString(const FXPMeta& format, const char* text, const char** end) {
  return FromRadix(1, format, text, end);
}

FXP FXP::fromOctalString(const FXPMeta& format, const char* text, const char** end) {
  return FromRadix(3, format, text, end);
}

FXP FXP::fromHexadecimalString(const FXPMeta& format, const char* text, const char** end) {
  return FromRadix(4, format, text, end);
}

FXP FXP::fromDecimalString(int maxWordLength, const char* text, const char** end, int qMode) {
  if (end) *end = text;
  DecimalText t;
  if (text == nullptr || !ScanDecimal(text, &t)) return Zero();
  if (qMode < kShouldntQuantize || qMode > kRoundTowardPosInf) qMode = kConvergent;
  const char* after = t.end;
  bool isSigned = false;
  int wl = 0;
  int iwl = 0;
  if (ReadFormatTag(&after, &isSigned, &wl, &iwl)) {
    uint64_t bits = 0;
    if (!DecimalIntoFormat(t, wl, iwl, isSigned, qMode, &bits)) return Zero();
    if (end) *end = after;
    return FXPAccess::Make(wl, iwl, isSigned, bits);
  }
  FXP r;
  if (!t.value.digits.empty()) {
    const int width = std::clamp(maxWordLength, 1, static_cast<int>(FXPMaxWordLength()));
    const int rule = qMode == kShouldntQuantize ? kConvergent : qMode;
    int64_t low = 0;
    int64_t high = 0;
    BinaryBounds(t.value, &low, &high);
    if (low > kMaxIwl + 1) return Zero();
    bool saturated = false;
    if (high <= kMinLsb - 3) {
      r = FitWide(t.value.negative ? -1 : 1, kMinLsb - 3, rule, width, nullptr, &saturated);
    } else {
      const int64_t g = std::max(high - 110, kMinLsb - 3);
      bool inexact = false;
      const FXPUInt128 q = ScaledQuotient(t, g, &inexact);
      r = FitWide(Signed(t.value.negative, q | (inexact ? 1 : 0)), g, rule, width, nullptr, &saturated);
    }
    if (saturated) return Zero();
  }
  if (end) *end = t.end;
  return r;
}

FXP FXP::fromDecimalString(const FXPMeta& format, const char* text, const char** end, QuantizationMode qMode) {
  if (end) *end = text;
  const FXP zero = FXPAccess::Make(format.wl(), format.iwl(), format.isSigned(), 0);
  DecimalText t;
  if (text == nullptr || !ScanDecimal(text, &t)) return zero;
  const int mode = (qMode < kShouldntQuantize || qMode > kRoundTowardPosInf) ? kConvergent : qMode;
  uint64_t bits = 0;
  if (!DecimalIntoFormat(t, format.wl(), format.iwl(), format.isSigned(), mode, &bits)) return zero;
  if (end) *end = t.end;
  return FXPAccess::Make(format.wl(), format.iwl(), format.isSigned(), bits);
}

// ----- Formats from ranges -----

bool FXP::signAndLengthsForRangeAndDelta(const FXP& min, const FXP& max, const FXP& delta, bool* isSigned, int* wl,
                                         int* iwl) {
  return DeriveFormat(min, max, delta, isSigned, wl, iwl);
}

FXPMeta FXP::fxpMetaFor(const FXP& min, const FXP& max, const FXP& delta) {
  bool valid = false;
  return MetaForRange(min, max, delta, &valid);
}

bool FXP::signAndLengthsForRangeSpec(const char* spec, bool* isSigned, int* wl, int* iwl) {
  return ParseRangeSpec(spec, isSigned, wl, iwl, nullptr);
}

bool FXP::signAndLengthsForRangeSpec(const char* spec, bool* isSigned, int* wl, int* iwl, const char** end) {
  return ParseRangeSpec(spec, isSigned, wl, iwl, end);
}

// ----- Bit helpers and shared values -----

int64_t FXP::smax(int n) {
  if (n < 1 || n > 64) return 0;
  return n == 64 ? INT64_MAX : (int64_t{1} << (n - 1)) - 1;
}

int64_t FXP::smin(int n) {
  if (n < 1 || n > 64) return 0;
  return n == 64 ? INT64_MIN : -(int64_t{1} << (n - 1));
}

uint64_t FXP::umax(int n) {
  if (n <= 0) return 0;
  return n >= 64 ? UINT64_MAX : (uint64_t{1} << n) - 1;
}

int64_t FXP::asr(int64_t x, int n) {
  if (n <= 0) return x;
  return x >> std::min(n, 63);
}

uint64_t FXP::asr(uint64_t x, int n) {
  if (n <= 0) return x;
  return n >= 64 ? 0 : x >> n;
}

double FXP::powerOf2(int n) {
  if (n < -1074) return 0.0;
  if (n > 1023) return HUGE_VAL;
  return std::ldexp(1.0, n);
}

void FXP::registerAssertFunction(FXPAssertFunction fn) { gAssertFunction.store(fn, std::memory_order_release); }

const FXP& FXPOne_() {
  static const FXP one = FXPAccess::Make(1, 1, false, 1);
  return one;
}

const FXP& FXPZero_() {
  static const FXP zero = FXPAccess::Make(1, 1, false, 0);
  return zero;
}

}  // namespace vellum
