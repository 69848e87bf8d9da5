// Speed of flattened data beside hand-written floors measured in the same run: a million Float64
// written and read big-endian against a plain byte-swapping copy, an array of 100,000 clusters
// {Int32, Float64, String} against a hand-written big-endian writer and reader of the same
// records, and the size of that array without writing. Buffers and destinations are made once
// and reused, so that what is measured is the work, not fresh pages from the kernel.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXApp.h"
#include "runtime/PXStrings.h"
#include "vellum/DataStreams.h"
#include "vellum.h"

namespace {

constexpr int32_t kDoubles = 1000000;
constexpr int32_t kRecords = 100000;

// The library runs for the whole program.
void EnsureSession() { static vellum::Session session; }

uint64_t Swap64(uint64_t v) { return __builtin_bswap64(v); }
uint32_t Swap32(uint32_t v) { return __builtin_bswap32(v); }

// --- 1,000,000 Float64 -----------------------------------------------------------------------------

struct DoubleArray {
  TDR type;
  UHandle from = nullptr;
  UHandle into = nullptr;
  OutputBuf out;

  DoubleArray() {
    EnsureSession();
    type = GetDbl1DTD();
    if (VectorSetSize(GetfD(), &from, kDoubles) != 0) std::abort();
    auto* first = static_cast<uint8_t*>(vellum::As<TDRArray>(type).GetFirstElementPtr(from));
    for (int32_t i = 0; i < kDoubles; ++i) {
      const double value = i * 0.25;
      std::memcpy(first + 8 * static_cast<size_t>(i), &value, 8);
    }
  }
  ~DoubleArray() {
    DSDisposeHandle(from);
    DSDisposeHandle(into);
  }
};

void BM_DoubleArrayWriteRead(benchmark::State& state) {
  static DoubleArray data;
  for (auto _ : state) {
    data.out.Rewind();
    KoDataWriter writer(&data.out, PXApp::Instance().GetVersion(), nullptr, 0);
    writer.WriteData(data.type, &data.from, 1);
    InputBuf in(data.out.Data(), data.out.GetBytesWritten());
    KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
    if (reader.ReadData(data.type, &data.into, 1) != 0) state.SkipWithError("read failed");
    benchmark::DoNotOptimize(*data.into);
  }
  state.SetBytesProcessed(state.iterations() * int64_t{8} * kDoubles);
}

void BM_DoubleArraySwapFloor(benchmark::State& state) {
  std::vector<uint64_t> from(kDoubles);
  for (int32_t i = 0; i < kDoubles; ++i) from[static_cast<size_t>(i)] = static_cast<uint64_t>(i) * 0x9E3779B97F4A7C15ull;
  std::vector<uint8_t> stream(8 * static_cast<size_t>(kDoubles) + 4);
  std::vector<uint64_t> into(kDoubles);
  for (auto _ : state) {
    const uint32_t count = Swap32(kDoubles);
    std::memcpy(stream.data(), &count, 4);
    for (int32_t i = 0; i < kDoubles; ++i) {
      const uint64_t v = Swap64(from[static_cast<size_t>(i)]);
      std::memcpy(stream.data() + 4 + 8 * static_cast<size_t>(i), &v, 8);
    }
    benchmark::ClobberMemory();
    for (int32_t i = 0; i < kDoubles; ++i) {
      uint64_t v;
      std::memcpy(&v, stream.data() + 4 + 8 * static_cast<size_t>(i), 8);
      into[static_cast<size_t>(i)] = Swap64(v);
    }
    benchmark::DoNotOptimize(into.data());
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(state.iterations() * int64_t{8} * kDoubles);
}

// --- 100,000 clusters {Int32, Float64, String} ------------------------------------------------------

struct Record {
  int32_t code;
  double value;
  std::string text;
};

std::string TextOf(int32_t i) { return std::string(static_cast<size_t>(8 + i % 17), static_cast<char>('a' + i % 26)); }

struct RecordArray {
  TDR type;
  TDR element;
  UHandle from = nullptr;
  UHandle into = nullptr;
  OutputBuf out;

  RecordArray() {
    EnsureSession();
    element = InterpretedStringToType("{iL,fD,S}");
    type = TDRArray(1, element);
    const TDRCluster cluster = vellum::As<TDRCluster>(element);
    TDRArray array = vellum::As<TDRArray>(type);
    if (array.SetArraySize(&from, kRecords, &kRecords) != 0) std::abort();
    auto* first = static_cast<uint8_t*>(array.GetFirstElementPtr(from));
    const int32_t size = element.DataSize();
    for (int32_t i = 0; i < kRecords; ++i) {
      uint8_t* at = first + static_cast<size_t>(size) * static_cast<size_t>(i);
      const double value = i * 1.5;
      std::memcpy(at + cluster.GetEltOffset(0), &i, 4);
      std::memcpy(at + cluster.GetEltOffset(1), &value, 8);
      LStrHandle text = nullptr;
      StringUtils::ToLStr(TextOf(i), &text);
      std::memcpy(at + cluster.GetEltOffset(2), &text, sizeof text);
    }
  }
  ~RecordArray() {
    type.DeflateData(&from, reinterpret_cast<uint8_t*>(&from) + sizeof from, 1, NormalHandleAllocator());
    type.DeflateData(&into, reinterpret_cast<uint8_t*>(&into) + sizeof into, 1, NormalHandleAllocator());
  }
};

RecordArray& Records() {
  static RecordArray data;
  return data;
}

void BM_RecordArrayWriteRead(benchmark::State& state) {
  RecordArray& data = Records();
  for (auto _ : state) {
    data.out.Rewind();
    KoDataWriter writer(&data.out, PXApp::Instance().GetVersion(), nullptr, 0);
    writer.WriteData(data.type, &data.from, 1);
    InputBuf in(data.out.Data(), data.out.GetBytesWritten());
    KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
    if (reader.ReadData(data.type, &data.into, 1) != 0) state.SkipWithError("read failed");
    benchmark::DoNotOptimize(*data.into);
  }
  state.SetItemsProcessed(state.iterations() * kRecords);
}

// The same bytes by hand: big-endian fields, the text as a 32-bit length and its bytes.
void BM_RecordArrayHandFloor(benchmark::State& state) {
  std::vector<Record> from(kRecords);
  for (int32_t i = 0; i < kRecords; ++i) from[static_cast<size_t>(i)] = {i, i * 1.5, TextOf(i)};
  std::vector<Record> into(kRecords);
  size_t total = 4;
  for (const Record& r : from) total += 16 + r.text.size();
  std::vector<uint8_t> stream(total);
  for (auto _ : state) {
    size_t put = 0;
    auto put32 = [&stream, &put](uint32_t v) {
      v = Swap32(v);
      std::memcpy(stream.data() + put, &v, 4);
      put += 4;
    };
    put32(kRecords);
    for (const Record& r : from) {
      put32(static_cast<uint32_t>(r.code));
      uint64_t bits;
      std::memcpy(&bits, &r.value, 8);
      bits = Swap64(bits);
      std::memcpy(stream.data() + put, &bits, 8);
      put += 8;
      put32(static_cast<uint32_t>(r.text.size()));
      std::memcpy(stream.data() + put, r.text.data(), r.text.size());
      put += r.text.size();
    }
    benchmark::ClobberMemory();
    size_t at = 4;
    auto get32 = [&stream, &at]() {
      uint32_t v;
      std::memcpy(&v, stream.data() + at, 4);
      at += 4;
      return Swap32(v);
    };
    for (Record& r : into) {
      r.code = static_cast<int32_t>(get32());
      uint64_t bits;
      std::memcpy(&bits, stream.data() + at, 8);
      at += 8;
      bits = Swap64(bits);
      std::memcpy(&r.value, &bits, 8);
      const uint32_t length = get32();
      r.text.assign(reinterpret_cast<const char*>(stream.data() + at), length);
      at += length;
    }
    benchmark::DoNotOptimize(into.data());
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * kRecords);
}

void BM_RecordArrayWriteOnly(benchmark::State& state) {
  RecordArray& data = Records();
  for (auto _ : state) {
    data.out.Rewind();
    KoDataWriter writer(&data.out, PXApp::Instance().GetVersion(), nullptr, 0);
    writer.WriteData(data.type, &data.from, 1);
    benchmark::DoNotOptimize(data.out.Data());
  }
  state.SetItemsProcessed(state.iterations() * kRecords);
}

void BM_RecordArrayFlatDataSize(benchmark::State& state) {
  RecordArray& data = Records();
  PreflightOutputBuf counter;
  KoDataWriter sizer(&counter, PXApp::Instance().GetVersion(), nullptr, kKoDataWriterDeterminingSizeWithoutData);
  for (auto _ : state) benchmark::DoNotOptimize(data.type.FlatDataSize(&sizer, &data.from));
  state.SetItemsProcessed(state.iterations() * kRecords);
}

}  // namespace

BENCHMARK(BM_DoubleArrayWriteRead)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_DoubleArraySwapFloor)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_RecordArrayWriteRead)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_RecordArrayHandFloor)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_RecordArrayWriteOnly)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_RecordArrayFlatDataSize)->Unit(benchmark::kMicrosecond);
