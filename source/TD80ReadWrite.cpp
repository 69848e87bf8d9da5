// Type strings: the stream classes that write and read lists of descriptors, each descriptor
// once, with containers referring to their elements by index.
#include "source/TD80ReadWrite.h"

TDDataWriter::TDDataWriter(const PersistTDData* persist, OutputBuf* out,
                           const Endianizer* endianizer, KoDataWriterOptions options)
    : KoDataWriter(persist, out, endianizer, options) {}

TDDataWriter::~TDDataWriter() = default;

TDDataReader::TDDataReader(const PersistTDData* persist, InputBuf* in,
                           const Endianizer* endianizer, ReaderOptions options)
    : KoDataReader(persist, in, endianizer, options) {}

TDDataReader::~TDDataReader() = default;
