// The textual type notation. The writer knows a small fixed vocabulary; the parser reads more
// (names, enum items, fixed dimensions, typedef links) and never trusts the text: every read is
// bounds-checked and nesting is limited, so hostile text costs a ParseException and nothing else.
#include "source/notation/basicTypeInterpreter.h"

#include <cstddef>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/PXTypes.h"
#include "vellum/QualifiedName.h"
#include "vellum/TDArrayHandles.h"
#include "vellum/TDAttributeHandles.h"
#include "vellum/TDContainerHandles.h"
#include "vellum/TDEnumHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDOtherHandles.h"
#include "vellum/TDSimpleHandles.h"
#include "vellum/TDStringHandles.h"
#include "vellum/TDTagHandles.h"
#include "vellum/TypeCodes.h"

namespace {

constexpr const char* kEndOfString = "expected valid char, got end of string";
constexpr const char* kUnexpectedChar = "expected specific char, got something else";
constexpr const char* kNoStopChar = "Could not find stop character in string";
constexpr const char* kNeedsLinker = "type requires non-null linker";
constexpr const char* kBadClusterToken = "invalid cluster token";
constexpr const char* kInvalidType = "invalid type";
constexpr const char* kNotAllRead = "entire string not read";
constexpr const char* kTooDeep = "type nesting deeper than 256 levels";
static_assert(kMaxInterpretedNesting == 256, "the refusal message names the limit");

// Array descriptors store their dimension count in 16 bits when saved.
constexpr int64_t kMaxDims = 0x7FFF;
// Dimensions of all arrays of one text together. Each dimension costs a word of memory but only
// a digit or two of text, so without this a short text could demand gigabytes.
constexpr int64_t kMaxDimsPerText = 0x10000;
constexpr uint32_t kFixedDimBit = 0x80000000u;

// ---------------------------------------------------------------------------------------------
// Writing

void Write(const TDR& type, std::string& out) {
  if (type.IsNull()) {
    out += 'N';
    return;
  }
  const auto code = static_cast<TypeCode>(type.GetTypeCode());
  if (code == TypeCode::Array || code == TypeCode::SubArray) {
    const TDRArrayBase array(type.GetImpPtr(), 1);
    out += code == TypeCode::Array ? '[' : '<';
    out += std::to_string(array.GetNumDims());
    out += ',';
    Write(array.GetEltTD(), out);
    out += code == TypeCode::Array ? ']' : '>';
    return;
  }
  if (code == TypeCode::Cluster) {
    const TDRMultiContainer cluster(type.GetImpPtr(), 1);
    out += '{';
    for (int32_t i = 0; i < cluster.GetNumElts(); ++i) {
      if (i != 0) out += ',';
      Write(cluster.GetEltTD(i), out);
    }
    out += '}';
    return;
  }
  if (code == TypeCode::PtrTo) {
    out += '&';
    Write(TDRSingleContainer(type.GetImpPtr(), 1).GetEltTD(), out);
    return;
  }
  // Kinds without a token of their own are written as '?'. Timestamps, waveforms, digital tables,
  // class instances and refnums get theirs with the kinds that describe them.
  const TypeCodeInfo* kind = FindTypeCode(static_cast<int32_t>(code));
  if (kind != nullptr && !kind->notation.empty()) {
    out += kind->notation;
  } else {
    out += '?';
  }
}

// ---------------------------------------------------------------------------------------------
// Parsing

class Parser {
 public:
  Parser(std::string_view text, IVILinkMediator* linker) : text_(text), linker_(linker) {}

  TDR ParseAll() {
    TDR result = ParseType(1);
    if (pos_ < text_.size()) throw ParseException(kNotAllRead);
    return result;
  }

 private:
  static bool IsSpace(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }
  static bool IsDigit(char c) { return c >= '0' && c <= '9'; }

  void SkipSpace() {
    while (pos_ < text_.size() && IsSpace(text_[pos_])) ++pos_;
  }
  bool AtEnd() const { return pos_ >= text_.size(); }
  char Peek() const {
    if (AtEnd()) throw ParseException(kEndOfString);
    return text_[pos_];
  }
  // The character after the current one, or 0 at the end (no token uses 0).
  char PeekNext() const { return pos_ + 1 < text_.size() ? text_[pos_ + 1] : '\0'; }
  char Next() {
    const char c = Peek();
    ++pos_;
    return c;
  }
  void Expect(char wanted) {
    SkipSpace();
    if (Next() != wanted) throw ParseException(kUnexpectedChar);
  }
  // Consumes `wanted` when it comes next (after blanks).
  bool Accept(char wanted) {
    SkipSpace();
    if (!AtEnd() && text_[pos_] == wanted) {
      ++pos_;
      return true;
    }
    return false;
  }

  int32_t Dimensions() {
    SkipSpace();
    const int64_t dims = Unsigned(kMaxDims);
    dimsLeft_ -= dims;
    if (dimsLeft_ < 0) throw ParseException(kInvalidType);
    return static_cast<int32_t>(dims);
  }

  int64_t Unsigned(int64_t max) {
    if (!IsDigit(Peek())) throw ParseException(kUnexpectedChar);
    int64_t value = 0;
    while (!AtEnd() && IsDigit(text_[pos_])) {
      value = value * 10 + (text_[pos_] - '0');
      if (value > max) throw ParseException(kInvalidType);
      ++pos_;
    }
    return value;
  }

  // A double-quoted string; \" and \\ stand for the character, other backslashes stay as written.
  std::string Quoted() {
    Expect('"');
    std::string value;
    for (;;) {
      if (AtEnd()) throw ParseException(kNoStopChar);
      const char c = text_[pos_++];
      if (c == '"') return value;
      if (c == '\\' && !AtEnd() && (text_[pos_] == '"' || text_[pos_] == '\\')) {
        value += text_[pos_++];
        continue;
      }
      value += c;
    }
  }

  static TDR Required(const TDR& type) {
    if (type.IsNull()) throw ParseException(kInvalidType);
    return type;
  }
  static TDR CheckedIn(const TDW& type) { return Required(type.CheckIn()); }

  TDR ParseType(int32_t level) {
    if (level > kMaxInterpretedNesting) throw ParseException(kTooDeep);
    SkipSpace();
    if (Peek() == '"') {
      std::string name = Quoted();
      Expect(':');
      SkipSpace();
      TDR body = ParseBody(level);
      if (body.IsNull()) return body;  // "N": nothing to name
      TDW named = body.CheckOut();
      if (named.IsNull() || named.SetName(name) != kStatusNoError) throw ParseException(kInvalidType);
      return CheckedIn(named);
    }
    return ParseBody(level);
  }

  TDR ParseBody(int32_t level) {
    const char c = Next();
    switch (c) {
      case '(': return ParseTypedef(level);
      case '[': return ParseArray(level);
      case '<': return PeekIs('<') ? ParseEnum() : ParseSubArray(level);
      case '{': return ParseCluster(level);
      case '&': {
        TDWPtrTo pointer;
        if (pointer.SetEltTD(Required(ParseType(level + 1))) != kStatusNoError) throw ParseException(kInvalidType);
        return CheckedIn(pointer);
      }
      case '@': return ParseArrayDataPtr(level);
      case 's': return Required(GetSubStringTD());
      case 'S':
        if (PeekIs('c')) return ++pos_, Required(TDRCStr());
        if (PeekIs('p')) return ++pos_, Required(TDRPStr());
        return Required(GetStringTD());
      case 'P': return Required(GetPathTD());
      case 'B': return Required(GetBoolTD());
      case 'b': return Required(TDRBooleanU16());
      case 'N': return TDR();
      case 'v': return Required(GetVoidTD());
      case '*': return Required(TDRPtr());
      case 'i':
      case 'u':
      case 'f':
      case 'c':
      case 'e': return ParseNumeric(c);
      case 'T': return ParseTag();
      case 'C': {
        if (linker_ == nullptr) throw ParseException(kNeedsLinker);
        return Required(linker_->LinkClass(Quoted()));
      }
      case 'x': {
        if (linker_ == nullptr) throw ParseException(kNeedsLinker);
        Expect(':');
        return Required(linker_->LinkCharacter(Next()));
      }
      default:
        // Variants, waveforms, timestamps, digital tables and refnums ("V", "M", "W", "#") have no
        // descriptor kind in this library yet.
        throw ParseException(kInvalidType);
    }
  }

  bool PeekIs(char wanted) const { return !AtEnd() && text_[pos_] == wanted; }

  TDR ParseTypedef(int32_t level) {
    const std::string path = Quoted();
    Expect(':');
    TDR inner = Required(ParseType(level + 1));
    Expect(')');
    QualifiedName name;
    if (name.FromDelimitedName(path) != kStatusNoError) throw ParseException(kInvalidType);
    TDW linked = inner.CheckOut();
    TDWTypedef link(name, 0, nullptr);
    if (linked.IsNull() || !link || linked.SetTypedef(link) != kStatusNoError) throw ParseException(kInvalidType);
    return CheckedIn(linked);
  }

  TDR ParseArray(int32_t level) {
    const int32_t dims = Dimensions();
    bool fixed = false;
    std::vector<uint32_t> sizes;
    if (Accept('#')) {
      fixed = true;
      for (int32_t i = 0; i < dims; ++i) {
        Expect(',');
        SkipSpace();
        sizes.push_back(static_cast<uint32_t>(Unsigned(0x7FFFFFFF)) | kFixedDimBit);
      }
    }
    Expect(',');
    TDR element = Required(ParseType(level + 1));
    Expect(']');
    TDWArray array(dims, element);
    if (array.IsNull()) throw ParseException(kInvalidType);
    if (fixed) {
      for (int32_t i = 0; i < dims; ++i) {
        if (array.SetDimSize(i, static_cast<int32_t>(sizes[static_cast<size_t>(i)])) != kStatusNoError) {
          throw ParseException(kInvalidType);
        }
      }
    }
    return CheckedIn(array);
  }

  TDR ParseSubArray(int32_t level) {
    const int32_t dims = Dimensions();
    Expect(',');
    TDR element = Required(ParseType(level + 1));
    Expect('>');
    return CheckedIn(TDWSubArray(dims, element));
  }

  // After "<<": an unsigned integer of the token's width with enum items and a name.
  TDR ParseEnum() {
    ++pos_;
    if (Next() != 'e') throw ParseException(kInvalidType);
    const char width = Next();
    TDWEnum items;
    const std::string name = Quoted();
    Accept(',');
    if (!Accept('>')) {
      for (;;) {
        const std::string item = Quoted();
        if (items.AppendString(item.data(), item.size()) != kStatusNoError) throw ParseException(kInvalidType);
        if (Accept(',')) continue;
        Expect('>');
        break;
      }
    }
    Expect('>');
    TDW numeric;
    switch (width) {
      case 'B': numeric = TDWUInt8(items, nullptr); break;
      case 'W': numeric = TDWUInt16(items, nullptr); break;
      case 'L': numeric = TDWUInt32(items, nullptr); break;
      default: throw ParseException(kInvalidType);
    }
    if (numeric.IsNull() || numeric.SetName(name) != kStatusNoError) throw ParseException(kInvalidType);
    return CheckedIn(numeric);
  }

  TDR ParseCluster(int32_t level) {
    TDWCluster cluster;
    if (cluster.IsNull()) throw ParseException(kInvalidType);
    if (Accept('}')) return CheckedIn(cluster);
    for (;;) {
      TDR element = Required(ParseType(level + 1));
      if (cluster.AppendEltTD(element) != kStatusNoError) throw ParseException(kInvalidType);
      SkipSpace();
      const char separator = Next();
      if (separator == '}') break;
      if (separator != ',') throw ParseException(kBadClusterToken);
    }
    return CheckedIn(cluster);
  }

  TDR ParseArrayDataPtr(int32_t level) {
    TDR target = Required(ParseType(level + 1));
    if (target.GetTypeCode() != static_cast<int16_t>(TypeCode::Array)) {
      return CheckedIn(TDWArrayDataPtr(1, GetVoidTD()));
    }
    const TDRArray array(target.GetImpPtr(), 1);
    TDWArrayDataPtr pointer(array.GetNumDims(), array.GetEltTD());
    if (pointer.IsNull()) throw ParseException(kInvalidType);
    for (int32_t i = 0; i < array.GetNumDims(); ++i) {
      if (pointer.SetDimSize(i, array.GetDimSize(i)) != kStatusNoError) throw ParseException(kInvalidType);
    }
    return CheckedIn(pointer);
  }

  TDR ParseNumeric(char first) {
    const char second = Next();
    switch (first) {
      case 'i':
      case 'u': {
        const bool isSigned = first == 'i';
        switch (second) {
          case 'B': return Required(isSigned ? GetiB() : GetuB());
          case 'W': return Required(isSigned ? GetiW() : GetuW());
          case 'L': return Required(isSigned ? GetiL() : GetuL());
          case 'Q': return Required(isSigned ? GetiQ() : GetuQ());
          case 'P': {
            const TDW wide = isSigned ? TDW(TDWInt64()) : TDW(TDWUInt64());
            TDWNumeric pointerSized(wide.GetImpPtr(), 1);
            if (pointerSized.IsNull()) throw ParseException(kInvalidType);
            pointerSized.SetIntPtrT();
            return CheckedIn(pointerSized);
          }
          default: throw ParseException(kInvalidType);
        }
      }
      case 'f':
        switch (second) {
          case 'S': return Required(GetfS());
          case 'D': return Required(GetfD());
          case 'X': return Required(GetfX());
          default: throw ParseException(kInvalidType);  // "fx": fixed point is not a kind here yet
        }
      case 'c':
        switch (second) {
          case 'S': return Required(GetcS());
          case 'D': return Required(GetcD());
          case 'X': return Required(GetcX());
          default: throw ParseException(kInvalidType);
        }
      default: {  // 'e'
        TDWEnum empty;
        switch (second) {
          case 'B': return CheckedIn(TDWUInt8(empty, nullptr));
          case 'W': return CheckedIn(TDWUInt16(empty, nullptr));
          case 'L': return CheckedIn(TDWUInt32(empty, nullptr));
          default: throw ParseException(kInvalidType);
        }
      }
    }
  }

  TDR ParseTag() {
    const auto kind = static_cast<TagType>(Unsigned(0x7FFFFFFF));
    if (kind == kTagTypeUserDefined) {
      const std::string tagClass = Quoted();
      TDWUserDefinedTag tag(nullptr);
      if (tag.IsNull()) throw ParseException(kInvalidType);
      std::string pstr(1, static_cast<char>(tagClass.size() > 255 ? 255 : tagClass.size()));
      pstr.append(tagClass, 0, static_cast<uint8_t>(pstr[0]));
      if (tag.SetTagClass(reinterpret_cast<const uint8_t*>(pstr.data())) != kStatusNoError) {
        throw ParseException(kInvalidType);
      }
      return CheckedIn(tag);
    }
    if (kind < 1 || kind > 23) throw ParseException(kInvalidType);
    return Required(TDRTag(kind, nullptr));
  }

  std::string_view text_;
  size_t pos_ = 0;
  int64_t dimsLeft_ = kMaxDimsPerText;
  IVILinkMediator* linker_;
};

}  // namespace

std::string TypeToInterpretedString(const TDR& type) {
  std::string out;
  Write(type, out);
  return out;
}

TDR InterpretedStringToType(const std::string& text) { return InterpretedStringToType(text, nullptr); }

TDR ParseInterpretedString(const std::string& text, IVILinkMediator* linker) {
  return Parser(text, linker).ParseAll();
}

TDR InterpretedStringToType(const std::string& text, IVILinkMediator* linker) {
  try {
    return ParseInterpretedString(text, linker);
  } catch (const ParseException&) {
    return TDR();
  } catch (const std::bad_alloc&) {
    return TDR();
  }
}
