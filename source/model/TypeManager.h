// Type factories by code, the type manager service with its start and stop sequences, the
// registry of shared global descriptors released at stop, and the host's procedure hooks.
#pragma once

#include <atomic>
#include <cstdint>

#include "source/model/TD.h"
#include "vellum/TypeManagerHooks.h"

// The factory of a kind whose descriptors start empty and are filled by their ConstructTD.
template <class Imp>
class EmptyTypeFactory final : public TDTypeFactory {
 public:
  TDImpPtr CreateTD(TDDataReader*, uint16_t, int32_t* status) const override {
    TDImpPtr type = MakeCounted<Imp>();
    if (status != nullptr) *status = type ? kStatusNoError : kStatusOutOfMemory;
    return type;
  }
};

// Each family announces, as it loads, the factories the service registers at start; `order`
// is the factory's place in the registration sequence.
void AnnounceTypeFactory(int32_t order, uint16_t typeCode, TDTypeFactory* factory);

// Each family announces the getter of its shared default descriptor per code.
using DefaultTypeGetter = const TDR& (*)();
void RegisterDefaultTypeGetter(int32_t code, DefaultTypeGetter getter);
bool HasDefaultTypeGetter(int32_t code);

// A static slot for one shared descriptor, released when the service stops.
struct GlobalTypeEntry {
  TDR td;
  std::atomic<bool> set{false};
  GlobalTypeEntry* next = nullptr;
};

// Under "RegisterMutex": the first registration of an entry wins; later ones change nothing.
void TDRegisterType(GlobalTypeEntry* entry, const TDR& td);
int32_t GetNumRegisteredTypes();

// The shared descriptor held by `entry`, built on first use by checking in `make()`. Builders
// on several threads all obtain the same interned object. The null `TDR` when memory runs out.
const TDR& SharedGlobalType(GlobalTypeEntry& entry, TDImpPtr (*make)());

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
