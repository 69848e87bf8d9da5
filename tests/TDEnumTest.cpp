// Enumerations: editing and its statuses, hash, equality, the prefix comparison and the sorting
// order, the flattened form with its pad byte and its reader on hostile or truncated bytes, the
// dump, interning and running out of memory.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "vellum/TypeStrings.h"
#include "vellum/TDEnumHandles.h"
#include "vellum.h"

namespace {

using Bytes = std::vector<uint8_t>;
using Items = std::vector<std::string>;

constexpr uint32_t kVersion = 0x22308000;
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

Bytes Flatten(const TDEnumImp& enumeration, int32_t* status = nullptr) {
  const PersistTDData persist(kVersion);
  OutputBuf out;
  TDDataWriter writer(&persist, &out, &kBigEndian);
  const int32_t result = enumeration.Flatten(&writer);
  EXPECT_EQ(result, writer.GetError());
  if (status != nullptr) *status = result;
  return out.Bytes();
}

int32_t FlatSize(const TDEnumImp& enumeration) {
  const PersistTDData persist(kVersion);
  OutputBuf out;
  TDDataWriter writer(&persist, &out, &kBigEndian);
  int32_t size = 100;  // the size is added to what the caller has counted so far
  enumeration.AddFlatSize(&size, &writer);
  return size - 100;
}

int32_t UnFlatten(const Bytes& bytes, TDEnumImp* enumeration, size_t* consumed = nullptr) {
  const PersistTDData persist(kVersion);
  InputBuf in(bytes.data(), bytes.size());
  TDDataReader reader(&persist, &in, &kBigEndian, 0);
  const int32_t status = enumeration->UnFlatten(&reader);
  EXPECT_EQ(status, reader.GetError());
  if (consumed != nullptr) *consumed = reader.Position();
  return status;
}

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

  int32_t status = 0;
  EXPECT_EQ(Flatten(*withoutStorage.GetEnumImpPtr(), &status), Bytes{});
  EXPECT_EQ(status, kStatusNullHandle);
  EXPECT_EQ(FlatSize(*withoutStorage.GetEnumImpPtr()), 0);
  EXPECT_EQ(UnFlatten({0x00, 0x00}, withoutStorage.GetEnumImpPtr().get()), kStatusNullHandle);
  DebugCapture capture;
  withoutStorage.PrintDebugStr();
  EXPECT_TRUE(capture.Messages().empty());
  // Without items it interns as the empty enumeration, which has its storage.
  EXPECT_EQ(withoutStorage.CheckIn(), TDWEnum().CheckIn());
  EXPECT_TRUE(withoutStorage.CheckIn().IsSane());
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
  EXPECT_EQ(first.GetEnumImpPtr()->IsEqual(*Make({"a", "b"}).GetEnumImpPtr()), 1);
  EXPECT_NE(Make({"b", "a"}).CheckIn(), first);
  EXPECT_NE(Make({"a", "b", ""}).CheckIn(), first);
  EXPECT_NE(Make({"a", "B"}).CheckIn(), first);
  // An embedded zero byte ends the hash of an item but not its comparison.
  const TDWEnum zeroA = Make({std::string("a\0x", 3)});
  const TDWEnum zeroB = Make({std::string("a\0y", 3)});
  EXPECT_EQ(zeroA.GetHashValue(), zeroB.GetHashValue());
  EXPECT_NE(zeroA.CheckIn(), zeroB.CheckIn());

  const TDWName name(PStr("a"));
  EXPECT_EQ(first.GetEnumImpPtr()->IsEqual(*name.GetAttributeImpPtr()), 0);
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
  int32_t order;  // CompareForSorting(a, b)
};

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
    const TDWEnum a = Make(c.a);
    const TDWEnum b = Make(c.b);
    EXPECT_EQ(Sign(a.GetEnumImpPtr()->CompareForSorting(*b.GetEnumImpPtr())), Sign(c.order));
    EXPECT_EQ(Sign(b.GetEnumImpPtr()->CompareForSorting(*a.GetEnumImpPtr())), -Sign(c.order));
  }
  EXPECT_EQ(Make({"a", "b", "c"}).GetEnumImpPtr()->CompareForSorting(*Make({"z"}).GetEnumImpPtr()), 2);
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
    const TDWEnum enumeration = Make(c.items);
    int32_t status = -1;
    EXPECT_EQ(Flatten(*enumeration.GetEnumImpPtr(), &status), c.bytes);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(FlatSize(*enumeration.GetEnumImpPtr()), static_cast<int32_t>(c.bytes.size()));

    TDWEnum back = Make({"stale"});  // reading replaces what was there
    Bytes followed = c.bytes;
    followed.push_back(0xAB);
    size_t consumed = 0;
    EXPECT_EQ(UnFlatten(followed, back.GetEnumImpPtr().get(), &consumed), 0);
    EXPECT_EQ(consumed, c.bytes.size());
    EXPECT_EQ(ItemsOf(back), c.items);
    EXPECT_EQ(back.CheckIn(), enumeration.CheckIn());
  }
}

TEST_F(TDEnumTest, ReadingSkipsWhateverPadByteIsThere) {
  TDWEnum enumeration;
  size_t consumed = 0;
  EXPECT_EQ(UnFlatten({0x00, 0x01, 0x02, 0x61, 0x62, 0x7F, 0x55}, enumeration.GetEnumImpPtr().get(), &consumed), 0);
  EXPECT_EQ(consumed, 6u);
  EXPECT_EQ(ItemsOf(enumeration), (Items{"ab"}));
}

TEST_F(TDEnumTest, TruncatedInputGivesAStatus) {
  const Bytes whole = kFlatCases[1].bytes;
  for (size_t length = 0; length < whole.size(); ++length) {
    SCOPED_TRACE(length);
    LiveBlockCheck blocks;
    TDWEnum enumeration = Make({"old"});
    const int32_t hashBefore = enumeration.GetHashValue();
    EXPECT_EQ(UnFlatten(Bytes(whole.begin(), whole.begin() + length), enumeration.GetEnumImpPtr().get()),
              kStatusCorruptData);
    EXPECT_EQ(ItemsOf(enumeration), (Items{"old"}));
    EXPECT_EQ(enumeration.GetHashValue(), hashBefore);
  }
  LiveBlockCheck blocks;
  TDWEnum enumeration;
  EXPECT_EQ(UnFlatten({0xFF, 0xFF, 0x01, 0x61, 0x01}, enumeration.GetEnumImpPtr().get()), kStatusCorruptData);
  EXPECT_EQ(enumeration.GetNumStrings(), 0u);
}

TEST_F(TDEnumTest, MoreItemsThanTheCountCanHoldDoNotFlatten) {
  TDWEnum enumeration;
  ASSERT_EQ(enumeration.ReserveStringCount(TDEnumImp::kMaxFlatItems + 1), 0);
  for (uint32_t i = 0; i < TDEnumImp::kMaxFlatItems; ++i) ASSERT_EQ(enumeration.AppendString("", 0), 0);
  Bytes bytes = Flatten(*enumeration.GetEnumImpPtr());
  EXPECT_EQ(bytes.size(), 2u + TDEnumImp::kMaxFlatItems + 1);  // the largest that can be stored

  ASSERT_EQ(enumeration.AppendString("", 0), 0);
  DebugCapture capture;
  int32_t status = 0;
  bytes = Flatten(*enumeration.GetEnumImpPtr(), &status);
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
  DebugCapture capture;
  Make({}).GetEnumImpPtr()->PrintDebugStr(PStr(">"));
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"># enum elements = 0", ">enum = {", ">\t}"}));
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
  const Bytes bytes = {0x00, 0x03, 0x03, 'o', 'n', 'e', 0x03, 't', 'w', 'o', 0x05, 't', 'h', 'r', 'e', 'e'};
  SweepAllocationFailures({"old"}, {kStatusOutOfMemory}, {"one", "two", "three"}, [&](TDWEnum& e) {
    const PersistTDData persist(kVersion);
    InputBuf in(bytes.data(), bytes.size());
    TDDataReader reader(&persist, &in, &kBigEndian, 0);
    const int32_t status = e.GetEnumImpPtr()->UnFlatten(&reader);
    EXPECT_EQ(reader.GetError(), status);
    return status;
  });
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
