// Reads arbitrary bytes as flattened units and as a flattened enumeration (big-endian). Whatever
// is accepted must flatten to its announced size and read back as an equal object; nothing may
// leak either way.
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "vellum/TypeStrings.h"
#include "vellum/TDEnumHandles.h"
#include "vellum/TDUnitsHandles.h"

namespace {

constexpr uint32_t kVersion = 0x22308000;

template <class Imp>
void CheckRoundTrip(const uint8_t* data, size_t size) {
  const BigEndianizer endianizer;
  const PersistTDData persist(kVersion);
  TDTypedPtr<Imp> first = MakeCounted<Imp>();
  if (!first) return;
  InputBuf in(data, size);
  TDDataReader reader(&persist, &in, &endianizer, 0);
  const int32_t status = first->UnFlatten(&reader);
  if (status != reader.GetError()) std::abort();
  if (status != 0) return;

  OutputBuf out;
  TDDataWriter writer(&persist, &out, &endianizer);
  if (first->Flatten(&writer) != 0) std::abort();
  int32_t flatSize = 0;
  first->AddFlatSize(&flatSize, &writer);
  if (static_cast<size_t>(flatSize) != out.GetBytesWritten()) std::abort();
  // Reading normalises (keys, zero exponents, pad bytes), so the bytes read may be longer than
  // the canonical form, never shorter.
  if (out.GetBytesWritten() > reader.Position()) std::abort();

  const std::vector<uint8_t> bytes = out.Bytes();
  TDTypedPtr<Imp> second = MakeCounted<Imp>();
  if (!second) return;
  InputBuf again(bytes.data(), bytes.size());
  TDDataReader rereader(&persist, &again, &endianizer, 0);
  if (second->UnFlatten(&rereader) != 0 || rereader.BytesLeft() != 0) std::abort();
  if (second->IsEqual(*first) == 0 || first->IsEqual(*second) == 0) std::abort();
  if (second->GetHashValue() != first->GetHashValue() || second->CompareForSorting(*first) != 0) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool quiet = [] {
    SetDebugSink([](const DebugMessage&) {});
    return true;
  }();
  (void)quiet;
  const int64_t liveBefore = DSLiveBlockCount();
  CheckRoundTrip<TDUnitsImp>(data, size);
  CheckRoundTrip<TDEnumImp>(data, size);
  if (DSLiveBlockCount() != liveBefore) std::abort();
  return 0;
}
