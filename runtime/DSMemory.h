// Handles, pointer blocks and raw counted memory. Every allocation of the library goes
// through here, so live blocks can be counted and the Nth allocation can be made to fail.
#pragma once

#include <cstddef>
#include <cstdint>
#include <limits>
#include <new>

#include "runtime/PXTypes.h"

// Handles. A handle points to a master pointer that points to the block; resizing may move
// the block but never the master pointer. A null handle is a valid empty value. Only handles
// made here are "live" (IsDSHandle); functions given a non-live handle refuse it with status 1
// and never touch it. Handles are not locked: one thread at a time may use a given handle.
// A block is never null, even at size 0.

// *out is the new handle, or null on failure (status 2).
int32_t DSNewHandle(size_t size, UHandle* out);
// Same, with the block zeroed.
int32_t DSNewHClr(size_t size, UHandle* out);
// Zeroed block whose address is a multiple of `alignment`, also after resizing. `alignment` is a
// power of two; any other value gets the default alignment of std::max_align_t.
int32_t DSNewAlignedHClr(size_t size, size_t alignment, UHandle* out);
// Keeps the first min(old, new) bytes. 42 for a null handle, 1 for a non-live one, 2 when
// memory runs out (the handle is then unchanged).
int32_t DSSetHandleSize(UHandle h, size_t size);
// Same, and any growth is zeroed.
int32_t DSSetHSzClr(UHandle h, size_t size);
// Resizes *h, or allocates a new handle into *h when *h is null.
int32_t DSSetHandleSizeOrNewHandle(UHandle* h, size_t size);
int32_t DSSetHSzOrNewHClr(UHandle* h, size_t size);
// 0 for a null or non-live handle.
size_t DSGetHandleSize(UHandle h);
// The same for a handle the caller holds in data it owns, which it knows to be live (or null):
// no registry lookup, so it must never see a handle that came from outside.
size_t DSGetLiveHandleSize(UHandle h);
// Makes *dst a copy of src: a live *dst is resized and reused, anything else is replaced by a
// new handle (a non-live *dst is not freed). A null src disposes a live *dst and sets it null.
// On failure *dst keeps its old value and status 2 is returned.
int32_t DSCopyHandle(UHandle* dst, UHandle src);
// 1 only for a live handle made here. Never dereferences h, so garbage is safe.
int32_t IsDSHandle(const void* h);
// null -> 0; non-live -> 1 and nothing is freed.
int32_t DSDisposeHandle(UHandle h);

// Pointer blocks: fixed-size, never null even at size 0. DSDisposePtr(null) is 0; a pointer
// not made by DSNewPtr/DSNewPClr is refused with 1 and not freed.
int32_t DSNewPtr(size_t size, UPtr* out);
int32_t DSNewPClr(size_t size, UPtr* out);
int32_t DSDisposePtr(UPtr p);

// Raw counted memory for objects and containers, aligned for any standard type. PXAlloc
// returns null when memory runs out or an injected failure fires; PXFree(null) does nothing.
void* PXAlloc(size_t size);
void PXFree(void* p);

// Standard allocator over PXAlloc; throws std::bad_alloc when the allocation fails.
template <class T>
struct PXAllocator {
  using value_type = T;
  static_assert(alignof(T) <= alignof(std::max_align_t), "PXAlloc blocks are max_align_t aligned");

  PXAllocator() noexcept = default;
  template <class U>
  PXAllocator(const PXAllocator<U>&) noexcept {}

  T* allocate(size_t n) {
    if (n > std::numeric_limits<size_t>::max() / sizeof(T)) throw std::bad_alloc();
    void* p = PXAlloc(n * sizeof(T));
    if (!p) throw std::bad_alloc();
    return static_cast<T*>(p);
  }
  void deallocate(T* p, size_t) noexcept { PXFree(p); }

  template <class U>
  bool operator==(const PXAllocator<U>&) const noexcept { return true; }
};

// Accounting and failure injection, meant for tests. One "allocation" is each call of a
// DSNew* function, a DSSet* call that grows a block (or makes a new handle), DSCopyHandle,
// and PXAlloc. Counters are process-wide and updated atomically.
int64_t DSLiveBlockCount();   // live handles + live pointer blocks + live PXAlloc blocks
int64_t DSAllocationCount();  // allocations attempted since process start
// Arms one failure: the nth allocation from now fails (1 = the next one). 0 disarms. The
// failure fires once and then disarms itself. Arming clears the "fired" state.
void DSFailAllocation(int64_t nth);
bool DSAllocationFailureFired();

// Arms DSFailAllocation(nth) for one scope and disarms it on exit.
class ScopedAllocationFailure {
 public:
  explicit ScopedAllocationFailure(int64_t nth);
  ~ScopedAllocationFailure();
  ScopedAllocationFailure(const ScopedAllocationFailure&) = delete;
  ScopedAllocationFailure& operator=(const ScopedAllocationFailure&) = delete;
  bool Fired() const;
};
