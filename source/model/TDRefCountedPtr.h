// The counted-object base of descriptors and of every interned member (names, typedef links,
// units, enumerations, object-manager identifiers), with the cached hash that interning rests on.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <new>
#include <utility>

#include "vellum/TDHandles.h"

class TDRefCountedObj {
 public:
  virtual ~TDRefCountedObj();  // the deleting destructor comes first among the virtual slots

  TDRefCountedObj(const TDRefCountedObj&) = delete;
  TDRefCountedObj& operator=(const TDRefCountedObj&) = delete;

  uint32_t GetRefCount() const noexcept { return refCount_.load(std::memory_order_acquire); }
  void AddRef() const noexcept { refCount_.fetch_add(1, std::memory_order_seq_cst); }
  // True when this took the count from 1 to 0: the caller then destroys the object.
  bool ReleaseRef() const noexcept { return refCount_.fetch_sub(1, std::memory_order_seq_cst) == 1; }

  // Counted objects live in the runtime's memory, so tests can fail their allocation and see
  // leaks. The throwing form is there for completeness; the library itself uses MakeCounted.
  static void* operator new(std::size_t size);
  static void* operator new(std::size_t size, const std::nothrow_t&) noexcept;
  static void operator delete(void* p) noexcept;

 protected:
  TDRefCountedObj() noexcept = default;

 private:
  mutable std::atomic<uint32_t> refCount_{0};
};

class TDRefCountedHashedObj : public TDRefCountedObj {
 public:
  // The cached hash, computed through ComputeHashValue on first use.
  virtual int32_t GetHashValue() const;
  virtual int32_t ComputeHashValue() const = 0;

  bool IsHashValid() const noexcept { return hashValid_.load(std::memory_order_acquire) != 0; }
  // Every change that can alter identity calls this.
  void ClearHashValid() const noexcept { hashValid_.store(0, std::memory_order_release); }

 protected:
  TDRefCountedHashedObj() noexcept = default;
  // Any thread may fill the cache of a shared object; all of them write the same value.
  void StoreHash(int32_t hash) const noexcept {
    hashValue_.store(hash, std::memory_order_relaxed);
    hashValid_.store(1, std::memory_order_release);
  }
  int32_t CachedHash() const noexcept { return hashValue_.load(std::memory_order_relaxed); }

 private:
  mutable std::atomic<int32_t> hashValue_{0};
  mutable std::atomic<int32_t> hashValid_{0};
};

// A new counted object, or a null pointer when memory runs out.
template <class T, class... Args>
TDTypedPtr<T> MakeCounted(Args&&... args) {
  return TDTypedPtr<T>(new (std::nothrow) T(std::forward<Args>(args)...));
}
