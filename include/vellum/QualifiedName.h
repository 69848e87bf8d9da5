// Hierarchical names made of string components ("lib.x:sub:Item"): the defining file of a
// typedef, the class name of an object reference. Text form, three comparison rules, flat form.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "runtime/DSMemory.h"

class DebugStream;
class KoDataReader;
class KoDataWriter;
struct LStr;

// An ordered list of components; component 0 is the outermost and the last one is the file
// name. A component is any run of bytes (empty allowed) and is compared as bytes unless a rule
// says otherwise.
//
// Text form: the components joined with ':'. Flat form (in the writer's byte order, big-endian
// in every stored format): a 32-bit component count, then each component as a length byte and
// its bytes, no padding.
//
// Operations that allocate return status 2 when memory runs out (the name may then hold the
// components added before the failure); they never throw. Constructors and copies throw
// std::bad_alloc. A name is a plain value: one thread may change it while none reads it.
class QualifiedName {
 public:
  QualifiedName() = default;
  // One component equal to the whole text; ':' is not special here.
  explicit QualifiedName(const std::string& component);
  // One component; a null PStr is the empty component.
  explicit QualifiedName(const uint8_t* pstr);

  int32_t NumElts() const { return static_cast<int32_t>(components_.size()); }
  // Component i; the empty string when i is out of range.
  const std::string& operator[](int32_t i) const;
  // The last component, or the empty string for an empty name.
  const std::string& GetFileName() const;

  void Clear() { components_.clear(); }
  [[nodiscard]] int32_t Reserve(int32_t n);
  // Becomes a copy of other; status 0, or 2 when memory runs out (then unchanged).
  [[nodiscard]] int32_t Copy(const QualifiedName& other);
  // Removes the component at i clamped to 0 .. count - 1; nothing for an empty name.
  void Delete(int32_t i);
  // Inserts at max(position, 0) when position < count, else appends.
  [[nodiscard]] int32_t Insert(const std::string& component, int32_t position);
  [[nodiscard]] int32_t Insert(const uint8_t* pstr, int32_t position);  // a null PStr inserts ""
  // The same with `length` bytes; null bytes with a positive length or a negative length is 1.
  [[nodiscard]] int32_t InsertStringBuffer(const uint8_t* bytes, int32_t length, int32_t position);
  // Puts the first count(other) - n components of other in front, in order (n is clamped to
  // 0 .. count(other)). On failure the name is unchanged.
  [[nodiscard]] int32_t Prepend(const QualifiedName& other, int32_t n);

  // Parses the text form: the name is cleared, then each run up to the next ':' (or the end)
  // becomes a component; after a ':' one more ':' is skipped, so "a::b" is "a", "b" and
  // "a:::b" is "a", "", "b". An empty text gives the empty name.
  [[nodiscard]] int32_t FromDelimitedName(const std::string& text);
  // The same from a counted string; null gives the empty name, a negative count is status 1.
  [[nodiscard]] int32_t FromDelimitedName(const LStr* text);
  // The same, but a component that is empty or starts or ends with white space stops the parse
  // with status 1; the components before it stay.
  [[nodiscard]] int32_t FromDelimitedNameWithSanityCheck(const std::string& text);
  // The components joined with ':'. Null `text` is status 1.
  int32_t ToDelimitedName(std::string* text) const;

  // Equal counts and every component equal: as bytes, by file-system name rules
  // (PathRef::NameCompare), or with ASCII letters folded.
  bool Equal(const QualifiedName& other) const;
  bool EqualFS(const QualifiedName& other) const;
  bool EqualNC(const QualifiedName& other) const;
  // False when either name has fewer than n components; otherwise whether the first n are
  // equal by file-system name rules.
  bool EqualNEltsFS(const QualifiedName& other, int32_t n) const;
  // Orders by the first differing component among the common ones, then by count (a shorter
  // name first). Compare answers -1, 0 or 1; CompareFS and CompareNC answer the component
  // comparison's own result (negative, 0, positive) or the count difference.
  int32_t Compare(const QualifiedName& other) const;
  int32_t CompareFS(const QualifiedName& other) const;
  int32_t CompareNC(const QualifiedName& other) const;

  // Writes the flat form. A component longer than 255 bytes has no flat form: nothing is
  // written, the writer's error becomes 1 and 1 is returned. Otherwise the writer's status.
  int32_t Flatten(KoDataWriter* writer) const;
  // Reads the flat form, replacing the name. A count that the bytes left cannot hold, or input
  // that ends early, is 74 before anything is allocated; running out of memory is 2. Any failure
  // becomes the reader's error and leaves the name empty. Otherwise the reader's status.
  [[nodiscard]] int32_t UnFlatten(KoDataReader* reader);
  // The bytes Flatten writes for that format version; 0 when the name has no flat form.
  int32_t GetFlatSize(uint32_t version) const;

  // A shared empty name, made on first use.
  static const QualifiedName& kEmpty();
  // "::"
  static const std::string& kDoubleDelimiter();

 private:
  using Components = std::vector<std::string, PXAllocator<std::string>>;
  [[nodiscard]] int32_t Parse(const uint8_t* text, size_t size, bool sanityCheck);
  [[nodiscard]] int32_t InsertBytes(const uint8_t* bytes, size_t length, int32_t position);
  bool HasFlatForm() const;

  Components components_;
};

// Writes "[QualifiedName ", a double quote, the text form and "]".
void ToDebugStream(DebugStream& stream, const QualifiedName& name);
