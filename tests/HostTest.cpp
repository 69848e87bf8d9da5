// The host API: the session, the holders of a handle and of a value, one value flattened and read
// back, the checked down-cast and the reason of a refusal on the calling thread.
#include "vellum/Host.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <thread>
#include <vector>

#include "runtime/MoveBytes.h"
#include "runtime/PXStrings.h"
#include "support/TestDatum.h"
#include "support/TypeSystemFixture.h"
#include "vellum.h"

namespace {

class HostTest : public TypeSystemTest {};

TDRCluster CountAndLabel() {
  TDWCluster cluster;
  cluster << TDWInt32(U("count")) << TDWString(U("label"));
  return cluster.CheckIn();
}

// A value of {count, label} holding 3 and "abc".
vellum::Value Filled(const TDRCluster& type) {
  vellum::Value value(type);
  EXPECT_EQ(value.Status(), kStatusNoError);
  // Packed data holds its elements unaligned: moved in and out by bytes.
  Store(type.GetEltPtr(0, value.Data()), int32_t{3});
  auto label = Load<LStrHandle>(type.GetEltPtr(1, value.Data()));
  EXPECT_EQ(StringUtils::ToLStr("abc", &label), kStatusNoError);
  Store(type.GetEltPtr(1, value.Data()), label);
  return value;
}

TEST(HostSessionTest, StartsTheLibraryAndStopsItAgain) {
  // What lives as long as the process (the dictionaries' tables) is made by the first start.
  { const vellum::Session first; }
  const int64_t before = DSLiveBlockCount();
  {
    const vellum::Session session;
    ASSERT_EQ(session.Status(), kStatusNoError);
    EXPECT_GT(GetNumDictionaries(), 0);
    EXPECT_TRUE(CountAndLabel());
  }
  EXPECT_EQ(GetNumDictionaries(), 0);
  EXPECT_EQ(DSLiveBlockCount(), before);
}

TEST_F(HostTest, ValuesFlattenAndReadBack) {
  const TDRCluster type = CountAndLabel();
  const vellum::Value value = Filled(type);
  std::vector<uint8_t> bytes = {0xEE};  // flattening appends
  ASSERT_EQ(vellum::FlattenData(value, &bytes), kStatusNoError);
  EXPECT_EQ(HexBytes(bytes), "EE 00 00 00 03 00 00 00 03 61 62 63");
  bytes.erase(bytes.begin());

  vellum::Value back(type);
  ASSERT_EQ(vellum::UnflattenData(bytes, &back), kStatusNoError);
  EXPECT_EQ(CompareDataTDR(type, value.Data(), back.Data(), 0, 0), 0);

  // A version before one-byte Booleans writes a Boolean as a 16-bit word.
  std::vector<uint8_t> old;
  const uint8_t yes = 1;
  ASSERT_EQ(vellum::FlattenData(GetBoolTD(), &yes, &old, 0x04502003), kStatusNoError);
  EXPECT_EQ(HexBytes(old), "80 00");

  // Moving a value moves its handles; only one holder gives them back.
  vellum::Value moved = std::move(back);
  EXPECT_EQ(moved.Type(), type);
  EXPECT_EQ(back.Data(), nullptr);
}

TEST_F(HostTest, UnflattenTakesExactlyOneValueUnlessAskedHowMuchItUsed) {
  const std::vector<uint8_t> twoInts = BytesFromHex("00 00 00 07 00 00 00 08");
  vellum::Value value(GetiL());
  DebugCapture capture;
  EXPECT_EQ(vellum::UnflattenData(twoInts, &value), kStatusCorruptData);
  EXPECT_EQ(vellum::LastRefusal(), "4 byte(s) follow the value, which ends at byte 4");
  EXPECT_EQ(Load<int32_t>(value.Data()), 0) << "a refused read leaves the default";

  size_t used = 0;
  ASSERT_EQ(vellum::UnflattenData(twoInts, &value, 0, &used), kStatusNoError);
  EXPECT_EQ(used, 4u);
  EXPECT_EQ(Load<int32_t>(value.Data()), 7);
  EXPECT_TRUE(vellum::LastRefusal().empty()) << "each call starts a new record";
}

TEST_F(HostTest, RefusalsGiveAStatusAndAReason) {
  struct Case {
    const char* name;
    int32_t status;
    int32_t expected;
  };
  vellum::Value value(GetStringTD());
  vellum::Value number(GetiL());
  std::vector<uint8_t> bytes;
  const uint8_t datum = 0;
  const Case kCases[] = {
      {"FlattenNullType", vellum::FlattenData(TDR(), &datum, &bytes), kStatusNullHandle},
      {"FlattenNullData", vellum::FlattenData(GetiL(), nullptr, &bytes), kStatusBadArgument},
      {"UnflattenNullType", vellum::UnflattenData(TDR(), bytes, &bytes), kStatusNullHandle},
      {"UnflattenIntoNothing", vellum::UnflattenData(bytes, nullptr), kStatusBadArgument},
      {"ShortNumber", vellum::UnflattenData(BytesFromHex("00 00 00"), &number), kStatusCorruptData},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.status, c.expected);
  }
  DebugCapture capture;
  EXPECT_EQ(vellum::UnflattenData(BytesFromHex("7F FF FF FF"), &value), kStatusImplausibleData);
  EXPECT_EQ(vellum::LastRefusal(), capture.Texts().front()) << "the first error line is the reason";
  vellum::ClearRefusal();
  EXPECT_TRUE(vellum::LastRefusal().empty());
}

TEST_F(HostTest, ARefusalIsSeenOnlyOnItsThread) {
  DebugCapture capture;
  vellum::Value value(GetStringTD());
  ASSERT_NE(vellum::UnflattenData(BytesFromHex("7F FF FF FF"), &value), kStatusNoError);
  const std::string here = vellum::LastRefusal();
  EXPECT_FALSE(here.empty());
  std::string there = "unset";
  std::thread([&] { there = vellum::LastRefusal(); }).join();
  EXPECT_EQ(there, "");
  EXPECT_EQ(vellum::LastRefusal(), here);
}

TEST_F(HostTest, HoldersGiveBackWhatTheyHoldEvenWhenMemoryRunsOut) {
  const TDRCluster type = CountAndLabel();
  const vellum::Value value = Filled(type);
  std::vector<uint8_t> flat;
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    const vellum::Value copy(type);
    if (copy.Status() != kStatusNoError) return copy.Status();
    flat.clear();
    return vellum::FlattenData(value, &flat);
  });
  // A read that cannot allocate says so with its own status, and gives back what it took.
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 100) << "never succeeded";
    const LiveBlockCheck blocks;
    vellum::Value back(type);
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      status = vellum::UnflattenData(flat, &back);
      fired = failure.Fired();
    }
    if (!fired) {
      ASSERT_EQ(status, kStatusNoError);
      EXPECT_EQ(CompareDataTDR(type, value.Data(), back.Data(), 0, 0), 0);
      break;
    }
    EXPECT_EQ(status, kStatusReadAllocationFailed);
  }

  vellum::OwnedHandle handle;
  ASSERT_EQ(FlattenOneType(nullptr, type, handle.Out(), nullptr), kStatusNoError);
  EXPECT_FALSE(handle.Bytes().empty());
  // A second use of Out() disposes of the first handle.
  ASSERT_EQ(FlattenOneType(nullptr, GetiL(), handle.Out(), nullptr), kStatusNoError);
  EXPECT_EQ(HexBytes(handle.Bytes().data(), handle.Bytes().size()), "00 00 00 01 00 05 00 03 00 00 01 00 00");
  vellum::OwnedHandle kept(handle.Release());
  EXPECT_EQ(handle.Get(), nullptr);
}

TEST_F(HostTest, DownCastsAnswerNullForAnotherKind) {
  const TDRCluster type = CountAndLabel();
  EXPECT_EQ(vellum::As<TDRCluster>(TDR(type)), type);
  EXPECT_FALSE(vellum::As<TDRArray>(TDR(type)));
  EXPECT_FALSE(vellum::As<TDRCluster>(TDR()));
  EXPECT_FALSE(vellum::As<TDWCluster>(TDR(type))) << "a writable handle never holds an interned descriptor";
  const TDWCluster writable = type.CheckOut();
  EXPECT_TRUE(vellum::As<TDWCluster>(writable));
  EXPECT_TRUE(vellum::As<TDWMultiContainer>(writable));
}

}  // namespace
