// Small questions about descriptors and a few shared descriptors that callers often need.
#pragma once

#include <cstdint>
#include <string>

#include "vellum/TDHandles.h"

// 1 unless `type`, measure-data wrapper removed, is an array kind, a cluster or a repeated block.
int32_t IsScalarType(const TDR& type);
// A measure-data descriptor's element cluster; any other descriptor itself.
TDR IgnoreMDTWrapper(const TDR& type);
// What a view kind converts to: a SubString's string, a SubArray's array; any other descriptor
// itself.
TDR TDRFromSubType(const TDR& type);
// The first context found in a walk of `type` (pre-order, elements in order); null when none.
const KoContext* TDRGetContextIfAvailable(const TDR& type);
// The value at `data` as text: numbers (their enumeration and units variants too) and Booleans
// as a standard stream prints them by default (8-bit integers as numbers, Booleans as 0 or 1);
// "?" for every other kind; "NULL" for a null type or null data.
std::string ValueToString(const TDR& type, const void* data);
// The element-count word of an Array (TDRArrayBase::BoundedOrFixed): -1 when a dimension is
// variable, 0x80000001 for no dimensions, else the product of the sizes with bit 31 set when all
// are fixed. Anything but an Array is reported ("Bad array", level 4) and gives 0x80000000.
int32_t BoundedOrFixedArrayType(const TDR& array);
// 1 for the analog waveform flavors 1, 2, 3, 5 and 10 to 20.
int32_t IsMDTAnalogWaveformFlavor(uint16_t flavor);

// The shared error cluster "error IO" {Boolean "status", Int32 "code", String "source"}, built on
// first use and released when the service stops; null when it cannot be built.
const TDR& GetErrorIOCTD();
