// What every host writes around the library, written once: a session that starts and stops the
// services, owning holders of a handle and of one value of a type, one value flattened to bytes
// and back, a checked down-cast, and the reason of the last refusal on this thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/PXServices.h"
#include "vellum/TDHandles.h"

namespace vellum {

// Starts the type manager service and the services it needs, and stops them again when it goes.
// Start and stop on one thread, with no other use of the library in progress; at most one
// session at a time.
class Session {
 public:
  Session();
  // Stops every service the session started, the last started first.
  ~Session();
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  // 0 when the library is running; otherwise the failing start's status (nothing stays started
  // that the session could stop).
  [[nodiscard]] int32_t Status() const { return status_; }
  explicit operator bool() const { return status_ == 0; }

 private:
  ServiceManager services_;
  int32_t status_;
};

// A handle the caller owns, disposed of when the holder goes. Move-only.
class OwnedHandle {
 public:
  OwnedHandle() noexcept = default;
  explicit OwnedHandle(UHandle handle) noexcept : handle_(handle) {}
  ~OwnedHandle();
  OwnedHandle(OwnedHandle&& other) noexcept;
  OwnedHandle& operator=(OwnedHandle&& other) noexcept;

  // Where a call that hands out a new handle stores it; a handle held before is disposed of first.
  UHandle* Out();
  UHandle Get() const noexcept { return handle_; }
  // Gives the handle up to the caller, who disposes of it.
  UHandle Release() noexcept;
  // The handle's bytes; empty for none.
  std::span<const uint8_t> Bytes() const;

 private:
  UHandle handle_ = nullptr;
};

// One datum of a type in storage the holder owns: default data of the type when made, its
// handles given back when the holder goes. Move-only; one thread at a time.
class Value {
 public:
  // No type and no data.
  Value() noexcept = default;
  // Default data of `type`. A null type holds nothing; Status() says when the default could not
  // be made (2 when memory runs out), in which case the holder holds no data.
  explicit Value(const TDR& type);
  ~Value();
  Value(Value&& other) noexcept;
  Value& operator=(Value&& other) noexcept;

  [[nodiscard]] int32_t Status() const { return status_; }
  const TDR& Type() const { return type_; }
  // The datum, laid out as the type says (aligned for any kind); null when there is none.
  void* Data() { return storage_.get(); }
  const void* Data() const { return storage_.get(); }

 private:
  void Release() noexcept;

  TDR type_;
  std::unique_ptr<uint64_t[]> storage_;
  size_t words_ = 0;
  int32_t status_ = 0;
};

// The version word of the running application: what the functions below write and read when
// given version 0.
uint32_t CurrentVersion();

// Appends the flattened form of one value of `type` at `data` to *bytes, for `version` (0 for the
// running one), big-endian. 0, or the writer's status with *bytes as it was (42 for a null type,
// 1 for null data or bytes); the reason is LastRefusal().
[[nodiscard]] int32_t FlattenData(const TDR& type, const void* data, std::vector<uint8_t>* bytes,
                                  uint32_t version = 0);
[[nodiscard]] int32_t FlattenData(const Value& value, std::vector<uint8_t>* bytes, uint32_t version = 0);

// Reads one value of `type` from bytes that come from outside into `data`, which holds data of the
// type (default data, or a value to replace). With `used`, it receives the number of bytes the
// value took, and bytes after the value are left alone; without it, bytes after the value are
// refused (74). 0, or the reader's status, with the value left cleared or default and what the
// read allocated released; the reason is LastRefusal().
[[nodiscard]] int32_t UnflattenData(const TDR& type, std::span<const uint8_t> bytes, void* data,
                                    uint32_t version = 0, size_t* used = nullptr);
[[nodiscard]] int32_t UnflattenData(std::span<const uint8_t> bytes, Value* value, uint32_t version = 0,
                                    size_t* used = nullptr);

// `type` seen as the typed handle `Handle` (TDRCluster, TDWArray, ...): null when it holds
// another kind, nothing, or (for writable handles) a read-only descriptor. Never an error.
template <class Handle>
Handle As(const TD& type) {
  return Handle(type.GetImpPtr(), 1);
}

// The reason of the last refusal on this thread: the first error-level line the library wrote
// since the last ClearRefusal() or the start of the last call of this header's functions and
// holders; empty when there was none. No sink needs to be installed.
std::string LastRefusal();
void ClearRefusal();

}  // namespace vellum
