#include "platform/linux/configuration/GlobPattern.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <fnmatch.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using testing::Optional;
using testing::StartsWith;

constexpr std::string_view kNoEnd = "the list has no \"]\" at its end";

TEST(GlobPatternTest, PatternsThatMatchSomethingHaveNoMistake) {
  // Each pattern with a text that it matches: what is accepted here must work in fnmatch(3).
  const std::vector<std::pair<std::string, std::string>> cases{
      {"user_*", "user_name"}, {"a?c", "abc"},         {"a]", "a]"},
      {"a\\*", "a\\b"},        {"a[]x]", "a]"},        {"b[!]]", "bx"},
      {"b[^]]", "bx"},         {"c[[]", "c["},         {"[a-z]?", "q1"},
      {"[a-]", "-"},           {"[-a]", "-"},          {"[!-a]", "b"},
      {"[--/]", "."},          {"[a-cx-z]", "y"},      {"[a-c-]", "-"},
      {"[]-a]", "^"},          {"[[:alpha:]]*", "a1"}, {"[[:digit:][:upper:]]", "X"},
      {"[![:digit:]]", "a"},   {"[[:alpha:]-]", "-"},  {"gr\xC3\xBC*", "gr\xC3\xBC\xC3\x9F"},
  };
  for (const auto& [pattern, text] : cases) {
    EXPECT_EQ(findPatternMistake(pattern), std::nullopt) << pattern;
    EXPECT_EQ(::fnmatch(pattern.c_str(), text.c_str(), FNM_NOESCAPE), 0) << pattern;
  }
}

TEST(GlobPatternTest, AListWithoutAnEndIsAMistakeAtItsStart) {
  for (const char* pattern : {"a[bc", "a[", "a[]", "a[!]", "a[^", "a[[:alpha:]", "a[b-"}) {
    EXPECT_THAT(findPatternMistake(pattern), Optional("character 2: " + std::string(kNoEnd)))
        << pattern;
  }
  EXPECT_THAT(findPatternMistake("[ab][cd"), Optional("character 5: " + std::string(kNoEnd)));
}

TEST(GlobPatternTest, ARangeThatEndsBeforeItStartsIsAMistake) {
  EXPECT_THAT(findPatternMistake("a[z-a]"),
              Optional(std::string(
                  "character 3: the range z-a is empty, because its end is before its start")));
  EXPECT_THAT(findPatternMistake("[a--]"), Optional(StartsWith("character 2: the range a--")));
}

TEST(GlobPatternTest, ARangeBetweenRangesOrClassesIsAMistake) {
  EXPECT_THAT(findPatternMistake("[a-c-e]"),
              Optional(std::string("character 5: a range cannot begin with a range or a class")));
  EXPECT_THAT(findPatternMistake("[[:alpha:]-z]"),
              Optional(std::string("character 11: a range cannot begin with a range or a class")));
  EXPECT_THAT(findPatternMistake("[a-[:alpha:]]"),
              Optional(std::string("character 4: a range cannot end with a class")));
}

TEST(GlobPatternTest, AnUnknownClassAndOneWithoutAnEndAreMistakes) {
  EXPECT_THAT(
      findPatternMistake("[[:letter:]]"),
      Optional(StartsWith("character 2: unknown class \"letter\"; the classes are alnum, ")));
  EXPECT_THAT(findPatternMistake("[[:alpha]]"),
              Optional(std::string("character 2: the class has no \":]\" at its end")));
}

TEST(GlobPatternTest, WhatDependsOnTheLocaleIsAMistakeWithinAList) {
  const std::string wanted = "a list cannot have \"[=\" or \"[.\"";
  EXPECT_THAT(findPatternMistake("[[=a=]]"), Optional("character 2: " + wanted));
  EXPECT_THAT(findPatternMistake("[x[.a.]]"), Optional("character 3: " + wanted));
  EXPECT_THAT(findPatternMistake("[\xC3\xBC]"),
              Optional(std::string("character 2: a list can have only characters of ASCII")));
}

TEST(GlobPatternTest, AnEmptyPatternAndOneWithACharacterZeroAreMistakes) {
  EXPECT_THAT(findPatternMistake(""), Optional(std::string("an empty pattern matches nothing")));
  EXPECT_THAT(findPatternMistake(std::string_view("a\0b", 3)),
              Optional(std::string("character 2: the character has the number 0")));
}

}  // namespace
}  // namespace halvox::platform::linux_
