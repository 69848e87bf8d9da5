// Sole ownership of one object that lives in the runtime's counted memory, so that tests can
// fail its allocation and see it leak.
#pragma once

#include <memory>
#include <new>
#include <utility>

#include "runtime/DSMemory.h"

template <class T>
struct PXDelete {
  void operator()(T* object) const noexcept {
    if (object == nullptr) return;
    object->~T();
    PXFree(object);
  }
};

template <class T>
using RuntimeUniquePtr = std::unique_ptr<T, PXDelete<T>>;

// A new object, or null when memory runs out (also when its constructor runs out).
template <class T, class... Args>
RuntimeUniquePtr<T> MakeUniqueInRuntime(Args&&... args) {
  void* memory = PXAlloc(sizeof(T));
  if (memory == nullptr) return RuntimeUniquePtr<T>();
  try {
    return RuntimeUniquePtr<T>(::new (memory) T(std::forward<Args>(args)...));
  } catch (const std::bad_alloc&) {
    PXFree(memory);
    return RuntimeUniquePtr<T>();
  }
}
