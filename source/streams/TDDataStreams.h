// The stream classes of type strings: a writer with its save table and a reader with its load
// table, so that each descriptor is written once and containers refer to their elements by index.
#pragma once

#include <cstdint>
#include <mutex>
#include <vector>

#include <boost/unordered_map.hpp>

#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/KoDataWriter.h"
#include "vellum/TDHandles.h"

// Writes a type string. The context, output buffer and endianizer belong to the caller and must
// outlive the writer; a null context stands for the running application's version. The save
// table holds every descriptor written so far; equal descriptors share one record.
class TDDataWriter : public KoDataWriter {
 public:
  TDDataWriter(const PersistTDData* persist, OutputBuf* out, const Endianizer* endianizer,
               KoDataWriterOptions options = 0);
  ~TDDataWriter() override;

  // The save-table index of a descriptor equal to `type`, or -1.
  int32_t GetSaveTableIndex(const TDImp* type) const;
  // Adds `type` (a reference is kept) and gives its index, the number of entries before it. An
  // equal descriptor already present keeps its index. 1 for null; 2 when memory runs out.
  int32_t AppendTDToSaveTable(const TDImp* type, uint32_t* index);
  int32_t GetSaveTableSize() const;

 private:
  struct Hash {
    size_t operator()(const TD& type) const { return static_cast<size_t>(type.GetHashValue()); }
  };
  struct Equal {
    bool operator()(const TD& a, const TD& b) const { return a == b || a.IsSameAs(b) != 0; }
  };
  // The keys hold references, so a descriptor lives as long as the table names it.
  using Table = boost::unordered_map<TD, uint32_t, Hash, Equal, PXAllocator<std::pair<const TD, uint32_t>>>;

  mutable std::mutex mutex_;
  Table table_;
};

// Reads a type string from bytes that come from outside. Ownership as for TDDataWriter. The load
// table holds the descriptors read so far, in record order.
class TDDataReader : public KoDataReader {
 public:
  TDDataReader(const PersistTDData* persist, InputBuf* in, const Endianizer* endianizer,
               ReaderOptions options = 0);
  ~TDDataReader() override;

  // Reads one record and gives its interned descriptor, also appended to the load table; the
  // null descriptor when the record is damaged or refused (the reader's error then says why,
  // except for a size below 4, which leaves the error clear). It builds descriptors through the
  // whole type system, so it is defined with the type-string loader.
  const TDR& ConstructEltTD();
  // Room for `count` entries, no more than the remaining bytes can hold records for.
  int32_t ReserveTDLoadTable(uint32_t count);
  int32_t AppendTDToLoadTable(const TDImpPtr& type);
  // A VSF index read from the stream and that load-table entry; the null descriptor outside.
  TDImpPtr RetrieveTDFromLoadTable();
  const TDR& GetTypeRef();
  // The entry at `index`; outside the table, "Invalid type index: " (level 2) and null.
  const TDR& RetrieveTDFromLoadTableByIndex(int32_t index);
  int32_t GetLoadTableSize() const { return static_cast<int32_t>(table_.size()); }

 private:
  std::vector<TDR, PXAllocator<TDR>> table_;
};
