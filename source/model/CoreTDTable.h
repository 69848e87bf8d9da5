// The interning dictionaries (one per interned kind), their registry, the table of recursive
// types and the garbage collection that removes what only a dictionary still holds.
#pragma once

#include <cstdint>
#include <optional>
#include <utility>

#include <boost/unordered_map.hpp>

#include "runtime/DSMemory.h"
#include "runtime/PXMutex.h"
#include "runtime/PXTypes.h"
#include "source/model/TDRefCountedPtr.h"
#include "vellum/Dictionaries.h"

class TDEventRegOMIdInfoImp;
class TDIVISubTypeImp;

// Holds interned objects keyed by their hash; equal objects (`InternEqual`, which must be
// visible where Find or Insert is used, as must `MarkInterned`) are kept once. Each dictionary has its own mutex, held
// for the whole of every operation; while it is held only the objects' hash and equality run.
template <class Ptr, class Imp>
class Dictionary : public ITDDictionary {
 public:
  explicit Dictionary(const char* name) : name_(name) {
    try {
      table_.emplace();
    } catch (const std::bad_alloc&) {
      table_.reset();  // behaves as empty; insertion reports 42
    }
    ThMutexCreate(&mutex_, "DictionaryMutex");
  }
  ~Dictionary() override {
    table_.reset();
    ThMutexDestroy(&mutex_);
  }
  Dictionary(const Dictionary&) = delete;
  Dictionary& operator=(const Dictionary&) = delete;

  // The interned object equal to `object`, with a new counted reference taken under the lock so
  // that a collection cannot remove it afterwards; null when there is none.
  Ptr Find(const Imp& object) const {
    const int32_t hash = object.GetHashValue();
    ThMutexLock lock(mutex_);
    return FindLocked(hash, object);
  }

  // Interns `object` unless an equal one is present, in which case `object` becomes that one.
  // 0; 2 when memory runs out (nothing interned); 42 when the dictionary has no table.
  int32_t Insert(Ptr& object) {
    if (!table_) return kStatusNullHandle;
    const int32_t hash = object->GetHashValue();
    ThMutexLock lock(mutex_);
    if (Ptr hit = FindLocked(hash, *object)) {
      object = hit;
      return kStatusNoError;
    }
    try {
      table_->emplace(hash, object);
    } catch (const std::bad_alloc&) {
      return kStatusOutOfMemory;
    }
    MarkInterned(*object);
    return kStatusNoError;
  }

  // Under the lock: a check-in on another thread may be growing the table meanwhile.
  uint32_t Size() const override {
    if (!table_) return 0;
    ThMutexLock lock(mutex_);
    return static_cast<uint32_t>(table_->size());
  }

  void Purge() override {
    if (!table_) return;
    ThMutexLock lock(mutex_);
    for (auto it = table_->begin(); it != table_->end();) {
      if (it->second.GetObject()->GetRefCount() == 1) {
        it = table_->erase(it);  // the object's destructor releases its members
      } else {
        ++it;
      }
    }
  }

  const char* Name() const override { return name_; }

  // Gives back the bucket array too (a fresh table allocates nothing until its first insertion),
  // so a stopped library holds no memory in its dictionaries.
  void Empty() override {
    if (!table_) return;
    Table doomed;
    {
      ThMutexLock lock(mutex_);
      table_->swap(doomed);
    }
  }

  // Calls `fn(Ptr&)` on every entry while holding the lock (the collection's marking walk).
  template <class Fn>
  void ForEachLocked(Fn&& fn) {
    if (!table_) return;
    ThMutexLock lock(mutex_);
    for (auto& entry : *table_) fn(entry.second);
  }

 private:
  using Table = boost::unordered_multimap<int32_t, Ptr, boost::hash<int32_t>, std::equal_to<int32_t>,
                                          PXAllocator<std::pair<const int32_t, Ptr>>>;

  Ptr FindLocked(int32_t hash, const Imp& object) const {
    if (!table_) return Ptr();
    auto range = table_->equal_range(hash);
    for (auto it = range.first; it != range.second; ++it) {
      if (InternEqual(*it->second, object)) return it->second;
    }
    return Ptr();
  }

  const char* name_;
  std::optional<Table> table_;
  ThMutex mutex_ = nullptr;
};

using TDDictionary = Dictionary<TDImpPtr, TDImp>;
using NameDictionary = Dictionary<TDNameImpPtr, TDNameImp>;
using TypedefDictionary = Dictionary<TDTypedefImpPtr, TDTypedefImp>;
using EnumDictionary = Dictionary<TDEnumImpPtr, TDEnumImp>;
using UnitsDictionary = Dictionary<TDUnitsImpPtr, TDUnitsImp>;
using EventRegOMIdInfoDictionary = Dictionary<TDTypedPtr<TDEventRegOMIdInfoImp>, TDEventRegOMIdInfoImp>;
using IVISubTypeDictionary = Dictionary<TDTypedPtr<TDIVISubTypeImp>, TDIVISubTypeImp>;
using OMIdDictionary = Dictionary<TDOMIdImpPtr, TDOMIdImp>;

TDDictionary& GTDDictionary();
NameDictionary& TheNameDictionary();
TypedefDictionary& TheTypedefDictionary();
EnumDictionary& TheEnumDictionary();
UnitsDictionary& TheUnitsDictionary();
EventRegOMIdInfoDictionary& TheEventRegOMIdInfoDictionary();
IVISubTypeDictionary& TheIVISubTypeDictionary();
OMIdDictionary& TheOMIdDictionary();

// Empties every registered dictionary in registration order and clears the registry.
void EmptyRegisteredDictionaries();

// The table of recursive types (functions and object references that can contain themselves).
// 0, or 2 when it cannot be allocated.
int32_t CreateRecursiveTypesTable();
void DestroyRecursiveTypesTable();

// The flattened-type cache's part in collection (entries removed and visited) and at stop.
using FlatTypeCacheCollectFn = void (*)(uint32_t* removed, uint32_t* visited);
using FlatTypeCacheEmptyFn = void (*)();
void SetFlatTypeCacheHooks(FlatTypeCacheCollectFn collect, FlatTypeCacheEmptyFn empty);
// Empties the flattened-type cache; called at stop before the dictionaries are emptied.
void EmptyingTypeDictionaries();
