// Helpers private to the runtime layer's own .cpp files; nothing outside runtime/ includes this.
#pragma once

#include <new>
#include <utility>

namespace pxinternal {

// A process-wide object that is built on first use and never destroyed, so that code running
// during static destruction (other modules disposing handles, say) still finds it alive.
template <class T>
class NoDestructor {
 public:
  template <class... Args>
  explicit NoDestructor(Args&&... args) {
    ::new (static_cast<void*>(storage_)) T(std::forward<Args>(args)...);
  }
  NoDestructor(const NoDestructor&) = delete;
  NoDestructor& operator=(const NoDestructor&) = delete;
  T& get() { return *std::launder(reinterpret_cast<T*>(storage_)); }

 private:
  alignas(T) unsigned char storage_[sizeof(T)];
};

}  // namespace pxinternal
