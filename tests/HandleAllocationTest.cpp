// The allocator interface that data operations give handle memory back through: the ordinary
// implementation over the memory manager, its refusals and running out of memory.
#include "runtime/HandleAllocation.h"

#include <gtest/gtest.h>

#include <cstring>

#include "support/TestSupport.h"
#include "runtime/DSMemory.h"

namespace {

TEST(HandleAllocationTest, NormalAllocatorUsesMemoryManagerHandles) {
  LiveBlockCheck noLeak;
  const HandleAllocationInterface& allocator = NormalHandleAllocator();
  UHandle h = nullptr;
  ASSERT_EQ(allocator.NewHandleClear(8, &h), 0);
  ASSERT_NE(h, nullptr);
  EXPECT_EQ(allocator.OwnsHandle(h), 1);
  EXPECT_EQ(IsDSHandle(h), 1);
  EXPECT_EQ(allocator.GetHandleSize(h), 8u);
  for (int i = 0; i < 8; ++i) EXPECT_EQ((*h)[i], 0);
  std::memset(*h, 7, 8);
  ASSERT_EQ(allocator.SetHandleSizeClear(h, 12), 0);
  EXPECT_EQ(allocator.GetHandleSize(h), 12u);
  EXPECT_EQ((*h)[7], 7);
  EXPECT_EQ((*h)[11], 0);
  ASSERT_EQ(allocator.SetHandleSize(h, 4), 0);
  EXPECT_EQ(allocator.GetHandleSize(h), 4u);
  EXPECT_EQ(allocator.DisposeHandle(h), 0);
  EXPECT_EQ(allocator.OwnsHandle(h), 0);

  UHandle plain = nullptr;
  ASSERT_EQ(allocator.NewHandle(3, &plain), 0);
  EXPECT_EQ(allocator.GetHandleSize(plain), 3u);
  EXPECT_EQ(allocator.DisposeHandle(plain), 0);
}

TEST(HandleAllocationTest, RefusalsAndNullHandles) {
  LiveBlockCheck noLeak;
  const HandleAllocationInterface& allocator = NormalHandleAllocator();
  uint8_t* master = nullptr;
  const UHandle foreign = &master;
  EXPECT_EQ(allocator.DisposeHandle(nullptr), 0);
  EXPECT_EQ(allocator.DisposeHandle(foreign), 1);
  EXPECT_EQ(allocator.SetHandleSize(nullptr, 4), 42);
  EXPECT_EQ(allocator.SetHandleSize(foreign, 4), 1);
  EXPECT_EQ(allocator.GetHandleSize(foreign), 0u);
  EXPECT_EQ(allocator.OwnsHandle(foreign), 0);
  EXPECT_EQ(allocator.OwnsHandle(nullptr), 0);
}

TEST(HandleAllocationTest, RunningOutOfMemoryLeavesTheHandle) {
  LiveBlockCheck noLeak;
  const HandleAllocationInterface& allocator = NormalHandleAllocator();
  UHandle h = nullptr;
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(allocator.NewHandle(16, &h), 2);
    EXPECT_EQ(h, nullptr);
  }
  ASSERT_EQ(allocator.NewHandle(4, &h), 0);
  (*h)[0] = 42;
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(allocator.SetHandleSize(h, 4096), 2);
  }
  EXPECT_EQ(allocator.GetHandleSize(h), 4u);
  EXPECT_EQ((*h)[0], 42);
  EXPECT_EQ(allocator.DisposeHandle(h), 0);
}

}  // namespace
