// Numbers: the numeric family base shared with fixed point, the integer, floating and complex
// kinds with their enumeration, units and flag byte, and the numeric operations on their data.
#pragma once

#include <cstdint>

#include "FixedPoint/fxp.h"
#include "source/families/TDEnum.h"
#include "source/families/TDUnits.h"
#include "source/model/TD.h"
#include "vellum/TDNumericHandles.h"

// Every numeric kind, fixed point included. Slots 179 to 202, in this order.
class TDNumericImp : public TDImp {
 public:
  int32_t IsNumeric() const override { return 1; }
  // Complex only into complex of at least the word length; integers by range and step; floating
  // only into floating of at least the word length.
  bool ConversionIsLossless(const TDImp* dst) const override;
  // By value (CompareData); by the bytes when the options ask for raw numbers.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

  // --- slots 179 to 202 ------------------------------------------------------------------------
  virtual int32_t SupportsUnits() const { return 0; }
  // 0, or 42 for a kind that carries no units.
  virtual int32_t SetUnits(const TDUnitsImpPtr& units);
  virtual TDUnitsImpPtr GetUnits() const { return TDUnitsImpPtr(); }
  virtual int32_t RemoveUnits();
  virtual int32_t IsFractional() const = 0;
  virtual int32_t IsSigned() const = 0;
  virtual uint32_t WordLength() const = 0;
  virtual int16_t IntegerWordLength() const = 0;
  virtual uint32_t RealPartWordLength() const = 0;
  virtual double RangeMinF64() const = 0;
  virtual double RangeMaxF64() const = 0;
  virtual vellum::FXP RangeMin() const = 0;
  virtual vellum::FXP RangeMax() const = 0;
  // The step between adjacent values; zero for floating kinds.
  virtual vellum::FXP Delta() const = 0;
  virtual int16_t MinBitPos() const = 0;
  virtual int16_t MaxBitPos() const = 0;
  // Zero in all bytes of one value.
  virtual void InitializeData(void* data) const = 0;
  // Takes name, no-select flag (mask bit 0x1) and typedef link (mask bit 0x2) from a numeric
  // `src`; nonzero when something was taken.
  virtual int32_t CopyAttributes(const TDImp* src, uint32_t mask);
  virtual int32_t ReservedNumericSlot() const { return 0; }
  // Converts one value into `dstData` of type `dst`: 1, or 0 (nothing written) when this kind
  // cannot convert into `dst`.
  virtual int32_t ConvertToNumeric(const void* data, const TDImp* dst, void* dstData) const = 0;
  // Converts one value of type `src` into `data`: 1, or 0 (nothing written) when it cannot.
  virtual int32_t ConvertFromNumeric(const TDImp* src, const void* srcData, void* data) const = 0;
  // <0, 0 or >0: the order of two values of this type.
  virtual int32_t CompareData(const void* a, const void* b) const = 0;
  // floor(log10(|value|)); 0 for zero.
  virtual int32_t MSDecimalDigitPos(const void* data) const = 0;
  virtual int32_t DecimalDigitsForAutoPrecision() const = 0;

 protected:
  TDNumericImp() noexcept = default;
  TDNumericImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept : TDImp(name, typedefLink) {}
};

// The integer, floating and complex kinds. One class per code (below); the kind's constants come
// from the one table in TDNumeric.cpp, found through the type code.
class TDBasicNumericImp : public TDNumericImp {
 public:
  // --- slots of TDImp --------------------------------------------------------------------------
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  int32_t HasEnum() const override { return enum_ ? 1 : 0; }
  int32_t HasUnits() const override { return units_ ? 1 : 0; }
  // The enumeration, the units, then the flag byte for versions that have it. The factory
  // reads them back.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  // Each value in the stream's order; complex values real part first; extended values in the
  // writer's 16-byte form.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  int32_t IsFlatDataFixedSize() const override { return 1; }
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t CompareForSorting(const TDImp* other) const override;
  int32_t IsBasicNumeric() const override { return 1; }
  int32_t IsInteger() const override;
  int32_t IsFloat() const override;
  int32_t IsComplex() const override;

  // --- slots 179 to 202 ------------------------------------------------------------------------
  int32_t SupportsUnits() const override { return 1; }
  int32_t SetUnits(const TDUnitsImpPtr& units) override;
  TDUnitsImpPtr GetUnits() const override { return units_; }
  int32_t RemoveUnits() override;
  int32_t IsFractional() const override;
  int32_t IsSigned() const override;
  uint32_t WordLength() const override;
  int16_t IntegerWordLength() const override;
  uint32_t RealPartWordLength() const override;
  double RangeMinF64() const override;
  double RangeMaxF64() const override;
  vellum::FXP RangeMin() const override;
  vellum::FXP RangeMax() const override;
  vellum::FXP Delta() const override;
  int16_t MinBitPos() const override { return 0; }
  int16_t MaxBitPos() const override;
  void InitializeData(void* data) const override;
  int32_t CopyAttributes(const TDImp* src, uint32_t mask) override;
  int32_t ConvertToNumeric(const void* data, const TDImp* dst, void* dstData) const override;
  int32_t ConvertFromNumeric(const TDImp* src, const void* srcData, void* data) const override;
  int32_t CompareData(const void* a, const void* b) const override;
  int32_t MSDecimalDigitPos(const void* data) const override;
  int32_t DecimalDigitsForAutoPrecision() const override;

  // --- slots 203 to 206 ------------------------------------------------------------------------
  // Copies one value of this kind's size.
  virtual void CopyOneValue(const void* src, void* dst) const;
  virtual int32_t IsIntPtrT() const { return 0; }
  virtual void SetIntPtrT() {}
  virtual void ClearIntPtrT() {}

  // --- members ---------------------------------------------------------------------------------
  const TDEnumImpPtr& GetEnumImpPtr() const noexcept { return enum_; }
  // Each clears hash-valid.
  void SetEnumImpPtr(const TDEnumImpPtr& enumeration);
  uint8_t GetNumFlags() const noexcept { return numFlags_; }
  void SetNumFlags(uint8_t numFlags);

 protected:
  TDBasicNumericImp() noexcept = default;
  TDBasicNumericImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, const TDEnumImpPtr& enumeration,
                    const TDUnitsImpPtr& units) noexcept
      : TDNumericImp(name, typedefLink), enum_(enumeration), units_(units) {}
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;

  // The code without the enumeration/units modifier.
  int32_t BaseCode() const { return StripTypeCodeModifier(GetTypeCode()); }

 private:
  TDEnumImpPtr enum_;
  TDUnitsImpPtr units_;
  uint8_t numFlags_ = 0;  // carried, hashed, compared and flattened; never interpreted here
};

// Which member, if any, a kind shows in its type code.
enum class NumericModifier : uint8_t { kNone, kEnum, kUnits };

constexpr NumericModifier ModifierOf(TypeCode code) {
  switch (code) {
    case TypeCode::UInt8:
    case TypeCode::UInt16:
    case TypeCode::UInt32:
      return NumericModifier::kEnum;
    case TypeCode::Float32:
    case TypeCode::Float64:
    case TypeCode::FloatExt:
    case TypeCode::Complex64:
    case TypeCode::Complex128:
    case TypeCode::ComplexExt:
      return NumericModifier::kUnits;
    default:
      return NumericModifier::kNone;
  }
}

// One class per basic numeric code. The type code carries 0x10 when the member the kind shows
// (enumeration for the small unsigned integers, units for floating and complex) is set.
template <TypeCode kCode>
class TDBasicNumericKindImp final : public TDBasicNumericImp {
 public:
  TDBasicNumericKindImp() noexcept = default;
  TDBasicNumericKindImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
      : TDBasicNumericImp(name, typedefLink, TDEnumImpPtr(), TDUnitsImpPtr()) {}
  TDBasicNumericKindImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink,
                        const TDEnumImpPtr& enumeration) noexcept
    requires(ModifierOf(kCode) == NumericModifier::kEnum)
      : TDBasicNumericImp(name, typedefLink, enumeration, TDUnitsImpPtr()) {}
  TDBasicNumericKindImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink,
                        const TDUnitsImpPtr& units) noexcept
    requires(ModifierOf(kCode) == NumericModifier::kUnits)
      : TDBasicNumericImp(name, typedefLink, TDEnumImpPtr(), units) {}

  int16_t GetTypeCode() const override {
    constexpr int16_t base = static_cast<int16_t>(kCode);
    if constexpr (ModifierOf(kCode) == NumericModifier::kEnum) return HasEnum() != 0 ? base | 0x10 : base;
    if constexpr (ModifierOf(kCode) == NumericModifier::kUnits) return HasUnits() != 0 ? base | 0x10 : base;
    return base;
  }
  TDImpPtr NewInstance() const override { return MakeCounted<TDBasicNumericKindImp>(); }
};

using TDInt8Imp = TDBasicNumericKindImp<TypeCode::Int8>;
using TDInt16Imp = TDBasicNumericKindImp<TypeCode::Int16>;
using TDInt32Imp = TDBasicNumericKindImp<TypeCode::Int32>;
using TDInt64Imp = TDBasicNumericKindImp<TypeCode::Int64>;
using TDUInt8Imp = TDBasicNumericKindImp<TypeCode::UInt8>;
using TDUInt16Imp = TDBasicNumericKindImp<TypeCode::UInt16>;
using TDUInt32Imp = TDBasicNumericKindImp<TypeCode::UInt32>;
using TDUInt64Imp = TDBasicNumericKindImp<TypeCode::UInt64>;
using TDFloat32Imp = TDBasicNumericKindImp<TypeCode::Float32>;
using TDFloat64Imp = TDBasicNumericKindImp<TypeCode::Float64>;
using TDFloatExtImp = TDBasicNumericKindImp<TypeCode::FloatExt>;
using TDComplex64Imp = TDBasicNumericKindImp<TypeCode::Complex64>;
using TDComplex128Imp = TDBasicNumericKindImp<TypeCode::Complex128>;
using TDComplexExtImp = TDBasicNumericKindImp<TypeCode::ComplexExt>;

// The decimal digits that show every value of a basic numeric code (modifier allowed); 20 after
// "Not yet supported" for the 64-bit integers, 0 after "Bad tc" for any other code.
int32_t DecimalDigitsForAutoPrecisionOfCode(int32_t code);

// The order of two values of numeric `type` (TDNumericImp::CompareData); 0 when `type` is null or
// not numeric.
int32_t CompareNumericData(const TDImp* type, const void* a, const void* b);

// The shared "Event Type" enumeration (59 items) that event enumerations convert into.
const TDR& GetEventTypeTD();
