// Numbers: type codes with enumerations and units, identity and interning, compatibility with
// the lossy table, lossless conversion, value conversion between every pair of kinds against
// independently computed values, enumerated values, decimal digits, the representation
// enumeration, attributes, the dump, the factories and running out of memory.
#include <gtest/gtest.h>

#include <algorithm>
#include <cfenv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>
#include <thread>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "runtime/PXNumbers.h"
#include "vellum/TypeStrings.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TypeManagerHooks.h"
#include "vellum.h"

namespace {

using Items = std::vector<std::string>;

constexpr int32_t kVoid = 0x00, kInt8 = 0x01, kInt16 = 0x02, kInt32 = 0x03, kInt64 = 0x04, kUInt8 = 0x05,
                  kUInt16 = 0x06, kUInt32 = 0x07, kUInt64 = 0x08, kFloat32 = 0x09, kFloat64 = 0x0A, kFloatExt = 0x0B,
                  kComplex64 = 0x0C, kComplex128 = 0x0D, kComplexExt = 0x0E;

class TDNumericTest : public TypeSystemTest {};

TDWEnum MakeEnum(const Items& items) {
  TDWEnum enumeration;
  for (const std::string& item : items) EXPECT_EQ(enumeration.AppendString(item.c_str()), 0);
  return enumeration;
}

TDRUInt32 EnumU32(const Items& items) { return TDRUInt32(MakeEnum(items), nullptr); }
TDRUInt16 EnumU16(const Items& items) { return TDRUInt16(MakeEnum(items), nullptr); }

TDWUnits Meters(int16_t exponent) {
  TDWUnits units;
  EXPECT_EQ(units.SetUnit(kUnitMeters, exponent), 0);
  return units;
}

const TDR& DefaultOf(int32_t code) { return MakeDefaultTDRForTypeCode(code); }

// --- the kinds, as this system defines them ----------------------------------------------------

struct KindCase {
  const char* name;
  int32_t code;
  const TDR& (*getter)();
  int32_t size;
  uint32_t wordLength;
  uint32_t realPartWordLength;
  int32_t isSigned, isInteger, isFloat, isComplex, isFractional;
  double rangeMin, rangeMax;
  int32_t representation;
  int32_t autoDigits;
  const char* debugName;
};

constexpr double kInf = std::numeric_limits<double>::infinity();

const KindCase kKinds[] = {
    {"Int8", kInt8, &GetiB, 1, 8, 8, 1, 1, 0, 0, 0, -128, 127, 5, 3, "int8"},
    {"Int16", kInt16, &GetiW, 2, 16, 16, 1, 1, 0, 0, 0, -32768, 32767, 4, 5, "int16"},
    {"Int32", kInt32, &GetiL, 4, 32, 32, 1, 1, 0, 0, 0, -2147483648.0, 2147483647.0, 3, 10, "int32"},
    {"Int64", kInt64, &GetiQ, 8, 64, 64, 1, 1, 0, 0, 0, -0x1p63, 0x1p63, 12, 20, "int64"},
    {"UInt8", kUInt8, &GetuB, 1, 8, 8, 0, 1, 0, 0, 0, 0, 255, 8, 3, "uInt8"},
    {"UInt16", kUInt16, &GetuW, 2, 16, 16, 0, 1, 0, 0, 0, 0, 65535, 7, 5, "uInt16"},
    {"UInt32", kUInt32, &GetuL, 4, 32, 32, 0, 1, 0, 0, 0, 0, 4294967295.0, 6, 10, "uInt32"},
    {"UInt64", kUInt64, &GetuQ, 8, 64, 64, 0, 1, 0, 0, 0, 0, 0x1p64, 13, 20, "uInt64"},
    {"Float32", kFloat32, &GetfS, 4, 32, 32, 1, 0, 1, 0, 1, -kInf, kInf, 2, 6, "single"},
    {"Float64", kFloat64, &GetfD, 8, 64, 64, 1, 0, 1, 0, 1, -kInf, kInf, 1, 13, "double"},
    {"FloatExt", kFloatExt, &GetfX, 10, 128, 128, 1, 0, 1, 0, 1, -kInf, kInf, 0, 13, "float extended"},
    {"Complex64", kComplex64, &GetcS, 8, 64, 32, 1, 0, 1, 1, 0, -kInf, kInf, 11, 6, "complex single"},
    {"Complex128", kComplex128, &GetcD, 16, 128, 64, 1, 0, 1, 1, 0, -kInf, kInf, 10, 13, "complex double"},
    {"ComplexExt", kComplexExt, &GetcX, 20, 256, 128, 1, 0, 1, 1, 0, -kInf, kInf, 9, 13, "complex extended"},
};

TEST_F(TDNumericTest, EveryKindHasItsConstants) {
  for (const KindCase& k : kKinds) {
    SCOPED_TRACE(k.name);
    const TDR& shared = k.getter();
    ASSERT_TRUE(shared);
    EXPECT_EQ(shared, DefaultOf(k.code));
    EXPECT_EQ(shared.GetTypeCode(), k.code);
    EXPECT_EQ(shared.IsReadOnlyTD(), 1);
    EXPECT_EQ(shared.IsNumeric(), 1);
    EXPECT_EQ(shared.IsBasicNumeric(), 1);
    EXPECT_EQ(shared.IsInteger(), k.isInteger);
    EXPECT_EQ(shared.IsFloat(), k.isFloat);
    EXPECT_EQ(shared.IsComplex(), k.isComplex);
    EXPECT_EQ(shared.IsFixedPoint(), 0);
    EXPECT_EQ(shared.DataSize(), k.size);

    const TDRNumeric numeric = vellum::As<TDRNumeric>(shared);
    ASSERT_TRUE(numeric);
    EXPECT_EQ(numeric.IsSigned(), k.isSigned);
    EXPECT_EQ(numeric.IsFractional(), k.isFractional);
    EXPECT_EQ(numeric.WordLength(), k.wordLength);
    EXPECT_EQ(numeric.RealPartWordLength(), k.realPartWordLength);
    EXPECT_EQ(numeric.IntegerWordLength(), k.isInteger ? static_cast<int16_t>(k.wordLength) : 0);
    EXPECT_EQ(numeric.MinBitPos(), 0);
    EXPECT_EQ(numeric.MaxBitPos(), k.isFloat ? 0 : static_cast<int16_t>(k.wordLength - 1));
    EXPECT_EQ(numeric.IsIntPtrT(), 0);
    EXPECT_EQ(numeric.SupportsUnits(), 1);
    double min = 0;
    double max = 0;
    EXPECT_EQ(numeric.RangeF64(&min, &max), 0);
    EXPECT_EQ(min, k.rangeMin);
    EXPECT_EQ(max, k.rangeMax);
    EXPECT_EQ(numeric.GetNumericRepEnumIndex(), k.representation);
    EXPECT_EQ(TDRNumeric::GetTCForNumericRepEnumIndex(k.representation), k.code);

    DebugCapture capture;
    EXPECT_EQ(numeric.DecimalDigitsForAutoPrecision(), k.autoDigits);
    EXPECT_EQ(capture.Contains("Not yet supported"), k.autoDigits == 20);
  }
}

TEST_F(TDNumericTest, RangesAndStepsAreExactFixedPointValues) {
  using vellum::FXP;
  struct Case {
    int32_t code;
    FXP min, max, delta;
    int wl;
    bool isSigned;
  };
  const Case kCases[] = {
      {kInt8, FXP(int64_t{-128}), FXP(int64_t{127}), FXP(int64_t{1}), 8, true},
      {kInt32, FXP(int64_t{INT32_MIN}), FXP(int64_t{INT32_MAX}), FXP(int64_t{1}), 32, true},
      {kInt64, FXP(int64_t{INT64_MIN}), FXP(int64_t{INT64_MAX}), FXP(int64_t{1}), 64, true},
      {kUInt16, FXP(uint64_t{0}), FXP(uint64_t{65535}), FXP(int64_t{1}), 16, false},
      {kUInt64, FXP(uint64_t{0}), FXP(uint64_t{UINT64_MAX}), FXP(int64_t{1}), 64, false},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.code);
    const TDRNumeric numeric = vellum::As<TDRNumeric>(DefaultOf(c.code));
    EXPECT_EQ(numeric.RangeMin(), c.min);
    EXPECT_EQ(numeric.RangeMax(), c.max);
    EXPECT_EQ(numeric.Delta(), c.delta);
    // The ends are given in the kind's own format.
    EXPECT_EQ(numeric.RangeMin().wl(), c.wl);
    EXPECT_EQ(numeric.RangeMin().iwl(), c.wl);
    EXPECT_EQ(numeric.RangeMax().isSigned(), c.isSigned);
  }
  const TDRNumeric float64 = vellum::As<TDRNumeric>(GetfD());
  EXPECT_TRUE(float64.Delta().isZero());
  EXPECT_TRUE(float64.RangeMin().isNegative());
  EXPECT_GT(float64.RangeMax(), FXP(uint64_t{UINT64_MAX}));
}

// --- type codes, admission and identity ------------------------------------------------------

TEST_F(TDNumericTest, TypeCodeFollowsEnumerationAndUnits) {
  TDWUInt8 byte;
  EXPECT_EQ(byte.GetTypeCode(), kUInt8);
  ASSERT_EQ(byte.SetEnum(MakeEnum({"a", "b"})), 0);
  EXPECT_EQ(byte.GetTypeCode(), 0x15);
  EXPECT_EQ(byte.HasEnum(), 1);
  ASSERT_EQ(byte.RemoveEnum(), 0);
  EXPECT_EQ(byte.GetTypeCode(), kUInt8);

  struct Case {
    int32_t code;
    int32_t withEnum;
    int32_t withUnits;
  };
  const Case kCases[] = {
      {kInt8, kInt8, kInt8},          {kInt16, kInt16, kInt16},       {kInt32, kInt32, kInt32},
      {kInt64, kInt64, kInt64},       {kUInt8, 0x15, kUInt8},         {kUInt16, 0x16, kUInt16},
      {kUInt32, 0x17, kUInt32},       {kUInt64, kUInt64, kUInt64},    {kFloat32, kFloat32, 0x19},
      {kFloat64, kFloat64, 0x1A},     {kFloatExt, kFloatExt, 0x1B},   {kComplex64, kComplex64, 0x1C},
      {kComplex128, kComplex128, 0x1D}, {kComplexExt, kComplexExt, 0x1E},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.code);
    TDWBasicNumeric withEnum = vellum::As<TDWBasicNumeric>(MakeDefaultTDWForTypeCode(c.code));
    ASSERT_EQ(withEnum.SetEnum(MakeEnum({"x"})), 0);
    EXPECT_EQ(withEnum.GetTypeCode(), c.withEnum);
    EXPECT_EQ(withEnum.HasEnum(), 1);
    TDWBasicNumeric withUnits = vellum::As<TDWBasicNumeric>(MakeDefaultTDWForTypeCode(c.code));
    ASSERT_EQ(withUnits.SetUnits(Meters(1)), 0);
    EXPECT_EQ(withUnits.GetTypeCode(), c.withUnits);
    EXPECT_EQ(withUnits.HasUnits(), 1);
    // The default of a code with the modifier is the plain kind.
    EXPECT_EQ(DefaultOf(c.withEnum), DefaultOf(c.code));
    EXPECT_EQ(DefaultOf(c.withUnits), DefaultOf(c.code));
  }
}

TEST_F(TDNumericTest, TypedHandlesAdmitTheirCodes) {
  const TDR enumerated = EnumU32({"a"});
  const TDR withUnits = TDRFloat64(Meters(2), nullptr);
  ASSERT_EQ(enumerated.GetTypeCode(), 0x17);
  ASSERT_EQ(withUnits.GetTypeCode(), 0x1A);

  EXPECT_TRUE(vellum::As<TDRUInt32>(enumerated));
  EXPECT_TRUE(vellum::As<TDRUInt32>(GetuL()));
  EXPECT_FALSE(TDRUInt32(GetuL().GetImpPtr(), 0));
  EXPECT_FALSE(vellum::As<TDRUInt16>(enumerated));
  EXPECT_TRUE(vellum::As<TDRFloat64>(withUnits));
  EXPECT_FALSE(vellum::As<TDRInt32>(GetiW()));
  EXPECT_FALSE(vellum::As<TDRUInt64>(GetuL()));
  EXPECT_TRUE(vellum::As<TDRBasicNumeric>(enumerated));
  EXPECT_FALSE(vellum::As<TDRNumeric>(GetBoolTD()));
  // The unchecked form holds anything it is given.
  EXPECT_TRUE(TDRNumeric(GetBoolTD().GetImpPtr(), 1, 0));
  EXPECT_FALSE(TDRNumeric(GetBoolTD().GetImpPtr(), 0, 0));
  // Writable handles never hold interned objects.
  EXPECT_FALSE(vellum::As<TDWFloat64>(withUnits));
  // The abstract kinds have no default object.
  EXPECT_FALSE(TDRNumeric());
  EXPECT_FALSE(TDWBasicNumeric());
}

TEST_F(TDNumericTest, MemberConstructorsCarryNameTypedefAndMember) {
  const TDWTypedef link(QualifiedName(), 7, nullptr);
  const TDRUInt16 readOnly(MakeEnum({"off", "on"}), U("switch"), link);
  ASSERT_TRUE(readOnly);
  EXPECT_EQ(readOnly.GetTypeCode(), 0x16);
  EXPECT_EQ(readOnly.IsReadOnlyTD(), 1);
  std::string name;
  EXPECT_EQ(readOnly.GetName(&name), 0);
  EXPECT_EQ(name, "switch");
  EXPECT_EQ(readOnly.HasTypedef(), 1);
  EXPECT_EQ(readOnly.GetEnum().GetNumStrings(), 2u);

  // A writable descriptor made from interned members gets private copies of them.
  const TDRUnits interned = Meters(1).CheckIn();
  TDWComplex128 writable(interned, U("z"));
  ASSERT_TRUE(writable);
  EXPECT_EQ(writable.GetTypeCode(), 0x1D);
  EXPECT_NE(writable.GetUnits().GetUnitsImpPtr(), interned.GetUnitsImpPtr());
  EXPECT_EQ(writable.GetUnits().SetUnit(kUnitSeconds, -1), 0);
  EXPECT_EQ(interned.GetExponent(kUnitSeconds), 0);
  EXPECT_EQ(writable.CheckIn(), TDRComplex128(Meters(1) << std::make_pair(kUnitSeconds, int16_t{-1}),
                                              U("z")));
}

TEST_F(TDNumericTest, NumFlagsKeepTwoDescriptorsApart) {
  TDWFloat64 first;
  TDWFloat64 second;
  ASSERT_EQ(second.SetNumFlags(0x40), 0);
  EXPECT_EQ(first.IsSameAs(second), 0);
  const TDR a = first.CheckIn();
  const TDR b = second.CheckIn();
  EXPECT_NE(a, b);
  EXPECT_EQ(a, GetfD());
  EXPECT_EQ(vellum::As<TDRBasicNumeric>(b).GetNumFlags(), 0x40);
  EXPECT_NE(a.GetHashValue(), b.GetHashValue());
  // Checking out keeps the byte, and the same byte interns to the same object.
  TDWBasicNumeric again = vellum::As<TDRBasicNumeric>(b).CheckOut();
  EXPECT_EQ(again.GetNumFlags(), 0x40);
  EXPECT_EQ(again.CheckIn(), b);
  EXPECT_NE(again.CompareForSorting(a), 0);
}

TEST_F(TDNumericTest, EqualDescriptorsInternToOneObject) {
  const TDR a = TDRUInt8(MakeEnum({"red", "green"}), U("colour"));
  const TDR b = TDRUInt8(MakeEnum({"red", "green"}), U("colour"));
  const TDR reordered = TDRUInt8(MakeEnum({"green", "red"}), U("colour"));
  const TDR plain = TDRUInt8(U("colour"));
  EXPECT_EQ(a, b);
  EXPECT_EQ(a.GetHashValue(), b.GetHashValue());
  EXPECT_NE(a, reordered);
  EXPECT_NE(a, plain);
  EXPECT_EQ(plain.GetTypeCode(), kUInt8);

  const TDR m2 = TDRFloat32(Meters(2), nullptr);
  EXPECT_EQ(m2, TDRFloat32(Meters(2), nullptr));
  EXPECT_NE(m2, TDRFloat32(Meters(3), nullptr));
  EXPECT_NE(m2, GetfS());

  // Members of an interned descriptor are interned too.
  EXPECT_EQ(vellum::As<TDRFloat32>(m2).GetUnits(), Meters(2).CheckIn());
}

TEST_F(TDNumericTest, CheckOutGivesPrivateMembers) {
  const TDRUInt8 interned(MakeEnum({"a", "b"}), nullptr);
  TDWUInt8 writable = interned.CheckOut();
  ASSERT_TRUE(writable);
  EXPECT_EQ(writable.GetTypeCode(), 0x15);
  EXPECT_EQ(writable.IsSameAs(interned), 1);
  EXPECT_EQ(writable.GetEnum().AppendString("c"), 0);
  EXPECT_EQ(interned.GetEnum().GetNumStrings(), 2u);
  EXPECT_EQ(writable.IsSameAs(interned), 0);
  EXPECT_EQ(writable.CheckIn(), TDR(TDRUInt8(MakeEnum({"a", "b", "c"}), nullptr)));
}

TEST_F(TDNumericTest, SettersOnNullOrUnsuitableHandles) {
  TDWBasicNumeric none;
  TDWNumeric noneNumeric;
  EXPECT_EQ(none.SetEnum(MakeEnum({"a"})), 42);
  EXPECT_EQ(none.SetEnum(TDREnum()), 42);
  EXPECT_EQ(none.RemoveEnum(), 42);
  EXPECT_EQ(none.SetNumFlags(1), 42);
  EXPECT_EQ(noneNumeric.SetUnits(Meters(1)), 42);
  EXPECT_EQ(noneNumeric.SetUnits(TDRUnits()), 42);
  EXPECT_EQ(noneNumeric.RemoveUnits(), 42);
  EXPECT_EQ(noneNumeric.CopyAttributes(GetiL(), 3), 0);
  EXPECT_FALSE(noneNumeric.GetUnits());
  EXPECT_FALSE(TDRBasicNumeric().GetEnum());
  EXPECT_EQ(TDRNumeric().GetNumericRepEnumIndex(), -1);
  EXPECT_EQ(TDRNumeric().WordLength(), 0u);
  double min = 1;
  EXPECT_EQ(TDRNumeric().RangeF64(&min, nullptr), 42);
  EXPECT_EQ(min, 1);

  // A null member removes the member.
  TDWFloat32 withUnits(Meters(1), nullptr);
  EXPECT_EQ(withUnits.SetUnits(TDWUnits(TDUnitsImpPtr(), 1)), 0);
  EXPECT_EQ(withUnits.GetTypeCode(), kFloat32);
}

TEST_F(TDNumericTest, SortingOrderOfEqualCodes) {
  TDWFloat64 flagged;
  ASSERT_EQ(flagged.SetNumFlags(2), 0);
  // Units leave an integer's code as it is, so only the kind's own order tells these apart.
  TDWInt32 integerWithUnits;
  ASSERT_EQ(integerWithUnits.SetUnits(Meters(1)), 0);
  struct Case {
    const char* name;
    TDR a;
    TDR b;
    int sign;
  };
  const Case kCases[] = {
      {"Same", GetuL(), GetuL(), 0},
      {"EnumAfterPlain", EnumU32({"a"}), GetuL(), 1},
      {"PlainBeforeEnum", GetuL(), EnumU32({"a"}), -1},
      {"FewerItemsFirst", EnumU32({"a"}), EnumU32({"a", "b"}), -1},
      {"ItemOrder", EnumU32({"a", "c"}), EnumU32({"a", "b"}), 1},
      {"UnitsAfterPlain", TDRFloat64(Meters(1), nullptr), GetfD(), 1},
      {"UnitsByExponent", TDRFloat64(Meters(1), nullptr), TDRFloat64(Meters(2), nullptr), -1},
      {"FlagByte", flagged.CheckIn(), GetfD(), 1},
      {"UnitsOnAnInteger", integerWithUnits.CheckIn(), GetiL(), 1},
      {"NoUnitsOnAnInteger", GetiL(), integerWithUnits.CheckIn(), -1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const int32_t order = c.a.CompareForSorting(c.b);
    EXPECT_EQ((order > 0) - (order < 0), c.sign);
  }
}

TEST_F(TDNumericTest, ConcurrentCheckInsGiveOneObjectPerType) {
  constexpr int kThreads = 8;
  std::vector<TDR> defaults(kThreads);
  std::vector<TDR> withUnits(kThreads);
  std::vector<TDR> enumerated(kThreads);
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&, i] {
      defaults[i] = GetcD();
      withUnits[i] = TDRFloat32(TDWUnits() << std::make_pair(kUnitKelvins, int16_t{1}), nullptr);
      TDWEnum items;
      items << "low" << "high";
      enumerated[i] = TDRUInt8(items, nullptr);
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int i = 0; i < kThreads; ++i) {
    EXPECT_TRUE(defaults[i]);
    EXPECT_EQ(defaults[i], defaults[0]);
    EXPECT_TRUE(withUnits[i]);
    EXPECT_EQ(withUnits[i], withUnits[0]);
    EXPECT_TRUE(enumerated[i]);
    EXPECT_EQ(enumerated[i], enumerated[0]);
  }
}

// --- compatibility --------------------------------------------------------------------------------

// Rows: source code, columns: destination code, Void to ComplexExt; 1 = may lose information.
constexpr int kLossy[15][15] = {
    {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}, {0, 0, 0, 0, 0, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0},
    {0, 1, 0, 0, 0, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0}, {0, 1, 1, 0, 0, 1, 1, 1, 1, 1, 0, 0, 1, 0, 0},
    {0, 1, 1, 1, 0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1}, {0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0},
    {0, 1, 1, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0}, {0, 1, 1, 1, 0, 1, 1, 0, 0, 1, 0, 0, 1, 0, 0},
    {0, 1, 1, 1, 1, 1, 1, 1, 0, 1, 1, 1, 1, 1, 1}, {0, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0},
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 1, 0, 0}, {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 1, 1, 0},
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0}, {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0},
    {0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0},
};

TEST_F(TDNumericTest, LossyTableBitsForEveryPair) {
  for (int32_t src = 0; src < 15; ++src) {
    for (int32_t dst = 0; dst < 15; ++dst) {
      SCOPED_TRACE(std::to_string(src) + " -> " + std::to_string(dst));
      const int32_t withFlag = DefaultOf(dst).CmpTD(DefaultOf(src), 0x2000);
      EXPECT_EQ((withFlag & 0x80000) != 0, kLossy[src][dst] != 0);
      EXPECT_EQ(DefaultOf(dst).CmpTD(DefaultOf(src), 0) & 0x80000, 0);
    }
  }
}

TEST_F(TDNumericTest, CmpTDKindsAndSizes) {
  struct Case {
    int32_t dst;
    int32_t src;
    int32_t expected;
  };
  const Case kCases[] = {
      {kInt32, kInt32, 0},
      {kInt32, kUInt32, 0x1},    // signedness alone
      {kInt8, kUInt8, 0x1},
      {kInt32, kInt16, 0x10},    // precision and size
      {kUInt64, kInt64, 0x1},
      {kFloat64, kFloat32, 0x10},
      {kFloat64, kInt64, 0x10},  // floating on one side; same size
      {kComplex128, kFloat64, 0x10},
      {kInt32, kFloat32, 0x10},
      {kInt32, kVoid, 0x100},
      {kVoid, kInt32, 0x100},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(std::to_string(c.src) + " -> " + std::to_string(c.dst));
    EXPECT_EQ(DefaultOf(c.dst).CmpTD(DefaultOf(c.src), 0), c.expected);
  }
  EXPECT_EQ(GetiL().CmpTD(GetBoolTD(), 0), 0x100);
  EXPECT_EQ(GetiL().CmpTD(TD(), 0), 0x100);
}

TEST_F(TDNumericTest, CmpTDUnits) {
  const TDR plain = GetfD();
  const TDR meters = TDRFloat64(Meters(1), nullptr);
  const TDR squared = TDRFloat64(Meters(2), nullptr);
  const TDR empty = TDRFloat64(TDWUnits(), nullptr);  // units without any entry
  TDWUnits polyUnits;
  ASSERT_EQ(polyUnits.SetUnit(PolymorphicUnit(1), 1), 0);
  const TDR poly = TDRFloat64(polyUnits, nullptr);
  struct Case {
    const char* name;
    TDR dst;
    TDR src;
    int32_t flags;
    int32_t expected;
  };
  const Case kCases[] = {
      {"UnitsIntoPlain", plain, meters, 0, 0x800},
      {"UnitsIntoPlainAllowed", plain, meters, 0x4000, 0},
      {"EmptyUnitsIntoPlain", plain, empty, 0, 0},
      {"PlainIntoUnits", meters, plain, 0, 0x800},
      {"PlainIntoUnitsAllowed", meters, plain, 0x4000, 0},
      {"DifferentUnits", squared, meters, 0, 0x800},
      {"DifferentUnitsAnyway", squared, meters, 0x4000, 0x800},
      {"IntoPolymorphic", poly, meters, 0, 0x800},
      {"IntoPolymorphicMatchesAny", poly, meters, 0x80000, 0},
      {"IntoPolymorphicPlain", poly, plain, 0x80000, 0},
      {"SameUnits", meters, TDRFloat64(Meters(1), nullptr), 0, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.dst.CmpTD(c.src, c.flags), c.expected);
  }
}

TEST_F(TDNumericTest, CmpTDEnumerations) {
  const TDR ab = EnumU32({"a", "b"});
  const TDR abc = EnumU32({"a", "b", "c"});
  const TDR ax = EnumU32({"a", "x"});
  struct Case {
    const char* name;
    TDR dst;
    TDR src;
    int32_t flags;
    int32_t expected;
  };
  const Case kCases[] = {
      {"EnumIntoPlain", GetuL(), ab, 0, 0x10},
      {"EnumIntoPlainLoose", GetuL(), ab, 0x100, 0},
      {"EnumIntoPlainAllowed", GetuL(), ab, 0x800000, 0},
      {"PlainIntoEnum", ab, GetuL(), 0, 0x10},
      {"PlainIntoEnumLossy", ab, GetuL(), 0x2000, 0x80010},
      {"ItemsDiffer", ax, ab, 0, 0x80},
      {"DestinationHasMore", abc, ab, 0x2000, 0x10},
      {"DestinationHasFewer", ab, abc, 0x2000, 0x80010},
      {"DestinationHasFewerNoReport", ab, abc, 0, 0x10},
      {"EnumIntoOtherSize", EnumU16({"a", "b"}), ab, 0, 0x10},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.dst.CmpTD(c.src, c.flags), c.expected);
  }
}

TEST_F(TDNumericTest, ConversionIsLossless) {
  struct Case {
    int32_t src;
    int32_t dst;
    bool expected;
  };
  const Case kCases[] = {
      {kInt16, kInt32, true},      {kInt32, kInt16, false},       {kUInt8, kInt8, false},
      {kUInt8, kInt16, true},      {kUInt32, kInt64, true},       {kUInt64, kInt64, false},
      {kInt8, kUInt64, false},     {kInt32, kInt32, true},        {kFloat64, kFloat32, false},
      {kFloat32, kFloat64, true},  {kFloat64, kFloatExt, true},   {kInt32, kFloat64, false},
      {kFloat32, kInt64, false},   {kComplex64, kComplex128, true}, {kComplex128, kComplex64, false},
      {kFloat32, kComplex64, false}, {kComplex64, kFloat64, false}, {kFloatExt, kComplexExt, false},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(std::to_string(c.src) + " -> " + std::to_string(c.dst));
    EXPECT_EQ(DefaultOf(c.src).ConversionIsLossless(DefaultOf(c.dst)), c.expected);
  }
  EXPECT_FALSE(GetiL().ConversionIsLossless(GetBoolTD()));
  EXPECT_FALSE(GetiL().ConversionIsLossless(TD()));
  EXPECT_FALSE(TD().ConversionIsLossless(GetiL()));
}

// --- value conversion between every pair of kinds ----------------------------------------------

// A kind as the test sees it: its class and range, and the native types that hold its values.
struct Kind {
  int32_t code;
  int numClass;  // 1 integer, 2 real, 3 complex
  long double lo, hi;
};

const Kind kAllKinds[] = {
    {kInt8, 1, -128.0L, 127.0L},
    {kInt16, 1, -32768.0L, 32767.0L},
    {kInt32, 1, -2147483648.0L, 2147483647.0L},
    {kInt64, 1, -9223372036854775808.0L, 9223372036854775807.0L},
    {kUInt8, 1, 0, 255.0L},
    {kUInt16, 1, 0, 65535.0L},
    {kUInt32, 1, 0, 4294967295.0L},
    {kUInt64, 1, 0, 18446744073709551615.0L},
    {kFloat32, 2, 0, 0},
    {kFloat64, 2, 0, 0},
    {kFloatExt, 2, 0, 0},
    {kComplex64, 3, 0, 0},
    {kComplex128, 3, 0, 0},
    {kComplexExt, 3, 0, 0},
};

// The component precision of a floating kind: 0 float, 1 double, 2 extended.
int Precision(int32_t code) {
  switch (code) {
    case kFloat32:
    case kComplex64: return 0;
    case kFloat64:
    case kComplex128: return 1;
    default: return 2;
  }
}

long double RoundTo(int precision, long double v) {
  if (precision == 0) return static_cast<float>(v);
  if (precision == 1) return static_cast<double>(v);
  return v;
}

bool Holds(const Kind& k, long double v) {
  if (k.numClass == 1) return std::isfinite(v) && v == std::truncl(v) && v >= k.lo && v <= k.hi;
  if (std::isnan(v)) return true;
  return RoundTo(Precision(k.code), v) == v;
}

void PutComponent(int precision, long double v, uint8_t* out) {
  if (precision == 0) {
    const float f = static_cast<float>(v);
    std::memcpy(out, &f, 4);
  } else if (precision == 1) {
    const double d = static_cast<double>(v);
    std::memcpy(out, &d, 8);
  } else {
    std::memcpy(out, &v, 10);  // the machine's own extended format
  }
}

long double GetComponent(int precision, const uint8_t* in) {
  if (precision == 0) {
    float f;
    std::memcpy(&f, in, 4);
    return f;
  }
  if (precision == 1) {
    double d;
    std::memcpy(&d, in, 8);
    return d;
  }
  long double v = 0;
  std::memcpy(&v, in, 10);
  return v;
}

int ComponentSize(int precision) { return precision == 0 ? 4 : (precision == 1 ? 8 : 10); }

void Encode(const Kind& k, long double re, long double im, uint8_t* out) {
  switch (k.code) {
    case kInt8: { const auto x = static_cast<int8_t>(re); std::memcpy(out, &x, 1); return; }
    case kInt16: { const auto x = static_cast<int16_t>(re); std::memcpy(out, &x, 2); return; }
    case kInt32: { const auto x = static_cast<int32_t>(re); std::memcpy(out, &x, 4); return; }
    case kInt64: { const auto x = static_cast<int64_t>(re); std::memcpy(out, &x, 8); return; }
    case kUInt8: { const auto x = static_cast<uint8_t>(re); std::memcpy(out, &x, 1); return; }
    case kUInt16: { const auto x = static_cast<uint16_t>(re); std::memcpy(out, &x, 2); return; }
    case kUInt32: { const auto x = static_cast<uint32_t>(re); std::memcpy(out, &x, 4); return; }
    case kUInt64: { const auto x = static_cast<uint64_t>(re); std::memcpy(out, &x, 8); return; }
    default: break;
  }
  const int precision = Precision(k.code);
  PutComponent(precision, re, out);
  if (k.numClass == 3) PutComponent(precision, im, out + ComponentSize(precision));
}

long double Decode(const Kind& k, const uint8_t* in, long double* im) {
  *im = 0;
  switch (k.code) {
    case kInt8: { int8_t x; std::memcpy(&x, in, 1); return x; }
    case kInt16: { int16_t x; std::memcpy(&x, in, 2); return x; }
    case kInt32: { int32_t x; std::memcpy(&x, in, 4); return x; }
    case kInt64: { int64_t x; std::memcpy(&x, in, 8); return static_cast<long double>(x); }
    case kUInt8: { uint8_t x; std::memcpy(&x, in, 1); return x; }
    case kUInt16: { uint16_t x; std::memcpy(&x, in, 2); return x; }
    case kUInt32: { uint32_t x; std::memcpy(&x, in, 4); return x; }
    case kUInt64: { uint64_t x; std::memcpy(&x, in, 8); return static_cast<long double>(x); }
    default: break;
  }
  const int precision = Precision(k.code);
  if (k.numClass == 3) *im = GetComponent(precision, in + ComponentSize(precision));
  return GetComponent(precision, in);
}

// What a value becomes in a destination kind: integers round to nearest with ties to even and
// saturate (NaN is 0); floating values round to the destination's precision.
long double Expected(const Kind& dst, long double v) {
  if (dst.numClass != 1) return RoundTo(Precision(dst.code), v);
  if (std::isnan(v)) return 0;
  if (v <= dst.lo) return dst.lo;
  if (v >= dst.hi) return dst.hi;
  const long double r = std::nearbyintl(v);  // the default rounding: to nearest, ties to even
  return r < dst.lo ? dst.lo : (r > dst.hi ? dst.hi : r);
}

bool SameValue(long double a, long double b) { return (std::isnan(a) && std::isnan(b)) || a == b; }

const long double kValues[] = {
    0.0L, -0.0L, 1, -1, 0.5L, -0.5L, 1.5L, 2.5L, -2.5L, 3.5L, 0.25L, 0.1L, 2.675L, 126.5L, 127, 127.5L,
    128, -128, -128.5L, -129, 254.5L, 255, 255.5L, 256, 300, -300, 32767, 32767.5L, 32768, -32768, -32769,
    65535, 65536, 100000.75L, 2147483647, 2147483647.5L, 2147483648.0L, -2147483648.0L, -2147483649.0L,
    4294967295.0L, 4294967295.5L, 4294967296.0L, 9007199254740993.0L, 9223372036854775807.0L,
    9223372036854775808.0L, -9223372036854775808.0L, -9223372036854775809.0L, 18446744073709551615.0L,
    18446744073709551616.0L, 1e20L, -1e20L, 3.4028234663852886e38L, 3.5e38L, 1e300L, -1e300L, 1e-300L,
    1.401298464324817e-45L, 1e4000L, -1e4000L, std::numeric_limits<long double>::infinity(),
    -std::numeric_limits<long double>::infinity(), std::numeric_limits<long double>::quiet_NaN(),
};

TEST_F(TDNumericTest, EveryPairConvertsToIndependentlyComputedValues) {
  ASSERT_EQ(std::fegetround(), FE_TONEAREST);
  int64_t checked = 0;
  for (const Kind& src : kAllKinds) {
    for (const Kind& dst : kAllKinds) {
      for (const long double v : kValues) {
        if (!Holds(src, v)) continue;
        const long double im = src.numClass == 3 ? RoundTo(Precision(src.code), -0.75L) : 0;
        SCOPED_TRACE(std::to_string(src.code) + " -> " + std::to_string(dst.code) + " value " +
                     std::to_string(static_cast<double>(v)));
        uint8_t in[20] = {};
        Encode(src, v, im, in);
        uint8_t viaCopy[20] = {};
        uint8_t viaConvert[20] = {};
        ASSERT_EQ(DefaultOf(src.code).CopyDataConvert(DefaultOf(dst.code), in, viaCopy, 0), 0);
        ASSERT_EQ(ConvertNumTDR(DefaultOf(src.code), in, DefaultOf(dst.code), viaConvert, 0), 0);
        long double gotIm = 0;
        const long double got = Decode(dst, viaCopy, &gotIm);
        EXPECT_TRUE(SameValue(got, Expected(dst, v))) << static_cast<double>(got);
        if (dst.numClass == 3) {
          EXPECT_TRUE(SameValue(gotIm, RoundTo(Precision(dst.code), im)));
        }
        EXPECT_EQ(std::memcmp(viaCopy, viaConvert, sizeof viaCopy), 0);
        ++checked;
      }
    }
  }
  EXPECT_GT(checked, 3000);
}

TEST_F(TDNumericTest, UnitsTakeNoPartInValueConversion) {
  const TDR meters = TDRFloat32(Meters(1), nullptr);
  const TDR seconds = TDRFloat64(TDWUnits() << std::make_pair(kUnitSeconds, int16_t{1}), nullptr);
  const float in = 2.5f;
  double out = 0;
  EXPECT_EQ(meters.CopyDataConvert(seconds, &in, &out, 0), 0);
  EXPECT_EQ(out, 2.5);
  int32_t rounded = 0;
  EXPECT_EQ(meters.CopyDataConvert(GetiL(), &in, &rounded, 0), 0);
  EXPECT_EQ(rounded, 2);
  // The same kind with and without units copies the value.
  float copied = 0;
  EXPECT_EQ(GetfS().CopyDataConvert(meters, &in, &copied, 0), 0);
  EXPECT_EQ(copied, 2.5f);
}

TEST_F(TDNumericTest, ConversionRefusals) {
  DebugCapture capture;
  const int32_t value = 1;
  uint8_t out[8] = {0xAA, 0xAA};
  EXPECT_EQ(GetiL().CopyDataConvert(GetBoolTD(), &value, out, 0), 1);
  EXPECT_EQ(out[0], 0xAA);
  ASSERT_EQ(capture.Texts().size(), 1u);
  EXPECT_EQ(capture.Texts()[0], "CopyDataConvert tcDst=0x00000021, tcSrc=0x00000003");
  EXPECT_EQ(capture.Messages()[0].module, "TDNumeric");
  EXPECT_EQ(ConvertNumTDR(GetBoolTD(), &value, GetiL(), out, 0), 1);
  EXPECT_EQ(ConvertNumTDR(GetiL(), nullptr, GetiL(), out, 0), 1);
  EXPECT_EQ(ConvertNumTDR(TDR(), &value, GetiL(), out, 0), 42);
  EXPECT_EQ(GetiL().CopyDataConvert(TD(), &value, out, 0), 42);
  EXPECT_EQ(GetiL().CopyDataConvert(GetiB(), nullptr, out, 0), 1);
  EXPECT_EQ(out[0], 0xAA);

  const TDRNumeric int32 = vellum::As<TDRNumeric>(GetiL());
  EXPECT_EQ(int32.ConvertToNumeric(&value, GetBoolTD(), out), 0);
  EXPECT_EQ(int32.ConvertFromNumeric(GetBoolTD(), &value, out), 0);
  EXPECT_EQ(out[0], 0xAA);
  double converted = 0;
  EXPECT_EQ(int32.ConvertToNumeric(&value, GetfD(), &converted), 1);
  EXPECT_EQ(converted, 1.0);
}

// --- enumerated values --------------------------------------------------------------------------

TEST_F(TDNumericTest, ValuesIntoAnEnumerationAreClamped) {
  const TDR fourItems = EnumU16({"a", "b", "c", "d"});
  struct Case {
    const char* name;
    TDR src;
    double value;  // converted into the source kind first
    uint16_t expected;
  };
  const Case kCases[] = {
      {"Int32Above", GetiL(), 300, 3},  {"Int32Negative", GetiL(), -1, 0},  {"Int32Inside", GetiL(), 2, 2},
      {"UInt32Huge", GetuL(), 4e9, 3},  {"Int64Huge", GetiQ(), -1e18, 0},  {"Float64Rounds", GetfD(), 1.5, 2},
      {"Float64Tie", GetfD(), 2.5, 2},  {"NaN", GetfD(), std::nan(""), 0}, {"Infinity", GetfD(), kInf, 3},
      {"Complex", GetcD(), 1.0, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    uint8_t in[20] = {};
    ASSERT_EQ(ConvertNumTDR(GetfD(), &c.value, c.src, in, 0), 0);
    uint16_t out = 0xFFFF;
    EXPECT_EQ(c.src.CopyDataConvert(fourItems, in, &out, 0), 0);
    EXPECT_EQ(out, c.expected);
  }
  // An enumeration with the same items, or whose items begin the other's, maps by index.
  const uint32_t value = 2;
  uint16_t out = 0;
  EXPECT_EQ(EnumU32({"a", "b", "c", "d", "e"}).CopyDataConvert(fourItems, &value, &out, 0), 0);
  EXPECT_EQ(out, 2);
  const uint32_t beyond = 4;
  EXPECT_EQ(EnumU32({"a", "b", "c", "d", "e"}).CopyDataConvert(fourItems, &beyond, &out, 0), 0);
  EXPECT_EQ(out, 3);
  // An enumeration into a plain number is its index.
  int32_t plain = -1;
  EXPECT_EQ(fourItems.CopyDataConvert(GetiL(), &out, &plain, 0), 0);
  EXPECT_EQ(plain, 3);
}

TEST_F(TDNumericTest, EnumerationsWithOtherItemsMapByName) {
  const TDR src = EnumU16({"zero", "one", "two", "three", "four"});
  const TDR reordered = EnumU32({"four", "three", "two", "one", "zero"});
  const TDR partial = EnumU32({"one", "other", "x"});
  struct Case {
    const char* name;
    TDR dst;
    uint16_t value;
    uint32_t expected;
  };
  const Case kCases[] = {
      {"Found", reordered, 1, 3},        {"FoundFirst", reordered, 4, 0},
      {"MissingInRange", partial, 2, 2}, {"MissingOutOfRange", partial, 3, 0},
      {"FoundElsewhere", partial, 1, 0}, {"ValueBeyondSource", reordered, 9, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    uint32_t out = 77;
    EXPECT_EQ(src.CopyDataConvert(c.dst, &c.value, &out, 0), 0);
    EXPECT_EQ(out, c.expected);
  }
}

void MapEventPlusForty(uint32_t event, uint32_t* eventType) { *eventType = event + 40; }

const Items kEventTypeItems = {
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

TEST_F(TDNumericTest, EventEnumerationsGoThroughTheHostProcedure) {
  ASSERT_EQ(kEventTypeItems.size(), 59u);
  // The host's procedure is used only for a destination equal, whatever its name, to the
  // library's "Event Type" enumeration: these items in this order. One item renamed is another
  // enumeration, so the procedure answering proves every item of the library's.
  const TDR eventType = TDRUInt32(MakeEnum(kEventTypeItems), U("events"));
  ASSERT_EQ(eventType.GetTypeCode(), 0x17);
  Items renamedItems = kEventTypeItems;
  renamedItems[58] = "Value Changed";
  const TDR otherType = EnumU32(renamedItems);

  Items events = {"Null", "Timeout", "Value Change", "Mouse Down", "Key Down", "e5",
                  "e6",   "e7",      "e8",           "e9",         "e10",      "e11"};
  const TDR src = EnumU16(events);
  const uint16_t mouseDown = 3;
  uint32_t out = 0;
  EXPECT_EQ(src.CopyDataConvert(eventType, &mouseDown, &out, 0), 0);
  EXPECT_EQ(out, 32u);  // by name without a procedure

  SetEventToEventTypeEnumProc(&MapEventPlusForty);
  EXPECT_EQ(src.CopyDataConvert(eventType, &mouseDown, &out, 0), 0);
  EXPECT_EQ(out, 43u);
  EXPECT_EQ(src.CopyDataConvert(otherType, &mouseDown, &out, 0), 0);
  EXPECT_EQ(out, 32u);
  // Other enumerations are still mapped by name.
  events.resize(11);
  EXPECT_EQ(EnumU16(events).CopyDataConvert(eventType, &mouseDown, &out, 0), 0);
  EXPECT_EQ(out, 32u);
  SetEventToEventTypeEnumProc(nullptr);
}

TEST_F(TDNumericTest, EnumConflictAndContainsEnum) {
  struct Case {
    const char* name;
    TDR a;
    TDR b;
    int32_t expected;
  };
  const Case kCases[] = {
      {"Prefix", EnumU32({"a", "b"}), EnumU32({"a", "b", "c"}), 0},
      {"PrefixOtherSide", EnumU32({"a", "b", "c"}), EnumU16({"a", "b"}), 0},
      {"Differ", EnumU32({"a", "b"}), EnumU32({"a", "x"}), 1},
      {"DifferFirst", EnumU32({"x", "b"}), EnumU32({"a", "b"}), 1},
      {"NoEnum", EnumU32({"a"}), GetuL(), 1},
      {"NotNumeric", EnumU32({"a"}), GetBoolTD(), 1},
      {"Null", TDR(), EnumU32({"a"}), 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(EnumConflict(c.a, c.b), c.expected);
  }
  EXPECT_TRUE(TDContainsEnum(EnumU32({"a"})));
  EXPECT_FALSE(TDContainsEnum(GetuL()));
  EXPECT_FALSE(TDContainsEnum(TDR()));
}

// --- data of numbers ------------------------------------------------------------------------------

TEST_F(TDNumericTest, CompareDataOrdersValues) {
  const double nan = std::nan("");
  struct Case {
    const char* name;
    TDR type;
    double a;
    double b;
    int32_t expected;
  };
  const Case kCases[] = {
      {"Int8Difference", GetiB(), -3, 4, -7},   {"UInt16Difference", GetuW(), 60000, 1, 59999},
      {"Int32Less", GetiL(), -5, 7, -1},        {"UInt32Greater", GetuL(), 4e9, 1, 1},
      {"Int64Equal", GetiQ(), 9, 9, 0},         {"Float64Less", GetfD(), 1, 2, -1},
      {"Float32Greater", GetfS(), 2, -2, 1},    {"NaNAfterNumber", GetfD(), nan, 1e300, 2},
      {"NaNAfterInfinity", GetfD(), nan, kInf, 1}, {"NumberBeforeNaN", GetfD(), 0, nan, -3},
      {"TwoNaN", GetfD(), nan, nan, 0},         {"InfinitiesEqual", GetfD(), kInf, kInf, 0},
      {"ExtendedLess", GetfX(), -1e300, 1, -1}, {"ExtendedNaN", GetfX(), nan, 0, 3},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    uint8_t a[20] = {};
    uint8_t b[20] = {};
    ASSERT_EQ(ConvertNumTDR(GetfD(), &c.a, c.type, a, 0), 0);
    ASSERT_EQ(ConvertNumTDR(GetfD(), &c.b, c.type, b, 0), 0);
    EXPECT_EQ(vellum::As<TDRNumeric>(c.type).CompareData(a, b), c.expected);
  }
  // Complex values compare as bytes.
  const float x[2] = {1.0f, 2.0f};
  const float y[2] = {1.0f, 3.0f};
  const TDRNumeric complex = vellum::As<TDRNumeric>(GetcS());
  EXPECT_EQ(complex.CompareData(x, x), 0);
  EXPECT_NE(complex.CompareData(x, y), 0);
  EXPECT_EQ(complex.CompareData(x, y) < 0, std::memcmp(x, y, 8) < 0);
}

TEST_F(TDNumericTest, MostSignificantDecimalDigit) {
  struct Case {
    const char* name;
    TDR type;
    long double value;
    int32_t expected;
  };
  const Case kCases[] = {
      {"Zero", GetfD(), 0.0L, 0},           {"Thousands", GetfD(), 1234.5L, 3},
      {"Hundredths", GetfD(), 0.01L, -2},     {"Negative", GetfD(), -0.5L, -1},
      {"One", GetfS(), 1.0L, 0},              {"Integer", GetiL(), 1000, 3},
      {"Small", GetfD(), 1e-300L, -300},      {"Infinity", GetfD(), kInf, 3},
      {"NaN", GetfS(), NAN, 3},               {"ExtendedInfinity", GetfX(), -kInf, 7},
      {"ExtendedNaN", GetfX(), NAN, 7},       {"ExtendedBeyondDouble", GetfX(), 1e400L, 400},
      {"ComplexRealPart", GetcD(), 250, 2},   {"ComplexExtendedInfinity", GetcX(), kInf, 3},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const Kind& kind = kAllKinds[NumBaseCode(c.type.GetTypeCode()) - 1];
    uint8_t data[20] = {};
    Encode(kind, c.value, 0, data);
    EXPECT_EQ(vellum::As<TDRNumeric>(c.type).MSDecimalDigitPos(data), c.expected);
  }
}

TEST_F(TDNumericTest, DecimalDigitsRefusals) {
  DebugCapture capture;
  EXPECT_EQ(vellum::As<TDRNumeric>(GetuQ()).DecimalDigitsForAutoPrecision(), 20);
  ASSERT_EQ(capture.Texts(), std::vector<std::string>{"Not yet supported"});
  EXPECT_EQ(capture.Messages()[0].level, 3);
  capture.Clear();
  // A code with its modifier counts as its base code.
  EXPECT_EQ(vellum::As<TDRNumeric>(EnumU16({"a"})).DecimalDigitsForAutoPrecision(), 5);
  EXPECT_EQ(vellum::As<TDRNumeric>(TDRComplex128(Meters(1), nullptr)).DecimalDigitsForAutoPrecision(), 13);
  EXPECT_TRUE(capture.Texts().empty());
}

TEST_F(TDNumericTest, InitializeDataZeroesOneValue) {
  uint8_t data[24];
  std::memset(data, 0xCD, sizeof data);
  vellum::As<TDRNumeric>(GetcX()).InitializeData(data);
  for (int i = 0; i < 20; ++i) EXPECT_EQ(data[i], 0) << i;
  for (int i = 20; i < 24; ++i) EXPECT_EQ(data[i], 0xCD) << i;
}

// --- the representation enumeration -------------------------------------------------------------

TEST_F(TDNumericTest, RepresentationEnumeration) {
  const TDRNumeric representation = TDRNumeric::BuildRepresentationEnum();
  ASSERT_TRUE(representation);
  EXPECT_EQ(representation, TDRNumeric::BuildRepresentationEnum());
  EXPECT_EQ(representation.GetTypeCode(), 0x17);
  std::string name;
  EXPECT_EQ(representation.GetName(&name), 0);
  EXPECT_EQ(name, "Numeric Representation");
  const Items expected = {"Extended Precision", "Double Precision", "Single Precision", "Long",
                          "Word",               "Byte",             "Unsigned Long",    "Unsigned Word",
                          "Unsigned Byte",      "Complex Extended", "Complex Double",   "Complex Single",
                          "Quad",               "Unsigned Quad",    "Fixed-Point"};
  const TDREnum items = vellum::As<TDRBasicNumeric>(representation).GetEnum();
  ASSERT_EQ(items.GetNumStrings(), expected.size());
  for (uint32_t i = 0; i < expected.size(); ++i) {
    const uint8_t* item = items.GetEltPStr(i);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(item + 1), item[0]), expected[i]);
  }

  // Index and code are inverse; FixedPoint is 14.
  for (int32_t index = 0; index < 15; ++index) {
    SCOPED_TRACE(index);
    const int32_t code = TDRNumeric::GetTCForNumericRepEnumIndex(index);
    if (index == 14) {
      EXPECT_EQ(code, 0x5F);
    } else {
      EXPECT_EQ(vellum::As<TDRNumeric>(DefaultOf(code)).GetNumericRepEnumIndex(), index);
    }
  }
  EXPECT_EQ(TDRNumeric::GetTCForNumericRepEnumIndex(-1), 0);
  EXPECT_EQ(TDRNumeric::GetTCForNumericRepEnumIndex(15), 0);
  EXPECT_EQ(vellum::As<TDRNumeric>(TDRFloat64(Meters(1), nullptr)).GetNumericRepEnumIndex(), 1);
  EXPECT_EQ(TDRNumeric(GetBoolTD().GetImpPtr(), 1, 0).GetNumericRepEnumIndex(), -1);

  uint32_t value = 99;
  EXPECT_EQ(representation.GetRepresentationEnumValue(GetuW(), &value), 0);
  EXPECT_EQ(value, 7u);
  EXPECT_EQ(representation.GetRepresentationEnumValue(GetBoolTD(), &value), 1);
  EXPECT_EQ(value, 7u);
}

// --- attributes, dump, factories --------------------------------------------------------------------

TEST_F(TDNumericTest, CopyAttributesByMask) {
  TDWFloat64 source(Meters(1), U("length"),
                    TDWTypedef(QualifiedName(), 3, nullptr));
  ASSERT_EQ(source.SetNoSelectMask(1), 0);
  const TDR from = source.CheckIn();

  TDWFloat64 names;
  EXPECT_EQ(names.CopyAttributes(from, 0x1), 1);
  EXPECT_EQ(names.GetTypeCode(), 0x1A);
  EXPECT_EQ(names.IsNoSelectTD(), 8);
  EXPECT_EQ(names.HasTypedef(), 0);
  std::string name;
  EXPECT_EQ(names.GetName(&name), 0);
  EXPECT_EQ(name, "length");

  TDWFloat64 links;
  EXPECT_EQ(links.CopyAttributes(from, 0x2), 1);
  EXPECT_EQ(links.HasTypedef(), 1);
  EXPECT_EQ(links.HasName(), 0);
  EXPECT_EQ(links.HasUnits(), 0);

  TDWFloat64 nothing;
  EXPECT_EQ(nothing.CopyAttributes(from, 0), 0);
  EXPECT_EQ(nothing.CopyAttributes(GetBoolTD(), 0x3), 0);
  EXPECT_EQ(nothing.HasName(), 0);

  // Enumerations come across too; the copy is private.
  TDWUInt8 byte;
  const TDR enumerated = TDRUInt8(MakeEnum({"a"}), nullptr);
  EXPECT_EQ(byte.CopyAttributes(enumerated, 0x1), 1);
  EXPECT_EQ(byte.GetTypeCode(), 0x15);
  EXPECT_EQ(byte.GetEnum().AppendString("b"), 0);
  EXPECT_EQ(vellum::As<TDRUInt8>(enumerated).GetEnum().GetNumStrings(), 1u);
}

TEST_F(TDNumericTest, DebugDump) {
  TDWUInt16 type(MakeEnum({"a"}), U("n"));
  ASSERT_EQ(type.SetNumFlags(0x0B), 0);
  DebugCapture capture;
  EXPECT_EQ(type.PrintDebugStr(U(">")), 0);
  const std::vector<std::string> texts = capture.Texts();
  ASSERT_GE(texts.size(), 5u);
  EXPECT_EQ(texts.front(), ">TypeDescriptor {");
  EXPECT_EQ(texts[1], ">\t\ttype = uInt16");
  EXPECT_EQ(texts[texts.size() - 2], " numFlags= 0x0b");
  EXPECT_EQ(texts.back(), ">\t}");
  EXPECT_NE(std::find(texts.begin(), texts.end(), ">\tenum = {"), texts.end());
  EXPECT_NE(std::find(texts.begin(), texts.end(), ">\t\ta"), texts.end());
  for (const DebugMessage& m : capture.Messages()) EXPECT_EQ(m.level, 0);
}

TEST_F(TDNumericTest, FactoriesByCode) {
  for (const KindCase& k : kKinds) {
    SCOPED_TRACE(k.name);
    TDTypeFactory* factory = GetTypeFactory(k.code);
    ASSERT_NE(factory, nullptr);
    const bool modifiable = (k.code >= kUInt8 && k.code <= kUInt32) || k.code >= kFloat32;
    EXPECT_EQ(GetTypeFactory(k.code | 0x10) == factory, modifiable);
    int32_t status = -1;
    const TDW empty(factory->CreateTD(nullptr, static_cast<uint16_t>(k.code), &status), 1);
    ASSERT_TRUE(empty);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(empty.GetTypeCode(), k.code);
    EXPECT_EQ(empty.IsReadOnlyTD(), 0);
    EXPECT_EQ(empty.CheckIn(), k.getter());
    EXPECT_EQ(factory->CreateUnflattenHandler(static_cast<int16_t>(k.code)), k.getter().GetImpPtr());
  }
}

// One record of `code` with `payload` in a type string; its one entry follows only when
// `complete`, so that an incomplete payload ends the bytes.
std::vector<uint8_t> OneRecord(int32_t code, const std::vector<uint8_t>& payload, bool complete) {
  const size_t size = 4 + payload.size();
  std::vector<uint8_t> bytes = {0x00, 0x00, 0x00, 0x01, static_cast<uint8_t>(size >> 8), static_cast<uint8_t>(size),
                                0x00, static_cast<uint8_t>(code)};
  bytes.insert(bytes.end(), payload.begin(), payload.end());
  if (complete) bytes.insert(bytes.end(), {0x00, 0x01, 0x00, 0x00});
  return bytes;
}

TEST_F(TDNumericTest, FactoryReadsMembersAndFlagByte) {
  const BigEndianizer bigEndian;
  const PersistTDData persist(0x22308000);
  struct Case {
    const char* name;
    int32_t code;
    std::vector<uint8_t> payload;
    int32_t status;
    TDR expected;
  };
  TDWFloat64 flagged(Meters(2), nullptr);
  ASSERT_EQ(flagged.SetNumFlags(7), 0);
  TDWUInt8 enumerated(MakeEnum({"a", "bc"}), nullptr);
  ASSERT_EQ(enumerated.SetNumFlags(1), 0);
  const Case kCases[] = {
      {"Units", 0x1A, {0x00, 0x01, 0x00, 0x03, 0x00, 0x02, 0x07}, 0, flagged.CheckIn()},
      {"Enum", 0x15, {0x00, 0x02, 0x01, 0x61, 0x02, 0x62, 0x63, 0x00, 0x01}, 0, enumerated.CheckIn()},
      {"Plain", 0x03, {0x00}, 0, GetiL()},
      {"Truncated", 0x1A, {0x00, 0x01, 0x00, 0x03}, 74, TDR()},
      {"NoFlagByte", 0x1A, {0x00, 0x00}, 74, TDR()},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const std::vector<uint8_t> bytes = OneRecord(c.code, c.payload, c.status == 0);
    InputBuf in(bytes.data(), bytes.size());
    KoDataReader reader(&persist, &in, &bigEndian, 0);
    const TDR read = reader.ReadTD();
    EXPECT_EQ(reader.GetError(), c.status);
    EXPECT_EQ(read, c.expected);
    if (c.status != 0) continue;
    EXPECT_EQ(read.GetTypeCode(), c.code);
    EXPECT_EQ(reader.BytesLeft(), 0u);
  }
}

TEST_F(TDNumericTest, NumbersDoNotMutateBooleans) {
  TDImpPtr imp = TDWInt8().GetImpPtr();
  const TDImpPtr before = imp;
  EXPECT_EQ(MutateBooleanTD(&imp, 1), 0);
  EXPECT_EQ(MutateBooleanTD(&imp, 0), 0);
  EXPECT_EQ(imp, before);
}

// --- running out of memory ------------------------------------------------------------------------

TEST_F(TDNumericTest, CheckInSurvivesEveryAllocationFailure) {
  TDWUInt32 type(MakeEnum({"one", "two", "three"}), U("counted"));
  ASSERT_EQ(type.SetNumFlags(3), 0);
  TDR reference;
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 200);
    TDR result;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      result = type.CheckIn();
      fired = failure.Fired();
    }
    if (!fired) {
      ASSERT_TRUE(result);
      reference = result;
      break;
    }
    EXPECT_FALSE(result);
    EXPECT_EQ(type.GetTypeCode(), 0x17);
    EXPECT_EQ(type.GetEnum().GetNumStrings(), 3u);
  }
  EXPECT_EQ(type.CheckIn(), reference);
}

TEST_F(TDNumericTest, ConstructionSurvivesEveryAllocationFailure) {
  const TDWUnits units = Meters(2);
  const TDWEnum items = MakeEnum({"a", "b"});
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 200);
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      const TDRFloat32 a(units, U("a"));
      const TDWUInt8 b(items, U("b"));
      const TDRComplexExt c;
      fired = failure.Fired();
      if (!fired) {
        EXPECT_TRUE(a && b && c);
      } else {
        EXPECT_TRUE(!a || !b || !c);
      }
    }
    if (!fired) break;
  }
}

}  // namespace
