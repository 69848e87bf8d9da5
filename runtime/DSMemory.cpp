// Handles, pointer blocks and counted raw memory over malloc, with a registry of live master
// pointers (so a stray pointer is recognised, not dereferenced) and failure injection.
#include "runtime/DSMemory.h"

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <unordered_set>

#include "runtime/PXInternal.h"

namespace {

// The master pointer is the first member, so a handle is the address of its record.
struct HandleRec {
  uint8_t* block;
  size_t size;
  size_t alignment;  // 0 for plain malloc blocks
};

struct Registry {
  std::mutex mutex;  // guards handles and ptrs
  std::unordered_set<const void*> handles;
  std::unordered_set<const void*> ptrs;
};

Registry& TheRegistry() {
  static pxinternal::NoDestructor<Registry> registry;
  return registry.get();
}

std::atomic<int64_t> gAllocations{0};
std::atomic<int64_t> gFailAt{0};  // absolute allocation number that fails; 0 when disarmed
std::atomic<bool> gFired{false};
std::atomic<int64_t> gLiveBlocks{0};

// No block may be larger than this; it keeps size arithmetic below overflow everywhere.
constexpr size_t kMaxBlockSize = size_t{1} << 47;

// One allocation attempt; false when the armed failure fires on it.
bool CountAllocation() {
  const int64_t n = gAllocations.fetch_add(1) + 1;
  int64_t at = gFailAt.load();
  if (at != 0 && n >= at && gFailAt.compare_exchange_strong(at, 0)) {
    gFired.store(true);
    return false;
  }
  return true;
}

uint8_t* AllocBlock(size_t size, size_t alignment) {
  if (size > kMaxBlockSize) return nullptr;
  const size_t n = size == 0 ? 1 : size;
  if (alignment == 0) return static_cast<uint8_t*>(std::malloc(n));
  return static_cast<uint8_t*>(::operator new(n, std::align_val_t(alignment), std::nothrow));
}

void FreeBlock(uint8_t* block, size_t alignment) {
  if (alignment == 0)
    std::free(block);
  else
    ::operator delete(block, std::align_val_t(alignment), std::nothrow);
}

HandleRec* LiveHandle(const void* h) {
  if (!h) return nullptr;
  Registry& r = TheRegistry();
  std::lock_guard lock(r.mutex);
  if (r.handles.find(h) == r.handles.end()) return nullptr;
  return static_cast<HandleRec*>(const_cast<void*>(h));
}

int32_t NewHandleImpl(size_t size, size_t alignment, bool clear, bool count, UHandle* out) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  if (count && !CountAllocation()) return kStatusOutOfMemory;
  auto* rec = static_cast<HandleRec*>(std::malloc(sizeof(HandleRec)));
  if (!rec) return kStatusOutOfMemory;
  rec->block = AllocBlock(size, alignment);
  if (!rec->block) {
    std::free(rec);
    return kStatusOutOfMemory;
  }
  rec->size = size;
  rec->alignment = alignment;
  if (clear) std::memset(rec->block, 0, size);
  Registry& r = TheRegistry();
  try {
    std::lock_guard lock(r.mutex);
    r.handles.insert(rec);
  } catch (const std::bad_alloc&) {
    FreeBlock(rec->block, alignment);
    std::free(rec);
    return kStatusOutOfMemory;
  }
  gLiveBlocks.fetch_add(1);
  *out = &rec->block;
  return kStatusNoError;
}

int32_t ResizeImpl(UHandle h, size_t size, bool clear, bool count) {
  if (!h) return kStatusNullHandle;
  HandleRec* rec = LiveHandle(h);
  if (!rec) return kStatusBadArgument;
  const size_t old = rec->size;
  if (size == old) return kStatusNoError;
  if (size > old) {
    if (count && !CountAllocation()) return kStatusOutOfMemory;
    if (size > kMaxBlockSize) return kStatusOutOfMemory;
    uint8_t* grown = nullptr;
    if (rec->alignment == 0) {
      grown = static_cast<uint8_t*>(std::realloc(rec->block, size));
    } else {
      grown = AllocBlock(size, rec->alignment);
      if (grown) {
        std::memcpy(grown, rec->block, old);
        FreeBlock(rec->block, rec->alignment);
      }
    }
    if (!grown) return kStatusOutOfMemory;
    rec->block = grown;
    if (clear) std::memset(grown + old, 0, size - old);
  } else if (rec->alignment == 0) {
    // Giving memory back is best effort: a refused shrink keeps the larger block.
    if (auto* shrunk = static_cast<uint8_t*>(std::realloc(rec->block, size == 0 ? 1 : size)))
      rec->block = shrunk;
  }
  rec->size = size;
  return kStatusNoError;
}

int32_t NewPtrImpl(size_t size, bool clear, UPtr* out) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  if (!CountAllocation()) return kStatusOutOfMemory;
  uint8_t* p = AllocBlock(size, 0);
  if (!p) return kStatusOutOfMemory;
  if (clear) std::memset(p, 0, size);
  Registry& r = TheRegistry();
  try {
    std::lock_guard lock(r.mutex);
    r.ptrs.insert(p);
  } catch (const std::bad_alloc&) {
    std::free(p);
    return kStatusOutOfMemory;
  }
  gLiveBlocks.fetch_add(1);
  *out = p;
  return kStatusNoError;
}

size_t NormalizedAlignment(size_t alignment) {
  if (alignment == 0 || (alignment & (alignment - 1)) != 0) return 0;
  return alignment <= alignof(std::max_align_t) ? 0 : alignment;
}

}  // namespace

int32_t DSNewHandle(size_t size, UHandle* out) { return NewHandleImpl(size, 0, false, true, out); }

int32_t DSNewHClr(size_t size, UHandle* out) { return NewHandleImpl(size, 0, true, true, out); }

int32_t DSNewAlignedHClr(size_t size, size_t alignment, UHandle* out) {
  return NewHandleImpl(size, NormalizedAlignment(alignment), true, true, out);
}

int32_t DSSetHandleSize(UHandle h, size_t size) { return ResizeImpl(h, size, false, true); }

int32_t DSSetHSzClr(UHandle h, size_t size) { return ResizeImpl(h, size, true, true); }

int32_t DSSetHandleSizeOrNewHandle(UHandle* h, size_t size) {
  if (!h) return kStatusBadArgument;
  if (!*h) return NewHandleImpl(size, 0, false, true, h);
  return ResizeImpl(*h, size, false, true);
}

int32_t DSSetHSzOrNewHClr(UHandle* h, size_t size) {
  if (!h) return kStatusBadArgument;
  if (!*h) return NewHandleImpl(size, 0, true, true, h);
  return ResizeImpl(*h, size, true, true);
}

size_t DSGetLiveHandleSize(UHandle h) { return h ? reinterpret_cast<const HandleRec*>(h)->size : 0; }

size_t DSGetHandleSize(UHandle h) {
  const HandleRec* rec = LiveHandle(h);
  return rec ? rec->size : 0;
}

int32_t DSCopyHandle(UHandle* dst, UHandle src) {
  if (!dst) return kStatusBadArgument;
  if (!src) {
    if (LiveHandle(*dst)) DSDisposeHandle(*dst);
    *dst = nullptr;
    return kStatusNoError;
  }
  const HandleRec* from = LiveHandle(src);
  if (!from) return kStatusBadArgument;
  if (*dst == src) return kStatusNoError;
  if (!CountAllocation()) return kStatusOutOfMemory;
  const size_t size = from->size;
  if (LiveHandle(*dst)) {
    if (int32_t err = ResizeImpl(*dst, size, false, false)) return err;
    std::memcpy(**dst, *src, size);
    return kStatusNoError;
  }
  UHandle copy = nullptr;
  if (int32_t err = NewHandleImpl(size, from->alignment, false, false, &copy)) return err;
  std::memcpy(*copy, *src, size);
  *dst = copy;
  return kStatusNoError;
}

int32_t IsDSHandle(const void* h) { return LiveHandle(h) ? 1 : 0; }

int32_t DSDisposeHandle(UHandle h) {
  if (!h) return kStatusNoError;
  Registry& r = TheRegistry();
  {
    std::lock_guard lock(r.mutex);
    if (r.handles.erase(h) == 0) return kStatusBadArgument;
  }
  auto* rec = reinterpret_cast<HandleRec*>(h);
  FreeBlock(rec->block, rec->alignment);
  std::free(rec);
  gLiveBlocks.fetch_sub(1);
  return kStatusNoError;
}

int32_t DSNewPtr(size_t size, UPtr* out) { return NewPtrImpl(size, false, out); }

int32_t DSNewPClr(size_t size, UPtr* out) { return NewPtrImpl(size, true, out); }

int32_t DSDisposePtr(UPtr p) {
  if (!p) return kStatusNoError;
  Registry& r = TheRegistry();
  {
    std::lock_guard lock(r.mutex);
    if (r.ptrs.erase(p) == 0) return kStatusBadArgument;
  }
  std::free(p);
  gLiveBlocks.fetch_sub(1);
  return kStatusNoError;
}

void* PXAlloc(size_t size) {
  if (!CountAllocation()) return nullptr;
  void* p = AllocBlock(size, 0);
  if (p) gLiveBlocks.fetch_add(1);
  return p;
}

void PXFree(void* p) {
  if (!p) return;
  std::free(p);
  gLiveBlocks.fetch_sub(1);
}

int64_t DSLiveBlockCount() { return gLiveBlocks.load(); }

int64_t DSAllocationCount() { return gAllocations.load(); }

void DSFailAllocation(int64_t nth) {
  if (nth <= 0) {
    gFailAt.store(0);
    return;
  }
  gFired.store(false);
  gFailAt.store(gAllocations.load() + nth);
}

bool DSAllocationFailureFired() { return gFired.load(); }

ScopedAllocationFailure::ScopedAllocationFailure(int64_t nth) { DSFailAllocation(nth); }

ScopedAllocationFailure::~ScopedAllocationFailure() { DSFailAllocation(0); }

bool ScopedAllocationFailure::Fired() const { return DSAllocationFailureFired(); }
