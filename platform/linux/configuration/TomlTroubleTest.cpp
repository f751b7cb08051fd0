#include "platform/linux/configuration/TomlTrouble.h"

#include <cstddef>
#include <string>
#include <string_view>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

bool isNestedTooDeep(std::string_view text) {
  const auto trouble = findTomlTrouble(text);
  return trouble.has_value() && trouble->kind == TomlTrouble::Kind::kTooDeep;
}

std::size_t lineNestedTooDeep(std::string_view text) {
  return isNestedTooDeep(text) ? findTomlTrouble(text)->line : 0;
}

// The line of a character that must be in quotes; 0 if there is none.
std::size_t lineOfCharacter(std::string_view text) {
  const auto trouble = findTomlTrouble(text);
  if (!trouble.has_value() || trouble->kind != TomlTrouble::Kind::kCharacter) return 0;
  return trouble->line;
}

// "a.a.a", with that many dots.
std::string key(std::size_t dots) {
  std::string text = "a";
  for (std::size_t count = 0; count < dots; ++count) text += ".a";
  return text;
}

TEST(TomlTroubleTest, DotsOfAKeyAreLevels) {
  EXPECT_FALSE(isNestedTooDeep(key(kDeepestNesting) + " = 1"));
  EXPECT_TRUE(isNestedTooDeep(key(kDeepestNesting + 1) + " = 1"));
  EXPECT_TRUE(isNestedTooDeep("b = 1\n  " + key(100'000) + " = 1\n"));
}

TEST(TomlTroubleTest, LevelsOfAHeaderAddToThoseBelowIt) {
  EXPECT_FALSE(isNestedTooDeep("[" + key(200) + "]\n" + key(50) + " = 1\n"));
  EXPECT_TRUE(isNestedTooDeep("[" + key(200) + "]\nb = 1\n" + key(100) + " = 1\n"));
  EXPECT_TRUE(isNestedTooDeep("[[" + key(200) + "]]\n" + key(100) + " = 1\n"));
  EXPECT_FALSE(isNestedTooDeep("[" + key(200) + "]\nb = 1\n[b]\n" + key(200) + " = 1\n"));
}

TEST(TomlTroubleTest, LevelsInBracketsAddUp) {
  EXPECT_TRUE(isNestedTooDeep(key(100) + " = [\n {" + key(100) + " = {" + key(100) + " = 1}}]"));
  EXPECT_FALSE(isNestedTooDeep("b = [{" + key(200) + " = 1}, {" + key(200) + " = 1}]\n" + key(200) +
                               " = 1"));
  EXPECT_TRUE(isNestedTooDeep("b = " + std::string(1000, '[')));
}

TEST(TomlTroubleTest, ManyLinesAndNumbersAreNotDeep) {
  std::string text;
  for (int line = 0; line < 1000; ++line) text += "a.b" + std::to_string(line) + " = 1.5\n";
  text += "list = [";
  for (int count = 0; count < 1000; ++count) text += "0.5, ";
  EXPECT_FALSE(isNestedTooDeep(text + "]"));
}

TEST(TomlTroubleTest, QuotedDotsAndBracketsAndThoseOfCommentsDoNotCount) {
  const std::string dots = std::string(1000, '.') + std::string(1000, '[');
  EXPECT_FALSE(isNestedTooDeep("a = \"\\\"" + dots + "\" # " + dots + "\nb = '" + dots + "\\'\n"));
  EXPECT_FALSE(isNestedTooDeep("a = \"\"\"\n\"" + dots + "\\\"\"\" " + dots + "\n\"\"\""));
  EXPECT_FALSE(isNestedTooDeep("a = '''\n''" + dots + "\\'''\n\"" + dots + "\" = 1"));
  EXPECT_TRUE(isNestedTooDeep("a = \"" + dots + "\"\n" + key(1000) + " = 1"));
}

TEST(TomlTroubleTest, QuotesAtTheEndOfALongTextHideNothing) {
  for (const char* text : {R"("")", R"("""b"""")", R"("""b""""")", "'''b''''", "'''b'''''"}) {
    const std::string line = "a = {b = " + std::string(text) + ", " + key(1000) + " = 1}";
    EXPECT_TRUE(isNestedTooDeep(line)) << text;
  }
}

TEST(TomlTroubleTest, ReturnsTheFirstLineThatIsTooDeep) {
  EXPECT_EQ(lineNestedTooDeep("a.b = 1\n"), 0U);
  EXPECT_EQ(lineNestedTooDeep(key(1000)), 1U);
  EXPECT_EQ(lineNestedTooDeep("a = \"\"\"\n\n\"\"\"\n" + key(1000) + "\n" + key(1000)), 4U);
}

TEST(TomlTroubleTest, TextsThatEndTooEarlyAreHarmless) {
  for (const char* text : {"", "\"", "'''", "\"\\", "#", "]", "}}}", "[", "a = \"\"\"\\", ","}) {
    EXPECT_FALSE(isNestedTooDeep(text)) << text;
  }
}

TEST(TomlTroubleTest, CharactersBeyondAsciiMustBeInQuotesOrComments) {
  EXPECT_EQ(lineOfCharacter("a = 1\n\u00E9 = 2\n"), 2U);
  EXPECT_EQ(lineOfCharacter("a = \u0464\n"), 1U);
  EXPECT_EQ(lineOfCharacter("a =\u00A01\n"), 1U);
  EXPECT_EQ(lineOfCharacter("a = \"\u00E9\" # \u00E9\n'\u00E9' = \"\"\"\n\u00E9\"\"\"\n"), 0U);
}

TEST(TomlTroubleTest, ControlCharactersAreRefusedOutsideQuotes) {
  EXPECT_EQ(lineOfCharacter(std::string("a = 1\n\n\0", 8)), 3U);
  EXPECT_EQ(lineOfCharacter("a = \x7F"), 1U);
  EXPECT_EQ(lineOfCharacter("\ta = 1\r\n"), 0U);
}

TEST(TomlTroubleTest, AByteOrderMarkMayBeginTheText) {
  EXPECT_EQ(lineOfCharacter("\xEF\xBB\xBF"
                            "a = 1\n"),
            0U);
  EXPECT_EQ(lineOfCharacter("a = 1\n\xEF\xBB\xBF"), 2U);
}

}  // namespace
}  // namespace halvox::platform::linux_
