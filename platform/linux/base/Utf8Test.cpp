#include "platform/linux/base/Utf8.h"

#include <algorithm>
#include <random>
#include <string>
#include <string_view>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

std::string escaped(std::string_view text, std::size_t room = 1000) {
  std::string line;
  appendEscaped(line, text, room);
  return line;
}

TEST(Utf8Test, ReplacesEachByteThatIsNoCharacter) {
  EXPECT_EQ(replaceInvalidUtf8("a\xFF\xFE"
                               "b"),
            "a\uFFFD\uFFFDb");
  EXPECT_EQ(replaceInvalidUtf8("caf\xC3"), "caf\uFFFD");
}

TEST(Utf8Test, KeepsCharactersOfEveryLength) { EXPECT_EQ(replaceInvalidUtf8("aé€😀"), "aé€😀"); }

TEST(Utf8Test, OverlongFormsSurrogatesAndTooLargeOnesAreNoCharacters) {
  EXPECT_FALSE(nextUtf8("\xC0\x80").valid);
  EXPECT_FALSE(nextUtf8("\xE0\x80\x80").valid);
  EXPECT_FALSE(nextUtf8("\xED\xA0\x80").valid);
  EXPECT_FALSE(nextUtf8("\xF4\x90\x80\x80").valid);
}

TEST(Utf8Test, EscapesWhatWouldBreakALineOrDriveATerminal) {
  EXPECT_EQ(escaped("a\nb\r\tc"), "a\\nb\\r\\tc");
  EXPECT_EQ(escaped("\x1B[31m"), "\\x1b[31m");
  EXPECT_EQ(escaped(std::string_view("\0\x7F", 2)), "\\x00\\x7f");
  EXPECT_EQ(escaped("\u0085\u2028\u2029"), "\\u0085\\u2028\\u2029");
}

TEST(Utf8Test, EscapesBytesThatAreNoCharacters) { EXPECT_EQ(escaped("\xC3("), "\\xc3("); }

TEST(Utf8Test, LeavesOtherTextAsItStands) {
  EXPECT_EQ(escaped("naïve \"quoted\" \\n 😀"), "naïve \"quoted\" \\n 😀");
}

TEST(Utf8Test, EscapedBytesOfAnyKindAreOneLineOfUtf8) {
  std::mt19937 random(1);  // always the same
  for (int round = 0; round < 2000; ++round) {
    std::string bytes(random() % 40, '\0');
    for (char& byte : bytes) byte = static_cast<char>(random());

    const std::string line = escaped(bytes, 60);

    ASSERT_LE(line.size(), 60U);
    ASSERT_EQ(replaceInvalidUtf8(line), line);
    ASSERT_TRUE(std::ranges::none_of(line, [](char byte) { return byte >= 0 && byte < 0x20; }));
  }
}

TEST(Utf8Test, StopsBeforeThePartThatFindsNoRoom) {
  std::string line;

  EXPECT_EQ(appendEscaped(line, "abc", 2), 2U);
  EXPECT_EQ(appendEscaped(line, "é€", 3), 2U);
  EXPECT_EQ(appendEscaped(line, "x\n", 2), 1U);
  EXPECT_EQ(line, "abéx");
}

}  // namespace
}  // namespace halvox::platform::linux_
