// The vellum tool's JSON view of values: every kind read from JSON, flattened, read back and shown
// again; the refusals of JSON that does not fit its type; and seeded random types and values.
#include "JsonView.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXApp.h"
#include "runtime/PXNumbers.h"
#include "vellum/DataStreams.h"
#include "HexText.h"
#include "vellum.h"

namespace {

class JsonViewTest : public TypeSystemTest {};

constexpr int32_t kVar = vellum::bound::kVariable;
constexpr int32_t Fix(int32_t n) { return vellum::bound::Fixed(n); }

// The flattened data of the value `json` gives, in hex; "error: " and the reason when it is refused.
std::string Encode(const TDR& type, const JsonValue& json, uint32_t version = PXApp::Instance().GetVersion()) {
  vellum::Value datum(type);
  EXPECT_EQ(datum.Status(), kStatusNoError);
  try {
    JsonToData(type, json, datum.Data());
  } catch (const JsonViewError& e) {
    return std::string("error: ") + e.what();
  }
  OutputBuf out;
  KoDataWriter writer(&out, version, nullptr, 0);
  const int32_t status = writer.WriteData(type, datum.Data(), 1);
  if (status != kStatusNoError) return "status " + std::to_string(status);
  return LowerHex(out.Data(), out.GetBytesWritten());
}

// The same for JSON text.
std::string EncodeText(const TDR& type, const std::string& json) { return Encode(type, JsonValue::parse(json)); }

// The value the flattened data `hex` holds, as JSON text; "status N" when it does not read whole.
std::string Decode(const TDR& type, const std::string& hex, bool named = false) {
  std::vector<uint8_t> bytes;
  EXPECT_EQ(ParseHex(hex, &bytes), "");
  vellum::Value datum(type);
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
  const int32_t status = reader.ReadData(type, datum.Data(), 1);
  if (status != kStatusNoError) return "status " + std::to_string(status);
  EXPECT_EQ(reader.BytesLeft(), 0u) << hex;
  return DataToJson(type, datum.Data(), named).dump();
}

TDR Named(const TDR& type, const char* name) {
  TDW named = type.CheckOut();
  EXPECT_EQ(named.SetName(std::string(name)), 0);
  return named.CheckIn();
}

TDR Cluster(const std::vector<TDR>& elements) {
  TDWCluster cluster;
  for (const TDR& e : elements) EXPECT_EQ(cluster.AppendEltTD(e), 0);
  return cluster.CheckIn();
}

TDR ArrayOf(const TDR& element, const std::vector<int32_t>& words) {
  TDWArray array(0, element);
  for (const int32_t word : words) EXPECT_EQ(array.AddDim(word), kStatusNoError);
  return array.CheckIn();
}

TDR WithUnits(const TDR& type) {
  TDWUnits units;
  EXPECT_EQ(units.SetUnit(kUnitSeconds, -1), 0);
  TDWNumeric numeric = vellum::As<TDWNumeric>(type.CheckOut());
  EXPECT_EQ(numeric.SetUnits(units), 0);
  return numeric.CheckIn();
}

TDR Block(int32_t size) {
  TDWBlock block;
  EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
  return block.CheckIn();
}

TDR AlignedBlock(int32_t size, uint16_t alignment) {
  TDWAlignedBlock block;
  EXPECT_EQ(block.SetBlockSize(size), kStatusNoError);
  EXPECT_EQ(block.SetAlignment(alignment), kStatusNoError);
  return block.CheckIn();
}

TDR TypeBlock(const TDR& element) {
  TDWTypeBlock block;
  EXPECT_EQ(block.SetEltTD(element), kStatusNoError);
  return block.CheckIn();
}

TDR VoidBlock() {
  TDWVoidBlock block;
  EXPECT_EQ(block.SetAlignment(4), kStatusNoError);
  return block.CheckIn();
}

TDR Repeated(const TDR& element, uint32_t count) {
  TDWRepeatedBlock block;
  EXPECT_EQ(block.SetEltTD(element), kStatusNoError);
  EXPECT_EQ(block.SetNumBlocks(count), kStatusNoError);
  return block.CheckIn();
}

TDR Marker(const TDR& source) {
  TDWAlignmentMarker marker;
  EXPECT_EQ(marker.SetAlignmentSource(source), kStatusNoError);
  return marker.CheckIn();
}

TDR Notation(const char* text) {
  const TDR type = InterpretedStringToType(text);
  EXPECT_TRUE(type) << text;
  return type;
}

struct KindCase {
  const char* name;
  TDR type;
  const char* json;  // the value given
  const char* flat;  // its flattened data in hex
  const char* shown;  // the value shown after reading the data back (null: `json` itself)
  bool named = false;
};

TEST_F(JsonViewTest, EveryKindRoundTrips) {
  TDWEnum items;
  items << "a" << "b" << "c";
  const KindCase kCases[] = {
      {"Void", GetVoidTD(), "null", "", nullptr},
      {"Int8", GetiB(), "-128", "80", nullptr},
      {"Int16", GetiW(), "-2", "fffe", nullptr},
      {"Int32", GetiL(), "1", "00000001", nullptr},
      {"Int64", GetiQ(), "-9223372036854775808", "8000000000000000", nullptr},
      {"UInt8", GetuB(), "255", "ff", nullptr},
      {"UInt16", GetuW(), "65535", "ffff", nullptr},
      {"UInt32", GetuL(), "4294967295", "ffffffff", nullptr},
      {"UInt64", GetuQ(), "18446744073709551615", "ffffffffffffffff", nullptr},
      {"EnumUInt8", TDWUInt8(items, nullptr).CheckIn(), "2", "02", nullptr},
      {"EnumUInt16", TDWUInt16(items, nullptr).CheckIn(), "1", "0001", nullptr},
      {"EnumUInt32", TDWUInt32(items, nullptr).CheckIn(), "7", "00000007", nullptr},
      {"Float32", GetfS(), "0.1", "3dcccccd", nullptr},
      {"Float32Max", GetfS(), "3.4028234663852886e+38", "7f7fffff", "3.4028235e+38"},
      {"Float32Units", WithUnits(GetfS()), "-0.0", "80000000", nullptr},
      {"Float64", GetfD(), "1.0", "3ff0000000000000", nullptr},
      {"Float64Tiny", GetfD(), "5e-324", "0000000000000001", nullptr},
      {"Float64NaN", GetfD(), "\"NaN\"", "7ff8000000000000", nullptr},
      {"Float64Infinity", GetfD(), "\"-Infinity\"", "fff0000000000000", nullptr},
      {"Float64Units", WithUnits(GetfD()), "2", "4000000000000000", "2.0"},
      {"FloatExt", GetfX(), "\"-0.1\"", "bffb999999999999999a000000000000", nullptr},
      {"FloatExtFromNumber", GetfX(), "1", "3fff0000000000000000000000000000", "\"1\""},
      {"FloatExtPi", GetfX(), "\"3.14159265358979323846264\"", "4000921fb54442d1846a000000000000",
       "\"3.1415926535897932385\""},
      {"FloatExtUnits", WithUnits(GetfX()), "\"Infinity\"", "7fff0000000000000000000000000000", nullptr},
      {"Complex64", GetcS(), "[1.0,-2.0]", "3f800000c0000000", nullptr},
      {"Complex128", GetcD(), "[0.5,\"NaN\"]", "3fe00000000000007ff8000000000000", nullptr},
      {"ComplexExt", GetcX(), "[\"1\",\"-1\"]", "3fff0000000000000000000000000000bfff0000000000000000000000000000", nullptr},
      {"Complex128Units", WithUnits(GetcD()), "[0.0,1.0]", "00000000000000003ff0000000000000", nullptr},
      {"Boolean", GetBoolTD(), "true", "01", nullptr},
      {"String", GetStringTD(), "\"abc\"", "00000003616263", nullptr},
      {"EmptyString", GetStringTD(), "\"\"", "00000000", nullptr},
      {"StringUtf8", GetStringTD(), "\"h\\u00e9\\u0000\"", "0000000468c3a900", "\"h\xC3\xA9\\u0000\""},
      {"StringBytes", GetStringTD(), "{\"bytes\":\"FF 00\"}", "00000002ff00", "{\"bytes\":\"ff00\"}"},
      {"StringBytesThatAreText", GetStringTD(), "{\"bytes\":\"6869\"}", "000000026869", "\"hi\""},
      {"BoundedString", TDRString(nullptr, 4), "\"abcd\"", "0000000461626364", nullptr},
      {"FixedString", TDRString(nullptr, Fix(5)), "\"abc\"", "000000056162630000", "\"abc\\u0000\\u0000\""},
      {"Pict", GetPictTD(), "{\"bytes\":\"0001ff\"}", "000000030001ff", nullptr},
      {"Tag", Notation("T1"), "\"tag\"", "00000003746167", nullptr},
      {"UserDefinedTag", Notation("T5\"cls\""), "\"x\"", "0000000178", nullptr},
      {"Path", GetPathTD(), "{\"path\":[\"usr\",\"lib\"]}", "505448300000000c0000000203757372036c6962",
       "{\"path\":[\"usr\",\"lib\"],\"type\":\"absolute\"}"},
      {"RelativePath", GetPathTD(), "{\"path\":[\"a\"],\"type\":\"relative\"}", "5054483000000006000100010161", nullptr},
      {"UncPath", GetPathTD(), "{\"type\":\"unc\",\"path\":[\"srv\"]}", "50544830000000080003000103737276",
       "{\"path\":[\"srv\"],\"type\":\"unc\"}"},
      {"NotAPath", GetPathTD(), "{\"path\":[],\"type\":\"not a path\"}", "505448300000000400020000", nullptr},
      {"EmptyPath", GetPathTD(), "{\"path\":[],\"type\":\"absolute\"}", "505448300000000400000000", nullptr},
      {"Array", TDRArray(1, GetiW()), "[1,2]", "0000000200010002", nullptr},
      {"EmptyArray", TDRArray(1, GetiW()), "[]", "00000000", nullptr},
      {"ArrayAsDims", TDRArray(1, GetiW()), "{\"dims\":[1],\"elements\":[7]}", "000000010007", "[7]"},
      {"ArrayOfStrings", TDRArray(1, GetStringTD()), "[\"a\",\"\"]", "00000002000000016100000000", nullptr},
      {"ArrayOfPaths", TDRArray(1, GetPathTD()), "[{\"path\":[],\"type\":\"relative\"}]",
       "00000001505448300000000400010000", nullptr},
      {"Array2D", TDRArray(2, GetiB()), "{\"dims\":[2,3],\"elements\":[1,2,3,4,5,6]}", "0000000200000003010203040506",
       nullptr},
      {"Array2DEmpty", TDRArray(2, GetStringTD()), "{\"dims\":[0,3],\"elements\":[]}", "0000000000000003", nullptr},
      {"Array0D", TDRArray(0, GetiL()), "{\"dims\":[],\"elements\":[5]}", "00000005", nullptr},
      {"BoundedArray", ArrayOf(GetiW(), {3}), "[1,2]", "0000000200010002", nullptr},
      {"FixedArray", ArrayOf(GetiW(), {Fix(3)}), "[1,2,3]", "00000003000100020003", nullptr},
      {"FixedArrayOfBoundedStrings", ArrayOf(TDRString(nullptr, 2), {Fix(2)}), "[\"ab\",\"\"]",
       "00000002000000026162" "00000000", nullptr},
      {"Mixed2DBounds", ArrayOf(GetuB(), {Fix(2), 3}), "{\"dims\":[2,1],\"elements\":[9,8]}", "00000002000000010908",
       nullptr},
      {"Cluster", Cluster({GetiB(), GetiL()}), "[-2,16909060]", "fe01020304", nullptr},
      {"EmptyCluster", Cluster({}), "[]", "", nullptr},
      {"NamedCluster", Cluster({Named(GetiL(), "count"), Named(GetStringTD(), "label")}),
       "{\"label\":\"x\",\"count\":1}", "0000000100000001" "78", "{\"count\":1,\"label\":\"x\"}", true},
      {"NamedClusterInOrder", Cluster({Named(GetiL(), "count"), Named(GetStringTD(), "label")}), "[1,\"x\"]",
       "0000000100000001" "78", nullptr},
      {"DuplicateNames", Cluster({Named(GetiB(), "a"), Named(GetiB(), "a")}), "[1,2]", "0102", nullptr, true},
      {"PartlyNamed", Cluster({Named(GetiB(), "a"), GetiB()}), "[1,2]", "0102", nullptr, true},
      {"NestedNamed", Cluster({Named(Cluster({Named(GetfD(), "x")}), "point")}), "{\"point\":{\"x\":0.5}}",
       "3fe0000000000000", nullptr, true},
      {"Block", Block(3), "{\"bytes\":\"010203\"}", "010203", nullptr},
      {"AlignedBlock", AlignedBlock(2, 4), "{\"bytes\":\"abcd\"}", "abcd", nullptr},
      {"TypeBlock", TypeBlock(GetiL()), "{\"bytes\":\"00000009\"}", "00000009", nullptr},
      {"VoidBlock", VoidBlock(), "{\"bytes\":\"\"}", "", nullptr},
      {"RepeatedBlock", Repeated(GetiW(), 3), "[1,2,3]", "000100020003", nullptr},
      {"RepeatedStrings", Repeated(GetStringTD(), 2), "[\"a\",\"b\"]", "00000001610000000162", nullptr},
      {"AlignmentMarker", Cluster({GetiB(), Marker(GetfD())}), "[1,null]", "01", nullptr},
      {"Ptr", TDRPtr(), "null", "", nullptr},
      {"PtrTo", Notation("&iL"), "null", "", nullptr},
      {"CStr", TDRCStr(), "null", "", nullptr},
      {"PStr", TDRPStr(), "null", "", nullptr},
      {"ArrayDataPtr", Notation("@[1,iL]"), "null", "", nullptr},
  };
  for (const KindCase& c : kCases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(c.type);
    EXPECT_EQ(JsonViewRefusal(c.type), "");
    const std::string flat = EncodeText(c.type, c.json);
    EXPECT_EQ(flat, c.flat);
    EXPECT_EQ(Decode(c.type, flat, c.named), c.shown != nullptr ? c.shown : c.json);
  }
}

TEST_F(JsonViewTest, PointersAndOlderVersionsFollowTheFlattenedForm) {
  EXPECT_EQ(Encode(TDRPtr(), JsonValue(nullptr), 0x08602025), "00000000");
  EXPECT_EQ(Encode(GetBoolTD(), JsonValue(true), 0x04502003), "8000");
  EXPECT_EQ(Encode(TDRArray(1, GetBoolTD()), JsonValue::parse("[true,false,true]"), 0x04502003), "00000003a000");
}

TEST_F(JsonViewTest, IntegersKeepEverySixtyFourBits) {
  EXPECT_EQ(Encode(GetiQ(), JsonValue(int64_t{-1})), "ffffffffffffffff");
  EXPECT_EQ(Encode(GetiQ(), JsonValue(int64_t{9007199254740993})), "0020000000000001");
  EXPECT_EQ(Decode(GetiQ(), "0020000000000001"), "9007199254740993");
  EXPECT_EQ(Encode(GetuQ(), JsonValue(uint64_t{18446744073709551615u})), "ffffffffffffffff");
  // Integers built in code, not parsed, are signed whatever their sign.
  EXPECT_EQ(Encode(GetuB(), JsonValue(255)), "ff");
  EXPECT_EQ(Encode(GetuB(), JsonValue(256)), "error: 256 does not fit UInt8");
}

TEST_F(JsonViewTest, FloatsShowTheirShortestDigits) {
  const struct {
    float value;
    const char* shown;
  } kFloats[] = {{0.1f, "0.1"}, {1.0f / 3.0f, "0.33333334"}, {16777216.0f, "16777216.0"}, {1e-45f, "1e-45"}};
  for (const auto& c : kFloats) {
    uint8_t flat[4];
    uint32_t bits = 0;
    std::memcpy(&bits, &c.value, sizeof bits);
    for (int i = 0; i < 4; ++i) flat[i] = static_cast<uint8_t>(bits >> (24 - 8 * i));
    EXPECT_EQ(Decode(GetfS(), LowerHex(flat, 4)), c.shown);
  }
  // Every Float32 bit pattern that is a number comes back through its digits.
  std::mt19937 random(7);
  for (int i = 0; i < 20000; ++i) {
    const uint32_t bits = random();
    float value = 0;
    std::memcpy(&value, &bits, sizeof value);
    if (std::isnan(value)) continue;
    uint8_t flat[4];
    for (int k = 0; k < 4; ++k) flat[k] = static_cast<uint8_t>(bits >> (24 - 8 * k));
    const std::string hex = LowerHex(flat, 4);
    ASSERT_EQ(Encode(GetfS(), JsonValue::parse(Decode(GetfS(), hex))), hex) << i;
  }
}

TEST_F(JsonViewTest, ExtendedValuesReadBackExactly) {
  std::mt19937_64 random(11);
  for (int i = 0; i < 3000; ++i) {
    // A normal or denormal 80-bit pattern: the integer bit set exactly when the exponent is not 0.
    uint8_t ten[10];
    const uint64_t significand = random();
    const auto exponent = static_cast<uint16_t>(random() % 0x7FFF);
    const auto sign = static_cast<uint16_t>((random() & 1) << 15);
    const uint64_t mantissa = exponent != 0 ? (significand | (uint64_t{1} << 63)) : (significand >> 1);
    std::memcpy(ten, &mantissa, 8);
    const auto top = static_cast<uint16_t>(sign | exponent);
    std::memcpy(ten + 8, &top, 2);
    const long double value = ExtendedToLongDouble(ten);
    char text[64];
    std::snprintf(text, sizeof text, "%.21Lg", value);
    const std::string flat = Encode(GetfX(), JsonValue(text));
    ASSERT_EQ(flat.rfind("error", 0), std::string::npos) << text;
    const std::string shown = Decode(GetfX(), flat);
    ASSERT_EQ(Encode(GetfX(), JsonValue::parse(shown)), flat) << text << " shown as " << shown;
  }
}

TEST_F(JsonViewTest, FixedAndBoundedSizesAreKept) {
  // A fixed string pads, a bounded one keeps its length; neither takes more than its size.
  const TDR fixed = TDRString(nullptr, Fix(3));
  EXPECT_EQ(EncodeText(fixed, "\"\""), "00000003000000");
  EXPECT_EQ(EncodeText(fixed, "\"abcd\""), "error: 4 bytes do not fit String of fixed size 3");
  const TDR bounded = TDRString(nullptr, 2);
  EXPECT_EQ(EncodeText(bounded, "\"\""), "00000000");
  EXPECT_EQ(EncodeText(bounded, "\"abc\""), "error: 3 bytes do not fit String of at most 2");
  EXPECT_EQ(EncodeText(TDRString(nullptr, 0), "\"\""), "00000000");
  EXPECT_EQ(EncodeText(TDRString(nullptr, Fix(0)), "\"\""), "00000000");
  EXPECT_EQ(EncodeText(ArrayOf(GetiB(), {2}), "[1,2,3]"), "error: the array holds at most 2 elements, not 3");
  EXPECT_EQ(EncodeText(ArrayOf(GetiB(), {Fix(2)}), "[]"), "error: the array has fixed size 2, not 0");
  EXPECT_EQ(EncodeText(ArrayOf(GetiB(), {Fix(2), 2}), "{\"dims\":[2,3],\"elements\":[1,2,3,4,5,6]}"),
            "error: dimension 1 holds at most 2 elements, not 3");
  // Elements of a bounded array's block beyond the given ones stay as they were made.
  EXPECT_EQ(EncodeText(ArrayOf(TDRString(nullptr, Fix(1)), {3}), "[\"a\"]"), "000000010000000161");
}

struct RefusalCase {
  const char* name;
  TDR type;
  const char* json;
  const char* reason;
};

TEST_F(JsonViewTest, JsonThatDoesNotFitIsRefused) {
  const TDR record = Cluster({Named(GetiL(), "count"), Named(TDRArray(1, GetfD()), "samples")});
  const TDR pair = Cluster({GetiL(), GetStringTD()});
  const std::string longName = "{\"path\":[\"" + std::string(256, 'n') + "\"]}";
  const RefusalCase kCases[] = {
      {"IntegerFromString", GetiL(), "\"1\"", "expected an integer for Int32, got string"},
      {"IntegerFromFraction", GetiL(), "1.5", "1.5 is not an integer that fits Int32"},
      {"IntegerTooSmall", GetiB(), "-129", "-129 does not fit Int8"},
      {"UnsignedNegative", GetuL(), "-1", "-1 does not fit UInt32"},
      {"UnsignedTooLarge", GetuQ(), "18446744073709551616", "1.8446744073709552e+19 is not an integer that fits UInt64"},
      {"EnumTooLarge", TDWUInt8(TDWEnum() << "a", nullptr).CheckIn(), "256", "256 does not fit EnumUInt8"},
      {"FloatFromBoolean", GetfD(), "true", "expected a number, \"NaN\", \"Infinity\" or \"-Infinity\" for Float64, got boolean"},
      {"FloatSpelledOtherwise", GetfD(), "\"nan\"", "expected a number, \"NaN\", \"Infinity\" or \"-Infinity\" for Float64, got string"},
      {"Float32Overflow", GetfS(), "1e39", "1e+39 is beyond the range of Float32"},
      {"ExtendedNotDecimal", GetfX(), "\"1.5x\"", "\"1.5x\" is not a decimal number for FloatExt"},
      {"ExtendedEmpty", GetfX(), "\"\"", "\"\" is not a decimal number for FloatExt"},
      {"ExtendedBlank", GetfX(), "\" 1\"", "\" 1\" is not a decimal number for FloatExt"},
      {"ExtendedOverflow", GetfX(), "\"1e5000\"", "\"1e5000\" is beyond the range of FloatExt"},
      {"ComplexOnePart", GetcD(), "[1]", "expected [re, im] for Complex128, got array"},
      {"ComplexBadPart", GetcS(), "[1,\"x\"]", "at /1: expected a number, \"NaN\", \"Infinity\" or \"-Infinity\" for Complex64, got string"},
      {"BooleanFromNumber", GetBoolTD(), "1", "expected true or false for Boolean, got number"},
      {"StringFromNumber", GetStringTD(), "5", "expected a string or {\"bytes\": hex} for String, got number"},
      {"StringBadHex", GetStringTD(), "{\"bytes\":\"abc\"}", "\"bytes\": an odd number of hex digits"},
      {"StringHexNotText", GetStringTD(), "{\"bytes\":7}", "\"bytes\" must be a string of hex digits"},
      {"StringWithOtherKeys", GetStringTD(), "{\"bytes\":\"00\",\"more\":1}", "expected a string or {\"bytes\": hex} for String, got object"},
      {"PathFromString", GetPathTD(), "\"/usr\"", "expected {\"path\": [name, ...], \"type\": ...} for Path, got string"},
      {"PathBadName", GetPathTD(), "{\"path\":[\"ok\",\"a/b\"]}", "at /path/1: not a path name: names are 1 to 255 bytes, without NUL, '/' or '\\'"},
      {"PathEmptyName", GetPathTD(), "{\"path\":[\"\"]}", "at /path/0: not a path name: names are 1 to 255 bytes, without NUL, '/' or '\\'"},
      {"PathLongName", GetPathTD(), longName.c_str(), "at /path/0: a path name is at most 255 bytes"},
      {"PathBadType", GetPathTD(), "{\"path\":[],\"type\":\"home\"}", "a path's \"type\" is one of \"absolute\", \"relative\", \"unc\" or \"not a path\""},
      {"PathExtraMember", GetPathTD(), "{\"path\":[],\"volume\":\"c\"}", "a path has no member \"volume\""},
      {"NotAPathWithNames", GetPathTD(), "{\"path\":[\"a\"],\"type\":\"not a path\"}", "\"not a path\" has no names"},
      {"ArrayFromObject", TDRArray(1, GetiL()), "{\"a\":1}", "expected an array or {\"dims\": [...], \"elements\": [...]} for Array, got object"},
      {"Array2DFromArray", TDRArray(2, GetiL()), "[1,2]", "expected {\"dims\": [...], \"elements\": [...]} for Array, got array"},
      {"ArrayWrongDimCount", TDRArray(2, GetiL()), "{\"dims\":[1],\"elements\":[1]}", "\"dims\" must list 2 size(s)"},
      {"ArrayNegativeDim", TDRArray(1, GetiL()), "{\"dims\":[-1],\"elements\":[]}", "\"dims\" must hold sizes from 0 to 2147483647"},
      {"ArrayHugeDims", TDRArray(2, GetiL()), "{\"dims\":[2147483647,2147483647],\"elements\":[]}", "\"dims\" call for more than 2^32 element(s), \"elements\" holds 0"},
      {"ArrayElementsMismatch", TDRArray(2, GetiL()), "{\"dims\":[2,2],\"elements\":[1,2,3]}", "\"dims\" call for 4 element(s), \"elements\" holds 3"},
      {"ArrayBadElement", TDRArray(1, GetiL()), "[1,2,\"3\"]", "at /2: expected an integer for Int32, got string"},
      {"ArrayBadShapedElement", TDRArray(2, GetiB()), "{\"dims\":[1,1],\"elements\":[300]}", "at /elements/0: 300 does not fit Int8"},
      {"ClusterTooShort", pair, "[1]", "the cluster has 2 element(s), the array 1"},
      {"ClusterFromString", pair, "\"x\"", "expected an array or an object for Cluster, got string"},
      {"ClusterObjectWithoutNames", pair, "{}", "the cluster's elements lack distinct names: give them as an array"},
      {"ClusterUnknownName", record, "{\"count\":1,\"sample\":[]}", "the cluster has no element named \"sample\""},
      {"ClusterMissingName", record, "{\"count\":1}", "element \"samples\" is missing"},
      {"ClusterDeepFault", record, "{\"count\":1,\"samples\":[1,null]}", "at /samples/1: expected a number, \"NaN\", \"Infinity\" or \"-Infinity\" for Float64, got null"},
      {"PointerFromNumber", Cluster({Named(TDRPtr(), "a/b~c")}), "{\"a/b~c\":0}", "at /a~1b~0c: expected null for Ptr, got number"},
      {"BlockWrongSize", Block(2), "{\"bytes\":\"00\"}", "Block holds 2 bytes, not 1"},
      {"BlockFromString", Block(2), "\"00\"", "expected {\"bytes\": hex} for Block, got string"},
      {"RepeatedWrongCount", Repeated(GetiB(), 2), "[1]", "the block repeats 2 time(s), not 1"},
      {"VoidFromNumber", GetVoidTD(), "0", "expected null for Void, got number"},
  };
  for (const RefusalCase& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(EncodeText(c.type, c.json), std::string("error: ") + c.reason);
  }
}

TEST_F(JsonViewTest, KindsWithoutAViewAreNamed) {
  EXPECT_EQ(JsonViewRefusal(TDR()), "the null type has no values");
  EXPECT_EQ(JsonViewRefusal(TDRBooleanU16()), "BooleanU16 values have no JSON view");
  EXPECT_EQ(JsonViewRefusal(GetSubStringTD()), "SubString values have no JSON view");
  EXPECT_EQ(JsonViewRefusal(Notation("{iL,[1,{S,<1,iL>}]}")), "SubArray values have no JSON view");
  EXPECT_EQ(JsonViewRefusal(Repeated(TDRBooleanU16(), 2)), "BooleanU16 values have no JSON view");
  vellum::Value datum{TDRBooleanU16()};
  EXPECT_THROW(JsonToData(TDRBooleanU16(), JsonValue(true), datum.Data()), JsonViewError);
  EXPECT_THROW(DataToJson(TDRBooleanU16(), datum.Data(), false), JsonViewError);
}

TEST_F(JsonViewTest, DefaultDataIsMeasuredBeforeItIsMade) {
  EXPECT_EQ(DefaultDataBytes(GetiL()), 4u);
  EXPECT_EQ(DefaultDataBytes(GetStringTD()), 8u);
  // Preallocated blocks count, with the blocks inside them.
  const TDR strings = ArrayOf(TDRString(nullptr, 100), {Fix(1000)});
  EXPECT_GE(DefaultDataBytes(strings), 1000u * (8 + 104));
  EXPECT_LT(DefaultDataBytes(strings), 1000u * (8 + 200));
  EXPECT_GE(DefaultDataBytes(Repeated(strings, 1000)), uint64_t{1000} * 1000 * 104);
  EXPECT_GE(DefaultDataBytes(ArrayOf(GetiQ(), {Fix(0x7FFFFFFE)})), uint64_t{8} * 0x7FFFFFFE);
}

TEST_F(JsonViewTest, AValueRefusedHalfWayLeaksNothing) {
  const TDR type = Cluster({TDRArray(1, GetStringTD()), TDRArray(1, GetPathTD()), GetiB()});
  LiveBlockCheck blocks;
  {
    vellum::Value datum(type);
    const JsonValue value = JsonValue::parse(
        "[[\"a\",\"b\",\"c\"],[{\"path\":[\"x\"]},{\"path\":[\"y\"]}],1000]");
    EXPECT_THROW(JsonToData(type, value, datum.Data()), JsonViewError);
  }
}

// Random types of the kinds with a view, and random JSON values for them.
class RandomValues {
 public:
  explicit RandomValues(uint32_t seed) : random_(seed) {}

  TDR Type(int depth) {
    const int pick = Pick(depth > 2 ? 14 : 19);
    switch (pick) {
      case 0: return GetiB();
      case 1: return GetiQ();
      case 2: return GetuQ();
      case 3: return GetuW();
      case 4: return GetfS();
      case 5: return GetfD();
      case 6: return GetfX();
      case 7: return GetcD();
      case 8: return GetBoolTD();
      case 9: return GetStringTD();
      case 10: return TDRString(nullptr, Pick(2) == 0 ? Pick(5) : Fix(Pick(5)));
      case 11: return GetPathTD();
      case 12: return Block(Pick(4));
      case 13: return TDRPtr();
      case 14: return TDRArray(1, Element(depth + 1));
      case 15: return TDRArray(2, Element(depth + 1));
      // A bound or fixed size of 0 is left out: the library reads no data into such an array.
      case 16: return ArrayOf(Element(depth + 1), {Pick(2) == 0 ? 1 + Pick(3) : Fix(1 + Pick(2))});
      case 17: return Repeated(Type(depth + 1), static_cast<uint32_t>(Pick(3)));
      default: {
        TDWCluster cluster;
        const int n = Pick(4);
        for (int i = 0; i < n; ++i) {
          TDW element = Type(depth + 1).CheckOut();
          if (Pick(3) != 0) {
            EXPECT_EQ(element.SetName("e" + std::to_string(Pick(5))), 0);
          }
          EXPECT_EQ(cluster.AppendEltTD(element), 0);
        }
        return cluster.CheckIn();
      }
    }
  }

  JsonValue Value(const TDR& type) {
    switch (StripTypeCodeModifier(type.GetTypeCode())) {
      case static_cast<int>(TypeCode::Int8): return JsonValue(static_cast<int64_t>(static_cast<int8_t>(random_())));
      case static_cast<int>(TypeCode::Int64): return JsonValue(static_cast<int64_t>(Wide()));
      case static_cast<int>(TypeCode::UInt64): return JsonValue(Wide());
      case static_cast<int>(TypeCode::UInt16): return JsonValue(static_cast<uint64_t>(random_() & 0xFFFF));
      case static_cast<int>(TypeCode::Float32): {
        float value = 0;
        const uint32_t bits = random_();
        std::memcpy(&value, &bits, sizeof value);
        return std::isnan(value) ? JsonValue("NaN") : std::isinf(value) ? JsonValue(value > 0 ? "Infinity" : "-Infinity")
                                                                         : JsonValue(static_cast<double>(value));
      }
      case static_cast<int>(TypeCode::Float64): return Double();
      case static_cast<int>(TypeCode::Complex128): return JsonValue::array({Double(), Double()});
      case static_cast<int>(TypeCode::FloatExt): {
        char text[64];
        std::snprintf(text, sizeof text, "%.21Lg",
                      std::ldexp(static_cast<long double>(Wide()), Pick(2000) - 1000) * (Pick(2) == 0 ? 1 : -1));
        return JsonValue(text);
      }
      case static_cast<int>(TypeCode::Boolean): return JsonValue(Pick(2) == 0);
      case static_cast<int>(TypeCode::String): {
        const int32_t bound = vellum::As<TDRStringBase>(type).GetBound();
        return Text(bound == kVar ? Pick(6) : Pick(vellum::bound::Length(bound) + 1));
      }
      case static_cast<int>(TypeCode::Path): {
        static const char* const kTypes[] = {"absolute", "relative", "unc", "not a path"};
        const int kind = Pick(4);
        JsonValue names = JsonValue::array();
        for (int i = kind == 3 ? 3 : Pick(3); i < 3; ++i) names.push_back(Pick(2) == 0 ? "Data" : "\xC3\xA9t\xC3\xA9");
        return JsonValue{{"path", names}, {"type", kTypes[kind]}};
      }
      case static_cast<int>(TypeCode::Block): {
        std::vector<uint8_t> bytes(static_cast<size_t>(type.DataSize()));
        for (uint8_t& b : bytes) b = static_cast<uint8_t>(random_());
        return JsonValue{{"bytes", LowerHex(bytes.data(), bytes.size())}};
      }
      case static_cast<int>(TypeCode::Ptr): return JsonValue(nullptr);
      case static_cast<int>(TypeCode::Array): {
        const TDRArray array = vellum::As<TDRArray>(type);
        std::vector<int32_t> dims;
        int32_t count = 1;
        for (int32_t d = 0; d < array.GetNumDims(); ++d) {
          const int32_t word = array.GetDimSize(d);
          dims.push_back(word == kVar ? Pick(3) : vellum::bound::IsFixed(word) ? vellum::bound::Length(word) : Pick(word + 1));
          count *= dims.back();
        }
        JsonValue elements = JsonValue::array();
        for (int32_t i = 0; i < count; ++i) elements.push_back(Value(array.GetEltTD()));
        if (dims.size() == 1 && Pick(2) == 0) return elements;
        return JsonValue{{"dims", dims}, {"elements", elements}};
      }
      case static_cast<int>(TypeCode::RepeatedBlock): {
        const TDRRepeatedBlock repeated = vellum::As<TDRRepeatedBlock>(type);
        JsonValue elements = JsonValue::array();
        for (uint32_t i = 0; i < repeated.GetNumBlocks(); ++i) elements.push_back(Value(repeated.GetEltTD()));
        return elements;
      }
      case static_cast<int>(TypeCode::Cluster): {
        const TDRCluster cluster = vellum::As<TDRCluster>(type);
        JsonValue elements = JsonValue::array();
        for (int32_t i = 0; i < cluster.GetNumElts(); ++i) elements.push_back(Value(cluster.GetEltTD(i)));
        return elements;
      }
      default: {
        ADD_FAILURE() << "no value for " << TypeToInterpretedString(type);
        return JsonValue();
      }
    }
  }

  int32_t Pick(int32_t n) { return static_cast<int32_t>(random_() % static_cast<uint32_t>(n)); }

 private:
  // An array's element: anything but another array, which arrays cannot hold.
  TDR Element(int depth) {
    for (;;) {
      TDR type = Type(depth);
      if (type.GetTypeCode() != static_cast<int16_t>(TypeCode::Array)) return type;
    }
  }

  uint64_t Wide() { return uint64_t{random_()} << 32 | random_(); }

  JsonValue Double() {
    const uint64_t bits = Wide();
    double value = 0;
    std::memcpy(&value, &bits, sizeof value);
    if (std::isnan(value)) return JsonValue("NaN");
    if (std::isinf(value)) return JsonValue(value > 0 ? "Infinity" : "-Infinity");
    return JsonValue(value);
  }

  // Text of `n` bytes: UTF-8 letters, or any bytes written as hex.
  JsonValue Text(int32_t n) {
    std::string bytes;
    const bool raw = Pick(3) == 0;
    while (static_cast<int32_t>(bytes.size()) < n) {
      if (raw) {
        bytes += static_cast<char>(random_());
      } else if (n - static_cast<int32_t>(bytes.size()) >= 2 && Pick(4) == 0) {
        bytes += "\xC3\xA9";
      } else {
        bytes += static_cast<char>('a' + Pick(26));
      }
    }
    if (!raw) return JsonValue(bytes);
    return JsonValue{{"bytes", LowerHex(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size())}};
  }

  std::mt19937 random_;
};

// The value read from JSON flattens; the data read back shows as the same JSON; that JSON read
// again flattens to the same bytes.
TEST_F(JsonViewTest, RandomTypesAndValuesRoundTrip) {
  const uint32_t seed = std::random_device{}();
  std::printf("JsonViewTest seed %u\n", seed);
  RandomValues random(seed);
  for (int round = 0; round < 400; ++round) {
    const TDR type = random.Type(0);
    ASSERT_TRUE(type);
    const JsonValue value = random.Value(type);
    const bool named = random.Pick(2) == 0;
    SCOPED_TRACE("seed " + std::to_string(seed) + ", round " + std::to_string(round) + ": " +
                 TypeToInterpretedString(type) + " " + value.dump());
    vellum::Value first(type);
    ASSERT_NO_THROW(JsonToData(type, value, first.Data()));
    const JsonValue shown = DataToJson(type, first.Data(), named);
    OutputBuf out;
    KoDataWriter writer(&out, PXApp::Instance().GetVersion(), nullptr, 0);
    ASSERT_EQ(writer.WriteData(type, first.Data(), 1), kStatusNoError);
    const std::string flat = LowerHex(out.Data(), out.GetBytesWritten());
    ASSERT_EQ(Decode(type, flat, named), shown.dump());
    ASSERT_EQ(Encode(type, shown), flat);
  }
}

}  // namespace
