// Version rules: whether bytes saved by one version predate a change of the format, across
// release branches that were developed side by side.
#pragma once

#include <cstdint>

#include "vellum/Versions.h"

// The versions that changed a stored format, in order. Readers and writers of every layer test
// these names, so that one change is described once.
// Booleans took a 16-bit word (0x8000 for true) before this version, one byte from it on.
constexpr uint32_t kOneByteBooleanVersion = 0x04502004;
// Typedef links held one name (a PStr) before this version, a qualified name from it on.
constexpr uint32_t kTypedefOneNameVersion = 0x08006016;
// Descriptors inside data of older versions are read and written by the host's procedures.
constexpr uint32_t kTypesInDataVersion = 0x08002184;
// The user-defined tag's class entered the tag record in this version.
constexpr uint32_t kTagClassVersion = 0x08102000;
// Fixed point did not exist before this version; it is saved as Float64 for older ones.
constexpr uint32_t kFixedPointVersion = 0x08208003;
// Alignment markers were added in this version.
constexpr uint32_t kAlignmentMarkerVersion = 0x08602000;
// Before this version a raw pointer took four zero bytes in flattened data.
constexpr uint32_t kPointerPlaceholderVersion = 0x08602026;
// Consolidated types were first written by this version.
constexpr uint32_t kConsolidatedTypesVersion = 0x08602039;
// Versions before this one wrote consolidated references with consolidation suppressed.
constexpr uint32_t kSuppressedConsolidationVersion = 0x08604005;
// The numeric record's flag byte entered in this version.
constexpr uint32_t kNumFlagsVersion = 0x08604012;
// From this version on, the inner size of a typedef record leaves out the bytes of the typedef
// part as written; before it, those of the one-name layout that preceded qualified names.
constexpr uint32_t kInnerSizeVersion = 0x08608002;
// The generic flag reached the record's code word in this version.
constexpr uint32_t kGenericFlagVersion = 0x09002000;

// Versions whose tag records carry the tag's user data.
constexpr bool TagCarriesUserData(uint32_t version) {
  return (version >= 0x08208003 && version < 0x08212000) || version >= 0x08502031;
}

// The first version whose type strings can hold a record of `code` (0 for kinds as old as the
// format): writers refuse to save the kind for an earlier version, and readers refuse such a record.
uint32_t FirstVersionWithTypeCode(int32_t code);
