// The factory table, the type manager service's start and stop, the registry of shared global
// descriptors and the host's hooks.
#include "vellum/TypeManagerHooks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "FixedPoint/fxp.h"
#include "vellum/Dictionaries.h"
#include "vellum.h"

namespace {

class TypeManagerTest : public TypeSystemTest {};


class NullFactory final : public TDTypeFactory {
 public:
  TDImpPtr CreateTD(TDDataReader*, uint16_t, int32_t* status) const override {
    if (status != nullptr) *status = kStatusNoError;
    return TDImpPtr();
  }
};

class RecordingRegistrar final : public IServiceDependencyRegistrar {
 public:
  void DependsOn(IServiceObject* service) override { seen.push_back(service); }
  std::vector<IServiceObject*> seen;
};

std::vector<TDTypeFactory*> FactoryTable() {
  std::vector<TDTypeFactory*> table;
  for (int32_t code = 0; code < 256; ++code) table.push_back(GetTypeFactory(code));
  return table;
}

TEST_F(TypeManagerTest, FactoriesAfterStart) {
  struct Case {
    const char* name;
    int32_t code;
    int32_t (TD::*is)() const;
  };
  const Case kCases[] = {
      {"Void", 0x00, &TD::IsVoid},
      {"BooleanU16", 0x20, &TD::IsBoolU16},
      {"Boolean", 0x21, &TD::IsBool},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const TDTypeFactory* factory = GetTypeFactory(c.code);
    ASSERT_NE(factory, nullptr);
    EXPECT_TRUE(HasTypeFactory(c.code));
    int32_t status = -1;
    const TDW made(factory->CreateTD(nullptr, static_cast<uint16_t>(c.code), &status), 1);
    EXPECT_EQ(status, kStatusNoError);
    ASSERT_TRUE(made) << "a writable, empty descriptor";
    EXPECT_EQ(made.GetTypeCode(), c.code);
    EXPECT_EQ((made.*c.is)(), 1);
    EXPECT_EQ(made.HasName(), 0);
    EXPECT_FALSE(CreateUnflattenHandler(static_cast<int16_t>(c.code)));

    LiveBlockCheck leaks;
    ScopedAllocationFailure failure(1);
    status = -1;
    EXPECT_FALSE(factory->CreateTD(nullptr, static_cast<uint16_t>(c.code), &status));
    EXPECT_EQ(status, kStatusOutOfMemory);
  }
  EXPECT_EQ(GetTypeFactory(0x31), nullptr);
  EXPECT_FALSE(HasTypeFactory(0x31));
  EXPECT_FALSE(CreateUnflattenHandler(0x31));
  EXPECT_EQ(GetTypeFactory(256), nullptr);
  EXPECT_EQ(GetTypeFactory(-1), nullptr);
}

TEST_F(TypeManagerTest, InvalidFactoryCodeChangesNothing) {
  NullFactory factory;
  const std::vector<TDTypeFactory*> before = FactoryTable();
  for (const uint16_t code : {uint16_t{256}, uint16_t{0x1FF}, uint16_t{0xFFFF}}) {
    SCOPED_TRACE(code);
    DebugCapture capture;
    RegisterTypeFactory(code, &factory);
    ASSERT_EQ(capture.Messages().size(), 1u);
    EXPECT_EQ(capture.Messages()[0].text, "Registering an invalid type factory");
    EXPECT_EQ(capture.Messages()[0].level, 3);
    EXPECT_EQ(FactoryTable(), before);
  }
}

TEST_F(TypeManagerTest, ReregisteringReportsAndReplaces) {
  NullFactory factory;
  TDTypeFactory* const original = GetTypeFactory(0x21);
  DebugCapture capture;
  RegisterTypeFactory(0x21, &factory);
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "Reregistering a type factory");
  EXPECT_EQ(capture.Messages()[0].level, 3);
  EXPECT_EQ(GetTypeFactory(0x21), &factory);

  capture.Clear();
  RegisterTypeFactory(0x31, &factory);
  EXPECT_TRUE(capture.Messages().empty()) << "a free code is filled silently";
  EXPECT_EQ(GetTypeFactory(0x31), &factory);

  RegisterTypeFactory(0x21, original);
  EXPECT_EQ(GetTypeFactory(0x21), original);
}

TEST_F(TypeManagerTest, StopClearsTheTablesAndStartFillsThemAgain) {
  const std::vector<TDTypeFactory*> running = FactoryTable();
  services_.StopAll();
  EXPECT_EQ(FactoryTable(), std::vector<TDTypeFactory*>(256, nullptr));
  EXPECT_EQ(GetNumDictionaries(), 0);
  EXPECT_FALSE(HasRecursiveTypesTable());
  ASSERT_EQ(services_.Start(TypeManagerService()), kStatusNoError);
  EXPECT_EQ(FactoryTable(), running);
  EXPECT_EQ(GetNumDictionaries(), 8);
}

TEST_F(TypeManagerTest, StartWithoutStopReportsEveryRegisteredCode) {
  const std::vector<TDTypeFactory*> running = FactoryTable();
  size_t registered = 0;
  for (const TDTypeFactory* factory : running) registered += factory != nullptr ? 1 : 0;
  ASSERT_GE(registered, 3u);

  DebugCapture capture;
  ASSERT_EQ(TypeManagerService()->Start(), kStatusNoError);
  EXPECT_EQ(capture.Messages().size(), registered);
  for (const DebugMessage& m : capture.Messages()) {
    EXPECT_EQ(m.text, "Reregistering a type factory");
    EXPECT_EQ(m.level, 3);
  }
  EXPECT_EQ(FactoryTable(), running);
  EXPECT_EQ(GetNumDictionaries(), 8);
}

TEST_F(TypeManagerTest, ServiceNameAndDependencies) {
  IServiceObject* service = TypeManagerService();
  ASSERT_NE(service, nullptr);
  EXPECT_EQ(TypeManagerService(), service);
  EXPECT_STREQ(service->Name(), "TypeManager");
  RecordingRegistrar registrar;
  service->DeclareDependencies(&registrar);
  EXPECT_EQ(registrar.seen, (std::vector<IServiceObject*>{MemoryManagerService(), PathManagerService(),
                                                          ProtectedAtomicOperationsService()}));
}

TEST_F(TypeManagerTest, StartUnderAllocationFailureFailsCleanly) {
  services_.StopAll();
  const int64_t stopped = DSLiveBlockCount();
  IServiceObject* service = TypeManagerService();
  int32_t failures = 0;
  bool started = false;
  for (int64_t n = 1; n <= 50 && !started; ++n) {
    SCOPED_TRACE(n);
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      status = service->Start();
      fired = failure.Fired();
    }
    if (fired) {
      ++failures;
      EXPECT_EQ(status, kStatusOutOfMemory);
      EXPECT_EQ(GetNumDictionaries() == 0, GetTypeFactory(0x21) == nullptr)
          << "dictionaries and factories are registered together or not at all";
    } else {
      EXPECT_EQ(status, kStatusNoError);
      EXPECT_EQ(GetNumDictionaries(), 8);
      EXPECT_NE(GetTypeFactory(0x21), nullptr);
      EXPECT_TRUE(TDWBoolean(U("started")).CheckIn());
      started = true;
    }
    EXPECT_EQ(service->Stop(), kStatusNoError);
    EXPECT_EQ(DSLiveBlockCount(), stopped);
    EXPECT_EQ(GetNumDictionaries(), 0);
    EXPECT_EQ(GetTypeFactory(0x21), nullptr);
  }
  EXPECT_TRUE(started);
  EXPECT_GE(failures, 1);
}

TEST_F(TypeManagerTest, RegisteredTypeKeepsTheFirstHandle) {
  static GlobalTypeEntry entry;  // linked into the registry until the service stops
  const int32_t before = GetNumRegisteredTypes();
  TDRegisterType(&entry, TDRBoolean(U("first")));
  TDRegisterType(&entry, TDRBoolean(U("second")));
  TDRegisterType(nullptr, TDRBoolean(U("nowhere")));
  std::string name;
  EXPECT_EQ(entry.td.GetName(&name), kStatusNoError);
  EXPECT_EQ(name, "first");
  EXPECT_EQ(GetNumRegisteredTypes(), before + 1);

  services_.StopAll();
  EXPECT_TRUE(entry.td.IsNull()) << "released at stop";
  EXPECT_EQ(GetNumRegisteredTypes(), 0);
  EXPECT_EQ(DSLiveBlockCount(), baseline_);

  ASSERT_EQ(services_.Start(TypeManagerService()), kStatusNoError);
  TDRegisterType(&entry, TDRBoolean(U("after restart")));
  EXPECT_EQ(entry.td.GetName(&name), kStatusNoError);
  EXPECT_EQ(name, "after restart");
}

TEST_F(TypeManagerTest, SharedDefaultsAreReleasedAtStopAndRebuilt) {
  const int32_t registered = GetNumRegisteredTypes();
  const TDR& boolean = GetBoolTD();
  ASSERT_TRUE(boolean);
  EXPECT_EQ(boolean.IsReadOnlyTD(), 1);
  EXPECT_EQ(boolean.IsBool(), 1);
  EXPECT_TRUE(GetBoolTD() == boolean);
  EXPECT_TRUE(GetVoidTD());
  EXPECT_EQ(GetNumRegisteredTypes(), registered + 2);

  services_.StopAll();
  EXPECT_TRUE(boolean.IsNull());
  EXPECT_EQ(DSLiveBlockCount(), baseline_) << "nothing of the defaults is left";

  ASSERT_EQ(services_.Start(TypeManagerService()), kStatusNoError);
  const int32_t restarted = GetNumRegisteredTypes();
  const TDR& rebuilt = GetBoolTD();
  ASSERT_TRUE(rebuilt);
  EXPECT_EQ(rebuilt.IsReadOnlyTD(), 1);
  EXPECT_TRUE(rebuilt == TDRBoolean());
  EXPECT_EQ(GetNumRegisteredTypes(), restarted + 1);
}

TEST_F(TypeManagerTest, ConcurrentFirstUseOfSharedDefaultsGivesOneObject) {
  constexpr int32_t kThreads = 8;
  std::vector<TDR> booleans(kThreads);
  std::vector<TDR> voids(kThreads);
  static GlobalTypeEntry contested;
  const int32_t registered = GetNumRegisteredTypes();
  std::atomic<int32_t> waiting{kThreads};
  std::vector<std::thread> threads;
  for (int32_t t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      waiting.fetch_sub(1);
      while (waiting.load() > 0) std::this_thread::yield();
      booleans[t] = GetBoolTD();
      voids[t] = GetVoidTD();
      TDRegisterType(&contested, TDRBoolean(U(("contender " + std::to_string(t)).c_str())));
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int32_t t = 0; t < kThreads; ++t) {
    SCOPED_TRACE(t);
    EXPECT_TRUE(booleans[t] == GetBoolTD());
    EXPECT_TRUE(voids[t] == GetVoidTD());
  }
  ASSERT_TRUE(GetBoolTD());
  EXPECT_TRUE(contested.td);
  EXPECT_EQ(GetNumRegisteredTypes(), registered + 3) << "each entry is registered once";
}

int32_t SanityCheck(const TD&) { return 0; }
void Rave(void*, void*, int32_t&, int32_t) {}
void CompleteDataSize(const void*, int32_t, const TDR&, uint64_t*, uint64_t*) {}
void EventToEventType(uint32_t, uint32_t*) {}
int32_t FindRefObj(LStr*, void*, const TDR&) { return 0; }
GDataDispatchTable* DispatchTableFactory(const TDR&) { return nullptr; }
int32_t MapStatus(int32_t status) { return status; }
int32_t OleVariantUnFlatten(KoDataReader*, void*) { return 0; }
std::string ShortString(const TDR&, bool, bool*) { return std::string(); }

struct Hook {
  const char* name;
  std::function<void(bool install)> set;
  std::function<bool()> installed;
  std::function<bool()> removed;
};

template <class Proc>
Hook ProcHook(const char* name, void (*setter)(Proc), Proc (*getter)(), Proc proc) {
  return {name, [=](bool install) { setter(install ? proc : nullptr); }, [=] { return getter() == proc; },
          [=] { return getter() == nullptr; }};
}

Hook FlagHook(const char* name, void (*setter)(bool), bool (*getter)()) {
  return {name, [=](bool install) { setter(install); }, [=] { return getter(); }, [=] { return !getter(); }};
}

TEST_F(TypeManagerTest, HookSettersStore) {
  const Hook kHooks[] = {
      ProcHook<TDSanityCheckProc>("SanityCheck", &SetTDSanityCheckProc, &GetTDSanityCheckProc, &SanityCheck),
      ProcHook<TDRaveProc>("Rave", &SetTDRaveProc, &GetTDRaveProc, &Rave),
      ProcHook<CompleteDataSizeProc>("CompleteDataSize", &SetCompleteDataSizeProc, &GetCompleteDataSizeProc,
                                     &CompleteDataSize),
      ProcHook<EventToEventTypeEnumProc>("EventToEventType", &SetEventToEventTypeEnumProc,
                                         &GetEventToEventTypeEnumProc, &EventToEventType),
      ProcHook<FindRefObjTDRProc>("FindRefObj", &SetFindRefObjTDRProc, &GetFindRefObjTDRProc, &FindRefObj),
      ProcHook<GDataDispatchTableFactoryProc>("DispatchTableFactory", &SetGDataDispatchTableFactoryProc,
                                              &GetGDataDispatchTableFactoryProc, &DispatchTableFactory),
      ProcHook<StatusMapProc>("HResultToMgErr", &SetHResultToMgErrProc, &GetHResultToMgErrProc, &MapStatus),
      ProcHook<StatusMapProc>("MgErrToHResult", &SetMgErrToHResultProc, &GetMgErrToHResultProc, &MapStatus),
      ProcHook<OleVariantUnFlattenDataProc>("OleVariantUnFlatten", &SetOleVariantUnFlattenDataProc,
                                            &GetOleVariantUnFlattenDataProc, &OleVariantUnFlatten),
      ProcHook<TypeToShortStringProc>("TypeToShortString", &SetTypeToShortStringProc, &GetTypeToShortStringProc,
                                      &ShortString),
      FlagHook("CoerceFromKoVariant", &TDCoerceFromKoVariant, &IsCoerceFromKoVariantEnabled),
      FlagHook("FlatTypeCache", &TDEnableFlatTypeCache, &IsFlatTypeCacheEnabled),
      FlagHook("PreAllocation", &TDEnablePreAllocation, &IsPreAllocationEnabled),
      FlagHook("RecursiveTypes", &TDEnableRecursiveTypes, &AreRecursiveTypesEnabled),
  };
  for (const Hook& hook : kHooks) {
    SCOPED_TRACE(hook.name);
    hook.set(true);
    EXPECT_TRUE(hook.installed());
    hook.set(false);
    EXPECT_TRUE(hook.removed());
  }
  const int32_t alignment = GetDSAlign();
  SetDSAlign(8);
  EXPECT_EQ(GetDSAlign(), 8);
  SetDSAlign(1);
  EXPECT_EQ(GetDSAlign(), 1);
  SetDSAlign(alignment);
}

// Fixed-point arithmetic reports failed checks only while the service runs; they arrive as one
// level-2 line of the type manager.
TEST_F(TypeManagerTest, FixedPointAssertionsAreReportedWhileRunning) {
  DebugCapture capture;
  const vellum::FXP bad(int64_t{1}, 0, 0);
  const std::vector<DebugMessage> messages = capture.Messages();
  ASSERT_FALSE(messages.empty());
  EXPECT_EQ(messages[0].level, 2);
  EXPECT_EQ(messages[0].module, "TypeManager");
  const std::string prefix = "FXP assertion failed in: dep_mirror\\deps\\FixedPoint\\includes\\fxp:";
  EXPECT_EQ(messages[0].text.substr(0, prefix.size()), prefix);
  const std::string suffix = ".  Failed assertion was m_wl >= 1 with message \"Wordlenth out of range\"";
  ASSERT_GE(messages[0].text.size(), suffix.size());
  EXPECT_EQ(messages[0].text.substr(messages[0].text.size() - suffix.size()), suffix);

  services_.StopAll();
  capture.Clear();
  const vellum::FXP unchecked(int64_t{1}, 0, 0);
  EXPECT_TRUE(capture.Messages().empty()) << "no reporter once the service has stopped";
  ASSERT_EQ(services_.Start(TypeManagerService()), 0);
}

}  // namespace
