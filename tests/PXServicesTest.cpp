// The small host modules: services and their manager, the application object, the
// placement-delete registry and KoExcept.
#include "runtime/PXServices.h"

#include <gtest/gtest.h>

#include <cstdlib>

#include <new>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "runtime/KoExcept.h"
#include "runtime/PXApp.h"
#include "runtime/PlacementDelete.h"

namespace {

class RecordingService : public IServiceObject {
 public:
  RecordingService(std::string name, std::vector<std::string>* log, int32_t startStatus = 0)
      : name_(std::move(name)), log_(log), startStatus_(startStatus) {}
  int32_t Start() override {
    log_->push_back("start " + name_);
    return startStatus_;
  }
  int32_t Stop() override {
    log_->push_back("stop " + name_);
    return 0;
  }
  const char* Name() const override { return name_.c_str(); }
  void DeclareDependencies(IServiceDependencyRegistrar* r) override {
    for (IServiceObject* d : dependencies) r->DependsOn(d);
  }
  std::vector<IServiceObject*> dependencies;

 private:
  std::string name_;
  std::vector<std::string>* log_;
  int32_t startStatus_;
};

TEST(PXServicesTest, BuiltInServices) {
  struct Case {
    IServiceObject* service;
    const char* name;
  };
  const Case kCases[] = {
      {MemoryManagerService(), "MemoryManager"},
      {PathManagerService(), "PathManager"},
      {ProtectedAtomicOperationsService(), "ProtectedAtomicOperations"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_STREQ(c.service->Name(), c.name);
    std::vector<std::string> log;
    RecordingService probe("probe", &log);
    ServiceManager manager;
    EXPECT_EQ(manager.Start(c.service), 0);
    EXPECT_TRUE(manager.IsRunning(c.service));
    EXPECT_EQ(manager.Stop(c.service), 0);
    EXPECT_FALSE(manager.IsRunning(c.service));
  }
  EXPECT_EQ(MemoryManagerService(), MemoryManagerService());
}

TEST(PXServicesTest, DependenciesStartFirstAndOnce) {
  std::vector<std::string> log;
  RecordingService memory("memory", &log);
  RecordingService paths("paths", &log);
  RecordingService types("types", &log);
  paths.dependencies = {&memory};
  types.dependencies = {&memory, &paths, &memory};
  ServiceManager manager;
  ASSERT_EQ(manager.Start(&types), 0);
  EXPECT_EQ(log, (std::vector<std::string>{"start memory", "start paths", "start types"}));
  ASSERT_EQ(manager.Start(&types), 0);
  EXPECT_EQ(log.size(), 3u) << "running services are not started again";
  EXPECT_EQ(manager.StopAll(), 0);
  EXPECT_EQ(log, (std::vector<std::string>{"start memory", "start paths", "start types", "stop types",
                                           "stop paths", "stop memory"}));
  EXPECT_EQ(manager.Start(nullptr), kStatusNullHandle);
}

TEST(PXServicesTest, FailuresAndCycles) {
  std::vector<std::string> log;
  RecordingService broken("broken", &log, kStatusOutOfMemory);
  RecordingService user("user", &log);
  user.dependencies = {&broken};
  ServiceManager manager;
  EXPECT_EQ(manager.Start(&user), kStatusOutOfMemory);
  EXPECT_FALSE(manager.IsRunning(&user));
  EXPECT_EQ(log, (std::vector<std::string>{"start broken"}));

  RecordingService a("a", &log);
  RecordingService b("b", &log);
  a.dependencies = {&b};
  b.dependencies = {&a};
  EXPECT_EQ(manager.Start(&a), kStatusBadArgument);
  EXPECT_FALSE(manager.IsRunning(&a));
  EXPECT_FALSE(manager.IsRunning(&b));
}

TEST(PXServicesTest, ApplicationVersion) {
  EXPECT_EQ(PXApp::Instance().GetVersion(), 0x22308000u);
  EXPECT_EQ(&PXApp::Instance(), &PXApp::Instance());
}

std::vector<int>* gDestroyed = nullptr;

void Destroy(void* object) {
  const int id = *static_cast<int*>(object);
  gDestroyed->push_back(id);
  // A delete registered while deleting runs in the same pass.
  static int late = 99;
  if (id == 1) RegisterPlacementDelete(&Destroy, &late);
}

// Running the placement deletes is the host's shutdown: it destroys the library's own statics
// too, so the test runs it in a child process and keeps this one usable.
bool PlacementDeletesBehave() {
  RunPlacementDeletes();  // whatever earlier code registered
  std::vector<int> destroyed;
  gDestroyed = &destroyed;
  int one = 1;
  int two = 2;
  int three = 3;
  RegisterPlacementDelete(&Destroy, &one);
  RegisterPlacementDelete(&Destroy, &two);
  RegisterPlacementDelete(&Destroy, &three);
  RegisterPlacementDelete(nullptr, &three);
  bool ok = PendingPlacementDeletes() == 3;
  RunPlacementDeletes();
  ok = ok && destroyed == std::vector<int>{3, 2, 1, 99};
  RunPlacementDeletes();
  ok = ok && destroyed.size() == 4u;  // each runs once
  RegisterPlacementDelete(&Destroy, &two);
  RunPlacementDeletes();
  ok = ok && destroyed.back() == 2;  // registrations after a run still work
  gDestroyed = nullptr;
  return ok;
}

TEST(PXServicesTest, PlacementDeletesRunNewestFirstOnce) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_EXIT(std::exit(PlacementDeletesBehave() ? 0 : 1), ::testing::ExitedWithCode(0), "");
}

TEST(PXServicesTest, KoExceptFromStandardExceptions) {
  struct Case {
    const char* name;
    KoExcept made;
    int32_t status;
    const char* message;
  };
  const Case kCases[] = {
      {"BadAlloc", KoExcept::FromStd(std::bad_alloc(), "f.cpp", 3), kStatusOutOfMemory, std::bad_alloc().what()},
      {"Other", KoExcept::FromStd(std::runtime_error("boom"), "f.cpp", 3), kStatusBadArgument, "boom"},
      {"KoExcept", KoExcept::FromStd(KoExcept(74, "corrupt", "g.cpp", 8), "f.cpp", 3), 74, "corrupt"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.made.Status(), c.status);
    EXPECT_STREQ(c.made.what(), c.message);
  }
  EXPECT_STREQ(kCases[0].made.File(), "f.cpp");
  EXPECT_EQ(kCases[2].made.Line(), 8) << "a KoExcept keeps its own origin";
  EXPECT_STREQ(KoExcept(1, "m", nullptr, 0).File(), "");
}

}  // namespace
