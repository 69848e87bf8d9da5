// Reads qualified names from arbitrary bytes, both as a flat form and as text. Whatever is
// accepted must survive writing and reading back unchanged.
#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "runtime/BinData.h"
#include "runtime/DebugStream.h"
#include "vellum/DataStreams.h"
#include "vellum/QualifiedName.h"

namespace {

constexpr uint32_t kVersion = 0x22308000;

void CheckFlatRoundTrip(const uint8_t* data, size_t size) {
  const BigEndianizer endianizer;
  InputBuf in(data, size);
  KoDataReader reader(&in, kVersion, nullptr, &endianizer, 0);
  QualifiedName name;
  if (name.UnFlatten(&reader) != 0) return;

  OutputBuf out;
  KoDataWriter writer(&out, kVersion, &endianizer, 0);
  if (name.Flatten(&writer) != 0) std::abort();
  if (name.GetFlatSize(kVersion) != static_cast<int32_t>(out.GetBytesWritten())) std::abort();

  const std::vector<uint8_t> bytes = out.Bytes();
  InputBuf again(bytes.data(), bytes.size());
  KoDataReader rereader(&again, kVersion, nullptr, &endianizer, 0);
  QualifiedName back;
  if (back.UnFlatten(&rereader) != 0 || !back.Equal(name) || rereader.BytesLeft() != 0)
    std::abort();
}

// A text without empty components has a text form that parses back to the same name; empty
// components would turn into doubled delimiters, which parse as one.
void CheckTextRoundTrip(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  QualifiedName name;
  if (name.FromDelimitedName(text) != 0) std::abort();
  for (int32_t i = 0; i < name.NumElts(); ++i) {
    if (name[i].empty()) return;
  }
  std::string printed;
  if (name.ToDelimitedName(&printed) != 0) std::abort();
  QualifiedName back;
  if (back.FromDelimitedName(printed) != 0 || !back.Equal(name)) std::abort();

  QualifiedName checked;
  if (checked.FromDelimitedNameWithSanityCheck(text) == 0 && !checked.Equal(name)) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool quiet = [] {
    SetDebugSink([](const DebugMessage&) {});
    return true;
  }();
  (void)quiet;
  CheckFlatRoundTrip(data, size);
  CheckTextRoundTrip(data, size);
  return 0;
}
