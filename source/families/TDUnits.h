// Units: the interned attribute that gives a number its physical dimension, as exponents of base
// and polymorphic unit keys, with its hash, order, flattened form and dump.
#pragma once

#include <cstdint>
#include <functional>
#include <map>

#include "runtime/DSMemory.h"
#include "runtime/PXUnique.h"
#include "source/model/TDAttributes.h"
#include "vellum/TDUnitsHandles.h"

// Normalises a key for the setters: 1 for a key above 9; a negative key k becomes k % 10
// (truncated toward zero), so -10 is 0 and -11 is -1.
int32_t NormalizeUnitKey(TDBaseUnits unit, TDBaseUnits* normalized);

class TDUnitsImp final : public TDAttributeImp {
 public:
  // The exponents by key, in key order; no entry is 0.
  using Map = std::map<TDBaseUnits, int16_t, std::less<TDBaseUnits>,
                       PXAllocator<std::pair<const TDBaseUnits, int16_t>>>;

  // An empty units object. When its storage cannot be allocated the object has no map: it has
  // no units, its setters answer 42 and it does not flatten.
  TDUnitsImp() noexcept;
  ~TDUnitsImp() override;

  int32_t ComputeHashValue() const override;
  int32_t IsEqual(const TDAttributeImp& other) const override;
  // 2 + 4 per entry; nothing for an object without storage.
  void AddFlatSize(int32_t* size, const TDDataWriter* writer) const override;
  // Entry count (16 bits), then key and exponent (16 bits each) per entry in key order.
  // 42 without storage.
  int32_t Flatten(TDDataWriter* writer) const override;
  // Replaces the entries with the ones read, normalised as by SetUnit. On failure (the reader's
  // status, 1 for a key above 9, 2 when memory runs out) the reader keeps the error and the
  // entries are left as they were. 42 without storage.
  int32_t UnFlatten(TDDataReader* reader) override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsUnitsAttribute() const override { return 1; }

  bool HasMap() const { return map_ != nullptr; }
  uint32_t GetNumUnits() const;
  int32_t GetUnits(uint32_t index, TDUnitPair* pair) const;
  int16_t GetExponent(TDBaseUnits unit) const;
  int32_t HasPolyUnits() const;

  // Statuses as on TDWUnits; 2 when a new entry cannot be allocated (nothing changes).
  int32_t SetUnit(TDBaseUnits unit, int16_t exponent);
  int32_t IncreaseExponent(TDBaseUnits unit, int16_t delta);
  int32_t ClearAllUnits();

  // A total order for sorting descriptors: the entry counts first, then the exponents compared
  // key by key in key order over the keys of both (an absent key counting as 0). <0, 0 or >0;
  // 0 exactly when the units are equal.
  int32_t CompareForSorting(const TDUnitsImp& other) const;

  // The interned equal units (inserting a copy when there is none); null when memory runs out.
  TDUnitsImpPtr CheckIn() const;
  // A new private copy with storage; null when memory runs out.
  TDUnitsImpPtr CloneOrCheckOut() const;

 private:
  RuntimeUniquePtr<Map> map_;
};
