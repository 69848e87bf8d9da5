// Named, non-recursive mutexes. The name is only for diagnostics; several mutexes may share one.
#pragma once

#include <cstdint>

#include "runtime/PXTypes.h"

struct ThMutexRec;
using ThMutex = ThMutexRec*;

// *out is the new mutex, or null on failure (status 2; 1 for a null out). The name is copied
// (a null name is kept as "").
int32_t ThMutexCreate(ThMutex* out, const char* name);
// 42 for a null mutex. Acquiring a mutex this thread already holds would deadlock, so it is
// refused with 1; releasing one this thread does not hold is refused with 1 as well.
int32_t ThMutexAcquire(ThMutex m);
int32_t ThMutexRelease(ThMutex m);
// Destroys *m and sets it null. 42 when m or *m is null. The mutex must not be held.
int32_t ThMutexDestroy(ThMutex* m);
// The name given at creation; "" for a null mutex.
const char* ThMutexName(ThMutex m);

// Holds a mutex for one scope; a null mutex makes it do nothing.
class ThMutexLock {
 public:
  explicit ThMutexLock(ThMutex m);
  ~ThMutexLock();
  ThMutexLock(const ThMutexLock&) = delete;
  ThMutexLock& operator=(const ThMutexLock&) = delete;

 private:
  ThMutex mutex_;
  bool held_;
};
