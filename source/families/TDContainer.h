// Descriptors made of other descriptors: the container base with what every container shares
// (identity, order, check-in, traversal, ephemeral marking, the Boolean mutation), the
// one-element container that arrays and wrappers build on, and the ordered element list.
#pragma once

#include <cstdint>
#include <vector>

#include "runtime/DSMemory.h"
#include "source/model/TD.h"
#include "vellum/TDContainerHandles.h"

class TDContainerImp : public TDImp {
 public:
  // --- slots of TDImp --------------------------------------------------------------------------
  // The base hash, then for each present element i: rotl(element hash + hash, i).
  int32_t ComputeHashValue() const override;
  // The base test, equal element counts, and each pair the same (absent equals only absent).
  int32_t IsSameAs(const TDImp& other) const override;
  // Both pass the change on to the elements; an interned element is replaced by a changed copy.
  int32_t EphemeralizeTD(int32_t queryOnly) override;
  int32_t UnephemeralizeTD(int32_t queryOnly) override;
  // Each element is mutated; an interned element is replaced by a mutated copy. 1 when anything
  // changed; this object stays in place.
  int32_t MutateBooleanTD(TDImpPtr* self, int32_t toSixteenBit) override;
  // By element count, then by the first element pair that orders differently (type code, then
  // the element's own order; an absent element first).
  int32_t CompareForSorting(const TDImp* other) const override;
  // Into a container of the same arity (one element, or a list) with the same element count
  // whose element pairs each convert without loss.
  bool ConversionIsLossless(const TDImp* dst) const override;
  int32_t IsContainer() const override { return 1; }
  // Visits this object, then each present element in order, stopping at the first result that
  // is neither 0 nor -1. A replacement the walk hands back takes the element's place; in an
  // interned container it goes into a writable copy that is handed up as this one's replacement.
  TDTraverseValue TraverseTD(TDVisitFn visit, void* context, TDShouldRecurseFn shouldRecurse,
                             TDImpPtr* replacement) override;
  // The present elements' records first (each once), then this one's.
  int32_t FlattenTDForSaving(TDDataWriter* writer, int32_t* index) const override;
  void ComputeNesting(uint32_t* depth, uint32_t* count) const override;

  // --- container slots -------------------------------------------------------------------------
  // A one-element container always counts one element, present or not.
  virtual int32_t GetNumElts() const = 0;
  // The null pointer beyond the end.
  virtual const TDImpPtr& GetEltImpPtr(int32_t index) const = 0;
  // Replaces an existing element (null allowed) and clears hash-valid; nothing beyond the end.
  virtual void SetEltImpPtr(int32_t index, const TDImpPtr& element) = 0;

  // Whether `element`'s tree holds this object, which would make it its own element.
  bool WouldContainItself(const TDImp& element) const;

 protected:
  TDContainerImp() noexcept = default;
  TDContainerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
};

// One element descriptor (arrays, pointer-to, set collections, blocks, alignment markers).
class TDSingleContainerImp : public TDContainerImp {
 public:
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsSingleContainer() const override { return 1; }

  int32_t GetNumElts() const override { return 1; }
  const TDImpPtr& GetEltImpPtr(int32_t index) const override;
  void SetEltImpPtr(int32_t index, const TDImpPtr& element) override;

  const TDImpPtr& GetElt() const noexcept { return element_; }
  void SetElt(const TDImpPtr& element);

  // The element's save-table index.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  // The element from its load-table index; 42 when there is none.
  int32_t ConstructTD(TDDataReader* reader) override;

  // Converting a cluster into a one-dimensional variable array of this container's kind: resizes
  // the datum at `data` to `count` elements, writes its dimension word and stores where its
  // first element lies. 0; 2 when memory runs out; 1, with nothing changed, when this kind is not
  // a one-dimensional variable array. The array family overrides it.
  virtual int32_t ResizeAsVector(void* data, int32_t count, void** firstElement) const;

 protected:
  TDSingleContainerImp() noexcept = default;
  TDSingleContainerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDContainerImp(name, typedefLink) {}
  TDSingleContainerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, const TDImpPtr& element) noexcept
      : TDContainerImp(name, typedefLink), element_(element) {}

 private:
  // The element into a copy being made, through `copyOf` (a clone or a check-in); 2 when memory
  // runs out.
  int32_t CopyEltInto(TDSingleContainerImp& copy, TDImpPtr (TDImp::*copyOf)() const) const;

  TDImpPtr element_;
};

// An ordered list of element descriptors (clusters, functions, map collections). An element may
// be absent while a descriptor is being built.
class TDMultiContainerImp : public TDContainerImp {
 public:
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsMultiContainer() const override { return 1; }
  // The element count, then each element's save-table index. More than 65535 elements are
  // refused (1), as a reader would refuse them.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  // A count of more than 65535 elements is outside the format and refused (74); a missing
  // element is 42.
  int32_t ConstructTD(TDDataReader* reader) override;

  int32_t GetNumElts() const override { return static_cast<int32_t>(elements_.size()); }
  const TDImpPtr& GetEltImpPtr(int32_t index) const override;
  void SetEltImpPtr(int32_t index, const TDImpPtr& element) override;

  // Each returns 0, 1 for an index out of range, 2 when memory runs out (nothing changed then).
  int32_t AppendElt(const TDImpPtr& element);
  int32_t InsertEltAt(const TDImpPtr& element, int32_t index);
  int32_t ReplaceEltAt(const TDImpPtr& element, int32_t index);
  void RemoveAllElts();
  int32_t ReserveElts(int32_t count);
  // The first element whose name equals the Pascal string `name`; -1 when none.
  int32_t FindEltByName(const uint8_t* name) const;

 protected:
  TDMultiContainerImp() noexcept = default;
  TDMultiContainerImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDContainerImp(name, typedefLink) {}

 private:
  // The elements into a copy being made, through `copyOf`; absent ones stay absent. 2 when memory
  // runs out.
  int32_t CopyEltsInto(TDMultiContainerImp& copy, TDImpPtr (TDImp::*copyOf)() const) const;

  std::vector<TDImpPtr, PXAllocator<TDImpPtr>> elements_;
};

// The container side of `type`, for the container families; null when it is not one.
const TDContainerImp* AsContainer(const TDImp* type);
TDContainerImp* AsWritableContainer(const TD& type);
const TDSingleContainerImp* AsSingleContainer(const TDImp* type);
const TDMultiContainerImp* AsMultiContainer(const TDImp* type);

namespace vellum::detail {
// Appends for an `operator<<` chain; false, after the diagnostic, when the chain must break.
bool AppendInChain(TDWMultiContainer& container, const TD& element);
}  // namespace vellum::detail


// The save-table index of an element whose record is already written, as a VSF; 42 when it
// is missing from the table.
int32_t WriteEltIndex(TDDataWriter* writer, const TDImpPtr& element);
