// Independent exact oracle for the fixed-point library: random formats and values, and the
// expected results computed with arbitrary-precision integers and rationals.
// Shared by the unit tests (a few thousand cases) and the opt-in fxp_oracle program (millions).
#pragma once

#include <boost/multiprecision/cpp_int.hpp>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <functional>
#include <random>
#include <sstream>
#include <string>

#include "FixedPoint/fxp.h"

namespace vellum::fxporacle {

using boost::multiprecision::cpp_int;
using boost::multiprecision::cpp_rational;

// n * 2^pos
struct Exact {
  cpp_int n;
  int64_t pos = 0;
};

// The outcome of a run: how many cases, how many disagreed, and the first disagreement.
struct Report {
  uint64_t cases = 0;
  uint64_t mismatches = 0;
  std::string firstMismatch;
  void Fail(const std::string& what) {
    if (mismatches++ == 0) firstMismatch = what;
  }
};

// Decimal digits as an integer (the string constructor would read a leading 0 as octal).
inline cpp_int FromDigits(const std::string& digits) {
  cpp_int n = 0;
  for (const char c : digits) n = n * 10 + (c - '0');
  return n;
}

inline cpp_int Pow2(int64_t n) { return cpp_int(1) << static_cast<unsigned>(n); }

inline Exact ValueOf(const FXP& x) {
  Exact e;
  e.n = x.isSigned() ? cpp_int(static_cast<int64_t>(x.bits())) : cpp_int(x.bits());
  e.pos = x.minBitPos();
  return e;
}

inline cpp_rational Rational(const Exact& e) {
  if (e.pos >= 0) return cpp_rational(e.n << static_cast<unsigned>(e.pos));
  return cpp_rational(e.n, Pow2(-e.pos));
}

inline int Sign(const cpp_int& n) { return n < 0 ? -1 : (n > 0 ? 1 : 0); }

inline int Compare(const Exact& a, const Exact& b) {
  const int64_t p = std::min(a.pos, b.pos);
  const cpp_int x = a.n << static_cast<unsigned>(a.pos - p);
  const cpp_int y = b.n << static_cast<unsigned>(b.pos - p);
  return x < y ? -1 : (x > y ? 1 : 0);
}

enum class Rule { Floor, Ceil, HalfUp, HalfEven, TowardZero };

// round(num / den) by the rule; den > 0. *inexact tells whether it was.
inline cpp_int RoundQuotient(const cpp_int& num, const cpp_int& den, Rule rule, bool* inexact = nullptr) {
  cpp_int q;
  cpp_int r;
  boost::multiprecision::divide_qr(num, den, q, r);
  if (r < 0) {  // make it a floor division
    q -= 1;
    r += den;
  }
  if (inexact) *inexact = r != 0;
  if (r == 0) return q;
  const int half = Sign(2 * r - den);  // -1 below one half, 0 at it, 1 above
  switch (rule) {
    case Rule::Floor: return q;
    case Rule::Ceil: return q + 1;
    case Rule::HalfUp: return half >= 0 ? q + 1 : q;
    case Rule::HalfEven: return (half > 0 || (half == 0 && (q & 1) != 0)) ? q + 1 : q;
    case Rule::TowardZero: return num < 0 ? q + 1 : q;
  }
  return q;
}

// round(x / 2^g)
inline cpp_int RoundTo(const Exact& x, int64_t g, Rule rule, bool* inexact = nullptr) {
  if (x.pos >= g) {
    if (inexact) *inexact = false;
    return x.n << static_cast<unsigned>(x.pos - g);
  }
  return RoundQuotient(x.n, Pow2(g - x.pos), rule, inexact);
}

// round(r / 2^g)
inline cpp_int RoundTo(const cpp_rational& r, int64_t g, Rule rule, bool* inexact = nullptr) {
  cpp_int num = boost::multiprecision::numerator(r);
  cpp_int den = boost::multiprecision::denominator(r);
  if (g >= 0)
    den <<= static_cast<unsigned>(g);
  else
    num <<= static_cast<unsigned>(-g);
  return RoundQuotient(num, den, rule, inexact);
}

inline unsigned BitLength(const cpp_int& magnitude) {
  return magnitude == 0 ? 0 : static_cast<unsigned>(boost::multiprecision::msb(magnitude)) + 1;
}

// Significant bits of a two's-complement integer, sign included when negative.
inline int64_t SignificantBits(const cpp_int& n) {
  if (n >= 0) return BitLength(n);
  return BitLength(-n - 1) + 1;
}

inline uint64_t Word(const cpp_int& n) {
  const cpp_int m = n & cpp_int(~uint64_t{0});  // two's complement low word
  return static_cast<uint64_t>(m);
}

// The smallest format of an exact value, as the library defines it.
inline FXP Smallest(Exact x) {
  if (x.n == 0) return FXP(uint64_t{0}, 1, 1, false);
  while ((x.n & 1) == 0) {
    x.n >>= 1;
    ++x.pos;
  }
  const int64_t wl = SignificantBits(x.n);
  return FXP(Word(x.n), static_cast<int>(wl), static_cast<int>(x.pos + wl), x.n < 0);
}

inline Rule ConversionRule(int qMode, bool negative) {
  switch (qMode) {
    case FXP::kTruncate:
    case FXP::kRoundTowardNegInf: return Rule::Floor;
    case FXP::kRoundHalfUp: return Rule::HalfUp;
    case FXP::kRoundTowardZero: return negative ? Rule::Ceil : Rule::Floor;
    case FXP::kRoundTowardPosInf: return Rule::Ceil;
    default: return Rule::HalfEven;
  }
}

inline Rule ArithmeticRule(int qMode) {
  switch (qMode) {
    case FXP::kRoundHalfUp: return Rule::HalfUp;
    case FXP::kConvergent: return Rule::HalfEven;
    case FXP::kRoundTowardZero: return Rule::TowardZero;
    case FXP::kRoundTowardPosInf: return Rule::Ceil;
    default: return Rule::Floor;
  }
}

// ----- Random formats and values -----

class Generator {
 public:
  explicit Generator(uint64_t seed) : rng_(seed) {}

  int64_t Uniform(int64_t lo, int64_t hi) { return std::uniform_int_distribution<int64_t>(lo, hi)(rng_); }
  bool Chance(int percent) { return Uniform(0, 99) < percent; }
  uint64_t Word() { return rng_(); }

  int WordLength() {
    static constexpr int kEdges[] = {1, 2, 3, 63, 64};
    if (Chance(30)) return kEdges[Uniform(0, 4)];
    return static_cast<int>(Uniform(1, 64));
  }

  int IntegerWordLength(int wl) {
    const int64_t pick = Uniform(0, 99);
    if (pick < 35) return static_cast<int>(Uniform(FXPMinIntegerWordLength(), FXPMaxIntegerWordLength()));
    if (pick < 80) return static_cast<int>(Uniform(-wl - 4, 2 * wl + 4));
    static constexpr int kEdges[] = {-2048, -2047, 2047, 2046, -1100, 1100, 0, 1};
    return kEdges[Uniform(0, 7)];
  }

  FXPMeta Format() {
    const int wl = WordLength();
    return FXPMeta(wl, IntegerWordLength(wl), Chance(50));
  }

  // A format near another one, so that conversions drop or add only a few bits.
  FXPMeta FormatNear(const FXPMeta& f) {
    const int wl = static_cast<int>(std::clamp<int64_t>(f.wl() + Uniform(-12, 4), 1, 64));
    const int iwl = static_cast<int>(f.iwl() + Uniform(-4, 4));
    return FXPMeta(wl, iwl, Chance(50));
  }

  uint64_t Bits(const FXPMeta& f) {
    const int wl = f.wl();
    const bool s = f.isSigned();
    const uint64_t max = s ? static_cast<uint64_t>(FXP::smax(wl)) : FXP::umax(wl);
    const uint64_t min = s ? static_cast<uint64_t>(FXP::smin(wl)) : 0;
    uint64_t b = 0;
    switch (Uniform(0, 11)) {
      case 0: b = max; break;
      case 1: b = min; break;
      case 2: b = 0; break;
      case 3: b = 1; break;
      case 4: b = ~uint64_t{0}; break;          // -1 when signed
      case 5: b = max - 1; break;
      case 6: b = min + 1; break;
      case 7: b = uint64_t{1} << Uniform(0, 63); break;
      case 8: b = FXP::umax(static_cast<int>(Uniform(1, 64))); break;
      case 9: b = (uint64_t{1} << Uniform(0, 63)) | 1; break;
      default: b = Word(); break;
    }
    return fxpstorage::CutToWordLength(b, wl, s);
  }

  FXP Value(const FXPMeta& f) { return FXP(Bits(f), f.wl(), f.iwl(), f.isSigned()); }
  FXP Value() { return Value(Format()); }

  double Double() {
    switch (Uniform(0, 9)) {
      case 0: {
        static const double kEdges[] = {0.0, -0.0, INFINITY, -INFINITY, NAN, 4.9406564584124654e-324,
                                        -2.2250738585072014e-308, 1.7976931348623157e308, 1.0, -1.0, 0.5, -4.0, 0.75};
        return kEdges[Uniform(0, 12)];
      }
      case 1: return std::ldexp(static_cast<double>(static_cast<int64_t>(Word()) >> Uniform(0, 63)),
                                static_cast<int>(Uniform(-80, 80)));
      default: {
        const uint64_t w = Word();
        double d = 0;
        std::memcpy(&d, &w, sizeof d);
        return d;
      }
    }
  }

  std::mt19937_64& Engine() { return rng_; }

 private:
  std::mt19937_64 rng_;
};

inline std::string Describe(const FXP& x) { return x.debugDump(); }

inline std::string ModeText(int oMode, int qMode) {
  return " oMode " + std::to_string(oMode) + " qMode " + std::to_string(qMode);
}

// ----- Expected results -----

struct ExpectedConversion {
  uint64_t bits;
  bool overflowed;
};

inline ExpectedConversion ExpectConversion(const FXP& src, const FXPMeta& dst, int oMode, int qMode, const FXP* lo,
                                           const FXP* hi) {
  const Exact x = ValueOf(src);
  const int64_t dL = dst.minBitPos();
  const cpp_int q = RoundTo(x, dL, ConversionRule(qMode, x.n < 0));
  const int wl = dst.wl();
  const cpp_int minQ = dst.isSigned() ? cpp_int(-(cpp_int(1) << (wl - 1))) : cpp_int(0);
  const cpp_int maxQ = dst.isSigned() ? cpp_int((cpp_int(1) << (wl - 1)) - 1) : cpp_int((cpp_int(1) << wl) - 1);
  const bool inside = q >= minQ && q <= maxQ;
  const auto clamp = [&](const cpp_int& v) { return v < minQ ? minQ : (v > maxQ ? maxQ : v); };
  if (oMode == FXP::kWrap) {
    cpp_int w = q & ((cpp_int(1) << wl) - 1);
    if (dst.isSigned() && w > maxQ) w -= cpp_int(1) << wl;
    return {Word(w), !inside};
  }
  const Exact v{q, dL};
  if (lo != nullptr && Compare(v, ValueOf(*lo)) < 0) return {Word(clamp(RoundTo(ValueOf(*lo), dL, Rule::Ceil))), true};
  if (hi != nullptr && Compare(v, ValueOf(*hi)) > 0) return {Word(clamp(RoundTo(ValueOf(*hi), dL, Rule::Floor))), true};
  return {Word(clamp(q)), !inside};
}

// Fits an exact rational into at most width significant bits, as the arithmetic does.
inline FXP ExpectFit(const cpp_rational& r, Rule rule, int width, bool* lost) {
  *lost = false;
  if (r == 0) return Smallest(Exact{0, 0});
  // The lowest position at which the floor still fits in width bits.
  const cpp_int num = boost::multiprecision::numerator(r);
  const cpp_int den = boost::multiprecision::denominator(r);
  const int64_t top = static_cast<int64_t>(BitLength(abs(num))) - static_cast<int64_t>(BitLength(den));
  int64_t g = top - width - 2;
  const auto fitsAt = [&](int64_t at) {
    const cpp_int f = RoundTo(r, at, Rule::Floor);
    return SignificantBits(f) <= width;
  };
  while (!fitsAt(g)) ++g;
  while (fitsAt(g - 1)) --g;
  bool inexact = false;
  const cpp_int q = RoundTo(r, g, rule, &inexact);
  *lost = inexact;
  return Smallest(Exact{q, g});
}

// Nearest double (ties to even) of an exact value, by checking the neighbours.
inline bool IsNearestDouble(const Exact& x, double d) {
  const cpp_rational v = Rational(x);
  const auto exactOf = [](double y) {
    int e = 0;
    const double m = std::frexp(y, &e);
    return Rational(Exact{cpp_int(static_cast<int64_t>(std::ldexp(m, 53))), e - 53});
  };
  if (std::isnan(d)) return false;
  if (std::isinf(d)) {
    // Overflow exactly from the midpoint between the largest double and 2^1024.
    const cpp_rational limit = Rational(Exact{cpp_int((uint64_t{1} << 54) - 1), 970});
    return d > 0 ? v >= limit : v <= -limit;
  }
  const cpp_rational here = exactOf(d);
  const cpp_rational err = abs(v - here);
  for (const double dir : {INFINITY, -INFINITY}) {
    const double n = std::nextafter(d, dir);
    const cpp_rational there = std::isinf(n) ? Rational(Exact{n > 0 ? cpp_int(1) : cpp_int(-1), 1024}) : exactOf(n);
    const cpp_rational errThere = abs(v - there);
    if (errThere < err) return false;
    if (errThere == err) {
      // A tie: the even significand wins (the one whose last bit is 0).
      int e = 0;
      const double m = std::frexp(d, &e);
      const int64_t sig = static_cast<int64_t>(std::ldexp(std::fabs(m), 53));
      const bool subnormalOrZero = d == 0 || std::fabs(d) < 2.2250738585072014e-308;
      const int64_t lastBit = subnormalOrZero ? (static_cast<int64_t>(std::ldexp(std::fabs(d), 1074)) & 1) : (sig & 1);
      if (lastBit != 0) return false;
    }
  }
  return true;
}

// ----- Runs -----

// Conversion with one quantization mode and random overflow modes and limits.
inline Report RunConversion(uint64_t seed, uint64_t cases, int qMode) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    const FXP src = gen.Value();
    const FXPMeta dst = gen.Chance(50) ? gen.FormatNear(src) : gen.Format();
    static constexpr int kOverflowModes[] = {FXP::kWrap, FXP::kSaturate, FXP::kShouldntOverflow};
    const int oMode = kOverflowModes[gen.Uniform(0, 2)];
    FXP lo;
    FXP hi;
    const bool limits = oMode != FXP::kWrap && gen.Chance(20);
    if (limits) {
      lo = gen.Chance(50) ? gen.Value(gen.FormatNear(dst)) : gen.Value();
      hi = gen.Chance(50) ? gen.Value(gen.FormatNear(dst)) : gen.Value();
      if (lo > hi) std::swap(lo, hi);
    }
    bool overflowed = false;
    const FXP got(src, dst.wl(), dst.iwl(), dst.isSigned(), static_cast<FXP::OverflowMode>(oMode),
                  static_cast<FXP::QuantizationMode>(qMode), limits ? &lo : nullptr, limits ? &hi : nullptr,
                  &overflowed);
    const ExpectedConversion want = ExpectConversion(src, dst, oMode, qMode, limits ? &lo : nullptr, limits ? &hi : nullptr);
    ++rep.cases;
    if (!got.sameFormat(dst) || got.bits() != want.bits || overflowed != want.overflowed) {
      std::ostringstream s;
      s << "convert " << Describe(src) << " to <" << dst.isSigned() << "," << dst.wl() << "," << dst.iwl() << ">"
        << ModeText(oMode, qMode) << (limits ? " limits " + Describe(lo) + " .. " + Describe(hi) : "") << ": got "
        << Describe(got) << " overflowed " << overflowed << ", want bits 0x" << std::hex << want.bits << std::dec
        << " overflowed " << want.overflowed;
      rep.Fail(s.str());
    }
  }
  return rep;
}

enum class Operation { Add, Sub, Mul };

inline Report RunArithmetic(uint64_t seed, uint64_t cases, Operation op) {
  Generator gen(seed);
  Report rep;
  static constexpr int kModes[] = {0, 1, 2, 3, 4, 5, 6};
  for (uint64_t i = 0; i < cases; ++i) {
    const FXP a = gen.Value();
    // Operands close in position make carries and cancellations; far ones make sticky bits.
    const FXP b = gen.Chance(50) ? gen.Value(gen.FormatNear(a)) : gen.Value();
    const int qMode = kModes[gen.Uniform(0, 6)];
    const auto mode = static_cast<FXP::QuantizationMode>(qMode);
    bool lost = false;
    FXP got;
    cpp_rational exact;
    const char* name = "";
    switch (op) {
      case Operation::Add: got = a.add(b, mode, &lost); exact = Rational(ValueOf(a)) + Rational(ValueOf(b)); name = "add"; break;
      case Operation::Sub: got = a.sub(b, mode, &lost); exact = Rational(ValueOf(a)) - Rational(ValueOf(b)); name = "sub"; break;
      case Operation::Mul: got = a.mul(b, mode, &lost); exact = Rational(ValueOf(a)) * Rational(ValueOf(b)); name = "mul"; break;
    }
    bool wantLost = false;
    const FXP want = ExpectFit(exact, ArithmeticRule(qMode), 64, &wantLost);
    ++rep.cases;
    if (!got.identical(want) || lost != wantLost) {
      rep.Fail(std::string(name) + " " + Describe(a) + " , " + Describe(b) + ModeText(-1, qMode) + ": got " +
               Describe(got) + " lost " + std::to_string(lost) + ", want " + Describe(want) + " lost " +
               std::to_string(wantLost));
    }
  }
  return rep;
}

inline Report RunCompare(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    const FXP a = gen.Value();
    FXP b;
    switch (gen.Uniform(0, 3)) {
      case 0: b = gen.Value(); break;
      case 1: b = gen.Value(gen.FormatNear(a)); break;
      case 2: b = a.normalize(); break;  // equal values in other formats
      default: b = FXP(a, gen.WordLength(), a.iwl() + static_cast<int>(gen.Uniform(-2, 2)), gen.Chance(50), FXP::kSaturate,
                       FXP::kConvergent);
        break;
    }
    const int want = Compare(ValueOf(a), ValueOf(b));
    const int got = FXP::compare(a, b);
    const bool operatorsAgree = (a == b) == (want == 0) && (a != b) == (want != 0) && (a < b) == (want < 0) &&
                                (a <= b) == (want <= 0) && (a > b) == (want > 0) && (a >= b) == (want >= 0);
    ++rep.cases;
    if (got != want || !operatorsAgree)
      rep.Fail("compare " + Describe(a) + " , " + Describe(b) + ": got " + std::to_string(got) + ", want " +
               std::to_string(want));
  }
  return rep;
}

inline Report RunToFloat64(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    FXP x = gen.Value();
    if (gen.Chance(30)) {
      // Values near the double range's ends: huge, tiny and subnormal.
      const int wl = gen.WordLength();
      static constexpr int kPositions[] = {-1074, -1075, -1100, -1022, -1023, 1024, 1023, 970, 971};
      const int lsb = kPositions[gen.Uniform(0, 8)] - static_cast<int>(gen.Uniform(0, wl));
      x = gen.Value(FXPMeta(wl, lsb + wl, gen.Chance(50)));
    }
    const double d = x.to_float64();
    ++rep.cases;
    if (!IsNearestDouble(ValueOf(x), d)) {
      std::ostringstream s;
      s.precision(17);
      s << "to_float64 " << Describe(x) << ": got " << d;
      rep.Fail(s.str());
    }
  }
  return rep;
}

inline Report RunFromDouble(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    const double d = gen.Double();
    const FXP got(d);
    FXP want;
    if (std::isnan(d) || d == 0) {
      want = Smallest(Exact{0, 0});
    } else if (std::isinf(d)) {
      want = d > 0 ? FXP(~uint64_t{0}, 64, 32767, false) : FXP(uint64_t{1} << 63, 64, 32767, true);
    } else {
      int e = 0;
      const double m = std::frexp(d, &e);
      want = Smallest(Exact{cpp_int(static_cast<int64_t>(std::ldexp(m, 53))), e - 53});
    }
    ++rep.cases;
    if (!got.identical(want)) {
      std::ostringstream s;
      s.precision(17);
      s << "FXP(double) " << d << ": got " << Describe(got) << ", want " << Describe(want);
      rep.Fail(s.str());
    }
  }
  return rep;
}

// Negation, abs, normalize, truncate and the two roundings.
inline Report RunUnary(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    const FXP x = gen.Value();
    const Exact v = ValueOf(x);
    ++rep.cases;
    std::string fault;
    const FXP n = -x;
    const bool wide = !x.isSigned() && x.wl() == 64 && (x.bits() >> 63) != 0;
    const cpp_int wantNeg = wide ? cpp_int(-RoundTo(v, v.pos + 1, Rule::HalfEven)) : cpp_int(-v.n);
    if (Compare(ValueOf(n), Exact{wantNeg, wide ? v.pos + 1 : v.pos}) != 0) fault = "negation " + Describe(n);
    if (Compare(ValueOf(x.abs()), Exact{abs(v.n), v.pos}) != 0) fault = "abs " + Describe(x.abs());
    if (!x.normalize().identical(Smallest(v))) fault = "normalize " + Describe(x.normalize());
    const int pos = x.minBitPos() - 2 + static_cast<int>(gen.Uniform(0, x.wl() + 4));
    const int64_t step = int64_t{pos} + 1;
    uint64_t lost = 0;
    const FXP t = x.truncate(pos, &lost);
    if (Compare(ValueOf(t), Exact{RoundTo(v, step, Rule::Floor), step}) != 0) fault = "truncate " + Describe(t);
    // lost is the dropped fraction of a step, exact to 64 bits with a sticky lowest bit.
    const cpp_int frac = v.pos >= step ? cpp_int(0) : cpp_int(v.n - (RoundTo(v, step, Rule::Floor) << static_cast<unsigned>(step - v.pos)));
    if (v.pos < step) {
      bool inexact = false;
      const cpp_int scaled = RoundTo(Exact{frac, v.pos - step + 64}, 0, Rule::Floor, &inexact);
      const uint64_t want = static_cast<uint64_t>(scaled) | (inexact ? 1 : 0);
      if (lost != want) fault = "truncate lost " + std::to_string(lost) + " want " + std::to_string(want);
    } else if (lost != 0) {
      fault = "truncate lost " + std::to_string(lost);
    }
    const FXP c = x.convergentRound(pos);
    if (Compare(ValueOf(c), Exact{RoundTo(v, step, Rule::HalfEven), step}) != 0) fault = "convergentRound " + Describe(c);
    const FXP r = x.roundToNearest(pos);
    if (Compare(ValueOf(r), Exact{RoundTo(v, step, Rule::HalfUp), step}) != 0) fault = "roundToNearest " + Describe(r);
    if (!fault.empty()) rep.Fail(Describe(x) + " pos " + std::to_string(pos) + ": " + fault);
  }
  return rep;
}

// Printing then reading back gives the identical value and format, in every layout.
inline Report RunDecimalRoundTrip(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    const FXP x = gen.Value();
    ++rep.cases;
    const std::string plain = x.toDecimalString();
    const std::string tagged = x.toDecimalString(0, FXP::kDecimalTagged, '.');
    const std::string sci = x.toDecimalString(0, FXP::kDecimalScientific, ',');
    const char* end = nullptr;
    const FXP a = FXP::fromDecimalString(x, plain.c_str(), &end);
    const bool aOk = a.identical(x) && *end == 0;
    const FXP b = FXP::fromDecimalString(1, tagged.c_str(), &end, FXP::kRoundTowardZero);
    const bool bOk = b.identical(x) && *end == 0;
    const FXP c = FXP::fromDecimalString(x, sci.c_str(), &end, FXP::kRoundTowardPosInf);
    const bool cOk = c.identical(x) && *end == 0;
    // Untagged into 64 bits: the same value, smallest format.
    const FXP d = FXP::fromDecimalString(64, plain.c_str(), &end, FXP::kConvergent);
    const bool dOk = d.identical(x.normalize());
    // Binary, octal, hexadecimal back in the same format.
    std::string radix[3];
    for (int k = 0; k < 3; ++k) {
      const int n = k == 0 ? x.toBinaryString(0, nullptr) : (k == 1 ? x.toOctalString(0, nullptr) : x.toHexadecimalString(0, nullptr));
      std::string buf(static_cast<size_t>(n), '\0');
      if (k == 0) x.toBinaryString(n, buf.data());
      if (k == 1) x.toOctalString(n, buf.data());
      if (k == 2) x.toHexadecimalString(n, buf.data());
      buf.resize(static_cast<size_t>(n - 1));
      radix[k] = buf;
    }
    const FXP rb = FXP::fromBinaryString(x, radix[0].c_str(), &end);
    const bool rbOk = rb.identical(x) && *end == 0;
    const FXP ro = FXP::fromOctalString(x, radix[1].c_str(), &end);
    const bool roOk = ro.identical(x) && *end == 0;
    const FXP rh = FXP::fromHexadecimalString(x, radix[2].c_str(), &end);
    const bool rhOk = rh.identical(x) && *end == 0;
    // The exact decimal names the exact value.
    const cpp_rational printed = [&] {
      std::string digits = plain;
      bool negative = false;
      if (!digits.empty() && digits[0] == '-') {
        negative = true;
        digits.erase(0, 1);
      }
      const size_t point = digits.find('.');
      int64_t fraction = 0;
      if (point != std::string::npos) {
        fraction = static_cast<int64_t>(digits.size() - point - 1);
        digits.erase(point, 1);
      }
      cpp_rational r(FromDigits(digits), boost::multiprecision::pow(cpp_int(10), static_cast<unsigned>(fraction)));
      return negative ? cpp_rational(-r) : r;
    }();
    const bool exactOk = printed == Rational(ValueOf(x));
    if (!(aOk && bOk && cOk && dOk && rbOk && roOk && rhOk && exactOk))
      rep.Fail("round trip " + Describe(x) + " plain " + std::to_string(aOk) + " tagged " + std::to_string(bOk) +
               " scientific " + std::to_string(cOk) + " untagged " + std::to_string(dOk) + " binary " +
               std::to_string(rbOk) + " octal " + std::to_string(roOk) + " hex " + std::to_string(rhOk) +
               " exact " + std::to_string(exactOk) + " text " + tagged + " " + sci + " " + radix[2]);
  }
  return rep;
}

// Random decimal texts read into random formats, against exact rational rounding.
inline Report RunDecimalParse(uint64_t seed, uint64_t cases) {
  Generator gen(seed);
  Report rep;
  for (uint64_t i = 0; i < cases; ++i) {
    std::string digits;
    const int64_t n = gen.Uniform(1, gen.Chance(10) ? 200 : 30);
    for (int64_t j = 0; j < n; ++j) digits += static_cast<char>('0' + gen.Uniform(0, 9));
    const int64_t point = gen.Uniform(0, n);
    const int64_t exponent = gen.Chance(50) ? 0 : gen.Uniform(-400, 400);
    const bool negative = gen.Chance(50);
    std::string text = negative ? "-" : "";
    text += digits.substr(0, static_cast<size_t>(point));
    if (point == 0) text += "0";
    if (point < n) text += "." + digits.substr(static_cast<size_t>(point));
    if (exponent != 0) text += "e" + std::to_string(exponent);
    cpp_rational value{FromDigits(digits)};
    const int64_t scale = exponent - (n - point);
    if (scale >= 0)
      value *= cpp_rational(boost::multiprecision::pow(cpp_int(10), static_cast<unsigned>(scale)));
    else
      value /= cpp_rational(boost::multiprecision::pow(cpp_int(10), static_cast<unsigned>(-scale)));
    if (negative) value = -value;
    const int qMode = static_cast<int>(gen.Uniform(1, 6));
    ++rep.cases;
    const char* end = nullptr;
    if (gen.Chance(50)) {
      // Into a format.
      FXPMeta f = gen.Format();
      if (gen.Chance(70)) {
        // A format that holds the value more often than not.
        const double approx = static_cast<double>(value);
        const int top = std::isfinite(approx) && approx != 0 ? std::ilogb(approx) + 2 : 0;
        const int wl = gen.WordLength();
        f = FXPMeta(wl, std::clamp(top + static_cast<int>(gen.Uniform(-1, 2)), -2048, 2047), gen.Chance(50) || negative);
      }
      const FXP got = FXP::fromDecimalString(f, text.c_str(), &end, static_cast<FXP::QuantizationMode>(qMode));
      const cpp_int q = RoundTo(value, f.minBitPos(), ConversionRule(qMode, negative));
      const int wl = f.wl();
      const cpp_int minQ = f.isSigned() ? cpp_int(-(cpp_int(1) << (wl - 1))) : cpp_int(0);
      const cpp_int maxQ = f.isSigned() ? cpp_int((cpp_int(1) << (wl - 1)) - 1) : cpp_int((cpp_int(1) << wl) - 1);
      const bool fits = q >= minQ && q <= maxQ;
      const bool ok = fits ? (got.sameFormat(f) && got.bits() == Word(q) && *end == 0)
                           : (end == text.c_str() && got.isZero());
      if (!ok)
        rep.Fail("parse " + text + " into <" + std::to_string(f.isSigned()) + "," + std::to_string(wl) + "," +
                 std::to_string(f.iwl()) + "> qMode " + std::to_string(qMode) + ": got " + Describe(got) +
                 (fits ? " want bits " + std::to_string(Word(q)) : std::string(" want rejection")));
    } else {
      const int width = gen.WordLength();
      const FXP got = FXP::fromDecimalString(width, text.c_str(), &end, qMode);
      bool lost = false;
      const FXP want = ExpectFit(value, ArithmeticRule(qMode), width, &lost);
      if (!got.identical(want) || *end != 0)
        rep.Fail("parse " + text + " in " + std::to_string(width) + " bits qMode " + std::to_string(qMode) + ": got " +
                 Describe(got) + " want " + Describe(want));
    }
  }
  return rep;
}

// Every run under one name, for the tests and the large program alike.
struct NamedRun {
  const char* name;
  std::function<Report(uint64_t seed, uint64_t cases)> run;
};

inline std::vector<NamedRun> AllRuns() {
  std::vector<NamedRun> runs;
  static const char* kModeNames[] = {"convert.ShouldntQuantize", "convert.Truncate", "convert.RoundHalfUp",
                                     "convert.Convergent", "convert.RoundTowardZero", "convert.RoundTowardNegInf",
                                     "convert.RoundTowardPosInf"};
  for (int q = 0; q <= 6; ++q)
    runs.push_back({kModeNames[q], [q](uint64_t s, uint64_t c) { return RunConversion(s, c, q); }});
  runs.push_back({"add", [](uint64_t s, uint64_t c) { return RunArithmetic(s, c, Operation::Add); }});
  runs.push_back({"sub", [](uint64_t s, uint64_t c) { return RunArithmetic(s, c, Operation::Sub); }});
  runs.push_back({"mul", [](uint64_t s, uint64_t c) { return RunArithmetic(s, c, Operation::Mul); }});
  runs.push_back({"compare", RunCompare});
  runs.push_back({"to_float64", RunToFloat64});
  runs.push_back({"FXP(double)", RunFromDouble});
  runs.push_back({"negate.abs.normalize.truncate.round", RunUnary});
  runs.push_back({"text.roundTrip", RunDecimalRoundTrip});
  runs.push_back({"decimal.parse", RunDecimalParse});
  return runs;
}

}  // namespace vellum::fxporacle
