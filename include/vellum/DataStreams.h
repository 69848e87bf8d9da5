// Flattened data streams: the context of one save or load (PersistTDData), the writer and the
// reader of data of one format version over the runtime's binary streams.
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

// Options of a reader; nested readers are given the same options.
using ReaderOptions = uint32_t;

// Reads flattened data of one format version from bytes that come from outside. The input
// buffer and the endianizer belong to the caller and must outlive the reader. The error is
// sticky: after the first failure every read does nothing, returns that status and clears its
// destination. Reading past the end is status 74. One thread at a time.
class KoDataReader : public BinDataReader {
 public:
  static constexpr uint32_t kType = 0x5244564C;

  // A reader with a context of its own built from `version` and `context`.
  KoDataReader(InputBuf* in, uint32_t version, const KoContext* context,
               const Endianizer* endianizer, ReaderOptions options);
  // A reader that uses the caller's context, which must outlive it. A null context stands for
  // the running application's version.
  KoDataReader(const PersistTDData* persist, InputBuf* in, const Endianizer* endianizer,
               ReaderOptions options);
  ~KoDataReader() override;

  KoDataReader(const KoDataReader&) = delete;
  KoDataReader& operator=(const KoDataReader&) = delete;

  virtual uint32_t GetType() const { return kType; }
  uint32_t GetVersion() const { return persist_->GetVersion(); }
  const KoContext* GetContext() const { return persist_->GetContext(); }
  // The context in use; while a VersionOverride is alive it carries the overridden version.
  const PersistTDData* GetPersistTDData() const { return persist_; }
  ReaderOptions GetOptions() const { return options_; }

  // Reads a 16-bit value; when it is negative, a second 16-bit word follows and the value is
  // ((first & 0x7FFF) << 16) | second. `value` may be null to skip the field; on failure it is 0.
  int32_t ReadVariableSizeField(int32_t* value);

  // As KoDataWriter::WriteBool wrote it: true for a nonzero byte, or for bit 15 of the old word.
  uint8_t ReadBool();

  // `count` values of `type` into `data` (which holds default data of the type, or null to skip
  // the values); the stream's status. A failed read leaves the values cleared or default and
  // releases what it allocated.
  int32_t ReadData(const TD& type, void* data, int32_t count);

  // Whether a read may allocate `bytes` now: a single allocation may take no more than
  // max(2 MiB, 32 x the input left), so that memory follows what the input pays for. A refusal
  // is status 116 with a message naming the limit.
  bool MayAllocate(uint64_t bytes);

  // A descriptor inside data, as WriteTD wrote it; the null descriptor on failure (or for a
  // string with no entry). More than one entry is 74.
  TDR ReadTD();

  // Reads with `version` for as long as it lives (nested readers made from the reader's context
  // see it too), then restores the version and context the reader had. Overrides nest; they
  // must end in reverse order of their creation, which scoping gives.
  class VersionOverride {
   public:
    VersionOverride(KoDataReader* reader, uint32_t version);
    ~VersionOverride();
    VersionOverride(const VersionOverride&) = delete;
    VersionOverride& operator=(const VersionOverride&) = delete;

   private:
    KoDataReader* reader_;
    const PersistTDData* savedPersist_;
    uint32_t savedOwnVersion_;
  };

 private:
  ReaderOptions options_;
  const PersistTDData* persist_;  // the caller's context, or own_
  PersistTDData own_;             // a copy of the caller's context, or built from the version
};
