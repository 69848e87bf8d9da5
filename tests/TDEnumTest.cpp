// Enumerations: editing and its statuses, hash, equality, the prefix comparison and the sorting
// order, the flattened form with its pad byte and its reader on hostile or truncated bytes, the
// dump, interning and running out of memory. Enumerations travel only inside the record of an
// unsigned integer, so their stored form is checked there.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeStringRecords.h"
#include "support/TypeSystemFixture.h"
#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "vellum/TypeStrings.h"
#include "vellum/TDEnumHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum.h"

namespace {

using records::Bytes;
using Items = std::vector<std::string>;

using records::kVersion;
constexpr uint8_t kEnumUInt8 = 0x15;
constexpr size_t kEnumPartOffset = records::kPartOffset;
// The item count is stored in 16 bits.
constexpr uint32_t kMaxFlatItems = 0xFFFF;
const BigEndianizer kBigEndian;

class TDEnumTest : public TypeSystemTest {};

TDWEnum Make(const Items& items) {
  TDWEnum enumeration;
  for (const std::string& item : items) EXPECT_EQ(enumeration.AppendString(item.data(), item.size()), 0);
  return enumeration;
}

template <class Handle>
Items ItemsOf(const Handle& enumeration) {
  Items items;
  for (uint32_t i = 0; i < enumeration.GetNumStrings(); ++i) {
    const uint8_t* item = enumeration.GetEltPStr(i);
    items.emplace_back(reinterpret_cast<const char*>(item + 1), item[0]);
  }
  return items;
}

// The type string of one record that carries `enumPart`, then the flag byte 0 and the list's one entry.
Bytes RecordWith(const Bytes& enumPart) { return records::OneRecordWith(kEnumUInt8, enumPart); }

using records::Load;
using records::Loaded;
using records::Saved;

TDREnum EnumOf(const TDR& type) { return vellum::As<TDRBasicNumeric>(type).GetEnum(); }

int32_t Sign(int32_t value) { return (value > 0) - (value < 0); }

const uint8_t* PStr(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

// Fails the 1st, 2nd, ... allocation of `operation` on a fresh enumeration of `items` until it
// succeeds. Each failure must give one of the statuses `allowed` and leave the items as they
// were; success must leave `after`.
template <class Operation>
void SweepAllocationFailures(const Items& items, std::vector<int32_t> allowed, const Items& after,
                             Operation&& operation) {
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100) << "never succeeded";
    LiveBlockCheck blocks;
    TDWEnum enumeration = Make(items);
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      status = operation(enumeration);
      fired = failure.Fired();
    }
    if (!fired) {
      EXPECT_EQ(status, 0);
      EXPECT_EQ(ItemsOf(enumeration), after);
      EXPECT_GT(nth, 1) << "the operation allocated nothing that could fail";
      return;
    }
    EXPECT_NE(std::find(allowed.begin(), allowed.end(), status), allowed.end()) << status;
    EXPECT_EQ(ItemsOf(enumeration), items);
  }
}

// ---- editing ----

TEST_F(TDEnumTest, AppendingInAllItsForms) {
  TDWEnum enumeration;
  EXPECT_EQ(enumeration.AppendString("Red"), 0);
  EXPECT_EQ(enumeration.AppendString("Gr\0en", 5), 0);  // the given length, zero byte included
  EXPECT_EQ(enumeration.AppendPStr(PStr("\x04" "Blue")), 0);
  EXPECT_EQ(enumeration.AppendString("", 0), 0);
  enumeration << "Cyan" << PStr("\x03" "Tan");
  EXPECT_EQ(ItemsOf(enumeration), (Items{"Red", std::string("Gr\0en", 5), "Blue", "", "Cyan", "Tan"}));
}

TEST_F(TDEnumTest, ALongItemKeepsItsFirst255Bytes) {
  const std::string longText(300, 'x');
  TDWEnum enumeration;
  EXPECT_EQ(enumeration.AppendString(longText.c_str()), 0);
  EXPECT_EQ(enumeration.InsertStringAt(longText.c_str(), 0), 0);
  EXPECT_EQ(enumeration.ReplaceStringAt(longText.c_str(), 1), 0);
  EXPECT_EQ(ItemsOf(enumeration), (Items{std::string(255, 'x'), std::string(255, 'x')}));
}

struct EditCase {
  const char* name;
  int32_t (*edit)(TDWEnum&);
  int32_t status;
  Items after;  // starting from "a", "b"
};

const EditCase kEditCases[] = {
    {"InsertAtStart", [](TDWEnum& e) { return e.InsertStringAt("x", 0); }, 0, {"x", "a", "b"}},
    {"InsertInside", [](TDWEnum& e) { return e.InsertStringAt("x", 1); }, 0, {"a", "x", "b"}},
    {"InsertAtCountAppends", [](TDWEnum& e) { return e.InsertStringAt("x", 2); }, 0, {"a", "b", "x"}},
    {"InsertPastTheEnd", [](TDWEnum& e) { return e.InsertStringAt("x", 3); }, 1, {"a", "b"}},
    {"InsertNull", [](TDWEnum& e) { return e.InsertStringAt(nullptr, 0); }, 1, {"a", "b"}},
    {"ReplaceLast", [](TDWEnum& e) { return e.ReplaceStringAt("x", 1); }, 0, {"a", "x"}},
    {"ReplacePastTheEnd", [](TDWEnum& e) { return e.ReplaceStringAt("x", 2); }, 1, {"a", "b"}},
    {"ReplaceNull", [](TDWEnum& e) { return e.ReplaceStringAt(nullptr, 0); }, 1, {"a", "b"}},
    {"RemoveFirst", [](TDWEnum& e) { return e.RemoveString(0); }, 0, {"b"}},
    {"RemovePastTheEnd", [](TDWEnum& e) { return e.RemoveString(2); }, 1, {"a", "b"}},
    {"RemoveAll", [](TDWEnum& e) { return e.RemoveAllStrings(); }, 0, {}},
    {"Reserve", [](TDWEnum& e) { return e.ReserveStringCount(40); }, 0, {"a", "b"}},
    {"AppendNull", [](TDWEnum& e) { return e.AppendString(nullptr); }, 1, {"a", "b"}},
    {"AppendNullWithLength", [](TDWEnum& e) { return e.AppendString(nullptr, 3); }, 1, {"a", "b"}},
    {"AppendNullPStr", [](TDWEnum& e) { return e.AppendPStr(nullptr); }, 1, {"a", "b"}},
};

TEST_F(TDEnumTest, EditingStatuses) {
  for (const EditCase& c : kEditCases) {
    SCOPED_TRACE(c.name);
    TDWEnum enumeration = Make({"a", "b"});
    const int32_t hashBefore = enumeration.GetHashValue();
    EXPECT_EQ(c.edit(enumeration), c.status);
    EXPECT_EQ(ItemsOf(enumeration), c.after);
    if (c.status != 0) {
      EXPECT_EQ(enumeration.GetHashValue(), hashBefore);
    }
    EXPECT_EQ(enumeration.GetHashValue(), Make(c.after).GetHashValue());
  }
}

TEST_F(TDEnumTest, EditingANullHandleOrAnObjectWithoutStorageGives42) {
  TDWEnum null(TDEnumImpPtr(), 1);
  TDWEnum withoutStorage = [] {
    ScopedAllocationFailure failure(2);  // the object is made, its list is not
    return TDWEnum();
  }();
  ASSERT_TRUE(withoutStorage);
  for (TDWEnum* enumeration : {&null, &withoutStorage}) {
    SCOPED_TRACE(enumeration == &null ? "null" : "without storage");
    for (const EditCase& c : kEditCases) {
      SCOPED_TRACE(c.name);
      EXPECT_EQ(c.edit(*enumeration), kStatusNullHandle);
    }
    *enumeration << "x" << PStr("\x01y");
    EXPECT_EQ(enumeration->GetNumStrings(), 0u);
    EXPECT_EQ(enumeration->GetEltPStr(0), nullptr);
    EXPECT_FALSE(enumeration->IsSane());
    EXPECT_EQ(enumeration->GetHashValue(), 0);
  }
  EXPECT_FALSE(null.CheckIn());
  EXPECT_FALSE(null.Clone());
  EXPECT_FALSE(TDREnum().CheckOut());
  EXPECT_FALSE(TDREnum().IsSane());

  DebugCapture capture;
  withoutStorage.PrintDebugStr();
  EXPECT_TRUE(capture.Messages().empty());
  // Without items it interns as the empty enumeration, which has its storage; a number that
  // carries it is saved with the empty enumeration.
  EXPECT_EQ(withoutStorage.CheckIn(), TDWEnum().CheckIn());
  EXPECT_TRUE(withoutStorage.CheckIn().IsSane());
  TDWUInt8 number;
  ASSERT_EQ(number.SetEnum(withoutStorage), 0);
  const TDR saved = number.CheckIn();
  EXPECT_EQ(EnumOf(saved), TDWEnum().CheckIn());
  EXPECT_EQ(Saved(saved), RecordWith({0x00, 0x00}));
}

// ---- hash, equality, orders ----

TEST_F(TDEnumTest, HashOfKnownItems) {
  // rotate-left(string hash of the item + h, i) over the items.
  EXPECT_EQ(Make({}).GetHashValue(), 0);
  EXPECT_EQ(Make({"a", "bc"}).GetHashValue(), 0x1880);
  EXPECT_EQ(Make({"a", "b"}).GetHashValue(), 0x920);
  EXPECT_EQ(Make({"b", "a"}).GetHashValue(), 0x928);
  EXPECT_EQ(Make({"Red", "Green", "Blue"}).GetHashValue(), 0x8FF0E80);
}

TEST_F(TDEnumTest, EqualItemsInternToOneObject) {
  const TDREnum first = Make({"a", "b"}).CheckIn();
  ASSERT_TRUE(first);
  EXPECT_EQ(Make({"a", "b"}).CheckIn(), first);
  EXPECT_NE(Make({"b", "a"}).CheckIn(), first);
  EXPECT_NE(Make({"a", "b", ""}).CheckIn(), first);
  EXPECT_NE(Make({"a", "B"}).CheckIn(), first);
  // An embedded zero byte ends the hash of an item but not its comparison.
  const TDWEnum zeroA = Make({std::string("a\0x", 3)});
  const TDWEnum zeroB = Make({std::string("a\0y", 3)});
  EXPECT_EQ(zeroA.GetHashValue(), zeroB.GetHashValue());
  EXPECT_NE(zeroA.CheckIn(), zeroB.CheckIn());
}

struct PrefixCase {
  Items a;
  Items b;
  int32_t compare;
};

const PrefixCase kPrefixCases[] = {
    {{"a", "b"}, {"a", "b", "c"}, 1},
    {{"a", "b"}, {"a", "b"}, 3},
    {{"a", "b"}, {"a", "x"}, 0},
    {{"a", "b", "c"}, {"a", "b"}, 2},
    {{"x", "b"}, {"a", "b", "c"}, 0},
    {{}, {}, 3},
    {{}, {"a"}, 1},
};

TEST_F(TDEnumTest, PrefixComparison) {
  for (const PrefixCase& c : kPrefixCases) {
    SCOPED_TRACE(testing::PrintToString(c.a) + " vs " + testing::PrintToString(c.b));
    const TDWEnum a = Make(c.a);
    const TDWEnum b = Make(c.b);
    EXPECT_EQ(a.Compare(b), c.compare);
    EXPECT_EQ(a.CheckIn().Compare(b.CheckIn()), c.compare);
    EXPECT_EQ(a.CheckIn().Compare(b), c.compare);
  }
}

TEST_F(TDEnumTest, PrefixComparisonWithoutTwoEnumerations) {
  const TDREnum enumeration = Make({"a"}).CheckIn();
  const TDWName name(PStr("a"));
  DebugCapture capture;
  EXPECT_EQ(enumeration.Compare(name), 0);
  EXPECT_EQ(enumeration.Compare(TDREnum()), 0);
  EXPECT_EQ(TDREnum().Compare(enumeration), 0);
  EXPECT_EQ(TDWEnum(TDEnumImpPtr(), 0).Compare(enumeration), 0);
  ASSERT_EQ(capture.Messages().size(), 4u);
  for (const DebugMessage& m : capture.Messages()) {
    EXPECT_EQ(m.text, "Not implemented");
    EXPECT_EQ(m.level, 3);
    EXPECT_EQ(m.module, "TDEnum");
  }
}

struct OrderCase {
  Items a;
  Items b;
  int32_t order;  // the order of two numbers that differ only in these enumerations
};

// Private numbers, so that equal enumerations are still compared rather than found to be one
// object.
int32_t EnumOrder(const Items& a, const Items& b) {
  return TDWUInt8(Make(a), nullptr).CompareForSorting(TDWUInt8(Make(b), nullptr));
}

const OrderCase kOrderCases[] = {
    {{"a", "b"}, {"a", "b"}, 0},
    {{"z"}, {"a", "b"}, -1},
    {{"a", "b", "c"}, {"z"}, 2},
    {{"a", "b"}, {"a", "c"}, -1},
    {{"b", "a"}, {"a", "z"}, 1},
    {{"ab"}, {"a"}, 1},
    {{""}, {"a"}, -1},
    {{"\xFF"}, {"a"}, 1},
};

TEST_F(TDEnumTest, SortingOrder) {
  for (const OrderCase& c : kOrderCases) {
    SCOPED_TRACE(testing::PrintToString(c.a) + " vs " + testing::PrintToString(c.b));
    EXPECT_EQ(Sign(EnumOrder(c.a, c.b)), Sign(c.order));
    EXPECT_EQ(Sign(EnumOrder(c.b, c.a)), -Sign(c.order));
  }
  EXPECT_EQ(EnumOrder({"a", "b", "c"}, {"z"}), 2);
}

// ---- flattened form ----

struct FlatCase {
  const char* name;
  Items items;
  Bytes bytes;
};

const FlatCase kFlatCases[] = {
    {"Empty", {}, {0x00, 0x00}},
    {"OddItemBytesArePadded", {"a", "bc"}, {0x00, 0x02, 0x01, 0x61, 0x02, 0x62, 0x63, 0x00}},
    {"EvenItemBytesAreNot", {"a"}, {0x00, 0x01, 0x01, 0x61}},
    {"EmptyItem", {""}, {0x00, 0x01, 0x00, 0x00}},
    {"TwoEmptyItems", {"", ""}, {0x00, 0x02, 0x00, 0x00}},
    {"ZeroInside", {std::string("a\0", 2)}, {0x00, 0x01, 0x02, 0x61, 0x00, 0x00}},
};

TEST_F(TDEnumTest, FlattenedBytes) {
  for (const FlatCase& c : kFlatCases) {
    SCOPED_TRACE(c.name);
    const TDRUInt8 number(Make(c.items), nullptr);
    ASSERT_TRUE(number);
    // The record's size field counts the enumeration part as its flattened size.
    const Bytes record = RecordWith(c.bytes);
    EXPECT_EQ(Saved(number), record);

    Bytes followed = record;
    followed.push_back(0xAB);
    const Loaded loaded = Load(followed);
    EXPECT_EQ(loaded.status, 0);
    EXPECT_EQ(loaded.consumed, record.size());
    EXPECT_EQ(loaded.type, number);
    EXPECT_EQ(ItemsOf(EnumOf(loaded.type)), c.items);
  }
}

TEST_F(TDEnumTest, ReadingSkipsWhateverPadByteIsThere) {
  const Loaded loaded = Load(RecordWith({0x00, 0x01, 0x02, 0x61, 0x62, 0x7F}));
  ASSERT_EQ(loaded.status, 0);
  EXPECT_EQ(ItemsOf(EnumOf(loaded.type)), (Items{"ab"}));
  // Saved again, the pad byte is zero.
  EXPECT_EQ(Saved(loaded.type), RecordWith({0x00, 0x01, 0x02, 0x61, 0x62, 0x00}));
}

TEST_F(TDEnumTest, TruncatedInputGivesAStatus) {
  const Bytes whole = RecordWith(kFlatCases[1].bytes);
  for (size_t length = 0; length < kFlatCases[1].bytes.size(); ++length) {
    SCOPED_TRACE(length);
    LiveBlockCheck blocks;
    const Loaded loaded = Load(Bytes(whole.begin(), whole.begin() + kEnumPartOffset + length));
    EXPECT_EQ(loaded.status, kStatusCorruptData);
    EXPECT_FALSE(loaded.type);
  }
  // A huge count with one item behind it stops at the end of the bytes.
  LiveBlockCheck blocks;
  const Bytes huge = RecordWith({0xFF, 0xFF, 0x01, 0x61, 0x01});
  const Loaded loaded = Load(Bytes(huge.begin(), huge.begin() + kEnumPartOffset + 5));
  EXPECT_EQ(loaded.status, kStatusCorruptData);
  EXPECT_FALSE(loaded.type);
}

TEST_F(TDEnumTest, MoreItemsThanTheCountCanHoldDoNotFlatten) {
  TDWEnum enumeration;
  ASSERT_EQ(enumeration.ReserveStringCount(kMaxFlatItems + 1), 0);
  for (uint32_t i = 0; i < kMaxFlatItems; ++i) ASSERT_EQ(enumeration.AppendString("", 0), 0);
  // The largest that can be stored: the count, one length byte per item and a pad byte, in a
  // record long enough for a four-byte size field.
  Bytes bytes = Saved(TDRUInt16(enumeration, nullptr));
  const size_t part = 2u + kMaxFlatItems + 1;
  ASSERT_EQ(bytes.size(), 4u + 4u + 2u + part + 1u + 4u);
  EXPECT_EQ(Bytes(bytes.begin(), bytes.begin() + 12),
            (Bytes{0x00, 0x00, 0x00, 0x01, 0x80, 0x01, 0x00, 0x09, 0x00, 0x16, 0xFF, 0xFF}));

  ASSERT_EQ(enumeration.AppendString("", 0), 0);
  DebugCapture capture;
  int32_t status = 0;
  bytes = Saved(TDRUInt16(enumeration, nullptr), &status);
  EXPECT_EQ(status, kStatusBadArgument);
  EXPECT_TRUE(bytes.empty());
  ASSERT_FALSE(capture.Messages().empty());
  EXPECT_EQ(capture.Messages()[0].text, "Too many enum items to flatten: 65536");
  EXPECT_EQ(capture.Messages()[0].level, 2);
}

// ---- dump ----

TEST_F(TDEnumTest, DebugDump) {
  {
    DebugCapture capture;
    Make({"Red", "", "Blue"}).PrintDebugStr();
    EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"# enum elements = 3", "enum = {", "\tRed", "\t",
                                                         "\tBlue", "\t}"}));
    for (const DebugMessage& m : capture.Messages()) {
      EXPECT_EQ(m.level, 0);
      EXPECT_EQ(m.module, "TDEnum");
    }
  }
  // Inside a number's dump the enumeration's lines carry the prefix the number's lines carry.
  DebugCapture capture;
  TDRUInt8(Make({}), nullptr).PrintDebugStr(PStr(">"));
  const std::vector<std::string> texts = capture.Texts();
  const std::vector<std::string> enumLines = {">\t# enum elements = 0", ">\tenum = {", ">\t\t}"};
  EXPECT_NE(std::search(texts.begin(), texts.end(), enumLines.begin(), enumLines.end()), texts.end())
      << testing::PrintToString(texts);
}

// ---- interning ----

TEST_F(TDEnumTest, CheckInCheckOutAndClone) {
  TDWEnum enumeration = Make({"on", "off"});
  const TDREnum interned = enumeration.CheckIn();
  ASSERT_TRUE(interned);
  EXPECT_TRUE(interned.IsSane());
  EXPECT_NE(interned.GetEnumImpPtr(), enumeration.GetEnumImpPtr());
  EXPECT_EQ(enumeration.AppendString("auto"), 0);  // the writable object stays private
  EXPECT_EQ(ItemsOf(interned), (Items{"on", "off"}));

  TDWEnum checkedOut = interned.CheckOut();
  ASSERT_TRUE(checkedOut);
  EXPECT_NE(checkedOut.GetEnumImpPtr(), interned.GetEnumImpPtr());
  EXPECT_EQ(checkedOut.CheckIn(), interned);
  TDWEnum clone = checkedOut.Clone();
  EXPECT_EQ(clone.RemoveString(0), 0);
  EXPECT_EQ(ItemsOf(checkedOut), (Items{"on", "off"}));
  EXPECT_EQ(clone.CheckIn(), Make({"off"}).CheckIn());
}

// ---- running out of memory ----

TEST_F(TDEnumTest, EditingRunningOutOfMemoryChangesNothing) {
  const Items start = {"a", "b"};
  SweepAllocationFailures(start, {kStatusOutOfMemory}, {"a", "b", "c"},
                          [](TDWEnum& e) { return e.AppendString("c"); });
  SweepAllocationFailures(start, {kStatusOutOfMemory}, {"a", "b", "c"},
                          [](TDWEnum& e) { return e.AppendPStr(PStr("\x01" "c")); });
  // The item's text is 2; a list that cannot grow is 42 when inserting.
  SweepAllocationFailures(start, {kStatusOutOfMemory, kStatusNullHandle}, {"c", "a", "b"},
                          [](TDWEnum& e) { return e.InsertStringAt("c", 0); });
  SweepAllocationFailures(start, {kStatusOutOfMemory}, {"a", "c"},
                          [](TDWEnum& e) { return e.ReplaceStringAt("c", 1); });
  SweepAllocationFailures(start, {kStatusOutOfMemory}, {"a", "b"},
                          [](TDWEnum& e) { return e.ReserveStringCount(1000); });
}

TEST_F(TDEnumTest, UnFlattenRunningOutOfMemory) {
  const Bytes bytes =
      RecordWith({0x00, 0x03, 0x03, 'o', 'n', 'e', 0x03, 't', 'w', 'o', 0x05, 't', 'h', 'r', 'e', 'e'});
  // Interned first, so that a load that fails leaves no half-interned member behind.
  const TDRUInt8 expected(Make({"one", "two", "three"}), nullptr);
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
    // An enumeration made without its storage refuses to be read into (42); any other failure,
    // the items' among them, is out of memory.
    if (loaded.status == kStatusNullHandle) ++storageRefusals;
    else EXPECT_EQ(loaded.status, kStatusOutOfMemory);
  }
  EXPECT_LE(storageRefusals, 1);
}

TEST_F(TDEnumTest, CheckInAndCloneRunningOutOfMemory) {
  const Items items = {"low", "mid", "high"};
  SweepAllocationFailures(items, {kStatusOutOfMemory}, items, [](TDWEnum& e) {
    const TDWEnum clone = e.Clone();
    if (!clone) return kStatusOutOfMemory;
    EXPECT_TRUE(clone.IsSane());
    EXPECT_EQ(ItemsOf(clone), ItemsOf(e));
    return kStatusNoError;
  });
  const TDWEnum enumeration = Make(items);
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100);
    TDREnum interned;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      interned = enumeration.CheckIn();
      fired = failure.Fired();
    }
    EXPECT_EQ(ItemsOf(enumeration), items);
    if (!fired) {
      ASSERT_TRUE(interned);
      EXPECT_EQ(interned, enumeration.CheckIn());
      break;
    }
    EXPECT_FALSE(interned);
  }
}

}  // namespace
