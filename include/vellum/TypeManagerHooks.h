// Starting and stopping the library, garbage collection, and the procedures a host installs
// once at start-up. Each setter stores one value process-wide; null removes a procedure. Setters
// are plain stores, meant to be called before concurrent use.
#pragma once

#include <cstdint>
#include <string>

#include "runtime/PXServices.h"
#include "runtime/PXTypes.h"
#include "vellum/TDHandles.h"

class KoDataReader;
class GDataDispatchTable;

// The single type manager service ("TypeManager"). The host starts it on one thread, after the
// memory, path and atomic-operations services, and stops it with no other use in progress.
IServiceObject* TypeManagerService();

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
// The running process's largest alignment for data layout; 0 (packed) until set.
void SetDSAlign(int32_t alignment);
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
