// Tags: kinds, identity by kind, context and class, the guard on the user-defined kind, the
// comparison hook, compatibility with strings and the order of tag descriptors.
#include "vellum/TDTagHandles.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

namespace {

class TDTagBaseTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    TDRTagBase::SetComparisonFunc(nullptr);
    TypeSystemTest::TearDown();
  }
};


TEST_F(TDTagBaseTest, Kinds) {
  const TDRTag plain;
  EXPECT_TRUE(plain == GetTagTD());
  EXPECT_TRUE(MakeDefaultTDRForTypeCode(0x37) == GetTagTD());
  EXPECT_EQ(plain.GetTagType(), kTagTypeDefault);
  EXPECT_EQ(plain.IsTag(), 1);
  EXPECT_EQ(plain.IsStringBase(), 1);
  EXPECT_EQ(plain.IsString(), 0);
  EXPECT_EQ(plain.IsUserDefinedTag(), 0);
  EXPECT_EQ(plain.DataSize(), 8);
  EXPECT_TRUE(plain.HoldsContext());

  const TDRTag userDefined(kTagTypeUserDefined, U("u"));
  EXPECT_EQ(userDefined.IsUserDefinedTag(), 1);
  EXPECT_TRUE(vellum::As<TDRUserDefinedTag>(userDefined));
  EXPECT_TRUE(vellum::As<TDRUserDefinedTag>(plain).IsNull());
  EXPECT_TRUE(vellum::As<TDRTagBase>(userDefined));
  EXPECT_TRUE(TDRTagBase().IsNull()) << "an abstract kind has no default";

  const TDRTag sized(7, 3, U("t"));
  EXPECT_EQ(sized.GetBound(), 7);
  EXPECT_EQ(sized.GetTagType(), 3);
  EXPECT_TRUE(sized == TDWTag(7, 3, U("t")).CheckIn());
  EXPECT_FALSE(sized == TDRTag(7, 4, U("t")));
}

TEST_F(TDTagBaseTest, UserDefinedClassIsIdentity) {
  const TDRUserDefinedTag none;
  const TDRUserDefinedTag empty(U("\0"));
  EXPECT_TRUE(none == empty) << "an empty class is no class";
  EXPECT_EQ(none.HasTagClass(), 0);
  const TDRUserDefinedTag widget(U("\x06Widget"));
  EXPECT_FALSE(widget == none);
  EXPECT_EQ(widget.HasTagClass(), 1);
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(widget.GetTagClass() + 1), 6), "Widget");
  EXPECT_EQ(widget.GetTagType(), kTagTypeUserDefined);
  EXPECT_EQ(widget.GetBound(), -1);

  TDWUserDefinedTag edit = vellum::As<TDWUserDefinedTag>(widget.CheckOut());
  ASSERT_TRUE(edit);
  EXPECT_TRUE(edit.CheckIn() == widget) << "check-out keeps the class";
  EXPECT_EQ(edit.SetTagClassCStr(U("")), kStatusNoError);
  EXPECT_TRUE(edit.CheckIn() == none);
  EXPECT_EQ(edit.SetTagClassCStr(U("Widget")), kStatusNoError);
  EXPECT_TRUE(edit.CheckIn() == widget);
  EXPECT_EQ(vellum::As<TDWUserDefinedTag>(GetTagTD()).SetTagClass(U("\x01x")), kStatusNullHandle);

  // Order: by tag kind first, then no class before a class, then the classes.
  const TDRUserDefinedTag gadget(U("\x06Gadget"));
  EXPECT_LT(GetTagTD().CompareForSorting(none), 0);
  EXPECT_LT(none.CompareForSorting(gadget), 0);
  EXPECT_LT(gadget.CompareForSorting(widget), 0);
  EXPECT_EQ(widget.CompareForSorting(widget.CheckOut()), 0);
}

TEST_F(TDTagBaseTest, SetTagTypeNeverCrossesTheUserDefinedKind) {
  DebugCapture capture;
  TDWTag plain;
  EXPECT_EQ(plain.SetTagType(kTagTypeUserDefined), kStatusBadArgument);
  EXPECT_EQ(plain.GetTagType(), kTagTypeDefault);
  EXPECT_EQ(plain.IsUserDefinedTag(), 0);
  EXPECT_EQ(plain.SetTagType(2), kStatusNoError);
  EXPECT_EQ(plain.GetTagType(), 2);
  TDWUserDefinedTag user;
  EXPECT_EQ(user.SetTagType(3), kStatusBadArgument);
  EXPECT_EQ(user.SetTagType(kTagTypeUserDefined), kStatusNoError);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"Illegal SetTagType setting!", "Illegal SetTagType setting!"}));
  EXPECT_EQ(TDWTagBase().SetTagType(2), kStatusNullHandle);
}

TEST_F(TDTagBaseTest, ContextIsIdentity) {
  int first = 0;
  int second = 0;
  const auto* a = reinterpret_cast<const KoContext*>(&first);
  const auto* b = reinterpret_cast<const KoContext*>(&second);
  TDWTag tag;
  const int32_t before = tag.GetHashValue();
  tag.SetContextRecursive(a);
  EXPECT_EQ(tag.GetContext(), a);
  EXPECT_NE(tag.GetHashValue(), before);
  const TDR inA = tag.CheckIn();
  EXPECT_EQ(inA.GetContext(), a);
  EXPECT_TRUE(inA.CheckOut().CheckIn() == inA);
  tag.SetContextRecursive(b);
  const TDR inB = tag.CheckIn();
  EXPECT_FALSE(inA == inB);
  EXPECT_NE(inA.CompareForSorting(inB), 0);
  EXPECT_EQ(inA.CompareForSorting(inB), -inB.CompareForSorting(inA));
}

int32_t CompareNothing(const TDR&, const KoVariant*, const KoVariant*, const KoContext*, const KoContext*, int32_t*) {
  return 0;
}
int32_t CompareOther(const TDR&, const KoVariant*, const KoVariant*, const KoContext*, const KoContext*, int32_t*) {
  return 1;
}

TEST_F(TDTagBaseTest, ComparisonFunctionIsInstallable) {
  DebugCapture capture;
  TDRTagBase::SetComparisonFunc(&CompareNothing);
  EXPECT_EQ(TDRTagBase::GetComparisonFunc(), &CompareNothing);
  EXPECT_TRUE(capture.Texts().empty());
  TDRTagBase::SetComparisonFunc(&CompareOther);
  EXPECT_EQ(TDRTagBase::GetComparisonFunc(), &CompareOther);
  EXPECT_EQ(capture.Texts(),
            (std::vector<std::string>{"Redefining comparison function in TDRTagBase::SetComparisonFunc"}));
}

TEST_F(TDTagBaseTest, CmpTD) {
  struct Case {
    const char* name;
    TDR dst;
    TDR src;
    int32_t flags;
    int32_t result;
  };
  const Case kCases[] = {
      {"SameTag", GetTagTD(), TDRTag(1, nullptr), 0, 0},
      {"Kinds1And2", TDRTag(2, nullptr), TDRTag(1, nullptr), 0, 0x10},
      {"OtherKinds", TDRTag(3, nullptr), TDRTag(1, nullptr), 0, 0x100},
      {"FromString", GetTagTD(), GetStringTD(), 0, 0x2},
      {"FromSubString", GetTagTD(), GetSubStringTD(), 0, 0xA},
      {"FromPath", GetTagTD(), GetPathTD(), 0, 0x100},
      {"FromNumber", GetTagTD(), GetiL(), 0, 0x100},
      {"BoundsDiffer", GetTagTD(), TDRTag(4, 1, nullptr), 0, 0x8},
      {"StringFromBoundedTag", TDRString(nullptr, vellum::bound::Fixed(2)), TDRTag(4, 1, nullptr), 0x2000, 0x8000A},
      {"ClassesDiffer", TDRUserDefinedTag(U("\x01" "a")), TDRUserDefinedTag(U("\x01" "b")), 0, 0x100},
      {"ClassesAgree", TDRUserDefinedTag(U("\x01" "a")), TDRUserDefinedTag(U("\x01" "a")), 0, 0},
      {"UserDefinedFromPlain", TDRUserDefinedTag(), GetTagTD(), 0, 0x100},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.dst.CmpTD(c.src, c.flags), c.result);
  }
}

TEST_F(TDTagBaseTest, DataIsAString) {
  LStrHandle tag = nullptr;
  const TDR bounded = TDRTag(3, 1, nullptr);
  ASSERT_EQ(bounded.InflateDefData(&tag, 0, 0, 0), kStatusNoError);
  EXPECT_EQ(DSGetHandleSize(reinterpret_cast<UHandle>(tag)), 7u);
  LStrHandle text = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abcdef", &text), kStatusNoError);
  ASSERT_EQ(GetStringTD().CopyDataConvert(bounded, &text, &tag, 0), kStatusNoError);
  EXPECT_EQ(StringUtils::FromLStr(tag), "abc");
  ASSERT_EQ(GetTagTD().CopyData(&text, &tag, nullptr, 0), kStatusNoError);
  EXPECT_EQ(StringUtils::FromLStr(tag), "abcdef");
  DSDisposeHandle(reinterpret_cast<UHandle>(tag));
  DSDisposeHandle(reinterpret_cast<UHandle>(text));
}

TEST_F(TDTagBaseTest, DebugDump) {
  DebugCapture capture;
  TDRUserDefinedTag(U("\x03" "Cls")).PrintDebugStr();
  const std::vector<std::string> texts = capture.Texts();
  ASSERT_EQ(texts.size(), 8u);
  EXPECT_EQ(texts[1], "\ttype = user-defined tag");
  EXPECT_EQ(texts[3], "\tbound = -1");
  EXPECT_EQ(texts[4], "\ttagType = 5");
  EXPECT_EQ(texts[5], "\tcontext = 0x0");
  EXPECT_EQ(texts[6], "\ttagClass = Cls");
}

TEST_F(TDTagBaseTest, StoredKindsOutsideTheValidOnesAreReported) {
  struct KindCase {
    const char* name;
    TagType saved;
    TagType loaded;
    std::vector<std::string> messages;
  };
  const KindCase kCases[] = {
      {"Valid", 23, 23, {}},
      {"SwappedOne", 0x0100, 1, {"invalid tag type:256", "replacing invalid tag type:256 with:1"}},
      {"SwappedLast", 0x1700, 23, {"invalid tag type:5888", "replacing invalid tag type:5888 with:23"}},
      {"BeyondTheKinds", 24, 24, {"invalid tag type:24"}},
      {"Zero", 0, 0, {"invalid tag type:0"}},
  };
  for (const KindCase& c : kCases) {
    SCOPED_TRACE(c.name);
    UHandle h = nullptr;
    ASSERT_EQ(FlattenOneType(nullptr, TDRTag(c.saved, nullptr), &h, nullptr), kStatusNoError);
    DebugCapture capture;
    TDR loaded;
    EXPECT_EQ(UnFlattenOneType(nullptr, h, &loaded, nullptr), kStatusNoError);
    DSDisposeHandle(h);
    EXPECT_EQ(vellum::As<TDRTag>(loaded).GetTagType(), c.loaded);
    EXPECT_EQ(capture.Texts(), c.messages);
  }
}

TEST_F(TDTagBaseTest, CheckOutWithAClassSurvivesAllocationFailures) {
  const TDRUserDefinedTag widget(U("\x06Widget"));
  for (int64_t nth = 1; nth < 50; ++nth) {
    LiveBlockCheck check;
    ScopedAllocationFailure failure(nth);
    const TDW copy = widget.CheckOut();
    if (!failure.Fired()) {
      EXPECT_TRUE(copy);
      EXPECT_EQ(vellum::As<TDWUserDefinedTag>(copy).HasTagClass(), 1);
      return;
    }
    EXPECT_FALSE(copy);
  }
  ADD_FAILURE() << "never succeeded";
}

}  // namespace
