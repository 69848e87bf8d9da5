// How data operations give handle memory back: the allocator interface and its ordinary
// implementation, which forwards to the memory manager.
#include "runtime/HandleAllocation.h"

#include "runtime/DSMemory.h"

HandleAllocationInterface::~HandleAllocationInterface() = default;

NormalHandleAllocationInterface::~NormalHandleAllocationInterface() = default;

int32_t NormalHandleAllocationInterface::NewHandle(size_t size, UHandle* out) const {
  return DSNewHandle(size, out);
}

int32_t NormalHandleAllocationInterface::NewHandleClear(size_t size, UHandle* out) const {
  return DSNewHClr(size, out);
}

int32_t NormalHandleAllocationInterface::SetHandleSize(UHandle h, size_t size) const {
  return DSSetHandleSize(h, size);
}

int32_t NormalHandleAllocationInterface::SetHandleSizeClear(UHandle h, size_t size) const {
  return DSSetHSzClr(h, size);
}

size_t NormalHandleAllocationInterface::GetHandleSize(UHandle h) const { return DSGetHandleSize(h); }

int32_t NormalHandleAllocationInterface::OwnsHandle(const void* h) const { return IsDSHandle(h); }

int32_t NormalHandleAllocationInterface::DisposeHandle(UHandle h) const { return DSDisposeHandle(h); }

const NormalHandleAllocationInterface& NormalHandleAllocator() {
  static const NormalHandleAllocationInterface allocator;
  return allocator;
}
