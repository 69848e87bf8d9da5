// Handles: admission, check-in, check-out and clone, the common setters, allocation failure on
// the way in, traversal and the walks built on it.
#include "vellum/TDHandles.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/DSMemory.h"
#include "runtime/PXPath.h"
#include "vellum/Dictionaries.h"
#include "vellum.h"

namespace {

class TDDataTypeTest : public TypeSystemTest {};



TDW Linked(TDW type, const TDWTypedef& link) {
  EXPECT_EQ(type.SetTypedef(link), kStatusNoError);
  return type;
}

std::string NameOf(const TD& type) {
  std::string name = "<none>";
  EXPECT_EQ(type.GetName(&name), kStatusNoError);
  return name;
}

// Live blocks once everything no handle holds has been collected.
int64_t SettledBlockCount() {
  GarbageCollectDictionaries();
  return DSLiveBlockCount();
}

constexpr int64_t kSweepLimit = 200;

TEST_F(TDDataTypeTest, ConstructionFromAPointer) {
  const TDImpPtr readOnly = GetBoolTD().GetImpPtr();
  const TDImpPtr writable = TDWBoolean().GetImpPtr();
  const TDImpPtr writableVoid = TDWVoid().GetImpPtr();
  const TDImpPtr writableU16 = TDWBooleanU16().GetImpPtr();
  const TDImpPtr none;

  struct Case {
    const char* name;
    TD handle;
    const TDImpPtr* holds;  // null: the handle is null
  };
  const Case kCases[] = {
      {"TDTakes", TD(readOnly, 1), &readOnly},
      {"TDWithoutTake", TD(readOnly, 0), nullptr},
      {"TDRReadOnly", TDR(readOnly, 1), &readOnly},
      {"TDRWritableIsHeld", TDR(writable, 1), &writable},
      {"TDRWithoutTake", TDR(readOnly, 0), nullptr},
      {"TDRNullPointer", TDR(none, 1), nullptr},
      {"TDWWritable", TDW(writable, 1), &writable},
      {"TDWRefusesReadOnly", TDW(readOnly, 1), nullptr},
      {"TDWWithoutTake", TDW(writable, 0), nullptr},
      {"TDWNullPointer", TDW(none, 1), nullptr},
      {"TypedAdmits", TDRBoolean(readOnly, 1), &readOnly},
      {"TypedAdmitsWritable", TDRBoolean(writable, 1), &writable},
      {"TypedRefusesOtherKind", TDRBoolean(writableVoid, 1), nullptr},
      {"TypedCheckZero", TDRBoolean(readOnly, 0), nullptr},
      {"TypedVoidRefusesBoolean", TDRVoid(readOnly, 1), nullptr},
      {"TypedU16RefusesBoolean", TDRBooleanU16(writable, 1), nullptr},
      {"TypedU16Admits", TDWBooleanU16(writableU16, 1), &writableU16},
      {"TypedWritableAdmits", TDWBoolean(writable, 1), &writable},
      {"TypedWritableRefusesReadOnly", TDWBoolean(readOnly, 1), nullptr},
      {"TypedWritableCheckZero", TDWBoolean(writable, 0), nullptr},
      {"TypedNullPointer", TDWVoid(none, 1), nullptr},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    if (c.holds == nullptr) {
      EXPECT_TRUE(c.handle.IsNull());
    } else {
      EXPECT_TRUE(c.handle.GetImpPtr() == *c.holds);
    }
  }
}

TEST_F(TDDataTypeTest, ConversionsOfNullHandles) {
  EXPECT_TRUE(TDR().CheckOut().IsNull());
  EXPECT_TRUE(TDRNull().CheckOut().IsNull());
  const TDR in = TDW().CheckIn();
  EXPECT_TRUE(in.IsNull());
  EXPECT_TRUE(in == GNullTD());
  EXPECT_TRUE(TDWNull().CheckIn().IsNull());
  EXPECT_TRUE(TDW().Clone().IsNull());
  const TDRBoolean refused = vellum::As<TDRBoolean>(TDWVoid());
  EXPECT_TRUE(refused.CheckOut().IsNull());
  EXPECT_TRUE(vellum::As<TDWBoolean>(GetVoidTD()).CheckIn().IsNull());
}

TEST_F(TDDataTypeTest, TypedConversionsKeepTheKind) {
  const TDWBoolean writable(U("t"));
  const TDRBoolean interned = writable.CheckIn();
  EXPECT_TRUE(interned == TDRBoolean(U("t")));
  const TDWBoolean out = interned.CheckOut();
  ASSERT_TRUE(out);
  EXPECT_EQ(out.IsReadOnlyTD(), 0);
  EXPECT_EQ(NameOf(out), "t");
  const TDWBoolean copy = out.Clone();
  ASSERT_TRUE(copy);
  EXPECT_FALSE(copy.GetImpPtr() == out.GetImpPtr());
  EXPECT_TRUE(copy.CheckIn() == interned);
  EXPECT_TRUE(TDRBoolean() == GetBoolTD());
  EXPECT_TRUE(TDRBoolean(U("")) == GetBoolTD()) << "an empty name gives no name";
  EXPECT_TRUE(TDRBoolean(static_cast<const uint8_t*>(nullptr)) == GetBoolTD());
  EXPECT_EQ(TDWBoolean(U("")).HasName(), 0);
}

TEST_F(TDDataTypeTest, CheckOutNeverChangesTheSource) {
  const TDR source = Linked(TDWBoolean(U("keep")), Link("a:b", 1)).CheckIn();
  const int32_t hash = source.GetHashValue();
  TDW copy = source.CheckOut();
  ASSERT_TRUE(copy);
  EXPECT_FALSE(copy.GetImpPtr() == source.GetImpPtr());
  EXPECT_TRUE(copy.GetName().GetAttributeImpPtr() != source.GetName().GetAttributeImpPtr())
      << "the copy owns its own name object";

  EXPECT_EQ(copy.SetName(std::string("other")), kStatusNoError);
  EXPECT_EQ(copy.GetName().SetName(std::string("again")), kStatusNoError);
  EXPECT_EQ(copy.GetTypedef().SetTimeStamp(99), kStatusNoError);
  EXPECT_EQ(copy.SetNoSelectMask(1), kStatusNoError);
  EXPECT_EQ(copy.EphemeralizeTD(), 0);
  EXPECT_EQ(copy.SetGenericness(1), kStatusNoError);

  EXPECT_EQ(NameOf(source), "keep");
  EXPECT_EQ(source.GetTypedef().GetTimeStamp(), 1u);
  EXPECT_EQ(source.IsNoSelectTD(), 0);
  EXPECT_EQ(source.IsEphemeralTD(), 0);
  EXPECT_EQ(source.IsGeneric(), 0);
  EXPECT_EQ(source.GetHashValue(), hash);
  EXPECT_EQ(NameOf(copy), "again");
  EXPECT_FALSE(copy.CheckIn() == source);

  TDW clone = copy.Clone();
  EXPECT_EQ(clone.RemoveName(), kStatusNoError);
  EXPECT_EQ(clone.RemoveTypedef(), kStatusNoError);
  EXPECT_EQ(NameOf(copy), "again");
  EXPECT_EQ(copy.HasTypedef(), 1);
}

TEST_F(TDDataTypeTest, EverySetterOnANullHandleGives42) {
  struct Case {
    const char* name;
    std::function<int32_t(TDW&)> set;
  };
  const Case kCases[] = {
      {"SetNameString", [](TDW& t) { return t.SetName(std::string("x")); }},
      {"SetNameEmptyString", [](TDW& t) { return t.SetName(std::string()); }},
      {"SetNameCString", [](TDW& t) { return t.SetName(U("x")); }},
      {"SetNamePStr", [](TDW& t) { return t.SetNamePStr(U("\x01x")); }},
      {"SetNamePStrNull", [](TDW& t) { return t.SetNamePStr(nullptr); }},
      {"SetNameHandle", [](TDW& t) { return t.SetName(TDWName(U("x"))); }},
      {"RemoveName", [](TDW& t) { return t.RemoveName(); }},
      {"SetTypedef", [](TDW& t) { return t.SetTypedef(Link("a:b", 1)); }},
      {"RemoveTypedef", [](TDW& t) { return t.RemoveTypedef(); }},
      {"SetNoSelectMask", [](TDW& t) { return t.SetNoSelectMask(1); }},
      {"SetGenericness", [](TDW& t) { return t.SetGenericness(1); }},
      {"EphemeralizeTD", [](TDW& t) { return t.EphemeralizeTD(); }},
      {"UnephemeralizeTD", [](TDW& t) { return t.UnephemeralizeTD(); }},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    TDW none;
    EXPECT_EQ(c.set(none), kStatusNullHandle);
    EXPECT_TRUE(none.IsNull());
  }
  std::string untouched = "untouched";
  EXPECT_EQ(TD().GetName(&untouched), kStatusNullHandle);
  EXPECT_EQ(untouched, "untouched");
  EXPECT_EQ(TD().GetNamePStr()[0], 0);
  EXPECT_EQ(TD().HasName(), 0);
  EXPECT_EQ(TD().GetTypeCode(), 0);
  EXPECT_TRUE(TDR().GetName().GetAttributeImpPtr() == TDAttributeImpPtr());
  EXPECT_TRUE(TDW().GetTypedef().GetAttributeImpPtr() == TDAttributeImpPtr());
}

TEST_F(TDDataTypeTest, NameSetters) {
  struct Case {
    const char* name;
    std::function<int32_t(TDW&)> set;
    const char* expected;  // null: no name afterwards
  };
  const Case kCases[] = {
      {"String", [](TDW& t) { return t.SetName(std::string("abc")); }, "abc"},
      {"CString", [](TDW& t) { return t.SetName(U("abc")); }, "abc"},
      {"PStr", [](TDW& t) { return t.SetNamePStr(U("\x03" "abc")); }, "abc"},
      {"PStrStopsAtZero", [](TDW& t) { return t.SetNamePStr(U("\x03" "a\0c")); }, "a"},
      {"Handle", [](TDW& t) { return t.SetName(TDWName(U("given"))); }, "given"},
      {"EmptyString", [](TDW& t) { return t.SetName(std::string()); }, nullptr},
      {"EmptyCString", [](TDW& t) { return t.SetName(U("")); }, nullptr},
      {"NullCString", [](TDW& t) { return t.SetName(static_cast<const uint8_t*>(nullptr)); }, nullptr},
      {"EmptyPStr", [](TDW& t) { return t.SetNamePStr(U("\x00")); }, nullptr},
      {"NullPStr", [](TDW& t) { return t.SetNamePStr(nullptr); }, nullptr},
      {"NullHandle", [](TDW& t) { return t.SetName(TDWName()); }, nullptr},
      {"Remove", [](TDW& t) { return t.RemoveName(); }, nullptr},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    TDW type = TDWBoolean(U("old"));
    EXPECT_EQ(c.set(type), kStatusNoError);
    if (c.expected == nullptr) {
      EXPECT_EQ(type.HasName(), 0);
      EXPECT_EQ(type.GetNamePStr()[0], 0);
      EXPECT_TRUE(type.CheckIn() == GetBoolTD());
    } else {
      EXPECT_EQ(NameOf(type), c.expected);
      EXPECT_TRUE(type.CheckIn() == TDRBoolean(U(c.expected)));
    }
  }

  std::string untouched = "untouched";
  EXPECT_EQ(TDWBoolean().GetName(&untouched), kStatusNoError);
  EXPECT_EQ(untouched, "untouched") << "no name leaves the string alone";

  TDW unnamed = TDWBoolean();
  EXPECT_EQ(unnamed.SetName(std::string("fresh")), kStatusNoError);
  EXPECT_EQ(NameOf(unnamed), "fresh");

  TDW longName = TDWBoolean();
  EXPECT_EQ(longName.SetName(std::string(300, 'n')), kStatusNoError);
  EXPECT_EQ(NameOf(longName), std::string(255, 'n'));
}

TEST_F(TDDataTypeTest, NameAllocationFailureLeavesNoName) {
  struct Case {
    const char* name;
    std::function<int32_t(TDW&)> set;
  };
  const Case kCases[] = {
      {"String", [](TDW& t) { return t.SetName(std::string("swept")); }},
      {"PStr", [](TDW& t) { return t.SetNamePStr(U("\x05swept")); }},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    bool succeeded = false;
    for (int64_t n = 1; n <= kSweepLimit && !succeeded; ++n) {
      SCOPED_TRACE(n);
      LiveBlockCheck leaks;
      TDW type = TDWBoolean();
      int32_t status = 0;
      bool fired = false;
      {
        ScopedAllocationFailure failure(n);
        status = c.set(type);
        fired = failure.Fired();
      }
      if (fired) {
        EXPECT_EQ(status, kStatusOutOfMemory);
        EXPECT_EQ(type.HasName(), 0);
      } else {
        EXPECT_EQ(status, kStatusNoError);
        EXPECT_EQ(NameOf(type), "swept");
        succeeded = true;
      }
    }
    EXPECT_TRUE(succeeded);
  }
}

TEST_F(TDDataTypeTest, CheckInUnderAllocationFailureGivesNullAndLeaksNothing) {
  TDW type = Linked(TDWBoolean(U("swept")), Link("lib:swept.ctl", 7, true));
  ASSERT_EQ(type.SetNoSelectMask(1), kStatusNoError);
  ASSERT_TRUE(type.CheckIn()) << "the dictionaries get their tables on first use and keep them";
  const int64_t settled = SettledBlockCount();
  const uint32_t interned = DictionarySize("TD");
  bool succeeded = false;
  for (int64_t n = 1; n <= kSweepLimit && !succeeded; ++n) {
    SCOPED_TRACE(n);
    TDR result;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      result = type.CheckIn();
      fired = failure.Fired();
    }
    if (fired) {
      EXPECT_TRUE(result.IsNull());
      EXPECT_EQ(DictionarySize("TD"), interned) << "nothing half-built is interned";
    } else {
      ASSERT_TRUE(result);
      EXPECT_EQ(result.IsSameAs(type), 1);
      EXPECT_EQ(NameOf(result), "swept");
      EXPECT_EQ(result.GetTypedef().IsPathized(), 1);
      EXPECT_EQ(result.IsNoSelectTD(), 8);
      succeeded = true;
    }
    result = TDR();
    EXPECT_EQ(SettledBlockCount(), settled);
  }
  EXPECT_TRUE(succeeded);
}

TEST_F(TDDataTypeTest, TraverseTDRVisitsTheTopAndPassesStopsUp) {
  struct Visit {
    int32_t calls = 0;
    TDTraverseValue answer = 0;
    TDR seen;
  };
  auto visit = [](const TDR& type, void* context) {
    auto* v = static_cast<Visit*>(context);
    ++v->calls;
    v->seen = type;
    return v->answer;
  };
  struct Case {
    TDTraverseValue answer;
    TDTraverseValue result;
  };
  const Case kCases[] = {{0, 0}, {-1, 0}, {1, 1}, {7, 7}, {-2, -2}};
  const TDR top = TDRBoolean(U("top"));
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.answer);
    Visit v;
    v.answer = c.answer;
    EXPECT_EQ(top.TraverseTDR(visit, &v, nullptr), c.result);
    EXPECT_EQ(v.calls, 1);
    EXPECT_TRUE(v.seen == top);
    EXPECT_EQ(top.TraverseTDR(visit, &v, [](const TDR&) { return false; }), c.result);
  }
  Visit none;
  EXPECT_EQ(TDR().TraverseTDR(visit, &none, nullptr), 0);
  EXPECT_EQ(none.calls, 0);
}

TEST_F(TDDataTypeTest, TraverseTDWReplacesTheTopWhenAsked) {
  struct Case {
    const char* name;
    TDW::VisitTDW visit;
    TDTraverseValue result;
    bool replaced;
  };
  const Case kCases[] = {
      {"Replace",
       [](TDW& t, void*, bool* replaced) {
         t = TDWVoid(U("new"));
         *replaced = true;
         return TDTraverseValue{0};
       },
       0, true},
      {"ReplaceAndSkip",
       [](TDW& t, void*, bool* replaced) {
         t = TDWVoid(U("new"));
         *replaced = true;
         return TDTraverseValue{-1};
       },
       0, true},
      {"ChangedButNotReplaced",
       [](TDW& t, void*, bool*) {
         t = TDWVoid(U("new"));
         return TDTraverseValue{0};
       },
       0, false},
      {"ReplacedByNothing",
       [](TDW& t, void*, bool* replaced) {
         t = TDW();
         *replaced = true;
         return TDTraverseValue{0};
       },
       0, false},
      {"Stop", [](TDW&, void*, bool*) { return TDTraverseValue{5}; }, 5, false},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    TDW top = TDWBoolean(U("top"));
    const TDImpPtr original = top.GetImpPtr();
    EXPECT_EQ(top.TraverseTDW(c.visit, nullptr, nullptr), c.result);
    if (c.replaced) {
      EXPECT_EQ(top.IsVoid(), 1);
      EXPECT_EQ(NameOf(top), "new");
    } else {
      EXPECT_TRUE(top.GetImpPtr() == original);
    }
  }
  TDW none;
  EXPECT_EQ(none.TraverseTDW(kCases[0].visit, nullptr, nullptr), 0);
  EXPECT_TRUE(none.IsNull());

  TDW top = TDWBoolean();
  TDImpPtr seen;
  top.TraverseTDW(
      [](TDW& t, void* context, bool*) {
        *static_cast<TDImpPtr*>(context) = t.GetImpPtr();
        return TDTraverseValue{0};
      },
      &seen, nullptr);
  EXPECT_TRUE(seen == top.GetImpPtr()) << "the visitor's handle holds the visited object";
}

TEST_F(TDDataTypeTest, WalksOverWhatExists) {
  struct Case {
    const char* name;
    TD type;
    int32_t containsBoolean;
    int32_t containsTypedef;
    int32_t typedefsPathized;
  };
  const Case kCases[] = {
      {"Null", TD(), 0, 0, 0},
      {"Boolean", GetBoolTD(), 1, 0, 1},
      {"WritableBoolean", TDWBoolean(U("b")), 1, 0, 1},
      {"BooleanU16", TDRBooleanU16(), 0, 0, 1},
      {"Void", GetVoidTD(), 0, 0, 1},
      {"LinkedWithoutPath", Linked(TDWBoolean(), Link("a:b", 1)).CheckIn(), 1, 1, 0},
      {"LinkedWithPath", Linked(TDWVoid(), Link("a:b", 1, true)).CheckIn(), 0, 1, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.type.ContainsBooleanTD(), c.containsBoolean);
    EXPECT_EQ(c.type.ContainsTypedef(), c.containsTypedef);
    EXPECT_EQ(c.type.TypedefsPathized(), c.typedefsPathized);
    EXPECT_EQ(c.type.ContainsVariantAsData(), 0);
    const TDR asRead = vellum::As<TDR>(c.type);
    EXPECT_EQ(asRead.GetContextRecursive(), nullptr);
    EXPECT_FALSE(asRead.HoldsContextRecursive());
  }
  TDW writable = TDWBoolean();
  writable.SetContextRecursive(nullptr);
  EXPECT_TRUE(writable.CheckIn() == GetBoolTD()) << "a kind without context ignores it";
}

}  // namespace
