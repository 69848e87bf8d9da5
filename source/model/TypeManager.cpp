// The factory table, the type manager service, the shared global descriptors and host hooks.
#include "source/model/TypeManager.h"

#include <algorithm>
#include <array>
#include <mutex>
#include <vector>

#include "FixedPoint/fxp.h"
#include "runtime/DebugStream.h"
#include "runtime/PXMutex.h"
#include "source/model/CoreTDTable.h"
#include "source/model/TDAttributes.h"

VELLUM_DIAGNOSTIC_MODULE("TypeManager");

namespace {

std::array<std::atomic<TDTypeFactory*>, 256> gFactories{};

struct Announcement {
  int32_t order;
  uint16_t code;
  TDTypeFactory* factory;
};

// Families announce from their static initialisers, in whatever order the loader runs them.
std::mutex& AnnouncementMutex() {
  static std::mutex mutex;
  return mutex;
}
std::vector<Announcement>& Announcements() {
  static std::vector<Announcement> announcements;
  return announcements;
}

ThMutex gRegisterMutex = nullptr;
GlobalTypeEntry* gRegisteredHead = nullptr;
int32_t gRegisteredCount = 0;

std::atomic<TDSanityCheckProc> gSanityCheck{nullptr};
std::atomic<TDRaveProc> gRave{nullptr};
std::atomic<CompleteDataSizeProc> gCompleteDataSize{nullptr};
std::atomic<EventToEventTypeEnumProc> gEventToEventType{nullptr};
std::atomic<FindRefObjTDRProc> gFindRefObjTDR{nullptr};
std::atomic<GDataDispatchTableFactoryProc> gDispatchTableFactory{nullptr};
std::atomic<StatusMapProc> gHResultToMgErr{nullptr};
std::atomic<StatusMapProc> gMgErrToHResult{nullptr};
std::atomic<OleVariantUnFlattenDataProc> gOleVariantUnFlatten{nullptr};
std::atomic<TypeToShortStringProc> gTypeToShortString{nullptr};
std::atomic<DestroyTDListener> gDestroyTDListener{nullptr};
std::atomic<GetSpecialClusterRulesProc> gSpecialClusterRules{nullptr};
std::atomic<bool> gCoerceFromKoVariant{false};
std::atomic<bool> gFlatTypeCache{false};
std::atomic<bool> gPreAllocation{false};
std::atomic<bool> gRecursiveTypes{false};
std::atomic<bool> gGarbageCollectingTDs{false};

void RegisterAnnouncedFactories() {
  std::vector<Announcement> ordered;
  {
    std::lock_guard lock(AnnouncementMutex());
    ordered = Announcements();
  }
  std::stable_sort(ordered.begin(), ordered.end(),
                   [](const Announcement& a, const Announcement& b) { return a.order < b.order; });
  for (const Announcement& a : ordered) RegisterTypeFactory(a.code, a.factory);
}

void ReleaseRegisteredTypes() {
  ThMutexLock lock(gRegisterMutex);
  for (GlobalTypeEntry* entry = gRegisteredHead; entry != nullptr;) {
    GlobalTypeEntry* next = entry->next;
    entry->td = TDR();
    entry->set.store(false, std::memory_order_release);
    entry->next = nullptr;
    entry = next;
  }
  gRegisteredHead = nullptr;
  gRegisteredCount = 0;
}

// Fixed-point arithmetic has no diagnostics of its own; its failed checks come here.
void ReportFixedPointAssertion(const char* file, uint32_t line, const char* condition, const char* message) {
  (VELLUM_DEBUG(2) << "FXP assertion failed in: " << (file != nullptr ? file : "") << ":" << line
                   << ".  Failed assertion was " << (condition != nullptr ? condition : "") << " with message \""
                   << (message != nullptr ? message : "") << "\"")
      .Process();
}

class TypeManager_Service final : public IServiceObject {
 public:
  int32_t Start() override {
    if (CreateRecursiveTypesTable() != kStatusNoError) return kStatusOutOfMemory;
    RegisterDictionary(&GTDDictionary());
    RegisterDictionary(&TheNameDictionary());
    RegisterDictionary(&TheTypedefDictionary());
    RegisterDictionary(&TheEnumDictionary());
    RegisterDictionary(&TheUnitsDictionary());
    RegisterDictionary(&TheEventRegOMIdInfoDictionary());
    RegisterDictionary(&TheIVISubTypeDictionary());
    RegisterDictionary(&TheOMIdDictionary());
    RegisterAnnouncedFactories();
    if (gRegisterMutex == nullptr) {
      const int32_t status = ThMutexCreate(&gRegisterMutex, "RegisterMutex");
      if (status != kStatusNoError) return status;
    }
    vellum::FXP::registerAssertFunction(&ReportFixedPointAssertion);
    return kStatusNoError;
  }

  int32_t Stop() override {
    vellum::FXP::registerAssertFunction(nullptr);
    ReleaseRegisteredTypes();
    ThMutexDestroy(&gRegisterMutex);
    GarbageCollectDictionaries();
    DestroyRecursiveTypesTable();
    EmptyingTypeDictionaries();
    EmptyRegisteredDictionaries();
    for (auto& factory : gFactories) factory.store(nullptr, std::memory_order_release);
    return kStatusNoError;
  }

  const char* Name() const override { return "TypeManager"; }

  void DeclareDependencies(IServiceDependencyRegistrar* registrar) override {
    registrar->DependsOn(MemoryManagerService());
    registrar->DependsOn(PathManagerService());
    registrar->DependsOn(ProtectedAtomicOperationsService());
  }
};

}  // namespace

TDTypeFactory::~TDTypeFactory() = default;

TDImpPtr TDTypeFactory::CreateUnflattenHandler(int16_t) const { return TDImpPtr(); }

void RegisterTypeFactory(uint16_t typeCode, TDTypeFactory* factory) {
  if (typeCode > 255) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Registering an invalid type factory");
    return;
  }
  if (gFactories[typeCode].load(std::memory_order_acquire) != nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Reregistering a type factory");
  }
  gFactories[typeCode].store(factory, std::memory_order_release);
}

TDTypeFactory* GetTypeFactory(int32_t typeCode) {
  if (typeCode < 0 || typeCode > 255) return nullptr;
  return gFactories[static_cast<size_t>(typeCode)].load(std::memory_order_acquire);
}

TDImpPtr CreateUnflattenHandler(int16_t typeCode) {
  TDTypeFactory* factory = GetTypeFactory(typeCode);
  return factory != nullptr ? factory->CreateUnflattenHandler(typeCode) : TDImpPtr();
}

bool HasTypeFactory(int32_t code) { return GetTypeFactory(code) != nullptr; }

bool HasDefaultType(int32_t code) { return HasDefaultTypeGetter(code); }

void AnnounceTypeFactory(int32_t order, uint16_t typeCode, TDTypeFactory* factory) {
  std::lock_guard lock(AnnouncementMutex());
  Announcements().push_back({order, typeCode, factory});
}

void TDRegisterType(GlobalTypeEntry* entry, const TDR& td) {
  if (entry == nullptr) return;
  ThMutexLock lock(gRegisterMutex);
  if (entry->set.load(std::memory_order_acquire)) return;
  entry->td = td;
  entry->next = gRegisteredHead;
  gRegisteredHead = entry;
  ++gRegisteredCount;
  entry->set.store(true, std::memory_order_release);
}

int32_t GetNumRegisteredTypes() {
  ThMutexLock lock(gRegisterMutex);
  return gRegisteredCount;
}

const TDR& SharedGlobalType(GlobalTypeEntry& entry, TDImpPtr (*make)()) {
  if (entry.set.load(std::memory_order_acquire)) return entry.td;
  TDImpPtr fresh = make();
  if (!fresh) return GNullTD();
  TDImpPtr interned = fresh->CheckIn();
  if (!interned) return GNullTD();
  TDRegisterType(&entry, TDR(interned, 1));
  return entry.set.load(std::memory_order_acquire) ? entry.td : GNullTD();
}

IServiceObject* TypeManagerService() {
  static TypeManager_Service service;
  return &service;
}

void SetTDSanityCheckProc(TDSanityCheckProc proc) { gSanityCheck.store(proc); }
TDSanityCheckProc GetTDSanityCheckProc() { return gSanityCheck.load(); }
void SetTDRaveProc(TDRaveProc proc) { gRave.store(proc); }
TDRaveProc GetTDRaveProc() { return gRave.load(); }
void SetCompleteDataSizeProc(CompleteDataSizeProc proc) { gCompleteDataSize.store(proc); }
CompleteDataSizeProc GetCompleteDataSizeProc() { return gCompleteDataSize.load(); }
void SetEventToEventTypeEnumProc(EventToEventTypeEnumProc proc) { gEventToEventType.store(proc); }
EventToEventTypeEnumProc GetEventToEventTypeEnumProc() { return gEventToEventType.load(); }
void SetFindRefObjTDRProc(FindRefObjTDRProc proc) { gFindRefObjTDR.store(proc); }
FindRefObjTDRProc GetFindRefObjTDRProc() { return gFindRefObjTDR.load(); }
void SetGDataDispatchTableFactoryProc(GDataDispatchTableFactoryProc proc) { gDispatchTableFactory.store(proc); }
GDataDispatchTableFactoryProc GetGDataDispatchTableFactoryProc() { return gDispatchTableFactory.load(); }
void SetHResultToMgErrProc(StatusMapProc proc) { gHResultToMgErr.store(proc); }
StatusMapProc GetHResultToMgErrProc() { return gHResultToMgErr.load(); }
void SetMgErrToHResultProc(StatusMapProc proc) { gMgErrToHResult.store(proc); }
StatusMapProc GetMgErrToHResultProc() { return gMgErrToHResult.load(); }
void SetOleVariantUnFlattenDataProc(OleVariantUnFlattenDataProc proc) { gOleVariantUnFlatten.store(proc); }
OleVariantUnFlattenDataProc GetOleVariantUnFlattenDataProc() { return gOleVariantUnFlatten.load(); }
void SetTypeToShortStringProc(TypeToShortStringProc proc) { gTypeToShortString.store(proc); }
TypeToShortStringProc GetTypeToShortStringProc() { return gTypeToShortString.load(); }
void TDCoerceFromKoVariant(bool enable) { gCoerceFromKoVariant.store(enable); }
bool IsCoerceFromKoVariantEnabled() { return gCoerceFromKoVariant.load(); }
void TDEnableFlatTypeCache(bool enable) { gFlatTypeCache.store(enable); }
bool IsFlatTypeCacheEnabled() { return gFlatTypeCache.load(); }
void TDEnablePreAllocation(bool enable) { gPreAllocation.store(enable); }
bool IsPreAllocationEnabled() { return gPreAllocation.load(); }
void TDEnableRecursiveTypes(bool enable) { gRecursiveTypes.store(enable); }
bool AreRecursiveTypesEnabled() { return gRecursiveTypes.load(); }
void SetDestroyTDListener(DestroyTDListener listener) { gDestroyTDListener.store(listener); }
void SetGetSpecialClusterRulesProc(GetSpecialClusterRulesProc proc) { gSpecialClusterRules.store(proc); }
void SetGarbageCollectingTDs(bool enable) { gGarbageCollectingTDs.store(enable); }
