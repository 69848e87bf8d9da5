// Helpers shared by every test file: capturing diagnostic lines and checking that a test
// leaves no handle or block allocated.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <initializer_list>
#include <utility>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "vellum/Dictionaries.h"

// Collects every DebugMessage emitted while it lives (from any thread), instead of printing
// them; restores the default sink when destroyed.
class DebugCapture {
 public:
  DebugCapture() : state_(std::make_shared<State>()) {
    std::shared_ptr<State> state = state_;
    SetDebugSink([state](const DebugMessage& m) {
      std::lock_guard lock(state->mutex);
      state->messages.push_back(m);
    });
  }
  ~DebugCapture() { SetDebugSink(DebugSink()); }
  DebugCapture(const DebugCapture&) = delete;
  DebugCapture& operator=(const DebugCapture&) = delete;

  std::vector<DebugMessage> Messages() const {
    std::lock_guard lock(state_->mutex);
    return state_->messages;
  }
  std::vector<std::string> Texts() const {
    std::vector<std::string> texts;
    for (const DebugMessage& m : Messages()) texts.push_back(m.text);
    return texts;
  }
  // True when some message's text contains `text`.
  bool Contains(std::string_view text) const {
    const std::vector<std::string> texts = Texts();
    return std::any_of(texts.begin(), texts.end(),
                       [&](const std::string& t) { return t.find(text) != std::string::npos; });
  }
  void Clear() {
    std::lock_guard lock(state_->mutex);
    state_->messages.clear();
  }

 private:
  struct State {
    std::mutex mutex;  // guards messages
    std::vector<DebugMessage> messages;
  };
  std::shared_ptr<State> state_;
};

// Records the live block count when built and expects the same count when destroyed.
class LiveBlockCheck {
 public:
  LiveBlockCheck() : before_(DSLiveBlockCount()) {}
  ~LiveBlockCheck() { EXPECT_EQ(DSLiveBlockCount(), before_) << "handles or blocks leaked"; }
  LiveBlockCheck(const LiveBlockCheck&) = delete;
  LiveBlockCheck& operator=(const LiveBlockCheck&) = delete;

 private:
  int64_t before_;
};

// Text literals as the byte strings the library's C-string and Pascal-string calls take.
inline const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

// The number of objects the registered dictionary `name` ("TD", "Name", ...) holds; 0 when no
// such dictionary is registered (the service is stopped).
inline uint32_t DictionarySize(std::string_view name) {
  for (int32_t i = 0; i < GetNumDictionaries(); ++i) {
    if (GetTDDictionaries()[i]->Name() == name) return GetTDDictionaries()[i]->Size();
  }
  return 0;
}

// Fails the 1st, 2nd, ... allocation of `operation` until it succeeds: the one sweep every test
// of running out of memory uses. Each failed run must return one of `failures` and leave no
// block behind; `afterFailure` (optional) then checks that the caller's data is intact. The run
// that succeeds must return 0. `operation` makes what it changes afresh each run, or changes
// only what a failure leaves as it was.
template <class Operation, class AfterFailure>
void SweepAllocationFailures(std::initializer_list<int32_t> failures, Operation&& operation,
                             AfterFailure&& afterFailure) {
  for (int64_t nth = 1;; ++nth) {
    SCOPED_TRACE(nth);
    ASSERT_LT(nth, 1000) << "never succeeded";
    LiveBlockCheck blocks;
    int32_t status = 0;
    bool fired = false;
    {
      ScopedAllocationFailure failure(nth);
      status = operation();
      fired = failure.Fired();
    }
    if (!fired) {
      EXPECT_EQ(status, 0);
      EXPECT_GT(nth, 1) << "the operation allocated nothing that could fail";
      return;
    }
    EXPECT_NE(std::find(failures.begin(), failures.end(), status), failures.end()) << "status " << status;
    afterFailure();
  }
}

template <class Operation>
void SweepAllocationFailures(int32_t expected, Operation&& operation) {
  SweepAllocationFailures({expected}, std::forward<Operation>(operation), [] {});
}
