// Exact binary fixed-point numbers: a two's-complement or unsigned word of 1 to 64 bits and the
// position of its binary point, with format conversion, exact arithmetic, ordering and text forms.
#pragma once

#include <cstdint>
#include <string>
#include <type_traits>

#include "FixedPoint/fxpstoragelib.h"

namespace vellum {

// Receives every failed check: the source file, a line, the text of the failed condition and a
// message. Installed once at start-up; the checks are skipped while none is installed.
using FXPAssertFunction = void (*)(const char* file, uint32_t line, const char* condition, const char* message);

// A fixed-point format. The most significant stored bit has weight 2^(iwl - 1), the least
// significant 2^(iwl - wl). Plain value: copy freely from any thread.
class FXPMeta {
 public:
  // Unsigned, one bit, the binary point after it: the format of the shared zero.
  FXPMeta() = default;
  // A word length outside 1 ... 64 or an integer word length outside
  // FXPMinStoredIWL() ... FXPMaxStoredIWL() is reported through the assertion hook and clamped.
  FXPMeta(int wl, int iwl, bool isSigned);
  // The smallest format holding min ... max in steps of delta, word length capped at 64 (the
  // integer word length is kept). Non-finite values, delta <= 0 or min > max are reported and
  // give signed 64 / 64.
  FXPMeta(double min, double max, double delta);

  int wl() const { return wl_; }
  int iwl() const { return iwl_; }
  int fwl() const { return wl_ - iwl_; }
  bool isSigned() const { return signed_; }
  bool isUnsigned() const { return !signed_; }
  int maxBitPos() const { return iwl_ - 1; }
  int minBitPos() const { return iwl_ - wl_; }
  bool sameFormat(const FXPMeta& other) const {
    return wl_ == other.wl_ && iwl_ == other.iwl_ && signed_ == other.signed_;
  }

  // 2^(iwl - wl) and 2^(wl - iwl): exactly 0 below 2^-1074, subnormal down to there, +inf from 2^1024.
  double deltaF64() const;
  double scaleF64() const;
  // The largest and the smallest value of the format as a double: roundDirection < 0 rounds
  // toward -inf, > 0 toward +inf, 0 to nearest (ties to even).
  double rangeMaxF64(int roundDirection) const;
  double rangeMinF64(int roundDirection) const;

  // Sign and lengths of the smallest format that holds min ... max in steps of delta: fwl makes
  // 2^-fwl the largest power of two not above delta; the word length is not capped here. The
  // doubles are taken exactly. Returns false, writing nothing, for non-finite values, delta <= 0 or
  // min > max.
  static bool signAndLengthsForRangeAndDeltaF64(double min, double max, double delta, bool* isSigned, int* wl,
                                                int* iwl);

 protected:
  int32_t wl_ = 1;
  int32_t iwl_ = 1;
  bool signed_ = false;
};

// An exact fixed-point value: FXPMeta followed by the stored bits, which are read as a signed
// wl-bit integer (kept sign-extended to 64 bits) or an unsigned one (upper bits zero). The value
// is bits * 2^(iwl - wl). Plain value; every operation is reentrant and none allocates, except the
// text conversions that return std::string and the decimal conversions.
class FXP : public FXPMeta {
 public:
  enum OverflowMode : int32_t {
    kShouldntOverflow = 0,  // saturate, and report when it happens
    kWrap = 1,              // keep the low wl bits
    kSaturate = 2,          // clamp to the format's (or the given) limits
  };
  enum QuantizationMode : int32_t {
    kShouldntQuantize = 0,    // convergent, and report when a non-zero bit is dropped
    kTruncate = 1,            // floor
    kRoundHalfUp = 2,         // nearest, ties toward +inf
    kConvergent = 3,          // nearest, ties to even
    kRoundTowardZero = 4,
    kRoundTowardNegInf = 5,   // floor
    kRoundTowardPosInf = 6,   // ceiling
  };
  // Layouts of toDecimalString. Plain: "-12.375" (no exponent, no trailing fraction zeros).
  // Scientific: "-1.2375e+1". Tagged: the plain text followed by the format, "-12.375<s,16,8>"
  // ('s' signed, 'u' unsigned, then wl and iwl), which fromDecimalString reads back exactly.
  enum DecimalFormat : int32_t {
    kDecimalPlain = 0,
    kDecimalScientific = 1,
    kDecimalTagged = 2,
  };

  // Zero, (1, 1, unsigned).
  FXP() = default;
  // The integer v as (64, 64, signed) or (64, 64, unsigned).
  explicit FXP(int64_t v);
  explicit FXP(uint64_t v);
  template <typename T>
    requires(std::is_integral_v<T> && !std::is_same_v<T, bool> && !std::is_same_v<T, int64_t> &&
             !std::is_same_v<T, uint64_t>)
  explicit FXP(T v) : FXP(static_cast<std::conditional_t<std::is_signed_v<T>, int64_t, uint64_t>>(v)) {}
  // Raw bits in a format. Bits outside the format's range are reported and cut to wl bits (sign-
  // extended for a signed format); a bad word length or integer word length as for FXPMeta.
  FXP(int64_t bits, int wl, int iwl);
  FXP(uint64_t bits, int wl, int iwl, bool isSigned);
  // Exactly d: NaN and +-0 give zero, +inf (64, 32767, unsigned, all ones), -inf
  // (64, 32767, signed, 0x8000000000000000); a finite d is held in its smallest format.
  explicit FXP(double d);
  // src converted to (wl, iwl, isSigned). Bits below the destination's least significant bit are
  // dropped by qMode; a value outside the destination (or outside *min ... *max, when given, with
  // a saturating mode) is handled by oMode. *overflowed, when given, tells whether it was.
  FXP(const FXP& src, int wl, int iwl, bool isSigned, OverflowMode oMode, QuantizationMode qMode,
      const FXP* min = nullptr, const FXP* max = nullptr, bool* overflowed = nullptr);
  // src converted to the format of a range specification (see signAndLengthsForRangeSpec); a
  // malformed one is reported and gives signed 64 / 64.
  FXP(const FXP& src, const char* rangeSpec, OverflowMode oMode, QuantizationMode qMode);
  // src converted to the format fxpMetaFor(rangeMin, rangeMax, delta) gives, limited to
  // rangeMin ... rangeMax when saturating.
  FXP(const FXP& src, const FXP& rangeMin, const FXP& rangeMax, const FXP& delta, OverflowMode oMode,
      QuantizationMode qMode);
  // Raw bits of that same format, placed into rangeMin ... rangeMax by oMode.
  FXP(uint64_t bits, const FXP& rangeMin, const FXP& rangeMax, const FXP& delta, OverflowMode oMode,
      QuantizationMode qMode, bool* overflowed);

  // Exact sum, difference and product in their smallest format (unsigned when not negative). A
  // result that needs more than 64 significant bits is rounded by qMode and *precisionLost (when
  // given) is set.
  FXP add(const FXP& other, QuantizationMode qMode, bool* precisionLost = nullptr) const;
  FXP sub(const FXP& other, QuantizationMode qMode, bool* precisionLost = nullptr) const;
  FXP mul(const FXP& other, QuantizationMode qMode, bool* precisionLost = nullptr) const;
  // A signed value keeps its format (the most negative one becomes unsigned); an unsigned one
  // gains a sign bit. An unsigned 64-bit word of 2^63 or more becomes (64, iwl + 1, signed) with
  // its lowest bit rounded to even.
  FXP operator-() const;
  FXP abs() const;

  // The value plus one step; at the format's maximum, the next power of two.
  FXP addDelta() const;
  FXP deltaValue() const;  // 2^(iwl - wl)
  FXP scaleValue() const;  // 2^(wl - iwl)
  FXP maxValue() const;    // in this format
  FXP minValue() const;
  // The value minus its integer part (toward zero), so with the value's sign; smallest format.
  FXP fracValue() const;

  // Floor to a multiple of 2^(pos + 1). *lost receives the dropped part as a fraction of that step
  // in 64 bits (2^63 is one half), its lowest bit set when anything below it was dropped too.
  FXP truncate(int pos, uint64_t* lost = nullptr) const;
  // Round to a multiple of 2^(pos + 1): ties to even, and ties toward +inf.
  FXP convergentRound(int pos) const;
  FXP roundToNearest(int pos) const;
  // The same value in its smallest format; zero is (1, 1, unsigned).
  FXP normalize() const;

  // -1, 0 or 1: exact order of the values, whatever their formats.
  static int compare(const FXP& a, const FXP& b);
  // Same format and same bits.
  bool identical(const FXP& other) const { return sameFormat(other) && bits_ == other.bits_; }
  bool isNegative() const { return signed_ && static_cast<int64_t>(bits_) < 0; }
  bool isZero() const { return bits_ == 0; }
  // Whether the stored bits lie within the format; reports through the hook when not.
  bool check_invariant() const;

  uint64_t bits() const { return bits_; }
  // The bit at binary position pos: 0 below the least significant bit, the sign above the most.
  int bit(int pos) const;
  // The value rounded to nearest (ties to even), subnormals included; +-inf from 2^1024 on.
  double to_float64() const;
  // Significant decimal digits that print every value of this format exactly.
  int maxSignificantDecimalDigits() const;
  // One line for diagnostics: the format, the bits and the exact value.
  std::string debugDump() const;

  // Text. Each writer puts at most size - 1 characters and a terminating zero into buf (nothing
  // when buf is null or size < 1) and returns the length the whole text needs, terminator included.
  //
  // Binary, octal and hexadecimal: the stored bits from the most significant down, 1, 3 or 4 bits
  // per digit aligned on the binary point; digit positions above the most significant bit hold
  // the sign (the integer digit is always written), positions below the least significant bit 0,
  // and an integer format is written down to position 0. The point separates positions 0 and -1;
  // toBinaryString writes it only when showPoint is set, the others whenever there are fraction
  // digits. Hexadecimal digits are upper case.
  int toBinaryString(int size, char* buf, char point = '.', bool showPoint = true) const;
  int toOctalString(int size, char* buf) const;
  int toHexadecimalString(int size, char* buf) const;
  // Decimal, exact when digits <= 0 or digits >= maxSignificantDecimalDigits(); otherwise rounded
  // (ties to even) to that many significant digits. point replaces '.' (a digit, sign, 'e', '<' or
  // NUL is ignored and '.' used); fromDecimalString reads back '.' and ','.
  int toDecimalString(int size, char* buf, int digits, DecimalFormat format, char point) const;
  std::string toDecimalString(int digits = 0, DecimalFormat format = kDecimalPlain, char point = '.') const;

  // Readers. Each stops at the first character it cannot use and sets *end (when given) just
  // after the text it read; none reads past the terminating zero. A text that cannot be read, or
  // whose value does not fit, sets *end = text and gives zero: in `format` when one is given, else
  // the shared zero (1, 1, unsigned).
  //
  // Binary, octal, hexadecimal: digits (either case) with an optional point ('.' or ',') as the
  // writers put them, read as the two's-complement (signed format) or plain bit pattern of a value
  // of `format`. Digits above the format must repeat the sign, digits below it must be 0. Without a
  // point the last digit is taken as the lowest one the writer would put for this format.
  static FXP fromBinaryString(const FXPMeta& format, const char* text, const char** end = nullptr);
  static FXP fromOctalString(const FXPMeta& format, const char* text, const char** end = nullptr);
  static FXP fromHexadecimalString(const FXPMeta& format, const char* text, const char** end = nullptr);
  // Decimal: optional blanks, an optional sign, digits with an optional point ('.' or ','), an
  // optional exponent ('e' or 'E', optional sign, digits), and an optional format tag
  // "<s,wl,iwl>" / "<u,wl,iwl>" ('+/-' and '+' are read as s and u). With a tag the value is
  // rounded into that format; without one it is rounded to at most maxWordLength (1 ... 64)
  // significant bits and given in its smallest format. qMode rounds (an unknown one counts as
  // kConvergent); a value too large for its format (or for any) is rejected. A malformed tag is
  // left unread.
  static FXP fromDecimalString(int maxWordLength, const char* text, const char** end, int qMode);
  // The same text without a tag, rounded into `format`; a value outside it is rejected.
  static FXP fromDecimalString(const FXPMeta& format, const char* text, const char** end,
                               QuantizationMode qMode = kConvergent);

  // Format from range and step with exact values: as FXPMeta::signAndLengthsForRangeAndDeltaF64.
  static bool signAndLengthsForRangeAndDelta(const FXP& min, const FXP& max, const FXP& delta, bool* isSigned,
                                             int* wl, int* iwl);
  // The same with the word length capped at 64 (integer word length kept); bad arguments are
  // reported and give signed 64 / 64.
  static FXPMeta fxpMetaFor(const FXP& min, const FXP& max, const FXP& delta);
  // Range specification: the first '<', '[' or '(' in spec decides.
  //   <s,16,8>  sign ('s' or "+/-" signed, any other character unsigned), word length (capped at
  //             64), integer word length; a missing part keeps the default; '>' is optional.
  //   [min,max]:delta  decimal numbers; '(' excludes the minimum (min + delta is used), ')' the
  //             maximum (max - delta); the format then comes from range and step, wl capped at 64.
  // Defaults signed, 64, 64, always written. Returns false (defaults written) when spec is null,
  // has none of the three characters, is malformed, lacks the ':' step, or gives a word length
  // below 1, an integer word length outside the stored range, or a bad range or step.
  static bool signAndLengthsForRangeSpec(const char* spec, bool* isSigned, int* wl, int* iwl);
  // The same, with *end (when given) set after the text read (to spec when it returns false).
  static bool signAndLengthsForRangeSpec(const char* spec, bool* isSigned, int* wl, int* iwl, const char** end);

  // Bit helpers. smax(n) = 2^(n-1) - 1 and smin(n) = -2^(n-1) for 1 <= n <= 64, else 0;
  // umax(n) = 2^n - 1 (0 for n <= 0, all ones from 64); asr shifts right arithmetically (signed,
  // n capped at 63) or logically (unsigned, 0 from n = 64); a negative n shifts nothing.
  static int64_t smax(int n);
  static int64_t smin(int n);
  static int64_t smax() { return INT64_MAX; }
  static int64_t smin() { return INT64_MIN; }
  static uint64_t umax() { return UINT64_MAX; }
  static uint64_t umin() { return 0; }
  static uint64_t umax(int n);
  static int64_t asr(int64_t x, int n);
  static uint64_t asr(uint64_t x, int n);
  // 2^n as a double, as deltaF64 builds it.
  static double powerOf2(int n);

  // Installs (or, with nullptr, removes) the assertion hook. Set while no other thread uses FXP.
  static void registerAssertFunction(FXPAssertFunction fn);

 private:
  struct RawTag {};
  FXP(RawTag, int32_t wl, int32_t iwl, bool isSigned, uint64_t bits) {
    wl_ = wl;
    iwl_ = iwl;
    signed_ = isSigned;
    bits_ = bits;
  }
  friend struct FXPAccess;

  uint64_t bits_ = 0;
};

// The shared constants 1, as (1, 1, unsigned, 1), and 0, as (1, 1, unsigned, 0).
const FXP& FXPOne_();
const FXP& FXPZero_();

inline bool operator==(const FXP& a, const FXP& b) { return FXP::compare(a, b) == 0; }
inline bool operator!=(const FXP& a, const FXP& b) { return FXP::compare(a, b) != 0; }
inline bool operator<(const FXP& a, const FXP& b) { return FXP::compare(a, b) < 0; }
inline bool operator<=(const FXP& a, const FXP& b) { return FXP::compare(a, b) <= 0; }
inline bool operator>(const FXP& a, const FXP& b) { return FXP::compare(a, b) > 0; }
inline bool operator>=(const FXP& a, const FXP& b) { return FXP::compare(a, b) >= 0; }

}  // namespace vellum
