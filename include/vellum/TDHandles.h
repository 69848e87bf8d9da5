// Handles to type descriptors: the counted owning pointer, the null-safe base handle `TD`, the
// read-only `TDR` (an interned descriptor: identity is type equality) and the writable `TDW`.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>

#include "vellum/TDFlags.h"
#include "vellum/TDLayout.h"
#include "vellum/TDPredicates.h"
#include "vellum/TypeCodes.h"

struct KoContext;
class DebugStream;
class TDRefCountedObj;
class TDImp;
class TDAttributeImp;
class TDNameImp;
class TDTypedefImp;
class TDUnitsImp;
class TDEnumImp;
class TDOMIdImp;
class ITDVisitor;
class KoDataWriter;
class KoDataReader;
class HandleAllocationInterface;

// Owning pointer to a counted object. Copying takes a reference; `Free` drops it and destroys the
// object when it was the last one. Counts change atomically, so pointers to one shared object may
// be copied and released on any thread.
class TDRefCountedPtr {
 public:
  TDRefCountedPtr() noexcept = default;
  explicit TDRefCountedPtr(TDRefCountedObj* object) noexcept;
  TDRefCountedPtr(const TDRefCountedPtr& other) noexcept;
  TDRefCountedPtr(TDRefCountedPtr&& other) noexcept;
  TDRefCountedPtr& operator=(const TDRefCountedPtr& other) noexcept;
  TDRefCountedPtr& operator=(TDRefCountedPtr&& other) noexcept;
  ~TDRefCountedPtr();

  // Releases the held object (destroying it when this was its last owner) and becomes null.
  void Free() noexcept;
  // Holds `object` (null allowed) with a counted reference; nothing happens if it is already held.
  void assign(TDRefCountedObj* object) noexcept;
  // Releases the held object and takes `other`'s without touching any count; `other` becomes null.
  void move(TDRefCountedPtr& other) noexcept;

  TDRefCountedObj* GetObject() const noexcept { return object_; }
  explicit operator bool() const noexcept { return object_ != nullptr; }
  bool operator==(const TDRefCountedPtr& other) const noexcept { return object_ == other.object_; }

 protected:
  TDRefCountedObj* object_ = nullptr;
};

// The typed forms (`TDImpPtr`, `TDNameImpPtr`, ...). The type only records what the object is.
template <class T>
class TDTypedPtr : public TDRefCountedPtr {
 public:
  TDTypedPtr() noexcept = default;
  explicit TDTypedPtr(T* object) noexcept : TDRefCountedPtr(Base(object)) {}
  template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
  TDTypedPtr(const TDTypedPtr<U>& other) noexcept : TDRefCountedPtr(other) {}  // NOLINT: implicit upcast

  T* get() const noexcept { return static_cast<T*>(object_); }
  T* operator->() const noexcept { return get(); }
  T& operator*() const noexcept { return *get(); }
  void assign(T* object) noexcept { TDRefCountedPtr::assign(Base(object)); }
  void assign(const TDTypedPtr& other) noexcept { TDRefCountedPtr::assign(other.object_); }

  // For the family that owns `U`: the same object seen as its own class. Anyone else asks a slot.
  template <class U>
  TDTypedPtr<U> StaticCast() const noexcept {
    return TDTypedPtr<U>(static_cast<U*>(get()));
  }

 private:
  static TDRefCountedObj* Base(T* object) noexcept { return object; }
};

using TDImpPtr = TDTypedPtr<TDImp>;
using TDAttributeImpPtr = TDTypedPtr<TDAttributeImp>;
using TDNameImpPtr = TDTypedPtr<TDNameImp>;
using TDTypedefImpPtr = TDTypedPtr<TDTypedefImp>;
using TDUnitsImpPtr = TDTypedPtr<TDUnitsImp>;
using TDEnumImpPtr = TDTypedPtr<TDEnumImp>;
using TDOMIdImpPtr = TDTypedPtr<TDOMIdImp>;

// The shared null pointers of every member kind.
const TDImpPtr& GNullImpPtr();
const TDNameImpPtr& GNullNameImpPtr();
const TDTypedefImpPtr& GNullTypedefImpPtr();
const TDUnitsImpPtr& GNullUnitsImpPtr();
const TDEnumImpPtr& GNullEnumImpPtr();
const TDOMIdImpPtr& GNullOMIdImpPtr();

// Result of one traversal step: 0 go on, -1 go on without descending, anything else stops and is
// passed up unchanged.
using TDTraverseValue = int32_t;
constexpr TDTraverseValue kTraverseContinue = 0;
constexpr TDTraverseValue kTraverseSkipElements = -1;

class TDR;
class TDW;
class TDRName;
class TDWName;
class TDRTypedef;
class TDWTypedef;

// The base of all handles; it may be null. Queries on a null handle answer 0, null or false and
// status-returning members answer 42; nothing ever calls through a null object.
class TD {
 public:
  TD() noexcept = default;
  // Holds `p` when `take` is nonzero, otherwise nothing.
  TD(const TDImpPtr& p, int32_t take);

  bool operator==(const TD& other) const noexcept { return imp_ == other.imp_; }
  explicit operator bool() const noexcept { return static_cast<bool>(imp_); }
  bool IsNull() const noexcept { return !imp_; }
  const TDImpPtr& GetImpPtr() const noexcept { return imp_; }
  TDImp* GetImp() const noexcept;

  int16_t GetTypeCode() const;
  int32_t GetHashValue() const;
  int32_t IsSameAs(const TD& other) const;
  int32_t IsReadOnlyTD() const;

  int32_t HasName() const;
  // 0 and the name, or 42 for a null handle; `name` is left as it is when there is no name.
  [[nodiscard]] int32_t GetName(std::string* name) const;
  // The name as a Pascal string; the shared empty one when there is no name or no descriptor.
  const uint8_t* GetNamePStr() const;
  int32_t HasTypedef() const;

  int32_t IsEphemeralTD() const;
  // Flag 0x0008 itself: 8 or 0.
  int32_t IsNoSelectTD() const;

#define VELLUM_TD_DECLARE_PREDICATE(name) int32_t name() const;
  VELLUM_TD_PREDICATES_FIRST(VELLUM_TD_DECLARE_PREDICATE)
  int32_t IsErrorCluster(int32_t strict) const;
  VELLUM_TD_PREDICATES_SECOND(VELLUM_TD_DECLARE_PREDICATE)
  int32_t IsGeneric() const;
  VELLUM_TD_PREDICATES_THIRD(VELLUM_TD_DECLARE_PREDICATE)
#undef VELLUM_TD_DECLARE_PREDICATE

  int32_t HasEnum() const;
  int32_t HasUnits() const;
  bool HoldsContext() const;
  const KoContext* GetContext() const;

  // Type compatibility of data of `other`'s type going into this type: 0 the same for data
  // purposes, otherwise the result bits. The same object (or both null) is 0, one null 0x100.
  int32_t CmpTD(const TD& other, int32_t flags) const;
  // A total order of descriptors for sorting them: null first, then by type code, then by the
  // kind's own order (sizes, bounds, elements, ...); 0 for the same type.
  int32_t CompareForSorting(const TD& other) const;

  // Writes the descriptor dump to the debug stream (level 0); always 0.
  int32_t PrintDebugStr(const uint8_t* prefix) const;
  int32_t PrintDebugStr() const;
  // 0 for a null handle; otherwise calls the descriptor's visitor entry and answers 1.
  int32_t Accept(ITDVisitor* visitor) const;

  // Walks of the whole descriptor tree.
  int32_t ContainsBooleanTD() const;
  int32_t ContainsTypedef() const;
  int32_t ContainsVariantAsData() const;
  int32_t TypedefsPathized() const;

  // Data layout and the life cycle of data of this type. `platform` null means the running
  // process (pointer size 8, largest alignment as set by SetDSAlign). A null handle answers 0 for
  // sizes, alignments, shapes and released bytes; AlignDatum then returns the offset unchanged.
  int32_t DataSize(ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetAlignment(ITargetPlatformAlignment* platform = nullptr) const;
  // `offset` (or an absolute address) rounded up to where a datum of this type may start.
  int64_t AlignDatum(int64_t offset, ITargetPlatformAlignment* platform = nullptr) const;
  DataShapes DataShape() const;
  DataShapes FlatDataShape() const;
  // Writes the default value into uninitialised (onlyIfEmpty 0) or empty memory. 1 for a null
  // handle or null data; 2 when memory runs out.
  [[nodiscard]] int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const;
  // Turns a valid value into the default, reusing its memory. 1 for null data, 42 for a null handle.
  [[nodiscard]] int32_t ResetToDefaultData(void* data) const;
  // Give handle memory back through `allocator`; only data below `end` is touched. The result is
  // the number of bytes released.
  int32_t DeflateData(void* data, void* end, int32_t dispose, const HandleAllocationInterface& allocator) const;
  int32_t ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const;
  // 0 when the datum's handles are sound; damage goes to the rave procedure (SetTDRaveProc) and
  // the debug stream. 0x100000 for a null handle.
  int32_t VerifyData(const void* data, const KoContext* context) const;
  // A deep copy into storage of the same type. 1 when either pointer is null, 42 for a null handle.
  [[nodiscard]] int32_t CopyData(const void* src, void* dst, const KoContext* context, int32_t flags) const;
  // Whether every value of this type survives conversion into `other`; false when either is null.
  bool ConversionIsLossless(const TD& other) const;
  // The kind's comparison of class data; 42 for a null handle. Kinds without one answer 0 and
  // leave *dataType as it is.
  [[nodiscard]] int32_t CompareClassData(int32_t how, const void* data, const TDR& other, TDR* dataType) const;

  // The flattened form of `count` values at `data` (consecutive, DataSize apart): the bytes
  // written or read, with the stream's status in *status (42 for a null handle). Reading fills
  // default data of the type (null `data` skips the values).
  int32_t WriteData(KoDataWriter* writer, const void* data, int32_t count, int32_t* status) const;
  int32_t ReadData(KoDataReader* reader, void* data, int32_t count, int32_t* status) const;
  // The bytes WriteData would write for one value; null `data` gives the size without data.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const;

 protected:
  TDImpPtr imp_;
};

// A read-only handle: null, or an interned, checked-in descriptor. Two `TDR`s describe the same
// type exactly when they hold the same object.
class TDR : public TD {
 public:
  TDR() noexcept = default;
  // Holds `p` when `take` is nonzero and `p` is not null. The read-only flag is not tested.
  TDR(const TDImpPtr& p, int32_t take);

  // A new writable copy; a null handle gives a null `TDW`.
  TDW CheckOut() const;
  TDR SetConstantness(int32_t) const { return *this; }
  int32_t GetConstantness() const { return 0; }

  using TD::GetName;
  TDRName GetName() const;
  TDRTypedef GetTypedef() const;

  bool HoldsContextRecursive() const;
  const KoContext* GetContextRecursive() const;

  using VisitTDR = TDTraverseValue (*)(const TDR&, void*);
  using ShouldRecurseTDR = bool (*)(const TDR&);
  // Pre-order walk, elements in order; nothing is replaced. A null `shouldRecurse` always descends.
  TDTraverseValue TraverseTDR(VisitTDR visit, void* context, ShouldRecurseTDR shouldRecurse) const;

  // Copies a value of this type into storage of type `dst`, converting it. 1 when either data
  // pointer is null, 42 when either handle is null; otherwise the families' status.
  [[nodiscard]] int32_t CopyDataConvert(const TD& dst, const void* src, void* dstData, int32_t flags) const;
};

// A writable handle: null, or a private, mutable descriptor that is not interned. It can never
// hold a read-only object. Not to be shared between threads while it is being changed.
class TDW : public TD {
 public:
  TDW() noexcept = default;
  // Holds `p` when `take` is nonzero, `p` is not null and `p` is not read-only.
  TDW(const TDImpPtr& p, int32_t take);

  // The interned equal descriptor; the writable object is not consumed and stays usable.
  // A null handle gives the null `TDR`, and so does a failed check-in (out of memory).
  TDR CheckIn() const;
  // A new writable copy.
  TDW Clone() const;

  using TD::GetName;
  TDWName GetName() const;
  TDWTypedef GetTypedef() const;

  // Setters: 42 and no change for a null handle, otherwise 0 unless stated.
  // An empty or null text removes the name; 2 when a new name object cannot be allocated.
  [[nodiscard]] int32_t SetName(std::string_view name);
  [[nodiscard]] int32_t SetName(const uint8_t* cString);
  [[nodiscard]] int32_t SetNamePStr(const uint8_t* pString);
  [[nodiscard]] int32_t SetName(const TDWName& name);
  [[nodiscard]] int32_t RemoveName();
  [[nodiscard]] int32_t SetTypedef(const TDWTypedef& typedefLink);
  [[nodiscard]] int32_t RemoveTypedef();
  [[nodiscard]] int32_t SetNoSelectMask(int32_t mask);
  [[nodiscard]] int32_t SetGenericness(int32_t generic);
  // The previous ephemeral flag (4 or 0); 42 for a null handle.
  int32_t EphemeralizeTD();
  int32_t UnephemeralizeTD();

  void SetContextRecursive(const KoContext* context);

  using VisitTDW = TDTraverseValue (*)(TDW&, void*, bool* replaced);
  using ShouldRecurseTDW = bool (*)(const TDW&);
  // Each visited object comes wrapped in a `TDW` (null for a read-only one). When the visitor sets
  // *replaced, the object its `TDW` then holds replaces the visited one in its container, or, at
  // the top, becomes this handle's object.
  TDTraverseValue TraverseTDW(VisitTDW visit, void* context, ShouldRecurseTDW shouldRecurse);

  // As TDR::CopyDataConvert.
  [[nodiscard]] int32_t CopyDataConvert(const TD& dst, const void* src, void* dstData, int32_t flags) const;
};

// Handles that always hold null.
class TDRNull : public TDR {
 public:
  TDRNull() noexcept = default;
};
class TDWNull : public TDW {
 public:
  TDWNull() noexcept = default;
};

// The shared null read-only handle.
const TDR& GNullTD();

// A read-only handle on `imp` (null allowed).
TDR MakeTDRFromTDImp(const TDImp* imp);

// The shared default descriptor of a code (bit 0x10 stripped), or the null `TDR` after a
// diagnostic when the code has none.
const TDR& MakeDefaultTDRForTypeCode(int32_t code);
// The default checked out, or a null `TDW` when there is none.
TDW MakeDefaultTDWForTypeCode(int32_t code);

// Zeroes the in-place bytes of one datum of `type` when `clear` is nonzero (nothing for a null
// handle or null data). Handles inside the datum are not disposed.
void TDImpClearMemory(void* data, const TD& type, int32_t clear);

// A process-wide slot the host fills around the conversions it makes for probes; nothing in the
// library reads it. Plain stores, meant for one converting thread at a time.
void SetCopyDataConvertSourceContextForProbe(const KoContext* context);
const KoContext* GetCopyDataConvertSourceContextForProbe();

// The short type text: "null" for a null handle, otherwise the kind's text.
std::string ToString(const TDR& type);
// Appends `[TD "name"]` to the stream: the descriptor's name, empty when it has none or the
// handle is null.
void ToDebugStream(DebugStream& stream, const TD& type);

// ---------------------------------------------------------------------------------------------
// Typed handles. A kind describes itself with a small struct:
//   struct Kind { static bool Admit(const TDImp&);            // the admission test
//                 static TDImpPtr New(const uint8_t* name); };  // a fresh writable object
// A typed handle has the same single field as `TDR`/`TDW`; its type records that the object passed
// the kind's test. Construction from a pointer with check 0, or an object that fails the test,
// gives a null handle, never an error.

namespace vellum::detail {
TDImpPtr Admitted(const TDImpPtr& p, int32_t check, bool (*admit)(const TDImp&));
TDImpPtr CheckInNew(const TDImpPtr& fresh);

// A name given as text, zero-terminated for the calls that take C strings. A temporary made in
// a call's arguments lives until the call returns.
class CName {
 public:
  explicit CName(std::string_view text) : text_(text) {}
  const uint8_t* Get() const { return reinterpret_cast<const uint8_t*>(text_.c_str()); }

 private:
  std::string text_;
};
}  // namespace vellum::detail

template <class Self, class Writable, class Base, class Kind>
class TDRTyped : public Base {
 public:
  // A new default object of the kind, checked in.
  TDRTyped() : Base(vellum::detail::CheckInNew(Kind::New(nullptr)), 1) {}
  explicit TDRTyped(const uint8_t* name) : Base(vellum::detail::CheckInNew(Kind::New(name)), 1) {}
  explicit TDRTyped(std::string_view name) : TDRTyped(vellum::detail::CName(name).Get()) {}
  TDRTyped(const TDImpPtr& p, int32_t check)
      : Base(vellum::detail::Admitted(p, check, &Kind::Admit), 1) {}

  Writable CheckOut() const { return Writable(TDR::CheckOut().GetImpPtr(), 1); }
};

template <class Readable, class Self, class Base, class Kind>
class TDWTyped : public Base {
 public:
  // A new default object of the kind, writable.
  TDWTyped() : Base(Kind::New(nullptr), 1) {}
  explicit TDWTyped(const uint8_t* name) : Base(Kind::New(name), 1) {}
  explicit TDWTyped(std::string_view name) : TDWTyped(vellum::detail::CName(name).Get()) {}
  TDWTyped(const TDImpPtr& p, int32_t check)
      : Base(vellum::detail::Admitted(p, check, &Kind::Admit), 1) {}

  Readable CheckIn() const { return Readable(TDW::CheckIn().GetImpPtr(), 1); }
  Self Clone() const { return Self(TDW::Clone().GetImpPtr(), 1); }
};
