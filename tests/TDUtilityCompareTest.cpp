// Ordering of typed data: numbers by value and float class, Booleans, strings with null handles,
// exact paths, arrays by count, dimension words and elements (null-first, bytewise, packed
// Booleans), clusters with and without padding, blocks, subtypes, registered comparisons, the
// string hashes, and a seeded check that the order is reflexive and antisymmetric.
#include "vellum/TDCompare.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <functional>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include "support/TestDatum.h"
#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

namespace {

class TDUtilityCompareTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    SetDSAlign(0);
    TypeSystemTest::TearDown();
  }
};

int32_t Sign(int64_t v) { return v < 0 ? -1 : (v > 0 ? 1 : 0); }

// The order BlockCmp gives two byte strings of one length.
int32_t BytesOrder(const void* a, const void* b, size_t n) { return Sign(std::memcmp(a, b, n)); }


int32_t Compare(const TDR& type, Datum& a, Datum& b, int32_t bytewise = 0) {
  return CompareDataTDR(type, a.Data(), b.Data(), 0, bytewise);
}

TDRCluster Cluster(const std::vector<TDR>& elements) {
  TDWCluster cluster;
  for (const TDR& element : elements) cluster << element;
  return cluster.CheckIn();
}

TDR Named(const TDR& type, const char* name) {
  TDW copy = type.CheckOut();
  EXPECT_EQ(copy.SetName(std::string(name)), kStatusNoError);
  return copy.CheckIn();
}

// Fills an array datum of `type` (Int32 elements) with `values` in the given dimensions.
void FillInt32Array(const TDRArray& type, Datum& datum, const std::vector<int32_t>& dims,
                    const std::vector<int32_t>& values) {
  UHandle h = datum.Handle();
  ASSERT_EQ(type.SetArraySize(&h, static_cast<int32_t>(values.size()), dims.data()), kStatusNoError);
  datum.Put(0, h);
  if (values.empty()) return;
  std::memcpy(type.GetFirstElementPtr(h), values.data(), values.size() * sizeof(int32_t));
}

// --- numbers --------------------------------------------------------------------------------------

TEST_F(TDUtilityCompareTest, FloatValuesOfClassThreeAreEqualAndOrderByClass) {
  const double quiet = std::numeric_limits<double>::quiet_NaN();
  uint64_t bits = 0;
  std::memcpy(&bits, &quiet, sizeof bits);
  bits |= 0x8000000000000000u | 0x1234u;  // another sign and payload, still class 3
  double other = 0;
  std::memcpy(&other, &bits, sizeof other);
  ASSERT_EQ(ClassifyFloatNumber(0x0A, &quiet), kFloatClassNaN);
  ASSERT_EQ(ClassifyFloatNumber(0x0A, &other), kFloatClassNaN);
  ASSERT_NE(std::memcmp(&quiet, &other, sizeof quiet), 0);

  const double inf = std::numeric_limits<double>::infinity();
  struct Case {
    const char* name;
    double a;
    double b;
    int32_t expected;  // class(a) - class(b) whenever either is class 3
  };
  const Case kCases[] = {
      {"TwoNaNs", quiet, other, 0},          {"NaNAgainstFinite", quiet, -1e300, 2},
      {"FiniteAgainstNaN", 1e300, other, -2}, {"NaNAgainstInfinity", other, -inf, 1},
      {"ZeroAgainstNaN", 0.0, quiet, -3},    {"InfinityAgainstFinite", inf, 1.0, 1},
      {"FiniteByValue", -2.0, 1.0, -1},      {"EqualValues", 0.5, 0.5, 0},
  };
  // Units variants (code 0x1A) compare like the plain kind.
  TDWUnits meters;
  ASSERT_EQ(meters.SetUnit(kUnitMeters, 1), 0);
  const TDRFloat64 withUnits(meters, nullptr);
  ASSERT_EQ(withUnits.GetTypeCode(), 0x1A);
  for (const TDR& type : {GetfD(), TDR(withUnits)}) {
    for (const Case& c : kCases) {
      SCOPED_TRACE(c.name);
      EXPECT_EQ(CompareDataTDR(type, &c.a, &c.b, 0, 0), c.expected);
    }
  }

  // An extended value whose integer bit disagrees with its exponent is of class 3 as well.
  const uint8_t unnormal[10] = {1, 0, 0, 0, 0, 0, 0, 0x40, 0xFF, 0x3F};
  uint8_t extendedNaN[10] = {};
  LongDoubleToExtended(std::numeric_limits<long double>::quiet_NaN(), extendedNaN);
  uint8_t one[10] = {};
  LongDoubleToExtended(1.0L, one);
  ASSERT_EQ(ClassifyFloatNumber(0x0B, unnormal), kFloatClassNaN);
  EXPECT_EQ(CompareDataTDR(GetfX(), unnormal, extendedNaN, 0, 0), 0);
  EXPECT_EQ(CompareDataTDR(GetfX(), unnormal, one, 0, 0), 2);
  const float nan32 = std::numeric_limits<float>::quiet_NaN();
  const float zero32 = 0.0f;
  EXPECT_EQ(CompareDataTDR(GetfS(), &zero32, &nan32, 0, 0), -3);
}

TEST_F(TDUtilityCompareTest, NumbersOrderByKind) {
  TDWEnum items;
  for (const char* item : {"a", "b", "c", "d", "e", "f"}) ASSERT_EQ(items.AppendString(item), 0);
  const TDRUInt16 enumerated(items, nullptr);
  ASSERT_EQ(enumerated.GetTypeCode(), 0x16);

  struct Case {
    const char* name;
    TDR type;
    double a;
    double b;
    int32_t expected;
  };
  const Case kCases[] = {
      {"Int8Difference", GetiB(), -3, 4, -7},
      {"UInt8Difference", GetuB(), 200, 1, 199},
      {"Int16Difference", GetiW(), -30000, 30000, -60000},
      {"EnumUInt16LikeUInt16", enumerated, 5, 3, 2},
      {"Int32Signed", GetiL(), -1, 1, -1},
      {"UInt32Unsigned", GetuL(), 4e9, 1, 1},
      {"Int64Equal", GetiQ(), -9, -9, 0},
      {"UInt64Unsigned", GetuQ(), 1, 1.8e19, -1},
      {"Float32Greater", GetfS(), 2, -2, 1},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    uint8_t a[16] = {};
    uint8_t b[16] = {};
    ASSERT_EQ(ConvertNumTDR(GetfD(), &c.a, c.type, a, 0), 0);
    ASSERT_EQ(ConvertNumTDR(GetfD(), &c.b, c.type, b, 0), 0);
    EXPECT_EQ(CompareDataTDR(c.type, a, b, 0, 0), c.expected);
    EXPECT_EQ(CompareDataTDR(c.type, a, b, 0, 0), vellum::As<TDRNumeric>(c.type).CompareData(a, b));
    // The raw-numbers option orders the stored bytes instead.
    EXPECT_EQ(CompareDataTDRCore(c.type, false, a, b, 0, 0, 1),
              BytesOrder(a, b, static_cast<size_t>(c.type.DataSize())));
  }
  // Complex values always compare as bytes.
  const double x[2] = {1.0, 2.0};
  const double y[2] = {1.0, -3.0};
  EXPECT_EQ(CompareDataTDR(GetcD(), x, y, 0, 0), BytesOrder(x, y, sizeof x));
  EXPECT_EQ(CompareDataTDR(GetcD(), x, x, 0, 0), 0);
}

TEST_F(TDUtilityCompareTest, TrueSortsAfterFalse) {
  const uint8_t f8 = 0;
  const uint8_t t8 = 1;
  EXPECT_EQ(CompareDataTDR(GetBoolTD(), &t8, &f8, 0, 0), 1);
  EXPECT_EQ(CompareDataTDR(GetBoolTD(), &f8, &t8, 0, 0), -1);
  EXPECT_EQ(CompareDataTDR(GetBoolTD(), &t8, &t8, 0, 0), 0);
  // Two different true bytes: whichever comes first sorts after.
  const uint8_t other8 = 2;
  EXPECT_EQ(CompareDataTDR(GetBoolTD(), &t8, &other8, 0, 0), 1);
  EXPECT_EQ(CompareDataTDR(GetBoolTD(), &other8, &t8, 0, 0), 1);
  const TDRBooleanU16 boolean16;
  const uint16_t f16 = 0;
  const uint16_t t16 = 0x0100;  // true in either byte
  EXPECT_EQ(CompareDataTDR(boolean16, &t16, &f16, 0, 0), 1);
  EXPECT_EQ(CompareDataTDR(boolean16, &f16, &t16, 0, 0), -1);
}

TEST_F(TDUtilityCompareTest, NullDataAndNullTypesCompareEqual) {
  const int32_t one = 1;
  EXPECT_EQ(CompareDataTDR(TDR(), &one, &one, 0, 0), 0);
  EXPECT_EQ(CompareDataTDR(GetiL(), nullptr, &one, 0, 0), 0);
  EXPECT_EQ(CompareDataTDR(GetiL(), &one, nullptr, 0, 0), 0);
  EXPECT_EQ(TDRNumeric().CompareData(&one, &one), 0);
}

// --- strings and paths ----------------------------------------------------------------------------

TEST_F(TDUtilityCompareTest, NullStringIsTheEmptyString) {
  for (const TDR& type : {GetStringTD(), GetPictTD(), GetTagTD()}) {
    SCOPED_TRACE(ToString(type));
    Datum null(type);
    Datum empty(type);
    Datum a(type);
    Datum ab(type);
    Datum b(type);
    empty.PutString(0, "");
    ASSERT_NE(empty.Handle(), nullptr);
    a.PutString(0, "a");
    ab.PutString(0, "ab");
    b.PutString(0, "b");
    struct Case {
      const char* name;
      Datum& x;
      Datum& y;
      int32_t expected;
    };
    const Case kCases[] = {
        {"NullAgainstEmpty", null, empty, 0}, {"EmptyAgainstNull", empty, null, 0},
        {"NullAgainstA", null, a, -1},        {"AAgainstNull", a, null, 1},
        {"PrefixFirst", a, ab, -1},           {"ByBytes", b, ab, 1},
        {"Same", ab, ab, 0},
    };
    for (const Case& c : kCases) {
      SCOPED_TRACE(c.name);
      EXPECT_EQ(Compare(type, c.x, c.y), c.expected);
      EXPECT_EQ(Compare(type, c.x, c.y, 1), c.expected);
    }
  }
}

TEST_F(TDUtilityCompareTest, PathsCompareNamesExactly) {
  Path lower = nullptr;
  Path upper = nullptr;
  ASSERT_EQ(FEmptyPath(&lower), kStatusNoError);
  ASSERT_EQ(FEmptyPath(&upper), kStatusNoError);
  ASSERT_EQ(FAppendName(lower, U("\x04" "data")), kStatusNoError);
  ASSERT_EQ(FAppendName(upper, U("\x04" "DATA")), kStatusNoError);
  ASSERT_EQ(FPathCmp(lower, upper), 0);
  Path none = nullptr;
  EXPECT_EQ(CompareDataTDR(GetPathTD(), &lower, &upper, 0, 0), 1);
  EXPECT_EQ(CompareDataTDR(GetPathTD(), &upper, &lower, 0, 0), -1);
  EXPECT_EQ(CompareDataTDR(GetPathTD(), &lower, &lower, 0, 0), 0);
  // No path yet flattens as not-a-path, and compares as one.
  Path notAPath = nullptr;
  ASSERT_EQ(FNotAPath(&notAPath), kStatusNoError);
  EXPECT_EQ(CompareDataTDR(GetPathTD(), &none, &notAPath, 0, 0), 0);
  EXPECT_EQ(CompareDataTDR(GetPathTD(), &none, &lower, 0, 0), CompareDataTDR(GetPathTD(), &notAPath, &lower, 0, 0));
  EXPECT_NE(CompareDataTDR(GetPathTD(), &none, &lower, 0, 0), 0);
  FDestroyPath(&notAPath);
  FDestroyPath(&lower);
  FDestroyPath(&upper);
}

// --- arrays ---------------------------------------------------------------------------------------

TEST_F(TDUtilityCompareTest, ArraysOrderByCountBeforeValues) {
  const TDRArray vector(1, GetiL());
  Datum three(vector);
  Datum two(vector);
  Datum null(vector);
  Datum empty(vector);
  FillInt32Array(vector, three, {3}, {-5, -5, -5});
  FillInt32Array(vector, two, {2}, {9, 9});
  // An empty array may keep a block of its dimension words only.
  UHandle block = nullptr;
  ASSERT_EQ(DSNewHClr(sizeof(int32_t), &block), kStatusNoError);
  empty.Put(0, block);

  struct Case {
    const char* name;
    Datum& a;
    Datum& b;
    bool nullFirst;
    int32_t expected;
  };
  const Case kCases[] = {
      {"MoreElementsAfter", three, two, false, 1},
      {"FewerElementsFirst", two, three, false, -1},
      {"NullEqualsEmpty", null, empty, false, 0},
      {"NullBeforeTwo", null, two, false, -1},
      {"NullFirstNullAgainstTwo", null, two, true, 1},
      {"NullFirstTwoAgainstNull", two, null, true, -1},
      {"NullFirstBothNull", null, null, true, 0},
      {"NullFirstNullAgainstEmpty", null, empty, true, 1},
      {"NullFirstCountsByDimensionWords", three, two, true,
       BytesOrder(*three.Handle(), *two.Handle(), sizeof(int32_t))},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    for (int32_t bytewise : {0, 1}) {
      EXPECT_EQ(CompareDataTDRCore(vector, c.nullFirst, c.a.Data(), c.b.Data(), 0, bytewise, 0), c.expected);
    }
  }
}

TEST_F(TDUtilityCompareTest, ArraysOfOneCountCompareDimensionWordsThenElements) {
  const TDRArray matrix(2, GetiL());
  Datum twoByThree(matrix);
  Datum threeByTwo(matrix);
  FillInt32Array(matrix, twoByThree, {2, 3}, {0, 0, 0, 0, 0, 0});
  FillInt32Array(matrix, threeByTwo, {3, 2}, {0, 0, 0, 0, 0, 0});
  const int32_t dims = BytesOrder(*twoByThree.Handle(), *threeByTwo.Handle(), 2 * sizeof(int32_t));
  ASSERT_NE(dims, 0);
  EXPECT_EQ(Compare(matrix, twoByThree, threeByTwo), dims);
  EXPECT_EQ(Compare(matrix, threeByTwo, twoByThree), -dims);

  const TDRArray vector(1, GetiL());
  Datum small(vector);
  Datum large(vector);
  FillInt32Array(vector, small, {3}, {1, 2, 0});
  FillInt32Array(vector, large, {3}, {1, 0x100, 0});
  // By value, element by element; with the bytewise option the element bytes in one block.
  EXPECT_EQ(Compare(vector, small, large), -1);
  EXPECT_EQ(Compare(vector, large, small), 1);
  const int32_t bytes = BytesOrder(vector.GetFirstElementPtr(small.Handle()), vector.GetFirstElementPtr(large.Handle()),
                                   3 * sizeof(int32_t));
  EXPECT_EQ(Compare(vector, small, large, 1), bytes);
  EXPECT_EQ(Compare(vector, small, small, 1), 0);
}

TEST_F(TDUtilityCompareTest, DamagedArrayBlocksAreNeverRead) {
  const TDRArray vector(1, GetiL());
  Datum damaged(vector);
  Datum two(vector);
  FillInt32Array(vector, two, {2}, {1, 2});
  // Dimension words that promise more elements than the block holds.
  UHandle h = nullptr;
  ASSERT_EQ(DSNewHClr(sizeof(int32_t), &h), kStatusNoError);
  const int32_t promised = 1000;
  std::memcpy(*h, &promised, sizeof promised);
  damaged.Put(0, h);
  EXPECT_EQ(Compare(vector, damaged, two), -1);
  EXPECT_EQ(CompareDataTDRCore(vector, true, damaged.Data(), two.Data(), 0, 0, 0), 1);
  // Something that is not a handle at all.
  uint64_t word = 0x1234;
  UHandle stray = reinterpret_cast<UHandle>(&word);
  EXPECT_EQ(CompareDataTDR(vector, &stray, two.Data(), 0, 0), -1);
}

TEST_F(TDUtilityCompareTest, PackedBooleanArraysCompareElementByElement) {
  const TDRArray bits(1, TDRBooleanU16());
  Datum a(bits);
  Datum b(bits);
  for (Datum* d : {&a, &b}) {
    UHandle h = nullptr;
    const int32_t dims[1] = {20};
    ASSERT_EQ(bits.SetArraySize(&h, 20, dims), kStatusNoError);
    d->Put(0, h);
  }
  auto words = [&](Datum& d) { return static_cast<uint16_t*>(bits.GetFirstElementPtr(d.Handle())); };
  EXPECT_EQ(Compare(bits, a, b), 0);
  // Element 17 is the second bit from the top of the second word.
  words(a)[1] = 0x4000;
  EXPECT_EQ(Compare(bits, a, b), 1);
  EXPECT_EQ(Compare(bits, b, a), -1);
  // An earlier element decides: element 3 is set in b only.
  words(b)[0] = 0x1000;
  EXPECT_EQ(Compare(bits, a, b), -1);
  // Bits past the row's twenty elements are not elements.
  words(a)[1] = 0;
  words(b)[0] = 0;
  words(b)[1] = 0x0001;
  EXPECT_EQ(Compare(bits, a, b), 0);
  EXPECT_EQ(Compare(bits, a, b, 1), -1) << "the bytewise option reads every stored byte";
}

// --- clusters, blocks and subtypes ----------------------------------------------------------------

TEST_F(TDUtilityCompareTest, ArraysOfClustersWithStrings) {
  const TDRCluster record = Cluster({GetiL(), GetStringTD()});
  const TDRArray table(1, record);
  const int32_t textOffset = record.GetEltOffset(1);
  const int32_t stride = record.DataSize();
  auto fill = [&](Datum& d, const std::vector<std::pair<int32_t, std::string>>& rows) {
    UHandle h = d.Handle();
    ASSERT_EQ(table.SetArraySize(&h, static_cast<int32_t>(rows.size()), std::vector<int32_t>{static_cast<int32_t>(rows.size())}.data()),
              kStatusNoError);
    d.Put(0, h);
    auto* first = static_cast<uint8_t*>(table.GetFirstElementPtr(h));
    for (size_t i = 0; i < rows.size(); ++i) {
      uint8_t* element = first + static_cast<int64_t>(i) * stride;
      std::memcpy(element, &rows[i].first, sizeof(int32_t));
      LStrHandle text = nullptr;
      std::memcpy(&text, element + textOffset, sizeof text);
      ASSERT_EQ(StringUtils::ToLStr(rows[i].second, &text), kStatusNoError);
      std::memcpy(element + textOffset, &text, sizeof text);
    }
  };
  Datum a(table);
  Datum b(table);
  Datum c(table);
  fill(a, {{1, "one"}, {2, "apple"}});
  fill(b, {{1, "one"}, {2, "banana"}});
  fill(c, {{1, "one"}, {1, "zebra"}});
  for (int32_t bytewise : {0, 1}) {
    SCOPED_TRACE(bytewise);
    EXPECT_EQ(Compare(table, a, b, bytewise), -1);
    EXPECT_EQ(Compare(table, b, a, bytewise), 1);
    EXPECT_EQ(Compare(table, a, a, bytewise), 0);
    // The number comes before the string in each element.
    EXPECT_EQ(Compare(table, c, a, bytewise), -1);
  }
}

TEST_F(TDUtilityCompareTest, NestedClustersWithPaddingAgreeWithTheirBytes) {
  SetDSAlign(8);
  const TDRCluster inner = Cluster({GetuB(), GetfD()});
  const TDRCluster outer = Cluster({GetuB(), inner, GetBoolTD()});
  const int32_t innerAt = outer.GetEltOffset(1);
  const int32_t flagAt = outer.GetEltOffset(2);
  const int32_t valueAt = innerAt + inner.GetEltOffset(1);
  ASSERT_EQ(innerAt, 8);
  ASSERT_EQ(valueAt, 16);
  ASSERT_EQ(outer.DataSize(), 32) << "padding after each byte-sized element";

  // With the padding zeroed and equal Float64 values, the bytes order as the elements do: every
  // element that can differ is a single unsigned byte.
  const uint32_t seed = std::random_device()();
  std::printf("seed %u\n", seed);
  std::mt19937 random(seed);
  for (int32_t round = 0; round < 200; ++round) {
    Datum a(outer);
    Datum b(outer);
    const double value = std::uniform_real_distribution<double>(-1e6, 1e6)(random);
    for (Datum* d : {&a, &b}) {
      d->Put(0, static_cast<uint8_t>(random() % 3));
      d->Put(innerAt, static_cast<uint8_t>(random() % 3));
      d->Put(valueAt, value);
      d->Put(flagAt, static_cast<uint8_t>(random() % 2));
    }
    const int32_t elementwise = Compare(outer, a, b);
    ASSERT_EQ(Sign(elementwise), Compare(outer, a, b, 1)) << "round " << round;
  }

  // Bytes that are padding take part only in the bytewise comparison.
  Datum a(outer);
  Datum b(outer);
  a.Put(1, static_cast<uint8_t>(0xAA));
  EXPECT_EQ(Compare(outer, a, b), 0);
  EXPECT_EQ(Compare(outer, a, b, 1), 1);
  // Where the elements are wider than a byte the two orders need not agree.
  b.Put(1, static_cast<uint8_t>(0xAA));
  a.Put(valueAt, 256.0);
  b.Put(valueAt, 1.0);
  EXPECT_EQ(Compare(outer, a, b), 1);
  EXPECT_EQ(Compare(outer, a, b, 1), BytesOrder(a.Data(), b.Data(), 32));
}

TEST_F(TDUtilityCompareTest, BlocksPointersAndRepeatedBlocks) {
  TDWBlock raw;
  ASSERT_EQ(raw.SetBlockSize(4), kStatusNoError);
  const TDR block = raw.CheckIn();
  const uint8_t x[4] = {1, 2, 3, 4};
  const uint8_t y[4] = {1, 2, 9, 0};
  EXPECT_EQ(CompareDataTDR(block, x, y, 0, 0), -1);
  EXPECT_EQ(CompareDataTDR(block, y, x, 0, 0), 1);
  EXPECT_EQ(CompareDataTDR(TDRVoidBlock(), x, y, 0, 0), 0) << "a void block";

  const TDRPtr pointer;
  const uint64_t p = 0x0100;
  const uint64_t q = 0x0001;
  EXPECT_EQ(CompareDataTDR(pointer, &p, &q, 0, 0), BytesOrder(&p, &q, sizeof p));

  TDWRepeatedBlock numbers;
  ASSERT_EQ(numbers.SetEltTD(GetiL()), kStatusNoError);
  ASSERT_EQ(numbers.SetNumBlocks(3), kStatusNoError);
  const TDR repeated = numbers.CheckIn();
  const int32_t small[3] = {7, -1, 0};
  const int32_t large[3] = {7, 1, -100};
  EXPECT_EQ(CompareDataTDR(repeated, small, large, 0, 0), -1);
  EXPECT_EQ(CompareDataTDR(repeated, small, large, 0, 1), BytesOrder(small, large, sizeof small));

  // Copies of an element with handles compare element by element even when bytewise.
  TDWRepeatedBlock texts;
  ASSERT_EQ(texts.SetEltTD(GetStringTD()), kStatusNoError);
  ASSERT_EQ(texts.SetNumBlocks(2), kStatusNoError);
  const TDR textBlock = texts.CheckIn();
  Datum a(textBlock);
  Datum b(textBlock);
  a.PutString(8, "b");
  b.PutString(0, "");
  b.PutString(8, "a");
  EXPECT_EQ(Compare(textBlock, a, b), 1);
  EXPECT_EQ(Compare(textBlock, a, b, 1), 1);
}

TEST_F(TDUtilityCompareTest, SubtypesCompareTheirRecordsAfterAMessage) {
  DebugCapture capture;
  const char text[] = "abc";
  // Records made byte by byte, so that their padding is known too.
  SubStringRec a;
  std::memset(&a, 0, sizeof a);
  a.dataPtr = reinterpret_cast<const uint8_t*>(text);
  a.length = 3;
  a.stride = 1;
  SubStringRec b;
  std::memcpy(&b, &a, sizeof b);
  EXPECT_EQ(CompareDataTDR(GetSubStringTD(), &a, &b, 0, 0), 0);
  b.length = 2;
  EXPECT_EQ(CompareDataTDR(GetSubStringTD(), &a, &b, 0, 0), BytesOrder(&a, &b, sizeof a));
  const std::vector<std::string> expected(2, "CompareData for subtypes should be implemented correctly.");
  EXPECT_EQ(capture.Texts(), expected);
}

TEST_F(TDUtilityCompareTest, KindsWithoutAnOrderCompareEqualAfterAMessage) {
  DebugCapture capture;
  const char* x = "x";
  const char* y = "y";
  EXPECT_EQ(CompareDataTDR(TDRCStr(), &x, &y, 0, 0), 0);
  EXPECT_EQ(capture.Texts(), std::vector<std::string>{"CompareData: tc=52?"});
  capture.Clear();
  EXPECT_EQ(CompareDataTDR(GetVoidTD(), &x, &y, 0, 0), 0);
  EXPECT_TRUE(capture.Texts().empty());
}

// --- registered comparisons -----------------------------------------------------------------------

struct SeenArguments {
  bool nullFirst = false;
  int32_t variantOption = 0;
  int32_t bytewise = 0;
  int32_t rawNumbers = 0;
  int32_t calls = 0;
};
SeenArguments gSeen;

constexpr const char* kReversedName = "compare test: reversed";

bool IsReversed(const TDR& type) {
  std::string name;
  EXPECT_EQ(type.GetName(&name), kStatusNoError);
  return name == kReversedName;
}

int32_t ReversedInt32(const TDR& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                      int32_t bytewise, int32_t rawNumbers) {
  gSeen = SeenArguments{nullFirst, variantOption, bytewise, rawNumbers, gSeen.calls + 1};
  return -vellum::As<TDRNumeric>(type).CompareData(a, b);
}

int32_t AlwaysSeven(const TDR&, bool, const void*, const void*, int32_t, int32_t, int32_t) { return 7; }

// Registrations last as long as the process; the ones made here answer only for descriptors of a
// name no other test uses.
TEST_F(TDUtilityCompareTest, RegisteredComparisonAppliesOnlyWhereItsPredicateAgrees) {
  DebugCapture capture;
  EXPECT_EQ(RegisterCompareDataFunctionForTypeCode(3, &IsReversed, nullptr), kStatusBadArgument);
  EXPECT_EQ(capture.Texts(), std::vector<std::string>{"Tried to register a NULL comparison proc for type code 3"});

  // A later registration for a code replaces the earlier one.
  ASSERT_EQ(RegisterCompareDataFunctionForTypeCode(3, &IsReversed, &AlwaysSeven), kStatusNoError);
  const TDR reversed = Named(GetiL(), kReversedName);
  const int32_t one = 1;
  const int32_t two = 2;
  EXPECT_EQ(CompareDataTDR(reversed, &one, &two, 0, 0), 7);
  ASSERT_EQ(RegisterCompareDataFunctionForTypeCode(3, &IsReversed, &ReversedInt32), kStatusNoError);

  gSeen = SeenArguments{};
  EXPECT_EQ(CompareDataTDRCore(reversed, true, &one, &two, 5, 6, 0), 1);
  EXPECT_EQ(gSeen.calls, 1);
  EXPECT_TRUE(gSeen.nullFirst);
  EXPECT_EQ(gSeen.variantOption, 5);
  EXPECT_EQ(gSeen.bytewise, 6);
  EXPECT_EQ(gSeen.rawNumbers, 0);

  // The predicate declines every other Int32: the built-in order holds for them.
  EXPECT_EQ(CompareDataTDR(GetiL(), &one, &two, 0, 0), -1);
  EXPECT_EQ(CompareDataTDR(Named(GetiL(), "plain"), &one, &two, 0, 0), -1);
  EXPECT_EQ(gSeen.calls, 1);

  // Elements of aggregates are compared through the table too.
  const TDRCluster pair = Cluster({GetiL(), reversed});
  const int32_t a[2] = {4, 1};
  const int32_t b[2] = {4, 2};
  EXPECT_EQ(CompareDataTDR(pair, a, b, 0, 0), 1);
  EXPECT_EQ(gSeen.calls, 2);
  // Codes beyond those of descriptors are accepted and never consulted.
  EXPECT_EQ(RegisterCompareDataFunctionForTypeCode(300, nullptr, &AlwaysSeven), kStatusNoError);
  EXPECT_EQ(RegisterCompareDataFunctionForTypeCode(-1, nullptr, &AlwaysSeven), kStatusNoError);
}

// --- hashes ---------------------------------------------------------------------------------------

TEST_F(TDUtilityCompareTest, StringHashes) {
  EXPECT_EQ(GetCStrHashValue(U("ab")), 0x490);
  EXPECT_EQ(GetPStrHashValue(U("\x02" "ab")), 0x490);
  EXPECT_EQ(GetNarrowStrHashValue("ab"), 0x490);
  EXPECT_EQ(GetNarrowStrHashValue(std::string("ab\0cd", 5)), 0x490) << "stops at the first zero";
  EXPECT_EQ(GetPStrHashValue(U("\x03" "ab\0")), 0x490) << "stops at a zero byte";
  EXPECT_EQ(GetCStrHashValue(U("")), 0);
  EXPECT_EQ(GetCStrHashValue(nullptr), 0);
  EXPECT_EQ(GetPStrHashValue(nullptr), 0);
  EXPECT_EQ(GetPStrHashValue(U("\x00" "ab")), 0);
  EXPECT_EQ(GetNarrowStrHashValue(""), 0);
  // Rotation counts past 31 wrap: the three forms agree on a long text.
  const std::string text(70, 'q');
  const std::string pascal = static_cast<char>(text.size()) + text;
  EXPECT_EQ(GetCStrHashValue(U(text.c_str())), GetNarrowStrHashValue(text));
  EXPECT_EQ(GetPStrHashValue(U(pascal.c_str())), GetNarrowStrHashValue(text));
}

// --- properties -----------------------------------------------------------------------------------

TEST_F(TDUtilityCompareTest, OrderIsReflexiveAndAntisymmetric) {
  const TDRCluster mixed = Cluster({GetiB(), GetStringTD(), GetfS()});
  const TDRArray vector(1, GetiW());
  const uint32_t seed = std::random_device()();
  std::printf("seed %u\n", seed);
  std::mt19937 random(seed);
  auto word = [&](int32_t range) { return static_cast<int32_t>(random() % static_cast<uint32_t>(range)); };
  auto text = [&] { return std::string(static_cast<size_t>(word(3)), static_cast<char>('a' + word(2))); };
  auto real = [&]() -> float {
    switch (word(5)) {
      case 0: return std::numeric_limits<float>::quiet_NaN();
      case 1: return std::numeric_limits<float>::infinity();
      default: return static_cast<float>(word(5) - 2);
    }
  };

  struct Maker {
    const char* name;
    TDR type;
    std::function<void(Datum&)> fill;
  };
  const std::vector<Maker> makers = {
      {"Int16", GetiW(), [&](Datum& d) { d.Put(0, static_cast<int16_t>(word(7) - 3)); }},
      {"Float32", GetfS(), [&](Datum& d) { d.Put(0, real()); }},
      {"String", GetStringTD(),
       [&](Datum& d) {
         if (word(4) != 0) d.PutString(0, text());
       }},
      {"Cluster", mixed,
       [&](Datum& d) {
         d.Put(mixed.GetEltOffset(0), static_cast<int8_t>(word(3) - 1));
         if (word(3) != 0) d.PutString(mixed.GetEltOffset(1), text());
         d.Put(mixed.GetEltOffset(2), real());
       }},
      {"Array", vector,
       [&](Datum& d) {
         const int32_t count = word(4) - 1;  // -1: a null handle
         if (count < 0) return;
         std::vector<int32_t> values;
         UHandle h = nullptr;
         ASSERT_EQ(vector.SetArraySize(&h, count, &count), kStatusNoError);
         d.Put(0, h);
         auto* first = static_cast<int16_t*>(vector.GetFirstElementPtr(h));
         for (int32_t i = 0; i < count; ++i) first[i] = static_cast<int16_t>(word(3));
       }},
  };
  for (const Maker& maker : makers) {
    SCOPED_TRACE(maker.name);
    for (int32_t round = 0; round < 300; ++round) {
      Datum a(maker.type);
      Datum b(maker.type);
      maker.fill(a);
      maker.fill(b);
      for (int32_t flags = 0; flags < 4; ++flags) {
        const bool nullFirst = (flags & 1) != 0;
        const int32_t bytewise = flags >> 1;
        const int32_t ab = CompareDataTDRCore(maker.type, nullFirst, a.Data(), b.Data(), 0, bytewise, 0);
        const int32_t ba = CompareDataTDRCore(maker.type, nullFirst, b.Data(), a.Data(), 0, bytewise, 0);
        ASSERT_EQ(CompareDataTDRCore(maker.type, nullFirst, a.Data(), a.Data(), 0, bytewise, 0), 0);
        ASSERT_EQ(Sign(ab), -Sign(ba)) << "round " << round << " flags " << flags;
      }
    }
  }
}

}  // namespace
