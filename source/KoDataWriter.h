// The data flattener's stream state: the context of one save or load (PersistTDData) and the
// writer that adds a version, that context and options to the runtime's binary writer.
#pragma once

#include <cstdint>
#include <memory>

#include "runtime/BinData.h"
#include "runtime/PXTypes.h"
#include "vellum/TDHandles.h"

// Options of one save or load. The bits are the ones a context keeps for consolidated types.
using PersistTDDataOptions = uint32_t;
constexpr PersistTDDataOptions kPersistDropSharedList = 0x1;         // keep no shared type list
constexpr PersistTDDataOptions kPersistDeferIndices = 0x2;           // queue consolidated references
constexpr PersistTDDataOptions kPersistSuppressConsolidation = 0x4;  // no consolidated types

// Told when a save for an earlier version loses information; `code` says what was lost
// (1: a fixed-point type saved as Float64).
class IPersistWarningSink {
 public:
  virtual ~IPersistWarningSink() = default;
  virtual void LogSaveForPrevWarning(int32_t code) = 0;
};

class TMTypeList;

// The context of one save or load of descriptors and data: the version word being written or
// read, the application context the descriptors belong to, options, and for consolidated types
// the shared type list and the queue of pending type indices. A small value: copies share the
// caller's list, sink and queue, none of which the context owns (the queue is shared and lives
// as long as its last copy). The context pointer is carried along, never dereferenced.
class PersistTDData {
 public:
  static constexpr uint32_t kType = 0x44445450;

  explicit PersistTDData(uint32_t version, const KoContext* context = nullptr, PersistTDDataOptions options = 0);
  // A context for consolidated types kept in `typeList` (not owned; it must outlive every copy).
  // `apiVersion` 0 stands for the running application's version; a version above it is reported.
  PersistTDData(TMTypeList* typeList, const KoContext* context, uint32_t version, PersistTDDataOptions options,
                uint32_t apiVersion = 0);

  uint32_t GetType() const { return kType; }
  uint32_t GetVersion() const { return version_; }
  void SetVersion(uint32_t version);
  const KoContext* GetContext() const { return context_; }
  PersistTDDataOptions GetOptions() const { return options_; }

  // Whether the version written or read knows consolidated types at all.
  bool ConsolidationEnabled() const { return consolidationEnabled_; }
  bool PersistingWithConsolidatedTypes() const;
  bool VersionUsedSuppressedConsolidatedTypes() const;
  bool DefersIndices() const { return (options_ & kPersistDeferIndices) != 0; }
  TMTypeList* GetTypeList() const { return typeList_; }
  // Takes the list only when consolidation is enabled and no shared list is to be dropped.
  void SetTypeList(TMTypeList* typeList);

  void SetWarningSink(IPersistWarningSink* sink) { sink_ = sink; }
  void LogSaveForPrevWarning(int32_t code) const;

  // The pending-index queue of deferred consolidated references: a reader pushes, a writer pops.
  // Pop gives false when the queue is empty (or was never made: only deferring contexts have one).
  bool PushPendingIndex(uint32_t index) const;
  bool PopPendingIndex(uint32_t* index) const;

 private:
  struct PendingQueue;
  TMTypeList* typeList_ = nullptr;
  const KoContext* context_;
  uint32_t version_;
  uint32_t apiVersion_;
  PersistTDDataOptions options_;
  IPersistWarningSink* sink_ = nullptr;
  bool consolidationEnabled_ = false;
  std::shared_ptr<PendingQueue> pending_;

  void Init();
};

// A process-wide context for the running application's version, built once.
const PersistTDData& GetPersistTDDataCurrentVersion();

using KoDataWriterOptions = uint32_t;
// The writer only determines sizes; no data exist to be written.
constexpr KoDataWriterOptions kKoDataWriterDeterminingSizeWithoutData = 0x1;

// Writes flattened data of one format version. The output buffer and the endianizer belong to
// the caller and must outlive the writer. The error is sticky: after the first failing write
// every write does nothing and returns that status. One thread at a time.
class KoDataWriter : public BinDataWriter {
 public:
  static constexpr uint32_t kType = 0x5744564C;

  // A writer with a context of its own: `version`, no application context, no options.
  KoDataWriter(OutputBuf* out, uint32_t version, const Endianizer* endianizer,
               KoDataWriterOptions options);
  // A writer that uses the caller's context, which must outlive it. A null context stands for
  // the running application's version.
  KoDataWriter(const PersistTDData* persist, OutputBuf* out, const Endianizer* endianizer,
               KoDataWriterOptions options);
  // A writer that still holds an error says so on the debug stream (level 0).
  ~KoDataWriter() override;

  KoDataWriter(const KoDataWriter&) = delete;
  KoDataWriter& operator=(const KoDataWriter&) = delete;

  virtual uint32_t GetType() const { return kType; }
  uint32_t GetVersion() const { return persist_->GetVersion(); }
  const KoContext* GetContext() const { return persist_->GetContext(); }
  const PersistTDData* GetPersistTDData() const { return persist_; }
  KoDataWriterOptions GetOptions() const { return options_; }

  bool IsDeterminingSizeWithoutData() const {
    return (options_ & kKoDataWriterDeterminingSizeWithoutData) != 0;
  }
  // True when the output buffer only counts bytes.
  bool IsOnlyDeterminingSize() const;
  virtual bool IsRTDataWriter() const { return false; }

  // A value below 32768 is 16 bits; larger values are 32 bits with bit 31 set. A negative value
  // cannot be represented: it is reported (level 3) and its low 16 bits are written.
  int32_t WriteVariableSizeField(int32_t value);
  // The bytes WriteVariableSizeField writes for `value`: 2 or 4.
  static int32_t GetSizeOfVariableSizeField(int32_t value);

  // One byte, 1 for true and 0 for false; before 0x04502004 a 16-bit word, 0x8000 for true.
  int32_t WriteBool(bool value);

  // `count` values of `type` from `data` in their flattened form; the stream's status.
  int32_t WriteData(const TD& type, const void* data, int32_t count);

  // A descriptor inside data: its one-entry type string (the host's writer for versions before
  // 0x08002184). The flattening's status becomes the stream's.
  int32_t WriteTD(const TDR& type);

 private:
  KoDataWriterOptions options_;
  const PersistTDData* persist_;  // the caller's context, or own_
  PersistTDData own_;
};
