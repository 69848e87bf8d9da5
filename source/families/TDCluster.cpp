// Clusters: in-place layout and element offsets, default data, reset, disposal, verification,
// copy (as a block, element by element, or into the other Boolean width), conversion into
// clusters and vectors, compatibility, the factory, handles and the shared empty cluster.
#include "source/families/TDCluster.h"

#include "source/streams/KoDataReader.h"
#include "source/streams/KoDataWriter.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXStrings.h"
#include "source/families/TDStringBase.h"
#include "runtime/MoveBytes.h"
#include "source/model/TDAttributes.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"

VELLUM_DIAGNOSTIC_MODULE("TDCluster");

namespace {

constexpr int64_t kMaxDataSize = std::numeric_limits<int32_t>::max();

int32_t MaxAlignmentOf(ITargetPlatformAlignment* platform) {
  return platform != nullptr ? platform->MaxAlignment() : GetDSAlign();
}

// A cache entry: the SetDSAlign value it belongs to (plus one, so that 0 means none) and the value.
uint64_t CacheEntry(int32_t dsAlign, int32_t value) {
  return (static_cast<uint64_t>(static_cast<uint32_t>(dsAlign) + 1u) << 32) | static_cast<uint32_t>(value);
}

bool CacheHit(uint64_t entry, int32_t dsAlign, int32_t* value) {
  if (entry == 0 || (entry >> 32) != static_cast<uint64_t>(static_cast<uint32_t>(dsAlign) + 1u)) return false;
  *value = static_cast<int32_t>(static_cast<uint32_t>(entry));
  return true;
}

// Walks the elements of a container in order with their offsets in a datum. Absent elements are
// visited too (with no element and no size), so that two cursors over clusters of the same
// element count stay at the same index.
class EltCursor {
 public:
  EltCursor(const TDContainerImp& container, ITargetPlatformAlignment* platform)
      : container_(container), platform_(platform), count_(container.GetNumElts()) {}

  bool Next() {
    if (++index_ >= count_) return false;
    element_ = container_.GetEltImpPtr(index_).get();
    if (element_ != nullptr) {
      offset_ = element_->AlignDatumCore(end_, platform_);
      size_ = element_->DataSizeCore(platform_);
    } else {
      offset_ = end_;
      size_ = 0;
    }
    end_ = offset_ + size_;
    return true;
  }

  int32_t Index() const { return index_; }
  const TDImp* Element() const { return element_; }
  int64_t Offset() const { return offset_; }
  int64_t Size() const { return size_; }
  // Where the elements so far end.
  int64_t End() const { return end_; }

 private:
  const TDContainerImp& container_;
  ITargetPlatformAlignment* platform_;
  int32_t count_;
  int32_t index_ = -1;
  const TDImp* element_ = nullptr;
  int64_t offset_ = 0;
  int64_t size_ = 0;
  int64_t end_ = 0;
};

uint8_t* At(void* data, int64_t offset) { return static_cast<uint8_t*>(data) + offset; }
const uint8_t* At(const void* data, int64_t offset) { return static_cast<const uint8_t*>(data) + offset; }

// The part of [begin, begin + size) below `end`; null `end` means no limit. Compared as
// addresses, since `end` may lie anywhere.
void* CutEnd(void* begin, int64_t size, void* end) {
  const uintptr_t elementEnd = reinterpret_cast<uintptr_t>(begin) + static_cast<uintptr_t>(size);
  if (end == nullptr) return reinterpret_cast<void*>(elementEnd);
  return reinterpret_cast<void*>(std::min(elementEnd, reinterpret_cast<uintptr_t>(end)));
}

bool Below(const void* p, const void* end) {
  return end == nullptr || reinterpret_cast<uintptr_t>(p) < reinterpret_cast<uintptr_t>(end);
}

// Copies between the two Boolean widths along two clusters of the same shape: `dstType` is
// `srcType` after the mutation, so nested clusters follow the direction chosen at the top.
int32_t CopyBooleanForm(const TDImp& srcType, const TDImp& dstType, const void* src, void* dst, int32_t flags,
                        const KoContext* context) {
  if (srcType.IsBool() != 0 && dstType.IsBoolU16() != 0) {
    const uint16_t value = *static_cast<const uint8_t*>(src) != 0 ? 1 : 0;
    std::memcpy(dst, &value, sizeof value);
    return kStatusNoError;
  }
  if (srcType.IsBoolU16() != 0 && dstType.IsBool() != 0) {
    uint16_t value = 0;
    std::memcpy(&value, src, sizeof value);
    *static_cast<uint8_t*>(dst) = value != 0 ? 1 : 0;
    return kStatusNoError;
  }
  const TDClusterImp* from = AsCluster(&srcType);
  const TDClusterImp* into = AsCluster(&dstType);
  if (from == nullptr || into == nullptr || from->GetNumElts() != into->GetNumElts()) {
    return srcType.CopyData(src, dst, flags, context);
  }
  EltCursor source(*from, nullptr);
  EltCursor target(*into, nullptr);
  while (source.Next() && target.Next()) {
    if (source.Element() == nullptr || target.Element() == nullptr) continue;
    const int32_t status = CopyBooleanForm(*source.Element(), *target.Element(), At(src, source.Offset()),
                                           At(dst, target.Offset()), flags, context);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

void ReportNotACluster() { DebugReport(kDiagnosticModule, __LINE__, 3, "CopyDataConvert:  destination is not a cluster!"); }



EmptyTypeFactory<TDClusterImp> gClusterFactory;

// Announced as the library loads; the service registers it in this place at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(10, static_cast<uint16_t>(TypeCode::Cluster), &gClusterFactory);
  return true;
}();

}  // namespace

// --- identity and kind -----------------------------------------------------------------------------

TDImpPtr TDClusterImp::NewInstance() const { return MakeCounted<TDClusterImp>(); }

int32_t TDClusterImp::IsNumericClust() const {
  const int32_t count = GetNumElts();
  if (count == 0) return 0;
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (!element || element->IsNumeric() == 0) return 0;
  }
  return 1;
}

int32_t TDClusterImp::IsErrorCluster(int32_t strict) const {
  if (GetNumElts() != 3) return 0;
  const TDImpPtr& status = GetEltImpPtr(0);
  const TDImpPtr& code = GetEltImpPtr(1);
  const TDImpPtr& source = GetEltImpPtr(2);
  if (!status || !code || !source) return 0;
  if (status->IsBool() == 0 || code->GetTypeCode() != static_cast<int16_t>(TypeCode::Int32) ||
      source->IsStringOnly() == 0) {
    return 0;
  }
  if (strict == 0) return 1;
  auto named = [](const TDImpPtr& element, const char* expected) {
    uint8_t pascal[256] = {};
    CToPStr(reinterpret_cast<const uint8_t*>(expected), pascal);
    const TDNameImpPtr& label = element->GetNameImpPtr();
    return label && PStrCmp(label->GetNamePStr(), pascal) == 0;
  };
  return named(status, "status") && named(code, "code") && named(source, "source") ? 1 : 0;
}

int32_t TDClusterImp::IsSemiGeneric() const {
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (element && (element->IsGeneric() != 0 || element->IsSemiGeneric() != 0)) return 1;
  }
  return 0;
}

int32_t TDClusterImp::DefinedType(int32_t how) const {
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (!element || element->DefinedType(how) == 0) return 0;
  }
  return 1;
}

void TDClusterImp::PrintDebugStr(const uint8_t* prefix) const {
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "type = cluster").Process();
  TDMultiContainerImp::PrintDebugStr(prefix);
}

// --- layout ----------------------------------------------------------------------------------------

int32_t TDClusterImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  const bool cacheable = platform == nullptr && IsReadOnlyTD() != 0;
  const int32_t dsAlign = GetDSAlign();
  int32_t cached = 0;
  if (cacheable && CacheHit(sizeCache_.load(std::memory_order_acquire), dsAlign, &cached)) return cached;

  EltCursor cursor(*this, platform);
  while (cursor.Next()) {
  }
  const int64_t size = std::min(AlignDatumCore(cursor.End(), platform), kMaxDataSize);
  if (cacheable) sizeCache_.store(CacheEntry(dsAlign, static_cast<int32_t>(size)), std::memory_order_release);
  return static_cast<int32_t>(size);
}

int32_t TDClusterImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  const int32_t max = MaxAlignmentOf(platform);
  if (max < 2) return max;
  const bool cacheable = platform == nullptr && IsReadOnlyTD() != 0;
  int32_t cached = 0;
  if (cacheable && CacheHit(alignmentCache_.load(std::memory_order_acquire), max, &cached)) return cached;
  if (platform != nullptr && platform->AggregateAlignmentMode() == 1) return max;

  int32_t result = 1;
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count && result < max; ++i) {
    if (const TDImpPtr& element = GetEltImpPtr(i)) result = std::max(result, element->GetAlignment(platform));
  }
  if (cacheable) alignmentCache_.store(CacheEntry(max, result), std::memory_order_release);
  return result;
}

DataShapes TDClusterImp::DataShapeOf(int32_t) const {
  const bool cacheable = IsReadOnlyTD() != 0;
  if (cacheable) {
    const int32_t cached = shapeCache_.load(std::memory_order_acquire);
    if (cached >= 0) return static_cast<DataShapes>(cached);
  }
  DataShapes shape = kDataShapePlain;
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (element && element->DataShapeOf(1) != kDataShapePlain) {
      shape = kDataShapeHandles;
      break;
    }
  }
  if (cacheable) shapeCache_.store(shape, std::memory_order_release);
  return shape;
}

int32_t TDClusterImp::IsFlatDataFixedSize() const {
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (element && element->IsFlatDataFixedSize() == 0) return 0;
  }
  return 1;
}

int32_t TDClusterImp::GetEltOffset(int32_t index, ITargetPlatformAlignment* platform) const {
  if (index <= 0 || index >= GetNumElts()) return 0;
  if (platform == nullptr && HasRecordedLayout()) return offsets_[static_cast<size_t>(index)];
  EltCursor cursor(*this, platform);
  while (cursor.Next() && cursor.Index() < index) {
  }
  return static_cast<int32_t>(std::min(cursor.Offset(), kMaxDataSize));
}

int32_t TDClusterImp::GetNumEltsDeep() const {
  const int32_t count = GetNumElts();
  int32_t deep = count;
  for (int32_t i = 0; i < count; ++i) {
    if (const TDClusterImp* nested = AsCluster(GetEltImpPtr(i).get())) deep += nested->GetNumEltsDeep();
  }
  return deep;
}

int32_t TDClusterImp::ForEachEltOffset(EltOffsetVisit visit, void* context) const {
  const bool recorded = HasRecordedLayout();
  EltCursor cursor(*this, nullptr);
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    int64_t offset = 0;
    if (recorded) {
      offset = offsets_[static_cast<size_t>(i)];
    } else {
      cursor.Next();
      offset = cursor.Offset();
    }
    const TDImp* element = GetEltImpPtr(i).get();
    if (element == nullptr) continue;
    const int32_t result = visit(context, *element, offset);
    if (result != 0) return result;
  }
  return 0;
}

// --- recorded layout -------------------------------------------------------------------------------

int32_t TDClusterImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDMultiContainerImp::MemberCheckIn(target);
  if (status != kStatusNoError) return status;
  return static_cast<TDClusterImp&>(*target).RecordLayout();
}

int32_t TDClusterImp::RecordLayout() {
  const int32_t dsAlign = GetDSAlign();
  layoutDSAlign_ = -1;
  plainDataSize_ = -1;
  offsets_.clear();
  steps_.clear();
  try {
    offsets_.reserve(static_cast<size_t>(GetNumElts()));
    EltCursor cursor(*this, nullptr);
    while (cursor.Next()) {
      const auto offset = static_cast<int32_t>(std::min(cursor.Offset(), kMaxDataSize));
      const auto end = static_cast<int32_t>(std::min(cursor.End(), kMaxDataSize));
      offsets_.push_back(offset);
      const TDImp* element = cursor.Element();
      if (element == nullptr || end == offset) continue;
      if (element->DataShapeOf(1) != kDataShapePlain) {
        const auto* text = dynamic_cast<const TDStringImp*>(element);
        const bool variableString = text != nullptr && vellum::bound::IsVariable(text->GetBound());
        steps_.push_back(DataStep{element, offset, end - offset, variableString});
      } else if (!steps_.empty() && steps_.back().element == nullptr) {
        // Bytes next to bytes (padding between them included) move as one run.
        steps_.back().size = end - steps_.back().offset;
      } else {
        steps_.push_back(DataStep{nullptr, offset, end - offset});
      }
    }
  } catch (const std::bad_alloc&) {
    offsets_.clear();
    steps_.clear();
    return kStatusOutOfMemory;
  }
  const bool handles =
      std::any_of(steps_.begin(), steps_.end(), [](const DataStep& step) { return step.element != nullptr; });
  if (!handles) plainDataSize_ = DataSizeCore(nullptr);
  layoutDSAlign_ = dsAlign;
  return RecordFlatPlan();
}

template <class Step>
int32_t TDClusterImp::ForEachDataStep(Step step) const {
  if (HasRecordedLayout()) {
    for (const DataStep& s : steps_) {
      const int32_t status = step(s.element, static_cast<int64_t>(s.offset), static_cast<int64_t>(s.size));
      if (status != kStatusNoError) return status;
    }
    return kStatusNoError;
  }
  EltCursor cursor(*this, nullptr);
  while (cursor.Next()) {
    const TDImp* element = cursor.Element();
    if (element == nullptr || cursor.Size() == 0) continue;
    const TDImp* handles = element->DataShapeOf(1) != kDataShapePlain ? element : nullptr;
    const int32_t status = step(handles, cursor.Offset(), cursor.Size());
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

// --- data ------------------------------------------------------------------------------------------

int32_t TDClusterImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty == 0) TDImpClearMemory(data, this, clearFirst);
  EltCursor cursor(*this, nullptr);
  int32_t status = kStatusNoError;
  while (cursor.Next()) {
    if (cursor.Element() == nullptr) continue;
    status = cursor.Element()->InflateDefData(At(data, cursor.Offset()), onlyIfEmpty, clearFirst, flags);
    if (status != kStatusNoError) break;
  }
  if (status == kStatusNoError || onlyIfEmpty != 0) return status;

  // The caller's memory held no value before: give back what the earlier elements took, so that
  // a failed inflation leaks nothing, and leave a datum that every operation accepts.
  const int32_t failed = cursor.Index();
  EltCursor undo(*this, nullptr);
  while (undo.Next() && undo.Index() < failed) {
    if (undo.Element() == nullptr) continue;
    void* element = At(data, undo.Offset());
    undo.Element()->DeflateData(element, At(data, undo.End()), 1, NormalHandleAllocator());
  }
  TDImpClearMemory(data, this, 1);
  return status;
}

int32_t TDClusterImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  if (DataShapeOf(1) == kDataShapePlain) {
    TDImpClearMemory(data, this, 1);
    return kStatusNoError;
  }
  return ForEachDataStep([data](const TDImp* element, int64_t offset, int64_t size) {
    if (element != nullptr) return element->ResetToDefaultData(At(data, offset));
    ClearMem(At(data, offset), static_cast<size_t>(size));
    return kStatusNoError;
  });
}

int32_t TDClusterImp::DeflateData(void* data, void* end, int32_t dispose,
                                  const HandleAllocationInterface& allocator) const {
  if (data == nullptr || !Below(data, end) || DataShapeOf(1) == kDataShapePlain) return 0;
  int32_t released = 0;
  ForEachDataStep([&](const TDImp* element, int64_t offset, int64_t size) {
    if (element == nullptr) return kStatusNoError;
    void* at = At(data, offset);
    if (!Below(at, end)) return kStatusBadArgument;  // stops the walk
    released += element->DeflateData(at, CutEnd(at, size, end), dispose, allocator);
    return kStatusNoError;
  });
  return released;
}

int32_t TDClusterImp::ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const {
  if (data == nullptr || !Below(data, end) || DataShapeOf(1) == kDataShapePlain) return 0;
  int32_t released = 0;
  ForEachDataStep([&](const TDImp* element, int64_t offset, int64_t size) {
    if (element == nullptr) return kStatusNoError;
    void* at = At(data, offset);
    if (!Below(at, end)) return kStatusBadArgument;  // stops the walk
    released += element->ShrinkData(at, CutEnd(at, size, end), flag, allocator);
    return kStatusNoError;
  });
  return released;
}

int32_t TDClusterImp::VerifyData(const void* data, const KoContext* context) const {
  if (data == nullptr || DataShapeOf(1) == kDataShapePlain) return kStatusNoError;
  return ForEachDataStep([&](const TDImp* element, int64_t offset, int64_t) {
    if (element == nullptr) return kStatusNoError;
    const int32_t status = element->VerifyData(At(data, offset), context);
    if (status != kStatusNoError) WriteVerifyDataMessage(status, *this, data, offset);
    return status;
  });
}

int32_t TDClusterImp::CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  if ((flags & kCopyFlagBooleanForm) != 0 || !HasRecordedLayout()) return CopyDataWalk(src, dst, flags, context);
  // The interned cluster's copy plan: runs of plain bytes and the handle-bearing elements' own
  // copy slots, with no descriptor walk.
  if (plainDataSize_ >= 0) {
    MoveBytes(dst, src, static_cast<size_t>(plainDataSize_));
    return kStatusNoError;
  }
  for (const DataStep& s : steps_) {
    void* into = At(dst, s.offset);
    const void* from = At(src, s.offset);
    if (s.element == nullptr) {
      MoveBytes(into, from, static_cast<size_t>(s.size));
      continue;
    }
    if (s.variableString && MoveSameLengthLStr(from, into)) continue;
    const int32_t status = s.element->CopyData(from, into, flags, context);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

int32_t TDClusterImp::CopyDataWalk(const void* src, void* dst, int32_t flags, const KoContext* context) const {
  if ((flags & kCopyFlagBooleanForm) != 0) {
    TDImpPtr mutated = CloneOrCheckOut();
    if (!mutated) return kStatusOutOfMemory;
    const int32_t toSixteenBit = TD(TDImpPtr(const_cast<TDClusterImp*>(this)), 1).ContainsBooleanTD();
    mutated->MutateBooleanTD(&mutated, toSixteenBit);
    return CopyBooleanForm(*this, *mutated, src, dst, flags, context);
  }
  if (DataShapeOf(1) == kDataShapePlain) {
    MoveBlock(src, dst, static_cast<size_t>(DataSizeCore(nullptr)));
    return kStatusNoError;
  }
  // Data without handles is its bytes, as a cluster of such elements is copied as one block.
  return ForEachDataStep([&](const TDImp* element, int64_t offset, int64_t size) {
    if (element != nullptr) return element->CopyData(At(src, offset), At(dst, offset), flags, context);
    MoveBlock(At(src, offset), At(dst, offset), static_cast<size_t>(size));
    return kStatusNoError;
  });
}

int32_t TDClusterImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  if (dst == nullptr) return kStatusNullHandle;
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  if (dst == this && (flags & (kCopyFlagBooleanForm | kCopyFlagSkipArrays)) == 0) {
    return CopyData(src, dstData, flags, nullptr);
  }

  if (const TDClusterImp* into = AsCluster(dst)) {
    const int32_t count = GetNumElts();
    if (into->GetNumElts() != count) {
      (VELLUM_DEBUG(3) << "CopyDataConvert elts=" << into->GetNumElts() << ", eltsSrc=" << count).Process();
      return kStatusBadArgument;
    }
    const int32_t passed = flags & ~kCopyFlagSkipArrays;
    EltCursor source(*this, nullptr);
    EltCursor target(*into, nullptr);
    while (source.Next() && target.Next()) {
      const TDImp* from = source.Element();
      const TDImp* to = target.Element();
      if (from == nullptr || to == nullptr) continue;
      if ((flags & kCopyFlagSkipArrays) != 0 && from->IsArray() != 0) continue;
      const int32_t status =
          CopyDataConvertImp(from, to, At(src, source.Offset()), At(dstData, target.Offset()), passed);
      if (status != kStatusNoError) return status;
    }
    return kStatusNoError;
  }

  if (dst->IsArrayOnly() != 0) {
    const TDSingleContainerImp* vector = AsSingleContainer(dst);
    const TDImp* eltType = vector != nullptr ? vector->GetElt().get() : nullptr;
    if (eltType == nullptr) {
      ReportNotACluster();
      return kStatusBadArgument;
    }
    void* first = nullptr;
    const int32_t resized = vector->ResizeAsVector(dstData, GetNumElts(), &first);
    if (resized == kStatusBadArgument) {
      ReportNotACluster();
      return kStatusBadArgument;
    }
    if (resized != kStatusNoError) return resized;
    const int64_t eltSize = eltType->DataSizeCore(nullptr);
    EltCursor source(*this, nullptr);
    while (source.Next()) {
      if (source.Element() == nullptr) continue;
      const int32_t status = CopyDataConvertImp(source.Element(), eltType, At(src, source.Offset()),
                                                At(first, eltSize * source.Index()), flags);
      if (status != kStatusNoError) return status;
    }
    return kStatusNoError;
  }

  ReportNotACluster();
  return kStatusBadArgument;
}

DataOrder TDClusterImp::OrderData(const void* a, const void* b, const DataOrderOptions& options) const {
  if (options.bytewise != 0 && DataShapeOf(1) == kDataShapePlain) return OrderBytes(a, b);
  return {ForEachElt([&](const TDImp& element, int64_t offset) {
    return options.compareElement(element, At(a, offset), At(b, offset), options);
  })};
}

// --- compatibility ---------------------------------------------------------------------------------

int32_t TDClusterImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  // Sets and maps against a {UInt32, array} pair compare in their own family.
  const TDClusterImp* other = AsCluster(source);
  if (other == nullptr) return kCmpIncompatible;
  const int32_t count = GetNumElts();
  if (other->GetNumElts() != count) return kCmpEltCountsDiffer;
  // The second-pass mark belongs to the comparison of this pair, not of their elements.
  const int32_t passed = flags & ~kCmpFlagSecondPass;
  int32_t result = 0;
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& mine = GetEltImpPtr(i);
    const TDImpPtr& theirs = other->GetEltImpPtr(i);
    if (!mine || !theirs) {
      result |= kCmpIncompatible;
    } else if (mine.get() != theirs.get()) {
      result |= mine->CmpTDCommon(theirs.get(), passed);
    }
    if ((result & (kCmpEltCountsDiffer | kCmpDimsDiffer | kCmpIncompatible)) != 0) break;
  }
  return result;
}

// --- free functions and handles ----------------------------------------------------------------------

const TDClusterImp* AsCluster(const TDImp* type) {
  return type != nullptr && type->IsClust() != 0 ? static_cast<const TDClusterImp*>(type) : nullptr;
}

bool ClusterKind::Admit(const TDImp& type) { return type.IsClust() != 0; }
TDImpPtr ClusterKind::New(const uint8_t* name) { return MakeNamedTD<TDClusterImp>(name); }

namespace {

int32_t OffsetOf(const TD& type, int32_t index, ITargetPlatformAlignment* platform) {
  const TDClusterImp* cluster = AsCluster(type.GetImp());
  return cluster != nullptr ? cluster->GetEltOffset(index, platform) : 0;
}

int32_t OffsetByName(const TD& type, const uint8_t* name, ITargetPlatformAlignment* platform) {
  const TDClusterImp* cluster = AsCluster(type.GetImp());
  if (cluster == nullptr) return 0;
  uint8_t pascal[256] = {};
  CToPStr(name, pascal);
  const int32_t index = cluster->FindEltByName(pascal);
  if (index < 0) {
    (VELLUM_DEBUG(3) << "Could not find " << reinterpret_cast<const char*>(name != nullptr ? name : pascal + 1)
                     << " to get the offset!")
        .Process();
    return 0;
  }
  return cluster->GetEltOffset(index, platform);
}

int32_t OffsetByNameDebug(const TD& type, const uint8_t* name, ITargetPlatformAlignment* platform, int32_t expected) {
  const int32_t offset = OffsetByName(type, name, platform);
  if (platform != nullptr || offset == expected) return offset;
  (VELLUM_DEBUG(3) << "Unexpected offset for " << reinterpret_cast<const char*>(name != nullptr ? name : EmptyPStr() + 1)
                   << ": " << offset << " Expected: " << expected)
      .Process();
  return expected;
}

int32_t NumEltsDeep(const TD& type) {
  const TDClusterImp* cluster = AsCluster(type.GetImp());
  return cluster != nullptr ? cluster->GetNumEltsDeep() : 0;
}

}  // namespace

int32_t TDRCluster::GetEltOffset(int32_t index, ITargetPlatformAlignment* platform) const {
  return OffsetOf(*this, index, platform);
}
int32_t TDRCluster::GetEltOffsetByName(const uint8_t* name, ITargetPlatformAlignment* platform) const {
  return OffsetByName(*this, name, platform);
}
int32_t TDRCluster::GetEltOffsetByNameDebug(const uint8_t* name, ITargetPlatformAlignment* platform,
                                            int32_t expected) const {
  return OffsetByNameDebug(*this, name, platform, expected);
}
void* TDRCluster::GetEltPtr(int32_t index, void* data) const {
  return data != nullptr ? At(data, OffsetOf(*this, index, nullptr)) : nullptr;
}
const void* TDRCluster::GetEltPtr(int32_t index, const void* data) const {
  return data != nullptr ? At(data, OffsetOf(*this, index, nullptr)) : nullptr;
}
int32_t TDRCluster::GetNumEltsDeep() const { return NumEltsDeep(*this); }

int32_t TDWCluster::GetEltOffset(int32_t index, ITargetPlatformAlignment* platform) const {
  return OffsetOf(*this, index, platform);
}
int32_t TDWCluster::GetEltOffsetByName(const uint8_t* name, ITargetPlatformAlignment* platform) const {
  return OffsetByName(*this, name, platform);
}
int32_t TDWCluster::GetEltOffsetByNameDebug(const uint8_t* name, ITargetPlatformAlignment* platform,
                                            int32_t expected) const {
  return OffsetByNameDebug(*this, name, platform, expected);
}
void* TDWCluster::GetEltPtr(int32_t index, void* data) const {
  return data != nullptr ? At(data, OffsetOf(*this, index, nullptr)) : nullptr;
}
const void* TDWCluster::GetEltPtr(int32_t index, const void* data) const {
  return data != nullptr ? At(data, OffsetOf(*this, index, nullptr)) : nullptr;
}
int32_t TDWCluster::GetNumEltsDeep() const { return NumEltsDeep(*this); }

TDWCluster& TDWCluster::operator<<(const TD& element) {
  if (vellum::detail::AppendInChain(*this, element)) return *this;
  static TDWCluster broken(TDImpPtr(), 0);
  return broken;
}

const TDR& GetClust0TD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDClusterImp>()); });
}

// --- flattened data --------------------------------------------------------------------------------

uint32_t TDClusterImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  if (HasFlatPlan()) return static_cast<uint32_t>(std::min<uint64_t>(PlannedFlatSize(static_cast<const uint8_t*>(data)), UINT32_MAX));
  uint64_t size = 0;
  ForEachElt([&](const TDImp& element, int64_t offset) {
    size += element.FlatDataSize(writer, data != nullptr ? At(data, offset) : nullptr);
    return 0;
  });
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDClusterImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (count > 0 && data == nullptr) writer->SetError(kStatusBadArgument);
  if (HasFlatPlan() && !writer->IsOnlyDeterminingSize()) {
    if (writer->GetError() == kStatusNoError) WriteWithPlan(writer, data, count);
  } else {
    const int64_t stride = DataSizeCore(nullptr);
    for (int32_t v = 0; v < count && writer->GetError() == kStatusNoError; ++v) {
      const uint8_t* value = At(data, stride * v);
      ForEachElt([&](const TDImp& element, int64_t offset) {
        element.WriteData(writer, At(value, offset), 1, nullptr);
        return writer->GetError();
      });
    }
  }
}

void TDClusterImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  if (HasFlatPlan() && data != nullptr) {
    if (reader->GetError() == kStatusNoError) ReadWithPlan(reader, data, count);
  } else {
    const int64_t stride = DataSizeCore(nullptr);
    for (int32_t v = 0; v < count && reader->GetError() == kStatusNoError; ++v) {
      uint8_t* value = data != nullptr ? At(data, stride * v) : nullptr;
      ForEachElt([&](const TDImp& element, int64_t offset) {
        element.ReadData(reader, value != nullptr ? At(value, offset) : nullptr, 1, nullptr);
        return reader->GetError();
      });
    }
  }
}

// --- the flat plan ---------------------------------------------------------------------------------

namespace {

// The part size of a plain number kind whose flattened form is its bytes in the stream's order;
// 0 for any other kind. Complex kinds count their parts.
int32_t PlainNumberParts(const TDImp& element, uint8_t* partSize) {
  if (element.IsBasicNumeric() == 0) return 0;
  switch (static_cast<TypeCode>(element.GetTypeCode() & ~0x10)) {
    case TypeCode::Int8:
    case TypeCode::UInt8: *partSize = 1; return 1;
    case TypeCode::Int16:
    case TypeCode::UInt16: *partSize = 2; return 1;
    case TypeCode::Int32:
    case TypeCode::UInt32:
    case TypeCode::Float32: *partSize = 4; return 1;
    case TypeCode::Int64:
    case TypeCode::UInt64:
    case TypeCode::Float64: *partSize = 8; return 1;
    case TypeCode::Complex64: *partSize = 4; return 2;
    case TypeCode::Complex128: *partSize = 8; return 2;
    default: return 0;
  }
}

[[gnu::always_inline]] inline void PutPart(uint8_t* into, const uint8_t* from, uint8_t size, bool swap) {
  switch (size) {
    case 1: *into = *from; return;
    case 2: {
      uint16_t v;
      std::memcpy(&v, from, 2);
      if (swap) v = static_cast<uint16_t>((v >> 8) | (v << 8));
      std::memcpy(into, &v, 2);
      return;
    }
    case 4: {
      uint32_t v;
      std::memcpy(&v, from, 4);
      if (swap) v = __builtin_bswap32(v);
      std::memcpy(into, &v, 4);
      return;
    }
    default: {
      uint64_t v;
      std::memcpy(&v, from, 8);
      if (swap) v = __builtin_bswap64(v);
      std::memcpy(into, &v, 8);
      return;
    }
  }
}

int32_t StringLength(const uint8_t* slot) {
  const auto h = Load<LStrHandle>(slot);
  return h != nullptr ? std::max((*h)->cnt, 0) : 0;
}

}  // namespace

int32_t TDClusterImp::RecordFlatPlan() {
  flatFixedBytes_ = -1;
  flatSteps_.clear();
  int32_t fixed = 0;
  bool plain = true;
  try {
    ForEachElt([&](const TDImp& element, int64_t offset) {
      uint8_t size = 0;
      const int32_t parts = PlainNumberParts(element, &size);
      for (int32_t p = 0; p < parts; ++p) {
        flatSteps_.push_back(FlatStep{static_cast<int32_t>(offset + p * size), size});
        fixed += size;
      }
      if (parts != 0) return 0;
      const auto* text = dynamic_cast<const TDStringImp*>(&element);
      if (text != nullptr && vellum::bound::IsVariable(text->GetBound())) {
        flatSteps_.push_back(FlatStep{static_cast<int32_t>(offset), 0});
        fixed += 4;
        return 0;
      }
      plain = false;
      return 1;
    });
  } catch (const std::bad_alloc&) {
    flatSteps_.clear();
    return kStatusOutOfMemory;
  }
  if (!plain || GetNumElts() == 0) {
    flatSteps_.clear();
    return kStatusNoError;
  }
  flatFixedBytes_ = fixed;
  return kStatusNoError;
}

uint64_t TDClusterImp::PlannedFlatSize(const uint8_t* value) const {
  uint64_t size = static_cast<uint64_t>(flatFixedBytes_);
  if (value == nullptr) return size;
  for (const FlatStep& step : flatSteps_)
    if (step.size == 0) size += static_cast<uint64_t>(StringLength(value + step.offset));
  return size;
}

int32_t TDClusterImp::WriteWithPlan(KoDataWriter* writer, const void* data, int32_t count) const {
  const int64_t stride = DataSizeCore(nullptr);
  const auto* values = static_cast<const uint8_t*>(data);
  uint64_t total = 0;
  for (int32_t v = 0; v < count; ++v) total += PlannedFlatSize(values + stride * v);
  uint8_t* out = writer->ReserveBytes(static_cast<size_t>(total));
  if (out == nullptr) return writer->GetError();
  const bool swap = writer->GetEndianizer()->Swaps();
  for (int32_t v = 0; v < count; ++v) {
    const uint8_t* value = values + stride * v;
    for (const FlatStep& step : flatSteps_) {
      if (step.size != 0) {
        PutPart(out, value + step.offset, step.size, swap);
        out += step.size;
        continue;
      }
      const auto h = Load<LStrHandle>(value + step.offset);
      const int32_t length = h != nullptr ? std::max((*h)->cnt, 0) : 0;
      const uint32_t word = static_cast<uint32_t>(length);
      PutPart(out, reinterpret_cast<const uint8_t*>(&word), 4, swap);
      if (length != 0) std::memcpy(out + 4, (*h)->str, static_cast<size_t>(length));
      out += 4 + length;
    }
  }
  return writer->GetError();
}

int32_t TDClusterImp::ReadWithPlan(KoDataReader* reader, void* data, int32_t count) const {
  const int64_t stride = DataSizeCore(nullptr);
  auto* values = static_cast<uint8_t*>(data);
  const bool swap = reader->GetEndianizer()->Swaps();
  for (int32_t v = 0; v < count && reader->GetError() == kStatusNoError; ++v) {
    uint8_t* value = values + stride * v;
    for (const FlatStep& step : flatSteps_) {
      if (step.size == 0) {
        auto h = Load<LStrHandle>(value + step.offset);
        const int32_t status = ReadLStrValue(reader, vellum::bound::kVariable, &h);
        Store(value + step.offset, h);
        if (status != kStatusNoError) return status;
        continue;
      }
      const uint8_t* in = reader->TakeBytes(step.size);
      if (in == nullptr) {
        std::memset(value + step.offset, 0, step.size);
        return reader->GetError();
      }
      PutPart(value + step.offset, in, step.size, swap);
    }
  }
  return reader->GetError();
}
