// Containers: what every descriptor made of other descriptors shares (identity, order, check-in,
// traversal, ephemeral marking, the Boolean mutation) and the editing of their elements.
#include "source/families/TDContainer.h"

#include <algorithm>
#include <bit>
#include <new>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"
#include "source/model/TDAttributes.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDContainer");

namespace {

bool SameElt(const TDImpPtr& a, const TDImpPtr& b) {
  if (a.get() == b.get()) return true;
  if (!a || !b) return false;
  return a->IsSameAs(*b) != 0;
}

struct Search {
  const TDImp* target;  // an object to find by identity, or null
  bool (*test)(const TDImp&);
  bool found;
};

TDTraverseValue VisitSearch(TDImp* td, void* context, TDImpPtr*) {
  auto* search = static_cast<Search*>(context);
  if (td != search->target && (search->test == nullptr || !search->test(*td))) return kTraverseContinue;
  search->found = true;
  return 1;
}

bool Holds(TDImp& tree, const TDImp* target, bool (*test)(const TDImp&)) {
  Search search{target, test, false};
  TDImpPtr replacement;
  tree.TraverseTD(&VisitSearch, &search, nullptr, &replacement);
  return search.found;
}

// Whether mutating `element` toward the given Boolean width would change anything.
bool HoldsBooleanToChange(TDImp& element, int32_t toSixteenBit) {
  if (toSixteenBit != 0) return Holds(element, nullptr, [](const TDImp& t) { return t.IsBool() != 0; });
  return Holds(element, nullptr, [](const TDImp& t) { return t.IsBoolU16() != 0; });
}

TDSingleContainerImp* WritableSingle(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || imp->IsSingleContainer() == 0) return nullptr;
  return static_cast<TDSingleContainerImp*>(imp);
}

TDMultiContainerImp* WritableMulti(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || imp->IsMultiContainer() == 0) return nullptr;
  return static_cast<TDMultiContainerImp*>(imp);
}

// An element is refused when it would hold its own container: the two would keep each other
// alive and every walk over them would never end.
int32_t RefuseSelfContainment(const TDContainerImp& container, const TD& element, const char* operation) {
  if (!element || !container.WouldContainItself(*element.GetImp())) return kStatusNoError;
  (VELLUM_DEBUG(3) << operation << ": an element cannot hold its own container").Process();
  return kStatusBadArgument;
}

}  // namespace

// --- TDContainerImp ------------------------------------------------------------------------------

int32_t TDContainerImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(TDImp::ComputeHashValue());
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    if (const TDImpPtr& element = GetEltImpPtr(i)) {
      hash = std::rotl(static_cast<uint32_t>(element->GetHashValue()) + hash, i % 32);
    }
  }
  return static_cast<int32_t>(hash);
}

int32_t TDContainerImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDImp::IsSameAs(other) == 0) return 0;
  const TDContainerImp* that = AsContainer(&other);
  if (that == nullptr) return 0;
  const int32_t count = GetNumElts();
  if (count != that->GetNumElts()) return 0;
  for (int32_t i = 0; i < count; ++i) {
    if (!SameElt(GetEltImpPtr(i), that->GetEltImpPtr(i))) return 0;
  }
  return 1;
}

namespace {

// Applies `change` to every present element. An interned element is never changed: a writable
// copy is changed and takes its place (when memory runs out the element stays as it was).
// `worthCopying` says whether an interned element needs the change at all.
template <class Change, class Worth>
int32_t ChangeElements(TDContainerImp& container, Change change, Worth worthCopying) {
  int32_t changed = 0;
  const int32_t count = container.GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    TDImpPtr element = container.GetEltImpPtr(i);
    if (!element) continue;
    const bool copied = element->IsReadOnlyTD() != 0;
    if (copied) {
      if (!worthCopying(*element)) continue;
      element = element->CloneOrCheckOut();
      if (!element) continue;
    }
    TDImpPtr result = element;
    if (change(result) != 0) changed = 1;
    if (copied || result.get() != element.get()) container.SetEltImpPtr(i, result);
  }
  return changed;
}

}  // namespace

int32_t TDContainerImp::EphemeralizeTD(int32_t queryOnly) {
  const int32_t old = TDImp::EphemeralizeTD(queryOnly);
  if (queryOnly == 0) {
    ChangeElements(
        *this, [](TDImpPtr& e) { return e->EphemeralizeTD(0); },
        [](TDImp& e) { return Holds(e, nullptr, [](const TDImp& t) { return (t.Flags() & kTDFlagEphemeral) == 0; }); });
  }
  return old;
}

int32_t TDContainerImp::UnephemeralizeTD(int32_t queryOnly) {
  const int32_t old = TDImp::UnephemeralizeTD(queryOnly);
  if (queryOnly == 0) {
    ChangeElements(
        *this, [](TDImpPtr& e) { return e->UnephemeralizeTD(0); },
        [](TDImp& e) { return Holds(e, nullptr, [](const TDImp& t) { return (t.Flags() & kTDFlagEphemeral) != 0; }); });
  }
  return old;
}

int32_t TDContainerImp::MutateBooleanTD(TDImpPtr*, int32_t toSixteenBit) {
  return ChangeElements(
      *this, [toSixteenBit](TDImpPtr& e) { return e->MutateBooleanTD(&e, toSixteenBit); },
      [toSixteenBit](TDImp& e) { return HoldsBooleanToChange(e, toSixteenBit); });
}

int32_t TDContainerImp::CompareForSorting(const TDImp* other) const {
  const TDContainerImp* that = AsContainer(other);
  if (that == nullptr) return 0;
  const int32_t count = GetNumElts();
  if (count != that->GetNumElts()) return count - that->GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const int32_t difference = CompareEltsForSorting(GetEltImpPtr(i).get(), that->GetEltImpPtr(i).get());
    if (difference != 0) return difference;
  }
  return 0;
}

bool TDContainerImp::ConversionIsLossless(const TDImp* dst) const {
  const TDContainerImp* to = AsContainer(dst);
  if (to == nullptr) return false;
  if (IsSingleContainer() != to->IsSingleContainer() || IsMultiContainer() != to->IsMultiContainer()) return false;
  const int32_t count = GetNumElts();
  if (count != to->GetNumElts()) return false;
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& from = GetEltImpPtr(i);
    const TDImpPtr& into = to->GetEltImpPtr(i);
    if (!from || !into) {
      if (from || into) return false;
      continue;
    }
    if (!from->ConversionIsLossless(into.get())) return false;
  }
  return true;
}

TDTraverseValue TDContainerImp::TraverseTD(TDVisitFn visit, void* context, TDShouldRecurseFn shouldRecurse,
                                           TDImpPtr* replacement) {
  TDTraverseValue result = visit(this, context, replacement);
  if (result != kTraverseContinue) return result == kTraverseSkipElements ? kTraverseContinue : result;
  if (replacement != nullptr && *replacement) return kTraverseContinue;
  if (shouldRecurse != nullptr && !shouldRecurse(this, context)) return kTraverseContinue;

  // An interned container never changes: replacements go into a writable copy made on the first
  // one, and the copy is handed up in this container's place.
  const bool interned = IsReadOnlyTD() != 0;
  TDImpPtr copy;
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    TDImpPtr element = GetEltImpPtr(i);  // held: the walk may replace it
    if (!element) continue;
    TDImpPtr fresh;
    result = element->TraverseTD(visit, context, shouldRecurse, &fresh);
    if (fresh) {
      if (!interned) {
        SetEltImpPtr(i, fresh);
      } else if (replacement != nullptr) {
        if (!copy) copy = CloneOrCheckOut();
        if (copy) static_cast<TDContainerImp*>(copy.get())->SetEltImpPtr(i, fresh);
      }
    }
    if (result == kTraverseSkipElements) result = kTraverseContinue;
    if (result != kTraverseContinue) break;
  }
  if (copy) *replacement = copy;
  return result;
}

bool TDContainerImp::WouldContainItself(const TDImp& element) const {
  if (&element == this) return true;
  // An interned tree holds only interned objects, and a container being edited is not one.
  if (element.IsReadOnlyTD() != 0) return false;
  return Holds(const_cast<TDImp&>(element), this, nullptr);
}

// --- TDSingleContainerImp ------------------------------------------------------------------------

int32_t TDSingleContainerImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCloneOrCheckOut(target);
  return status != kStatusNoError ? status
                                  : CopyEltInto(static_cast<TDSingleContainerImp&>(*target), &TDImp::CloneOrCheckOut);
}

int32_t TDSingleContainerImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCheckIn(target);
  return status != kStatusNoError ? status : CopyEltInto(static_cast<TDSingleContainerImp&>(*target), &TDImp::CheckIn);
}

int32_t TDSingleContainerImp::CopyEltInto(TDSingleContainerImp& copy, TDImpPtr (TDImp::*copyOf)() const) const {
  copy.element_.Free();
  copy.ClearHashValid();
  if (!element_) return kStatusNoError;
  copy.element_ = ((*element_).*copyOf)();
  return copy.element_ ? kStatusNoError : kStatusOutOfMemory;
}

void TDSingleContainerImp::PrintDebugStr(const uint8_t* prefix) const {
  TDImp::PrintDebugStr(prefix);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "element = ").Process();
  TD(element_, 1).PrintDebugStr(prefix);
}

const TDImpPtr& TDSingleContainerImp::GetEltImpPtr(int32_t index) const {
  return index == 0 ? element_ : GNullImpPtr();
}

void TDSingleContainerImp::SetEltImpPtr(int32_t index, const TDImpPtr& element) {
  if (index == 0) SetElt(element);
}

void TDSingleContainerImp::SetElt(const TDImpPtr& element) {
  element_ = element;
  ClearHashValid();
}

int32_t TDSingleContainerImp::ResizeAsVector(void*, int32_t, void**) const { return kStatusBadArgument; }

// --- TDMultiContainerImp -------------------------------------------------------------------------

int32_t TDMultiContainerImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCloneOrCheckOut(target);
  return status != kStatusNoError ? status
                                  : CopyEltsInto(static_cast<TDMultiContainerImp&>(*target), &TDImp::CloneOrCheckOut);
}

int32_t TDMultiContainerImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDImp::MemberCheckIn(target);
  return status != kStatusNoError ? status : CopyEltsInto(static_cast<TDMultiContainerImp&>(*target), &TDImp::CheckIn);
}

int32_t TDMultiContainerImp::CopyEltsInto(TDMultiContainerImp& copy, TDImpPtr (TDImp::*copyOf)() const) const {
  copy.elements_.clear();
  copy.ClearHashValid();
  try {
    copy.elements_.reserve(elements_.size());
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  for (const TDImpPtr& element : elements_) {
    if (!element) {
      copy.elements_.emplace_back();
      continue;
    }
    TDImpPtr made = ((*element).*copyOf)();
    if (!made) return kStatusOutOfMemory;
    copy.elements_.push_back(std::move(made));
  }
  return kStatusNoError;
}

void TDMultiContainerImp::PrintDebugStr(const uint8_t* prefix) const {
  TDImp::PrintDebugStr(prefix);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "number of elements = " << elements_.size()).Process();
  for (const TDImpPtr& element : elements_) TD(element, 1).PrintDebugStr(prefix);
}

const TDImpPtr& TDMultiContainerImp::GetEltImpPtr(int32_t index) const {
  if (index < 0 || static_cast<size_t>(index) >= elements_.size()) return GNullImpPtr();
  return elements_[static_cast<size_t>(index)];
}

void TDMultiContainerImp::SetEltImpPtr(int32_t index, const TDImpPtr& element) {
  if (index < 0 || static_cast<size_t>(index) >= elements_.size()) return;
  elements_[static_cast<size_t>(index)] = element;
  ClearHashValid();
}

int32_t TDMultiContainerImp::AppendElt(const TDImpPtr& element) {
  try {
    elements_.push_back(element);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDMultiContainerImp::InsertEltAt(const TDImpPtr& element, int32_t index) {
  if (index < 0 || static_cast<size_t>(index) > elements_.size()) return kStatusBadArgument;
  try {
    elements_.insert(elements_.begin() + index, element);
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDMultiContainerImp::ReplaceEltAt(const TDImpPtr& element, int32_t index) {
  if (index < 0 || static_cast<size_t>(index) >= elements_.size()) return kStatusBadArgument;
  SetEltImpPtr(index, element);
  return kStatusNoError;
}

void TDMultiContainerImp::RemoveAllElts() {
  elements_.clear();
  ClearHashValid();
}

int32_t TDMultiContainerImp::ReserveElts(int32_t count) {
  if (count < 0) return kStatusBadArgument;
  try {
    elements_.reserve(static_cast<size_t>(count));
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  } catch (const std::length_error&) {
    return kStatusBadArgument;
  }
  return kStatusNoError;
}

int32_t TDMultiContainerImp::FindEltByName(const uint8_t* name) const {
  for (size_t i = 0; i < elements_.size(); ++i) {
    const TDImpPtr& element = elements_[i];
    if (!element) continue;
    const TDNameImpPtr& label = element->GetNameImpPtr();
    const uint8_t* text = label ? label->GetNamePStr() : EmptyPStr();
    if (PStrCmp(text, name) == 0) return static_cast<int32_t>(i);
  }
  return -1;
}

// --- free functions ------------------------------------------------------------------------------

const TDContainerImp* AsContainer(const TDImp* type) {
  return type != nullptr && type->IsContainer() != 0 ? static_cast<const TDContainerImp*>(type) : nullptr;
}

TDContainerImp* AsWritableContainer(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsReadOnlyTD() != 0 || imp->IsContainer() == 0) return nullptr;
  return static_cast<TDContainerImp*>(imp);
}

const TDSingleContainerImp* AsSingleContainer(const TDImp* type) {
  return type != nullptr && type->IsSingleContainer() != 0 ? static_cast<const TDSingleContainerImp*>(type)
                                                            : nullptr;
}

const TDMultiContainerImp* AsMultiContainer(const TDImp* type) {
  return type != nullptr && type->IsMultiContainer() != 0 ? static_cast<const TDMultiContainerImp*>(type)
                                                           : nullptr;
}

// --- handles -------------------------------------------------------------------------------------

bool ContainerKind::Admit(const TDImp& type) { return type.IsContainer() != 0; }
bool SingleContainerKind::Admit(const TDImp& type) { return type.IsSingleContainer() != 0; }
bool MultiContainerKind::Admit(const TDImp& type) { return type.IsMultiContainer() != 0; }

TDR TDRSingleContainer::GetEltTD() const {
  const TDSingleContainerImp* single = AsSingleContainer(GetImp());
  return single != nullptr ? TDR(single->GetElt(), 1) : TDR();
}

TDW TDWSingleContainer::GetEltTD() const {
  const TDSingleContainerImp* single = AsSingleContainer(GetImp());
  return single != nullptr ? TDW(single->GetElt(), 1) : TDW();
}

int32_t TDWSingleContainer::SetEltTD(const TD& element) {
  TDSingleContainerImp* single = WritableSingle(*this);
  if (single == nullptr) return kStatusNullHandle;
  if (const int32_t refused = RefuseSelfContainment(*single, element, "SetEltTD")) return refused;
  single->SetElt(element.GetImpPtr());
  return kStatusNoError;
}

int32_t TDWSingleContainer::RemoveEltTD() {
  TDSingleContainerImp* single = WritableSingle(*this);
  if (single == nullptr) return kStatusNullHandle;
  single->SetElt(TDImpPtr());
  return kStatusNoError;
}

namespace {

int32_t NumEltsOf(const TD& type) {
  const TDMultiContainerImp* multi = AsMultiContainer(type.GetImp());
  return multi != nullptr ? multi->GetNumElts() : 0;
}

const TDImpPtr& EltOf(const TD& type, int32_t index) {
  const TDMultiContainerImp* multi = AsMultiContainer(type.GetImp());
  return multi != nullptr ? multi->GetEltImpPtr(index) : GNullImpPtr();
}

int32_t EltPosOf(const TD& type, const uint8_t* name) {
  const TDMultiContainerImp* multi = AsMultiContainer(type.GetImp());
  if (multi == nullptr) return -1;
  uint8_t pascal[256] = {};
  CToPStr(name, pascal);
  return multi->FindEltByName(pascal);
}

}  // namespace

int32_t TDRMultiContainer::GetNumElts() const { return NumEltsOf(*this); }
TDR TDRMultiContainer::GetEltTD(int32_t index) const { return TDR(EltOf(*this, index), 1); }
int32_t TDRMultiContainer::GetEltPos(const uint8_t* name) const { return EltPosOf(*this, name); }

int32_t TDWMultiContainer::GetNumElts() const { return NumEltsOf(*this); }
TDW TDWMultiContainer::GetEltTD(int32_t index) const { return TDW(EltOf(*this, index), 1); }
int32_t TDWMultiContainer::GetEltPos(const uint8_t* name) const { return EltPosOf(*this, name); }

int32_t TDWMultiContainer::AppendEltTD(const TD& element) {
  TDMultiContainerImp* multi = WritableMulti(*this);
  if (multi == nullptr || !element) return kStatusNullHandle;
  if (const int32_t refused = RefuseSelfContainment(*multi, element, "AppendEltTD")) return refused;
  return multi->AppendElt(element.GetImpPtr());
}

int32_t TDWMultiContainer::InsertEltTDAt(const TD& element, int32_t index) {
  TDMultiContainerImp* multi = WritableMulti(*this);
  if (multi == nullptr || !element) return kStatusNullHandle;
  if (const int32_t refused = RefuseSelfContainment(*multi, element, "InsertEltTDAt")) return refused;
  return multi->InsertEltAt(element.GetImpPtr(), index);
}

int32_t TDWMultiContainer::ReplaceEltTDAt(const TD& element, int32_t index) {
  TDMultiContainerImp* multi = WritableMulti(*this);
  if (multi == nullptr || !element) return kStatusNullHandle;
  if (const int32_t refused = RefuseSelfContainment(*multi, element, "ReplaceEltTDAt")) return refused;
  return multi->ReplaceEltAt(element.GetImpPtr(), index);
}

int32_t TDWMultiContainer::RemoveAllEltTDs() {
  TDMultiContainerImp* multi = WritableMulti(*this);
  if (multi == nullptr) return kStatusNullHandle;
  multi->RemoveAllElts();
  return kStatusNoError;
}

int32_t TDWMultiContainer::ReserveElementCount(int32_t count) {
  TDMultiContainerImp* multi = WritableMulti(*this);
  if (multi == nullptr) return kStatusNullHandle;
  return multi->ReserveElts(count);
}

namespace vellum::detail {

bool AppendInChain(TDWMultiContainer& container, const TD& element) {
  const int32_t status = container.AppendEltTD(element);
  if (status == kStatusNoError) return true;
  (VELLUM_DEBUG(3) << "TDWMultiContainer::operator<<: AppendEltTD failed (" << status << ")").Process();
  return false;
}

}  // namespace vellum::detail

TDWMultiContainer& TDWMultiContainer::operator<<(const TD& element) {
  if (vellum::detail::AppendInChain(*this, element)) return *this;
  static TDWMultiContainer broken(TDImpPtr(), 0);
  return broken;
}

// --- type strings ----------------------------------------------------------------------------------

namespace {

// Clusters count their elements in a 16-bit word wherever they are walked.
constexpr int32_t kMaxClusterElements = 0xFFFF;

}  // namespace

int32_t WriteEltIndex(TDDataWriter* writer, const TDImpPtr& element) {
  const int32_t index = element ? writer->GetSaveTableIndex(element.get()) : -1;
  if (index < 0) {
    writer->SetError(kStatusNullHandle);
    return kStatusNullHandle;
  }
  return writer->WriteVariableSizeField(index);
}

int32_t TDContainerImp::FlattenTDForSaving(TDDataWriter* writer, int32_t* index) const {
  if (writer == nullptr) return kStatusNullHandle;
  if (const int32_t found = writer->GetSaveTableIndex(this); found >= 0) {
    if (index != nullptr) *index = found;
    return kStatusNoError;
  }
  const int32_t count = GetNumElts();
  for (int32_t i = 0; i < count; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (!element) continue;
    uint32_t elementIndex = 0;
    if (const int32_t status = SaveTDRecord(element.get(), writer, &elementIndex); status != kStatusNoError)
      return status;
  }
  return TDImp::FlattenTDForSaving(writer, index);
}

void TDContainerImp::ComputeNesting(uint32_t* depth, uint32_t* count) const {
  uint32_t deepest = 0;
  uint64_t total = 1;
  const int32_t elements = GetNumElts();
  for (int32_t i = 0; i < elements; ++i) {
    const TDImpPtr& element = GetEltImpPtr(i);
    if (!element) continue;
    deepest = std::max(deepest, element->NestingDepth());
    total += element->ExpandedCount();
  }
  *depth = deepest + 1;
  *count = static_cast<uint32_t>(std::min<uint64_t>(total, UINT32_MAX));
}

int32_t TDSingleContainerImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  return WriteEltIndex(writer, element_);
}

int32_t TDSingleContainerImp::ConstructTD(TDDataReader* reader) {
  TDImpPtr element = reader->RetrieveTDFromLoadTable();
  if (!element) return reader->GetError() != kStatusNoError ? reader->GetError() : kStatusNullHandle;
  SetElt(element);
  return kStatusNoError;
}

int32_t TDMultiContainerImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  // A reader refuses such a count, so writing it would save a string that never loads.
  if (GetNumElts() > kMaxClusterElements) {
    (VELLUM_DEBUG(2) << "Too many elements in a container to save: " << GetNumElts()).Process();
    writer->SetError(kStatusBadArgument);
    return kStatusBadArgument;
  }
  writer->WriteVariableSizeField(GetNumElts());
  for (const TDImpPtr& element : elements_)
    if (const int32_t status = WriteEltIndex(writer, element); status != kStatusNoError) return status;
  return writer->GetError();
}

int32_t TDMultiContainerImp::ConstructTD(TDDataReader* reader) {
  int32_t count = 0;
  if (const int32_t status = reader->ReadVariableSizeField(&count); status != kStatusNoError) return status;
  if (count < 0 || count > kMaxClusterElements) {
    (VELLUM_DEBUG(2) << "Too many elements in a container: " << count).Process();
    reader->SetError(kStatusCorruptData);
    return kStatusCorruptData;
  }
  // Each index takes at least two bytes: a count the input cannot hold reserves no more.
  const auto room = static_cast<int32_t>(std::min<size_t>(static_cast<size_t>(count), reader->BytesLeft() / 2));
  if (const int32_t status = ReserveElts(room); status != kStatusNoError) return status;
  for (int32_t i = 0; i < count; ++i) {
    TDImpPtr element = reader->RetrieveTDFromLoadTable();
    if (!element) return reader->GetError() != kStatusNoError ? reader->GetError() : kStatusNullHandle;
    if (const int32_t status = AppendElt(element); status != kStatusNoError) return status;
  }
  return kStatusNoError;
}
