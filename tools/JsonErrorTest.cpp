#include "tools/JsonError.h"

#include <gtest/gtest.h>

#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

std::string errorOf(std::string_view json) {
  const auto parsed = parseDictionary(json);
  return parsed ? "" : parsed.error().message;
}

TEST(JsonErrorTest, ReportsWhatWasExpectedAndFoundAndWhere) {
  EXPECT_EQ(errorOf(R"({"a":})"), R"(line 1, column 6: expected a value, found "}")");
  EXPECT_EQ(errorOf("{\n \"a\": 1,\n}"),
            "line 3, column 1: expected a name in double quotes, found \"}\"");
  EXPECT_EQ(errorOf("{a: 1}"), "line 1, column 2: expected a name in double quotes, found \"a\"");
  EXPECT_EQ(errorOf(R"({"a" 1})"), R"(line 1, column 6: expected ":" after the name, found "1")");
  EXPECT_EQ(errorOf(R"({"a": 1)"),
            R"(line 1, column 8: expected "," or "}", found the end of the text)");
  EXPECT_EQ(errorOf(""), "line 1, column 1: expected a value, but the text is empty");
  EXPECT_EQ(errorOf(R"({"a": 1} x)"),
            R"(line 1, column 10: expected the end of the text, found "x")");
}

TEST(JsonErrorTest, ColumnsCountCharacters) {
  EXPECT_EQ(errorOf("{\"\xC3\xA4\xE2\x82\xAC\": \xC3\xBC}"),
            "line 1, column 8: expected a value, found \"\xC3\xBC\"");
}

TEST(JsonErrorTest, MistakesInStringsAndNumbersAreSentencesToo) {
  EXPECT_NE(errorOf(R"({"a": "\x"})").find("after the backslash"), std::string::npos);
  EXPECT_NE(errorOf(R"({"a": "\u12"})").find("four hexadecimal digits"), std::string::npos);
  EXPECT_NE(errorOf("{\"a\": \"\xFF\"}").find("expected UTF-8"), std::string::npos);
  EXPECT_NE(errorOf(R"({"a": 1e999})").find("the number is too large"), std::string::npos);
}

TEST(JsonErrorTest, NothingInItDrivesATerminal) {
  EXPECT_EQ(errorOf("{\x1B"),
            "line 1, column 2: expected a name in double quotes, found \"\\u001b\"");
}

}  // namespace
}  // namespace halvox::tools
