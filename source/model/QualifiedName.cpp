// Hierarchical names made of string components ("lib.x:sub:Item"): the defining file of a
// typedef, the class name of an object reference. Text form, three comparison rules, flat form.
#include "source/model/QualifiedName.h"

#include <algorithm>
#include <exception>
#include <string_view>
#include <utility>

#include "runtime/BinData.h"
#include "runtime/DebugStream.h"
#include "runtime/KoExcept.h"
#include "runtime/PXPath.h"
#include "runtime/PXStrings.h"

VELLUM_DIAGNOSTIC_MODULE("QualifiedName");

namespace {

constexpr uint8_t kDelimiter = ':';
constexpr size_t kLongestFlatComponent = 255;  // a component is flattened behind one length byte

const std::string& EmptyComponent() {
  static const std::string empty;
  return empty;
}

// Editing reports running out of memory as a status, never as an exception.
template <class Edit>
int32_t Guarded(Edit&& edit) {
  try {
    return edit();
  } catch (const std::exception& e) {
    return KoExcept::FromStd(e, __FILE__, __LINE__).Status();
  }
}

bool IsWhiteSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r';
}

bool IsSaneComponent(std::string_view component) {
  return !component.empty() && !IsWhiteSpace(component.front()) &&
         !IsWhiteSpace(component.back());
}

std::string_view AsView(const uint8_t* bytes, size_t length) {
  if (length == 0) return std::string_view();
  return std::string_view(reinterpret_cast<const char*>(bytes), length);
}

// Orders two names by `rule` over the common components, then by count.
template <class Rule>
int32_t CompareWith(const QualifiedName& a, const QualifiedName& b, Rule&& rule) {
  const int32_t common = std::min(a.NumElts(), b.NumElts());
  for (int32_t i = 0; i < common; ++i) {
    if (const int32_t order = rule(a[i], b[i]); order != 0) return order;
  }
  return a.NumElts() - b.NumElts();
}

int32_t CompareBytes(const std::string& a, const std::string& b) {
  const int order = a.compare(b);
  return order < 0 ? -1 : (order > 0 ? 1 : 0);
}

int32_t CompareFileSystem(const std::string& a, const std::string& b) {
  return PathRef::NameCompare(a, b);
}

int32_t CompareNoCase(const std::string& a, const std::string& b) {
  return StringUtils::CaseInsensitiveCompare(a, b);
}

}  // namespace

QualifiedName::QualifiedName(const std::string& component) { components_.push_back(component); }

QualifiedName::QualifiedName(const uint8_t* pstr) {
  components_.emplace_back(AsView(PStrBuf(pstr), static_cast<size_t>(PStrLen(pstr))));
}

const std::string& QualifiedName::operator[](int32_t i) const {
  if (i < 0 || i >= NumElts()) return EmptyComponent();
  return components_[static_cast<size_t>(i)];
}

const std::string& QualifiedName::GetFileName() const {
  return components_.empty() ? EmptyComponent() : components_.back();
}

int32_t QualifiedName::Reserve(int32_t n) {
  if (n < 0) return kStatusBadArgument;
  return Guarded([&] {
    components_.reserve(static_cast<size_t>(n));
    return kStatusNoError;
  });
}

int32_t QualifiedName::Copy(const QualifiedName& other) {
  if (&other == this) return kStatusNoError;
  return Guarded([&] {
    Components copy(other.components_);
    components_.swap(copy);
    return kStatusNoError;
  });
}

void QualifiedName::Delete(int32_t i) {
  if (components_.empty()) return;
  const int32_t at = std::clamp(i, 0, NumElts() - 1);
  components_.erase(components_.begin() + at);
}

int32_t QualifiedName::InsertBytes(const uint8_t* bytes, size_t length, int32_t position) {
  return Guarded([&] {
    std::string component(AsView(bytes, length));
    const int32_t at = position < NumElts() ? std::max(position, 0) : NumElts();
    components_.insert(components_.begin() + at, std::move(component));
    return kStatusNoError;
  });
}

int32_t QualifiedName::Insert(const std::string& component, int32_t position) {
  return InsertBytes(reinterpret_cast<const uint8_t*>(component.data()), component.size(),
                     position);
}

int32_t QualifiedName::Insert(const uint8_t* pstr, int32_t position) {
  return InsertBytes(PStrBuf(pstr), static_cast<size_t>(PStrLen(pstr)), position);
}

int32_t QualifiedName::InsertStringBuffer(const uint8_t* bytes, int32_t length,
                                          int32_t position) {
  if (length < 0 || (bytes == nullptr && length > 0)) return kStatusBadArgument;
  return InsertBytes(bytes, static_cast<size_t>(length), position);
}

int32_t QualifiedName::Prepend(const QualifiedName& other, int32_t n) {
  const int32_t taken = std::clamp(other.NumElts() - std::max(n, 0), 0, other.NumElts());
  if (taken == 0) return kStatusNoError;
  return Guarded([&] {
    Components joined;
    joined.reserve(static_cast<size_t>(taken) + components_.size());
    joined.insert(joined.end(), other.components_.begin(), other.components_.begin() + taken);
    joined.insert(joined.end(), components_.begin(), components_.end());
    components_.swap(joined);
    return kStatusNoError;
  });
}

int32_t QualifiedName::Parse(const uint8_t* text, size_t size, bool sanityCheck) {
  components_.clear();
  if (size == 0) return kStatusNoError;
  return Guarded([&] {
    size_t start = 0;
    for (;;) {
      size_t end = start;
      while (end < size && text[end] != kDelimiter) ++end;
      const std::string_view component = AsView(text + start, end - start);
      if (sanityCheck && !IsSaneComponent(component)) return kStatusBadArgument;
      components_.emplace_back(component);
      if (end == size) return kStatusNoError;
      start = end + 1;
      // A doubled delimiter separates like a single one.
      if (start < size && text[start] == kDelimiter) ++start;
    }
  });
}

int32_t QualifiedName::FromDelimitedName(const std::string& text) {
  return Parse(reinterpret_cast<const uint8_t*>(text.data()), text.size(), false);
}

int32_t QualifiedName::FromDelimitedName(const LStr* text) {
  if (text == nullptr) return Parse(nullptr, 0, false);
  if (text->cnt < 0) {
    components_.clear();
    return kStatusBadArgument;
  }
  return Parse(text->str, static_cast<size_t>(text->cnt), false);
}

int32_t QualifiedName::FromDelimitedNameWithSanityCheck(const std::string& text) {
  return Parse(reinterpret_cast<const uint8_t*>(text.data()), text.size(), true);
}

int32_t QualifiedName::ToDelimitedName(std::string* text) const {
  if (text == nullptr) return kStatusBadArgument;
  return Guarded([&] {
    size_t size = components_.empty() ? 0 : components_.size() - 1;
    for (const std::string& component : components_) size += component.size();
    text->clear();
    text->reserve(size);
    for (size_t i = 0; i < components_.size(); ++i) {
      if (i != 0) text->push_back(static_cast<char>(kDelimiter));
      text->append(components_[i]);
    }
    return kStatusNoError;
  });
}

bool QualifiedName::Equal(const QualifiedName& other) const {
  return components_.size() == other.components_.size() && Compare(other) == 0;
}

bool QualifiedName::EqualFS(const QualifiedName& other) const {
  return components_.size() == other.components_.size() && CompareFS(other) == 0;
}

bool QualifiedName::EqualNC(const QualifiedName& other) const {
  return components_.size() == other.components_.size() && CompareNC(other) == 0;
}

bool QualifiedName::EqualNEltsFS(const QualifiedName& other, int32_t n) const {
  if (NumElts() < n || other.NumElts() < n) return false;
  for (int32_t i = 0; i < n; ++i) {
    if (CompareFileSystem((*this)[i], other[i]) != 0) return false;
  }
  return true;
}

int32_t QualifiedName::Compare(const QualifiedName& other) const {
  return CompareWith(*this, other, CompareBytes);
}

int32_t QualifiedName::CompareFS(const QualifiedName& other) const {
  return CompareWith(*this, other, CompareFileSystem);
}

int32_t QualifiedName::CompareNC(const QualifiedName& other) const {
  return CompareWith(*this, other, CompareNoCase);
}

bool QualifiedName::HasFlatForm() const {
  return std::none_of(components_.begin(), components_.end(), [](const std::string& c) {
    return c.size() > kLongestFlatComponent;
  });
}

int32_t QualifiedName::Flatten(KoDataWriter* writer) const {
  if (writer == nullptr) return kStatusBadArgument;
  if (writer->GetError() != kStatusNoError) return writer->GetError();
  if (!HasFlatForm()) {
    (VELLUM_DEBUG(2) << "QualifiedName component longer than 255 bytes cannot be flattened")
        .Process();
    writer->SetError(kStatusBadArgument);
    return writer->GetError();
  }
  writer->WriteI32(NumElts());
  for (const std::string& component : components_) {
    writer->WriteU8(static_cast<uint8_t>(component.size()));
    writer->WriteBytes(component.data(), component.size());
  }
  return writer->GetError();
}

int32_t QualifiedName::UnFlatten(KoDataReader* reader) {
  components_.clear();
  if (reader == nullptr) return kStatusBadArgument;
  int32_t count = 0;
  if (const int32_t status = reader->ReadI32(&count); status != kStatusNoError) return status;
  // Each component takes at least its length byte, so the count is checked against the bytes
  // left before anything is allocated for it.
  if (count < 0 || static_cast<size_t>(count) > reader->BytesLeft()) {
    (VELLUM_DEBUG(2) << "QualifiedName count " << count << " exceeds the " << reader->BytesLeft()
                     << " bytes left")
        .Process();
    reader->SetError(kStatusCorruptData);
    return reader->GetError();
  }
  Components read;
  const int32_t status = Guarded([&] {
    uint8_t bytes[kLongestFlatComponent];
    for (int32_t i = 0; i < count; ++i) {
      uint8_t length = 0;
      if (const int32_t failed = reader->ReadU8(&length); failed != kStatusNoError) return failed;
      if (const int32_t failed = reader->ReadBytes(bytes, length); failed != kStatusNoError)
        return failed;
      read.emplace_back(AsView(bytes, length));
    }
    return kStatusNoError;
  });
  if (status != kStatusNoError) {
    reader->SetError(status);
    return reader->GetError();
  }
  components_.swap(read);
  return reader->GetError();
}

int32_t QualifiedName::GetFlatSize(uint32_t version) const {
  if (!HasFlatForm()) return 0;
  PreflightOutputBuf counter;
  const BigEndianizer endianizer;
  KoDataWriter writer(&counter, version, &endianizer, 0);
  Flatten(&writer);
  return static_cast<int32_t>(counter.GetBytesWritten());
}

const QualifiedName& QualifiedName::kEmpty() {
  static const QualifiedName empty;
  return empty;
}

const std::string& QualifiedName::kDoubleDelimiter() {
  static const std::string doubled = "::";
  return doubled;
}

void ToDebugStream(DebugStream& stream, const QualifiedName& name) {
  std::string text;
  name.ToDelimitedName(&text);
  stream << "[QualifiedName " << '"' << text << "]";
}
