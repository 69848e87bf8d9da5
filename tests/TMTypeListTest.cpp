// Type lists: positions, slot reuse, growth, share groups, copies and the missing-list failures.
#include "vellum/TMTypeList.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "vellum.h"

namespace {

class TMTypeListTest : public TypeSystemTest {};

std::vector<uint32_t> Groups(const TMTypeList& list, uint32_t* counter) {
  uint32_t* groups = nullptr;
  EXPECT_EQ(list.BuildShareList(&groups, counter), 0);
  std::vector<uint32_t> result;
  if (groups == nullptr) return result;
  result.assign(groups, groups + list.GetNumTypes());
  EXPECT_EQ(DSDisposePtr(reinterpret_cast<UPtr>(groups)), 0);
  return result;
}

TEST_F(TMTypeListTest, AppendNumbersFromOneAndGrowsByOneHundred) {
  TMTypeList list;
  EXPECT_EQ(list.GetNumTypes(), 0);
  EXPECT_EQ(list.GetCapacity(), 0);
  uint32_t index = 0;
  ASSERT_EQ(list.AppendType(GetiL(), &index), 0);
  EXPECT_EQ(index, 1u);
  EXPECT_EQ(list.GetCapacity(), 100);
  for (uint32_t i = 2; i <= 101; ++i) {
    ASSERT_EQ(list.AppendType(GetfD(), &index), 0);
    EXPECT_EQ(index, i);
  }
  EXPECT_EQ(list.GetCapacity(), 200);

  // From a list of exactly 100 the 101st append makes room for 200.
  TMTypeList exact;
  ASSERT_EQ(exact.ReserveList(100), 0);
  for (int i = 0; i < 100; ++i) ASSERT_EQ(exact.AppendType(GetiL(), nullptr), 0);
  EXPECT_EQ(exact.GetCapacity(), 100);
  ASSERT_EQ(exact.AppendType(GetiL(), &index), 0);
  EXPECT_EQ(index, 101u);
  EXPECT_EQ(exact.GetCapacity(), 200);
}

TEST_F(TMTypeListTest, AppendOfAnImplementationPointerReturnsTheStoredHandle) {
  TMTypeList list;
  uint32_t index = 0;
  const TDR& stored = list.AppendType(GetStringTD().GetImpPtr(), &index);
  EXPECT_EQ(stored, GetStringTD());
  EXPECT_EQ(&stored, &list.GetType(0));
  EXPECT_EQ(index, 1u);
}

TEST_F(TMTypeListTest, DeletedSlotsAreReusedByInsert) {
  TMTypeList list;
  for (const TDR& type : {GetiL(), GetfD(), GetStringTD()}) ASSERT_EQ(list.InsertType(type, nullptr), 0);
  EXPECT_EQ(list.GetNumTypes(), 3);
  ASSERT_EQ(list.DeleteType(2), 0);
  EXPECT_EQ(list.GetNumTypes(), 3);
  EXPECT_TRUE(list.GetType(1).IsNull());
  uint32_t index = 0;
  ASSERT_EQ(list.InsertType(GetBoolTD(), &index), 0);
  EXPECT_EQ(index, 2u);
  EXPECT_EQ(list.GetType(1), GetBoolTD());
  EXPECT_EQ(list.GetNumTypes(), 3);
  // No empty slot left: appended.
  ASSERT_EQ(list.InsertType(GetPathTD(), &index), 0);
  EXPECT_EQ(index, 4u);
}

TEST_F(TMTypeListTest, FreeHintFollowsTheLowestEmptySlot) {
  TMTypeList list;
  for (int i = 0; i < 5; ++i) ASSERT_EQ(list.AppendType(GetiL(), nullptr), 0);
  EXPECT_EQ(list.FindNullType(), -1);
  ASSERT_EQ(list.DeleteType(4), 0);
  EXPECT_EQ(list.FindNullType(), 3);
  // A slot below the hint lowers it; one above does not hide the lower one.
  ASSERT_EQ(list.DeleteType(2), 0);
  ASSERT_EQ(list.DeleteType(5), 0);
  EXPECT_EQ(list.FindNullType(), 1);
  ASSERT_EQ(list.ReplaceType(2, GetfD()), 0);
  EXPECT_EQ(list.FindNullType(), 3);
  ASSERT_EQ(list.DeleteAllTypes(), 0);
  EXPECT_EQ(list.GetNumTypes(), 0);
  EXPECT_EQ(list.FindNullType(), -1);
}

TEST_F(TMTypeListTest, PositionsOutsideTheList) {
  TMTypeList list;
  ASSERT_EQ(list.AppendType(GetiL(), nullptr), 0);
  struct Case {
    uint32_t position;
    int32_t status;
  };
  for (const Case c : {Case{0, 1}, Case{2, 1}, Case{0xFFFFFFFF, 1}, Case{1, 0}}) {
    SCOPED_TRACE(c.position);
    EXPECT_EQ(list.ReplaceType(c.position, GetfD()), c.status);
  }
  EXPECT_EQ(list.GetType(0), GetfD());
  EXPECT_TRUE(list.GetType(1).IsNull());
  EXPECT_TRUE(list.GetType(0xFFFFFFFF).IsNull());
  EXPECT_EQ(list.DeleteType(0), 1);
}

TEST_F(TMTypeListTest, ShareGroupsFollowDataEquality) {
  TMTypeList list;
  for (const TDR& type : {GetiL(), GetfD(), GetiL()}) ASSERT_EQ(list.AppendType(type, nullptr), 0);
  uint32_t counter = 0;
  EXPECT_EQ(Groups(list, &counter), (std::vector<uint32_t>{0, 1, 0}));
  EXPECT_EQ(counter, 2u);

  // Numbering continues from the counter; names are compared, so a named Int32 is a group of its
  // own; empty slots get their own numbers and match nothing.
  TDWInt32 named;
  ASSERT_EQ(named.SetName(std::string("count")), 0);
  ASSERT_EQ(list.AppendType(named.CheckIn(), nullptr), 0);
  ASSERT_EQ(list.AppendType(TDR(), nullptr), 0);
  ASSERT_EQ(list.AppendType(TDR(), nullptr), 0);
  counter = 5;
  EXPECT_EQ(Groups(list, &counter), (std::vector<uint32_t>{5, 6, 5, 7, 8, 9}));
  EXPECT_EQ(counter, 10u);

  uint32_t* groups = nullptr;
  EXPECT_EQ(list.BuildShareList(nullptr, &counter), 1);
  EXPECT_EQ(list.BuildShareList(&groups, nullptr), 1);
}

TEST_F(TMTypeListTest, CopiesShareTheDescriptors) {
  TMTypeList list;
  ASSERT_EQ(list.AppendType(GetiL(), nullptr), 0);
  ASSERT_EQ(list.AppendType(GetStringTD(), nullptr), 0);
  ASSERT_EQ(list.DeleteType(1), 0);
  TMTypeList copy(list);
  EXPECT_EQ(copy.GetNumTypes(), 2);
  EXPECT_EQ(copy.GetType(1), GetStringTD());
  EXPECT_EQ(copy.FindNullType(), 0);

  TMTypeList assigned;
  ASSERT_EQ(assigned.AppendType(GetfD(), nullptr), 0);
  assigned = list;
  EXPECT_EQ(assigned.GetNumTypes(), 2);
  EXPECT_EQ(assigned.GetType(1), GetStringTD());

  TMTypeList replaced;
  ASSERT_EQ(replaced.ReplaceAllTypes(copy), 0);
  EXPECT_EQ(replaced.GetType(1), GetStringTD());
  EXPECT_EQ(replaced.ReplaceAllTypes(replaced), 0);
  EXPECT_EQ(replaced.GetNumTypes(), 2);
}

TEST_F(TMTypeListTest, SetContextLeavesContextFreeEntriesAlone) {
  TMTypeList list;
  ASSERT_EQ(list.AppendType(GetiL(), nullptr), 0);
  ASSERT_EQ(list.AppendType(TDR(), nullptr), 0);
  EXPECT_EQ(list.SetContextRecursive(nullptr), 0);
  EXPECT_EQ(list.GetType(0), GetiL());
  EXPECT_TRUE(list.GetType(1).IsNull());
}

TEST_F(TMTypeListTest, MissingListFailsEveryOperation) {
  DebugCapture capture;
  std::unique_ptr<TMTypeList> list;
  {
    ScopedAllocationFailure failure(1);
    list = std::make_unique<TMTypeList>();
  }
  ASSERT_FALSE(list->IsValid());
  EXPECT_TRUE(capture.Contains("Couldn't initialize type list!"));
  uint32_t index = 7;
  EXPECT_EQ(list->AppendType(GetiL(), &index), 42);
  EXPECT_EQ(index, 7u);
  EXPECT_TRUE(list->AppendType(GetiL().GetImpPtr(), &index).IsNull());
  EXPECT_EQ(list->InsertType(GetiL(), &index), 42);
  EXPECT_EQ(list->ReplaceType(1, GetiL()), 42);
  EXPECT_EQ(list->DeleteAllTypes(), 42);
  EXPECT_EQ(list->FindNullType(), -1);
  EXPECT_EQ(list->ReserveList(4), 42);
  EXPECT_EQ(list->SetContextRecursive(nullptr), 42);
  uint32_t* groups = nullptr;
  uint32_t counter = 0;
  EXPECT_EQ(list->BuildShareList(&groups, &counter), 42);
  EXPECT_TRUE(capture.Contains("The type list is missing."));
  EXPECT_EQ(list->GetNumTypes(), 0);
  EXPECT_TRUE(capture.Contains("Type manager wasn't properly initialized!"));
  EXPECT_TRUE(list->GetType(0).IsNull());
  EXPECT_TRUE(capture.Contains("The type list is missing!"));
  for (const DebugMessage& m : capture.Messages()) EXPECT_EQ(m.level, 2) << m.text;
}

TEST_F(TMTypeListTest, AllocationFailuresAreStatuses) {
  DebugCapture capture;
  TMTypeList list;
  const TDR int32 = GetiL();
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(list.AppendType(int32, nullptr), 42);
    EXPECT_TRUE(failure.Fired()) << list.GetCapacity();
  }
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(list.InsertType(GetiL(), nullptr), 42);
  }
  EXPECT_TRUE(capture.Contains("Failed to insert the type."));
  EXPECT_EQ(list.GetNumTypes(), 0);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(list.ReserveList(1000), 2);
  }
  ASSERT_EQ(list.AppendType(GetiL(), nullptr), 0);
  {
    ScopedAllocationFailure failure(1);
    uint32_t* groups = nullptr;
    uint32_t counter = 0;
    EXPECT_EQ(list.BuildShareList(&groups, &counter), 2);
    EXPECT_EQ(groups, nullptr);
  }
  TMTypeList other;
  for (int i = 0; i < 3; ++i) ASSERT_EQ(other.AppendType(GetfD(), nullptr), 0);
  {
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(list.ReplaceAllTypes(other), 2);
  }
  EXPECT_EQ(list.GetNumTypes(), 0);
}

}  // namespace
