// Attributes: the small interned objects a descriptor points to. Names and typedef links live
// here; units and enumerations derive from the same base in their own modules.
#pragma once

#include <atomic>
#include <cstdint>
#include <cstring>
#include <string>

#include "runtime/DSMemory.h"
#include "runtime/PXPath.h"
#include "source/model/TDRefCountedPtr.h"
#include "vellum/QualifiedName.h"
#include "vellum/TDAttributeHandles.h"

class TDDataWriter;
class TDDataReader;

class TDAttributeImp : public TDRefCountedHashedObj {
 public:
  ~TDAttributeImp() override;
  // Slots 1 and 2 come from the base: attributes have no read-only flag, so the hash is computed
  // once and cached; every setter clears it.
  virtual int32_t IsEqual(const TDAttributeImp& other) const = 0;
  // Adds the flattened size for `writer`'s version to *size.
  virtual void AddFlatSize(int32_t* size, const TDDataWriter* writer) const = 0;
  virtual int32_t Flatten(TDDataWriter* writer) const = 0;
  virtual int32_t UnFlatten(TDDataReader* reader) = 0;
  virtual void PrintDebugStr(const uint8_t* prefix) const = 0;
  virtual int32_t IsNameAttribute() const { return 0; }
  virtual int32_t IsTypedefAttribute() const { return 0; }
  virtual int32_t IsEnumAttribute() const { return 0; }
  virtual int32_t IsUnitsAttribute() const { return 0; }

  // Set when the object enters its dictionary: from then on it is shared by every descriptor that
  // uses it, so no writable handle may hold it and no setter may touch it.
  bool IsInterned() const noexcept { return interned_.load(std::memory_order_acquire); }
  void MarkInterned() noexcept { interned_.store(true, std::memory_order_release); }

 protected:
  TDAttributeImp() noexcept = default;

 private:
  std::atomic<bool> interned_{false};
};

// A descriptor's label: at most 255 bytes, or no text at all.
class TDNameImp final : public TDAttributeImp {
 public:
  TDNameImp() noexcept = default;
  ~TDNameImp() override;

  // A name object with a copy of the text, or null when memory runs out. A name longer than
  // 255 bytes keeps its first 255.
  static TDNameImpPtr Make(const uint8_t* bytes, size_t length);

  int32_t ComputeHashValue() const override;
  int32_t IsEqual(const TDAttributeImp& other) const override;
  void AddFlatSize(int32_t* size, const TDDataWriter* writer) const override;
  int32_t Flatten(TDDataWriter* writer) const override;
  int32_t UnFlatten(TDDataReader* reader) override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsNameAttribute() const override { return 1; }

  // The text as a Pascal string, or the shared empty one.
  const uint8_t* GetNamePStr() const;
  bool HasText() const { return text_ != nullptr; }
  // Replace the text (null or empty clears it); 2 when memory runs out, text unchanged.
  int32_t SetText(const uint8_t* bytes, size_t length);
  int32_t SetNamePStr(const uint8_t* pString);

  // The interned equal name; a name without text is never interned and gets a fresh copy.
  // Null when memory runs out.
  TDNameImpPtr CheckIn() const;
  TDNameImpPtr CloneOrCheckOut() const;

 private:
  UPtr text_ = nullptr;  // Pascal string in a runtime pointer block
};

// The identity of the user-defined type definition a descriptor was made from.
class TDTypedefImp final : public TDAttributeImp {
 public:
  TDTypedefImp() noexcept = default;
  ~TDTypedefImp() override;

  // A typedef link with copies of the name and path, or null when memory runs out.
  static TDTypedefImpPtr Make(const QualifiedName& viName, uint32_t timeStamp, Path viPath);

  int32_t ComputeHashValue() const override;
  int32_t IsEqual(const TDAttributeImp& other) const override;
  void AddFlatSize(int32_t* size, const TDDataWriter* writer) const override;
  int32_t Flatten(TDDataWriter* writer) const override;
  int32_t UnFlatten(TDDataReader* reader) override;
  void PrintDebugStr(const uint8_t* prefix) const override;
  int32_t IsTypedefAttribute() const override { return 1; }
  // Consumes one flattened typedef link without building it.
  virtual int32_t Skip(TDDataReader* reader) const;

  const QualifiedName& GetVIName() const { return viName_; }
  uint32_t GetTimeStamp() const { return timeStamp_; }
  Path GetVIPath() const { return viPath_; }
  bool IsPathized() const { return viPath_ != nullptr; }
  int32_t SetVIName(const QualifiedName& viName);
  void SetTimeStamp(uint32_t timeStamp);
  // Takes a copy of `viPath` (null clears); 2 when the copy cannot be made, path unchanged.
  int32_t SetVIPath(Path viPath);

  TDTypedefImpPtr CheckIn() const;
  TDTypedefImpPtr CloneOrCheckOut() const;

 private:
  QualifiedName viName_;
  uint32_t timeStamp_ = 0;
  Path viPath_ = nullptr;
};

// What the dictionaries call to match interned attributes.
inline bool InternEqual(const TDAttributeImp& a, const TDAttributeImp& b) { return a.IsEqual(b) != 0; }
inline void MarkInterned(TDAttributeImp& attribute) { attribute.MarkInterned(); }

// A new writable descriptor of class `Imp` labelled with the zero-terminated `name` (no label
// for a null or empty one); null when memory runs out.
template <class Imp>
TDImpPtr MakeNamedTD(const uint8_t* name) {
  TDNameImpPtr label;
  if (name != nullptr && name[0] != 0) {
    label = TDNameImp::Make(name, std::strlen(reinterpret_cast<const char*>(name)));
    if (!label) return TDImpPtr();
  }
  return MakeCounted<Imp>(label, TDTypedefImpPtr());
}
