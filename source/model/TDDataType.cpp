// Handles: null-safe forwarding to the descriptor's slots, the conversions between read-only and
// writable handles, the common setters and the walks built on traversal.
#include "source/model/TDDataType.h"

#include <cstring>
#include <new>
#include <string>

#include "runtime/PXStrings.h"
#include "runtime/PlacementDelete.h"
#include "source/model/TDAttributes.h"

VELLUM_DIAGNOSTIC_MODULE("TDDataType");

namespace {

alignas(TDR) unsigned char gNullTDStorage[sizeof(TDR)];

void DestroyNullTD(void* object) { static_cast<TDR*>(object)->~TDR(); }

// A walk that stops at the first descriptor passing `test`.
struct Search {
  bool (*test)(const TDImp&);
  bool skipRefnums;
  bool found;
};

TDTraverseValue VisitSearch(TDImp* td, void* context, TDImpPtr*) {
  auto* search = static_cast<Search*>(context);
  if (!search->test(*td)) return kTraverseContinue;
  search->found = true;
  return 1;
}

bool RecurseSearch(TDImp* td, void* context) {
  // A refnum's element types describe the referenced object, not data.
  return !(static_cast<Search*>(context)->skipRefnums && td->IsRefnum() != 0);
}

bool Contains(const TDImpPtr& imp, bool (*test)(const TDImp&), bool skipRefnums = false) {
  if (!imp) return false;
  Search search{test, skipRefnums, false};
  TDImpPtr replacement;
  imp->TraverseTD(&VisitSearch, &search, &RecurseSearch, &replacement);
  return search.found;
}

struct ContextSearch {
  const KoContext* found;
};

TDTraverseValue VisitForContext(TDImp* td, void* context, TDImpPtr*) {
  const KoContext* held = td->GetContext();
  if (held == nullptr) return kTraverseContinue;
  static_cast<ContextSearch*>(context)->found = held;
  return 1;
}

TDTraverseValue VisitSetContext(TDImp* td, void* context, TDImpPtr*) {
  td->SetContext(static_cast<const KoContext*>(context));
  return kTraverseContinue;
}

bool AlwaysRecurse(TDImp*, void*) { return true; }

struct TDRWalk {
  TDR::VisitTDR visit;
  TDR::ShouldRecurseTDR shouldRecurse;
  void* context;
};

TDTraverseValue VisitTDRWalk(TDImp* td, void* context, TDImpPtr*) {
  auto* walk = static_cast<TDRWalk*>(context);
  return walk->visit(TDR(TDImpPtr(td), 1), walk->context);
}

bool RecurseTDRWalk(TDImp* td, void* context) {
  auto* walk = static_cast<TDRWalk*>(context);
  return walk->shouldRecurse == nullptr || walk->shouldRecurse(TDR(TDImpPtr(td), 1));
}

struct TDWWalk {
  TDW::VisitTDW visit;
  TDW::ShouldRecurseTDW shouldRecurse;
  void* context;
};

TDTraverseValue VisitTDWWalk(TDImp* td, void* context, TDImpPtr* replacement) {
  auto* walk = static_cast<TDWWalk*>(context);
  TDW writable(TDImpPtr(td), 1);
  bool replaced = false;
  const TDTraverseValue result = walk->visit(writable, walk->context, &replaced);
  if (replaced && replacement != nullptr) *replacement = writable.GetImpPtr();
  return result;
}

bool RecurseTDWWalk(TDImp* td, void* context) {
  auto* walk = static_cast<TDWWalk*>(context);
  return walk->shouldRecurse == nullptr || walk->shouldRecurse(TDW(TDImpPtr(td), 1));
}

size_t CStrLength(const uint8_t* cString) {
  return cString != nullptr ? std::strlen(reinterpret_cast<const char*>(cString)) : 0;
}

}  // namespace

// --- TD ------------------------------------------------------------------------------------------

TD::TD(const TDImpPtr& p, int32_t take) {
  if (take != 0) imp_ = p;
}

TDImp* TD::GetImp() const noexcept { return imp_.get(); }

int16_t TD::GetTypeCode() const { return imp_ ? imp_->GetTypeCode() : 0; }

int32_t TD::GetHashValue() const { return imp_ ? imp_->GetHashValue() : 0; }

int32_t TD::IsSameAs(const TD& other) const {
  if (!imp_ || !other.imp_) return !imp_ && !other.imp_ ? 1 : 0;
  return imp_->IsSameAs(*other.imp_);
}

int32_t TD::IsReadOnlyTD() const { return imp_ ? imp_->IsReadOnlyTD() : 0; }

int32_t TD::HasName() const { return imp_ && imp_->GetNameImpPtr() ? 1 : 0; }

int32_t TD::GetName(std::string* name) const {
  if (!imp_) return kStatusNullHandle;
  if (const TDNameImpPtr& n = imp_->GetNameImpPtr(); n && name != nullptr) {
    const uint8_t* text = n->GetNamePStr();
    name->assign(reinterpret_cast<const char*>(text + 1), text[0]);
  }
  return kStatusNoError;
}

const uint8_t* TD::GetNamePStr() const {
  if (!imp_ || !imp_->GetNameImpPtr()) return EmptyPStr();
  return imp_->GetNameImpPtr()->GetNamePStr();
}

int32_t TD::HasTypedef() const { return imp_ && imp_->GetTypedefImpPtr() ? 1 : 0; }

int32_t TD::IsEphemeralTD() const { return imp_ ? imp_->UnephemeralizeTD(1) : 0; }

int32_t TD::IsNoSelectTD() const { return imp_ ? static_cast<int32_t>(imp_->Flags() & kTDFlagNoSelect) : 0; }

#define VELLUM_TD_DEFINE_PREDICATE(name) \
  int32_t TD::name() const { return imp_ ? imp_->name() : 0; }
VELLUM_TD_PREDICATES_FIRST(VELLUM_TD_DEFINE_PREDICATE)
VELLUM_TD_PREDICATES_SECOND(VELLUM_TD_DEFINE_PREDICATE)
VELLUM_TD_PREDICATES_THIRD(VELLUM_TD_DEFINE_PREDICATE)
#undef VELLUM_TD_DEFINE_PREDICATE

int32_t TD::IsErrorCluster(int32_t strict) const { return imp_ ? imp_->IsErrorCluster(strict) : 0; }

int32_t TD::IsGeneric() const { return imp_ ? imp_->IsGeneric() : 0; }

int32_t TD::HasEnum() const { return imp_ ? imp_->HasEnum() : 0; }

int32_t TD::HasUnits() const { return imp_ ? imp_->HasUnits() : 0; }

bool TD::HoldsContext() const { return imp_ && imp_->HoldsContext(); }

const KoContext* TD::GetContext() const { return imp_ ? imp_->GetContext() : nullptr; }

int32_t TD::CmpTD(const TD& other, int32_t flags) const {
  if (imp_ == other.imp_) return 0;
  if (!imp_ || !other.imp_) return kCmpIncompatible;
  return imp_->CmpTDCommon(other.imp_.get(), flags);
}

int32_t TD::CompareForSorting(const TD& other) const {
  return CompareEltsForSorting(imp_.get(), other.imp_.get());
}

int32_t TD::PrintDebugStr(const uint8_t* prefix) const {
  const std::string text = prefix != nullptr ? std::string(reinterpret_cast<const char*>(prefix)) : std::string();
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "TypeDescriptor {");
  if (!imp_) {
    DebugReport(kDiagnosticModule, __LINE__, 0, text + "\tNULL");
  } else {
    const std::string inner = text + "\t";
    imp_->PrintDebugStr(reinterpret_cast<const uint8_t*>(inner.c_str()));
  }
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "\t}");
  return 0;
}

int32_t TD::PrintDebugStr() const { return PrintDebugStr(nullptr); }

int32_t TD::Accept(ITDVisitor* visitor) const {
  if (!imp_ || visitor == nullptr) return 0;
  imp_->Accept(visitor);
  return 1;
}

int32_t TD::ContainsBooleanTD() const {
  return Contains(imp_, [](const TDImp& t) { return t.IsBool() != 0; }) ? 1 : 0;
}

int32_t TD::ContainsTypedef() const {
  return Contains(imp_, [](const TDImp& t) { return static_cast<bool>(t.GetTypedefImpPtr()); }) ? 1 : 0;
}

int32_t TD::ContainsVariantAsData() const {
  return Contains(imp_, [](const TDImp& t) { return t.IsKoVariant() != 0; }, true) ? 1 : 0;
}

int32_t TD::TypedefsPathized() const {
  if (!imp_) return 0;
  const bool unpathized = Contains(imp_, [](const TDImp& t) {
    const TDTypedefImpPtr& link = t.GetTypedefImpPtr();
    return link && !link->IsPathized();
  });
  return unpathized ? 0 : 1;
}

// --- TDR -----------------------------------------------------------------------------------------

TDR::TDR(const TDImpPtr& p, int32_t take) {
  if (take != 0 && p) imp_ = p;
}

TDW TDR::CheckOut() const {
  if (!imp_) return TDWNull();
  return TDW(imp_->CloneOrCheckOut(), 1);
}

TDRName TDR::GetName() const { return imp_ ? TDRName(imp_->GetNameImpPtr(), 1) : TDRName(); }

TDRTypedef TDR::GetTypedef() const { return imp_ ? TDRTypedef(imp_->GetTypedefImpPtr(), 1) : TDRTypedef(); }

bool TDR::HoldsContextRecursive() const {
  return Contains(imp_, [](const TDImp& t) { return t.HoldsContext(); });
}

const KoContext* TDR::GetContextRecursive() const {
  if (!imp_) return nullptr;
  ContextSearch search{nullptr};
  TDImpPtr replacement;
  imp_->TraverseTD(&VisitForContext, &search, &AlwaysRecurse, &replacement);
  return search.found;
}

TDTraverseValue TDR::TraverseTDR(VisitTDR visit, void* context, ShouldRecurseTDR shouldRecurse) const {
  if (!imp_ || visit == nullptr) return kTraverseContinue;
  TDRWalk walk{visit, shouldRecurse, context};
  TDImpPtr replacement;
  return imp_->TraverseTD(&VisitTDRWalk, &walk, &RecurseTDRWalk, &replacement);
}

// --- TDW -----------------------------------------------------------------------------------------

TDW::TDW(const TDImpPtr& p, int32_t take) {
  if (take != 0 && p && p->IsReadOnlyTD() == 0) imp_ = p;
}

TDR TDW::CheckIn() const {
  if (!imp_) return GNullTD();
  return TDR(imp_->CheckIn(), 1);
}

TDW TDW::Clone() const {
  if (!imp_) return GNullTD().CheckOut();
  return TDW(imp_->CloneOrCheckOut(), 1);
}

TDWName TDW::GetName() const { return imp_ ? TDWName(imp_->GetNameImpPtr(), 1) : TDWName(); }

TDWTypedef TDW::GetTypedef() const { return imp_ ? TDWTypedef(imp_->GetTypedefImpPtr(), 1) : TDWTypedef(); }

int32_t TDW::SetName(std::string_view name) {
  if (!imp_) return kStatusNullHandle;
  imp_->ClearHashValid();
  if (name.empty()) {
    imp_->SetNameImpPtr(TDNameImpPtr());
    return kStatusNoError;
  }
  const auto* bytes = reinterpret_cast<const uint8_t*>(name.data());
  if (const TDNameImpPtr& existing = imp_->GetNameImpPtr(); existing && !existing->IsInterned()) {
    const int32_t status = existing->SetText(bytes, name.size());
    imp_->ClearHashValid();
    return status;
  }
  TDNameImpPtr fresh = TDNameImp::Make(bytes, name.size());
  if (!fresh) return kStatusOutOfMemory;
  imp_->SetNameImpPtr(fresh);
  return kStatusNoError;
}

int32_t TDW::SetName(const uint8_t* cString) {
  if (!imp_) return kStatusNullHandle;
  return SetName(std::string(reinterpret_cast<const char*>(cString != nullptr ? cString : EmptyPStr() + 1),
                             CStrLength(cString)));
}

int32_t TDW::SetNamePStr(const uint8_t* pString) {
  if (!imp_) return kStatusNullHandle;
  uint8_t buffer[256] = {};
  if (pString != nullptr) PToCStr(pString, buffer);
  return SetName(buffer);
}

int32_t TDW::SetName(const TDWName& name) {
  if (!imp_) return kStatusNullHandle;
  imp_->SetNameImpPtr(name.GetNameImpPtr());
  return kStatusNoError;
}

int32_t TDW::RemoveName() {
  if (!imp_) return kStatusNullHandle;
  imp_->SetNameImpPtr(TDNameImpPtr());
  return kStatusNoError;
}

int32_t TDW::SetTypedef(const TDWTypedef& typedefLink) {
  if (!imp_) return kStatusNullHandle;
  imp_->SetTypedefImpPtr(typedefLink.GetTypedefImpPtr());
  return kStatusNoError;
}

int32_t TDW::RemoveTypedef() {
  if (!imp_) return kStatusNullHandle;
  imp_->SetTypedefImpPtr(TDTypedefImpPtr());
  return kStatusNoError;
}

int32_t TDW::SetNoSelectMask(int32_t mask) {
  if (!imp_) return kStatusNullHandle;
  imp_->ClearHashValid();
  if (mask != 0) {
    imp_->SetFlagBits(kTDFlagNoSelect);
  } else {
    imp_->ClearFlagBits(kTDFlagNoSelect);
  }
  return kStatusNoError;
}

int32_t TDW::SetGenericness(int32_t generic) {
  if (!imp_) return kStatusNullHandle;
  imp_->ClearHashValid();
  imp_->SetGenericness(generic);
  return kStatusNoError;
}

int32_t TDW::EphemeralizeTD() { return imp_ ? imp_->EphemeralizeTD(0) : kStatusNullHandle; }

int32_t TDW::UnephemeralizeTD() { return imp_ ? imp_->UnephemeralizeTD(0) : kStatusNullHandle; }

void TDW::SetContextRecursive(const KoContext* context) {
  if (!imp_) return;
  TDImpPtr replacement;
  imp_->TraverseTD(&VisitSetContext, const_cast<KoContext*>(context), &AlwaysRecurse, &replacement);
}

TDTraverseValue TDW::TraverseTDW(VisitTDW visit, void* context, ShouldRecurseTDW shouldRecurse) {
  if (!imp_ || visit == nullptr) return kTraverseContinue;
  TDWWalk walk{visit, shouldRecurse, context};
  TDImpPtr replacement;
  const TDTraverseValue result = imp_->TraverseTD(&VisitTDWWalk, &walk, &RecurseTDWWalk, &replacement);
  if (replacement && replacement->IsReadOnlyTD() == 0) imp_ = replacement;
  return result;
}

// --- shared nulls and typed-handle support -----------------------------------------------------

const TDR& GNullTD() {
  static TDR* const null = [] {
    auto* created = ::new (static_cast<void*>(gNullTDStorage)) TDR();
    RegisterPlacementDelete(&DestroyNullTD, created);
    return created;
  }();
  return *null;
}

const TDImpPtr& GNullImpPtr() {
  static const TDImpPtr null;
  return null;
}

const TDNameImpPtr& GNullNameImpPtr() {
  static const TDNameImpPtr null;
  return null;
}

const TDTypedefImpPtr& GNullTypedefImpPtr() {
  static const TDTypedefImpPtr null;
  return null;
}

const TDUnitsImpPtr& GNullUnitsImpPtr() {
  static const TDUnitsImpPtr null;
  return null;
}

const TDEnumImpPtr& GNullEnumImpPtr() {
  static const TDEnumImpPtr null;
  return null;
}

const TDOMIdImpPtr& GNullOMIdImpPtr() {
  static const TDOMIdImpPtr null;
  return null;
}

namespace vellum::detail {

TDImpPtr Admitted(const TDImpPtr& p, int32_t check, bool (*admit)(const TDImp&)) {
  if (check == 0 || !p || !admit(*p)) return TDImpPtr();
  return p;
}

TDImpPtr CheckInNew(const TDImpPtr& fresh) { return fresh ? fresh->CheckIn() : TDImpPtr(); }

}  // namespace vellum::detail
