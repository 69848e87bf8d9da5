// Handles to units: products of powers of the SI base units and of up to nine polymorphic units,
// attached to floating and complex numbers. Read-only handles hold interned objects.
#pragma once

#include <cstdint>
#include <utility>

#include "vellum/TDAttributeHandles.h"
#include "vellum/TDHandles.h"

// A unit key. Keys 0 to 9 are the base units below; -1 to -9 are polymorphic units 1 to 9, which
// stand for whatever unit a caller supplies later.
using TDBaseUnits = int32_t;
constexpr TDBaseUnits kUnitRadians = 0;
constexpr TDBaseUnits kUnitSteradians = 1;
constexpr TDBaseUnits kUnitSeconds = 2;
constexpr TDBaseUnits kUnitMeters = 3;
constexpr TDBaseUnits kUnitKilograms = 4;
constexpr TDBaseUnits kUnitAmperes = 5;
constexpr TDBaseUnits kUnitKelvins = 6;
constexpr TDBaseUnits kUnitMoles = 7;
constexpr TDBaseUnits kUnitCandelas = 8;
constexpr TDBaseUnits kUnitInvalid = 9;
constexpr TDBaseUnits kUnitLargestKey = 9;
// Polymorphic unit n (1 to 9).
constexpr TDBaseUnits PolymorphicUnit(int32_t n) { return -n; }

// One entry of a units object: a key and its nonzero exponent.
struct TDUnitPair {
  TDBaseUnits unit = 0;
  int16_t exponent = 0;
};

class TDWUnits;

class TDRUnits : public TDAttribute {
 public:
  // A null handle: no units.
  TDRUnits() noexcept = default;
  // Holds `p` when `take` is nonzero and `p` is not null.
  TDRUnits(const TDUnitsImpPtr& p, int32_t take);

  TDUnitsImpPtr GetUnitsImpPtr() const;
  // 0 for a null handle or an object without storage.
  uint32_t GetNumUnits() const;
  // The index-th entry in key order: 0; 1 for an index out of range or a null `pair`; 42 for a
  // null handle or an object without storage.
  [[nodiscard]] int32_t GetUnits(uint32_t index, TDUnitPair* pair) const;
  // The key's exponent (negative keys normalised as the setters do); 0 when absent, for a key
  // above 9 and for a null handle.
  int16_t GetExponent(TDBaseUnits unit) const;
  // 1 when some polymorphic unit has a nonzero exponent.
  int32_t HasPolyUnits() const;
  // The handle holds an object that has its storage.
  bool IsSane() const;
  // 0 when either handle is null; otherwise 1 when the units are equal.
  int32_t UnitsMatch(const TDRUnits& other) const;

  // A new, private copy; a null handle when this one is null or memory runs out.
  TDWUnits CheckOut() const;
};

class TDWUnits : public TDAttribute {
 public:
  // A new, private, empty units object (null only when memory runs out).
  TDWUnits();
  // Holds `p` when `take` is nonzero and `p` is a private object; an interned one is refused.
  TDWUnits(const TDUnitsImpPtr& p, int32_t take);

  TDUnitsImpPtr GetUnitsImpPtr() const;
  uint32_t GetNumUnits() const;
  [[nodiscard]] int32_t GetUnits(uint32_t index, TDUnitPair* pair) const;
  int16_t GetExponent(TDBaseUnits unit) const;
  int32_t HasPolyUnits() const;
  bool IsSane() const;

  // Setters: 42 for a null handle or an object without storage; 1 for a key above 9 (nothing
  // changes). A negative key k stands for k % 10 (truncated): -12 is polymorphic unit 2, -10 is
  // radians. SetUnit with exponent 0 removes the key.
  [[nodiscard]] int32_t SetUnit(TDBaseUnits unit, int16_t exponent);
  // Adds `delta` to the key's exponent; a result of 0 removes the key. 1 when the result would
  // not fit in 16 bits (nothing changes).
  [[nodiscard]] int32_t IncreaseExponent(TDBaseUnits unit, int16_t delta);
  [[nodiscard]] int32_t ClearAllUnits();
  // IncreaseExponent(unit, exponent); the status is dropped.
  TDWUnits& operator<<(std::pair<TDBaseUnits, int16_t> power);

  // The interned equal units; a null handle when this one is null or memory runs out. This
  // object stays private and usable.
  TDRUnits CheckIn() const;
  TDWUnits Clone() const;
};
