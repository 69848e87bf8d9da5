// Named mutexes over std::mutex. The owner is tracked so that misuse (relocking, releasing a
// mutex held by someone else) gets a status instead of a deadlock or undefined behaviour.
#include "runtime/PXMutex.h"

#include <atomic>
#include <cstring>
#include <mutex>
#include <new>
#include <thread>

#include "runtime/DSMemory.h"

struct ThMutexRec {
  std::mutex mutex;
  std::atomic<std::thread::id> owner{};
  const char* name = "";  // points into the same block, just past this record
};

int32_t ThMutexCreate(ThMutex* out, const char* name) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  const char* text = name ? name : "";
  const size_t length = std::strlen(text);
  // One block holds the record and a copy of its name.
  void* block = PXAlloc(sizeof(ThMutexRec) + length + 1);
  if (!block) return kStatusOutOfMemory;
  auto* rec = ::new (block) ThMutexRec();
  char* copy = static_cast<char*>(block) + sizeof(ThMutexRec);
  std::memcpy(copy, text, length + 1);
  rec->name = copy;
  *out = rec;
  return kStatusNoError;
}

int32_t ThMutexAcquire(ThMutex m) {
  if (!m) return kStatusNullHandle;
  const std::thread::id self = std::this_thread::get_id();
  if (m->owner.load() == self) return kStatusBadArgument;
  m->mutex.lock();
  m->owner.store(self);
  return kStatusNoError;
}

int32_t ThMutexRelease(ThMutex m) {
  if (!m) return kStatusNullHandle;
  if (m->owner.load() != std::this_thread::get_id()) return kStatusBadArgument;
  m->owner.store(std::thread::id());
  m->mutex.unlock();
  return kStatusNoError;
}

int32_t ThMutexDestroy(ThMutex* m) {
  if (!m || !*m) return kStatusNullHandle;
  ThMutexRec* rec = *m;
  *m = nullptr;
  rec->~ThMutexRec();
  PXFree(rec);
  return kStatusNoError;
}

const char* ThMutexName(ThMutex m) { return m ? m->name : ""; }

ThMutexLock::ThMutexLock(ThMutex m) : mutex_(m), held_(m && ThMutexAcquire(m) == kStatusNoError) {}

ThMutexLock::~ThMutexLock() {
  if (held_) ThMutexRelease(mutex_);
}
