// The byte-string interface that hosts hand to the library (IQXStr), and CQXLStr, which offers
// a counted-string (LStr) handle through that interface.
#pragma once

#include <cstdint>

#include "runtime/PXTypes.h"

// A resizable run of bytes owned by whoever implements it. Pointers it gives out stay valid
// until the next SetSize. One thread at a time.
class IQXStr {
 public:
  virtual ~IQXStr() = default;
  // The bytes, or null when the string is empty.
  virtual const uint8_t* GetReadPtr() const = 0;
  virtual uint8_t* GetWritePtr() = 0;
  virtual int32_t GetSize() const = 0;
  // Makes the string `length` bytes long. With keepContents the first min(old, new) bytes stay
  // and any growth is zero; without it every byte is zero. Status 0, 1 for a negative length,
  // 2 when memory runs out (then unchanged).
  [[nodiscard]] virtual int32_t SetSize(int32_t length, bool keepContents) = 0;

 protected:
  IQXStr() = default;
  IQXStr(const IQXStr&) = default;
  IQXStr& operator=(const IQXStr&) = default;
};

// Owns one LStr handle, null while the string is empty, and disposes it when destroyed.
// Constructors copy their argument and throw std::bad_alloc when memory runs out; the Copy...
// operations return a status instead and leave the string unchanged on failure. Not copyable;
// moving hands the handle over.
class CQXLStr : public IQXStr {
 public:
  CQXLStr() = default;
  // A zero-terminated string; null is the empty string.
  explicit CQXLStr(const uint8_t* cstr);
  // `length` bytes; null bytes or a non-positive length give the empty string.
  CQXLStr(const uint8_t* bytes, int32_t length);
  // A copy of the handle's string; a null handle is the empty string.
  explicit CQXLStr(LStrHandle handle);
  ~CQXLStr() override;

  CQXLStr(const CQXLStr&) = delete;
  CQXLStr& operator=(const CQXLStr&) = delete;
  CQXLStr(CQXLStr&& other) noexcept;
  CQXLStr& operator=(CQXLStr&& other) noexcept;

  // Each replaces the string with a copy of its argument (which may point into this string).
  // Null is the empty string. A negative length, null bytes with a positive length, or a handle
  // that is not a live counted string is status 1; running out of memory is 2.
  [[nodiscard]] int32_t CopyFromCStr(const uint8_t* cstr);
  [[nodiscard]] int32_t CopyFromCStr(const uint8_t* bytes, int32_t length);
  [[nodiscard]] int32_t CopyFromLStr(LStrHandle handle);

  // Copies at most capacity - 1 bytes into buffer and a terminating zero. A null buffer or a
  // capacity below 1 has no room even for the terminator: it is reported (level 2), nothing is
  // written and the status is 1.
  [[nodiscard]] int32_t CopyToCStr(int32_t capacity, uint8_t* buffer) const;
  // Writes at most 255 bytes as a length byte and bytes into a 256-byte buffer. A null buffer
  // is reported (level 2) and is status 1.
  [[nodiscard]] int32_t CopyToPStr(uint8_t* buffer) const;

  const uint8_t* GetReadPtr() const override;
  uint8_t* GetWritePtr() override;
  int32_t GetSize() const override;
  [[nodiscard]] int32_t SetSize(int32_t length, bool keepContents) override;

  // The handle, still owned by this object; null while empty.
  LStrHandle GetLStrHandle() const { return handle_; }

 private:
  [[nodiscard]] int32_t Replace(const uint8_t* bytes, size_t length);
  void Dispose();

  LStrHandle handle_ = nullptr;
};
