// The descriptor object: interning identity (hash and equality), flags, type compatibility, the
// debug dump, the short type text and the shared defaults by code.
#include "vellum/TDHandles.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXPath.h"
#include "vellum.h"

namespace {

class TDTest : public TypeSystemTest {};



TDW Boolean(const char* name = nullptr) { return TDWBoolean(U(name)); }

TDW Linked(TDW type, const TDWTypedef& link) {
  EXPECT_EQ(type.SetTypedef(link), kStatusNoError);
  return type;
}

TDW NoSelect(TDW type) {
  EXPECT_EQ(type.SetNoSelectMask(1), kStatusNoError);
  return type;
}

TDW Generic(TDW type) {
  EXPECT_EQ(type.SetGenericness(1), kStatusNoError);
  return type;
}

TDW Ephemeral(TDW type) {
  EXPECT_EQ(type.EphemeralizeTD(), 0);
  return type;
}

TDW EventDiscard(TDW type) {
  EXPECT_EQ(vellum::As<TDWBoolean>(type).SetEventDiscardMask(1), kStatusNoError);
  return type;
}

std::vector<std::string> Texts(const DebugCapture& capture) {
  std::vector<std::string> texts;
  for (const DebugMessage& m : capture.Messages()) texts.push_back(m.text);
  return texts;
}

std::vector<int32_t> Levels(const DebugCapture& capture) {
  std::vector<int32_t> levels;
  for (const DebugMessage& m : capture.Messages()) levels.push_back(m.level);
  return levels;
}

TEST_F(TDTest, EveryIdentityTraitMakesItsOwnInternedType) {
  struct Case {
    const char* name;
    std::function<TDW()> make;
  };
  const Case kCases[] = {
      {"Plain", [] { return Boolean(); }},
      {"NamedA", [] { return Boolean("a"); }},
      {"NamedB", [] { return Boolean("b"); }},
      {"NameObjectWithoutText",
       [] {
         TDW type = Boolean();
         EXPECT_EQ(type.SetName(TDWName(static_cast<const uint8_t*>(nullptr))), kStatusNoError);
         return type;
       }},
      {"LinkAB", [] { return Linked(Boolean(), Link("a:b", 1)); }},
      {"LinkAC", [] { return Linked(Boolean(), Link("a:c", 1)); }},
      {"LinkABOtherTimeStamp", [] { return Linked(Boolean(), Link("a:b", 2)); }},
      {"LinkABPathized", [] { return Linked(Boolean(), Link("a:b", 1, true)); }},
      {"NamedALinkAB", [] { return Linked(Boolean("a"), Link("a:b", 1)); }},
      {"NoSelect", [] { return NoSelect(Boolean()); }},
      {"Generic", [] { return Generic(Boolean()); }},
      {"Ephemeral", [] { return Ephemeral(Boolean()); }},
      {"EventDiscard", [] { return EventDiscard(Boolean()); }},
      {"BooleanU16", [] { return TDW(TDWBooleanU16()); }},
      {"Void", [] { return TDW(TDWVoid()); }},
  };
  std::vector<TDR> interned;
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const TDW first = c.make();
    const TDW second = c.make();
    ASSERT_FALSE(first.GetImpPtr() == second.GetImpPtr());
    const TDR a = first.CheckIn();
    const TDR b = second.CheckIn();
    ASSERT_TRUE(a);
    EXPECT_TRUE(a == b) << "equal descriptors built separately share one interned object";
    EXPECT_EQ(a.IsReadOnlyTD(), 1);
    EXPECT_EQ(first.IsReadOnlyTD(), 0);
    EXPECT_EQ(first.IsSameAs(a), 1);
    EXPECT_EQ(a.IsSameAs(first), 1);
    EXPECT_EQ(first.GetHashValue(), a.GetHashValue()) << "the read-only bit takes no part in the hash";
    EXPECT_TRUE(first.CheckIn() == a) << "checking in leaves the writable descriptor usable";
    interned.push_back(a);
  }
  for (size_t i = 0; i < interned.size(); ++i) {
    for (size_t j = i + 1; j < interned.size(); ++j) {
      SCOPED_TRACE(std::string(kCases[i].name) + " vs " + kCases[j].name);
      EXPECT_FALSE(interned[i] == interned[j]);
      EXPECT_EQ(interned[i].IsSameAs(interned[j]), 0);
    }
  }
}

TEST_F(TDTest, HashOfAWritableDescriptorFollowsItsSetters) {
  struct Case {
    const char* name;
    std::function<void(TDW&)> change;
  };
  const Case kCases[] = {
      {"NoSelect", [](TDW& t) { EXPECT_EQ(t.SetNoSelectMask(1), kStatusNoError); }},
      {"Generic", [](TDW& t) { EXPECT_EQ(t.SetGenericness(1), kStatusNoError); }},
      {"Ephemeral", [](TDW& t) { EXPECT_EQ(t.EphemeralizeTD(), 0); }},
      {"EventDiscard", [](TDW& t) { EXPECT_EQ(vellum::As<TDWBoolean>(t).SetEventDiscardMask(1), 0); }},
      {"Name", [](TDW& t) { EXPECT_EQ(t.SetName(std::string("renamed")), kStatusNoError); }},
      {"Typedef", [](TDW& t) { EXPECT_EQ(t.SetTypedef(Link("a:b", 3)), kStatusNoError); }},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    TDW type = Boolean("x");
    const int32_t before = type.GetHashValue();
    c.change(type);
    EXPECT_NE(type.GetHashValue(), before);
    EXPECT_EQ(type.CheckIn().GetHashValue(), type.GetHashValue());
  }
}

TEST_F(TDTest, EphemeralQueryNeverChangesTheFlag) {
  TDW type = Boolean();
  EXPECT_EQ(type.IsEphemeralTD(), 0);
  EXPECT_EQ(type.IsEphemeralTD(), 0);
  EXPECT_EQ(type.EphemeralizeTD(), 0) << "the old value";
  EXPECT_EQ(type.IsEphemeralTD(), 4);
  EXPECT_EQ(type.IsEphemeralTD(), 4);
  EXPECT_EQ(type.EphemeralizeTD(), 4);
  const TDR interned = type.CheckIn();
  EXPECT_EQ(interned.IsEphemeralTD(), 4);
  EXPECT_EQ(type.UnephemeralizeTD(), 4);
  EXPECT_EQ(type.IsEphemeralTD(), 0);
  EXPECT_EQ(type.UnephemeralizeTD(), 0);
  EXPECT_EQ(interned.IsEphemeralTD(), 4) << "the interned copy is not touched";
  EXPECT_TRUE(type.CheckIn() == GetBoolTD());
  EXPECT_EQ(TDR().IsEphemeralTD(), 0);
}

TEST_F(TDTest, NoSelectAndGenericQueriesAnswerTheirFlags) {
  TDW type = Boolean();
  EXPECT_EQ(type.IsNoSelectTD(), 0);
  EXPECT_EQ(type.IsGeneric(), 0);
  EXPECT_EQ(type.SetNoSelectMask(5), kStatusNoError);
  EXPECT_EQ(type.SetGenericness(7), kStatusNoError);
  EXPECT_EQ(type.IsNoSelectTD(), 8);
  EXPECT_EQ(type.IsGeneric(), 1);
  const TDR interned = type.CheckIn();
  EXPECT_EQ(interned.IsNoSelectTD(), 8);
  EXPECT_EQ(interned.IsGeneric(), 1);
  EXPECT_EQ(type.SetNoSelectMask(0), kStatusNoError);
  EXPECT_EQ(type.SetGenericness(0), kStatusNoError);
  EXPECT_EQ(type.IsNoSelectTD(), 0);
  EXPECT_EQ(type.IsGeneric(), 0);
  EXPECT_TRUE(type.CheckIn() == GetBoolTD());
}

TEST_F(TDTest, CmpTDOfNullAndIdenticalHandles) {
  const TDR b = GetBoolTD();
  EXPECT_EQ(b.CmpTD(b, 0), 0);
  EXPECT_EQ(b.CmpTD(b, kCmpFlagCompareNames | kCmpFlagTypedefIncompatible | kCmpFlagCompareFlagWords), 0);
  EXPECT_EQ(TDR().CmpTD(TDW(), 0), 0);
  EXPECT_EQ(TDR().CmpTD(b, 0), 0x100);
  EXPECT_EQ(b.CmpTD(TDR(), 0), 0x100);
}

TEST_F(TDTest, CmpTDResultBits) {
  struct Case {
    const char* name;
    std::function<TD()> destination;
    std::function<TD()> source;
    int32_t flags;
    int32_t expected;
  };
  const Case kCases[] = {
      {"SameType", [] { return Boolean(); }, [] { return Boolean(); }, 0, 0},
      {"DifferentCodes", [] { return Boolean(); }, [] { return TDWVoid(); }, 0, 0x100},
      {"CheckedInAgainstWritable", [] { return GetBoolTD(); }, [] { return Boolean(); }, 0x40, 0},

      {"LinksDiffer", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 1)); }, 0, 0x1},
      {"LinksDifferIncompatible", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 1)); }, 0x4, 0x100},
      {"LinksDifferTypedefBit", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 1)); }, 0x400, 0x20},
      {"LinksDifferIgnored", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 1)); }, 0x8, 0},
      {"LinksIgnoredOverTypedefBit", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 1)); }, 0x8 | 0x400, 0},
      {"OnlyDestinationLinked", [] { return Linked(Boolean(), Link("a:b", 1)); }, [] { return Boolean(); }, 0,
       0x1},
      {"OnlySourceLinked", [] { return Boolean(); }, [] { return Linked(Boolean(), Link("a:b", 1)); }, 0x4,
       0x100},
      {"SameLinks", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:b", 1)); }, 0x4, 0},
      {"LinkNamesCompareAsFileNames", [] { return Linked(Boolean(), Link("A:B", 1)); },
       [] { return Linked(Boolean(), Link("a:b", 1)); }, 0x4, 0},
      {"TimeStampsDiffer", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:b", 2)); }, 0, 0x1},
      {"TimeStampsIgnored", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:b", 2)); }, 0x8000, 0},
      {"TimeStampsIgnoredButNamesStillCount", [] { return Linked(Boolean(), Link("a:b", 1)); },
       [] { return Linked(Boolean(), Link("a:c", 2)); }, 0x8000, 0x1},

      {"NamesDiffer", [] { return Boolean("a"); }, [] { return Boolean("b"); }, 0x1, 0x8000},
      {"NamesDifferUnasked", [] { return Boolean("a"); }, [] { return Boolean("b"); }, 0, 0},
      {"NamePresenceDiffers", [] { return Boolean("a"); }, [] { return Boolean(); }, 0x1, 0x8000},
      {"SameNames", [] { return Boolean("a"); }, [] { return Boolean("a"); }, 0x1, 0},
      {"LinkedSideCountsUnnamedBehindItsLink", [] { return Linked(Boolean("a"), Link("a:b", 1)); },
       [] { return Boolean("a"); }, 0x1, 0x8001},

      {"FlagWordsDiffer", [] { return NoSelect(Boolean()); }, [] { return Boolean(); }, 0x40, 0x100},
      {"FlagWordsUnasked", [] { return NoSelect(Boolean()); }, [] { return Boolean(); }, 0, 0},
      {"FlagWordsNamePresence", [] { return Boolean("a"); }, [] { return Boolean(); }, 0x40, 0x100},
      {"EphemeralCountsInFlagWords", [] { return Ephemeral(Boolean()); }, [] { return Boolean(); }, 0x40,
       0x100},
      {"EphemeralIgnoredBetweenEventDiscards", [] { return Ephemeral(EventDiscard(Boolean())); },
       [] { return EventDiscard(Boolean()); }, 0x40, 0},
      {"EventDiscardCountsInFlagWords", [] { return EventDiscard(Boolean()); }, [] { return Boolean(); }, 0x40,
       0x100},

      {"GenericMatters", [] { return Generic(Boolean()); }, [] { return Boolean(); }, 0x8000000, 0x100},
      {"GenericUnasked", [] { return Generic(Boolean()); }, [] { return Boolean(); }, 0, 0},
      {"EphemeralMatters", [] { return Boolean(); }, [] { return Ephemeral(Boolean()); }, 0x10000000, 0x100},
      {"EphemeralUnasked", [] { return Boolean(); }, [] { return Ephemeral(Boolean()); }, 0, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.destination().CmpTD(c.source(), c.flags), c.expected);
  }
}

TEST_F(TDTest, DumpWritesOneLevelZeroLinePerPart) {
  struct Case {
    const char* name;
    std::function<TD()> make;
    const char* prefix;
    std::vector<std::string> lines;
  };
  const Case kCases[] = {
      {"Null", [] { return TD(); }, nullptr, {"TypeDescriptor {", "\tNULL", "\t}"}},
      {"NamedCheckedIn", [] { return TDRBoolean(U("x")); }, nullptr,
       {"TypeDescriptor {", "\tname = 'x'", "\tattributes = 0x00000001", "\t}"}},
      {"Prefixed", [] { return TDRBoolean(U("x")); }, ">",
       {">TypeDescriptor {", ">\tname = 'x'", ">\tattributes = 0x00000001", ">\t}"}},
      {"Unnamed", [] { return GetVoidTD(); }, nullptr,
       {"TypeDescriptor {", "\tattributes = 0x00000001", "\t}"}},
      {"LinkedWithTimeStamp", [] { return NoSelect(Linked(Boolean(), Link("a:b", 42))); }, nullptr,
       {"TypeDescriptor {", "\tcontrol name = 'a:b'", "\ttime stamp = 0x0000002a", "\tattributes = 0x00000008",
        "\t}"}},
      {"LinkedWithoutTimeStamp", [] { return Linked(Boolean("n"), Link("lib:t.ctl", 0)); }, nullptr,
       {"TypeDescriptor {", "\tname = 'n'", "\tcontrol name = 'lib:t.ctl'", "\tattributes = 0x00000000", "\t}"}},
      {"NameWithoutText",
       [] {
         TDW type = Generic(Boolean());
         EXPECT_EQ(type.SetName(TDWName(static_cast<const uint8_t*>(nullptr))), kStatusNoError);
         return type;
       },
       nullptr, {"TypeDescriptor {", "\tattributes = 0x00002000", "\t}"}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const TD type = c.make();
    DebugCapture capture;
    EXPECT_EQ(c.prefix != nullptr ? type.PrintDebugStr(U(c.prefix)) : type.PrintDebugStr(), 0);
    EXPECT_EQ(Texts(capture), c.lines);
    EXPECT_EQ(Levels(capture), std::vector<int32_t>(c.lines.size(), 0));
  }
}

TEST_F(TDTest, DebugStreamShowsTheName) {
  struct Case {
    const char* name;
    TD type;
    const char* text;
  };
  const Case kCases[] = {
      {"Named", TDRBoolean(U("x")), "[TD \"x\"]"},
      {"Unnamed", GetBoolTD(), "[TD \"\"]"},
      {"Null", TD(), "[TD \"\"]"},
      {"Writable", Boolean("w y"), "[TD \"w y\"]"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    DebugStream stream(__FILE__, __LINE__, 0);
    stream << "type " << c.type;
    EXPECT_EQ(stream.Text(), std::string("type ") + c.text);
  }
}

TEST_F(TDTest, ShortTypeText) {
  EXPECT_EQ(ToString(TDR()), "null");
  EXPECT_EQ(ToString(GetVoidTD()), "void");
  EXPECT_EQ(ToString(GetBoolTD()), "bool");
  EXPECT_EQ(ToString(TDRBoolean(U("named"))), "bool");
  EXPECT_EQ(ToString(TDRBooleanU16()), "?");

  struct Case {
    int32_t code;
    const char* text;
  };
  const Case kCases[] = {{0x0B, "f80"}, {0x0E, "?"}, {0x1C, "complex32Units"}, {0x54, "WFMDT"}, {0x21, "bool"}};
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.code);
    const TypeCodeInfo* info = FindTypeCode(c.code);
    ASSERT_NE(info, nullptr);
    EXPECT_EQ(info->text, c.text);
  }
  EXPECT_EQ(FindTypeCode(0x31), nullptr);
  EXPECT_EQ(FindTypeCode(-1), nullptr);
  EXPECT_EQ(FindTypeCode(0x121), nullptr);
}

TEST_F(TDTest, DefaultDescriptorForACode) {
  EXPECT_TRUE(MakeDefaultTDRForTypeCode(0x21) == GetBoolTD());
  EXPECT_TRUE(MakeDefaultTDRForTypeCode(0x00) == GetVoidTD());
  EXPECT_EQ(GetBoolTD().IsReadOnlyTD(), 1);
  EXPECT_EQ(GetBoolTD().HasName(), 0);

  struct Refused {
    int32_t code;
    const char* text;
  };
  const Refused kRefused[] = {
      {0x50, "MakeDefault for type 0x00000050 not supported yet"},
      {0x20, "MakeDefault for type 0x00000020 not supported yet"},
      {0x31, "MakeDefault for type 0x00000031 not supported yet"},
      {0x121, "MakeDefault for type 0x00000121 not supported yet"},
      {-1, "MakeDefault for type 0xffffffff not supported yet"},
  };
  for (const Refused& c : kRefused) {
    SCOPED_TRACE(c.text);
    DebugCapture capture;
    const TDR& type = MakeDefaultTDRForTypeCode(c.code);
    EXPECT_TRUE(type.IsNull());
    EXPECT_TRUE(type == GNullTD());
    EXPECT_EQ(Texts(capture), std::vector<std::string>{c.text});
    EXPECT_EQ(Levels(capture), std::vector<int32_t>{3});
  }
}

TEST_F(TDTest, WritableDefaultIsAFreshCheckOut) {
  TDW type = MakeDefaultTDWForTypeCode(0x21);
  ASSERT_TRUE(type);
  EXPECT_EQ(type.IsBool(), 1);
  EXPECT_EQ(type.IsReadOnlyTD(), 0);
  EXPECT_FALSE(type.GetImpPtr() == GetBoolTD().GetImpPtr());
  EXPECT_FALSE(type.GetImpPtr() == MakeDefaultTDWForTypeCode(0x21).GetImpPtr());
  EXPECT_TRUE(type.CheckIn() == GetBoolTD());
  EXPECT_EQ(type.SetName(std::string("changed")), kStatusNoError);
  EXPECT_EQ(GetBoolTD().HasName(), 0);

  DebugCapture capture;
  EXPECT_TRUE(MakeDefaultTDWForTypeCode(0x50).IsNull());
  EXPECT_EQ(Texts(capture), std::vector<std::string>{"MakeDefault for type 0x00000050 not supported yet"});
}

TEST_F(TDTest, ReadOnlyHandleFromAnObject) {
  EXPECT_TRUE(MakeTDRFromTDImp(nullptr).IsNull());
  const TDR b = MakeTDRFromTDImp(GetBoolTD().GetImp());
  EXPECT_TRUE(b == GetBoolTD());
}

}  // namespace
