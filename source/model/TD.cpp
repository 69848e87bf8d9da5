// The descriptor object's shared behaviour: hash and equality for interning, check-in and
// check-out, flags, type compatibility framework, traversal, the debug dump and the short text.
#include "source/model/TD.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstring>

#include "runtime/PXNumbers.h"
#include "runtime/PXStrings.h"
#include "source/model/CoreTDTable.h"
#include "runtime/MoveBytes.h"
#include "source/model/TDAttributes.h"
#include "source/model/TypeManager.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/RecordFormat.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TDVisitor.h"
#include "vellum/TypeManagerHooks.h"

VELLUM_DIAGNOSTIC_MODULE("TD");

namespace {


// The shared default getter of each code, filled by the families as they load.
std::array<std::atomic<DefaultTypeGetter>, 256>& DefaultGetters() {
  static std::array<std::atomic<DefaultTypeGetter>, 256> getters{};
  return getters;
}

bool TypedefLinksDiffer(const TDTypedefImp& a, const TDTypedefImp& b, int32_t flags) {
  if (!a.GetVIName().EqualFS(b.GetVIName())) return true;
  return (flags & kCmpFlagIgnoreTimeStamps) == 0 && a.GetTimeStamp() != b.GetTimeStamp();
}

}  // namespace

TDImp::TDImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink) noexcept
    : name_(name), typedef_(typedefLink) {}

TDImp::~TDImp() {
  typedef_.Free();
  name_.Free();
}

int32_t TDImp::GetHashValue() const {
  // Only an interned object keeps its hash: a writable one may change under any setter.
  if ((Flags() & kTDFlagReadOnly) != 0 && IsHashValid()) return CachedHash();
  const int32_t hash = ComputeHashValue();
  StoreHash(hash);
  return hash;
}

int32_t TDImp::ComputeHashValue() const {
  const int32_t code = GetTypeCode();
  uint32_t hash = Flags() & kTDIdentityFlagsMask;
  if (name_) hash += static_cast<uint32_t>(name_->GetHashValue());
  if (typedef_) hash += static_cast<uint32_t>(typedef_->GetHashValue());
  hash += static_cast<uint32_t>(code) * static_cast<uint32_t>(code);
  return static_cast<int32_t>(hash);
}

int32_t TDImp::IsSameAs(const TDImp& other) const {
  if (this == &other) return 1;
  if (IsHashValid() && other.IsHashValid() && GetHashValue() != other.GetHashValue()) return 0;
  if (GetTypeCode() != other.GetTypeCode()) return 0;
  if ((Flags() & kTDIdentityFlagsMask) != (other.Flags() & kTDIdentityFlagsMask)) return 0;
  if (static_cast<bool>(name_) != static_cast<bool>(other.name_)) return 0;
  if (name_ && !name_->IsEqual(*other.name_)) return 0;
  if (static_cast<bool>(typedef_) != static_cast<bool>(other.typedef_)) return 0;
  if (typedef_ && !typedef_->IsEqual(*other.typedef_)) return 0;
  return 1;
}

int32_t TDImp::MemberCloneOrCheckOut(TDImpPtr& target) const {
  TDImp& copy = *target;
  copy.SetFlags(Flags() & ~kTDFlagReadOnly);
  copy.ClearHashValid();
  copy.name_.Free();
  copy.typedef_.Free();
  if (name_) {
    copy.name_ = name_->CloneOrCheckOut();
    if (!copy.name_) return kStatusOutOfMemory;
  }
  if (typedef_) {
    copy.typedef_ = typedef_->CloneOrCheckOut();
    if (!copy.typedef_) return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDImp::MemberCheckIn(TDImpPtr& target) const {
  TDImp& copy = *target;
  copy.ClearHashValid();
  copy.SetFlags(Flags() | kTDFlagReadOnly);
  if (name_) {
    copy.name_ = name_->CheckIn();
    copy.ClearHashValid();
    if (!copy.name_) return kStatusOutOfMemory;
  }
  if (typedef_) {
    copy.typedef_ = typedef_->CheckIn();
    copy.ClearHashValid();
    if (!copy.typedef_) return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t TDImp::EphemeralizeTD(int32_t queryOnly) {
  const int32_t old = static_cast<int32_t>(Flags() & kTDFlagEphemeral);
  ClearHashValid();
  if (IsFunction() != 0) {
    DebugReport(kDiagnosticModule, __LINE__, 3, "EphemeralizeTD on functionCode?");
    return 0;
  }
  if (queryOnly == 0) SetFlagBits(kTDFlagEphemeral);
  return old;
}

int32_t TDImp::UnephemeralizeTD(int32_t queryOnly) {
  const int32_t old = static_cast<int32_t>(Flags() & kTDFlagEphemeral);
  ClearHashValid();
  if (queryOnly != 0) return old;
  if (IsFunction() != 0) return 0;
  ClearFlagBits(kTDFlagEphemeral);
  return old;
}

// --- type strings ----------------------------------------------------------------------------------

namespace {

constexpr int32_t kLargestShortField = 0x7FFF;

int32_t TypedefPartSize(const TDTypedefImp& link, const TDDataWriter& writer) {
  int32_t size = 0;
  link.AddFlatSize(&size, &writer);
  return size - 4;  // AddFlatSize counts the marker and the inner size too
}

// What the inner size of a typedef record leaves out.
int32_t InnerSizeDeduction(const TDTypedefImp& link, const TDDataWriter& writer) {
  if (writer.GetVersion() >= kInnerSizeVersion) return TypedefPartSize(link, writer);
  const QualifiedName& name = link.GetVIName();
  if (name.NumElts() == 0) return 10;
  const int32_t n = static_cast<int32_t>(name.GetFileName().size());
  return ((n + 2) | 1) + 7;
}

}  // namespace

uint16_t TDImp::RecordCodeWord(uint32_t version) const {
  uint16_t code = static_cast<uint8_t>(GetTypeCode());
  const uint32_t flags = Flags();
  if (name_ && name_->HasText()) code |= kCodeWordNamed;
  if ((flags & kTDFlagNoSelect) != 0) code |= kCodeWordNoSelect;
  if ((flags & kTDFlagEphemeral) != 0 && IsFunction() == 0) code |= kCodeWordEphemeral;
  if ((flags & kTDFlagEventDiscard) != 0 && GetTypeCode() == static_cast<int16_t>(TypeCode::Boolean))
    code |= kCodeWordEventDiscard;
  if ((flags & kTDFlagGeneric) != 0 && version >= kGenericFlagVersion) code |= kCodeWordGeneric;
  if ((flags & kTDFlagColumnVector) != 0) code |= kCodeWordColumnVector;
  return code;
}

// Records are measured by writing the payload to a counting buffer: the size field then always
// matches what is written, whatever the kind.
int32_t TDImp::GetFlatSizeForSaving(int32_t* size, TDDataWriter* writer, int32_t* index) const {
  if (size == nullptr || writer == nullptr) return kStatusNullHandle;
  *size = 0;
  if (const int32_t found = writer->GetSaveTableIndex(this); found >= 0) {
    if (index != nullptr) *index = found;
    return kStatusNoError;
  }
  PreflightOutputBuf counter;
  OutputBuf* const previous = writer->SwapOutputBuf(&counter);
  const int32_t status = FlattenTDPartsForSaving(writer);
  writer->SwapOutputBuf(previous);
  if (status != kStatusNoError) return status;
  if (writer->GetError() != kStatusNoError) return writer->GetError();

  int64_t total = 4 + static_cast<int64_t>(counter.GetBytesWritten());
  if (name_ && name_->HasText()) {
    int32_t nameSize = 0;
    name_->AddFlatSize(&nameSize, writer);
    total += nameSize;
  }
  int64_t deduction = 0;
  if (typedef_) {
    int32_t linkSize = 0;
    typedef_->AddFlatSize(&linkSize, writer);
    total += linkSize;
    deduction = InnerSizeDeduction(*typedef_, *writer);
  }
  // Long fields take 2 more bytes each; growing one may push the other over, so settle both.
  bool longSize = false;
  bool longInner = false;
  for (bool changed = true; changed;) {
    changed = false;
    if (!longSize && total > kLargestShortField) {
      longSize = true;
      total += 2;
      changed = true;
    }
    if (typedef_ && !longInner && total - deduction > kLargestShortField) {
      longInner = true;
      total += 2;
      changed = true;
    }
  }
  if (total > INT32_MAX) return kStatusBadArgument;
  *size = static_cast<int32_t>(total);
  if (index != nullptr) *index = -1;
  return kStatusNoError;
}

int32_t TDImp::FlattenTDForSaving(TDDataWriter* writer, int32_t* index) const {
  if (writer == nullptr) return kStatusNullHandle;
  if (const int32_t found = writer->GetSaveTableIndex(this); found >= 0) {
    if (index != nullptr) *index = found;
    return kStatusNoError;
  }
  const size_t start = writer->GetBytesWritten();
  int32_t size = 0;
  if (const int32_t status = GetFlatSizeForSaving(&size, writer, nullptr); status != kStatusNoError) {
    writer->SetError(status);
    return status;
  }
  writer->WriteVariableSizeField(size);
  if (typedef_) {
    writer->WriteU16(kTypedefMarker);
    typedef_->Flatten(writer);
    writer->WriteVariableSizeField(size - InnerSizeDeduction(*typedef_, *writer));
  }
  uint16_t codeWord = RecordCodeWord(writer->GetVersion());
  if (GetTypeCode() == static_cast<int16_t>(TypeCode::FixedPoint) && writer->GetVersion() < kFixedPointVersion) {
    codeWord = static_cast<uint16_t>((codeWord & 0xFF00) | static_cast<uint16_t>(TypeCode::Float64));
    if (const PersistTDData* persist = writer->GetPersistTDData()) persist->LogSaveForPrevWarning(1);
  }
  writer->WriteU16(codeWord);
  if (const int32_t status = FlattenTDPartsForSaving(writer); status != kStatusNoError) {
    writer->SetError(status);
    return status;
  }
  if (name_ && name_->HasText()) name_->Flatten(writer);
  if (writer->GetError() != kStatusNoError) return writer->GetError();
  if (writer->GetBytesWritten() - start != static_cast<size_t>(size) && IsFunction() == 0)
    DebugReport(kDiagnosticModule, __LINE__, 3, "We calculated the wrong size.");
  if (index != nullptr) *index = -1;
  return kStatusNoError;
}

// Kinds without a payload read nothing.
int32_t TDImp::ConstructTD(TDDataReader*) { return kStatusNoError; }

// --- nesting -----------------------------------------------------------------------------------------

void TDImp::ComputeNesting(uint32_t* depth, uint32_t* count) const {
  *depth = 1;
  *count = 1;
}

uint32_t TDImp::NestingDepth() const {
  if (const uint32_t known = depth_.load(std::memory_order_acquire); known != 0) return known;
  uint32_t depth = 0;
  uint32_t count = 0;
  ComputeNesting(&depth, &count);
  if (IsReadOnlyTD() != 0) {
    expanded_.store(count, std::memory_order_relaxed);
    depth_.store(depth, std::memory_order_release);
  }
  return depth;
}

uint32_t TDImp::ExpandedCount() const {
  if (depth_.load(std::memory_order_acquire) != 0) return expanded_.load(std::memory_order_relaxed);
  uint32_t depth = 0;
  uint32_t count = 0;
  ComputeNesting(&depth, &count);
  return count;
}

int32_t TDImp::GetAlignment(ITargetPlatformAlignment* platform) const { return DataSizeCore(platform); }

int64_t TDImp::AlignDatumCore(int64_t offset, ITargetPlatformAlignment* platform) const {
  const int32_t max = platform != nullptr ? platform->MaxAlignment() : GetDSAlign();
  if (max < 2) return offset;
  int64_t alignment = GetAlignment(platform);
  if (alignment > max) alignment = max;
  if (alignment < 1) alignment = 1;
  return (offset + alignment - 1) & -alignment;
}

int32_t TDImp::InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t) const {
  if (onlyIfEmpty == 0 && clearFirst != 0) TDImpClearMemory(data, this, 1);
  return kStatusNoError;
}

DataShapes TDImp::DataShapeOf(int32_t) const { return kDataShapePlain; }

// --- flattened data --------------------------------------------------------------------------------

namespace {


// Pointers into the writer's memory mean nothing to a reader, and one taken from input would point
// anywhere: such data travel as nothing (or the old placeholder) and read back cleared.
bool HoldsRawPointer(const TDImp& type) {
  return type.IsPtr() != 0 || type.IsCStr() != 0 || type.IsPStr() != 0 || type.IsPtrTo() != 0 ||
         type.IsArrayDataPtr() != 0;
}

bool WritesPointerPlaceholder(uint32_t version) { return VersionShouldMutate(version, kPointerPlaceholderVersion); }

}  // namespace

uint32_t TDImp::FlatDataSize(KoDataWriter* writer, const void*) const {
  if (HoldsRawPointer(*this))
    return writer != nullptr && WritesPointerPlaceholder(writer->GetVersion()) ? 4 : 0;
  return static_cast<uint32_t>(DataSizeCore(nullptr));
}

int32_t TDImp::WriteData(KoDataWriter* writer, const void* data, int32_t count, int32_t* status) const {
  const size_t start = writer->GetBytesWritten();
  WriteFlatData(writer, data, count);
  if (status != nullptr) *status = writer->GetError();
  return static_cast<int32_t>(writer->GetBytesWritten() - start);
}

int32_t TDImp::ReadData(KoDataReader* reader, void* data, int32_t count, int32_t* status) const {
  const size_t start = reader->Position();
  ReadFlatData(reader, data, count);
  if (status != nullptr) *status = reader->GetError();
  return static_cast<int32_t>(reader->Position() - start);
}

// Fixed-size data without a form of its own: the bytes as they are in memory.
void TDImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  if (count > 0 && writer->GetError() == kStatusNoError) {
    if (HoldsRawPointer(*this)) {
      if (WritesPointerPlaceholder(writer->GetVersion()))
        for (int32_t i = 0; i < count; ++i) writer->WriteU32(0);
    } else {
      const auto bytes = static_cast<size_t>(DataSizeCore(nullptr)) * static_cast<size_t>(count);
      if (data == nullptr && bytes != 0) {
        writer->SetError(kStatusBadArgument);
      } else {
        writer->WriteBytes(data, bytes);
      }
    }
  }
}

void TDImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  if (count > 0) {
    const auto bytes = static_cast<size_t>(DataSizeCore(nullptr)) * static_cast<size_t>(count);
    if (HoldsRawPointer(*this)) {
      if (WritesPointerPlaceholder(reader->GetVersion())) reader->Skip(4 * static_cast<size_t>(count));
      if (data != nullptr) std::memset(data, 0, bytes);
    } else if (data != nullptr) {
      reader->ReadBytes(data, bytes);
    } else {
      reader->Skip(bytes);
    }
  }
}

// --- ordering of data ------------------------------------------------------------------------------

DataOrder TDImp::OrderBytes(const void* a, const void* b) const {
  return {BlockCmp(a, b, static_cast<size_t>(std::max(DataSizeCore(nullptr), 0)))};
}

DataOrder TDImp::OrderData(const void* a, const void* b, const DataOrderOptions& options) const {
  if (GetTypeCode() != static_cast<int16_t>(TypeCode::Refnum)) return {0, DataOrderNote::NoOrder};
  // A refnum's datum is its cookie, an unsigned number of its size.
  if (options.bytewise != 0) return OrderBytes(a, b);
  const auto order = [](auto x, auto y) { return DataOrder{x < y ? -1 : (y < x ? 1 : 0)}; };
  switch (DataSizeCore(nullptr)) {
    case sizeof(uint64_t): return order(Load<uint64_t>(a), Load<uint64_t>(b));
    case sizeof(uint32_t): return order(Load<uint32_t>(a), Load<uint32_t>(b));
    default: return {0, DataOrderNote::UnsupportedRefnumSize};
  }
}

int32_t TDImp::CopyData(const void* src, void* dst, int32_t, const KoContext*) const {
  // The int32 is the copy's flags, never a count: one datum is copied.
  const int32_t code = GetTypeCode();
  if (code < 1 || code > 30) {
    (VELLUM_DEBUG(3) << "CopyData bad type=").AppendHex32(static_cast<uint32_t>(code)).Process();
    return kStatusBadArgument;
  }
  if (src == nullptr || dst == nullptr) return kStatusBadArgument;
  MoveBlock(src, dst, static_cast<size_t>(NumSize(code)));
  return kStatusNoError;
}

int32_t TDImp::CopyDataConvertCore(const TDImp* dst, const void*, void*, int32_t) const {
  // A family without conversions refuses rather than report an untouched destination as done.
  ReportConversionCodes(kDiagnosticModule, __LINE__, dst, *this);
  return kStatusBadArgument;
}

int32_t TDImp::ResetToDefaultData(void* data) const {
  if (data == nullptr) return kStatusBadArgument;
  TDImpClearMemory(data, this, 1);
  return kStatusNoError;
}

void TDImp::Accept(ITDVisitor* visitor) {
  TDImpPtr self(this);
  if (IsReadOnlyTD() != 0) {
    visitor->Visit(TDR(self, 1));
  } else {
    TDW writable(self, 1);
    visitor->Visit(writable);
  }
}

void TDImp::PrintDebugStr(const uint8_t* prefix) const {
  if (name_) name_->PrintDebugStr(prefix);
  if (typedef_) typedef_->PrintDebugStr(prefix);
  (VELLUM_DEBUG(0) << PrefixText(prefix) << "attributes = ").AppendHex32(Flags()).Process();
}

int32_t TDImp::CmpTD(const TDImp* source, int32_t, int32_t) const {
  return source->GetTypeCode() == GetTypeCode() ? 0 : kCmpIncompatible;
}

bool TDImp::ConversionIsLossless(const TDImp* dst) const {
  return dst != nullptr && dst->GetTypeCode() == GetTypeCode();
}

TDTraverseValue TDImp::TraverseTD(TDVisitFn visit, void* context, TDShouldRecurseFn, TDImpPtr* replacement) {
  const TDTraverseValue result = visit(this, context, replacement);
  return result == kTraverseSkipElements ? kTraverseContinue : result;
}

void TDImp::SetGenericness(int32_t generic) {
  if (generic != 0) {
    SetFlagBits(kTDFlagGeneric);
  } else {
    ClearFlagBits(kTDFlagGeneric);
  }
}

TDImpPtr TDImp::CheckIn() const {
  Dictionary<TDImpPtr, TDImp>& dictionary = GTDDictionary();
  if (TDImpPtr hit = dictionary.Find(*this)) return hit;
  TDImpPtr copy = NewInstance();
  if (!copy) return TDImpPtr();
  // Members are interned outside the descriptor dictionary's lock, each under its own.
  if (MemberCheckIn(copy) != kStatusNoError) return TDImpPtr();
  copy->NestingDepth();  // known before anyone else can see the object
  if (dictionary.Insert(copy) != kStatusNoError) return TDImpPtr();
  return copy;
}

TDImpPtr TDImp::CloneOrCheckOut() const {
  TDImpPtr copy = NewInstance();
  if (!copy) return TDImpPtr();
  if (MemberCloneOrCheckOut(copy) != kStatusNoError) return TDImpPtr();
  return copy;
}

void TDImp::SetNameImpPtr(const TDNameImpPtr& name) {
  name_ = name;
  ClearHashValid();
}

void TDImp::SetTypedefImpPtr(const TDTypedefImpPtr& typedefLink) {
  typedef_ = typedefLink;
  ClearHashValid();
}

int32_t TDImp::CmpTDCommon(const TDImp* other, int32_t flags) const {
  int32_t result = 0;
  const bool eitherLinked = typedef_ || other->typedef_;
  const bool dropLinks = (flags & kCmpFlagDropLinksIfAny) != 0 && eitherLinked;
  const bool secondPass = (flags & kCmpFlagSecondPass) != 0;
  // On the second pass a linked side counts as unnamed: its name belongs to the definition.
  auto named = [&](const TDImp* t) {
    if (secondPass && !dropLinks && t->typedef_) return false;
    return static_cast<bool>(t->name_);
  };
  const bool thisNamed = named(this);
  const bool otherNamed = named(other);

  if ((flags & kCmpFlagCompareNames) != 0) {
    if (thisNamed != otherNamed) {
      result |= kCmpNamesDiffer;
    } else if (thisNamed && PStrCmp(name_->GetNamePStr(), other->name_->GetNamePStr()) != 0) {
      result |= kCmpNamesDiffer;
    }
  }
  if ((flags & kCmpFlagCompareNamesDeep) != 0) flags |= kCmpFlagCompareNames;

  if (!secondPass && !dropLinks && (flags & kCmpFlagIgnoreTypedefs) == 0 && eitherLinked) {
    int32_t penalty = kCmpMinor;
    if ((flags & kCmpFlagTypedefIncompatible) != 0) {
      penalty = kCmpIncompatible;
    } else if ((flags & kCmpFlagTypedefBit) != 0) {
      penalty = kCmpTypedefDiffers;
    }
    if (typedef_ && other->typedef_) {
      if (TypedefLinksDiffer(*typedef_, *other->typedef_, flags)) result |= penalty;
    } else {
      result |= penalty;
    }
    return result | CmpTDCommon(other, flags | kCmpFlagSecondPass);
  }

  int32_t overridden = 0;
  if (other->CmpTDOverride(this, flags, overridden)) return result | overridden;

  if ((flags & kCmpFlagCompareFlagWords) != 0) {
    uint32_t mine = Flags() & ~kTDFlagReadOnly;
    uint32_t theirs = other->Flags() & ~kTDFlagReadOnly;
    if ((mine & kTDFlagEventDiscard) != 0 && (theirs & kTDFlagEventDiscard) != 0) {
      mine &= ~kTDFlagEphemeral;
      theirs &= ~kTDFlagEphemeral;
    }
    if (mine != theirs || GetTypeCode() != other->GetTypeCode() || thisNamed != otherNamed) {
      result |= kCmpIncompatible;
    }
  }
  if ((flags & kCmpFlagGenericMatters) != 0 &&
      ((Flags() ^ other->Flags()) & kTDFlagGeneric) != 0) {
    result |= kCmpIncompatible;
  }
  if ((flags & kCmpFlagEphemeralMatters) != 0 &&
      ((Flags() ^ other->Flags()) & kTDFlagEphemeral) != 0) {
    result |= kCmpIncompatible;
  }
  return result | CmpTD(other, flags, result);
}

void TDImpClearMemory(void* data, const TDImp* type, int32_t clear) {
  if (clear == 0 || data == nullptr || type == nullptr) return;
  const int32_t size = type->DataSizeCore(nullptr);
  if (size > 0) ClearMem(data, static_cast<size_t>(size));
}

std::string PrefixText(const uint8_t* prefix) {
  return prefix != nullptr ? std::string(reinterpret_cast<const char*>(prefix)) : std::string();
}

void ReportConversionCodes(const char* module, int32_t line, const TDImp* dst, const TDImp& src) {
  (DebugStream(module, line, 3) << "CopyDataConvert tcDst=")
      .AppendHex32(static_cast<uint32_t>(dst != nullptr ? dst->GetTypeCode() : 0))
      .Append(", tcSrc=")
      .AppendHex32(static_cast<uint32_t>(src.GetTypeCode()))
      .Process();
}

void ToDebugStream(DebugStream& stream, const TD& type) {
  stream << "[TD \"";
  stream.AppendPStr(type.GetNamePStr());
  stream << "\"]";
}

std::atomic<int32_t> vellum::detail::gDSAlign{0};

void SetDSAlign(int32_t alignment) { vellum::detail::gDSAlign.store(alignment, std::memory_order_relaxed); }

void RegisterDefaultTypeGetter(int32_t code, DefaultTypeGetter getter) {
  if (code < 0 || code > 255) return;
  DefaultGetters()[static_cast<size_t>(code)].store(getter, std::memory_order_release);
}

bool HasDefaultTypeGetter(int32_t code) {
  if (code < 0 || code > 255) return false;
  return DefaultGetters()[static_cast<size_t>(code)].load(std::memory_order_acquire) != nullptr;
}

const TDR& MakeDefaultTDRForTypeCode(int32_t code) {
  const int32_t stripped = StripTypeCodeModifier(code);
  if (stripped >= 0 && stripped <= 255) {
    if (DefaultTypeGetter getter = DefaultGetters()[static_cast<size_t>(stripped)].load(std::memory_order_acquire)) {
      return getter();
    }
  }
  (VELLUM_DEBUG(3) << "MakeDefault for type ").AppendHex32(static_cast<uint32_t>(code)).Append(" not supported yet").Process();
  return GNullTD();
}

TDW MakeDefaultTDWForTypeCode(int32_t code) {
  const TDR& type = MakeDefaultTDRForTypeCode(code);
  if (!type) return TDW();
  return type.CheckOut();
}

std::string ToString(const TDR& type) {
  if (!type) return "null";
  const TypeCodeInfo* info = FindTypeCode(type.GetTypeCode());
  return info != nullptr ? std::string(info->text) : std::string("?");
}

TDR MakeTDRFromTDImp(const TDImp* imp) {
  return TDR(TDImpPtr(const_cast<TDImp*>(imp)), 1);
}

int32_t SaveTDRecord(const TDImp* type, TDDataWriter* writer, uint32_t* index) {
  if (type == nullptr || writer == nullptr) return kStatusNullHandle;
  if (const int32_t found = writer->GetSaveTableIndex(type); found >= 0) {
    *index = static_cast<uint32_t>(found);
    return kStatusNoError;
  }
  if (const int32_t status = type->FlattenTDForSaving(writer, nullptr); status != kStatusNoError) return status;
  if (writer->GetError() != kStatusNoError) return writer->GetError();
  if (const int32_t status = writer->AppendTDToSaveTable(type, index); status != kStatusNoError) {
    writer->SetError(status);
    return status;
  }
  return kStatusNoError;
}

int32_t CompareEltsForSorting(const TDImp* a, const TDImp* b) {
  if (a == b) return 0;
  if (a == nullptr || b == nullptr) return a == nullptr ? -1 : 1;
  const int32_t codes = static_cast<int32_t>(a->GetTypeCode()) - static_cast<int32_t>(b->GetTypeCode());
  if (codes != 0) return codes;
  return a->CompareForSorting(b);
}
