// The data unflattener's stream state: the runtime's binary reader with the version of the
// format being read, the persist context, options and the variable-size field.
#include "source/KoDataReader.h"

#include "runtime/PXApp.h"

KoDataReader::KoDataReader(InputBuf* in, uint32_t version, const KoContext* context,
                           const Endianizer* endianizer, ReaderOptions options)
    : BinDataReader(in, endianizer), options_(options), persist_(&own_), own_(version, context) {}

KoDataReader::KoDataReader(const PersistTDData* persist, InputBuf* in,
                           const Endianizer* endianizer, ReaderOptions options)
    : BinDataReader(in, endianizer),
      options_(options),
      persist_(persist ? persist : &own_),
      own_(persist ? *persist : PersistTDData(PXApp::Instance().GetVersion())) {}

KoDataReader::~KoDataReader() = default;

int32_t KoDataReader::ReadVariableSizeField(int32_t* value) {
  if (value) *value = 0;
  int16_t first = 0;
  if (const int32_t status = ReadI16(&first); status != kStatusNoError) return status;
  int32_t result = first;
  if (first < 0) {
    uint16_t second = 0;
    if (const int32_t status = ReadU16(&second); status != kStatusNoError) return status;
    result = static_cast<int32_t>(((static_cast<uint32_t>(first) & 0x7FFFu) << 16) | second);
  }
  if (value) *value = result;
  return kStatusNoError;
}

// The override lives in the reader's own context, so that everything that asks the reader for
// its context (nested readers of descriptors, say) reads with the overridden version as well.
KoDataReader::VersionOverride::VersionOverride(KoDataReader* reader, uint32_t version)
    : reader_(reader),
      savedPersist_(reader ? reader->persist_ : nullptr),
      savedOwnVersion_(reader ? reader->own_.GetVersion() : 0) {
  if (!reader_) return;
  if (reader_->persist_ != &reader_->own_) {
    // The own context was copied from the caller's at construction; bring it up to date.
    reader_->own_ = *reader_->persist_;
  }
  reader_->own_.SetVersion(version);
  reader_->persist_ = &reader_->own_;
}

KoDataReader::VersionOverride::~VersionOverride() {
  if (!reader_) return;
  reader_->own_.SetVersion(savedOwnVersion_);
  reader_->persist_ = savedPersist_;
}
