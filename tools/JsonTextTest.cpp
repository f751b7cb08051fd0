#include "tools/JsonText.h"

#include <cmath>
#include <limits>
#include <string>

#include <gtest/gtest.h>

namespace halvox::tools {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::NumberKind;

Dictionary dictionaryOf(std::string_view json) {
  const auto parsed = parseDictionary(json);
  if (parsed) return *parsed;
  ADD_FAILURE() << parsed.error().message;
  return {};
}

std::string errorOf(std::string_view json) {
  const auto parsed = parseDictionary(json);
  return parsed ? "" : parsed.error().message;
}

std::string nested(std::size_t levels) {
  std::string json;
  for (std::size_t level = 0; level < levels; ++level) json += "{\"d\":";
  return json + "1" + std::string(levels, '}');
}

TEST(JsonTextTest, ObjectsBecomeDictionaries) {
  EXPECT_EQ(dictionaryOf(R"({"a": 1, "b": {"c": [true, "text", 2.5]}, "d": {}, "e": []})"),
            (Dictionary{{"a", 1},
                        {"b", Dictionary{{"c", Array{true, "text", 2.5}}}},
                        {"d", Dictionary{}},
                        {"e", Array{}}}));
}

TEST(JsonTextTest, WholeNumbersKeepTheir64Bits) {
  const auto numbers = dictionaryOf(
      R"({"least": -9223372036854775808, "most": 18446744073709551615, "real": 1.0, "yes": true})");

  EXPECT_EQ(numbers.find("least")->numberKind(), NumberKind::kInt64);
  EXPECT_EQ(numbers.find("least")->toInt64(), std::numeric_limits<std::int64_t>::min());
  EXPECT_EQ(numbers.find("most")->numberKind(), NumberKind::kUInt64);
  EXPECT_EQ(numbers.find("most")->toUInt64(), std::numeric_limits<std::uint64_t>::max());
  EXPECT_EQ(numbers.find("real")->numberKind(), NumberKind::kDouble);
  EXPECT_EQ(numbers.find("yes")->numberKind(), NumberKind::kBool);
}

TEST(JsonTextTest, RefusesNullAndNamesItsPlace) {
  EXPECT_EQ(errorOf(R"({"a": {"b": [1, null]}})"),
            "\"a.b[1]\": a message cannot hold null; omit the key");
}

TEST(JsonTextTest, RefusesAKeyThatOccursTwice) {
  EXPECT_EQ(errorOf(R"({"x": {"a": 1, "a": 2}})"), "\"x.a\": the key occurs twice");
}

TEST(JsonTextTest, ReportsWhereTextIsNotJson) {
  EXPECT_EQ(errorOf(R"({"a": 1,})").substr(0, 19), "line 1, column 9: e");
  EXPECT_NE(errorOf(""), "");
  EXPECT_NE(errorOf(R"({"a": 1} x)"), "");
  EXPECT_NE(errorOf("{\"a\": \"\xFF\"}"), "");
  EXPECT_NE(errorOf(R"({"a": NaN})"), "");
  EXPECT_NE(errorOf(R"({"a": 1e999})"), "");
}

TEST(JsonTextTest, RefusesAnythingButAnObject) {
  EXPECT_EQ(errorOf("[1]"), "expected a JSON object, such as {\"sample_rate\": 48000}");
}

TEST(JsonTextTest, RefusesANulInAText) {
  EXPECT_EQ(errorOf(R"({"a": "x\u0000y"})"), "\"a\": a message cannot hold a NUL character");
}

TEST(JsonTextTest, NestsAsDeepAsAMessageMay) {
  EXPECT_EQ(errorOf(nested(32)), "");
  EXPECT_NE(errorOf(nested(33)).find("nested too deep"), std::string::npos);
  EXPECT_NE(errorOf(nested(100'000)).find("nested too deep"), std::string::npos);
}

TEST(JsonTextTest, ValuesBecomeJson) {
  EXPECT_EQ(toJson(Dictionary{{"a", Array{1, 2.5, true, "x\"y"}}, {"b", Dictionary{}}}),
            R"({"a":[1,2.5,true,"x\"y"],"b":{}})");
  EXPECT_EQ(toJson(Array{std::nan(""), HUGE_VAL, -HUGE_VAL}), R"(["NaN","Infinity","-Infinity"])");
  EXPECT_EQ(toJson(Array{INT64_MIN, UINT64_MAX}), "[-9223372036854775808,18446744073709551615]");
}

TEST(JsonTextTest, NumbersAreAsShortAsTheyReadBack) {
  const double latency = 2048.0 / 48000;

  EXPECT_EQ(toJson(Array{latency, 0.1, 1.0, 1e300}), "[0.042666666666666665,0.1,1.0,1e+300]");
  EXPECT_EQ(fieldsOfJson(R"({"a":0.042666666666666665,"b":{"c":[48000.0,-0.5]}})"),
            R"(a=0.042666666666666665 b={"c":[48000,-0.5]})");
}

TEST(JsonTextTest, TextForATerminalHasNoControlCharacters) {
  EXPECT_EQ(harmlessText("a\x1B[31mb\nc\x7F\xC2\x9B"
                         "2J\xFF\xE2\x80\xAE!"),
            "a\\u001b[31mb\\u000ac\\u007f\\u009b2J\\xff\\u202e!");
  EXPECT_EQ(harmlessText("gr\xC3\xBC\xC3\x9F \xF0\x9F\x8E\xA7"),
            "gr\xC3\xBC\xC3\x9F \xF0\x9F\x8E\xA7");
}

TEST(JsonTextTest, TextForATerminalHasNoInvisibleCharacters) {
  EXPECT_EQ(harmlessText("pl\u200Bay\u00ADer\uFEFF\u2060\u180E\u3164"),
            R"(pl\u200bay\u00ader\ufeff\u2060\u180e\u3164)");
  EXPECT_EQ(harmlessText("a\U000E0041b"), R"(a\udb40\udc41b)");
}

TEST(JsonTextTest, JsonForATerminalStaysTheSameJson) {
  const std::string json = harmlessJson("{\"a\":\"\xC2\x9B\x7F\"}");

  EXPECT_EQ(json, R"({"a":"\u009b\u007f"})");
  EXPECT_EQ(dictionaryOf(json), dictionaryOf("{\"a\":\"\xC2\x9B\x7F\"}"));
  const std::string tag = "{\"a\":\"\U000E0041\"}";
  EXPECT_EQ(harmlessJson(tag), R"({"a":"\udb40\udc41"})");
  EXPECT_EQ(dictionaryOf(harmlessJson(tag)), dictionaryOf(tag));
}

TEST(JsonTextTest, QuotedTextIsAlwaysJson) {
  EXPECT_EQ(quoted("a\"b\x01\xFF"), "\"a\\\"b\\u0001\xEF\xBF\xBD\"");
}

TEST(JsonTextTest, FieldsStandWithoutQuotesWhereThatLeavesNoDoubt) {
  EXPECT_EQ(fieldsOfJson(R"({"a":1,"b":"x","c":"two words","d":{"e":[1,2]},"f":"","g h":true})"),
            R"(a=1 b=x c="two words" d={"e":[1,2]} f="" "g h"=true)");
}

TEST(JsonTextTest, FieldsCannotDriveATerminal) {
  EXPECT_EQ(fieldsOfJson("{\"a\\u001b\":\"\\u001b]0;x\\u0007\",\"b\":\"\xC2\x9B\"}"),
            R"(a\u001b="\u001B]0;x\u0007" b=\u009b)");
}

TEST(JsonTextTest, TextThatIsNotAnObjectIsShownUnchanged) {
  EXPECT_EQ(fieldsOfJson("not \x1B json"), "not \\u001b json");
}

}  // namespace
}  // namespace halvox::tools
