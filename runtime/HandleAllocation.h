// How data operations give handle memory back: an allocator interface that callers pass to
// DeflateData and ShrinkData, and its ordinary implementation over the memory manager.
#pragma once

#include <cstddef>
#include <cstdint>

#include "runtime/PXTypes.h"

// The virtual functions keep this order: hosts that supply their own allocator rely on resize
// being the third operation after the destructor and dispose the seventh. Every operation may
// be called from any thread for handles that thread owns; statuses are those of DSMemory.h.
class HandleAllocationInterface {
 public:
  virtual ~HandleAllocationInterface();
  // *out is a new handle of `size` bytes, or null on failure (status 2).
  virtual int32_t NewHandle(size_t size, UHandle* out) const = 0;
  // The same, with the block zeroed.
  virtual int32_t NewHandleClear(size_t size, UHandle* out) const = 0;
  // Resizes `h` keeping the first min(old, new) bytes; 42 for a null handle, 1 for one this
  // allocator does not own, 2 when memory runs out (the handle is then unchanged).
  virtual int32_t SetHandleSize(UHandle h, size_t size) const = 0;
  // The same, with any growth zeroed.
  virtual int32_t SetHandleSizeClear(UHandle h, size_t size) const = 0;
  // 0 for a null handle or one this allocator does not own.
  virtual size_t GetHandleSize(UHandle h) const = 0;
  // Whether `h` is a live handle of this allocator; never dereferences it.
  virtual int32_t OwnsHandle(const void* h) const = 0;
  // Frees `h`; a null handle is 0, one this allocator does not own 1 (and is not freed).
  virtual int32_t DisposeHandle(UHandle h) const = 0;

 protected:
  HandleAllocationInterface() = default;
  HandleAllocationInterface(const HandleAllocationInterface&) = default;
  HandleAllocationInterface& operator=(const HandleAllocationInterface&) = default;
};

// The memory manager's own handles (DSNewHandle and its kin). Stateless.
class NormalHandleAllocationInterface final : public HandleAllocationInterface {
 public:
  NormalHandleAllocationInterface() = default;
  ~NormalHandleAllocationInterface() override;

  int32_t NewHandle(size_t size, UHandle* out) const override;
  int32_t NewHandleClear(size_t size, UHandle* out) const override;
  int32_t SetHandleSize(UHandle h, size_t size) const override;
  int32_t SetHandleSizeClear(UHandle h, size_t size) const override;
  size_t GetHandleSize(UHandle h) const override;
  int32_t OwnsHandle(const void* h) const override;
  int32_t DisposeHandle(UHandle h) const override;
};

// One shared instance, usable from any thread.
const NormalHandleAllocationInterface& NormalHandleAllocator();
