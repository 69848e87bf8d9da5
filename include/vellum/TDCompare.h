// Ordering of typed data: the three-way comparison that sorting, sets, maps and equality tests on
// data rest on, and the table through which a family takes over the comparison of a type code.
#pragma once

#include <cstdint>

#include "vellum/TDHandles.h"

// Whether a registered comparison applies to a descriptor of its type code.
using CompareDataApplicableProc = bool (*)(const TDR& type);
// A comparison with the arguments of CompareDataTDRCore.
using CompareDataProc = int32_t (*)(const TDR& type, bool nullFirst, const void* a, const void* b,
                                    int32_t variantOption, int32_t bytewise, int32_t rawNumbers);

// The order of data `a` and `b` of `type`: <0, 0 or >0. Numbers by value, strings by their bytes
// (a null handle as the empty string), arrays first by element count, clusters element by
// element. Options count when nonzero:
//   variantOption  passed to the comparison of variants and, as a flag, of sets and maps;
//   bytewise       aggregates without handles, refnums and the elements of arrays of such
//                  elements compare as raw bytes (padding included);
//   rawNumbers     numerics compare as raw bytes instead of by value.
// `nullFirst` orders a null array handle after any other array, whatever its count, instead of
// comparing counts first. Never fails: a null type or null data compare equal (0), and kinds
// without an order compare equal after one diagnostic line. Any thread may call; the data are
// only read, and must not change during the call.
int32_t CompareDataTDRCore(const TDR& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                           int32_t bytewise, int32_t rawNumbers);
// CompareDataTDRCore(type, false, a, b, variantOption, bytewise, 0).
int32_t CompareDataTDR(const TDR& type, const void* a, const void* b, int32_t variantOption, int32_t bytewise);

// Makes `compare` the comparison of every descriptor whose code (without the enumeration or units
// bit 0x10 of codes 1 to 30) is `typeCode`, and of data inside aggregates of such descriptors,
// whenever `applies` is null or answers true for the descriptor; otherwise the built-in
// comparison runs. A later registration for the same code replaces this one. 0; 1 after a
// diagnostic for a null `compare`; 2 when memory runs out (nothing changed). Registrations are
// made at start-up, before comparisons begin; the table is read without a lock.
[[nodiscard]] int32_t RegisterCompareDataFunctionForTypeCode(int16_t typeCode, CompareDataApplicableProc applies,
                                               CompareDataProc compare);
