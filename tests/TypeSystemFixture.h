// A test fixture that runs the type manager service the way a host does, and checks at the end
// that stopping it gave back every handle and block the test made.
#pragma once

#include <gtest/gtest.h>

#include "TestSupport.h"
#include "runtime/DSMemory.h"
#include "runtime/PXServices.h"
#include "vellum.h"

class TypeSystemTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // One start and stop first, so that what lives as long as the process (the dictionaries'
    // tables) exists before the baseline is taken.
    ASSERT_EQ(services_.Start(TypeManagerService()), 0);
    services_.StopAll();
    baseline_ = DSLiveBlockCount();
    ASSERT_EQ(services_.Start(TypeManagerService()), 0);
  }

  void TearDown() override {
    services_.StopAll();
    EXPECT_EQ(DSLiveBlockCount(), baseline_) << "the test leaked handles, blocks or descriptors";
  }

  ServiceManager services_;
  int64_t baseline_ = 0;
};
