// Handles of descriptors made of other descriptors: any container, the one-element containers,
// the ordered element lists, and clusters with their in-place layout.
#pragma once

#include <cstdint>
#include <string_view>

#include "vellum/TDHandles.h"

struct ContainerKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct SingleContainerKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct MultiContainerKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct ClusterKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRContainer;
class TDWContainer;
class TDRSingleContainer;
class TDWSingleContainer;
class TDRMultiContainer;
class TDWMultiContainer;
class TDRCluster;
class TDWCluster;

// Abstract kinds: default construction gives a null handle.
class TDRContainer : public TDRTyped<TDRContainer, TDWContainer, TDR, ContainerKind> {
 public:
  using TDRTyped::TDRTyped;
};
class TDWContainer : public TDWTyped<TDRContainer, TDWContainer, TDW, ContainerKind> {
 public:
  using TDWTyped::TDWTyped;
};

class TDRSingleContainer
    : public TDRTyped<TDRSingleContainer, TDWSingleContainer, TDRContainer, SingleContainerKind> {
 public:
  using TDRTyped::TDRTyped;
  // The element; null when there is none or the handle is null.
  TDR GetEltTD() const;
};

class TDWSingleContainer
    : public TDWTyped<TDRSingleContainer, TDWSingleContainer, TDWContainer, SingleContainerKind> {
 public:
  using TDWTyped::TDWTyped;
  // The element itself, so that changes through the result change this descriptor; null when
  // there is none or the element is an interned (read-only) descriptor.
  TDW GetEltTD() const;
  // The element becomes the object the argument holds (a null one removes it). 42 for a null
  // handle; 1 after a diagnostic when the element would contain this descriptor.
  [[nodiscard]] int32_t SetEltTD(const TD& element);
  [[nodiscard]] int32_t RemoveEltTD();
};

class TDRMultiContainer
    : public TDRTyped<TDRMultiContainer, TDWMultiContainer, TDRContainer, MultiContainerKind> {
 public:
  using TDRTyped::TDRTyped;
  int32_t GetNumElts() const;
  // Null beyond the end or for an absent element.
  TDR GetEltTD(int32_t index) const;
  // The index of the first element whose name equals the zero-terminated `name` (both compared
  // as Pascal strings, so only the first 255 bytes count); -1 when none.
  int32_t GetEltPos(const uint8_t* name) const;
  int32_t GetEltPos(std::string_view name) const { return GetEltPos(vellum::detail::CName(name).Get()); }
};

class TDWMultiContainer
    : public TDWTyped<TDRMultiContainer, TDWMultiContainer, TDWContainer, MultiContainerKind> {
 public:
  using TDWTyped::TDWTyped;
  int32_t GetNumElts() const;
  // The element itself (changes through it change this descriptor); null beyond the end, for an
  // absent element, or for an interned (read-only) element.
  TDW GetEltTD(int32_t index) const;
  int32_t GetEltPos(const uint8_t* name) const;
  int32_t GetEltPos(std::string_view name) const { return GetEltPos(vellum::detail::CName(name).Get()); }

  // Elements are held, not copied: the object an argument holds becomes the element. Each
  // returns 0; 42 for a null handle or a null element; 1 for an index out of range, and 1 after
  // a diagnostic when the element would contain this descriptor; 2 when memory runs out.
  [[nodiscard]] int32_t AppendEltTD(const TD& element);
  // At `index` (0 to the element count; the count appends).
  [[nodiscard]] int32_t InsertEltTDAt(const TD& element, int32_t index);
  [[nodiscard]] int32_t ReplaceEltTDAt(const TD& element, int32_t index);
  [[nodiscard]] int32_t RemoveAllEltTDs();
  // Room for `count` elements; the elements do not change.
  [[nodiscard]] int32_t ReserveElementCount(int32_t count);

  // Appends and returns this handle for chaining. When appending fails a diagnostic is written
  // and a shared handle without a descriptor is returned, on which every further `<<` fails
  // again with 42, so the rest of the chain adds nothing.
  TDWMultiContainer& operator<<(const TD& element);
};

class TDRCluster : public TDRTyped<TDRCluster, TDWCluster, TDRMultiContainer, ClusterKind> {
 public:
  using TDRTyped::TDRTyped;

  // Where element `index` starts in a datum of this cluster for `platform` (null: the running
  // process). 0 for index 0, for an index beyond the list and for a null handle.
  int32_t GetEltOffset(int32_t index, ITargetPlatformAlignment* platform = nullptr) const;
  // The offset of the first element named `name`; 0 after a diagnostic when none has that name.
  int32_t GetEltOffsetByName(const uint8_t* name, ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetEltOffsetByName(std::string_view name, ITargetPlatformAlignment* platform = nullptr) const {
    return GetEltOffsetByName(vellum::detail::CName(name).Get(), platform);
  }
  // As GetEltOffsetByName; without a platform, a result other than `expected` is reported and
  // `expected` returned.
  int32_t GetEltOffsetByNameDebug(const uint8_t* name, ITargetPlatformAlignment* platform, int32_t expected) const;
  // data + GetEltOffset(index); null for null data.
  void* GetEltPtr(int32_t index, void* data) const;
  const void* GetEltPtr(int32_t index, const void* data) const;
  // The element count plus, for each element that is a cluster, its own deep count.
  int32_t GetNumEltsDeep() const;
};

class TDWCluster : public TDWTyped<TDRCluster, TDWCluster, TDWMultiContainer, ClusterKind> {
 public:
  using TDWTyped::TDWTyped;

  int32_t GetEltOffset(int32_t index, ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetEltOffsetByName(const uint8_t* name, ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetEltOffsetByName(std::string_view name, ITargetPlatformAlignment* platform = nullptr) const {
    return GetEltOffsetByName(vellum::detail::CName(name).Get(), platform);
  }
  int32_t GetEltOffsetByNameDebug(const uint8_t* name, ITargetPlatformAlignment* platform, int32_t expected) const;
  void* GetEltPtr(int32_t index, void* data) const;
  const void* GetEltPtr(int32_t index, const void* data) const;
  int32_t GetNumEltsDeep() const;

  // As TDWMultiContainer's, keeping the cluster type along the chain.
  TDWCluster& operator<<(const TD& element);
};

// The shared empty cluster, built on first use and released when the service stops.
const TDR& GetClust0TD();
