// The byte-string interface that hosts hand to the library (IQXStr), and CQXLStr, which offers
// a counted-string (LStr) handle through that interface.
#include "source/model/QXLStr.h"

#include <algorithm>
#include <cstddef>
#include <limits>
#include <new>
#include <utility>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"

VELLUM_DIAGNOSTIC_MODULE("QXLStr");

namespace {

constexpr size_t kCountBytes = offsetof(LStr, str);
constexpr size_t kLongestLStr = static_cast<size_t>(std::numeric_limits<int32_t>::max());
constexpr int32_t kLongestPStr = 255;

void ThrowWhenOutOfMemory(int32_t status) {
  if (status == kStatusOutOfMemory) throw std::bad_alloc();
}

}  // namespace

CQXLStr::CQXLStr(const uint8_t* cstr) { ThrowWhenOutOfMemory(CopyFromCStr(cstr)); }

CQXLStr::CQXLStr(const uint8_t* bytes, int32_t length) {
  if (bytes != nullptr && length > 0) ThrowWhenOutOfMemory(CopyFromCStr(bytes, length));
}

CQXLStr::CQXLStr(LStrHandle handle) { ThrowWhenOutOfMemory(CopyFromLStr(handle)); }

CQXLStr::~CQXLStr() { Dispose(); }

CQXLStr::CQXLStr(CQXLStr&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

CQXLStr& CQXLStr::operator=(CQXLStr&& other) noexcept {
  if (this != &other) {
    Dispose();
    handle_ = std::exchange(other.handle_, nullptr);
  }
  return *this;
}

void CQXLStr::Dispose() {
  DSDisposeHandle(reinterpret_cast<UHandle>(handle_));
  handle_ = nullptr;
}

// Builds the new handle before letting go of the old one, so that `bytes` may point into the
// current string and a failure leaves the string as it was.
int32_t CQXLStr::Replace(const uint8_t* bytes, size_t length) {
  if (length > kLongestLStr - kCountBytes) return kStatusBadArgument;
  if (length == 0) {
    Dispose();
    return kStatusNoError;
  }
  UHandle fresh = nullptr;
  if (const int32_t status = DSNewHandle(kCountBytes + length, &fresh); status != kStatusNoError)
    return status;
  LStrHandle string = reinterpret_cast<LStrHandle>(fresh);
  (*string)->cnt = static_cast<int32_t>(length);
  MoveBlock(bytes, LStrBuf(*string), length);
  Dispose();
  handle_ = string;
  return kStatusNoError;
}

int32_t CQXLStr::CopyFromCStr(const uint8_t* cstr) {
  return Replace(cstr, static_cast<size_t>(StrLen(cstr)));
}

int32_t CQXLStr::CopyFromCStr(const uint8_t* bytes, int32_t length) {
  if (length < 0 || (bytes == nullptr && length > 0)) return kStatusBadArgument;
  return Replace(bytes, static_cast<size_t>(length));
}

int32_t CQXLStr::CopyFromLStr(LStrHandle handle) {
  if (handle == nullptr) return Replace(nullptr, 0);
  // The count is believed only when the handle is ours and big enough to hold that many bytes.
  if (IsDSHandle(handle) != 1) return kStatusBadArgument;
  const size_t size = DSGetHandleSize(reinterpret_cast<UHandle>(handle));
  if (size < kCountBytes) return kStatusBadArgument;
  const int32_t count = (*handle)->cnt;
  if (count < 0 || static_cast<size_t>(count) > size - kCountBytes) return kStatusBadArgument;
  return Replace(LStrBuf(*handle), static_cast<size_t>(count));
}

int32_t CQXLStr::CopyToCStr(int32_t capacity, uint8_t* buffer) const {
  if (buffer == nullptr || capacity < 1) {
    (VELLUM_DEBUG(2) << "CQXLStr::CopyToCStr: no room for the string in a "
                     << (buffer == nullptr ? "null buffer" : "buffer") << " of capacity "
                     << capacity)
        .Process();
    return kStatusBadArgument;
  }
  const int32_t length = std::min(GetSize(), capacity - 1);
  MoveBlock(GetReadPtr(), buffer, static_cast<size_t>(length));
  buffer[length] = 0;
  return kStatusNoError;
}

int32_t CQXLStr::CopyToPStr(uint8_t* buffer) const {
  if (buffer == nullptr) {
    (VELLUM_DEBUG(2) << "CQXLStr::CopyToPStr: null buffer").Process();
    return kStatusBadArgument;
  }
  const int32_t length = std::min(GetSize(), kLongestPStr);
  buffer[0] = static_cast<uint8_t>(length);
  MoveBlock(GetReadPtr(), buffer + 1, static_cast<size_t>(length));
  return kStatusNoError;
}

const uint8_t* CQXLStr::GetReadPtr() const { return handle_ ? LStrBuf(*handle_) : nullptr; }

uint8_t* CQXLStr::GetWritePtr() { return handle_ ? LStrBuf(*handle_) : nullptr; }

int32_t CQXLStr::GetSize() const { return LHStrLen(handle_); }

int32_t CQXLStr::SetSize(int32_t length, bool keepContents) {
  if (length < 0 || static_cast<size_t>(length) > kLongestLStr - kCountBytes)
    return kStatusBadArgument;
  if (length == 0) {
    Dispose();
    return kStatusNoError;
  }
  const size_t size = kCountBytes + static_cast<size_t>(length);
  if (handle_ != nullptr && keepContents) {
    if (const int32_t status = DSSetHSzClr(reinterpret_cast<UHandle>(handle_), size);
        status != kStatusNoError)
      return status;
  } else {
    UHandle fresh = nullptr;
    if (const int32_t status = DSNewHClr(size, &fresh); status != kStatusNoError) return status;
    Dispose();
    handle_ = reinterpret_cast<LStrHandle>(fresh);
  }
  (*handle_)->cnt = length;
  return kStatusNoError;
}
