// The plain pointer kinds: their objects, layout, the pointer copies of Ptr and PtrTo, factories
// and handles. CStr and PStr data belongs to the caller: the generic copy refuses it.
#include "source/families/TDOther.h"

#include <cstring>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"
#include "source/families/TDStringBase.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"

VELLUM_DIAGNOSTIC_MODULE("TDOther");

namespace {

constexpr int32_t kPointerSize = 8;

int32_t PointerSize(ITargetPlatformAlignment* platform) {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

void PrintKind(const TDImp& type, const char* kind, const uint8_t* prefix) {
  DebugReport(kDiagnosticModule, __LINE__, 0, PrefixText(prefix) + "type = " + kind);
  type.TDImp::PrintDebugStr(prefix);
}

int32_t CopyPointer(const void* src, void* dst) {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, sizeof(void*));
  return kStatusNoError;
}

// A pointer converts only into its own kind.
int32_t ConvertPointer(const TDImp& self, const TDImp* dst, const void* src, void* dstData) {
  if (dst == nullptr || dst->GetTypeCode() != self.GetTypeCode()) {
    ReportConvertCodes(dst, self);
    return kStatusBadArgument;
  }
  return CopyPointer(src, dstData);
}


EmptyTypeFactory<TDPtrToImp> gPtrToFactory;
EmptyTypeFactory<TDPtrImp> gPtrFactory;
EmptyTypeFactory<TDPStrImp> gPStrFactory;
EmptyTypeFactory<TDCStrImp> gCStrFactory;

// Announced as the library loads; the service registers them in this order at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(41, static_cast<uint16_t>(TypeCode::PtrTo), &gPtrToFactory);
  AnnounceTypeFactory(42, static_cast<uint16_t>(TypeCode::Ptr), &gPtrFactory);
  AnnounceTypeFactory(43, static_cast<uint16_t>(TypeCode::PStr), &gPStrFactory);
  AnnounceTypeFactory(44, static_cast<uint16_t>(TypeCode::CStr), &gCStrFactory);
  return true;
}();


}  // namespace

TDImpPtr TDCStrImp::NewInstance() const { return MakeCounted<TDCStrImp>(); }
int32_t TDCStrImp::DataSizeCore(ITargetPlatformAlignment* platform) const { return PointerSize(platform); }
void TDCStrImp::PrintDebugStr(const uint8_t* prefix) const { PrintKind(*this, "cstr", prefix); }

TDImpPtr TDPStrImp::NewInstance() const { return MakeCounted<TDPStrImp>(); }
int32_t TDPStrImp::DataSizeCore(ITargetPlatformAlignment* platform) const { return PointerSize(platform); }
void TDPStrImp::PrintDebugStr(const uint8_t* prefix) const { PrintKind(*this, "pstr", prefix); }

TDImpPtr TDPtrImp::NewInstance() const { return MakeCounted<TDPtrImp>(); }
int32_t TDPtrImp::DataSizeCore(ITargetPlatformAlignment* platform) const { return PointerSize(platform); }
int32_t TDPtrImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  return CopyPointer(src, dst);
}
int32_t TDPtrImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertPointer(*this, dst, src, dstData);
}
void TDPtrImp::PrintDebugStr(const uint8_t* prefix) const { PrintKind(*this, "ptr", prefix); }

TDImpPtr TDPtrToImp::NewInstance() const { return MakeCounted<TDPtrToImp>(); }
int32_t TDPtrToImp::DataSizeCore(ITargetPlatformAlignment* platform) const { return PointerSize(platform); }
int32_t TDPtrToImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  return CopyPointer(src, dst);
}
int32_t TDPtrToImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertPointer(*this, dst, src, dstData);
}

bool CStrKind::Admit(const TDImp& type) { return type.IsCStr() != 0; }
TDImpPtr CStrKind::New(const uint8_t* name) { return MakeNamedTD<TDCStrImp>(name); }
bool PStrKind::Admit(const TDImp& type) { return type.IsPStr() != 0; }
TDImpPtr PStrKind::New(const uint8_t* name) { return MakeNamedTD<TDPStrImp>(name); }
bool PtrKind::Admit(const TDImp& type) { return type.IsPtr() != 0; }
TDImpPtr PtrKind::New(const uint8_t* name) { return MakeNamedTD<TDPtrImp>(name); }
bool PtrToKind::Admit(const TDImp& type) { return type.IsPtrTo() != 0; }
TDImpPtr PtrToKind::New(const uint8_t* name) { return MakeNamedTD<TDPtrToImp>(name); }
