// Type strings: the stream classes that write and read lists of descriptors, each descriptor
// once, with containers referring to their elements by index.
#pragma once

#include <cstdint>

#include "runtime/BinData.h"
#include "source/KoDataReader.h"
#include "source/KoDataWriter.h"

// Writes a type string. The context, output buffer and endianizer belong to the caller and must
// outlive the writer; a null context stands for the running application's version.
class TDDataWriter : public KoDataWriter {
 public:
  TDDataWriter(const PersistTDData* persist, OutputBuf* out, const Endianizer* endianizer,
               KoDataWriterOptions options = 0);
  ~TDDataWriter() override;
};

// Reads a type string from bytes that come from outside. Ownership as for TDDataWriter.
class TDDataReader : public KoDataReader {
 public:
  TDDataReader(const PersistTDData* persist, InputBuf* in, const Endianizer* endianizer,
               ReaderOptions options);
  ~TDDataReader() override;
};
