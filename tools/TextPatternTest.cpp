#include "tools/TextPattern.h"

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

bool matches(std::string_view pattern, std::string_view text) {
  const auto compiled = TextPattern::compile(pattern);
  EXPECT_TRUE(compiled) << compiled.error().message;
  return compiled && compiled->matches(text);
}

TEST(TextPatternTest, MatchesAPartOfAText) {
  EXPECT_TRUE(matches("b+|x", "abbc"));
  EXPECT_FALSE(matches("^b", "abbc"));
}

TEST(TextPatternTest, IgnoresCaseUnlessThePatternHasAnUpperCaseLetter) {
  EXPECT_TRUE(matches("xrun", "an XRun"));
  EXPECT_FALSE(matches("XRUN", "an XRun"));
}

TEST(TextPatternTest, LooksNoFurtherThanTheText) {
  EXPECT_FALSE(matches("c", std::string_view("abc").substr(0, 2)));
}

TEST(TextPatternTest, RefusesAWrongPattern) {
  const auto compiled = TextPattern::compile("a(");
  ASSERT_FALSE(compiled);
  EXPECT_TRUE(
      compiled.error().message.starts_with("expected a regular expression, found \"a(\": "));
}

}  // namespace
}  // namespace halvox::tools
