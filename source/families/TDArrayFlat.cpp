// The flattened form of array data: each value's dimension sizes, then its elements (Booleans of
// old streams packed sixteen to a word); a subarray is written as the array it views.
#include "source/families/TDArray.h"

#include <algorithm>
#include <cstdint>
#include <vector>

#include "runtime/DebugStream.h"
#include "runtime/PXApp.h"
#include "source/families/TDArrayInternal.h"
#include "source/streams/KoCMutate.h"
#include "source/streams/KoDataReader.h"
#include "source/streams/KoDataWriter.h"

VELLUM_DIAGNOSTIC_MODULE("TDArray");

namespace {

using namespace tdarray_detail;

// A fixed array of elements whose flattened size is fixed.
int32_t FixedFlatSize(const TDArrayBaseImp& array) {
  bool overflow = false;
  const int32_t word = array.CountWord(&overflow);
  const TDImpPtr& element = array.GetElt();
  return IsFixed(word) && word != kCountWordMalformed && element && element->IsFlatDataFixedSize() != 0 ? 1 : 0;
}

// Sets the writer's error, for a type without its dimension list or element (after a report) or
// for values without data, so that nothing is written.
void RefuseUnwritable(const TDArrayBaseImp& type, KoDataWriter* writer, const void* data, int32_t count) {
  if (!type.IsWellFormed()) {
    ReportMalformed();
    writer->SetError(kStatusNullHandle);
  } else if (count > 0 && data == nullptr) {
    writer->SetError(kStatusBadArgument);
  }
}

// Values that take no input (pointers, empty clusters) cost time only: so many are enough for any
// real stream.
constexpr int64_t kMaxEmptyValues = int64_t{1} << 20;

// Booleans of streams before the one-byte form are packed sixteen to a word, a new word each row.
bool PacksBooleans(const TDImp& element, uint32_t version) {
  return element.IsBool() != 0 && version < kOneByteBooleanVersion;
}

// The words of packed Booleans for these sizes (at least one row).
int64_t PackedWords(int32_t nDims, const int32_t* sizes) {
  if (nDims < 1) return 1;
  int64_t rows = 1;
  for (int32_t d = 0; d + 1 < nDims; ++d) rows *= sizes[d];
  return rows * ((static_cast<int64_t>(sizes[nDims - 1]) + 15) >> 4);
}

int32_t WritePackedBooleans(KoDataWriter* writer, const uint8_t* values, int32_t nDims, const int32_t* sizes,
                            int64_t count) {
  const int64_t row = nDims < 1 ? 1 : sizes[nDims - 1];
  if (row == 0) return writer->GetError();
  for (int64_t start = 0; start < count && writer->GetError() == kStatusNoError; start += row) {
    for (int64_t bit = 0; bit < row; bit += 16) {
      uint16_t word = 0;
      for (int64_t k = 0; k < 16 && bit + k < row; ++k)
        if (values[start + bit + k] != 0) word = static_cast<uint16_t>(word | (0x8000u >> k));
      writer->WriteU16(word);
    }
  }
  return writer->GetError();
}

// Unpacks into `values` (null: skip the words).
int32_t ReadPackedBooleans(KoDataReader* reader, uint8_t* values, int32_t nDims, const int32_t* sizes,
                           int64_t count) {
  const int64_t row = nDims < 1 ? 1 : sizes[nDims - 1];
  if (values == nullptr || row == 0) return reader->Skip(static_cast<size_t>(2 * PackedWords(nDims, sizes)));
  for (int64_t start = 0; start < count && reader->GetError() == kStatusNoError; start += row) {
    for (int64_t bit = 0; bit < row; bit += 16) {
      uint16_t word = 0;
      reader->ReadU16(&word);
      for (int64_t k = 0; k < 16 && bit + k < row; ++k) values[start + bit + k] = (word & (0x8000u >> k)) != 0 ? 1 : 0;
    }
  }
  return reader->GetError();
}

// The fewest bytes one value of `element` takes in the stream.
uint64_t MinFlatSize(const TDImp& element, uint32_t version) {
  PreflightOutputBuf counter;
  KoDataWriter sizer(&counter, version, nullptr, kKoDataWriterDeterminingSizeWithoutData);
  return element.FlatDataSize(&sizer, nullptr);
}

// Whether `count` values of `element` with these sizes can be in what is left of the input;
// 116 with a message when they cannot.
bool CountFitsInput(KoDataReader* reader, const TDImp& element, int32_t nDims, const int32_t* sizes, int64_t count) {
  uint64_t need = 0;
  if (PacksBooleans(element, reader->GetVersion())) {
    need = 2 * static_cast<uint64_t>(PackedWords(nDims, sizes));
  } else {
    const uint64_t each = MinFlatSize(element, reader->GetVersion());
    if (each != 0 && static_cast<uint64_t>(count) > UINT64_MAX / each) need = UINT64_MAX;
    else need = each * static_cast<uint64_t>(count);
  }
  if (need <= reader->BytesLeft()) return true;
  (VELLUM_DEBUG(2) << "ReadData: " << count << " array elements cannot be in the " << reader->BytesLeft()
                   << " bytes left")
      .Process();
  reader->SetError(kStatusImplausibleData);
  return false;
}

// Reads `count` elements into consecutive slots from `first` (null: skip them).
int32_t ReadElements(KoDataReader* reader, const ArrayLayout& layout, uint8_t* first, int32_t nDims,
                     const int32_t* sizes, int64_t count) {
  if (PacksBooleans(*layout.elt, reader->GetVersion())) return ReadPackedBooleans(reader, first, nDims, sizes, count);
  if (count == 0) return reader->GetError();
  // Values that take no input cost time only; a count the input does not pay for is refused.
  if (count > kMaxEmptyValues && MinFlatSize(*layout.elt, reader->GetVersion()) == 0) {
    (VELLUM_DEBUG(2) << "ReadData: " << count << " array elements that take no input are more than "
                     << kMaxEmptyValues)
        .Process();
    reader->SetError(kStatusImplausibleData);
    return reader->GetError();
  }
  layout.elt->ReadData(reader, first, static_cast<int32_t>(count), nullptr);
  return reader->GetError();
}

// A bounded or fixed array's read: the stream's elements (`sizes`) go into the preallocated
// block cut to the type's words; elements outside are read and dropped.
int32_t ReadIntoPreallocated(KoDataReader* reader, const TDArrayImp& type, const ArrayLayout& layout, UHandle h,
                             const int32_t* sizes, int64_t count) {
  const int32_t nDims = layout.nDims;
  std::vector<int32_t> kept(static_cast<size_t>(nDims));
  bool same = true;
  for (int32_t d = 0; d < nDims; ++d) {
    const int32_t word = type.GetDimSize(d);
    const int32_t limit = vellum::bound::Length(word);
    if (vellum::bound::IsFixed(word) && sizes[d] != limit)
      DebugReport(kDiagnosticModule, __LINE__, 3, "fixed size array prealloc'd wrong?");
    kept[static_cast<size_t>(d)] = vellum::bound::IsFixed(word) ? limit : std::min(sizes[d], limit);
    same = same && kept[static_cast<size_t>(d)] == sizes[d];
  }
  for (int32_t d = 0; d < nDims; ++d) DimsOf(h)[d] = kept[static_cast<size_t>(d)];
  if (same) return ReadElements(reader, layout, layout.Element(*h, 0), nDims, sizes, count);
  // Packed Booleans are unpacked whole first, then placed like any other element.
  std::vector<uint8_t> unpacked;
  const bool packed = PacksBooleans(*layout.elt, reader->GetVersion());
  if (packed) {
    unpacked.resize(static_cast<size_t>(count));
    if (ReadPackedBooleans(reader, unpacked.data(), nDims, sizes, count) != kStatusNoError) return reader->GetError();
  }
  for (int64_t linear = 0; linear < count && reader->GetError() == kStatusNoError; ++linear) {
    int64_t rest = linear;
    int64_t target = 0;
    int64_t step = 1;
    bool inside = true;
    for (int32_t d = nDims - 1; d >= 0; --d) {
      const int64_t index = rest % sizes[d];
      rest /= sizes[d];
      if (index >= kept[static_cast<size_t>(d)]) inside = false;
      target += index * step;
      step *= kept[static_cast<size_t>(d)];
    }
    uint8_t* into = inside ? layout.Element(*h, target) : nullptr;
    if (packed) {
      if (into != nullptr) *into = unpacked[static_cast<size_t>(linear)];
      continue;
    }
    layout.elt->ReadData(reader, into, 1, nullptr);
  }
  return reader->GetError();
}

}  // namespace

int32_t TDArrayImp::IsFlatDataFixedSize() const { return FixedFlatSize(*this); }

uint32_t TDArrayImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  const int32_t nDims = GetNumDims();
  uint64_t size = 4 * static_cast<uint64_t>(nDims);
  if (!IsWellFormed()) return static_cast<uint32_t>(size);
  const uint32_t version = writer != nullptr ? writer->GetVersion() : PXApp::Instance().GetVersion();
  if (data == nullptr) {
    // Without data only a fixed array knows its elements: every value has them all.
    if (IsFlatDataFixedSize() == 0) return static_cast<uint32_t>(size);
    bool overflow = false;
    const int64_t count = CountWord(&overflow) & 0x7FFFFFFF;
    if (PacksBooleans(*GetElt(), version)) {
      std::vector<int32_t> sizes(static_cast<size_t>(nDims));
      for (int32_t d = 0; d < nDims; ++d) sizes[static_cast<size_t>(d)] = vellum::bound::Length(GetDimSize(d));
      size += 2 * static_cast<uint64_t>(PackedWords(nDims, sizes.data()));
    } else {
      size += static_cast<uint64_t>(count) * GetElt()->FlatDataSize(writer, nullptr);
    }
    return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
  }
  const ArrayLayout layout(*GetElt(), nDims);
  const UHandle h = Load<UHandle>(data);
  int64_t count = 0;
  if (h == nullptr || !layout.ReadCount(h, &count)) return static_cast<uint32_t>(size);
  if (PacksBooleans(*layout.elt, version)) {
    size += 2 * static_cast<uint64_t>(PackedWords(nDims, DimsOf(h)));
  } else if (layout.elt->IsFlatDataFixedSize() != 0) {
    size += static_cast<uint64_t>(count) * layout.elt->FlatDataSize(writer, nullptr);
  } else {
    for (int64_t i = 0; i < count; ++i) size += layout.elt->FlatDataSize(writer, layout.Element(*h, i));
  }
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDArrayImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  RefuseUnwritable(*this, writer, data, count);
  const int32_t nDims = GetNumDims();
  for (int32_t v = 0; v < count && writer->GetError() == kStatusNoError; ++v) {
    const UHandle h = Load<UHandle>(static_cast<const uint8_t*>(data) + static_cast<size_t>(v) * sizeof(UHandle));
    if (h == nullptr) {
      for (int32_t d = 0; d < nDims; ++d) writer->WriteI32(0);
      continue;
    }
    const ArrayLayout layout(*GetElt(), nDims);
    int64_t elements = 0;
    if (!layout.ReadCount(h, &elements)) {
      ReportDamagedBlock();
      writer->SetError(kStatusBadArgument);
      break;
    }
    writer->WriteValues(DimsOf(h), sizeof(int32_t), static_cast<size_t>(nDims));
    if (PacksBooleans(*layout.elt, writer->GetVersion())) {
      WritePackedBooleans(writer, layout.Element(*h, 0), nDims, DimsOf(h), elements);
    } else if (elements != 0) {
      layout.elt->WriteData(writer, layout.Element(*h, 0), static_cast<int32_t>(elements), nullptr);
    }
  }
}

void TDArrayImp::ReadFlatData(KoDataReader* reader, void* data, int32_t count) const {
  if (!IsWellFormed()) {
    ReportMalformed();
    reader->SetError(kStatusNullHandle);
  }
  const int32_t nDims = GetNumDims();
  bool overflow = false;
  const int32_t word = IsWellFormed() ? CountWord(&overflow) : -1;
  std::vector<int32_t> sizes(static_cast<size_t>(nDims));
  for (int32_t v = 0; v < count && reader->GetError() == kStatusNoError; ++v) {
    uint8_t* slot = data != nullptr ? static_cast<uint8_t*>(data) + static_cast<size_t>(v) * sizeof(UHandle) : nullptr;
    if (reader->ReadValues(sizes.data(), sizeof(int32_t), static_cast<size_t>(nDims)) != kStatusNoError) break;
    int32_t tooMany = 0;
    const int64_t elements = NArrayElts(nDims, sizes.data(), &tooMany);
    if (tooMany != 0) {
      ReportOverflow();
      reader->SetError(kStatusImplausibleData);
      break;
    }
    const ArrayLayout layout(*GetElt(), nDims);
    if (!CountFitsInput(reader, *layout.elt, nDims, sizes.data(), elements)) break;
    if (slot == nullptr) {
      ReadElements(reader, layout, nullptr, nDims, sizes.data(), elements);
      continue;
    }
    UHandle h = Load<UHandle>(slot);
    if (word == -1) {
      const int64_t bytes = layout.header + layout.Bytes(elements, sizes.data());
      if ((h == nullptr || static_cast<int64_t>(DSGetHandleSize(h)) < bytes) &&
          !reader->MayAllocate(static_cast<uint64_t>(bytes)))
        break;
      const int32_t resized = ResizeToDimWords(layout, &h, sizes.data());
      Store(slot, h);
      if (resized != kStatusNoError) {
        reader->SetError(kStatusCorruptData);
        break;
      }
      if (h != nullptr) ReadElements(reader, layout, layout.Element(*h, 0), nDims, sizes.data(), elements);
      continue;
    }
    // Bounded or fixed: the preallocated block, made when there is none.
    const int64_t capacity = word & 0x7FFFFFFF;
    const int64_t need = layout.header + (layout.packed ? 2 * PackedWordsOfSizes(nDims, Dims()) : capacity * layout.eltSize);
    if (h == nullptr) {
      if (!reader->MayAllocate(static_cast<uint64_t>(need))) break;
      if (InflateDefData(slot, 0, 1, 0) != kStatusNoError) {
        reader->SetError(kStatusOutOfMemory);
        break;
      }
      h = Load<UHandle>(slot);
    }
    if (h == nullptr && capacity == 0) {
      // No room at all: the default of such an array is no block, and every element is dropped.
      ReadElements(reader, layout, nullptr, nDims, sizes.data(), elements);
      continue;
    }
    if (h == nullptr || static_cast<int64_t>(DSGetHandleSize(h)) < need) {
      DebugReport(kDiagnosticModule, __LINE__, 3,
                  "Array exists whose type thinks it needs more memory than what is preallocated.");
      reader->SetError(kStatusOutOfMemory);
      break;
    }
    ReadIntoPreallocated(reader, *this, layout, h, sizes.data(), elements);
  }
}

int32_t TDSubArrayImp::IsFlatDataFixedSize() const { return FixedFlatSize(*this); }

uint32_t TDSubArrayImp::FlatDataSize(KoDataWriter* writer, const void* data) const {
  const int32_t nDims = GetNumDims();
  uint64_t size = 4 * static_cast<uint64_t>(nDims);
  if (data == nullptr || !IsWellFormed()) return static_cast<uint32_t>(size);
  const ArrayLayout layout(*GetElt(), nDims);
  Source source;
  if (!SubArraySource(layout, data, &source)) return static_cast<uint32_t>(size);
  bool overflow = false;
  const int64_t count = source.Count(&overflow);
  WalkRowMajor(source, [&source](int32_t d) { return source.Size(d); }, count, [&](int64_t, const uint8_t* element) {
    size += layout.elt->FlatDataSize(writer, element);
    return kStatusNoError;
  });
  return static_cast<uint32_t>(std::min<uint64_t>(size, UINT32_MAX));
}

void TDSubArrayImp::WriteFlatData(KoDataWriter* writer, const void* data, int32_t count) const {
  RefuseUnwritable(*this, writer, data, count);
  const int32_t nDims = GetNumDims();
  const int64_t recordSize = DataSizeCore(nullptr);
  for (int32_t v = 0; v < count && writer->GetError() == kStatusNoError; ++v) {
    const ArrayLayout layout(*GetElt(), nDims);
    Source source;
    if (!SubArraySource(layout, static_cast<const uint8_t*>(data) + recordSize * v, &source)) {
      writer->SetError(kStatusBadArgument);
      break;
    }
    bool overflow = false;
    const int64_t elements = source.Count(&overflow);
    for (int32_t d = 0; d < nDims; ++d) writer->WriteI32(static_cast<int32_t>(source.Size(d)));
    WalkRowMajor(source, [&source](int32_t d) { return source.Size(d); }, elements,
                 [&](int64_t, const uint8_t* element) {
                   layout.elt->WriteData(writer, element, 1, nullptr);
                   return writer->GetError();
                 });
  }
}

void TDSubArrayImp::ReadFlatData(KoDataReader* reader, void*, int32_t) const {
  DebugReport(kDiagnosticModule, __LINE__, 2, "ReadData does not handle subArrays!");
  reader->SetError(kStatusBadArgument);
}
