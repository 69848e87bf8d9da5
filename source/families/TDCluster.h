// Clusters: records whose elements lie in place one after another with alignment padding; their
// layout and element offsets, data life cycle, copy and conversion, and compatibility.
#pragma once

#include <atomic>
#include <cstdint>
#include <type_traits>
#include <vector>

#include "source/families/TDContainer.h"


class TDClusterImp : public TDMultiContainerImp {
 public:
  TDClusterImp() noexcept = default;
  TDClusterImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDMultiContainerImp(name, typedefLink) {}

  // --- slots of TDImp --------------------------------------------------------------------------
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Cluster); }
  TDImpPtr NewInstance() const override;
  // Checks each element's data in order; the first damage is reported again with the element's
  // offset, and its status returned.
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  // 1 when every element is present and defined.
  int32_t DefinedType(int32_t how) const override;
  // On a failure with onlyIfEmpty 0, what the earlier elements allocated is given back and the
  // datum is left all zero.
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const override;
  DataShapes DataShapeOf(int32_t inMemory) const override;
  int32_t ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const override;
  int32_t IsFlatDataFixedSize() const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  // The elements in order, each in its own flattened form, without the in-memory padding.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t IsClust() const override { return 1; }
  // Every element present and numeric (an empty cluster is not numeric).
  int32_t IsNumericClust() const override;
  // The shape {Boolean, Int32, String}; with `strict` nonzero also the names "status", "code"
  // and "source".
  int32_t IsErrorCluster(int32_t strict) const override;
  // Some element is generic or semi-generic.
  int32_t IsSemiGeneric() const override;
  // Element by element in order, the first that differs deciding; bytewise, the bytes when no
  // element holds handles.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

  // The interned copy also records its layout for the SetDSAlign value in force (2 when memory
  // runs out).
  int32_t MemberCheckIn(TDImpPtr& target) const override;

  // --- cluster slots ---------------------------------------------------------------------------
  // Where element `index` starts; 0 for index 0 and for an index beyond the list.
  virtual int32_t GetEltOffset(int32_t index, ITargetPlatformAlignment* platform) const;
  virtual int32_t GetNumEltsDeep() const;

  // Calls `visit(element, offset)` for each present element in order, with its offset in a datum
  // of the running process, while it returns 0; the first other value. The recorded layout
  // serves when it holds, so the walk is linear either way.
  template <class Visit>
  int32_t ForEachElt(Visit&& visit) const {
    return ForEachEltOffset(
        [](void* context, const TDImp& element, int64_t offset) {
          return (*static_cast<std::remove_reference_t<Visit>*>(context))(element, offset);
        },
        &visit);
  }

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;

 private:
  using EltOffsetVisit = int32_t (*)(void* context, const TDImp& element, int64_t offset);
  int32_t ForEachEltOffset(EltOffsetVisit visit, void* context) const;

  // One step of a walk over a datum: an element with handles, or (element null) a run of bytes
  // without handles that is copied or cleared as it is.
  struct DataStep {
    const TDImp* element;
    int32_t offset;
    int32_t size;
    // A variable String, whose same-length copy is made here without a call.
    bool variableString = false;
  };

  int32_t RecordLayout();
  // CopyData without the recorded copy plan: the Boolean-form copy, and clusters that are not
  // interned or whose layout no longer holds. Kept out of line so the planned copy stays small.
  [[gnu::noinline]] int32_t CopyDataWalk(const void* src, void* dst, int32_t flags, const KoContext* context) const;
  bool HasRecordedLayout() const { return layoutDSAlign_ >= 0 && layoutDSAlign_ == GetDSAlign(); }
  // Calls `step(element or null, offset, size)` over the datum in order while it returns 0; the
  // first other status.
  template <class Step>
  int32_t ForEachDataStep(Step step) const;
  // The flattened form of an interned cluster made only of plain numbers and variable strings,
  // recorded with its layout: values are then written and read in one pass, with no call per
  // element. A number of several parts (complex) takes one step per part.
  struct FlatStep {
    int32_t offset;
    uint8_t size;  // bytes of a number part; 0 for a variable string
  };
  bool HasFlatPlan() const { return flatFixedBytes_ >= 0 && HasRecordedLayout(); }
  int32_t RecordFlatPlan();
  uint64_t PlannedFlatSize(const uint8_t* value) const;
  int32_t WriteWithPlan(KoDataWriter* writer, const void* data, int32_t count) const;
  int32_t ReadWithPlan(KoDataReader* reader, void* data, int32_t count) const;

  // The layout of an interned cluster for the running process, made at check-in with the
  // SetDSAlign value then in force (-1: none); used only while that value holds.
  int32_t layoutDSAlign_ = -1;
  std::vector<FlatStep, PXAllocator<FlatStep>> flatSteps_;
  int32_t flatFixedBytes_ = -1;  // the number parts' bytes per value; -1: no plan
  std::vector<int32_t, PXAllocator<int32_t>> offsets_;
  std::vector<DataStep, PXAllocator<DataStep>> steps_;
  // The whole datum's size when no element holds handles (copied as one block); -1 otherwise.
  int32_t plainDataSize_ = -1;
  // Layout facts of the running process, kept only by interned clusters (which never change).
  // A size or alignment entry records the SetDSAlign value it was computed with and is used only
  // while that value holds; 0 means no entry.
  mutable std::atomic<uint64_t> sizeCache_{0};
  mutable std::atomic<uint64_t> alignmentCache_{0};
  mutable std::atomic<int32_t> shapeCache_{-1};
};

// The cluster side of `type`; null when it is not a cluster.
const TDClusterImp* AsCluster(const TDImp* type);
