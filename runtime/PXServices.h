// The host's small service framework: services declare which others they need, and a
// ServiceManager starts those first.
#pragma once

#include <cstdint>
#include <vector>

class IServiceObject;

class IServiceDependencyRegistrar {
 public:
  virtual void DependsOn(IServiceObject* s) = 0;
  virtual ~IServiceDependencyRegistrar();
};

// The virtual slots keep this order: Start, Stop, Name, DeclareDependencies, destructor.
class IServiceObject {
 public:
  virtual int32_t Start() = 0;  // 0 on success
  virtual int32_t Stop() = 0;
  virtual const char* Name() const = 0;
  virtual void DeclareDependencies(IServiceDependencyRegistrar* r) = 0;
  virtual ~IServiceObject();
};

// The host services this library depends on. Each is one object in static storage; its Start
// and Stop return 0 and it declares no dependencies.
IServiceObject* MemoryManagerService();              // "MemoryManager"
IServiceObject* PathManagerService();                // "PathManager"
IServiceObject* ProtectedAtomicOperationsService();  // "ProtectedAtomicOperations"

// Starts and stops services in dependency order. Meant for one thread (the host's start-up and
// shutdown); not locked.
class ServiceManager {
 public:
  ServiceManager() = default;
  ServiceManager(const ServiceManager&) = delete;
  ServiceManager& operator=(const ServiceManager&) = delete;
  ~ServiceManager() = default;

  // Starts s's dependencies first (each once, depth first, in declaration order), then s.
  // A running service is not started again. 42 for null; 1 for a dependency cycle; a failing
  // Start's status stops the walk (services already started stay running).
  int32_t Start(IServiceObject* s);
  // Stops s alone (0 when it was not running); the status of its Stop.
  int32_t Stop(IServiceObject* s);
  // Stops every running service, the last started first; the first nonzero status.
  int32_t StopAll();
  bool IsRunning(IServiceObject* s) const;

 private:
  int32_t StartWithin(IServiceObject* s, std::vector<IServiceObject*>* path);
  std::vector<IServiceObject*> running_;  // in start order
};
