// The built-in host services and the manager that starts services after their dependencies.
#include "runtime/PXServices.h"

#include <algorithm>

#include "runtime/PXTypes.h"

IServiceDependencyRegistrar::~IServiceDependencyRegistrar() = default;
IServiceObject::~IServiceObject() = default;

namespace {

// A host service with nothing to do in this build: memory, paths and atomics need no set-up.
class PassiveService final : public IServiceObject {
 public:
  explicit PassiveService(const char* name) : name_(name) {}
  int32_t Start() override { return kStatusNoError; }
  int32_t Stop() override { return kStatusNoError; }
  const char* Name() const override { return name_; }
  void DeclareDependencies(IServiceDependencyRegistrar*) override {}

 private:
  const char* name_;
};

class Collector final : public IServiceDependencyRegistrar {
 public:
  void DependsOn(IServiceObject* s) override {
    if (s) dependencies.push_back(s);
  }
  std::vector<IServiceObject*> dependencies;
};

}  // namespace

IServiceObject* MemoryManagerService() {
  static PassiveService service("MemoryManager");
  return &service;
}

IServiceObject* PathManagerService() {
  static PassiveService service("PathManager");
  return &service;
}

IServiceObject* ProtectedAtomicOperationsService() {
  static PassiveService service("ProtectedAtomicOperations");
  return &service;
}

bool ServiceManager::IsRunning(IServiceObject* s) const {
  return s && std::find(running_.begin(), running_.end(), s) != running_.end();
}

int32_t ServiceManager::Start(IServiceObject* s) {
  if (!s) return kStatusNullHandle;
  std::vector<IServiceObject*> path;
  return StartWithin(s, &path);
}

int32_t ServiceManager::StartWithin(IServiceObject* s, std::vector<IServiceObject*>* path) {
  if (IsRunning(s)) return kStatusNoError;
  if (std::find(path->begin(), path->end(), s) != path->end()) return kStatusBadArgument;
  Collector collector;
  s->DeclareDependencies(&collector);
  path->push_back(s);
  for (IServiceObject* d : collector.dependencies) {
    if (int32_t err = StartWithin(d, path)) return err;
  }
  path->pop_back();
  if (int32_t err = s->Start()) return err;
  running_.push_back(s);
  return kStatusNoError;
}

int32_t ServiceManager::Stop(IServiceObject* s) {
  if (!s) return kStatusNullHandle;
  auto it = std::find(running_.begin(), running_.end(), s);
  if (it == running_.end()) return kStatusNoError;
  running_.erase(it);
  return s->Stop();
}

int32_t ServiceManager::StopAll() {
  int32_t first = kStatusNoError;
  while (!running_.empty()) {
    IServiceObject* s = running_.back();
    running_.pop_back();
    const int32_t err = s->Stop();
    if (first == kStatusNoError) first = err;
  }
  return first;
}
