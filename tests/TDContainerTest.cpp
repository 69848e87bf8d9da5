// Containers: identity and interning of nested descriptors, check-out, editing of element lists
// and single elements, the `<<` chain and its breaking, traversal with replacement (also inside
// interned containers), ephemeral marking and the Boolean mutation passed to elements, order,
// lossless conversion, allocation failures and concurrent check-in.
#include "vellum/TDContainerHandles.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "vellum.h"

namespace {

using TDContainerTest = TypeSystemTest;


TDW Named(const TDR& type, const char* name) {
  TDW copy = type.CheckOut();
  EXPECT_EQ(copy.SetName(std::string(name)), kStatusNoError);
  return copy;
}

TDRCluster Cluster(const std::vector<TD>& elements, const char* name = nullptr) {
  TDWCluster cluster(U(name));
  for (const TD& element : elements) cluster << element;
  return cluster.CheckIn();
}

// A nested descriptor built from scratch, with writable elements only; null when a step fails.
TDRCluster BuildNested() {
  TDWCluster inner(U("inner"));
  if (!(inner << TDWInt32(U("count")) << TDWBoolean(U("flag")))) return TDRCluster(TDImpPtr(), 0);
  TDWCluster outer(U("outer"));
  return (outer << TDWString(U("text")) << inner << TDWFloat64()).CheckIn();
}

std::string NameOf(const TD& type) {
  std::string name;
  EXPECT_EQ(type.GetName(&name), kStatusNoError);
  return name;
}

TEST_F(TDContainerTest, EqualNestedDescriptorsCheckInToOneObject) {
  const TDRCluster first = BuildNested();
  const TDRCluster second = BuildNested();
  ASSERT_TRUE(first);
  EXPECT_TRUE(first == second);
  EXPECT_EQ(first.GetHashValue(), second.GetHashValue());
  // Its elements are interned as well.
  const TDR inner = first.GetEltTD(1);
  EXPECT_EQ(inner.IsReadOnlyTD(), 1);
  EXPECT_TRUE(inner == Cluster({Named(GetiL(), "count"), Named(GetBoolTD(), "flag")}, "inner"));
  // A writable copy hashes and compares as its interned form.
  const TDWCluster copy = first.CheckOut();
  EXPECT_EQ(copy.GetHashValue(), first.GetHashValue());
  EXPECT_EQ(copy.IsSameAs(first), 1);
}

TEST_F(TDContainerTest, WhatMakesTwoContainersDifferent) {
  const TDRCluster base = Cluster({GetiB(), GetiL()});
  struct Case {
    const char* name;
    TDR other;
  };
  const Case kCases[] = {
      {"order", Cluster({GetiL(), GetiB()})},
      {"count", Cluster({GetiB(), GetiL(), GetiL()})},
      {"element kind", Cluster({GetiB(), GetiW()})},
      {"element name", Cluster({GetiB(), Named(GetiL(), "x")})},
      {"own name", Cluster({GetiB(), GetiL()}, "named")},
      {"nesting", Cluster({GetiB(), Cluster({GetiL()})})},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(c.other);
    EXPECT_FALSE(c.other == base);
    EXPECT_EQ(c.other.IsSameAs(base), 0);
  }
  EXPECT_TRUE(Cluster({GetiB(), GetiL()}) == base);
}

TEST_F(TDContainerTest, AnAbsentElementEqualsOnlyAnAbsentElement) {
  TDWPtrTo a;
  ASSERT_EQ(a.SetEltTD(GetiL()), kStatusNoError);
  TDWPtrTo b = a.Clone();
  ASSERT_EQ(a.RemoveEltTD(), kStatusNoError);
  EXPECT_EQ(a.IsSameAs(b), 0);
  EXPECT_EQ(b.IsSameAs(a), 0);
  ASSERT_EQ(b.RemoveEltTD(), kStatusNoError);
  EXPECT_EQ(a.IsSameAs(b), 1);
  EXPECT_TRUE(a.CheckIn() == b.CheckIn());
  EXPECT_FALSE(a.CheckIn().GetEltTD());
}

TEST_F(TDContainerTest, CheckOutGivesAnIndependentWritableTree) {
  const TDRCluster original = BuildNested();
  TDWCluster copy = original.CheckOut();
  ASSERT_TRUE(copy);
  TDWCluster inner = vellum::As<TDWCluster>(copy.GetEltTD(1));
  ASSERT_TRUE(inner);
  EXPECT_EQ(inner.AppendEltTD(TDWInt8()), kStatusNoError);
  EXPECT_EQ(copy.GetEltTD(0).SetName(std::string("renamed")), kStatusNoError);
  EXPECT_EQ(vellum::As<TDRCluster>(original.GetEltTD(1)).GetNumElts(), 2);
  EXPECT_EQ(NameOf(original.GetEltTD(0)), "text");
  EXPECT_FALSE(copy.CheckIn() == original);
  // The read-only handle offers no writable element.
  EXPECT_FALSE(vellum::As<TDWMultiContainer>(original));
}

TEST_F(TDContainerTest, EditingTheElementList) {
  TDWCluster cluster;
  EXPECT_EQ(cluster.AppendEltTD(GetiL()), kStatusNoError);
  EXPECT_EQ(cluster.InsertEltTDAt(GetiB(), 0), kStatusNoError);
  EXPECT_EQ(cluster.InsertEltTDAt(GetfD(), 2), kStatusNoError);
  EXPECT_EQ(cluster.InsertEltTDAt(GetfD(), 4), kStatusBadArgument);
  EXPECT_EQ(cluster.InsertEltTDAt(GetfD(), -1), kStatusBadArgument);
  EXPECT_EQ(cluster.ReplaceEltTDAt(GetiW(), 1), kStatusNoError);
  EXPECT_EQ(cluster.ReplaceEltTDAt(GetiW(), 3), kStatusBadArgument);
  EXPECT_EQ(cluster.AppendEltTD(TDR()), kStatusNullHandle);
  EXPECT_EQ(cluster.ReserveElementCount(10), kStatusNoError);
  EXPECT_EQ(cluster.ReserveElementCount(-1), kStatusBadArgument);
  EXPECT_TRUE(cluster.CheckIn() == Cluster({GetiB(), GetiW(), GetfD()}));
  EXPECT_EQ(cluster.RemoveAllEltTDs(), kStatusNoError);
  EXPECT_EQ(cluster.GetNumElts(), 0);
  EXPECT_TRUE(cluster.CheckIn() == GetClust0TD());

  TDWCluster null(TDImpPtr(), 0);
  EXPECT_EQ(null.AppendEltTD(GetiL()), kStatusNullHandle);
  EXPECT_EQ(null.InsertEltTDAt(GetiL(), 0), kStatusNullHandle);
  EXPECT_EQ(null.ReplaceEltTDAt(GetiL(), 0), kStatusNullHandle);
  EXPECT_EQ(null.RemoveAllEltTDs(), kStatusNullHandle);
  EXPECT_EQ(null.ReserveElementCount(1), kStatusNullHandle);
  EXPECT_EQ(null.GetNumElts(), 0);
  EXPECT_EQ(null.GetEltPos(U("a")), -1);
  EXPECT_FALSE(null.GetEltTD(0));
  EXPECT_FALSE(Cluster({GetiL()}).GetEltTD(1));
  EXPECT_FALSE(Cluster({GetiL()}).GetEltTD(-1));
}

TEST_F(TDContainerTest, ElementPositionByName) {
  const std::string longName(300, 'n');
  TDWCluster cluster;
  cluster << Named(GetiL(), "a") << GetiW() << Named(GetfD(), "b") << Named(GetiB(), "a") << Named(GetiL(), longName.c_str());
  EXPECT_EQ(cluster.GetEltPos(U("a")), 0);
  EXPECT_EQ(cluster.GetEltPos(U("b")), 2);
  EXPECT_EQ(cluster.GetEltPos(U("c")), -1);
  // Names are compared as Pascal strings: an unnamed element answers to the empty name, and only
  // the first 255 bytes of a name count.
  EXPECT_EQ(cluster.GetEltPos(U("")), 1);
  EXPECT_EQ(cluster.GetEltPos(U(std::string(400, 'n').c_str())), 4);
  EXPECT_EQ(cluster.CheckIn().GetEltPos(U("b")), 2);
}

TEST_F(TDContainerTest, ChainAppendsAndBreaksOnTheFirstFailure) {
  TDWCluster cluster;
  DebugCapture capture;
  TDWCluster& end = cluster << GetiL() << cluster << GetiW() << GetfD();
  EXPECT_FALSE(end);
  EXPECT_EQ(cluster.GetNumElts(), 1);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{
                                 "AppendEltTD: an element cannot hold its own container",
                                 "TDWMultiContainer::operator<<: AppendEltTD failed (1)",
                                 "TDWMultiContainer::operator<<: AppendEltTD failed (42)",
                                 "TDWMultiContainer::operator<<: AppendEltTD failed (42)",
                             }));
  // A container deeper down may not take its ancestor either.
  TDWCluster inner;
  TDWCluster outer;
  outer << inner;
  capture.Clear();
  EXPECT_EQ(inner.AppendEltTD(outer), kStatusBadArgument);
  EXPECT_EQ(inner.ReplaceEltTDAt(outer, 0), kStatusBadArgument);
  EXPECT_EQ(capture.Texts().size(), 2u);
  // Through the multi-container handle the chain keeps that type.
  TDWMultiContainer multi = vellum::As<TDWMultiContainer>(TDWCluster());
  TDWMultiContainer& chained = multi << GetiL() << GetiB();
  EXPECT_TRUE(chained);
  EXPECT_EQ(multi.GetNumElts(), 2);
}

TEST_F(TDContainerTest, SingleElementEditing) {
  TDWRepeatedBlock repeated;
  EXPECT_FALSE(repeated.GetEltTD());
  EXPECT_EQ(repeated.SetEltTD(GetiW()), kStatusNoError);
  EXPECT_FALSE(repeated.GetEltTD());  // an interned element is not offered writable
  EXPECT_TRUE(repeated.CheckIn().GetEltTD() == GetiW());
  TDWInt16 own;
  EXPECT_EQ(repeated.SetEltTD(own), kStatusNoError);
  EXPECT_TRUE(repeated.GetEltTD() == own);
  EXPECT_EQ(repeated.SetEltTD(repeated), kStatusBadArgument);
  EXPECT_EQ(repeated.RemoveEltTD(), kStatusNoError);
  EXPECT_FALSE(repeated.GetEltTD());
  TDWRepeatedBlock null(TDImpPtr(), 0);
  EXPECT_EQ(null.SetEltTD(GetiW()), kStatusNullHandle);
  EXPECT_EQ(null.RemoveEltTD(), kStatusNullHandle);
  EXPECT_FALSE(TDRSingleContainer().GetEltTD());
}

// --- traversal -------------------------------------------------------------------------------------

struct Walk {
  std::vector<int16_t> codes;
  int16_t stopAt = -1;
  int16_t skipAt = -1;
};

TDTraverseValue Record(const TDR& type, void* context) {
  auto* walk = static_cast<Walk*>(context);
  walk->codes.push_back(type.GetTypeCode());
  if (type.GetTypeCode() == walk->stopAt) return 7;
  if (type.GetTypeCode() == walk->skipAt) return kTraverseSkipElements;
  return kTraverseContinue;
}

TEST_F(TDContainerTest, TraversalVisitsInOrderAndStops) {
  const TDRCluster type = Cluster({GetiB(), Cluster({GetiW(), GetiL()}, "inner"), GetfD()});
  struct Case {
    const char* name;
    int16_t stopAt;
    int16_t skipAt;
    TDTraverseValue result;
    std::vector<int16_t> codes;
  };
  const Case kCases[] = {
      {"whole", -1, -1, 0, {0x50, 0x01, 0x50, 0x02, 0x03, 0x0A}},
      {"stop in nested", 0x02, -1, 7, {0x50, 0x01, 0x50, 0x02}},
      {"skip nested elements", -1, 0x50, 0, {0x50}},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    Walk walk;
    walk.stopAt = c.stopAt;
    walk.skipAt = c.skipAt;
    EXPECT_EQ(type.TraverseTDR(&Record, &walk, nullptr), c.result);
    EXPECT_EQ(walk.codes, c.codes);
  }
  // Elements of a container that should not be entered are not visited.
  Walk walk;
  EXPECT_EQ(type.TraverseTDR(&Record, &walk, [](const TDR& t) { return t.HasName() == 0; }), 0);
  EXPECT_EQ(walk.codes, (std::vector<int16_t>{0x50, 0x01, 0x50, 0x0A}));
}

// Writable Int16 elements become Float64 through the handle walk.
TDTraverseValue WidenInt16(TDW& type, void*, bool* replaced) {
  if (type.GetTypeCode() == 0x02) {
    type = TDWFloat64();
    *replaced = true;
  }
  return kTraverseContinue;
}

TEST_F(TDContainerTest, HandleWalkReplacesWritableElements) {
  TDWCluster inner;
  inner << TDWInt16() << TDWInt8();
  TDWCluster outer;
  outer << TDWInt16() << inner;
  EXPECT_EQ(outer.TraverseTDW(&WidenInt16, nullptr, nullptr), 0);
  EXPECT_TRUE(outer.CheckIn() == Cluster({GetfD(), Cluster({GetfD(), GetiB()})}));
  // At the top the handle itself takes the replacement.
  TDW single = TDWInt16();
  EXPECT_EQ(single.TraverseTDW(&WidenInt16, nullptr, nullptr), 0);
  EXPECT_EQ(single.GetTypeCode(), 0x0A);
}

// Interned objects reach the visitor as null handles, so it picks its victim by visiting order.
struct NthVisit {
  int32_t visits = 0;
  int32_t replaceAt = -1;
};

TDTraverseValue WidenNthVisit(TDW& type, void* context, bool* replaced) {
  auto* walk = static_cast<NthVisit*>(context);
  if (walk->visits++ == walk->replaceAt) {
    type = TDWFloat64();
    *replaced = true;
  }
  return kTraverseContinue;
}

TEST_F(TDContainerTest, ReplacementInsideAnInternedContainerGoesIntoACopy) {
  const TDRCluster shared = Cluster({GetiW(), GetiB()});
  TDWCluster outer;
  outer << GetiL() << shared;
  const TDImpPtr top = outer.GetImpPtr();
  NthVisit walk;
  walk.replaceAt = 3;  // outer, Int32, shared, then shared's Int16
  EXPECT_EQ(outer.TraverseTDW(&WidenNthVisit, &walk, nullptr), 0);
  EXPECT_EQ(walk.visits, 5);
  EXPECT_TRUE(outer.GetImpPtr() == top) << "the writable top takes its new element itself";
  EXPECT_TRUE(shared.GetEltTD(0) == GetiW());
  EXPECT_TRUE(outer.GetEltTD(1)) << "the interned element handed up a writable copy";
  EXPECT_TRUE(outer.CheckIn() == Cluster({GetiL(), Cluster({GetfD(), GetiB()})}));
}

// --- marking, mutation, order, lossless conversion ------------------------------------------------------

TEST_F(TDContainerTest, EphemeralMarkReachesEveryElement) {
  const TDRCluster shared = Cluster({GetiW()});
  TDWCluster cluster;
  TDWInt32 own;
  cluster << own << shared;
  EXPECT_EQ(cluster.EphemeralizeTD(), 0);
  EXPECT_EQ(cluster.IsEphemeralTD(), 4);
  EXPECT_EQ(own.IsEphemeralTD(), 4);
  const TDW nested = cluster.GetEltTD(1);
  ASSERT_TRUE(nested);  // an interned element was replaced by a marked writable copy
  EXPECT_EQ(nested.IsEphemeralTD(), 4);
  EXPECT_EQ(vellum::As<TDWCluster>(nested).GetEltTD(0).IsEphemeralTD(), 4);
  EXPECT_EQ(shared.IsEphemeralTD(), 0);
  EXPECT_EQ(shared.GetEltTD(0).IsEphemeralTD(), 0);

  EXPECT_EQ(cluster.UnephemeralizeTD(), 4);
  EXPECT_EQ(cluster.IsEphemeralTD(), 0);
  EXPECT_EQ(own.IsEphemeralTD(), 0);
  EXPECT_TRUE(cluster.CheckIn() == Cluster({GetiL(), shared}));
}

TEST_F(TDContainerTest, BooleanMutationThroughContainers) {
  const TDRCluster shared = Cluster({Named(GetBoolTD(), "inner"), GetiL()});
  TDWCluster cluster;
  cluster << Named(GetBoolTD(), "flag") << shared << GetiW();
  EXPECT_EQ(MutateBooleanTD(&cluster, 1), 1);
  EXPECT_EQ(cluster.GetEltTD(0).IsBoolU16(), 1);
  EXPECT_EQ(NameOf(cluster.GetEltTD(0)), "flag");
  EXPECT_EQ(vellum::As<TDWCluster>(cluster.GetEltTD(1)).GetEltTD(0).IsBoolU16(), 1);
  EXPECT_EQ(shared.GetEltTD(0).IsBool(), 1);  // the interned original stays as it was
  EXPECT_EQ(MutateBooleanTD(&cluster, 1), 0);
  EXPECT_EQ(MutateBooleanTD(&cluster, 0), 1);
  EXPECT_TRUE(cluster.CheckIn() == Cluster({Named(GetBoolTD(), "flag"), shared, GetiW()}));

  DebugCapture capture;
  TDImpPtr interned = shared.GetImpPtr();
  EXPECT_EQ(MutateBooleanTD(&interned, 1), 0);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"What are you doing?  This TDImpPtr is readonly!"}));
}

TEST_F(TDContainerTest, SortingOrder) {
  struct Case {
    const char* name;
    TDR a;
    TDR b;
    int32_t sign;
  };
  const Case kCases[] = {
      {"fewer elements first", Cluster({GetiL()}), Cluster({GetiB(), GetiB()}), -1},
      {"by element code", Cluster({GetiB(), GetiB()}), Cluster({GetiB(), GetiW()}), -1},
      {"by nested order", Cluster({Cluster({GetiL()})}), Cluster({Cluster({GetiL(), GetiL()})}), -1},
      {"equal kinds", Cluster({GetiL()}), Cluster({Named(GetiL(), "x")}), 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const int32_t ab = c.a.CompareForSorting(c.b);
    const int32_t ba = c.b.CompareForSorting(c.a);
    EXPECT_EQ((ab > 0) - (ab < 0), c.sign);
    EXPECT_EQ((ba > 0) - (ba < 0), -c.sign);
  }
}

TEST_F(TDContainerTest, LosslessConversion) {
  struct Case {
    const char* name;
    TDR from;
    TDR to;
    bool lossless;
  };
  const Case kCases[] = {
      {"same", Cluster({GetiL()}), Cluster({GetiL()}), true},
      {"count differs", Cluster({GetiL()}), Cluster({GetiL(), GetiL()}), false},
      {"widening", Cluster({GetiB(), GetfS()}), Cluster({GetiL(), GetfD()}), true},
      {"narrowing", Cluster({GetiL()}), Cluster({GetiB()}), false},
      {"nested", Cluster({Cluster({GetiB()})}), Cluster({Cluster({GetiW()})}), true},
      {"cluster into scalar", Cluster({GetiL()}), GetiL(), false},
      {"empty", GetClust0TD(), Cluster({}), true},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.from.ConversionIsLossless(c.to), c.lossless);
  }
  TDWRepeatedBlock small;
  EXPECT_EQ(small.SetEltTD(GetiB()), kStatusNoError);
  TDWRepeatedBlock wide;
  EXPECT_EQ(wide.SetEltTD(GetiL()), kStatusNoError);
  EXPECT_TRUE(small.ConversionIsLossless(wide));
  EXPECT_FALSE(wide.ConversionIsLossless(small));
  EXPECT_FALSE(small.ConversionIsLossless(Cluster({GetiB()})));
}

// --- failures and threads ------------------------------------------------------------------------------

TEST_F(TDContainerTest, AllocationFailuresWhileBuildingAndCheckingIn) {
  const TDRCluster expected = BuildNested();
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    TDRCluster built;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      built = BuildNested();
      fired = failure.Fired();
    }
    if (!fired) {
      EXPECT_TRUE(built == expected);
      break;
    }
    EXPECT_FALSE(built);
  }
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    TDWCluster copy;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      copy = expected.CheckOut();
      fired = failure.Fired();
    }
    if (!fired) {
      EXPECT_EQ(copy.IsSameAs(expected), 1);
      break;
    }
    EXPECT_FALSE(copy);
  }
}

TEST_F(TDContainerTest, ConcurrentCheckInsMakeOneObject) {
  std::vector<TDR> results(8);
  std::vector<std::thread> threads;
  for (size_t i = 0; i < results.size(); ++i) {
    threads.emplace_back([&results, i] { results[i] = BuildNested(); });
  }
  for (std::thread& thread : threads) thread.join();
  for (const TDR& result : results) EXPECT_TRUE(result == results[0]);
}

}  // namespace
