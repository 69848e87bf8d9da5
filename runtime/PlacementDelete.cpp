// The placement-delete registry: a stack of (destroy, object) pairs under a mutex. Each delete
// runs outside the mutex, so it may register or run others.
#include "runtime/PlacementDelete.h"

#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "runtime/DebugStream.h"
#include "runtime/PXInternal.h"

VELLUM_DIAGNOSTIC_MODULE("PlacementDelete");

namespace {

struct Registry {
  std::mutex mutex;  // guards entries
  std::vector<std::pair<void (*)(void*), void*>> entries;
};

Registry& TheRegistry() {
  static pxinternal::NoDestructor<Registry> registry;
  return registry.get();
}

}  // namespace

void RegisterPlacementDelete(void (*destroy)(void*), void* object) {
  if (!destroy) return;
  Registry& r = TheRegistry();
  try {
    std::lock_guard lock(r.mutex);
    r.entries.emplace_back(destroy, object);
    return;
  } catch (const std::bad_alloc&) {
  }
  // The object then lives until the process ends: a leak at exit, never a dangling pointer.
  DebugReport(kDiagnosticModule, __LINE__, 3, "Placement delete could not be registered");
}

void RunPlacementDeletes() {
  Registry& r = TheRegistry();
  for (;;) {
    std::pair<void (*)(void*), void*> entry;
    {
      std::lock_guard lock(r.mutex);
      if (r.entries.empty()) return;
      entry = r.entries.back();
      r.entries.pop_back();
    }
    entry.first(entry.second);
  }
}

int32_t PendingPlacementDeletes() {
  Registry& r = TheRegistry();
  std::lock_guard lock(r.mutex);
  return static_cast<int32_t>(r.entries.size());
}
