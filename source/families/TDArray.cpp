// Arrays, subarrays and array data pointers as descriptors: dimension words and element counts,
// identity, order and compatibility, layout, type strings, the factories, the shared
// one-dimensional arrays and the handles.
#include "source/families/TDArray.h"

#include <algorithm>
#include <bit>
#include <new>

#include "runtime/DebugStream.h"
#include "source/families/TDArrayInternal.h"
#include "source/families/TDStringBase.h"
#include "source/model/TDAttributes.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TDBlockHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDSimpleHandles.h"
#include "vellum/TDStringHandles.h"

VELLUM_DIAGNOSTIC_MODULE("TDArray");

namespace {

using namespace tdarray_detail;

constexpr int32_t kPointerSize = 8;
constexpr int32_t kCountWordNoDims = static_cast<int32_t>(0x80000001u);

// CmpTD flags of the array family.
constexpr int32_t kCmpFlagClusterAsVector = 0x4000;
constexpr int32_t kCmpFlagNoSizeBits = 0x10;
constexpr int32_t kCmpFlagNoElementMatch = 0x2000000;
constexpr int32_t kCmpFlagDimensionsFree = 0x4000000;
constexpr int32_t kCmpKindsDiffer = 0x8;
// Element bits that still let an array's element stand for the other, non-array side.
constexpr int32_t kCmpElementMatchBits = kCmpMinor | kCmpKindsDiffer | kCmpNeedsConversion;

}  // namespace

// --- TDArrayBaseImp: dimensions, identity and order ------------------------------------------------

int32_t TDArrayBaseImp::GetDimSize(int32_t index) const noexcept {
  if (index < 0 || index >= GetNumDims()) return 0;
  return dims_[static_cast<size_t>(index)];
}

int32_t TDArrayBaseImp::CountWord(bool* overflow) const noexcept {
  *overflow = false;
  if (!hasDims_) return kCountWordMalformed;
  if (dims_.empty()) return kCountWordNoDims;
  if (std::find(dims_.begin(), dims_.end(), vellum::bound::kVariable) != dims_.end()) return -1;
  int64_t product = 1;
  bool allFixed = true;
  bool zero = false;
  for (const int32_t word : dims_) {
    const int64_t size = Length(word);
    if (!IsFixed(word)) allFixed = false;
    if (size == 0) zero = true;
    if (product <= kMaxCount) product *= size;
  }
  if (zero) return 0;
  if (product > kMaxCount) {
    *overflow = true;
    return kCountWordMalformed;
  }
  return allFixed ? static_cast<int32_t>(static_cast<uint32_t>(product) | 0x80000000u) : static_cast<int32_t>(product);
}

int32_t TDArrayBaseImp::InitDims(int32_t count) {
  if (count < 0) return kStatusBadArgument;
  try {
    dims_.assign(static_cast<size_t>(count), vellum::bound::kVariable);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  hasDims_ = true;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::AddDim(int32_t word, int32_t position) {
  try {
    if (position >= 0 && position < GetNumDims()) {
      dims_.insert(dims_.begin() + position, word);
    } else {
      dims_.push_back(word);
    }
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  hasDims_ = true;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::RemoveDim(int32_t index) {
  if (!hasDims_) return kStatusNullHandle;
  if (index < 0 || index >= GetNumDims()) return kStatusBadArgument;
  dims_.erase(dims_.begin() + index);
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::RemoveAllDims() {
  if (!hasDims_) return kStatusNullHandle;
  dims_.clear();
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::SetNumDims(int32_t count) {
  if (!hasDims_) return kStatusNullHandle;
  if (count < 0) return kStatusBadArgument;
  try {
    dims_.resize(static_cast<size_t>(count), vellum::bound::kVariable);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::SetDimSize(int32_t index, int32_t word) {
  if (!hasDims_) return kStatusNullHandle;
  if (index < 0 || index >= GetNumDims()) return kStatusBadArgument;
  dims_[static_cast<size_t>(index)] = word;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(TDSingleContainerImp::ComputeHashValue());
  for (size_t i = 0; i < dims_.size(); ++i) {
    hash += std::rotl(static_cast<uint32_t>(dims_[i]), static_cast<int>((i + 1) % 32));
  }
  return static_cast<int32_t>(hash);
}

int32_t TDArrayBaseImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDSingleContainerImp::IsSameAs(other) == 0) return 0;
  const TDArrayBaseImp* that = AsArrayBase(&other);
  if (that == nullptr) return 0;
  return hasDims_ == that->hasDims_ && dims_ == that->dims_ ? 1 : 0;
}

int32_t TDArrayBaseImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDSingleContainerImp::MemberCloneOrCheckOut(target);
  return status != kStatusNoError ? status : CopyDimsInto(static_cast<TDArrayBaseImp&>(*target));
}

int32_t TDArrayBaseImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDSingleContainerImp::MemberCheckIn(target);
  return status != kStatusNoError ? status : CopyDimsInto(static_cast<TDArrayBaseImp&>(*target));
}

int32_t TDArrayBaseImp::CopyDimsInto(TDArrayBaseImp& copy) const {
  try {
    copy.dims_ = dims_;
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  copy.hasDims_ = hasDims_;
  copy.ClearHashValid();
  return kStatusNoError;
}

int32_t TDArrayBaseImp::DefinedType(int32_t how) const {
  const TDImpPtr& element = GetElt();
  return element && element->DefinedType(how) != 0 ? 1 : 0;
}

int32_t TDArrayBaseImp::IsSemiGeneric() const {
  const TDImpPtr& element = GetElt();
  return element && (element->IsGeneric() != 0 || element->IsSemiGeneric() != 0) ? 1 : 0;
}

int32_t TDArrayBaseImp::IsArrayFloat64Wfms() const {
  const TDImpPtr& element = GetElt();
  return element && element->IsFloat64Waveform() != 0 ? 1 : 0;
}

void TDArrayBaseImp::PrintDebugStr(const uint8_t* prefix) const {
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "type = " << KindText()).Process();
  DebugStream line(__FILE__, __LINE__, 0);
  line << PrefixText(prefix) << "dimensions = ";
  if (!hasDims_) {
    line << "none";
  } else {
    line << GetNumDims() << ":";
    for (const int32_t word : dims_) line << " " << word;
  }
  line.Process();
  TDSingleContainerImp::PrintDebugStr(prefix);
}

int32_t TDArrayBaseImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  // The second-pass mark belongs to the comparison of this pair, not of their elements.
  const int32_t passed = flags & ~kCmpFlagSecondPass;
  const TDImp* mine = GetElt().get();

  if ((flags & kCmpFlagClusterAsVector) != 0 && source->IsClust() != 0 && GetNumDims() == 1 &&
      IsVariable(GetDimSize(0))) {
    int32_t result = kCmpNeedsConversion;
    const TDContainerImp* cluster = AsContainer(source);
    const int32_t count = cluster->GetNumElts();
    for (int32_t i = 0; i < count; ++i) {
      const TDImp* theirs = cluster->GetEltImpPtr(i).get();
      const int32_t bits = mine != nullptr && theirs != nullptr ? mine->CmpTDCommon(theirs, passed) : kCmpIncompatible;
      result |= (bits & kCmpIncompatible) != 0 ? kCmpIncompatible : bits;
    }
    return result;
  }

  int32_t result = 0;
  const TDArrayBaseImp* other = AsArrayBase(source);
  if (other == nullptr) {
    result = kCmpIncompatible;
  } else {
    if (IsArrayInterface() != other->IsArrayInterface()) {
      DebugReport(kDiagnosticModule, __LINE__, 0,
                  "TDArrayBaseImp::CmpTD : Should check array dimensions and datatype before setting sConvert.");
      return kCmpNeedsConversion;
    }
    const bool sizeBits = (flags & kCmpFlagNoSizeBits) == 0;
    const bool dimensionsFree = (flags & kCmpFlagDimensionsFree) != 0;
    if (GetTypeCode() != other->GetTypeCode() && sizeBits) result |= kCmpKindsDiffer;
    if (GetNumDims() != other->GetNumDims()) result |= kCmpDimsDiffer;
    const int32_t common = std::min(GetNumDims(), other->GetNumDims());
    for (int32_t d = 0; d < common; ++d) {
      const int32_t word = GetDimSize(d);
      const int32_t theirs = other->GetDimSize(d);
      if (word == theirs) continue;
      const bool smaller = IsVariable(theirs) || Length(word) < Length(theirs);
      if (!dimensionsFree && (IsFixed(word) || (IsBounded(word) && smaller))) {
        result |= kCmpDimensionLimited;
      } else if (sizeBits) {
        result |= kCmpKindsDiffer;
      }
      if ((flags & kCmpFlagReportLoss) != 0 && !dimensionsFree && sizeBits && !IsVariable(word) && smaller) {
        result |= kCmpMayLoseInformation;
      }
    }
    const TDImp* theirs = other->GetElt().get();
    if (mine == nullptr || theirs == nullptr) {
      result |= kCmpIncompatible;
    } else if (mine != theirs) {
      result |= mine->CmpTDCommon(theirs, passed);
    }
  }
  if ((flags & kCmpFlagNoElementMatch) == 0 && (result & kCmpIncompatible) != 0 && other == nullptr &&
      mine != nullptr && (mine->CmpTDCommon(source, passed) & ~kCmpElementMatchBits) == 0) {
    result |= kCmpEltMatchesNonArray;
  }
  return result;
}

int32_t TDArrayBaseImp::CompareForSorting(const TDImp* other) const {
  const TDArrayBaseImp* that = AsArrayBase(other);
  if (that == nullptr) return 0;
  if (GetNumDims() != that->GetNumDims()) return GetNumDims() - that->GetNumDims();
  for (int32_t d = 0; d < GetNumDims(); ++d) {
    const auto mine = static_cast<uint32_t>(GetDimSize(d));
    const auto theirs = static_cast<uint32_t>(that->GetDimSize(d));
    if (mine != theirs) return mine < theirs ? -1 : 1;
  }
  return TDContainerImp::CompareForSorting(other);
}

bool TDArrayBaseImp::ConversionIsLossless(const TDImp* dst) const {
  const TDArrayBaseImp* to = AsArrayBase(dst);
  if (to == nullptr || to->GetNumDims() != GetNumDims()) return false;
  for (int32_t d = 0; d < GetNumDims(); ++d) {
    const int32_t into = to->GetDimSize(d);
    const int32_t from = GetDimSize(d);
    if (IsVariable(into)) continue;
    if (IsVariable(from) || Length(from) > Length(into)) return false;
  }
  return TDContainerImp::ConversionIsLossless(dst);
}

const TDArrayBaseImp* AsArrayBase(const TDImp* type) {
  return type != nullptr && type->IsArrayBase() != 0 ? static_cast<const TDArrayBaseImp*>(type) : nullptr;
}

// --- TDArrayImp: layout ----------------------------------------------------------------------------

TDImpPtr TDArrayImp::NewInstance() const { return MakeCounted<TDArrayImp>(); }

int32_t TDArrayImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

// --- TDSubArrayImp ---------------------------------------------------------------------------------

TDImpPtr TDSubArrayImp::NewInstance() const { return MakeCounted<TDSubArrayImp>(); }

int32_t TDSubArrayImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  if (platform == nullptr) return static_cast<int32_t>(kRecordDimsOffset + kRecordDimSize * GetNumDims());
  const TDRCluster record(GetSubArrayTD().GetImpPtr(), 1);
  const int64_t size = record.GetEltOffset(1, platform) +
                       static_cast<int64_t>(GetNumDims()) * GetDimensionSpecifierTD().DataSize(platform);
  return Saturated(size);
}

int32_t TDSubArrayImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

// --- TDArrayDataPtrImp -----------------------------------------------------------------------------

TDImpPtr TDArrayDataPtrImp::NewInstance() const { return MakeCounted<TDArrayDataPtrImp>(); }

int32_t TDArrayDataPtrImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

// --- factories and shared descriptors --------------------------------------------------------------

namespace {

// Read descriptors start without a dimension list; reading their payload gives them one.

EmptyTypeFactory<TDArrayImp> gArrayFactory;
EmptyTypeFactory<TDSubArrayImp> gSubArrayFactory;
EmptyTypeFactory<TDArrayDataPtrImp> gArrayDataPtrFactory;

// Announced as the library loads; the service registers them in this place at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(2, static_cast<uint16_t>(TypeCode::Array), &gArrayFactory);
  AnnounceTypeFactory(3, static_cast<uint16_t>(TypeCode::SubArray), &gSubArrayFactory);
  AnnounceTypeFactory(4, static_cast<uint16_t>(TypeCode::ArrayDataPtr), &gArrayDataPtrFactory);
  return true;
}();

TDImpPtr NewOfCode(TypeCode code, const TDNameImpPtr& name) {
  switch (code) {
    case TypeCode::Array: return MakeCounted<TDArrayImp>(name, TDTypedefImpPtr());
    case TypeCode::SubArray: return MakeCounted<TDSubArrayImp>(name, TDTypedefImpPtr());
    case TypeCode::ArrayDataPtr: return MakeCounted<TDArrayDataPtrImp>(name, TDTypedefImpPtr());
    default: return TDImpPtr();
  }
}

// A writable array of `code` with nDims variable dimensions holding `element` itself.
TDImpPtr NewArrayOf(TypeCode code, int32_t nDims, const TDImpPtr& element, const uint8_t* name) {
  if (nDims < 0) return TDImpPtr();
  bool failed = false;
  const TDNameImpPtr label = MakeNameFromCStr(name, &failed);
  if (failed) return TDImpPtr();
  TDImpPtr fresh = NewOfCode(code, label);
  if (!fresh) return TDImpPtr();
  auto& array = static_cast<TDArrayBaseImp&>(*fresh);
  if (array.InitDims(nDims) != kStatusNoError) return TDImpPtr();
  array.SetElt(element);
  return fresh;
}

// `type` as another array kind: the same dimensions, column-vector mark and name; an interned
// element is shared, a writable one copied.
TDImpPtr ConvertArrayKind(const TD& type, TypeCode code) {
  const TDArrayBaseImp* from = AsArrayBase(type.GetImp());
  if (from == nullptr) return TDImpPtr();
  TDNameImpPtr label;
  if (const TDNameImpPtr& name = from->GetNameImpPtr()) {
    label = name->CloneOrCheckOut();
    if (!label) return TDImpPtr();
  }
  TDImpPtr element = from->GetElt();
  if (element && element->IsReadOnlyTD() == 0) {
    element = element->CloneOrCheckOut();
    if (!element) return TDImpPtr();
  }
  TDImpPtr fresh = NewOfCode(code, label);
  if (!fresh) return TDImpPtr();
  auto& array = static_cast<TDArrayBaseImp&>(*fresh);
  if (from->HasDimList()) {
    if (array.InitDims(0) != kStatusNoError) return TDImpPtr();
    for (int32_t d = 0; d < from->GetNumDims(); ++d) {
      if (array.AddDim(from->GetDimSize(d), -1) != kStatusNoError) return TDImpPtr();
    }
  }
  array.SetElt(element);
  array.SetFlagBits(from->Flags() & kTDFlagColumnVector);
  return fresh;
}

template <const TDR& (*Element)()>
const TDR& SharedVector() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    const TDR& element = Element();
    return element ? NewArrayOf(TypeCode::Array, 1, element.GetImpPtr(), nullptr) : TDImpPtr();
  });
}

TDArrayBaseImp* WritableArray(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || imp->IsArrayBase() == 0) return nullptr;
  return static_cast<TDArrayBaseImp*>(imp);
}

int32_t DimSizeOf(const TD& type, int32_t index) {
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  return array != nullptr ? array->GetDimSize(index) : 0;
}

int32_t NumDimsOf(const TD& type) {
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  return array != nullptr ? array->GetNumDims() : 0;
}

int32_t CountWordOf(const TD& type) {
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  if (array == nullptr) return kCountWordMalformed;
  bool overflow = false;
  return array->CountWord(&overflow);
}

bool WellFormed(const TD& type) {
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  return array != nullptr && array->IsWellFormed();
}

bool ColumnVector(const TD& type) {
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  return array != nullptr && (array->Flags() & kTDFlagColumnVector) != 0;
}

enum class RecordPart { kDataPtr, kDimSize, kStride };

int32_t RecordOffset(const TD& type, int32_t dim, ITargetPlatformAlignment* platform, RecordPart part) {
  if (part != RecordPart::kDataPtr && (dim < 0 || dim >= NumDimsOf(type))) {
    DebugReport(kDiagnosticModule, __LINE__, 3, " Invalid dimension");
    return 0;
  }
  if (platform == nullptr) {
    switch (part) {
      case RecordPart::kDataPtr: return 0;
      case RecordPart::kDimSize: return static_cast<int32_t>(kRecordDimsOffset + kRecordDimSize * dim);
      case RecordPart::kStride: return static_cast<int32_t>(kRecordDimsOffset + kRecordDimSize * dim + 8);
    }
  }
  const TDRCluster record(GetSubArrayTD().GetImpPtr(), 1);
  if (part == RecordPart::kDataPtr) return record.GetEltOffset(0, platform);
  const TDRCluster specifier(GetDimensionSpecifierTD().GetImpPtr(), 1);
  const int64_t base = record.GetEltOffset(1, platform) + static_cast<int64_t>(dim) * specifier.DataSize(platform);
  return Saturated(base + specifier.GetEltOffset(part == RecordPart::kDimSize ? 0 : 1, platform));
}

}  // namespace

const TDR& GetIbyt1DTD() { return SharedVector<&GetiB>(); }
const TDR& GetUbyt1DTD() { return SharedVector<&GetuB>(); }
const TDR& GetInt1DTD() { return SharedVector<&GetiW>(); }
const TDR& GetUWord1DTD() { return SharedVector<&GetuW>(); }
const TDR& GetLong1DTD() { return SharedVector<&GetiL>(); }
const TDR& GetULong1DTD() { return SharedVector<&GetuL>(); }
const TDR& GetQuad1DTD() { return SharedVector<&GetiQ>(); }
const TDR& GetUQuad1DTD() { return SharedVector<&GetuQ>(); }
const TDR& GetSingle1DTD() { return SharedVector<&GetfS>(); }
const TDR& GetDbl1DTD() { return SharedVector<&GetfD>(); }
const TDR& GetVoid1DTD() { return SharedVector<&GetVoidTD>(); }

// --- handles ---------------------------------------------------------------------------------------

bool ArrayBaseKind::Admit(const TDImp& type) { return type.IsArrayBase() != 0; }
bool ArrayKind::Admit(const TDImp& type) { return type.IsArrayOnly() != 0; }
TDImpPtr ArrayKind::New(const uint8_t* name) { return NewArrayOf(TypeCode::Array, 1, TDImpPtr(), name); }
bool SubArrayKind::Admit(const TDImp& type) { return type.IsSubArrayOnly() != 0; }
TDImpPtr SubArrayKind::New(const uint8_t* name) { return NewArrayOf(TypeCode::SubArray, 1, TDImpPtr(), name); }
bool ArrayDataPtrKind::Admit(const TDImp& type) { return type.IsArrayDataPtr() != 0; }
TDImpPtr ArrayDataPtrKind::New(const uint8_t* name) { return NewArrayOf(TypeCode::ArrayDataPtr, 1, TDImpPtr(), name); }

int32_t TDRArrayBase::GetDimSize(int32_t index) const { return DimSizeOf(*this, index); }
int32_t TDRArrayBase::GetNumDims() const { return NumDimsOf(*this); }
int32_t TDRArrayBase::BoundedOrFixed() const { return CountWordOf(*this); }
bool TDRArrayBase::IsWellFormed() const { return WellFormed(*this); }
bool TDRArrayBase::IsColumnVector() const { return ColumnVector(*this); }

int32_t TDWArrayBase::GetDimSize(int32_t index) const { return DimSizeOf(*this, index); }
int32_t TDWArrayBase::GetNumDims() const { return NumDimsOf(*this); }
int32_t TDWArrayBase::BoundedOrFixed() const { return CountWordOf(*this); }
bool TDWArrayBase::IsWellFormed() const { return WellFormed(*this); }
bool TDWArrayBase::IsColumnVector() const { return ColumnVector(*this); }

int32_t TDWArrayBase::AddDim(int32_t word, int32_t position) {
  TDArrayBaseImp* array = WritableArray(*this);
  return array != nullptr ? array->AddDim(word, position) : kStatusNullHandle;
}

int32_t TDWArrayBase::RemoveDim(int32_t index) {
  TDArrayBaseImp* array = WritableArray(*this);
  return array != nullptr ? array->RemoveDim(index) : kStatusNullHandle;
}

int32_t TDWArrayBase::RemoveAllDims() {
  TDArrayBaseImp* array = WritableArray(*this);
  return array != nullptr ? array->RemoveAllDims() : kStatusNullHandle;
}

int32_t TDWArrayBase::SetNumDims(int32_t count) {
  TDArrayBaseImp* array = WritableArray(*this);
  return array != nullptr ? array->SetNumDims(count) : kStatusNullHandle;
}

int32_t TDWArrayBase::SetDimSize(int32_t index, int32_t word) {
  TDArrayBaseImp* array = WritableArray(*this);
  return array != nullptr ? array->SetDimSize(index, word) : kStatusNullHandle;
}

bool TDWArrayBase::SetIsColumnVector(bool columnVector) {
  TDArrayBaseImp* array = WritableArray(*this);
  if (array == nullptr) return false;
  const bool old = (array->Flags() & kTDFlagColumnVector) != 0;
  if (columnVector) {
    array->SetFlagBits(kTDFlagColumnVector);
  } else {
    array->ClearFlagBits(kTDFlagColumnVector);
  }
  return old;
}

TDRArray::TDRArray(int32_t nDims, const TDR& elt, const uint8_t* name)
    : TDRTyped(vellum::detail::CheckInNew(NewArrayOf(TypeCode::Array, nDims, elt.GetImpPtr(), name)), 1) {}
TDWArray::TDWArray(int32_t nDims, const TD& elt, const uint8_t* name)
    : TDWTyped(NewArrayOf(TypeCode::Array, nDims, elt.GetImpPtr(), name), 1) {}
TDRSubArray::TDRSubArray(int32_t nDims, const TDR& elt, const uint8_t* name)
    : TDRTyped(vellum::detail::CheckInNew(NewArrayOf(TypeCode::SubArray, nDims, elt.GetImpPtr(), name)), 1) {}
TDWSubArray::TDWSubArray(int32_t nDims, const TD& elt, const uint8_t* name)
    : TDWTyped(NewArrayOf(TypeCode::SubArray, nDims, elt.GetImpPtr(), name), 1) {}
TDRArrayDataPtr::TDRArrayDataPtr(int32_t nDims, const TDR& elt, const uint8_t* name)
    : TDRTyped(vellum::detail::CheckInNew(NewArrayOf(TypeCode::ArrayDataPtr, nDims, elt.GetImpPtr(), name)), 1) {}
TDWArrayDataPtr::TDWArrayDataPtr(int32_t nDims, const TD& elt, const uint8_t* name)
    : TDWTyped(NewArrayOf(TypeCode::ArrayDataPtr, nDims, elt.GetImpPtr(), name), 1) {}

TDRSubArray TDRArray::ConvertToSubArray() const {
  return TDRSubArray(vellum::detail::CheckInNew(ConvertArrayKind(*this, TypeCode::SubArray)), 1);
}
TDWSubArray TDWArray::ConvertToSubArray() const { return TDWSubArray(ConvertArrayKind(*this, TypeCode::SubArray), 1); }
TDRArray TDRSubArray::ConvertToArray() const {
  return TDRArray(vellum::detail::CheckInNew(ConvertArrayKind(*this, TypeCode::Array)), 1);
}
TDWArray TDWSubArray::ConvertToArray() const { return TDWArray(ConvertArrayKind(*this, TypeCode::Array), 1); }

void* TDRArray::GetFirstElementPtr(UHandle handle, ITargetPlatformAlignment* platform) const {
  const TDArrayBaseImp* array = AsArrayBase(GetImp());
  if (handle == nullptr || array == nullptr || !array->GetElt()) return nullptr;
  return At(*handle, array->GetElt()->AlignDatumCore(kDimWordSize * array->GetNumDims(), platform));
}

int32_t TDRSubArray::GetArrayPtrOffset(ITargetPlatformAlignment* platform) const {
  return RecordOffset(*this, 0, platform, RecordPart::kDataPtr);
}
int32_t TDRSubArray::GetDimSizeOffset(int32_t dim, ITargetPlatformAlignment* platform) const {
  return RecordOffset(*this, dim, platform, RecordPart::kDimSize);
}
int32_t TDRSubArray::GetStrideOffset(int32_t dim, ITargetPlatformAlignment* platform) const {
  return RecordOffset(*this, dim, platform, RecordPart::kStride);
}

int32_t ArrayTypeDimSize(const TD& type, int32_t index) { return DimSizeOf(type, index); }
int32_t ArrayTypeNDims(const TD& type) { return NumDimsOf(type); }

int32_t FixedArrayTDR(const TDRArrayBase& type, int32_t* err) {
  if (err != nullptr) *err = kStatusNoError;
  const TDArrayBaseImp* array = AsArrayBase(type.GetImp());
  if (array == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "This is not an array type!");
    if (err != nullptr) *err = kStatusNullHandle;
    return 0;
  }
  bool overflow = false;
  const int32_t word = array->CountWord(&overflow);
  if (overflow) {
    if (err != nullptr) *err = kStatusBadArgument;
    return 0;
  }
  return IsFixed(word) && word != kCountWordMalformed ? Length(word) : 0;
}

// --- type strings ----------------------------------------------------------------------------------

int32_t TDArrayBaseImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  if (!hasDims_ || dims_.size() > UINT16_MAX) {
    writer->SetError(kStatusNullHandle);
    return kStatusNullHandle;
  }
  writer->WriteU16(static_cast<uint16_t>(dims_.size()));
  for (const int32_t word : dims_) writer->WriteI32(word);
  return TDSingleContainerImp::FlattenTDPartsForSaving(writer);
}

int32_t TDArrayBaseImp::ConstructTD(TDDataReader* reader) {
  uint16_t count = 0;
  if (const int32_t status = reader->ReadU16(&count); status != kStatusNoError) return status;
  // Each word takes four bytes: a count the input cannot hold is damage, found before allocating.
  if (static_cast<size_t>(count) * 4 > reader->BytesLeft()) {
    reader->SetError(kStatusCorruptData);
    return kStatusCorruptData;
  }
  if (const int32_t status = InitDims(count); status != kStatusNoError) return status;
  for (int32_t i = 0; i < count; ++i) {
    int32_t word = 0;
    if (const int32_t status = reader->ReadI32(&word); status != kStatusNoError) return status;
    dims_[static_cast<size_t>(i)] = word;
  }
  ClearHashValid();
  return TDSingleContainerImp::ConstructTD(reader);
}
