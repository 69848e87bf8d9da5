// The large opt-in oracle run: millions of random cases per operation against exact rational
// arithmetic. Usage: fxp_oracle [cases per operation, default 1000000] [seed] [name filter]
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "FxpOracle.h"

int main(int argc, char** argv) {
  const uint64_t cases = argc > 1 ? std::strtoull(argv[1], nullptr, 0) : 1000000;
  const uint64_t seed = argc > 2 ? std::strtoull(argv[2], nullptr, 0)
                                 : static_cast<uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
  const char* filter = argc > 3 ? argv[3] : "";
  std::printf("fxp_oracle: %llu cases per operation, seed %llu\n", static_cast<unsigned long long>(cases),
              static_cast<unsigned long long>(seed));
  uint64_t total = 0;
  uint64_t failed = 0;
  uint64_t index = 0;
  for (const vellum::fxporacle::NamedRun& run : vellum::fxporacle::AllRuns()) {
    const uint64_t runSeed = seed + index++;
    if (std::strstr(run.name, filter) == nullptr) continue;
    const auto start = std::chrono::steady_clock::now();
    const vellum::fxporacle::Report r = run.run(runSeed, cases);
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    std::printf("%-40s %10llu cases %6llu mismatches %8.1f s\n", run.name, static_cast<unsigned long long>(r.cases),
                static_cast<unsigned long long>(r.mismatches), seconds);
    if (r.mismatches != 0) std::printf("  first (seed %llu): %s\n", static_cast<unsigned long long>(runSeed), r.firstMismatch.c_str());
    std::fflush(stdout);
    total += r.cases;
    failed += r.mismatches;
  }
  std::printf("%llu passed, %llu failed\n", static_cast<unsigned long long>(total - failed),
              static_cast<unsigned long long>(failed));
  return failed == 0 ? 0 : 1;
}
