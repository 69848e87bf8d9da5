// Blocks: identity, order, layout, data and conversion of sized, aligned, type, void and repeated
// blocks; their factories and handles; the registered subarray record clusters.
#include "source/families/TDBlock.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXStrings.h"
#include "source/model/TDAttributes.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDOtherHandles.h"

VELLUM_DIAGNOSTIC_MODULE("TDBlock");

namespace {

constexpr int64_t kMaxDataSize = std::numeric_limits<int32_t>::max();

void Report(const uint8_t* prefix, const char* text) {
  (VELLUM_DEBUG(0) << PrefixText(prefix) << text).Process();
}

// The difference of two values as an order, without overflow.
int32_t Order(int64_t a, int64_t b) {
  const int64_t difference = a - b;
  return static_cast<int32_t>(std::clamp<int64_t>(difference, std::numeric_limits<int32_t>::min(),
                                                  std::numeric_limits<int32_t>::max()));
}

void ReportCodes(const TDImp* dst, const TDImp& src) { ReportConversionCodes(kDiagnosticModule, __LINE__, dst, src); }

const TDSizedBlockImp* AsSizedBlock(const TDImp* type) {
  return type != nullptr && type->IsSizedBlock() != 0 ? static_cast<const TDSizedBlockImp*>(type) : nullptr;
}

// The element's comparison for block containers whose elements describe the bytes.
int32_t CompareElements(const TDSingleContainerImp& mine, const TDImp* source, int32_t flags) {
  const TDSingleContainerImp* other = AsSingleContainer(source);
  if (other == nullptr || other->GetTypeCode() != mine.GetTypeCode()) return kCmpIncompatible;
  const TDImp* a = mine.GetElt().get();
  const TDImp* b = other->GetElt().get();
  if (a == b) return 0;
  if (a == nullptr || b == nullptr) return kCmpIncompatible;
  return a->CmpTDCommon(b, flags & ~kCmpFlagSecondPass);
}



EmptyTypeFactory<TDBlockImp> gBlockFactory;
EmptyTypeFactory<TDAlignedBlockImp> gAlignedBlockFactory;
EmptyTypeFactory<TDTypeBlockImp> gTypeBlockFactory;
EmptyTypeFactory<TDVoidBlockImp> gVoidBlockFactory;
EmptyTypeFactory<TDRepeatedBlockImp> gRepeatedBlockFactory;

// Announced as the library loads; the service registers them in these places at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(5, static_cast<uint16_t>(TypeCode::Block), &gBlockFactory);
  AnnounceTypeFactory(6, static_cast<uint16_t>(TypeCode::AlignedBlock), &gAlignedBlockFactory);
  AnnounceTypeFactory(7, static_cast<uint16_t>(TypeCode::TypeBlock), &gTypeBlockFactory);
  AnnounceTypeFactory(8, static_cast<uint16_t>(TypeCode::VoidBlock), &gVoidBlockFactory);
  AnnounceTypeFactory(9, static_cast<uint16_t>(TypeCode::RepeatedBlock), &gRepeatedBlockFactory);
  return true;
}();

uint8_t* At(void* data, int64_t offset) { return static_cast<uint8_t*>(data) + offset; }
const uint8_t* At(const void* data, int64_t offset) { return static_cast<const uint8_t*>(data) + offset; }

}  // namespace

const TDRepeatedBlockImp* AsRepeatedBlock(const TDImp* type) {
  return type != nullptr && type->IsRepeatedBlock() != 0 ? static_cast<const TDRepeatedBlockImp*>(type) : nullptr;
}

// --- TDSizedBlockImp -------------------------------------------------------------------------------

int32_t TDSizedBlockImp::ComputeHashValue() const {
  return static_cast<int32_t>(static_cast<uint32_t>(TDImp::ComputeHashValue()) + static_cast<uint32_t>(blockSize_));
}

int32_t TDSizedBlockImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDImp::IsSameAs(other) == 0) return 0;
  const TDSizedBlockImp* that = AsSizedBlock(&other);
  return that != nullptr && that->blockSize_ == blockSize_ ? 1 : 0;
}

int32_t TDSizedBlockImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCloneOrCheckOut(target);
  static_cast<TDSizedBlockImp&>(*target).blockSize_ = blockSize_;
  return status;
}

int32_t TDSizedBlockImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCheckIn(target);
  static_cast<TDSizedBlockImp&>(*target).blockSize_ = blockSize_;
  target->ClearHashValid();
  return status;
}

int32_t TDSizedBlockImp::DataSizeCore(ITargetPlatformAlignment*) const { return std::max(blockSize_, 0); }

int32_t TDSizedBlockImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, static_cast<size_t>(DataSizeCore(nullptr)));
  return kStatusNoError;
}

int32_t TDSizedBlockImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  if (dst == nullptr || dst->GetTypeCode() != GetTypeCode()) {
    ReportCodes(dst, *this);
    return kStatusBadArgument;
  }
  const int32_t dstSize = dst->DataSizeCore(nullptr);
  const int32_t srcSize = DataSizeCore(nullptr);
  if (dstSize != srcSize) {
    (VELLUM_DEBUG(3) << "CopyDataConvert sz=" << dstSize << ", szSrc=" << srcSize).Process();
    return kStatusBadArgument;
  }
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  MoveBlock(src, dstData, static_cast<size_t>(srcSize));
  return kStatusNoError;
}

int32_t TDSizedBlockImp::CmpTD(const TDImp* source, int32_t, int32_t) const {
  const TDSizedBlockImp* other = AsSizedBlock(source);
  if (other == nullptr || other->GetTypeCode() != GetTypeCode() || other->blockSize_ != blockSize_) {
    return kCmpIncompatible;
  }
  return 0;
}

int32_t TDSizedBlockImp::CompareForSorting(const TDImp* other) const {
  const TDSizedBlockImp* that = AsSizedBlock(other);
  return that != nullptr ? Order(blockSize_, that->blockSize_) : 0;
}

void TDSizedBlockImp::SetBlockSize(int32_t size) {
  blockSize_ = size;
  ClearHashValid();
}

void TDSizedBlockImp::PrintSize(const uint8_t* prefix) const {
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "block size = " << blockSize_).Process();
}

// --- TDBlockImp and TDAlignedBlockImp --------------------------------------------------------------

TDImpPtr TDBlockImp::NewInstance() const { return MakeCounted<TDBlockImp>(); }

void TDBlockImp::PrintDebugStr(const uint8_t* prefix) const {
  Report(prefix, "type = block");
  PrintSize(prefix);
  TDImp::PrintDebugStr(prefix);
}

TDImpPtr TDAlignedBlockImp::NewInstance() const { return MakeCounted<TDAlignedBlockImp>(); }

int32_t TDAlignedBlockImp::ComputeHashValue() const {
  return static_cast<int32_t>(static_cast<uint32_t>(TDSizedBlockImp::ComputeHashValue()) + alignment_);
}

int32_t TDAlignedBlockImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDSizedBlockImp::IsSameAs(other) == 0 || other.IsAlignedBlock() == 0) return 0;
  return static_cast<const TDAlignedBlockImp&>(other).alignment_ == alignment_ ? 1 : 0;
}

int32_t TDAlignedBlockImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDSizedBlockImp::MemberCloneOrCheckOut(target);
  static_cast<TDAlignedBlockImp&>(*target).alignment_ = alignment_;
  return status;
}

int32_t TDAlignedBlockImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDSizedBlockImp::MemberCheckIn(target);
  static_cast<TDAlignedBlockImp&>(*target).alignment_ = alignment_;
  target->ClearHashValid();
  return status;
}

int32_t TDAlignedBlockImp::CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const {
  const int32_t result = TDSizedBlockImp::CmpTD(source, flags, bitsSoFar);
  if (result != 0) return result;
  return static_cast<const TDAlignedBlockImp*>(source)->alignment_ == alignment_ ? 0 : kCmpIncompatible;
}

int32_t TDAlignedBlockImp::CompareForSorting(const TDImp* other) const {
  const int32_t bySize = TDSizedBlockImp::CompareForSorting(other);
  if (bySize != 0 || other == nullptr || other->IsAlignedBlock() == 0) return bySize;
  return Order(alignment_, static_cast<const TDAlignedBlockImp*>(other)->alignment_);
}

void TDAlignedBlockImp::PrintDebugStr(const uint8_t* prefix) const {
  Report(prefix, "type = aligned block");
  PrintSize(prefix);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "alignment = " << alignment_).Process();
  TDImp::PrintDebugStr(prefix);
}

void TDAlignedBlockImp::SetStoredAlignment(uint16_t alignment) {
  alignment_ = alignment;
  ClearHashValid();
}

// --- TDBlockContainerImp ---------------------------------------------------------------------------

int32_t TDBlockContainerImp::ConvertBytes(const TDImp* dst, const void* src, void* dstData) const {
  if (dst == nullptr || dst->GetTypeCode() != GetTypeCode()) {
    ReportCodes(dst, *this);
    return kStatusBadArgument;
  }
  const int32_t dstSize = dst->DataSizeCore(nullptr);
  const int32_t srcSize = DataSizeCore(nullptr);
  if (dstSize > srcSize) {
    (VELLUM_DEBUG(3) << "CopyDataConvert block reallooc? tcDst=")
        .AppendHex32(static_cast<uint32_t>(dst->GetTypeCode()))
        .Append(", tcSrc=")
        .AppendHex32(static_cast<uint32_t>(GetTypeCode()))
        .Process();
    return kStatusBadArgument;
  }
  if (dstSize != srcSize) {
    (VELLUM_DEBUG(3) << "CopyDataConvert sz=" << dstSize << ", szSrc=" << srcSize).Process();
    return kStatusBadArgument;
  }
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  MoveBlock(src, dstData, static_cast<size_t>(srcSize));
  return kStatusNoError;
}

// --- TDStoredAlignmentBlockImp -----------------------------------------------------------------------

int32_t TDStoredAlignmentBlockImp::ComputeHashValue() const {
  return static_cast<int32_t>(static_cast<uint32_t>(TDBlockContainerImp::ComputeHashValue()) + alignment_);
}

int32_t TDStoredAlignmentBlockImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDBlockContainerImp::IsSameAs(other) == 0 || other.GetTypeCode() != GetTypeCode()) return 0;
  return static_cast<const TDStoredAlignmentBlockImp&>(other).alignment_ == alignment_ ? 1 : 0;
}

int32_t TDStoredAlignmentBlockImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  static_cast<TDStoredAlignmentBlockImp&>(*target).alignment_ = alignment_;
  return TDBlockContainerImp::MemberCloneOrCheckOut(target);
}

int32_t TDStoredAlignmentBlockImp::MemberCheckIn(TDImpPtr& target) const {
  static_cast<TDStoredAlignmentBlockImp&>(*target).alignment_ = alignment_;
  return TDBlockContainerImp::MemberCheckIn(target);
}

int32_t TDStoredAlignmentBlockImp::CompareForSorting(const TDImp* other) const {
  const int32_t byElement = TDBlockContainerImp::CompareForSorting(other);
  if (byElement != 0 || other == nullptr || other->GetTypeCode() != GetTypeCode()) return byElement;
  return Order(alignment_, static_cast<const TDStoredAlignmentBlockImp*>(other)->alignment_);
}

void TDStoredAlignmentBlockImp::SetAlignmentValue(uint16_t alignment) {
  alignment_ = alignment;
  ClearHashValid();
}

void TDStoredAlignmentBlockImp::PrintBlock(const uint8_t* prefix, const char* kind) const {
  Report(prefix, kind);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "alignment = " << alignment_).Process();
  TDBlockContainerImp::PrintDebugStr(prefix);
}

// --- TDTypeBlockImp --------------------------------------------------------------------------------

TDImpPtr TDTypeBlockImp::NewInstance() const { return MakeCounted<TDTypeBlockImp>(); }

int32_t TDTypeBlockImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  return GetElt() ? GetElt()->DataSizeCore(platform) : 0;
}

int32_t TDTypeBlockImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  const int32_t own = GetElt() ? GetElt()->GetAlignment(platform) : 1;
  const int32_t stored = GetStoredAlignment();
  if (stored == 0) return own;
  if (stored != own) {
    (VELLUM_DEBUG(3) << "TypeBlock alignment " << stored << " differs from its element's " << own).Process();
  }
  return stored;
}

int32_t TDTypeBlockImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, static_cast<size_t>(DataSizeCore(nullptr)));
  return kStatusNoError;
}

int32_t TDTypeBlockImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertBytes(dst, src, dstData);
}

int32_t TDTypeBlockImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  return CompareElements(*this, source, flags);
}

void TDTypeBlockImp::PrintDebugStr(const uint8_t* prefix) const { PrintBlock(prefix, "type = type block"); }

// --- TDVoidBlockImp --------------------------------------------------------------------------------

TDImpPtr TDVoidBlockImp::NewInstance() const { return MakeCounted<TDVoidBlockImp>(); }

int32_t TDVoidBlockImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertBytes(dst, src, dstData);
}

void TDVoidBlockImp::PrintDebugStr(const uint8_t* prefix) const { PrintBlock(prefix, "type = void block"); }

// --- TDRepeatedBlockImp ----------------------------------------------------------------------------

TDImpPtr TDRepeatedBlockImp::NewInstance() const { return MakeCounted<TDRepeatedBlockImp>(); }

int32_t TDRepeatedBlockImp::ComputeHashValue() const {
  return static_cast<int32_t>(static_cast<uint32_t>(TDBlockContainerImp::ComputeHashValue()) + numBlocks_);
}

int32_t TDRepeatedBlockImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  const TDRepeatedBlockImp* that = AsRepeatedBlock(&other);
  if (that == nullptr || TDBlockContainerImp::IsSameAs(other) == 0) return 0;
  return that->numBlocks_ == numBlocks_ ? 1 : 0;
}

int32_t TDRepeatedBlockImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  static_cast<TDRepeatedBlockImp&>(*target).numBlocks_ = numBlocks_;
  return TDBlockContainerImp::MemberCloneOrCheckOut(target);
}

int32_t TDRepeatedBlockImp::MemberCheckIn(TDImpPtr& target) const {
  static_cast<TDRepeatedBlockImp&>(*target).numBlocks_ = numBlocks_;
  return TDBlockContainerImp::MemberCheckIn(target);
}

int32_t TDRepeatedBlockImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  if (!GetElt()) return 0;
  const int64_t size = static_cast<int64_t>(GetElt()->DataSizeCore(platform)) * numBlocks_;
  return static_cast<int32_t>(std::min(size, kMaxDataSize));
}

int32_t TDRepeatedBlockImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  const int32_t max = platform != nullptr ? platform->MaxAlignment() : GetDSAlign();
  if (max < 2) return 1;
  if (platform != nullptr && platform->AggregateAlignmentMode() == 1) return max;
  return GetElt() ? GetElt()->GetAlignment(platform) : 1;
}

DataShapes TDRepeatedBlockImp::DataShapeOf(int32_t inMemory) const {
  return GetElt() && GetElt()->DataShapeOf(inMemory) != kDataShapePlain ? kDataShapeHandles : kDataShapePlain;
}

int32_t TDRepeatedBlockImp::IsFlatDataFixedSize() const {
  return GetElt() ? GetElt()->IsFlatDataFixedSize() : 1;
}

template <class Step>
int32_t TDRepeatedBlockImp::ForEachBlock(void* data, Step step) const {
  const TDImpPtr& element = GetElt();
  if (!element) return kStatusNoError;
  const int64_t size = element->DataSizeCore(nullptr);
  for (uint32_t k = 0; k < numBlocks_; ++k) {
    const int32_t status = step(*element, At(data, size * k), size);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

int32_t TDRepeatedBlockImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty == 0) TDImpClearMemory(data, this, clearFirst);
  if (DataShapeOf(1) == kDataShapePlain) return kStatusNoError;
  void* failedAt = nullptr;
  const int32_t status = ForEachBlock(data, [&](const TDImp& element, void* block, int64_t) {
    const int32_t inflated = element.InflateDefData(block, onlyIfEmpty, clearFirst, flags);
    if (inflated != kStatusNoError) failedAt = block;
    return inflated;
  });
  if (status == kStatusNoError || onlyIfEmpty != 0) return status;
  // As a cluster does: give back what the earlier blocks took and leave the datum all zero.
  DeflateData(data, failedAt, 1, NormalHandleAllocator());
  TDImpClearMemory(data, this, 1);
  return status;
}

int32_t TDRepeatedBlockImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  if (DataShapeOf(1) == kDataShapePlain) {
    TDImpClearMemory(data, this, 1);
    return kStatusNoError;
  }
  return ForEachBlock(data, [](const TDImp& element, void* block, int64_t) { return element.ResetToDefaultData(block); });
}

int32_t TDRepeatedBlockImp::DeflateData(void* data, void* end, int32_t dispose,
                                        const HandleAllocationInterface& allocator) const {
  if (data == nullptr || DataShapeOf(1) == kDataShapePlain) return 0;
  const uintptr_t limit = end != nullptr ? reinterpret_cast<uintptr_t>(end) : std::numeric_limits<uintptr_t>::max();
  int32_t released = 0;
  ForEachBlock(data, [&](const TDImp& element, void* block, int64_t size) {
    const uintptr_t begin = reinterpret_cast<uintptr_t>(block);
    if (begin >= limit) return kStatusBadArgument;  // stops the walk
    void* cut = reinterpret_cast<void*>(std::min(begin + static_cast<uintptr_t>(size), limit));
    released += element.DeflateData(block, cut, dispose, allocator);
    return kStatusNoError;
  });
  return released;
}

int32_t TDRepeatedBlockImp::ShrinkData(void* data, void* end, int32_t flag,
                                       const HandleAllocationInterface& allocator) const {
  if (data == nullptr || DataShapeOf(1) == kDataShapePlain) return 0;
  const uintptr_t limit = end != nullptr ? reinterpret_cast<uintptr_t>(end) : std::numeric_limits<uintptr_t>::max();
  int32_t released = 0;
  ForEachBlock(data, [&](const TDImp& element, void* block, int64_t size) {
    const uintptr_t begin = reinterpret_cast<uintptr_t>(block);
    if (begin >= limit) return kStatusBadArgument;
    void* cut = reinterpret_cast<void*>(std::min(begin + static_cast<uintptr_t>(size), limit));
    released += element.ShrinkData(block, cut, flag, allocator);
    return kStatusNoError;
  });
  return released;
}

int32_t TDRepeatedBlockImp::VerifyData(const void* data, const KoContext* context) const {
  if (data == nullptr || DataShapeOf(1) == kDataShapePlain) return kStatusNoError;
  void* begin = const_cast<void*>(data);
  return ForEachBlock(begin, [&](const TDImp& element, void* block, int64_t) {
    const int32_t status = element.VerifyData(block, context);
    if (status != kStatusNoError) {
      WriteVerifyDataMessage(status, *this, data, static_cast<uint8_t*>(block) - static_cast<uint8_t*>(begin));
    }
    return status;
  });
}

int32_t TDRepeatedBlockImp::CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  if (DataShapeOf(1) == kDataShapePlain) {
    MoveBlock(src, dst, static_cast<size_t>(DataSizeCore(nullptr)));
    return kStatusNoError;
  }
  const auto* from = static_cast<const uint8_t*>(src);
  return ForEachBlock(dst, [&](const TDImp& element, void* block, int64_t) {
    const int64_t offset = static_cast<uint8_t*>(block) - static_cast<uint8_t*>(dst);
    return element.CopyData(from + offset, block, flags, context);
  });
}

int32_t TDRepeatedBlockImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  const TDRepeatedBlockImp* into = AsRepeatedBlock(dst);
  if (into == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "CopyDataConvert:  destination is not a repeated block!");
    return kStatusBadArgument;
  }
  if (into->numBlocks_ != numBlocks_) {
    (VELLUM_DEBUG(3) << "CopyDataConvert elts=" << into->numBlocks_ << ", eltsSrc=" << numBlocks_).Process();
    return kStatusBadArgument;
  }
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  const TDImp* from = GetElt().get();
  const TDImp* to = into->GetElt().get();
  if (from == nullptr || to == nullptr) return kStatusNoError;
  const int64_t srcSize = from->DataSizeCore(nullptr);
  const int64_t dstSize = to->DataSizeCore(nullptr);
  for (uint32_t k = 0; k < numBlocks_; ++k) {
    const int32_t status = CopyDataConvertImp(from, to, static_cast<const uint8_t*>(src) + srcSize * k,
                                              At(dstData, dstSize * k), flags);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

int32_t TDRepeatedBlockImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  const TDRepeatedBlockImp* other = AsRepeatedBlock(source);
  if (other == nullptr || other->numBlocks_ != numBlocks_) return kCmpIncompatible;
  return CompareElements(*this, source, flags);
}

int32_t TDRepeatedBlockImp::CompareForSorting(const TDImp* other) const {
  const int32_t byElement = TDBlockContainerImp::CompareForSorting(other);
  const TDRepeatedBlockImp* that = AsRepeatedBlock(other);
  if (byElement != 0 || that == nullptr) return byElement;
  return Order(numBlocks_, that->numBlocks_);
}

DataOrder TDRepeatedBlockImp::OrderData(const void* a, const void* b, const DataOrderOptions& options) const {
  if (options.bytewise != 0 && DataShapeOf(1) == kDataShapePlain) return OrderBytes(a, b);
  const TDImp* element = GetElt().get();
  if (element == nullptr) return {};
  const int64_t size = std::max(element->DataSizeCore(nullptr), 0);
  // Copies of nothing are all alike, however many the count says there are.
  if (size == 0) return {};
  for (uint32_t k = 0; k < numBlocks_; ++k) {
    const int32_t order = options.compareElement(*element, At(a, size * k), At(b, size * k), options);
    if (order != 0) return {order};
  }
  return {};
}

void TDRepeatedBlockImp::PrintDebugStr(const uint8_t* prefix) const {
  Report(prefix, "type = repeated block");
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "number of blocks = " << numBlocks_).Process();
  TDBlockContainerImp::PrintDebugStr(prefix);
}

void TDRepeatedBlockImp::SetNumBlocks(uint32_t count) {
  numBlocks_ = count;
  ClearHashValid();
}

// --- handles ---------------------------------------------------------------------------------------

bool SizedBlockKind::Admit(const TDImp& type) { return type.IsSizedBlock() != 0; }
bool BlockKind::Admit(const TDImp& type) { return type.IsBlock() != 0; }
TDImpPtr BlockKind::New(const uint8_t* name) { return MakeNamedTD<TDBlockImp>(name); }
bool AlignedBlockKind::Admit(const TDImp& type) { return type.IsAlignedBlock() != 0; }
TDImpPtr AlignedBlockKind::New(const uint8_t* name) { return MakeNamedTD<TDAlignedBlockImp>(name); }
bool TypeBlockKind::Admit(const TDImp& type) { return type.IsTypeBlock() != 0; }
TDImpPtr TypeBlockKind::New(const uint8_t* name) { return MakeNamedTD<TDTypeBlockImp>(name); }
bool VoidBlockKind::Admit(const TDImp& type) { return type.IsVoidBlock() != 0; }
TDImpPtr VoidBlockKind::New(const uint8_t* name) { return MakeNamedTD<TDVoidBlockImp>(name); }
bool RepeatedBlockKind::Admit(const TDImp& type) { return type.IsRepeatedBlock() != 0; }
TDImpPtr RepeatedBlockKind::New(const uint8_t* name) { return MakeNamedTD<TDRepeatedBlockImp>(name); }

namespace {

// The writable object of a handle when it is of kind `Imp` (as `admit` tells); null otherwise.
template <class Imp>
Imp* Writable(const TD& handle, int32_t (TDImp::*admit)() const) {
  TDImp* imp = handle.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || (imp->*admit)() == 0) return nullptr;
  return static_cast<Imp*>(imp);
}

template <class Imp>
const Imp* Readable(const TD& handle, int32_t (TDImp::*admit)() const) {
  const TDImp* imp = handle.GetImp();
  if (imp == nullptr || (imp->*admit)() == 0) return nullptr;
  return static_cast<const Imp*>(imp);
}

int32_t BlockSizeOf(const TD& handle) {
  const TDSizedBlockImp* block = AsSizedBlock(handle.GetImp());
  return block != nullptr ? block->GetBlockSize() : -1;
}

}  // namespace

int32_t TDRSizedBlock::GetBlockSize() const { return BlockSizeOf(*this); }
int32_t TDWSizedBlock::GetBlockSize() const { return BlockSizeOf(*this); }

int32_t TDWSizedBlock::SetBlockSize(int32_t size) {
  TDSizedBlockImp* block = Writable<TDSizedBlockImp>(*this, &TDImp::IsSizedBlock);
  if (block == nullptr) return kStatusNullHandle;
  block->SetBlockSize(size);
  return kStatusNoError;
}

namespace {

// The stored alignment of a block kind, 0 for an empty handle or another kind; and its setter.
template <class Imp>
uint16_t StoredAlignmentOf(const TD& handle, int32_t (TDImp::*admit)() const) {
  const auto* block = Readable<Imp>(handle, admit);
  return block != nullptr ? block->GetStoredAlignment() : 0;
}

template <class Imp>
int32_t SetStoredAlignmentOf(const TD& handle, int32_t (TDImp::*admit)() const, uint16_t alignment) {
  auto* block = Writable<Imp>(handle, admit);
  if (block == nullptr) return kStatusNullHandle;
  block->SetStoredAlignment(alignment);
  return kStatusNoError;
}

}  // namespace

uint16_t TDRAlignedBlock::GetAlignment() const { return StoredAlignmentOf<TDAlignedBlockImp>(*this, &TDImp::IsAlignedBlock); }
uint16_t TDWAlignedBlock::GetAlignment() const { return StoredAlignmentOf<TDAlignedBlockImp>(*this, &TDImp::IsAlignedBlock); }
int32_t TDWAlignedBlock::SetAlignment(uint16_t alignment) {
  return SetStoredAlignmentOf<TDAlignedBlockImp>(*this, &TDImp::IsAlignedBlock, alignment);
}

uint16_t TDRTypeBlock::GetAlignment() const { return StoredAlignmentOf<TDTypeBlockImp>(*this, &TDImp::IsTypeBlock); }
uint16_t TDWTypeBlock::GetAlignment() const { return StoredAlignmentOf<TDTypeBlockImp>(*this, &TDImp::IsTypeBlock); }
int32_t TDWTypeBlock::SetAlignment(uint16_t) { return kStatusNullHandle; }

uint16_t TDRVoidBlock::GetAlignment() const { return StoredAlignmentOf<TDVoidBlockImp>(*this, &TDImp::IsVoidBlock); }
uint16_t TDWVoidBlock::GetAlignment() const { return StoredAlignmentOf<TDVoidBlockImp>(*this, &TDImp::IsVoidBlock); }
int32_t TDWVoidBlock::SetAlignment(uint16_t alignment) {
  return SetStoredAlignmentOf<TDVoidBlockImp>(*this, &TDImp::IsVoidBlock, alignment);
}

uint32_t TDRRepeatedBlock::GetNumBlocks() const {
  const TDRepeatedBlockImp* block = AsRepeatedBlock(GetImp());
  return block != nullptr ? block->GetNumBlocks() : 0;
}
uint32_t TDWRepeatedBlock::GetNumBlocks() const {
  const TDRepeatedBlockImp* block = AsRepeatedBlock(GetImp());
  return block != nullptr ? block->GetNumBlocks() : 0;
}
int32_t TDWRepeatedBlock::SetNumBlocks(uint32_t count) {
  auto* block = Writable<TDRepeatedBlockImp>(*this, &TDImp::IsRepeatedBlock);
  if (block == nullptr) return kStatusNullHandle;
  block->SetNumBlocks(count);
  return kStatusNoError;
}

// --- the subarray record clusters ------------------------------------------------------------------

namespace {
const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }
}  // namespace

const TDR& GetDimensionSpecifierTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    TDWCluster specifier(U("DimensionSpecifier"));
    specifier << TDWInt32(U("dimensionSize")) << TDWPtr(U("stride"));
    // A chain broken by a failed allocation leaves a shorter record, which must not be shared.
    return specifier.GetNumElts() == 2 ? specifier.GetImpPtr() : TDImpPtr();
  });
}

const TDR& GetSubArrayTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    const TDR& specifier = GetDimensionSpecifierTD();
    if (!specifier) return TDImpPtr();
    TDWRepeatedBlock dimensions(U("dimensionSpecifier"));
    if (dimensions.SetEltTD(specifier) != kStatusNoError || dimensions.SetNumBlocks(1) != kStatusNoError) {
      return TDImpPtr();
    }
    TDWCluster record(U("SubArray"));
    record << TDWPtr(U("dataPtr")) << dimensions;
    return record.GetNumElts() == 2 ? record.GetImpPtr() : TDImpPtr();
  });
}

// --- type strings ----------------------------------------------------------------------------------

int32_t TDSizedBlockImp::FlattenTDPartsForSaving(TDDataWriter* writer) const { return writer->WriteI32(blockSize_); }

int32_t TDSizedBlockImp::ConstructTD(TDDataReader* reader) {
  int32_t size = 0;
  if (const int32_t status = reader->ReadI32(&size); status != kStatusNoError) return status;
  SetBlockSize(size);
  return kStatusNoError;
}

int32_t TDAlignedBlockImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  TDSizedBlockImp::FlattenTDPartsForSaving(writer);
  return writer->WriteU16(alignment_);
}

int32_t TDAlignedBlockImp::ConstructTD(TDDataReader* reader) {
  if (const int32_t status = TDSizedBlockImp::ConstructTD(reader); status != kStatusNoError) return status;
  uint16_t alignment = 0;
  if (const int32_t status = reader->ReadU16(&alignment); status != kStatusNoError) return status;
  SetStoredAlignment(alignment);
  return kStatusNoError;
}

int32_t TDRepeatedBlockImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  writer->WriteU32(numBlocks_);
  return TDBlockContainerImp::FlattenTDPartsForSaving(writer);
}

int32_t TDRepeatedBlockImp::ConstructTD(TDDataReader* reader) {
  uint32_t count = 0;
  if (const int32_t status = reader->ReadU32(&count); status != kStatusNoError) return status;
  SetNumBlocks(count);
  return TDBlockContainerImp::ConstructTD(reader);
}

// --- flattened data --------------------------------------------------------------------------------

namespace {

// Values of a repeated block's element for `count` repeated blocks; 0 when they do not fit 31 bits.
int32_t ElementValues(uint32_t blocks, int32_t count) {
  const uint64_t values = static_cast<uint64_t>(blocks) * static_cast<uint64_t>(std::max(count, 0));
  return values > static_cast<uint64_t>(std::numeric_limits<int32_t>::max()) ? -1 : static_cast<int32_t>(values);
}

}  // namespace

uint32_t TDRepeatedBlockImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  const TDImpPtr& element = GetElt();
  if (!element) return 0;
  if (data == nullptr) return static_cast<uint32_t>(std::min<uint64_t>(uint64_t{element->FlatDataSize(writer, nullptr)} * numBlocks_, UINT32_MAX));
  const int64_t stride = element->DataSizeCore(nullptr);
  uint64_t size = 0;
  for (uint32_t k = 0; k < numBlocks_; ++k)
    size += element->FlatDataSize(writer, static_cast<const uint8_t*>(data) + stride * k);
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDRepeatedBlockImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  const int32_t values = ElementValues(numBlocks_, count);
  if (!GetElt() || values < 0) {
    writer->SetError(GetElt() ? kStatusBadArgument : kStatusNullHandle);
    return;
  }
  GetElt()->WriteData(writer, data, values, nullptr);
}

void TDRepeatedBlockImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  const int32_t values = ElementValues(numBlocks_, count);
  if (!GetElt() || values < 0) {
    reader->SetError(GetElt() ? kStatusImplausibleData : kStatusNullHandle);
    return;
  }
  GetElt()->ReadData(reader, data, values, nullptr);
}
