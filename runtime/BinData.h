// Byte-order-aware reading and writing over memory buffers. Readers are bounded by the bytes
// they were given; writers and readers keep their first error.
#pragma once

#include <cstddef>
#include <cstdint>
#include <new>
#include <utility>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/PXTypes.h"

struct PathRef;
using Path = PathRef*;

// Converts between native order and the order of a stream; the conversion is its own inverse.
class Endianizer {
 public:
  virtual ~Endianizer();
  virtual bool IsBigEndian() const = 0;
  uint16_t Stream16(uint16_t v) const;
  uint32_t Stream32(uint32_t v) const;
  uint64_t Stream64(uint64_t v) const;
  float StreamF32(float v) const;
  double StreamF64(double v) const;
  // True when the stream's order differs from the machine's.
  bool Swaps() const;
  // The bytes of one flattened extended-precision value (see BinDataWriter::WriteExtended).
  static constexpr size_t kExtendedSize = 16;
  size_t ExtendedSize() const { return kExtendedSize; }
};

// Every flattened format of this library is big-endian.
class BigEndianizer : public Endianizer {
 public:
  bool IsBigEndian() const override { return true; }
};

class NativeEndianizer : public Endianizer {
 public:
  bool IsBigEndian() const override;
};

// A read-only view of bytes owned by the caller, with a position.
class InputBuf {
 public:
  InputBuf(const void* data, size_t size);  // a null data reads as 0 bytes
  size_t Size() const { return size_; }
  size_t Position() const { return pos_; }
  size_t BytesLeft() const { return size_ - pos_; }
  // Copies n bytes and advances; false (nothing read, position unchanged) when fewer are left.
  bool Read(void* dst, size_t n);
  bool Skip(size_t n);
  bool Seek(size_t pos);  // false when pos > Size()
  const uint8_t* Data() const { return data_; }

 private:
  const uint8_t* data_;
  size_t size_;
  size_t pos_ = 0;
};

// A growing byte buffer (memory through PXAllocator, so failure injection reaches it).
class OutputBuf {
 public:
  OutputBuf() = default;
  OutputBuf(const OutputBuf&) = delete;
  OutputBuf& operator=(const OutputBuf&) = delete;
  virtual ~OutputBuf();
  // 0, or 2 when memory runs out (nothing written), or 1 for null p with n > 0.
  virtual int32_t Write(const void* p, size_t n);
  virtual size_t GetBytesWritten() const;
  virtual bool IsCounting() const { return false; }
  // Appends n bytes and gives where they start, for the caller to fill; null when memory runs
  // out (nothing appended) or for a counting buffer, which only counts them.
  virtual uint8_t* Extend(size_t n);
  // Replaces n bytes written earlier, from `position` on; 1 when they were not all written yet
  // (a counting buffer accepts any).
  virtual int32_t Overwrite(size_t position, const void* p, size_t n);
  const uint8_t* Data() const { return bytes_.data(); }
  std::vector<uint8_t> Bytes() const;
  // Copies the bytes into *out: a null or non-live *out gets a new handle, a live one is resized.
  int32_t CopyToHandle(UHandle* out) const;
  void Clear();
  // Empties the buffer but keeps its memory for the next use.
  void Rewind() { bytes_.clear(); }

 private:
  // Grows without zero-filling: Extend's callers write every byte it hands out.
  template <class T>
  struct GrowAllocator : PXAllocator<T> {
    template <class U>
    struct rebind {
      using other = GrowAllocator<U>;
    };
    GrowAllocator() noexcept = default;
    template <class U>
    GrowAllocator(const GrowAllocator<U>&) noexcept {}
    template <class U>
    void construct(U* p) noexcept {
      ::new (static_cast<void*>(p)) U;
    }
    template <class U, class... Args>
    void construct(U* p, Args&&... args) {
      ::new (static_cast<void*>(p)) U(std::forward<Args>(args)...);
    }
  };
  std::vector<uint8_t, GrowAllocator<uint8_t>> bytes_;
};

// Counts bytes without storing them, to learn a size before writing.
class PreflightOutputBuf : public OutputBuf {
 public:
  int32_t Write(const void* p, size_t n) override;
  size_t GetBytesWritten() const override { return count_; }
  bool IsCounting() const override { return true; }
  int32_t Overwrite(size_t, const void*, size_t) override { return 0; }
  uint8_t* Extend(size_t n) override;

 private:
  size_t count_ = 0;
};

// Writes values in the endianizer's order. A null endianizer means big-endian. After the first
// error every write does nothing and returns that error; a null OutputBuf is error 42.
class BinDataWriter {
 public:
  BinDataWriter(OutputBuf* out, const Endianizer* e);
  BinDataWriter(const BinDataWriter&) = delete;
  BinDataWriter& operator=(const BinDataWriter&) = delete;
  virtual ~BinDataWriter();

  int32_t WriteI8(int8_t v);
  int32_t WriteI16(int16_t v);
  int32_t WriteI32(int32_t v);
  int32_t WriteI64(int64_t v);
  int32_t WriteU8(uint8_t v);
  int32_t WriteU16(uint16_t v);
  int32_t WriteU32(uint32_t v);
  int32_t WriteU64(uint64_t v);
  int32_t WriteF32(float v);
  int32_t WriteF64(double v);
  // Length byte and bytes; null writes the empty string.
  int32_t WritePStr(const uint8_t* p);
  // 32-bit count and bytes; null writes count 0; a negative count is error 1.
  int32_t WriteLStr(LStrHandle h);
  int32_t WriteBytes(const void* p, size_t n);
  // Appends n bytes for the caller to fill and gives where they start; null when the writer has
  // failed, runs out of memory (2) or only counts bytes (they are counted).
  uint8_t* ReserveBytes(size_t n);
  // `count` values of `size` bytes each (1, 2, 4 or 8), in the stream's order, in one piece.
  int32_t WriteValues(const void* p, size_t size, size_t count);
  // An 80-bit extended value (10 bytes as PXNumbers.h stores them) in 16 bytes: the IEEE
  // binary128 value that equals it, written as two 64-bit halves in the stream's order (high
  // half first when big-endian). Every 80-bit value has one: the exponent bias is the same and the
  // 63 fraction bits lead the 112; only an integer bit that disagrees with the exponent (the
  // unnormal and pseudo-denormal encodings, which binary128 cannot express) is kept apart, in
  // the lowest fraction bit, which is zero for every value that binary128 can hold. Reading
  // restores all 80 bits exactly.
  int32_t WriteExtended(const uint8_t* ten);
  // The flattened form of PXPath.h; a null path is written as not-a-path.
  int32_t WritePath(Path p);
  // Zero bytes up to a multiple of n bytes from the start of the buffer (n 0 or 1: nothing).
  int32_t Align(size_t n);

  int32_t GetError() const { return status_; }
  // Keeps the first nonzero status; 0 changes nothing.
  void SetError(int32_t status);
  size_t GetBytesWritten() const;
  OutputBuf* GetOutputBuf() const { return out_; }
  // Writes continue into `other`; returns the previous buffer.
  OutputBuf* SwapOutputBuf(OutputBuf* other);
  const Endianizer* GetEndianizer() const { return endianizer_; }

 private:
  int32_t Put(const void* p, size_t n);
  OutputBuf* out_;
  const Endianizer* endianizer_;
  int32_t status_ = 0;
};

// Reads values in the endianizer's order (null means big-endian). Reading past the end is
// error 74. After the first error every read does nothing and returns that error. A failed read
// clears its destination: numbers become 0, a PStr empty, bytes zero, an LStr handle empty (or
// null, see ReadLStr), a path null. A null InputBuf is error 42.
class BinDataReader {
 public:
  BinDataReader(InputBuf* in, const Endianizer* e);
  BinDataReader(const BinDataReader&) = delete;
  BinDataReader& operator=(const BinDataReader&) = delete;
  virtual ~BinDataReader();

  int32_t ReadI8(int8_t* v);
  int32_t ReadI16(int16_t* v);
  int32_t ReadI32(int32_t* v);
  int32_t ReadI64(int64_t* v);
  int32_t ReadU8(uint8_t* v);
  int32_t ReadU16(uint16_t* v);
  int32_t ReadU32(uint32_t* v);
  int32_t ReadU64(uint64_t* v);
  int32_t ReadF32(float* v);
  int32_t ReadF64(double* v);
  // buf256 receives the length byte and bytes.
  int32_t ReadPStr(uint8_t* buf256);
  // A 32-bit count and the bytes. A live *h is resized and reused; a null or non-live *h is
  // replaced by a new handle (the old value is not freed). A negative count or one beyond the
  // bytes left is 74. On failure a live *h is left as the empty string, anything else as null.
  int32_t ReadLStr(LStrHandle* h);
  int32_t ReadBytes(void* dst, size_t n);
  // Where the next n bytes of input are, consumed; null (and 74) when fewer are left.
  const uint8_t* TakeBytes(size_t n);
  // `count` values of `size` bytes each (1, 2, 4 or 8) into native order; zeros on failure.
  int32_t ReadValues(void* dst, size_t size, size_t count);
  // The 16-byte form WriteExtended writes, into 10 bytes; zeros on failure.
  int32_t ReadExtended(uint8_t* ten);
  // *p receives a new path owned by the caller (null on failure); the old value is overwritten.
  int32_t ReadPath(Path* p);
  int32_t Skip(size_t n);
  // Skips to a multiple of n bytes from the start of the input (n 0 or 1: nothing).
  int32_t Align(size_t n);

  int32_t GetError() const { return status_; }
  void SetError(int32_t status);  // keeps the first nonzero status
  size_t BytesLeft() const;
  size_t Position() const;
  InputBuf* GetInputBuf() const { return in_; }
  const Endianizer* GetEndianizer() const { return endianizer_; }

 private:
  int32_t Take(void* dst, size_t n);
  InputBuf* in_;
  const Endianizer* endianizer_;
  int32_t status_ = 0;
};
