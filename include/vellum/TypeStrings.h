// Type strings: lists of descriptors saved as one flat byte string and loaded back, the version
// rules that decide how older strings read, and the hooks for descriptors of the oldest format.
#pragma once

#include <cstdint>

#include "runtime/BinData.h"
#include "runtime/PXTypes.h"
#include "vellum/DataStreams.h"
#include "vellum/TDHandles.h"
#include "vellum/TMTypeList.h"
#include "vellum/Versions.h"

// What a type string may describe. A load refuses, with status 2 and a message naming the limit,
// a descriptor nested deeper than kMaxTypeNestingDepth levels (every recursive walk over a
// descriptor at the limit fits a 1 MiB stack), one whose tree counts more than
// kMaxTypeExpandedCount descriptors when each is counted every time it occurs, and one whose
// data would not fit in 31 bits.
constexpr uint32_t kMaxTypeNestingDepth = 256;
constexpr uint64_t kMaxTypeExpandedCount = uint64_t{1} << 24;

// Writes the type string of `list` into a new handle stored in *outHandle (the caller disposes
// of it). `extra` (may be null) holds one value per entry, stored after its index. `single`
// selects the one-type reference form of consolidated types; with `skipNull`, empty entries are
// not written. A null endianizer writes big-endian. A null `persist` writes the running
// application's version. 0, or the failing status; no handle on failure.
[[nodiscard]] int32_t FlattenListOfTypes(const PersistTDData* persist, const TMTypeList* list, const uint32_t* extra,
                           UHandle* outHandle, int32_t single, const Endianizer* endianizer, int32_t skipNull);
// A one-entry list (an empty one for the null descriptor) in the `single` form.
[[nodiscard]] int32_t FlattenOneType(const PersistTDData* persist, const TDR& type, UHandle* outHandle,
                       const Endianizer* endianizer);
// Flattened big-endian and added as resource (`resType`, `resId`) of file `fileRef`, which then
// owns the handle.
[[nodiscard]] int32_t SaveListOfTypes(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                        const TMTypeList* list, const uint32_t* extra, int32_t single, int32_t skipNull);
[[nodiscard]] int32_t SaveListOfOneType(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                          const TDR& type);

// Reads a type string from bytes that come from outside, appending its entries to *out. With
// `outExtra`, the entries' extra values go into a new pointer block the caller frees with
// DSDisposePtr (null when there are none). 0; 1 for a null list; 2 when the string is damaged,
// exceeds a limit or memory runs out (a message says which).
[[nodiscard]] int32_t UnFlattenListOfTypes(const PersistTDData* persist, const uint8_t* data, uint32_t size, TMTypeList* out,
                             uint32_t** outExtra, int32_t single, const Endianizer* endianizer);
[[nodiscard]] int32_t UnFlattenListOfTypes(const PersistTDData* persist, UHandle handle, TMTypeList* out, uint32_t** outExtra,
                             int32_t single, const Endianizer* endianizer);
// The one descriptor of a one-entry string (the null descriptor for an empty one); 42 when it
// holds more than one.
[[nodiscard]] int32_t UnFlattenOneType(const PersistTDData* persist, UHandle handle, TDR* out, const Endianizer* endianizer);
[[nodiscard]] int32_t UnFlattenOneType(const PersistTDData* persist, const uint8_t* data, uint32_t size, TDR* out,
                         const Endianizer* endianizer);
[[nodiscard]] int32_t LoadListOfOneType(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                          TDR* out);

// The host's readers and writers of descriptors inside data older than 0x08002184.
using ReadOldTDProc = TDR (*)(KoDataReader* reader);
using WriteOldTDProc = uint32_t (*)(KoDataWriter* writer, const TDR& type);
void SetReadOldTDProc(ReadOldTDProc proc);
void SetWriteOldTDProc(WriteOldTDProc proc);
ReadOldTDProc GetReadOldTDProc();
WriteOldTDProc GetWriteOldTDProc();
