// Tags: string data that names an object of the host, with the tag's kind, the application
// context it belongs to, and for the user-defined kind a class name.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "runtime/DSMemory.h"
#include "source/families/TDStringBase.h"
#include "vellum/TDTagHandles.h"

// Every tag: data as a String's; identity adds the kind and the context.
class TDTagBaseImp : public TDStringBaseImp {
 public:
  // --- slots of TDImp --------------------------------------------------------------------------
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Tag); }
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  // After the bound word: the kind, then the context.
  int32_t CompareForSorting(const TDImp* other) const override;
  int32_t IsTag() const override { return 1; }
  const KoContext* GetContext() const override { return context_.load(std::memory_order_acquire); }
  // Clears hash-valid.
  void SetContext(const KoContext* context) override;
  bool HoldsContext() const override { return true; }
  // The bound word, the kind, then for the versions that carry one the user data (a variant;
  // tags carry none yet, so an empty one is written and only an empty one is read). The factory
  // reads the bound word and the kind, which decide the class.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;

  // --- members ---------------------------------------------------------------------------------
  TagType GetTagType() const noexcept { return tagType_; }
  // 0, or 1 after a diagnostic with no change when the change would cross the user-defined kind.
  int32_t SetTagType(TagType tagType);

 protected:
  explicit TDTagBaseImp(TagType tagType) noexcept : tagType_(tagType) {}
  TDTagBaseImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound, TagType tagType) noexcept
      : TDStringBaseImp(name, typedefLink, bound), tagType_(tagType) {}

 private:
  TagType tagType_;
  std::atomic<const KoContext*> context_{nullptr};
};

// A tag of any kind but the user-defined one.
class TDTagImp final : public TDTagBaseImp {
 public:
  TDTagImp() noexcept : TDTagBaseImp(kTagTypeDefault) {}
  TDTagImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound, TagType tagType) noexcept
      : TDTagBaseImp(name, typedefLink, bound, tagType) {}
  TDImpPtr NewInstance() const override;

 protected:
  const char* KindText() const override { return "tag"; }
};

// A tag of kind 5 with an optional class name. An empty class is kept as none, so that the two,
// which count as the same type, also hash alike.
class TDUserDefinedTagImp final : public TDTagBaseImp {
 public:
  TDUserDefinedTagImp() noexcept : TDTagBaseImp(kTagTypeUserDefined) {}
  TDUserDefinedTagImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDTagBaseImp(name, typedefLink, bound, kTagTypeUserDefined) {}
  TDImpPtr NewInstance() const override;

  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  // After the tag's own order: no class first, then the classes in PStr order.
  int32_t CompareForSorting(const TDImp* other) const override;
  int32_t IsUserDefinedTag() const override { return 1; }
  // The tag's part, then for versions that have it the class, padded to even length.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;

  // The class as a PStr, or null when there is none.
  const uint8_t* GetTagClass() const noexcept { return tagClass_.get(); }
  // Replaces the class with the first min(length, 255) bytes (none for 0); 2 when memory runs
  // out (class unchanged). Clears hash-valid.
  int32_t SetTagClass(const uint8_t* bytes, size_t length);

 protected:
  const char* KindText() const override { return "user-defined tag"; }

 private:
  struct DisposeClass {
    void operator()(uint8_t* block) const noexcept { DSDisposePtr(block); }
  };
  std::unique_ptr<uint8_t, DisposeClass> tagClass_;
};
