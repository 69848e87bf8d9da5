// The plain pointer kinds: CStr, PStr, Ptr and PtrTo: kinds, layout, the copies refused for
// caller-owned strings, pointer copies, their factories and the absence of shared defaults.
#include "vellum/TDOtherHandles.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "vellum/TypeManagerHooks.h"
#include "vellum.h"

namespace {

class TDOtherTest : public TypeSystemTest {};


class PointerPlatform final : public ITargetPlatformAlignment {
 public:
  int32_t MaxAlignment() const override { return 4; }
  int32_t AggregateAlignmentMode() const override { return 0; }
  int32_t PointerSize() const override { return 4; }
  int32_t IsBigEndian() const override { return 0; }
  int32_t NumericSize(int32_t) const override { return 0; }
};

TEST_F(TDOtherTest, Kinds) {
  struct Case {
    const char* name;
    TDR type;
    int16_t code;
    int32_t (TD::*predicate)() const;
    DataShapes shape;
  };
  const Case kCases[] = {
      {"CStr", TDRCStr(), 0x34, &TD::IsCStr, kDataShapeStringLike},
      {"PStr", TDRPStr(), 0x35, &TD::IsPStr, kDataShapeStringLike},
      {"Ptr", TDRPtr(), 0x80, &TD::IsPtr, kDataShapePlain},
      {"PtrTo", TDRPtrTo(), 0x83, &TD::IsPtrTo, kDataShapePlain},
  };
  PointerPlatform platform;
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(c.type);
    EXPECT_EQ(c.type.GetTypeCode(), c.code);
    EXPECT_EQ((c.type.*c.predicate)(), 1);
    EXPECT_EQ(c.type.IsStringBase(), 0);
    EXPECT_EQ(c.type.DataSize(), 8);
    EXPECT_EQ(c.type.GetAlignment(), 8);
    EXPECT_EQ(c.type.DataSize(&platform), 4);
    EXPECT_EQ(c.type.DataShape(), c.shape);
    EXPECT_EQ(ToString(c.type), "?");
    // Read back from type strings through their factories; no shared default.
    TDTypeFactory* factory = GetTypeFactory(c.code);
    ASSERT_NE(factory, nullptr);
    int32_t status = -1;
    EXPECT_EQ(TD(factory->CreateTD(nullptr, static_cast<uint16_t>(c.code), &status), 1).GetTypeCode(), c.code);
    EXPECT_EQ(status, kStatusNoError);
    DebugCapture capture;
    EXPECT_FALSE(MakeDefaultTDRForTypeCode(c.code));
    EXPECT_EQ(capture.Texts().size(), 1u);
  }
  EXPECT_EQ(TDRPtrTo().IsSingleContainer(), 1);
  EXPECT_TRUE(TDRCStr(U("c")) == TDWCStr(U("c")).CheckIn());
  EXPECT_FALSE(TDRCStr() == TDRPStr());
  EXPECT_TRUE(vellum::As<TDRPtr>(TDRCStr()).IsNull());
}

TEST_F(TDOtherTest, CallerOwnedStringsAreNeverCopied) {
  DebugCapture capture;
  const char* text = "abc";
  const char* copy = nullptr;
  EXPECT_EQ(TDRCStr().CopyData(&text, &copy, nullptr, 0), kStatusBadArgument);
  EXPECT_EQ(TDRPStr().CopyData(&text, &copy, nullptr, 0), kStatusBadArgument);
  EXPECT_EQ(copy, nullptr);
  EXPECT_EQ(TDRCStr().CopyDataConvert(TDRPStr(), &text, &copy, 0), kStatusBadArgument);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"CopyData bad type=0x00000034", "CopyData bad type=0x00000035",
                                                       "CopyDataConvert tcDst=0x00000035, tcSrc=0x00000034"}));
  EXPECT_EQ(TDRCStr().CmpTD(TDRCStr(U("named")), 0), 0);
  EXPECT_EQ(TDRCStr().CmpTD(TDRPStr(), 0), 0x100);
  // Default data is the null pointer.
  copy = text;
  EXPECT_EQ(TDRCStr().InflateDefData(&copy, 0, 1, 0), kStatusNoError);
  EXPECT_EQ(copy, nullptr);
}

TEST_F(TDOtherTest, PointersCopyTheirValue) {
  int target = 0;
  void* src = &target;
  void* dst = nullptr;
  EXPECT_EQ(TDRPtr().CopyData(&src, &dst, nullptr, 0), kStatusNoError);
  EXPECT_EQ(dst, &target);
  dst = nullptr;
  EXPECT_EQ(TDRPtr().CopyDataConvert(TDRPtr(U("other")), &src, &dst, 0), kStatusNoError);
  EXPECT_EQ(dst, &target);
  DebugCapture capture;
  EXPECT_EQ(TDRPtr().CopyDataConvert(GetiQ(), &src, &dst, 0), kStatusBadArgument);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"CopyDataConvert tcDst=0x00000004, tcSrc=0x00000080"}));

  TDWPtrTo pointer;
  ASSERT_EQ(pointer.SetEltTD(TDWFloat64()), kStatusNoError);
  const TDR toDouble = pointer.CheckIn();
  EXPECT_TRUE(vellum::As<TDRPtrTo>(toDouble).GetEltTD() == GetfD());
  EXPECT_FALSE(toDouble == TDRPtrTo());
  dst = nullptr;
  EXPECT_EQ(toDouble.CopyData(&src, &dst, nullptr, 0), kStatusNoError);
  EXPECT_EQ(dst, &target);
}

}  // namespace
