// The data unflattener's stream state: the runtime's binary reader with the version of the
// format being read, the persist context, options and the variable-size field.
#pragma once

#include <cstdint>

#include "runtime/BinData.h"
#include "runtime/PXTypes.h"
#include "source/KoDataWriter.h"

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
