// Units: key normalisation and the setters, hash, equality and sorting order, the flattened form
// and its reader on hostile or truncated bytes, the dump, interning and running out of memory.
// Units travel only inside the record of a floating or complex number, so their stored form is
// checked there.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeStringRecords.h"
#include "support/TypeSystemFixture.h"
#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "vellum/TypeStrings.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDUnitsHandles.h"
#include "vellum.h"

namespace {

using records::Bytes;
using Powers = std::vector<std::pair<TDBaseUnits, int16_t>>;

using records::kVersion;
constexpr uint8_t kFloat64WithUnits = 0x1A;
constexpr size_t kUnitsPartOffset = records::kPartOffset;
const BigEndianizer kBigEndian;

class TDUnitsTest : public TypeSystemTest {};

TDWUnits Make(const Powers& powers) {
  TDWUnits units;
  for (const auto& [unit, exponent] : powers) EXPECT_EQ(units.SetUnit(unit, exponent), 0);
  return units;
}

template <class Handle>
Powers PowersOf(const Handle& units) {
  Powers powers;
  for (uint32_t i = 0; i < units.GetNumUnits(); ++i) {
    TDUnitPair pair;
    EXPECT_EQ(units.GetUnits(i, &pair), 0);
    powers.emplace_back(pair.unit, pair.exponent);
  }
  return powers;
}

// The type string of one record that carries `unitsPart`, then the flag byte 0 and the list's one entry.
Bytes RecordWith(const Bytes& unitsPart) { return records::OneRecordWith(kFloat64WithUnits, unitsPart); }

using records::Load;
using records::Loaded;
using records::Saved;

TDRUnits UnitsOf(const TDR& type) { return vellum::As<TDRNumeric>(type).GetUnits(); }

int32_t Sign(int32_t value) { return (value > 0) - (value < 0); }


// ---- keys and setters ----

struct KeyCase {
  TDBaseUnits key;
  int32_t status;
  TDBaseUnits stored;
};

const KeyCase kKeyCases[] = {
    {kUnitRadians, 0, kUnitRadians},
    {kUnitCandelas, 0, kUnitCandelas},
    {kUnitInvalid, 0, kUnitInvalid},
    {10, 1, 0},
    {std::numeric_limits<int32_t>::max(), 1, 0},
    {-1, 0, -1},
    {-9, 0, -9},
    {-10, 0, kUnitRadians},
    {-11, 0, -1},
    {-12, 0, -2},
    {-19, 0, -9},
    {std::numeric_limits<int32_t>::min(), 0, -8},
};

TEST_F(TDUnitsTest, SetUnitNormalisesTheKey) {
  for (const KeyCase& c : kKeyCases) {
    SCOPED_TRACE(c.key);
    TDWUnits units = Make({{kUnitSeconds, -1}});
    const int32_t hashBefore = units.GetHashValue();
    EXPECT_EQ(units.SetUnit(c.key, 3), c.status);
    if (c.status != 0) {
      EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -1}}));
      EXPECT_EQ(units.GetHashValue(), hashBefore);
      EXPECT_EQ(units.IncreaseExponent(c.key, 1), c.status);
      EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -1}}));
      EXPECT_EQ(units.GetExponent(c.key), 0);
      continue;
    }
    EXPECT_EQ(units.GetExponent(c.stored), 3);
    EXPECT_EQ(units.GetExponent(c.key), 3);
    EXPECT_EQ(units.GetNumUnits(), 2u);
    EXPECT_EQ(units.IncreaseExponent(c.key, -3), 0);
    EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -1}}));
  }
}

TEST_F(TDUnitsTest, SettersKeepNoZeroExponent) {
  TDWUnits units = Make({{kUnitMeters, 2}, {kUnitSeconds, -2}});
  EXPECT_EQ(units.SetUnit(kUnitMeters, 0), 0);
  EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -2}}));
  EXPECT_EQ(units.SetUnit(kUnitKelvins, 0), 0);
  EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -2}}));

  TDWUnits climbed;
  EXPECT_EQ(climbed.IncreaseExponent(kUnitMeters, 1), 0);
  EXPECT_EQ(climbed.IncreaseExponent(kUnitMeters, 1), 0);
  EXPECT_EQ(climbed.GetExponent(kUnitMeters), 2);
  EXPECT_EQ(climbed.IncreaseExponent(kUnitMeters, -2), 0);
  EXPECT_EQ(climbed.GetNumUnits(), 0u);
  EXPECT_EQ(climbed.GetHashValue(), 0);
  EXPECT_EQ(climbed.CheckIn(), TDWUnits().CheckIn());

  EXPECT_EQ(units.ClearAllUnits(), 0);
  EXPECT_EQ(units.GetNumUnits(), 0u);
}

TEST_F(TDUnitsTest, IncreaseExponentRefusesToWrap) {
  TDWUnits units = Make({{kUnitMeters, std::numeric_limits<int16_t>::max()}, {kUnitSeconds, -30000}});
  EXPECT_EQ(units.IncreaseExponent(kUnitMeters, 1), kStatusBadArgument);
  EXPECT_EQ(units.IncreaseExponent(kUnitSeconds, -3000), kStatusBadArgument);
  EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -30000}, {kUnitMeters, 32767}}));
  EXPECT_EQ(units.IncreaseExponent(kUnitSeconds, -2768), 0);
  EXPECT_EQ(units.GetExponent(kUnitSeconds), std::numeric_limits<int16_t>::min());
}

TEST_F(TDUnitsTest, EntriesComeInKeyOrder) {
  TDWUnits units;
  units << std::pair{kUnitCandelas, int16_t{1}} << std::pair{PolymorphicUnit(3), int16_t{2}}
        << std::pair{kUnitRadians, int16_t{-1}} << std::pair{kUnitCandelas, int16_t{1}};
  EXPECT_EQ(PowersOf(units), (Powers{{-3, 2}, {kUnitRadians, -1}, {kUnitCandelas, 2}}));
  TDUnitPair pair{7, 7};
  EXPECT_EQ(units.GetUnits(3, &pair), kStatusBadArgument);
  EXPECT_EQ(pair.unit, 7);
  EXPECT_EQ(units.GetUnits(0, nullptr), kStatusBadArgument);
}

TEST_F(TDUnitsTest, HasPolyUnits) {
  EXPECT_EQ(TDWUnits().HasPolyUnits(), 0);
  EXPECT_EQ(Make({{kUnitMeters, 1}}).HasPolyUnits(), 0);
  EXPECT_EQ(Make({{kUnitMeters, 1}, {-9, -1}}).HasPolyUnits(), 1);
  EXPECT_EQ(Make({{-12, 1}}).CheckIn().HasPolyUnits(), 1);
}

TEST_F(TDUnitsTest, NullHandleAnswers42AndNothingElse) {
  TDWUnits null(TDUnitsImpPtr(), 1);
  EXPECT_FALSE(null);
  EXPECT_EQ(null.SetUnit(kUnitMeters, 1), kStatusNullHandle);
  EXPECT_EQ(null.IncreaseExponent(kUnitMeters, 1), kStatusNullHandle);
  EXPECT_EQ(null.ClearAllUnits(), kStatusNullHandle);
  null << std::pair{kUnitMeters, int16_t{1}};
  TDUnitPair pair;
  EXPECT_EQ(null.GetUnits(0, &pair), kStatusNullHandle);
  EXPECT_EQ(null.GetNumUnits(), 0u);
  EXPECT_EQ(null.GetExponent(kUnitMeters), 0);
  EXPECT_EQ(null.HasPolyUnits(), 0);
  EXPECT_FALSE(null.IsSane());
  EXPECT_FALSE(null.CheckIn());
  EXPECT_FALSE(null.Clone());
  EXPECT_EQ(null.IsUnitsAttribute(), 0);

  const TDRUnits readOnly;
  EXPECT_FALSE(readOnly.CheckOut());
  EXPECT_EQ(readOnly.UnitsMatch(readOnly), 0);
  EXPECT_EQ(readOnly.UnitsMatch(Make({}).CheckIn()), 0);

}

TEST_F(TDUnitsTest, AnObjectWithoutStorageHasNoUnits) {
  TDWUnits units = [] {
    ScopedAllocationFailure failure(2);  // the object is made, its map is not
    return TDWUnits();
  }();
  ASSERT_TRUE(units);
  EXPECT_EQ(units.IsUnitsAttribute(), 1);
  EXPECT_FALSE(units.IsSane());
  EXPECT_EQ(units.SetUnit(kUnitMeters, 1), kStatusNullHandle);
  EXPECT_EQ(units.IncreaseExponent(kUnitMeters, 1), kStatusNullHandle);
  EXPECT_EQ(units.ClearAllUnits(), kStatusNullHandle);
  EXPECT_EQ(units.GetNumUnits(), 0u);
  EXPECT_EQ(units.GetHashValue(), 0);

  DebugCapture capture;
  units.PrintDebugStr();
  EXPECT_TRUE(capture.Messages().empty());

  // It has no units, so it interns as the empty units, which have their storage; a number that
  // carries it is saved with empty units.
  const TDRUnits interned = units.CheckIn();
  EXPECT_EQ(interned, TDWUnits().CheckIn());
  EXPECT_TRUE(interned.IsSane());
  EXPECT_TRUE(units.Clone().IsSane());
  TDWFloat64 number;
  ASSERT_EQ(number.SetUnits(units), 0);
  const TDR saved = number.CheckIn();
  EXPECT_EQ(UnitsOf(saved), interned);
  EXPECT_EQ(Saved(saved), RecordWith({0x00, 0x00}));
}

// ---- hash, equality, order ----

TEST_F(TDUnitsTest, HashOfKnownUnits) {
  // rotate-left(h + exponent * 256 + key, i) over the entries in key order.
  EXPECT_EQ(Make({}).GetHashValue(), 0);
  EXPECT_EQ(Make({{kUnitMeters, 2}}).GetHashValue(), 0x406);
  EXPECT_EQ(Make({{kUnitMeters, 1}, {kUnitSeconds, -1}}).GetHashValue(), static_cast<int32_t>(0xFFFFFC23));
  EXPECT_EQ(Make({{kUnitKilograms, 1}, {-2, -3}}).GetHashValue(), static_cast<int32_t>(0xFFFFEC07));
}

struct EqualityCase {
  const char* name;
  Powers a;
  Powers b;
  bool equal;
};

const EqualityCase kEqualityCases[] = {
    {"Empty", {}, {}, true},
    {"SameEntry", {{kUnitMeters, 2}}, {{kUnitMeters, 2}}, true},
    {"OtherExponent", {{kUnitMeters, 2}}, {{kUnitMeters, 3}}, false},
    {"OtherKey", {{kUnitMeters, 2}}, {{kUnitSeconds, 2}}, false},
    {"MoreEntries", {{kUnitMeters, 2}}, {{kUnitMeters, 2}, {kUnitSeconds, -1}}, false},
    {"PolymorphicIsNotBase", {{-3, 1}}, {{3, 1}}, false},
    {"NormalisedKey", {{-13, 1}}, {{-3, 1}}, true},
    {"BuildingOrder", {{kUnitMeters, 1}, {kUnitSeconds, -1}}, {{kUnitSeconds, -1}, {kUnitMeters, 1}}, true},
};

TEST_F(TDUnitsTest, Equality) {
  for (const EqualityCase& c : kEqualityCases) {
    SCOPED_TRACE(c.name);
    const TDWUnits a = Make(c.a);
    const TDWUnits b = Make(c.b);
    // The private objects themselves, before interning can make them one.
    const TDRUnits privateA(a.GetUnitsImpPtr(), 1);
    const TDRUnits privateB(b.GetUnitsImpPtr(), 1);
    EXPECT_EQ(privateA.UnitsMatch(privateB), c.equal ? 1 : 0);
    EXPECT_EQ(privateB.UnitsMatch(privateA), c.equal ? 1 : 0);
    EXPECT_EQ(a.CheckIn() == b.CheckIn(), c.equal);
    EXPECT_EQ(a.CheckIn().UnitsMatch(b.CheckIn()), c.equal ? 1 : 0);
    EXPECT_EQ(TDRFloat64(a, nullptr) == TDRFloat64(b, nullptr), c.equal);
  }
}

struct OrderCase {
  const char* name;
  Powers a;
  Powers b;
  int32_t order;  // the order of two numbers that differ only in these units
};

// Private numbers, so that equal units are still compared rather than found to be one object.
int32_t UnitsOrder(const Powers& a, const Powers& b) {
  return TDWFloat64(Make(a), nullptr).CompareForSorting(TDWFloat64(Make(b), nullptr));
}

const OrderCase kOrderCases[] = {
    {"Equal", {{kUnitMeters, 1}, {kUnitSeconds, -1}}, {{kUnitSeconds, -1}, {kUnitMeters, 1}}, 0},
    {"FewerEntriesFirst", {{kUnitMeters, 5}}, {{kUnitMeters, 1}, {kUnitSeconds, 1}}, -1},
    {"CountDifference", {{kUnitMeters, 1}, {kUnitSeconds, 1}, {kUnitKelvins, 1}}, {{kUnitMeters, 1}}, 2},
    {"ExponentDifference", {{kUnitMeters, 3}}, {{kUnitMeters, 1}}, 2},
    {"LowestKeyDecides", {{kUnitSeconds, 1}, {kUnitMeters, 9}}, {{kUnitSeconds, 2}, {kUnitMeters, 1}}, -1},
    // Each side has a key the other lacks: the lowest such key decides, in both directions.
    {"DisjointKeys", {{kUnitSeconds, 1}, {kUnitMeters, 1}}, {{kUnitMeters, 1}, {kUnitKilograms, 1}}, 1},
    {"DisjointKeysReversed", {{kUnitMeters, 1}, {kUnitKilograms, 1}}, {{kUnitSeconds, 1}, {kUnitMeters, 1}}, -1},
};

TEST_F(TDUnitsTest, SortingOrder) {
  for (const OrderCase& c : kOrderCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(UnitsOrder(c.a, c.b), c.order);
  }
}

TEST_F(TDUnitsTest, SortingOrderIsAntisymmetricAndAgreesWithEquality) {
  const std::vector<Powers> all = {
      {},
      {{kUnitMeters, 1}},
      {{kUnitMeters, -1}},
      {{kUnitSeconds, 1}},
      {{-1, 1}},
      {{kUnitSeconds, 1}, {kUnitMeters, 1}},
      {{kUnitMeters, 1}, {kUnitKilograms, 1}},
      {{kUnitSeconds, 1}, {kUnitKilograms, 1}},
      {{-9, 2}, {kUnitInvalid, 1}},
  };
  for (size_t i = 0; i < all.size(); ++i) {
    for (size_t j = 0; j < all.size(); ++j) {
      SCOPED_TRACE(testing::Message() << i << " vs " << j);
      const int32_t ab = UnitsOrder(all[i], all[j]);
      const int32_t ba = UnitsOrder(all[j], all[i]);
      EXPECT_EQ(Sign(ab), -Sign(ba));
      EXPECT_EQ(ab == 0, i == j);
    }
  }
}

// ---- flattened form ----

struct FlatCase {
  const char* name;
  Powers powers;
  Bytes bytes;
};

const FlatCase kFlatCases[] = {
    {"Empty", {}, {0x00, 0x00}},
    {"MetersSquared", {{kUnitMeters, 2}}, {0x00, 0x01, 0x00, 0x03, 0x00, 0x02}},
    {"MetersPerSecond",
     {{kUnitMeters, 1}, {kUnitSeconds, -1}},
     {0x00, 0x02, 0x00, 0x02, 0xFF, 0xFF, 0x00, 0x03, 0x00, 0x01}},
    {"PolymorphicFirst",
     {{kUnitCandelas, 300}, {PolymorphicUnit(2), -3}},
     {0x00, 0x02, 0xFF, 0xFE, 0xFF, 0xFD, 0x00, 0x08, 0x01, 0x2C}},
};

TEST_F(TDUnitsTest, FlattenedBytes) {
  for (const FlatCase& c : kFlatCases) {
    SCOPED_TRACE(c.name);
    const TDRFloat64 number(Make(c.powers), nullptr);
    ASSERT_TRUE(number);
    // The record's size field counts the units part as its flattened size.
    const Bytes record = RecordWith(c.bytes);
    EXPECT_EQ(Saved(number), record);

    Bytes followed = record;
    followed.push_back(0xAB);
    const Loaded loaded = Load(followed);
    EXPECT_EQ(loaded.status, 0);
    EXPECT_EQ(loaded.consumed, record.size());
    EXPECT_EQ(loaded.type, number);
    EXPECT_EQ(PowersOf(UnitsOf(loaded.type)), PowersOf(Make(c.powers)));
  }
}

TEST_F(TDUnitsTest, ReadingNormalisesEntries) {
  // Polymorphic key -12, a zero exponent, a key given twice (the later one wins).
  const Bytes bytes = {0x00, 0x04, 0xFF, 0xF4, 0x00, 0x01, 0x00, 0x05, 0x00, 0x00,
                       0x00, 0x03, 0x00, 0x01, 0x00, 0x03, 0x00, 0x02};
  const Loaded loaded = Load(RecordWith(bytes));
  ASSERT_EQ(loaded.status, 0);
  EXPECT_EQ(PowersOf(UnitsOf(loaded.type)), (Powers{{-2, 1}, {kUnitMeters, 2}}));
  // Saved again, the entries are in their canonical form.
  EXPECT_EQ(Saved(loaded.type), RecordWith({0x00, 0x02, 0xFF, 0xFE, 0x00, 0x01, 0x00, 0x03, 0x00, 0x02}));
}

TEST_F(TDUnitsTest, ReadingAKeyAboveNineFails) {
  const Bytes bytes = RecordWith({0x00, 0x02, 0x00, 0x03, 0x00, 0x01, 0x00, 0x0A, 0x00, 0x01, 0x12, 0x34});
  const PersistTDData persist(kVersion);
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&persist, &in, &kBigEndian, 0);
  EXPECT_FALSE(reader.ReadTD());
  EXPECT_EQ(reader.GetError(), kStatusBadArgument);
  uint16_t next = 7;
  EXPECT_EQ(reader.ReadU16(&next), kStatusBadArgument);  // the reader keeps the error
  TMTypeList list;
  EXPECT_EQ(UnFlattenListOfTypes(&persist, bytes.data(), static_cast<uint32_t>(bytes.size()), &list, nullptr, 0,
                                 &kBigEndian),
            kStatusOutOfMemory);
}

TEST_F(TDUnitsTest, TruncatedInputGivesAStatus) {
  const Bytes whole = RecordWith(kFlatCases[3].bytes);
  for (size_t length = 0; length < kFlatCases[3].bytes.size(); ++length) {
    SCOPED_TRACE(length);
    LiveBlockCheck blocks;
    const Loaded loaded = Load(Bytes(whole.begin(), whole.begin() + kUnitsPartOffset + length));
    EXPECT_EQ(loaded.status, kStatusCorruptData);
    EXPECT_FALSE(loaded.type);
  }
  // A huge count with nothing behind it stops at the end of the bytes.
  LiveBlockCheck blocks;
  const Bytes huge = RecordWith({0xFF, 0xFF, 0x00, 0x01});
  const Loaded loaded = Load(Bytes(huge.begin(), huge.begin() + kUnitsPartOffset + 4));
  EXPECT_EQ(loaded.status, kStatusCorruptData);
  EXPECT_FALSE(loaded.type);
}

// ---- dump ----

TEST_F(TDUnitsTest, DebugDump) {
  const TDWUnits units = Make({{kUnitMeters, 2}, {PolymorphicUnit(2), -1}, {kUnitInvalid, 1}});
  {
    DebugCapture capture;
    units.PrintDebugStr();
    EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"# of units = 3", "units = {", "\tpolymorphic unit 2 ^ -1",
                                                         "\tmeters ^ 2", "\tinvalid unit ^ 1", "\t}"}));
    for (const DebugMessage& m : capture.Messages()) {
      EXPECT_EQ(m.level, 0);
      EXPECT_EQ(m.module, "TDUnits");
    }
  }
  // Inside a number's dump the units lines carry the prefix the number's lines carry.
  DebugCapture capture;
  TDRFloat64(Make({{kUnitSteradians, -4}}), nullptr).PrintDebugStr(U("  "));
  const std::vector<std::string> texts = capture.Texts();
  const std::vector<std::string> unitsLines = {"  \t# of units = 1", "  \tunits = {", "  \t\tsteradians ^ -4",
                                               "  \t\t}"};
  EXPECT_NE(std::search(texts.begin(), texts.end(), unitsLines.begin(), unitsLines.end()), texts.end())
      << testing::PrintToString(texts);
}

// ---- interning ----

TEST_F(TDUnitsTest, CheckInCheckOutAndClone) {
  TDWUnits units = Make({{kUnitAmperes, 1}, {kUnitSeconds, 1}});
  const TDRUnits interned = units.CheckIn();
  ASSERT_TRUE(interned);
  EXPECT_NE(interned.GetUnitsImpPtr(), units.GetUnitsImpPtr());
  EXPECT_EQ(interned.GetNumUnits(), 2u);
  EXPECT_EQ(units.SetUnit(kUnitSeconds, 2), 0);  // the writable object stays private
  EXPECT_EQ(interned.GetExponent(kUnitSeconds), 1);
  EXPECT_NE(units.CheckIn(), interned);

  TDWUnits checkedOut = interned.CheckOut();
  ASSERT_TRUE(checkedOut);
  EXPECT_NE(checkedOut.GetUnitsImpPtr(), interned.GetUnitsImpPtr());
  EXPECT_EQ(checkedOut.CheckIn(), interned);
  TDWUnits clone = checkedOut.Clone();
  EXPECT_EQ(clone.SetUnit(kUnitAmperes, 0), 0);
  EXPECT_EQ(checkedOut.GetNumUnits(), 2u);
  EXPECT_EQ(clone.CheckIn(), Make({{kUnitSeconds, 1}}).CheckIn());
}

// ---- running out of memory ----

TEST_F(TDUnitsTest, SetUnitRunningOutOfMemoryChangesNothing) {
  TDWUnits units = Make({{kUnitMeters, 1}});
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    const int32_t status = units.SetUnit(kUnitSeconds, -1);
    if (status != 0) EXPECT_EQ(PowersOf(units), (Powers{{kUnitMeters, 1}}));
    else EXPECT_EQ(units.SetUnit(kUnitSeconds, 0), 0);
    return status;
  });
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    const int32_t status = units.IncreaseExponent(kUnitKelvins, 2);
    if (status != 0) EXPECT_EQ(PowersOf(units), (Powers{{kUnitMeters, 1}}));
    else EXPECT_EQ(units.SetUnit(kUnitKelvins, 0), 0);
    return status;
  });
}

TEST_F(TDUnitsTest, UnFlattenRunningOutOfMemory) {
  const Bytes bytes = RecordWith(kFlatCases[3].bytes);
  // Interned first, so that a load that fails leaves no half-interned member behind.
  const TDRFloat64 expected(Make(kFlatCases[3].powers), nullptr);
  int32_t storageRefusals = 0;
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100) << "never succeeded";
    LiveBlockCheck blocks;
    Loaded loaded;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      loaded = Load(bytes);
      fired = failure.Fired();
    }
    if (!fired || loaded.type) {  // some room is only reserved ahead, and the load does without
      EXPECT_EQ(loaded.status, 0);
      EXPECT_EQ(loaded.type, expected);
      if (!fired) break;
      continue;
    }
    EXPECT_FALSE(loaded.type);
    // A units object made without its storage refuses to be read into (42); any other failure,
    // the entries' among them, is out of memory.
    if (loaded.status == kStatusNullHandle) ++storageRefusals;
    else EXPECT_EQ(loaded.status, kStatusOutOfMemory);
  }
  EXPECT_LE(storageRefusals, 1);
}

TEST_F(TDUnitsTest, CheckInAndCloneRunningOutOfMemory) {
  const TDWUnits units = Make({{kUnitMeters, 1}, {kUnitSeconds, -2}});
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    const TDWUnits clone = units.Clone();
    if (!clone) return kStatusOutOfMemory;
    EXPECT_TRUE(clone.IsSane());
    EXPECT_EQ(PowersOf(clone), PowersOf(units));
    return kStatusNoError;
  });
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100);
    TDRUnits interned;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      interned = units.CheckIn();
      fired = failure.Fired();
    }
    EXPECT_EQ(PowersOf(units), (Powers{{kUnitSeconds, -2}, {kUnitMeters, 1}}));
    if (!fired) {
      ASSERT_TRUE(interned);
      EXPECT_EQ(interned, units.CheckIn());
      break;
    }
    EXPECT_FALSE(interned);
  }
}

}  // namespace
