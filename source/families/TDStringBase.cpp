// Strings, substrings, paths and pictures: identity and order by bound word, compatibility, the
// layout and life cycle of their data, the exported copy routines, conversions between the kinds,
// their factories, shared defaults and handles.
#include "source/families/TDStringBase.h"

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <functional>
#include <limits>
#include <string>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXPath.h"
#include "runtime/PXStrings.h"
#include "runtime/MoveBytes.h"
#include "source/model/TDAttributes.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TDContainerHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDOtherHandles.h"

VELLUM_DIAGNOSTIC_MODULE("TDStringBase");

namespace {

using vellum::bound::IsFixed;
using vellum::bound::IsVariable;

constexpr int32_t kPointerSize = 8;
constexpr size_t kLengthWordSize = sizeof(int32_t);

// The elements of the "SubStringRec" cluster that describes a SubString datum.
constexpr int32_t kRecordDataPtr = 0;
constexpr int32_t kRecordLength = 1;
constexpr int32_t kRecordElements = 3;

const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

// Data may sit at any offset of a packed cluster: handles and records are moved bytewise.
UHandle AsUHandle(LStrHandle h) { return reinterpret_cast<UHandle>(h); }
int32_t LengthWord(LStrHandle h) { return (*h)->cnt; }
void SetLengthWord(LStrHandle h, int32_t length) { (*h)->cnt = length; }
uint8_t* Bytes(LStrHandle h) { return reinterpret_cast<uint8_t*>(*h) + kLengthWordSize; }

int32_t Saturated(size_t bytes) {
  return static_cast<int32_t>(std::min<size_t>(bytes, std::numeric_limits<int32_t>::max()));
}

bool Below(const void* data, const void* end) { return data != nullptr && std::less<const void*>()(data, end); }

void ReportPreallocatedTooSmall() {
  DebugReport(kDiagnosticModule, __LINE__, 3,
              "Preallocated string exists whose type thinks it needs more memory than what is preallocated.");
}

// Writes `count` bytes as the whole value of a variable string, allocating or resizing *dst.
int32_t StoreVariable(const uint8_t* bytes, int32_t count, LStrHandle* dst) {
  const size_t size = kLengthWordSize + static_cast<size_t>(count);
  if (*dst == nullptr) {
    if (count == 0) return kStatusNoError;
    UHandle fresh = nullptr;
    if (DSNewHandle(size, &fresh) != kStatusNoError) return kStatusOutOfMemory;
    *dst = reinterpret_cast<LStrHandle>(fresh);
  } else if (LengthWord(*dst) != count) {
    const int32_t status = DSSetHandleSize(AsUHandle(*dst), size);
    if (status != kStatusNoError) return status;
  }
  SetLengthWord(*dst, count);
  MoveBlock(bytes, Bytes(*dst), static_cast<size_t>(count));
  return kStatusNoError;
}

// Writes `count` bytes into a preallocated fixed or bounded string; the handle is never resized,
// so `bytes` may lie inside it.
int32_t StoreBounded(const uint8_t* bytes, int32_t count, LStrHandle* dst, int32_t bound, int32_t tooSmallStatus) {
  const int32_t length = bound & 0x7FFFFFFF;
  int64_t capacity = 0;
  if (*dst != nullptr) {
    const size_t size = DSGetHandleSize(AsUHandle(*dst));
    // A handle too small for its length word (or not a handle at all) holds nothing usable.
    capacity = size >= kLengthWordSize ? static_cast<int64_t>(size - kLengthWordSize) : -1;
  }
  if (length > capacity) {
    ReportPreallocatedTooSmall();
    return tooSmallStatus;
  }
  if (*dst == nullptr) return kStatusNoError;
  if (length == 0) DebugReport(kDiagnosticModule, __LINE__, 3, "empty bound/fixed string alloc'd?");
  const int32_t copied = std::min(length, count);
  if (IsFixed(bound)) {
    if (LengthWord(*dst) != length) {
      DebugReport(kDiagnosticModule, __LINE__, 3, "fixed string len prealloc'd wrong?");
      return kStatusBadArgument;
    }
    MoveBlock(bytes, Bytes(*dst), static_cast<size_t>(copied));
    ClearMem(Bytes(*dst) + copied, static_cast<size_t>(length - copied));
  } else {
    MoveBlock(bytes, Bytes(*dst), static_cast<size_t>(copied));
    SetLengthWord(*dst, copied);
  }
  return kStatusNoError;
}

// A record whose bytes can be read: a length >= 0 and, when there are bytes, a data pointer.
bool ReadableRecord(const SubStringRec& rec) {
  return rec.length >= 0 && (rec.length == 0 || rec.dataPtr != nullptr);
}

// Whether the record's first byte lies inside the block of *dst.
bool PointsInto(const SubStringRec& rec, LStrHandle dst, size_t* offset) {
  if (dst == nullptr || rec.length == 0) return false;
  const auto start = reinterpret_cast<uintptr_t>(*dst);
  const auto first = reinterpret_cast<uintptr_t>(rec.dataPtr);
  const size_t size = DSGetHandleSize(AsUHandle(dst));
  if (first < start || first - start >= size) return false;
  *offset = first - start;
  return true;
}

void ReportConvertCodes4(const TDImp* dst, const TDImp& src) {
  char text[64];
  std::snprintf(text, sizeof text, "CopyDataConvert tcDst=0x%04x, tcSrc=0x%04x",
                static_cast<unsigned>(static_cast<uint16_t>(dst != nullptr ? dst->GetTypeCode() : 0)),
                static_cast<unsigned>(static_cast<uint16_t>(src.GetTypeCode())));
  DebugReport(kDiagnosticModule, __LINE__, 3, text);
}

// Copies the string at `src` (null: empty) into data of `dstType` (String, Pict or Tag): a
// variable destination takes it whole, a fixed or bounded one is preallocated when null and
// filled within its bound.
int32_t CopyIntoLStrData(const TDStringBaseImp& dstType, LStrHandle src, void* dstData) {
  const int32_t bound = dstType.GetBound();
  LStrHandle dst = Load<LStrHandle>(dstData);
  if (IsVariable(bound)) {
    const int32_t status = CopyLStr(src, &dst);
    Store(dstData, dst);
    return status;
  }
  if (dst == nullptr) {
    const int32_t status = dstType.InflateDefData(dstData, 0, 0, 0);
    if (status != kStatusNoError) return status;
    dst = Load<LStrHandle>(dstData);
  }
  return CopyBndFixString(src, &dst, bound);
}

// The string rule of CmpTD, for a String or SubString destination.
int32_t StringKindCmpTD(const TDStringBaseImp& self, const TDImp* source, int32_t flags) {
  int32_t result = 0;
  if (source->IsString() != 0) {
    if (source->GetTypeCode() != self.GetTypeCode() && (flags & kCmpFlagNoStringSizeBits) == 0) {
      result |= kCmpStringSizesDiffer;
    }
  } else if (source->IsTag() != 0) {
    result |= self.IsSubStringOnly() != 0 ? kCmpSubStringMeetsTag : kCmpStringMeetsTag;
  } else if (source->IsRefnumTag() != 0) {
    return (flags & kCmpFlagReportLoss) != 0 ? (kCmpMayLoseInformation | kCmpNeedsConversion) : kCmpNeedsConversion;
  } else if (source->IsNotifierRef() != 0 || source->IsQueueRef() != 0) {
    return (flags & kCmpFlagLooseNumbers) != 0 ? 0 : kCmpIncompatible;
  } else {
    return kCmpIncompatible;
  }
  return result | StringBoundCmpBits(self.GetBound(), BoundOfStringBase(source), flags);
}


EmptyTypeFactory<TDStringImp> gStringFactory;
EmptyTypeFactory<TDPictImp> gPictFactory;
EmptyTypeFactory<TDPathImp> gPathFactory;
EmptyTypeFactory<TDSubStringImp> gSubStringFactory;

// Announced as the library loads; the service registers them in this order at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(47, static_cast<uint16_t>(TypeCode::String), &gStringFactory);
  AnnounceTypeFactory(48, static_cast<uint16_t>(TypeCode::Pict), &gPictFactory);
  AnnounceTypeFactory(49, static_cast<uint16_t>(TypeCode::Path), &gPathFactory);
  AnnounceTypeFactory(50, static_cast<uint16_t>(TypeCode::SubString), &gSubStringFactory);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::String), &GetStringTD);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::Pict), &GetPictTD);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::Path), &GetPathTD);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::SubString), &GetSubStringTD);
  return true;
}();

template <class Imp>
TDImpPtr NewKind(const TDNameImpPtr& name, int32_t bound) {
  return TDImpPtr(MakeCounted<Imp>(name, TDTypedefImpPtr(), bound));
}

TDImpPtr NewOfCode(TypeCode code, const TDNameImpPtr& name, int32_t bound) {
  switch (code) {
    case TypeCode::String: return NewKind<TDStringImp>(name, bound);
    case TypeCode::SubString: return NewKind<TDSubStringImp>(name, bound);
    case TypeCode::Path: return NewKind<TDPathImp>(name, bound);
    case TypeCode::Pict: return NewKind<TDPictImp>(name, bound);
    default: return TDImpPtr();
  }
}

TDImpPtr NewStringBase(TypeCode code, const uint8_t* name, int32_t bound) {
  bool failed = false;
  TDNameImpPtr label = MakeNameFromCStr(name, &failed);
  if (failed) return TDImpPtr();
  return NewOfCode(code, label, bound);
}

// The descriptor of `type` as another string-base code: same name (a private copy) and bound.
TDImpPtr ConvertStringBase(const TD& type, TypeCode code) {
  if (!type) return TDImpPtr();
  TDNameImpPtr label;
  if (const TDNameImpPtr& name = type.GetImp()->GetNameImpPtr()) {
    label = name->CloneOrCheckOut();
    if (!label) return TDImpPtr();
  }
  return NewOfCode(code, label, BoundOfStringBase(type.GetImp()));
}

TDStringBaseImp* WritableStringBase(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsStringBase() == 0 || imp->IsReadOnlyTD() != 0) return nullptr;
  return static_cast<TDStringBaseImp*>(imp);
}

}  // namespace

// --- exported copy routines ----------------------------------------------------------------------

int32_t CopyLStr(LStrHandle src, LStrHandle* dst) {
  if (dst == nullptr) return kStatusBadArgument;
  const int32_t count = src != nullptr ? LengthWord(src) : 0;
  if (count < 0) return kStatusBadArgument;
  return StoreVariable(src != nullptr ? Bytes(src) : nullptr, count, dst);
}

int32_t CopyBndFixString(LStrHandle src, LStrHandle* dst, int32_t bound) {
  if (dst == nullptr) return kStatusBadArgument;
  const int32_t count = src != nullptr ? LengthWord(src) : 0;
  if (count < 0) return kStatusBadArgument;
  return StoreBounded(src != nullptr ? Bytes(src) : nullptr, count, dst, bound, kStatusBadArgument);
}

int32_t CopySString(const SubStringRec* rec, LStrHandle* dst) {
  if (rec == nullptr || dst == nullptr) return kStatusBadArgument;
  if (!ReadableRecord(*rec) || (rec->length != 0 && rec->stride != 1)) return kStatusBadArgument;
  size_t offset = 0;
  if (PointsInto(*rec, *dst, &offset)) {
    // A piece of the destination itself: move it down over the old value, then cut the handle.
    const size_t size = DSGetHandleSize(AsUHandle(*dst));
    if (offset < kLengthWordSize || static_cast<size_t>(rec->length) > size - offset) return kStatusBadArgument;
    MoveBlock(rec->dataPtr, Bytes(*dst), static_cast<size_t>(rec->length));
    SetLengthWord(*dst, rec->length);
    return DSSetHandleSize(AsUHandle(*dst), kLengthWordSize + static_cast<size_t>(rec->length));
  }
  return StoreVariable(rec->dataPtr, rec->length, dst);
}

int32_t CopySBndFixString(const SubStringRec* rec, LStrHandle* dst, int32_t bound) {
  if (rec == nullptr || dst == nullptr) return kStatusBadArgument;
  if (!ReadableRecord(*rec)) return kStatusBadArgument;
  if (rec->length != 0 && rec->stride != 1) {
    (VELLUM_DEBUG(3) << "substring stride=" << static_cast<int64_t>(rec->stride) << "?").Process();
    return kStatusBadArgument;
  }
  size_t offset = 0;
  if (PointsInto(*rec, *dst, &offset) &&
      static_cast<size_t>(rec->length) > DSGetHandleSize(AsUHandle(*dst)) - offset) {
    return kStatusBadArgument;
  }
  return StoreBounded(rec->dataPtr, rec->length, dst, bound, kStatusOutOfMemory);
}

int32_t CopyPath(Path src, Path* dst) {
  if (dst == nullptr) return kStatusBadArgument;
  if (src == nullptr) {
    if (*dst == nullptr) return FEmptyPath(dst);
    (*dst)->type = kAbsPath;
    (*dst)->names.clear();
    return kStatusNoError;
  }
  if (src == *dst) return kStatusNoError;
  Path copy = nullptr;
  if (FPathCopy(src, &copy) != kStatusNoError) return kStatusOutOfMemory;
  FDestroyPath(dst);
  *dst = copy;
  return kStatusNoError;
}

// --- helpers of the family -----------------------------------------------------------------------

int32_t BoundOfStringBase(const TDImp* type) {
  if (type == nullptr || type->IsStringBase() == 0) return vellum::bound::kVariable;
  return static_cast<const TDStringBaseImp*>(type)->GetBound();
}

int32_t StringBoundCmpBits(int32_t dstBound, int32_t srcBound, int32_t flags) {
  if (dstBound == srcBound) return 0;
  int32_t result = 0;
  const bool sizeBits = (flags & kCmpFlagNoStringSizeBits) == 0;
  if ((IsFixed(dstBound) && IsFixed(srcBound)) || sizeBits) result |= kCmpStringSizesDiffer;
  if ((flags & kCmpFlagReportLoss) != 0 && sizeBits && IsFixed(dstBound) &&
      (!IsFixed(srcBound) || vellum::bound::Length(srcBound) > vellum::bound::Length(dstBound))) {
    result |= kCmpMayLoseInformation;
  }
  return result;
}

TDNameImpPtr MakeNameFromCStr(const uint8_t* name, bool* failed) {
  *failed = false;
  if (name == nullptr || name[0] == 0) return TDNameImpPtr();
  TDNameImpPtr label = TDNameImp::Make(name, std::strlen(reinterpret_cast<const char*>(name)));
  if (!label) *failed = true;
  return label;
}

void ReportConvertCodes(const TDImp* dst, const TDImp& src) {
  ReportConversionCodes(kDiagnosticModule, __LINE__, dst, src);
}

// --- TDStringBaseImp: identity -------------------------------------------------------------------

int32_t TDStringBaseImp::ComputeHashValue() const {
  return static_cast<int32_t>(static_cast<uint32_t>(TDImp::ComputeHashValue()) + static_cast<uint32_t>(bound_));
}

int32_t TDStringBaseImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDImp::IsSameAs(other) == 0 || other.IsStringBase() == 0) return 0;
  return bound_ == static_cast<const TDStringBaseImp&>(other).bound_ ? 1 : 0;
}

int32_t TDStringBaseImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCloneOrCheckOut(target);
  if (status != kStatusNoError) return status;
  static_cast<TDStringBaseImp&>(*target).SetBound(bound_);
  return kStatusNoError;
}

int32_t TDStringBaseImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCheckIn(target);
  if (status != kStatusNoError) return status;
  static_cast<TDStringBaseImp&>(*target).SetBound(bound_);
  return kStatusNoError;
}

void TDStringBaseImp::SetBound(int32_t bound) {
  bound_ = bound;
  ClearHashValid();
}

int32_t TDStringBaseImp::CompareForSorting(const TDImp* other) const {
  if (other == nullptr || other->IsStringBase() == 0) return 0;
  const int32_t theirs = BoundOfStringBase(other);
  return bound_ < theirs ? -1 : (bound_ > theirs ? 1 : 0);
}

int32_t TDStringBaseImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  if (source->GetTypeCode() != GetTypeCode()) return kCmpIncompatible;
  const int32_t theirs = BoundOfStringBase(source);
  if (theirs == bound_) return 0;
  if ((flags & kCmpFlagReportLoss) != 0 && (flags & kCmpFlagNoStringSizeBits) == 0 && IsFixed(bound_) &&
      (!IsFixed(theirs) || vellum::bound::Length(theirs) > vellum::bound::Length(bound_))) {
    return kCmpMayLoseInformation | kCmpStringSizesDiffer;
  }
  return kCmpStringSizesDiffer;
}

void TDStringBaseImp::PrintDebugStr(const uint8_t* prefix) const {
  const std::string text = PrefixText(prefix);
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "type = " + KindText());
  TDImp::PrintDebugStr(prefix);
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "bound = " + std::to_string(bound_));
}

// --- TDStringBaseImp: data of a counted string in a handle ---------------------------------------

int32_t TDStringBaseImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

int32_t TDStringBaseImp::VerifyData(const void* data, const KoContext*) const {
  if (data == nullptr) return kStatusBadArgument;
  const auto h = Load<LStrHandle>(data);
  if (h == nullptr) return kStatusNoError;
  // Nothing is read before the handle is known to be live and large enough for what is read.
  bool sound = IsDSHandle(h) != 0;
  if (sound) {
    const size_t size = DSGetHandleSize(AsUHandle(h));
    sound = size >= kLengthWordSize && LengthWord(h) >= 0 &&
            static_cast<uint64_t>(LengthWord(h)) + kLengthWordSize <= size;
  }
  return sound ? kStatusNoError : ReportDamagedData(*this, data);
}

int32_t TDStringBaseImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty != 0) {
    if (Load<LStrHandle>(data) != nullptr) return kStatusNoError;
  } else {
    TDImpClearMemory(data, this, clearFirst);
  }
  const int32_t length = vellum::bound::Length(bound_);
  Store<LStrHandle>(data, nullptr);
  if (onlyIfEmpty == 0 && length == 0) return kStatusNoError;
  UHandle block = nullptr;
  if (DSNewHClr(kLengthWordSize + static_cast<size_t>(length), &block) != kStatusNoError) return kStatusOutOfMemory;
  auto h = reinterpret_cast<LStrHandle>(block);
  SetLengthWord(h, IsFixed(bound_) ? length : 0);
  Store(data, h);
  return kStatusNoError;
}

int32_t TDStringBaseImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  LStrHandle h = Load<LStrHandle>(data);
  if (IsVariable(bound_)) {
    const int32_t status = CopyLStr(nullptr, &h);
    Store(data, h);
    return status;
  }
  // Freshly inflated data is the default already.
  if (h == nullptr) return InflateDefData(data, 0, 0, 0);
  return CopyBndFixString(nullptr, &h, bound_);
}

int32_t TDStringBaseImp::DeflateData(void* data, void* end, int32_t dispose,
                                     const HandleAllocationInterface& allocator) const {
  if (!Below(data, end)) return 0;
  const auto h = Load<LStrHandle>(data);
  if (h == nullptr) return 0;
  const size_t size = allocator.GetHandleSize(AsUHandle(h));
  if (dispose != 0) {
    if (allocator.DisposeHandle(AsUHandle(h)) != kStatusNoError) return 0;
    Store<LStrHandle>(data, nullptr);
    return Saturated(size);
  }
  if (IsVariable(bound_)) {
    if (allocator.SetHandleSize(AsUHandle(h), kLengthWordSize) != kStatusNoError) return 0;
    SetLengthWord(h, 0);
    return size > kLengthWordSize ? Saturated(size - kLengthWordSize) : 0;
  }
  if (vellum::bound::IsBounded(bound_) && size >= kLengthWordSize) SetLengthWord(h, 0);
  return 0;
}

int32_t TDStringBaseImp::ShrinkData(void* data, void* end, int32_t flag,
                                    const HandleAllocationInterface& allocator) const {
  if (flag != 0 || !IsVariable(bound_) || !Below(data, end)) return 0;
  const auto h = Load<LStrHandle>(data);
  if (h == nullptr) return 0;
  const size_t size = allocator.GetHandleSize(AsUHandle(h));
  if (size <= kLengthWordSize || allocator.DisposeHandle(AsUHandle(h)) != kStatusNoError) return 0;
  Store<LStrHandle>(data, nullptr);
  return Saturated(size);
}

int32_t TDStringBaseImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  if (IsVariable(GetBound()) && MoveSameLengthLStr(src, dst)) return kStatusNoError;
  return CopyIntoLStrData(*this, Load<LStrHandle>(src), dst);
}

int32_t TDStringBaseImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  const int32_t srcCode = GetTypeCode();
  const int32_t dstCode = dst != nullptr ? dst->GetTypeCode() : 0;
  constexpr auto kString = static_cast<int32_t>(TypeCode::String);
  constexpr auto kTag = static_cast<int32_t>(TypeCode::Tag);
  const bool stringAndTag = (srcCode == kString && dstCode == kTag) || (srcCode == kTag && dstCode == kString);
  if (dst == nullptr || dst->IsStringBase() == 0 || (srcCode != dstCode && !stringAndTag)) {
    ReportConvertCodes(dst, *this);
    return kStatusBadArgument;
  }
  return CopyIntoLStrData(*static_cast<const TDStringBaseImp*>(dst), Load<LStrHandle>(src), dstData);
}

// --- TDStringImp ---------------------------------------------------------------------------------

TDImpPtr TDStringImp::NewInstance() const { return MakeCounted<TDStringImp>(); }

int32_t TDStringImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  if (dst == nullptr || dst->IsSubStringOnly() == 0) {
    return TDStringBaseImp::CopyDataConvertCore(dst, src, dstData, flags);
  }
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  const auto h = Load<LStrHandle>(src);
  SubStringRec rec{nullptr, 0, 1};
  if (h != nullptr) {
    if (LengthWord(h) < 0) return kStatusBadArgument;
    rec.dataPtr = Bytes(h);
    rec.length = LengthWord(h);
  }
  // A bound only ever shortens the view: a fixed length beyond the source would point past it.
  const int32_t bound = BoundOfStringBase(dst);
  if (!IsVariable(bound)) rec.length = std::min(rec.length, vellum::bound::Length(bound));
  Store(dstData, rec);
  return kStatusNoError;
}

int32_t TDStringImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  return StringKindCmpTD(*this, source, flags);
}

// --- TDSubStringImp ------------------------------------------------------------------------------

TDImpPtr TDSubStringImp::NewInstance() const { return MakeCounted<TDSubStringImp>(); }

int32_t TDSubStringImp::VerifyData(const void* data, const KoContext*) const {
  if (data == nullptr) return kStatusBadArgument;
  return ReadableRecord(Load<SubStringRec>(data)) ? kStatusNoError : ReportDamagedData(*this, data);
}

int32_t TDSubStringImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  if (platform == nullptr) return static_cast<int32_t>(sizeof(SubStringRec));
  return GetSubStringRecTD().DataSize(platform);
}

int32_t TDSubStringImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

int32_t TDSubStringImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  return TDImp::InflateDefData(data, onlyIfEmpty, clearFirst, flags);
}

int32_t TDSubStringImp::ResetToDefaultData(void* data) const { return TDImp::ResetToDefaultData(data); }

int32_t TDSubStringImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, sizeof(SubStringRec));
  return kStatusNoError;
}

int32_t TDSubStringImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  auto rec = Load<SubStringRec>(src);
  const int32_t bound = BoundOfStringBase(dst);
  if (dst != nullptr && dst->IsSubStringOnly() != 0) {
    if (!IsVariable(bound)) rec.length = std::min(rec.length, vellum::bound::Length(bound));
    Store(dstData, rec);
    return kStatusNoError;
  }
  if (dst == nullptr || (dst->IsStringOnly() == 0 && dst->IsTag() == 0)) {
    ReportConvertCodes4(dst, *this);
    return kStatusBadArgument;
  }
  LStrHandle h = Load<LStrHandle>(dstData);
  if (IsVariable(bound)) {
    const int32_t status = CopySString(&rec, &h);
    Store(dstData, h);
    return status;
  }
  // A fixed or bounded tag keeps its size like a string would.
  if (h == nullptr) {
    const int32_t status = dst->InflateDefData(dstData, 0, 0, 0);
    if (status != kStatusNoError) return status;
    h = Load<LStrHandle>(dstData);
  }
  return CopySBndFixString(&rec, &h, bound);
}

int32_t TDSubStringImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  return StringKindCmpTD(*this, source, flags);
}

// --- TDPathImp -----------------------------------------------------------------------------------

TDImpPtr TDPathImp::NewInstance() const { return MakeCounted<TDPathImp>(); }

int32_t TDPathImp::VerifyData(const void* data, const KoContext*) const {
  if (data == nullptr) return kStatusBadArgument;
  const auto path = Load<Path>(data);
  if (path == nullptr || FIsSanePath(path) != 0) return kStatusNoError;
  return ReportDamagedData(*this, data);
}

int32_t TDPathImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty != 0) {
    if (Load<Path>(data) != nullptr) return kStatusNoError;
  } else {
    TDImpClearMemory(data, this, clearFirst);
  }
  Path path = nullptr;
  const int32_t status = FEmptyPath(&path);
  Store(data, path);
  return status == kStatusNoError ? kStatusNoError : kStatusOutOfMemory;
}

int32_t TDPathImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  auto path = Load<Path>(data);
  const int32_t status = CopyPath(nullptr, &path);
  Store(data, path);
  return status;
}

int32_t TDPathImp::DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface&) const {
  if (!Below(data, end)) return 0;
  auto path = Load<Path>(data);
  if (path == nullptr) return 0;
  if (dispose != 0) {
    FDestroyPath(&path);
  } else {
    // Kept but emptied; when even that fails the old path stays, which is still a valid datum.
    static_cast<void>(CopyPath(nullptr, &path));
  }
  Store(data, path);
  return 0;
}

int32_t TDPathImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  auto path = Load<Path>(dst);
  const int32_t status = CopyPath(Load<Path>(src), &path);
  Store(dst, path);
  return status;
}

int32_t TDPathImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  if (dst == nullptr || dst->IsPath() == 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "CopyDataConvert:  destination is not a path!");
    return kStatusBadArgument;
  }
  return CopyData(src, dstData, flags, nullptr);
}

// --- TDPictImp -----------------------------------------------------------------------------------

TDImpPtr TDPictImp::NewInstance() const { return MakeCounted<TDPictImp>(); }

// --- shared defaults -----------------------------------------------------------------------------

const TDR& GetStringTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDStringImp>()); });
}

const TDR& GetSubStringTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDSubStringImp>()); });
}

const TDR& GetPathTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDPathImp>()); });
}

const TDR& GetSubStringRecTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    TDWCluster record(U("SubStringRec"));
    record << TDWPtr(U("dataPtr")) << TDWInt32(U("length")) << TDWPtr(U("stride"));
    // A chain broken by a failed allocation leaves a shorter record, which must not be shared.
    return record.GetNumElts() == kRecordElements ? record.GetImpPtr() : TDImpPtr();
  });
}

const TDR& GetPictTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDPictImp>()); });
}

// --- handles -------------------------------------------------------------------------------------

bool StringBaseKind::Admit(const TDImp& type) { return type.IsStringBase() != 0; }
bool StringKind::Admit(const TDImp& type) { return type.IsStringOnly() != 0; }
TDImpPtr StringKind::New(const uint8_t* name) { return NewStringBase(TypeCode::String, name, -1); }
bool SubStringKind::Admit(const TDImp& type) { return type.IsSubStringOnly() != 0; }
TDImpPtr SubStringKind::New(const uint8_t* name) { return NewStringBase(TypeCode::SubString, name, -1); }
bool PathKind::Admit(const TDImp& type) { return type.IsPath() != 0; }
TDImpPtr PathKind::New(const uint8_t* name) { return NewStringBase(TypeCode::Path, name, -1); }
bool PictKind::Admit(const TDImp& type) { return type.IsPict() != 0; }
TDImpPtr PictKind::New(const uint8_t* name) { return NewStringBase(TypeCode::Pict, name, -1); }

int32_t TDRStringBase::GetBound() const { return BoundOfStringBase(GetImp()); }
int32_t TDWStringBase::GetBound() const { return BoundOfStringBase(GetImp()); }

int32_t TDWStringBase::SetBound(int32_t bound) {
  TDStringBaseImp* imp = WritableStringBase(*this);
  if (imp == nullptr) return kStatusNullHandle;
  imp->SetBound(bound);
  return kStatusNoError;
}

TDRString::TDRString(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(NewStringBase(TypeCode::String, name, bound)), 1) {}
TDWString::TDWString(const uint8_t* name, int32_t bound)
    : TDWTyped(NewStringBase(TypeCode::String, name, bound), 1) {}
TDRSubString::TDRSubString(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(NewStringBase(TypeCode::SubString, name, bound)), 1) {}
TDWSubString::TDWSubString(const uint8_t* name, int32_t bound)
    : TDWTyped(NewStringBase(TypeCode::SubString, name, bound), 1) {}
TDRPath::TDRPath(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(NewStringBase(TypeCode::Path, name, bound)), 1) {}
TDWPath::TDWPath(const uint8_t* name, int32_t bound) : TDWTyped(NewStringBase(TypeCode::Path, name, bound), 1) {}
TDRPict::TDRPict(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(NewStringBase(TypeCode::Pict, name, bound)), 1) {}
TDWPict::TDWPict(const uint8_t* name, int32_t bound) : TDWTyped(NewStringBase(TypeCode::Pict, name, bound), 1) {}

TDRSubString TDRString::ConvertToSubString() const {
  return TDRSubString(vellum::detail::CheckInNew(ConvertStringBase(*this, TypeCode::SubString)), 1);
}

TDWSubString TDWString::ConvertToSubString() const {
  return TDWSubString(ConvertStringBase(*this, TypeCode::SubString), 1);
}

TDRString TDRSubString::ConvertToString() const {
  return TDRString(vellum::detail::CheckInNew(ConvertStringBase(*this, TypeCode::String)), 1);
}

TDWString TDWSubString::ConvertToString() const { return TDWString(ConvertStringBase(*this, TypeCode::String), 1); }

int32_t TDRSubString::GetStringPtrOffset(ITargetPlatformAlignment* platform) const {
  if (platform == nullptr) return static_cast<int32_t>(offsetof(SubStringRec, dataPtr));
  return TDRCluster(GetSubStringRecTD().GetImpPtr(), 1).GetEltOffset(kRecordDataPtr, platform);
}

int32_t TDRSubString::GetLengthOffset(ITargetPlatformAlignment* platform) const {
  if (platform == nullptr) return static_cast<int32_t>(offsetof(SubStringRec, length));
  return TDRCluster(GetSubStringRecTD().GetImpPtr(), 1).GetEltOffset(kRecordLength, platform);
}

// --- type strings ----------------------------------------------------------------------------------

int32_t TDStringBaseImp::FlattenTDPartsForSaving(TDDataWriter* writer) const { return writer->WriteI32(bound_); }

int32_t TDStringBaseImp::ConstructTD(TDDataReader* reader) {
  int32_t bound = 0;
  if (const int32_t status = reader->ReadI32(&bound); status != kStatusNoError) return status;
  SetBound(bound);
  return kStatusNoError;
}

// --- flattened data --------------------------------------------------------------------------------

namespace {

LStrHandle LoadHandle(const void* slot) { return Load<LStrHandle>(slot); }

}  // namespace

int32_t ReadLStrValue(KoDataReader* reader, int32_t bound, LStrHandle* slot) {
  const uint8_t* word = reader->TakeBytes(sizeof(int32_t));
  if (word == nullptr) return reader->GetError();
  uint32_t raw = Load<uint32_t>(word);
  if (reader->GetEndianizer()->Swaps()) raw = __builtin_bswap32(raw);
  const auto length = static_cast<int32_t>(raw);
  // The bytes must be in the input before anything is allocated for them.
  if (length < 0 || static_cast<size_t>(length) > reader->BytesLeft()) {
    (VELLUM_DEBUG(2) << "ReadData: string length " << length << " is implausible with " << reader->BytesLeft()
                     << " bytes left")
        .Process();
    reader->SetError(kStatusImplausibleData);
    return reader->GetError();
  }
  if (slot == nullptr) return reader->Skip(static_cast<size_t>(length));
  const int32_t target = vellum::bound::IsVariable(bound) ? length : vellum::bound::Length(bound);
  if (target == 0 && *slot == nullptr) return reader->Skip(static_cast<size_t>(length));
  const size_t need = sizeof(int32_t) + static_cast<size_t>(target);
  UHandle h = reinterpret_cast<UHandle>(*slot);
  // The destination is the caller's datum: its handles are live.
  const size_t have = DSGetLiveHandleSize(h);
  if (!vellum::bound::IsVariable(bound) && h != nullptr && have != need)
    DebugReport(kDiagnosticModule, __LINE__, 3, "fixed/bounded str was preallocated to wrong size?");
  if ((h == nullptr || have < need) && !reader->MayAllocate(need)) return reader->GetError();
  if (h == nullptr || have != need) {
    const int32_t status = DSSetHandleSizeOrNewHandle(&h, need);
    if (status != kStatusNoError) {
      reader->SetError(status == kStatusOutOfMemory ? kStatusReadAllocationFailed : status);
      return reader->GetError();
    }
    *slot = reinterpret_cast<LStrHandle>(h);
  }
  uint8_t* bytes = *h + sizeof(int32_t);
  const int32_t taken = std::min(target, length);
  reader->ReadBytes(bytes, static_cast<size_t>(taken));
  if (target > length) std::memset(bytes + length, 0, static_cast<size_t>(target - length));
  if (length > target) reader->Skip(static_cast<size_t>(length - target));
  const int32_t stored = target < length || vellum::bound::IsFixed(bound) ? target : length;
  std::memcpy(*h, &stored, sizeof stored);
  if (reader->GetError() != kStatusNoError) {
    const int32_t empty = 0;
    std::memcpy(*h, &empty, sizeof empty);
  }
  return reader->GetError();
}


uint32_t TDStringBaseImp::FlatDataSize(KoDataWriter*, const void* data) const {
  if (data == nullptr) return 4 + static_cast<uint32_t>(vellum::bound::IsFixed(bound_) ? vellum::bound::Length(bound_) : 0);
  const LStrHandle h = LoadHandle(data);
  return 4 + static_cast<uint32_t>(h != nullptr ? std::max((*h)->cnt, 0) : 0);
}

void TDStringBaseImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (count > 0 && data == nullptr) writer->SetError(kStatusBadArgument);
  const auto* slots = static_cast<const uint8_t*>(data);
  for (int32_t i = 0; i < count && writer->GetError() == kStatusNoError; ++i)
    writer->WriteLStr(LoadHandle(slots + static_cast<size_t>(i) * sizeof(LStrHandle)));
}

void TDStringBaseImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  auto* slots = static_cast<uint8_t*>(data);
  for (int32_t i = 0; i < count && reader->GetError() == kStatusNoError; ++i) {
    if (slots == nullptr) {
      ReadLStrValue(reader, bound_, nullptr);
      continue;
    }
    uint8_t* slot = slots + static_cast<size_t>(i) * sizeof(LStrHandle);
    LStrHandle h = LoadHandle(slot);
    ReadLStrValue(reader, bound_, &h);
    Store(slot, h);
  }
}

uint32_t TDSubStringImp::FlatDataSize(KoDataWriter*, const void* data) const {
  if (data == nullptr) return 4;
  const SubStringRec rec = Load<SubStringRec>(data);
  return 4 + static_cast<uint32_t>(std::max(rec.length, 0));
}

void TDSubStringImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (count > 0 && data == nullptr) writer->SetError(kStatusBadArgument);
  const auto* records = static_cast<const uint8_t*>(data);
  for (int32_t i = 0; i < count && writer->GetError() == kStatusNoError; ++i) {
    const SubStringRec rec = Load<SubStringRec>(records + static_cast<size_t>(i) * sizeof(SubStringRec));
    if (!ReadableRecord(rec)) {
      writer->SetError(kStatusBadArgument);
      break;
    }
    if (rec.stride != 1)
      (VELLUM_DEBUG(2) << "KoDataWriter::WriteData : substring stride == " << static_cast<int64_t>(rec.stride)).Process();
    writer->WriteI32(rec.length);
    for (int32_t k = 0; k < rec.length && writer->GetError() == kStatusNoError; ++k)
      writer->WriteU8(rec.dataPtr[static_cast<intptr_t>(k) * rec.stride]);
  }
}

void TDSubStringImp::ReadFlatData(KoDataReader*, void*, int32_t) const {
  DebugReport(kDiagnosticModule, __LINE__, 2, "ReadData does not handle subStrings!");
}

uint32_t TDPathImp::FlatDataSize(KoDataWriter*, const void* data) const {
  if (data == nullptr) return 12;
  PreflightOutputBuf counter;
  BinDataWriter writer(&counter, nullptr);
  writer.WritePath(Load<Path>(data));
  return static_cast<uint32_t>(counter.GetBytesWritten());
}

void TDPathImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (count > 0 && data == nullptr) writer->SetError(kStatusBadArgument);
  const auto* slots = static_cast<const uint8_t*>(data);
  for (int32_t i = 0; i < count && writer->GetError() == kStatusNoError; ++i)
    writer->WritePath(Load<Path>(slots + static_cast<size_t>(i) * sizeof(Path)));
}

// A path read replaces the one in place, which is disposed of; a failed read leaves no path.
void TDPathImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  auto* slots = static_cast<uint8_t*>(data);
  for (int32_t i = 0; i < count && reader->GetError() == kStatusNoError; ++i) {
    Path read = nullptr;
    reader->ReadPath(&read);
    if (slots == nullptr) {
      FDestroyPath(&read);
      continue;
    }
    uint8_t* slot = slots + static_cast<size_t>(i) * sizeof(Path);
    Path old = Load<Path>(slot);
    FDestroyPath(&old);
    Store(slot, read);
  }
}

// --- ordering of data ------------------------------------------------------------------------------

DataOrder TDStringBaseImp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  return {LHStrCmp(Load<LStrHandle>(a), Load<LStrHandle>(b))};
}

DataOrder TDSubStringImp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  return {OrderBytes(a, b).order, DataOrderNote::SubtypeRecords};
}

DataOrder TDPathImp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  const auto first = Load<Path>(a);
  const auto second = Load<Path>(b);
  if (first != nullptr && second != nullptr) return {FPathCmpExact(first, second)};
  Path notAPath = nullptr;
  if (FNotAPath(&notAPath) != kStatusNoError) {
    FDestroyPath(&notAPath);
    return {FPathCmpExact(first, second)};
  }
  const int32_t order = FPathCmpExact(first != nullptr ? first : notAPath, second != nullptr ? second : notAPath);
  FDestroyPath(&notAPath);
  return {order};
}
