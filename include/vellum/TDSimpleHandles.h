// Handles of the kinds without members: Void and the two Booleans (the 8-bit one, and the 16-bit
// one of old data).
#pragma once

#include <cstdint>

#include "vellum/TDHandles.h"

struct VoidKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct BooleanKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct BooleanU16Kind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRVoid;
class TDWVoid;
class TDRBoolean;
class TDWBoolean;
class TDRBooleanU16;
class TDWBooleanU16;

class TDRVoid : public TDRTyped<TDRVoid, TDWVoid, TDR, VoidKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWVoid : public TDWTyped<TDRVoid, TDWVoid, TDW, VoidKind> {
 public:
  using TDWTyped::TDWTyped;
};

class TDRBoolean : public TDRTyped<TDRBoolean, TDWBoolean, TDR, BooleanKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWBoolean : public TDWTyped<TDRBoolean, TDWBoolean, TDW, BooleanKind> {
 public:
  using TDWTyped::TDWTyped;
  // Flag 0x0002, which the type string records; 42 for a null handle, else 0.
  [[nodiscard]] int32_t SetEventDiscardMask(int32_t mask);
};

class TDRBooleanU16 : public TDRTyped<TDRBooleanU16, TDWBooleanU16, TDR, BooleanU16Kind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWBooleanU16 : public TDWTyped<TDRBooleanU16, TDWBooleanU16, TDW, BooleanU16Kind> {
 public:
  using TDWTyped::TDWTyped;
};

// The shared defaults, built on first use and released when the service stops.
const TDR& GetVoidTD();
const TDR& GetBoolTD();

// Replaces a writable Boolean descriptor by one of the other Boolean kind with the same name (no
// typedef, flags 0): to the 16-bit kind when toOld is nonzero, else to the 8-bit kind. 1 when
// replaced, 0 otherwise; a read-only descriptor is refused with a diagnostic.
int32_t MutateBooleanTD(TDImpPtr* type, int32_t toOld);
int32_t MutateBooleanTD(TDW* type, int32_t toOld);
