// The eight interning dictionaries, their registry, the recursive-types table and garbage
// collection with its timing log.
#include "source/model/CoreTDTable.h"

#include <atomic>
#include <chrono>
#include <ctime>
#include <iomanip>
#include <map>
#include <new>
#include <sstream>
#include <vector>

#include "runtime/DebugStream.h"
#include "runtime/PXConfig.h"
#include "runtime/PXUnique.h"
#include "runtime/PlacementDelete.h"
#include "source/model/TD.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "vellum/TypeManagerHooks.h"

VELLUM_DIAGNOSTIC_MODULE("CoreTDTable");

ITDDictionary::~ITDDictionary() = default;

namespace {

// --- the registry ----------------------------------------------------------------------------------

ITDDictionary* gDictionaries[kMaxDictionaries] = {};
std::atomic<int32_t> gNumDictionaries{0};

// --- the descriptor dictionary lives until the host's shutdown ---------------------------------------

alignas(TDDictionary) unsigned char gTDDictionaryStorage[sizeof(TDDictionary)];

void DestroyTDDictionary(void* object) { static_cast<TDDictionary*>(object)->~TDDictionary(); }

// --- the recursive-types table -----------------------------------------------------------------------

struct RecursiveTypesTable {
  using Map = std::map<const TDImp*, TDImpPtr, std::less<const TDImp*>,
                       PXAllocator<std::pair<const TDImp* const, TDImpPtr>>>;
  Map entries;
  ThMutex mutex = nullptr;
};

RecursiveTypesTable* gRecursiveTypes = nullptr;

// --- the flattened-type cache's part in collection and stop ----------------------------------------

FlatTypeCacheCollectFn gFlatCacheCollect = nullptr;
FlatTypeCacheEmptyFn gFlatCacheEmpty = nullptr;

// --- collection --------------------------------------------------------------------------------------

std::atomic<uint32_t> gCollectionCount{0};
std::atomic<GarbageCollectingListener> gListener{nullptr};
std::atomic<int32_t> gLogging{-1};  // -1 until the first collection reads the configuration

using Clock = std::chrono::steady_clock;

double Milliseconds(Clock::duration d) {
  return std::chrono::duration<double, std::milli>(d).count();
}

std::string Number(double value) {
  std::ostringstream out;
  out << std::setprecision(3) << value;
  return out.str();
}

std::string Percent(double part, double whole) { return Number(whole == 0 ? 0.0 : part * 100.0 / whole); }

std::string LocalTimestamp() {
  const auto now = std::chrono::system_clock::now();
  const std::time_t seconds = std::chrono::system_clock::to_time_t(now);
  const auto millis =
      std::chrono::duration_cast<std::chrono::milliseconds>(now.time_since_epoch()).count() % 1000;
  std::tm local{};
  localtime_r(&seconds, &local);
  std::ostringstream out;
  out << std::setfill('0') << std::setw(4) << local.tm_year + 1900 << '.' << std::setw(2) << local.tm_mon + 1
      << '.' << std::setw(2) << local.tm_mday << ' ' << std::setw(2) << local.tm_hour << ':' << std::setw(2)
      << local.tm_min << ':' << std::setw(2) << local.tm_sec << '.' << std::setw(3) << millis;
  return out.str();
}

bool LoggingEnabled() {
  int32_t state = gLogging.load(std::memory_order_acquire);
  if (state < 0) {
    static const uint8_t kKey[] = "\x20vellum.garbageCollection.logging";
    bool enabled = false;
    CfgGetDefault(kKey, &enabled);
    state = enabled ? 1 : 0;
    gLogging.store(state, std::memory_order_release);
  }
  return state == 1;
}

TDTraverseValue VisitAll(TDImp*, void*, TDImpPtr*) { return kTraverseContinue; }
bool AlwaysRecurse(TDImp*, void*) { return true; }

// Marks the recursive types still reachable from live containers and drops the rest.
void SweepRecursiveTypes() {
  RecursiveTypesTable* table = gRecursiveTypes;
  ThMutexLock tableLock(table->mutex);
  for (auto& entry : table->entries) entry.second->ClearFlagBits(kTDFlagRecursiveMark);
  GTDDictionary().ForEachLocked([](TDImpPtr& type) {
    if (type->IsContainer() == 0) return;
    // A typedef'd container held only by the dictionary and its definition is not a live use.
    if (type->GetTypedefImpPtr() && type->GetRefCount() < 3) return;
    TDImpPtr replacement;
    type->TraverseTD(&VisitAll, nullptr, &AlwaysRecurse, &replacement);
  });
  for (auto it = table->entries.begin(); it != table->entries.end();) {
    if ((it->second->Flags() & kTDFlagRecursiveMark) == 0) {
      it = table->entries.erase(it);
    } else {
      it->second->ClearFlagBits(kTDFlagRecursiveMark);
      it->second->ClearHashValid();
      ++it;
    }
  }
}

}  // namespace

TDDictionary& GTDDictionary() {
  static TDDictionary* const dictionary = [] {
    auto* created = ::new (static_cast<void*>(gTDDictionaryStorage)) TDDictionary("TD");
    RegisterPlacementDelete(&DestroyTDDictionary, created);
    return created;
  }();
  return *dictionary;
}

NameDictionary& TheNameDictionary() {
  static NameDictionary dictionary("Name");
  return dictionary;
}

TypedefDictionary& TheTypedefDictionary() {
  static TypedefDictionary dictionary("Typedef");
  return dictionary;
}

EnumDictionary& TheEnumDictionary() {
  static EnumDictionary dictionary("Enum");
  return dictionary;
}

UnitsDictionary& TheUnitsDictionary() {
  static UnitsDictionary dictionary("Unit");
  return dictionary;
}

EventRegOMIdInfoDictionary& TheEventRegOMIdInfoDictionary() {
  static EventRegOMIdInfoDictionary dictionary("EventRegOMId");
  return dictionary;
}

IVISubTypeDictionary& TheIVISubTypeDictionary() {
  static IVISubTypeDictionary dictionary("IVISubType");
  return dictionary;
}

OMIdDictionary& TheOMIdDictionary() {
  static OMIdDictionary dictionary("OMId");
  return dictionary;
}

void RegisterDictionary(ITDDictionary* dictionary) {
  const int32_t count = gNumDictionaries.load(std::memory_order_acquire);
  // A start without a stop registers the same dictionaries again; each is collected once.
  for (int32_t i = 0; i < count; ++i) {
    if (gDictionaries[i] == dictionary) return;
  }
  if (count >= kMaxDictionaries) {
    DebugReport(kDiagnosticModule, __LINE__, 4, "Too many dictionaries registered");
    return;
  }
  gDictionaries[count] = dictionary;
  gNumDictionaries.store(count + 1, std::memory_order_release);
}

ITDDictionary* const* GetTDDictionaries() { return gDictionaries; }

int32_t GetNumDictionaries() { return gNumDictionaries.load(std::memory_order_acquire); }

void EmptyRegisteredDictionaries() {
  const int32_t count = GetNumDictionaries();
  for (int32_t i = 0; i < count; ++i) gDictionaries[i]->Empty();
  for (int32_t i = 0; i < count; ++i) gDictionaries[i] = nullptr;
  gNumDictionaries.store(0, std::memory_order_release);
}

int32_t CreateRecursiveTypesTable() {
  if (gRecursiveTypes != nullptr) return kStatusNoError;
  auto table = MakeUniqueInRuntime<RecursiveTypesTable>();
  if (!table) return kStatusOutOfMemory;
  if (ThMutexCreate(&table->mutex, "RecursiveTypesTableMutex") != kStatusNoError) return kStatusOutOfMemory;
  gRecursiveTypes = table.release();
  return kStatusNoError;
}

void DestroyRecursiveTypesTable() {
  RuntimeUniquePtr<RecursiveTypesTable> table(gRecursiveTypes);
  gRecursiveTypes = nullptr;
  if (!table) return;
  table->entries.clear();
  ThMutexDestroy(&table->mutex);
}

bool HasRecursiveTypesTable() { return gRecursiveTypes != nullptr; }

int32_t InsertRecursiveTypeIntoTable(const TDR& type) {
  if (gRecursiveTypes == nullptr) return kStatusNullHandle;
  if (!type) return kStatusBadArgument;
  ThMutexLock lock(gRecursiveTypes->mutex);
  try {
    gRecursiveTypes->entries.emplace(type.GetImp(), type.GetImpPtr());
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t RecursiveTypesTableSize() {
  if (gRecursiveTypes == nullptr) return 0;
  ThMutexLock lock(gRecursiveTypes->mutex);
  return static_cast<int32_t>(gRecursiveTypes->entries.size());
}

void ResetCollectionLoggingSetting() { gLogging.store(-1, std::memory_order_release); }

void SetFlatTypeCacheHooks(FlatTypeCacheCollectFn collect, FlatTypeCacheEmptyFn empty) {
  gFlatCacheCollect = collect;
  gFlatCacheEmpty = empty;
}

void EmptyingTypeDictionaries() {
  if (gFlatCacheEmpty != nullptr) gFlatCacheEmpty();
}

void SetGarbageCollectingListener(GarbageCollectingListener listener) {
  gListener.store(listener, std::memory_order_release);
}

void GarbageCollectDictionaries() {
  const uint32_t number = gCollectionCount.fetch_add(1, std::memory_order_acq_rel) + 1;

  const Clock::time_point flatStart = Clock::now();
  uint32_t flatRemoved = 0;
  uint32_t flatVisited = 0;
  if (gFlatCacheCollect != nullptr) gFlatCacheCollect(&flatRemoved, &flatVisited);
  const double flatMs = Milliseconds(Clock::now() - flatStart);

  const Clock::time_point dictStart = Clock::now();
  if (GarbageCollectingListener listener = gListener.load(std::memory_order_acquire)) listener(true);
  std::vector<std::pair<uint64_t, uint64_t>> passes;  // (removed, total)
  for (;;) {
    for (;;) {
      uint64_t removed = 0;
      uint64_t total = 0;
      const int32_t count = GetNumDictionaries();
      for (int32_t i = 0; i < count; ++i) {
        const uint32_t before = gDictionaries[i]->Size();
        gDictionaries[i]->Purge();
        const uint32_t after = gDictionaries[i]->Size();
        removed += before - after;
        total += before;
      }
      passes.emplace_back(removed, total);
      if (removed == 0) break;
    }
    if (gRecursiveTypes == nullptr || RecursiveTypesTableSize() == 0) break;
    const int32_t noted = RecursiveTypesTableSize();
    SweepRecursiveTypes();
    if (RecursiveTypesTableSize() == noted) break;
  }
  const double dictMs = Milliseconds(Clock::now() - dictStart);

  if (LoggingEnabled()) {
    const uint64_t firstTotal = passes.front().second;
    const uint64_t lastTotal = passes.back().second;
    // Other threads may check in while this runs, so the dictionaries can end up larger.
    const int64_t freed = static_cast<int64_t>(firstTotal) - static_cast<int64_t>(lastTotal);
    std::ostringstream line;
    line << "TypeGC[" << number << "] " << LocalTimestamp() << " {Flat:" << Number(flatMs) << "ms, "
         << Percent(flatRemoved, flatVisited) << "%(" << flatRemoved << "/" << flatVisited << ")}"
         << " {Dicts:" << Number(dictMs) << "ms, " << firstTotal << "[";
    for (size_t i = 0; i < passes.size(); ++i) line << (i == 0 ? "" : ",") << passes[i].first;
    line << "]" << lastTotal << ", " << Percent(static_cast<double>(freed), static_cast<double>(firstTotal)) << "%("
         << freed << "/" << firstTotal << ")}";
    DebugReport(kDiagnosticModule, __LINE__, 1, line.str());
  }
  if (GarbageCollectingListener listener = gListener.load(std::memory_order_acquire)) listener(false);
}
