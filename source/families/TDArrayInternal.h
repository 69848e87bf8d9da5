// The array family's shared parts: the words of its data, the view of a source's elements and
// the resizing of blocks, which its descriptor, its data engine and its flattened form all use.
#pragma once

#include <algorithm>
#include <cstdint>
#include <limits>

#include "runtime/DSMemory.h"
#include "source/families/TDArray.h"
#include "runtime/MoveBytes.h"
#include "vellum/TDStringHandles.h"

namespace tdarray_detail {

using vellum::bound::IsBounded;
using vellum::bound::IsFixed;
using vellum::bound::IsVariable;
using vellum::bound::Length;

constexpr int64_t kMaxCount = std::numeric_limits<int32_t>::max();
constexpr int64_t kDimWordSize = sizeof(int32_t);
constexpr int32_t kCountWordMalformed = std::numeric_limits<int32_t>::min();
// A SubArray datum in the running process: the data pointer, then per dimension the size and
// the stride, 8 bytes each.
constexpr int64_t kRecordDimsOffset = 8;
constexpr int64_t kRecordDimSize = 16;

inline const uint8_t* At(const void* data, int64_t offset) { return static_cast<const uint8_t*>(data) + offset; }
inline uint8_t* At(void* data, int64_t offset) { return static_cast<uint8_t*>(data) + offset; }

inline int32_t* DimsOf(UHandle h) { return reinterpret_cast<int32_t*>(*h); }

inline int32_t Saturated(int64_t bytes) { return static_cast<int32_t>(std::clamp<int64_t>(bytes, 0, kMaxCount)); }

void ReportMalformed();
void ReportOverflow();
void ReportDamagedBlock();

// The 16-bit words of packed Booleans in a preallocated block, from the bound or fixed sizes.
int64_t PackedWordsOfSizes(int32_t nDims, const int32_t* words);

// Resizes *h for the dimension words `dims` (null: every size 0) and writes them into the block.
int32_t ResizeToDimWords(const ArrayLayout& layout, UHandle* h, const int32_t* dims);

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

// The source of a SubArray datum; false after a diagnostic when the record cannot be read.
bool SubArraySource(const ArrayLayout& layout, const void* data, Source* source);

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

}  // namespace tdarray_detail
