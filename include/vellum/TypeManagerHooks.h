// Starting and stopping the library, garbage collection, and the procedures a host installs
// once at start-up. Each setter stores one value process-wide; null removes a procedure. Setters
// are plain stores, meant to be called before concurrent use.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include "runtime/PXServices.h"
#include "runtime/PXTypes.h"
#include "vellum/TDHandles.h"

class KoDataReader;
class TDDataReader;
class GDataDispatchTable;

// The single type manager service ("TypeManager"). The host starts it on one thread, after the
// memory, path and atomic-operations services, and stops it with no other use in progress.
IServiceObject* TypeManagerService();

// Makes empty descriptors of one kind while saved types are read. Stateless; one object per
// kind in static storage, never freed.
class TDTypeFactory {
 public:
  virtual ~TDTypeFactory();
  // A new, writable, empty descriptor of the kind about to be filled by its ConstructTD; null
  // with *status set when it cannot be made.
  virtual TDImpPtr CreateTD(TDDataReader* reader, uint16_t typeCode, int32_t* status) const = 0;
  // A descriptor that can stand for data of this code when only the code is known.
  virtual TDImpPtr CreateUnflattenHandler(int16_t typeCode) const;
};

// Stores a factory for a code (0 to 255; others are refused with a message). Replacing one
// reports the re-registration and goes on.
void RegisterTypeFactory(uint16_t typeCode, TDTypeFactory* factory);
// The factory of a code, or null (also for codes outside 0..255).
TDTypeFactory* GetTypeFactory(int32_t typeCode);
// The code's factory's stand-in descriptor, or null when no factory is registered.
TDImpPtr CreateUnflattenHandler(int16_t typeCode);

// One collection of every registered dictionary; logs its timing at level 1 when the
// configuration key "vellum.garbageCollection.logging" is set.
void GarbageCollectDictionaries();
using GarbageCollectingListener = void (*)(bool collecting);
// Called with true when a collection's dictionary phase begins and false when it ends.
void SetGarbageCollectingListener(GarbageCollectingListener listener);

// Whether a code has a registered factory (the service is running) and a shared default.
bool HasTypeFactory(int32_t code);
bool HasDefaultType(int32_t code);

using TDSanityCheckProc = int32_t (*)(const TD&);
using TDRaveProc = void (*)(void*, void*, int32_t&, int32_t);
using CompleteDataSizeProc = void (*)(const void*, int32_t, const TDR&, uint64_t*, uint64_t*);
using EventToEventTypeEnumProc = void (*)(uint32_t, uint32_t*);
using FindRefObjTDRProc = int32_t (*)(LStr*, void*, const TDR&);
using GDataDispatchTableFactoryProc = GDataDispatchTable* (*)(const TDR&);
using StatusMapProc = int32_t (*)(int32_t);
using OleVariantUnFlattenDataProc = int32_t (*)(KoDataReader*, void*);
using TypeToShortStringProc = std::string (*)(const TDR&, bool, bool*);
using DestroyTDListener = void (*)(const TD&);
using GetSpecialClusterRulesProc = int32_t (*)(const TD&);

void SetTDSanityCheckProc(TDSanityCheckProc proc);
void SetTDRaveProc(TDRaveProc proc);
TDRaveProc GetTDRaveProc();
namespace vellum::detail {
extern std::atomic<int32_t> gDSAlign;
}  // namespace vellum::detail
// The running process's largest alignment for data layout; 0 (packed) until set. The getter is
// inline: every layout question and every cluster copy asks it.
void SetDSAlign(int32_t alignment);
inline int32_t GetDSAlign() { return vellum::detail::gDSAlign.load(std::memory_order_relaxed); }
void SetCompleteDataSizeProc(CompleteDataSizeProc proc);
void SetEventToEventTypeEnumProc(EventToEventTypeEnumProc proc);
void SetFindRefObjTDRProc(FindRefObjTDRProc proc);
void SetGDataDispatchTableFactoryProc(GDataDispatchTableFactoryProc proc);
void SetHResultToMgErrProc(StatusMapProc proc);
void SetMgErrToHResultProc(StatusMapProc proc);
void SetOleVariantUnFlattenDataProc(OleVariantUnFlattenDataProc proc);
void SetTypeToShortStringProc(TypeToShortStringProc proc);
void TDCoerceFromKoVariant(bool enable);
void TDEnableFlatTypeCache(bool enable);
void TDEnablePreAllocation(bool enable);
void TDEnableRecursiveTypes(bool enable);
void SetDestroyTDListener(DestroyTDListener listener);
void SetGetSpecialClusterRulesProc(GetSpecialClusterRulesProc proc);
void SetGarbageCollectingTDs(bool enable);

// What the library consults of the host's hooks.
TDSanityCheckProc GetTDSanityCheckProc();
CompleteDataSizeProc GetCompleteDataSizeProc();
EventToEventTypeEnumProc GetEventToEventTypeEnumProc();
FindRefObjTDRProc GetFindRefObjTDRProc();
GDataDispatchTableFactoryProc GetGDataDispatchTableFactoryProc();
StatusMapProc GetHResultToMgErrProc();
StatusMapProc GetMgErrToHResultProc();
OleVariantUnFlattenDataProc GetOleVariantUnFlattenDataProc();
TypeToShortStringProc GetTypeToShortStringProc();
bool IsCoerceFromKoVariantEnabled();
bool IsFlatTypeCacheEnabled();
bool IsPreAllocationEnabled();
bool AreRecursiveTypesEnabled();

// A slot in static storage for one shared descriptor. The registry links it; the service's stop
// releases its descriptor and unlinks it, so that it can be registered again after a restart.
struct GlobalTypeEntry {
  TDR td;
  std::atomic<bool> set{false};
  GlobalTypeEntry* next = nullptr;
};

// Under "RegisterMutex", from any thread: the first registration of an entry wins; later ones,
// and a null entry, change nothing.
void TDRegisterType(GlobalTypeEntry* entry, const TDR& td);
// The number of entries linked since the service started.
int32_t GetNumRegisteredTypes();
