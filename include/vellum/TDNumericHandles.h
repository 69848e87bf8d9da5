// Handles of the numeric kinds: the family handles (any numeric, any basic numeric) and one pair
// per integer, floating and complex kind, with their enumeration and units, and the numeric
// operations on data.
#pragma once

#include <cstdint>
#include <string_view>

#include "FixedPoint/fxp.h"
#include "vellum/TDAttributeHandles.h"
#include "vellum/TDEnumHandles.h"
#include "vellum/TDHandles.h"
#include "vellum/TDUnitsHandles.h"

class TDRNumeric;
class TDWNumeric;

// The operations every numeric handle offers; the handle type supplies the descriptor. A null
// handle answers 0 (null units, zero values) unless stated.
namespace vellum::numeric {
int32_t IsSigned(const TD& type);
int32_t IsFractional(const TD& type);
int32_t IsIntPtrT(const TD& type);
uint32_t WordLength(const TD& type);
int16_t IntegerWordLength(const TD& type);
uint32_t RealPartWordLength(const TD& type);
int16_t MinBitPos(const TD& type);
int16_t MaxBitPos(const TD& type);
vellum::FXP RangeMin(const TD& type);
vellum::FXP RangeMax(const TD& type);
vellum::FXP Delta(const TD& type);
// 0 and both ends as doubles (infinities for floating kinds); 42 for a null handle.
int32_t RangeF64(const TD& type, double* min, double* max);
void InitializeData(const TD& type, void* data);
int32_t CompareData(const TD& type, const void* a, const void* b);
[[nodiscard]] int32_t ConvertFromNumeric(const TD& type, const TD& src, const void* srcData, void* dstData);
[[nodiscard]] int32_t ConvertToNumeric(const TD& type, const void* srcData, const TD& dst, void* dstData);
int32_t MSDecimalDigitPos(const TD& type, const void* data);
int32_t DecimalDigitsForAutoPrecision(const TD& type);
int32_t SupportsUnits(const TD& type);
int32_t GetNumericRepEnumIndex(const TD& type);
int32_t GetRepresentationEnumValue(const TD& type, const TD& of, void* data);
TDUnitsImpPtr GetUnitsImpPtr(const TD& type);
TDEnumImpPtr GetEnumImpPtr(const TD& type);
}  // namespace vellum::numeric

template <class Handle>
class TDNumericReadAccess {
 public:
  int32_t IsSigned() const { return vellum::numeric::IsSigned(Self()); }
  int32_t IsFractional() const { return vellum::numeric::IsFractional(Self()); }
  int32_t IsIntPtrT() const { return vellum::numeric::IsIntPtrT(Self()); }
  uint32_t WordLength() const { return vellum::numeric::WordLength(Self()); }
  int16_t IntegerWordLength() const { return vellum::numeric::IntegerWordLength(Self()); }
  uint32_t RealPartWordLength() const { return vellum::numeric::RealPartWordLength(Self()); }
  int16_t MinBitPos() const { return vellum::numeric::MinBitPos(Self()); }
  int16_t MaxBitPos() const { return vellum::numeric::MaxBitPos(Self()); }
  // The smallest and largest value and the step as exact fixed-point values: an integer kind's
  // ends in its own format (Int8: -128 as <s,8,8>), a floating kind's as the infinities.
  vellum::FXP RangeMin() const { return vellum::numeric::RangeMin(Self()); }
  vellum::FXP RangeMax() const { return vellum::numeric::RangeMax(Self()); }
  vellum::FXP Delta() const { return vellum::numeric::Delta(Self()); }
  int32_t RangeF64(double* min, double* max) const { return vellum::numeric::RangeF64(Self(), min, max); }
  // Zero in all bytes of one value.
  void InitializeData(void* data) const { vellum::numeric::InitializeData(Self(), data); }
  // <0, 0 or >0: integers by value, floating values by value with NaN ordered by class, complex
  // values by their bytes.
  int32_t CompareData(const void* a, const void* b) const { return vellum::numeric::CompareData(Self(), a, b); }
  // One value of numeric type `src` into `dstData` of this type, or of this type into `dst`: 1
  // when converted, 0 (nothing written) when the pair cannot be converted this way. Units and
  // enumerations take no part; the last argument is unused.
  [[nodiscard]] int32_t ConvertFromNumeric(const TD& src, const void* srcData, void* dstData, int32_t = 0) const {
    return vellum::numeric::ConvertFromNumeric(Self(), src, srcData, dstData);
  }
  [[nodiscard]] int32_t ConvertToNumeric(const void* srcData, const TD& dst, void* dstData, int32_t = 0) const {
    return vellum::numeric::ConvertToNumeric(Self(), srcData, dst, dstData);
  }
  // floor(log10(|value|)); 0 for zero; for an infinity or NaN 7 on FloatExt, 3 on other kinds.
  int32_t MSDecimalDigitPos(const void* data) const { return vellum::numeric::MSDecimalDigitPos(Self(), data); }
  // Decimal digits that show every value of the kind; 20 with a diagnostic for 64-bit integers.
  int32_t DecimalDigitsForAutoPrecision() const { return vellum::numeric::DecimalDigitsForAutoPrecision(Self()); }
  int32_t SupportsUnits() const { return vellum::numeric::SupportsUnits(Self()); }
  // The kind's index in the "Numeric Representation" enumeration; -1 for a null handle or a
  // code without one.
  int32_t GetNumericRepEnumIndex() const { return vellum::numeric::GetNumericRepEnumIndex(Self()); }
  // Stores the representation index of `of` into `data`, a value of this type. 0; 1 when `of` has
  // no representation index or this type is not numeric.
  int32_t GetRepresentationEnumValue(const TD& of, void* data) const {
    return vellum::numeric::GetRepresentationEnumValue(Self(), of, data);
  }

 protected:
  TDNumericReadAccess() = default;

 private:
  const TD& Self() const { return static_cast<const Handle&>(*this); }
};

// --- kinds ---------------------------------------------------------------------------------------

// Abstract kinds: the admission test only; default construction gives a null handle.
struct NumericKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct BasicNumericKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
// One per basic numeric code: admits the base code and, for a kind that shows its enumeration or
// units in the code, the code with 0x10.
template <TypeCode kCode>
struct NumericCodeKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

// --- family handles ------------------------------------------------------------------------------

class TDRNumeric : public TDRTyped<TDRNumeric, TDWNumeric, TDR, NumericKind>,
                   public TDNumericReadAccess<TDRNumeric> {
 public:
  using TDRTyped::TDRTyped;
  // Holds `p` whenever `take` is nonzero, without the admission test.
  TDRNumeric(const TDImpPtr& p, int32_t take, int32_t) : TDRTyped(p, 0) {
    if (take != 0 && p) imp_ = p;
  }

  // Null when there are none.
  TDRUnits GetUnits() const { return TDRUnits(vellum::numeric::GetUnitsImpPtr(*this), 1); }

  // The code of a representation index (14 is FixedPoint); 0 outside 0 to 14.
  static int32_t GetTCForNumericRepEnumIndex(int32_t index);
  // The shared "Numeric Representation" enumeration (an EnumUInt32 whose items name the
  // numeric kinds in representation-index order), built on first use.
  static TDRNumeric BuildRepresentationEnum();
};

class TDWNumeric : public TDWTyped<TDRNumeric, TDWNumeric, TDW, NumericKind>,
                   public TDNumericReadAccess<TDWNumeric> {
 public:
  using TDWTyped::TDWTyped;

  // The descriptor's own units object: changes through it change the descriptor.
  TDWUnits GetUnits() const { return TDWUnits(vellum::numeric::GetUnitsImpPtr(*this), 1); }
  // Each: 42 for a null handle or a kind without units; 0 otherwise. A null `units` removes them.
  [[nodiscard]] int32_t SetUnits(const TDWUnits& units);
  [[nodiscard]] int32_t SetUnits(const TDRUnits& units);
  [[nodiscard]] int32_t RemoveUnits();
  // Takes attributes of `src` by `mask`: 0x1 its enumeration, units, name and no-select flag,
  // 0x2 its typedef link. Nonzero when something was taken; 0 for a null handle.
  [[nodiscard]] int32_t CopyAttributes(const TDR& src, uint32_t mask);
  // The pointer-sized-integer mark is not kept by the basic kinds; these do nothing.
  void SetIntPtrT();
  void ClearIntPtrT();
};

class TDRBasicNumeric;
class TDWBasicNumeric;

class TDRBasicNumeric : public TDRTyped<TDRBasicNumeric, TDWBasicNumeric, TDRNumeric, BasicNumericKind> {
 public:
  using TDRTyped::TDRTyped;
  // Null when there is none.
  TDREnum GetEnum() const { return TDREnum(vellum::numeric::GetEnumImpPtr(*this), 1); }
  // The extra flag byte the descriptor carries; 0 for a null handle.
  uint8_t GetNumFlags() const;
};

class TDWBasicNumeric : public TDWTyped<TDRBasicNumeric, TDWBasicNumeric, TDWNumeric, BasicNumericKind> {
 public:
  using TDWTyped::TDWTyped;
  // The descriptor's own enumeration object: changes through it change the descriptor.
  TDWEnum GetEnum() const { return TDWEnum(vellum::numeric::GetEnumImpPtr(*this), 1); }
  // Each: 42 for a null handle, else 0. A null `enumeration` removes it. The type code of an
  // unsigned 8-, 16- or 32-bit integer follows (EnumUInt8 ... while it has one).
  [[nodiscard]] int32_t SetEnum(const TDWEnum& enumeration);
  [[nodiscard]] int32_t SetEnum(const TDREnum& enumeration);
  [[nodiscard]] int32_t RemoveEnum();
  uint8_t GetNumFlags() const;
  [[nodiscard]] int32_t SetNumFlags(uint8_t numFlags);
};

// --- one pair per kind ---------------------------------------------------------------------------
// Besides the default, named and pointer constructors, the small unsigned integers take an
// enumeration and the floating and complex kinds units: (member, name[, typedef link]). A
// read-only handle checks the new descriptor in (null when memory runs out); a writable one
// holds private copies of the members given (null when they cannot be made).

namespace vellum::detail {
// A new writable basic numeric of `code` with the given members (each may be null), copied when
// `copyMembers` is set; null when memory runs out or `code` is not a basic numeric code.
TDImpPtr NewBasicNumeric(TypeCode code, const uint8_t* name, const TDTypedefImpPtr& typedefLink,
                         const TDEnumImpPtr& enumeration, const TDUnitsImpPtr& units, bool copyMembers);
inline TDImpPtr Fresh(const TDImpPtr& p) { return p; }
}  // namespace vellum::detail

#define VELLUM_NUMERIC_MEMBER_CTORS(Self, Base, Kind, Finish, Copy, Member, EnumArg, UnitsArg)              \
  Self(const Member& member, const uint8_t* name)                                                          \
      : Base(Finish(vellum::detail::NewBasicNumeric(TypeCode::Kind, name, TDTypedefImpPtr(), EnumArg,        \
                                                    UnitsArg, Copy)),                                       \
             1) {}                                                                                         \
  Self(const Member& member, const uint8_t* name, const TDRTypedef& typedefLink)                           \
      : Base(Finish(vellum::detail::NewBasicNumeric(TypeCode::Kind, name, typedefLink.GetTypedefImpPtr(),    \
                                                    EnumArg, UnitsArg, Copy)),                              \
             1) {}                                                                                         \
  Self(const Member& member, const uint8_t* name, const TDWTypedef& typedefLink)                           \
      : Base(Finish(vellum::detail::NewBasicNumeric(TypeCode::Kind, name, typedefLink.GetTypedefImpPtr(),    \
                                                    EnumArg, UnitsArg, Copy)),                              \
             1) {} \
  Self(const Member& member, std::string_view name) : Self(member, vellum::detail::CName(name).Get()) {}
#define VELLUM_NUMERIC_ENUM_CTORS(Self, Base, Kind, Finish, Copy)                                          \
  VELLUM_NUMERIC_MEMBER_CTORS(Self, Base, Kind, Finish, Copy, TDREnum, member.GetEnumImpPtr(), TDUnitsImpPtr()) \
  VELLUM_NUMERIC_MEMBER_CTORS(Self, Base, Kind, Finish, Copy, TDWEnum, member.GetEnumImpPtr(), TDUnitsImpPtr())
#define VELLUM_NUMERIC_UNITS_CTORS(Self, Base, Kind, Finish, Copy)                                         \
  VELLUM_NUMERIC_MEMBER_CTORS(Self, Base, Kind, Finish, Copy, TDRUnits, TDEnumImpPtr(), member.GetUnitsImpPtr()) \
  VELLUM_NUMERIC_MEMBER_CTORS(Self, Base, Kind, Finish, Copy, TDWUnits, TDEnumImpPtr(), member.GetUnitsImpPtr())
#define VELLUM_NUMERIC_NO_CTORS(Self, Base, Kind, Finish, Copy)
#define VELLUM_NUMERIC_HANDLES(Kind, Ctors)                                                                 \
  class TDW##Kind;                                                                                          \
  class TDR##Kind                                                                                           \
      : public TDRTyped<TDR##Kind, TDW##Kind, TDRBasicNumeric, NumericCodeKind<TypeCode::Kind>> {           \
   public:                                                                                                  \
    using TDRTyped::TDRTyped;                                                                               \
    Ctors(TDR##Kind, TDRTyped, Kind, vellum::detail::CheckInNew, false)                                     \
  };                                                                                                        \
  class TDW##Kind                                                                                           \
      : public TDWTyped<TDR##Kind, TDW##Kind, TDWBasicNumeric, NumericCodeKind<TypeCode::Kind>> {           \
   public:                                                                                                  \
    using TDWTyped::TDWTyped;                                                                               \
    Ctors(TDW##Kind, TDWTyped, Kind, vellum::detail::Fresh, true)                                           \
  };

VELLUM_NUMERIC_HANDLES(Int8, VELLUM_NUMERIC_NO_CTORS)
VELLUM_NUMERIC_HANDLES(Int16, VELLUM_NUMERIC_NO_CTORS)
VELLUM_NUMERIC_HANDLES(Int32, VELLUM_NUMERIC_NO_CTORS)
VELLUM_NUMERIC_HANDLES(Int64, VELLUM_NUMERIC_NO_CTORS)
VELLUM_NUMERIC_HANDLES(UInt8, VELLUM_NUMERIC_ENUM_CTORS)
VELLUM_NUMERIC_HANDLES(UInt16, VELLUM_NUMERIC_ENUM_CTORS)
VELLUM_NUMERIC_HANDLES(UInt32, VELLUM_NUMERIC_ENUM_CTORS)
VELLUM_NUMERIC_HANDLES(UInt64, VELLUM_NUMERIC_NO_CTORS)
VELLUM_NUMERIC_HANDLES(Float32, VELLUM_NUMERIC_UNITS_CTORS)
VELLUM_NUMERIC_HANDLES(Float64, VELLUM_NUMERIC_UNITS_CTORS)
VELLUM_NUMERIC_HANDLES(FloatExt, VELLUM_NUMERIC_UNITS_CTORS)
VELLUM_NUMERIC_HANDLES(Complex64, VELLUM_NUMERIC_UNITS_CTORS)
VELLUM_NUMERIC_HANDLES(Complex128, VELLUM_NUMERIC_UNITS_CTORS)
VELLUM_NUMERIC_HANDLES(ComplexExt, VELLUM_NUMERIC_UNITS_CTORS)

#undef VELLUM_NUMERIC_HANDLES
#undef VELLUM_NUMERIC_NO_CTORS
#undef VELLUM_NUMERIC_UNITS_CTORS
#undef VELLUM_NUMERIC_ENUM_CTORS
#undef VELLUM_NUMERIC_MEMBER_CTORS

// --- free functions ------------------------------------------------------------------------------

// The shared default of each kind, built on first use and released when the service stops.
const TDR& GetiB();
const TDR& GetiW();
const TDR& GetiL();
const TDR& GetiQ();
const TDR& GetuB();
const TDR& GetuW();
const TDR& GetuL();
const TDR& GetuQ();
const TDR& GetfS();
const TDR& GetfD();
const TDR& GetfX();
const TDR& GetcS();
const TDR& GetcD();
const TDR& GetcX();

// The precision rank of each type code below 32: 0 for the 8-bit integers, Float32 and Complex64,
// 1 for the 16-bit integers, Float64 and Complex128, 2 for the 32-bit integers, FloatExt and
// ComplexExt, 3 for the 64-bit integers, 0 for every other code (modifiers included).
const uint8_t* KoNumPrec();

// Converts one value between two numeric types: 0; 1 when either pointer is null, 42 when either
// handle is null, and 1 after a diagnostic when either type is not numeric. The flags are passed
// to the conversion.
[[nodiscard]] int32_t ConvertNumTDR(const TDR& src, const void* srcData, const TDR& dst, void* dstData, int32_t flags);

// 1 when either descriptor is not a basic numeric or has no enumeration, or when their items
// differ at some index both have; 0 when one item list begins the other.
int32_t EnumConflict(const TDR& a, const TDR& b);
// Whether some descriptor of the tree of `type` has an enumeration.
bool TDContainsEnum(const TDR& type);
