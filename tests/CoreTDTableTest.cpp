// The interning dictionaries, their registry, the recursive-types table and garbage collection
// with its log line, including check-in and collection from many threads at once.
#include "vellum/Dictionaries.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/PXConfig.h"
#include "vellum/TDAttributeHandles.h"
#include "vellum.h"

namespace {

class CoreTDTableTest : public TypeSystemTest {};


constexpr const char* kLoggingKey = "vellum.garbageCollection.logging";

// Sets the logging key for one scope and makes the next collection read it.
class ScopedCollectionLogging {
 public:
  explicit ScopedCollectionLogging(const char* value) {
    CfgSetOverride(kLoggingKey, value);
    ResetCollectionLoggingSetting();
  }
  ~ScopedCollectionLogging() {
    CfgClearOverrides();
    ResetCollectionLoggingSetting();
  }
  ScopedCollectionLogging(const ScopedCollectionLogging&) = delete;
  ScopedCollectionLogging& operator=(const ScopedCollectionLogging&) = delete;
};

struct CollectionLine {
  uint32_t number;
  uint64_t firstTotal;
  std::string passes;  // the removed count of each pass, comma-separated
  uint64_t lastTotal;
  double percent;
  uint64_t removed;
  uint64_t denominator;
};

// Reads a text from left to right; every step fails once one has failed.
class Cursor {
 public:
  explicit Cursor(std::string_view text) : rest_(text) {}

  bool Literal(std::string_view expected) {
    if (rest_.substr(0, expected.size()) != expected) return false;
    rest_.remove_prefix(expected.size());
    return true;
  }
  // One or more characters of `allowed`.
  bool Run(std::string_view allowed, std::string* out) {
    const size_t length = std::min(rest_.find_first_not_of(allowed), rest_.size());
    if (length == 0) return false;
    out->assign(rest_.substr(0, length));
    rest_.remove_prefix(length);
    return true;
  }
  bool Digits(size_t count) {
    std::string digits;
    return Run("0123456789", &digits) && digits.size() == count;
  }
  bool Number(uint64_t* value) {
    std::string digits;
    if (!Run("0123456789", &digits)) return false;
    *value = std::stoull(digits);
    return true;
  }
  // A double as a stream prints it: digits, a point, an exponent.
  bool Real(double* value) {
    std::string text;
    if (!Run("0123456789.e+-", &text)) return false;
    char* end = nullptr;
    *value = std::strtod(text.c_str(), &end);
    return end == text.c_str() + text.size();
  }
  bool AtEnd() const { return rest_.empty(); }

 private:
  std::string_view rest_;
};

// "TypeGC[n] YYYY.MM.DD HH:MM:SS.mmm {Flat:t ms, 0%(0/0)} {Dicts:t ms, T[r,...]T', P%(R/T)}"
std::optional<CollectionLine> ParseCollectionLine(const std::string& text) {
  Cursor c(text);
  CollectionLine line{};
  uint64_t number = 0;
  double milliseconds = 0;
  const bool parsed =
      c.Literal("TypeGC[") && c.Number(&number) && c.Literal("] ") && c.Digits(4) && c.Literal(".") &&
      c.Digits(2) && c.Literal(".") && c.Digits(2) && c.Literal(" ") && c.Digits(2) && c.Literal(":") &&
      c.Digits(2) && c.Literal(":") && c.Digits(2) && c.Literal(".") && c.Digits(3) && c.Literal(" {Flat:") &&
      c.Real(&milliseconds) && c.Literal("ms, 0%(0/0)} {Dicts:") && c.Real(&milliseconds) &&
      c.Literal("ms, ") && c.Number(&line.firstTotal) && c.Literal("[") && c.Run("0123456789,", &line.passes) &&
      c.Literal("]") && c.Number(&line.lastTotal) && c.Literal(", ") && c.Real(&line.percent) &&
      c.Literal("%(") && c.Number(&line.removed) && c.Literal("/") && c.Number(&line.denominator) &&
      c.Literal(")}") && c.AtEnd();
  if (!parsed) return std::nullopt;
  line.number = static_cast<uint32_t>(number);
  return line;
}

// The one collection line among the captured messages.
std::optional<CollectionLine> LoggedCollection(const DebugCapture& capture) {
  std::vector<DebugMessage> lines;
  for (const DebugMessage& m : capture.Messages()) {
    if (m.level == 1) lines.push_back(m);
  }
  EXPECT_EQ(lines.size(), 1u);
  if (lines.size() != 1) return std::nullopt;
  std::optional<CollectionLine> line = ParseCollectionLine(lines[0].text);
  EXPECT_TRUE(line.has_value()) << lines[0].text;
  return line;
}

uint64_t TotalInterned() {
  uint64_t total = 0;
  for (int32_t i = 0; i < GetNumDictionaries(); ++i) total += GetTDDictionaries()[i]->Size();
  return total;
}

class FakeDictionary : public ITDDictionary {
 public:
  explicit FakeDictionary(const char* name) : name_(name) {}
  uint32_t Size() const override { return 0; }
  void Purge() override { ++purges; }
  const char* Name() const override { return name_; }
  void Empty() override { ++empties; }
  int32_t purges = 0;
  int32_t empties = 0;

 private:
  const char* name_;
};

// Reports the sizes of a script, one per call, then keeps the last.
class ScriptedDictionary : public ITDDictionary {
 public:
  explicit ScriptedDictionary(std::vector<uint32_t> sizes) : sizes_(std::move(sizes)) {}
  uint32_t Size() const override { return sizes_[std::min(calls_++, sizes_.size() - 1)]; }
  void Purge() override {}
  const char* Name() const override { return "scripted"; }
  void Empty() override {}

 private:
  std::vector<uint32_t> sizes_;
  mutable size_t calls_ = 0;
};

// Stops the service when it goes out of scope, so that dictionaries of a test (registered
// after it) are unregistered before they are destroyed, whatever the test's outcome.
class StopBeforeLeaving {
 public:
  explicit StopBeforeLeaving(ServiceManager& services) : services_(services) {}
  ~StopBeforeLeaving() { services_.StopAll(); }
  StopBeforeLeaving(const StopBeforeLeaving&) = delete;
  StopBeforeLeaving& operator=(const StopBeforeLeaving&) = delete;

 private:
  ServiceManager& services_;
};

std::vector<std::string> RegisteredNames() {
  std::vector<std::string> names;
  for (int32_t i = 0; i < GetNumDictionaries(); ++i) names.emplace_back(GetTDDictionaries()[i]->Name());
  return names;
}

const std::vector<std::string> kDictionaryNames = {"TD",   "Name",         "Typedef",    "Enum",
                                                   "Unit", "EventRegOMId", "IVISubType", "OMId"};

TEST_F(CoreTDTableTest, RegistryFollowsTheService) {
  EXPECT_EQ(GetNumDictionaries(), 8);
  EXPECT_EQ(RegisteredNames(), kDictionaryNames);
  const uint32_t descriptors = GetTDDictionaries()[0]->Size();
  const TDR fresh = TDRBoolean(U("registry"));
  EXPECT_EQ(GetTDDictionaries()[0]->Size(), descriptors + 1) << "the first entry holds the descriptors";
  EXPECT_TRUE(HasRecursiveTypesTable());

  DebugCapture capture;
  RegisterDictionary(GetTDDictionaries()[0]);
  EXPECT_EQ(GetNumDictionaries(), 8) << "a dictionary is registered once";
  EXPECT_TRUE(capture.Messages().empty());

  services_.StopAll();
  EXPECT_EQ(GetNumDictionaries(), 0);
  EXPECT_FALSE(HasRecursiveTypesTable());
  GarbageCollectDictionaries();  // nothing registered: nothing to do

  ASSERT_EQ(services_.Start(TypeManagerService()), kStatusNoError);
  EXPECT_EQ(RegisteredNames(), kDictionaryNames);
  const TDR again = TDRBoolean(U("after restart"));
  EXPECT_TRUE(again == TDWBoolean(U("after restart")).CheckIn());
}

TEST_F(CoreTDTableTest, EleventhDictionaryIsRefused) {
  FakeDictionary ninth("ninth");
  FakeDictionary tenth("tenth");
  FakeDictionary eleventh("eleventh");
  const StopBeforeLeaving stop(services_);
  RegisterDictionary(&ninth);
  RegisterDictionary(&tenth);
  ASSERT_EQ(GetNumDictionaries(), 10);

  DebugCapture capture;
  RegisterDictionary(&eleventh);
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "Too many dictionaries registered");
  EXPECT_EQ(capture.Messages()[0].level, 4);
  EXPECT_EQ(GetNumDictionaries(), 10);
  EXPECT_EQ(GetTDDictionaries()[8], &ninth);
  EXPECT_EQ(GetTDDictionaries()[9], &tenth);

  GarbageCollectDictionaries();
  EXPECT_EQ(ninth.purges, 1);
  EXPECT_EQ(tenth.purges, 1);
  EXPECT_EQ(eleventh.purges, 0);

  services_.StopAll();
  EXPECT_EQ(ninth.empties, 1);
  EXPECT_EQ(tenth.empties, 1);
  EXPECT_EQ(eleventh.empties, 0);
  EXPECT_EQ(GetNumDictionaries(), 0);
}

TEST_F(CoreTDTableTest, CollectionRemovesAReleasedDescriptorAndItsName) {
  ScopedCollectionLogging logging("1");
  const TDR kept = TDRBoolean(U("kept"));
  TDR released = TDRBoolean(U("collected"));
  const uint32_t descriptors = DictionarySize("TD");
  const uint32_t names = DictionarySize("Name");
  const uint64_t total = TotalInterned();
  released = TDR();

  DebugCapture capture;
  GarbageCollectDictionaries();
  EXPECT_EQ(DictionarySize("TD"), descriptors - 1);
  EXPECT_EQ(DictionarySize("Name"), names - 1);
  EXPECT_TRUE(kept == TDRBoolean(U("kept")));

  const std::optional<CollectionLine> line = LoggedCollection(capture);
  ASSERT_TRUE(line.has_value());
  EXPECT_EQ(line->firstTotal, total);
  EXPECT_EQ(line->passes, "2,0") << "the name goes in the same pass: its dictionary comes later";
  EXPECT_EQ(line->lastTotal, total - 2);
  EXPECT_EQ(line->removed, 2u);
  EXPECT_EQ(line->denominator, total);
  EXPECT_NEAR(line->percent, 200.0 / static_cast<double>(total), 0.01 * 200.0 / static_cast<double>(total));
}

TEST_F(CoreTDTableTest, CollectionWithNothingToRemoveLogsOnePass) {
  ScopedCollectionLogging logging("true");
  DebugCapture capture;
  const TDR kept = TDRBoolean(U("kept"));
  GarbageCollectDictionaries();
  const uint64_t total = TotalInterned();

  capture.Clear();
  GarbageCollectDictionaries();
  GarbageCollectDictionaries();
  std::vector<CollectionLine> lines;
  for (const DebugMessage& m : capture.Messages()) {
    EXPECT_EQ(m.level, 1);
    std::optional<CollectionLine> line = ParseCollectionLine(m.text);
    ASSERT_TRUE(line.has_value()) << m.text;
    lines.push_back(*line);
  }
  ASSERT_EQ(lines.size(), 2u);
  for (const CollectionLine& line : lines) {
    EXPECT_EQ(line.passes, "0");
    EXPECT_EQ(line.firstTotal, total);
    EXPECT_EQ(line.lastTotal, total);
    EXPECT_EQ(line.removed, 0u);
    EXPECT_EQ(line.denominator, total);
    EXPECT_EQ(line.percent, 0.0);
  }
  EXPECT_EQ(lines[1].number, lines[0].number + 1);
}

TEST_F(CoreTDTableTest, EmptyDictionariesLogZeroOverZero) {
  ScopedCollectionLogging logging("1");
  DebugCapture capture;
  GarbageCollectDictionaries();
  ASSERT_EQ(TotalInterned(), 0u);
  capture.Clear();
  GarbageCollectDictionaries();
  ASSERT_EQ(capture.Messages().size(), 1u);
  const std::string text = capture.Messages()[0].text;
  const std::string tail = "0[0]0, 0%(0/0)}";
  ASSERT_GE(text.size(), tail.size());
  EXPECT_EQ(text.substr(text.size() - tail.size()), tail) << text;
}

TEST_F(CoreTDTableTest, LogOfACollectionWhileDictionariesGrow) {
  ScopedCollectionLogging logging("1");
  DebugCapture capture;
  GarbageCollectDictionaries();
  ASSERT_EQ(TotalInterned(), 0u);
  // Before and after each purge: the first pass frees one object, then others check in four.
  ScriptedDictionary growing({5, 4, 9, 9});
  const StopBeforeLeaving stop(services_);
  RegisterDictionary(&growing);
  capture.Clear();
  GarbageCollectDictionaries();
  ASSERT_EQ(capture.Messages().size(), 1u);
  const std::string text = capture.Messages()[0].text;
  const std::string tail = "5[1,0]9, -80%(-4/5)}";
  ASSERT_GE(text.size(), tail.size());
  EXPECT_EQ(text.substr(text.size() - tail.size()), tail) << text;
}

TEST_F(CoreTDTableTest, LoggingKeyIsReadOnceUntilReset) {
  ScopedCollectionLogging logging("0");
  DebugCapture capture;
  GarbageCollectDictionaries();
  EXPECT_TRUE(capture.Messages().empty());

  CfgSetOverride(kLoggingKey, "1");
  GarbageCollectDictionaries();
  EXPECT_TRUE(capture.Messages().empty()) << "the setting is kept from the first read";

  ResetCollectionLoggingSetting();
  GarbageCollectDictionaries();
  EXPECT_TRUE(LoggedCollection(capture).has_value());

  capture.Clear();
  CfgSetOverride(kLoggingKey, "off");
  ResetCollectionLoggingSetting();
  GarbageCollectDictionaries();
  EXPECT_TRUE(capture.Messages().empty());
}

std::vector<bool>* gListened = nullptr;
void Listen(bool collecting) { gListened->push_back(collecting); }

TEST_F(CoreTDTableTest, ListenerSeesTrueThenFalse) {
  std::vector<bool> events;
  gListened = &events;
  SetGarbageCollectingListener(&Listen);
  GarbageCollectDictionaries();
  EXPECT_EQ(events, (std::vector<bool>{true, false}));
  GarbageCollectDictionaries();
  EXPECT_EQ(events, (std::vector<bool>{true, false, true, false}));
  SetGarbageCollectingListener(nullptr);
  GarbageCollectDictionaries();
  EXPECT_EQ(events.size(), 4u);
  gListened = nullptr;
}

TEST_F(CoreTDTableTest, RecursiveTypesNothingReachesAreDropped) {
  ScopedCollectionLogging logging("1");
  DebugCapture capture;
  GarbageCollectDictionaries();
  const uint32_t descriptors = DictionarySize("TD");
  const uint64_t total = TotalInterned();
  ASSERT_EQ(InsertRecursiveTypeIntoTable(TDRBoolean(U("recursive"))), kStatusNoError);
  EXPECT_EQ(InsertRecursiveTypeIntoTable(TDR()), kStatusBadArgument);
  EXPECT_EQ(RecursiveTypesTableSize(), 1);

  capture.Clear();
  GarbageCollectDictionaries();
  EXPECT_EQ(RecursiveTypesTableSize(), 0);
  EXPECT_EQ(DictionarySize("TD"), descriptors) << "the dropped entry was its last holder";
  const std::optional<CollectionLine> line = LoggedCollection(capture);
  ASSERT_TRUE(line.has_value());
  EXPECT_EQ(line->passes, "0,2,0") << "dropping the entry frees the descriptor for a later pass";
  EXPECT_EQ(line->firstTotal, total + 2);
  EXPECT_EQ(line->lastTotal, total);

  const TDR held = TDRBoolean(U("held"));
  ASSERT_EQ(InsertRecursiveTypeIntoTable(held), kStatusNoError);
  GarbageCollectDictionaries();
  EXPECT_EQ(RecursiveTypesTableSize(), 0);
  EXPECT_TRUE(held == TDRBoolean(U("held"))) << "a handle still keeps it interned";

  ASSERT_EQ(InsertRecursiveTypeIntoTable(held), kStatusNoError);
  services_.StopAll();
  EXPECT_EQ(RecursiveTypesTableSize(), 0);
  EXPECT_EQ(InsertRecursiveTypeIntoTable(held), kStatusNullHandle);
}

ITDDictionary* Registered(std::string_view name) {
  for (int32_t i = 0; i < GetNumDictionaries(); ++i) {
    if (GetTDDictionaries()[i]->Name() == name) return GetTDDictionaries()[i];
  }
  return nullptr;
}

// Names check in through the registered name dictionary, which keeps each text once.
TEST_F(CoreTDTableTest, DictionaryInternsFindsPurgesAndEmpties) {
  ITDDictionary* names = Registered("Name");
  ASSERT_NE(names, nullptr);
  const uint32_t before = names->Size();
  const TDWName first(U("ab"));
  const TDWName colliding(U("b`"));
  ASSERT_EQ(first.GetHashValue(), colliding.GetHashValue()) << "two texts with one hash";

  const TDRName original = first.CheckIn();
  ASSERT_TRUE(original);
  EXPECT_EQ(names->Size(), before + 1);
  EXPECT_TRUE(TDWName(U("ab")).CheckIn() == original) << "an equal object gives the interned one";
  TDRName other = colliding.CheckIn();
  ASSERT_TRUE(other);
  EXPECT_FALSE(other == original);
  EXPECT_EQ(names->Size(), before + 2);
  EXPECT_TRUE(TDWName(U("b`")).CheckIn() == other);
  EXPECT_TRUE(TDWName(U("ab")).CheckIn() == original);
  EXPECT_EQ(names->Size(), before + 2);

  names->Purge();
  EXPECT_EQ(names->Size(), before + 2) << "held objects stay";
  other = TDRName();
  names->Purge();
  EXPECT_EQ(names->Size(), before + 1);
  EXPECT_TRUE(TDWName(U("ab")).CheckIn() == original);

  names->Empty();
  EXPECT_EQ(names->Size(), 0u);
  const TDRName again = TDWName(U("ab")).CheckIn();
  EXPECT_FALSE(again == original) << "an emptied dictionary no longer finds what it held";
  EXPECT_EQ(names->Size(), 1u);
}

TEST_F(CoreTDTableTest, DictionaryInsertUnderAllocationFailure) {
  ITDDictionary* names = Registered("Name");
  ASSERT_NE(names, nullptr);
  // Emptying gives the bucket array back too, so the count below covers the whole table.
  names->Empty();
  LiveBlockCheck leaks;
  bool succeeded = false;
  for (int64_t n = 1; n <= 50 && !succeeded; ++n) {
    SCOPED_TRACE(n);
    const TDWName name(U("swept"));
    TDRName interned;
    bool fired = false;
    {
      ScopedAllocationFailure failure(n);
      interned = name.CheckIn();
      fired = failure.Fired();
    }
    if (fired) {
      EXPECT_FALSE(interned);
      EXPECT_EQ(names->Size(), 0u);
    } else {
      EXPECT_TRUE(interned);
      EXPECT_EQ(names->Size(), 1u);
      succeeded = true;
    }
  }
  EXPECT_TRUE(succeeded);
  names->Empty();
}

std::string ConcurrentName(int32_t i) { return "concurrent " + std::to_string(i); }

// Starts all threads' work at once so that check-ins really overlap.
class StartLine {
 public:
  explicit StartLine(int32_t threads) : waiting_(threads) {}
  void ArriveAndWait() {
    waiting_.fetch_sub(1);
    while (waiting_.load() > 0) std::this_thread::yield();
  }

 private:
  std::atomic<int32_t> waiting_;
};

TEST_F(CoreTDTableTest, ConcurrentCheckInsOfTheSameNewTypesGiveOneObjectEach) {
  constexpr int32_t kThreads = 8;
  constexpr int32_t kTypes = 256;
  std::vector<std::vector<TDR>> results(kThreads, std::vector<TDR>(kTypes));
  StartLine start(kThreads);
  std::vector<std::thread> threads;
  for (int32_t t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      start.ArriveAndWait();
      for (int32_t j = 0; j < kTypes; ++j) {
        const int32_t i = (j + t * 37) % kTypes;
        TDWBoolean type(U(ConcurrentName(i).c_str()));
        if (i % 2 != 0) {
          EXPECT_EQ(type.SetNoSelectMask(1), kStatusNoError);
        }
        results[t][i] = type.CheckIn();
      }
    });
  }
  for (std::thread& thread : threads) thread.join();

  std::set<const TDImp*> distinct;
  for (int32_t i = 0; i < kTypes; ++i) {
    SCOPED_TRACE(i);
    ASSERT_TRUE(results[0][i]);
    for (int32_t t = 1; t < kThreads; ++t) EXPECT_TRUE(results[t][i] == results[0][i]);
    distinct.insert(results[0][i].GetImp());
    std::string name;
    EXPECT_EQ(results[0][i].GetName(&name), kStatusNoError);
    EXPECT_EQ(name, ConcurrentName(i));
    EXPECT_EQ(results[0][i].IsNoSelectTD(), i % 2 != 0 ? 8 : 0);
  }
  EXPECT_EQ(distinct.size(), static_cast<size_t>(kTypes));
}

TEST_F(CoreTDTableTest, ConcurrentCheckInsWhileCollecting) {
  constexpr int32_t kThreads = 8;
  constexpr int32_t kRounds = 12;
  constexpr int32_t kTypes = 40;
  std::atomic<int32_t> working{kThreads};
  std::atomic<int32_t> mismatches{0};
  StartLine start(kThreads + 1);
  std::thread collector([&] {
    start.ArriveAndWait();
    for (int32_t runs = 0; runs < 100000 && working.load() > 0; ++runs) GarbageCollectDictionaries();
  });
  std::vector<std::thread> threads;
  for (int32_t t = 0; t < kThreads; ++t) {
    threads.emplace_back([&] {
      start.ArriveAndWait();
      for (int32_t round = 0; round < kRounds; ++round) {
        for (int32_t i = 0; i < kTypes; ++i) {
          const std::string name = ConcurrentName(i);
          const TDR held = TDWBoolean(U(name.c_str())).CheckIn();
          const TDR again = TDWBoolean(U(name.c_str())).CheckIn();
          if (!held || !(held == again)) mismatches.fetch_add(1);
        }
      }
      working.fetch_sub(1);
    });
  }
  for (std::thread& thread : threads) thread.join();
  collector.join();
  EXPECT_EQ(mismatches.load(), 0) << "a held descriptor is never collected";
  GarbageCollectDictionaries();
  EXPECT_EQ(DictionarySize("TD"), 0u);
  EXPECT_EQ(DictionarySize("Name"), 0u);
}

}  // namespace
