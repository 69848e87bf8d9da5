// The life cycle of typed data at the handle level: null-safe forwarding of the layout and data
// slots, the copy-with-conversion dispatch and the report of damaged data.
#include "source/model/TDDataManager.h"

#include <atomic>
#include <cstdio>

#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "source/model/TypeManager.h"

int32_t TD::DataSize(ITargetPlatformAlignment* platform) const {
  return imp_ ? imp_->DataSizeCore(platform) : 0;
}

int32_t TD::GetAlignment(ITargetPlatformAlignment* platform) const {
  return imp_ ? imp_->GetAlignment(platform) : 0;
}

int64_t TD::AlignDatum(int64_t offset, ITargetPlatformAlignment* platform) const {
  return imp_ ? imp_->AlignDatumCore(offset, platform) : offset;
}

DataShapes TD::DataShape() const { return imp_ ? imp_->DataShapeOf(1) : kDataShapePlain; }

DataShapes TD::FlatDataShape() const { return imp_ ? imp_->DataShapeOf(0) : kDataShapePlain; }

int32_t TD::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (!imp_ || data == nullptr) return kStatusBadArgument;
  return imp_->InflateDefData(data, onlyIfEmpty, clearFirst, flags);
}

int32_t TD::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  if (!imp_) return kStatusNullHandle;
  return imp_->ResetToDefaultData(data);
}

int32_t TD::DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const {
  return imp_ ? imp_->DeflateData(data, end, dispose, allocator) : 0;
}

int32_t TD::ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const {
  return imp_ ? imp_->ShrinkData(data, end, flag, allocator) : 0;
}

int32_t TD::VerifyData(const void* data, const KoContext* context) const {
  return imp_ ? imp_->VerifyData(data, context) : kVerifyDataNoType;
}

int32_t TD::CopyData(const void* src, void* dst, const KoContext* context, int32_t flags) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  if (!imp_) return kStatusNullHandle;
  return imp_->CopyData(src, dst, flags, context);
}

bool TD::ConversionIsLossless(const TD& other) const {
  return imp_ && other.imp_ && imp_->ConversionIsLossless(other.imp_.get());
}

int32_t TDR::CopyDataConvert(const TD& dst, const void* src, void* dstData, int32_t flags) const {
  return CopyDataConvertImp(imp_.get(), dst.GetImp(), src, dstData, flags);
}

int32_t TDW::CopyDataConvert(const TD& dst, const void* src, void* dstData, int32_t flags) const {
  return CopyDataConvertImp(imp_.get(), dst.GetImp(), src, dstData, flags);
}

void TDImpClearMemory(void* data, const TD& type, int32_t clear) { TDImpClearMemory(data, type.GetImp(), clear); }

int32_t CopyDataConvertImp(const TDImp* srcType, const TDImp* dstType, const void* src, void* dstData,
                           int32_t flags) {
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  if (srcType == nullptr || dstType == nullptr) return kStatusNullHandle;
  // A destination that accepts everything (the variant) takes charge; otherwise the source's
  // family converts into the destinations it knows.
  int32_t status = kStatusNoError;
  if (dstType->CopyDataConvertDestOverride(srcType, src, dstData, flags, status)) return status;
  return srcType->CopyDataConvertCore(dstType, src, dstData, flags);
}

int32_t RaveStatusForDamage(int32_t code) {
  TDRaveProc rave = GetTDRaveProc();
  if (rave == nullptr) return kStatusBadArgument;
  int32_t status = kStatusNoError;
  rave(nullptr, nullptr, status, code);
  return status;
}

void WriteVerifyDataMessage(int32_t status, const TDImp& type, const void* data, std::optional<int64_t> eltOffset) {
  char code[8];
  std::snprintf(code, sizeof code, "0x%04x", static_cast<unsigned>(static_cast<uint16_t>(type.GetTypeCode())));
  DebugStream stream(__FILE__, __LINE__, 3);
  stream << "##VerifyData err ";
  stream.AppendHex32(static_cast<uint32_t>(status));
  stream << " at type=" << code << ", data=";
  stream.Append(data);
  if (eltOffset) stream << ", eltOffset=" << *eltOffset;
  stream.Process();
}

int32_t ReportDamagedData(const TDImp& type, const void* data) {
  const int32_t status = RaveStatusForDamage();
  if (status != kStatusNoError) WriteVerifyDataMessage(status, type, data);
  return status;
}

int32_t TD::CompareClassData(int32_t how, const void* data, const TDR& other, TDR* dataType) const {
  if (!imp_) return kStatusNullHandle;
  TDImp* found = nullptr;
  const int32_t status = imp_->CompareClassData(how, data, other.GetImp(), &found);
  if (found != nullptr && dataType != nullptr) *dataType = MakeTDRFromTDImp(found);
  return status;
}

namespace {
std::atomic<const KoContext*> gProbeSourceContext{nullptr};
}  // namespace

void SetCopyDataConvertSourceContextForProbe(const KoContext* context) {
  gProbeSourceContext.store(context, std::memory_order_relaxed);
}

const KoContext* GetCopyDataConvertSourceContextForProbe() {
  return gProbeSourceContext.load(std::memory_order_relaxed);
}

int32_t TD::WriteData(KoDataWriter* writer, const void* data, int32_t count, int32_t* status) const {
  if (writer == nullptr || !imp_) {
    if (status != nullptr) *status = kStatusNullHandle;
    return 0;
  }
  return imp_->WriteData(writer, data, count, status);
}

int32_t TD::ReadData(KoDataReader* reader, void* data, int32_t count, int32_t* status) const {
  if (reader == nullptr || !imp_) {
    if (status != nullptr) *status = kStatusNullHandle;
    return 0;
  }
  return imp_->ReadData(reader, data, count, status);
}

uint32_t TD::FlatDataSize(KoDataWriter* writer, const void* data) const {
  return imp_ ? imp_->FlatDataSize(writer, data) : 0;
}
