// Storage-level tools of the fixed-point library: the global word-length limits, bit counts and
// shifts on 64- and 128-bit words, and the unsigned big integer that exact decimal text needs.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace vellum {

// 128-bit words for exact intermediate results; the language has no standard spelling for them.
__extension__ typedef __int128 FXPInt128;
__extension__ typedef unsigned __int128 FXPUInt128;

// Limits of fixed-point formats. Descriptors keep integer word lengths within
// FXPMinIntegerWordLength() ... FXPMaxIntegerWordLength(); the fractional limits follow from them.
constexpr uint16_t FXPMaxWordLength() { return 64; }
constexpr uint16_t FXPMinWordLength() { return 1; }
constexpr uint16_t FXPInvalidWordLength() { return 0xFFFF; }
constexpr int16_t FXPMaxIntegerWordLength() { return 2047; }
constexpr int16_t FXPMinIntegerWordLength() { return -2048; }
constexpr int16_t FXPMaxFractionalWordLength() { return 2112; }
constexpr int16_t FXPMinFractionalWordLength() { return -2046; }
constexpr int32_t FXPMetaMaxIWL() { return 32767; }
constexpr int32_t FXPMetaMinIWL() { return -32768; }
constexpr int16_t FXPInvalidPartLength() { return -32768; }

// The integer word lengths an FXP value itself can hold: twice the meta range, so that the step,
// the scale and the product of values within the meta range stay exact. Results beyond it
// saturate (too large) or are rounded at the finest step (too small).
constexpr int32_t FXPMaxStoredIWL() { return 2 * FXPMetaMaxIWL() + 1; }
constexpr int32_t FXPMinStoredIWL() { return 2 * FXPMetaMinIWL(); }
// The lowest binary position any stored bit can have.
constexpr int32_t FXPMinStoredBitPos() { return FXPMinStoredIWL() - FXPMaxWordLength(); }

// Leading and trailing zero bits of a word; 64 for zero.
constexpr int nlz(uint64_t x) { return std::countl_zero(x); }
constexpr int ntz(uint64_t x) { return std::countr_zero(x); }

namespace fxpstorage {

// Number of bits needed for an unsigned 128-bit word (0 for zero).
constexpr int BitLength(FXPUInt128 x) {
  const uint64_t high = static_cast<uint64_t>(x >> 64);
  if (high != 0) return 128 - std::countl_zero(high);
  return 64 - std::countl_zero(static_cast<uint64_t>(x));
}

// Bits of a two's-complement value other than its sign: the length of the value for a
// non-negative one, of its complement for a negative one. So -2^n and 2^n - 1 both give n.
constexpr int MagnitudeBits(FXPInt128 v) {
  return BitLength(static_cast<FXPUInt128>(v < 0 ? ~v : v));
}

// Two's-complement left shift that never shifts a negative signed value.
constexpr FXPInt128 ShiftLeft(FXPInt128 v, int n) {
  return static_cast<FXPInt128>(static_cast<FXPUInt128>(v) << n);
}

// The low wl bits of a word, sign-extended from bit wl - 1 (signed) or zero-extended.
constexpr uint64_t CutToWordLength(uint64_t word, int wl, bool isSigned) {
  if (wl >= 64) return word;
  if (isSigned) {
    const int unused = 64 - wl;
    return static_cast<uint64_t>(static_cast<int64_t>(word << unused) >> unused);
  }
  return word & ((uint64_t{1} << wl) - 1);
}

// Non-negative integer of any size, little-endian 32-bit limbs with no zero limb on top. Only the
// decimal conversions use it; arithmetic on values never allocates.
class UnsignedBigInteger {
 public:
  UnsignedBigInteger() = default;
  explicit UnsignedBigInteger(uint64_t v);
  static UnsignedBigInteger FromUInt128(FXPUInt128 v);

  bool IsZero() const { return limbs_.empty(); }
  size_t BitLength() const;
  bool AnyBitBelow(size_t n) const;  // is any of the n lowest bits set?

  void MultiplySmall(uint32_t m);
  void AddSmall(uint32_t a);
  uint32_t DivideSmall(uint32_t d);  // returns the remainder
  void MultiplyByPowerOfFive(int64_t n);
  void ShiftLeft(size_t n);
  void ShiftRight(size_t n);
  void Subtract(const UnsignedBigInteger& smaller);  // requires *this >= smaller
  int Compare(const UnsignedBigInteger& other) const;

  // Low 128 bits.
  FXPUInt128 Low128() const;
  // Decimal digits, "0" for zero.
  std::string ToDecimal() const;
  // Quotient (which the caller knows to be below 2^126) and whether the division was inexact.
  static FXPUInt128 DivideBounded(UnsignedBigInteger numerator, UnsignedBigInteger denominator,
                                  bool* inexact);

 private:
  void Trim();
  std::vector<uint32_t> limbs_;
};

}  // namespace fxpstorage
}  // namespace vellum
