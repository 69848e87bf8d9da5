// Reads arbitrary bytes as a type string, for the running version, for one before the flag byte
// and alignment markers existed, and for one before typedefs held qualified names. Whatever is accepted must save to a type string that
// loads back and saves to the same bytes again; for the running version, which can say all that
// a record can hold, it must load back as the same interned descriptors. Nothing may leak once
// the type manager has stopped.
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "runtime/DSMemory.h"
#include "support/FreshLibrary.h"
#include "vellum.h"

namespace {

bool SameBytes(UHandle a, UHandle b) {
  const size_t size = DSGetHandleSize(a);
  return size == DSGetHandleSize(b) && std::memcmp(*a, *b, size) == 0;
}

void CheckRoundTrip(const uint8_t* data, size_t size, uint32_t version, bool identical) {
  const PersistTDData persist(version);
  TMTypeList first;
  if (UnFlattenListOfTypes(&persist, data, static_cast<uint32_t>(size), &first, nullptr, 0, nullptr) != 0) return;
  for (int32_t i = 0; i < first.GetNumTypes(); ++i)
    if (!first.GetType(static_cast<uint32_t>(i))) return;  // a list with holes has no saved form

  UHandle saved = nullptr;
  if (FlattenListOfTypes(&persist, &first, nullptr, &saved, 0, nullptr, 0) != 0) std::abort();
  TMTypeList second;
  if (UnFlattenListOfTypes(&persist, saved, &second, nullptr, 0, nullptr) != 0) std::abort();
  if (second.GetNumTypes() != first.GetNumTypes()) std::abort();
  for (int32_t i = 0; identical && i < first.GetNumTypes(); ++i)
    if (!(second.GetType(static_cast<uint32_t>(i)) == first.GetType(static_cast<uint32_t>(i)))) std::abort();
  UHandle again = nullptr;
  if (FlattenListOfTypes(&persist, &second, nullptr, &again, 0, nullptr, 0) != 0) std::abort();
  if (!SameBytes(saved, again)) std::abort();
  DSDisposeHandle(saved);
  DSDisposeHandle(again);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  vellum::fuzz::WithFreshLibrary([&] {
    CheckRoundTrip(data, size, 0x22308000, true);
    // Flags an old record cannot hold (the generic bit) are read but not written back.
    CheckRoundTrip(data, size, 0x08600000, false);
    CheckRoundTrip(data, size, 0x08006000, false);
  });
  return 0;
}
