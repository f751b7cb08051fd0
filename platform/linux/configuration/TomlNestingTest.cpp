#include "platform/linux/configuration/TomlNesting.h"

#include <string>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

// "a.a.a", with that many dots.
std::string key(std::size_t dots) {
  std::string text = "a";
  for (std::size_t count = 0; count < dots; ++count) text += ".a";
  return text;
}

TEST(TomlNestingTest, DotsOfAKeyAreLevels) {
  EXPECT_FALSE(isNestedTooDeep(key(kDeepestNesting) + " = 1"));
  EXPECT_TRUE(isNestedTooDeep(key(kDeepestNesting + 1) + " = 1"));
  EXPECT_TRUE(isNestedTooDeep("b = 1\n  " + key(100'000) + " = 1\n"));
}

TEST(TomlNestingTest, LevelsOfAHeaderAddToThoseBelowIt) {
  EXPECT_FALSE(isNestedTooDeep("[" + key(200) + "]\n" + key(50) + " = 1\n"));
  EXPECT_TRUE(isNestedTooDeep("[" + key(200) + "]\nb = 1\n" + key(100) + " = 1\n"));
  EXPECT_TRUE(isNestedTooDeep("[[" + key(200) + "]]\n" + key(100) + " = 1\n"));
  EXPECT_FALSE(isNestedTooDeep("[" + key(200) + "]\nb = 1\n[b]\n" + key(200) + " = 1\n"));
}

TEST(TomlNestingTest, LevelsInBracketsAddUp) {
  EXPECT_TRUE(isNestedTooDeep(key(100) + " = [\n {" + key(100) + " = {" + key(100) + " = 1}}]"));
  EXPECT_FALSE(isNestedTooDeep("b = [{" + key(200) + " = 1}, {" + key(200) + " = 1}]\n" + key(200) +
                               " = 1"));
  EXPECT_TRUE(isNestedTooDeep("b = " + std::string(1000, '[')));
}

TEST(TomlNestingTest, ManyLinesAndNumbersAreNotDeep) {
  std::string text;
  for (int line = 0; line < 1000; ++line) text += "a.b" + std::to_string(line) + " = 1.5\n";
  text += "list = [";
  for (int count = 0; count < 1000; ++count) text += "0.5, ";
  EXPECT_FALSE(isNestedTooDeep(text + "]"));
}

TEST(TomlNestingTest, QuotedDotsAndBracketsAndThoseOfCommentsDoNotCount) {
  const std::string dots = std::string(1000, '.') + std::string(1000, '[');
  EXPECT_FALSE(isNestedTooDeep("a = \"\\\"" + dots + "\" # " + dots + "\nb = '" + dots + "\\'\n"));
  EXPECT_FALSE(isNestedTooDeep("a = \"\"\"\n\"" + dots + "\\\"\"\" " + dots + "\n\"\"\""));
  EXPECT_FALSE(isNestedTooDeep("a = '''\n''" + dots + "\\'''\n\"" + dots + "\" = 1"));
  EXPECT_TRUE(isNestedTooDeep("a = \"" + dots + "\"\n" + key(1000) + " = 1"));
}

TEST(TomlNestingTest, QuotesAtTheEndOfALongTextHideNothing) {
  for (const char* text : {R"("")", R"("""b"""")", R"("""b""""")", "'''b''''", "'''b'''''"}) {
    const std::string line = "a = {b = " + std::string(text) + ", " + key(1000) + " = 1}";
    EXPECT_TRUE(isNestedTooDeep(line)) << text;
  }
}

TEST(TomlNestingTest, ReturnsTheFirstLineThatIsTooDeep) {
  EXPECT_EQ(lineNestedTooDeep("a.b = 1\n"), std::nullopt);
  EXPECT_EQ(lineNestedTooDeep(key(1000)), 1U);
  EXPECT_EQ(lineNestedTooDeep("a = \"\"\"\n\n\"\"\"\n" + key(1000) + "\n" + key(1000)), 4U);
}

TEST(TomlNestingTest, TextsThatEndTooEarlyAreHarmless) {
  for (const char* text : {"", "\"", "'''", "\"\\", "#", "]", "}}}", "[", "a = \"\"\"\\", ","}) {
    EXPECT_FALSE(isNestedTooDeep(text)) << text;
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
