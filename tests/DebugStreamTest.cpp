// Diagnostic messages: module names, formatting, emission through the sink.
#include "runtime/DebugStream.h"

#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "support/TestSupport.h"

VELLUM_DIAGNOSTIC_MODULE("DebugStreamTest");

namespace {

struct Widget {
  int id;
};
void ToDebugStream(DebugStream& s, const Widget& w) { s << "[Widget " << w.id << "]"; }

TEST(DebugStreamTest, ModuleNames) {
  struct Case {
    const char* file;
    const char* module;
  };
  const Case kCases[] = {
      {"/work/main/source/TD.cpp", "TD"},
      {"C:\\build\\source\\KoVariant.cpp", "KoVariant"},
      {"basicTypeInterpreter.cpp", "basicTypeInterpreter"},
      {"dir/archive.tar.gz", "archive.tar"},
      {"NoExtension", "NoExtension"},
      {"", ""},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.file);
    EXPECT_EQ(DebugModuleName(c.file), c.module);
    EXPECT_EQ(DebugStream(c.file, 1, 0).Module(), c.module);
  }
  EXPECT_EQ(DebugModuleName(nullptr), "");
}

TEST(DebugStreamTest, Formatting) {
  struct Case {
    const char* name;
    std::string text;
    const char* expected;
  };
  auto text = [](auto&& build) {
    DebugStream s("x.cpp", 1, 0);
    build(s);
    return s.Text();
  };
  const Case kCases[] = {
      {"Double", text([](DebugStream& s) { s << 0.1 << " " << 1e20 << " " << 2.0 << " " << 1.0 / 3; }),
       "0.1 1e+20 2 0.333333"},
      {"Integers", text([](DebugStream& s) { s << int8_t{-5} << uint8_t{200} << ' ' << INT64_MIN << ' ' << UINT64_MAX; }),
       "-5200 -9223372036854775808 18446744073709551615"},
      {"Hex", text([](DebugStream& s) { s.AppendHex32(0x1A).Append(" ").AppendHex32(0xDEADBEEF); }),
       "0x0000001a 0xdeadbeef"},
      {"PStr", text([](DebugStream& s) { s.AppendPStr(reinterpret_cast<const uint8_t*>("\x03" "abcdef")).AppendPStr(nullptr); }),
       "abc"},
      {"Strings", text([](DebugStream& s) { s << std::string("a") << std::string_view("b") << "c" << static_cast<const char*>(nullptr); }),
       "abc"},
      {"Bool", text([](DebugStream& s) { s << true << false; }), "10"},
      {"ToDebugStream", text([](DebugStream& s) { s << Widget{7}; }), "[Widget 7]"},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.text, c.expected);
  }
}

TEST(DebugStreamTest, ProcessEmitsOnceThroughTheSink) {
  DebugCapture capture;
  DebugStream s("/src/source/TDCluster.cpp", 120, 3);
  s << "bad count " << 5;
  EXPECT_TRUE(capture.Messages().empty()) << "nothing is emitted before Process";
  s.Process();
  s.Process();
  (VELLUM_DEBUG(2) << "macro").Process();
  DebugReport("KoVariant.cpp", 9, 4, "Insane KoVariant_ must abort");
  const std::vector<DebugMessage> m = capture.Messages();
  ASSERT_EQ(m.size(), 3u);
  EXPECT_EQ(m[0].module, "TDCluster");
  EXPECT_EQ(m[0].line, 120);
  EXPECT_EQ(m[0].level, 3);
  EXPECT_EQ(m[0].text, "bad count 5");
  EXPECT_EQ(m[1].module, "DebugStreamTest");
  EXPECT_EQ(m[1].text, "macro");
  EXPECT_EQ(m[2].module, "KoVariant");
  EXPECT_TRUE(capture.Contains("must abort"));
  EXPECT_FALSE(capture.Contains("absent"));
}

TEST(DebugStreamTest, DefaultSinkWritesOneLineToStderr) {
  SetDebugSink(DebugSink());
  ::testing::internal::CaptureStderr();
  DebugReport("dir/TD.cpp", 42, 3, "Reregistering a type factory");
  EXPECT_EQ(::testing::internal::GetCapturedStderr(), "TD(42) 3: Reregistering a type factory\n");
}

TEST(DebugStreamTest, SinkMayReportAndBeReplacedFromOtherThreads) {
  DebugCapture outer;
  std::atomic<int> nested{0};
  // A sink that itself reports must not deadlock: it is called outside the runtime's lock.
  SetDebugSink([&nested](const DebugMessage& m) {
    if (m.text == "outer") {
      ++nested;
      SetDebugSink(DebugSink([&nested](const DebugMessage&) { ++nested; }));
      DebugReport("a.cpp", 1, 0, "inner");
    }
  });
  DebugReport("a.cpp", 1, 0, "outer");
  EXPECT_EQ(nested.load(), 2);

  DebugCapture capture;
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t)
    threads.emplace_back([t] {
      for (int i = 0; i < 50; ++i) DebugReport("T.cpp", t, 0, "x");
    });
  for (std::thread& t : threads) t.join();
  EXPECT_EQ(capture.Messages().size(), 400u);
}

}  // namespace
