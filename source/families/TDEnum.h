// Enumerations: the interned attribute that names the values of an enumerated unsigned integer,
// with its editing, hash, orders, flattened form and dump.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/PXUnique.h"
#include "source/model/TDAttributes.h"
#include "vellum/TDEnumHandles.h"

class TDEnumImp final : public TDAttributeImp {
 public:
  // The flattened count is 16 bits; an enumeration with more items cannot be stored.
  static constexpr uint32_t kMaxFlatItems = 0xFFFF;

  // An empty enumeration. When its storage cannot be allocated the object has no list: it has
  // no items, editing answers 42 and it does not flatten.
  TDEnumImp() noexcept;
  ~TDEnumImp() override;

  int32_t ComputeHashValue() const override;
  int32_t IsEqual(const TDAttributeImp& other) const override;
  // 2 plus length + 1 per item, rounded up to even; nothing for an object without storage.
  void AddFlatSize(int32_t* size, const TDDataWriter* writer) const override;
  // Item count (16 bits), each item as a Pascal string, then one zero byte when the items'
  // bytes (length bytes included) are odd in total. 42 without storage; 1 (after a diagnostic)
  // for more than 65535 items.
  int32_t Flatten(TDDataWriter* writer) const override;
  // Replaces the items with the ones read. On failure (the reader's status, 2 when memory runs
  // out) the reader keeps the error and the items are left as they were. 42 without storage.
  int32_t UnFlatten(TDDataReader* reader) override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsEnumAttribute() const override { return 1; }

  bool HasList() const { return items_ != nullptr; }
  uint32_t GetNumStrings() const;
  // Null when out of range.
  const uint8_t* GetEltPStr(uint32_t index) const;

  // Statuses as on TDWEnum. `bytes` may be null only when `length` is 0.
  int32_t AppendString(const uint8_t* bytes, size_t length);
  int32_t InsertStringAt(const uint8_t* bytes, size_t length, uint32_t index);
  int32_t ReplaceStringAt(const uint8_t* bytes, size_t length, uint32_t index);
  int32_t RemoveString(uint32_t index);
  int32_t RemoveAllStrings();
  int32_t ReserveStringCount(uint32_t count);

  // 3 the same items, 1 this list is a proper prefix of other's, 2 other's is a proper prefix
  // of this one, 0 otherwise.
  int32_t ComparePrefix(const TDEnumImp& other) const;
  // A total order for sorting descriptors: the item counts first, then the first differing
  // item in Pascal-string order. <0, 0 or >0; 0 exactly when the items are equal.
  int32_t CompareForSorting(const TDEnumImp& other) const;

  // The interned equal enumeration (inserting a copy when there is none); null when memory runs
  // out.
  TDEnumImpPtr CheckIn() const;
  // A new private copy with storage; null when memory runs out.
  TDEnumImpPtr CloneOrCheckOut() const;

 private:
  struct DisposeItem {
    void operator()(uint8_t* item) const noexcept { DSDisposePtr(item); }
  };
  // One item: a Pascal string in a runtime pointer block.
  using Item = std::unique_ptr<uint8_t, DisposeItem>;
  using List = std::vector<Item, PXAllocator<Item>>;

  static int32_t MakeItem(const uint8_t* bytes, size_t length, Item* item);
  static int32_t CopyList(const List& from, List* to);

  RuntimeUniquePtr<List> items_;
};
