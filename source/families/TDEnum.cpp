// Enumerations: editing of the item list, hash, equality and the two orders, the flattened form
// with its pad byte, the dump, interning and the enumeration handles.
#include "source/families/TDEnum.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>
#include <string>
#include <utility>

#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"
#include "source/model/CoreTDTable.h"
#include "source/model/TD.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDEnum");

namespace {

constexpr size_t kMaxItemLength = 255;

}  // namespace

TDEnumImp::TDEnumImp() noexcept : items_(MakeUniqueInRuntime<List>()) {}

TDEnumImp::~TDEnumImp() = default;

int32_t TDEnumImp::MakeItem(const uint8_t* bytes, size_t length, Item* item) {
  if (bytes == nullptr && length != 0) return kStatusBadArgument;
  length = std::min(length, kMaxItemLength);
  UPtr block = nullptr;
  if (DSNewPtr(length + 1, &block) != kStatusNoError) return kStatusOutOfMemory;
  block[0] = static_cast<uint8_t>(length);
  MoveBlock(bytes, block + 1, length);
  item->reset(block);
  return kStatusNoError;
}

int32_t TDEnumImp::CopyList(const List& from, List* to) {
  List copy;
  try {
    copy.reserve(from.size());
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  for (const Item& item : from) {
    Item made;
    if (int32_t status = MakeItem(item.get() + 1, item.get()[0], &made); status != kStatusNoError) return status;
    copy.push_back(std::move(made));  // room was reserved
  }
  to->swap(copy);
  return kStatusNoError;
}

uint32_t TDEnumImp::GetNumStrings() const { return items_ ? static_cast<uint32_t>(items_->size()) : 0; }

const uint8_t* TDEnumImp::GetEltPStr(uint32_t index) const {
  if (!items_ || index >= items_->size()) return nullptr;
  return (*items_)[index].get();
}

int32_t TDEnumImp::AppendString(const uint8_t* bytes, size_t length) {
  if (!items_) return kStatusNullHandle;
  // Inserting reports a list that cannot grow as 42; appending reports it as out of memory.
  const int32_t status = InsertStringAt(bytes, length, GetNumStrings());
  return status == kStatusNullHandle ? kStatusOutOfMemory : status;
}

int32_t TDEnumImp::InsertStringAt(const uint8_t* bytes, size_t length, uint32_t index) {
  if (!items_) return kStatusNullHandle;
  if (index > items_->size()) return kStatusBadArgument;
  Item item;
  if (int32_t status = MakeItem(bytes, length, &item); status != kStatusNoError) return status;
  try {
    items_->insert(items_->begin() + index, std::move(item));
  } catch (const std::bad_alloc&) {
    return kStatusNullHandle;  // the list cannot grow; `item` is disposed, the list unchanged
  }
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDEnumImp::ReplaceStringAt(const uint8_t* bytes, size_t length, uint32_t index) {
  if (!items_) return kStatusNullHandle;
  if (index >= items_->size()) return kStatusBadArgument;
  Item item;
  if (int32_t status = MakeItem(bytes, length, &item); status != kStatusNoError) return status;
  (*items_)[index] = std::move(item);
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDEnumImp::RemoveString(uint32_t index) {
  if (!items_) return kStatusNullHandle;
  if (index >= items_->size()) return kStatusBadArgument;
  items_->erase(items_->begin() + index);
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDEnumImp::RemoveAllStrings() {
  if (!items_) return kStatusNullHandle;
  items_->clear();
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDEnumImp::ReserveStringCount(uint32_t count) {
  if (!items_) return kStatusNullHandle;
  try {
    items_->reserve(count);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  } catch (const std::length_error&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDEnumImp::ComputeHashValue() const {
  if (!items_) return 0;
  uint32_t hash = 0;
  int i = 1;
  for (const Item& item : *items_) {
    hash = std::rotl(static_cast<uint32_t>(GetPStrHashValue(item.get())) + hash, i++ % 32);
  }
  return static_cast<int32_t>(hash);
}

int32_t TDEnumImp::IsEqual(const TDAttributeImp& other) const {
  if (this == &other) return 1;
  if (other.IsEnumAttribute() == 0) return 0;
  const auto& enumeration = static_cast<const TDEnumImp&>(other);
  if (GetHashValue() != enumeration.GetHashValue()) return 0;
  const uint32_t count = GetNumStrings();
  if (count != enumeration.GetNumStrings()) return 0;
  for (uint32_t i = 0; i < count; ++i) {
    if (PStrCmp(GetEltPStr(i), enumeration.GetEltPStr(i)) != 0) return 0;
  }
  return 1;
}

int32_t TDEnumImp::ComparePrefix(const TDEnumImp& other) const {
  const uint32_t count = GetNumStrings();
  const uint32_t otherCount = other.GetNumStrings();
  for (uint32_t i = std::min(count, otherCount); i > 0; --i) {
    if (PStrCmp(GetEltPStr(i - 1), other.GetEltPStr(i - 1)) != 0) return 0;
  }
  if (count == otherCount) return 3;
  return count < otherCount ? 1 : 2;
}

int32_t TDEnumImp::CompareForSorting(const TDEnumImp& other) const {
  const int64_t countDifference = int64_t{GetNumStrings()} - int64_t{other.GetNumStrings()};
  if (countDifference != 0) {
    return static_cast<int32_t>(std::clamp<int64_t>(countDifference, std::numeric_limits<int32_t>::min(),
                                                    std::numeric_limits<int32_t>::max()));
  }
  const uint32_t count = GetNumStrings();
  for (uint32_t i = 0; i < count; ++i) {
    if (int32_t order = PStrCmp(GetEltPStr(i), other.GetEltPStr(i)); order != 0) return order;
  }
  return 0;
}

void TDEnumImp::AddFlatSize(int32_t* size, const TDDataWriter*) const {
  if (!items_) return;
  int64_t itemBytes = 0;
  for (const Item& item : *items_) itemBytes += item.get()[0] + 1;
  const int64_t flatSize = (2 + itemBytes + 1) & ~int64_t{1};
  *size += static_cast<int32_t>(std::min<int64_t>(flatSize, std::numeric_limits<int32_t>::max()));
}

int32_t TDEnumImp::Flatten(TDDataWriter* writer) const {
  if (!items_) {
    writer->SetError(kStatusNullHandle);
    return writer->GetError();
  }
  if (items_->size() > kMaxFlatItems) {
    (VELLUM_DEBUG(2) << "Too many enum items to flatten: " << items_->size()).Process();
    writer->SetError(kStatusBadArgument);
    return writer->GetError();
  }
  writer->WriteU16(static_cast<uint16_t>(items_->size()));
  uint32_t itemBytes = 0;
  for (const Item& item : *items_) {
    writer->WritePStr(item.get());
    itemBytes += item.get()[0] + 1u;
  }
  if (itemBytes % 2 != 0) writer->WriteU8(0);
  return writer->GetError();
}

int32_t TDEnumImp::UnFlatten(TDDataReader* reader) {
  if (!items_) {
    reader->SetError(kStatusNullHandle);
    return reader->GetError();
  }
  uint16_t count = 0;
  if (int32_t status = reader->ReadU16(&count); status != kStatusNoError) return status;
  List items;
  uint32_t itemBytes = 0;
  for (uint32_t i = 0; i < count; ++i) {
    uint8_t text[256] = {};
    if (int32_t status = reader->ReadPStr(text); status != kStatusNoError) return status;
    Item item;
    int32_t status = MakeItem(text + 1, text[0], &item);
    if (status == kStatusNoError) {
      try {
        items.push_back(std::move(item));
      } catch (const std::bad_alloc&) {
        status = kStatusOutOfMemory;
      }
    }
    if (status != kStatusNoError) {
      reader->SetError(status);
      return status;
    }
    itemBytes += text[0] + 1u;
  }
  if (itemBytes % 2 != 0) {
    if (int32_t status = reader->Skip(1); status != kStatusNoError) return status;
  }
  items_->swap(items);
  ClearHashValid();
  return kStatusNoError;
}

void TDEnumImp::PrintDebugStr(const uint8_t* prefix) const {
  if (!items_) return;
  const std::string lead = PrefixText(prefix);
  (VELLUM_DEBUG(0) << lead << "# enum elements = " << items_->size()).Process();
  (VELLUM_DEBUG(0) << lead << "enum = {").Process();
  for (const Item& item : *items_) (VELLUM_DEBUG(0) << lead << "\t").AppendPStr(item.get()).Process();
  (VELLUM_DEBUG(0) << lead << "\t}").Process();
}

TDEnumImpPtr TDEnumImp::CheckIn() const {
  EnumDictionary& dictionary = TheEnumDictionary();
  if (TDEnumImpPtr hit = dictionary.Find(*this)) return hit;
  TDEnumImpPtr copy = CloneOrCheckOut();
  if (!copy) return copy;
  if (dictionary.Insert(copy) != kStatusNoError) return TDEnumImpPtr();
  return copy;
}

TDEnumImpPtr TDEnumImp::CloneOrCheckOut() const {
  TDEnumImpPtr copy = MakeCounted<TDEnumImp>();
  if (!copy || !copy->items_) return TDEnumImpPtr();
  if (items_ && CopyList(*items_, copy->items_.get()) != kStatusNoError) return TDEnumImpPtr();
  return copy;
}

// --- handles --------------------------------------------------------------------------------------

namespace {

TDEnumImp* EnumOf(const TDAttributeImpPtr& p) {
  return p && p->IsEnumAttribute() != 0 ? static_cast<TDEnumImp*>(p.get()) : nullptr;
}

TDEnumImpPtr EnumPtr(const TDAttributeImpPtr& p) {
  return EnumOf(p) != nullptr ? p.StaticCast<TDEnumImp>() : TDEnumImpPtr();
}

uint32_t NumStrings(const TDAttributeImpPtr& p) {
  const TDEnumImp* enumeration = EnumOf(p);
  return enumeration != nullptr ? enumeration->GetNumStrings() : 0;
}

const uint8_t* EltPStr(const TDAttributeImpPtr& p, uint32_t index) {
  const TDEnumImp* enumeration = EnumOf(p);
  return enumeration != nullptr ? enumeration->GetEltPStr(index) : nullptr;
}

bool Sane(const TDAttributeImpPtr& p) {
  const TDEnumImp* enumeration = EnumOf(p);
  return enumeration != nullptr && enumeration->HasList();
}

int32_t ComparePrefix(const TDAttributeImpPtr& p, const TDAttribute& other) {
  const TDEnumImp* enumeration = EnumOf(p);
  const TDEnumImp* others = EnumOf(other.GetAttributeImpPtr());
  if (enumeration == nullptr || others == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Not implemented");
    return 0;
  }
  return enumeration->ComparePrefix(*others);
}

// The editable enumeration behind a writable handle, or null (42) when there is none.
TDEnumImp* Editable(const TDAttributeImpPtr& p) {
  TDEnumImp* enumeration = EnumOf(p);
  return enumeration != nullptr && enumeration->HasList() ? enumeration : nullptr;
}

size_t CStrLength(const char* cString) { return cString != nullptr ? std::strlen(cString) : 0; }

const uint8_t* Bytes(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

}  // namespace

TDREnum::TDREnum(const TDEnumImpPtr& p, int32_t take) {
  if (take != 0 && p) imp_ = p;
}

TDEnumImpPtr TDREnum::GetEnumImpPtr() const { return EnumPtr(imp_); }
uint32_t TDREnum::GetNumStrings() const { return NumStrings(imp_); }
const uint8_t* TDREnum::GetEltPStr(uint32_t index) const { return EltPStr(imp_, index); }
bool TDREnum::IsSane() const { return Sane(imp_); }
int32_t TDREnum::Compare(const TDAttribute& other) const { return ComparePrefix(imp_, other); }

TDWEnum TDREnum::CheckOut() const {
  const TDEnumImp* enumeration = EnumOf(imp_);
  if (enumeration == nullptr) return TDWEnum(TDEnumImpPtr(), 0);
  return TDWEnum(enumeration->CloneOrCheckOut(), 1);
}

TDWEnum::TDWEnum() { imp_ = MakeCounted<TDEnumImp>(); }

TDWEnum::TDWEnum(const TDEnumImpPtr& p, int32_t take) {
  if (take != 0 && p && !p->IsInterned()) imp_ = p;
}

TDEnumImpPtr TDWEnum::GetEnumImpPtr() const { return EnumPtr(imp_); }
uint32_t TDWEnum::GetNumStrings() const { return NumStrings(imp_); }
const uint8_t* TDWEnum::GetEltPStr(uint32_t index) const { return EltPStr(imp_, index); }
bool TDWEnum::IsSane() const { return Sane(imp_); }
int32_t TDWEnum::Compare(const TDAttribute& other) const { return ComparePrefix(imp_, other); }

int32_t TDWEnum::AppendString(const char* text, size_t length) {
  TDEnumImp* enumeration = Editable(imp_);
  if (enumeration == nullptr) return kStatusNullHandle;
  if (text == nullptr) return kStatusBadArgument;
  return enumeration->AppendString(Bytes(text), length);
}

int32_t TDWEnum::AppendString(const char* cString) { return AppendString(cString, CStrLength(cString)); }

int32_t TDWEnum::AppendPStr(const uint8_t* pString) {
  TDEnumImp* enumeration = Editable(imp_);
  if (enumeration == nullptr) return kStatusNullHandle;
  if (pString == nullptr) return kStatusBadArgument;
  return enumeration->AppendString(pString + 1, pString[0]);
}

int32_t TDWEnum::InsertStringAt(const char* cString, uint32_t index) {
  TDEnumImp* enumeration = Editable(imp_);
  if (enumeration == nullptr) return kStatusNullHandle;
  if (cString == nullptr) return kStatusBadArgument;
  return enumeration->InsertStringAt(Bytes(cString), CStrLength(cString), index);
}

int32_t TDWEnum::ReplaceStringAt(const char* cString, uint32_t index) {
  TDEnumImp* enumeration = Editable(imp_);
  if (enumeration == nullptr) return kStatusNullHandle;
  if (cString == nullptr) return kStatusBadArgument;
  return enumeration->ReplaceStringAt(Bytes(cString), CStrLength(cString), index);
}

int32_t TDWEnum::RemoveString(uint32_t index) {
  TDEnumImp* enumeration = Editable(imp_);
  return enumeration != nullptr ? enumeration->RemoveString(index) : kStatusNullHandle;
}

int32_t TDWEnum::RemoveAllStrings() {
  TDEnumImp* enumeration = Editable(imp_);
  return enumeration != nullptr ? enumeration->RemoveAllStrings() : kStatusNullHandle;
}

int32_t TDWEnum::ReserveStringCount(uint32_t count) {
  TDEnumImp* enumeration = Editable(imp_);
  return enumeration != nullptr ? enumeration->ReserveStringCount(count) : kStatusNullHandle;
}

TDWEnum& TDWEnum::operator<<(const char* cString) {
  static_cast<void>(AppendString(cString));  // a chain drops statuses
  return *this;
}

TDWEnum& TDWEnum::operator<<(const uint8_t* pString) {
  static_cast<void>(AppendPStr(pString));
  return *this;
}

TDREnum TDWEnum::CheckIn() const {
  const TDEnumImp* enumeration = EnumOf(imp_);
  if (enumeration == nullptr) return TDREnum();
  return TDREnum(enumeration->CheckIn(), 1);
}

TDWEnum TDWEnum::Clone() const {
  const TDEnumImp* enumeration = EnumOf(imp_);
  if (enumeration == nullptr) return TDWEnum(TDEnumImpPtr(), 0);
  return TDWEnum(enumeration->CloneOrCheckOut(), 1);
}
