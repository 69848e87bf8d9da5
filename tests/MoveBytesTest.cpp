// The short byte moves of the copy paths: every length and overlap against memmove, and the
// same-length variable string move taking only the case it can finish alone.
#include "runtime/MoveBytes.h"

#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <numeric>
#include <string_view>

#include "runtime/DSMemory.h"
#include "runtime/PXStrings.h"

namespace {

constexpr size_t kRoom = 256;
constexpr size_t kBase = 96;

std::array<uint8_t, kRoom> Pattern() {
  std::array<uint8_t, kRoom> bytes{};
  std::iota(bytes.begin(), bytes.end(), uint8_t{1});
  return bytes;
}

TEST(MoveBytesTest, EveryShortLengthAndOverlapMatchesMemmove) {
  // Lengths across every size class (and past the in-register limit); the destination before,
  // on and after the source, overlapping by every amount up to a whole chunk.
  for (size_t count = 0; count <= 80; ++count) {
    for (int shift = -40; shift <= 40; ++shift) {
      std::array<uint8_t, kRoom> expected = Pattern();
      std::array<uint8_t, kRoom> actual = Pattern();
      const size_t to = static_cast<size_t>(static_cast<int>(kBase) + shift);
      std::memmove(expected.data() + to, expected.data() + kBase, count);
      MoveBytes(actual.data() + to, actual.data() + kBase, count);
      ASSERT_EQ(expected, actual) << "count " << count << ", shift " << shift;
    }
  }
}

struct OwnedLStr {
  LStrHandle h = nullptr;
  explicit OwnedLStr(std::string_view text) { EXPECT_EQ(StringUtils::ToLStr(text, &h), kStatusNoError); }
  ~OwnedLStr() { DSDisposeHandle(reinterpret_cast<UHandle>(h)); }
  OwnedLStr(const OwnedLStr&) = delete;
  OwnedLStr& operator=(const OwnedLStr&) = delete;
  std::string_view Text() const { return {reinterpret_cast<const char*>((*h)->str), static_cast<size_t>((*h)->cnt)}; }
};

TEST(MoveBytesTest, SameLengthStringIsMovedInPlace) {
  const struct {
    std::string_view from;
    std::string_view into;
  } cases[] = {
      {"", ""},
      {"abc", "xyz"},
      {"a source string of some forty bytes....", "A SOURCE STRING OF SOME FORTY BYTES...."},
      {std::string_view("0123456789012345678901234567890123456789012345678901234567890123456789"),
       std::string_view("abcdefghijabcdefghijabcdefghijabcdefghijabcdefghijabcdefghijabcdefghij")},
  };
  for (const auto& c : cases) {
    OwnedLStr from(c.from);
    OwnedLStr into(c.into);
    const UHandle before = reinterpret_cast<UHandle>(into.h);
    EXPECT_TRUE(MoveSameLengthLStr(&from.h, &into.h)) << c.from;
    EXPECT_EQ(reinterpret_cast<UHandle>(into.h), before);
    EXPECT_EQ(into.Text(), c.from);
  }
}

TEST(MoveBytesTest, OtherCasesAreLeftToTheGeneralCopy) {
  OwnedLStr shorter("abc");
  OwnedLStr longer("abcd");
  EXPECT_FALSE(MoveSameLengthLStr(&shorter.h, &longer.h));
  EXPECT_EQ(longer.Text(), "abcd");
  EXPECT_FALSE(MoveSameLengthLStr(&longer.h, &shorter.h));
  EXPECT_EQ(shorter.Text(), "abc");

  LStrHandle none = nullptr;
  EXPECT_FALSE(MoveSameLengthLStr(&none, &shorter.h));
  EXPECT_EQ(shorter.Text(), "abc");
  EXPECT_FALSE(MoveSameLengthLStr(&shorter.h, &none));
  EXPECT_EQ(none, nullptr);

  // A damaged length word is never trusted as a byte count.
  OwnedLStr damaged("wxyz");
  (*damaged.h)->cnt = -4;
  OwnedLStr target("wxyz");
  EXPECT_FALSE(MoveSameLengthLStr(&damaged.h, &target.h));
  EXPECT_EQ(target.Text(), "wxyz");
  (*damaged.h)->cnt = 4;
}

}  // namespace
