// The kinds without members of their own: Void, and the 8-bit and 16-bit Booleans.
#pragma once

#include "source/model/TD.h"
#include "vellum/TDSimpleHandles.h"

class TDVoidImp final : public TDImp {
 public:
  TDVoidImp() noexcept = default;
  TDVoidImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Void); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment*) const override { return 0; }
  int32_t GetAlignment(ITargetPlatformAlignment*) const override { return 0; }
  int32_t CopyData(const void*, void*, int32_t, const KoContext*) const override { return 0; }
  void Accept(ITDVisitor* visitor) override;
  int32_t IsVoid() const override { return 1; }
  // Nothing tells two void data apart.
  DataOrder OrderData(const void*, const void*, const DataOrderOptions&) const override { return {}; }
};

// One byte per value.
class TDBooleanImp final : public TDImp {
 public:
  TDBooleanImp() noexcept = default;
  TDBooleanImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Boolean); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment*) const override { return 1; }
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t MutateBooleanTD(TDImpPtr* self, int32_t toOld) override;
  void Accept(ITDVisitor* visitor) override;
  int32_t IsBool() const override { return 1; }
  // One byte as it is in memory; before 0x04502004 a 16-bit word, 0x8000 for true.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  // True sorts after false.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
};

// The 16-bit Boolean of old data: two bytes per value.
class TDBooleanU16Imp final : public TDImp {
 public:
  TDBooleanU16Imp() noexcept = default;
  TDBooleanU16Imp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::BooleanU16); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment*) const override { return 2; }
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t MutateBooleanTD(TDImpPtr* self, int32_t toOld) override;
  void Accept(ITDVisitor* visitor) override;
  int32_t IsBoolU16() const override { return 1; }
  // Has no flattened form: the bytes are copied as they are, after a diagnostic.
  // True (any bit set) sorts after false.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
};
