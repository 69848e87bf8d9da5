// The resource store: an ordered map from (file, type, id) to an owned handle, under one mutex.
#include "runtime/PXResources.h"

#include <map>
#include <mutex>
#include <new>
#include <tuple>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/PXInternal.h"

namespace {

using Key = std::tuple<int32_t, uint32_t, uint32_t>;  // file, type, id

struct Resource {
  UHandle handle;
  int32_t flags;
};

struct Store {
  std::mutex mutex;  // guards resources
  std::map<Key, Resource, std::less<Key>, PXAllocator<std::pair<const Key, Resource>>> resources;
};

Store& TheStore() {
  static pxinternal::NoDestructor<Store> store;
  return store.get();
}

}  // namespace

int32_t RAdd(UHandle h, uint32_t resId, uint32_t resType, int32_t fileRef, int32_t flags) {
  if (!h) return kStatusNullHandle;
  if (!IsDSHandle(h)) return kStatusBadArgument;
  UHandle replaced = nullptr;
  {
    Store& s = TheStore();
    std::lock_guard lock(s.mutex);
    try {
      auto [it, inserted] = s.resources.try_emplace(Key{fileRef, resType, resId}, Resource{h, flags});
      if (!inserted) {
        if (it->second.handle != h) replaced = it->second.handle;
        it->second = Resource{h, flags};
      }
    } catch (const std::bad_alloc&) {
      return kStatusOutOfMemory;
    }
  }
  DSDisposeHandle(replaced);
  return kStatusNoError;
}

int32_t RGet(uint32_t resId, uint32_t resType, int32_t fileRef, UHandle* out) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  Store& s = TheStore();
  std::lock_guard lock(s.mutex);
  auto it = s.resources.find(Key{fileRef, resType, resId});
  if (it == s.resources.end()) return kStatusNullHandle;
  *out = it->second.handle;
  return kStatusNoError;
}

int32_t RGetFlags(uint32_t resId, uint32_t resType, int32_t fileRef, int32_t* flags) {
  if (!flags) return kStatusBadArgument;
  Store& s = TheStore();
  std::lock_guard lock(s.mutex);
  auto it = s.resources.find(Key{fileRef, resType, resId});
  if (it == s.resources.end()) return kStatusNullHandle;
  *flags = it->second.flags;
  return kStatusNoError;
}

int32_t RRemove(uint32_t resId, uint32_t resType, int32_t fileRef) {
  UHandle removed = nullptr;
  {
    Store& s = TheStore();
    std::lock_guard lock(s.mutex);
    auto it = s.resources.find(Key{fileRef, resType, resId});
    if (it == s.resources.end()) return kStatusNullHandle;
    removed = it->second.handle;
    s.resources.erase(it);
  }
  DSDisposeHandle(removed);
  return kStatusNoError;
}

void RCloseFile(int32_t fileRef) {
  Store& s = TheStore();
  for (;;) {
    UHandle removed = nullptr;
    {
      std::lock_guard lock(s.mutex);
      auto it = s.resources.lower_bound(Key{fileRef, 0, 0});
      if (it == s.resources.end() || std::get<0>(it->first) != fileRef) return;
      removed = it->second.handle;
      s.resources.erase(it);
    }
    DSDisposeHandle(removed);
  }
}
