// The alignment marker: a zero-size cluster element whose element, the alignment source, makes
// the cluster align as that type does; how a derived class's data cluster keeps its parent's.
#pragma once

#include <cstdint>

#include "source/families/TDContainer.h"
#include "vellum/TDBlockHandles.h"


class TDAlignmentMarkerImp final : public TDSingleContainerImp {
 public:
  // Markers did not exist before 0x08602000: saving one for such a version is refused (42).
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  TDAlignmentMarkerImp() noexcept = default;
  TDAlignmentMarkerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSingleContainerImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::AlignmentMarker); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment*) const override { return 0; }
  // 1 without a source; the source's alignment for the running process or for the platform
  // kAlignmentSourcePlatformId; 1 for every other platform.
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  // No bytes to copy.
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into another alignment marker only; no bytes move.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsAlignmentMarker() const override { return 1; }
};
