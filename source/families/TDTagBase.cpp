// Tags: identity by kind, context and class, their compatibility with strings, the kind's guard
// against crossing into or out of the user-defined kind, the factory, shared default and handles.
#include "source/families/TDTagBase.h"

#include <cstring>
#include <functional>
#include <string>

#include "runtime/DebugStream.h"
#include "runtime/PXStrings.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TypeStrings.h"

VELLUM_DIAGNOSTIC_MODULE("TDTagBase");

namespace {

// The kinds whose tags convert into each other.
constexpr TagType kTagTypeConvertibleA = 1;
constexpr TagType kTagTypeConvertibleB = 2;
// The kind whose data a Tallis refnum can give.
constexpr TagType kTagTypeTallis = 15;
constexpr size_t kMaxClassLength = 255;
// The valid kinds.
constexpr TagType kFirstTagType = 1;
constexpr TagType kLastTagType = 23;

bool IsValidTagType(int32_t kind) { return kind >= kFirstTagType && kind <= kLastTagType; }

// A stored kind outside the valid ones is reported; when it reads as a valid kind with its two
// bytes swapped, it was written in the wrong byte order and the swapped kind is taken.
uint16_t RepairedTagType(uint16_t kind) {
  if (IsValidTagType(kind)) return kind;
  (VELLUM_DEBUG(2) << "invalid tag type:" << static_cast<int32_t>(kind)).Process();
  const auto swapped = static_cast<uint16_t>((kind >> 8) | (kind << 8));
  if (!IsValidTagType(swapped)) return kind;
  (VELLUM_DEBUG(2) << "replacing invalid tag type:" << static_cast<int32_t>(kind) << " with:"
                    << static_cast<int32_t>(swapped))
      .Process();
  return swapped;
}

std::atomic<TagComparisonFunc> gComparisonFunc{nullptr};

uint32_t ContextBits(const KoContext* context) {
  return static_cast<uint32_t>(reinterpret_cast<uintptr_t>(context));
}

const TDTagBaseImp* AsTag(const TDImp* type) {
  return type != nullptr && type->IsTag() != 0 ? static_cast<const TDTagBaseImp*>(type) : nullptr;
}

const TDUserDefinedTagImp* AsUserDefinedTag(const TDImp* type) {
  return type != nullptr && type->IsUserDefinedTag() != 0 ? static_cast<const TDUserDefinedTagImp*>(type) : nullptr;
}

// Absent sorts and compares as the empty class; the setter never stores an empty one.
int32_t CompareClasses(const uint8_t* a, const uint8_t* b) {
  return PStrCmp(a != nullptr ? a : EmptyPStr(), b != nullptr ? b : EmptyPStr());
}


// Reads the bound word and the kind, which decide the class, and leaves the rest of the record
// to the tag's ConstructTD.
class TagFactory final : public TDTypeFactory {
 public:
  TDImpPtr CreateTD(TDDataReader* reader, uint16_t, int32_t* status) const override {
    int32_t bound = vellum::bound::kVariable;
    uint16_t kind = static_cast<uint16_t>(kTagTypeDefault);
    if (reader != nullptr) {
      reader->ReadI32(&bound);
      reader->ReadU16(&kind);
      if (reader->GetError() != kStatusNoError) {
        *status = reader->GetError();
        return TDImpPtr();
      }
      kind = RepairedTagType(kind);
    }
    TDImpPtr type;
    if (kind == kTagTypeUserDefined) {
      type = MakeCounted<TDUserDefinedTagImp>();
    } else {
      auto tag = MakeCounted<TDTagImp>();
      if (tag) tag->SetTagType(static_cast<TagType>(kind));
      type = tag;
    }
    if (!type) {
      *status = kStatusOutOfMemory;
      return type;
    }
    static_cast<TDStringBaseImp&>(*type).SetBound(bound);
    *status = kStatusNoError;
    return type;
  }
};

TagFactory gTagFactory;

// Announced as the library loads; the service registers it in its place at start.
const bool gAnnounced = [] {
  AnnounceTypeFactory(51, static_cast<uint16_t>(TypeCode::Tag), &gTagFactory);
  RegisterDefaultTypeGetter(static_cast<int32_t>(TypeCode::Tag), &GetTagTD);
  return true;
}();

TDTagBaseImp* WritableTag(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsTag() == 0 || imp->IsReadOnlyTD() != 0) return nullptr;
  return static_cast<TDTagBaseImp*>(imp);
}

TDUserDefinedTagImp* WritableUserDefinedTag(const TD& type) {
  TDImp* imp = type.GetImp();
  if (imp == nullptr || imp->IsUserDefinedTag() == 0 || imp->IsReadOnlyTD() != 0) return nullptr;
  return static_cast<TDUserDefinedTagImp*>(imp);
}

}  // namespace

// --- TDTagBaseImp --------------------------------------------------------------------------------

int32_t TDTagBaseImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(TDStringBaseImp::ComputeHashValue());
  hash += static_cast<uint32_t>(tagType_);
  hash += ContextBits(GetContext());
  return static_cast<int32_t>(hash);
}

int32_t TDTagBaseImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDStringBaseImp::IsSameAs(other) == 0) return 0;
  const TDTagBaseImp* that = AsTag(&other);
  if (that == nullptr || IsUserDefinedTag() != other.IsUserDefinedTag()) return 0;
  return tagType_ == that->tagType_ && GetContext() == that->GetContext() ? 1 : 0;
}

int32_t TDTagBaseImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDStringBaseImp::MemberCloneOrCheckOut(target);
  if (status != kStatusNoError) return status;
  auto& copy = static_cast<TDTagBaseImp&>(*target);
  copy.tagType_ = tagType_;
  copy.SetContext(GetContext());
  return kStatusNoError;
}

int32_t TDTagBaseImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDStringBaseImp::MemberCheckIn(target);
  if (status != kStatusNoError) return status;
  auto& copy = static_cast<TDTagBaseImp&>(*target);
  copy.tagType_ = tagType_;
  copy.SetContext(GetContext());
  return kStatusNoError;
}

void TDTagBaseImp::SetContext(const KoContext* context) {
  context_.store(context, std::memory_order_release);
  ClearHashValid();
}

int32_t TDTagBaseImp::SetTagType(TagType tagType) {
  // The user-defined kind has a class of its own, which a plain tag has no room for.
  if ((tagType == kTagTypeUserDefined) != (IsUserDefinedTag() != 0)) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "Illegal SetTagType setting!");
    return kStatusBadArgument;
  }
  tagType_ = tagType;
  ClearHashValid();
  return kStatusNoError;
}

void TDTagBaseImp::PrintDebugStr(const uint8_t* prefix) const {
  TDStringBaseImp::PrintDebugStr(prefix);
  const std::string text = PrefixText(prefix);
  DebugReport(kDiagnosticModule, __LINE__, 0, text + "tagType = " + std::to_string(tagType_));
  (VELLUM_DEBUG(0) << text << "context = ").Append(static_cast<const void*>(GetContext())).Process();
}

int32_t TDTagBaseImp::CmpTD(const TDImp* source, int32_t flags, int32_t) const {
  int32_t result = 0;
  if (const TDTagBaseImp* tag = AsTag(source)) {
    if (tag->tagType_ != tagType_) {
      const bool convertible = (tagType_ == kTagTypeConvertibleA && tag->tagType_ == kTagTypeConvertibleB) ||
                               (tagType_ == kTagTypeConvertibleB && tag->tagType_ == kTagTypeConvertibleA);
      if (!convertible) return kCmpIncompatible;
      result |= kCmpNeedsConversion;
    }
  } else if (source->IsStringOnly() != 0) {
    result |= kCmpStringMeetsTag;
  } else if (source->IsSubStringOnly() != 0) {
    result |= kCmpSubStringMeetsTag;
  } else if (tagType_ == kTagTypeTallis && source->IsTallisRef() != 0) {
    return (flags & kCmpFlagReportLoss) != 0 ? (kCmpMayLoseInformation | kCmpNeedsConversion) : kCmpNeedsConversion;
  } else {
    return kCmpIncompatible;
  }
  return result | StringBoundCmpBits(GetBound(), BoundOfStringBase(source), flags);
}

int32_t TDTagBaseImp::CompareForSorting(const TDImp* other) const {
  const int32_t byBound = TDStringBaseImp::CompareForSorting(other);
  if (byBound != 0) return byBound;
  const TDTagBaseImp* that = AsTag(other);
  if (that == nullptr) return 0;
  if (tagType_ != that->tagType_) return tagType_ < that->tagType_ ? -1 : 1;
  const KoContext* mine = GetContext();
  const KoContext* theirs = that->GetContext();
  if (mine == theirs) return 0;
  return std::less<const KoContext*>()(mine, theirs) ? -1 : 1;
}

// --- TDTagImp ------------------------------------------------------------------------------------

TDImpPtr TDTagImp::NewInstance() const { return MakeCounted<TDTagImp>(); }

// --- TDUserDefinedTagImp -------------------------------------------------------------------------

TDImpPtr TDUserDefinedTagImp::NewInstance() const { return MakeCounted<TDUserDefinedTagImp>(); }

int32_t TDUserDefinedTagImp::ComputeHashValue() const {
  uint32_t hash = static_cast<uint32_t>(TDTagBaseImp::ComputeHashValue());
  hash += tagClass_ ? static_cast<uint32_t>(GetPStrHashValue(tagClass_.get())) : 1u;
  return static_cast<int32_t>(hash);
}

int32_t TDUserDefinedTagImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (TDTagBaseImp::IsSameAs(other) == 0) return 0;
  const TDUserDefinedTagImp* that = AsUserDefinedTag(&other);
  return that != nullptr && CompareClasses(GetTagClass(), that->GetTagClass()) == 0 ? 1 : 0;
}

int32_t TDUserDefinedTagImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  const int32_t status = TDTagBaseImp::MemberCloneOrCheckOut(target);
  if (status != kStatusNoError) return status;
  const uint8_t* tagClass = GetTagClass();
  return static_cast<TDUserDefinedTagImp&>(*target).SetTagClass(PStrBuf(tagClass), PStrLen(tagClass));
}

int32_t TDUserDefinedTagImp::MemberCheckIn(TDImpPtr& target) const {
  const int32_t status = TDTagBaseImp::MemberCheckIn(target);
  if (status != kStatusNoError) return status;
  const uint8_t* tagClass = GetTagClass();
  return static_cast<TDUserDefinedTagImp&>(*target).SetTagClass(PStrBuf(tagClass), PStrLen(tagClass));
}

int32_t TDUserDefinedTagImp::SetTagClass(const uint8_t* bytes, size_t length) {
  ClearHashValid();
  if (length == 0 || bytes == nullptr) {
    tagClass_.reset();
    return kStatusNoError;
  }
  length = std::min(length, kMaxClassLength);
  UPtr block = nullptr;
  if (DSNewPtr(length + 1, &block) != kStatusNoError) return kStatusOutOfMemory;
  block[0] = static_cast<uint8_t>(length);
  std::memcpy(block + 1, bytes, length);
  tagClass_.reset(block);
  return kStatusNoError;
}

void TDUserDefinedTagImp::PrintDebugStr(const uint8_t* prefix) const {
  TDTagBaseImp::PrintDebugStr(prefix);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "tagClass = ").AppendPStr(GetTagClass()).Process();
}

int32_t TDUserDefinedTagImp::CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const {
  if (const TDUserDefinedTagImp* that = AsUserDefinedTag(source)) {
    if (CompareClasses(GetTagClass(), that->GetTagClass()) != 0) return kCmpIncompatible;
  }
  return TDTagBaseImp::CmpTD(source, flags, bitsSoFar);
}

int32_t TDUserDefinedTagImp::CompareForSorting(const TDImp* other) const {
  const int32_t byTag = TDTagBaseImp::CompareForSorting(other);
  if (byTag != 0) return byTag;
  const TDUserDefinedTagImp* that = AsUserDefinedTag(other);
  if (that == nullptr) return 0;
  const int32_t presence = (tagClass_ ? 1 : 0) - (that->tagClass_ ? 1 : 0);
  if (presence != 0) return presence;
  const int32_t order = CompareClasses(GetTagClass(), that->GetTagClass());
  return order < 0 ? -1 : (order > 0 ? 1 : 0);
}

// --- shared default and handles ------------------------------------------------------------------

const TDR& GetTagTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] { return TDImpPtr(MakeCounted<TDTagImp>()); });
}

TDImpPtr vellum::detail::NewTag(const uint8_t* name, int32_t bound, TagType tagType, const uint8_t* tagClass) {
  bool failed = false;
  TDNameImpPtr label = MakeNameFromCStr(name, &failed);
  if (failed) return TDImpPtr();
  if (tagType != kTagTypeUserDefined) return TDImpPtr(MakeCounted<TDTagImp>(label, TDTypedefImpPtr(), bound, tagType));
  auto tag = MakeCounted<TDUserDefinedTagImp>(label, TDTypedefImpPtr(), bound);
  if (!tag || tag->SetTagClass(PStrBuf(tagClass), PStrLen(tagClass)) != kStatusNoError) return TDImpPtr();
  return TDImpPtr(tag);
}

bool TagBaseKind::Admit(const TDImp& type) { return type.IsTag() != 0; }
bool TagKind::Admit(const TDImp& type) { return type.IsTag() != 0; }
TDImpPtr TagKind::New(const uint8_t* name) {
  return vellum::detail::NewTag(name, vellum::bound::kVariable, kTagTypeDefault, nullptr);
}
bool UserDefinedTagKind::Admit(const TDImp& type) { return type.IsUserDefinedTag() != 0; }
TDImpPtr UserDefinedTagKind::New(const uint8_t* name) {
  return vellum::detail::NewTag(name, vellum::bound::kVariable, kTagTypeUserDefined, nullptr);
}

TagType TDRTagBase::GetTagType() const {
  const TDTagBaseImp* tag = AsTag(GetImp());
  return tag != nullptr ? tag->GetTagType() : 0;
}

void TDRTagBase::SetComparisonFunc(TagComparisonFunc func) {
  const TagComparisonFunc old = gComparisonFunc.exchange(func);
  if (old != nullptr && func != nullptr) {
    DebugReport(kDiagnosticModule, __LINE__, 2, "Redefining comparison function in TDRTagBase::SetComparisonFunc");
  }
}

TagComparisonFunc TDRTagBase::GetComparisonFunc() { return gComparisonFunc.load(); }

TagType TDWTagBase::GetTagType() const {
  const TDTagBaseImp* tag = AsTag(GetImp());
  return tag != nullptr ? tag->GetTagType() : 0;
}

int32_t TDWTagBase::SetTagType(TagType tagType) {
  TDTagBaseImp* tag = WritableTag(*this);
  return tag != nullptr ? tag->SetTagType(tagType) : kStatusNullHandle;
}

TDRTag::TDRTag(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(vellum::detail::NewTag(name, bound, kTagTypeDefault, nullptr)), 1) {}
TDRTag::TDRTag(TagType tagType, const uint8_t* name)
    : TDRTyped(vellum::detail::CheckInNew(vellum::detail::NewTag(name, vellum::bound::kVariable, tagType, nullptr)),
               1) {}
TDRTag::TDRTag(int32_t bound, TagType tagType, const uint8_t* name)
    : TDRTyped(vellum::detail::CheckInNew(vellum::detail::NewTag(name, bound, tagType, nullptr)), 1) {}

TDWTag::TDWTag(const uint8_t* name, int32_t bound)
    : TDWTyped(vellum::detail::NewTag(name, bound, kTagTypeDefault, nullptr), 1) {}
TDWTag::TDWTag(TagType tagType, const uint8_t* name)
    : TDWTyped(vellum::detail::NewTag(name, vellum::bound::kVariable, tagType, nullptr), 1) {}
TDWTag::TDWTag(int32_t bound, TagType tagType, const uint8_t* name)
    : TDWTyped(vellum::detail::NewTag(name, bound, tagType, nullptr), 1) {}

TDRUserDefinedTag::TDRUserDefinedTag(const uint8_t* name, int32_t bound)
    : TDRTyped(vellum::detail::CheckInNew(vellum::detail::NewTag(name, bound, kTagTypeUserDefined, nullptr)), 1) {}
TDRUserDefinedTag::TDRUserDefinedTag(const uint8_t* tagClassPStr)
    : TDRTyped(vellum::detail::CheckInNew(
                   vellum::detail::NewTag(nullptr, vellum::bound::kVariable, kTagTypeUserDefined, tagClassPStr)),
               1) {}

int32_t TDRUserDefinedTag::HasTagClass() const {
  const TDUserDefinedTagImp* tag = AsUserDefinedTag(GetImp());
  return tag != nullptr && tag->GetTagClass() != nullptr ? 1 : 0;
}

const uint8_t* TDRUserDefinedTag::GetTagClass() const {
  const TDUserDefinedTagImp* tag = AsUserDefinedTag(GetImp());
  return tag != nullptr && tag->GetTagClass() != nullptr ? tag->GetTagClass() : EmptyPStr();
}

TDWUserDefinedTag::TDWUserDefinedTag(const uint8_t* name, int32_t bound)
    : TDWTyped(vellum::detail::NewTag(name, bound, kTagTypeUserDefined, nullptr), 1) {}
TDWUserDefinedTag::TDWUserDefinedTag(const uint8_t* tagClassPStr)
    : TDWTyped(vellum::detail::NewTag(nullptr, vellum::bound::kVariable, kTagTypeUserDefined, tagClassPStr), 1) {}

int32_t TDWUserDefinedTag::HasTagClass() const {
  const TDUserDefinedTagImp* tag = AsUserDefinedTag(GetImp());
  return tag != nullptr && tag->GetTagClass() != nullptr ? 1 : 0;
}

const uint8_t* TDWUserDefinedTag::GetTagClass() const {
  const TDUserDefinedTagImp* tag = AsUserDefinedTag(GetImp());
  return tag != nullptr && tag->GetTagClass() != nullptr ? tag->GetTagClass() : EmptyPStr();
}

int32_t TDWUserDefinedTag::SetTagClass(const uint8_t* tagClassPStr) {
  TDUserDefinedTagImp* tag = WritableUserDefinedTag(*this);
  if (tag == nullptr) return kStatusNullHandle;
  return tag->SetTagClass(PStrBuf(tagClassPStr), PStrLen(tagClassPStr));
}

int32_t TDWUserDefinedTag::SetTagClassCStr(const uint8_t* tagClassCStr) {
  TDUserDefinedTagImp* tag = WritableUserDefinedTag(*this);
  if (tag == nullptr) return kStatusNullHandle;
  const size_t length = tagClassCStr != nullptr ? std::strlen(reinterpret_cast<const char*>(tagClassCStr)) : 0;
  return tag->SetTagClass(tagClassCStr, length);
}

// --- type strings ----------------------------------------------------------------------------------

namespace {


// How deep tag user data reads are nested on this thread: each holds a type string of its own.
thread_local uint32_t gUserDataDepth = 0;

// The empty variant: version word, the void type, no data, no attributes.
int32_t WriteEmptyUserData(TDDataWriter* writer) {
  writer->WriteU32(writer->GetVersion());
  writer->WriteTD(MakeDefaultTDRForTypeCode(static_cast<int32_t>(TypeCode::Void)));
  writer->WriteI32(0);
  return writer->GetError();
}

int32_t ReadEmptyUserData(TDDataReader* reader) {
  if (gUserDataDepth >= kMaxTypeNestingDepth) {
    DebugReport(kDiagnosticModule, __LINE__, 2, "Type string refused: nesting deeper than 256 levels");
    reader->SetError(kStatusCorruptData);
    return kStatusCorruptData;
  }
  ++gUserDataDepth;
  uint32_t header = 0;
  reader->ReadU32(&header);
  const TDR type = reader->ReadTD();
  int32_t attributes = 0;
  reader->ReadI32(&attributes);
  --gUserDataDepth;
  if (reader->GetError() != kStatusNoError) return reader->GetError();
  if ((type && type.GetTypeCode() != static_cast<int16_t>(TypeCode::Void)) || attributes != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 2, "Tag user data other than the empty variant cannot be read yet");
    reader->SetError(kStatusCorruptData);
    return kStatusCorruptData;
  }
  return kStatusNoError;
}

}  // namespace

int32_t TDTagBaseImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  writer->WriteI32(GetBound());
  writer->WriteU16(static_cast<uint16_t>(tagType_));
  if (TagCarriesUserData(writer->GetVersion())) return WriteEmptyUserData(writer);
  return writer->GetError();
}

int32_t TDTagBaseImp::ConstructTD(TDDataReader* reader) {
  if (TagCarriesUserData(reader->GetVersion()))
    if (const int32_t status = ReadEmptyUserData(reader); status != kStatusNoError) return status;
  SetContext(reader->GetContext());
  return reader->GetError();
}

int32_t TDUserDefinedTagImp::FlattenTDPartsForSaving(TDDataWriter* writer) const {
  if (const int32_t status = TDTagBaseImp::FlattenTDPartsForSaving(writer); status != kStatusNoError) return status;
  if (writer->GetVersion() < kTagClassVersion) return writer->GetError();
  const uint8_t* tagClass = GetTagClass();
  writer->WritePStr(tagClass);
  if (((tagClass != nullptr ? tagClass[0] : 0) + 1) % 2 != 0) writer->WriteU8(0);
  return writer->GetError();
}

int32_t TDUserDefinedTagImp::ConstructTD(TDDataReader* reader) {
  if (const int32_t status = TDTagBaseImp::ConstructTD(reader); status != kStatusNoError) return status;
  if (reader->GetVersion() < kTagClassVersion) return kStatusNoError;
  uint8_t tagClass[256] = {};
  if (const int32_t status = reader->ReadPStr(tagClass); status != kStatusNoError) return status;
  if ((tagClass[0] + 1) % 2 != 0) reader->Skip(1);
  if (reader->GetError() != kStatusNoError) return reader->GetError();
  return SetTagClass(tagClass + 1, tagClass[0]);
}
