// The frame of a fuzz target that needs the library: quiet diagnostics, the library started for
// each input and stopped after it, and nothing left allocated once it has stopped.
#pragma once

#include <cstdint>
#include <cstdlib>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "vellum/Host.h"

namespace vellum::fuzz {

// Runs `check` with the library running, then aborts when a handle or block outlives the stop.
// The first call starts and stops the library once before anything is counted, so that what
// lives as long as the process (the dictionaries' tables) exists before the count is taken.
template <class Check>
void WithFreshLibrary(Check&& check) {
  static const bool ready = [] {
    SetDebugSink([](const DebugMessage&) {});
    const Session session;
    if (session.Status() != 0) std::abort();
    return true;
  }();
  (void)ready;
  const int64_t liveBefore = DSLiveBlockCount();
  {
    const Session session;
    if (session.Status() != 0) std::abort();
    check();
  }
  if (DSLiveBlockCount() != liveBefore) std::abort();
}

}  // namespace vellum::fuzz
