// The data flattener's stream state: the context of one save or load (PersistTDData) and the
// writer that adds a version, that context and options to the runtime's binary writer.
#include "source/KoDataWriter.h"

#include "runtime/DebugStream.h"
#include "runtime/PXApp.h"

namespace {

constexpr int32_t kLargestShortSizeField = 0x7FFF;

}  // namespace

KoDataWriter::KoDataWriter(OutputBuf* out, uint32_t version, const Endianizer* endianizer,
                           KoDataWriterOptions options)
    : BinDataWriter(out, endianizer), options_(options), persist_(&own_), own_(version) {}

KoDataWriter::KoDataWriter(const PersistTDData* persist, OutputBuf* out,
                           const Endianizer* endianizer, KoDataWriterOptions options)
    : BinDataWriter(out, endianizer),
      options_(options),
      persist_(persist ? persist : &own_),
      own_(persist ? *persist : PersistTDData(PXApp::Instance().GetVersion())) {}

KoDataWriter::~KoDataWriter() {
  if (const int32_t status = GetError(); status != kStatusNoError)
    (VELLUM_DEBUG(0) << "KoDataWriter finished with " << status << " error").Process();
}

bool KoDataWriter::IsOnlyDeterminingSize() const {
  const OutputBuf* out = GetOutputBuf();
  return out != nullptr && out->IsCounting();
}

int32_t KoDataWriter::WriteVariableSizeField(int32_t value) {
  if (GetError() != kStatusNoError) return GetError();
  if (value < 0) {
    // A negative value has no form that reads back: its low 16 bits would be taken as the start
    // of a 32-bit field and the rest of the stream misread. Refuse it instead of writing it.
    (VELLUM_DEBUG(3) << "Exceeded limits of TDDataWriter::WriteVariableSizeField").Process();
    SetError(kStatusBadArgument);
    return GetError();
  }
  if (value <= kLargestShortSizeField) return WriteU16(static_cast<uint16_t>(value));
  return WriteU32(static_cast<uint32_t>(value) | 0x80000000u);
}

int32_t KoDataWriter::GetSizeOfVariableSizeField(int32_t value) {
  return value <= kLargestShortSizeField ? 2 : 4;
}

int32_t KoDataWriter::WriteBool(bool value) { return WriteU8(value ? 1 : 0); }
