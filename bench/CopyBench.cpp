// Speed of typed copies beside their floors: a cluster {Int32, Float64, String} copied 100,000
// times against a hand-written struct with a heap string, and a 1,000,000-element Float64 array
// against memcpy of the same bytes. Destinations are made once and reused, so that what is
// measured is the copy, not fresh pages from the kernel.
#include <benchmark/benchmark.h>

#include <cstring>
#include <string>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

namespace {

constexpr int kClusterCopies = 100000;
constexpr int32_t kArrayElements = 1000000;
// Longer than any in-place small-string buffer, so the baseline's text lives on the heap too.
const char kText[] = "a source string of some forty bytes....";

// The library runs for the whole program.
void EnsureSession() { static vellum::Session session; }

const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

// --- cluster {Int32, Float64, String} --------------------------------------------------------------

struct Record {
  int32_t code;
  double value;
  std::string text;
};

void BM_ClusterCopy(benchmark::State& state) {
  EnsureSession();
  TDWCluster writable;
  writable << TDWInt32(U("code")) << TDWFloat64(U("value")) << TDWString(U("text"));
  const TDRCluster type = writable.CheckIn();
  const auto size = static_cast<size_t>(type.DataSize());
  std::vector<uint64_t> from((size + 7) / 8, 0);
  std::vector<uint64_t> into((size + 7) / 8, 0);
  if (type.InflateDefData(from.data(), 0, 1, 0) != 0 || type.InflateDefData(into.data(), 0, 1, 0) != 0)
    state.SkipWithError("no default data");
  const int32_t code = 7;
  const double value = 2.5;
  std::memcpy(type.GetEltPtr(0, static_cast<void*>(from.data())), &code, sizeof code);
  std::memcpy(type.GetEltPtr(1, static_cast<void*>(from.data())), &value, sizeof value);
  LStrHandle text = nullptr;
  if (StringUtils::ToLStr(kText, &text) != 0) state.SkipWithError("no string");
  std::memcpy(type.GetEltPtr(2, static_cast<void*>(from.data())), &text, sizeof text);
  if (type.CopyData(from.data(), into.data(), nullptr, 0) != 0) state.SkipWithError("copy failed");

  for (auto _ : state) {
    for (int i = 0; i < kClusterCopies; ++i) {
      benchmark::DoNotOptimize(type.CopyData(from.data(), into.data(), nullptr, 0));
      benchmark::DoNotOptimize(into.data());
      benchmark::ClobberMemory();
    }
  }
  state.SetItemsProcessed(state.iterations() * kClusterCopies);
  type.DeflateData(from.data(), reinterpret_cast<uint8_t*>(from.data()) + size, 1, NormalHandleAllocator());
  type.DeflateData(into.data(), reinterpret_cast<uint8_t*>(into.data()) + size, 1, NormalHandleAllocator());
}

void BM_ClusterCopyFloor(benchmark::State& state) {
  // Not const: the length of the text is read at run time, as the typed copy reads it.
  Record from{7, 2.5, kText};
  Record into{};
  into = from;
  for (auto _ : state) {
    for (int i = 0; i < kClusterCopies; ++i) {
      benchmark::DoNotOptimize(&from);
      into = from;
      benchmark::DoNotOptimize(&into);
      benchmark::ClobberMemory();
    }
  }
  state.SetItemsProcessed(state.iterations() * kClusterCopies);
}

// --- 1,000,000 Float64 -----------------------------------------------------------------------------

void BM_ArrayCopy(benchmark::State& state) {
  EnsureSession();
  const TDR& type = GetDbl1DTD();
  UHandle from = nullptr;
  UHandle into = nullptr;
  if (VectorSetSize(GetfD(), &from, kArrayElements) != 0) state.SkipWithError("no array");
  auto* first = static_cast<uint8_t*>(vellum::As<TDRArray>(type).GetFirstElementPtr(from));
  for (int32_t i = 0; i < kArrayElements; ++i) {
    const double value = i * 0.5;
    std::memcpy(first + sizeof(double) * static_cast<size_t>(i), &value, sizeof value);
  }
  if (type.CopyData(&from, &into, nullptr, 0) != 0) state.SkipWithError("copy failed");

  for (auto _ : state) {
    benchmark::DoNotOptimize(type.CopyData(&from, &into, nullptr, 0));
    benchmark::DoNotOptimize(*into);
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(DSGetHandleSize(from)));
  DSDisposeHandle(from);
  DSDisposeHandle(into);
}

void BM_ArrayCopyFloor(benchmark::State& state) {
  const size_t bytes = 4 + 8 * static_cast<size_t>(kArrayElements);
  std::vector<uint8_t> from(bytes, 1);
  std::vector<uint8_t> into(bytes, 0);
  for (auto _ : state) {
    std::memcpy(into.data(), from.data(), bytes);
    benchmark::DoNotOptimize(into.data());
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(bytes));
}

}  // namespace

BENCHMARK(BM_ClusterCopy)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_ClusterCopyFloor)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_ArrayCopy)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_ArrayCopyFloor)->Unit(benchmark::kMicrosecond);
