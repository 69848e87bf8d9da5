// Handles of the string-like kinds built on the string base (String, SubString, Path, Pict) and
// the copy routines for their data, which the array and cluster families call too.
#pragma once

#include <cstdint>
#include <string_view>

#include "runtime/PXPath.h"
#include "runtime/PXTypes.h"
#include "vellum/TDHandles.h"

// The bound word of a string (and the size word of an array dimension): -1 variable length; a
// value >= 0 bounded (at most that many bytes); any other value with bit 31 set fixed at
// (value & 0x7FFFFFFF) bytes.
namespace vellum::bound {
constexpr int32_t kVariable = -1;
constexpr bool IsVariable(int32_t word) { return word == kVariable; }
constexpr bool IsFixed(int32_t word) { return word < kVariable; }
constexpr bool IsBounded(int32_t word) { return word >= 0; }
// The byte count of a fixed or bounded word; 0 for a variable one.
constexpr int32_t Length(int32_t word) { return IsVariable(word) ? 0 : (word & 0x7FFFFFFF); }
constexpr int32_t Fixed(int32_t length) { return static_cast<int32_t>(static_cast<uint32_t>(length) | 0x80000000u); }
}  // namespace vellum::bound

// The datum of a SubString: a view of bytes owned by someone else. Data produced here always has
// stride 1. Offsets 0, 8 and 16 in the running process.
struct SubStringRec {
  const uint8_t* dataPtr;
  int32_t length;
  intptr_t stride;
};
static_assert(sizeof(SubStringRec) == 24);

// --- copy routines -------------------------------------------------------------------------------
// Each returns a status: 1 for a null destination pointer (or bad source record), 2 when memory
// runs out. None of them checks that a handle is live; VerifyData does that.

// *dst becomes a copy of src (null: the empty string). A null *dst stays null for an empty source;
// a handle whose length word already matches is reused without resizing.
[[nodiscard]] int32_t CopyLStr(LStrHandle src, LStrHandle* dst);
// Copies into a preallocated fixed (bound < -1) or bounded (bound >= 0) string without resizing:
// at most the bound's length, the rest of a fixed string zeroed. 1 after a diagnostic when *dst
// holds fewer bytes than the bound needs, or a fixed string's length word is not its length;
// nothing is written then.
[[nodiscard]] int32_t CopyBndFixString(LStrHandle src, LStrHandle* dst, int32_t bound);
// A substring into a variable string. A record that points into *dst itself is moved down and
// the handle shrunk. 1 for a null record, a negative length, or a non-empty record with a null
// data pointer or a stride other than 1.
[[nodiscard]] int32_t CopySString(const SubStringRec* rec, LStrHandle* dst);
// As CopyBndFixString with the record's bytes; 1 after a diagnostic for a stride other than 1,
// 2 after a diagnostic when the preallocated handle is too small.
[[nodiscard]] int32_t CopySBndFixString(const SubStringRec* rec, LStrHandle* dst, int32_t bound);
// *dst becomes a copy of src, or the empty path for a null src. On failure (2) *dst is unchanged.
[[nodiscard]] int32_t CopyPath(Path src, Path* dst);

// --- kinds ---------------------------------------------------------------------------------------

struct StringBaseKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct StringKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct SubStringKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct PathKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct PictKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

// --- handles -------------------------------------------------------------------------------------
// Besides the default, named and pointer constructors, each kind takes (name, bound word); a null
// or empty name gives an unnamed descriptor, and a read-only handle checks the new descriptor in
// (null when memory runs out).

class TDRStringBase;
class TDWStringBase;

class TDRStringBase : public TDRTyped<TDRStringBase, TDWStringBase, TDR, StringBaseKind> {
 public:
  using TDRTyped::TDRTyped;
  // -1 for a null handle.
  int32_t GetBound() const;
};

class TDWStringBase : public TDWTyped<TDRStringBase, TDWStringBase, TDW, StringBaseKind> {
 public:
  using TDWTyped::TDWTyped;
  int32_t GetBound() const;
  // 42 for a null handle, else 0.
  [[nodiscard]] int32_t SetBound(int32_t bound);
};

class TDRString;
class TDWString;
class TDRSubString;
class TDWSubString;
class TDRPath;
class TDWPath;
class TDRPict;
class TDWPict;

class TDRString : public TDRTyped<TDRString, TDWString, TDRStringBase, StringKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRString(const uint8_t* name, int32_t bound);
  TDRString(std::string_view name, int32_t bound) : TDRString(vellum::detail::CName(name).Get(), bound) {}
  // A SubString with the same name and bound.
  TDRSubString ConvertToSubString() const;
};
class TDWString : public TDWTyped<TDRString, TDWString, TDWStringBase, StringKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWString(const uint8_t* name, int32_t bound);
  TDWString(std::string_view name, int32_t bound) : TDWString(vellum::detail::CName(name).Get(), bound) {}
  TDWSubString ConvertToSubString() const;
};

class TDRSubString : public TDRTyped<TDRSubString, TDWSubString, TDRStringBase, SubStringKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRSubString(const uint8_t* name, int32_t bound);
  TDRSubString(std::string_view name, int32_t bound) : TDRSubString(vellum::detail::CName(name).Get(), bound) {}
  // A String with the same name and bound.
  TDRString ConvertToString() const;
  // Where the record keeps its data pointer and its length: 0 and 8 in the running process.
  int32_t GetStringPtrOffset(ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetLengthOffset(ITargetPlatformAlignment* platform = nullptr) const;
};
class TDWSubString : public TDWTyped<TDRSubString, TDWSubString, TDWStringBase, SubStringKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWSubString(const uint8_t* name, int32_t bound);
  TDWSubString(std::string_view name, int32_t bound) : TDWSubString(vellum::detail::CName(name).Get(), bound) {}
  TDWString ConvertToString() const;
};

class TDRPath : public TDRTyped<TDRPath, TDWPath, TDRStringBase, PathKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRPath(const uint8_t* name, int32_t bound);
  TDRPath(std::string_view name, int32_t bound) : TDRPath(vellum::detail::CName(name).Get(), bound) {}
};
class TDWPath : public TDWTyped<TDRPath, TDWPath, TDWStringBase, PathKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWPath(const uint8_t* name, int32_t bound);
  TDWPath(std::string_view name, int32_t bound) : TDWPath(vellum::detail::CName(name).Get(), bound) {}
};

class TDRPict : public TDRTyped<TDRPict, TDWPict, TDRStringBase, PictKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRPict(const uint8_t* name, int32_t bound);
};
class TDWPict : public TDWTyped<TDRPict, TDWPict, TDWStringBase, PictKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWPict(const uint8_t* name, int32_t bound);
};

// The shared defaults (variable length, no name), built on first use and released when the
// service stops.
const TDR& GetStringTD();
const TDR& GetSubStringTD();
const TDR& GetPathTD();
const TDR& GetPictTD();
// The "SubStringRec" cluster {Ptr "dataPtr", Int32 "length", Ptr "stride"} that lays out a
// SubString datum for another platform.
const TDR& GetSubStringRecTD();
