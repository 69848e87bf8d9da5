// The descriptor object every kind derives from: its flags, its cached hash and equality (what
// interning rests on), the virtual interface in slot order, the kind predicates, traversal and dump.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include "runtime/DebugStream.h"
#include "source/model/TDRefCountedPtr.h"
#include "vellum/TDHandles.h"
#include "vellum/TDLayout.h"
#include "vellum/TypeCodes.h"
#include "vellum/TypeManagerHooks.h"

class TDDataWriter;
class TDDataReader;
class KoDataWriter;
class KoDataReader;
class FlatDataCacheHelper;
class HandleAllocationInterface;

// Flag bits of a descriptor.
constexpr uint32_t kTDFlagReadOnly = 0x0001;       // the interned copy; never changes again
constexpr uint32_t kTDFlagEventDiscard = 0x0002;   // Boolean event-discard mask
constexpr uint32_t kTDFlagEphemeral = 0x0004;
constexpr uint32_t kTDFlagNoSelect = 0x0008;
constexpr uint32_t kTDFlagRecursiveMark = 0x0010;  // garbage collection's mark, not identity
constexpr uint32_t kTDFlagGeneric = 0x2000;
constexpr uint32_t kTDFlagColumnVector = 0x4000;

// The flag bits that take part in hash and equality: the read-only bit says where an object
// lives, and the collection's mark is bookkeeping set on interned objects while others may look
// them up, so neither may change what type an object is.
constexpr uint32_t kTDIdentityFlagsMask = ~(kTDFlagReadOnly | kTDFlagRecursiveMark);

// One traversal step's callbacks. `replacement` starts null; a visitor that fills it asks the
// container to put that descriptor in place of the visited one.
using TDVisitFn = TDTraverseValue (*)(TDImp* td, void* context, TDImpPtr* replacement);
using TDShouldRecurseFn = bool (*)(TDImp* td, void* context);

// What a kind's order of two data says besides the order. Ordering reports what it has to say
// from one module, so a kind hands back a note and the caller writes the message.
enum class DataOrderNote : uint8_t {
  None,
  NoOrder,                // the kind has no order: its data compare equal
  SubtypeRecords,         // a subtype's records were compared as bytes, not what they view
  UnsupportedRefnumSize,  // a refnum of neither 4 nor 8 bytes: its data compare equal
};

struct DataOrder {
  int32_t order = 0;  // negative, 0 or positive, as a three-way comparison
  DataOrderNote note = DataOrderNote::None;
};

struct DataOrderOptions;
// The whole comparison of one datum of `type`, registered comparisons included; 0 when either
// datum is null.
using ElementComparison = int32_t (*)(const TDImp& type, const void* a, const void* b, const DataOrderOptions& options);

// How two data are ordered; aggregates pass the same options on to their elements.
struct DataOrderOptions {
  // Null array handles: with it a null array sorts after any other and counts are not compared
  // first; without it a null array is an empty one.
  bool nullFirst = false;
  int32_t variantOption = 0;  // for the comparisons registered for variants and collections
  // Aggregates without handles, and refnums, compare their bytes; arrays of elements without
  // handles compare their elements in one block.
  int32_t bytewise = 0;
  int32_t rawNumbers = 0;  // numbers compare their bytes rather than their values
  // Compares each element of an aggregate, so that a registered comparison applies at any depth.
  ElementComparison compareElement = nullptr;
};

class TDImp : public TDRefCountedHashedObj {
 public:
  ~TDImp() override;

  // --- slots 1 to 41 ---------------------------------------------------------------------------
  int32_t GetHashValue() const override;
  int32_t ComputeHashValue() const override;
  virtual int16_t GetTypeCode() const = 0;
  virtual int32_t GetFlatSizeForSaving(int32_t* size, TDDataWriter* writer, int32_t* index) const;
  virtual int32_t IsSameAs(const TDImp& other) const;
  // A new, empty object of the same class: null name and typedef, flags 0, default members.
  virtual TDImpPtr NewInstance() const = 0;
  // Fill `target` (fresh from NewInstance) with writable copies of this object's members.
  // 0, or 2 when a copy cannot be allocated.
  virtual int32_t MemberCloneOrCheckOut(TDImpPtr& target) const;
  // Fill `target` with interned copies of this object's members and mark it read-only.
  // 0, or 2 when a member cannot be interned.
  virtual int32_t MemberCheckIn(TDImpPtr& target) const;
  virtual int32_t HasEnum() const { return 0; }
  virtual int32_t HasUnits() const { return 0; }
  virtual int32_t EphemeralizeTD(int32_t queryOnly);
  virtual int32_t UnephemeralizeTD(int32_t queryOnly);
  virtual int32_t FlattenTDForSaving(TDDataWriter* writer, int32_t* index) const;
  virtual int32_t FlattenTDPartsForSaving(TDDataWriter*) const { return 0; }
  virtual int32_t ConstructTD(TDDataReader* reader);
  virtual int32_t ConvertTDIndicesToTDImpPtrs(FlatDataCacheHelper*) const { return 0; }
  virtual int32_t VerifyData(const void*, const KoContext*) const { return 0; }
  virtual int32_t DataSizeCore(ITargetPlatformAlignment* platform) const = 0;
  virtual int32_t GetAlignment(ITargetPlatformAlignment* platform) const;
  virtual int64_t AlignDatumCore(int64_t offset, ITargetPlatformAlignment* platform) const;
  virtual int32_t DefinedType(int32_t) const { return 1; }
  virtual int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const;
  virtual int32_t DeflateData(void*, void*, int32_t, const HandleAllocationInterface&) const { return 0; }
  virtual DataShapes DataShapeOf(int32_t inMemory) const;
  virtual int32_t ShrinkData(void*, void*, int32_t, const HandleAllocationInterface&) const { return 0; }
  virtual uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const;
  virtual int32_t IsFlatDataFixedSize() const { return 0; }

 protected:
  // The work of ReadData and WriteData, which keep the books around it: `count` values read into
  // `data` (null: skipped) or written from it, any failure left in the stream.
  virtual void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const;
  virtual void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const;

 public:
  virtual int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const;
  virtual bool CopyDataConvertDestOverride(const TDImp*, const void*, void*, int32_t, int32_t&) const {
    return false;
  }
  virtual int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const;
  virtual int32_t ResetToDefaultData(void* data) const;
  virtual int32_t CompareClassData(int32_t, const void*, const TDImp*, TDImp**) const { return 0; }
  virtual int32_t MutateBooleanTD(TDImpPtr*, int32_t) { return 0; }
  virtual void Accept(ITDVisitor* visitor);
  virtual void PrintDebugStr(const uint8_t* prefix) const;
  virtual int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const;
  virtual bool CmpTDOverride(const TDImp*, int32_t, int32_t&) const { return false; }
  virtual int32_t CompareForSorting(const TDImp*) const { return 0; }
  virtual bool ConversionIsLossless(const TDImp* dst) const;

  // --- slots 42 to 173: the kind predicates ----------------------------------------------------
#define VELLUM_TD_DECLARE_SLOT(name) \
  virtual int32_t name() const { return 0; }
  VELLUM_TD_PREDICATES_FIRST(VELLUM_TD_DECLARE_SLOT)
  virtual int32_t IsErrorCluster(int32_t) const { return 0; }
  VELLUM_TD_PREDICATES_SECOND(VELLUM_TD_DECLARE_SLOT)
  virtual int32_t IsGeneric() const { return (Flags() & kTDFlagGeneric) != 0 ? 1 : 0; }
  VELLUM_TD_PREDICATES_THIRD(VELLUM_TD_DECLARE_SLOT)
#undef VELLUM_TD_DECLARE_SLOT

  // --- slots 174 to 178 ------------------------------------------------------------------------
  // Visits this descriptor (a -1 answer becomes 0); containers then walk their elements.
  virtual TDTraverseValue TraverseTD(TDVisitFn visit, void* context, TDShouldRecurseFn shouldRecurse,
                                     TDImpPtr* replacement);
  virtual const KoContext* GetContext() const { return nullptr; }
  virtual void SetContext(const KoContext*) { ClearHashValid(); }
  virtual void SetGenericness(int32_t generic);
  virtual bool HoldsContext() const { return false; }

  // --- what the loaders and walks learn of a tree ----------------------------------------------
  // Depth and expanded count from the elements' own (1 and 1 for a descriptor without any).
  virtual void ComputeNesting(uint32_t* depth, uint32_t* count) const;

  // --- ordering of data ------------------------------------------------------------------------
  // The order of two data (neither null) of this kind. The base knows none, but for the refnum's
  // cookie while refnums have no family of their own.
  virtual DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const;

  // --- non-virtual members ---------------------------------------------------------------------
  // `count` values in this kind's flattened form, read into `data` (null: skipped) or written
  // from it. *status, when given, gets the stream's error afterwards; the bytes read or written.
  int32_t ReadData(KoDataReader* reader, void* data, int32_t count, int32_t* status) const;
  int32_t WriteData(KoDataWriter* writer, const void* data, int32_t count, int32_t* status) const;

  // The interned equal object (made and inserted when absent); null when memory runs out.
  TDImpPtr CheckIn() const;
  // Always a new writable copy; null when memory runs out.
  TDImpPtr CloneOrCheckOut() const;

  int32_t IsReadOnlyTD() const { return (Flags() & kTDFlagReadOnly) != 0 ? 1 : 0; }
  uint32_t Flags() const noexcept { return flags_.load(std::memory_order_relaxed); }
  // Flag changes; the caller decides whether the change is one of identity (ClearHashValid).
  void SetFlags(uint32_t flags) noexcept { flags_.store(flags, std::memory_order_relaxed); }
  void SetFlagBits(uint32_t bits) noexcept { flags_.fetch_or(bits, std::memory_order_relaxed); }
  void ClearFlagBits(uint32_t bits) noexcept { flags_.fetch_and(~bits, std::memory_order_relaxed); }

  const TDNameImpPtr& GetNameImpPtr() const noexcept { return name_; }
  const TDTypedefImpPtr& GetTypedefImpPtr() const noexcept { return typedef_; }
  void SetNameImpPtr(const TDNameImpPtr& name);
  void SetTypedefImpPtr(const TDTypedefImpPtr& typedefLink);

  int32_t CmpTDCommon(const TDImp* other, int32_t flags) const;

  // How many levels this descriptor's tree has (1 for one without elements) and how many
  // descriptors the tree holds when each is counted every time it occurs (saturating). Kept by
  // interned objects from their check-in, so constant time for them; the loaders' limits and
  // every recursive walk rely on them.
  uint32_t NestingDepth() const;
  uint32_t ExpandedCount() const;

  // The code word of this descriptor's record in a type string of `version`: the code with the
  // flag bits of the record.
  uint16_t RecordCodeWord(uint32_t version) const;

 protected:
  TDImp() noexcept = default;
  TDImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept;

  // The order of the two data's bytes, DataSizeCore of them.
  DataOrder OrderBytes(const void* a, const void* b) const;

 private:
  TDNameImpPtr name_;
  TDTypedefImpPtr typedef_;
  std::atomic<uint32_t> flags_{0};
  // Cached nesting of an interned object; 0 until known.
  mutable std::atomic<uint32_t> depth_{0};
  mutable std::atomic<uint32_t> expanded_{0};
};

// What the descriptor dictionary calls to match interned descriptors.
inline bool InternEqual(const TDImp& a, const TDImp& b) { return a.IsSameAs(b) != 0; }
// Descriptors carry their own read-only flag, set by check-in before insertion.
inline void MarkInterned(TDImp&) {}

// A read-only handle on an interned descriptor; for code that has the object in hand.
inline TDR TDRFromImp(const TDImpPtr& imp) { return TDR(imp, 1); }

// Zeroes the in-place bytes of one datum of `type` when `clear` is nonzero.
void TDImpClearMemory(void* data, const TDImp* type, int32_t clear);

// The prefix PrintDebugStr puts before each line of a dump, as text; empty for null.
std::string PrefixText(const uint8_t* prefix);

// Writes "CopyDataConvert tcDst=<code of dst, 0 for null>, tcSrc=<code of src>" at level 3 as
// `module`'s line `line`: the refusal of a conversion, in the words of the family that refused.
void ReportConversionCodes(const char* module, int32_t line, const TDImp* dst, const TDImp& src);

// Writes the record of `type` (and first those of every descriptor it needs) unless the writer's
// save table holds an equal one, and gives its save-table index.
int32_t SaveTDRecord(const TDImp* type, TDDataWriter* writer, uint32_t* index);

// The order of two descriptors: an absent one first, then by type code, then by the kind's own
// order (CompareForSorting).
int32_t CompareEltsForSorting(const TDImp* a, const TDImp* b);
