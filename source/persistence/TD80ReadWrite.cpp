// Type strings: the stream classes that write and read lists of descriptors, each descriptor
// once, with containers referring to their elements by index; the list functions over them.
#include "source/persistence/TD80ReadWrite.h"

#include <algorithm>
#include <atomic>
#include <limits>
#include <new>

#include "runtime/DebugStream.h"
#include "runtime/PXResources.h"
#include "source/model/CoreTDTable.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/RecordFormat.h"
#include "vellum/TypeManagerHooks.h"

VELLUM_DIAGNOSTIC_MODULE("TD80ReadWrite");

namespace {


std::atomic<ReadOldTDProc> gReadOldTDProc{nullptr};
std::atomic<WriteOldTDProc> gWriteOldTDProc{nullptr};

bool IsSane(const TD& type) {
  const TDSanityCheckProc check = GetTDSanityCheckProc();
  return check == nullptr || check(type) != 0;
}

// The record's flag bits become the descriptor's flag word.
uint32_t FlagsFromCodeWord(uint16_t codeWord) {
  uint32_t flags = 0;
  if ((codeWord & kCodeWordNoSelect) != 0) flags |= kTDFlagNoSelect;
  if ((codeWord & kCodeWordEphemeral) != 0) flags |= kTDFlagEphemeral;
  if ((codeWord & kCodeWordEventDiscard) != 0 &&
      (codeWord & kCodeWordTypeCodeMask) == static_cast<uint16_t>(TypeCode::Boolean))
    flags |= kTDFlagEventDiscard;
  if ((codeWord & kCodeWordGeneric) != 0) flags |= kTDFlagGeneric;
  if ((codeWord & kCodeWordColumnVector) != 0) flags |= kTDFlagColumnVector;
  return flags;
}

// Why a descriptor is beyond what a load accepts; null when it is not.
const char* ExceedsLimits(const TDImp& type) {
  if (type.NestingDepth() > kMaxTypeNestingDepth) return "nesting deeper than 256 levels";
  if (type.ExpandedCount() > kMaxTypeExpandedCount) return "more than 16777216 descriptors when expanded";
  if (type.DataSizeCore(nullptr) >= std::numeric_limits<int32_t>::max()) return "data size does not fit in 31 bits";
  return nullptr;
}

}  // namespace

const TDR& TDDataReader::ConstructEltTD() {
  if (GetError() != kStatusNoError) return GNullTD();
  int32_t size = 0;
  if (ReadVariableSizeField(&size) != kStatusNoError || size < static_cast<int32_t>(kMinRecordBytes))
    return GNullTD();
  uint16_t codeWord = 0;
  if (ReadU16(&codeWord) != kStatusNoError) return GNullTD();

  TDTypedefImpPtr link;
  if ((codeWord & kCodeWordTypeCodeMask) == kTypedefMarker) {
    link = MakeCounted<TDTypedefImp>();
    if (!link) {
      SetError(kStatusOutOfMemory);
      return GNullTD();
    }
    if (const int32_t status = link->UnFlatten(this); status != kStatusNoError) {
      SetError(status);
      return GNullTD();
    }
    ReadVariableSizeField(nullptr);  // the inner size tells a reader nothing it needs
    if (ReadU16(&codeWord) != kStatusNoError) return GNullTD();
  }

  const uint16_t code = codeWord & kCodeWordTypeCodeMask;
  const TDTypeFactory* factory = GetTypeFactory(code);
  if (factory == nullptr) {
    (VELLUM_DEBUG(2) << "ConstructEltTD(): type code " << code << " is invalid.").Process();
    SetError(kStatusNullHandle);
    return GNullTD();
  }
  // A writer of an older version cannot save this kind, so no string of that version holds one.
  if (GetVersion() < FirstVersionWithTypeCode(code)) {
    (VELLUM_DEBUG(2) << "Type string refused: type code " << code << " did not exist in version ")
        .AppendHex32(GetVersion())
        .Process();
    SetError(kStatusImplausibleData);
    return GNullTD();
  }
  int32_t status = kStatusNoError;
  TDImpPtr type = factory->CreateTD(this, code, &status);
  if (status == kStatusNoError && !type) status = kStatusOutOfMemory;
  if (status == kStatusNoError) status = type->ConstructTD(this);
  if (status == kStatusNoError) status = GetError();
  if (status != kStatusNoError) {
    SetError(status);
    return GNullTD();
  }
  type->SetFlags(FlagsFromCodeWord(codeWord));
  type->ClearHashValid();

  if (link) type->SetTypedefImpPtr(link);
  if ((codeWord & kCodeWordNamed) != 0) {
    TDNameImpPtr name = MakeCounted<TDNameImp>();
    if (!name) {
      SetError(kStatusOutOfMemory);
      return GNullTD();
    }
    if (const int32_t nameStatus = name->UnFlatten(this); nameStatus != kStatusNoError) {
      SetError(nameStatus);
      return GNullTD();
    }
    if (name->HasText()) type->SetNameImpPtr(name);
  }

  if (const char* refusal = ExceedsLimits(*type)) {
    (VELLUM_DEBUG(2) << "Type string refused: " << refusal).Process();
    // Sound bytes that describe too much: not damage, so no second message says so.
    SetError(kStatusImplausibleData);
    return GNullTD();
  }
  TDImpPtr interned = type->CheckIn();
  if (!interned) {
    SetError(kStatusOutOfMemory);
    return GNullTD();
  }
  if (const int32_t appendStatus = AppendTDToLoadTable(interned); appendStatus != kStatusNoError) {
    SetError(appendStatus);
    return GNullTD();
  }
  const TDR& loaded = table_.back();
  if (!IsSane(loaded)) DebugReport(kDiagnosticModule, __LINE__, 3, "UnFlattenListOfTypes : Loading an insane type descriptor.");
  return loaded;
}

// --- lists -----------------------------------------------------------------------------------------

namespace {

// Hands the written bytes out as a new handle.
int32_t HandOut(const OutputBuf& out, UHandle* outHandle) {
  UHandle handle = nullptr;
  if (const int32_t status = out.CopyToHandle(&handle); status != kStatusNoError) return status;
  *outHandle = handle;
  return kStatusNoError;
}

int32_t WriteConsolidated(TDDataWriter& writer, const PersistTDData& persist, const TMTypeList* list,
                          const uint32_t* extra, int32_t single, int32_t skipNull) {
  const int32_t count = list != nullptr ? list->GetNumTypes() : 0;
  if (persist.DefersIndices()) {
    uint32_t reference = 0;
    if (single == 0 || !persist.PopPendingIndex(&reference)) {
      DebugReport(kDiagnosticModule, __LINE__, 3, "invalid call");
      return kStatusNullHandle;
    }
    writer.WriteVariableSizeField(static_cast<int32_t>(reference));
    return writer.GetError();
  }
  TMTypeList* shared = persist.GetTypeList();
  if (shared == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "invalid call");
    return kStatusNullHandle;
  }
  // A run of equal descriptors already in the shared list is referred to where it stands.
  int32_t reference = 0;
  const int32_t sharedCount = shared->GetNumTypes();
  for (int32_t start = 0; count > 0 && start + count <= sharedCount && reference == 0; ++start) {
    bool match = true;
    for (int32_t k = 0; k < count && match; ++k)
      match = shared->GetType(static_cast<uint32_t>(start + k)) == list->GetType(static_cast<uint32_t>(k));
    if (match) reference = start + 1;
  }
  if (reference == 0 && count > 0) {
    for (int32_t k = 0; k < count; ++k) {
      TDR entry = list->GetType(static_cast<uint32_t>(k));
      if (!entry) {
        if (skipNull == 0) DebugReport(kDiagnosticModule, __LINE__, 3, "");
        entry = MakeDefaultTDRForTypeCode(static_cast<int32_t>(TypeCode::Void));
      }
      uint32_t position = 0;
      if (const int32_t status = shared->AppendType(entry, &position); status != kStatusNoError) return status;
      if (k == 0) reference = static_cast<int32_t>(position);
    }
  }
  if (single == 0) writer.WriteVariableSizeField(count);
  if (single != 0 || count != 0) writer.WriteVariableSizeField(reference);
  if (extra != nullptr)
    for (int32_t k = 0; k < count; ++k) writer.WriteVariableSizeField(static_cast<int32_t>(extra[k]));
  return writer.GetError();
}

int32_t WriteOrdinary(TDDataWriter& writer, OutputBuf& out, const TMTypeList* list, const uint32_t* extra,
                      int32_t skipNull) {
  const int32_t count = list != nullptr ? list->GetNumTypes() : 0;
  std::vector<uint32_t, PXAllocator<uint32_t>> indices;
  try {
    indices.resize(static_cast<size_t>(count));
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  const size_t countAt = out.GetBytesWritten();
  writer.WriteU32(0);
  for (int32_t k = 0; k < count; ++k) {
    const TDR& entry = list->GetType(static_cast<uint32_t>(k));
    if (!entry && skipNull != 0) {
      indices[static_cast<size_t>(k)] = k > 0 ? indices[static_cast<size_t>(k) - 1] : 0;
      continue;
    }
    if (!IsSane(entry)) DebugReport(kDiagnosticModule, __LINE__, 3, "Saving an insane type descriptor.");
    // What no load accepts is not saved either: the failure belongs to the save, not to a later load.
    if (const char* refusal = entry ? ExceedsLimits(*entry.GetImp()) : nullptr) {
      (VELLUM_DEBUG(2) << "Type not saved, no load would accept it: " << refusal).Process();
      writer.SetError(kStatusBadArgument);
      break;
    }
    if (const int32_t status = SaveTDRecord(entry.GetImpPtr().get(), &writer, &indices[static_cast<size_t>(k)]);
        status != kStatusNoError) {
      writer.SetError(status);
      break;
    }
  }
  writer.WriteVariableSizeField(count);
  for (int32_t k = 0; k < count && writer.GetError() == kStatusNoError; ++k) {
    writer.WriteVariableSizeField(static_cast<int32_t>(indices[static_cast<size_t>(k)]));
    if (extra != nullptr) writer.WriteVariableSizeField(static_cast<int32_t>(extra[k]));
  }
  if (writer.GetError() != kStatusNoError) return writer.GetError();
  // The record count goes in front once every record is written.
  OutputBuf patch;
  BinDataWriter countWriter(&patch, writer.GetEndianizer());
  countWriter.WriteU32(static_cast<uint32_t>(writer.GetSaveTableSize()));
  if (countWriter.GetError() != kStatusNoError) return countWriter.GetError();
  return out.Overwrite(countAt, patch.Data(), patch.GetBytesWritten());
}

}  // namespace

int32_t FlattenListOfTypes(const PersistTDData* persist, const TMTypeList* list, const uint32_t* extra,
                           UHandle* outHandle, int32_t single, const Endianizer* endianizer, int32_t skipNull) {
  if (outHandle == nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "FlattenListOfTypes : Do not pass hdl as NULL in FlattenListOfTypes");
    return kStatusNullHandle;
  }
  static const BigEndianizer kBigEndian;
  OutputBuf out;
  TDDataWriter writer(persist, &out, endianizer != nullptr ? endianizer : &kBigEndian);
  const PersistTDData& context = *writer.GetPersistTDData();
  const int32_t status = context.PersistingWithConsolidatedTypes()
                             ? WriteConsolidated(writer, context, list, extra, single, skipNull)
                             : WriteOrdinary(writer, out, list, extra, skipNull);
  if (status != kStatusNoError || writer.GetError() != kStatusNoError) {
    DebugReport(kDiagnosticModule, __LINE__, 2, "Saving type descriptors encountered an error!");
    return status != kStatusNoError ? status : writer.GetError();
  }
  return HandOut(out, outHandle);
}

int32_t FlattenOneType(const PersistTDData* persist, const TDR& type, UHandle* outHandle,
                       const Endianizer* endianizer) {
  TMTypeList list;
  if (!list.IsValid()) return kStatusOutOfMemory;
  if (type) {
    uint32_t position = 0;
    // A valid list refuses only when it cannot grow.
    if (list.AppendType(type, &position) != kStatusNoError) return kStatusOutOfMemory;
  }
  return FlattenListOfTypes(persist, &list, nullptr, outHandle, 1, endianizer, 0);
}

int32_t SaveListOfTypes(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                        const TMTypeList* list, const uint32_t* extra, int32_t single, int32_t skipNull) {
  UHandle handle = nullptr;
  if (const int32_t status = FlattenListOfTypes(persist, list, extra, &handle, single, nullptr, skipNull);
      status != kStatusNoError)
    return status;
  const int32_t status = RAdd(handle, resId, resType, fileRef, 0);
  if (status != kStatusNoError) DSDisposeHandle(handle);
  return status;
}

int32_t SaveListOfOneType(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                          const TDR& type) {
  TMTypeList list;
  if (!list.IsValid()) return kStatusOutOfMemory;
  if (type) {
    uint32_t position = 0;
    // A valid list refuses only when it cannot grow.
    if (list.AppendType(type, &position) != kStatusNoError) return kStatusOutOfMemory;
  }
  return SaveListOfTypes(persist, fileRef, resId, resType, &list, nullptr, 1, 0);
}

namespace {

int32_t ReadOrdinary(TDDataReader& reader, TMTypeList* out, uint32_t** outExtra) {
  uint32_t records = 0;
  if (reader.ReadU32(&records) != kStatusNoError) return kStatusOutOfMemory;
  if (reader.ReserveTDLoadTable(records) != kStatusNoError) return kStatusOutOfMemory;
  for (uint32_t r = 0; r < records; ++r) {
    const TDR& type = reader.ConstructEltTD();
    if (!type) return kStatusOutOfMemory;
    if (type.IsRecursiveType() != 0 && type.IsKoObjRef() != 0)
      if (const int32_t status = InsertRecursiveTypeIntoTable(type); status != kStatusNoError) return status;
  }
  int32_t entries = 0;
  if (reader.ReadVariableSizeField(&entries) != kStatusNoError || entries < 0) return kStatusOutOfMemory;
  // Each entry takes at least two bytes: a count the input cannot hold reserves no more.
  const auto room = static_cast<uint32_t>(std::min<size_t>(static_cast<size_t>(entries),
                                                            reader.BytesLeft() / kMinEntryBytes));
  if (out->ReserveList(static_cast<uint32_t>(out->GetNumTypes()) + room) != kStatusNoError)
    return kStatusOutOfMemory;
  UPtr extra = nullptr;
  if (outExtra != nullptr) {
    if (static_cast<size_t>(entries) > reader.BytesLeft() / (2 * kMinEntryBytes)) return kStatusOutOfMemory;
    if (DSNewPtr(static_cast<size_t>(entries) * sizeof(uint32_t), &extra) != kStatusNoError)
      return kStatusOutOfMemory;
  }
  int32_t status = kStatusNoError;
  for (int32_t k = 0; k < entries && status == kStatusNoError; ++k) {
    const TDR& type = reader.GetTypeRef();
    if (reader.GetError() != kStatusNoError) {
      status = kStatusOutOfMemory;
      break;
    }
    uint32_t position = 0;
    if (out->AppendType(type, &position) != kStatusNoError) status = kStatusOutOfMemory;
    if (extra != nullptr) {
      int32_t value = 0;
      if (reader.ReadVariableSizeField(&value) != kStatusNoError) status = kStatusOutOfMemory;
      reinterpret_cast<uint32_t*>(extra)[k] = static_cast<uint32_t>(value);
    }
  }
  if (status != kStatusNoError) {
    DSDisposePtr(extra);
    return status;
  }
  if (outExtra != nullptr) *outExtra = reinterpret_cast<uint32_t*>(extra);
  return kStatusNoError;
}

int32_t ReadConsolidated(TDDataReader& reader, const PersistTDData& persist, TMTypeList* out,
                         uint32_t** outExtra, int32_t single) {
  int32_t count = 1;
  if (single == 0 && reader.ReadVariableSizeField(&count) != kStatusNoError) return kStatusOutOfMemory;
  if (count < 0) return kStatusOutOfMemory;
  int32_t reference = 0;
  if ((single != 0 || count > 0) && reader.ReadVariableSizeField(&reference) != kStatusNoError)
    return kStatusOutOfMemory;
  if (persist.DefersIndices()) persist.PushPendingIndex(static_cast<uint32_t>(reference));
  const TMTypeList* shared = persist.GetTypeList();
  UPtr extra = nullptr;
  if (outExtra != nullptr) {
    if (static_cast<size_t>(count) > reader.BytesLeft() / kMinEntryBytes) return kStatusOutOfMemory;
    if (DSNewPtr(static_cast<size_t>(count) * sizeof(uint32_t), &extra) != kStatusNoError) return kStatusOutOfMemory;
  }
  int32_t status = kStatusNoError;
  for (int32_t k = 0; k < count && status == kStatusNoError; ++k) {
    // References are 1-based; one outside the shared list stands for the null descriptor.
    const int64_t position = static_cast<int64_t>(reference) - 1 + k;
    const TDR& type = shared != nullptr && position >= 0 ? shared->GetType(static_cast<uint32_t>(position)) : GNullTD();
    uint32_t slot = 0;
    if (out->AppendType(type, &slot) != kStatusNoError) status = kStatusOutOfMemory;
    if (extra != nullptr) {
      int32_t value = 0;
      if (reader.ReadVariableSizeField(&value) != kStatusNoError) status = kStatusOutOfMemory;
      reinterpret_cast<uint32_t*>(extra)[k] = static_cast<uint32_t>(value);
    }
  }
  if (status != kStatusNoError) {
    DSDisposePtr(extra);
    return status;
  }
  if (outExtra != nullptr) *outExtra = reinterpret_cast<uint32_t*>(extra);
  return kStatusNoError;
}

}  // namespace

int32_t UnFlattenListOfTypes(const PersistTDData* persist, const uint8_t* data, uint32_t size, TMTypeList* out,
                             uint32_t** outExtra, int32_t single, const Endianizer* endianizer) {
  if (out == nullptr) return kStatusBadArgument;
  if (outExtra != nullptr) *outExtra = nullptr;
  static const BigEndianizer kBigEndian;
  InputBuf in(data, size);
  TDDataReader reader(persist, &in, endianizer != nullptr ? endianizer : &kBigEndian);
  const PersistTDData& context = *reader.GetPersistTDData();
  const int32_t status = context.PersistingWithConsolidatedTypes()
                             ? ReadConsolidated(reader, context, out, outExtra, single)
                             : ReadOrdinary(reader, out, outExtra);
  if (reader.GetError() == kStatusCorruptData)
    DebugReport(kDiagnosticModule, __LINE__, 2, "UnFlattenListOfTypes : The type string is damaged or ends early.");
  return status;
}

int32_t UnFlattenListOfTypes(const PersistTDData* persist, UHandle handle, TMTypeList* out, uint32_t** outExtra,
                             int32_t single, const Endianizer* endianizer) {
  const uint8_t* data = handle != nullptr && IsDSHandle(handle) ? *handle : nullptr;
  const auto size = data != nullptr ? static_cast<uint32_t>(DSGetHandleSize(handle)) : 0u;
  return UnFlattenListOfTypes(persist, data, size, out, outExtra, single, endianizer);
}

int32_t UnFlattenOneType(const PersistTDData* persist, const uint8_t* data, uint32_t size, TDR* out,
                         const Endianizer* endianizer) {
  if (out == nullptr) return kStatusBadArgument;
  TMTypeList list;
  if (!list.IsValid()) return kStatusOutOfMemory;
  if (const int32_t status = UnFlattenListOfTypes(persist, data, size, &list, nullptr, 1, endianizer);
      status != kStatusNoError)
    return status;
  if (list.GetNumTypes() > 1) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "UnFlattenOneType : We're only supposed to have one type.");
    return kStatusNullHandle;
  }
  *out = list.GetNumTypes() == 1 ? list.GetType(0) : GNullTD();
  return kStatusNoError;
}

int32_t UnFlattenOneType(const PersistTDData* persist, UHandle handle, TDR* out, const Endianizer* endianizer) {
  const uint8_t* data = handle != nullptr && IsDSHandle(handle) ? *handle : nullptr;
  const auto size = data != nullptr ? static_cast<uint32_t>(DSGetHandleSize(handle)) : 0u;
  return UnFlattenOneType(persist, data, size, out, endianizer);
}

int32_t LoadListOfOneType(const PersistTDData* persist, int32_t fileRef, uint32_t resId, uint32_t resType,
                          TDR* out) {
  UHandle handle = nullptr;
  if (const int32_t status = RGet(resId, resType, fileRef, &handle); status != kStatusNoError) return status;
  return UnFlattenOneType(persist, handle, out, nullptr);
}

void SetReadOldTDProc(ReadOldTDProc proc) { gReadOldTDProc.store(proc); }
void SetWriteOldTDProc(WriteOldTDProc proc) { gWriteOldTDProc.store(proc); }
ReadOldTDProc GetReadOldTDProc() { return gReadOldTDProc.load(); }
WriteOldTDProc GetWriteOldTDProc() { return gWriteOldTDProc.load(); }
