// The data unflattener's stream state: the runtime's binary reader with the version of the
// format being read, the persist context, options and the variable-size field.
#include "source/streams/KoDataReader.h"

#include <algorithm>

#include "runtime/DebugStream.h"
#include "runtime/PXApp.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TMTypeList.h"
#include "vellum/TypeStrings.h"

VELLUM_DIAGNOSTIC_MODULE("KoDataReader");

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

namespace {

constexpr uint64_t kAllocationAllowance = uint64_t{2} << 20;
constexpr uint64_t kAllocationPerInputByte = 32;

}  // namespace

uint8_t KoDataReader::ReadBool() {
  if (GetVersion() < kOneByteBooleanVersion) {
    uint16_t word = 0;
    ReadU16(&word);
    return (word & 0x8000) != 0 ? 1 : 0;
  }
  uint8_t byte = 0;
  ReadU8(&byte);
  return byte != 0 ? 1 : 0;
}

int32_t KoDataReader::ReadData(const TD& type, void* data, int32_t count) {
  if (!type) {
    SetError(kStatusNullHandle);
    return GetError();
  }
  int32_t status = GetError();
  type.ReadData(this, data, count, &status);
  SetError(status);
  return GetError();
}

bool KoDataReader::MayAllocate(uint64_t bytes) {
  const uint64_t left = BytesLeft();
  const uint64_t limit = std::max(kAllocationAllowance, left * kAllocationPerInputByte);
  if (bytes <= limit) return true;
  (VELLUM_DEBUG(2) << "ReadData refused an allocation of " << bytes
                   << " bytes: more than max(2 MiB, 32 x the " << left << " bytes of input left)")
      .Process();
  SetError(kStatusImplausibleData);
  return false;
}

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

TDR KoDataReader::ReadTD() {
  if (GetError() != kStatusNoError) return TDR();
  if (GetVersion() < kTypesInDataVersion) {
    const ReadOldTDProc readOld = GetReadOldTDProc();
    if (readOld == nullptr) {
      DebugReport(kDiagnosticModule, __LINE__, 4, "No callback to read old TD");
      SetError(kStatusNullHandle);
      return TDR();
    }
    return readOld(this);
  }
  const PersistTDData& persist = *GetPersistTDData();
  if (persist.PersistingWithConsolidatedTypes()) {
    int32_t reference = 0;
    if (ReadVariableSizeField(&reference) != kStatusNoError) return TDR();
    if (persist.DefersIndices()) {
      persist.PushPendingIndex(static_cast<uint32_t>(reference));
      return TDR();
    }
    const TMTypeList* shared = persist.GetTypeList();
    if (shared == nullptr || reference <= 0) return TDR();
    return shared->GetType(static_cast<uint32_t>(reference - 1));
  }
  // The nested reader reads from this reader's input; its failures become this reader's.
  TDDataReader types(&persist, GetInputBuf(), GetEndianizer(), GetOptions());
  uint32_t records = 0;
  types.ReadU32(&records);
  if (types.GetError() == kStatusNoError) types.ReserveTDLoadTable(records);
  for (uint32_t r = 0; r < records && types.GetError() == kStatusNoError; ++r)
    if (!types.ConstructEltTD() && types.GetError() == kStatusNoError) types.SetError(kStatusCorruptData);
  int32_t entries = 0;
  types.ReadVariableSizeField(&entries);
  TDR result;
  if (types.GetError() == kStatusNoError) {
    if (entries == 1) {
      result = types.GetTypeRef();
    } else if (entries != 0) {
      types.SetError(kStatusCorruptData);
    }
  }
  if (types.GetError() != kStatusNoError) {
    SetError(types.GetError());
    return TDR();
  }
  return result;
}
