// Handles of the tag kinds: string data that names an object of the host (a tag type, the
// application context it belongs to), and the user-defined tag with its class name.
#pragma once

#include <cstdint>

#include "vellum/TDHandles.h"
#include "vellum/TDStringHandles.h"

class KoVariant;

// 1 to 23 are the valid kinds; 5 is the user-defined one, which carries a class name. A plain tag
// can never become user-defined, nor the reverse.
using TagType = int32_t;
constexpr TagType kTagTypeUserDefined = 5;
// The kind of a tag made without one.
constexpr TagType kTagTypeDefault = 1;

// Compares the user data of two tags of descriptor `tag`: 0 and the order in *result, or a status.
using TagComparisonFunc = int32_t (*)(const TDR& tag, const KoVariant* a, const KoVariant* b, const KoContext* contextA,
                                      const KoContext* contextB, int32_t* result);

struct TagBaseKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct TagKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct UserDefinedTagKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

namespace vellum::detail {
// A new writable tag (user-defined for kTagTypeUserDefined, with a copy of `tagClass`, a PStr that
// may be null) with the name (null or empty for none) and bound word; null when memory runs out.
TDImpPtr NewTag(const uint8_t* name, int32_t bound, TagType tagType, const uint8_t* tagClass);
}  // namespace vellum::detail

class TDRTagBase;
class TDWTagBase;
class TDRTag;
class TDWTag;
class TDRUserDefinedTag;
class TDWUserDefinedTag;

class TDRTagBase : public TDRTyped<TDRTagBase, TDWTagBase, TDRStringBase, TagBaseKind> {
 public:
  using TDRTyped::TDRTyped;
  // 0 for a null handle.
  TagType GetTagType() const;

  // Installs the process-wide comparison of tags' user data (null removes it). Replacing one that
  // is installed reports the redefinition and goes on.
  static void SetComparisonFunc(TagComparisonFunc func);
  static TagComparisonFunc GetComparisonFunc();
};

class TDWTagBase : public TDWTyped<TDRTagBase, TDWTagBase, TDWStringBase, TagBaseKind> {
 public:
  using TDWTyped::TDWTyped;
  TagType GetTagType() const;
  // 0; 42 for a null handle; 1 after a diagnostic, with no change, for a change to or from the
  // user-defined kind.
  [[nodiscard]] int32_t SetTagType(TagType tagType);
};

class TDRTag : public TDRTyped<TDRTag, TDWTag, TDRTagBase, TagKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRTag(const uint8_t* name, int32_t bound);
  // Kind 5 gives a user-defined tag without a class.
  TDRTag(TagType tagType, const uint8_t* name);
  TDRTag(int32_t bound, TagType tagType, const uint8_t* name);
};

class TDWTag : public TDWTyped<TDRTag, TDWTag, TDWTagBase, TagKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWTag(const uint8_t* name, int32_t bound);
  TDWTag(TagType tagType, const uint8_t* name);
  TDWTag(int32_t bound, TagType tagType, const uint8_t* name);
};

// A tag of kind 5. Its class is a PStr of up to 255 bytes; an empty class is the same as none.
class TDRUserDefinedTag : public TDRTyped<TDRUserDefinedTag, TDWUserDefinedTag, TDRTagBase, UserDefinedTagKind> {
 public:
  TDRUserDefinedTag() = default;
  TDRUserDefinedTag(const TDImpPtr& p, int32_t check) : TDRTyped(p, check) {}
  TDRUserDefinedTag(const uint8_t* name, int32_t bound);
  // The class is copied; null for none. Bound -1, no name.
  explicit TDRUserDefinedTag(const uint8_t* tagClassPStr);

  int32_t HasTagClass() const;
  // The class as a PStr; the shared empty one when there is none.
  const uint8_t* GetTagClass() const;
};

class TDWUserDefinedTag : public TDWTyped<TDRUserDefinedTag, TDWUserDefinedTag, TDWTagBase, UserDefinedTagKind> {
 public:
  TDWUserDefinedTag() = default;
  TDWUserDefinedTag(const TDImpPtr& p, int32_t check) : TDWTyped(p, check) {}
  TDWUserDefinedTag(const uint8_t* name, int32_t bound);
  explicit TDWUserDefinedTag(const uint8_t* tagClassPStr);

  int32_t HasTagClass() const;
  const uint8_t* GetTagClass() const;
  // Each: 0, 42 for a null handle, 2 when memory runs out (class unchanged). Null or empty
  // removes the class; a CStr longer than 255 bytes keeps its first 255.
  [[nodiscard]] int32_t SetTagClass(const uint8_t* tagClassPStr);
  [[nodiscard]] int32_t SetTagClassCStr(const uint8_t* tagClassCStr);
};

// The shared default tag (kind 1, variable length, no name), built on first use.
const TDR& GetTagTD();
