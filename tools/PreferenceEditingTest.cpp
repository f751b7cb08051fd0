#include "tools/PreferenceEditing.h"

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using platform::Array;
using platform::Date;
using platform::Dictionary;
using platform::Value;
using platform::linux_::kLargestPreferenceFile;
using platform::linux_::parsePreferences;

PreferenceValue value(std::string_view text, ValueForm form = ValueForm::kTomlOrString) {
  return *parsePreferenceValue(text, form);
}

std::string set(std::string_view text, std::string_view key, std::string_view to) {
  const auto edited = withPreference(text, key, value(to), "/p/f.toml");
  return edited ? *edited : edited.error().message;
}

std::string unset(std::string_view text, std::string_view key) {
  const auto edited = withoutPreference(text, key, "/p/f.toml");
  return edited ? *edited : edited.error().message;
}

constexpr std::string_view kFile = R"(# Settings of the kitchen.

first = 1  # the first
device_name = "ä old" # who we are
list = [
  1, # one
  2,
]

# Others.
[table]
device_name = "not this"
)";

TEST(PreferenceEditingTest, TomlValuesAreWhatTheySay) {
  EXPECT_EQ(value("7").value, Value(7));
  EXPECT_EQ(value("true").value, Value(true));
  EXPECT_EQ(value("\"7\"").value, Value("7"));
  EXPECT_EQ(value("[1, {a = 2}]").value, Value(Array{1, Dictionary{{"a", 2}}}));
  EXPECT_EQ(value("1970-01-01T00:00:01Z").value, Value(Date{1}));
}

TEST(PreferenceEditingTest, EverythingElseIsAString) {
  for (const char* text : {"Kitchen", "the kitchen", "", "1\nother = 2", "7 # seven", "= 1", "[1",
                           "a \"b\" \\ \x01\x7f"}) {
    const PreferenceValue parsed = value(text);
    EXPECT_EQ(parsed.value, Value(text));
    const auto read = parsePreferences("v = " + parsed.text, "");
    EXPECT_EQ(*read, (Dictionary{{"v", text}}));
  }
}

TEST(PreferenceEditingTest, AStringCanBeForced) {
  EXPECT_EQ(value("7", ValueForm::kString).value, Value("7"));
  EXPECT_EQ(value("7", ValueForm::kString).text, "\"7\"");
}

TEST(PreferenceEditingTest, BytesThatAreNotTextAreRefused) {
  EXPECT_FALSE(parsePreferenceValue("a\xff", ValueForm::kString));
}

TEST(PreferenceEditingTest, SettingChangesNothingButTheValue) {
  std::string expected(kFile);
  expected.replace(expected.find("\"ä old\""), 8, "\"new\"");
  EXPECT_EQ(set(kFile, "device_name", "new"), expected);

  expected = kFile;
  expected.replace(expected.find("1  #"), 1, "[2]");
  EXPECT_EQ(set(kFile, "first", "[2]"), expected);
}

TEST(PreferenceEditingTest, AValueOfSeveralLinesIsReplacedAsAWhole) {
  EXPECT_EQ(set("a = [\n 1,\n]\nb = 2\n", "a", "3"), "a = 3\nb = 2\n");
  EXPECT_EQ(set("a = '''x\ny''' # c\n", "a", "3"), "a = 3 # c\n");
}

TEST(PreferenceEditingTest, ANewKeyFollowsTheOtherTopLevelKeys) {
  EXPECT_EQ(set("", "a", "1"), "a = 1\n");
  EXPECT_EQ(set("a = 1", "b", "x"), "a = 1\nb = \"x\"\n");
  EXPECT_EQ(set("# only a comment\n", "a", "1"), "# only a comment\na = 1\n");
  EXPECT_EQ(set("a = [\n1]\n[t]\nx = 1\n", "b", "2"), "a = [\n1]\nb = 2\n[t]\nx = 1\n");
  EXPECT_EQ(set("# top\n[t]\nx = 1\n", "b", "2"), "# top\nb = 2\n[t]\nx = 1\n");
  EXPECT_EQ(set("[[t]]\nx = 1\n", "b", "2"), "b = 2\n[[t]]\nx = 1\n");
}

TEST(PreferenceEditingTest, KeysAreQuotedWhereTheyMustBe) {
  EXPECT_EQ(set("", "a.b", "1"), "\"a.b\" = 1\n");
  EXPECT_EQ(set("\"a b\" = 1\n", "a b", "2"), "\"a b\" = 2\n");
  EXPECT_EQ(set("", "", "1"), "\"\" = 1\n");
}

TEST(PreferenceEditingTest, OtherLineEndsAndMarksStay) {
  EXPECT_EQ(set("a = 1\r\nb = 2\r\n", "a", "3"), "a = 3\r\nb = 2\r\n");
  EXPECT_EQ(set("\xEF\xBB\xBF"
                "a = 1\n",
                "a", "3"),
            "\xEF\xBB\xBF"
            "a = 3\n");
}

TEST(PreferenceEditingTest, UnsettingRemovesTheLinesOfTheKey) {
  EXPECT_EQ(unset("a = 1 # one\nb = 2\n", "a"), "b = 2\n");
  EXPECT_EQ(unset("a = 1\nb = [\n2,\n] # two", "b"), "a = 1\n");
  EXPECT_EQ(unset("a = 1\n", "other"), "a = 1\n");
  EXPECT_EQ(unset("[t]\na = 1\n", "a"), "[t]\na = 1\n");
}

TEST(PreferenceEditingTest, TablesWithLinesOfTheirOwnAreRefused) {
  for (const char* text : {"[a]\nb = 1\n", "a.b = 1\n", "[[a]]\nb = 1\n", "[a.b]\n"}) {
    EXPECT_NE(set(text, "a", "1").find("\"a\" is a table, or cannot be changed alone"),
              std::string::npos);
    EXPECT_NE(unset(text, "a").find("\"a\" is a table, or cannot be changed alone"),
              std::string::npos);
  }
  EXPECT_EQ(set("a = {b = 1}\n", "a", "1"), "a = 1\n");
  EXPECT_EQ(set("a = [{b = 1}]\n", "a", "1"), "a = 1\n");
}

TEST(PreferenceEditingTest, ABrokenFileIsRefusedWithItsPlace) {
  EXPECT_EQ(set("a = 1\nb =\n", "a", "1").rfind("/p/f.toml:2:", 0), 0U);
  EXPECT_EQ(unset("a = 1\nb =\n", "a").rfind("/p/f.toml:2:", 0), 0U);
}

TEST(PreferenceEditingTest, AFileThatWouldBeTooLargeIsRefused) {
  EXPECT_NE(set("", "a", std::string(kLargestPreferenceFile, 'x')).find("expected at most"),
            std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
