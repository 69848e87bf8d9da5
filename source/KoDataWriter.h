// The data flattener's stream state: the context of one save or load (PersistTDData) and the
// writer that adds a version, that context and options to the runtime's binary writer.
#pragma once

#include <cstdint>

#include "runtime/BinData.h"
#include "runtime/PXTypes.h"

// Options of one save or load. The bits are the ones a context keeps for consolidated types.
using PersistTDDataOptions = uint32_t;
constexpr PersistTDDataOptions kPersistDropSharedList = 0x1;         // keep no shared type list
constexpr PersistTDDataOptions kPersistDeferIndices = 0x2;           // queue consolidated references
constexpr PersistTDDataOptions kPersistSuppressConsolidation = 0x4;  // no consolidated types

// The context of one save or load of descriptors and data: the version word being written or
// read, the application context the descriptors belong to, and options. A small value; copies
// are independent. The context pointer is carried along, never dereferenced or owned.
class PersistTDData {
 public:
  static constexpr uint32_t kType = 0x44445450;

  explicit PersistTDData(uint32_t version, const KoContext* context = nullptr,
                         PersistTDDataOptions options = 0)
      : context_(context), version_(version), options_(options) {}

  uint32_t GetType() const { return kType; }
  uint32_t GetVersion() const { return version_; }
  void SetVersion(uint32_t version) { version_ = version; }
  const KoContext* GetContext() const { return context_; }
  PersistTDDataOptions GetOptions() const { return options_; }

 private:
  const KoContext* context_;
  uint32_t version_;
  PersistTDDataOptions options_;
};

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

  // One byte, 1 for true and 0 for false.
  int32_t WriteBool(bool value);

 private:
  KoDataWriterOptions options_;
  const PersistTDData* persist_;  // the caller's context, or own_
  PersistTDData own_;
};
