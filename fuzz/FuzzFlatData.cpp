// Reads arbitrary bytes as flattened data of a type chosen by the first byte among descriptors of
// every kind, nested, and for a version chosen by its top bits. Whatever is accepted must write
// back, and what is written must read and write again to the same bytes; every handle the reads
// allocate must be given back, accepted or not.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "vellum/DataStreams.h"
#include "vellum.h"

namespace {

constexpr uint32_t kVersions[] = {0x22308000, 0x08602025, 0x04502003, 0x08600000};

TDR Bounded(const TDR& element, int32_t word) {
  TDWArray array(0, element);
  if (array.AddDim(word, 0) != 0) std::abort();
  return array.CheckIn();
}

std::vector<TDR> MakeTypes() {
  const char* texts[] = {
      "iL", "fD", "fX", "cX", "B", "S", "P", "uQ", "[1,iW]", "[2,S]", "[1,B]", "[3,uB]", "[1,*]", "{}",
      "[1,{}]", "{iB,iL,S,[1,fD]}", "{S,[1,{S,[2,iL],P}],cS}", "[1,{iL,fD,S}]", "{{{{S}}}}", "T1", "*",
  };
  std::vector<TDR> types;
  for (const char* text : texts) {
    const TDR type = InterpretedStringToType(text);
    if (!type) std::abort();
    types.push_back(type);
  }
  types.push_back(TDRString(nullptr, 5));
  types.push_back(TDRString(nullptr, vellum::bound::Fixed(4)));
  types.push_back(Bounded(GetiW(), 3));
  types.push_back(Bounded(InterpretedStringToType("{S,iB}"), vellum::bound::Fixed(2)));
  types.push_back(Bounded(TDRString(nullptr, vellum::bound::Fixed(3)), 4));
  TDWRepeatedBlock repeated;
  if (repeated.SetEltTD(InterpretedStringToType("{iW,S}")) != 0 || repeated.SetNumBlocks(3) != 0) std::abort();
  types.push_back(repeated.CheckIn());
  TDWBlock block;
  if (block.SetBlockSize(6) != 0) std::abort();
  types.push_back(block.CheckIn());
  return types;
}

bool Write(const TDR& type, void* data, uint32_t version, std::vector<uint8_t>* bytes) {
  OutputBuf out;
  KoDataWriter writer(&out, version, nullptr, 0);
  if (writer.WriteData(type, data, 1) != 0) return false;
  if (type.FlatDataSize(&writer, data) != out.GetBytesWritten()) std::abort();
  *bytes = out.Bytes();
  return true;
}

int32_t Read(const TDR& type, const uint8_t* data, size_t size, uint32_t version, void* into, size_t* left) {
  InputBuf in(data, size);
  KoDataReader reader(&in, version, nullptr, nullptr, 0);
  const int32_t status = reader.ReadData(type, into, 1);
  *left = reader.BytesLeft();
  return status;
}

void Check(const TDR& type, uint32_t version, const uint8_t* data, size_t size) {
  vellum::Value first(type);
  if (first.Status() != 0) return;
  size_t left = 0;
  if (Read(type, data, size, version, first.Data(), &left) != 0) return;
  std::vector<uint8_t> written;
  if (!Write(type, first.Data(), version, &written)) return;
  vellum::Value second(type);
  if (Read(type, written.data(), written.size(), version, second.Data(), &left) != 0 || left != 0) std::abort();
  std::vector<uint8_t> again;
  if (!Write(type, second.Data(), version, &again) || again != written) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const bool ready = [] {
    SetDebugSink([](const DebugMessage&) {});
    static const vellum::Session session;
    if (session.Status() != 0) std::abort();
    return true;
  }();
  (void)ready;
  static const std::vector<TDR> types = MakeTypes();
  if (size < 1) return 0;
  const TDR& type = types[data[0] % types.size()];
  const uint32_t version = kVersions[(data[0] >> 6) & 3];
  const int64_t liveBefore = DSLiveBlockCount();
  Check(type, version, data + 1, size - 1);
  if (DSLiveBlockCount() != liveBefore) std::abort();
  return 0;
}
