// Void and the Booleans: their objects, factories, handles, shared defaults and the mutation
// between the two Boolean kinds.
#include "source/families/TDSimpleTypes.h"

#include "source/streams/KoCMutate.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/KoDataWriter.h"

#include <cstring>

#include "runtime/PXStrings.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "vellum/TDVisitor.h"

VELLUM_DIAGNOSTIC_MODULE("TDSimpleTypes");

namespace {



EmptyTypeFactory<TDVoidImp> gVoidFactory;
EmptyTypeFactory<TDBooleanImp> gBooleanFactory;
EmptyTypeFactory<TDBooleanU16Imp> gBooleanU16Factory;

// Announced as the library loads; the service registers them in this order at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(38, static_cast<uint16_t>(TypeCode::Boolean), &gBooleanFactory);
  AnnounceTypeFactory(39, static_cast<uint16_t>(TypeCode::BooleanU16), &gBooleanU16Factory);
  AnnounceTypeFactory(40, static_cast<uint16_t>(TypeCode::Void), &gVoidFactory);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::Void), &GetVoidTD);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::Boolean), &GetBoolTD);
  return true;
}();

int32_t CopyBytes(const void* src, void* dst, int32_t size) {
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, static_cast<size_t>(size));
  return kStatusNoError;
}

// A Boolean converts only into its own kind; the width change between the two kinds belongs to
// MutateBooleanTD.
int32_t ConvertBoolean(const TDImp& self, const TDImp* dst, const void* src, void* dstData, int32_t size) {
  if (dst != nullptr && dst->GetTypeCode() == self.GetTypeCode()) return CopyBytes(src, dstData, size);
  ReportConversionCodes(kDiagnosticModule, __LINE__, dst, self);
  return kStatusBadArgument;
}

// Any two values that differ order by `a` alone: a true `a` sorts after `b`, a false one before.
DataOrder OrderBooleans(const void* a, const void* b, size_t size) {
  if (BlockCmp(a, b, size) == 0) return {};
  const auto* bytes = static_cast<const uint8_t*>(a);
  for (size_t i = 0; i < size; ++i) {
    if (bytes[i] != 0) return {1};
  }
  return {-1};
}

// Replaces *self by a fresh object of kind `Other` carrying only the name.
template <class Other>
int32_t MutateTo(TDImpPtr* self) {
  TDImpPtr other = MakeCounted<Other>((*self)->GetNameImpPtr(), TDTypedefImpPtr());
  if (!other) return 0;
  *self = other;
  return 1;
}

}  // namespace

TDImpPtr TDVoidImp::NewInstance() const { return MakeCounted<TDVoidImp>(); }

void TDVoidImp::Accept(ITDVisitor* visitor) {
  TDImpPtr held(this);
  if (IsReadOnlyTD() != 0) {
    visitor->VisitVoid(TDRVoid(held, 1));
  } else {
    TDWVoid writable(held, 1);
    visitor->VisitVoid(writable);
  }
}

TDImpPtr TDBooleanImp::NewInstance() const { return MakeCounted<TDBooleanImp>(); }

int32_t TDBooleanImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  return CopyBytes(src, dst, 1);
}

int32_t TDBooleanImp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertBoolean(*this, dst, src, dstData, 1);
}

DataOrder TDBooleanImp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  return OrderBooleans(a, b, sizeof(uint8_t));
}

int32_t TDBooleanImp::MutateBooleanTD(TDImpPtr* self, int32_t toOld) {
  return toOld != 0 ? MutateTo<TDBooleanU16Imp>(self) : 0;
}

void TDBooleanImp::Accept(ITDVisitor* visitor) {
  TDImpPtr held(this);
  if (IsReadOnlyTD() != 0) {
    visitor->VisitBoolean(TDRBoolean(held, 1));
  } else {
    TDWBoolean writable(held, 1);
    visitor->VisitBoolean(writable);
  }
}

TDImpPtr TDBooleanU16Imp::NewInstance() const { return MakeCounted<TDBooleanU16Imp>(); }

int32_t TDBooleanU16Imp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  return CopyBytes(src, dst, 2);
}

int32_t TDBooleanU16Imp::CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t) const {
  return ConvertBoolean(*this, dst, src, dstData, 2);
}

DataOrder TDBooleanU16Imp::OrderData(const void* a, const void* b, const DataOrderOptions&) const {
  return OrderBooleans(a, b, sizeof(uint16_t));
}

int32_t TDBooleanU16Imp::MutateBooleanTD(TDImpPtr* self, int32_t toOld) {
  return toOld == 0 ? MutateTo<TDBooleanImp>(self) : 0;
}

void TDBooleanU16Imp::Accept(ITDVisitor* visitor) {
  TDImpPtr held(this);
  if (IsReadOnlyTD() != 0) {
    visitor->VisitBooleanU16(TDRBooleanU16(held, 1));
  } else {
    TDWBooleanU16 writable(held, 1);
    visitor->VisitBooleanU16(writable);
  }
}

bool VoidKind::Admit(const TDImp& type) { return type.IsVoid() != 0; }
TDImpPtr VoidKind::New(const uint8_t* name) { return MakeNamedTD<TDVoidImp>(name); }
bool BooleanKind::Admit(const TDImp& type) { return type.IsBool() != 0; }
TDImpPtr BooleanKind::New(const uint8_t* name) { return MakeNamedTD<TDBooleanImp>(name); }
bool BooleanU16Kind::Admit(const TDImp& type) { return type.IsBoolU16() != 0; }
TDImpPtr BooleanU16Kind::New(const uint8_t* name) { return MakeNamedTD<TDBooleanU16Imp>(name); }

int32_t TDWBoolean::SetEventDiscardMask(int32_t mask) {
  if (!imp_) return kStatusNullHandle;
  imp_->ClearHashValid();
  if (mask != 0) {
    imp_->SetFlagBits(kTDFlagEventDiscard);
  } else {
    imp_->ClearFlagBits(kTDFlagEventDiscard);
  }
  return kStatusNoError;
}

const TDR& GetVoidTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return MakeCounted<TDVoidImp>().StaticCast<TDImp>(); });
}

const TDR& GetBoolTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return MakeCounted<TDBooleanImp>().StaticCast<TDImp>(); });
}

int32_t MutateBooleanTD(TDImpPtr* type, int32_t toOld) {
  if (type == nullptr || !*type) return 0;
  if ((*type)->IsReadOnlyTD() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "What are you doing?  This TDImpPtr is readonly!");
    return 0;
  }
  return (*type)->MutateBooleanTD(type, toOld);
}

int32_t MutateBooleanTD(TDW* type, int32_t toOld) {
  if (type == nullptr || !*type) return 0;
  TDImpPtr imp = type->GetImpPtr();
  const int32_t mutated = MutateBooleanTD(&imp, toOld);
  if (mutated != 0) *type = TDW(imp, 1);
  return mutated;
}

void ITDVisitor::VisitVoid(const TDRVoid& type) { Visit(static_cast<const TDR&>(type)); }
void ITDVisitor::VisitVoid(TDWVoid& type) { Visit(static_cast<TDW&>(type)); }
void ITDVisitor::VisitBoolean(const TDRBoolean& type) { Visit(static_cast<const TDR&>(type)); }
void ITDVisitor::VisitBoolean(TDWBoolean& type) { Visit(static_cast<TDW&>(type)); }
void ITDVisitor::VisitBooleanU16(const TDRBooleanU16& type) { Visit(static_cast<const TDR&>(type)); }
void ITDVisitor::VisitBooleanU16(TDWBooleanU16& type) { Visit(static_cast<TDW&>(type)); }

// --- flattened data --------------------------------------------------------------------------------

namespace {


}  // namespace

uint32_t TDBooleanImp::FlatDataSize(KoDataWriter* writer, const void*) const {
  return writer != nullptr && writer->GetVersion() < kOneByteBooleanVersion ? 2 : 1;
}

void TDBooleanImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  const auto* bytes = static_cast<const uint8_t*>(data);
  if (count > 0 && bytes == nullptr) writer->SetError(kStatusBadArgument);
  if (writer->GetVersion() < kOneByteBooleanVersion) {
    for (int32_t i = 0; i < count && writer->GetError() == kStatusNoError; ++i) writer->WriteBool(bytes[i] != 0);
  } else if (count > 0) {
    writer->WriteBytes(bytes, static_cast<size_t>(count));
  }
}

void TDBooleanImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  auto* bytes = static_cast<uint8_t*>(data);
  if (reader->GetVersion() < kOneByteBooleanVersion) {
    if (count != 1) DebugReport(kDiagnosticModule, __LINE__, 3, "should not be doing multiple old bools");
    for (int32_t i = 0; i < count; ++i) {
      const uint8_t value = reader->ReadBool();
      if (bytes != nullptr) bytes[i] = value;
    }
  } else if (count > 0) {
    if (bytes != nullptr) {
      reader->ReadBytes(bytes, static_cast<size_t>(count));
    } else {
      reader->Skip(static_cast<size_t>(count));
    }
  }
}

void TDBooleanU16Imp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  DebugReport(kDiagnosticModule, __LINE__, 3, "Can't flatten old style boolean.");
  TDImp::WriteFlatData(writer, data, count);
}

void TDBooleanU16Imp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  DebugReport(kDiagnosticModule, __LINE__, 3, "Can't unflatten old style boolean.");
  TDImp::ReadFlatData(reader, data, count);
}
