// Arrays: counting, the element-count word, exact default blocks, the resizing engine and its
// alignment table, copy (flat, element by element, preallocated, into the other Boolean width),
// conversion along the row-major walk, views into subarrays and back, verification of damaged
// blocks, compatibility, identity, the shared vectors, and allocation failures.
#include "vellum/TDArrayHandles.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "vellum/TDFlags.h"
#include "vellum/TypeManagerHooks.h"
#include "vellum.h"

namespace {

class TDArrayTest : public TypeSystemTest {
 protected:
  void TearDown() override {
    SetDSAlign(0);
    SetTDRaveProc(nullptr);
    TDEnablePreAllocation(false);
    SetNeedsInflateForArrayEltsProc(nullptr);
    TypeSystemTest::TearDown();
  }
};

constexpr int32_t kVar = vellum::bound::kVariable;
constexpr int32_t Fix(int32_t n) { return vellum::bound::Fixed(n); }

// An array descriptor with the given dimension words.
TDRArray MakeArray(const TDR& elt, std::vector<int32_t> words) {
  TDWArray array(0, elt);
  for (int32_t word : words) EXPECT_EQ(array.AddDim(word), kStatusNoError);
  return array.CheckIn();
}

TDRSubArray MakeSubArray(const TDR& elt, std::vector<int32_t> words) {
  TDWSubArray array(0, elt);
  for (int32_t word : words) EXPECT_EQ(array.AddDim(word), kStatusNoError);
  return array.CheckIn();
}

// One datum of an array type that gives its handles back when it goes.
class Datum {
 public:
  explicit Datum(const TDR& type) : type_(type) {}
  ~Datum() { type_.DeflateData(&h_, &h_ + 1, 1, NormalHandleAllocator()); }
  Datum(const Datum&) = delete;
  Datum& operator=(const Datum&) = delete;

  UHandle* Slot() { return &h_; }
  UHandle H() const { return h_; }
  size_t Size() const { return DSGetHandleSize(h_); }
  std::vector<uint8_t> Bytes() const { return h_ ? std::vector<uint8_t>(*h_, *h_ + Size()) : std::vector<uint8_t>(); }
  std::vector<int32_t> Dims(int32_t n) const { return std::vector<int32_t>(DimsOf(), DimsOf() + n); }
  template <class T>
  T At(int64_t header, int64_t i) const {
    T value;
    std::memcpy(&value, *h_ + header + i * static_cast<int64_t>(sizeof(T)), sizeof value);
    return value;
  }
  template <class T>
  void Set(int64_t header, int64_t i, T value) {
    std::memcpy(*h_ + header + i * static_cast<int64_t>(sizeof(T)), &value, sizeof value);
  }

 private:
  const int32_t* DimsOf() const { return reinterpret_cast<const int32_t*>(*h_); }
  TDR type_;
  UHandle h_ = nullptr;
};

// A variable array datum of `type` with the given sizes and Int32 values 1, 2, 3, ...
void FillInt32(const TDRArray& type, Datum& datum, std::vector<int32_t> dims) {
  int32_t count = 1;
  for (int32_t d : dims) count *= d;
  ASSERT_EQ(type.SetArraySize(datum.Slot(), count, dims.data()), kStatusNoError);
  for (int32_t i = 0; i < count; ++i) datum.Set<int32_t>(4 * static_cast<int64_t>(dims.size()), i, i + 1);
}

std::vector<uint8_t> Block(std::vector<int32_t> words, size_t zeros) {
  std::vector<uint8_t> bytes(words.size() * 4 + zeros, 0);
  std::memcpy(bytes.data(), words.data(), words.size() * 4);
  return bytes;
}

int32_t gRaveCode = 0;
void Rave(void*, void*, int32_t& status, int32_t code) {
  gRaveCode = code;
  status = code;
}


// --- counting ------------------------------------------------------------------------------------

TEST(TDArrayCounting, ElementCountsAndOverflow) {
  struct Case {
    const char* name;
    std::vector<int32_t> dims;
    int64_t elts;
    int64_t binwds;
    int32_t overflow;
  };
  const Case cases[] = {
      {"NoDimensions", {}, 1, 1, 0},
      {"Row", {17}, 17, 2, 0},
      {"Matrix", {3, 17}, 51, 6, 0},
      {"EmptyRow", {3, 0}, 0, 0, 0},
      {"Negative", {2, -1}, 0, 0, 1},
      {"ProductTooLarge", {65536, 65536}, 0, 0, 1},
      {"LargeButEmpty", {65536, 65536, 0}, 0, 0, 0},
      {"Largest", {0x7FFFFFFF}, 0x7FFFFFFF, 0x8000000, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const auto n = static_cast<int32_t>(c.dims.size());
    int32_t overflow = -1;
    EXPECT_EQ(NArrayElts(n, c.dims.data(), &overflow), c.elts);
    EXPECT_EQ(overflow, c.overflow);
    EXPECT_EQ(NArrayBinwds(n, c.dims.data(), &overflow), c.binwds);
    EXPECT_EQ(overflow, c.overflow);
    std::vector<SubArrayDimension> entries;
    for (int32_t d : c.dims) entries.push_back({d, 0});
    EXPECT_EQ(NSubArrayElts(n, entries.data(), &overflow), c.elts);
    EXPECT_EQ(overflow, c.overflow);
  }
}

TEST(TDArrayCounting, CompactSubArray) {
  const SubArrayDimension compact[] = {{3, 16}, {4, 4}};
  const SubArrayDimension gapped[] = {{3, 20}, {4, 4}};
  const SubArrayDimension strided[] = {{3, 16}, {4, 8}};
  EXPECT_TRUE(CompactSubArray(compact, 2, 4));
  EXPECT_FALSE(CompactSubArray(gapped, 2, 4));
  EXPECT_FALSE(CompactSubArray(strided, 2, 4));
  EXPECT_FALSE(CompactSubArray(compact, 2, 8));
}

// --- descriptors ---------------------------------------------------------------------------------

TEST_F(TDArrayTest, CountWordOfDimensionWords) {
  struct Case {
    const char* name;
    std::vector<int32_t> words;
    int32_t word;
    int32_t fixedCount;
  };
  const Case cases[] = {
      {"Variable", {Fix(3), kVar}, -1, 0},
      {"NoDimensions", {}, static_cast<int32_t>(0x80000001u), 1},
      {"Fixed", {Fix(3), Fix(4)}, static_cast<int32_t>(0x8000000Cu), 12},
      {"FixedAndBounded", {Fix(3), 4}, 12, 0},
      {"BoundedZero", {0, 5}, 0, 0},
      {"Overflowing", {Fix(65536), Fix(65536)}, static_cast<int32_t>(0x80000000u), 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const TDRArray array = MakeArray(GetiL(), c.words);
    EXPECT_EQ(array.BoundedOrFixed(), c.word);
    EXPECT_EQ(BoundedOrFixedArrayType(array), c.word);
    int32_t err = -1;
    EXPECT_EQ(FixedArrayTDR(array, &err), c.fixedCount);
  }
  DebugCapture capture;
  EXPECT_EQ(BoundedOrFixedArrayType(GetiL()), static_cast<int32_t>(0x80000000u));
  EXPECT_TRUE(capture.Contains("Bad array"));
  int32_t err = 0;
  EXPECT_EQ(FixedArrayTDR(TDRArrayBase(), &err), 0);
  EXPECT_EQ(err, kStatusNullHandle);
  EXPECT_TRUE(capture.Contains("This is not an array type!"));
}

TEST_F(TDArrayTest, EditingDimensions) {
  TDWArray array(1, GetiL());
  EXPECT_EQ(array.AddDim(Fix(2), 0), kStatusNoError);
  EXPECT_EQ(array.AddDim(7, 5), kStatusNoError);
  EXPECT_EQ(array.GetNumDims(), 3);
  EXPECT_EQ(array.GetDimSize(0), Fix(2));
  EXPECT_EQ(array.GetDimSize(1), kVar);
  EXPECT_EQ(array.GetDimSize(2), 7);
  EXPECT_EQ(array.GetDimSize(3), 0);
  EXPECT_EQ(array.RemoveDim(3), kStatusBadArgument);
  EXPECT_EQ(array.SetDimSize(-1, 0), kStatusBadArgument);
  EXPECT_EQ(array.RemoveDim(1), kStatusNoError);
  EXPECT_EQ(array.SetNumDims(4), kStatusNoError);
  EXPECT_EQ(array.GetDimSize(3), kVar);
  EXPECT_FALSE(array.SetIsColumnVector(true));
  EXPECT_TRUE(array.SetIsColumnVector(false));
  EXPECT_EQ(TDWArray().SetNumDims(-1), kStatusBadArgument);
  EXPECT_EQ(TDWArrayBase().AddDim(1), kStatusNullHandle);
  EXPECT_EQ(ArrayTypeNDims(array), 4);
  EXPECT_EQ(ArrayTypeNDims(GetiL()), 0);

  // A descriptor read from a type string has no list until its payload is read.
  int32_t status = -1;
  const TDW read(GetTypeFactory(static_cast<int32_t>(TypeCode::Array))->CreateTD(nullptr, 0x40, &status), 1);
  EXPECT_FALSE(vellum::As<TDWArray>(read).IsWellFormed());
  EXPECT_EQ(vellum::As<TDWArray>(read).SetNumDims(1), kStatusNullHandle);
  EXPECT_EQ(vellum::As<TDWArray>(read).BoundedOrFixed(), static_cast<int32_t>(0x80000000u));
  DebugCapture capture;
  UHandle h = nullptr;
  EXPECT_EQ(read.InflateDefData(&h, 0, 1, 0), kStatusOutOfMemory);
}

TEST_F(TDArrayTest, IdentityHashAndSharedVectors) {
  const TDRArray a = MakeArray(GetiL(), {Fix(2), 3});
  EXPECT_EQ(a, MakeArray(GetiL(), {Fix(2), 3}));
  EXPECT_NE(a, MakeArray(GetiL(), {Fix(2), 4}));
  EXPECT_NE(a, MakeArray(GetiL(), {Fix(2)}));
  EXPECT_NE(a, MakeArray(GetfD(), {Fix(2), 3}));
  TDWArray column = a.CheckOut();
  column.SetIsColumnVector(true);
  EXPECT_NE(column.CheckIn(), a);
  EXPECT_EQ(a.CheckOut().GetHashValue(), a.GetHashValue());

  const TDRArray vector = vellum::As<TDRArray>(GetDbl1DTD());
  ASSERT_TRUE(vector);
  EXPECT_EQ(vector.GetEltTD(), GetfD());
  EXPECT_EQ(vector.BoundedOrFixed(), -1);
  EXPECT_EQ(&GetDbl1DTD(), &GetDbl1DTD());
  EXPECT_EQ(TDRArray(1, GetfD()), vector);
  EXPECT_EQ(vellum::As<TDRArray>(GetVoid1DTD()).GetEltTD(), GetVoidTD());
  EXPECT_EQ(IsScalarType(vector), 0);
  EXPECT_EQ(TDRFromSubType(vector.ConvertToSubArray()), vector);
  EXPECT_EQ(vector.ConvertToSubArray().IsSubType(), 1);
}

TEST_F(TDArrayTest, FactoriesWalksAndMarksReachTheElement) {
  for (const TypeCode code : {TypeCode::Array, TypeCode::SubArray, TypeCode::ArrayDataPtr}) {
    EXPECT_NE(GetTypeFactory(static_cast<int32_t>(code)), nullptr);
  }
  TDWArray array(2, GetiL());
  EXPECT_EQ(array.EphemeralizeTD(), 0);
  EXPECT_EQ(vellum::As<TDRArray>(array.CheckIn()).GetEltTD().IsEphemeralTD(), 4);
  int32_t visited = 0;
  array.CheckIn().TraverseTDR(
      [](const TDR& type, void* context) {
        *static_cast<int32_t*>(context) += type.GetTypeCode();
        return kTraverseContinue;
      },
      &visited, nullptr);
  EXPECT_EQ(visited, 0x40 + 0x03);
  TDW generic = GetiL().CheckOut();
  EXPECT_EQ(generic.SetGenericness(1), kStatusNoError);
  EXPECT_EQ(TDRArray(1, generic.CheckIn()).IsSemiGeneric(), 1);
  EXPECT_EQ(TDRArray(1, GetiL()).IsArrayFloat64Wfms(), 0);
}

TEST_F(TDArrayTest, MutateBooleanThroughArrays) {
  TDWArray array(1, GetBoolTD());
  TDW handle = array;
  EXPECT_EQ(MutateBooleanTD(&handle, 1), 1);
  EXPECT_EQ(vellum::As<TDRArray>(handle.CheckIn()).GetEltTD().IsBoolU16(), 1);
}

TEST_F(TDArrayTest, Compatibility) {
  struct Case {
    const char* name;
    TDR to;
    TDR from;
    int32_t flags;
    int32_t bits;
  };
  const TDRArray variable = MakeArray(GetiL(), {kVar});
  const TDRArray fixed = MakeArray(GetiL(), {Fix(4)});
  const TDRArray bounded = MakeArray(GetiL(), {4});
  const Case cases[] = {
      {"Same", variable, variable, 0, 0},
      {"Ranks", MakeArray(GetiL(), {kVar, kVar}), variable, 0, 0x200},
      {"IntoFixed", fixed, variable, 0, 0xA},
      {"IntoBoundedSmaller", bounded, MakeArray(GetiL(), {Fix(5)}), 0, 0xA},
      {"IntoBoundedLarger", bounded, MakeArray(GetiL(), {Fix(3)}), 0, 0x8},
      {"IntoVariable", variable, fixed, 0, 0x8},
      {"IntoVariableQuiet", variable, fixed, 0x10, 0},
      {"MayLose", fixed, variable, 0x2000, 0x8000A},
      {"Elements", MakeArray(GetfD(), {kVar}), variable, 0, GetfD().CmpTD(GetiL(), 0)},
      {"SubArrayKind", MakeSubArray(GetiL(), {kVar}), variable, 0, 0x8},
      {"NotAnArray", variable, GetBoolTD(), 0, 0x100},
      {"ElementMatches", variable, GetiL(), 0, 0x500},
      {"ElementMatchOff", variable, GetiL(), 0x2000000, 0x100},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.to.CmpTD(c.from, c.flags), c.bits);
  }
  TDWCluster three;
  three << GetiL() << GetiL() << GetiW();
  EXPECT_EQ(variable.CmpTD(three.CheckIn(), 0x4000), 0x10 | GetiL().CmpTD(GetiW(), 0x4000));
  EXPECT_TRUE(fixed.ConversionIsLossless(variable));
  EXPECT_FALSE(variable.ConversionIsLossless(fixed));
  EXPECT_TRUE(MakeArray(GetiL(), {Fix(3)}).ConversionIsLossless(bounded));
}

// --- default data, reset, disposal ---------------------------------------------------------------

TEST_F(TDArrayTest, DefaultBlocks) {
  struct Case {
    const char* name;
    TDR elt;
    std::vector<int32_t> words;
    int32_t dsAlign;
    std::vector<uint8_t> bytes;  // empty: a null handle
  };
  const Case cases[] = {
      {"Variable2D", GetiL(), {kVar, kVar}, 0, {}},
      {"Fixed2x3", GetiL(), {Fix(2), Fix(3)}, 0, Block({2, 3}, 24)},
      {"Bounded4", GetiL(), {4}, 0, Block({0}, 16)},
      {"BoundedEmpty", GetiL(), {0, 5}, 0, {}},
      {"FixedEmptyRows", GetiL(), {Fix(0), Fix(5)}, 0, Block({0, 5}, 0)},
      {"VariableByFixed", GetiL(), {kVar, Fix(3)}, 0, Block({0, 3}, 0)},
      {"PackedBooleans", TDRBooleanU16(), {Fix(2), Fix(17)}, 0, Block({2, 17}, 8)},
      {"Float64Packed", GetfD(), {Fix(1)}, 0, Block({1}, 8)},
      {"Float64Aligned", GetfD(), {Fix(1)}, 8, Block({1, 0}, 8)},
  };
  TDEnablePreAllocation(true);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    SetDSAlign(c.dsAlign);
    const TDRArray type = MakeArray(c.elt, c.words);
    Datum datum(type);
    std::memset(datum.Slot(), 0xA5, sizeof(UHandle));
    ASSERT_EQ(type.InflateDefData(datum.Slot(), 0, 1, 0), kStatusNoError);
    if (c.bytes.empty()) {
      EXPECT_EQ(datum.H(), nullptr);
    } else {
      ASSERT_NE(datum.H(), nullptr);
      EXPECT_EQ(datum.Bytes(), c.bytes);
    }
    EXPECT_EQ(type.VerifyData(datum.Slot(), nullptr), kStatusNoError);
  }
}

TEST_F(TDArrayTest, DefaultOfFixedStringsIsPreallocated) {
  const TDRArray type = MakeArray(TDRString(nullptr, Fix(3)), {Fix(2)});
  Datum datum(type);
  ASSERT_EQ(type.InflateDefData(datum.Slot(), 0, 1, 0), kStatusNoError);
  ASSERT_EQ(datum.Size(), 4u + 16u);  // packed: the first handle right after the dimension word
  for (int32_t i = 0; i < 2; ++i) {
    LStrHandle s = datum.At<LStrHandle>(4, i);
    ASSERT_NE(s, nullptr);
    EXPECT_EQ(DSGetHandleSize(reinterpret_cast<UHandle>(s)), 7u);
    EXPECT_EQ((*s)->cnt, 3);
  }
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    UHandle h = nullptr;
    const int32_t status = type.InflateDefData(&h, 0, 1, 0);
    type.DeflateData(&h, &h + 1, 1, NormalHandleAllocator());
    return status;
  });
}

TEST_F(TDArrayTest, ResetAndDeflate) {
  const TDRArray fixed = MakeArray(GetiL(), {Fix(2), Fix(3)});
  Datum datum(fixed);
  ASSERT_EQ(fixed.InflateDefData(datum.Slot(), 0, 1, 0), kStatusNoError);
  for (int32_t i = 0; i < 6; ++i) datum.Set<int32_t>(8, i, i + 1);
  EXPECT_EQ(fixed.ResetToDefaultData(datum.Slot()), kStatusNoError);
  EXPECT_EQ(datum.Bytes(), Block({2, 3}, 24));

  const TDRArray variable = MakeArray(GetiL(), {kVar});
  Datum vector(variable);
  FillInt32(variable, vector, {5});
  EXPECT_EQ(variable.DeflateData(vector.Slot(), vector.Slot() + 1, 0, NormalHandleAllocator()), 20);
  EXPECT_EQ(vector.Bytes(), Block({0}, 0));
  FillInt32(variable, vector, {5});
  EXPECT_EQ(variable.ResetToDefaultData(vector.Slot()), kStatusNoError);
  EXPECT_EQ(vector.H(), nullptr);

  const TDRArray bounded = MakeArray(GetiL(), {4});
  Datum limited(bounded);
  ASSERT_EQ(bounded.InflateDefData(limited.Slot(), 0, 1, 0), kStatusNoError);
  limited.Set<int32_t>(0, 0, 2);
  limited.Set<int32_t>(4, 1, 9);
  EXPECT_EQ(bounded.DeflateData(limited.Slot(), limited.Slot() + 1, 0, NormalHandleAllocator()), 0);
  EXPECT_EQ(limited.Bytes(), Block({0}, 16));
}

// --- resizing ------------------------------------------------------------------------------------

TEST_F(TDArrayTest, ResizingKeepsAndZeroes) {
  Datum datum(GetLong1DTD());
  ASSERT_EQ(VectorSetSize(GetiL(), datum.Slot(), 2), kStatusNoError);
  datum.Set<int32_t>(4, 0, 7);
  datum.Set<int32_t>(4, 1, 8);
  ASSERT_EQ(VectorSetSize(GetiL(), datum.Slot(), 5), kStatusNoError);
  EXPECT_EQ(datum.Bytes(), (std::vector<uint8_t>{5, 0, 0, 0, 7, 0, 0, 0, 8, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}));

  Datum empty(GetLong1DTD());
  EXPECT_EQ(VectorSetSize(GetiL(), empty.Slot(), 0), kStatusNoError);
  EXPECT_EQ(empty.H(), nullptr);
  EXPECT_EQ(SetArraySizeFromTDR(GetiL(), 1, empty.Slot(), 0, 1), kStatusNoError);
  EXPECT_EQ(empty.Size(), 4u);

  DebugCapture capture;
  EXPECT_EQ(SetArraySizeFromTDR(GetLong1DTD(), 1, empty.Slot(), 3, 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("SetArraySizeFromTDR: array element cannot be an array"));
  EXPECT_EQ(SetArraySizeFromTDR(GetiL(), 1, empty.Slot(), -1, 0), kStatusBadArgument);
  EXPECT_EQ(SetArraySizeFromTDR(GetiL(), 1, nullptr, 1, 0), kStatusBadArgument);
  // A block whose dimension words claim more than it holds is refused, not read.
  reinterpret_cast<int32_t*>(*empty.H())[0] = 1000;
  EXPECT_EQ(SetArraySizeFromTDR(GetiL(), 1, empty.Slot(), 3, 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("SetArraySizeFromTDR: array too large? nstrt=1000"));
  reinterpret_cast<int32_t*>(*empty.H())[0] = 0;
}

// A new block starts at the boundary its total size calls for. Below 0x4000 bytes the table asks
// no more than every block gets anyway.
TEST_F(TDArrayTest, NewBlocksAlignByTheirTotalSize) {
  const std::pair<int32_t, uintptr_t> table[] = {{0x4000, 64},    {20000, 64},     {0x10000, 256},
                                                 {0x40000, 1024}, {0xFFFFF, 1024}, {0x100000, 4096}};
  for (const auto& [total, alignment] : table) {
    SCOPED_TRACE(total);
    UHandle h = nullptr;
    // A one-dimensional UInt8 array: its dimension word, then one byte per element.
    ASSERT_EQ(SetArraySizeFromTDR(GetuB(), 1, &h, total - 4, 0), kStatusNoError);
    ASSERT_NE(h, nullptr);
    EXPECT_EQ(DSGetHandleSize(h), static_cast<size_t>(total));
    EXPECT_EQ(reinterpret_cast<uintptr_t>(*h) % alignment, 0u);
    DSDisposeHandle(h);
  }
}

TEST_F(TDArrayTest, ShrinkingStringsGivesTheirHandlesBack) {
  const TDRArray type(1, GetStringTD());
  Datum datum(type);
  const int64_t before = DSLiveBlockCount();
  ASSERT_EQ(VectorSetSize(GetStringTD(), datum.Slot(), 3), kStatusNoError);
  for (int32_t i = 0; i < 3; ++i) {
    LStrHandle s = nullptr;
    ASSERT_EQ(StringUtils::ToLStr("text", &s), kStatusNoError);
    datum.Set<LStrHandle>(4, i, s);
  }
  EXPECT_EQ(DSLiveBlockCount(), before + 4);
  ASSERT_EQ(SetArraySizeFromTDR(GetStringTD(), 1, datum.Slot(), 0, 0), kStatusNoError);
  EXPECT_EQ(DSLiveBlockCount(), before + 1);
  EXPECT_EQ(datum.Bytes(), Block({0}, 0));
}

TEST_F(TDArrayTest, GrowingInflatesAndUndoesOnFailure) {
  const TDR fixedString = TDRString(nullptr, Fix(2));
  EXPECT_TRUE(NeedsInflateForArrayElts(fixedString));
  EXPECT_FALSE(NeedsInflateForArrayElts(GetStringTD()));
  EXPECT_FALSE(NeedsInflateForArrayElts(TDRPath(nullptr, 4)));
  TDWCluster holder;
  holder << TDRString(nullptr, 4);
  EXPECT_TRUE(NeedsInflateForArrayElts(holder.CheckIn()));
  EXPECT_TRUE(NeedsInflateForArrayElts(MakeArray(GetiL(), {Fix(2)})));
  SetNeedsInflateForArrayEltsProc([](const TDR& elt) { return elt.IsBool() != 0; });
  EXPECT_TRUE(NeedsInflateForArrayElts(GetBoolTD()));
  EXPECT_FALSE(TDContainsBoundedOrFixed(GetBoolTD()));

  Datum datum(TDRArray(1, fixedString));
  ASSERT_EQ(VectorSetSize(fixedString, datum.Slot(), 1), kStatusNoError);
  const std::vector<uint8_t> kept = datum.Bytes();
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    const int32_t status = VectorSetSize(fixedString, datum.Slot(), 4);
    if (status != kStatusNoError) {
      EXPECT_EQ(datum.Bytes(), kept);
      return status;
    }
    EXPECT_EQ((*datum.At<LStrHandle>(4, 3))->cnt, 2);
    return VectorSetSize(fixedString, datum.Slot(), 1);
  });
}

// --- copy ----------------------------------------------------------------------------------------

TEST_F(TDArrayTest, FlatAndElementwiseCopies) {
  const TDRArray ints = MakeArray(GetiL(), {kVar, kVar});
  Datum from(ints);
  Datum into(ints);
  FillInt32(ints, from, {2, 3});
  ASSERT_EQ(ints.CopyData(from.Slot(), into.Slot(), nullptr, 0), kStatusNoError);
  EXPECT_EQ(into.Bytes(), from.Bytes());
  EXPECT_NE(into.H(), from.H());
  Datum row(GetLong1DTD());
  ASSERT_EQ(VectorResizeTDR(GetiL(), row.Slot(), from.H()), kStatusNoError);
  EXPECT_EQ(row.Bytes(), Block({2}, 8));
  UHandle none = nullptr;
  ASSERT_EQ(ints.CopyData(&none, into.Slot(), nullptr, 0), kStatusNoError);
  EXPECT_EQ(into.H(), nullptr);

  const TDRArray strings(1, GetStringTD());
  Datum text(strings);
  Datum copy(strings);
  ASSERT_EQ(VectorSetSize(GetStringTD(), text.Slot(), 2), kStatusNoError);
  LStrHandle s = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abc", &s), kStatusNoError);
  text.Set<LStrHandle>(4, 1, s);
  ASSERT_EQ(strings.CopyData(text.Slot(), copy.Slot(), nullptr, 0), kStatusNoError);
  EXPECT_EQ(copy.At<LStrHandle>(4, 0), nullptr);
  ASSERT_NE(copy.At<LStrHandle>(4, 1), s);
  EXPECT_EQ(StringUtils::FromLStr(copy.At<LStrHandle>(4, 1)), "abc");
  EXPECT_EQ(strings.VerifyData(copy.Slot(), nullptr), kStatusNoError);

  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    UHandle h = nullptr;
    const int32_t status = strings.CopyData(text.Slot(), &h, nullptr, 0);
    strings.DeflateData(&h, &h + 1, 1, NormalHandleAllocator());
    return status;
  });
  // Element by element through the conversion dispatch: the descriptors differ by a name.
  TDWArray named(1, GetStringTD());
  EXPECT_EQ(named.SetName(std::string("named")), kStatusNoError);
  const TDR other = named.CheckIn();
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    UHandle h = nullptr;
    const int32_t status = strings.CopyDataConvert(other, text.Slot(), &h, 0);
    if (status == kStatusNoError) {
      EXPECT_EQ(strings.VerifyData(&h, nullptr), kStatusNoError);
    }
    other.DeflateData(&h, &h + 1, 1, NormalHandleAllocator());
    return status;
  });

  // The exported flat copy refuses a block smaller than its dimension words say.
  UHandle h = nullptr;
  EXPECT_EQ(CopyFlatArray(8, from.H(), &h, 2, 4), kStatusNoError);
  EXPECT_EQ(DSGetHandleSize(h), 32u);
  reinterpret_cast<int32_t*>(*from.H())[0] = 3;
  DebugCapture capture;
  EXPECT_EQ(CopyFlatArray(8, from.H(), &h, 2, 4), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("Array block smaller than its dimension sizes"));
  EXPECT_EQ(CopyFlatArray(8, nullptr, &h, 2, 4), kStatusNoError);
  EXPECT_EQ(h, nullptr);
}

TEST_F(TDArrayTest, PreallocatedCopiesRefuseWrongSizes) {
  const TDRArray fixed = MakeArray(GetiL(), {Fix(2), Fix(3)});
  Datum from(fixed);
  Datum into(fixed);
  ASSERT_EQ(fixed.InflateDefData(from.Slot(), 0, 1, 0), kStatusNoError);
  for (int32_t i = 0; i < 6; ++i) from.Set<int32_t>(8, i, 10 * i);
  ASSERT_EQ(fixed.CopyData(from.Slot(), into.Slot(), nullptr, 0), kStatusNoError);  // a null one is inflated
  EXPECT_EQ(into.Bytes(), from.Bytes());

  DebugCapture capture;
  ASSERT_EQ(DSSetHandleSize(into.H(), 20), kStatusNoError);
  const std::vector<uint8_t> small = into.Bytes();
  EXPECT_EQ(fixed.CopyData(from.Slot(), into.Slot(), nullptr, 0), kStatusOutOfMemory);
  EXPECT_EQ(into.Bytes(), small);
  EXPECT_TRUE(capture.Contains(
      "Attempting to copy to an array whose type thinks it needs more memory than what is preallocated."));
  EXPECT_EQ(fixed.CopyData(into.Slot(), from.Slot(), nullptr, 0), kStatusOutOfMemory);
  EXPECT_TRUE(capture.Contains(
      "Attempting to copy from array whose type thinks it needs more memory than what is preallocated."));

  // A null source leaves a bounded array empty and a fixed one at its default.
  const TDRArray bounded = MakeArray(GetiL(), {4});
  Datum limited(bounded);
  ASSERT_EQ(bounded.InflateDefData(limited.Slot(), 0, 1, 0), kStatusNoError);
  limited.Set<int32_t>(0, 0, 1);
  UHandle none = nullptr;
  EXPECT_EQ(bounded.CopyData(&none, limited.Slot(), nullptr, 0), kStatusNoError);
  EXPECT_EQ(limited.Dims(1), std::vector<int32_t>{0});
  EXPECT_EQ(fixed.CopyData(&none, from.Slot(), nullptr, 0), kStatusNoError);
  EXPECT_EQ(from.Bytes(), Block({2, 3}, 24));
}

TEST_F(TDArrayTest, BooleanFormChange) {
  const TDRArray bytes = MakeArray(GetBoolTD(), {kVar, kVar});
  Datum from(bytes);
  ASSERT_EQ(bytes.SetArraySize(from.Slot(), 34, std::vector<int32_t>{2, 17}.data()), kStatusNoError);
  for (int32_t i = 0; i < 34; ++i) (*from.H())[8 + i] = (i % 17 == 0 || i % 17 == 16 || i == 18) ? 1 : 0;
  TDWArray sixteen = bytes.CheckOut();
  TDW handle = sixteen;
  MutateBooleanTD(&handle, 1);
  const TDRArray words = vellum::As<TDRArray>(handle.CheckIn());
  Datum packed(words);
  ASSERT_EQ(bytes.CopyData(from.Slot(), packed.Slot(), nullptr, kCopyFlagBooleanForm), kStatusNoError);
  // Rows start new words, most significant bit first: 0x8000 0x8000, then 0xC000 0x8000.
  EXPECT_EQ(packed.Bytes(), (std::vector<uint8_t>{2, 0, 0, 0, 17, 0, 0, 0, 0x00, 0x80, 0x00, 0x80, 0x00, 0xC0,
                                                  0x00, 0x80}));
  EXPECT_EQ(words.VerifyData(packed.Slot(), nullptr), kStatusNoError);
  Datum back(bytes);
  ASSERT_EQ(words.CopyData(packed.Slot(), back.Slot(), nullptr, kCopyFlagBooleanForm), kStatusNoError);
  EXPECT_EQ(back.Bytes(), from.Bytes());
}

// --- conversion ----------------------------------------------------------------------------------

TEST_F(TDArrayTest, RowMajorConversion) {
  const TDRArray ints = MakeArray(GetiL(), {kVar, kVar});
  Datum from(ints);
  FillInt32(ints, from, {2, 3});  // {1 2 3; 4 5 6}

  const TDRArray bounded = MakeArray(GetfD(), {2, 2});
  Datum two(bounded);
  ASSERT_EQ(ints.CopyDataConvert(bounded, from.Slot(), two.Slot(), 0), kStatusNoError);
  EXPECT_EQ(two.Dims(2), (std::vector<int32_t>{2, 2}));
  const double firstColumns[] = {1, 2, 4, 5};
  for (int32_t i = 0; i < 4; ++i) EXPECT_EQ(two.At<double>(8, i), firstColumns[i]);

  const TDRArray fixed = MakeArray(GetfD(), {Fix(3), Fix(3)});
  Datum three(fixed);
  ASSERT_EQ(fixed.InflateDefData(three.Slot(), 0, 1, 0), kStatusNoError);
  for (int32_t i = 0; i < 9; ++i) three.Set<double>(8, i, -1);
  ASSERT_EQ(ints.CopyDataConvert(fixed, from.Slot(), three.Slot(), 0), kStatusNoError);
  EXPECT_EQ(three.Dims(2), (std::vector<int32_t>{3, 3}));
  const double expected[] = {1, 2, 3, 4, 5, 6, 0, 0, 0};
  for (int32_t i = 0; i < 9; ++i) EXPECT_EQ(three.At<double>(8, i), expected[i]) << i;

  const TDRArray doubles = MakeArray(GetfD(), {kVar, kVar});
  Datum any(doubles);
  ASSERT_EQ(ints.CopyDataConvert(doubles, from.Slot(), any.Slot(), 0), kStatusNoError);
  EXPECT_EQ(any.Dims(2), (std::vector<int32_t>{2, 3}));
  EXPECT_EQ(any.At<double>(8, 5), 6.0);

  DebugCapture capture;
  Datum flat(GetDbl1DTD());
  EXPECT_EQ(ints.CopyDataConvert(GetDbl1DTD(), from.Slot(), flat.Slot(), 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("CopyDataConvert dims=1, dimsSrc=2"));
  EXPECT_EQ(flat.H(), nullptr);
  int32_t scalar = 0;
  EXPECT_EQ(ints.CopyDataConvert(GetiL(), from.Slot(), &scalar, 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("CopyDataConvert tcDst=0x00000003, tcSrc=0x00000040"));

  TDWCluster numbers;
  numbers << GetiL() << GetiL() << GetiL();
  const TDRCluster cluster = numbers.CheckIn();
  const int32_t values[] = {4, 5, 6};
  Datum vector(GetDbl1DTD());
  ASSERT_EQ(cluster.CopyDataConvert(GetDbl1DTD(), values, vector.Slot(), 0), kStatusNoError);
  EXPECT_EQ(vector.Dims(1), std::vector<int32_t>{3});
  EXPECT_EQ(vector.At<double>(4, 2), 6.0);
}

TEST_F(TDArrayTest, ViewsIntoSubArraysAndBack) {
  const TDRArray ints = MakeArray(GetiL(), {kVar, kVar});
  Datum from(ints);
  FillInt32(ints, from, {2, 3});
  const TDRSubArray view = MakeSubArray(GetiL(), {kVar, kVar});
  EXPECT_EQ(view.DataSize(), 40);
  struct Record {
    const uint8_t* data;
    SubArrayDimension dims[2];
  } record{};
  ASSERT_EQ(ints.CopyDataConvert(view, from.Slot(), &record, 0), kStatusNoError);
  EXPECT_EQ(record.data, *from.H() + 8);
  EXPECT_EQ(record.dims[0].dimensionSize, 2);
  EXPECT_EQ(record.dims[0].stride, 12);
  EXPECT_EQ(record.dims[1].dimensionSize, 3);
  EXPECT_EQ(record.dims[1].stride, 4);
  EXPECT_TRUE(CompactSubArray(record.dims, 2, 4));
  EXPECT_EQ(view.VerifyData(&record, nullptr), kStatusNoError);

  // The transposed view gathers into a 3x2 array.
  std::swap(record.dims[0], record.dims[1]);
  Datum transposed(ints);
  ASSERT_EQ(view.CopyDataConvert(ints, &record, transposed.Slot(), 0), kStatusNoError);
  EXPECT_EQ(transposed.Dims(2), (std::vector<int32_t>{3, 2}));
  const int32_t columns[] = {1, 4, 2, 5, 3, 6};
  for (int32_t i = 0; i < 6; ++i) EXPECT_EQ(transposed.At<int32_t>(8, i), columns[i]);

  // A fixed dimension larger than the source stops before anything is written.
  DebugCapture capture;
  const TDRSubArray wide = MakeSubArray(GetiL(), {kVar, Fix(5)});
  Record untouched{};
  EXPECT_EQ(ints.CopyDataConvert(wide, from.Slot(), &untouched, 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("CopyArrayToSubArray dim=5 dimsrc=3"));
  EXPECT_EQ(untouched.data, nullptr);
  const TDRSubArray narrow = MakeSubArray(GetiL(), {1, Fix(2)});
  Record part{};
  ASSERT_EQ(view.CopyDataConvert(narrow, &record, &part, 0), kStatusNoError);
  EXPECT_EQ(part.dims[0].dimensionSize, 1);
  EXPECT_EQ(part.dims[1].dimensionSize, 2);
  EXPECT_EQ(part.dims[1].stride, record.dims[1].stride);

  EXPECT_EQ(view.GetArrayPtrOffset(), 0);
  EXPECT_EQ(view.GetDimSizeOffset(1), 24);
  EXPECT_EQ(view.GetStrideOffset(1), 32);
  EXPECT_EQ(view.GetStrideOffset(2), 0);
  EXPECT_TRUE(capture.Contains(" Invalid dimension"));
  TestPlatform small(4, 0, 4);
  EXPECT_EQ(view.GetDimSizeOffset(1, &small), 12);
  EXPECT_EQ(view.GetStrideOffset(1, &small), 16);
  EXPECT_EQ(view.DataSize(&small), 20);
}

TEST_F(TDArrayTest, ArrayDataPtrIsNeverCopiedAsAValue) {
  const TDR fixedString = TDRString(nullptr, Fix(3));
  // Without data only an array of fixed size all through knows its elements' flattened size.
  EXPECT_EQ(MakeArray(fixedString, {Fix(2), Fix(3)}).FlatDataSize(nullptr, nullptr), 8u + 6 * (4 + 3));
  EXPECT_EQ(MakeArray(fixedString, {Fix(2), 3}).FlatDataSize(nullptr, nullptr), 8u);
  EXPECT_EQ(MakeArray(GetStringTD(), {Fix(2)}).FlatDataSize(nullptr, nullptr), 4u);
  const TDRArrayDataPtr pointer(1, GetiL());
  EXPECT_EQ(pointer.DataSize(), 8);
  EXPECT_EQ(pointer.DataShape(), kDataShapePlain);
  void* from = &from;
  void* into = nullptr;
  DebugCapture capture;
  EXPECT_EQ(pointer.CopyData(&from, &into, nullptr, 0), kStatusBadArgument);
  EXPECT_TRUE(capture.Contains("CopyData bad type=0x00000041"));
}

// --- bad input -----------------------------------------------------------------------------------

TEST_F(TDArrayTest, VerifyDataFindsDamage) {
  DebugCapture capture;
  SetTDRaveProc(&Rave);
  const TDRArray ints = MakeArray(GetiL(), {kVar, kVar});
  Datum datum(ints);
  FillInt32(ints, datum, {2, 3});
  int32_t* dims = reinterpret_cast<int32_t*>(*datum.H());
  struct Case {
    const char* name;
    int32_t first;
    int32_t second;
    int32_t code;
  };
  const Case cases[] = {
      {"Sound", 2, 3, 0},          {"MoreThanHeld", 3, 3, 1024}, {"Negative", -2, 3, 1024},
      {"Overflow", 65536, 65536, 1024}, {"Smaller", 1, 3, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    dims[0] = c.first;
    dims[1] = c.second;
    gRaveCode = 0;
    EXPECT_EQ(ints.VerifyData(datum.Slot(), nullptr), c.code);
    EXPECT_EQ(gRaveCode, c.code);
  }
  dims[0] = 2;
  dims[1] = 3;
  uint8_t garbage[32] = {};
  UHandle notAHandle = reinterpret_cast<UHandle>(garbage);
  EXPECT_EQ(ints.VerifyData(&notAHandle, nullptr), 1024);

  const TDRArray bounded = MakeArray(GetiL(), {4});
  Datum limited(bounded);
  ASSERT_EQ(bounded.InflateDefData(limited.Slot(), 0, 1, 0), kStatusNoError);
  EXPECT_EQ(bounded.VerifyData(limited.Slot(), nullptr), 4096);  // count 0, type says 4
  TDEnablePreAllocation(true);
  EXPECT_EQ(bounded.VerifyData(limited.Slot(), nullptr), kStatusNoError);
  reinterpret_cast<int32_t*>(*limited.H())[0] = 5;
  EXPECT_EQ(bounded.VerifyData(limited.Slot(), nullptr), 1024);  // more than the block holds
  TDEnablePreAllocation(false);
  reinterpret_cast<int32_t*>(*limited.H())[0] = 4;
  EXPECT_EQ(bounded.VerifyData(limited.Slot(), nullptr), 128);

  const TDRArray strings(1, GetStringTD());
  Datum text(strings);
  ASSERT_EQ(VectorSetSize(GetStringTD(), text.Slot(), 2), kStatusNoError);
  LStrHandle s = nullptr;
  ASSERT_EQ(StringUtils::ToLStr("abc", &s), kStatusNoError);
  (*s)->cnt = 100;
  text.Set<LStrHandle>(4, 1, s);
  EXPECT_EQ(strings.VerifyData(text.Slot(), nullptr), 1024);
  EXPECT_TRUE(capture.Contains(", eltOffset=12"));
  (*s)->cnt = 3;
}

TEST_F(TDArrayTest, OverflowingCountsAreRefused) {
  const TDRArray huge = MakeArray(GetiL(), {Fix(65536), Fix(65536)});
  DebugCapture capture;
  UHandle h = nullptr;
  EXPECT_EQ(huge.InflateDefData(&h, 0, 1, 0), kStatusBadArgument);
  EXPECT_EQ(h, nullptr);
  EXPECT_TRUE(capture.Contains("Array number of elements overflowed"));
  EXPECT_EQ(huge.CopyData(&h, &h, nullptr, 0), kStatusBadArgument);

  const TDRArray ints = MakeArray(GetiL(), {kVar, kVar});
  const int32_t dims[] = {65536, 65536};
  EXPECT_EQ(ints.SetArraySize(&h, 0, dims), kStatusBadArgument);
  EXPECT_EQ(h, nullptr);
}

}  // namespace
