// Speed of fixed-point conversion, add, mul and compare, each beside its floor: the same work done
// on plain __int128 words with shifts (align, round, fit to 64 bits, saturate) without formats.
// Operands are made once and reused; a counter shows that no arithmetic call allocates.
#include <benchmark/benchmark.h>

#include <atomic>
#include <cstdlib>
#include <new>
#include <random>
#include <vector>

#include "FixedPoint/fxp.h"

namespace {

// Every allocation of the program, to show that the measured loops make none.
std::atomic<uint64_t> gAllocations{0};

}  // namespace

// The replacements pair malloc with free, which the compiler cannot see through.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wmismatched-new-delete"
void* operator new(std::size_t size) {
  gAllocations.fetch_add(1, std::memory_order_relaxed);
  if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
  throw std::bad_alloc();
}
void operator delete(void* p) noexcept { std::free(p); }
void operator delete(void* p, std::size_t) noexcept { std::free(p); }
#pragma GCC diagnostic pop

namespace {

using vellum::FXP;
using vellum::FXPInt128;
using vellum::FXPUInt128;

constexpr size_t kOperands = 4096;  // a power of two; the loops wrap around it

struct Operand {
  FXP value;
  FXP other;
  // The destination of a conversion: a format near the value's, so that a few bits are dropped.
  int wl;
  int iwl;
  bool isSigned;
  // The same numbers as plain words for the floors.
  FXPInt128 word;
  FXPInt128 otherWord;
  int lsb;
  int otherLsb;
};

const std::vector<Operand>& Operands() {
  static const std::vector<Operand> operands = [] {
    std::mt19937_64 rng(20240611);
    std::vector<Operand> v;
    v.reserve(kOperands);
    const auto value = [&](int wl, int iwl, bool isSigned) {
      return FXP(vellum::fxpstorage::CutToWordLength(rng(), wl, isSigned), wl, iwl, isSigned);
    };
    for (size_t i = 0; i < kOperands; ++i) {
      const int wl = 8 + static_cast<int>(rng() % 57);
      const int iwl = static_cast<int>(rng() % 40) - 10;
      const bool isSigned = (rng() & 1) != 0;
      const FXP a = value(wl, iwl, isSigned);
      const FXP b = value(8 + static_cast<int>(rng() % 57), iwl + static_cast<int>(rng() % 9) - 4, (rng() & 1) != 0);
      const int dwl = std::max(1, wl - 1 - static_cast<int>(rng() % 8));
      const int diwl = iwl - 2 + static_cast<int>(rng() % 4);
      const auto word = [](const FXP& x) {
        return x.isSigned() ? FXPInt128{static_cast<int64_t>(x.bits())} : FXPInt128{x.bits()};
      };
      v.push_back({a, b, dwl, diwl, (rng() & 1) != 0, word(a), word(b), a.minBitPos(), b.minBitPos()});
    }
    return v;
  }();
  return operands;
}

// ----- Floors: the same arithmetic on plain words -----

int BitLength(FXPUInt128 x) {
  const uint64_t high = static_cast<uint64_t>(x >> 64);
  return high != 0 ? 128 - __builtin_clzll(high) : (static_cast<uint64_t>(x) != 0 ? 64 - __builtin_clzll(static_cast<uint64_t>(x)) : 0);
}

FXPInt128 Shl(FXPInt128 v, int n) { return static_cast<FXPInt128>(static_cast<FXPUInt128>(v) << n); }

// round(v / 2^s) by mode for 0 < s < 127, as the conversion needs.
FXPInt128 RoundShift(FXPInt128 v, int s, int mode) {
  if (s <= 0) return Shl(v, -s);
  const FXPInt128 q = v >> s;
  const FXPUInt128 rem = static_cast<FXPUInt128>(v) & ((FXPUInt128{1} << s) - 1);
  const FXPUInt128 half = FXPUInt128{1} << (s - 1);
  switch (mode) {
    case FXP::kRoundTowardPosInf: return q + (rem != 0);
    case FXP::kRoundHalfUp: return q + (rem >= half);
    case FXP::kConvergent: return q + (rem > half || (rem == half && (q & 1)));
    case FXP::kRoundTowardZero: return q + (v < 0 && rem != 0);
    default: return q;
  }
}

// Quantize to the destination step, then saturate to its range.
uint64_t ConvertFloor(const Operand& o, int mode) {
  const int shift = (o.iwl - o.wl) - o.lsb;
  const FXPInt128 m = RoundShift(o.word, shift, mode);
  const FXPInt128 hi = o.isSigned ? (FXPInt128{1} << (o.wl - 1)) - 1 : (FXPInt128{1} << o.wl) - 1;
  const FXPInt128 lo = o.isSigned ? -(FXPInt128{1} << (o.wl - 1)) : 0;
  return static_cast<uint64_t>(m < lo ? lo : (m > hi ? hi : m));
}

// An exact wide result fitted into 64 significant bits, nearest-even, trailing zeros removed.
struct Fitted {
  uint64_t bits;
  int lsb;
};
Fitted FitFloor(FXPInt128 v, int p) {
  if (v == 0) return {0, 0};
  const int significant = BitLength(static_cast<FXPUInt128>(v < 0 ? ~v : v)) + (v < 0);
  const int drop = significant > 64 ? significant - 64 : 0;
  if (drop > 0) {
    v = RoundShift(v, drop, FXP::kConvergent);
    p += drop;
  }
  const int trailing = __builtin_ctzll(static_cast<uint64_t>(v) | (uint64_t{1} << 63));
  return {static_cast<uint64_t>(v >> trailing), p + trailing};
}

Fitted AddFloor(const Operand& o) {
  const int w = std::min(o.lsb, o.otherLsb);
  return FitFloor(Shl(o.word, o.lsb - w) + Shl(o.otherWord, o.otherLsb - w), w);
}

Fitted MulFloor(const Operand& o) {
  FXPUInt128 product = static_cast<FXPUInt128>(o.word) * static_cast<FXPUInt128>(o.otherWord);
  int p = o.lsb + o.otherLsb;
  if (o.word >= 0 && o.otherWord >= 0 && (product >> 127) != 0) {
    product = (product >> 1) | (product & 1);
    ++p;
  }
  return FitFloor(static_cast<FXPInt128>(product), p);
}

int CompareFloor(const Operand& o) {
  const int w = std::min(o.lsb, o.otherLsb);
  const FXPInt128 a = Shl(o.word, o.lsb - w);
  const FXPInt128 b = Shl(o.otherWord, o.otherLsb - w);
  return (a > b) - (a < b);
}

// ----- Benchmarks -----

template <typename Body>
void Loop(benchmark::State& state, Body body) {
  const std::vector<Operand>& ops = Operands();
  size_t i = 0;
  const uint64_t before = gAllocations.load();
  for (auto _ : state) {
    body(ops[i]);
    i = (i + 1) & (kOperands - 1);
  }
  state.counters["allocations"] = static_cast<double>(gAllocations.load() - before);
}

void BM_Convert(benchmark::State& state) {
  const auto mode = static_cast<FXP::QuantizationMode>(state.range(0));
  Loop(state, [mode](const Operand& o) {
    FXP r(o.value, o.wl, o.iwl, o.isSigned, FXP::kSaturate, mode);
    benchmark::DoNotOptimize(r);
  });
}

void BM_ConvertFloor(benchmark::State& state) {
  const int mode = static_cast<int>(state.range(0));
  Loop(state, [mode](const Operand& o) {
    uint64_t r = ConvertFloor(o, mode);
    benchmark::DoNotOptimize(r);
  });
}

void BM_Add(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    FXP r = o.value.add(o.other, FXP::kConvergent);
    benchmark::DoNotOptimize(r);
  });
}

void BM_AddFloor(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    Fitted r = AddFloor(o);
    benchmark::DoNotOptimize(r);
  });
}

void BM_Mul(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    FXP r = o.value.mul(o.other, FXP::kConvergent);
    benchmark::DoNotOptimize(r);
  });
}

void BM_MulFloor(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    Fitted r = MulFloor(o);
    benchmark::DoNotOptimize(r);
  });
}

void BM_Compare(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    int r = FXP::compare(o.value, o.other);
    benchmark::DoNotOptimize(r);
  });
}

void BM_CompareFloor(benchmark::State& state) {
  Loop(state, [](const Operand& o) {
    int r = CompareFloor(o);
    benchmark::DoNotOptimize(r);
  });
}

// Quantization modes: ShouldntQuantize, Truncate, RoundHalfUp, Convergent, RoundTowardZero,
// RoundTowardNegInf, RoundTowardPosInf.
BENCHMARK(BM_Convert)->DenseRange(0, 6);
BENCHMARK(BM_ConvertFloor)->DenseRange(0, 6);
BENCHMARK(BM_Add);
BENCHMARK(BM_AddFloor);
BENCHMARK(BM_Mul);
BENCHMARK(BM_MulFloor);
BENCHMARK(BM_Compare);
BENCHMARK(BM_CompareFloor);

}  // namespace
