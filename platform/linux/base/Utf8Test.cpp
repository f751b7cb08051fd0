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

TEST(Utf8Test, ValidTextIsRecognised) {
  for (const char* good :
       {"", "a", "eight by", "exactly 16 bytes", "\x7f", "\xc2\x80", "\xdf\xbf", "\xe0\xa0\x80",
        "\xed\x9f\xbf", "\xee\x80\x80", "\xef\xbf\xbf", "\xf0\x90\x80\x80", "\xf4\x8f\xbf\xbf",
        "1234567\xc3\xa4 more of it", "\xC3\xA4\xE2\x82\xAC\xF0\x9F\x8E\xA7"}) {
    EXPECT_TRUE(isUtf8WithoutNul(good)) << good;
    EXPECT_TRUE(isUtf8(good)) << good;
  }
}

TEST(Utf8Test, InvalidTextIsRecognisedWhereverItStands) {
  for (const char* bad :
       {"\x80", "\xbf", "\xc0\x80", "\xc1\xbf", "\xc2", "\xc2\x41", "\xe0\x9f\xbf", "\xe1\x80",
        "\xe1\x80\x41", "\xed\xa0\x80", "\xf0\x8f\xbf\xbf", "\xf1\x80\x80", "\xf4\x90\x80\x80",
        "\xf5\x80\x80\x80", "\xff"}) {
    for (std::size_t before = 0; before < 17; ++before) {
      const std::string text = std::string(before, 'x') + bad;
      EXPECT_FALSE(isUtf8WithoutNul(text)) << text;
      EXPECT_FALSE(isUtf8(text)) << text;
      EXPECT_FALSE(isUtf8WithoutNul(text + "12345678")) << text;
    }
  }
}

TEST(Utf8Test, NulIsRecognisedWhereverItStands) {
  for (std::size_t length = 1; length < 20; ++length) {
    for (std::size_t at = 0; at < length; ++at) {
      std::string text(length, '\x01');
      EXPECT_TRUE(isUtf8WithoutNul(text));
      text[at] = '\0';
      EXPECT_FALSE(isUtf8WithoutNul(text)) << length << " " << at;
      EXPECT_TRUE(isUtf8(text));
    }
  }
}

TEST(Utf8Test, PrefixEndsBetweenCharacters) {
  EXPECT_EQ(utf8Prefix("abc", 3), "abc");
  EXPECT_EQ(utf8Prefix("abcd", 3), "abc");
  EXPECT_EQ(utf8Prefix("aé", 2), "a");
  EXPECT_EQ(utf8Prefix("aé€", 5), "aé");
  EXPECT_EQ(utf8Prefix("😀", 3), "");
  EXPECT_EQ(utf8Prefix("\x80\x80\x80", 2), "");
}

TEST(Utf8Test, StepsThroughCharactersAndInvalidBytes) {
  EXPECT_EQ(nextUtf8("é").character, U'é');
  EXPECT_EQ(nextUtf8("€").character, U'€');
  EXPECT_EQ(nextUtf8("😀x").character, U'😀');
  EXPECT_EQ(nextUtf8("😀x").length, 4U);
  EXPECT_FALSE(nextUtf8("\xC3(").valid);
  EXPECT_EQ(nextUtf8("\xC3(").length, 1U);
}

TEST(Utf8Test, WordsAtATimeAndCharactersAtATimeAgree) {
  std::mt19937 random(2);  // always the same
  for (int round = 0; round < 5000; ++round) {
    std::string bytes(random() % 30, 'x');
    for (std::size_t changes = random() % 3; changes > 0 && !bytes.empty(); --changes) {
      bytes[random() % bytes.size()] = static_cast<char>(random());
    }

    ASSERT_EQ(isUtf8(bytes), replaceInvalidUtf8(bytes) == bytes);
    ASSERT_EQ(isUtf8WithoutNul(bytes), isUtf8(bytes) && bytes.find('\0') == std::string::npos);
  }
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
