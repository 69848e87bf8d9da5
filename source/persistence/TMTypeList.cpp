// Type lists: a growable array of read-only descriptors with reusable empty slots.
#include "source/persistence/TMTypeList.h"

#include <algorithm>
#include <new>
#include <utility>

#include "runtime/DebugStream.h"
#include "runtime/PXTypes.h"

VELLUM_DIAGNOSTIC_MODULE("TMTypeList");

namespace {

// The array grows by a fixed step: lists are built once per file and rarely grow much past it.
constexpr size_t kGrowthStep = 100;

// Options of the share-group comparison: names, flag words and time stamps do not matter for
// data, typedef links do not either.
constexpr int32_t kShareCmpOptions = 0x8000241;

void ReportMissing(const char* text) { DebugReport(kDiagnosticModule, __LINE__, 2, text); }

}  // namespace

void TMTypeList::SlotsDeleter::operator()(Slots* slots) const noexcept {
  slots->~Slots();
  PXFree(slots);
}

TMTypeList::SlotsPtr TMTypeList::NewSlots() {
  void* memory = PXAlloc(sizeof(Slots));
  if (memory == nullptr) return SlotsPtr();
  return SlotsPtr(::new (memory) Slots());
}

TMTypeList::TMTypeList() : list_(NewSlots()) {
  if (!list_) DebugReport(kDiagnosticModule, __LINE__, 2, "Couldn't initialize type list!");
}

TMTypeList::TMTypeList(const TMTypeList& other) : list_(NewSlots()), freeHint_(other.freeHint_) {
  if (!list_) {
    DebugReport(kDiagnosticModule, __LINE__, 2, "Couldn't initialize type list!");
    return;
  }
  if (other.list_) {
    try {
      *list_ = *other.list_;
    } catch (const std::bad_alloc&) {
      list_->clear();
    }
  }
}

TMTypeList& TMTypeList::operator=(const TMTypeList& other) {
  // An assignment has no status: when memory runs out the list is left empty, as documented.
  if (this != &other) static_cast<void>(ReplaceAllTypes(other));
  return *this;
}

TMTypeList::~TMTypeList() = default;

int32_t TMTypeList::AppendType(const TDR& type, uint32_t* index) {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  try {
    if (list_->size() == list_->capacity()) list_->reserve(list_->size() + kGrowthStep);
    list_->push_back(type);
  } catch (const std::bad_alloc&) {
    return kStatusNullHandle;
  }
  if (index != nullptr) *index = static_cast<uint32_t>(list_->size());
  return kStatusNoError;
}

const TDR& TMTypeList::AppendType(const TDImpPtr& type, uint32_t* index) {
  if (AppendType(TDR(type, 1), index) != kStatusNoError) return GNullTD();
  return list_->back();
}

int32_t TMTypeList::InsertType(const TDR& type, uint32_t* index) {
  const int32_t slot = FindNullType();
  if (slot < 0) {
    if (AppendType(type, index) == kStatusNoError) return kStatusNoError;
    DebugReport(kDiagnosticModule, __LINE__, 2, "Failed to insert the type.");
    return kStatusNullHandle;
  }
  (*list_)[static_cast<size_t>(slot)] = type;
  if (index != nullptr) *index = static_cast<uint32_t>(slot) + 1;
  return kStatusNoError;
}

int32_t TMTypeList::ReplaceType(uint32_t position, const TDR& type) {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  if (position == 0 || position > list_->size()) return kStatusBadArgument;
  const size_t slot = position - 1;
  (*list_)[slot] = type;
  if (type.IsNull() && static_cast<int64_t>(slot) < freeHint_) freeHint_ = static_cast<int32_t>(slot);
  return kStatusNoError;
}

int32_t TMTypeList::DeleteType(uint32_t position) { return ReplaceType(position, GNullTD()); }

int32_t TMTypeList::DeleteAllTypes() {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  Slots().swap(*list_);
  freeHint_ = 0;
  return kStatusNoError;
}

int32_t TMTypeList::FindNullType() {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return -1;
  }
  for (size_t i = static_cast<size_t>(std::max(freeHint_, 0)); i < list_->size(); ++i) {
    if ((*list_)[i].IsNull()) {
      freeHint_ = static_cast<int32_t>(i);
      return freeHint_;
    }
  }
  return -1;
}

int32_t TMTypeList::GetNumTypes() const {
  if (!list_) {
    ReportMissing("Type manager wasn't properly initialized!");
    return 0;
  }
  return static_cast<int32_t>(list_->size());
}

const TDR& TMTypeList::GetType(uint32_t position) const {
  if (!list_) {
    ReportMissing("The type list is missing!");
    return GNullTD();
  }
  if (position >= list_->size()) return GNullTD();
  return (*list_)[position];
}

int32_t TMTypeList::ReserveList(uint32_t count) {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  try {
    list_->reserve(count);
  } catch (const std::exception&) {  // bad_alloc, or length_error for a count beyond any array
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TMTypeList::ReplaceAllTypes(const TMTypeList& other) {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  if (this == &other) return kStatusNoError;
  Slots().swap(*list_);
  freeHint_ = other.freeHint_;
  if (!other.list_) return kStatusNoError;
  try {
    *list_ = *other.list_;
  } catch (const std::bad_alloc&) {
    list_->clear();
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TMTypeList::SetContextRecursive(const KoContext* context) {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  for (TDR& entry : *list_) {
    if (entry.IsNull() || !entry.HoldsContextRecursive()) continue;
    TDW writable = entry.CheckOut();
    if (writable.IsNull()) return kStatusOutOfMemory;
    writable.SetContextRecursive(context);
    TDR replaced = writable.CheckIn();
    if (replaced.IsNull()) return kStatusOutOfMemory;
    entry = replaced;
  }
  return kStatusNoError;
}

int32_t TMTypeList::BuildShareList(uint32_t** shareHandle, uint32_t* groupCount) const {
  if (!list_) {
    ReportMissing("The type list is missing.");
    return kStatusNullHandle;
  }
  if (shareHandle == nullptr || groupCount == nullptr) return kStatusBadArgument;
  UPtr block = nullptr;
  if (DSNewPClr(list_->size() * sizeof(uint32_t), &block) != kStatusNoError || block == nullptr) {
    return kStatusOutOfMemory;
  }
  uint32_t* groups = reinterpret_cast<uint32_t*>(block);
  *shareHandle = groups;
  const Slots& slots = *list_;
  for (size_t i = 0; i < slots.size(); ++i) {
    bool matched = false;
    for (size_t j = 0; j < i && !slots[i].IsNull(); ++j) {
      if (slots[j].IsNull()) continue;
      if (slots[i].CmpTD(slots[j], kShareCmpOptions) == 0) {
        groups[i] = groups[j];
        matched = true;
        break;
      }
    }
    if (!matched) groups[i] = (*groupCount)++;
  }
  return kStatusNoError;
}

int32_t TMTypeList::GetCapacity() const { return list_ ? static_cast<int32_t>(list_->capacity()) : 0; }
