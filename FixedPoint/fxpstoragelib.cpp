// Storage-level tools of the fixed-point library: the unsigned big integer behind exact decimal
// text. Everything else in fxpstoragelib is inline.
#include "FixedPoint/fxpstoragelib.h"

#include <algorithm>

namespace vellum::fxpstorage {

UnsignedBigInteger::UnsignedBigInteger(uint64_t v) {
  while (v != 0) {
    limbs_.push_back(static_cast<uint32_t>(v));
    v >>= 32;
  }
}

UnsignedBigInteger UnsignedBigInteger::FromUInt128(FXPUInt128 v) {
  UnsignedBigInteger r;
  while (v != 0) {
    r.limbs_.push_back(static_cast<uint32_t>(v));
    v >>= 32;
  }
  return r;
}

void UnsignedBigInteger::Trim() {
  while (!limbs_.empty() && limbs_.back() == 0) limbs_.pop_back();
}

size_t UnsignedBigInteger::BitLength() const {
  if (limbs_.empty()) return 0;
  return 32 * (limbs_.size() - 1) + (32 - static_cast<size_t>(std::countl_zero(limbs_.back())));
}

bool UnsignedBigInteger::AnyBitBelow(size_t n) const {
  const size_t whole = std::min(n / 32, limbs_.size());
  for (size_t i = 0; i < whole; ++i)
    if (limbs_[i] != 0) return true;
  if (whole < limbs_.size() && n % 32 != 0) return (limbs_[whole] & ((uint32_t{1} << (n % 32)) - 1)) != 0;
  return false;
}

void UnsignedBigInteger::MultiplySmall(uint32_t m) {
  uint64_t carry = 0;
  for (uint32_t& limb : limbs_) {
    const uint64_t t = static_cast<uint64_t>(limb) * m + carry;
    limb = static_cast<uint32_t>(t);
    carry = t >> 32;
  }
  if (carry != 0) limbs_.push_back(static_cast<uint32_t>(carry));
  Trim();
}

void UnsignedBigInteger::AddSmall(uint32_t a) {
  uint64_t carry = a;
  for (size_t i = 0; carry != 0; ++i) {
    if (i == limbs_.size()) limbs_.push_back(0);
    const uint64_t t = static_cast<uint64_t>(limbs_[i]) + carry;
    limbs_[i] = static_cast<uint32_t>(t);
    carry = t >> 32;
  }
}

uint32_t UnsignedBigInteger::DivideSmall(uint32_t d) {
  uint64_t rem = 0;
  for (size_t i = limbs_.size(); i-- > 0;) {
    const uint64_t cur = (rem << 32) | limbs_[i];
    limbs_[i] = static_cast<uint32_t>(cur / d);
    rem = cur % d;
  }
  Trim();
  return static_cast<uint32_t>(rem);
}

void UnsignedBigInteger::MultiplyByPowerOfFive(int64_t n) {
  constexpr uint32_t kFiveToThe13 = 1220703125;  // the largest power of five below 2^32
  for (; n >= 13; n -= 13) MultiplySmall(kFiveToThe13);
  uint32_t rest = 1;
  for (; n > 0; --n) rest *= 5;
  MultiplySmall(rest);
}

void UnsignedBigInteger::ShiftLeft(size_t n) {
  if (limbs_.empty() || n == 0) return;
  const size_t whole = n / 32;
  const unsigned part = static_cast<unsigned>(n % 32);
  if (part != 0) {
    uint32_t carry = 0;
    for (uint32_t& limb : limbs_) {
      const uint32_t next = limb >> (32 - part);
      limb = (limb << part) | carry;
      carry = next;
    }
    if (carry != 0) limbs_.push_back(carry);
  }
  limbs_.insert(limbs_.begin(), whole, 0);
}

void UnsignedBigInteger::ShiftRight(size_t n) {
  const size_t whole = n / 32;
  if (whole >= limbs_.size()) {
    limbs_.clear();
    return;
  }
  limbs_.erase(limbs_.begin(), limbs_.begin() + static_cast<std::ptrdiff_t>(whole));
  const unsigned part = static_cast<unsigned>(n % 32);
  if (part != 0) {
    for (size_t i = 0; i < limbs_.size(); ++i) {
      const uint32_t high = i + 1 < limbs_.size() ? limbs_[i + 1] << (32 - part) : 0;
      limbs_[i] = (limbs_[i] >> part) | high;
    }
  }
  Trim();
}

void UnsignedBigInteger::Subtract(const UnsignedBigInteger& smaller) {
  int64_t borrow = 0;
  for (size_t i = 0; i < limbs_.size(); ++i) {
    int64_t t = static_cast<int64_t>(limbs_[i]) - borrow - (i < smaller.limbs_.size() ? smaller.limbs_[i] : 0);
    borrow = t < 0 ? 1 : 0;
    if (t < 0) t += int64_t{1} << 32;
    limbs_[i] = static_cast<uint32_t>(t);
  }
  Trim();
}

int UnsignedBigInteger::Compare(const UnsignedBigInteger& other) const {
  if (limbs_.size() != other.limbs_.size()) return limbs_.size() < other.limbs_.size() ? -1 : 1;
  for (size_t i = limbs_.size(); i-- > 0;)
    if (limbs_[i] != other.limbs_[i]) return limbs_[i] < other.limbs_[i] ? -1 : 1;
  return 0;
}

FXPUInt128 UnsignedBigInteger::Low128() const {
  FXPUInt128 r = 0;
  for (size_t i = std::min<size_t>(limbs_.size(), 4); i-- > 0;) r = (r << 32) | limbs_[i];
  return r;
}

std::string UnsignedBigInteger::ToDecimal() const {
  if (limbs_.empty()) return "0";
  constexpr uint32_t kChunk = 1000000000;  // nine digits at a time
  UnsignedBigInteger rest = *this;
  std::string reversed;
  while (!rest.IsZero()) {
    uint32_t chunk = rest.DivideSmall(kChunk);
    for (int i = 0; i < 9; ++i) {
      reversed.push_back(static_cast<char>('0' + chunk % 10));
      chunk /= 10;
      if (rest.IsZero() && chunk == 0) break;
    }
  }
  while (reversed.size() > 1 && reversed.back() == '0') reversed.pop_back();
  return std::string(reversed.rbegin(), reversed.rend());
}

FXPUInt128 UnsignedBigInteger::DivideBounded(UnsignedBigInteger numerator, UnsignedBigInteger denominator,
                                             bool* inexact) {
  FXPUInt128 quotient = 0;
  const size_t numBits = numerator.BitLength();
  const size_t denBits = denominator.BitLength();
  if (denBits != 0 && numBits >= denBits) {
    // Shift-and-subtract: the quotient is known to be short, so one pass per quotient bit.
    const size_t shift = std::min<size_t>(numBits - denBits, 126);
    denominator.ShiftLeft(shift);
    for (size_t i = shift + 1; i-- > 0;) {
      if (numerator.Compare(denominator) >= 0) {
        numerator.Subtract(denominator);
        quotient |= FXPUInt128{1} << i;
      }
      denominator.ShiftRight(1);
    }
  }
  *inexact = !numerator.IsZero();
  return quotient;
}

}  // namespace vellum::fxpstorage
