// Counted objects and their owning pointer.
#include "source/model/TDRefCountedPtr.h"

#include "runtime/DSMemory.h"

TDRefCountedObj::~TDRefCountedObj() = default;

void* TDRefCountedObj::operator new(std::size_t size) {
  if (void* p = PXAlloc(size)) return p;
  throw std::bad_alloc();
}

void* TDRefCountedObj::operator new(std::size_t size, const std::nothrow_t&) noexcept {
  return PXAlloc(size);
}

void TDRefCountedObj::operator delete(void* p) noexcept { PXFree(p); }

int32_t TDRefCountedHashedObj::GetHashValue() const {
  if (IsHashValid()) return CachedHash();
  const int32_t hash = ComputeHashValue();
  StoreHash(hash);
  return hash;
}

namespace {
void Release(TDRefCountedObj* object) noexcept {
  if (object != nullptr && object->ReleaseRef()) delete object;
}
}  // namespace

TDRefCountedPtr::TDRefCountedPtr(TDRefCountedObj* object) noexcept : object_(object) {
  if (object_ != nullptr) object_->AddRef();
}

TDRefCountedPtr::TDRefCountedPtr(const TDRefCountedPtr& other) noexcept : object_(other.object_) {
  if (object_ != nullptr) object_->AddRef();
}

TDRefCountedPtr::TDRefCountedPtr(TDRefCountedPtr&& other) noexcept : object_(other.object_) {
  other.object_ = nullptr;
}

TDRefCountedPtr& TDRefCountedPtr::operator=(const TDRefCountedPtr& other) noexcept {
  assign(other.object_);
  return *this;
}

TDRefCountedPtr& TDRefCountedPtr::operator=(TDRefCountedPtr&& other) noexcept {
  if (this != &other) move(other);
  return *this;
}

TDRefCountedPtr::~TDRefCountedPtr() { Free(); }

void TDRefCountedPtr::Free() noexcept {
  TDRefCountedObj* old = object_;
  object_ = nullptr;
  Release(old);
}

void TDRefCountedPtr::assign(TDRefCountedObj* object) noexcept {
  if (object == object_) return;
  if (object != nullptr) object->AddRef();
  TDRefCountedObj* old = object_;
  object_ = object;
  Release(old);
}

void TDRefCountedPtr::move(TDRefCountedPtr& other) noexcept {
  if (&other == this) return;
  TDRefCountedObj* old = object_;
  object_ = other.object_;
  other.object_ = nullptr;
  Release(old);
}
