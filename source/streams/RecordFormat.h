// The record format of type strings: the code word's bits, the typedef marker and the smallest
// record and list entry. Writer and reader both take them from here, so they cannot disagree.
#pragma once

#include <cstddef>
#include <cstdint>

// The code word of a record: the type code in the low byte, flags above it.
constexpr uint16_t kCodeWordTypeCodeMask = 0x00FF;
constexpr uint16_t kCodeWordNoSelect = 0x8000;        // descriptor flag 0x0008
constexpr uint16_t kCodeWordNamed = 0x4000;           // a name part follows the payload
constexpr uint16_t kCodeWordColumnVector = 0x0800;    // descriptor flag 0x4000
constexpr uint16_t kCodeWordGeneric = 0x0400;         // descriptor flag 0x2000, from 0x09002000 on
constexpr uint16_t kCodeWordEphemeral = 0x0200;       // descriptor flag 0x0004; never on a function
constexpr uint16_t kCodeWordEventDiscard = 0x0100;    // descriptor flag 0x0002, Booleans only

// A record with a typedef link starts with this in place of the code word; the link, the inner
// size and the real code word follow.
constexpr uint16_t kTypedefMarker = 0x00F1;

// The smallest record: a 2-byte size and the code word.
constexpr size_t kMinRecordBytes = 4;
// The smallest list entry: a 2-byte index.
constexpr size_t kMinEntryBytes = 2;
