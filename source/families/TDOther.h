// The plain pointer kinds: CStr and PStr (strings owned by the caller, never copied here), Ptr (a
// raw pointer) and PtrTo (a pointer described by the type of what it points to).
#pragma once

#include <cstdint>

#include "source/families/TDContainer.h"
#include "source/model/TD.h"
#include "vellum/TDOtherHandles.h"

// A zero-terminated string the caller owns: one pointer, string-like, without a copy of its own.
class TDCStrImp final : public TDImp {
 public:
  TDCStrImp() noexcept = default;
  TDCStrImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::CStr); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  DataShapes DataShapeOf(int32_t) const override { return kDataShapeStringLike; }
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsCStr() const override { return 1; }
};

// A length-byte string the caller owns: as CStr.
class TDPStrImp final : public TDImp {
 public:
  TDPStrImp() noexcept = default;
  TDPStrImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::PStr); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  DataShapes DataShapeOf(int32_t) const override { return kDataShapeStringLike; }
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsPStr() const override { return 1; }
};

// A raw pointer. Its value is copied as it is; what it points to is nobody's business here.
class TDPtrImp final : public TDImp {
 public:
  TDPtrImp() noexcept = default;
  TDPtrImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Ptr); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into another Ptr only.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsPtr() const override { return 1; }
  // The pointers' bytes.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions&) const override { return OrderBytes(a, b); }
};

// A pointer whose element describes what it points to. Its value is copied as it is.
class TDPtrToImp final : public TDSingleContainerImp {
 public:
  TDPtrToImp() noexcept = default;
  TDPtrToImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSingleContainerImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::PtrTo); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into another PtrTo only.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t IsPtrTo() const override { return 1; }
};
