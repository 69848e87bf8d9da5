// Arrays, subarrays and array data pointers: dimension words and element counts, identity, order
// and compatibility, the resizing engine, default data, reset, disposal, verification, copy and
// conversion (array to array along the row-major walk, views into subarrays, gathering from
// them), the factories, the shared one-dimensional arrays and the handles.
#include "source/families/TDArray.h"

#include <algorithm>
#include <atomic>
#include <bit>
#include <cstring>
#include <functional>
#include <limits>
#include <new>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXApp.h"
#include "runtime/PXStrings.h"
#include "source/families/TDStringBase.h"
#include "source/model/MoveBytes.h"
#include "source/model/TDAttributes.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TDBlockHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDSimpleHandles.h"
#include "vellum/TDStringHandles.h"

VELLUM_DIAGNOSTIC_MODULE("TDArray");

namespace {

using vellum::bound::IsBounded;
using vellum::bound::IsFixed;
using vellum::bound::IsVariable;
using vellum::bound::Length;

constexpr int32_t kPointerSize = 8;
constexpr int64_t kMaxCount = std::numeric_limits<int32_t>::max();
constexpr int64_t kDimWordSize = sizeof(int32_t);
constexpr int32_t kCountWordMalformed = std::numeric_limits<int32_t>::min();
constexpr int32_t kCountWordNoDims = static_cast<int32_t>(0x80000001u);
// A SubArray datum in the running process: the data pointer, then per dimension the size and
// the stride, 8 bytes each.
constexpr int64_t kRecordDimsOffset = 8;
constexpr int64_t kRecordDimSize = 16;

// What the rave procedure is told besides a bad size (1024): a preallocated array whose counts
// disagree with its type, and a bounded array while preallocation is off.
constexpr int32_t kRavePreallocation = 4096;
constexpr int32_t kRaveBoundedWithoutPreallocation = 128;

// CmpTD flags of the array family.
constexpr int32_t kCmpFlagClusterAsVector = 0x4000;
constexpr int32_t kCmpFlagNoSizeBits = 0x10;
constexpr int32_t kCmpFlagNoElementMatch = 0x2000000;
constexpr int32_t kCmpFlagDimensionsFree = 0x4000000;
constexpr int32_t kCmpKindsDiffer = 0x8;
// Element bits that still let an array's element stand for the other, non-array side.
constexpr int32_t kCmpElementMatchBits = kCmpMinor | kCmpKindsDiffer | kCmpNeedsConversion;

const uint8_t* At(const void* data, int64_t offset) { return static_cast<const uint8_t*>(data) + offset; }
uint8_t* At(void* data, int64_t offset) { return static_cast<uint8_t*>(data) + offset; }

int32_t* DimsOf(UHandle h) { return reinterpret_cast<int32_t*>(*h); }

bool Below(const void* data, const void* end) {
  return data != nullptr && (end == nullptr || std::less<const void*>()(data, end));
}

int32_t Saturated(int64_t bytes) { return static_cast<int32_t>(std::clamp<int64_t>(bytes, 0, kMaxCount)); }

void ReportMalformed() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array type without dimension list or element"); }
void ReportOverflow() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array number of elements overflowed"); }
void ReportDamagedBlock() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array block smaller than its dimension sizes"); }
void ReportTooLarge(const char* who, int64_t count) {
  (VELLUM_DEBUG(3) << who << ": array too large? nstrt=" << count).Process();
}
void ReportPreallocatedSource() {
  DebugReport(kDiagnosticModule, __LINE__, 3,
              "Attempting to copy from array whose type thinks it needs more memory than what is preallocated.");
}
void ReportPreallocatedDestination() {
  DebugReport(kDiagnosticModule, __LINE__, 3,
              "Attempting to copy to an array whose type thinks it needs more memory than what is preallocated.");
}
void ReportPreallocatedExisting() {
  DebugReport(kDiagnosticModule, __LINE__, 3,
              "Array exists whose type thinks it needs more memory than what is preallocated.");
}
void ReportCodes(const TDImp* dst, const TDImp& src) {
  (VELLUM_DEBUG(3) << "CopyDataConvert tcDst=")
      .AppendHex32(static_cast<uint32_t>(dst != nullptr ? dst->GetTypeCode() : 0))
      .Append(", tcSrc=")
      .AppendHex32(static_cast<uint32_t>(src.GetTypeCode()))
      .Process();
}

// The product of the sizes for a report, whatever it is.
int64_t RawProduct(int32_t nDims, const int32_t* dims) {
  int64_t product = 1;
  for (int32_t d = 0; d < nDims; ++d) {
    if (__builtin_mul_overflow(product, static_cast<int64_t>(dims[d]), &product)) return std::numeric_limits<int64_t>::max();
  }
  return product;
}

// The 16-bit words of packed Booleans in a preallocated block, from the bound or fixed sizes.
int64_t PackedWordsOfSizes(int32_t nDims, const int32_t* words) {
  if (nDims < 1) return 1;
  int64_t rows = 1;
  for (int32_t d = 0; d + 1 < nDims; ++d) rows *= words[d] & 0x7FFFFFFF;
  return rows * ((static_cast<int64_t>(words[nDims - 1] & 0x7FFFFFFF) + 15) >> 4);
}

// What a default (or reset) block holds in a dimension word: the fixed size, else 0.
int32_t DefaultWord(int32_t word) { return IsFixed(word) ? Length(word) : 0; }

// --- the element test of resizing ----------------------------------------------------------------

std::atomic<NeedsInflateForArrayEltsProc> gNeedsInflateProc{nullptr};

bool ContainsBoundedOrFixed(const TDImp* type) {
  if (type == nullptr) return false;
  if (type->IsClust() != 0) {
    const TDContainerImp* cluster = AsContainer(type);
    const int32_t count = cluster->GetNumElts();
    for (int32_t i = 0; i < count; ++i) {
      if (ContainsBoundedOrFixed(cluster->GetEltImpPtr(i).get())) return true;
    }
    return false;
  }
  if (type->IsRepeatedBlock() != 0) {
    const TDSingleContainerImp* repeated = AsSingleContainer(type);
    return repeated != nullptr && ContainsBoundedOrFixed(repeated->GetElt().get());
  }
  if (type->IsStringBase() != 0 && type->IsPath() == 0) return !IsVariable(BoundOfStringBase(type));
  if (type->IsArrayOnly() != 0) {
    bool overflow = false;
    return AsArrayBase(type)->CountWord(&overflow) != -1;
  }
  return false;
}

bool NeedsInflate(const TDImp* elt) {
  if (ContainsBoundedOrFixed(elt)) return true;
  const NeedsInflateForArrayEltsProc proc = gNeedsInflateProc.load(std::memory_order_acquire);
  return proc != nullptr && proc(MakeTDRFromTDImp(elt));
}

// --- the resizing engine -------------------------------------------------------------------------

// Gives back the handles of elements [from, to) of a block.
void DisposeElements(const ArrayLayout& layout, uint8_t* block, int64_t from, int64_t to) {
  for (int64_t i = from; i < to; ++i) {
    uint8_t* element = layout.Element(block, i);
    layout.elt->DeflateData(element, element + layout.eltSize, 1, NormalHandleAllocator());
  }
}

// Resizes *h to `newCount` elements (`newDims`, when given, make packed sizes exact). See
// SetArraySizeFromTDR for the rules; `aligned` uses the allocation alignment table for new
// blocks, and `who` names the caller in the diagnostics.
int32_t ResizeElements(const ArrayLayout& layout, UHandle* h, int64_t newCount, const int32_t* newDims,
                       bool allocWhenEmpty, int32_t inflateFlags, bool aligned, const char* who) {
  if (h == nullptr) return kStatusBadArgument;
  if (newCount < 0 || newCount > kMaxCount) {
    (VELLUM_DEBUG(3) << who << ": bad count=" << newCount).Process();
    return kStatusBadArgument;
  }
  const int64_t total = layout.header + layout.Bytes(newCount, newDims);
  int64_t oldCount = 0;
  int64_t oldTotal = 0;
  bool created = false;
  if (*h != nullptr) {
    size_t size = 0;
    if (!layout.ReadCount(*h, &oldCount, &size)) {
      ReportTooLarge(who, static_cast<int64_t>(size) >= kDimWordSize * layout.nDims ? RawProduct(layout.nDims, DimsOf(*h)) : 0);
      return kStatusBadArgument;
    }
    oldTotal = layout.header + layout.Bytes(oldCount, DimsOf(*h));
    if (layout.handles && newCount < oldCount) DisposeElements(layout, **h, newCount, oldCount);
    if (newCount == 0 && !allocWhenEmpty) ClearMem(**h, size);
    if (total > oldTotal) {
      const int32_t status = DSSetHandleSize(*h, static_cast<size_t>(total));
      if (status != kStatusNoError) return status;
      ClearMem(At(**h, oldTotal), static_cast<size_t>(total - oldTotal));
    } else if (total < oldTotal || newCount < oldCount) {
      DSSetHandleSize(*h, static_cast<size_t>(total));
    }
  } else {
    if (newCount == 0 && !allocWhenEmpty) return kStatusNoError;
    UHandle fresh = nullptr;
    const int32_t status = aligned ? DSNewAlignedHClr(static_cast<size_t>(total),
                                                      static_cast<size_t>(ArrayAllocationAlignment(total)), &fresh)
                                   : DSNewHClr(static_cast<size_t>(total), &fresh);
    if (status != kStatusNoError) return kStatusOutOfMemory;
    *h = fresh;
    created = true;
  }
  if (newCount <= oldCount || !NeedsInflate(layout.elt)) return kStatusNoError;
  for (int64_t i = oldCount; i < newCount; ++i) {
    const int32_t status = layout.elt->InflateDefData(layout.Element(**h, i), 0, 1, inflateFlags);
    if (status == kStatusNoError) continue;
    // Back to the block as it was: nothing the failed resize made stays behind.
    DisposeElements(layout, **h, oldCount, i);
    if (created) {
      DSDisposeHandle(*h);
      *h = nullptr;
    } else {
      DSSetHandleSize(*h, static_cast<size_t>(oldTotal));
    }
    return status;
  }
  return kStatusNoError;
}

// Resizes *h for the dimension sizes size(0) ... size(n - 1) and writes them into the block.
template <class SizeOf>
int32_t ResizeToSizes(const ArrayLayout& layout, UHandle* h, SizeOf size, const int32_t* dims, const char* who) {
  int64_t count = 1;
  bool anyNonZero = false;
  bool negative = false;
  for (int32_t d = 0; d < layout.nDims; ++d) {
    const int64_t s = size(d);
    if (s < 0 || s > kMaxCount) negative = true;
    if (s != 0) anyNonZero = true;
    count = std::min(count * std::clamp<int64_t>(s, 0, kMaxCount), kMaxCount + 1);
  }
  if (negative || count > kMaxCount) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  const int32_t status = ResizeElements(layout, h, count, dims, count == 0 && anyNonZero, 0, false, who);
  if (status != kStatusNoError || *h == nullptr) return status;
  for (int32_t d = 0; d < layout.nDims; ++d) DimsOf(*h)[d] = static_cast<int32_t>(size(d));
  return kStatusNoError;
}

int32_t ResizeToDimWords(const ArrayLayout& layout, UHandle* h, const int32_t* dims) {
  if (dims == nullptr) {
    return ResizeToSizes(layout, h, [](int32_t) { return int64_t{0}; }, nullptr, "SetArraySizeFromTDPtr");
  }
  return ResizeToSizes(layout, h, [dims](int32_t d) { return static_cast<int64_t>(dims[d]); }, dims,
                       "SetArraySizeFromTDPtr");
}

// --- flat copies ---------------------------------------------------------------------------------

// *dst becomes a block of `bytes` bytes copied from src (which holds `srcSize`, at least the
// dimension words); bytes beyond srcSize are zeroed.
int32_t CopyBlockBytes(UHandle src, size_t srcSize, UHandle* dst, int64_t bytes) {
  if (*dst == nullptr) {
    UHandle fresh = nullptr;
    if (DSNewHandle(static_cast<size_t>(bytes), &fresh) != kStatusNoError) return kStatusOutOfMemory;
    *dst = fresh;
  } else {
    const int32_t status = DSSetHandleSize(*dst, static_cast<size_t>(bytes));
    if (status != kStatusNoError) return status;
  }
  const size_t copied = std::min(static_cast<size_t>(bytes), srcSize);
  MoveBlock(*src, **dst, copied);
  if (copied < static_cast<size_t>(bytes)) ClearMem(At(**dst, static_cast<int64_t>(copied)), static_cast<size_t>(bytes) - copied);
  return kStatusNoError;
}

int32_t DisposeInto(UHandle* dst) {
  if (*dst == nullptr) return kStatusNoError;
  const int32_t status = DSDisposeHandle(*dst);
  if (status == kStatusNoError) *dst = nullptr;
  return status;
}

int32_t CopyFlatBlock(const ArrayLayout& layout, UHandle src, UHandle* dst) {
  if (src == nullptr) return DisposeInto(dst);
  if (src == *dst) return kStatusNoError;
  int64_t count = 0;
  size_t size = 0;
  if (!layout.ReadCount(src, &count, &size)) {
    ReportDamagedBlock();
    return kStatusBadArgument;
  }
  return CopyBlockBytes(src, size, dst, layout.header + layout.Bytes(count, DimsOf(src)));
}

// --- views of source elements --------------------------------------------------------------------

// The elements a conversion reads: an Array's block, or what a SubArray record points to.
struct Source {
  const uint8_t* first = nullptr;   // the element at index 0 in every dimension; null: no data
  int32_t nDims = 0;
  const int32_t* dims = nullptr;    // an Array's dimension words
  const uint8_t* record = nullptr;  // a SubArray's record
  int64_t eltSize = 0;
  UHandle handle = nullptr;         // an Array's handle

  int64_t Size(int32_t d) const {
    if (record != nullptr) return Load<int64_t>(At(record, kRecordDimsOffset + kRecordDimSize * d));
    return dims != nullptr ? dims[d] : 0;
  }
  // The byte step of dimension d; `rowMajor` is the step an Array's layout gives it.
  int64_t Stride(int32_t d, int64_t rowMajor) const {
    return record != nullptr ? Load<int64_t>(At(record, kRecordDimsOffset + kRecordDimSize * d + 8)) : rowMajor;
  }
  int64_t Count(bool* overflow) const {
    int64_t count = 1;
    *overflow = false;
    for (int32_t d = 0; d < nDims; ++d) {
      const int64_t s = Size(d);
      if (s < 0 || s > kMaxCount) *overflow = true;
      count = std::min(count * std::clamp<int64_t>(s, 0, kMaxCount), kMaxCount + 1);
    }
    if (count > kMaxCount) *overflow = true;
    return *overflow ? 0 : count;
  }
};

// The source of an Array datum; false after a diagnostic when its block is damaged.
bool ArraySource(const ArrayLayout& layout, const void* data, Source* source) {
  source->nDims = layout.nDims;
  source->eltSize = layout.eltSize;
  source->handle = Load<UHandle>(data);
  if (source->handle == nullptr) return true;
  int64_t count = 0;
  if (!layout.ReadCount(source->handle, &count)) {
    ReportDamagedBlock();
    return false;
  }
  source->dims = DimsOf(source->handle);
  source->first = layout.Element(*source->handle, 0);
  return true;
}

// The source of a SubArray datum; false after a diagnostic when the record cannot be read.
bool SubArraySource(const ArrayLayout& layout, const void* data, Source* source) {
  source->nDims = layout.nDims;
  source->eltSize = layout.eltSize;
  source->record = static_cast<const uint8_t*>(data);
  bool overflow = false;
  const int64_t count = source->Count(&overflow);
  const auto* first = Load<const uint8_t*>(data);
  if (overflow || (count > 0 && first == nullptr)) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "CopySubArrayConvert?");
    return false;
  }
  source->first = first;
  return true;
}

// Calls step(destination index, source element or null) for each destination element in
// row-major order over the destination sizes; the source element is the one at the same indices
// when the source extends that far. Stops at the first failure.
template <class SizeOf, class Step>
int32_t WalkRowMajor(const Source& source, SizeOf dstSize, int64_t dstCount, Step step) {
  for (int64_t linear = 0; linear < dstCount; ++linear) {
    int64_t rest = linear;
    int64_t offset = 0;
    int64_t rowMajor = source.eltSize;
    bool inside = source.first != nullptr;
    for (int32_t d = source.nDims - 1; d >= 0; --d) {
      const int64_t size = dstSize(d);
      const int64_t index = rest % size;
      rest /= size;
      const int64_t srcSize = source.Size(d);
      if (index >= srcSize) inside = false;
      if (inside) offset += index * source.Stride(d, rowMajor);
      rowMajor *= std::max<int64_t>(srcSize, 0);
    }
    const int32_t status = step(linear, inside ? source.first + offset : nullptr);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

// Whether `to` lays its data out as `from` does (the compatibility bits besides a minor difference).
bool SameLayout(const TDImp& to, const TDImp& from) {
  return &to == &from || (to.CmpTDCommon(&from, kCmpFlagReportLoss) & ~kCmpMinor) == 0;
}

// Converts the source elements into an Array datum of `dstType`: the walk of the conversion of
// arrays, also gathering a SubArray's elements.
int32_t ConvertIntoArray(const TDArrayImp& dstType, const TDArrayBaseImp& srcType, const Source& source,
                         void* dstData, int32_t flags) {
  const ArrayLayout into(*dstType.GetElt(), dstType.GetNumDims());
  const ArrayLayout from(*srcType.GetElt(), srcType.GetNumDims());
  bool overflow = false;
  const int32_t word = dstType.CountWord(&overflow);
  const int64_t srcCount = source.Count(&overflow);
  if (overflow) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  const bool same = source.record == nullptr && SameLayout(dstType, srcType);
  const TDImp* srcElt = from.elt;
  const TDImp* dstElt = into.elt;
  UHandle h = Load<UHandle>(dstData);
  auto convert = [&](int64_t index, const uint8_t* element) {
    uint8_t* target = into.Element(*h, index);
    if (element == nullptr) return dstElt->ResetToDefaultData(target);
    return CopyDataConvertImp(srcElt, dstElt, element, target, flags);
  };
  // Packed Booleans have no element of their own to convert one at a time.
  const bool packed = into.packed || from.packed;

  if (word == -1) {
    if (!into.handles && same) {
      const int32_t status = CopyFlatBlock(into, source.handle, &h);
      Store(dstData, h);
      return status;
    }
    if (packed) {
      ReportCodes(dstElt, *srcElt);
      return kStatusBadArgument;
    }
    const int32_t status =
        ResizeToSizes(into, &h, [&source](int32_t d) { return source.Size(d); }, source.dims, "SetArraySizeFromTDPtr");
    Store(dstData, h);
    // Elements without bytes (Void) have nothing to convert, however many there are.
    if (status != kStatusNoError || source.first == nullptr || into.eltSize == 0) return status;
    return WalkRowMajor(source, [&source](int32_t d) { return source.Size(d); }, srcCount, convert);
  }

  if (into.eltSize == 0) return kStatusNoError;
  const int64_t capacity = word & 0x7FFFFFFF;
  const int64_t capacityBytes =
      into.header + (into.packed ? 2 * PackedWordsOfSizes(into.nDims, dstType.Dims()) : capacity * into.eltSize);
  if (h == nullptr) {
    const int32_t status = dstType.InflateDefData(dstData, 0, 0, 0);
    if (status != kStatusNoError) return status;
    h = Load<UHandle>(dstData);
  }
  // A count word of 0 holds no element: its default may be no block at all.
  if (h == nullptr && word == 0) return kStatusNoError;
  if (h == nullptr || static_cast<int64_t>(DSGetHandleSize(h)) < capacityBytes) {
    ReportPreallocatedExisting();
    return kStatusOutOfMemory;
  }
  const bool fixed = IsFixed(word);
  if (same && !into.handles && source.handle != nullptr) {
    const bool fits = fixed ? srcCount == capacity : srcCount <= capacity;
    if (!fits || static_cast<int64_t>(DSGetHandleSize(source.handle)) < capacityBytes) {
      DebugReport(kDiagnosticModule, __LINE__, 3, "CompareTD didn't return sCvtLen?");
      return kStatusBadArgument;
    }
    MoveBlock(*source.handle, *h, static_cast<size_t>(capacityBytes));
    return kStatusNoError;
  }
  if (packed && source.first != nullptr) {
    ReportCodes(dstElt, *srcElt);
    return kStatusBadArgument;
  }
  for (int32_t d = 0; d < into.nDims; ++d) {
    const int32_t bound = dstType.GetDimSize(d);
    if (IsFixed(bound) && DimsOf(h)[d] != Length(bound)) {
      DebugReport(kDiagnosticModule, __LINE__, 3, "fixed size array prealloc'd wrong?");
      return kStatusOutOfMemory;
    }
  }
  int64_t dstCount = 1;
  for (int32_t d = 0; d < into.nDims; ++d) {
    const int32_t bound = dstType.GetDimSize(d);
    if (!IsFixed(bound)) DimsOf(h)[d] = static_cast<int32_t>(std::min<int64_t>(Length(bound), source.Size(d)));
    dstCount *= DimsOf(h)[d];
  }
  // A null source has no extent: a bounded destination is left empty, a fixed one at its default.
  if (packed) return dstType.ResetToDefaultData(dstData);
  const int32_t* sizes = DimsOf(h);
  return WalkRowMajor(source, [sizes](int32_t d) { return static_cast<int64_t>(sizes[d]); }, dstCount, convert);
}

// Fills a SubArray record of `dstType` with a view of the source's elements. Nothing is written
// when a fixed dimension of the destination is larger than the source's.
int32_t MakeView(const TDArrayBaseImp& dstType, const TDArrayBaseImp& srcType, const Source& source, void* dstData,
                 const char* who) {
  const ArrayLayout from(*srcType.GetElt(), srcType.GetNumDims());
  const int32_t nDims = dstType.GetNumDims();
  const int64_t recordSize = kRecordDimsOffset + kRecordDimSize * nDims;
  if (from.packed || !SameLayout(*dstType.GetElt(), *srcType.GetElt())) {
    ReportCodes(dstType.GetElt().get(), *srcType.GetElt());
    return kStatusBadArgument;
  }
  const bool nullData = source.record != nullptr ? Load<const void*>(source.record) == nullptr : source.handle == nullptr;
  if (nullData) {
    ClearMem(dstData, static_cast<size_t>(recordSize));
    return kStatusNoError;
  }
  for (int32_t d = 0; d < nDims; ++d) {
    const int32_t word = dstType.GetDimSize(d);
    if (IsFixed(word) && Length(word) > source.Size(d)) {
      (VELLUM_DEBUG(3) << who << " dim=" << Length(word) << " dimsrc=" << source.Size(d)).Process();
      return kStatusBadArgument;
    }
  }
  const uint8_t* first = source.record != nullptr ? Load<const uint8_t*>(source.record)
                                                  : At(*source.handle, ArrayLayout(*dstType.GetElt(), nDims).header);
  Store(dstData, first);
  int64_t rowMajor = from.eltSize;
  for (int32_t d = nDims - 1; d >= 0; --d) {
    const int32_t word = dstType.GetDimSize(d);
    const int64_t srcSize = source.Size(d);
    // A variable dimension takes the source's size: every reader of the record wants a count.
    int64_t size = srcSize;
    if (IsFixed(word)) {
      size = Length(word);
    } else if (IsBounded(word)) {
      size = std::min<int64_t>(srcSize, word);
    }
    Store<int64_t>(At(dstData, kRecordDimsOffset + kRecordDimSize * d), size);
    Store<int64_t>(At(dstData, kRecordDimsOffset + kRecordDimSize * d + 8), source.Stride(d, rowMajor));
    rowMajor *= std::max<int64_t>(srcSize, 0);
  }
  return kStatusNoError;
}

bool ReportDimsDiffer(const TDArrayBaseImp& dst, const TDArrayBaseImp& src) {
  if (dst.GetNumDims() == src.GetNumDims()) return false;
  (VELLUM_DEBUG(3) << "CopyDataConvert dims=" << dst.GetNumDims() << ", dimsSrc=" << src.GetNumDims()).Process();
  return true;
}

// Converts a datum of an Array or SubArray (`readSource` finds its elements) into an array kind of
// the same rank: a SubArray destination becomes a view (`viewCaller` names it in diagnostics), an
// Array gets the elements.
using SourceReader = bool (*)(const ArrayLayout& layout, const void* data, Source* source);
int32_t ConvertArrayKind(const TDArrayBaseImp& srcType, SourceReader readSource, const char* viewCaller,
                         const TDImp* dst, const void* src, void* dstData, int32_t flags) {
  if (src == nullptr || dstData == nullptr) return kStatusBadArgument;
  if (dst == nullptr) return kStatusNullHandle;
  if (dst->IsArray() == 0) {
    ReportCodes(dst, srcType);
    return kStatusBadArgument;
  }
  const TDArrayBaseImp& into = *AsArrayBase(dst);
  if (ReportDimsDiffer(into, srcType)) return kStatusBadArgument;
  if (!srcType.IsWellFormed() || !into.IsWellFormed()) {
    ReportMalformed();
    return kStatusNullHandle;
  }
  Source source;
  if (!readSource(ArrayLayout(*srcType.GetElt(), srcType.GetNumDims()), src, &source)) return kStatusBadArgument;
  if (dst->IsSubArrayOnly() != 0) return MakeView(into, srcType, source, dstData, viewCaller);
  return ConvertIntoArray(static_cast<const TDArrayImp&>(into), srcType, source, dstData, flags);
}

// --- the Boolean form change -----------------------------------------------------------------------

struct BooleanSearch {
  bool eightBitOnly;
  bool found;
};

TDTraverseValue VisitBoolean(TDImp* td, void* context, TDImpPtr*) {
  auto* search = static_cast<BooleanSearch*>(context);
  if (td->IsBool() == 0 && (search->eightBitOnly || td->IsBoolU16() == 0)) return kTraverseContinue;
  search->found = true;
  return 1;
}

// Whether `type`'s tree holds a Boolean (of the 8-bit kind only, or of either kind).
bool HoldsBoolean(const TDImp& type, bool eightBitOnly) {
  BooleanSearch search{eightBitOnly, false};
  const_cast<TDImp&>(type).TraverseTD(&VisitBoolean, &search, nullptr, nullptr);
  return search.found;
}

// Packs one byte per Boolean into 16-bit words, most significant bit first, a new word at each
// new row; or unpacks them.
void PackBooleans(const uint8_t* bytes, uint8_t* words, int64_t rows, int64_t rowLength) {
  const int64_t wordsPerRow = (rowLength + 15) >> 4;
  for (int64_t r = 0; r < rows; ++r) {
    for (int64_t w = 0; w < wordsPerRow; ++w) {
      uint16_t word = 0;
      for (int64_t bit = 0; bit < 16 && w * 16 + bit < rowLength; ++bit) {
        if (bytes[r * rowLength + w * 16 + bit] != 0) word = static_cast<uint16_t>(word | (0x8000u >> bit));
      }
      Store(words + 2 * (r * wordsPerRow + w), word);
    }
  }
}

void UnpackBooleans(const uint8_t* words, uint8_t* bytes, int64_t rows, int64_t rowLength) {
  const int64_t wordsPerRow = (rowLength + 15) >> 4;
  for (int64_t r = 0; r < rows; ++r) {
    for (int64_t j = 0; j < rowLength; ++j) {
      const auto word = Load<uint16_t>(words + 2 * (r * wordsPerRow + (j >> 4)));
      bytes[r * rowLength + j] = (word & (0x8000u >> (j & 15))) != 0 ? 1 : 0;
    }
  }
}

// The order of two blocks of packed Booleans of `rows` rows of `rowLength` elements (the layout
// of BooleanU16 arrays): at the first differing element, 1 when a's is true, else -1; 0 when all
// are equal.
int32_t ComparePackedBooleans(const uint8_t* a, const uint8_t* b, int64_t rows, int64_t rowLength) {
  const int64_t wordsPerRow = (rowLength + 15) >> 4;
  for (int64_t r = 0; r < rows; ++r) {
    for (int64_t w = 0; w < wordsPerRow; ++w) {
      const int64_t at = 2 * (r * wordsPerRow + w);
      // The bits past the end of a row are not elements; whatever they hold does not count.
      const int64_t used = std::min<int64_t>(16, rowLength - 16 * w);
      const auto mask = static_cast<uint16_t>(0xFFFFu << (16 - used));
      const auto x = static_cast<uint16_t>(Load<uint16_t>(a + at) & mask);
      const auto y = static_cast<uint16_t>(Load<uint16_t>(b + at) & mask);
      if (x == y) continue;
      // The most significant differing bit is the first differing element.
      const auto first = static_cast<uint16_t>(0x8000u >> std::countl_zero(static_cast<uint16_t>(x ^ y)));
      return (x & first) != 0 ? 1 : -1;
    }
  }
  return 0;
}

}  // namespace

// --- counting ------------------------------------------------------------------------------------

namespace {

// The element count of `nDims` sizes (`sizeAt(d)`): 0 when a size is 0; otherwise 0 with
// *overflow set when a size is negative or the product passes 0x7FFFFFFF (`bad`: no sizes at all).
template <class SizeAt>
int64_t CountOfSizes(int32_t nDims, bool bad, SizeAt sizeAt, int32_t* overflow) {
  if (overflow != nullptr) *overflow = 0;
  if (nDims < 1) return 1;
  bool zero = false;
  bool tooLarge = false;
  int64_t product = 1;
  for (int32_t d = 0; !bad && d < nDims; ++d) {
    const int64_t size = sizeAt(d);
    if (size < 0) {
      bad = true;
    } else if (size == 0) {
      zero = true;
    } else if (size > kMaxCount) {
      tooLarge = true;
    } else if (!tooLarge) {
      product *= size;
      tooLarge = product > kMaxCount;
    }
  }
  if (bad || (tooLarge && !zero)) {
    if (overflow != nullptr) *overflow = 1;
    return 0;
  }
  return zero ? 0 : product;
}

}  // namespace

int64_t NArrayElts(int32_t nDims, const int32_t* dims, int32_t* overflow) {
  return CountOfSizes(nDims, dims == nullptr, [dims](int32_t d) { return static_cast<int64_t>(dims[d]); }, overflow);
}

int64_t NSubArrayElts(int32_t nDims, const SubArrayDimension* entries, int32_t* overflow) {
  return CountOfSizes(nDims, entries == nullptr, [entries](int32_t d) { return entries[d].dimensionSize; }, overflow);
}

int64_t NArrayBinwds(int32_t nDims, const int32_t* dims, int32_t* overflow) {
  int32_t bad = 0;
  const int64_t count = NArrayElts(nDims, dims, &bad);
  if (overflow != nullptr) *overflow = bad;
  if (bad != 0) return 0;
  if (nDims < 1) return 1;
  if (count == 0) return 0;
  const int64_t last = dims[nDims - 1];
  return (count / last) * ((last + 15) >> 4);
}

bool CompactSubArray(const SubArrayDimension* entries, int32_t nDims, int64_t eltSize) {
  if (nDims < 1) return true;
  if (entries == nullptr) return false;
  for (int32_t d = 0; d + 1 < nDims; ++d) {
    int64_t inner = 0;
    if (entries[d].stride <= 0 ||
        __builtin_mul_overflow(entries[d + 1].stride, entries[d + 1].dimensionSize, &inner) ||
        entries[d].stride != inner) {
      return false;
    }
  }
  return entries[nDims - 1].stride == eltSize;
}

int32_t ArrayAllocationAlignment(int64_t total) {
  if (total >= 0x100000) return 4096;
  if (total >= 0x40000) return 1024;
  if (total >= 0x10000) return 256;
  if (total >= 0x4000) return 64;
  if (total >= 1024) return 22;
  return 8;
}

// --- ArrayLayout -----------------------------------------------------------------------------------

ArrayLayout::ArrayLayout(const TDImp& element, int32_t dimensions)
    : elt(&element),
      nDims(dimensions),
      eltSize(element.DataSizeCore(nullptr)),
      header(element.AlignDatumCore(kDimWordSize * dimensions, nullptr)),
      handles(element.DataShapeOf(1) != kDataShapePlain),
      packed(element.IsBoolU16() != 0) {}

bool ArrayLayout::ReadCount(UHandle h, int64_t* count, size_t* size) const {
  const size_t bytes = DSGetHandleSize(h);
  if (size != nullptr) *size = bytes;
  // An empty size is also what a handle that is not live answers; its block is never read.
  if (bytes == 0 && IsDSHandle(h) == 0) return false;
  if (static_cast<int64_t>(bytes) < kDimWordSize * nDims) return false;
  int32_t overflow = 0;
  *count = NArrayElts(nDims, DimsOf(h), &overflow);
  if (overflow != 0) return false;
  const int64_t need = *count == 0 ? kDimWordSize * nDims : header + Bytes(*count, DimsOf(h));
  return static_cast<int64_t>(bytes) >= need;
}

int64_t ArrayLayout::Bytes(int64_t count, const int32_t* dims) const {
  if (!packed) return count * eltSize;
  if (dims != nullptr) return 2 * NArrayBinwds(nDims, dims, nullptr);
  return nDims == 1 ? 2 * ((count + 15) >> 4) : 2 * count;
}

// --- resizing and flat copy --------------------------------------------------------------------------

int32_t SetArraySizeFromTDR(const TDR& elt, int32_t nDims, UHandle* handle, int32_t count, int32_t allocWhenEmpty) {
  return SetArraySizeFromTDR2(elt, nDims, handle, count, allocWhenEmpty, 0);
}

int32_t SetArraySizeFromTDR2(const TDR& elt, int32_t nDims, UHandle* handle, int32_t count, int32_t allocWhenEmpty,
                             int32_t inflateFlags) {
  if (!elt) return kStatusNullHandle;
  if (elt.IsArrayBase() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "SetArraySizeFromTDR: array element cannot be an array");
    return kStatusBadArgument;
  }
  if (nDims < 0) {
    (VELLUM_DEBUG(3) << "SetArraySizeFromTDR: bad dimension count=" << nDims).Process();
    return kStatusBadArgument;
  }
  const ArrayLayout layout(*elt.GetImp(), nDims);
  return ResizeElements(layout, handle, count, nullptr, allocWhenEmpty != 0, inflateFlags, true, "SetArraySizeFromTDR");
}

int32_t VectorSetSize(const TDR& elt, UHandle* handle, int32_t n) {
  const int32_t status = SetArraySizeFromTDR(elt, 1, handle, n, 0);
  if (status == kStatusNoError && *handle != nullptr) DimsOf(*handle)[0] = n;
  return status;
}

int32_t VectorResizeTDR(const TDR& elt, UHandle* handle, UHandle model) {
  int32_t n = 0;
  if (model != nullptr) {
    if (DSGetHandleSize(model) < sizeof(int32_t)) {
      ReportDamagedBlock();
      return kStatusBadArgument;
    }
    n = DimsOf(model)[0];
  }
  return VectorSetSize(elt, handle, n);
}

bool NeedsInflateForArrayElts(const TDR& elt) { return NeedsInflate(elt.GetImp()); }

void SetNeedsInflateForArrayEltsProc(NeedsInflateForArrayEltsProc proc) {
  gNeedsInflateProc.store(proc, std::memory_order_release);
}

bool TDContainsBoundedOrFixed(const TDR& type) { return ContainsBoundedOrFixed(type.GetImp()); }

int32_t CopyFlatArray(int32_t headerSize, UHandle src, UHandle* dst, int32_t nDims, int32_t eltSize) {
  if (dst == nullptr || headerSize < 0 || nDims < 0 || eltSize < 0) return kStatusBadArgument;
  if (src == nullptr) return DisposeInto(dst);
  if (src == *dst) return kStatusNoError;
  const size_t size = DSGetHandleSize(src);
  int32_t overflow = 0;
  int64_t count = 0;
  if (static_cast<int64_t>(size) >= kDimWordSize * nDims) count = NArrayElts(nDims, DimsOf(src), &overflow);
  const int64_t bytes = int64_t{headerSize} + count * eltSize;
  if (static_cast<int64_t>(size) < kDimWordSize * nDims || overflow != 0 ||
      (count != 0 && static_cast<int64_t>(size) < bytes)) {
    ReportDamagedBlock();
    return kStatusBadArgument;
  }
  return CopyBlockBytes(src, size, dst, bytes);
}

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

// --- TDArrayImp: layout and the life cycle of data -------------------------------------------------

TDImpPtr TDArrayImp::NewInstance() const { return MakeCounted<TDArrayImp>(); }

int32_t TDArrayImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  return platform != nullptr ? platform->PointerSize() : kPointerSize;
}

int32_t TDArrayImp::IsFlatDataFixedSize() const {
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  const TDImpPtr& element = GetElt();
  return IsFixed(word) && word != kCountWordMalformed && element && element->IsFlatDataFixedSize() != 0 ? 1 : 0;
}

int32_t TDArrayImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty == 0) TDImpClearMemory(data, this, clearFirst);
  if (!IsWellFormed()) {
    ReportMalformed();
    return kStatusOutOfMemory;
  }
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  if (overflow) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  const ArrayLayout layout(*GetElt(), GetNumDims());
  UHandle h = Load<UHandle>(data);
  if (onlyIfEmpty != 0 && h != nullptr) {
    if (!layout.handles) return kStatusNoError;
    int64_t count = 0;
    if (!layout.ReadCount(h, &count)) {
      ReportDamagedBlock();
      return kStatusBadArgument;
    }
    for (int64_t i = 0; i < count; ++i) {
      const int32_t status = layout.elt->InflateDefData(layout.Element(*h, i), 1, clearFirst, flags);
      if (status != kStatusNoError) return status;
    }
    return kStatusNoError;
  }

  const int64_t n = word == -1 ? 0 : (word & 0x7FFFFFFF);
  const bool anyFixedSize = std::any_of(Dims(), Dims() + GetNumDims(), [](int32_t w) { return DefaultWord(w) != 0; });
  Store<UHandle>(data, nullptr);
  if (n == 0 && !anyFixedSize) return kStatusNoError;
  const int64_t bytes = layout.packed ? 2 * PackedWordsOfSizes(layout.nDims, Dims()) : n * layout.eltSize;
  UHandle block = nullptr;
  if (DSNewHClr(static_cast<size_t>(layout.header + bytes), &block) != kStatusNoError) return kStatusOutOfMemory;
  for (int32_t d = 0; d < layout.nDims; ++d) DimsOf(block)[d] = DefaultWord(GetDimSize(d));
  if (layout.handles) {
    for (int64_t i = 0; i < n; ++i) {
      const int32_t status = layout.elt->InflateDefData(layout.Element(*block, i), 0, 1, flags);
      if (status == kStatusNoError) continue;
      DisposeElements(layout, *block, 0, i);
      DSDisposeHandle(block);
      return status;
    }
  }
  Store(data, block);
  return kStatusNoError;
}

int32_t TDArrayImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  if (!IsWellFormed()) {
    ReportMalformed();
    return kStatusOutOfMemory;
  }
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  if (overflow) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  UHandle h = Load<UHandle>(data);
  if (word == -1) {
    DeflateData(data, nullptr, 1, NormalHandleAllocator());
    return Load<UHandle>(data) == nullptr ? kStatusNoError : kStatusBadArgument;
  }
  if (h == nullptr) return InflateDefData(data, 0, 0, 0);
  const ArrayLayout layout(*GetElt(), GetNumDims());
  const int64_t n = word & 0x7FFFFFFF;
  const int64_t bytes = layout.packed ? 2 * PackedWordsOfSizes(layout.nDims, Dims()) : n * layout.eltSize;
  const int64_t need = n == 0 ? kDimWordSize * layout.nDims : layout.header + bytes;
  if (static_cast<int64_t>(DSGetHandleSize(h)) < need) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "ResetToDefaultArrayData?");
    return kStatusOutOfMemory;
  }
  for (int32_t d = 0; d < layout.nDims; ++d) DimsOf(h)[d] = DefaultWord(GetDimSize(d));
  if (!layout.handles) {
    // The default of every element without handles is zero bytes.
    if (n != 0) ClearMem(layout.Element(*h, 0), static_cast<size_t>(bytes));
    return kStatusNoError;
  }
  for (int64_t i = 0; i < n; ++i) {
    const int32_t status = layout.elt->ResetToDefaultData(layout.Element(*h, i));
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

int32_t TDArrayImp::DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const {
  if (!Below(data, end)) return 0;
  UHandle h = Load<UHandle>(data);
  if (h == nullptr || !IsWellFormed()) return 0;
  const ArrayLayout layout(*GetElt(), GetNumDims());
  const int64_t size = static_cast<int64_t>(allocator.GetHandleSize(h));
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  const bool bounded = !overflow && word != -1 && !IsFixed(word);
  int64_t released = 0;
  if (layout.handles && size >= kDimWordSize * layout.nDims) {
    int32_t bad = 0;
    int64_t count = bounded ? word : NArrayElts(layout.nDims, DimsOf(h), &bad);
    // Only the elements the block holds are given back.
    if (layout.eltSize > 0) count = std::min(count, std::max<int64_t>(size - layout.header, 0) / layout.eltSize);
    for (int64_t i = 0; i < count; ++i) {
      uint8_t* element = layout.Element(*h, i);
      released += layout.elt->DeflateData(element, element + layout.eltSize, 1, allocator);
    }
  }
  if (dispose != 0) {
    if (allocator.DisposeHandle(h) != kStatusNoError) return Saturated(released);
    Store<UHandle>(data, nullptr);
    return Saturated(released + size);
  }
  if (word == -1) {
    if (size > layout.header && allocator.SetHandleSize(h, static_cast<size_t>(layout.header)) == kStatusNoError) {
      released += size - layout.header;
    }
    ClearMem(*h, static_cast<size_t>(std::min<int64_t>(kDimWordSize * layout.nDims, size)));
  } else if (bounded) {
    ClearMem(*h, static_cast<size_t>(size));
  } else if (size > layout.header) {
    ClearMem(At(*h, layout.header), static_cast<size_t>(size - layout.header));
  }
  return Saturated(released);
}

int32_t TDArrayImp::VerifyData(const void* data, const KoContext* context) const {
  if (data == nullptr) return kStatusBadArgument;
  const UHandle h = Load<UHandle>(data);
  if (h == nullptr) return kStatusNoError;
  if (!IsWellFormed()) return kStatusNullHandle;
  const ArrayLayout layout(*GetElt(), GetNumDims());
  // Nothing is read before the handle is known to be live and large enough for what is read.
  int64_t count = 0;
  if (IsDSHandle(h) == 0 || !layout.ReadCount(h, &count)) return ReportDamagedData(*this, data);
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  if (word != -1) {
    const int64_t n = word & 0x7FFFFFFF;
    int32_t code = kStatusNoError;
    if (IsPreAllocationEnabled()) {
      if (count > n || (IsFixed(word) && count != n)) code = kRavePreallocation;
    } else if (count != n) {
      code = kRavePreallocation;
    } else if (!IsFixed(word)) {
      code = kRaveBoundedWithoutPreallocation;
    }
    if (code != kStatusNoError) {
      const int32_t status = RaveStatusForDamage(code);
      if (status != kStatusNoError) {
        WriteVerifyDataMessage(status, *this, data);
        return status;
      }
    }
  }
  if (!layout.handles) return kStatusNoError;
  for (int64_t i = 0; i < count; ++i) {
    const int32_t status = layout.elt->VerifyData(layout.Element(*h, i), context);
    if (status != kStatusNoError) {
      WriteVerifyDataMessage(status, *this, data, layout.header + i * layout.eltSize);
      return status;
    }
  }
  return kStatusNoError;
}

int32_t TDArrayImp::ResizeToDims(UHandle* h, const int32_t* dims) const {
  if (!IsWellFormed()) return kStatusNullHandle;
  return ResizeToDimWords(ArrayLayout(*GetElt(), GetNumDims()), h, dims);
}

int32_t TDArrayImp::ResizeAsVector(void* data, int32_t count, void** firstElement) const {
  if (data == nullptr || firstElement == nullptr || count < 0) return kStatusBadArgument;
  if (!IsWellFormed() || GetNumDims() != 1 || !IsVariable(GetDimSize(0))) return kStatusBadArgument;
  UHandle h = Load<UHandle>(data);
  const int32_t dims[1] = {count};
  const int32_t status = ResizeToDims(&h, dims);
  Store(data, h);
  // A damaged block is no reason to call the destination something other than a vector.
  if (status != kStatusNoError) return status == kStatusBadArgument ? kStatusNullHandle : status;
  *firstElement = h != nullptr ? ArrayLayout(*GetElt(), 1).Element(*h, 0) : nullptr;
  return kStatusNoError;
}

// --- TDArrayImp: copy and conversion ---------------------------------------------------------------

namespace {

// Copies a preallocated (bounded or fixed) array: nothing is resized.
int32_t CopyPreallocated(const TDArrayImp& type, const ArrayLayout& layout, int32_t word, const void* src, void* dst,
                         int32_t flags, const KoContext* context) {
  const int64_t n = word & 0x7FFFFFFF;
  const int64_t capacityBytes =
      layout.header + (layout.packed ? 2 * PackedWordsOfSizes(layout.nDims, type.Dims()) : n * layout.eltSize);
  const UHandle from = Load<UHandle>(src);
  int64_t count = 0;
  if (from != nullptr) {
    int32_t overflow = 0;
    if (static_cast<int64_t>(DSGetHandleSize(from)) < capacityBytes ||
        (count = NArrayElts(layout.nDims, DimsOf(from), &overflow), overflow != 0 || count > n)) {
      ReportPreallocatedSource();
      return kStatusOutOfMemory;
    }
  }
  UHandle into = Load<UHandle>(dst);
  if (into == nullptr) {
    const int32_t status = type.InflateDefData(dst, 0, 0, 0);
    if (status != kStatusNoError) return status;
    into = Load<UHandle>(dst);
  }
  if (into == nullptr || static_cast<int64_t>(DSGetHandleSize(into)) < capacityBytes) {
    ReportPreallocatedDestination();
    return kStatusOutOfMemory;
  }
  if (from == nullptr) {
    // A fixed array never loses its sizes: with nothing to copy it takes its default.
    if (IsFixed(word)) return type.ResetToDefaultData(dst);
    ClearMem(*into, static_cast<size_t>(kDimWordSize * layout.nDims));
    return kStatusNoError;
  }
  if (from == into) return kStatusNoError;
  if (!layout.handles) {
    MoveBlock(*from, *into, static_cast<size_t>(capacityBytes));
    return kStatusNoError;
  }
  MoveBlock(*from, *into, static_cast<size_t>(layout.header));
  for (int64_t i = 0; i < count; ++i) {
    const int32_t status = layout.elt->CopyData(layout.Element(*from, i), layout.Element(*into, i), flags, context);
    if (status != kStatusNoError) return status;
  }
  return kStatusNoError;
}

// Copies element by element into a destination sized like the source.
int32_t CopyElementwise(const ArrayLayout& layout, const void* src, void* dst, int32_t flags, const KoContext* context) {
  const UHandle from = Load<UHandle>(src);
  UHandle into = Load<UHandle>(dst);
  if (from != nullptr && from == into) return kStatusNoError;
  int64_t count = 0;
  if (from != nullptr && !layout.ReadCount(from, &count)) {
    ReportDamagedBlock();
    return kStatusBadArgument;
  }
  const int32_t status = ResizeToDimWords(layout, &into, from != nullptr ? DimsOf(from) : nullptr);
  Store(dst, into);
  if (status != kStatusNoError) return status;
  for (int64_t i = 0; i < count; ++i) {
    const int32_t copied = layout.elt->CopyData(layout.Element(*from, i), layout.Element(*into, i), flags, context);
    if (copied != kStatusNoError) return copied;
  }
  return kStatusNoError;
}

// The copy into the other Boolean width: the destination holds the source's dimensions with the
// element mutated (8-bit Booleans to the packed 16-bit form, or back). A bounded or fixed
// destination is given back first and made anew at the source's size.
int32_t CopyBooleanForm(const TDArrayImp& type, const ArrayLayout& layout, int32_t word, const void* src, void* dst,
                        int32_t flags, const KoContext* context) {
  const UHandle from = Load<UHandle>(src);
  if (from != nullptr && from == Load<UHandle>(dst)) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "wrong type for boolean convert");
    return kStatusBadArgument;
  }
  int64_t count = 0;
  if (from != nullptr && !layout.ReadCount(from, &count)) {
    ReportDamagedBlock();
    return kStatusBadArgument;
  }
  TDImpPtr mutated = type.CloneOrCheckOut();
  if (!mutated) return kStatusOutOfMemory;
  mutated->MutateBooleanTD(&mutated, HoldsBoolean(*layout.elt, true) ? 1 : 0);
  const TDImpPtr& element = AsSingleContainer(mutated.get())->GetElt();
  if (!element) return kStatusOutOfMemory;
  // Preallocated elements beyond the current count hold handles the resize would not see.
  if (word != -1) mutated->DeflateData(dst, nullptr, 1, NormalHandleAllocator());
  const ArrayLayout target(*element, layout.nDims);
  const int32_t* dims = from != nullptr ? DimsOf(from) : nullptr;
  UHandle into = Load<UHandle>(dst);
  const int32_t status = ResizeToDimWords(target, &into, dims);
  Store(dst, into);
  if (status != kStatusNoError || from == nullptr) return status;
  const int64_t rowLength = layout.nDims > 0 ? dims[layout.nDims - 1] : 1;
  const int64_t rows = rowLength > 0 ? count / rowLength : 0;
  if (layout.elt->IsBool() != 0 && target.elt->IsBoolU16() != 0) {
    PackBooleans(layout.Element(*from, 0), target.Element(*into, 0), rows, rowLength);
    return kStatusNoError;
  }
  if (layout.elt->IsBoolU16() != 0 && target.elt->IsBool() != 0) {
    UnpackBooleans(layout.Element(*from, 0), target.Element(*into, 0), rows, rowLength);
    return kStatusNoError;
  }
  if (layout.elt->IsBool() != 0 || layout.elt->IsBoolU16() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "wrong type for boolean convert");
    return kStatusBadArgument;
  }
  for (int64_t i = 0; i < count; ++i) {
    const int32_t copied = layout.elt->CopyData(layout.Element(*from, i), target.Element(*into, i), flags, context);
    if (copied != kStatusNoError) return copied;
  }
  return kStatusNoError;
}

}  // namespace

int32_t TDArrayImp::CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  if (!IsWellFormed()) {
    ReportMalformed();
    return kStatusNullHandle;
  }
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  if (overflow) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  const ArrayLayout layout(*GetElt(), GetNumDims());
  if ((flags & kCopyFlagBooleanForm) != 0 && HoldsBoolean(*layout.elt, false)) {
    return CopyBooleanForm(*this, layout, word, src, dst, flags, context);
  }
  // No elements can be preallocated when the count word is 0: the block is the dimension words.
  if ((word == -1 || word == 0) && !layout.handles && (flags & kCopyFlagBooleanForm) == 0) {
    UHandle into = Load<UHandle>(dst);
    const int32_t status = CopyFlatBlock(layout, Load<UHandle>(src), &into);
    Store(dst, into);
    return status;
  }
  if (word == -1 || word == 0) return CopyElementwise(layout, src, dst, flags, context);
  return CopyPreallocated(*this, layout, word, src, dst, flags, context);
}

int32_t TDArrayImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  return ConvertArrayKind(*this, &ArraySource, "CopyArrayToSubArray", dst, src, dstData, flags);
}

// --- TDArrayImp: order of data ---------------------------------------------------------------------

namespace {

// One side of an array comparison: the block, or null for a null handle and for a damaged block
// (whose elements are never read).
struct ArraySide {
  const uint8_t* block = nullptr;
  int64_t count = 0;

  ArraySide(const ArrayLayout& layout, const void* data) {
    const auto h = Load<UHandle>(data);
    if (h != nullptr && layout.ReadCount(h, &count)) {
      block = *h;
    } else {
      count = 0;
    }
  }
  const int32_t* Dims() const { return reinterpret_cast<const int32_t*>(block); }
};

}  // namespace

DataOrder TDArrayImp::OrderData(const void* a, const void* b, const DataOrderOptions& options) const {
  if (!IsWellFormed()) return {};
  const ArrayLayout layout(*GetElt(), GetNumDims());
  const ArraySide x(layout, a);
  const ArraySide y(layout, b);
  if (!options.nullFirst) {
    if (x.count != y.count) return {x.count < y.count ? -1 : 1};
    if (x.count == 0) return {};
  } else if (x.block == nullptr || y.block == nullptr) {
    return {x.block == y.block ? 0 : (x.block == nullptr ? 1 : -1)};
  }
  // Equal dimension words mean equal counts from here on.
  const int32_t dims = BlockCmp(x.block, y.block, sizeof(int32_t) * static_cast<size_t>(layout.nDims));
  if (dims != 0 || x.count == 0) return {dims};

  const uint8_t* firstA = layout.Element(x.block, 0);
  const uint8_t* firstB = layout.Element(y.block, 0);
  if (layout.packed) {
    if (options.bytewise != 0) return {BlockCmp(firstA, firstB, static_cast<size_t>(layout.Bytes(x.count, x.Dims())))};
    const int64_t rowLength = layout.nDims > 0 ? x.Dims()[layout.nDims - 1] : 1;
    return {ComparePackedBooleans(firstA, firstB, x.count / rowLength, rowLength)};
  }
  if (options.bytewise != 0 && !layout.handles) {
    return {BlockCmp(firstA, firstB, static_cast<size_t>(x.count * layout.eltSize))};
  }
  // Elements of no size are all alike, however many the dimensions count.
  if (layout.eltSize == 0) return {};
  for (int64_t i = 0; i < x.count; ++i) {
    const int32_t order =
        options.compareElement(*layout.elt, layout.Element(x.block, i), layout.Element(y.block, i), options);
    if (order != 0) return {order};
  }
  return {};
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

int32_t TDSubArrayImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  return TDImp::InflateDefData(data, onlyIfEmpty, clearFirst, flags);
}

int32_t TDSubArrayImp::IsFlatDataFixedSize() const {
  bool overflow = false;
  const int32_t word = CountWord(&overflow);
  const TDImpPtr& element = GetElt();
  return IsFixed(word) && word != kCountWordMalformed && element && element->IsFlatDataFixedSize() != 0 ? 1 : 0;
}

int32_t TDSubArrayImp::VerifyData(const void* data, const KoContext*) const {
  if (data == nullptr) return kStatusBadArgument;
  bool sound = true;
  int64_t count = 1;
  for (int32_t d = 0; d < GetNumDims(); ++d) {
    const auto size = Load<int64_t>(At(data, kRecordDimsOffset + kRecordDimSize * d));
    if (size < 0 || size > kMaxCount) sound = false;
    count = std::min(count * std::clamp<int64_t>(size, 0, kMaxCount), kMaxCount + 1);
  }
  if (count > kMaxCount || (count > 0 && Load<const void*>(data) == nullptr)) sound = false;
  return sound ? kStatusNoError : ReportDamagedData(*this, data);
}

int32_t TDSubArrayImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, static_cast<size_t>(DataSizeCore(nullptr)));
  return kStatusNoError;
}

int32_t TDSubArrayImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const {
  return ConvertArrayKind(*this, &SubArraySource, "CopySubArrayToSubArray", dst, src, dstData, flags);
}

DataOrder TDSubArrayImp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  return {OrderBytes(a, b).order, DataOrderNote::SubtypeRecords};
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

// --- handles -------------------------------------------------------------------------------------

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

int32_t TDRArray::SetArraySize(UHandle* handle, int32_t count) const {
  const TDArrayBaseImp* array = AsArrayBase(GetImp());
  if (array == nullptr || !array->IsWellFormed()) return kStatusNullHandle;
  if (array->GetElt()->IsArrayBase() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "SetArraySizeFromTDPtr: array element cannot be an array");
    return kStatusBadArgument;
  }
  const ArrayLayout layout(*array->GetElt(), array->GetNumDims());
  return ResizeElements(layout, handle, count, nullptr, false, 0, false, "SetArraySizeFromTDPtr");
}

int32_t TDRArray::SetArraySize(UHandle* handle, int32_t count, const int32_t* dims) const {
  const TDArrayBaseImp* array = AsArrayBase(GetImp());
  if (array == nullptr || !array->IsWellFormed()) return kStatusNullHandle;
  if (array->GetElt()->IsArrayBase() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "SetArraySizeFromTDPtr: array element cannot be an array");
    return kStatusBadArgument;
  }
  const ArrayLayout layout(*array->GetElt(), array->GetNumDims());
  if (dims != nullptr) {
    int32_t overflow = 0;
    const int64_t product = NArrayElts(layout.nDims, dims, &overflow);
    if (overflow != 0 || product != count) {
      (VELLUM_DEBUG(3) << "SetArraySizeFromTDPtr: count=" << count << " does not match the dimension sizes").Process();
      return kStatusBadArgument;
    }
  }
  const bool anyNonZero = dims != nullptr && std::any_of(dims, dims + layout.nDims, [](int32_t d) { return d != 0; });
  const int32_t status =
      ResizeElements(layout, handle, count, dims, count == 0 && anyNonZero, 0, false, "SetArraySizeFromTDPtr");
  if (status != kStatusNoError || *handle == nullptr) return status;
  for (int32_t d = 0; d < layout.nDims; ++d) DimsOf(*handle)[d] = dims != nullptr ? dims[d] : 0;
  return kStatusNoError;
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

// --- flattened data --------------------------------------------------------------------------------

namespace {

// Booleans of streams before this version are packed sixteen to a word, a new word each row.
// Values that take no input (pointers, empty clusters) cost time only: so many are enough for any
// real stream.
constexpr int64_t kMaxEmptyValues = int64_t{1} << 20;

bool PacksBooleans(const TDImp& element, uint32_t version) {
  return element.IsBool() != 0 && version < kOneByteBooleanVersion;
}

// The words of packed Booleans for these sizes (at least one row).
int64_t PackedWords(int32_t nDims, const int32_t* sizes) {
  if (nDims < 1) return 1;
  int64_t rows = 1;
  for (int32_t d = 0; d + 1 < nDims; ++d) rows *= sizes[d];
  return rows * ((static_cast<int64_t>(sizes[nDims - 1]) + 15) >> 4);
}

int32_t WritePackedBooleans(KoDataWriter* writer, const uint8_t* values, int32_t nDims, const int32_t* sizes,
                            int64_t count) {
  const int64_t row = nDims < 1 ? 1 : sizes[nDims - 1];
  if (row == 0) return writer->GetError();
  for (int64_t start = 0; start < count && writer->GetError() == kStatusNoError; start += row) {
    for (int64_t bit = 0; bit < row; bit += 16) {
      uint16_t word = 0;
      for (int64_t k = 0; k < 16 && bit + k < row; ++k)
        if (values[start + bit + k] != 0) word = static_cast<uint16_t>(word | (0x8000u >> k));
      writer->WriteU16(word);
    }
  }
  return writer->GetError();
}

// Unpacks into `values` (null: skip the words).
int32_t ReadPackedBooleans(KoDataReader* reader, uint8_t* values, int32_t nDims, const int32_t* sizes,
                           int64_t count) {
  const int64_t row = nDims < 1 ? 1 : sizes[nDims - 1];
  if (values == nullptr || row == 0) return reader->Skip(static_cast<size_t>(2 * PackedWords(nDims, sizes)));
  for (int64_t start = 0; start < count && reader->GetError() == kStatusNoError; start += row) {
    for (int64_t bit = 0; bit < row; bit += 16) {
      uint16_t word = 0;
      reader->ReadU16(&word);
      for (int64_t k = 0; k < 16 && bit + k < row; ++k) values[start + bit + k] = (word & (0x8000u >> k)) != 0 ? 1 : 0;
    }
  }
  return reader->GetError();
}

// The fewest bytes one value of `element` takes in the stream.
uint64_t MinFlatSize(const TDImp& element, uint32_t version) {
  PreflightOutputBuf counter;
  KoDataWriter sizer(&counter, version, nullptr, kKoDataWriterDeterminingSizeWithoutData);
  return element.FlatDataSize(&sizer, nullptr);
}

// Whether `count` values of `element` with these sizes can be in what is left of the input;
// 116 with a message when they cannot.
bool CountFitsInput(KoDataReader* reader, const TDImp& element, int32_t nDims, const int32_t* sizes, int64_t count) {
  uint64_t need = 0;
  if (PacksBooleans(element, reader->GetVersion())) {
    need = 2 * static_cast<uint64_t>(PackedWords(nDims, sizes));
  } else {
    const uint64_t each = MinFlatSize(element, reader->GetVersion());
    if (each != 0 && static_cast<uint64_t>(count) > UINT64_MAX / each) need = UINT64_MAX;
    else need = each * static_cast<uint64_t>(count);
  }
  if (need <= reader->BytesLeft()) return true;
  (VELLUM_DEBUG(2) << "ReadData: " << count << " array elements cannot be in the " << reader->BytesLeft()
                   << " bytes left")
      .Process();
  reader->SetError(kStatusImplausibleData);
  return false;
}

// Reads `count` elements into consecutive slots from `first` (null: skip them).
int32_t ReadElements(KoDataReader* reader, const ArrayLayout& layout, uint8_t* first, int32_t nDims,
                     const int32_t* sizes, int64_t count) {
  if (PacksBooleans(*layout.elt, reader->GetVersion())) return ReadPackedBooleans(reader, first, nDims, sizes, count);
  if (count == 0) return reader->GetError();
  // Values that take no input cost time only; a count the input does not pay for is refused.
  if (count > kMaxEmptyValues && MinFlatSize(*layout.elt, reader->GetVersion()) == 0) {
    (VELLUM_DEBUG(2) << "ReadData: " << count << " array elements that take no input are more than "
                     << kMaxEmptyValues)
        .Process();
    reader->SetError(kStatusImplausibleData);
    return reader->GetError();
  }
  layout.elt->ReadData(reader, first, static_cast<int32_t>(count), nullptr);
  return reader->GetError();
}

// A bounded or fixed array's read: the stream's elements (`sizes`) go into the preallocated
// block cut to the type's words; elements outside are read and dropped.
int32_t ReadIntoPreallocated(KoDataReader* reader, const TDArrayImp& type, const ArrayLayout& layout, UHandle h,
                             const int32_t* sizes, int64_t count) {
  const int32_t nDims = layout.nDims;
  std::vector<int32_t> kept(static_cast<size_t>(nDims));
  bool same = true;
  for (int32_t d = 0; d < nDims; ++d) {
    const int32_t word = type.GetDimSize(d);
    const int32_t limit = vellum::bound::Length(word);
    if (vellum::bound::IsFixed(word) && sizes[d] != limit)
      DebugReport(kDiagnosticModule, __LINE__, 3, "fixed size array prealloc'd wrong?");
    kept[static_cast<size_t>(d)] = vellum::bound::IsFixed(word) ? limit : std::min(sizes[d], limit);
    same = same && kept[static_cast<size_t>(d)] == sizes[d];
  }
  for (int32_t d = 0; d < nDims; ++d) DimsOf(h)[d] = kept[static_cast<size_t>(d)];
  if (same) return ReadElements(reader, layout, layout.Element(*h, 0), nDims, sizes, count);
  // Packed Booleans are unpacked whole first, then placed like any other element.
  std::vector<uint8_t> unpacked;
  const bool packed = PacksBooleans(*layout.elt, reader->GetVersion());
  if (packed) {
    unpacked.resize(static_cast<size_t>(count));
    if (ReadPackedBooleans(reader, unpacked.data(), nDims, sizes, count) != kStatusNoError) return reader->GetError();
  }
  for (int64_t linear = 0; linear < count && reader->GetError() == kStatusNoError; ++linear) {
    int64_t rest = linear;
    int64_t target = 0;
    int64_t step = 1;
    bool inside = true;
    for (int32_t d = nDims - 1; d >= 0; --d) {
      const int64_t index = rest % sizes[d];
      rest /= sizes[d];
      if (index >= kept[static_cast<size_t>(d)]) inside = false;
      target += index * step;
      step *= kept[static_cast<size_t>(d)];
    }
    uint8_t* into = inside ? layout.Element(*h, target) : nullptr;
    if (packed) {
      if (into != nullptr) *into = unpacked[static_cast<size_t>(linear)];
      continue;
    }
    layout.elt->ReadData(reader, into, 1, nullptr);
  }
  return reader->GetError();
}

}  // namespace

uint32_t TDArrayImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  const int32_t nDims = GetNumDims();
  uint64_t size = 4 * static_cast<uint64_t>(nDims);
  if (!IsWellFormed()) return static_cast<uint32_t>(size);
  const uint32_t version = writer != nullptr ? writer->GetVersion() : PXApp::Instance().GetVersion();
  if (data == nullptr) {
    // Without data only a fixed array knows its elements: every value has them all.
    if (IsFlatDataFixedSize() == 0) return static_cast<uint32_t>(size);
    bool overflow = false;
    const int64_t count = CountWord(&overflow) & 0x7FFFFFFF;
    if (PacksBooleans(*GetElt(), version)) {
      std::vector<int32_t> sizes(static_cast<size_t>(nDims));
      for (int32_t d = 0; d < nDims; ++d) sizes[static_cast<size_t>(d)] = vellum::bound::Length(GetDimSize(d));
      size += 2 * static_cast<uint64_t>(PackedWords(nDims, sizes.data()));
    } else {
      size += static_cast<uint64_t>(count) * GetElt()->FlatDataSize(writer, nullptr);
    }
    return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
  }
  const ArrayLayout layout(*GetElt(), nDims);
  const UHandle h = Load<UHandle>(data);
  int64_t count = 0;
  if (h == nullptr || !layout.ReadCount(h, &count)) return static_cast<uint32_t>(size);
  if (PacksBooleans(*layout.elt, version)) {
    size += 2 * static_cast<uint64_t>(PackedWords(nDims, DimsOf(h)));
  } else if (layout.elt->IsFlatDataFixedSize() != 0) {
    size += static_cast<uint64_t>(count) * layout.elt->FlatDataSize(writer, nullptr);
  } else {
    for (int64_t i = 0; i < count; ++i) size += layout.elt->FlatDataSize(writer, layout.Element(*h, i));
  }
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDArrayImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (!IsWellFormed()) {
    ReportMalformed();
    writer->SetError(kStatusNullHandle);
  } else if (count > 0 && data == nullptr) {
    writer->SetError(kStatusBadArgument);
  }
  const int32_t nDims = GetNumDims();
  for (int32_t v = 0; v < count && writer->GetError() == kStatusNoError; ++v) {
    const UHandle h = Load<UHandle>(static_cast<const uint8_t*>(data) + static_cast<size_t>(v) * sizeof(UHandle));
    if (h == nullptr) {
      for (int32_t d = 0; d < nDims; ++d) writer->WriteI32(0);
      continue;
    }
    const ArrayLayout layout(*GetElt(), nDims);
    int64_t elements = 0;
    if (!layout.ReadCount(h, &elements)) {
      ReportDamagedBlock();
      writer->SetError(kStatusBadArgument);
      break;
    }
    writer->WriteValues(DimsOf(h), sizeof(int32_t), static_cast<size_t>(nDims));
    if (PacksBooleans(*layout.elt, writer->GetVersion())) {
      WritePackedBooleans(writer, layout.Element(*h, 0), nDims, DimsOf(h), elements);
    } else if (elements != 0) {
      layout.elt->WriteData(writer, layout.Element(*h, 0), static_cast<int32_t>(elements), nullptr);
    }
  }
}

void TDArrayImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  if (!IsWellFormed()) {
    ReportMalformed();
    reader->SetError(kStatusNullHandle);
  }
  const int32_t nDims = GetNumDims();
  bool overflow = false;
  const int32_t word = IsWellFormed() ? CountWord(&overflow) : -1;
  std::vector<int32_t> sizes(static_cast<size_t>(nDims));
  for (int32_t v = 0; v < count && reader->GetError() == kStatusNoError; ++v) {
    uint8_t* slot = data != nullptr ? static_cast<uint8_t*>(data) + static_cast<size_t>(v) * sizeof(UHandle) : nullptr;
    if (reader->ReadValues(sizes.data(), sizeof(int32_t), static_cast<size_t>(nDims)) != kStatusNoError) break;
    int32_t tooMany = 0;
    const int64_t elements = NArrayElts(nDims, sizes.data(), &tooMany);
    if (tooMany != 0) {
      ReportOverflow();
      reader->SetError(kStatusImplausibleData);
      break;
    }
    const ArrayLayout layout(*GetElt(), nDims);
    if (!CountFitsInput(reader, *layout.elt, nDims, sizes.data(), elements)) break;
    if (slot == nullptr) {
      ReadElements(reader, layout, nullptr, nDims, sizes.data(), elements);
      continue;
    }
    UHandle h = Load<UHandle>(slot);
    if (word == -1) {
      const int64_t bytes = layout.header + layout.Bytes(elements, sizes.data());
      if ((h == nullptr || static_cast<int64_t>(DSGetHandleSize(h)) < bytes) &&
          !reader->MayAllocate(static_cast<uint64_t>(bytes)))
        break;
      const int32_t resized = ResizeToDimWords(layout, &h, sizes.data());
      Store(slot, h);
      if (resized != kStatusNoError) {
        reader->SetError(kStatusCorruptData);
        break;
      }
      if (h != nullptr) ReadElements(reader, layout, layout.Element(*h, 0), nDims, sizes.data(), elements);
      continue;
    }
    // Bounded or fixed: the preallocated block, made when there is none.
    const int64_t capacity = word & 0x7FFFFFFF;
    const int64_t need = layout.header + (layout.packed ? 2 * PackedWordsOfSizes(nDims, Dims()) : capacity * layout.eltSize);
    if (h == nullptr) {
      if (!reader->MayAllocate(static_cast<uint64_t>(need))) break;
      if (InflateDefData(slot, 0, 1, 0) != kStatusNoError) {
        reader->SetError(kStatusOutOfMemory);
        break;
      }
      h = Load<UHandle>(slot);
    }
    if (h == nullptr && capacity == 0) {
      // No room at all: the default of such an array is no block, and every element is dropped.
      ReadElements(reader, layout, nullptr, nDims, sizes.data(), elements);
      continue;
    }
    if (h == nullptr || static_cast<int64_t>(DSGetHandleSize(h)) < need) {
      DebugReport(kDiagnosticModule, __LINE__, 3,
                  "Array exists whose type thinks it needs more memory than what is preallocated.");
      reader->SetError(kStatusOutOfMemory);
      break;
    }
    ReadIntoPreallocated(reader, *this, layout, h, sizes.data(), elements);
  }
}

uint32_t TDSubArrayImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  const int32_t nDims = GetNumDims();
  uint64_t size = 4 * static_cast<uint64_t>(nDims);
  if (data == nullptr || !IsWellFormed()) return static_cast<uint32_t>(size);
  const ArrayLayout layout(*GetElt(), nDims);
  Source source;
  if (!SubArraySource(layout, data, &source)) return static_cast<uint32_t>(size);
  bool overflow = false;
  const int64_t count = source.Count(&overflow);
  WalkRowMajor(source, [&source](int32_t d) { return source.Size(d); }, count, [&](int64_t, const uint8_t* element) {
    size += layout.elt->FlatDataSize(writer, element);
    return kStatusNoError;
  });
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDSubArrayImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (!IsWellFormed()) {
    ReportMalformed();
    writer->SetError(kStatusNullHandle);
  } else if (count > 0 && data == nullptr) {
    writer->SetError(kStatusBadArgument);
  }
  const int32_t nDims = GetNumDims();
  const int64_t recordSize = DataSizeCore(nullptr);
  for (int32_t v = 0; v < count && writer->GetError() == kStatusNoError; ++v) {
    const ArrayLayout layout(*GetElt(), nDims);
    Source source;
    if (!SubArraySource(layout, static_cast<const uint8_t*>(data) + recordSize * v, &source)) {
      writer->SetError(kStatusBadArgument);
      break;
    }
    bool overflow = false;
    const int64_t elements = source.Count(&overflow);
    for (int32_t d = 0; d < nDims; ++d) writer->WriteI32(static_cast<int32_t>(source.Size(d)));
    WalkRowMajor(source, [&source](int32_t d) { return source.Size(d); }, elements,
                 [&](int64_t, const uint8_t* element) {
                   layout.elt->WriteData(writer, element, 1, nullptr);
                   return writer->GetError();
                 });
  }
}

void TDSubArrayImp::ReadFlatData(KoDataReader* reader, void*, int32_t) const {
  DebugReport(kDiagnosticModule, __LINE__, 2, "ReadData does not handle subArrays!");
  reader->SetError(kStatusBadArgument);
}
