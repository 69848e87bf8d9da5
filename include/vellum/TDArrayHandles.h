// Handles of the array kinds (Array, SubArray, ArrayDataPtr), the shared one-dimensional arrays,
// and the functions every producer of array data uses: counting, resizing and flat copy.
#pragma once

#include <cstdint>
#include <string_view>

#include "runtime/PXTypes.h"
#include "vellum/TDContainerHandles.h"
#include "vellum/TDHandles.h"

// A dimension size word uses the encoding of a string's bound (vellum::bound in
// TDStringHandles.h): -1 variable, >= 0 bounded (at most that many), any other value with bit 31
// set fixed at (word & 0x7FFFFFFF).
//
// Array data is one handle (null: an empty array of any dimension count) to a block of one int32
// size per dimension, then the elements, the first at the element type's AlignDatum of
// 4 x dimensions, each DataSize bytes apart. Arrays of BooleanU16 hold their elements packed
// into 16-bit words, most significant bit first, a new word at each new row (NArrayBinwds).
//
// Element counts: the product of the dimension sizes counts as overflowed when it exceeds
// 0x7FFFFFFF or when a size in a block is negative. Every operation refuses such a count with
// status 1 and one diagnostic line, and writes nothing.

// One dimension of a SubArray datum: the "dimensionSize" (an int32 in the low half of the
// 64-bit value, in the running process) and the byte distance between neighbours.
struct SubArrayDimension {
  int64_t dimensionSize;
  int64_t stride;
};
static_assert(sizeof(SubArrayDimension) == 16);

// --- counting ------------------------------------------------------------------------------------
// Each sets *overflow (when not null) to 1 for an overflowed count, and 0 otherwise; an
// overflowed count is returned as 0.

// The product of the sizes; 1 for nDims < 1.
int64_t NArrayElts(int32_t nDims, const int32_t* dims, int32_t* overflow);
// The same over the dimension entries of a SubArray datum.
int64_t NSubArrayElts(int32_t nDims, const SubArrayDimension* entries, int32_t* overflow);
// The 16-bit words of a packed Boolean array: the product of all sizes but the last, times
// (last + 15) >> 4.
int64_t NArrayBinwds(int32_t nDims, const int32_t* dims, int32_t* overflow);
// Whether the entries describe contiguous row-major storage of `eltSize`-byte elements.
bool CompactSubArray(const SubArrayDimension* entries, int32_t nDims, int64_t eltSize);

// --- resizing ------------------------------------------------------------------------------------
// Resizes the block at *handle (null: none yet) to `count` elements of `elt` for an array of
// `nDims` dimensions. Elements kept keep their values; removed elements holding handles are
// disposed; new elements are zeroed, and inflated to their default when
// NeedsInflateForArrayElts(elt). The dimension words are not written: the caller writes them.
// A count of 0 with allocWhenEmpty 0 leaves a null handle null and zeroes an existing block cut
// to its dimension words. 0; 1 for a null handle pointer, a negative count, an element that is
// itself an array, or a block whose dimension words overflow or need more bytes than it holds
// (nothing is changed then); 2 when memory runs out (the block is as it was); 42 for a null elt.
[[nodiscard]] int32_t SetArraySizeFromTDR(const TDR& elt, int32_t nDims, UHandle* handle, int32_t count, int32_t allocWhenEmpty);
// As above; `inflateFlags` goes to the elements' InflateDefData.
int32_t SetArraySizeFromTDR2(const TDR& elt, int32_t nDims, UHandle* handle, int32_t count, int32_t allocWhenEmpty,
                             int32_t inflateFlags);
// One dimension: resized to n elements, then the dimension word set to n (when there is a block).
[[nodiscard]] int32_t VectorSetSize(const TDR& elt, UHandle* handle, int32_t n);
// One dimension: resized to the length of `model` (a null model is empty).
[[nodiscard]] int32_t VectorResizeTDR(const TDR& elt, UHandle* handle, UHandle model);

// Whether new elements of `elt` need their default inflated, rather than zeroed: the type holds,
// looking into clusters and repeated blocks, a bounded or fixed string-like kind (not Path) or a
// bounded or fixed array; or the installed procedure says so.
bool NeedsInflateForArrayElts(const TDR& elt);
using NeedsInflateForArrayEltsProc = bool (*)(const TDR& elt);
// Installed once by the host before concurrent use; null removes it.
void SetNeedsInflateForArrayEltsProc(NeedsInflateForArrayEltsProc proc);
// The same test without the procedure.
bool TDContainsBoundedOrFixed(const TDR& type);

// Makes *dst a copy of the whole block `src` (dimension words included) of `headerSize` bytes
// of dimension words and padding followed by the elements: *dst is resized or made. A null src
// disposes *dst and sets it null. 1 for a null dst pointer, or a src block smaller than its
// dimension words say (after a diagnostic); 2 when memory runs out (*dst unchanged).
[[nodiscard]] int32_t CopyFlatArray(int32_t headerSize, UHandle src, UHandle* dst, int32_t nDims, int32_t eltSize);

// --- kinds ---------------------------------------------------------------------------------------

struct ArrayBaseKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t*) { return TDImpPtr(); }
};
struct ArrayKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct SubArrayKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};
struct ArrayDataPtrKind {
  static bool Admit(const TDImp& type);
  static TDImpPtr New(const uint8_t* name);
};

class TDRArrayBase;
class TDWArrayBase;
class TDRArray;
class TDWArray;
class TDRSubArray;
class TDWSubArray;
class TDRArrayDataPtr;
class TDWArrayDataPtr;

// --- handles -------------------------------------------------------------------------------------
// The default and named constructors make one variable dimension and no element. The
// (nDims, elt, name) constructors make nDims variable dimensions (a negative nDims gives a null
// handle); a read-only handle checks the new descriptor in (null when memory runs out), a
// writable one holds the element object itself.

class TDRArrayBase : public TDRTyped<TDRArrayBase, TDWArrayBase, TDRSingleContainer, ArrayBaseKind> {
 public:
  using TDRTyped::TDRTyped;
  // The word of a dimension; 0 out of range.
  int32_t GetDimSize(int32_t index) const;
  int32_t GetNumDims() const;
  // The element-count word: -1 variable (some dimension is); 0x80000001 no dimensions; else the
  // product p of the sizes, with bit 31 set when every dimension is fixed (0 when p is 0).
  // 0x80000000 for a null handle, a missing dimension list, or a product above 0x7FFFFFFF.
  int32_t BoundedOrFixed() const;
  // A dimension list and an element.
  bool IsWellFormed() const;
  bool IsColumnVector() const;
};

class TDWArrayBase : public TDWTyped<TDRArrayBase, TDWArrayBase, TDWSingleContainer, ArrayBaseKind> {
 public:
  using TDWTyped::TDWTyped;
  int32_t GetDimSize(int32_t index) const;
  int32_t GetNumDims() const;
  int32_t BoundedOrFixed() const;
  bool IsWellFormed() const;
  bool IsColumnVector() const;

  // Setters: 0; 42 for a null handle (and, except AddDim, for a missing dimension list); 1 for
  // an index out of range or a negative count; 2 when memory runs out (nothing changed).
  // Inserts `word` at `position` when 0 <= position < count, else appends; starts a missing list.
  [[nodiscard]] int32_t AddDim(int32_t word, int32_t position = -1);
  [[nodiscard]] int32_t RemoveDim(int32_t index);
  [[nodiscard]] int32_t RemoveAllDims();
  // New dimensions are variable; extra ones are dropped from the end.
  [[nodiscard]] int32_t SetNumDims(int32_t count);
  [[nodiscard]] int32_t SetDimSize(int32_t index, int32_t word);
  // The previous mark (false for a null handle).
  bool SetIsColumnVector(bool columnVector);
};

class TDRArray : public TDRTyped<TDRArray, TDWArray, TDRArrayBase, ArrayKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRArray(int32_t nDims, const TDR& elt, const uint8_t* name = nullptr);
  TDRArray(int32_t nDims, const TDR& elt, std::string_view name)
      : TDRArray(nDims, elt, vellum::detail::CName(name).Get()) {}
  // A SubArray with the same element, dimensions and name.
  TDRSubArray ConvertToSubArray() const;
  // Where the first element lies in `handle`'s block; null for a null handle or descriptor.
  void* GetFirstElementPtr(UHandle handle, ITargetPlatformAlignment* platform = nullptr) const;
  // The resizing of SetArraySizeFromTDR for this array, with plain allocation.
  [[nodiscard]] int32_t SetArraySize(UHandle* handle, int32_t count) const;
  // The same, then the dimension words copied from `dims` (zeroed when null) into the block; a
  // count of 0 with a nonzero dimension word keeps a block of dimension words only.
  [[nodiscard]] int32_t SetArraySize(UHandle* handle, int32_t count, const int32_t* dims) const;
};

class TDWArray : public TDWTyped<TDRArray, TDWArray, TDWArrayBase, ArrayKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWArray(int32_t nDims, const TD& elt, const uint8_t* name = nullptr);
  TDWArray(int32_t nDims, const TD& elt, std::string_view name)
      : TDWArray(nDims, elt, vellum::detail::CName(name).Get()) {}
  TDWSubArray ConvertToSubArray() const;
};

class TDRSubArray : public TDRTyped<TDRSubArray, TDWSubArray, TDRArrayBase, SubArrayKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRSubArray(int32_t nDims, const TDR& elt, const uint8_t* name = nullptr);
  TDRSubArray(int32_t nDims, const TDR& elt, std::string_view name)
      : TDRSubArray(nDims, elt, vellum::detail::CName(name).Get()) {}
  // An Array with the same element, dimensions and name.
  TDRArray ConvertToArray() const;
  // Where the record keeps its data pointer, and the size and stride of dimension `dim`: 0,
  // 8 + 16 x dim and 16 + 16 x dim in the running process; for a platform, from the "SubArray"
  // record cluster. A dimension at or beyond the count is reported and gives 0.
  int32_t GetArrayPtrOffset(ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetDimSizeOffset(int32_t dim, ITargetPlatformAlignment* platform = nullptr) const;
  int32_t GetStrideOffset(int32_t dim, ITargetPlatformAlignment* platform = nullptr) const;
};

class TDWSubArray : public TDWTyped<TDRSubArray, TDWSubArray, TDWArrayBase, SubArrayKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWSubArray(int32_t nDims, const TD& elt, const uint8_t* name = nullptr);
  TDWSubArray(int32_t nDims, const TD& elt, std::string_view name)
      : TDWSubArray(nDims, elt, vellum::detail::CName(name).Get()) {}
  TDWArray ConvertToArray() const;
};

class TDRArrayDataPtr : public TDRTyped<TDRArrayDataPtr, TDWArrayDataPtr, TDRArrayBase, ArrayDataPtrKind> {
 public:
  using TDRTyped::TDRTyped;
  TDRArrayDataPtr(int32_t nDims, const TDR& elt, const uint8_t* name = nullptr);
  TDRArrayDataPtr(int32_t nDims, const TDR& elt, std::string_view name)
      : TDRArrayDataPtr(nDims, elt, vellum::detail::CName(name).Get()) {}
};

class TDWArrayDataPtr : public TDWTyped<TDRArrayDataPtr, TDWArrayDataPtr, TDWArrayBase, ArrayDataPtrKind> {
 public:
  using TDWTyped::TDWTyped;
  TDWArrayDataPtr(int32_t nDims, const TD& elt, const uint8_t* name = nullptr);
  TDWArrayDataPtr(int32_t nDims, const TD& elt, std::string_view name)
      : TDWArrayDataPtr(nDims, elt, vellum::detail::CName(name).Get()) {}
};

// The word of dimension `index` and the dimension count of any array kind; 0 for anything else.
int32_t ArrayTypeDimSize(const TD& type, int32_t index);
int32_t ArrayTypeNDims(const TD& type);

// The element count of a fully fixed array (1 for no dimensions); 0 when some dimension is not
// fixed. *err (when not null) is 0; 42 after "This is not an array type!" for a handle without
// a descriptor; 1 when the count overflows (the result is then 0).
int32_t FixedArrayTDR(const TDRArrayBase& type, int32_t* err);

// The shared one-dimensional variable arrays of the shared numeric and Void descriptors, built
// on first use and released when the service stops; null when memory runs out.
const TDR& GetIbyt1DTD();
const TDR& GetUbyt1DTD();
const TDR& GetInt1DTD();
const TDR& GetUWord1DTD();
const TDR& GetLong1DTD();
const TDR& GetULong1DTD();
const TDR& GetQuad1DTD();
const TDR& GetUQuad1DTD();
const TDR& GetSingle1DTD();
const TDR& GetDbl1DTD();
const TDR& GetVoid1DTD();
