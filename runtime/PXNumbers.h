// Numeric kinds by type code, conversion between them, and float classification.
//
// Codes: 0x01 Int8, 0x02 Int16, 0x03 Int32, 0x04 Int64, 0x05 UInt8, 0x06 UInt16, 0x07 UInt32,
// 0x08 UInt64, 0x09 Float32, 0x0A Float64, 0x0B FloatExt, 0x0C Complex64 (two Float32),
// 0x0D Complex128 (two Float64), 0x0E ComplexExt (two FloatExt). The codes with an attached
// enumeration or unit (0x15-0x17 and 0x19-0x1E) are the same kinds. 0x11-0x14 and 0x18 are
// not numeric: no kind of this system carries a modifier there.
//
// FloatExt is the 80-bit extended value (sign, 15-bit exponent, 64-bit significand with an
// explicit integer bit) stored in 10 little-endian bytes; values are read and written
// unaligned, so callers may pass any address.
//
// ConvertNum rules:
//   - integer -> integer: the value saturates at the destination's range.
//   - floating -> integer: rounds to nearest, ties to even; saturates at the range (infinities
//     included); NaN becomes 0.
//   - integer -> floating, and floating -> narrower floating: rounds to nearest (ties to even);
//     out-of-range magnitudes become infinities.
//   - complex -> real or integer: the real part, then the rules above.
//   - real or integer -> complex: the real part converted, imaginary part 0.
//   - complex -> complex: both parts converted.
//   - src and dst may be the same or overlapping memory.
#pragma once

#include <cstdint>

// 1, 2, 4, 8, 1, 2, 4, 8, 4, 8, 10, 8, 16, 20 for the codes in order; 0 for a non-numeric code.
int32_t NumSize(int32_t code);

enum : int32_t { kNumClassNone = 0, kNumClassInteger = 1, kNumClassReal = 2, kNumClassComplex = 3 };
// 0 not numeric, 1 integer, 2 real floating, 3 complex.
int32_t NumClass(int32_t code);

// The code without its enumeration/unit modifier; non-numeric codes come back unchanged.
int32_t NumBaseCode(int32_t code);

// 0, or 1 for a non-numeric code or a null pointer (dst is then untouched).
int32_t ConvertNum(int32_t srcCode, const void* src, int32_t dstCode, void* dst);

enum : int32_t { kFloatClassZero = 0, kFloatClassFinite = 1, kFloatClassInfinite = 2, kFloatClassNaN = 3 };
// For Float32, Float64 and FloatExt (modifier allowed). -1 for any other code or a null value.
// Denormals are finite. An extended value whose integer bit disagrees with its exponent
// (an "unnormal") is NaN.
int32_t ClassifyFloatNumber(int32_t code, const void* value);

double DInfinity();
double DNegInfinity();

// FloatExt bytes to and from the widest native floating type.
long double ExtendedToLongDouble(const uint8_t* ten);
void LongDoubleToExtended(long double v, uint8_t* ten);
