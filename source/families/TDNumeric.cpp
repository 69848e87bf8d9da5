// Numbers: the integer, floating and complex kinds with their enumeration, units and flag byte;
// compatibility, conversion and comparison of their values; their handles, factories, shared
// defaults and the representation and event-type enumerations.
#include "source/families/TDNumeric.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <limits>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDNumeric");

namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

// The constants of each basic numeric kind, in code order (index = code - 1).
struct BasicNumericInfo {
  TypeCode code;
  uint32_t wordLength;
  uint32_t realPartWordLength;
  bool isSigned;
  double rangeMin;
  double rangeMax;
  const char* debugName;
  int32_t representationIndex;
  int32_t autoPrecisionDigits;
  bool autoPrecisionSupported;
  uint8_t precisionRank;
  DefaultTypeGetter defaultGetter;
};

const BasicNumericInfo kBasicNumerics[] = {
    {TypeCode::Int8, 8, 8, true, -128.0, 127.0, "int8", 5, 3, true, 0, &GetiB},
    {TypeCode::Int16, 16, 16, true, -32768.0, 32767.0, "int16", 4, 5, true, 1, &GetiW},
    {TypeCode::Int32, 32, 32, true, -2147483648.0, 2147483647.0, "int32", 3, 10, true, 2, &GetiL},
    {TypeCode::Int64, 64, 64, true, -9223372036854775808.0, 9223372036854775807.0, "int64", 12, 20, false, 3,
     &GetiQ},
    {TypeCode::UInt8, 8, 8, false, 0.0, 255.0, "uInt8", 8, 3, true, 0, &GetuB},
    {TypeCode::UInt16, 16, 16, false, 0.0, 65535.0, "uInt16", 7, 5, true, 1, &GetuW},
    {TypeCode::UInt32, 32, 32, false, 0.0, 4294967295.0, "uInt32", 6, 10, true, 2, &GetuL},
    {TypeCode::UInt64, 64, 64, false, 0.0, 18446744073709551615.0, "uInt64", 13, 20, false, 3, &GetuQ},
    {TypeCode::Float32, 32, 32, true, -kInfinity, kInfinity, "single", 2, 6, true, 0, &GetfS},
    {TypeCode::Float64, 64, 64, true, -kInfinity, kInfinity, "double", 1, 13, true, 1, &GetfD},
    {TypeCode::FloatExt, 128, 128, true, -kInfinity, kInfinity, "float extended", 0, 13, true, 2, &GetfX},
    {TypeCode::Complex64, 64, 32, true, -kInfinity, kInfinity, "complex single", 11, 6, true, 0, &GetcS},
    {TypeCode::Complex128, 128, 64, true, -kInfinity, kInfinity, "complex double", 10, 13, true, 1, &GetcD},
    {TypeCode::ComplexExt, 256, 128, true, -kInfinity, kInfinity, "complex extended", 9, 13, true, 2, &GetcX},
};
constexpr int32_t kNumBasicNumerics = 14;
static_assert(std::size(kBasicNumerics) == kNumBasicNumerics);

constexpr int32_t kFixedPointRepresentationIndex = 14;

// Whether converting from a code (row) into a code (column) may lose information, for the codes
// Void to ComplexExt.
constexpr uint8_t kLossy[15][15] = {
    // V I8 I16 I32 I64 U8 U16 U32 U64 F32 F64 FX C64 C128 CX  (destination)
    {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0},  // Void
    {0, 0, 0, 0, 0, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0},  // Int8
    {0, 1, 0, 0, 0, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0},  // Int16
    {0, 1, 1, 0, 0, 1, 1, 1, 1, 1, 0, 0, 1, 0, 0},  // Int32
    {0, 1, 1, 1, 0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1},  // Int64
    {0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0},  // UInt8
    {0, 1, 1, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0},  // UInt16
    {0, 1, 1, 1, 0, 1, 1, 0, 0, 1, 0, 0, 1, 0, 0},  // UInt32
    {0, 1, 1, 1, 1, 1, 1, 1, 0, 1, 1, 1, 1, 1, 1},  // UInt64
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0},  // Float32
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 1, 0, 0},  // Float64
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 1, 1, 0},  // FloatExt
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0},  // Complex64
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0},  // Complex128
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0},  // ComplexExt
};

const BasicNumericInfo* FindBasicNumeric(int32_t code) {
  const int32_t base = NumBaseCode(code);
  if (base < 1 || base > kNumBasicNumerics) return nullptr;
  return &kBasicNumerics[base - 1];
}

const BasicNumericInfo& InfoOf(int32_t code) {
  const BasicNumericInfo* info = FindBasicNumeric(code);
  return info != nullptr ? *info : kBasicNumerics[0];
}

bool IsEnumCode(int32_t code) { return code >= 0x15 && code <= 0x17; }
bool IsUnitsCode(int32_t code) { return code >= 0x19 && code <= 0x1E; }
// Codes 1 to 30: the integers, floating and complex kinds with their modifiers.
bool IsBasicNumericCode(int32_t code) { return static_cast<uint8_t>(code - 1) <= 29; }

void ReportConversionRefused(const TDImp* dst, const TDImp& src) {
  ReportConversionCodes(kDiagnosticModule, __LINE__, dst, src);
}

const TDBasicNumericImp* AsBasicNumeric(const TDImp* type) {
  return type != nullptr && type->IsBasicNumeric() != 0 ? static_cast<const TDBasicNumericImp*>(type) : nullptr;
}

const TDNumericImp* AsNumeric(const TDImp* type) {
  return type != nullptr && type->IsNumeric() != 0 ? static_cast<const TDNumericImp*>(type) : nullptr;
}

bool SameItem(const uint8_t* a, const uint8_t* b) {
  if (a == nullptr || b == nullptr) return a == b;
  return a[0] == b[0] && std::memcmp(a + 1, b + 1, a[0]) == 0;
}

// Whether the items at the indices both lists have, from the last down to `lowest`, differ.
bool ItemsDiffer(const TDEnumImp& a, const TDEnumImp& b, uint32_t lowest) {
  const uint32_t common = std::min(a.GetNumStrings(), b.GetNumStrings());
  for (uint32_t i = common; i > lowest; --i) {
    if (!SameItem(a.GetEltPStr(i - 1), b.GetEltPStr(i - 1))) return true;
  }
  return false;
}

// The largest power of two that divides `size`; at least 1.
int32_t LowestSetBit(int32_t size) { return size > 0 ? (size & -size) : 1; }

TDImpPtr MakeEnumeratedUInt32(const char* name, const char* const* items, size_t count) {
  TDEnumImpPtr enumeration = MakeCounted<TDEnumImp>();
  if (!enumeration || !enumeration->HasList()) return TDImpPtr();
  if (enumeration->ReserveStringCount(static_cast<uint32_t>(count)) != kStatusNoError) return TDImpPtr();
  for (size_t i = 0; i < count; ++i) {
    const auto* text = reinterpret_cast<const uint8_t*>(items[i]);
    if (enumeration->AppendString(text, std::strlen(items[i])) != kStatusNoError) return TDImpPtr();
  }
  TDNameImpPtr label = TDNameImp::Make(reinterpret_cast<const uint8_t*>(name), std::strlen(name));
  if (!label) return TDImpPtr();
  return MakeCounted<TDUInt32Imp>(label, TDTypedefImpPtr(), enumeration);
}

constexpr const char* kRepresentationItems[] = {
    "Extended Precision", "Double Precision", "Single Precision", "Long",          "Word",
    "Byte",               "Unsigned Long",    "Unsigned Word",    "Unsigned Byte", "Complex Extended",
    "Complex Double",     "Complex Single",   "Quad",             "Unsigned Quad", "Fixed-Point",
};

constexpr const char* kEventTypeItems[] = {
    "Null", "Timeout", "App Instance Close", "App Instance Close?", "Cell Edit", "Cell Edit?", "Cursor Grab",
    "Cursor Grab?", "Cursor Move", "Cursor Release", "Data Change", "Direction Change", "Display State Change",
    "Drag Ended", "Drag Enter", "Drag Leave", "Drag Over", "Drag Source Update", "Drag Starting",
    "Drag Starting?", "Drop", "Exec State Change", "Key Down", "Key Down?", "Key Repeat", "Key Repeat?", "Key Up",
    "Listbox Double Click", "Menu Activation?", "Menu Selection (App)", "Menu Selection? (App)",
    "Menu Selection (User)", "Mouse Down", "Mouse Down?", "Mouse Enter", "Mouse Leave", "Mouse Move", "Mouse Up",
    "QX Security User Change (App)", "Pane Size", "Panel Close", "Panel Close?", "Panel Resize",
    "Plot Attribute Change", "Scale Range Change", "Shortcut Menu Activation?", "Shortcut Menu Selection (App)",
    "Shortcut Menu Selection? (App)", "Shortcut Menu Selection (User)", "Tree Double Click", "Tree Drag",
    "Tree Drag?", "Tree Drop", "Tree Drop?", "Tree Item Close", "Tree Item Close?", "Tree Item Open",
    "Tree Item Open?", "Value Change",
};
static_assert(std::size(kEventTypeItems) == 59);

// An event enumeration of this many items, converted into the "Event Type" enumeration, is
// mapped by the host's procedure rather than by name.
constexpr uint32_t kEventEnumMinItems = 12;
constexpr uint32_t kEventEnumMaxItems = 22;
constexpr uint32_t kEventEnumValueLimit = 23;

// Streams older than this version carry no flag byte after a number's members.

template <TypeCode kCode>
const TDR& SharedDefault() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDBasicNumericKindImp<kCode>>()); });
}

template <TypeCode kCode>
class BasicNumericFactory final : public TDTypeFactory {
 public:
  TDImpPtr CreateTD(TDDataReader* reader, uint16_t typeCode, int32_t* status) const override {
    int32_t result = kStatusNoError;
    TDImpPtr type = Create(reader, typeCode, &result);
    if (status != nullptr) *status = result;
    return type;
  }

  TDImpPtr CreateUnflattenHandler(int16_t) const override {
    return InfoOf(static_cast<int32_t>(kCode)).defaultGetter().GetImpPtr();
  }

 private:
  // An empty descriptor; with a reader, the members the code announces and the flag byte are
  // read into it.
  static TDImpPtr Create(TDDataReader* reader, uint16_t typeCode, int32_t* status) {
    auto type = MakeCounted<TDBasicNumericKindImp<kCode>>();
    if (!type) {
      *status = kStatusOutOfMemory;
      return TDImpPtr();
    }
    if (reader == nullptr) return TDImpPtr(type);
    if constexpr (ModifierOf(kCode) == NumericModifier::kEnum) {
      if (IsEnumCode(typeCode)) {
        TDEnumImpPtr enumeration = MakeCounted<TDEnumImp>();
        *status = enumeration ? enumeration->UnFlatten(reader) : kStatusOutOfMemory;
        if (*status != kStatusNoError) return TDImpPtr();
        type->SetEnumImpPtr(enumeration);
      }
    }
    if constexpr (ModifierOf(kCode) == NumericModifier::kUnits) {
      if (IsUnitsCode(typeCode)) {
        TDUnitsImpPtr units = MakeCounted<TDUnitsImp>();
        *status = units ? units->UnFlatten(reader) : kStatusOutOfMemory;
        if (*status != kStatusNoError) return TDImpPtr();
        type->SetUnits(units);
      }
    }
    if (!VersionShouldMutate(reader->GetVersion(), kNumFlagsVersion)) {
      uint8_t numFlags = 0;
      *status = reader->ReadU8(&numFlags);
      if (*status != kStatusNoError) return TDImpPtr();
      type->SetNumFlags(numFlags);
    }
    return TDImpPtr(type);
  }
};

BasicNumericFactory<TypeCode::Int8> gInt8Factory;
BasicNumericFactory<TypeCode::Int16> gInt16Factory;
BasicNumericFactory<TypeCode::Int32> gInt32Factory;
BasicNumericFactory<TypeCode::Int64> gInt64Factory;
BasicNumericFactory<TypeCode::UInt8> gUInt8Factory;
BasicNumericFactory<TypeCode::UInt16> gUInt16Factory;
BasicNumericFactory<TypeCode::UInt32> gUInt32Factory;
BasicNumericFactory<TypeCode::UInt64> gUInt64Factory;
BasicNumericFactory<TypeCode::Float32> gFloat32Factory;
BasicNumericFactory<TypeCode::Float64> gFloat64Factory;
BasicNumericFactory<TypeCode::FloatExt> gFloatExtFactory;
BasicNumericFactory<TypeCode::Complex64> gComplex64Factory;
BasicNumericFactory<TypeCode::Complex128> gComplex128Factory;
BasicNumericFactory<TypeCode::ComplexExt> gComplexExtFactory;

// Announced as the library loads; the service registers them in this order at start. A kind
// that shows a member in its code is registered for both codes.
const bool gAnnounced = [] {
  TDTypeFactory* const factories[kNumBasicNumerics] = {
      &gInt8Factory,    &gInt16Factory,   &gInt32Factory,    &gInt64Factory,     &gUInt8Factory,
      &gUInt16Factory,  &gUInt32Factory,  &gUInt64Factory,   &gFloat32Factory,   &gFloat64Factory,
      &gFloatExtFactory, &gComplex64Factory, &gComplex128Factory, &gComplexExtFactory,
  };
  int32_t order = 13;
  for (int32_t i = 0; i < kNumBasicNumerics; ++i) {
    const TypeCode code = kBasicNumerics[i].code;
    const auto base = static_cast<uint16_t>(code);
    AnnounceTypeFactory(order++, base, factories[i]);
    RegisterDefaultTypeGetter(base, kBasicNumerics[i].defaultGetter);
    // The default of a code with the modifier is the plain kind's.
    if (ModifierOf(code) != NumericModifier::kNone) {
      AnnounceTypeFactory(order++, base | 0x10, factories[i]);
      RegisterDefaultTypeGetter(base | 0x10, kBasicNumerics[i].defaultGetter);
    }
  }
  return true;
}();

TDTraverseValue VisitForEnum(const TDR& type, void*) { return type.HasEnum() != 0 ? 1 : kTraverseContinue; }

}  // namespace

// --- TDNumericImp --------------------------------------------------------------------------------

bool TDNumericImp::ConversionIsLossless(const TDImp* dst) const {
  const TDNumericImp* to = AsNumeric(dst);
  if (to == nullptr) return false;
  if (IsComplex() != 0 || to->IsComplex() != 0) {
    return IsComplex() != 0 && to->IsComplex() != 0 && WordLength() <= to->WordLength();
  }
  if (IsFloat() == 0 && to->IsFloat() == 0) {
    return RangeMin() >= to->RangeMin() && RangeMax() <= to->RangeMax() && Delta() >= to->Delta();
  }
  return IsFloat() != 0 && to->IsFloat() != 0 && WordLength() <= to->WordLength();
}

int32_t TDNumericImp::SetUnits(const TDUnitsImpPtr&) { return kStatusNullHandle; }

int32_t TDNumericImp::RemoveUnits() { return kStatusNullHandle; }

int32_t TDNumericImp::CopyAttributes(const TDImp* src, uint32_t mask) {
  if (src == nullptr || src->IsNumeric() == 0) return 0;
  // Members of a writable descriptor stay private: what comes from `src` is copied.
  if ((mask & 0x1) != 0) {
    if (const TDNameImpPtr& name = src->GetNameImpPtr()) {
      if (TDNameImpPtr copy = name->CloneOrCheckOut()) SetNameImpPtr(copy);
    }
    if ((src->Flags() & kTDFlagNoSelect) != 0) {
      SetFlagBits(kTDFlagNoSelect);
      ClearHashValid();
    }
  }
  if ((mask & 0x2) != 0) {
    if (const TDTypedefImpPtr& link = src->GetTypedefImpPtr()) {
      if (TDTypedefImpPtr copy = link->CloneOrCheckOut()) SetTypedefImpPtr(copy);
    }
    return 1;
  }
  return static_cast<int32_t>(mask & 0x1);
}

// --- TDBasicNumericImp: identity -----------------------------------------------------------------

int32_t TDBasicNumericImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(TDImp::ComputeHashValue());
  if (enum_) hash += static_cast<uint32_t>(enum_->GetHashValue());
  if (units_) hash += static_cast<uint32_t>(units_->GetHashValue());
  hash += numFlags_;
  return static_cast<int32_t>(hash);
}

int32_t TDBasicNumericImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDImp::IsSameAs(other) == 0) return 0;
  const TDBasicNumericImp* that = AsBasicNumeric(&other);
  if (that == nullptr) return 0;
  if (HasEnum() != that->HasEnum() || HasUnits() != that->HasUnits()) return 0;
  if (enum_ && enum_->IsEqual(*that->enum_) == 0) return 0;
  if (units_ && units_->IsEqual(*that->units_) == 0) return 0;
  return numFlags_ == that->numFlags_ ? 1 : 0;
}

int32_t TDBasicNumericImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCloneOrCheckOut(target);
  if (status != kStatusNoError) return status;
  auto& copy = static_cast<TDBasicNumericImp&>(*target);
  copy.numFlags_ = numFlags_;
  copy.enum_.Free();
  copy.units_.Free();
  copy.ClearHashValid();
  if (enum_) {
    copy.enum_ = enum_->CloneOrCheckOut();
    if (!copy.enum_) return kStatusOutOfMemory;
  }
  if (units_) {
    copy.units_ = units_->CloneOrCheckOut();
    if (!copy.units_) return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDBasicNumericImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCheckIn(target);
  if (status != kStatusNoError) return status;
  auto& copy = static_cast<TDBasicNumericImp&>(*target);
  copy.numFlags_ = numFlags_;
  copy.ClearHashValid();
  if (enum_) {
    copy.enum_ = enum_->CheckIn();
    if (!copy.enum_) return kStatusOutOfMemory;
  }
  if (units_) {
    copy.units_ = units_->CheckIn();
    if (!copy.units_) return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDBasicNumericImp::CompareForSorting(const TDImp* other) const {
  const TDBasicNumericImp* that = AsBasicNumeric(other);
  if (that == nullptr) return 0;
  int32_t difference = HasEnum() - that->HasEnum();
  if (difference != 0) return difference;
  if (enum_ && that->enum_) {
    difference = enum_->CompareForSorting(*that->enum_);
    if (difference != 0) return difference;
  }
  difference = HasUnits() - that->HasUnits();
  if (difference != 0) return difference;
  if (units_ && that->units_) {
    difference = units_->CompareForSorting(*that->units_);
    if (difference != 0) return difference;
  }
  // The flag byte is part of identity, so two different types never sort as the same.
  return static_cast<int32_t>(numFlags_) - static_cast<int32_t>(that->numFlags_);
}

void TDBasicNumericImp::SetEnumImpPtr(const TDEnumImpPtr& enumeration) {
  enum_ = enumeration;
  ClearHashValid();
}

void TDBasicNumericImp::SetNumFlags(uint8_t numFlags) {
  numFlags_ = numFlags;
  ClearHashValid();
}

int32_t TDBasicNumericImp::SetUnits(const TDUnitsImpPtr& units) {
  units_ = units;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDBasicNumericImp::RemoveUnits() {
  units_.Free();
  ClearHashValid();
  return kStatusNoError;
}

// --- TDBasicNumericImp: kind constants -----------------------------------------------------------

int32_t TDBasicNumericImp::IsInteger() const { return NumClass(GetTypeCode()) == kNumClassInteger ? 1 : 0; }

int32_t TDBasicNumericImp::IsFloat() const {
  const int32_t numClass = NumClass(GetTypeCode());
  return numClass == kNumClassReal || numClass == kNumClassComplex ? 1 : 0;
}

int32_t TDBasicNumericImp::IsComplex() const { return NumClass(GetTypeCode()) == kNumClassComplex ? 1 : 0; }

int32_t TDBasicNumericImp::IsFractional() const { return NumClass(GetTypeCode()) == kNumClassReal ? 1 : 0; }

int32_t TDBasicNumericImp::IsSigned() const { return InfoOf(GetTypeCode()).isSigned ? 1 : 0; }

uint32_t TDBasicNumericImp::WordLength() const { return InfoOf(GetTypeCode()).wordLength; }

int16_t TDBasicNumericImp::IntegerWordLength() const {
  return IsInteger() != 0 ? static_cast<int16_t>(WordLength()) : int16_t{0};
}

uint32_t TDBasicNumericImp::RealPartWordLength() const { return InfoOf(GetTypeCode()).realPartWordLength; }

double TDBasicNumericImp::RangeMinF64() const { return InfoOf(GetTypeCode()).rangeMin; }

double TDBasicNumericImp::RangeMaxF64() const { return InfoOf(GetTypeCode()).rangeMax; }

vellum::FXP TDBasicNumericImp::RangeMin() const {
  if (IsInteger() == 0) return vellum::FXP(RangeMinF64());
  const int wl = static_cast<int>(WordLength());
  if (IsSigned() == 0) return vellum::FXP(uint64_t{0}, wl, wl, false);
  return vellum::FXP(vellum::FXP::smin(wl), wl, wl);
}

vellum::FXP TDBasicNumericImp::RangeMax() const {
  if (IsInteger() == 0) return vellum::FXP(RangeMaxF64());
  const int wl = static_cast<int>(WordLength());
  if (IsSigned() == 0) return vellum::FXP(vellum::FXP::umax(wl), wl, wl, false);
  return vellum::FXP(vellum::FXP::smax(wl), wl, wl);
}

vellum::FXP TDBasicNumericImp::Delta() const {
  return IsInteger() != 0 ? vellum::FXPOne_() : vellum::FXPZero_();
}

int16_t TDBasicNumericImp::MaxBitPos() const {
  return IsFloat() != 0 ? int16_t{0} : static_cast<int16_t>(WordLength() - 1);
}

int32_t TDBasicNumericImp::DecimalDigitsForAutoPrecision() const {
  return DecimalDigitsForAutoPrecisionOfCode(GetTypeCode());
}

// --- TDBasicNumericImp: layout and data ----------------------------------------------------------

int32_t TDBasicNumericImp::DataSizeCore(ITargetPlatformAlignment* platform) const {
  const int32_t code = GetTypeCode();
  return platform != nullptr ? platform->NumericSize(code) : NumSize(code);
}

int32_t TDBasicNumericImp::GetAlignment(ITargetPlatformAlignment* platform) const {
  // A complex value is two of its component, and aligns like one.
  int32_t code = GetTypeCode();
  if (IsComplex() != 0) code -= 3;
  return LowestSetBit(platform != nullptr ? platform->NumericSize(code) : NumSize(code));
}

void TDBasicNumericImp::InitializeData(void* data) const {
  if (data != nullptr) ClearMem(data, static_cast<size_t>(NumSize(GetTypeCode())));
}

void TDBasicNumericImp::CopyOneValue(const void* src, void* dst) const {
  MoveBlock(src, dst, static_cast<size_t>(NumSize(GetTypeCode())));
}

int32_t TDBasicNumericImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  CopyOneValue(src, dst);
  return kStatusNoError;
}

int32_t TDBasicNumericImp::ConvertToNumeric(const void* data, const TDImp* dst, void* dstData) const {
  if (AsBasicNumeric(dst) == nullptr) return 0;
  return ConvertNum(GetTypeCode(), data, dst->GetTypeCode(), dstData) == kStatusNoError ? 1 : 0;
}

int32_t TDBasicNumericImp::ConvertFromNumeric(const TDImp* src, const void* srcData, void* data) const {
  if (AsBasicNumeric(src) == nullptr) return 0;
  return ConvertNum(src->GetTypeCode(), srcData, GetTypeCode(), data) == kStatusNoError ? 1 : 0;
}

int32_t TDBasicNumericImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  const TDNumericImp* to = AsNumeric(dst);
  if (to == nullptr || src == nullptr || dstData == nullptr) {
    ReportConversionRefused(dst, *this);
    return kStatusBadArgument;
  }
  const int32_t srcCode = GetTypeCode();
  const int32_t dstCode = dst->GetTypeCode();
  const int32_t srcBase = NumBaseCode(srcCode);
  const int32_t dstBase = NumBaseCode(dstCode);
  const TDBasicNumericImp* basicDst = AsBasicNumeric(dst);

  if (IsEnumCode(dstCode) && basicDst != nullptr && basicDst->enum_) {
    const TDEnumImp& dstEnum = *basicDst->enum_;
    // Item 0 is not compared: enumerations that differ only there still map by index.
    if (IsEnumCode(srcCode) && enum_ && ItemsDiffer(*enum_, dstEnum, 1)) {
      uint32_t value = 0;
      ConvertNum(srcBase, src, static_cast<int32_t>(TypeCode::UInt32), &value);
      const uint32_t srcCount = enum_->GetNumStrings();
      const uint32_t dstCount = dstEnum.GetNumStrings();
      uint32_t result = 0;
      if (value < srcCount) {
        bool mapped = false;
        if (srcCount >= kEventEnumMinItems && srcCount <= kEventEnumMaxItems && value < kEventEnumValueLimit) {
          const EventToEventTypeEnumProc proc = GetEventToEventTypeEnumProc();
          const TDR& eventType = GetEventTypeTD();
          if (proc != nullptr && eventType && eventType.GetImp()->CmpTDCommon(dst, kCmpFlagSecondPass) == 0) {
            proc(value, &result);
            mapped = true;
          }
        }
        if (!mapped) {
          // By name; an item the destination lacks keeps its index while that is in range.
          result = value < dstCount ? value : 0;
          const uint8_t* item = enum_->GetEltPStr(value);
          for (uint32_t i = 0; i < dstCount; ++i) {
            if (SameItem(item, dstEnum.GetEltPStr(i))) {
              result = i;
              break;
            }
          }
        }
      }
      ConvertNum(static_cast<int32_t>(TypeCode::UInt32), &result, dstBase, dstData);
      return kStatusNoError;
    }
    // Anything else going into an enumeration is clamped to its items.
    const int32_t count = static_cast<int32_t>(std::min<uint32_t>(dstEnum.GetNumStrings(), 0x7FFFFFFF));
    int32_t value = 0;
    if (IsSigned() != 0) {
      int16_t narrow = 0;
      ConvertNum(srcBase, src, static_cast<int32_t>(TypeCode::Int16), &narrow);
      value = narrow;
    } else {
      uint16_t narrow = 0;
      ConvertNum(srcBase, src, static_cast<int32_t>(TypeCode::UInt16), &narrow);
      value = narrow;
    }
    if (value < 0 || count == 0) value = 0;
    if (value >= count && count > 0) value = count - 1;
    ConvertNum(static_cast<int32_t>(TypeCode::Int32), &value, dstBase, dstData);
    return kStatusNoError;
  }

  if (basicDst != nullptr && srcBase == dstBase) {
    CopyOneValue(src, dstData);
    return kStatusNoError;
  }
  if (ConvertToNumeric(src, dst, dstData) == 0 && to->ConvertFromNumeric(this, src, dstData) == 0) {
    ReportConversionRefused(dst, *this);
    return kStatusBadArgument;
  }
  return kStatusNoError;
}

int32_t TDBasicNumericImp::CompareData(const void* a, const void* b) const {
  if (a == nullptr || b == nullptr) return 0;
  auto order = [](auto x, auto y) { return x < y ? -1 : (y < x ? 1 : 0); };
  auto load = [](const void* p, auto value) {
    std::memcpy(&value, p, sizeof value);
    return value;
  };
  const auto code = static_cast<TypeCode>(BaseCode());
  switch (code) {
    case TypeCode::Int8: return load(a, int8_t{}) - load(b, int8_t{});
    case TypeCode::UInt8: return load(a, uint8_t{}) - load(b, uint8_t{});
    case TypeCode::Int16: return load(a, int16_t{}) - load(b, int16_t{});
    case TypeCode::UInt16: return load(a, uint16_t{}) - load(b, uint16_t{});
    case TypeCode::Int32: return order(load(a, int32_t{}), load(b, int32_t{}));
    case TypeCode::Int64: return order(load(a, int64_t{}), load(b, int64_t{}));
    case TypeCode::UInt32: return order(load(a, uint32_t{}), load(b, uint32_t{}));
    case TypeCode::UInt64: return order(load(a, uint64_t{}), load(b, uint64_t{}));
    case TypeCode::Float32:
    case TypeCode::Float64:
    case TypeCode::FloatExt: {
      // NaN orders by class: after every other value, equal to another NaN. Only the class of a
      // NaN (3) decides, so the common case of two numbers asks for no classes.
      auto byClass = [&] {
        return ClassifyFloatNumber(static_cast<int32_t>(code), a) - ClassifyFloatNumber(static_cast<int32_t>(code), b);
      };
      if (code == TypeCode::Float32) {
        const float x = load(a, float{});
        const float y = load(b, float{});
        return std::isnan(x) || std::isnan(y) ? byClass() : order(x, y);
      }
      if (code == TypeCode::Float64) {
        const double x = load(a, double{});
        const double y = load(b, double{});
        return std::isnan(x) || std::isnan(y) ? byClass() : order(x, y);
      }
      const int32_t classA = ClassifyFloatNumber(static_cast<int32_t>(code), a);
      const int32_t classB = ClassifyFloatNumber(static_cast<int32_t>(code), b);
      if (classA == kFloatClassNaN || classB == kFloatClassNaN) return classA - classB;
      return order(ExtendedToLongDouble(static_cast<const uint8_t*>(a)),
                   ExtendedToLongDouble(static_cast<const uint8_t*>(b)));
    }
    case TypeCode::Complex64:
    case TypeCode::Complex128:
    case TypeCode::ComplexExt:
      return BlockCmp(a, b, static_cast<size_t>(NumSize(static_cast<int32_t>(code))));
    default:
      return 0;
  }
}

int32_t TDBasicNumericImp::MSDecimalDigitPos(const void* data) const {
  if (data == nullptr) return 0;
  const int32_t base = BaseCode();
  long double value = 0;
  if (base == static_cast<int32_t>(TypeCode::FloatExt) || base == static_cast<int32_t>(TypeCode::ComplexExt)) {
    // Read in full: an extended value may lie beyond the range of a double.
    value = ExtendedToLongDouble(static_cast<const uint8_t*>(data));
  } else {
    double narrow = 0;
    ConvertNum(base, data, static_cast<int32_t>(TypeCode::Float64), &narrow);
    value = narrow;
  }
  if (value == 0) return 0;
  if (std::isfinite(value)) return static_cast<int32_t>(std::floor(std::log10(std::fabs(value))));
  return base == static_cast<int32_t>(TypeCode::FloatExt) ? 7 : 3;
}

// --- TDBasicNumericImp: compatibility ------------------------------------------------------------

int32_t TDBasicNumericImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  const int32_t dstCode = GetTypeCode();
  const int32_t srcCode = source->GetTypeCode();
  const TDBasicNumericImp* src = AsBasicNumeric(source);
  if (!IsBasicNumericCode(srcCode) || src == nullptr) {
    if ((flags & kCmpFlagLooseNumbers) != 0 && srcCode == static_cast<int32_t>(TypeCode::Refnum) &&
        (dstCode == static_cast<int32_t>(TypeCode::UInt32) || dstCode == static_cast<int32_t>(TypeCode::UInt64))) {
      return 0;
    }
    if (source->IsNumeric() == 0) return kCmpIncompatible;
    // Fixed point knows how basic numbers go into it; ask it the other way round.
    return source->CmpTDCommon(this, flags);
  }

  int32_t result = 0;
  // Units.
  if (!IsUnitsCode(dstCode)) {
    if (IsUnitsCode(srcCode) && src->units_->GetNumUnits() > 0 && (flags & kCmpFlagIgnoreMissingUnits) == 0) {
      result |= kCmpUnitsDiffer;
    }
  } else if (!((flags & kCmpFlagPolyUnitsMatchAny) != 0 && units_->HasPolyUnits() != 0)) {
    if (IsUnitsCode(srcCode)) {
      if (units_->IsEqual(*src->units_) == 0) result |= kCmpUnitsDiffer;
    } else if (units_->GetNumUnits() > 0 && (flags & kCmpFlagIgnoreMissingUnits) == 0) {
      result |= kCmpUnitsDiffer;
    }
  }

  // Enumerations.
  const bool reportLoss = (flags & kCmpFlagReportLoss) != 0;
  if (!IsEnumCode(dstCode)) {
    if (IsEnumCode(srcCode) && (flags & (kCmpFlagLooseNumbers | kCmpFlagEnumIntoPlain)) == 0) {
      result |= kCmpNeedsConversion;
    }
  } else if (!IsEnumCode(srcCode)) {
    result |= kCmpNeedsConversion;
    if (reportLoss) result |= kCmpMayLoseInformation;
  } else {
    if (!enum_ || !src->enum_) return kCmpEnumDiffers;
    if (ItemsDiffer(*enum_, *src->enum_, 0)) {
      result |= kCmpEnumDiffers;
    } else if (enum_->GetNumStrings() != src->enum_->GetNumStrings()) {
      result |= kCmpNeedsConversion;
      if (reportLoss && enum_->GetNumStrings() < src->enum_->GetNumStrings()) result |= kCmpMayLoseInformation;
    }
  }

  // Sizes.
  if (NumSize(dstCode) != NumSize(srcCode)) result |= kCmpNeedsConversion;
  if (IsIntPtrT() != src->IsIntPtrT()) result |= kCmpNeedsConversion;

  // Kinds.
  const int32_t dstBase = NumBaseCode(dstCode);
  const int32_t srcBase = NumBaseCode(srcCode);
  if (dstBase == srcBase) return result;
  const bool floating = NumClass(dstBase) >= kNumClassReal || NumClass(srcBase) >= kNumClassReal;
  if (floating) {
    result |= kCmpNeedsConversion;
  } else {
    const uint8_t* rank = KoNumPrec();
    result |= rank[dstBase] == rank[srcBase] ? kCmpMinor : kCmpNeedsConversion;
  }
  if (reportLoss && dstBase < 15 && srcBase < 15 && kLossy[srcBase][dstBase] != 0) {
    result |= kCmpMayLoseInformation;
  }
  return result;
}

// --- TDBasicNumericImp: attributes and dump ------------------------------------------------------

int32_t TDBasicNumericImp::CopyAttributes(const TDImp* src, uint32_t mask) {
  const TDBasicNumericImp* from = AsBasicNumeric(src);
  const bool takeMembers = from != nullptr && (mask & 0x1) != 0;
  if (takeMembers) {
    // Members of a writable descriptor stay private: they are copied, never shared.
    if (from->enum_) {
      if (TDEnumImpPtr copy = from->enum_->CloneOrCheckOut()) SetEnumImpPtr(copy);
    }
    if (from->units_) {
      if (TDUnitsImpPtr copy = from->units_->CloneOrCheckOut()) SetUnits(copy);
    }
  }
  const int32_t base = TDNumericImp::CopyAttributes(src, mask);
  return takeMembers || base != 0 ? 1 : 0;
}

void TDBasicNumericImp::PrintDebugStr(const uint8_t* prefix) const {
  const std::string text = PrefixText(prefix);
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "\ttype = " + InfoOf(GetTypeCode()).debugName);
  const std::string inner = text + "\t";
  TDImp::PrintDebugStr(reinterpret_cast<const uint8_t*>(inner.c_str()));
  if (enum_) enum_->PrintDebugStr(prefix);
  if (units_) units_->PrintDebugStr(prefix);
  char flags[8];
  std::snprintf(flags, sizeof flags, "0x%02x", static_cast<unsigned>(numFlags_));
  DebugReport(kDiagnosticModule, __LINE__, 0, std::string(" numFlags= ") + flags);
}

// --- free functions of the family ----------------------------------------------------------------

int32_t DecimalDigitsForAutoPrecisionOfCode(int32_t code) {
  const BasicNumericInfo* info = FindBasicNumeric(code);
  if (info == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Bad tc");
    return 0;
  }
  if (!info->autoPrecisionSupported) DebugReport(kDiagnosticModule, __LINE__, 3, "Not yet supported");
  return info->autoPrecisionDigits;
}

const TDR& GetEventTypeTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    return MakeEnumeratedUInt32("Event Type", kEventTypeItems, std::size(kEventTypeItems));
  });
}

const uint8_t* KoNumPrec() {
  static const auto ranks = [] {
    std::array<uint8_t, 32> table{};
    for (const BasicNumericInfo& info : kBasicNumerics) {
      const auto code = static_cast<size_t>(info.code);
      table[code] = info.precisionRank;
      if (ModifierOf(info.code) != NumericModifier::kNone) table[code | 0x10] = info.precisionRank;
    }
    return table;
  }();
  return ranks.data();
}

const TDR& GetiB() { return SharedDefault<TypeCode::Int8>(); }
const TDR& GetiW() { return SharedDefault<TypeCode::Int16>(); }
const TDR& GetiL() { return SharedDefault<TypeCode::Int32>(); }
const TDR& GetiQ() { return SharedDefault<TypeCode::Int64>(); }
const TDR& GetuB() { return SharedDefault<TypeCode::UInt8>(); }
const TDR& GetuW() { return SharedDefault<TypeCode::UInt16>(); }
const TDR& GetuL() { return SharedDefault<TypeCode::UInt32>(); }
const TDR& GetuQ() { return SharedDefault<TypeCode::UInt64>(); }
const TDR& GetfS() { return SharedDefault<TypeCode::Float32>(); }
const TDR& GetfD() { return SharedDefault<TypeCode::Float64>(); }
const TDR& GetfX() { return SharedDefault<TypeCode::FloatExt>(); }
const TDR& GetcS() { return SharedDefault<TypeCode::Complex64>(); }
const TDR& GetcD() { return SharedDefault<TypeCode::Complex128>(); }
const TDR& GetcX() { return SharedDefault<TypeCode::ComplexExt>(); }

int32_t ConvertNumTDR(const TDR& src, const void* srcData, const TDR& dst, void* dstData, int32_t flags) {
  if (srcData == nullptr || dstData == nullptr) return kStatusBadArgument;
  if (!src || !dst) return kStatusNullHandle;
  if (src.IsNumeric() == 0) {
    ReportConversionRefused(dst.GetImp(), *src.GetImp());
    return kStatusBadArgument;
  }
  return src.GetImp()->CopyDataConvertCore(dst.GetImp(), srcData, dstData, flags);
}

int32_t EnumConflict(const TDR& a, const TDR& b) {
  const TDBasicNumericImp* first = AsBasicNumeric(a.GetImp());
  const TDBasicNumericImp* second = AsBasicNumeric(b.GetImp());
  if (first == nullptr || second == nullptr || !first->GetEnumImpPtr() || !second->GetEnumImpPtr()) return 1;
  return ItemsDiffer(*first->GetEnumImpPtr(), *second->GetEnumImpPtr(), 0) ? 1 : 0;
}

bool TDContainsEnum(const TDR& type) { return type.TraverseTDR(&VisitForEnum, nullptr, nullptr) != 0; }

// --- handles -------------------------------------------------------------------------------------

bool NumericKind::Admit(const TDImp& type) { return type.IsNumeric() != 0; }
bool BasicNumericKind::Admit(const TDImp& type) { return type.IsBasicNumeric() != 0; }

template <TypeCode kCode>
bool NumericCodeKind<kCode>::Admit(const TDImp& type) {
  const int32_t code = type.GetTypeCode();
  const auto base = static_cast<int32_t>(kCode);
  return code == base || (ModifierOf(kCode) != NumericModifier::kNone && code == (base | 0x10));
}

template <TypeCode kCode>
TDImpPtr NumericCodeKind<kCode>::New(const uint8_t* name) {
  return vellum::detail::NewBasicNumeric(kCode, name, TDTypedefImpPtr(), TDEnumImpPtr(), TDUnitsImpPtr(), false);
}

template struct NumericCodeKind<TypeCode::Int8>;
template struct NumericCodeKind<TypeCode::Int16>;
template struct NumericCodeKind<TypeCode::Int32>;
template struct NumericCodeKind<TypeCode::Int64>;
template struct NumericCodeKind<TypeCode::UInt8>;
template struct NumericCodeKind<TypeCode::UInt16>;
template struct NumericCodeKind<TypeCode::UInt32>;
template struct NumericCodeKind<TypeCode::UInt64>;
template struct NumericCodeKind<TypeCode::Float32>;
template struct NumericCodeKind<TypeCode::Float64>;
template struct NumericCodeKind<TypeCode::FloatExt>;
template struct NumericCodeKind<TypeCode::Complex64>;
template struct NumericCodeKind<TypeCode::Complex128>;
template struct NumericCodeKind<TypeCode::ComplexExt>;

namespace {

template <TypeCode kCode>
TDImpPtr NewKind(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) {
  return TDImpPtr(MakeCounted<TDBasicNumericKindImp<kCode>>(name, typedefLink));
}

TDImpPtr NewOfCode(TypeCode code, const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) {
  switch (code) {
    case TypeCode::Int8: return NewKind<TypeCode::Int8>(name, typedefLink);
    case TypeCode::Int16: return NewKind<TypeCode::Int16>(name, typedefLink);
    case TypeCode::Int32: return NewKind<TypeCode::Int32>(name, typedefLink);
    case TypeCode::Int64: return NewKind<TypeCode::Int64>(name, typedefLink);
    case TypeCode::UInt8: return NewKind<TypeCode::UInt8>(name, typedefLink);
    case TypeCode::UInt16: return NewKind<TypeCode::UInt16>(name, typedefLink);
    case TypeCode::UInt32: return NewKind<TypeCode::UInt32>(name, typedefLink);
    case TypeCode::UInt64: return NewKind<TypeCode::UInt64>(name, typedefLink);
    case TypeCode::Float32: return NewKind<TypeCode::Float32>(name, typedefLink);
    case TypeCode::Float64: return NewKind<TypeCode::Float64>(name, typedefLink);
    case TypeCode::FloatExt: return NewKind<TypeCode::FloatExt>(name, typedefLink);
    case TypeCode::Complex64: return NewKind<TypeCode::Complex64>(name, typedefLink);
    case TypeCode::Complex128: return NewKind<TypeCode::Complex128>(name, typedefLink);
    case TypeCode::ComplexExt: return NewKind<TypeCode::ComplexExt>(name, typedefLink);
    default: return TDImpPtr();
  }
}

TDNumericImp* WritableNumeric(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsNumeric() == 0 || imp->IsReadOnlyTD() != 0) return nullptr;
  return static_cast<TDNumericImp*>(imp);
}

TDBasicNumericImp* WritableBasicNumeric(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsBasicNumeric() == 0 || imp->IsReadOnlyTD() != 0) return nullptr;
  return static_cast<TDBasicNumericImp*>(imp);
}

}  // namespace

TDImpPtr vellum::detail::NewBasicNumeric(TypeCode code, const uint8_t* name, const TDTypedefImpPtr& typedefLink,
                                         const TDEnumImpPtr& enumeration, const TDUnitsImpPtr& units,
                                         bool copyMembers) {
  TDNameImpPtr label;
  if (name != nullptr && name[0] != 0) {
    label = TDNameImp::Make(name, std::strlen(reinterpret_cast<const char*>(name)));
    if (!label) return TDImpPtr();
  }
  TDTypedefImpPtr link = typedefLink;
  TDEnumImpPtr enumCopy = enumeration;
  TDUnitsImpPtr unitsCopy = units;
  if (copyMembers) {
    if (link) link = typedefLink->CloneOrCheckOut();
    if (enumCopy) enumCopy = enumeration->CloneOrCheckOut();
    if (unitsCopy) unitsCopy = units->CloneOrCheckOut();
    if (static_cast<bool>(link) != static_cast<bool>(typedefLink) ||
        static_cast<bool>(enumCopy) != static_cast<bool>(enumeration) ||
        static_cast<bool>(unitsCopy) != static_cast<bool>(units)) {
      return TDImpPtr();
    }
  }
  TDImpPtr fresh = NewOfCode(code, label, link);
  if (!fresh) return TDImpPtr();
  auto* basic = static_cast<TDBasicNumericImp*>(fresh.get());
  if (enumCopy) basic->SetEnumImpPtr(enumCopy);
  if (unitsCopy) basic->SetUnits(unitsCopy);
  return fresh;
}

DataOrder TDNumericImp::OrderData(const void* a, const void* b, const DataOrderOptions& options) const {
  return options.rawNumbers != 0 ? OrderBytes(a, b) : DataOrder{CompareData(a, b)};
}

int32_t CompareNumericData(const TDImp* type, const void* a, const void* b) {
  const TDNumericImp* numeric = AsNumeric(type);
  return numeric != nullptr ? numeric->CompareData(a, b) : 0;
}

namespace vellum::numeric {

namespace {
const TDNumericImp* Numeric(const TD& type) { return AsNumeric(type.GetImp()); }
}  // namespace

int32_t IsSigned(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->IsSigned() : 0; }
int32_t IsFractional(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->IsFractional() : 0; }
int32_t IsIntPtrT(const TD& type) {
  const TDBasicNumericImp* basic = AsBasicNumeric(type.GetImp());
  return basic != nullptr ? basic->IsIntPtrT() : 0;
}
uint32_t WordLength(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->WordLength() : 0; }
int16_t IntegerWordLength(const TD& type) {
  return Numeric(type) != nullptr ? Numeric(type)->IntegerWordLength() : int16_t{0};
}
uint32_t RealPartWordLength(const TD& type) {
  return Numeric(type) != nullptr ? Numeric(type)->RealPartWordLength() : 0;
}
int16_t MinBitPos(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->MinBitPos() : int16_t{0}; }
int16_t MaxBitPos(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->MaxBitPos() : int16_t{0}; }
vellum::FXP RangeMin(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->RangeMin() : vellum::FXP(); }
vellum::FXP RangeMax(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->RangeMax() : vellum::FXP(); }
vellum::FXP Delta(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->Delta() : vellum::FXP(); }

int32_t RangeF64(const TD& type, double* min, double* max) {
  const TDNumericImp* numeric = Numeric(type);
  if (numeric == nullptr) return kStatusNullHandle;
  if (min != nullptr) *min = numeric->RangeMinF64();
  if (max != nullptr) *max = numeric->RangeMaxF64();
  return kStatusNoError;
}

void InitializeData(const TD& type, void* data) {
  if (Numeric(type) != nullptr) Numeric(type)->InitializeData(data);
}

int32_t CompareData(const TD& type, const void* a, const void* b) { return CompareNumericData(type.GetImp(), a, b); }

int32_t ConvertFromNumeric(const TD& type, const TD& src, const void* srcData, void* dstData) {
  if (Numeric(type) == nullptr || Numeric(src) == nullptr || srcData == nullptr || dstData == nullptr) return 0;
  return Numeric(type)->ConvertFromNumeric(src.GetImp(), srcData, dstData);
}

int32_t ConvertToNumeric(const TD& type, const void* srcData, const TD& dst, void* dstData) {
  if (Numeric(type) == nullptr || Numeric(dst) == nullptr || srcData == nullptr || dstData == nullptr) return 0;
  return Numeric(type)->ConvertToNumeric(srcData, dst.GetImp(), dstData);
}

int32_t MSDecimalDigitPos(const TD& type, const void* data) {
  return Numeric(type) != nullptr ? Numeric(type)->MSDecimalDigitPos(data) : 0;
}

int32_t DecimalDigitsForAutoPrecision(const TD& type) {
  return Numeric(type) != nullptr ? Numeric(type)->DecimalDigitsForAutoPrecision() : 0;
}

int32_t SupportsUnits(const TD& type) { return Numeric(type) != nullptr ? Numeric(type)->SupportsUnits() : 0; }

int32_t GetNumericRepEnumIndex(const TD& type) {
  if (!type) return -1;
  const int32_t code = type.GetTypeCode();
  if (code == static_cast<int32_t>(TypeCode::FixedPoint)) return kFixedPointRepresentationIndex;
  const BasicNumericInfo* info = FindBasicNumeric(code);
  return info != nullptr ? info->representationIndex : -1;
}

int32_t GetRepresentationEnumValue(const TD& type, const TD& of, void* data) {
  const int32_t index = GetNumericRepEnumIndex(of);
  if (index < 0 || data == nullptr || AsBasicNumeric(type.GetImp()) == nullptr) return kStatusBadArgument;
  return ConvertNum(static_cast<int32_t>(TypeCode::Int32), &index, type.GetTypeCode(), data);
}

TDUnitsImpPtr GetUnitsImpPtr(const TD& type) {
  return Numeric(type) != nullptr ? Numeric(type)->GetUnits() : TDUnitsImpPtr();
}

TDEnumImpPtr GetEnumImpPtr(const TD& type) {
  const TDBasicNumericImp* basic = AsBasicNumeric(type.GetImp());
  return basic != nullptr ? basic->GetEnumImpPtr() : TDEnumImpPtr();
}

}  // namespace vellum::numeric

int32_t TDRNumeric::GetTCForNumericRepEnumIndex(int32_t index) {
  if (index == kFixedPointRepresentationIndex) return static_cast<int32_t>(TypeCode::FixedPoint);
  for (const BasicNumericInfo& info : kBasicNumerics) {
    if (info.representationIndex == index) return static_cast<int32_t>(info.code);
  }
  return 0;
}

TDRNumeric TDRNumeric::BuildRepresentationEnum() {
  static GlobalTypeEntry entry;
  const TDR& shared = SharedGlobalType(entry, [] {
    return MakeEnumeratedUInt32("Numeric Representation", kRepresentationItems, std::size(kRepresentationItems));
  });
  return TDRNumeric(shared.GetImpPtr(), 1);
}

int32_t TDWNumeric::SetUnits(const TDWUnits& units) {
  TDNumericImp* numeric = WritableNumeric(*this);
  if (numeric == nullptr) return kStatusNullHandle;
  if (!units) return numeric->RemoveUnits();
  return numeric->SetUnits(units.GetUnitsImpPtr());
}

int32_t TDWNumeric::SetUnits(const TDRUnits& units) {
  TDNumericImp* numeric = WritableNumeric(*this);
  if (numeric == nullptr) return kStatusNullHandle;
  if (!units) return numeric->RemoveUnits();
  if (numeric->SupportsUnits() == 0) return kStatusNullHandle;
  // Interned units are shared; the writable descriptor gets its own copy.
  TDUnitsImpPtr copy = units.GetUnitsImpPtr()->CloneOrCheckOut();
  if (!copy) return kStatusOutOfMemory;
  return numeric->SetUnits(copy);
}

int32_t TDWNumeric::RemoveUnits() {
  TDNumericImp* numeric = WritableNumeric(*this);
  return numeric != nullptr ? numeric->RemoveUnits() : kStatusNullHandle;
}

int32_t TDWNumeric::CopyAttributes(const TDR& src, uint32_t mask) {
  TDNumericImp* numeric = WritableNumeric(*this);
  if (numeric == nullptr) return 0;
  return numeric->CopyAttributes(src.GetImp(), mask);
}

void TDWNumeric::SetIntPtrT() {
  if (TDBasicNumericImp* basic = WritableBasicNumeric(*this)) basic->SetIntPtrT();
}

void TDWNumeric::ClearIntPtrT() {
  if (TDBasicNumericImp* basic = WritableBasicNumeric(*this)) basic->ClearIntPtrT();
}

uint8_t TDRBasicNumeric::GetNumFlags() const {
  const TDBasicNumericImp* basic = AsBasicNumeric(GetImp());
  return basic != nullptr ? basic->GetNumFlags() : uint8_t{0};
}

uint8_t TDWBasicNumeric::GetNumFlags() const {
  const TDBasicNumericImp* basic = AsBasicNumeric(GetImp());
  return basic != nullptr ? basic->GetNumFlags() : uint8_t{0};
}

int32_t TDWBasicNumeric::SetNumFlags(uint8_t numFlags) {
  TDBasicNumericImp* basic = WritableBasicNumeric(*this);
  if (basic == nullptr) return kStatusNullHandle;
  basic->SetNumFlags(numFlags);
  return kStatusNoError;
}

int32_t TDWBasicNumeric::SetEnum(const TDWEnum& enumeration) {
  TDBasicNumericImp* basic = WritableBasicNumeric(*this);
  if (basic == nullptr) return kStatusNullHandle;
  basic->SetEnumImpPtr(enumeration.GetEnumImpPtr());
  return kStatusNoError;
}

int32_t TDWBasicNumeric::SetEnum(const TDREnum& enumeration) {
  TDBasicNumericImp* basic = WritableBasicNumeric(*this);
  if (basic == nullptr) return kStatusNullHandle;
  if (!enumeration) {
    basic->SetEnumImpPtr(TDEnumImpPtr());
    return kStatusNoError;
  }
  // Interned enumerations are shared; the writable descriptor gets its own copy.
  TDEnumImpPtr copy = enumeration.GetEnumImpPtr()->CloneOrCheckOut();
  if (!copy) return kStatusOutOfMemory;
  basic->SetEnumImpPtr(copy);
  return kStatusNoError;
}

int32_t TDWBasicNumeric::RemoveEnum() {
  TDBasicNumericImp* basic = WritableBasicNumeric(*this);
  if (basic == nullptr) return kStatusNullHandle;
  basic->SetEnumImpPtr(TDEnumImpPtr());
  return kStatusNoError;
}

int32_t TDBasicNumericImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  if (enum_) {
    if (const int32_t status = enum_->Flatten(writer); status != kStatusNoError) return status;
  }
  if (units_) {
    if (const int32_t status = units_->Flatten(writer); status != kStatusNoError) return status;
  }
  if (!VersionShouldMutate(writer->GetVersion(), kNumFlagsVersion)) writer->WriteU8(numFlags_);
  return writer->GetError();
}

// --- flattened data --------------------------------------------------------------------------------

namespace {

// How one value of a numeric code is laid out: `parts` values of `partSize` bytes, extended
// values marked by a part size of 10.
struct NumericParts {
  size_t partSize;
  size_t parts;
};

NumericParts PartsOf(int32_t code) {
  switch (static_cast<TypeCode>(code & ~0x10)) {
    case TypeCode::Int8:
    case TypeCode::UInt8: return {1, 1};
    case TypeCode::Int16:
    case TypeCode::UInt16: return {2, 1};
    case TypeCode::Int32:
    case TypeCode::UInt32:
    case TypeCode::Float32: return {4, 1};
    case TypeCode::Int64:
    case TypeCode::UInt64:
    case TypeCode::Float64: return {8, 1};
    case TypeCode::FloatExt: return {10, 1};
    case TypeCode::Complex64: return {4, 2};
    case TypeCode::Complex128: return {8, 2};
    case TypeCode::ComplexExt: return {10, 2};
    default: return {0, 0};
  }
}

constexpr size_t kExtendedBytes = 10;

}  // namespace

uint32_t TDBasicNumericImp::FlatDataSize(KoDataWriter*, const void*) const {
  const NumericParts parts = PartsOf(GetTypeCode());
  const size_t size = parts.partSize == kExtendedBytes ? Endianizer::kExtendedSize : parts.partSize;
  return static_cast<uint32_t>(size * parts.parts);
}

void TDBasicNumericImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  const NumericParts parts = PartsOf(GetTypeCode());
  const size_t values = parts.parts * static_cast<size_t>(std::max(count, 0));
  if (values != 0 && data == nullptr) writer->SetError(kStatusBadArgument);
  if (parts.partSize == kExtendedBytes) {
    const auto* bytes = static_cast<const uint8_t*>(data);
    for (size_t i = 0; i < values && writer->GetError() == kStatusNoError; ++i)
      writer->WriteExtended(bytes + i * kExtendedBytes);
  } else if (values != 0) {
    writer->WriteValues(data, parts.partSize, values);
  }
}

void TDBasicNumericImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  const NumericParts parts = PartsOf(GetTypeCode());
  const size_t values = parts.parts * static_cast<size_t>(std::max(count, 0));
  if (parts.partSize == kExtendedBytes) {
    auto* bytes = static_cast<uint8_t*>(data);
    uint8_t scratch[kExtendedBytes];
    for (size_t i = 0; i < values; ++i) reader->ReadExtended(bytes != nullptr ? bytes + i * kExtendedBytes : scratch);
  } else if (data != nullptr) {
    reader->ReadValues(data, parts.partSize, values);
  } else {
    reader->Skip(parts.partSize * values);
  }
}
