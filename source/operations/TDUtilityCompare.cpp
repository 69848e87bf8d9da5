// Ordering of typed data: one switch over the kinds that walks aggregates element by element, and
// the process-wide table of comparisons that families register for their type codes.
#include "source/operations/TDUtilityCompare.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstring>
#include <deque>
#include <mutex>
#include <new>

#include "runtime/DebugStream.h"
#include "runtime/PXPath.h"
#include "runtime/PXStrings.h"
#include "source/families/TDArray.h"
#include "source/families/TDBlock.h"
#include "source/families/TDCluster.h"
#include "source/families/TDNumeric.h"
#include "runtime/MoveBytes.h"

VELLUM_DIAGNOSTIC_MODULE("TDUtilityCompare");

namespace {

// Data without a path yet holds null, which flattens as not-a-path, and so compares as one.
int32_t ComparePathData(Path a, Path b) {
  if (a != nullptr && b != nullptr) return FPathCmpExact(a, b);
  Path notAPath = nullptr;
  if (FNotAPath(&notAPath) != kStatusNoError) {
    FDestroyPath(&notAPath);
    return FPathCmpExact(a, b);
  }
  const int32_t order = FPathCmpExact(a != nullptr ? a : notAPath, b != nullptr ? b : notAPath);
  FDestroyPath(&notAPath);
  return order;
}

constexpr size_t kTypeCodeCount = 256;

struct CompareEntry {
  CompareDataApplicableProc applies;
  CompareDataProc compare;
};

// Entries live as long as the process: a comparison on another thread may still be calling one
// that a later registration replaced. A slot holds the entry in force for its code.
class CompareTable {
 public:
  // 0; 2 when memory runs out.
  int32_t Register(int16_t code, CompareDataApplicableProc applies, CompareDataProc compare) {
    std::lock_guard lock(mutex_);
    try {
      entries_.push_back(CompareEntry{applies, compare});
    } catch (const std::bad_alloc&) {
      return kStatusOutOfMemory;
    }
    // No descriptor has a code outside the slots, so such an entry is kept but never consulted.
    if (code >= 0 && static_cast<size_t>(code) < kTypeCodeCount) {
      slots_[static_cast<size_t>(code)].store(&entries_.back(), std::memory_order_release);
    }
    return kStatusNoError;
  }

  const CompareEntry* Find(int32_t code) const {
    if (code < 0 || static_cast<size_t>(code) >= kTypeCodeCount) return nullptr;
    return slots_[static_cast<size_t>(code)].load(std::memory_order_acquire);
  }

 private:
  std::mutex mutex_;  // guards entries_
  std::deque<CompareEntry> entries_;
  std::array<std::atomic<const CompareEntry*>, kTypeCodeCount> slots_{};
};

// Families register from their static initialisers, whatever the order the loader runs them in.
CompareTable& TheCompareTable() {
  static CompareTable table;
  return table;
}

const uint8_t* At(const void* data, int64_t offset) { return static_cast<const uint8_t*>(data) + offset; }

template <class T>
int32_t Order(T a, T b) {
  return a < b ? -1 : (b < a ? 1 : 0);
}

size_t SizeOf(const TDImp& type) { return static_cast<size_t>(std::max(type.DataSizeCore(nullptr), 0)); }

void ReportUnordered(int32_t code) { (VELLUM_DEBUG(3) << "CompareData: tc=" << code << "?").Process(); }

// True sorts after false. Any two values that differ order by `a` alone: a true `a` sorts after
// `b`, a false one before.
int32_t CompareBoolean(const void* a, const void* b, size_t size) {
  if (BlockCmp(a, b, size) == 0) return 0;
  const auto* bytes = static_cast<const uint8_t*>(a);
  for (size_t i = 0; i < size; ++i) {
    if (bytes[i] != 0) return 1;
  }
  return -1;
}

int32_t CompareImp(const TDImp& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                   int32_t bytewise, int32_t rawNumbers);

int32_t CompareCluster(const TDClusterImp& cluster, bool nullFirst, const void* a, const void* b,
                       int32_t variantOption, int32_t bytewise, int32_t rawNumbers) {
  if (bytewise != 0 && cluster.DataShapeOf(1) == kDataShapePlain) return BlockCmp(a, b, SizeOf(cluster));
  return cluster.ForEachElt([&](const TDImp& element, int64_t offset) {
    return CompareImp(element, nullFirst, At(a, offset), At(b, offset), variantOption, bytewise, rawNumbers);
  });
}

int32_t CompareRepeatedBlock(const TDRepeatedBlockImp& repeated, bool nullFirst, const void* a, const void* b,
                             int32_t variantOption, int32_t bytewise, int32_t rawNumbers) {
  if (bytewise != 0 && repeated.DataShapeOf(1) == kDataShapePlain) return BlockCmp(a, b, SizeOf(repeated));
  const TDImp* element = repeated.GetElt().get();
  if (element == nullptr) return 0;
  const auto size = static_cast<int64_t>(SizeOf(*element));
  // Copies of nothing are all alike, however many the count says there are.
  if (size == 0) return 0;
  const uint32_t count = repeated.GetNumBlocks();
  for (uint32_t k = 0; k < count; ++k) {
    const int64_t offset = size * k;
    const int32_t result =
        CompareImp(*element, nullFirst, At(a, offset), At(b, offset), variantOption, bytewise, rawNumbers);
    if (result != 0) return result;
  }
  return 0;
}

// One side of an array comparison: the block, or null for a null handle and for a damaged block
// (whose elements are never read).
struct ArraySide {
  const uint8_t* block = nullptr;
  int64_t count = 0;

  ArraySide(const ArrayLayout& layout, const void* data) {
    const auto h = Load<UHandle>(data);
    if (h != nullptr && layout.ReadCount(h, &count)) {
      block = *h;
    } else {
      count = 0;
    }
  }
  const int32_t* Dims() const { return reinterpret_cast<const int32_t*>(block); }
};

int32_t CompareArray(const TDArrayBaseImp& array, bool nullFirst, const void* a, const void* b,
                     int32_t variantOption, int32_t bytewise, int32_t rawNumbers) {
  if (!array.IsWellFormed()) return 0;
  const ArrayLayout layout(*array.GetElt(), array.GetNumDims());
  const ArraySide x(layout, a);
  const ArraySide y(layout, b);
  if (!nullFirst) {
    if (x.count != y.count) return x.count < y.count ? -1 : 1;
    if (x.count == 0) return 0;
  } else {
    if (x.block == nullptr || y.block == nullptr) return x.block == y.block ? 0 : (x.block == nullptr ? 1 : -1);
  }
  // Equal dimension words mean equal counts from here on.
  const int32_t dims = BlockCmp(x.block, y.block, sizeof(int32_t) * static_cast<size_t>(layout.nDims));
  if (dims != 0 || x.count == 0) return dims;

  const uint8_t* firstA = layout.Element(x.block, 0);
  const uint8_t* firstB = layout.Element(y.block, 0);
  if (layout.packed) {
    if (bytewise != 0) return BlockCmp(firstA, firstB, static_cast<size_t>(layout.Bytes(x.count, x.Dims())));
    const int64_t rowLength = layout.nDims > 0 ? x.Dims()[layout.nDims - 1] : 1;
    return ComparePackedBooleans(firstA, firstB, x.count / rowLength, rowLength);
  }
  if (bytewise != 0 && !layout.handles) return BlockCmp(firstA, firstB, static_cast<size_t>(x.count * layout.eltSize));
  // Elements of no size are all alike, however many the dimensions count.
  if (layout.eltSize == 0) return 0;
  for (int64_t i = 0; i < x.count; ++i) {
    const int32_t result = CompareImp(*layout.elt, nullFirst, layout.Element(x.block, i), layout.Element(y.block, i),
                                      variantOption, bytewise, rawNumbers);
    if (result != 0) return result;
  }
  return 0;
}

int32_t CompareRefnum(const TDImp& refnum, const void* a, const void* b, int32_t bytewise) {
  const size_t size = SizeOf(refnum);
  if (bytewise != 0) return BlockCmp(a, b, size);
  if (size == sizeof(uint64_t)) return Order(Load<uint64_t>(a), Load<uint64_t>(b));
  if (size == sizeof(uint32_t)) return Order(Load<uint32_t>(a), Load<uint32_t>(b));
  DebugReport(kDiagnosticModule, __LINE__, 3, "Unsupported refnum size in CompareDataTDR.");
  return 0;
}

int32_t CompareImp(const TDImp& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                   int32_t bytewise, int32_t rawNumbers) {
  if (a == nullptr || b == nullptr) return 0;
  // Enumeration and units variants order like their plain numbers.
  const int32_t code = StripTypeCodeModifier(type.GetTypeCode());
  if (const CompareEntry* entry = TheCompareTable().Find(code)) {
    const TDR handle = MakeTDRFromTDImp(&type);
    if (entry->applies == nullptr || entry->applies(handle)) {
      return entry->compare(handle, nullFirst, a, b, variantOption, bytewise, rawNumbers);
    }
  }
  // A descriptor's code is always one of the kinds; were it not, it would fall through to the
  // message below.
  switch (static_cast<TypeCode>(code)) {
    case TypeCode::Void:
    case TypeCode::VoidBlock:
      return 0;
    case TypeCode::BooleanU16:
      return CompareBoolean(a, b, sizeof(uint16_t));
    case TypeCode::Boolean:
      return CompareBoolean(a, b, sizeof(uint8_t));
    case TypeCode::String:
    case TypeCode::Pict:
    case TypeCode::Tag:
      return LHStrCmp(Load<LStrHandle>(a), Load<LStrHandle>(b));
    case TypeCode::Path:
      return ComparePathData(Load<Path>(a), Load<Path>(b));
    case TypeCode::SubString:
    case TypeCode::SubArray:
      DebugReport(kDiagnosticModule, __LINE__, 3, "CompareData for subtypes should be implemented correctly.");
      return BlockCmp(a, b, SizeOf(type));
    case TypeCode::Array:
      if (const TDArrayBaseImp* array = AsArrayBase(&type)) {
        return CompareArray(*array, nullFirst, a, b, variantOption, bytewise, rawNumbers);
      }
      return 0;
    case TypeCode::Cluster:
      if (const TDClusterImp* cluster = AsCluster(&type)) {
        return CompareCluster(*cluster, nullFirst, a, b, variantOption, bytewise, rawNumbers);
      }
      return 0;
    case TypeCode::RepeatedBlock:
      if (const TDRepeatedBlockImp* repeated = AsRepeatedBlock(&type)) {
        return CompareRepeatedBlock(*repeated, nullFirst, a, b, variantOption, bytewise, rawNumbers);
      }
      return 0;
    case TypeCode::Block:
    case TypeCode::TypeBlock:
    case TypeCode::AlignedBlock:
    case TypeCode::Ptr:
      return BlockCmp(a, b, SizeOf(type));
    case TypeCode::Refnum:
      return CompareRefnum(type, a, b, bytewise);
    // Kinds whose data no family here can read (variants, measure data, sets and maps), and
    // functions: no order.
    case TypeCode::KoVariant:
    case TypeCode::MeasureData:
    case TypeCode::SetCollection:
    case TypeCode::MapCollection:
    case TypeCode::Function:
    case TypeCode::PolyVI:
      ReportUnordered(code);
      return 0;
    case TypeCode::Int8:
    case TypeCode::Int16:
    case TypeCode::Int32:
    case TypeCode::Int64:
    case TypeCode::UInt8:
    case TypeCode::UInt16:
    case TypeCode::UInt32:
    case TypeCode::UInt64:
    case TypeCode::Float32:
    case TypeCode::Float64:
    case TypeCode::FloatExt:
    case TypeCode::Complex64:
    case TypeCode::Complex128:
    case TypeCode::ComplexExt:
    case TypeCode::EnumUInt8:
    case TypeCode::EnumUInt16:
    case TypeCode::EnumUInt32:
    case TypeCode::Float32Units:
    case TypeCode::Float64Units:
    case TypeCode::FloatExtUnits:
    case TypeCode::Complex64Units:
    case TypeCode::Complex128Units:
    case TypeCode::ComplexExtUnits:
    case TypeCode::FixedPoint:
    case TypeCode::ComplexFixedPoint:
    case TypeCode::CStr:
    case TypeCode::PStr:
    case TypeCode::ArrayDataPtr:
    case TypeCode::PtrTo:
    case TypeCode::AlignmentMarker:
      break;
  }
  if (type.IsNumeric() == 0) {
    ReportUnordered(code);
    return 0;
  }
  return rawNumbers != 0 ? BlockCmp(a, b, SizeOf(type)) : CompareNumericData(&type, a, b);
}

}  // namespace

int32_t CompareDataTDRCore(const TDR& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                           int32_t bytewise, int32_t rawNumbers) {
  const TDImp* imp = type.GetImp();
  if (imp == nullptr) return 0;
  return CompareImp(*imp, nullFirst, a, b, variantOption, bytewise, rawNumbers);
}

int32_t CompareDataTDR(const TDR& type, const void* a, const void* b, int32_t variantOption, int32_t bytewise) {
  return CompareDataTDRCore(type, false, a, b, variantOption, bytewise, 0);
}

int32_t RegisterCompareDataFunctionForTypeCode(int16_t typeCode, CompareDataApplicableProc applies,
                                               CompareDataProc compare) {
  if (compare == nullptr) {
    (VELLUM_DEBUG(3) << "Tried to register a NULL comparison proc for type code " << typeCode).Process();
    return kStatusBadArgument;
  }
  return TheCompareTable().Register(typeCode, applies, compare);
}
