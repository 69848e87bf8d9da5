// Type strings as properties: random descriptor trees of every kind saved and loaded back give the
// same interned descriptor, lists keep their entries, and saving is repeatable.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <random>
#include <string>
#include <vector>

#include "support/TestDatum.h"
#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXApp.h"
#include "vellum.h"
#include "vellum/TypeStrings.h"

namespace {

class TypeStringRoundTripTest : public TypeSystemTest {};

std::vector<uint8_t> Bytes(UHandle h) {
  if (h == nullptr) return {};
  return std::vector<uint8_t>(*h, *h + DSGetHandleSize(h));
}

// The type string of one descriptor; empty when saving fails (the status is then reported).
std::vector<uint8_t> FlatOne(const PersistTDData* persist, const TDR& type) {
  UHandle h = nullptr;
  const int32_t status = FlattenOneType(persist, type, &h, nullptr);
  EXPECT_EQ(status, kStatusNoError);
  std::vector<uint8_t> bytes = Bytes(h);
  DSDisposeHandle(h);
  return bytes;
}

TDR LoadOne(const PersistTDData* persist, const std::vector<uint8_t>& bytes, int32_t* status) {
  TDR out;
  *status = UnFlattenOneType(persist, bytes.data(), static_cast<uint32_t>(bytes.size()), &out, nullptr);
  return out;
}

uint32_t SeedFromEnvironment(const char* what) {
  const char* given = std::getenv("VELLUM_TYPESTRING_SEED");
  const uint32_t seed =
      given != nullptr ? static_cast<uint32_t>(std::strtoul(given, nullptr, 10)) : std::random_device()();
  std::printf("%s seed %u (VELLUM_TYPESTRING_SEED)\n", what, seed);
  return seed;
}

// Random descriptors of every kind a type string can hold, each node possibly named, linked to a
// typedef and flagged. Alongside, a text that says what was built, for failure messages. What a
// record does not hold is left at its default: typedef links have no path, void blocks keep
// their alignment, tags have valid kinds.
class TreeGrower {
 public:
  explicit TreeGrower(uint32_t seed) : random_(seed) {}

  // A tree at most `depth` containers deep.
  TDR Make(int32_t depth, std::string& text) {
    TDW body = Body(depth, text);
    Decorate(body, text);
    return body.CheckIn();
  }

  int32_t Pick(int32_t n) { return static_cast<int32_t>(random_() % static_cast<uint32_t>(n)); }

 private:
  TDW Body(int32_t depth, std::string& text) {
    const int32_t kLeaves = 11;
    const int32_t choice = depth > 0 && Pick(2) == 0 ? kLeaves + Pick(7) : Pick(kLeaves);
    switch (choice) {
      case 0:
        text += "Void";
        return TDWVoid();
      case 1: {
        TDWBoolean boolean;
        text += "Boolean";
        if (Pick(3) == 0) {
          text += "+discard";
          EXPECT_EQ(boolean.SetEventDiscardMask(1), kStatusNoError);
        }
        return boolean;
      }
      case 2:
        text += "BooleanU16";
        return TDWBooleanU16();
      case 3: {
        const int32_t code = 1 + Pick(14);
        TDWBasicNumeric number = vellum::As<TDWBasicNumeric>(MakeDefaultTDWForTypeCode(code));
        text += "num" + std::to_string(code);
        if (Pick(3) == 0) {
          const auto flags = static_cast<uint8_t>(1 + Pick(255));
          text += "/flags" + std::to_string(flags);
          EXPECT_EQ(number.SetNumFlags(flags), kStatusNoError);
        }
        return number;
      }
      case 4: {
        TDWEnum items;
        text += "enum<";
        for (int32_t i = Pick(5); i > 0; --i) {
          const std::string item = RandomText(Pick(6));
          text += "'" + item + "',";
          EXPECT_EQ(items.AppendString(item.data(), item.size()), kStatusNoError);
        }
        text += ">";
        switch (Pick(3)) {
          case 0: text += "u8"; return TDWUInt8(items, nullptr);
          case 1: text += "u16"; return TDWUInt16(items, nullptr);
          default: text += "u32"; return TDWUInt32(items, nullptr);
        }
      }
      case 5: {
        TDWUnits units;
        text += "units<";
        for (int32_t i = Pick(4); i > 0; --i) {
          const TDBaseUnits key = Pick(2) == 0 ? Pick(kUnitLargestKey + 1) : PolymorphicUnit(1 + Pick(9));
          auto exponent = static_cast<int16_t>(Pick(4) == 0 ? random_() : Pick(2) == 0 ? 1 + Pick(4) : -1 - Pick(4));
          if (exponent == 0) exponent = 1;
          text += std::to_string(key) + "^" + std::to_string(exponent) + ",";
          EXPECT_EQ(units.SetUnit(key, exponent), kStatusNoError);
        }
        text += ">";
        switch (Pick(6)) {
          case 0: text += "f32"; return TDWFloat32(units, nullptr);
          case 1: text += "f64"; return TDWFloat64(units, nullptr);
          case 2: text += "fExt"; return TDWFloatExt(units, nullptr);
          case 3: text += "c64"; return TDWComplex64(units, nullptr);
          case 4: text += "c128"; return TDWComplex128(units, nullptr);
          default: text += "cExt"; return TDWComplexExt(units, nullptr);
        }
      }
      case 6: {
        const int32_t bound = RandomBound();
        text += "bound" + std::to_string(bound);
        switch (Pick(4)) {
          case 0: text += "String"; return TDWString(nullptr, bound);
          case 1: text += "Path"; return TDWPath(nullptr, bound);
          case 2: text += "Pict"; return TDWPict(nullptr, bound);
          default: text += "SubString"; return TDWSubString(nullptr, bound);
        }
      }
      case 7: {
        const int32_t bound = RandomBound();
        if (Pick(3) == 0) {
          const std::string tagClass = RandomText(Pick(7));
          text += "UserTag'" + tagClass + "'/bound" + std::to_string(bound);
          TDWUserDefinedTag tag;
          EXPECT_EQ(tag.SetTagClassCStr(U(tagClass.c_str())), kStatusNoError);
          EXPECT_EQ(tag.SetBound(bound), kStatusNoError);
          return tag;
        }
        const TagType kind = 1 + Pick(23);
        text += "Tag" + std::to_string(kind) + "/bound" + std::to_string(bound);
        return TDWTag(bound, kind, nullptr);
      }
      case 8:
        switch (Pick(3)) {
          case 0: text += "CStr"; return TDWCStr();
          case 1: text += "PStr"; return TDWPStr();
          default: text += "Ptr"; return TDWPtr();
        }
      case 9: {
        TDWBlock block;
        const int32_t size = Pick(4) == 0 ? Pick(0x10000) - 10 : Pick(9);
        text += "Block" + std::to_string(size);
        EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
        return block;
      }
      case 10: {
        TDWAlignedBlock block;
        const int32_t size = Pick(9);
        const auto alignment = static_cast<uint16_t>(Pick(4) == 0 ? random_() : 1u << Pick(5));
        text += "AlignedBlock" + std::to_string(size) + "/" + std::to_string(alignment);
        EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
        EXPECT_EQ(block.SetAlignment(alignment), kStatusNoError);
        return block;
      }
      case 11: {
        TDWPtrTo pointer;
        text += "PtrTo(";
        EXPECT_EQ(pointer.SetEltTD(Make(depth - 1, text)), kStatusNoError);
        text += ")";
        return pointer;
      }
      case 12: return Array(depth, text);
      case 13: {
        TDWCluster cluster;
        std::vector<TDR> elements;
        text += "{";
        for (int32_t i = Pick(6); i > 0; --i) {
          // Now and then an element met before, so that records are shared.
          if (!elements.empty() && Pick(3) == 0) {
            elements.push_back(elements[static_cast<size_t>(Pick(static_cast<int32_t>(elements.size())))]);
            text += "again,";
          } else {
            elements.push_back(Make(depth - 1, text));
            text += ",";
          }
          EXPECT_EQ(cluster.AppendEltTD(elements.back()), kStatusNoError);
        }
        text += "}";
        return cluster;
      }
      case 14: {
        TDWTypeBlock block;
        text += "TypeBlock(";
        EXPECT_EQ(block.SetEltTD(Make(depth - 1, text)), kStatusNoError);
        text += ")";
        return block;
      }
      case 15: {
        TDWVoidBlock block;
        text += "VoidBlock(";
        EXPECT_EQ(block.SetEltTD(Make(depth - 1, text)), kStatusNoError);
        text += ")";
        return block;
      }
      case 16: {
        TDWRepeatedBlock block;
        const auto count = static_cast<uint32_t>(Pick(4));
        text += "Repeated" + std::to_string(count) + "(";
        EXPECT_EQ(block.SetEltTD(Make(depth - 1, text)), kStatusNoError);
        EXPECT_EQ(block.SetNumBlocks(count), kStatusNoError);
        text += ")";
        return block;
      }
      default: {
        TDWAlignmentMarker marker;
        text += "Marker(";
        EXPECT_EQ(marker.SetAlignmentSource(Make(depth - 1, text)), kStatusNoError);
        text += ")";
        return marker;
      }
    }
  }

  // Array, SubArray or ArrayDataPtr of up to three dimensions, each variable, bounded or fixed;
  // the element is never itself an array.
  TDW Array(int32_t depth, std::string& text) {
    const int32_t kind = Pick(3);
    text += kind == 0 ? "Array[" : kind == 1 ? "SubArray[" : "ArrayDataPtr[";
    std::vector<int32_t> words;
    for (int32_t d = Pick(4); d > 0; --d) {
      words.push_back(RandomBound());
      text += std::to_string(words.back()) + ",";
    }
    std::string elementText;
    TDR element = Make(depth - 1, elementText);
    while (element.IsArrayBase() != 0) {
      elementText.clear();
      element = Make(depth - 1, elementText);
    }
    text += elementText + "]";
    TDWArrayBase array;
    switch (kind) {
      case 0: array = vellum::As<TDWArrayBase>(TDWArray(0, element)); break;
      case 1: array = vellum::As<TDWArrayBase>(TDWSubArray(0, element)); break;
      default: array = vellum::As<TDWArrayBase>(TDWArrayDataPtr(0, element)); break;
    }
    for (const int32_t word : words) EXPECT_EQ(array.AddDim(word), kStatusNoError);
    if (Pick(5) == 0) {
      text += "column";
      array.SetIsColumnVector(true);
    }
    return array;
  }

  void Decorate(TDW& type, std::string& text) {
    if (Pick(4) == 0) {
      // Mostly short names; now and then one that fills the length byte.
      const std::string name = RandomText(Pick(8) == 0 ? 255 : 1 + Pick(9));
      text += " '" + name + "'";
      EXPECT_EQ(type.SetName(name), kStatusNoError);
    }
    if (Pick(8) == 0) {
      // One to three parts; a few long ones fill their length bytes.
      std::string definition = "lib" + std::to_string(Pick(3));
      for (int32_t parts = Pick(3); parts > 0; --parts) {
        const std::string part =
            Pick(6) == 0 ? std::string(static_cast<size_t>(200 + Pick(56)), 'q') : RandomText(1 + Pick(5), false);
        definition += ":" + part;
      }
      const auto stamp = static_cast<uint32_t>(random_());
      text += " typedef " + definition + "@" + std::to_string(stamp);
      EXPECT_EQ(type.SetTypedef(Link(definition, stamp)), kStatusNoError);
    }
    if (Pick(8) == 0) {
      text += " noselect";
      EXPECT_EQ(type.SetNoSelectMask(1), kStatusNoError);
    }
    if (Pick(8) == 0) {
      text += " generic";
      EXPECT_EQ(type.SetGenericness(1), kStatusNoError);
    }
    if (Pick(8) == 0) {
      text += " ephemeral";
      type.EphemeralizeTD();
    }
  }

  int32_t RandomBound() {
    switch (Pick(3)) {
      case 0: return vellum::bound::kVariable;
      case 1: return Pick(4) == 0 ? static_cast<int32_t>(random_() >> 1) : Pick(7);
      default: return vellum::bound::Fixed(Pick(4) == 0 ? static_cast<int32_t>(random_() >> 1) : Pick(7));
    }
  }

  // Letters, punctuation, spaces and bytes above 127; never a zero byte. A part of a qualified
  // name has no delimiter.
  std::string RandomText(int32_t length, bool withDelimiter = true) {
    static const char kChars[] = "abcXYZ09 _\"\\\t\xE9\xFF:";
    const auto choices = static_cast<int32_t>(sizeof kChars - (withDelimiter ? 1 : 2));
    std::string out;
    for (int32_t i = 0; i < length; ++i) out += kChars[Pick(choices)];
    return out;
  }

  std::mt19937 random_;
};

// The descriptor whose record a type string writes first: elements go before their containers,
// in element order.
TDR FirstRecordOf(const TDR& type) {
  if (const TDRSingleContainer single = vellum::As<TDRSingleContainer>(type); single && single.GetEltTD()) {
    return FirstRecordOf(single.GetEltTD());
  }
  if (const TDRMultiContainer multi = vellum::As<TDRMultiContainer>(type); multi) {
    for (int32_t i = 0; i < multi.GetNumElts(); ++i) {
      if (const TDR element = multi.GetEltTD(i)) return FirstRecordOf(element);
    }
  }
  return type;
}

// The smallest part of `type` (itself included) that does not come back as itself, as text.
std::string SmallestFailingPart(const TDR& type) {
  std::vector<TDR> parts;
  type.TraverseTDR(
      [](const TDR& part, void* context) -> TDTraverseValue {
        static_cast<std::vector<TDR>*>(context)->push_back(part);
        return kTraverseContinue;
      },
      &parts, nullptr);
  std::vector<uint8_t> smallest;
  for (const TDR& part : parts) {
    const std::vector<uint8_t> bytes = FlatOne(nullptr, part);
    int32_t status = 0;
    const TDR back = LoadOne(nullptr, bytes, &status);
    if ((status != kStatusNoError || back != part) && (smallest.empty() || bytes.size() < smallest.size())) {
      smallest = bytes;
    }
  }
  return smallest.empty() ? std::string("none alone") : HexBytes(smallest);
}

TEST_F(TypeStringRoundTripTest, RandomTreesComeBackAsTheSameDescriptor) {
  const uint32_t seed = SeedFromEnvironment("type string round trip");
  RecordProperty("seed", std::to_string(seed));
  TreeGrower grower(seed);
  const PersistTDData current(PXApp::Instance().GetVersion());
  // Saving checks each record's size against what it wrote and says so when they differ.
  DebugCapture capture;
  size_t bytesSeen = 0;
  for (int32_t round = 0; round < 3000; ++round) {
    std::string text;
    const TDR type = grower.Make(4, text);
    ASSERT_TRUE(type) << text;
    SCOPED_TRACE("seed " + std::to_string(seed) + " round " + std::to_string(round) + ": " + text);
    // The default context and an explicit one of the running version write the same.
    const PersistTDData* persist = round % 2 == 0 ? nullptr : &current;
    const std::vector<uint8_t> bytes = FlatOne(persist, type);
    ASSERT_FALSE(bytes.empty());
    bytesSeen += bytes.size();
    int32_t status = 0;
    const TDR back = LoadOne(persist, bytes, &status);
    ASSERT_EQ(status, kStatusNoError) << HexBytes(bytes);
    ASSERT_EQ(back.GetImpPtr(), type.GetImpPtr())
        << HexBytes(bytes) << "\nsmallest failing part: " << SmallestFailingPart(type);
    ASSERT_EQ(FlatOne(persist == nullptr ? &current : nullptr, type), bytes) << "saving again wrote other bytes";
    ASSERT_EQ(capture.Texts(), std::vector<std::string>()) << HexBytes(bytes);
  }
  EXPECT_GT(bytesSeen, 100000u) << "the trees are too small to test much";
}

TEST_F(TypeStringRoundTripTest, RandomListsKeepTheirEntries) {
  const uint32_t seed = SeedFromEnvironment("type list round trip");
  RecordProperty("seed", std::to_string(seed));
  TreeGrower grower(seed);
  for (int32_t round = 0; round < 500; ++round) {
    SCOPED_TRACE("seed " + std::to_string(seed) + " round " + std::to_string(round));
    TMTypeList list;
    std::vector<TDR> entries;
    std::vector<uint32_t> extra;
    std::string text;
    for (int32_t i = grower.Pick(7); i > 0; --i) {
      const int32_t what = grower.Pick(6);
      if (what == 0) {
        entries.push_back(TDR());  // an empty entry
        text += "null;";
      } else if (what == 1 && !entries.empty()) {
        entries.push_back(entries[static_cast<size_t>(grower.Pick(static_cast<int32_t>(entries.size())))]);
        text += "again;";
      } else {
        entries.push_back(grower.Make(3, text));
        text += ";";
      }
      extra.push_back(grower.Pick(3) == 0 ? 0x7FFFFFFFu - static_cast<uint32_t>(grower.Pick(1000))
                                          : static_cast<uint32_t>(grower.Pick(70000)));
      ASSERT_EQ(list.AppendType(entries.back(), nullptr), kStatusNoError);
    }
    SCOPED_TRACE(text);
    const bool withExtra = grower.Pick(2) == 0;
    UHandle h = nullptr;
    ASSERT_EQ(FlattenListOfTypes(nullptr, &list, withExtra ? extra.data() : nullptr, &h, 0, nullptr, 1),
              kStatusNoError);
    const std::vector<uint8_t> bytes = Bytes(h);
    UHandle again = nullptr;
    ASSERT_EQ(FlattenListOfTypes(nullptr, &list, withExtra ? extra.data() : nullptr, &again, 0, nullptr, 1),
              kStatusNoError);
    EXPECT_EQ(Bytes(again), bytes) << "saving again wrote other bytes";
    DSDisposeHandle(again);

    TMTypeList back;
    uint32_t* values = nullptr;
    ASSERT_EQ(UnFlattenListOfTypes(nullptr, h, &back, withExtra ? &values : nullptr, 0, nullptr), kStatusNoError)
        << HexBytes(bytes);
    DSDisposeHandle(h);
    ASSERT_EQ(back.GetNumTypes(), static_cast<int32_t>(entries.size())) << HexBytes(bytes);
    // A skipped entry repeats the index of the one before it; a first one refers to record 0.
    TDR firstRecord;
    for (const TDR& entry : entries) {
      if (entry) {
        firstRecord = FirstRecordOf(entry);
        break;
      }
    }
    TDR expected;
    for (size_t k = 0; k < entries.size(); ++k) {
      expected = entries[k] ? entries[k] : k == 0 ? firstRecord : expected;
      EXPECT_EQ(back.GetType(static_cast<uint32_t>(k)).GetImpPtr(), expected.GetImpPtr())
          << "entry " << k << " " << HexBytes(bytes);
      if (withExtra && values != nullptr) {
        EXPECT_EQ(values[k], extra[k]) << "entry " << k;
      }
    }
    DSDisposePtr(reinterpret_cast<UPtr>(values));
  }
}

TEST_F(TypeStringRoundTripTest, EmptyEntriesAreRefusedUnlessSkipped) {
  DebugCapture capture;
  TMTypeList list;
  ASSERT_EQ(list.AppendType(GetiL(), nullptr), kStatusNoError);
  ASSERT_EQ(list.AppendType(TDR(), nullptr), kStatusNoError);
  UHandle h = nullptr;
  EXPECT_EQ(FlattenListOfTypes(nullptr, &list, nullptr, &h, 0, nullptr, 0), kStatusNullHandle);
  EXPECT_EQ(h, nullptr);
  EXPECT_TRUE(capture.Contains("Saving type descriptors encountered an error!"));
}

}  // namespace
