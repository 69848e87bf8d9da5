// The stream classes of type strings: the writer's save table and the reader's load table.
#include "source/streams/TDDataStreams.h"

#include <algorithm>
#include <new>

#include "runtime/DebugStream.h"
#include "source/streams/RecordFormat.h"

VELLUM_DIAGNOSTIC_MODULE("TD80ReadWrite");

// --- the writer --------------------------------------------------------------------------------------

TDDataWriter::TDDataWriter(const PersistTDData* persist, OutputBuf* out, const Endianizer* endianizer,
                           KoDataWriterOptions options)
    : KoDataWriter(persist, out, endianizer, options) {}

TDDataWriter::~TDDataWriter() = default;

int32_t TDDataWriter::GetSaveTableIndex(const TDImp* type) const {
  if (type == nullptr) return -1;
  const TD key = MakeTDRFromTDImp(type);
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto found = table_.find(key);
  return found != table_.end() ? static_cast<int32_t>(found->second) : -1;
}

int32_t TDDataWriter::AppendTDToSaveTable(const TDImp* type, uint32_t* index) {
  if (type == nullptr) return kStatusBadArgument;
  const TD key = MakeTDRFromTDImp(type);
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto found = table_.find(key);
  if (found != table_.end()) {
    if (index != nullptr) *index = found->second;
    return kStatusNoError;
  }
  const auto next = static_cast<uint32_t>(table_.size());
  try {
    table_.emplace(key, next);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  if (index != nullptr) *index = next;
  return kStatusNoError;
}

int32_t TDDataWriter::GetSaveTableSize() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return static_cast<int32_t>(table_.size());
}

// --- the reader --------------------------------------------------------------------------------------

TDDataReader::TDDataReader(const PersistTDData* persist, InputBuf* in, const Endianizer* endianizer,
                           ReaderOptions options)
    : KoDataReader(persist, in, endianizer, options) {}

TDDataReader::~TDDataReader() = default;

int32_t TDDataReader::ReserveTDLoadTable(uint32_t count) {
  const size_t room = std::min<size_t>(count, BytesLeft() / kMinRecordBytes);
  try {
    table_.reserve(table_.size() + room);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDDataReader::AppendTDToLoadTable(const TDImpPtr& type) {
  try {
    table_.push_back(TDR(type, 1));
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

const TDR& TDDataReader::GetTypeRef() {
  int32_t index = 0;
  if (ReadVariableSizeField(&index) != kStatusNoError) return GNullTD();
  if (index < 0 || static_cast<size_t>(index) >= table_.size()) return GNullTD();
  return table_[static_cast<size_t>(index)];
}

TDImpPtr TDDataReader::RetrieveTDFromLoadTable() { return GetTypeRef().GetImpPtr(); }

const TDR& TDDataReader::RetrieveTDFromLoadTableByIndex(int32_t index) {
  if (index < 0 || static_cast<size_t>(index) >= table_.size()) {
    (VELLUM_DEBUG(2) << "Invalid type index: " << index << ", " << table_.size()).Process();
    return GNullTD();
  }
  return table_[static_cast<size_t>(index)];
}
