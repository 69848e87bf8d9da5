// Ordering of typed data: the registered comparisons first, then the kind's own order (aggregates
// come back here for each element), and the process-wide table of comparisons for type codes.
#include "source/operations/TDUtilityCompare.h"

#include <array>
#include <atomic>
#include <deque>
#include <mutex>
#include <new>

#include "runtime/DebugStream.h"
#include "runtime/PXTypes.h"

VELLUM_DIAGNOSTIC_MODULE("TDUtilityCompare");

namespace {

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

// Writes what the kind's order had to say, in this module's words.
void Report(DataOrderNote note, int32_t code) {
  switch (note) {
    case DataOrderNote::None:
      return;
    case DataOrderNote::NoOrder:
      (VELLUM_DEBUG(3) << "CompareData: tc=" << code << "?").Process();
      return;
    case DataOrderNote::SubtypeRecords:
      DebugReport(kDiagnosticModule, __LINE__, 3, "CompareData for subtypes should be implemented correctly.");
      return;
    case DataOrderNote::UnsupportedRefnumSize:
      DebugReport(kDiagnosticModule, __LINE__, 3, "Unsupported refnum size in CompareDataTDR.");
      return;
  }
}

int32_t CompareImp(const TDImp& type, const void* a, const void* b, const DataOrderOptions& options) {
  if (a == nullptr || b == nullptr) return 0;
  // Enumeration and units variants order like their plain numbers.
  const int32_t code = StripTypeCodeModifier(type.GetTypeCode());
  if (const CompareEntry* entry = TheCompareTable().Find(code)) {
    const TDR handle = MakeTDRFromTDImp(&type);
    if (entry->applies == nullptr || entry->applies(handle)) {
      return entry->compare(handle, options.nullFirst, a, b, options.variantOption, options.bytewise,
                            options.rawNumbers);
    }
  }
  const DataOrder order = type.OrderData(a, b, options);
  Report(order.note, code);
  return order.order;
}

}  // namespace

int32_t CompareDataTDRCore(const TDR& type, bool nullFirst, const void* a, const void* b, int32_t variantOption,
                           int32_t bytewise, int32_t rawNumbers) {
  const TDImp* imp = type.GetImp();
  if (imp == nullptr) return 0;
  const DataOrderOptions options{nullFirst, variantOption, bytewise, rawNumbers, &CompareImp};
  return CompareImp(*imp, a, b, options);
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
