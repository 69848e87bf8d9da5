// Readers and writers of byte streams. A reader never reads beyond its InputBuf, and both keep
// their first error so callers can check once after a sequence of reads or writes.
#include "runtime/BinData.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>

#include "runtime/PXPath.h"

namespace {

const BigEndianizer kBigEndian;

uint16_t Swap16(uint16_t v) { return static_cast<uint16_t>((v >> 8) | (v << 8)); }
uint32_t Swap32(uint32_t v) {
  return ((v & 0xFF000000u) >> 24) | ((v & 0x00FF0000u) >> 8) | ((v & 0x0000FF00u) << 8) | ((v & 0x000000FFu) << 24);
}
uint64_t Swap64(uint64_t v) {
  return (static_cast<uint64_t>(Swap32(static_cast<uint32_t>(v))) << 32) | Swap32(static_cast<uint32_t>(v >> 32));
}

size_t PaddingTo(size_t position, size_t n) {
  if (n <= 1) return 0;
  const size_t rest = position % n;
  return rest == 0 ? 0 : n - rest;
}

}  // namespace

Endianizer::~Endianizer() = default;

bool Endianizer::Swaps() const { return IsBigEndian() != (std::endian::native == std::endian::big); }

uint16_t Endianizer::Stream16(uint16_t v) const { return Swaps() ? Swap16(v) : v; }
uint32_t Endianizer::Stream32(uint32_t v) const { return Swaps() ? Swap32(v) : v; }
uint64_t Endianizer::Stream64(uint64_t v) const { return Swaps() ? Swap64(v) : v; }
float Endianizer::StreamF32(float v) const { return std::bit_cast<float>(Stream32(std::bit_cast<uint32_t>(v))); }
double Endianizer::StreamF64(double v) const { return std::bit_cast<double>(Stream64(std::bit_cast<uint64_t>(v))); }

bool NativeEndianizer::IsBigEndian() const { return std::endian::native == std::endian::big; }

// ---- InputBuf

InputBuf::InputBuf(const void* data, size_t size)
    : data_(static_cast<const uint8_t*>(data)), size_(data ? size : 0) {}

bool InputBuf::Read(void* dst, size_t n) {
  if (n > BytesLeft()) return false;
  if (n != 0) {
    if (!dst) return false;
    std::memcpy(dst, data_ + pos_, n);
  }
  pos_ += n;
  return true;
}

bool InputBuf::Skip(size_t n) {
  if (n > BytesLeft()) return false;
  pos_ += n;
  return true;
}

bool InputBuf::Seek(size_t pos) {
  if (pos > size_) return false;
  pos_ = pos;
  return true;
}

// ---- OutputBuf

OutputBuf::~OutputBuf() = default;

int32_t OutputBuf::Write(const void* p, size_t n) {
  if (n == 0) return kStatusNoError;
  if (!p) return kStatusBadArgument;
  try {
    const auto* bytes = static_cast<const uint8_t*>(p);
    bytes_.insert(bytes_.end(), bytes, bytes + n);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  } catch (const std::length_error&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

uint8_t* OutputBuf::Extend(size_t n) {
  const size_t at = bytes_.size();
  try {
    bytes_.resize(at + n);
  } catch (const std::bad_alloc&) {
    return nullptr;
  } catch (const std::length_error&) {
    return nullptr;
  }
  return bytes_.data() + at;
}

uint8_t* PreflightOutputBuf::Extend(size_t n) {
  count_ += n;
  return nullptr;
}

int32_t OutputBuf::Overwrite(size_t position, const void* p, size_t n) {
  if (n == 0) return kStatusNoError;
  if (p == nullptr || position > bytes_.size() || n > bytes_.size() - position) return kStatusBadArgument;
  std::memcpy(bytes_.data() + position, p, n);
  return kStatusNoError;
}

size_t OutputBuf::GetBytesWritten() const { return bytes_.size(); }

std::vector<uint8_t> OutputBuf::Bytes() const { return std::vector<uint8_t>(bytes_.begin(), bytes_.end()); }

int32_t OutputBuf::CopyToHandle(UHandle* out) const {
  if (!out) return kStatusBadArgument;
  UHandle h = IsDSHandle(*out) ? *out : nullptr;
  if (int32_t err = DSSetHandleSizeOrNewHandle(&h, bytes_.size())) return err;
  if (!bytes_.empty()) std::memcpy(*h, bytes_.data(), bytes_.size());
  *out = h;
  return kStatusNoError;
}

void OutputBuf::Clear() {
  bytes_.clear();
  bytes_.shrink_to_fit();
}

int32_t PreflightOutputBuf::Write(const void* p, size_t n) {
  if (n != 0 && !p) return kStatusBadArgument;
  if (n > std::numeric_limits<size_t>::max() - count_) return kStatusOutOfMemory;
  count_ += n;
  return kStatusNoError;
}

// ---- BinDataWriter

BinDataWriter::BinDataWriter(OutputBuf* out, const Endianizer* e)
    : out_(out), endianizer_(e ? e : &kBigEndian), status_(out ? 0 : kStatusNullHandle) {}

BinDataWriter::~BinDataWriter() = default;

void BinDataWriter::SetError(int32_t status) {
  if (status_ == 0) status_ = status;
}

int32_t BinDataWriter::Put(const void* p, size_t n) {
  if (status_ != 0) return status_;
  if (!out_) {
    SetError(kStatusNullHandle);
    return status_;
  }
  if (int32_t err = out_->Write(p, n)) SetError(err);
  return status_;
}

int32_t BinDataWriter::WriteI8(int8_t v) { return Put(&v, 1); }
int32_t BinDataWriter::WriteU8(uint8_t v) { return Put(&v, 1); }
int32_t BinDataWriter::WriteI16(int16_t v) { return WriteU16(static_cast<uint16_t>(v)); }
int32_t BinDataWriter::WriteI32(int32_t v) { return WriteU32(static_cast<uint32_t>(v)); }
int32_t BinDataWriter::WriteI64(int64_t v) { return WriteU64(static_cast<uint64_t>(v)); }

int32_t BinDataWriter::WriteU16(uint16_t v) {
  const uint16_t s = endianizer_->Stream16(v);
  return Put(&s, sizeof s);
}

int32_t BinDataWriter::WriteU32(uint32_t v) {
  const uint32_t s = endianizer_->Stream32(v);
  return Put(&s, sizeof s);
}

int32_t BinDataWriter::WriteU64(uint64_t v) {
  const uint64_t s = endianizer_->Stream64(v);
  return Put(&s, sizeof s);
}

int32_t BinDataWriter::WriteF32(float v) { return WriteU32(std::bit_cast<uint32_t>(v)); }
int32_t BinDataWriter::WriteF64(double v) { return WriteU64(std::bit_cast<uint64_t>(v)); }

int32_t BinDataWriter::WritePStr(const uint8_t* p) {
  const uint8_t empty = 0;
  const uint8_t* s = p ? p : &empty;
  return Put(s, static_cast<size_t>(s[0]) + 1);
}

int32_t BinDataWriter::WriteLStr(LStrHandle h) {
  if (status_ != 0) return status_;
  const int32_t n = LHStrLen(h);
  if (n < 0) {
    SetError(kStatusBadArgument);
    return status_;
  }
  if (WriteI32(n) != 0 || n == 0) return status_;
  return Put((*h)->str, static_cast<size_t>(n));
}

int32_t BinDataWriter::WriteBytes(const void* p, size_t n) {
  if (status_ == 0 && n != 0 && !p) SetError(kStatusBadArgument);
  return Put(p, n);
}

int32_t BinDataWriter::WritePath(Path p) {
  if (status_ != 0) return status_;
  return FFlattenPath2(p, *this);
}

int32_t BinDataWriter::Align(size_t n) {
  static const uint8_t kZeros[16] = {};
  size_t pad = PaddingTo(GetBytesWritten(), n);
  while (pad != 0 && status_ == 0) {
    const size_t chunk = std::min(pad, sizeof kZeros);
    Put(kZeros, chunk);
    pad -= chunk;
  }
  return status_;
}

size_t BinDataWriter::GetBytesWritten() const { return out_ ? out_->GetBytesWritten() : 0; }

OutputBuf* BinDataWriter::SwapOutputBuf(OutputBuf* other) {
  OutputBuf* old = out_;
  out_ = other;
  return old;
}

// ---- BinDataReader

BinDataReader::BinDataReader(InputBuf* in, const Endianizer* e)
    : in_(in), endianizer_(e ? e : &kBigEndian), status_(in ? 0 : kStatusNullHandle) {}

BinDataReader::~BinDataReader() = default;

void BinDataReader::SetError(int32_t status) {
  if (status_ == 0) status_ = status;
}

size_t BinDataReader::BytesLeft() const { return in_ ? in_->BytesLeft() : 0; }

size_t BinDataReader::Position() const { return in_ ? in_->Position() : 0; }

int32_t BinDataReader::Take(void* dst, size_t n) {
  if (status_ == 0 && (!in_ || !in_->Read(dst, n))) SetError(in_ ? kStatusCorruptData : kStatusNullHandle);
  if (status_ != 0 && dst && n != 0) std::memset(dst, 0, n);
  return status_;
}

int32_t BinDataReader::ReadU8(uint8_t* v) {
  uint8_t s = 0;
  Take(&s, sizeof s);
  if (v) *v = s;
  return status_;
}

int32_t BinDataReader::ReadI8(int8_t* v) {
  uint8_t u = 0;
  ReadU8(&u);
  if (v) *v = static_cast<int8_t>(u);
  return status_;
}

int32_t BinDataReader::ReadI16(int16_t* v) {
  uint16_t u = 0;
  ReadU16(&u);
  if (v) *v = static_cast<int16_t>(u);
  return status_;
}

int32_t BinDataReader::ReadI32(int32_t* v) {
  uint32_t u = 0;
  ReadU32(&u);
  if (v) *v = static_cast<int32_t>(u);
  return status_;
}

int32_t BinDataReader::ReadI64(int64_t* v) {
  uint64_t u = 0;
  ReadU64(&u);
  if (v) *v = static_cast<int64_t>(u);
  return status_;
}

int32_t BinDataReader::ReadU16(uint16_t* v) {
  uint16_t s = 0;
  if (Take(&s, sizeof s) == 0) s = endianizer_->Stream16(s);
  if (v) *v = s;
  return status_;
}

int32_t BinDataReader::ReadU32(uint32_t* v) {
  uint32_t s = 0;
  if (Take(&s, sizeof s) == 0) s = endianizer_->Stream32(s);
  if (v) *v = s;
  return status_;
}

int32_t BinDataReader::ReadU64(uint64_t* v) {
  uint64_t s = 0;
  if (Take(&s, sizeof s) == 0) s = endianizer_->Stream64(s);
  if (v) *v = s;
  return status_;
}

int32_t BinDataReader::ReadF32(float* v) {
  uint32_t u = 0;
  ReadU32(&u);
  if (v) *v = std::bit_cast<float>(u);
  return status_;
}

int32_t BinDataReader::ReadF64(double* v) {
  uint64_t u = 0;
  ReadU64(&u);
  if (v) *v = std::bit_cast<double>(u);
  return status_;
}

int32_t BinDataReader::ReadPStr(uint8_t* buf256) {
  if (status_ == 0 && !buf256) SetError(kStatusBadArgument);
  uint8_t n = 0;
  if (ReadU8(&n) == 0) Take(buf256 ? buf256 + 1 : nullptr, n);
  if (buf256) buf256[0] = status_ == 0 ? n : 0;
  return status_;
}

int32_t BinDataReader::ReadLStr(LStrHandle* h) {
  const bool live = h && IsDSHandle(*h);
  int32_t n = 0;
  if (ReadI32(&n) == 0 && (n < 0 || static_cast<size_t>(n) > BytesLeft())) SetError(kStatusCorruptData);
  if (status_ == 0 && !h) SetError(kStatusBadArgument);
  if (status_ == 0) {
    UHandle u = live ? reinterpret_cast<UHandle>(*h) : nullptr;
    if (int32_t err = DSSetHandleSizeOrNewHandle(&u, sizeof(int32_t) + static_cast<size_t>(n))) {
      SetError(err);
    } else {
      *h = reinterpret_cast<LStrHandle>(u);
      (**h)->cnt = n;
      Take((**h)->str, static_cast<size_t>(n));
    }
  }
  if (status_ != 0 && h) {
    if (IsDSHandle(*h)) {
      // Left as a valid empty string; a block too small to be one is left alone.
      UHandle u = reinterpret_cast<UHandle>(*h);
      if (DSGetHandleSize(u) >= sizeof(int32_t)) {
        DSSetHandleSize(u, sizeof(int32_t));
        (**h)->cnt = 0;
      }
    } else {
      *h = nullptr;
    }
  }
  return status_;
}

int32_t BinDataReader::ReadBytes(void* dst, size_t n) {
  if (status_ == 0 && n != 0 && !dst) SetError(kStatusBadArgument);
  return Take(dst, n);
}

int32_t BinDataReader::ReadPath(Path* p) {
  if (status_ != 0) {
    if (p) *p = nullptr;
    return status_;
  }
  return FUnFlattenPath2(*this, p);
}

int32_t BinDataReader::Skip(size_t n) {
  if (status_ == 0 && (!in_ || !in_->Skip(n))) SetError(in_ ? kStatusCorruptData : kStatusNullHandle);
  return status_;
}

int32_t BinDataReader::Align(size_t n) { return Skip(PaddingTo(Position(), n)); }

// --- runs of values and extended precision ---------------------------------------------------------

namespace {

uint16_t SwapAny(uint16_t v) { return Swap16(v); }
uint32_t SwapAny(uint32_t v) { return Swap32(v); }
uint64_t SwapAny(uint64_t v) { return Swap64(v); }

template <class T>
void SwapRun(uint8_t* dst, const uint8_t* src, size_t count) {
  for (size_t i = 0; i < count; ++i) {
    T v;
    std::memcpy(&v, src + i * sizeof(T), sizeof(T));
    v = SwapAny(v);
    std::memcpy(dst + i * sizeof(T), &v, sizeof(T));
  }
}

// Copies `count` values of `size` bytes, reversing each one's bytes when `swap` is set.
void ConvertRun(uint8_t* dst, const uint8_t* src, size_t size, size_t count, bool swap) {
  if (!swap || size == 1) {
    std::memcpy(dst, src, size * count);
    return;
  }
  switch (size) {
    case 2: SwapRun<uint16_t>(dst, src, count); break;
    case 4: SwapRun<uint32_t>(dst, src, count); break;
    default: SwapRun<uint64_t>(dst, src, count); break;
  }
}

constexpr uint64_t kIntegerBit = uint64_t{1} << 63;

// The integer bit every canonical value with this exponent field has.
bool CanonicalIntegerBit(uint16_t exponent) { return exponent != 0; }

}  // namespace

int32_t BinDataWriter::WriteValues(const void* p, size_t size, size_t count) {
  if (status_ != 0) return status_;
  if (count == 0) return status_;
  if (!out_) {
    SetError(kStatusNullHandle);
    return status_;
  }
  if (size != 1 && size != 2 && size != 4 && size != 8) {
    SetError(kStatusBadArgument);
    return status_;
  }
  if (count > std::numeric_limits<size_t>::max() / size) {
    SetError(kStatusOutOfMemory);
    return status_;
  }
  if (out_->IsCounting()) {
    out_->Extend(size * count);
    return status_;
  }
  uint8_t* into = out_->Extend(size * count);
  if (into == nullptr) {
    SetError(kStatusOutOfMemory);
    return status_;
  }
  ConvertRun(into, static_cast<const uint8_t*>(p), size, count, endianizer_->Swaps());
  return status_;
}

int32_t BinDataReader::ReadValues(void* dst, size_t size, size_t count) {
  if (count == 0) return status_;
  const bool fits = size != 0 && count <= std::numeric_limits<size_t>::max() / size;
  const size_t bytes = fits ? size * count : 0;
  if (status_ == 0 && (!in_ || !fits || in_->BytesLeft() < bytes)) SetError(in_ ? kStatusCorruptData : kStatusNullHandle);
  if (status_ != 0) {
    if (dst && fits) std::memset(dst, 0, bytes);
    return status_;
  }
  ConvertRun(static_cast<uint8_t*>(dst), in_->Data() + in_->Position(), size, count, endianizer_->Swaps());
  in_->Skip(bytes);
  return status_;
}

int32_t BinDataWriter::WriteExtended(const uint8_t* ten) {
  uint64_t significand = 0;
  uint16_t signExponent = 0;
  std::memcpy(&significand, ten, 8);
  std::memcpy(&signExponent, ten + 8, 2);
  if constexpr (std::endian::native == std::endian::big) {
    significand = Swap64(significand);
    signExponent = Swap16(signExponent);
  }
  const uint16_t exponent = signExponent & 0x7FFF;
  const bool integerBit = (significand & kIntegerBit) != 0;
  const uint64_t fraction = significand & ~kIntegerBit;
  // binary128: sign and exponent in the top 16 bits, then the 63 fraction bits, then zeros.
  const uint64_t high = (static_cast<uint64_t>(signExponent) << 48) | (fraction >> 15);
  uint64_t low = fraction << 49;
  if (integerBit != CanonicalIntegerBit(exponent)) low |= 1;
  if (endianizer_->IsBigEndian()) {
    WriteU64(high);
    return WriteU64(low);
  }
  WriteU64(low);
  return WriteU64(high);
}

int32_t BinDataReader::ReadExtended(uint8_t* ten) {
  uint64_t high = 0;
  uint64_t low = 0;
  if (endianizer_->IsBigEndian()) {
    ReadU64(&high);
    ReadU64(&low);
  } else {
    ReadU64(&low);
    ReadU64(&high);
  }
  if (status_ != 0) {
    std::memset(ten, 0, 10);
    return status_;
  }
  uint16_t signExponent = static_cast<uint16_t>(high >> 48);
  const uint16_t exponent = signExponent & 0x7FFF;
  // Fraction bits below the 63 an extended value has are dropped (a binary128 value written by
  // another producer is rounded toward zero), except the marker bit.
  const uint64_t fraction = ((high & 0xFFFFFFFFFFFFull) << 15) | (low >> 49);
  bool integerBit = CanonicalIntegerBit(exponent);
  if ((low & 1) != 0) integerBit = !integerBit;
  uint64_t significand = fraction | (integerBit ? kIntegerBit : 0);
  if constexpr (std::endian::native == std::endian::big) {
    significand = Swap64(significand);
    signExponent = Swap16(signExponent);
  }
  std::memcpy(ten, &significand, 8);
  std::memcpy(ten + 8, &signExponent, 2);
  return status_;
}

uint8_t* BinDataWriter::ReserveBytes(size_t n) {
  if (status_ != 0) return nullptr;
  if (!out_) {
    SetError(kStatusNullHandle);
    return nullptr;
  }
  uint8_t* into = out_->Extend(n);
  if (into == nullptr && !out_->IsCounting() && n != 0) SetError(kStatusOutOfMemory);
  return into;
}

const uint8_t* BinDataReader::TakeBytes(size_t n) {
  if (status_ == 0 && (!in_ || in_->BytesLeft() < n)) SetError(in_ ? kStatusCorruptData : kStatusNullHandle);
  if (status_ != 0) return nullptr;
  const uint8_t* at = in_->Data() + in_->Position();
  in_->Skip(n);
  return at;
}
