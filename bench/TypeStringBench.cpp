// Speed of saving and loading a type list of 1,000 distinct record descriptors (named clusters of
// arrays of numerics and strings), beside building the same descriptors through the handles.
// Every figure is time per record; loading interns descriptors that already exist, as a host does.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "runtime/DSMemory.h"
#include "vellum.h"

namespace {

constexpr int kRecords = 1000;

// The library runs for the whole program.
void EnsureSession() { static vellum::Session session; }

const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

// A numeric element kind of record `i`'s array, so that records differ in more than their names.
TDW SampleElement(int i) {
  switch (i % 5) {
    case 0: return TDWFloat64();
    case 1: return TDWInt32();
    case 2: return TDWInt16();
    case 3: return TDWUInt8();
    default: return TDWFloat32();
  }
}

// Record `i`: {"id": Int32, "samples<i%7>": array of 1-3 dims of a numeric, "label": String
// bounded to i%40 (unbounded at 0), and, for every third record, "history": array of
// {"t": Float64, "note": String}}, the cluster named "record<i>".
TDR BuildRecord(int i) {
  char name[32];
  std::snprintf(name, sizeof name, "record%04d", i);
  char samples[16];
  std::snprintf(samples, sizeof samples, "samples%d", i % 7);
  TDWCluster record(U(name));
  record << TDWInt32(U("id")) << TDWArray(1 + i % 3, SampleElement(i), U(samples))
         << TDWString(U("label"), i % 40 == 0 ? -1 : i % 40);
  if (i % 3 == 0) {
    TDWCluster entry;
    entry << TDWFloat64(U("t")) << TDWString(U("note"), -1);
    record << TDWArray(1, entry, U("history"));
  }
  return record.CheckIn();
}

// The list every benchmark works on, built once and kept alive, so that its descriptors stay
// interned whichever benchmark runs first.
const TMTypeList& Records() {
  static const TMTypeList list = [] {
    TMTypeList built;
    for (int i = 0; i < kRecords; ++i)
      if (built.AppendType(BuildRecord(i), nullptr) != 0) std::abort();
    return built;
  }();
  return list;
}

// Time per record, shown beside the time per iteration.
void ReportPerRecord(benchmark::State& state) {
  state.counters["per_record"] =
      benchmark::Counter(kRecords, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
  state.SetItemsProcessed(state.iterations() * kRecords);
}

bool AllDistinct(const TMTypeList& list) {
  if (list.GetNumTypes() != kRecords) return false;
  for (int i = 1; i < kRecords; ++i) {
    if (!list.GetType(static_cast<uint32_t>(i)) ||
        list.GetType(static_cast<uint32_t>(i)) == list.GetType(static_cast<uint32_t>(i - 1)))
      return false;
  }
  return true;
}

void BM_SaveTypeList(benchmark::State& state) {
  EnsureSession();
  const TMTypeList& list = Records();
  if (!AllDistinct(list)) state.SkipWithError("the records did not build");
  for (auto _ : state) {
    UHandle flat = nullptr;
    if (FlattenListOfTypes(nullptr, &list, nullptr, &flat, 0, nullptr, 0) != 0) state.SkipWithError("save failed");
    benchmark::DoNotOptimize(flat);
    DSDisposeHandle(flat);
  }
  ReportPerRecord(state);
}

void BM_LoadTypeList(benchmark::State& state) {
  EnsureSession();
  const TMTypeList& list = Records();
  UHandle flat = nullptr;
  if (FlattenListOfTypes(nullptr, &list, nullptr, &flat, 0, nullptr, 0) != 0) state.SkipWithError("save failed");
  const auto size = static_cast<uint32_t>(DSGetHandleSize(flat));
  {
    TMTypeList check;
    if (UnFlattenListOfTypes(nullptr, *flat, size, &check, nullptr, 0, nullptr) != 0 ||
        check.GetNumTypes() != kRecords || check.GetType(kRecords - 1) != list.GetType(kRecords - 1))
      state.SkipWithError("the loaded list differs");
  }
  for (auto _ : state) {
    TMTypeList loaded;
    if (UnFlattenListOfTypes(nullptr, *flat, size, &loaded, nullptr, 0, nullptr) != 0)
      state.SkipWithError("load failed");
    benchmark::DoNotOptimize(loaded.GetType(0).GetImp());
  }
  ReportPerRecord(state);
  state.counters["bytes_per_record"] = static_cast<double>(size) / kRecords;
  DSDisposeHandle(flat);
}

void BM_BuildRecords(benchmark::State& state) {
  EnsureSession();
  const TMTypeList& list = Records();
  for (auto _ : state) {
    for (int i = 0; i < kRecords; ++i) {
      const TDR record = BuildRecord(i);
      benchmark::DoNotOptimize(record.GetImp());
    }
  }
  if (BuildRecord(kRecords - 1) != list.GetType(kRecords - 1)) state.SkipWithError("a rebuilt record differs");
  ReportPerRecord(state);
}

}  // namespace

BENCHMARK(BM_SaveTypeList)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_LoadTypeList)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_BuildRecords)->Unit(benchmark::kMicrosecond);
