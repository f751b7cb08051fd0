#include "platform/linux/store/PayloadEncoder.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <limits>
#include <span>
#include <string>
#include <string_view>

#include <gtest/gtest.h>
#include <rapidjson/document.h>

namespace halvox::platform::linux_ {
namespace {

std::string encodeOne(const Value& value) {
  PayloadEncoder encoder;
  return std::string(encoder.encode(Dictionary{{"k", value}}));
}

Data bytes(std::string_view text) {
  return Data(std::as_bytes(std::span(text.data(), text.size())));
}

bool parses(std::string_view text) {
  rapidjson::Document document;
  document.Parse<rapidjson::kParseValidateEncodingFlag>(text.data(), text.size());
  return !document.HasParseError() && document.IsObject();
}

TEST(PayloadEncoderTest, WritesBooleansAsBooleans) {
  EXPECT_EQ(encodeOne(true), R"({"k":true})");
  EXPECT_EQ(encodeOne(false), R"({"k":false})");
}

TEST(PayloadEncoderTest, WritesTheSmallestAndTheLargestIntegers) {
  EXPECT_EQ(encodeOne(std::numeric_limits<std::int64_t>::min()), R"({"k":-9223372036854775808})");
  EXPECT_EQ(encodeOne(std::numeric_limits<std::uint64_t>::max()), R"({"k":18446744073709551615})");
  EXPECT_EQ(encodeOne(std::int16_t{-7}), R"({"k":-7})");
  EXPECT_EQ(encodeOne(std::uint8_t{255}), R"({"k":255})");
}

TEST(PayloadEncoderTest, WritesRealsInTheirShortestForm) {
  EXPECT_EQ(encodeOne(0.1), R"({"k":0.1})");
  EXPECT_EQ(encodeOne(0.1F), R"({"k":0.1})");
  EXPECT_EQ(encodeOne(1.0), R"({"k":1})");
  EXPECT_EQ(encodeOne(-0.0), R"({"k":-0})");
  EXPECT_EQ(encodeOne(1e300), R"({"k":1e+300})");
  EXPECT_EQ(encodeOne(1'700'000'000.25), R"({"k":1700000000.25})");
}

TEST(PayloadEncoderTest, WritesNumbersThatJSONCannotHoldAsTexts) {
  EXPECT_EQ(encodeOne(std::numeric_limits<double>::quiet_NaN()), R"({"k":"NaN"})");
  EXPECT_EQ(encodeOne(std::numeric_limits<double>::infinity()), R"({"k":"Infinity"})");
  EXPECT_EQ(encodeOne(-std::numeric_limits<float>::infinity()), R"({"k":"-Infinity"})");
}

TEST(PayloadEncoderTest, WritesDatesInUTCWithAFraction) {
  EXPECT_EQ(encodeOne(Date{0}), R"({"k":"1970-01-01T00:00:00.000000Z"})");
  EXPECT_EQ(encodeOne(Date{1'700'000'000.25}), R"({"k":"2023-11-14T22:13:20.250000Z"})");
  EXPECT_EQ(encodeOne(Date{-0.5}), R"({"k":"1969-12-31T23:59:59.500000Z"})");
  EXPECT_EQ(encodeOne(Date{0.9999999}), R"({"k":"1970-01-01T00:00:01.000000Z"})");
}

TEST(PayloadEncoderTest, WritesTheFirstAndTheLastYearOfTheDateForm) {
  EXPECT_EQ(encodeOne(Date{-62135596800.0}), R"({"k":"0001-01-01T00:00:00.000000Z"})");
  EXPECT_EQ(encodeOne(Date{253402300799.5}), R"({"k":"9999-12-31T23:59:59.500000Z"})");
  const double justBeforeTheEnd = std::nextafter(253402300800.0, 0.0);
  EXPECT_TRUE(encodeOne(Date{justBeforeTheEnd}).starts_with(R"({"k":"9999-12-31T23:59:59.)"));
}

TEST(PayloadEncoderTest, WritesDatesOutsideTheFormAsSeconds) {
  EXPECT_EQ(encodeOne(Date{1e15}), R"({"k":1e+15})");
  EXPECT_EQ(encodeOne(Date{std::numeric_limits<double>::quiet_NaN()}), R"({"k":"NaN"})");
}

TEST(PayloadEncoderTest, WritesDataAsBase64) {
  EXPECT_EQ(encodeOne(bytes("")), R"({"k":""})");
  EXPECT_EQ(encodeOne(bytes("f")), R"({"k":"Zg=="})");
  EXPECT_EQ(encodeOne(bytes("fo")), R"({"k":"Zm8="})");
  EXPECT_EQ(encodeOne(bytes("foobar")), R"({"k":"Zm9vYmFy"})");
  EXPECT_EQ(encodeOne(bytes("\xFF\xFE\xFB")), R"({"k":"//77"})");
}

TEST(PayloadEncoderTest, WritesContainersAndNoValue) {
  const Value nested = Dictionary{{"list", Array{1, "two", Array{}, Value()}}};
  EXPECT_EQ(encodeOne(nested), R"({"k":{"list":[1,"two",[],null]}})");
  EXPECT_EQ(PayloadEncoder().encode({}), "{}");
}

TEST(PayloadEncoderTest, EscapesQuotesBackslashesAndControlCharacters) {
  EXPECT_EQ(encodeOne("a\"b\\c"), R"({"k":"a\"b\\c"})");
  EXPECT_EQ(encodeOne(std::string("a\0b\n\x1F", 5)), R"({"k":"a\u0000b\n\u001F"})");
}

TEST(PayloadEncoderTest, FindsWhatNeedsEscapingAtEveryPlaceOfAText) {
  for (const char special : {'"', '\\', '\n', '\0', '\x1F', '\xFF'}) {
    for (std::size_t length = 1; length <= 20; ++length) {
      for (std::size_t place = 0; place < length; ++place) {
        std::string text(length, 'x');
        text[place] = special;
        EXPECT_TRUE(parses(encodeOne(text))) << int{special} << " at " << place << "/" << length;
      }
    }
  }
}

TEST(PayloadEncoderTest, LeavesPlainTextsAsTheyAre) {
  for (char plain = ' '; plain < '\x7F'; ++plain) {
    if (plain == '"' || plain == '\\') continue;
    const std::string text(9, plain);
    EXPECT_EQ(encodeOne(text), "{\"k\":\"" + text + "\"}");
  }
}

TEST(PayloadEncoderTest, KeepsWellFormedUTF8) {
  EXPECT_EQ(encodeOne("Grüße €, 𝄞"), "{\"k\":\"Grüße €, 𝄞\"}");
}

TEST(PayloadEncoderTest, ReplacesWhatIsNotUTF8) {
  constexpr std::array<std::string_view, 8> kHostile{
      "\x80", "\xC0\xAF", "\xE0\x80\x80", "\xED\xA0\x80", "\xF4\x90\x80\x80",
      "\xC3", "\xF0\x9F", "\xFF\xFE"};
  for (const std::string_view text : kHostile) {
    const std::string encoded = encodeOne(text);
    EXPECT_TRUE(parses(encoded)) << encoded;
    EXPECT_NE(encoded.find("\xEF\xBF\xBD"), std::string::npos) << encoded;
  }
}

TEST(PayloadEncoderTest, EscapesKeysToo) {
  PayloadEncoder encoder;
  EXPECT_EQ(encoder.encode(Dictionary{{"a\"\n", 1}}), R"({"a\"\n":1})");
  EXPECT_TRUE(parses(encoder.encode(Dictionary{{"\xFF", 1}})));
}

TEST(PayloadEncoderTest, EncodesAgainAfterAVeryLargeText) {
  PayloadEncoder encoder;
  const std::string large(3'000'000, 'x');
  EXPECT_EQ(encoder.encode(Dictionary{{"k", large}}).size(), large.size() + 8);
  EXPECT_EQ(encoder.encode(Dictionary{{"k", 1}}), R"({"k":1})");
}

TEST(PayloadEncoderTest, EncodesDeepNesting) {
  Value value = 1;
  for (int level = 0; level < 200; ++level) value = Array{value};
  EXPECT_TRUE(parses(encodeOne(value)));
}

// --- Payloads that resemble the one before ------------------------------------------------------

// Encodes the payloads one after the other, and each with an encoder of its own.
void expectTextsOfTheirOwn(std::span<const Dictionary> payloads) {
  PayloadEncoder encoder;
  for (const Dictionary& payload : payloads) {
    EXPECT_EQ(encoder.encode(payload), PayloadEncoder().encode(payload));
  }
}

TEST(PayloadEncoderTest, AddsAnEntryAfterTheOthers) {
  PayloadEncoder encoder;
  const Dictionary::Entry added{"z", "end"};
  EXPECT_EQ(encoder.encode(Dictionary{{"a", 1}}, &added), R"({"a":1,"z":"end"})");
  EXPECT_EQ(encoder.encode(Dictionary{}, &added), R"({"z":"end"})");
  EXPECT_EQ(encoder.encode(Dictionary{}), "{}");
}

TEST(PayloadEncoderTest, TwinsHaveOneText) {
  PayloadEncoder encoder;
  const Dictionary message{{"a", 1}, {"b", "text"}};
  const Dictionary::Entry added{"z", "end"};
  const std::string first(encoder.encode(message, &added));
  EXPECT_FALSE(encoder.isRepeated());

  EXPECT_EQ(encoder.encode(message, &added), first);

  EXPECT_TRUE(encoder.isRepeated());
}

TEST(PayloadEncoderTest, PayloadWithAnotherEndIsNoTwin) {
  PayloadEncoder encoder;
  const Dictionary message{{"a", 1}};
  const Dictionary::Entry one{"z", 1};
  const Dictionary::Entry yes{"z", true};
  const Dictionary::Entry other{"y", 1};
  EXPECT_EQ(encoder.encode(message, &one), R"({"a":1,"z":1})");
  EXPECT_EQ(encoder.encode(message, &yes), R"({"a":1,"z":true})");
  EXPECT_EQ(encoder.encode(message, &other), R"({"a":1,"y":1})");
  EXPECT_EQ(encoder.encode(message), R"({"a":1})");
  EXPECT_EQ(encoder.encode(message, &one), R"({"a":1,"z":1})");
  EXPECT_FALSE(encoder.isRepeated());
}

TEST(PayloadEncoderTest, EqualPayloadsThatShareNothingAreRepetitions) {
  const auto message = [](int number) {
    return Dictionary{{"a", number}, {"b", "text"}, {"name", "app"}};
  };
  PayloadEncoder encoder;
  const std::string first(encoder.encode(message(1)));
  EXPECT_FALSE(encoder.isRepeated());

  EXPECT_EQ(encoder.encode(message(1)), first);
  EXPECT_TRUE(encoder.isRepeated());
  EXPECT_NE(encoder.encode(message(2)), first);
  EXPECT_FALSE(encoder.isRepeated());
  const Dictionary::Entry added{"z", 1};
  EXPECT_NE(encoder.encode(message(2), &added), first);
  EXPECT_FALSE(encoder.isRepeated());
  EXPECT_NE(encoder.encode({{"a", 2}, {"b", "text"}}, &added), first);
  EXPECT_FALSE(encoder.isRepeated());
}

TEST(PayloadEncoderTest, LongTextIsForgottenOnRequestAndAShortOneKept) {
  PayloadEncoder encoder;
  const Dictionary message{{"a", 1}};
  Dictionary longMessage{{"text", std::string(300'000, 'x')}};
  EXPECT_EQ(encoder.encode(message), R"({"a":1})");
  encoder.giveBackIfLong();
  EXPECT_EQ(encoder.encode(message), R"({"a":1})");
  EXPECT_TRUE(encoder.isRepeated());

  EXPECT_EQ(encoder.encode(longMessage).size(), 300'011U);
  encoder.giveBackIfLong();

  // If the encoder shared the entries, changing one would copy them first.
  const Dictionary::Entry* const before = longMessage.begin();
  longMessage.setAt(0, 2);
  EXPECT_EQ(longMessage.begin(), before);
  EXPECT_EQ(encoder.encode(longMessage), R"({"text":2})");
}

TEST(PayloadEncoderTest, LinkMessageWithOneMoreEntrySharesTheTextOfItsEvent) {
  Dictionary message;
  message.reserve(3);
  message.set("a", 1);
  message.set("b", "text");
  Dictionary tagged = message;
  tagged.set("audiotag", "Start");
  ASSERT_EQ(tagged.sharedEntries(message), 2U);
  const Dictionary::Entry name{"name", "app"};
  PayloadEncoder encoder;
  for (int round = 0; round < 3; ++round) {
    EXPECT_EQ(encoder.encode(message, &name), R"({"a":1,"b":"text","name":"app"})");
    EXPECT_EQ(encoder.encode(tagged), R"({"a":1,"b":"text","audiotag":"Start"})");
    EXPECT_EQ(encoder.encode(tagged, &name),
              R"({"a":1,"b":"text","audiotag":"Start","name":"app"})");
  }
}

TEST(PayloadEncoderTest, NextPayloadWithOtherValuesHasTextOfItsOwn) {
  const std::string longText(100, 'x');
  expectTextsOfTheirOwn(std::array<Dictionary, 6>{{
      {{"a", 1}, {"b", longText}, {"c", 2.5}},
      {{"a", 100}, {"b", longText}, {"c", 2.5}},
      {{"a", 1}, {"b", longText + "y"}, {"c", -0.0}},
      {{"a", true}, {"b", "\n"}, {"c", 0.0}},
      {{"a", Value()}, {"b", "\n"}, {"c", Array{1, "two"}}},
      {{"a", Value()}, {"b", Dictionary{{"b", 1}}}, {"c", Array{true, "two"}}},
  }});
}

TEST(PayloadEncoderTest, NextPayloadWithOtherKeysHasTextOfItsOwn) {
  const std::string rareKey(1000, 'k');  // too long to be interned
  expectTextsOfTheirOwn(std::array<Dictionary, 10>{{
      {{"a", 1}, {"b", 2}, {"c", 3}},
      {{"a", 1}, {"x", 2}, {"c", 3}},
      {{"x", 1}, {"b", 2}, {"c", 3}},
      {{"x", 1}, {"b", 2}},
      {{"x", 1}, {"b", 2}, {"c", 3}, {"d", 4}},
      {},
      {{rareKey, 1}, {"b", 2}},
      {{rareKey, 1}, {"b", 3}},
      {{"b", 3}, {rareKey, 1}},
      {{"a\"\xFF", 1}, {"b", 2}},
  }});
}

TEST(PayloadEncoderTest, PayloadAfterGivingBackHasTextOfItsOwn) {
  PayloadEncoder encoder;
  const Dictionary message{{"a", 1}};
  EXPECT_EQ(encoder.encode(message), R"({"a":1})");
  encoder.giveBack();
  EXPECT_EQ(encoder.encode(message), R"({"a":1})");
  EXPECT_FALSE(encoder.isRepeated());
  encoder.giveBack();
  EXPECT_EQ(encoder.encode({}), "{}");
  EXPECT_EQ(encoder.encode({}), "{}");
}

TEST(PayloadEncoderTest, PayloadThatWasChangedIsEncodedAgain) {
  PayloadEncoder encoder;
  Dictionary message{{"a", 1}, {"b", 2}};
  EXPECT_EQ(encoder.encode(message), R"({"a":1,"b":2})");
  message.set("a", 3);
  EXPECT_EQ(encoder.encode(message), R"({"a":3,"b":2})");
  message.remove("a");
  EXPECT_EQ(encoder.encode(message), R"({"b":2})");
  message.set("c", 4);
  EXPECT_EQ(encoder.encode(message), R"({"b":2,"c":4})");
}

TEST(PayloadEncoderTest, TextOfTheSizeOfAWordOrLessIsCopiedWhole) {
  for (std::size_t length = 0; length <= 40; ++length) {
    std::string text;
    for (std::size_t at = 0; at < length; ++at) text += static_cast<char>('a' + at % 26);
    EXPECT_EQ(encodeOne(text), "{\"k\":\"" + text + "\"}");
  }
}

TEST(PayloadEncoderTest, FindsEqualPayloadsAlike) {
  const auto make = [] {
    return Dictionary{{"a", 1}, {"b", "text"}, {"c", Array{1.5, Date{2}}}, {"d", Dictionary{}}};
  };
  EXPECT_TRUE(encodeAlike(make(), make()));
}

TEST(PayloadEncoderTest, DoesNotFindAlikeWhatIsEqualButReadsDifferently) {
  EXPECT_FALSE(encodeAlike({{"k", 1}}, {{"k", true}}));
  EXPECT_FALSE(encodeAlike({{"k", 0.0}}, {{"k", -0.0}}));
  EXPECT_FALSE(encodeAlike({{"k", Array{1}}}, {{"k", Array{true}}}));
  EXPECT_FALSE(encodeAlike({{"a", 1}, {"b", 2}}, {{"b", 2}, {"a", 1}}));
}

TEST(PayloadEncoderTest, DoesNotFindDifferentPayloadsAlike) {
  EXPECT_FALSE(encodeAlike({{"k", 1}}, {{"k", 2}}));
  EXPECT_FALSE(encodeAlike({{"k", 1}}, {{"l", 1}}));
  EXPECT_FALSE(encodeAlike({{"k", 1}}, {{"k", 1}, {"l", 1}}));
  EXPECT_FALSE(encodeAlike({{"k", bytes("a")}}, {{"k", bytes("b")}}));
}

}  // namespace
}  // namespace halvox::platform::linux_
