// Strings, substrings, paths and pictures: the string base with its bound word, the kinds built
// on it, the layout and life cycle of their data, and copy and conversion between them.
#pragma once

#include <cstdint>

#include "source/model/TD.h"
#include "vellum/TDStringHandles.h"

// Every string-like kind with a bound word. Its own data behaviour is that of a counted string in
// a handle (String, Pict, Tag); SubString and Path change what they hold.
class TDStringBaseImp : public TDImp {
 public:
  // --- slots of TDImp --------------------------------------------------------------------------
  int32_t ComputeHashValue() const override;
  int32_t IsSameAs(const TDImp& other) const override;
  int32_t MemberCloneOrCheckOut(TDImpPtr& target) const override;
  int32_t MemberCheckIn(TDImpPtr& target) const override;
  // A null handle is sound; otherwise the handle must be live, hold a length word >= 0 and at
  // least 4 + length bytes. Damage goes to the rave procedure (code 1024).
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  // One handle: the platform's pointer size, else 8.
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  // A zeroed block of 4 + n bytes (n the fixed length or the bound; length word n when fixed);
  // nothing for n = 0 unless only-if-empty finds a null handle.
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void* data, void* end, int32_t dispose,
                      const HandleAllocationInterface& allocator) const override;
  DataShapes DataShapeOf(int32_t) const override { return kDataShapeStringLike; }
  // With flag 0, a variable string's handle larger than 4 bytes is given back whole (the value
  // is meant to be dead): the result is its size.
  int32_t ShrinkData(void* data, void* end, int32_t flag, const HandleAllocationInterface& allocator) const override;
  // The bound word.
  int32_t FlattenTDPartsForSaving(TDDataWriter* writer) const override;
  int32_t ConstructTD(TDDataReader* reader) override;
  // Each value as a 32-bit length and the bytes (a null handle is length 0). Reading sizes the
  // handle for the bound word (the length read for a variable string), truncates or zero-fills
  // to it, and refuses a length that is negative or beyond the input (116) before allocating.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  int32_t IsFlatDataFixedSize() const override { return vellum::bound::IsFixed(bound_) ? 1 : 0; }
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into the same code, or between String and Tag, following the destination's bound word.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  // Path and Pict: the same code only; the bound words decide the rest.
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  // By bound word, smaller first.
  int32_t CompareForSorting(const TDImp* other) const override;
  int32_t IsStringBase() const override { return 1; }
  // The bytes, as LHStrCmp orders them; a null handle is the empty string.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

  // --- members ---------------------------------------------------------------------------------
  int32_t GetBound() const noexcept { return bound_; }
  // Clears hash-valid.
  void SetBound(int32_t bound);

 protected:
  TDStringBaseImp() noexcept = default;
  TDStringBaseImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDImp(name, typedefLink), bound_(bound) {}
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;

  // What the dump calls the kind.
  virtual const char* KindText() const = 0;

 private:
  int32_t bound_ = vellum::bound::kVariable;
};

class TDStringImp final : public TDStringBaseImp {
 public:
  TDStringImp() noexcept = default;
  TDStringImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDStringBaseImp(name, typedefLink, bound) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::String); }
  TDImpPtr NewInstance() const override;
  // Also into a SubString: a view of the source's bytes.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  int32_t IsString() const override { return 1; }
  int32_t IsStringOnly() const override { return 1; }

 protected:
  const char* KindText() const override { return "string"; }
};

// The datum is a SubStringRec that points into bytes owned elsewhere; there is no default value
// beyond zeroed bytes.
class TDSubStringImp final : public TDStringBaseImp {
 public:
  TDSubStringImp() noexcept = default;
  TDSubStringImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDStringBaseImp(name, typedefLink, bound) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::SubString); }
  TDImpPtr NewInstance() const override;
  // A negative length, or bytes without a data pointer.
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  int32_t DataSizeCore(ITargetPlatformAlignment* platform) const override;
  int32_t GetAlignment(ITargetPlatformAlignment* platform) const override;
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void*, void*, int32_t, const HandleAllocationInterface&) const override { return 0; }
  int32_t ShrinkData(void*, void*, int32_t, const HandleAllocationInterface&) const override { return 0; }
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  // Into a SubString, a String or a Tag.
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  int32_t CmpTD(const TDImp* source, int32_t flags, int32_t bitsSoFar) const override;
  // Written as the string it views; never read ("ReadData does not handle subStrings!").
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  int32_t IsString() const override { return 1; }
  int32_t IsSubStringOnly() const override { return 1; }
  int32_t IsSubType() const override { return 1; }
  // The records' bytes, not the bytes they view (noted as such).
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
  const char* KindText() const override { return "substring"; }
};

// The datum is a Path (a path object of the runtime), null meaning no path yet.
class TDPathImp final : public TDStringBaseImp {
 public:
  TDPathImp() noexcept = default;
  TDPathImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDStringBaseImp(name, typedefLink, bound) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Path); }
  TDImpPtr NewInstance() const override;
  // A path object whose type or names are not sane.
  int32_t VerifyData(const void* data, const KoContext* context) const override;
  int32_t InflateDefData(void* data, int32_t onlyIfEmpty, int32_t clearFirst, int32_t flags) const override;
  int32_t DeflateData(void* data, void* end, int32_t dispose,
                      const HandleAllocationInterface& allocator) const override;
  // Path objects keep no spare memory to give back.
  int32_t ShrinkData(void*, void*, int32_t, const HandleAllocationInterface&) const override { return 0; }
  int32_t CopyData(const void* src, void* dst, int32_t flags, const KoContext* context) const override;
  int32_t CopyDataConvertCore(const TDImp* dst, const void* src, void* dstData, int32_t flags) const override;
  int32_t ResetToDefaultData(void* data) const override;
  // The runtime's flattened path; a null path reads and writes as not-a-path.
  uint32_t FlatDataSize(KoDataWriter* writer, const void* data) const override;
  int32_t IsPath() const override { return 1; }
  // FPathCmpExact; a null path orders as not-a-path, which is how it is flattened.
  DataOrder OrderData(const void* a, const void* b, const DataOrderOptions& options) const override;

 protected:
  void WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const override;
  void ReadFlatData(KoDataReader* reader, void* data, int32_t count) const override;
  const char* KindText() const override { return "path"; }
};

class TDPictImp final : public TDStringBaseImp {
 public:
  TDPictImp() noexcept = default;
  TDPictImp(const TDNameImpPtr& name, const TDTypedefImpPtr& typedefLink, int32_t bound) noexcept
      : TDStringBaseImp(name, typedefLink, bound) {}
  int16_t GetTypeCode() const override { return static_cast<int16_t>(TypeCode::Pict); }
  TDImpPtr NewInstance() const override;
  int32_t IsPict() const override { return 1; }

 protected:
  const char* KindText() const override { return "picture"; }
};

// One string value of flattened data into *slot (null: skip it), sized for the bound word as a
// string of that bound reads it. 0, or the stream's status.
int32_t ReadLStrValue(KoDataReader* reader, int32_t bound, LStrHandle* slot);

// The bound word of a string-base descriptor; -1 for any other kind or null.
int32_t BoundOfStringBase(const TDImp* type);

// The compatibility bits of string data of bound `srcBound` going into bound `dstBound`, for a
// pair of kinds that otherwise match (strings, substrings, tags).
int32_t StringBoundCmpBits(int32_t dstBound, int32_t srcBound, int32_t flags);

// A name object for a zero-terminated text; null for a null or empty text. *failed is set when
// memory runs out.
TDNameImpPtr MakeNameFromCStr(const uint8_t* name, bool* failed);

// Reports a refused conversion with both codes in "0x%08x" form.
void ReportConvertCodes(const TDImp* dst, const TDImp& src);
