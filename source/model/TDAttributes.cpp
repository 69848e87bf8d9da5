// Names and typedef links: their hash, equality, flattened form, dump, interning and handles,
// and the string hash they share with the flattened-type cache.
#include "source/model/TDAttributes.h"

#include <bit>
#include <cstring>
#include <string_view>

#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"
#include "source/model/CoreTDTable.h"
#include "source/model/TD.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/TDDataStreams.h"

VELLUM_DIAGNOSTIC_MODULE("TDAttributes");

namespace {


uint32_t HashBytes(const uint8_t* bytes, size_t length) {
  uint32_t hash = 0;
  for (size_t i = 0; i < length && bytes[i] != 0; ++i) {
    hash = std::rotl(hash + bytes[i], static_cast<int>((i + 1) % 32));
  }
  return hash;
}

size_t CStrLength(const uint8_t* cString) {
  return cString != nullptr ? std::strlen(reinterpret_cast<const char*>(cString)) : 0;
}

}  // namespace

int32_t GetPStrHashValue(const uint8_t* pString) {
  if (pString == nullptr) return 0;
  return static_cast<int32_t>(HashBytes(pString + 1, pString[0]));
}

int32_t GetCStrHashValue(const uint8_t* cString) {
  if (cString == nullptr) return 0;
  return static_cast<int32_t>(HashBytes(cString, CStrLength(cString)));
}

int32_t GetNarrowStrHashValue(const std::string& text) {
  return static_cast<int32_t>(HashBytes(reinterpret_cast<const uint8_t*>(text.data()), text.size()));
}

TDAttributeImp::~TDAttributeImp() = default;

// --- names ---------------------------------------------------------------------------------------

TDNameImp::~TDNameImp() { DSDisposePtr(text_); }

TDNameImpPtr TDNameImp::Make(const uint8_t* bytes, size_t length) {
  TDNameImpPtr name = MakeCounted<TDNameImp>();
  if (!name) return name;
  if (name->SetText(bytes, length) != kStatusNoError) return TDNameImpPtr();
  return name;
}

int32_t TDNameImp::SetText(const uint8_t* bytes, size_t length) {
  ClearHashValid();
  if (bytes == nullptr || length == 0) {
    DSDisposePtr(text_);
    text_ = nullptr;
    return kStatusNoError;
  }
  if (length > 255) length = 255;
  UPtr text = nullptr;
  if (DSNewPtr(length + 1, &text) != kStatusNoError) return kStatusOutOfMemory;
  text[0] = static_cast<uint8_t>(length);
  MoveBlock(bytes, text + 1, length);
  DSDisposePtr(text_);
  text_ = text;
  return kStatusNoError;
}

int32_t TDNameImp::SetNamePStr(const uint8_t* pString) {
  if (pString == nullptr) return SetText(nullptr, 0);
  return SetText(pString + 1, pString[0]);
}

const uint8_t* TDNameImp::GetNamePStr() const { return text_ != nullptr ? text_ : EmptyPStr(); }

int32_t TDNameImp::ComputeHashValue() const { return GetPStrHashValue(text_); }

int32_t TDNameImp::IsEqual(const TDAttributeImp& other) const {
  if (this == &other) return 1;
  if (other.IsNameAttribute() == 0) return 0;
  const auto& name = static_cast<const TDNameImp&>(other);
  if (GetHashValue() != name.GetHashValue()) return 0;
  if (text_ == nullptr || name.text_ == nullptr) return text_ == name.text_ ? 1 : 0;
  return PStrCmp(text_, name.text_) == 0 ? 1 : 0;
}

void TDNameImp::AddFlatSize(int32_t* size, const TDDataWriter*) const {
  if (text_ != nullptr) *size += (text_[0] + 2) & ~1;
}

int32_t TDNameImp::Flatten(TDDataWriter* writer) const {
  if (text_ == nullptr) return writer->GetError();
  writer->WritePStr(text_);
  if ((text_[0] + 1) % 2 != 0) writer->WriteU8(0);
  return writer->GetError();
}

int32_t TDNameImp::UnFlatten(TDDataReader* reader) {
  uint8_t text[256] = {};
  int32_t status = reader->ReadPStr(text);
  if (status == kStatusNoError && (text[0] + 1) % 2 != 0) status = reader->Skip(1);  // the pad byte
  if (status != kStatusNoError) return status;
  return SetNamePStr(text);
}

void TDNameImp::PrintDebugStr(const uint8_t* prefix) const {
  if (text_ == nullptr || text_[0] == 0) return;
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "name = '").AppendPStr(text_).Append("'").Process();
}

TDNameImpPtr TDNameImp::CheckIn() const {
  if (text_ == nullptr) return MakeCounted<TDNameImp>();
  NameDictionary& dictionary = TheNameDictionary();
  if (TDNameImpPtr hit = dictionary.Find(*this)) return hit;
  TDNameImpPtr copy = Make(text_ + 1, text_[0]);
  if (!copy) return copy;
  if (dictionary.Insert(copy) != kStatusNoError) return TDNameImpPtr();
  return copy;
}

TDNameImpPtr TDNameImp::CloneOrCheckOut() const {
  if (text_ == nullptr) return MakeCounted<TDNameImp>();
  return Make(text_ + 1, text_[0]);
}

// --- typedef links --------------------------------------------------------------------------------

TDTypedefImp::~TDTypedefImp() { FDestroyPath(&viPath_); }

TDTypedefImpPtr TDTypedefImp::Make(const QualifiedName& viName, uint32_t timeStamp, Path viPath) {
  TDTypedefImpPtr link = MakeCounted<TDTypedefImp>();
  if (!link) return link;
  if (link->SetVIName(viName) != kStatusNoError || link->SetVIPath(viPath) != kStatusNoError) {
    return TDTypedefImpPtr();
  }
  link->timeStamp_ = timeStamp;
  return link;
}

int32_t TDTypedefImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(viName_.NumElts());
  for (int32_t i = 0; i < viName_.NumElts(); ++i) {
    hash += static_cast<uint32_t>(GetCStrHashValue(reinterpret_cast<const uint8_t*>(viName_[i].c_str())));
  }
  hash += timeStamp_;
  if (IsPathized()) hash += 1;
  return static_cast<int32_t>(hash);
}

int32_t TDTypedefImp::IsEqual(const TDAttributeImp& other) const {
  if (this == &other) return 1;
  if (other.IsTypedefAttribute() == 0) return 0;
  const auto& link = static_cast<const TDTypedefImp&>(other);
  if (GetHashValue() != link.GetHashValue()) return 0;
  if (timeStamp_ != link.timeStamp_) return 0;
  if (!viName_.Equal(link.viName_)) return 0;
  return FPathCmp(viPath_, link.viPath_) == 0 ? 1 : 0;
}

namespace {

// A typedef of a version before qualified names holds one name, its file name, in a PStr padded
// to even length: what a reader of that version reads back.
size_t OneNameFlatSize(const QualifiedName& name) {
  const size_t length = name.NumElts() > 0 ? name.GetFileName().size() : 0;
  return (length + 2) & ~size_t{1};
}

}  // namespace

void TDTypedefImp::AddFlatSize(int32_t* size, const TDDataWriter* writer) const {
  const uint32_t version = writer->GetVersion();
  *size += 8 + (version < kTypedefOneNameVersion ? static_cast<int32_t>(OneNameFlatSize(viName_))
                                                  : viName_.GetFlatSize(version));
}

int32_t TDTypedefImp::Flatten(TDDataWriter* writer) const {
  writer->WriteU32(timeStamp_);
  if (writer->GetVersion() >= kTypedefOneNameVersion) {
    viName_.Flatten(writer);
    return writer->GetError();
  }
  const std::string fileName = viName_.NumElts() > 0 ? viName_.GetFileName() : std::string();
  if (fileName.size() > 255) {
    (VELLUM_DEBUG(2) << "A typedef name of more than 255 bytes cannot be saved for version ")
        .AppendHex32(writer->GetVersion())
        .Process();
    writer->SetError(kStatusBadArgument);
    return kStatusBadArgument;
  }
  writer->WriteU8(static_cast<uint8_t>(fileName.size()));
  writer->WriteBytes(fileName.data(), fileName.size());
  if (fileName.size() % 2 == 0) writer->WriteU8(0);
  return writer->GetError();
}

int32_t TDTypedefImp::UnFlatten(TDDataReader* reader) {
  uint32_t timeStamp = 0;
  int32_t status = reader->ReadU32(&timeStamp);
  if (status != kStatusNoError) return status;
  QualifiedName viName;
  if (reader->GetVersion() < kTypedefOneNameVersion) {
    uint8_t text[256] = {};
    status = reader->ReadPStr(text);
    if (status == kStatusNoError && (text[0] + 1) % 2 != 0) status = reader->Skip(1);  // the pad byte
    if (status == kStatusNoError) status = viName.Insert(text, 0);
  } else {
    status = viName.UnFlatten(reader);
  }
  if (status != kStatusNoError) return status;
  status = SetVIName(viName);
  if (status != kStatusNoError) return status;
  timeStamp_ = timeStamp;
  ClearHashValid();
  return kStatusNoError;
}

int32_t TDTypedefImp::Skip(TDDataReader* reader) const {
  reader->Skip(4);
  int32_t count = 0;
  int32_t status = reader->ReadI32(&count);
  if (status != kStatusNoError) return status;
  if (count < 0) {
    reader->SetError(kStatusCorruptData);
    return reader->GetError();
  }
  for (int32_t i = 0; i < count && status == kStatusNoError; ++i) {
    uint8_t length = 0;
    status = reader->ReadU8(&length);
    if (status == kStatusNoError) status = reader->Skip(length);
  }
  return status;
}

void TDTypedefImp::PrintDebugStr(const uint8_t* prefix) const {
  std::string text;
  viName_.ToDelimitedName(&text);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "control name = '" << text << "'").Process();
  if (timeStamp_ != 0) {
    (VELLUM_DEBUG(0) << PrefixText(prefix) << "time stamp = ").AppendHex32(timeStamp_).Process();
  }
}

int32_t TDTypedefImp::SetVIName(const QualifiedName& viName) {
  ClearHashValid();
  return viName_.Copy(viName);
}

void TDTypedefImp::SetTimeStamp(uint32_t timeStamp) {
  ClearHashValid();
  timeStamp_ = timeStamp;
}

int32_t TDTypedefImp::SetVIPath(Path viPath) {
  ClearHashValid();
  Path copy = nullptr;
  if (viPath != nullptr && FPathCopy(viPath, &copy) != kStatusNoError) return kStatusOutOfMemory;
  FDestroyPath(&viPath_);
  viPath_ = copy;
  return kStatusNoError;
}

TDTypedefImpPtr TDTypedefImp::CheckIn() const {
  TypedefDictionary& dictionary = TheTypedefDictionary();
  if (TDTypedefImpPtr hit = dictionary.Find(*this)) return hit;
  TDTypedefImpPtr copy = CloneOrCheckOut();
  if (!copy) return copy;
  if (dictionary.Insert(copy) != kStatusNoError) return TDTypedefImpPtr();
  return copy;
}

TDTypedefImpPtr TDTypedefImp::CloneOrCheckOut() const { return Make(viName_, timeStamp_, viPath_); }

// --- handles --------------------------------------------------------------------------------------

namespace {

template <class Imp>
TDTypedPtr<Imp> As(const TDAttributeImpPtr& p) {
  return p.StaticCast<Imp>();
}

bool IsName(const TDAttributeImpPtr& p) { return p && p->IsNameAttribute() != 0; }
bool IsTypedef(const TDAttributeImpPtr& p) { return p && p->IsTypedefAttribute() != 0; }

}  // namespace

int32_t TDAttribute::IsNameAttribute() const { return imp_ ? imp_->IsNameAttribute() : 0; }
int32_t TDAttribute::IsTypedefAttribute() const { return imp_ ? imp_->IsTypedefAttribute() : 0; }
int32_t TDAttribute::IsEnumAttribute() const { return imp_ ? imp_->IsEnumAttribute() : 0; }
int32_t TDAttribute::IsUnitsAttribute() const { return imp_ ? imp_->IsUnitsAttribute() : 0; }
int32_t TDAttribute::GetHashValue() const { return imp_ ? imp_->GetHashValue() : 0; }

int32_t TDAttribute::PrintDebugStr() const {
  if (imp_) imp_->PrintDebugStr(nullptr);
  return 0;
}

TDRName::TDRName(const uint8_t* cString) {
  const size_t length = CStrLength(cString);
  if (length == 0) return;
  TDNameImpPtr name = TDNameImp::Make(cString, length);
  if (name) imp_ = name->CheckIn();
}

TDRName::TDRName(const TDNameImpPtr& p, int32_t take) {
  if (take != 0 && p) imp_ = p;
}

TDNameImpPtr TDRName::GetNameImpPtr() const { return IsName(imp_) ? As<TDNameImp>(imp_) : TDNameImpPtr(); }

const uint8_t* TDRName::GetNamePStr() const {
  return IsName(imp_) ? As<TDNameImp>(imp_)->GetNamePStr() : EmptyPStr();
}

TDWName TDRName::CheckOut() const {
  if (!IsName(imp_)) return TDWName();
  return TDWName(As<TDNameImp>(imp_)->CloneOrCheckOut(), 1);
}

TDWName::TDWName(const uint8_t* cString) {
  TDNameImpPtr name = TDNameImp::Make(cString, CStrLength(cString));
  imp_ = name;
}

TDWName::TDWName(const TDNameImpPtr& p, int32_t take) {
  if (take != 0 && p && !p->IsInterned()) imp_ = p;
}

TDNameImpPtr TDWName::GetNameImpPtr() const { return IsName(imp_) ? As<TDNameImp>(imp_) : TDNameImpPtr(); }

const uint8_t* TDWName::GetNamePStr() const {
  return IsName(imp_) ? As<TDNameImp>(imp_)->GetNamePStr() : EmptyPStr();
}

int32_t TDWName::SetName(std::string_view name) {
  if (!IsName(imp_)) return kStatusNullHandle;
  return As<TDNameImp>(imp_)->SetText(reinterpret_cast<const uint8_t*>(name.data()), name.size());
}

int32_t TDWName::SetName(const uint8_t* cString) {
  if (!IsName(imp_)) return kStatusNullHandle;
  return As<TDNameImp>(imp_)->SetText(cString, CStrLength(cString));
}

int32_t TDWName::SetNamePStr(const uint8_t* pString) {
  if (!IsName(imp_)) return kStatusNullHandle;
  return As<TDNameImp>(imp_)->SetNamePStr(pString);
}

TDRName TDWName::CheckIn() const {
  if (!IsName(imp_)) return TDRName();
  return TDRName(As<TDNameImp>(imp_)->CheckIn(), 1);
}

TDWName TDWName::Clone() const {
  if (!IsName(imp_)) return TDWName();
  return TDWName(As<TDNameImp>(imp_)->CloneOrCheckOut(), 1);
}

TDRTypedef::TDRTypedef(const TDTypedefImpPtr& p, int32_t take) {
  if (take != 0 && p) imp_ = p;
}

TDTypedefImpPtr TDRTypedef::GetTypedefImpPtr() const {
  return IsTypedef(imp_) ? As<TDTypedefImp>(imp_) : TDTypedefImpPtr();
}

QualifiedName TDRTypedef::GetVIName() const {
  return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetVIName() : QualifiedName();
}

uint32_t TDRTypedef::GetTimeStamp() const { return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetTimeStamp() : 0; }

Path TDRTypedef::GetVIPath() const { return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetVIPath() : nullptr; }

int32_t TDRTypedef::IsPathized() const {
  return IsTypedef(imp_) && As<TDTypedefImp>(imp_)->IsPathized() ? 1 : 0;
}

TDWTypedef TDRTypedef::CheckOut() const {
  if (!IsTypedef(imp_)) return TDWTypedef();
  return TDWTypedef(As<TDTypedefImp>(imp_)->CloneOrCheckOut(), 1);
}

TDWTypedef::TDWTypedef(const QualifiedName& viName, uint32_t timeStamp, Path viPath) {
  imp_ = TDTypedefImp::Make(viName, timeStamp, viPath);
}

TDWTypedef::TDWTypedef(const TDTypedefImpPtr& p, int32_t take) {
  if (take != 0 && p && !p->IsInterned()) imp_ = p;
}

TDTypedefImpPtr TDWTypedef::GetTypedefImpPtr() const {
  return IsTypedef(imp_) ? As<TDTypedefImp>(imp_) : TDTypedefImpPtr();
}

QualifiedName TDWTypedef::GetVIName() const {
  return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetVIName() : QualifiedName();
}

uint32_t TDWTypedef::GetTimeStamp() const { return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetTimeStamp() : 0; }

Path TDWTypedef::GetVIPath() const { return IsTypedef(imp_) ? As<TDTypedefImp>(imp_)->GetVIPath() : nullptr; }

int32_t TDWTypedef::IsPathized() const {
  return IsTypedef(imp_) && As<TDTypedefImp>(imp_)->IsPathized() ? 1 : 0;
}

int32_t TDWTypedef::SetVIName(const QualifiedName& viName) {
  if (!IsTypedef(imp_)) return kStatusNullHandle;
  return As<TDTypedefImp>(imp_)->SetVIName(viName);
}

int32_t TDWTypedef::SetVIPath(Path viPath) {
  if (!IsTypedef(imp_)) return kStatusNullHandle;
  return As<TDTypedefImp>(imp_)->SetVIPath(viPath);
}

int32_t TDWTypedef::SetTimeStamp(uint32_t timeStamp) {
  if (!IsTypedef(imp_)) return kStatusNullHandle;
  As<TDTypedefImp>(imp_)->SetTimeStamp(timeStamp);
  return kStatusNoError;
}

TDRTypedef TDWTypedef::CheckIn() const {
  if (!IsTypedef(imp_)) return TDRTypedef();
  return TDRTypedef(As<TDTypedefImp>(imp_)->CheckIn(), 1);
}

TDWTypedef TDWTypedef::Clone() const {
  if (!IsTypedef(imp_)) return TDWTypedef();
  return TDWTypedef(As<TDTypedefImp>(imp_)->CloneOrCheckOut(), 1);
}
