// Handles of the plain pointer kinds: CStr (a zero-terminated string) and PStr (a length-byte
// string), both owned by the caller and never copied by this library, Ptr (a raw pointer) and
// PtrTo (a pointer described by the type it points to).
#pragma once

#include <cstdint>

#include "vellum/TDContainerHandles.h"
#include "vellum/TDHandles.h"

struct CStrKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct PStrKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct PtrKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRCStr;
class TDWCStr;
class TDRPStr;
class TDWPStr;
class TDRPtr;
class TDWPtr;

class TDRCStr : public TDRTyped<TDRCStr, TDWCStr, TDR, CStrKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWCStr : public TDWTyped<TDRCStr, TDWCStr, TDW, CStrKind> {
 public:
  using TDWTyped::TDWTyped;
};

class TDRPStr : public TDRTyped<TDRPStr, TDWPStr, TDR, PStrKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWPStr : public TDWTyped<TDRPStr, TDWPStr, TDW, PStrKind> {
 public:
  using TDWTyped::TDWTyped;
};

class TDRPtr : public TDRTyped<TDRPtr, TDWPtr, TDR, PtrKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWPtr : public TDWTyped<TDRPtr, TDWPtr, TDW, PtrKind> {
 public:
  using TDWTyped::TDWTyped;
};

// A pointer described by its element (TDRSingleContainer::GetEltTD); the element is set through
// TDWSingleContainer::SetEltTD.
struct PtrToKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRPtrTo;
class TDWPtrTo;

class TDRPtrTo : public TDRTyped<TDRPtrTo, TDWPtrTo, TDRSingleContainer, PtrToKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWPtrTo : public TDWTyped<TDRPtrTo, TDWPtrTo, TDWSingleContainer, PtrToKind> {
 public:
  using TDWTyped::TDWTyped;
};
