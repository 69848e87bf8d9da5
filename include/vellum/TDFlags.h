// The bits callers pass to and get back from type compatibility (TD::CmpTD) and data copies
// (TD::CopyData, TDR::CopyDataConvert).
#pragma once

#include <cstdint>

// Result bits of type compatibility (CmpTD).
constexpr int32_t kCmpMinor = 0x1;
constexpr int32_t kCmpNeedsConversion = 0x10;
constexpr int32_t kCmpTypedefDiffers = 0x20;
constexpr int32_t kCmpEnumDiffers = 0x80;
constexpr int32_t kCmpIncompatible = 0x100;
constexpr int32_t kCmpUnitsDiffer = 0x800;
constexpr int32_t kCmpNamesDiffer = 0x8000;
constexpr int32_t kCmpMayLoseInformation = 0x80000;

// Flags of CmpTD.
constexpr int32_t kCmpFlagCompareNames = 0x1;
constexpr int32_t kCmpFlagCompareNamesDeep = 0x2;
constexpr int32_t kCmpFlagTypedefIncompatible = 0x4;
constexpr int32_t kCmpFlagIgnoreTypedefs = 0x8;
constexpr int32_t kCmpFlagCompareFlagWords = 0x40;
// Numbers: a refnum cookie may go into a UInt32 or UInt64, an enumeration into a plain number.
constexpr int32_t kCmpFlagLooseNumbers = 0x100;
constexpr int32_t kCmpFlagTypedefBit = 0x400;
constexpr int32_t kCmpFlagReportLoss = 0x2000;
// Numbers: units may be dropped or added where one side has none.
constexpr int32_t kCmpFlagIgnoreMissingUnits = 0x4000;
constexpr int32_t kCmpFlagIgnoreTimeStamps = 0x8000;
constexpr int32_t kCmpFlagDropLinksIfAny = 0x40000;
// Numbers: destination units with a polymorphic unit accept any units.
constexpr int32_t kCmpFlagPolyUnitsMatchAny = 0x80000;
constexpr int32_t kCmpFlagSecondPass = 0x100000;
// Numbers: an enumeration may go into a plain number.
constexpr int32_t kCmpFlagEnumIntoPlain = 0x800000;
constexpr int32_t kCmpFlagGenericMatters = 0x8000000;
constexpr int32_t kCmpFlagEphemeralMatters = 0x10000000;

// CmpTD result bits of the string family: data of a String (0x2) or a SubString (0xA) meets a
// tag, and sizes, bounds or kinds differ (0x8). A caller passing flag 0x10 asks for no 0x8 where
// only the sizes differ.
constexpr int32_t kCmpStringMeetsTag = 0x2;
constexpr int32_t kCmpStringSizesDiffer = 0x8;
constexpr int32_t kCmpSubStringMeetsTag = 0xA;
constexpr int32_t kCmpFlagNoStringSizeBits = 0x10;

// CmpTD result bit: the cluster element counts differ.
constexpr int32_t kCmpEltCountsDiffer = 0x1000;

// CmpTD result bits of arrays: a dimension of the destination is fixed, or bounded below the
// source's size; the dimension counts differ; one side's element matches the other, non-array side.
constexpr int32_t kCmpDimensionLimited = 0xA;
constexpr int32_t kCmpDimsDiffer = 0x200;
constexpr int32_t kCmpEltMatchesNonArray = 0x400;

// Flags of a copy. Other bits pass unchanged to element copies and to the families' converters.
// Arrays and clusters copy into the other Boolean width (Boolean and BooleanU16).
constexpr int32_t kCopyFlagBooleanForm = 0x1;
// Cluster-to-cluster conversion skips source elements that are arrays; the bit is removed before
// the elements are converted.
constexpr int32_t kCopyFlagSkipArrays = 0x2;
