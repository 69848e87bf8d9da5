// Named mutexes: creation under memory failure, misuse refused with a status, mutual exclusion.
#include "runtime/PXMutex.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "support/TestSupport.h"

namespace {

TEST(PXMutexTest, CreateKeepsTheNameAndDestroyClears) {
  LiveBlockCheck leaks;
  ThMutex m = nullptr;
  std::string name = "DictionaryMutex";
  ASSERT_EQ(ThMutexCreate(&m, name.c_str()), kStatusNoError);
  name = "changed";
  EXPECT_STREQ(ThMutexName(m), "DictionaryMutex");
  EXPECT_EQ(ThMutexDestroy(&m), kStatusNoError);
  EXPECT_EQ(m, nullptr);
  EXPECT_EQ(ThMutexDestroy(&m), kStatusNullHandle);
  EXPECT_EQ(ThMutexDestroy(nullptr), kStatusNullHandle);
  EXPECT_STREQ(ThMutexName(nullptr), "");
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(ThMutexCreate(&m, "RegisterMutex"), kStatusOutOfMemory);
    EXPECT_EQ(m, nullptr);
  }
}

TEST(PXMutexTest, MisuseIsRefused) {
  LiveBlockCheck leaks;
  ThMutex m = nullptr;
  ASSERT_EQ(ThMutexCreate(&m, nullptr), kStatusNoError);
  EXPECT_STREQ(ThMutexName(m), "");
  EXPECT_EQ(ThMutexAcquire(nullptr), kStatusNullHandle);
  EXPECT_EQ(ThMutexRelease(nullptr), kStatusNullHandle);
  EXPECT_EQ(ThMutexRelease(m), kStatusBadArgument) << "not held";
  ASSERT_EQ(ThMutexAcquire(m), kStatusNoError);
  EXPECT_EQ(ThMutexAcquire(m), kStatusBadArgument) << "non-recursive: relocking is refused";
  int32_t otherThreadRelease = -1;
  std::thread([&] { otherThreadRelease = ThMutexRelease(m); }).join();
  EXPECT_EQ(otherThreadRelease, kStatusBadArgument);
  EXPECT_EQ(ThMutexRelease(m), kStatusNoError);
  { ThMutexLock nothing(nullptr); }
  ThMutexDestroy(&m);
}

TEST(PXMutexTest, LockExcludesOtherThreads) {
  ThMutex m = nullptr;
  ASSERT_EQ(ThMutexCreate(&m, "counter"), kStatusNoError);
  int64_t counter = 0;  // guarded by m
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t)
    threads.emplace_back([&] {
      for (int i = 0; i < 10000; ++i) {
        ThMutexLock lock(m);
        counter = counter + 1;
      }
    });
  for (std::thread& t : threads) t.join();
  EXPECT_EQ(counter, 80000);
  ThMutexDestroy(&m);
}

}  // namespace
