// Arrays, subarrays and array data pointers: the dimension list on the one-element container,
// the layout and life cycle of array data, its copy and conversion, and compatibility.
#pragma once

#include <cstdint>
#include <vector>

#include "runtime/DSMemory.h"
#include "source/families/TDContainer.h"
#include "vellum/TDArrayHandles.h"

// The layout of one array datum's block in the running process, for an element type and a
// dimension count.
struct ArrayLayout {
  ArrayLayout(const TDImp& element, int32_t dimensions);

  const TDImp* elt;
  int32_t nDims;
  int64_t eltSize;
  int64_t header;  // the dimension words and the padding before the first element
  bool handles;    // elements hold handles
  bool packed;     // BooleanU16 elements, packed into 16-bit words

  // The bytes of `count` elements; with `dims` (the block's dimension words) exact for packed
  // elements, without them an upper bound.
  int64_t Bytes(int64_t count, const int32_t* dims) const;
  // The element count of block `h` into *count (and its size into *size): false when the block
  // is not live, or is smaller than its dimension words say, or their product overflows.
  bool ReadCount(UHandle h, int64_t* count, size_t* size = nullptr) const;
  uint8_t* Element(uint8_t* block, int64_t index) const { return block + header + index * eltSize; }
  const uint8_t* Element(const uint8_t* block, int64_t index) const { return block + header + index * eltSize; }
};

// The three array kinds share the element, the dimension words and their compatibility rules.
class TDArrayBaseImp : public TDSingleContainerImp {
 public:
  // --- slots of TDImp --------------------------------------------------------------------------
  // The container hash plus, for each dimension word at 1-based position i, the word rotated
  // left by i bits.
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  // An element that is present and defined.
  int32_t DefinedType(int32_t how) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  // By dimension count, then by the first differing dimension word (unsigned), then by element.
  int32_t CompareForSorting(const TDImp* other) const override;
  // Into an array kind of the same rank whose every dimension holds the source's (variable, or
  // at least as large) and whose element converts without loss.
  bool ConversionIsLossless(const TDImp* dst) const override;
  int32_t IsArrayBase() const override { return 1; }
  // The dimension count, each dimension word, then the element's index. 42 without a
  // dimension list.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;
  int32_t IsSemiGeneric() const override;
  // An array of Float64 waveforms.
  int32_t IsArrayFloat64Wfms() const override;

  // --- members ---------------------------------------------------------------------------------
  bool HasDimList() const noexcept { return hasDims_; }
  int32_t GetNumDims() const noexcept { return static_cast<int32_t>(dims_.size()); }
  // The word of a dimension; 0 out of range.
  int32_t GetDimSize(int32_t index) const noexcept;
  const int32_t* Dims() const noexcept { return dims_.data(); }
  // The element-count word (TDRArrayBase::BoundedOrFixed); *overflow says whether the product
  // of the sizes exceeds 0x7FFFFFFF (the word is then 0x80000000).
  int32_t CountWord(bool* overflow) const noexcept;
  // Editing; statuses as on TDWArrayBase. Each clears hash-valid.
  int32_t AddDim(int32_t word, int32_t position);
  int32_t RemoveDim(int32_t index);
  int32_t RemoveAllDims();
  int32_t SetNumDims(int32_t count);
  int32_t SetDimSize(int32_t index, int32_t word);
  // The element and a dimension list are present.
  bool IsWellFormed() const noexcept { return hasDims_ && static_cast<bool>(GetElt()); }
  // A list of `count` variable dimensions in place of any list; 2 when memory runs out.
  int32_t InitDims(int32_t count);

 protected:
  TDArrayBaseImp() noexcept = default;
  TDArrayBaseImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSingleContainerImp(name, typedefLink) {}
  // What the dump calls the kind.
  virtual const char* KindText() const = 0;

 private:
  // The dimension list into a copy being made; 2 when memory runs out.
  int32_t CopyDimsInto(TDArrayBaseImp& copy) const;

  std::vector<int32_t, PXAllocator<int32_t>> dims_;
  bool hasDims_ = false;
};

// Data: a handle to the dimension words and the elements.
class TDArrayImp final : public TDArrayBaseImp {
 public:
  TDArrayImp() noexcept = default;
  TDArrayImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDArrayBaseImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Array); }
  TDImpPtr NewInstance() const override;
  // The handle, its size against its dimension words, the preallocation rules, then each
  // element; damage goes to the rave procedure (1024, 4096 or 128).
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const override;
  DataShapes DataShapeOf(int32_t) const override { return kDataShapeHandles; }
  // A fixed array of elements whose flattened size is fixed.
  int32_t IsFlatDataFixedSize() const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into an Array or a SubArray of the same rank.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  int32_t IsArray() const override { return 1; }
  int32_t IsArrayOnly() const override { return 1; }
  int32_t ResizeAsVector(void* data, int32_t count, void** firstElement) const override;
  // Each value as its dimension sizes and then its elements in storage order. Reading refuses,
  // before allocating, a count whose elements cannot fit in the input left (116), and keeps a
  // bounded or fixed array in its preallocated block, cut to the bounds.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  // By element count first (without nullFirst; with it a null array sorts last), then by the
  // dimension words, then element by element; bytewise, elements without handles as one block.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

  // Resizes the block at *h for the dimension words `dims` and writes them: a null *h stays null
  // when every word is 0, and a count of 0 with a nonzero word keeps a block of words only.
  int32_t ResizeToDims(UHandle* h, const int32_t* dims) const;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
  const char* KindText() const override { return "array"; }
};

// Data: a record that views another array's elements; it owns nothing.
class TDSubArrayImp final : public TDArrayBaseImp {
 public:
  TDSubArrayImp() noexcept = default;
  TDSubArrayImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDArrayBaseImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::SubArray); }
  TDImpPtr NewInstance() const override;
  // A negative size, or elements without a data pointer.
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  // 8 + 16 x dimensions; for a platform, from the "SubArray" record cluster.
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  // Only the clearing: there is no default view.
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  DataShapes DataShapeOf(int32_t) const override { return kDataShapeHandles; }
  int32_t IsFlatDataFixedSize() const override;
  // The record bytes: the view is copied, not what it points to.
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into a SubArray (the same view) or an Array (the elements gathered) of the same rank.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t IsArray() const override { return 1; }
  int32_t IsSubArrayOnly() const override { return 1; }
  // Written as the array it views; never read ("ReadData does not handle subArrays!").
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  int32_t IsSubType() const override { return 1; }
  // The records' bytes, not the elements they view (noted as such).
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
  const char* KindText() const override { return "subarray"; }
};

// Data: one pointer the descriptor does not own; zero bytes by default, never copied as a value.
class TDArrayDataPtrImp final : public TDArrayBaseImp {
 public:
  TDArrayDataPtrImp() noexcept = default;
  TDArrayDataPtrImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDArrayBaseImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::ArrayDataPtr); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t IsArrayDataPtr() const override { return 1; }

 protected:
  const char* KindText() const override { return "array data pointer"; }
};

// The array side of `type`; null when it is not an array kind.
const TDArrayBaseImp* AsArrayBase(const TDImp* type);

// The alignment asked of the allocator for a new array block of `total` bytes: 4096 from
// 0x100000 bytes, 1024 from 0x40000, 256 from 0x10000, 64 from 0x4000, 22 from 1024, else 8.
// The allocator takes a value that is not a power of two (22) as its default alignment.
int32_t ArrayAllocationAlignment(int64_t total);
