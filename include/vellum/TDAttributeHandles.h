// Handles to the attributes a descriptor carries: its name and its typedef link (units and
// enumerations have their own headers). Read-only handles hold interned objects; writable ones
// hold private objects that a writable descriptor may take over.
#pragma once

#include <cstdint>
#include <string_view>
#include <string>

#include "runtime/PXPath.h"
#include "vellum/QualifiedName.h"
#include "vellum/TDHandles.h"

class TDAttribute {
 public:
  TDAttribute() noexcept = default;
  explicit TDAttribute(const TDAttributeImpPtr& p) noexcept : imp_(p) {}

  bool operator==(const TDAttribute& other) const noexcept { return imp_ == other.imp_; }
  explicit operator bool() const noexcept { return static_cast<bool>(imp_); }
  const TDAttributeImpPtr& GetAttributeImpPtr() const noexcept { return imp_; }

  // 1 in the attribute's own kind; 0 otherwise and for a null handle.
  int32_t IsNameAttribute() const;
  int32_t IsTypedefAttribute() const;
  int32_t IsEnumAttribute() const;
  int32_t IsUnitsAttribute() const;
  int32_t GetHashValue() const;
  // 1 when the handle holds an object.
  int32_t ValidateImpClass() const { return imp_ ? 1 : 0; }
  // Writes the attribute's dump (level 0); always 0.
  int32_t PrintDebugStr() const;

 protected:
  TDAttributeImpPtr imp_;
};

class TDWName;

class TDRName : public TDAttribute {
 public:
  TDRName() noexcept = default;
  // The interned name of that text; a null handle for a null or empty string.
  explicit TDRName(const uint8_t* cString);
  explicit TDRName(std::string_view text) : TDRName(vellum::detail::CName(text).Get()) {}
  // Holds `p` when `take` is nonzero and `p` is not null.
  TDRName(const TDNameImpPtr& p, int32_t take);

  TDNameImpPtr GetNameImpPtr() const;
  // The shared empty Pascal string when there is no text.
  const uint8_t* GetNamePStr() const;
  TDWName CheckOut() const;
};

class TDWName : public TDAttribute {
 public:
  TDWName() noexcept = default;
  // A new, private name object with that text (at most 255 bytes kept).
  explicit TDWName(const uint8_t* cString);
  explicit TDWName(std::string_view text) : TDWName(vellum::detail::CName(text).Get()) {}
  // Holds `p` when `take` is nonzero and `p` is a private object; an interned one is refused.
  TDWName(const TDNameImpPtr& p, int32_t take);

  TDNameImpPtr GetNameImpPtr() const;
  const uint8_t* GetNamePStr() const;
  // Replace the text; 42 for a null handle, 2 when the text cannot be allocated.
  [[nodiscard]] int32_t SetName(std::string_view name);
  [[nodiscard]] int32_t SetName(const uint8_t* cString);
  [[nodiscard]] int32_t SetNamePStr(const uint8_t* pString);

  TDRName CheckIn() const;
  TDWName Clone() const;
};

class TDWTypedef;

class TDRTypedef : public TDAttribute {
 public:
  TDRTypedef() noexcept = default;
  TDRTypedef(const TDTypedefImpPtr& p, int32_t take);

  TDTypedefImpPtr GetTypedefImpPtr() const;
  // The empty name, 0 and null for a null handle.
  QualifiedName GetVIName() const;
  uint32_t GetTimeStamp() const;
  // The definition's path, still owned by the typedef; null when it has none.
  Path GetVIPath() const;
  // 1 when the typedef holds a path.
  int32_t IsPathized() const;
  TDWTypedef CheckOut() const;
};

class TDWTypedef : public TDAttribute {
 public:
  TDWTypedef() noexcept = default;
  // A new, private typedef link. The path is copied (null for none).
  TDWTypedef(const QualifiedName& viName, uint32_t timeStamp, Path viPath);
  // Holds `p` when `take` is nonzero and `p` is a private object; an interned one is refused.
  TDWTypedef(const TDTypedefImpPtr& p, int32_t take);

  TDTypedefImpPtr GetTypedefImpPtr() const;
  QualifiedName GetVIName() const;
  uint32_t GetTimeStamp() const;
  Path GetVIPath() const;
  int32_t IsPathized() const;
  // Each replaces its field; 42 for a null handle, 2 when a copy cannot be allocated.
  [[nodiscard]] int32_t SetVIName(const QualifiedName& viName);
  [[nodiscard]] int32_t SetVIPath(Path viPath);
  [[nodiscard]] int32_t SetTimeStamp(uint32_t timeStamp);

  TDRTypedef CheckIn() const;
  TDWTypedef Clone() const;
};

// The string hash of names and the flattened-type cache: h = rotate-left(h + c, i mod 32) over the
// characters c, i counting from 1. A Pascal string stops after its length or at a zero byte.
int32_t GetPStrHashValue(const uint8_t* pString);
int32_t GetCStrHashValue(const uint8_t* cString);
int32_t GetNarrowStrHashValue(const std::string& text);
