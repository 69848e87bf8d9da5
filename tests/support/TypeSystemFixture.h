// A test fixture that runs the type manager service the way a host does, and checks at the end
// that stopping it gave back every handle and block the test made.
#pragma once

#include <gtest/gtest.h>

#include "support/TestSupport.h"
#include "runtime/DSMemory.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXPath.h"
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

// A writable typedef link to the definition `viName` ("lib:file"), with a path when `pathized`.
inline TDWTypedef Link(const std::string& viName, uint32_t timeStamp, bool pathized = false) {
  QualifiedName name;
  EXPECT_EQ(name.FromDelimitedName(viName), kStatusNoError);
  Path path = nullptr;
  if (pathized) {
    EXPECT_EQ(FEmptyPath(&path), kStatusNoError);
    EXPECT_EQ(FAppendName(path, U("\x07types.x")), kStatusNoError);
  }
  TDWTypedef link(name, timeStamp, path);
  FDestroyPath(&path);
  return link;
}

// A target platform for layout tests: its largest alignment, whether aggregates take it, and
// its pointer size; numerics have this process's sizes.
class TestPlatform final : public ITargetPlatformAlignment {
 public:
  TestPlatform(int32_t maxAlignment, int32_t aggregateMode, int32_t pointerSize)
      : max_(maxAlignment), aggregate_(aggregateMode), pointer_(pointerSize) {}
  int32_t MaxAlignment() const override { return max_; }
  int32_t AggregateAlignmentMode() const override { return aggregate_; }
  int32_t PointerSize() const override { return pointer_; }
  int32_t IsBigEndian() const override { return 0; }
  int32_t NumericSize(int32_t typeCode) const override { return NumSize(typeCode); }

 private:
  int32_t max_;
  int32_t aggregate_;
  int32_t pointer_;
};
