// Descriptors of raw memory described by size and alignment rather than by value: opaque and
// aligned blocks of bytes, blocks laid out as another type, zero-size aligning blocks and blocks
// repeated a number of times.
#pragma once

#include <cstdint>

#include "source/families/TDContainer.h"
#include "source/model/TD.h"
#include "vellum/TDBlockHandles.h"

// A block of a stated byte size; its data is that many bytes, copied unchanged.
class TDSizedBlockImp : public TDImp {
 public:
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  // The block size (a negative size counts as 0).
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into a block of the same code and size only.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  // Different sizes (or kinds) cannot hold each other's data.
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t CompareForSorting(const TDImp* other) const override;
  int32_t IsSizedBlock() const override { return 1; }
  // The blocks' bytes.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions&) const override { return OrderBytes(a, b); }
  // The block size.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;

  int32_t GetBlockSize() const noexcept { return blockSize_; }
  void SetBlockSize(int32_t size);

 protected:
  TDSizedBlockImp() noexcept = default;
  TDSizedBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
  // The size line of the dump.
  void PrintSize(const uint8_t* prefix) const;

 private:
  int32_t blockSize_ = 0;
};

class TDBlockImp final : public TDSizedBlockImp {
 public:
  TDBlockImp() noexcept = default;
  TDBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSizedBlockImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Block); }
  TDImpPtr NewInstance() const override;
  int32_t GetAlignment(ITargetPlatformAlignment*) const override { return 1; }
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsBlock() const override { return 1; }
};

class TDAlignedBlockImp final : public TDSizedBlockImp {
 public:
  TDAlignedBlockImp() noexcept = default;
  TDAlignedBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSizedBlockImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::AlignedBlock); }
  TDImpPtr NewInstance() const override;
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  int32_t GetAlignment(ITargetPlatformAlignment*) const override { return alignment_; }
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t CompareForSorting(const TDImp* other) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsAlignedBlock() const override { return 1; }
  // The block size, then the alignment.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;

  uint16_t GetStoredAlignment() const noexcept { return alignment_; }
  void SetStoredAlignment(uint16_t alignment);

 private:
  uint16_t alignment_ = 0;
};

// Blocks described by an element type (type, void and repeated blocks).
class TDBlockContainerImp : public TDSingleContainerImp {
 protected:
  TDBlockContainerImp() noexcept = default;
  TDBlockContainerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDSingleContainerImp(name, typedefLink) {}
  // Bytes copied into a block of the same code and size; a larger destination is refused.
  int32_t ConvertBytes(const TDImp* dst, const void* src, void* dstData) const;
};

// Element blocks with a stored alignment (type and void blocks): the alignment takes part in
// hash, equality, copies and order.
class TDStoredAlignmentBlockImp : public TDBlockContainerImp {
 public:
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  // By element, then by alignment.
  int32_t CompareForSorting(const TDImp* other) const override;
  // The blocks' bytes (none for a void block).
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions&) const override { return OrderBytes(a, b); }

  uint16_t GetStoredAlignment() const noexcept { return alignment_; }

 protected:
  explicit TDStoredAlignmentBlockImp(uint16_t alignment) noexcept : alignment_(alignment) {}
  TDStoredAlignmentBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, uint16_t alignment) noexcept
      : TDBlockContainerImp(name, typedefLink), alignment_(alignment) {}
  void SetAlignmentValue(uint16_t alignment);
  // The kind line and the alignment line of the dump, then the element.
  void PrintBlock(const uint8_t* prefix, const char* kind) const;

 private:
  uint16_t alignment_;
};

// Bytes laid out as the element type: its size, and the stored alignment (the element's own when
// none was stored).
class TDTypeBlockImp final : public TDStoredAlignmentBlockImp {
 public:
  TDTypeBlockImp() noexcept : TDStoredAlignmentBlockImp(0) {}
  TDTypeBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDStoredAlignmentBlockImp(name, typedefLink, 0) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::TypeBlock); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  // A stored alignment other than the element's is reported and still used.
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsTypeBlock() const override { return 1; }
};

// No bytes; only an alignment.
class TDVoidBlockImp final : public TDStoredAlignmentBlockImp {
 public:
  TDVoidBlockImp() noexcept : TDStoredAlignmentBlockImp(1) {}
  TDVoidBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDStoredAlignmentBlockImp(name, typedefLink, 1) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::VoidBlock); }
  TDImpPtr NewInstance() const override;
  int32_t DataSizeCore(ITargetPlatformAlignment*) const override { return 0; }
  int32_t GetAlignment(ITargetPlatformAlignment*) const override { return GetStoredAlignment(); }
  int32_t CopyData(const void*, void*, int32_t, const KoContext*) const override { return 0; }
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsVoidBlock() const override { return 1; }

  void SetStoredAlignment(uint16_t alignment) { SetAlignmentValue(alignment); }
};

// The element repeated a number of times, each copy at the next multiple of the element's size:
// its data behaves as a cluster of that many elements.
class TDRepeatedBlockImp final : public TDBlockContainerImp {
 public:
  TDRepeatedBlockImp() noexcept = default;
  TDRepeatedBlockImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDBlockContainerImp(name, typedefLink) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::RepeatedBlock); }
  TDImpPtr NewInstance() const override;
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  // Element size times the count (a layout beyond 2^31 - 1 bytes counts as that).
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  // 1 when packed; the largest alignment when the platform aligns aggregates to it; otherwise
  // the element's.
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const override;
  DataShapes DataShapeOf(int32_t inMemory) const override;
  int32_t ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const override;
  int32_t IsFlatDataFixedSize() const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t CompareForSorting(const TDImp* other) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsRepeatedBlock() const override { return 1; }
  // As a cluster of that many copies of the element; bytewise, the bytes when no copy holds
  // handles.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

  // The number of blocks, then the element's index.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;
  // The element's values, one per block.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;

  uint32_t GetNumBlocks() const noexcept { return numBlocks_; }
  void SetNumBlocks(uint32_t count);

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;

 private:
  // Calls `step(block data)` for each block in order while it returns 0; the first other status.
  template <class Step>
  int32_t ForEachBlock(void* data, Step step) const;

  uint32_t numBlocks_ = 0;
};

// The repeated-block side of `type`; null when it is not a repeated block.
const TDRepeatedBlockImp* AsRepeatedBlock(const TDImp* type);
