// Array data: the resizing engine, default data, reset, disposal, verification, copy and
// conversion (array to array along the row-major walk, views into subarrays, gathering from
// them), the order of array data and the counting of elements.
#include "source/families/TDArray.h"

#include <algorithm>
#include <atomic>
#include <bit>
#include <cstring>
#include <functional>
#include <limits>
#include <vector>

#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXStrings.h"
#include "source/families/TDArrayInternal.h"
#include "source/families/TDStringBase.h"
#include "source/model/TDDataManager.h"
#include "source/model/TypeManager.h"

VELLUM_DIAGNOSTIC_MODULE("TDArray");

namespace {

using namespace tdarray_detail;

// What the rave procedure is told besides a bad size (1024): a preallocated array whose counts
// disagree with its type, and a bounded array while preallocation is off.
constexpr int32_t kRavePreallocation = 4096;
constexpr int32_t kRaveBoundedWithoutPreallocation = 128;

bool Below(const void* data, const void* end) {
  return data != nullptr && (end == nullptr || std::less<const void*>()(data, end));
}

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
void ReportCodes(const TDImp* dst, const TDImp& src) { ReportConversionCodes(kDiagnosticModule, __LINE__, dst, src); }

// The product of the sizes for a report, whatever it is.
int64_t RawProduct(int32_t nDims, const int32_t* dims) {
  int64_t product = 1;
  for (int32_t d = 0; d < nDims; ++d) {
    if (__builtin_mul_overflow(product, static_cast<int64_t>(dims[d]), &product)) return std::numeric_limits<int64_t>::max();
  }
  return product;
}

// The count word of `type` into *word: 0; after a report, `malformed` for an array without its
// dimension list or element, and 1 for sizes whose product overflows.
int32_t UsableCountWord(const TDArrayBaseImp& type, int32_t malformed, int32_t* word) {
  if (!type.IsWellFormed()) {
    ReportMalformed();
    return malformed;
  }
  bool overflow = false;
  *word = type.CountWord(&overflow);
  if (overflow) {
    ReportOverflow();
    return kStatusBadArgument;
  }
  return kStatusNoError;
}

// What a default (or reset) block holds in a dimension word: the fixed size, else 0.
int32_t DefaultWord(int32_t word) { return IsFixed(word) ? Length(word) : 0; }

// --- the element test of resizing ------------------------------------------------------------------

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

// --- the resizing engine ---------------------------------------------------------------------------

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

// --- flat copies -----------------------------------------------------------------------------------

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

// --- views of source elements ----------------------------------------------------------------------

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

// --- what the flattened form shares ----------------------------------------------------------------

namespace tdarray_detail {

void ReportMalformed() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array type without dimension list or element"); }
void ReportOverflow() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array number of elements overflowed"); }
void ReportDamagedBlock() { DebugReport(kDiagnosticModule, __LINE__, 3, "Array block smaller than its dimension sizes"); }

int64_t PackedWordsOfSizes(int32_t nDims, const int32_t* words) {
  if (nDims < 1) return 1;
  int64_t rows = 1;
  for (int32_t d = 0; d + 1 < nDims; ++d) rows *= words[d] & 0x7FFFFFFF;
  return rows * ((static_cast<int64_t>(words[nDims - 1] & 0x7FFFFFFF) + 15) >> 4);
}

int32_t ResizeToDimWords(const ArrayLayout& layout, UHandle* h, const int32_t* dims) {
  if (dims == nullptr) {
    return ResizeToSizes(layout, h, [](int32_t) { return int64_t{0}; }, nullptr, "SetArraySizeFromTDPtr");
  }
  return ResizeToSizes(layout, h, [dims](int32_t d) { return static_cast<int64_t>(dims[d]); }, dims,
                       "SetArraySizeFromTDPtr");
}

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

}  // namespace tdarray_detail

// --- counting --------------------------------------------------------------------------------------

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

// --- resizing and flat copy ------------------------------------------------------------------------

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

// --- TDArrayImp: the life cycle of data ------------------------------------------------------------

int32_t TDArrayImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  if (onlyIfEmpty == 0) TDImpClearMemory(data, this, clearFirst);
  int32_t word = 0;
  if (const int32_t status = UsableCountWord(*this, kStatusOutOfMemory, &word); status != kStatusNoError) return status;
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
  int32_t word = 0;
  if (const int32_t status = UsableCountWord(*this, kStatusOutOfMemory, &word); status != kStatusNoError) return status;
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
  int32_t word = 0;
  if (const int32_t status = UsableCountWord(*this, kStatusNullHandle, &word); status != kStatusNoError) return status;
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

// --- TDSubArrayImp: data ---------------------------------------------------------------------------

int32_t TDSubArrayImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const {
  if (data == nullptr) return kStatusBadArgument;
  return TDImp::InflateDefData(data, onlyIfEmpty, clearFirst, flags);
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

// --- sizing through the handles --------------------------------------------------------------------

namespace {

// The array `type` describes into *array: 0; 42 when it is no array with a dimension list and an
// element; 1, after a report, when its element is itself an array.
int32_t SizableArray(const TD& type, const TDArrayBaseImp** array) {
  *array = AsArrayBase(type.GetImp());
  if (*array == nullptr || !(*array)->IsWellFormed()) return kStatusNullHandle;
  if ((*array)->GetElt()->IsArrayBase() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "SetArraySizeFromTDPtr: array element cannot be an array");
    return kStatusBadArgument;
  }
  return kStatusNoError;
}

}  // namespace

int32_t TDRArray::SetArraySize(UHandle* handle, int32_t count) const {
  const TDArrayBaseImp* array = nullptr;
  if (const int32_t status = SizableArray(*this, &array); status != kStatusNoError) return status;
  const ArrayLayout layout(*array->GetElt(), array->GetNumDims());
  return ResizeElements(layout, handle, count, nullptr, false, 0, false, "SetArraySizeFromTDPtr");
}

int32_t TDRArray::SetArraySize(UHandle* handle, int32_t count, const int32_t* dims) const {
  const TDArrayBaseImp* array = nullptr;
  if (const int32_t status = SizableArray(*this, &array); status != kStatusNoError) return status;
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
