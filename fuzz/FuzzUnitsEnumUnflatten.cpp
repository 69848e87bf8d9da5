// Reads arbitrary bytes as the units of a Float64 and as the enumeration of an EnumUInt8: each
// time the bytes are the payload of the one record of a big-endian type string, followed by the
// flag byte and the list's one entry. Whatever loads must save with records of their announced
// size, never longer than the string read, and load back as the same interned descriptors; nothing
// may be left behind once the dictionaries are collected.
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "runtime/PXServices.h"
#include "vellum.h"

namespace {

constexpr uint32_t kVersion = 0x22308000;
constexpr uint8_t kFloat64WithUnits = 0x1A;
constexpr uint8_t kEnumUInt8 = 0x15;
// A variable-size field below this value takes two bytes, from it on four with bit 31 set.
constexpr size_t kLongFieldFrom = 0x8000;

void PutU16(std::vector<uint8_t>* bytes, uint32_t value) {
  bytes->push_back(static_cast<uint8_t>(value >> 8));
  bytes->push_back(static_cast<uint8_t>(value));
}

void PutSizeField(std::vector<uint8_t>* bytes, size_t value) {
  if (value < kLongFieldFrom) {
    PutU16(bytes, static_cast<uint32_t>(value));
    return;
  }
  const auto field = static_cast<uint32_t>(value) | 0x80000000u;
  PutU16(bytes, field >> 16);
  PutU16(bytes, field & 0xFFFF);
}

// A type string of one record of `code` whose payload starts with `data`: the flag byte 0 and
// one entry at index 0 follow, and are read only when the payload ends where `data` does.
std::vector<uint8_t> Wrap(uint8_t code, const uint8_t* data, size_t size) {
  std::vector<uint8_t> bytes = {0x00, 0x00, 0x00, 0x01};
  size_t recordSize = 2 + 2 + size + 1;
  if (recordSize >= kLongFieldFrom) recordSize += 2;
  PutSizeField(&bytes, recordSize);
  PutU16(&bytes, code);
  bytes.insert(bytes.end(), data, data + size);
  bytes.push_back(0x00);
  PutU16(&bytes, 1);
  PutU16(&bytes, 0);
  return bytes;
}

std::vector<uint8_t> Save(const PersistTDData& persist, const TMTypeList& list) {
  UHandle saved = nullptr;
  if (FlattenListOfTypes(&persist, &list, nullptr, &saved, 0, nullptr, 0) != 0) std::abort();
  std::vector<uint8_t> bytes(*saved, *saved + DSGetHandleSize(saved));
  DSDisposeHandle(saved);
  return bytes;
}

// The record's size as its field gives it.
size_t RecordSizeField(const std::vector<uint8_t>& saved) {
  if (saved.size() < 8) std::abort();
  const uint32_t first = (uint32_t{saved[4]} << 8) | saved[5];
  if ((first & 0x8000) == 0) return first;
  return ((first & 0x7FFF) << 16) | (uint32_t{saved[6]} << 8) | saved[7];
}

void CheckRoundTrip(uint8_t code, const uint8_t* data, size_t size) {
  const PersistTDData persist(kVersion);
  const std::vector<uint8_t> wrapped = Wrap(code, data, size);
  TMTypeList first;
  if (UnFlattenListOfTypes(&persist, wrapped.data(), static_cast<uint32_t>(wrapped.size()), &first, nullptr, 0,
                           nullptr) != 0)
    return;
  const int32_t entries = first.GetNumTypes();
  for (int32_t i = 0; i < entries; ++i)
    if (!first.GetType(static_cast<uint32_t>(i))) return;  // a list with holes has no saved form

  const std::vector<uint8_t> saved = Save(persist, first);
  if (entries > 0) {
    // One record, then the entry count and one two-byte index per entry.
    if (saved[0] != 0 || saved[1] != 0 || saved[2] != 0 || saved[3] != 1) std::abort();
    const size_t listBytes = (static_cast<size_t>(entries) < kLongFieldFrom ? 2 : 4) + 2 * static_cast<size_t>(entries);
    if (4 + RecordSizeField(saved) + listBytes != saved.size()) std::abort();
  }
  // Reading normalises (keys, zero exponents, pad bytes), so the saved form may be shorter than
  // what was read, never longer.
  if (saved.size() > wrapped.size()) std::abort();

  TMTypeList second;
  if (UnFlattenListOfTypes(&persist, saved.data(), static_cast<uint32_t>(saved.size()), &second, nullptr, 0,
                           nullptr) != 0)
    std::abort();
  if (second.GetNumTypes() != entries) std::abort();
  for (int32_t i = 0; i < entries; ++i) {
    const TDR& type = first.GetType(static_cast<uint32_t>(i));
    const TDR& again = second.GetType(static_cast<uint32_t>(i));
    if (!(again == type) || type.GetTypeCode() != code) std::abort();
    if (type.CompareForSorting(again) != 0) std::abort();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  // The type manager runs for the whole process, which is cheaper than a start and stop per
  // input; a collection after each input gives back what the input interned. Units and an
  // enumeration are loaded once first, so that the dictionaries' own tables exist before counting.
  static ServiceManager services;
  static const bool ready = [] {
    SetDebugSink([](const DebugMessage&) {});
    if (services.Start(TypeManagerService()) != 0) std::abort();
    const uint8_t metersSquared[] = {0x00, 0x01, 0x00, 0x03, 0x00, 0x02};
    const uint8_t itemA[] = {0x00, 0x01, 0x01, 0x61};
    CheckRoundTrip(kFloat64WithUnits, metersSquared, sizeof metersSquared);
    CheckRoundTrip(kEnumUInt8, itemA, sizeof itemA);
    GarbageCollectDictionaries();
    return true;
  }();
  (void)ready;
  const int64_t liveBefore = DSLiveBlockCount();
  CheckRoundTrip(kFloat64WithUnits, data, size);
  CheckRoundTrip(kEnumUInt8, data, size);
  GarbageCollectDictionaries();
  if (DSLiveBlockCount() != liveBefore) std::abort();
  return 0;
}
