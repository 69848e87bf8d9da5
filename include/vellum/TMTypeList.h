// The ordered list of read-only descriptors a saved file uses. Entries are numbered from 1 from
// outside; a slot may be empty (the null descriptor) and is reused by the next insertion.
#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "runtime/DSMemory.h"
#include "vellum/TDHandles.h"

// A list belongs to one thread at a time; the descriptors it holds may be shared freely.
class TMTypeList {
 public:
  // Reports "Couldn't initialize type list!" and stays without an array when memory runs out.
  TMTypeList();
  TMTypeList(const TMTypeList& other);
  // Copies the entries; when memory runs out the list is left empty (ReplaceAllTypes says so).
  TMTypeList& operator=(const TMTypeList& other);
  ~TMTypeList();

  // 0, and the new entry's 1-based position in *index (when given); 42 when the list is missing
  // or cannot grow.
  [[nodiscard]] int32_t AppendType(const TDR& type, uint32_t* index);
  // The stored handle, or the null descriptor on failure.
  const TDR& AppendType(const TDImpPtr& type, uint32_t* index);
  // Into the first empty slot when there is one, otherwise appended; 42 on failure.
  [[nodiscard]] int32_t InsertType(const TDR& type, uint32_t* index);
  // `position` is 1-based; 1 when it is 0 or beyond the count.
  [[nodiscard]] int32_t ReplaceType(uint32_t position, const TDR& type);
  [[nodiscard]] int32_t DeleteType(uint32_t position);
  [[nodiscard]] int32_t DeleteAllTypes();
  // The 0-based position of the first empty slot at or after the free hint, or -1.
  int32_t FindNullType();
  // Slots, empty ones included.
  int32_t GetNumTypes() const;
  // `position` is 0-based; the null descriptor beyond the end.
  const TDR& GetType(uint32_t position) const;
  // 0, 2 when the room cannot be allocated, 42 when the list is missing.
  [[nodiscard]] int32_t ReserveList(uint32_t count);
  [[nodiscard]] int32_t ReplaceAllTypes(const TMTypeList& other);
  // Sets the context on every entry that holds one somewhere, replacing it with the result.
  int32_t SetContextRecursive(const KoContext* context);
  // Gives every entry a share-group number (in a pointer block the caller frees with
  // DSDisposePtr); entries of the same type for data purposes share one. Numbering continues
  // from *groupCount, which ends one past the last number given.
  [[nodiscard]] int32_t BuildShareList(uint32_t** shareHandle, uint32_t* groupCount) const;

  // Slots the array can hold before it must grow; 0 when the list is missing.
  int32_t GetCapacity() const;
  // Whether the array exists (false only after an allocation failure at construction or copy).
  bool IsValid() const { return list_ != nullptr; }

 private:
  using Slots = std::vector<TDR, PXAllocator<TDR>>;
  struct SlotsDeleter {
    void operator()(Slots* slots) const noexcept;
  };
  using SlotsPtr = std::unique_ptr<Slots, SlotsDeleter>;
  static SlotsPtr NewSlots();

  // Storage in the list's own memory, so that allocation-failure injection reaches it.
  SlotsPtr list_;
  int32_t freeHint_ = 0;
};
