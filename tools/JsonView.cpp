// The JSON view of typed values: how the vellum tool shows a datum of any type and reads one
// back. It lives with the tool, not the library: JSON is a way of showing data, not a stored form.
#include "JsonView.h"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <set>
#include <string_view>
#include <utility>

#include "runtime/DSMemory.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXNumbers.h"
#include "runtime/PXPath.h"
#include "runtime/PXStrings.h"
#include "HexText.h"
#include "vellum.h"

JsonViewError::JsonViewError(const std::string& reason) : std::runtime_error(reason), reason_(reason), text_(reason) {}

void JsonViewError::Within(const std::string& step) {
  std::string escaped;
  for (const char c : step) {
    if (c == '~') {
      escaped += "~0";
    } else if (c == '/') {
      escaped += "~1";
    } else {
      escaped += c;
    }
  }
  where_ = "/" + escaped + where_;
  text_ = "at " + where_ + ": " + reason_;
}

namespace {

// Data is caller memory of no particular alignment: values are copied in and out.
template <class T>
T Load(const void* data) {
  T value;
  std::memcpy(&value, data, sizeof value);
  return value;
}

template <class T>
void Store(void* data, T value) {
  std::memcpy(data, &value, sizeof value);
}

const uint8_t* Bytes(const void* data) { return static_cast<const uint8_t*>(data); }
uint8_t* Bytes(void* data) { return static_cast<uint8_t*>(data); }

// The kind of a descriptor, with an enumeration's or units' mark taken off; null for a code no
// kind has.
const TypeCodeInfo* KindOf(const TD& type) { return FindTypeCode(StripTypeCodeModifier(type.GetTypeCode())); }

// The name of the descriptor's own kind, for messages.
std::string KindName(const TD& type) {
  const TypeCodeInfo* info = FindTypeCode(type.GetTypeCode());
  return info != nullptr ? std::string(info->name) : "type code " + std::to_string(type.GetTypeCode());
}

std::string NoView(const TD& type) { return KindName(type) + " values have no JSON view"; }

// "expected ... for <kind>, got <json type>".
[[noreturn]] void Expected(const std::string& what, const TD& type, const JsonValue& value) {
  throw JsonViewError("expected " + what + " for " + KindName(type) + ", got " + std::string(value.type_name()));
}

[[noreturn]] void OutOfMemory() { throw JsonViewError("memory ran out (status 2)"); }

// Runs `convert` for one part of a value, placing any failure at `step`.
template <class Convert>
void Inside(const std::string& step, Convert&& convert) {
  try {
    convert();
  } catch (JsonViewError& e) {
    e.Within(step);
    throw;
  }
}

// --- UTF-8 and bytes ---------------------------------------------------------------------------

// Well-formed UTF-8: no overlong forms, no surrogates, nothing above U+10FFFF.
bool IsUtf8(std::string_view text) {
  size_t i = 0;
  while (i < text.size()) {
    const auto lead = static_cast<uint8_t>(text[i]);
    if (lead < 0x80) {
      ++i;
      continue;
    }
    size_t extra = 0;
    uint32_t low = 0x80;  // bounds of the first continuation byte
    uint32_t high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
      extra = 1;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
      extra = 2;
      if (lead == 0xE0) low = 0xA0;
      if (lead == 0xED) high = 0x9F;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
      extra = 3;
      if (lead == 0xF0) low = 0x90;
      if (lead == 0xF4) high = 0x8F;
    } else {
      return false;
    }
    if (text.size() - i <= extra) return false;
    for (size_t k = 1; k <= extra; ++k) {
      const auto c = static_cast<uint8_t>(text[i + k]);
      if (k == 1 ? (c < low || c > high) : (c < 0x80 || c > 0xBF)) return false;
    }
    i += extra + 1;
  }
  return true;
}

JsonValue BytesToJson(std::string_view bytes) {
  if (IsUtf8(bytes)) return JsonValue(std::string(bytes));
  JsonValue object = JsonValue::object();
  object["bytes"] = LowerHex(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size());
  return object;
}

// The bytes of {"bytes": "<hex>"}, or nothing when `value` is not of that form.
bool HexObjectBytes(const JsonValue& value, std::string* bytes) {
  if (!value.is_object() || value.size() != 1 || !value.contains("bytes")) return false;
  const JsonValue& hex = value["bytes"];
  if (!hex.is_string()) throw JsonViewError("\"bytes\" must be a string of hex digits");
  std::vector<uint8_t> parsed;
  if (const std::string problem = ParseHex(hex.get_ref<const std::string&>(), &parsed); !problem.empty())
    throw JsonViewError("\"bytes\": " + problem);
  bytes->assign(parsed.begin(), parsed.end());
  return true;
}

// The bytes of a string-like value: a JSON string or {"bytes": "<hex>"}.
std::string JsonToBytes(const TD& type, const JsonValue& value) {
  if (value.is_string()) return value.get<std::string>();
  std::string bytes;
  if (HexObjectBytes(value, &bytes)) return bytes;
  Expected("a string or {\"bytes\": hex}", type, value);
}

// --- numbers -----------------------------------------------------------------------------------

template <class T>
JsonValue IntegerToJson(const void* data) {
  const T value = Load<T>(data);
  if constexpr (std::numeric_limits<T>::is_signed) {
    return JsonValue(static_cast<int64_t>(value));
  } else {
    return JsonValue(static_cast<uint64_t>(value));
  }
}

template <class T>
void JsonToInteger(const TD& type, const JsonValue& value, void* data) {
  constexpr auto kMin = static_cast<int64_t>(std::numeric_limits<T>::min());
  constexpr auto kMax = static_cast<uint64_t>(std::numeric_limits<T>::max());
  // nlohmann keeps a non-negative integer as unsigned and a negative one as signed.
  if (value.is_number_unsigned()) {
    const auto n = value.get<uint64_t>();
    if (n > kMax) throw JsonViewError(std::to_string(n) + " does not fit " + KindName(type));
    Store(data, static_cast<T>(n));
  } else if (value.is_number_integer()) {
    const auto n = value.get<int64_t>();
    if (n < kMin || (n > 0 && static_cast<uint64_t>(n) > kMax)) throw JsonViewError(std::to_string(n) + " does not fit " + KindName(type));
    Store(data, static_cast<T>(n));
  } else if (value.is_number()) {
    throw JsonViewError(value.dump() + " is not an integer that fits " + KindName(type));
  } else {
    Expected("an integer", type, value);
  }
}

// The names of the values a JSON number cannot hold.
JsonValue SpecialToJson(bool nan, bool negative) {
  if (nan) return JsonValue("NaN");
  return JsonValue(negative ? "-Infinity" : "Infinity");
}

// A special value's name read back; false when `text` is none of them.
template <class Float>
bool SpecialFromText(std::string_view text, Float* value) {
  if (text == "NaN") {
    *value = std::numeric_limits<Float>::quiet_NaN();
  } else if (text == "Infinity") {
    *value = std::numeric_limits<Float>::infinity();
  } else if (text == "-Infinity") {
    *value = -std::numeric_limits<Float>::infinity();
  } else {
    return false;
  }
  return true;
}

JsonValue DoubleToJson(double value) {
  if (!std::isfinite(value)) return SpecialToJson(std::isnan(value), std::signbit(value));
  return JsonValue(value);
}

// The JSON number holds a double; the float's own shortest digits go into it, which prints them
// back unchanged, unless reading them as a double would round to another float.
JsonValue FloatToJson(float value) {
  if (!std::isfinite(value)) return SpecialToJson(std::isnan(value), std::signbit(value));
  char digits[64];
  const std::to_chars_result written = std::to_chars(digits, digits + sizeof digits - 1, value);
  *written.ptr = '\0';
  const double shortest = std::strtod(digits, nullptr);
  return JsonValue(static_cast<float>(shortest) == value ? shortest : static_cast<double>(value));
}

double JsonToDouble(const TD& type, const JsonValue& value) {
  if (value.is_number()) return value.get<double>();
  double special = 0;
  if (value.is_string() && SpecialFromText(value.get_ref<const std::string&>(), &special)) return special;
  Expected("a number, \"NaN\", \"Infinity\" or \"-Infinity\"", type, value);
}

float JsonToFloat(const TD& type, const JsonValue& value) {
  const double wide = JsonToDouble(type, value);
  const auto narrow = static_cast<float>(wide);
  if (std::isfinite(wide) && !std::isfinite(narrow))
    throw JsonViewError(value.dump() + " is beyond the range of " + KindName(type));
  return narrow;
}

// The fewest significant digits that read back to the same value; 21 always do, as they tell
// every 64-bit significand apart.
JsonValue ExtendedToJson(const void* data) {
  const long double value = ExtendedToLongDouble(Bytes(data));
  if (!std::isfinite(value)) return SpecialToJson(std::isnan(value), std::signbit(value));
  char text[64];
  for (int digits = 1; digits <= 21; ++digits) {
    std::snprintf(text, sizeof text, "%.*Lg", digits, value);
    if (std::strtold(text, nullptr) == value) break;
  }
  return JsonValue(text);
}

void JsonToExtended(const TD& type, const JsonValue& value, void* data) {
  long double result = 0;
  if (value.is_number_unsigned()) {
    result = static_cast<long double>(value.get<uint64_t>());
  } else if (value.is_number_integer()) {
    result = static_cast<long double>(value.get<int64_t>());
  } else if (value.is_number()) {
    result = static_cast<long double>(value.get<double>());
  } else if (value.is_string()) {
    const std::string& text = value.get_ref<const std::string&>();
    if (!SpecialFromText(text, &result)) {
      const bool blank = text.empty() || std::isspace(static_cast<unsigned char>(text[0])) != 0;
      char* end = nullptr;
      errno = 0;
      result = blank ? 0 : std::strtold(text.c_str(), &end);
      if (blank || end != text.c_str() + text.size())
        throw JsonViewError("\"" + text + "\" is not a decimal number for " + KindName(type));
      // A value too small only loses digits; one too large would silently become infinite.
      if (errno == ERANGE && std::isinf(result))
        throw JsonViewError("\"" + text + "\" is beyond the range of " + KindName(type));
    }
  } else {
    Expected("a decimal string, a number, \"NaN\", \"Infinity\" or \"-Infinity\"", type, value);
  }
  LongDoubleToExtended(result, Bytes(data));
}

// The two parts of a complex value at `data`, each `partSize` bytes.
template <class ShowPart>
JsonValue ComplexToJson(const void* data, size_t partSize, ShowPart&& show) {
  JsonValue pair = JsonValue::array();
  pair.push_back(show(Bytes(data)));
  pair.push_back(show(Bytes(data) + partSize));
  return pair;
}

template <class ReadPart>
void JsonToComplex(const TD& type, const JsonValue& value, void* data, size_t partSize, ReadPart&& read) {
  if (!value.is_array() || value.size() != 2) Expected("[re, im]", type, value);
  Inside("0", [&] { read(value[0], Bytes(data)); });
  Inside("1", [&] { read(value[1], Bytes(data) + partSize); });
}

// One Float part of `bytes` bytes (4, 8 or the 10-byte extended form).
JsonValue FloatPartToJson(uint8_t bytes, const void* data) {
  if (bytes == sizeof(float)) return FloatToJson(Load<float>(data));
  if (bytes == sizeof(double)) return DoubleToJson(Load<double>(data));
  return ExtendedToJson(data);
}

void JsonToFloatPart(const TD& type, uint8_t bytes, const JsonValue& value, void* data) {
  if (bytes == sizeof(float)) return Store(data, JsonToFloat(type, value));
  if (bytes == sizeof(double)) return Store(data, JsonToDouble(type, value));
  JsonToExtended(type, value, data);
}

// Calls `visit` with a zero of the C integer type of `form` and `bytes` (1, 2, 4 or 8).
template <class Visit>
decltype(auto) WithIntegerType(ValueForm form, uint8_t bytes, Visit&& visit) {
  const bool isSigned = form == ValueForm::SignedInteger;
  switch (bytes) {
    case 1: return isSigned ? visit(int8_t{}) : visit(uint8_t{});
    case 2: return isSigned ? visit(int16_t{}) : visit(uint16_t{});
    case 4: return isSigned ? visit(int32_t{}) : visit(uint32_t{});
    default: return isSigned ? visit(int64_t{}) : visit(uint64_t{});
  }
}

// --- strings and paths -------------------------------------------------------------------------

int32_t StringBound(const TD& type) {
  const TDRStringBase string = vellum::As<TDRStringBase>(type);
  return string ? string.GetBound() : vellum::bound::kVariable;
}

JsonValue StringToJson(const void* data) {
  const auto h = Load<LStrHandle>(data);
  if (h == nullptr || *h == nullptr) return JsonValue("");
  const size_t held = DSGetHandleSize(reinterpret_cast<UHandle>(h));
  const size_t room = held > sizeof(int32_t) ? held - sizeof(int32_t) : 0;
  const size_t length = std::min(static_cast<size_t>(std::max((*h)->cnt, 0)), room);
  return BytesToJson(std::string_view(reinterpret_cast<const char*>((*h)->str), length));
}

// A variable string takes any length; a bounded one at most its bound, kept in its block of
// bound + 4 bytes; a fixed one its length exactly, shorter bytes padded with zeros.
void JsonToString(const TD& type, const JsonValue& value, void* data) {
  const std::string bytes = JsonToBytes(type, value);
  const int32_t bound = StringBound(type);
  auto h = Load<LStrHandle>(data);
  if (vellum::bound::IsVariable(bound)) {
    const int32_t status = StringUtils::ToLStr(bytes, &h);
    if (status == kStatusOutOfMemory) OutOfMemory();
    if (status != kStatusNoError) throw JsonViewError(std::to_string(bytes.size()) + " bytes are too long a string");
    Store(data, h);
    return;
  }
  const int32_t limit = vellum::bound::Length(bound);
  if (bytes.size() > static_cast<size_t>(limit)) {
    throw JsonViewError(std::to_string(bytes.size()) + " bytes do not fit " + KindName(type) + " of " +
                        (vellum::bound::IsFixed(bound) ? "fixed size " : "at most ") + std::to_string(limit));
  }
  const size_t need = sizeof(int32_t) + static_cast<size_t>(limit);
  // No block stands for the empty string, as default data of a bound (or fixed size) of 0 has it.
  if (bytes.empty() && h == nullptr && (limit == 0 || !vellum::bound::IsFixed(bound))) return;
  auto block = reinterpret_cast<UHandle>(h);
  if (block == nullptr || DSGetHandleSize(block) != need) {
    if (DSSetHandleSizeOrNewHandle(&block, need) != kStatusNoError) OutOfMemory();
    h = reinterpret_cast<LStrHandle>(block);
    Store(data, h);
  }
  std::memset((*h)->str, 0, static_cast<size_t>(limit));
  std::memcpy((*h)->str, bytes.data(), bytes.size());
  (*h)->cnt = vellum::bound::IsFixed(bound) ? limit : static_cast<int32_t>(bytes.size());
}

constexpr const char* kPathTypeNames[] = {"absolute", "relative", "not a path", "unc"};
static_assert(kAbsPath == 0 && kRelPath == 1 && kNotAPath == 2 && kUNCPath == 3);

JsonValue PathToJson(const void* data) {
  const auto path = Load<Path>(data);
  int32_t pathType = kNotAPath;
  JsonValue names = JsonValue::array();
  if (path != nullptr && FGetPathType(path, &pathType) == kStatusNoError) {
    for (const PathRef::Name& name : path->names) names.push_back(BytesToJson(std::string_view(name)));
  }
  if (pathType < 0 || pathType > kUNCPath) pathType = kNotAPath;
  JsonValue object = JsonValue::object();
  object["path"] = std::move(names);
  object["type"] = kPathTypeNames[pathType];
  return object;
}

// A path owned here until it is stored.
class PathOwner {
 public:
  PathOwner() = default;
  ~PathOwner() { FDestroyPath(&path_); }
  PathOwner(const PathOwner&) = delete;
  PathOwner& operator=(const PathOwner&) = delete;
  Path* Out() { return &path_; }
  Path Get() const { return path_; }
  Path Release() { return std::exchange(path_, nullptr); }

 private:
  Path path_ = nullptr;
};

void JsonToPath(const TD& type, const JsonValue& value, void* data) {
  if (!value.is_object() || !value.contains("path")) Expected("{\"path\": [name, ...], \"type\": ...}", type, value);
  int32_t pathType = kAbsPath;
  for (const auto& [key, member] : value.items()) {
    if (key == "path") continue;
    if (key != "type") throw JsonViewError("a path has no member \"" + key + "\"");
    bool known = false;
    for (int32_t t = 0; t <= kUNCPath && member.is_string(); ++t) {
      if (member.get_ref<const std::string&>() == kPathTypeNames[t]) {
        pathType = t;
        known = true;
      }
    }
    if (!known)
      throw JsonViewError("a path's \"type\" is one of \"absolute\", \"relative\", \"unc\" or \"not a path\"");
  }
  const JsonValue& names = value["path"];
  if (!names.is_array()) throw JsonViewError("a path's \"path\" must be an array of names");
  PathOwner fresh;
  if (pathType == kNotAPath) {
    if (!names.empty()) throw JsonViewError("\"not a path\" has no names");
    if (FNotAPath(fresh.Out()) != kStatusNoError) OutOfMemory();
  } else {
    if (FEmptyPath(fresh.Out()) != kStatusNoError) OutOfMemory();
    if (const int32_t status = FSetPathType(fresh.Get(), pathType); status != kStatusNoError)
      throw JsonViewError("cannot make the path (status " + std::to_string(status) + ")");
    for (size_t i = 0; i < names.size(); ++i) {
      Inside("path", [&] {
        Inside(std::to_string(i), [&] {
          const std::string name = JsonToBytes(type, names[i]);
          if (name.size() > 255) throw JsonViewError("a path name is at most 255 bytes");
          uint8_t pstr[256];
          pstr[0] = static_cast<uint8_t>(name.size());
          std::memcpy(pstr + 1, name.data(), name.size());
          const int32_t status = FAppendName(fresh.Get(), pstr);
          if (status == kStatusOutOfMemory) OutOfMemory();
          if (status != kStatusNoError)
            throw JsonViewError("not a path name: names are 1 to 255 bytes, without NUL, '/' or '\\'");
        });
      });
    }
  }
  auto old = Load<Path>(data);
  FDestroyPath(&old);
  Store(data, fresh.Release());
}

// --- containers --------------------------------------------------------------------------------

JsonValue HexObject(const void* data, size_t size) {
  JsonValue object = JsonValue::object();
  object["bytes"] = LowerHex(Bytes(data), size);
  return object;
}

void JsonToBlock(const TD& type, const JsonValue& value, void* data) {
  std::string bytes;
  if (!HexObjectBytes(value, &bytes)) Expected("{\"bytes\": hex}", type, value);
  const auto size = static_cast<size_t>(std::max(type.DataSize(), 0));
  if (bytes.size() != size)
    throw JsonViewError(KindName(type) + " holds " + std::to_string(size) + " bytes, not " + std::to_string(bytes.size()));
  std::memcpy(data, bytes.data(), size);
}

// The elements of the array at `data`: their count, where the first lies (null when none) and the
// dimension sizes.
struct ArrayContents {
  std::vector<int32_t> dims;
  int64_t count = 0;
  uint8_t* first = nullptr;
};

ArrayContents ContentsOf(const TDRArray& array, const void* data) {
  ArrayContents contents;
  const int32_t nDims = array.GetNumDims();
  contents.dims.assign(static_cast<size_t>(std::max(nDims, 0)), 0);
  const auto h = Load<UHandle>(data);
  if (h == nullptr) return contents;
  const size_t blockSize = DSGetHandleSize(h);
  if (blockSize < contents.dims.size() * sizeof(int32_t)) throw JsonViewError("the array's block is damaged");
  if (!contents.dims.empty()) std::memcpy(contents.dims.data(), *h, contents.dims.size() * sizeof(int32_t));
  int32_t overflow = 0;
  contents.count = NArrayElts(nDims, contents.dims.data(), &overflow);
  if (overflow != 0) throw JsonViewError("the array's sizes overflow");
  contents.first = static_cast<uint8_t*>(array.GetFirstElementPtr(h));
  const auto eltSize = static_cast<uint64_t>(std::max(array.GetEltTD().DataSize(), 0));
  if (contents.count > 0 &&
      (contents.first == nullptr ||
       static_cast<uint64_t>(contents.first - *h) + eltSize * static_cast<uint64_t>(contents.count) > blockSize))
    throw JsonViewError("the array's block is smaller than its sizes say");
  return contents;
}

JsonValue ArrayToJson(const TD& type, const void* data, bool named) {
  const TDRArray array = vellum::As<TDRArray>(type);
  const TDR element = array.GetEltTD();
  if (!array || !element) throw JsonViewError("the array type has no element");
  const ArrayContents contents = ContentsOf(array, data);
  const int64_t eltSize = element.DataSize();
  JsonValue elements = JsonValue::array();
  for (int64_t i = 0; i < contents.count; ++i) elements.push_back(DataToJson(element, contents.first + i * eltSize, named));
  if (contents.dims.size() == 1) return elements;
  JsonValue object = JsonValue::object();
  object["dims"] = contents.dims;
  object["elements"] = std::move(elements);
  return object;
}

// The dimension sizes and elements a JSON value gives for an array of `nDims` dimensions.
std::vector<int32_t> ArrayShape(const TD& type, const JsonValue& value, int32_t nDims, const JsonValue** elements) {
  if (value.is_array() && nDims == 1) {
    if (value.size() > static_cast<size_t>(std::numeric_limits<int32_t>::max()))
      throw JsonViewError("too many elements for an array");
    *elements = &value;
    return {static_cast<int32_t>(value.size())};
  }
  const bool shaped = value.is_object() && value.size() == 2 && value.contains("dims") && value.contains("elements");
  if (!shaped) {
    Expected(nDims == 1 ? "an array or {\"dims\": [...], \"elements\": [...]}" : "{\"dims\": [...], \"elements\": [...]}",
             type, value);
  }
  const JsonValue& dims = value["dims"];
  if (!dims.is_array() || dims.size() != static_cast<size_t>(nDims))
    throw JsonViewError("\"dims\" must list " + std::to_string(nDims) + " size(s)");
  std::vector<int32_t> sizes;
  // The product, held below 2^32 (any larger count cannot match the elements given).
  uint64_t product = 1;
  for (const JsonValue& d : dims) {
    if (!d.is_number_integer() || d.get<int64_t>() < 0 || d.get<int64_t>() > std::numeric_limits<int32_t>::max())
      throw JsonViewError("\"dims\" must hold sizes from 0 to 2147483647");
    sizes.push_back(static_cast<int32_t>(d.get<int64_t>()));
    product = std::min<uint64_t>(product * static_cast<uint64_t>(sizes.back()), uint64_t{1} << 32);
  }
  const JsonValue& list = value["elements"];
  if (!list.is_array()) throw JsonViewError("\"elements\" must be an array");
  if (list.size() != product) {
    throw JsonViewError("\"dims\" call for " + (product >> 32 != 0 ? std::string("more than 2^32") : std::to_string(product)) +
                        " element(s), \"elements\" holds " + std::to_string(list.size()));
  }
  *elements = &list;
  return sizes;
}

void JsonToArray(const TD& type, const JsonValue& value, void* data) {
  const TDRArray array = vellum::As<TDRArray>(type);
  const TDR element = array.GetEltTD();
  if (!array || !element) throw JsonViewError("the array type has no element");
  const int32_t nDims = array.GetNumDims();
  const JsonValue* elements = nullptr;
  const std::vector<int32_t> dims = ArrayShape(type, value, nDims, &elements);
  for (int32_t d = 0; d < nDims; ++d) {
    const int32_t word = array.GetDimSize(d);
    const int32_t limit = vellum::bound::Length(word);
    const int32_t given = dims[static_cast<size_t>(d)];
    const std::string which = nDims == 1 ? std::string("the array") : "dimension " + std::to_string(d);
    if (vellum::bound::IsFixed(word) && given != limit)
      throw JsonViewError(which + " has fixed size " + std::to_string(limit) + ", not " + std::to_string(given));
    if (vellum::bound::IsBounded(word) && given > limit)
      throw JsonViewError(which + " holds at most " + std::to_string(limit) + " elements, not " + std::to_string(given));
  }
  const auto count = static_cast<int32_t>(elements->size());
  auto h = Load<UHandle>(data);
  if (array.BoundedOrFixed() == vellum::bound::kVariable) {
    const int32_t status = array.SetArraySize(&h, count, dims.data());
    Store(data, h);
    if (status == kStatusOutOfMemory) OutOfMemory();
    if (status != kStatusNoError) throw JsonViewError("cannot size the array (status " + std::to_string(status) + ")");
  } else {
    // Bounded and fixed arrays keep the block their default data preallocated.
    if (h == nullptr) {
      if (count == 0) return;
      throw JsonViewError("the array has no preallocated block");
    }
    if (DSGetHandleSize(h) < dims.size() * sizeof(int32_t)) throw JsonViewError("the array's block is damaged");
    if (!dims.empty()) std::memcpy(*h, dims.data(), dims.size() * sizeof(int32_t));
  }
  if (count == 0) return;
  const ArrayContents contents = ContentsOf(array, data);
  const int64_t eltSize = element.DataSize();
  const bool plain = value.is_array();
  for (int32_t i = 0; i < count; ++i) {
    const auto convert = [&] { JsonToData(element, (*elements)[static_cast<size_t>(i)], contents.first + i * eltSize); };
    if (plain) {
      Inside(std::to_string(i), convert);
    } else {
      Inside("elements", [&] { Inside(std::to_string(i), convert); });
    }
  }
}

// The element names, when every element has one, all differ and all can be JSON keys.
bool ElementNames(const TDRCluster& cluster, std::vector<std::string>* names) {
  std::set<std::string> seen;
  for (int32_t i = 0; i < cluster.GetNumElts(); ++i) {
    std::string name;
    const TDR element = cluster.GetEltTD(i);
    if (!element || element.GetName(&name) != kStatusNoError || name.empty() || !IsUtf8(name)) return false;
    if (!seen.insert(name).second) return false;
    names->push_back(name);
  }
  return true;
}

JsonValue ClusterToJson(const TD& type, const void* data, bool named) {
  const TDRCluster cluster = vellum::As<TDRCluster>(type);
  const int32_t n = cluster.GetNumElts();
  std::vector<std::string> names;
  const bool asObject = named && n > 0 && ElementNames(cluster, &names);
  JsonValue result = asObject ? JsonValue::object() : JsonValue::array();
  for (int32_t i = 0; i < n; ++i) {
    JsonValue element = DataToJson(cluster.GetEltTD(i), Bytes(data) + cluster.GetEltOffset(i), named);
    if (asObject) {
      result[names[static_cast<size_t>(i)]] = std::move(element);
    } else {
      result.push_back(std::move(element));
    }
  }
  return result;
}

void JsonToCluster(const TD& type, const JsonValue& value, void* data) {
  const TDRCluster cluster = vellum::As<TDRCluster>(type);
  const int32_t n = cluster.GetNumElts();
  const auto convert = [&](int32_t i, const JsonValue& part) {
    JsonToData(cluster.GetEltTD(i), part, Bytes(data) + cluster.GetEltOffset(i));
  };
  if (value.is_array()) {
    if (value.size() != static_cast<size_t>(n))
      throw JsonViewError("the cluster has " + std::to_string(n) + " element(s), the array " + std::to_string(value.size()));
    for (int32_t i = 0; i < n; ++i) Inside(std::to_string(i), [&] { convert(i, value[static_cast<size_t>(i)]); });
    return;
  }
  if (!value.is_object()) Expected("an array or an object", type, value);
  std::vector<std::string> names;
  if (!ElementNames(cluster, &names))
    throw JsonViewError("the cluster's elements lack distinct names: give them as an array");
  for (const auto& [key, part] : value.items()) {
    bool known = false;
    for (const std::string& name : names) known = known || name == key;
    if (!known) throw JsonViewError("the cluster has no element named \"" + key + "\"");
  }
  for (int32_t i = 0; i < n; ++i) {
    const std::string& name = names[static_cast<size_t>(i)];
    if (!value.contains(name)) throw JsonViewError("element \"" + name + "\" is missing");
    Inside(name, [&] { convert(i, value[name]); });
  }
}

JsonValue RepeatedToJson(const TD& type, const void* data, bool named) {
  const TDRRepeatedBlock repeated = vellum::As<TDRRepeatedBlock>(type);
  const TDR element = repeated.GetEltTD();
  if (!element) throw JsonViewError("the repeated block has no element");
  const int64_t stride = element.DataSize();
  JsonValue result = JsonValue::array();
  for (uint32_t k = 0; k < repeated.GetNumBlocks(); ++k) result.push_back(DataToJson(element, Bytes(data) + stride * k, named));
  return result;
}

void JsonToRepeated(const TD& type, const JsonValue& value, void* data) {
  const TDRRepeatedBlock repeated = vellum::As<TDRRepeatedBlock>(type);
  const TDR element = repeated.GetEltTD();
  if (!element) throw JsonViewError("the repeated block has no element");
  if (!value.is_array()) Expected("an array", type, value);
  if (value.size() != repeated.GetNumBlocks())
    throw JsonViewError("the block repeats " + std::to_string(repeated.GetNumBlocks()) + " time(s), not " +
                        std::to_string(value.size()));
  const int64_t stride = element.DataSize();
  for (uint32_t k = 0; k < repeated.GetNumBlocks(); ++k)
    Inside(std::to_string(k), [&] { JsonToData(element, value[k], Bytes(data) + stride * k); });
}

}  // namespace

// --- the kinds, once -----------------------------------------------------------------------------

std::string JsonViewRefusal(const TDR& type) {
  if (!type) return "the null type has no values";
  const TypeCodeInfo* kind = KindOf(type);
  if (kind == nullptr) return NoView(type);
  switch (kind->form) {
    case ValueForm::Array:
      return JsonViewRefusal(vellum::As<TDRArray>(type).GetEltTD());
    case ValueForm::RepeatedBlock:
      return JsonViewRefusal(vellum::As<TDRRepeatedBlock>(type).GetEltTD());
    case ValueForm::Cluster: {
      const TDRCluster cluster = vellum::As<TDRCluster>(type);
      for (int32_t i = 0; i < cluster.GetNumElts(); ++i) {
        if (std::string refusal = JsonViewRefusal(cluster.GetEltTD(i)); !refusal.empty()) return refusal;
      }
      return std::string();
    }
    case ValueForm::Nothing:
    case ValueForm::SignedInteger:
    case ValueForm::UnsignedInteger:
    case ValueForm::Float:
    case ValueForm::Complex:
    case ValueForm::Boolean:
    case ValueForm::StringHandle:
    case ValueForm::Path:
    case ValueForm::ByteBlock:
      return std::string();
    case ValueForm::NoGenericView:
      return NoView(type);
  }
  return NoView(type);
}

JsonValue DataToJson(const TDR& type, const void* data, bool named) {
  const TypeCodeInfo* kind = KindOf(type);
  if (kind == nullptr) throw JsonViewError(NoView(type));
  const uint8_t bytes = kind->partBytes;
  switch (kind->form) {
    case ValueForm::SignedInteger:
    case ValueForm::UnsignedInteger:
      return WithIntegerType(kind->form, bytes, [&](auto zero) { return IntegerToJson<decltype(zero)>(data); });
    case ValueForm::Float: return FloatPartToJson(bytes, data);
    case ValueForm::Complex:
      return ComplexToJson(data, bytes, [bytes](const uint8_t* part) { return FloatPartToJson(bytes, part); });
    case ValueForm::Boolean: return JsonValue(Load<uint8_t>(data) != 0);
    case ValueForm::StringHandle: return StringToJson(data);
    case ValueForm::Path: return PathToJson(data);
    case ValueForm::Array: return ArrayToJson(type, data, named);
    case ValueForm::Cluster: return ClusterToJson(type, data, named);
    case ValueForm::RepeatedBlock: return RepeatedToJson(type, data, named);
    case ValueForm::ByteBlock: return HexObject(data, static_cast<size_t>(std::max(type.DataSize(), 0)));
    case ValueForm::Nothing: return JsonValue(nullptr);
    case ValueForm::NoGenericView: break;
  }
  throw JsonViewError(NoView(type));
}

void JsonToData(const TDR& type, const JsonValue& value, void* data) {
  const TypeCodeInfo* kind = KindOf(type);
  if (kind == nullptr) throw JsonViewError(NoView(type));
  const uint8_t bytes = kind->partBytes;
  switch (kind->form) {
    case ValueForm::SignedInteger:
    case ValueForm::UnsignedInteger:
      return WithIntegerType(kind->form, bytes, [&](auto zero) { JsonToInteger<decltype(zero)>(type, value, data); });
    case ValueForm::Float: return JsonToFloatPart(type, bytes, value, data);
    case ValueForm::Complex:
      return JsonToComplex(type, value, data, bytes,
                           [&](const JsonValue& part, uint8_t* at) { JsonToFloatPart(type, bytes, part, at); });
    case ValueForm::Boolean:
      if (!value.is_boolean()) Expected("true or false", type, value);
      return Store<uint8_t>(data, value.get<bool>() ? 1 : 0);
    case ValueForm::StringHandle: return JsonToString(type, value, data);
    case ValueForm::Path: return JsonToPath(type, value, data);
    case ValueForm::Array: return JsonToArray(type, value, data);
    case ValueForm::Cluster: return JsonToCluster(type, value, data);
    case ValueForm::RepeatedBlock: return JsonToRepeated(type, value, data);
    case ValueForm::ByteBlock: return JsonToBlock(type, value, data);
    case ValueForm::Nothing:
      if (!value.is_null()) Expected("null", type, value);
      return;
    case ValueForm::NoGenericView: break;
  }
  throw JsonViewError(NoView(type));
}

// --- default data ------------------------------------------------------------------------------

namespace {

constexpr uint64_t kSaturated = uint64_t{1} << 62;

uint64_t SaturatingAdd(uint64_t a, uint64_t b) { return std::min(a + b, kSaturated); }
uint64_t SaturatingMultiply(uint64_t a, uint64_t b) { return a != 0 && b > kSaturated / a ? kSaturated : a * b; }

// The blocks default data of `type` holds beyond its own DataSize bytes.
uint64_t BlockBytes(const TDR& type, uint32_t depth) {
  const TypeCodeInfo* kind = KindOf(type);
  if (kind == nullptr || depth > kMaxTypeNestingDepth) return 0;
  // A block's bookkeeping, rounded up.
  constexpr uint64_t kBlockOverhead = 64;
  const ValueForm form = kind->form;
  if (form == ValueForm::StringHandle) {
    const int32_t bound = StringBound(type);
    return vellum::bound::IsVariable(bound) ? 0 : kBlockOverhead + static_cast<uint64_t>(vellum::bound::Length(bound));
  }
  if (form == ValueForm::Path) return kBlockOverhead;
  if (form == ValueForm::Cluster) {
    const TDRCluster cluster = vellum::As<TDRCluster>(type);
    uint64_t total = 0;
    for (int32_t i = 0; i < cluster.GetNumElts(); ++i) total = SaturatingAdd(total, BlockBytes(cluster.GetEltTD(i), depth + 1));
    return total;
  }
  if (form == ValueForm::RepeatedBlock) {
    const TDRRepeatedBlock repeated = vellum::As<TDRRepeatedBlock>(type);
    return SaturatingMultiply(repeated.GetNumBlocks(), BlockBytes(repeated.GetEltTD(), depth + 1));
  }
  if (form != ValueForm::Array) return 0;
  const TDRArray array = vellum::As<TDRArray>(type);
  const TDR element = array.GetEltTD();
  const uint64_t header = kBlockOverhead + 4 * static_cast<uint64_t>(std::max(array.GetNumDims(), 0));
  const int32_t word = array.BoundedOrFixed();
  if (word == vellum::bound::kVariable) return header;
  if (word == static_cast<int32_t>(0x80000000u)) return kSaturated;  // the capacity overflows
  const auto capacity = static_cast<uint64_t>(word & 0x7FFFFFFF);
  const uint64_t each = SaturatingAdd(static_cast<uint64_t>(std::max(element.DataSize(), 0)), BlockBytes(element, depth + 1));
  return SaturatingAdd(header, SaturatingMultiply(capacity, each));
}

}  // namespace

uint64_t DefaultDataBytes(const TDR& type) {
  return SaturatingAdd(static_cast<uint64_t>(std::max(type.DataSize(), 0)), BlockBytes(type, 0));
}

// --- owned data ----------------------------------------------------------------------------------
