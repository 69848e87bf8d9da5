// Handles to enumerations: the ordered item names of an enumerated unsigned integer, whose value
// is the index of an item. Read-only handles hold interned objects.
#pragma once

#include <cstddef>
#include <cstdint>

#include "vellum/TDAttributeHandles.h"
#include "vellum/TDHandles.h"

class TDWEnum;

// Item indices are 0-based. Items are Pascal strings of at most 255 bytes; longer texts keep
// their first 255 bytes.
class TDREnum : public TDAttribute {
 public:
  // A null handle: no enumeration.
  TDREnum() noexcept = default;
  // Holds `p` when `take` is nonzero and `p` is not null.
  TDREnum(const TDEnumImpPtr& p, int32_t take);

  TDEnumImpPtr GetEnumImpPtr() const;
  // 0 for a null handle or an object without storage.
  uint32_t GetNumStrings() const;
  // The item as a Pascal string owned by the enumeration; null when out of range.
  const uint8_t* GetEltPStr(uint32_t index) const;
  // The handle holds an object that has its storage.
  bool IsSane() const;
  // Prefix comparison: 3 the same items, 1 this one's items begin the other's, 2 the other's
  // items begin this one's, 0 the items differ. When either handle holds no enumeration the
  // answer is 0 after "Not implemented" (level 3).
  int32_t Compare(const TDAttribute& other) const;

  // A new, private copy; a null handle when this one is null or memory runs out.
  TDWEnum CheckOut() const;
};

class TDWEnum : public TDAttribute {
 public:
  // A new, private, empty enumeration (null only when memory runs out).
  TDWEnum();
  // Holds `p` when `take` is nonzero and `p` is a private object; an interned one is refused.
  TDWEnum(const TDEnumImpPtr& p, int32_t take);

  TDEnumImpPtr GetEnumImpPtr() const;
  uint32_t GetNumStrings() const;
  const uint8_t* GetEltPStr(uint32_t index) const;
  bool IsSane() const;
  int32_t Compare(const TDAttribute& other) const;

  // Editing. Each answers 42 for a null handle or an object without storage, 1 for a null text
  // or an index out of range (nothing changes), 2 when an item's text cannot be allocated, and
  // otherwise 0; whatever fails leaves the items as they were.
  // `length` bytes of `text` (embedded zero bytes included) become a new last item; 2 when the
  // list cannot grow.
  [[nodiscard]] int32_t AppendString(const char* text, size_t length);
  [[nodiscard]] int32_t AppendString(const char* cString);
  [[nodiscard]] int32_t AppendPStr(const uint8_t* pString);
  // Inserts before item `index`; `index` equal to the count appends. 42 when the list cannot grow.
  [[nodiscard]] int32_t InsertStringAt(const char* cString, uint32_t index);
  [[nodiscard]] int32_t ReplaceStringAt(const char* cString, uint32_t index);
  [[nodiscard]] int32_t RemoveString(uint32_t index);
  [[nodiscard]] int32_t RemoveAllStrings();
  // Makes room for `count` items in all; 2 when it cannot.
  [[nodiscard]] int32_t ReserveStringCount(uint32_t count);
  // AppendString(cString) and AppendPStr(pString); the status is dropped.
  TDWEnum& operator<<(const char* cString);
  TDWEnum& operator<<(const uint8_t* pString);

  // The interned equal enumeration; a null handle when this one is null or memory runs out.
  // This object stays private and usable.
  TDREnum CheckIn() const;
  TDWEnum Clone() const;
};
