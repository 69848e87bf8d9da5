// Alignment markers: their layout, their factory and handles, and the inheritance of a parent
// cluster's alignment by a derived data cluster.
#include "source/families/TDAlignmentMarker.h"

#include <cstring>
#include <string>

#include "runtime/DebugStream.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDAlignmentMarker");

namespace {


EmptyTypeFactory<TDAlignmentMarkerImp> gAlignmentMarkerFactory;

// Announced as the library loads; the service registers it first at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(1, static_cast<uint16_t>(TypeCode::AlignmentMarker), &gAlignmentMarkerFactory);
  return true;
}();

TDAlignmentMarkerImp* WritableMarker(const TD& handle) {
  TDImp* imp = handle.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || imp->IsAlignmentMarker() == 0) return nullptr;
  return static_cast<TDAlignmentMarkerImp*>(imp);
}

const TDImpPtr& SourceOf(const TD& handle) {
  const TDImp* imp = handle.GetImp();
  if (imp == nullptr || imp->IsAlignmentMarker() == 0) return GNullImpPtr();
  return static_cast<const TDAlignmentMarkerImp*>(imp)->GetElt();
}

}  // namespace

TDImpPtr TDAlignmentMarkerImp::NewInstance() const { return MakeCounted<TDAlignmentMarkerImp>(); }

int32_t TDAlignmentMarkerImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  if (!GetElt()) return 1;
  if (platform == nullptr || platform->PlatformIdentifier() == kAlignmentSourcePlatformId) {
    return GetElt()->GetAlignment(platform);
  }
  return 1;
}

int32_t TDAlignmentMarkerImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  return src == nullptr || dst == nullptr ? kStatusBadArgument : kStatusNoError;
}

int32_t TDAlignmentMarkerImp::CopyDataConvertCore(const TDImp* dst, const void*, void*, int32_t) const {
  if (dst != nullptr && dst->IsAlignmentMarker() != 0) return kStatusNoError;
  ReportConversionCodes(kDiagnosticModule, __LINE__, dst, *this);
  return kStatusBadArgument;
}

void TDAlignmentMarkerImp::PrintDebugStr(const uint8_t* prefix) const {
  const std::string text = prefix != nullptr ? std::string(reinterpret_cast<const char*>(prefix)) : std::string();
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "type = alignment marker");
  TDSingleContainerImp::PrintDebugStr(prefix);
}

bool AlignmentMarkerKind::Admit(const TDImp& type) { return type.IsAlignmentMarker() != 0; }

TDImpPtr AlignmentMarkerKind::New(const uint8_t* name) {
  TDNameImpPtr label;
  if (name != nullptr && name[0] != 0) {
    label = TDNameImp::Make(name, std::strlen(reinterpret_cast<const char*>(name)));
    if (!label) return TDImpPtr();
  }
  return MakeCounted<TDAlignmentMarkerImp>(label, TDTypedefImpPtr());
}

TDR TDRAlignmentMarker::GetAlignmentSource() const { return TDR(SourceOf(*this), 1); }

TDW TDWAlignmentMarker::GetAlignmentSource() const { return TDW(SourceOf(*this), 1); }

int32_t TDWAlignmentMarker::SetAlignmentSource(const TD& source) {
  if (WritableMarker(*this) == nullptr) return kStatusNullHandle;
  return SetEltTD(source);
}

int32_t TDWAlignmentMarker::RemoveAlignmentSource() {
  TDAlignmentMarkerImp* marker = WritableMarker(*this);
  if (marker == nullptr) return kStatusNullHandle;
  marker->SetElt(TDImpPtr());
  return kStatusNoError;
}

TDWCluster InheritTDWFromParentTDR(const TDRCluster& parent) {
  if (!parent) return TDWCluster(TDImpPtr(), 0);
  TDWCluster derived = parent.CheckOut();
  TDWCluster source = parent.CheckOut();
  TDWAlignmentMarker marker;
  if (!derived || !source || !marker) return TDWCluster(TDImpPtr(), 0);
  if (marker.SetAlignmentSource(source) != kStatusNoError) return TDWCluster(TDImpPtr(), 0);
  if (derived.AppendEltTD(marker) != kStatusNoError) return TDWCluster(TDImpPtr(), 0);
  return derived;
}

int32_t TDAlignmentMarkerImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  if (writer->GetVersion() < kAlignmentMarkerVersion) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Invalid type write");
    writer->SetError(kStatusNullHandle);
    return kStatusNullHandle;
  }
  return TDSingleContainerImp::FlattenTDPartsForSaving(writer);
}
