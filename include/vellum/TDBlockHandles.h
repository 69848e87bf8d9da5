// Handles of the descriptors of raw memory: opaque and aligned blocks of bytes, blocks laid out
// as another type, zero-size blocks that only align, repeated blocks, and the alignment marker
// that makes a cluster align as another type does.
#pragma once

#include <cstdint>

#include "vellum/TDContainerHandles.h"
#include "vellum/TDHandles.h"

struct SizedBlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct BlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct AlignedBlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct TypeBlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct VoidBlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct RepeatedBlockKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
// The target platform (ITargetPlatformAlignment::PlatformIdentifier) on which an alignment marker
// still aligns as its source; on every other platform a marker aligns to 1.
constexpr uint32_t kAlignmentSourcePlatformId = 0x34367877;

struct AlignmentMarkerKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRSizedBlock;
class TDWSizedBlock;
class TDRBlock;
class TDWBlock;
class TDRAlignedBlock;
class TDWAlignedBlock;
class TDRTypeBlock;
class TDWTypeBlock;
class TDRVoidBlock;
class TDWVoidBlock;
class TDRRepeatedBlock;
class TDWRepeatedBlock;
class TDRAlignmentMarker;
class TDWAlignmentMarker;

// Setters below return 42 for a null handle and 0 otherwise, and change the descriptor's hash.
// A block handle's GetAlignment() is the stored alignment word; the layout alignment for a
// platform is TD::GetAlignment(platform), reached through a `const TD&`.

// Blocks of a stated byte size: Block and AlignedBlock.
class TDRSizedBlock : public TDRTyped<TDRSizedBlock, TDWSizedBlock, TDR, SizedBlockKind> {
 public:
  using TDRTyped::TDRTyped;
  // -1 for a null handle.
  int32_t GetBlockSize() const;
};
class TDWSizedBlock : public TDWTyped<TDRSizedBlock, TDWSizedBlock, TDW, SizedBlockKind> {
 public:
  using TDWTyped::TDWTyped;
  int32_t GetBlockSize() const;
  [[nodiscard]] int32_t SetBlockSize(int32_t size);
};

// Opaque bytes aligned to 1.
class TDRBlock : public TDRTyped<TDRBlock, TDWBlock, TDRSizedBlock, BlockKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWBlock : public TDWTyped<TDRBlock, TDWBlock, TDWSizedBlock, BlockKind> {
 public:
  using TDWTyped::TDWTyped;
};

// Bytes with an alignment of their own.
class TDRAlignedBlock : public TDRTyped<TDRAlignedBlock, TDWAlignedBlock, TDRSizedBlock, AlignedBlockKind> {
 public:
  using TDRTyped::TDRTyped;
  // 0 for a null handle.
  uint16_t GetAlignment() const;
};
class TDWAlignedBlock : public TDWTyped<TDRAlignedBlock, TDWAlignedBlock, TDWSizedBlock, AlignedBlockKind> {
 public:
  using TDWTyped::TDWTyped;
  uint16_t GetAlignment() const;
  [[nodiscard]] int32_t SetAlignment(uint16_t alignment);
};

// Bytes laid out as the element type (set with SetEltTD).
class TDRTypeBlock : public TDRTyped<TDRTypeBlock, TDWTypeBlock, TDRSingleContainer, TypeBlockKind> {
 public:
  using TDRTyped::TDRTyped;
  // The stored alignment; 0 (the element's own is used) when none was stored.
  uint16_t GetAlignment() const;
};
class TDWTypeBlock : public TDWTyped<TDRTypeBlock, TDWTypeBlock, TDWSingleContainer, TypeBlockKind> {
 public:
  using TDWTyped::TDWTyped;
  uint16_t GetAlignment() const;
  // A type block takes its layout from its element: this changes nothing and returns 42.
  [[nodiscard]] int32_t SetAlignment(uint16_t alignment);
};

// No bytes; only an alignment (1 when made).
class TDRVoidBlock : public TDRTyped<TDRVoidBlock, TDWVoidBlock, TDRSingleContainer, VoidBlockKind> {
 public:
  using TDRTyped::TDRTyped;
  uint16_t GetAlignment() const;
};
class TDWVoidBlock : public TDWTyped<TDRVoidBlock, TDWVoidBlock, TDWSingleContainer, VoidBlockKind> {
 public:
  using TDWTyped::TDWTyped;
  uint16_t GetAlignment() const;
  [[nodiscard]] int32_t SetAlignment(uint16_t alignment);
};

// The element repeated a number of times (0 when made), one after another.
class TDRRepeatedBlock
    : public TDRTyped<TDRRepeatedBlock, TDWRepeatedBlock, TDRSingleContainer, RepeatedBlockKind> {
 public:
  using TDRTyped::TDRTyped;
  // 0 for a null handle.
  uint32_t GetNumBlocks() const;
};
class TDWRepeatedBlock
    : public TDWTyped<TDRRepeatedBlock, TDWRepeatedBlock, TDWSingleContainer, RepeatedBlockKind> {
 public:
  using TDWTyped::TDWTyped;
  uint32_t GetNumBlocks() const;
  [[nodiscard]] int32_t SetNumBlocks(uint32_t count);
};

// A zero-size cluster element that makes the cluster align as its source type does.
class TDRAlignmentMarker
    : public TDRTyped<TDRAlignmentMarker, TDWAlignmentMarker, TDRSingleContainer, AlignmentMarkerKind> {
 public:
  using TDRTyped::TDRTyped;
  // Null when there is none.
  TDR GetAlignmentSource() const;
};
class TDWAlignmentMarker
    : public TDWTyped<TDRAlignmentMarker, TDWAlignmentMarker, TDWSingleContainer, AlignmentMarkerKind> {
 public:
  using TDWTyped::TDWTyped;
  // The source itself (null when there is none or it is interned).
  TDW GetAlignmentSource() const;
  [[nodiscard]] int32_t SetAlignmentSource(const TD& source);
  [[nodiscard]] int32_t RemoveAlignmentSource();
};

// A writable copy of `parent` with an alignment marker appended whose source is another writable
// copy of `parent`: the data cluster of a derived class, which keeps its parent's alignment.
// Null when `parent` is null or memory runs out.
TDWCluster InheritTDWFromParentTDR(const TDRCluster& parent);

// The registered record clusters of a subarray's data: "SubArray" {"dataPtr" (Ptr),
// "dimensionSpecifier" (a repeated block of one "DimensionSpecifier")} and "DimensionSpecifier"
// {"dimensionSize" (Int32), "stride" (Ptr)}. They give the record layout for a target platform;
// a subarray of n dimensions repeats the dimension specifier n times. Built on first use and
// released when the service stops.
const TDR& GetSubArrayTD();
const TDR& GetDimensionSpecifierTD();
