// The data flattener's stream state: the context of one save or load (PersistTDData) and the
// writer that adds a version, that context and options to the runtime's binary writer.
#include "source/streams/KoDataWriter.h"

#include <deque>
#include <mutex>

#include "runtime/DebugStream.h"
#include "runtime/PXApp.h"
#include "source/streams/KoCMutate.h"
#include "vellum/TypeStrings.h"

VELLUM_DIAGNOSTIC_MODULE("KoDataWriter");

namespace {

constexpr int32_t kLargestShortSizeField = 0x7FFF;


}  // namespace

struct PersistTDData::PendingQueue {
  std::mutex mutex;
  std::deque<uint32_t> indices;
};

PersistTDData::PersistTDData(uint32_t version, const KoContext* context, PersistTDDataOptions options)
    : context_(context), version_(version), apiVersion_(PXApp::Instance().GetVersion()), options_(options) {
  Init();
}

PersistTDData::PersistTDData(TMTypeList* typeList, const KoContext* context, uint32_t version,
                             PersistTDDataOptions options, uint32_t apiVersion)
    : context_(context),
      version_(version),
      apiVersion_(apiVersion != 0 ? apiVersion : PXApp::Instance().GetVersion()),
      options_(options) {
  if (version_ > apiVersion_) DebugReport(kDiagnosticModule, __LINE__, 3, "The API version should be passed to KoDataWriter");
  Init();
  SetTypeList(typeList);
}

void PersistTDData::Init() {
  consolidationEnabled_ = !VersionShouldMutate(version_, kConsolidatedTypesVersion, apiVersion_);
  if (DefersIndices() && !pending_) pending_ = std::make_shared<PendingQueue>();
}

void PersistTDData::SetVersion(uint32_t version) {
  version_ = version;
  consolidationEnabled_ = !VersionShouldMutate(version_, kConsolidatedTypesVersion, apiVersion_);
}

bool PersistTDData::PersistingWithConsolidatedTypes() const {
  if (!consolidationEnabled_ || (options_ & kPersistSuppressConsolidation) != 0) return false;
  return typeList_ != nullptr || (options_ & (kPersistDeferIndices | kPersistDropSharedList)) != 0;
}

bool PersistTDData::VersionUsedSuppressedConsolidatedTypes() const {
  return VersionShouldMutate(version_, kSuppressedConsolidationVersion, apiVersion_);
}

void PersistTDData::SetTypeList(TMTypeList* typeList) {
  if (consolidationEnabled_ && (options_ & kPersistDropSharedList) == 0) typeList_ = typeList;
}

void PersistTDData::LogSaveForPrevWarning(int32_t code) const {
  if (sink_ != nullptr) sink_->LogSaveForPrevWarning(code);
}

bool PersistTDData::PushPendingIndex(uint32_t index) const {
  if (!pending_) return false;
  const std::lock_guard<std::mutex> lock(pending_->mutex);
  pending_->indices.push_back(index);
  return true;
}

bool PersistTDData::PopPendingIndex(uint32_t* index) const {
  if (!pending_) return false;
  const std::lock_guard<std::mutex> lock(pending_->mutex);
  if (pending_->indices.empty()) return false;
  *index = pending_->indices.front();
  pending_->indices.pop_front();
  return true;
}

const PersistTDData& GetPersistTDDataCurrentVersion() {
  static const PersistTDData context(PXApp::Instance().GetVersion());
  return context;
}

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

int32_t KoDataWriter::WriteBool(bool value) {
  if (GetVersion() < kOneByteBooleanVersion) return WriteU16(value ? 0x8000 : 0);
  return WriteU8(value ? 1 : 0);
}

int32_t KoDataWriter::WriteData(const TD& type, const void* data, int32_t count) {
  if (GetError() != kStatusNoError) return GetError();
  if (!type) {
    SetError(kStatusNullHandle);
    return GetError();
  }
  int32_t status = kStatusNoError;
  type.WriteData(this, data, count, &status);
  SetError(status);
  return GetError();
}

int32_t KoDataWriter::WriteTD(const TDR& type) {
  if (GetError() != kStatusNoError) return GetError();
  if (GetVersion() < kTypesInDataVersion) {
    const WriteOldTDProc writeOld = GetWriteOldTDProc();
    if (writeOld == nullptr) {
      DebugReport(kDiagnosticModule, __LINE__, 4, "No callback to write old TD");
      SetError(kStatusNullHandle);
      return GetError();
    }
    writeOld(this, type);
    return GetError();
  }
  UHandle flat = nullptr;
  const int32_t status = FlattenOneType(GetPersistTDData(), type, &flat, GetEndianizer());
  if (status != kStatusNoError) {
    SetError(status);
    return status;
  }
  WriteBytes(*flat, DSGetHandleSize(flat));
  DSDisposeHandle(flat);
  return GetError();
}
