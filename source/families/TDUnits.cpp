// Units: key normalisation, the setters, hash, equality and order, the flattened form, the dump,
// interning and the units handles.
#include "source/families/TDUnits.h"

#include <bit>
#include <iterator>
#include <limits>
#include <new>
#include <string>

#include "runtime/DebugStream.h"
#include "source/model/CoreTDTable.h"
#include "source/model/TD.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDUnits");

namespace {

constexpr TDBaseUnits kSmallestPolymorphicKey = -9;

const char* const kBaseUnitText[] = {"radians", "steradians", "seconds",  "meters",  "kilograms",
                                     "amperes", "kelvins",    "moles",    "candelas", "invalid unit"};

// Sets or removes one entry of `map`; the map is unchanged when the insertion runs out of memory.
int32_t StoreExponent(TDUnitsImp::Map* map, TDBaseUnits unit, int32_t exponent) {
  if (exponent == 0) {
    map->erase(unit);
    return kStatusNoError;
  }
  try {
    (*map)[unit] = static_cast<int16_t>(exponent);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int16_t ExponentIn(const TDUnitsImp::Map* map, TDBaseUnits unit) {
  if (map == nullptr) return 0;
  const auto it = map->find(unit);
  return it != map->end() ? it->second : 0;
}

}  // namespace

int32_t NormalizeUnitKey(TDBaseUnits unit, TDBaseUnits* normalized) {
  if (unit > kUnitLargestKey) return kStatusBadArgument;
  *normalized = unit < 0 ? unit % 10 : unit;
  return kStatusNoError;
}

TDUnitsImp::TDUnitsImp() noexcept : map_(MakeUniqueInRuntime<Map>()) {}

TDUnitsImp::~TDUnitsImp() = default;

uint32_t TDUnitsImp::GetNumUnits() const { return map_ ? static_cast<uint32_t>(map_->size()) : 0; }

int32_t TDUnitsImp::GetUnits(uint32_t index, TDUnitPair* pair) const {
  if (!map_) return kStatusNullHandle;
  if (pair == nullptr || index >= map_->size()) return kStatusBadArgument;
  auto it = map_->begin();
  std::advance(it, index);
  pair->unit = it->first;
  pair->exponent = it->second;
  return kStatusNoError;
}

int16_t TDUnitsImp::GetExponent(TDBaseUnits unit) const {
  TDBaseUnits key = 0;
  if (NormalizeUnitKey(unit, &key) != kStatusNoError) return 0;
  return ExponentIn(map_.get(), key);
}

int32_t TDUnitsImp::HasPolyUnits() const {
  if (!map_) return 0;
  // Polymorphic keys sort first, and no entry has exponent 0.
  return !map_->empty() && map_->begin()->first < 0 ? 1 : 0;
}

int32_t TDUnitsImp::SetUnit(TDBaseUnits unit, int16_t exponent) {
  if (!map_) return kStatusNullHandle;
  TDBaseUnits key = 0;
  if (int32_t status = NormalizeUnitKey(unit, &key); status != kStatusNoError) return status;
  if (int32_t status = StoreExponent(map_.get(), key, exponent); status != kStatusNoError) return status;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDUnitsImp::IncreaseExponent(TDBaseUnits unit, int16_t delta) {
  if (!map_) return kStatusNullHandle;
  TDBaseUnits key = 0;
  if (int32_t status = NormalizeUnitKey(unit, &key); status != kStatusNoError) return status;
  const int32_t exponent = int32_t{ExponentIn(map_.get(), key)} + delta;
  // A wrapped exponent would silently turn meters^32767 * meters into meters^-32768.
  if (exponent > std::numeric_limits<int16_t>::max() || exponent < std::numeric_limits<int16_t>::min()) {
    return kStatusBadArgument;
  }
  if (int32_t status = StoreExponent(map_.get(), key, exponent); status != kStatusNoError) return status;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDUnitsImp::ClearAllUnits() {
  if (!map_) return kStatusNullHandle;
  map_->clear();
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDUnitsImp::ComputeHashValue() const {
  if (!map_) return 0;
  uint32_t hash = 0;
  int i = 1;
  for (const auto& [unit, exponent] : *map_) {
    const uint32_t term = static_cast<uint32_t>(int32_t{exponent} * 256) + static_cast<uint32_t>(unit);
    hash = std::rotl(hash + term, i++);
  }
  return static_cast<int32_t>(hash);
}

int32_t TDUnitsImp::IsEqual(const TDAttributeImp& other) const {
  if (this == &other) return 1;
  if (other.IsUnitsAttribute() == 0) return 0;
  const auto& units = static_cast<const TDUnitsImp&>(other);
  if (GetHashValue() != units.GetHashValue()) return 0;
  if (GetNumUnits() != units.GetNumUnits()) return 0;
  if (!map_) return 1;
  for (const auto& [unit, exponent] : *map_) {
    if (ExponentIn(units.map_.get(), unit) != exponent) return 0;
  }
  return 1;
}

int32_t TDUnitsImp::CompareForSorting(const TDUnitsImp& other) const {
  // At most 19 entries each, so the difference fits.
  const int32_t countDifference = static_cast<int32_t>(GetNumUnits()) - static_cast<int32_t>(other.GetNumUnits());
  if (countDifference != 0) return countDifference;
  // Walking the keys of both sides, not only this one's, keeps the order antisymmetric: units
  // {s, m} and {m, kg} would otherwise each sort after the other.
  for (TDBaseUnits unit = kSmallestPolymorphicKey; unit <= kUnitLargestKey; ++unit) {
    const int32_t difference = int32_t{ExponentIn(map_.get(), unit)} - ExponentIn(other.map_.get(), unit);
    if (difference != 0) return difference;
  }
  return 0;
}

void TDUnitsImp::AddFlatSize(int32_t* size, const TDDataWriter*) const {
  if (map_) *size += 2 + 4 * static_cast<int32_t>(map_->size());
}

int32_t TDUnitsImp::Flatten(TDDataWriter* writer) const {
  if (!map_) {
    writer->SetError(kStatusNullHandle);
    return writer->GetError();
  }
  writer->WriteU16(static_cast<uint16_t>(map_->size()));
  for (const auto& [unit, exponent] : *map_) {
    writer->WriteI16(static_cast<int16_t>(unit));
    writer->WriteI16(exponent);
  }
  return writer->GetError();
}

int32_t TDUnitsImp::UnFlatten(TDDataReader* reader) {
  if (!map_) {
    reader->SetError(kStatusNullHandle);
    return reader->GetError();
  }
  uint16_t count = 0;
  if (int32_t status = reader->ReadU16(&count); status != kStatusNoError) return status;
  Map entries;
  for (uint32_t i = 0; i < count; ++i) {
    int16_t unit = 0;
    int16_t exponent = 0;
    reader->ReadI16(&unit);
    if (int32_t status = reader->ReadI16(&exponent); status != kStatusNoError) return status;
    TDBaseUnits key = 0;
    int32_t status = NormalizeUnitKey(unit, &key);
    if (status == kStatusNoError) status = StoreExponent(&entries, key, exponent);
    if (status != kStatusNoError) {
      reader->SetError(status);
      return status;
    }
  }
  map_->swap(entries);
  ClearHashValid();
  return kStatusNoError;
}

void TDUnitsImp::PrintDebugStr(const uint8_t* prefix) const {
  if (!map_) return;
  const std::string lead = PrefixText(prefix);
  (VELLUM_DEBUG(0) << lead << "# of units = " << map_->size()).Process();
  (VELLUM_DEBUG(0) << lead << "units = {").Process();
  for (const auto& [unit, exponent] : *map_) {
    if (unit < 0) {
      (VELLUM_DEBUG(0) << lead << "\tpolymorphic unit " << -unit << " ^ " << exponent).Process();
    } else {
      (VELLUM_DEBUG(0) << lead << "\t" << kBaseUnitText[unit] << " ^ " << exponent).Process();
    }
  }
  (VELLUM_DEBUG(0) << lead << "\t}").Process();
}

TDUnitsImpPtr TDUnitsImp::CheckIn() const {
  UnitsDictionary& dictionary = TheUnitsDictionary();
  if (TDUnitsImpPtr hit = dictionary.Find(*this)) return hit;
  TDUnitsImpPtr copy = CloneOrCheckOut();
  if (!copy) return copy;
  if (dictionary.Insert(copy) != kStatusNoError) return TDUnitsImpPtr();
  return copy;
}

TDUnitsImpPtr TDUnitsImp::CloneOrCheckOut() const {
  TDUnitsImpPtr copy = MakeCounted<TDUnitsImp>();
  if (!copy || !copy->map_) return TDUnitsImpPtr();
  if (map_) {
    try {
      *copy->map_ = *map_;
    } catch (const std::bad_alloc&) {
      return TDUnitsImpPtr();
    }
  }
  return copy;
}

// --- handles --------------------------------------------------------------------------------------

namespace {

TDUnitsImp* UnitsOf(const TDAttributeImpPtr& p) {
  return p && p->IsUnitsAttribute() != 0 ? static_cast<TDUnitsImp*>(p.get()) : nullptr;
}

uint32_t NumUnits(const TDAttributeImpPtr& p) {
  const TDUnitsImp* units = UnitsOf(p);
  return units != nullptr ? units->GetNumUnits() : 0;
}

int32_t UnitsAt(const TDAttributeImpPtr& p, uint32_t index, TDUnitPair* pair) {
  const TDUnitsImp* units = UnitsOf(p);
  return units != nullptr ? units->GetUnits(index, pair) : kStatusNullHandle;
}

int16_t ExponentOf(const TDAttributeImpPtr& p, TDBaseUnits unit) {
  const TDUnitsImp* units = UnitsOf(p);
  return units != nullptr ? units->GetExponent(unit) : 0;
}

int32_t PolyUnits(const TDAttributeImpPtr& p) {
  const TDUnitsImp* units = UnitsOf(p);
  return units != nullptr ? units->HasPolyUnits() : 0;
}

bool Sane(const TDAttributeImpPtr& p) {
  const TDUnitsImp* units = UnitsOf(p);
  return units != nullptr && units->HasMap();
}

TDUnitsImpPtr UnitsPtr(const TDAttributeImpPtr& p) {
  return UnitsOf(p) != nullptr ? p.StaticCast<TDUnitsImp>() : TDUnitsImpPtr();
}

}  // namespace

TDRUnits::TDRUnits(const TDUnitsImpPtr& p, int32_t take) {
  if (take != 0 && p) imp_ = p;
}

TDUnitsImpPtr TDRUnits::GetUnitsImpPtr() const { return UnitsPtr(imp_); }
uint32_t TDRUnits::GetNumUnits() const { return NumUnits(imp_); }
int32_t TDRUnits::GetUnits(uint32_t index, TDUnitPair* pair) const { return UnitsAt(imp_, index, pair); }
int16_t TDRUnits::GetExponent(TDBaseUnits unit) const { return ExponentOf(imp_, unit); }
int32_t TDRUnits::HasPolyUnits() const { return PolyUnits(imp_); }
bool TDRUnits::IsSane() const { return Sane(imp_); }

int32_t TDRUnits::UnitsMatch(const TDRUnits& other) const {
  const TDUnitsImp* units = UnitsOf(imp_);
  const TDUnitsImp* others = UnitsOf(other.imp_);
  if (units == nullptr || others == nullptr) return 0;
  return units->IsEqual(*others);
}

TDWUnits TDRUnits::CheckOut() const {
  const TDUnitsImp* units = UnitsOf(imp_);
  if (units == nullptr) return TDWUnits(TDUnitsImpPtr(), 0);
  return TDWUnits(units->CloneOrCheckOut(), 1);
}

TDWUnits::TDWUnits() { imp_ = MakeCounted<TDUnitsImp>(); }

TDWUnits::TDWUnits(const TDUnitsImpPtr& p, int32_t take) {
  if (take != 0 && p && !p->IsInterned()) imp_ = p;
}

TDUnitsImpPtr TDWUnits::GetUnitsImpPtr() const { return UnitsPtr(imp_); }
uint32_t TDWUnits::GetNumUnits() const { return NumUnits(imp_); }
int32_t TDWUnits::GetUnits(uint32_t index, TDUnitPair* pair) const { return UnitsAt(imp_, index, pair); }
int16_t TDWUnits::GetExponent(TDBaseUnits unit) const { return ExponentOf(imp_, unit); }
int32_t TDWUnits::HasPolyUnits() const { return PolyUnits(imp_); }
bool TDWUnits::IsSane() const { return Sane(imp_); }

int32_t TDWUnits::SetUnit(TDBaseUnits unit, int16_t exponent) {
  TDUnitsImp* units = UnitsOf(imp_);
  return units != nullptr ? units->SetUnit(unit, exponent) : kStatusNullHandle;
}

int32_t TDWUnits::IncreaseExponent(TDBaseUnits unit, int16_t delta) {
  TDUnitsImp* units = UnitsOf(imp_);
  return units != nullptr ? units->IncreaseExponent(unit, delta) : kStatusNullHandle;
}

int32_t TDWUnits::ClearAllUnits() {
  TDUnitsImp* units = UnitsOf(imp_);
  return units != nullptr ? units->ClearAllUnits() : kStatusNullHandle;
}

TDWUnits& TDWUnits::operator<<(std::pair<TDBaseUnits, int16_t> power) {
  static_cast<void>(IncreaseExponent(power.first, power.second));  // a chain drops statuses
  return *this;
}

TDRUnits TDWUnits::CheckIn() const {
  const TDUnitsImp* units = UnitsOf(imp_);
  if (units == nullptr) return TDRUnits();
  return TDRUnits(units->CheckIn(), 1);
}

TDWUnits TDWUnits::Clone() const {
  const TDUnitsImp* units = UnitsOf(imp_);
  if (units == nullptr) return TDWUnits(TDUnitsImpPtr(), 0);
  return TDWUnits(units->CloneOrCheckOut(), 1);
}
