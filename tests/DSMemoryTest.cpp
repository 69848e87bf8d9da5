// Handles, pointer blocks, counted memory, and the failure injection that other tests rely on.
#include "runtime/DSMemory.h"

#include <gtest/gtest.h>

#include <cstring>
#include <thread>
#include <vector>

#include "support/TestSupport.h"

namespace {

std::vector<uint8_t> Contents(UHandle h) { return std::vector<uint8_t>(*h, *h + DSGetHandleSize(h)); }

TEST(DSMemoryTest, ResizeKeepsContentAndClearVariantsZeroGrowth) {
  LiveBlockCheck leaks;
  UHandle h = nullptr;
  ASSERT_EQ(DSNewHandle(4, &h), kStatusNoError);
  std::memcpy(*h, "abcd", 4);
  ASSERT_EQ(DSSetHSzClr(h, 4096), kStatusNoError);
  EXPECT_EQ(DSGetHandleSize(h), 4096u);
  EXPECT_EQ(std::memcmp(*h, "abcd", 4), 0);
  EXPECT_EQ(Contents(h), [] {
    std::vector<uint8_t> v(4096, 0);
    std::memcpy(v.data(), "abcd", 4);
    return v;
  }());
  ASSERT_EQ(DSSetHandleSize(h, 2), kStatusNoError);
  EXPECT_EQ(Contents(h), (std::vector<uint8_t>{'a', 'b'}));
  ASSERT_EQ(DSSetHandleSize(h, 0), kStatusNoError);
  EXPECT_NE(*h, nullptr) << "a block is never null";
  EXPECT_EQ(DSDisposeHandle(h), kStatusNoError);

  UHandle z = nullptr;
  ASSERT_EQ(DSNewHClr(100, &z), kStatusNoError);
  EXPECT_EQ(Contents(z), std::vector<uint8_t>(100, 0));
  DSDisposeHandle(z);
}

TEST(DSMemoryTest, NullAndForeignHandlesAreRefusedWithoutBeingTouched) {
  LiveBlockCheck leaks;
  uint8_t* fakeMaster = nullptr;
  UHandle garbage = &fakeMaster;  // looks like a handle, was not made here
  UHandle freed = nullptr;
  ASSERT_EQ(DSNewHandle(8, &freed), kStatusNoError);
  ASSERT_EQ(DSDisposeHandle(freed), kStatusNoError);

  struct Case {
    const char* name;
    UHandle h;
    int32_t resize;
    int32_t dispose;
  };
  const Case kCases[] = {
      {"Null", nullptr, kStatusNullHandle, kStatusNoError},
      {"Garbage", garbage, kStatusBadArgument, kStatusBadArgument},
      {"AlreadyDisposed", freed, kStatusBadArgument, kStatusBadArgument},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(IsDSHandle(c.h), 0);
    EXPECT_EQ(DSGetHandleSize(c.h), 0u);
    EXPECT_EQ(DSSetHandleSize(c.h, 16), c.resize);
    EXPECT_EQ(DSSetHSzClr(c.h, 16), c.resize);
    EXPECT_EQ(DSDisposeHandle(c.h), c.dispose);
  }
  EXPECT_EQ(fakeMaster, nullptr);
  EXPECT_EQ(IsDSHandle(reinterpret_cast<const void*>(uintptr_t{0x10})), 0);
}

TEST(DSMemoryTest, SetSizeOrNewAllocatesOnlyForNull) {
  LiveBlockCheck leaks;
  UHandle h = nullptr;
  ASSERT_EQ(DSSetHSzOrNewHClr(&h, 3), kStatusNoError);
  ASSERT_NE(h, nullptr);
  EXPECT_EQ(Contents(h), std::vector<uint8_t>(3, 0));
  UHandle same = h;
  ASSERT_EQ(DSSetHandleSizeOrNewHandle(&h, 50), kStatusNoError);
  EXPECT_EQ(h, same) << "the master pointer never moves";
  EXPECT_EQ(DSGetHandleSize(h), 50u);
  EXPECT_EQ(DSSetHandleSizeOrNewHandle(nullptr, 1), kStatusBadArgument);
  DSDisposeHandle(h);
}

TEST(DSMemoryTest, AlignedHandlesStayAlignedWhenTheyGrow) {
  LiveBlockCheck leaks;
  for (size_t alignment : {size_t{32}, size_t{64}, size_t{4096}}) {
    SCOPED_TRACE(alignment);
    UHandle h = nullptr;
    ASSERT_EQ(DSNewAlignedHClr(10, alignment, &h), kStatusNoError);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(*h) % alignment, 0u);
    (*h)[9] = 7;
    ASSERT_EQ(DSSetHSzClr(h, 100000), kStatusNoError);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(*h) % alignment, 0u);
    EXPECT_EQ((*h)[9], 7);
    EXPECT_EQ((*h)[99999], 0);
    UHandle copy = nullptr;
    ASSERT_EQ(DSCopyHandle(&copy, h), kStatusNoError);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(*copy) % alignment, 0u);
    DSDisposeHandle(copy);
    DSDisposeHandle(h);
  }
}

TEST(DSMemoryTest, CopyHandleCases) {
  LiveBlockCheck leaks;
  UHandle src = nullptr;
  ASSERT_EQ(DSNewHandle(5, &src), kStatusNoError);
  std::memcpy(*src, "hello", 5);

  UHandle dst = nullptr;
  ASSERT_EQ(DSCopyHandle(&dst, src), kStatusNoError);
  EXPECT_NE(dst, src);
  EXPECT_EQ(Contents(dst), Contents(src));

  UHandle reused = dst;
  std::memcpy(*src, "HELLO", 5);
  ASSERT_EQ(DSSetHandleSize(src, 3), kStatusNoError);
  ASSERT_EQ(DSCopyHandle(&dst, src), kStatusNoError);
  EXPECT_EQ(dst, reused) << "a live destination is reused";
  EXPECT_EQ(Contents(dst), (std::vector<uint8_t>{'H', 'E', 'L'}));

  ASSERT_EQ(DSCopyHandle(&dst, dst), kStatusNoError);
  EXPECT_EQ(Contents(dst), (std::vector<uint8_t>{'H', 'E', 'L'}));

  ASSERT_EQ(DSCopyHandle(&dst, nullptr), kStatusNoError);
  EXPECT_EQ(dst, nullptr) << "a null source disposes the destination";

  uint8_t* fakeMaster = nullptr;
  EXPECT_EQ(DSCopyHandle(&dst, &fakeMaster), kStatusBadArgument);
  EXPECT_EQ(dst, nullptr);
  DSDisposeHandle(src);
}

TEST(DSMemoryTest, PointerBlocks) {
  LiveBlockCheck leaks;
  const int64_t live = DSLiveBlockCount();
  UPtr p = nullptr;
  ASSERT_EQ(DSNewPClr(64, &p), kStatusNoError);
  EXPECT_EQ(std::vector<uint8_t>(p, p + 64), std::vector<uint8_t>(64, 0));
  EXPECT_EQ(DSLiveBlockCount(), live + 1);
  uint8_t local = 0;
  EXPECT_EQ(DSDisposePtr(&local), kStatusBadArgument);
  EXPECT_EQ(DSDisposePtr(nullptr), kStatusNoError);
  EXPECT_EQ(DSDisposePtr(p), kStatusNoError);
  EXPECT_EQ(DSDisposePtr(p), kStatusBadArgument) << "a second dispose is refused";
  UPtr empty = nullptr;
  ASSERT_EQ(DSNewPtr(0, &empty), kStatusNoError);
  EXPECT_NE(empty, nullptr);
  DSDisposePtr(empty);
}

TEST(DSMemoryTest, InjectedFailureFiresOnceOnTheNthAllocation) {
  LiveBlockCheck leaks;
  UHandle a = nullptr;
  UHandle b = nullptr;
  UHandle c = nullptr;
  {
    ScopedAllocationFailure failure(2);
    EXPECT_EQ(DSNewHandle(8, &a), kStatusNoError);
    EXPECT_FALSE(failure.Fired());
    EXPECT_EQ(DSNewHandle(8, &b), kStatusOutOfMemory);
    EXPECT_EQ(b, nullptr);
    EXPECT_TRUE(failure.Fired());
    EXPECT_EQ(DSNewHandle(8, &c), kStatusNoError) << "the failure fires once";
  }
  void* after = PXAlloc(0);
  EXPECT_NE(after, nullptr) << "leaving the scope disarms";
  PXFree(after);
  DSDisposeHandle(a);
  DSDisposeHandle(c);
}

TEST(DSMemoryTest, EveryKindOfAllocationCanBeFailed) {
  LiveBlockCheck leaks;
  UHandle h = nullptr;
  ASSERT_EQ(DSNewHandle(4, &h), kStatusNoError);
  std::memcpy(*h, "keep", 4);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(DSSetHandleSize(h, 1 << 20), kStatusOutOfMemory);
  }
  EXPECT_EQ(Contents(h), (std::vector<uint8_t>{'k', 'e', 'e', 'p'})) << "a failed resize leaves the handle";
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(DSSetHandleSize(h, 2), kStatusNoError) << "shrinking is not an allocation";
    EXPECT_FALSE(failure.Fired());
  }
  UHandle copy = nullptr;
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(DSCopyHandle(&copy, h), kStatusOutOfMemory);
    EXPECT_EQ(copy, nullptr);
  }
  UPtr p = nullptr;
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(DSNewPtr(4, &p), kStatusOutOfMemory);
    EXPECT_EQ(p, nullptr);
  }
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(PXAlloc(16), nullptr);
  }
  {
    ScopedAllocationFailure failure(1);
    std::vector<int, PXAllocator<int>> v;
    EXPECT_THROW(v.resize(10), std::bad_alloc);
  }
  DSDisposeHandle(h);
}

// Builds a handle through several growths and a copy; every step is one allocation.
int32_t GrowAndCopy(UHandle* grown, UHandle* copy) {
  if (int32_t err = DSNewHClr(1, grown)) return err;
  for (size_t size : {size_t{100}, size_t{1000}, size_t{100000}}) {
    if (int32_t err = DSSetHSzClr(*grown, size)) return err;
    (**grown)[size - 1] = static_cast<uint8_t>(size);
  }
  return DSCopyHandle(copy, *grown);
}

TEST(DSMemoryTest, FailureSweepOverHandleGrowth) {
  LiveBlockCheck leaks;
  for (int64_t n = 1;; ++n) {
    SCOPED_TRACE(n);
    UHandle grown = nullptr;
    UHandle copy = nullptr;
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      status = GrowAndCopy(&grown, &copy);
      fired = failure.Fired();
    }
    if (!fired) {
      ASSERT_EQ(status, kStatusNoError);
      EXPECT_EQ(Contents(copy), Contents(grown));
      EXPECT_EQ(n - 1, 5) << "one new handle, three growths, one copy";
      DSDisposeHandle(grown);
      DSDisposeHandle(copy);
      break;
    }
    EXPECT_EQ(status, kStatusOutOfMemory);
    EXPECT_EQ(copy, nullptr);
    DSDisposeHandle(grown);
  }
}

TEST(DSMemoryTest, CountersFollowAllocations) {
  const int64_t attempts = DSAllocationCount();
  const int64_t live = DSLiveBlockCount();
  void* p = PXAlloc(10);
  UHandle h = nullptr;
  DSNewHandle(1, &h);
  EXPECT_EQ(DSAllocationCount(), attempts + 2);
  EXPECT_EQ(DSLiveBlockCount(), live + 2);
  PXFree(p);
  DSDisposeHandle(h);
  EXPECT_EQ(DSLiveBlockCount(), live);
}

TEST(DSMemoryTest, ConcurrentHandleTraffic) {
  LiveBlockCheck leaks;
  std::vector<std::thread> threads;
  std::vector<int> failures(8, 0);
  for (int t = 0; t < 8; ++t) {
    threads.emplace_back([t, &failures] {
      for (int i = 0; i < 500; ++i) {
        UHandle h = nullptr;
        if (DSNewHandle(static_cast<size_t>(i % 64), &h) != 0 || !IsDSHandle(h)) ++failures[t];
        if (DSSetHSzClr(h, 128) != 0 || DSDisposeHandle(h) != 0) ++failures[t];
        PXFree(PXAlloc(32));
      }
    });
  }
  for (std::thread& t : threads) t.join();
  EXPECT_EQ(failures, std::vector<int>(8, 0));
}

}  // namespace
