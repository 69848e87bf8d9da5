// Random nested descriptors (clusters of arrays of strings of clusters ...) and random values
// for them, shared by the tests that walk data of every common shape.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "runtime/PXStrings.h"
#include "vellum.h"

class RandomTypes {
 public:
  explicit RandomTypes(uint32_t seed) : random_(seed) {}

  TDR Make(int32_t depth) {
    const int32_t pick = Pick(depth > 0 ? 12 : 7);
    switch (pick) {
      case 0:
        return MakeDefaultTDRForTypeCode(Pick(14) + 1);
      case 1:
        return GetBoolTD();
      case 2:
        return GetStringTD();
      case 3:
        return TDRString(nullptr, Pick(6));
      case 4:
        return TDRString(nullptr, vellum::bound::Fixed(Pick(6)));
      case 5:
        return GetPathTD();
      case 6: {
        TDWBlock block;
        EXPECT_EQ(block.SetBlockSize(Pick(5)), kStatusNoError);
        return block.CheckIn();
      }
      case 7: {
        TDWRepeatedBlock repeated;
        EXPECT_EQ(repeated.SetEltTD(Make(depth - 1)), kStatusNoError);
        EXPECT_EQ(repeated.SetNumBlocks(static_cast<uint32_t>(Pick(3))), kStatusNoError);
        return repeated.CheckIn();
      }
      case 8:
      case 9: {
        // Variable, bounded or fixed arrays of one or two dimensions; arrays hold no arrays.
        TDR element = Make(depth - 1);
        while (element.IsArrayBase() != 0) element = Make(depth - 1);
        TDWArray array(0, element);
        const int32_t kind = pick == 8 ? 0 : 1 + Pick(2);
        for (int32_t d = 0, n = 1 + Pick(2); d < n; ++d) {
          const int32_t size = Pick(3);
          EXPECT_EQ(array.AddDim(kind == 0 ? vellum::bound::kVariable : kind == 1 ? size : vellum::bound::Fixed(size)), kStatusNoError);
        }
        return array.CheckIn();
      }
      default: {
        TDWCluster cluster;
        const int32_t count = Pick(5);
        for (int32_t i = 0; i < count; ++i) cluster << Make(depth - 1);
        return cluster.CheckIn();
      }
    }
  }

  // Nonzero bytes for every element without handles, strings with text: a value unlike the default.
  void Fill(const TDR& type, uint8_t* data) {
    if (type.IsClust() != 0) {
      const TDRCluster cluster = vellum::As<TDRCluster>(type);
      for (int32_t i = 0; i < cluster.GetNumElts(); ++i) Fill(cluster.GetEltTD(i), data + cluster.GetEltOffset(i));
      return;
    }
    if (type.IsRepeatedBlock() != 0) {
      const TDRRepeatedBlock repeated = vellum::As<TDRRepeatedBlock>(type);
      const TDR element = repeated.GetEltTD();
      for (uint32_t k = 0; k < repeated.GetNumBlocks(); ++k) Fill(element, data + k * element.DataSize());
      return;
    }
    if (type.IsArrayOnly() != 0) {
      FillArray(vellum::As<TDRArray>(type), data);
      return;
    }
    if (type.IsStringOnly() != 0 && vellum::As<TDRString>(type).GetBound() == vellum::bound::kVariable) {
      LStrHandle text = nullptr;
      std::memcpy(&text, data, sizeof text);
      EXPECT_EQ(StringUtils::ToLStr(std::string(static_cast<size_t>(Pick(9)), 'x'), &text), kStatusNoError);
      std::memcpy(data, &text, sizeof text);
      return;
    }
    if (type.DataShape() == kDataShapePlain) {
      for (int32_t i = 0; i < type.DataSize(); ++i) data[i] = static_cast<uint8_t>(Pick(255) + 1);
      if (type.IsBool() != 0) data[0] = 1;
    }
  }

  // A variable array gets new sizes, a bounded one sizes within its bounds, a fixed one keeps its
  // own; then every element is filled.
  void FillArray(const TDRArray& array, uint8_t* data) {
    const TDR element = array.GetEltTD();
    const int32_t n = array.GetNumDims();
    UHandle h = nullptr;
    std::memcpy(&h, data, sizeof h);
    std::vector<int32_t> dims(static_cast<size_t>(n));
    int32_t count = 1;
    for (int32_t d = 0; d < n; ++d) {
      const int32_t word = array.GetDimSize(d);
      dims[static_cast<size_t>(d)] = word == vellum::bound::kVariable ? Pick(3) : word >= 0 ? Pick(word + 1) : (word & 0x7FFFFFFF);
      count *= dims[static_cast<size_t>(d)];
    }
    if (array.BoundedOrFixed() == vellum::bound::kVariable) {
      ASSERT_EQ(array.SetArraySize(&h, count, dims.data()), kStatusNoError);
      std::memcpy(data, &h, sizeof h);
    } else if (h != nullptr) {
      std::memcpy(*h, dims.data(), dims.size() * sizeof(int32_t));
    }
    if (h == nullptr) return;
    auto* first = static_cast<uint8_t*>(array.GetFirstElementPtr(h));
    for (int32_t i = 0; i < count; ++i) Fill(element, first + static_cast<int64_t>(i) * element.DataSize());
  }

  int32_t Pick(int32_t n) { return static_cast<int32_t>(random_() % static_cast<uint32_t>(n)); }

 private:
  std::mt19937 random_;
};
