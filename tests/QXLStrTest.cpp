// CQXLStr: a counted-string handle behind the byte-string interface: copies in and out,
// resizing, refused buffers and handles, and running out of memory.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <utility>

#include "support/TestSupport.h"
#include "runtime/DSMemory.h"
#include "runtime/PXStrings.h"
#include "vellum/QXLStr.h"

namespace {

const uint8_t* Bytes(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

std::string Contents(const IQXStr& s) {
  if (s.GetSize() == 0) return std::string();
  return std::string(reinterpret_cast<const char*>(s.GetReadPtr()),
                     static_cast<size_t>(s.GetSize()));
}

LStrHandle MakeLStr(std::string_view text) {
  LStrHandle h = nullptr;
  EXPECT_EQ(StringUtils::ToLStr(text, &h), 0);
  return h;
}

TEST(QXLStrTest, EmptyStringHasNoHandle) {
  LiveBlockCheck blocks;
  CQXLStr s;
  EXPECT_EQ(s.GetSize(), 0);
  EXPECT_EQ(s.GetReadPtr(), nullptr);
  EXPECT_EQ(s.GetWritePtr(), nullptr);
  EXPECT_EQ(s.GetLStrHandle(), nullptr);
  EXPECT_EQ(CQXLStr(Bytes("")).GetLStrHandle(), nullptr);
  EXPECT_EQ(CQXLStr(static_cast<const uint8_t*>(nullptr)).GetSize(), 0);
  EXPECT_EQ(CQXLStr(static_cast<LStrHandle>(nullptr)).GetSize(), 0);
  EXPECT_EQ(CQXLStr(nullptr, 5).GetSize(), 0);
}

TEST(QXLStrTest, ConstructorsCopy) {
  LiveBlockCheck blocks;
  EXPECT_EQ(Contents(CQXLStr(Bytes("hello"))), "hello");
  EXPECT_EQ(Contents(CQXLStr(Bytes("hello"), 3)), "hel");
  const uint8_t withZero[] = {'a', 0, 'b'};
  EXPECT_EQ(Contents(CQXLStr(withZero, 3)), std::string("a\0b", 3));

  LStrHandle h = MakeLStr("counted");
  {
    CQXLStr s(h);
    EXPECT_EQ(Contents(s), "counted");
    EXPECT_NE(s.GetLStrHandle(), h) << "the caller keeps its handle";
    EXPECT_EQ(LHStrLen(s.GetLStrHandle()), 7);
  }
  EXPECT_EQ(StringUtils::FromLStr(h), "counted");
  DSDisposeHandle(reinterpret_cast<UHandle>(h));
}

TEST(QXLStrTest, CopyFrom) {
  LiveBlockCheck blocks;
  CQXLStr s(Bytes("start"));
  EXPECT_EQ(s.CopyFromCStr(Bytes("next")), 0);
  EXPECT_EQ(Contents(s), "next");
  EXPECT_EQ(s.CopyFromCStr(Bytes("bytes!"), 5), 0);
  EXPECT_EQ(Contents(s), "bytes");
  LStrHandle h = MakeLStr("from handle");
  EXPECT_EQ(s.CopyFromLStr(h), 0);
  EXPECT_EQ(Contents(s), "from handle");
  DSDisposeHandle(reinterpret_cast<UHandle>(h));
  EXPECT_EQ(s.CopyFromCStr(nullptr), 0);
  EXPECT_EQ(s.GetLStrHandle(), nullptr);
}

TEST(QXLStrTest, CopyFromItsOwnBytes) {
  LiveBlockCheck blocks;
  CQXLStr s(Bytes("abcdef"));
  EXPECT_EQ(s.CopyFromCStr(s.GetReadPtr() + 2, 3), 0);
  EXPECT_EQ(Contents(s), "cde");
  EXPECT_EQ(s.CopyFromLStr(s.GetLStrHandle()), 0);
  EXPECT_EQ(Contents(s), "cde");
}

TEST(QXLStrTest, CopyFromRefusesBadArguments) {
  LiveBlockCheck blocks;
  CQXLStr s(Bytes("keep"));
  EXPECT_EQ(s.CopyFromCStr(Bytes("x"), -1), kStatusBadArgument);
  EXPECT_EQ(s.CopyFromCStr(nullptr, 2), kStatusBadArgument);

  // Not a handle at all: never dereferenced.
  LStr fake{1000, {'x'}};
  LStr* master = &fake;
  EXPECT_EQ(s.CopyFromLStr(&master), kStatusBadArgument);

  // A real handle whose count claims more bytes than it holds.
  LStrHandle lying = MakeLStr("abc");
  (*lying)->cnt = 1 << 20;
  EXPECT_EQ(s.CopyFromLStr(lying), kStatusBadArgument);
  (*lying)->cnt = -4;
  EXPECT_EQ(s.CopyFromLStr(lying), kStatusBadArgument);
  DSDisposeHandle(reinterpret_cast<UHandle>(lying));

  EXPECT_EQ(Contents(s), "keep");
}

struct CStrCase {
  int32_t capacity;
  std::string expected;
};

const CStrCase kCStrCases[] = {{1, ""}, {2, "h"}, {5, "hell"}, {6, "hello"}, {64, "hello"}};

TEST(QXLStrTest, CopyToCStrTruncatesToTheCapacity) {
  const CQXLStr s(Bytes("hello"));
  for (const CStrCase& c : kCStrCases) {
    SCOPED_TRACE(c.capacity);
    uint8_t buffer[64];
    std::fill(std::begin(buffer), std::end(buffer), 0xEE);
    EXPECT_EQ(s.CopyToCStr(c.capacity, buffer), 0);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(buffer)), c.expected);
    if (c.capacity < 64) {
      EXPECT_EQ(buffer[c.capacity], 0xEE) << "nothing written past the capacity";
    }
  }
  uint8_t buffer[4] = {0xEE, 0xEE, 0xEE, 0xEE};
  EXPECT_EQ(CQXLStr().CopyToCStr(4, buffer), 0);
  EXPECT_EQ(buffer[0], 0);
}

TEST(QXLStrTest, CopyToCStrWithoutRoomIsReportedAndWritesNothing) {
  const CQXLStr s(Bytes("hello"));
  const std::pair<int32_t, bool> kCases[] = {{0, true}, {-3, true}, {8, false}};
  for (const auto& [capacity, withBuffer] : kCases) {
    SCOPED_TRACE(capacity);
    DebugCapture capture;
    uint8_t guard = 0xEE;
    EXPECT_EQ(s.CopyToCStr(capacity, withBuffer ? &guard : nullptr), kStatusBadArgument);
    EXPECT_EQ(guard, 0xEE);
    ASSERT_EQ(capture.Messages().size(), 1u);
    EXPECT_EQ(capture.Messages()[0].level, 2);
    EXPECT_EQ(capture.Messages()[0].module, "QXLStr");
    EXPECT_TRUE(capture.Contains("CQXLStr::CopyToCStr"));
  }
}

TEST(QXLStrTest, CopyToPStr) {
  uint8_t buffer[256];
  EXPECT_EQ(CQXLStr(Bytes("abc")).CopyToPStr(buffer), 0);
  EXPECT_EQ(StringUtils::FromPStr(buffer), "abc");

  const std::string longText(300, 'z');
  const CQXLStr longString(Bytes(longText.c_str()));
  EXPECT_EQ(longString.CopyToPStr(buffer), 0);
  EXPECT_EQ(buffer[0], 255);
  EXPECT_EQ(StringUtils::FromPStr(buffer), std::string(255, 'z'));

  DebugCapture capture;
  EXPECT_EQ(longString.CopyToPStr(nullptr), kStatusBadArgument);
  EXPECT_EQ(capture.Messages().size(), 1u);
}

TEST(QXLStrTest, SetSize) {
  LiveBlockCheck blocks;
  CQXLStr s(Bytes("abcdef"));
  EXPECT_EQ(s.SetSize(3, true), 0);
  EXPECT_EQ(Contents(s), "abc");
  EXPECT_EQ(s.SetSize(5, true), 0);
  EXPECT_EQ(Contents(s), std::string("abc\0\0", 5));
  EXPECT_EQ(s.SetSize(4, false), 0);
  EXPECT_EQ(Contents(s), std::string(4, '\0'));
  s.GetWritePtr()[0] = 'w';
  EXPECT_EQ(Contents(s), std::string("w\0\0\0", 4));
  EXPECT_EQ(s.SetSize(-1, true), kStatusBadArgument);
  EXPECT_EQ(s.GetSize(), 4);
  EXPECT_EQ(s.SetSize(0, true), 0);
  EXPECT_EQ(s.GetLStrHandle(), nullptr);
  EXPECT_EQ(s.SetSize(2, true), 0);
  EXPECT_EQ(Contents(s), std::string(2, '\0'));
  EXPECT_EQ(DSGetHandleSize(reinterpret_cast<UHandle>(s.GetLStrHandle())), 6u);
}

TEST(QXLStrTest, MovingHandsTheHandleOver) {
  LiveBlockCheck blocks;
  CQXLStr a(Bytes("moved"));
  const LStrHandle h = a.GetLStrHandle();
  CQXLStr b(std::move(a));
  EXPECT_EQ(b.GetLStrHandle(), h);
  EXPECT_EQ(a.GetLStrHandle(), nullptr);  // NOLINT(bugprone-use-after-move)
  CQXLStr c(Bytes("replaced"));
  c = std::move(b);
  EXPECT_EQ(Contents(c), "moved");
}

TEST(QXLStrTest, RunningOutOfMemoryLeavesTheStringAsItWas) {
  LiveBlockCheck blocks;
  CQXLStr s(Bytes("kept"));
  LStrHandle h = MakeLStr("other");
  const std::pair<const char*, int32_t (*)(CQXLStr&, LStrHandle)> kOperations[] = {
      {"CopyFromCStr", [](CQXLStr& x, LStrHandle) { return x.CopyFromCStr(Bytes("new")); }},
      {"CopyFromLStr", [](CQXLStr& x, LStrHandle o) { return x.CopyFromLStr(o); }},
      {"SetSizeKeeping", [](CQXLStr& x, LStrHandle) { return x.SetSize(100, true); }},
      {"SetSizeClearing", [](CQXLStr& x, LStrHandle) { return x.SetSize(2, false); }},
  };
  for (const auto& [name, operation] : kOperations) {
    SCOPED_TRACE(name);
    ScopedAllocationFailure failure(1);
    EXPECT_EQ(operation(s, h), kStatusOutOfMemory);
    EXPECT_TRUE(failure.Fired());
    EXPECT_EQ(Contents(s), "kept");
  }
  DSDisposeHandle(reinterpret_cast<UHandle>(h));
  {
    ScopedAllocationFailure failure(1);
    EXPECT_THROW(CQXLStr(Bytes("thrown")), std::bad_alloc);
  }
}

}  // namespace
