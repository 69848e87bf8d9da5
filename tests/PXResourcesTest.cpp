// The resource store: ownership of filed handles, replacement, removal and closing a file.
#include "runtime/PXResources.h"

#include <gtest/gtest.h>

#include "support/TestSupport.h"
#include "runtime/DSMemory.h"

namespace {

UHandle NewHandle(uint8_t first) {
  UHandle h = nullptr;
  EXPECT_EQ(DSNewHandle(1, &h), kStatusNoError);
  (*h)[0] = first;
  return h;
}

constexpr uint32_t kType = 0x54444320;  // four characters, as resource types are

TEST(PXResourcesTest, StoreOwnsReplacesAndRemoves) {
  LiveBlockCheck leaks;
  UHandle a = NewHandle(1);
  ASSERT_EQ(RAdd(a, 7, kType, 100, 0x20), kStatusNoError);
  UHandle got = nullptr;
  ASSERT_EQ(RGet(7, kType, 100, &got), kStatusNoError);
  EXPECT_EQ(got, a);
  int32_t flags = 0;
  EXPECT_EQ(RGetFlags(7, kType, 100, &flags), kStatusNoError);
  EXPECT_EQ(flags, 0x20);
  EXPECT_EQ(RAdd(a, 7, kType, 100, 0), kStatusNoError) << "filing the same handle again keeps it";
  EXPECT_EQ(IsDSHandle(a), 1);

  UHandle b = NewHandle(2);
  ASSERT_EQ(RAdd(b, 7, kType, 100, 0), kStatusNoError);
  EXPECT_EQ(IsDSHandle(a), 0) << "the replaced handle is disposed";
  ASSERT_EQ(RGet(7, kType, 100, &got), kStatusNoError);
  EXPECT_EQ((*got)[0], 2);

  EXPECT_EQ(RGet(8, kType, 100, &got), kStatusNullHandle);
  EXPECT_EQ(got, nullptr);
  EXPECT_EQ(RGet(7, kType, 101, &got), kStatusNullHandle);
  EXPECT_EQ(RRemove(7, kType, 100), kStatusNoError);
  EXPECT_EQ(RRemove(7, kType, 100), kStatusNullHandle);
}

TEST(PXResourcesTest, RefusalsLeaveOwnershipWithTheCaller) {
  LiveBlockCheck leaks;
  EXPECT_EQ(RAdd(nullptr, 1, kType, 5, 0), kStatusNullHandle);
  uint8_t* fake = nullptr;
  EXPECT_EQ(RAdd(&fake, 1, kType, 5, 0), kStatusBadArgument);
  UHandle h = NewHandle(3);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(RAdd(h, 1, kType, 5, 0), kStatusOutOfMemory);
  }
  EXPECT_EQ(IsDSHandle(h), 1);
  DSDisposeHandle(h);
}

TEST(PXResourcesTest, CloseFileDisposesOnlyThatFile) {
  LiveBlockCheck leaks;
  for (uint32_t id = 0; id < 5; ++id) {
    ASSERT_EQ(RAdd(NewHandle(0), id, kType, 200, 0), kStatusNoError);
    ASSERT_EQ(RAdd(NewHandle(0), id, kType + 1, 200, 0), kStatusNoError);
  }
  ASSERT_EQ(RAdd(NewHandle(9), 0, kType, 201, 0), kStatusNoError);
  RCloseFile(200);
  UHandle got = nullptr;
  EXPECT_EQ(RGet(3, kType, 200, &got), kStatusNullHandle);
  ASSERT_EQ(RGet(0, kType, 201, &got), kStatusNoError);
  EXPECT_EQ((*got)[0], 9);
  RCloseFile(201);
  RCloseFile(999);
}

}  // namespace
