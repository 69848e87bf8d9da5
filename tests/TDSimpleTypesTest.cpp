// Void and the two Booleans: their kinds, shared defaults, the event-discard mask, the mutation
// between the Boolean kinds and the visitor entries.
#include "vellum/TDSimpleHandles.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "vellum.h"

namespace {

class TDSimpleTypesTest : public TypeSystemTest {};


std::string NameOf(const TD& type) {
  std::string name = "<none>";
  EXPECT_EQ(type.GetName(&name), kStatusNoError);
  return name;
}

TEST_F(TDSimpleTypesTest, Kinds) {
  struct Case {
    const char* name;
    TDR type;
    int16_t code;
    int32_t isVoid;
    int32_t isBool;
    int32_t isBoolU16;
    int32_t size;
  };
  const Case kCases[] = {
      {"Void", GetVoidTD(), 0x00, 1, 0, 0, 0},
      {"Boolean", GetBoolTD(), 0x21, 0, 1, 0, 1},
      {"BooleanU16", TDRBooleanU16(), 0x20, 0, 0, 1, 2},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(c.type);
    EXPECT_EQ(c.type.GetTypeCode(), c.code);
    EXPECT_EQ(c.type.IsVoid(), c.isVoid);
    EXPECT_EQ(c.type.IsBool(), c.isBool);
    EXPECT_EQ(c.type.IsBoolU16(), c.isBoolU16);
    EXPECT_EQ(c.type.IsNumeric(), 0);
    EXPECT_EQ(c.type.IsContainer(), 0);
    EXPECT_EQ(c.type.HasName(), 0);
    EXPECT_EQ(c.type.IsReadOnlyTD(), 1);
    EXPECT_EQ(c.type.DataSize(), c.size);
    EXPECT_EQ(c.type.CheckOut().DataSize(), c.size);
  }
  EXPECT_EQ(TD().DataSize(), 0);
  EXPECT_TRUE(TDRVoid() == GetVoidTD());
  EXPECT_TRUE(TDRBoolean() == GetBoolTD());
  EXPECT_TRUE(TDRBooleanU16() == TDWBooleanU16().CheckIn());
  EXPECT_TRUE(TDRBoolean(U("b")) == TDWBoolean(U("b")).CheckIn());
  EXPECT_FALSE(TDRVoid(U("b")) == TDRBoolean(U("b")));
}

TEST_F(TDSimpleTypesTest, EventDiscardMask) {
  TDWBoolean type;
  EXPECT_EQ(type.SetEventDiscardMask(1), kStatusNoError);
  const TDR discarding = type.CheckIn();
  EXPECT_FALSE(discarding == GetBoolTD());
  {
    DebugCapture capture;
    discarding.PrintDebugStr();
    EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"TypeDescriptor {", "\tattributes = 0x00000003", "\t}"}));
  }
  EXPECT_TRUE(vellum::As<TDWBoolean>(discarding).IsNull());
  TDWBoolean out = vellum::As<TDRBoolean>(discarding).CheckOut();
  EXPECT_TRUE(out.CheckIn() == discarding) << "check-out keeps the mask";
  EXPECT_EQ(out.SetEventDiscardMask(0), kStatusNoError);
  EXPECT_TRUE(out.CheckIn() == GetBoolTD());
  EXPECT_EQ(vellum::As<TDWBoolean>(GetVoidTD()).SetEventDiscardMask(1), kStatusNullHandle);
}

TEST_F(TDSimpleTypesTest, MutateBooleanKeepsOnlyTheName) {
  auto decorated = [](TDW type) {
    QualifiedName viName;
    EXPECT_EQ(viName.FromDelimitedName("lib:t.ctl"), kStatusNoError);
    EXPECT_EQ(type.SetName(std::string("m")), kStatusNoError);
    EXPECT_EQ(type.SetTypedef(TDWTypedef(viName, 3, nullptr)), kStatusNoError);
    EXPECT_EQ(type.SetNoSelectMask(1), kStatusNoError);
    EXPECT_EQ(type.EphemeralizeTD(), 0);
    EXPECT_EQ(type.SetGenericness(1), kStatusNoError);
    if (type.IsBool() != 0) {
      EXPECT_EQ(vellum::As<TDWBoolean>(type).SetEventDiscardMask(1), kStatusNoError);
    }
    return type;
  };
  struct Case {
    const char* name;
    std::function<TDW()> make;
    int32_t toOld;
    int32_t result;
    int16_t code;  // afterwards
  };
  const Case kCases[] = {
      {"BooleanToOld", [&] { return decorated(TDWBoolean()); }, 1, 1, 0x20},
      {"BooleanStays", [&] { return decorated(TDWBoolean()); }, 0, 0, 0x21},
      {"OldToBoolean", [&] { return decorated(TDWBooleanU16()); }, 0, 1, 0x21},
      {"OldStays", [&] { return decorated(TDWBooleanU16()); }, 1, 0, 0x20},
      {"VoidStays", [&] { return decorated(TDWVoid()); }, 1, 0, 0x00},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    for (const bool throughHandle : {true, false}) {
      SCOPED_TRACE(throughHandle ? "TDW" : "TDImpPtr");
      TDW type = c.make();
      const TDImpPtr before = type.GetImpPtr();
      int32_t result = 0;
      if (throughHandle) {
        result = MutateBooleanTD(&type, c.toOld);
      } else {
        TDImpPtr imp = type.GetImpPtr();
        result = MutateBooleanTD(&imp, c.toOld);
        type = TDW(imp, 1);
      }
      EXPECT_EQ(result, c.result);
      ASSERT_TRUE(type);
      EXPECT_EQ(type.GetTypeCode(), c.code);
      EXPECT_EQ(NameOf(type), "m");
      if (c.result == 0) {
        EXPECT_TRUE(type.GetImpPtr() == before) << "nothing to change";
        continue;
      }
      EXPECT_EQ(type.IsReadOnlyTD(), 0);
      EXPECT_EQ(type.HasTypedef(), 0);
      EXPECT_EQ(type.IsNoSelectTD(), 0);
      EXPECT_EQ(type.IsEphemeralTD(), 0);
      EXPECT_EQ(type.IsGeneric(), 0);
      const TDR plain = c.code == 0x20 ? TDR(TDRBooleanU16(U("m"))) : TDR(TDRBoolean(U("m")));
      EXPECT_TRUE(type.CheckIn() == plain) << "no flags are carried over";
    }
  }
  TDW none;
  EXPECT_EQ(MutateBooleanTD(&none, 1), 0);
  EXPECT_EQ(MutateBooleanTD(static_cast<TDW*>(nullptr), 1), 0);
  EXPECT_EQ(MutateBooleanTD(static_cast<TDImpPtr*>(nullptr), 1), 0);
}

TEST_F(TDSimpleTypesTest, MutateBooleanRefusesAReadOnlyDescriptor) {
  TDImpPtr interned = TDRBoolean(U("fixed")).GetImpPtr();
  const TDImpPtr before = interned;
  DebugCapture capture;
  EXPECT_EQ(MutateBooleanTD(&interned, 1), 0);
  EXPECT_TRUE(interned == before);
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "What are you doing?  This TDImpPtr is readonly!");
  EXPECT_EQ(capture.Messages()[0].level, 3);
  EXPECT_EQ(TD(interned, 1).GetTypeCode(), 0x21);
}

class RecordingVisitor : public ITDVisitor {
 public:
  void Visit(const TDR& type) override { Record("R", type); }
  void Visit(TDW& type) override { Record("W", type); }
  std::vector<std::string> seen;
  TDImpPtr object;

 protected:
  void Record(const std::string& entry, const TD& type) {
    seen.push_back(entry);
    object = type.GetImpPtr();
  }
};

class KindVisitor : public RecordingVisitor {
 public:
  void VisitVoid(const TDRVoid& type) override { Record("Void R", type); }
  void VisitVoid(TDWVoid& type) override { Record("Void W", type); }
  void VisitBoolean(const TDRBoolean& type) override { Record("Boolean R", type); }
  void VisitBoolean(TDWBoolean& type) override { Record("Boolean W", type); }
  void VisitBooleanU16(const TDRBooleanU16& type) override { Record("BooleanU16 R", type); }
  void VisitBooleanU16(TDWBooleanU16& type) override { Record("BooleanU16 W", type); }
};

TEST_F(TDSimpleTypesTest, VisitorReachesTheEntryOfEachKind) {
  struct Case {
    const char* name;
    TD type;
    const char* kindEntry;
    const char* generalEntry;
  };
  const Case kCases[] = {
      {"ReadOnlyVoid", GetVoidTD(), "Void R", "R"},
      {"WritableVoid", TDWVoid(), "Void W", "W"},
      {"ReadOnlyBoolean", GetBoolTD(), "Boolean R", "R"},
      {"WritableBoolean", TDWBoolean(), "Boolean W", "W"},
      {"ReadOnlyBooleanU16", TDRBooleanU16(), "BooleanU16 R", "R"},
      {"WritableBooleanU16", TDWBooleanU16(), "BooleanU16 W", "W"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    KindVisitor kinds;
    EXPECT_EQ(c.type.Accept(&kinds), 1);
    EXPECT_EQ(kinds.seen, std::vector<std::string>{c.kindEntry});
    EXPECT_TRUE(kinds.object == c.type.GetImpPtr());
    RecordingVisitor general;
    EXPECT_EQ(c.type.Accept(&general), 1);
    EXPECT_EQ(general.seen, std::vector<std::string>{c.generalEntry}) << "kind entries default to the general ones";
  }
  KindVisitor none;
  EXPECT_EQ(TD().Accept(&none), 0);
  EXPECT_TRUE(none.seen.empty());
  EXPECT_EQ(GetBoolTD().Accept(nullptr), 0);
}

}  // namespace
