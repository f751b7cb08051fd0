#include "client/EncodedDictionary.h"

#include <cstdint>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "client/EncodedArray.h"
#include "client/RequestEncoder.h"

namespace halvox::client {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;

const std::vector<ReporterID> kIds{7, -8};

// Returns the frame of a message that is kept in its encoded form.
std::string frameOf(const EncodedDictionary& message) {
  HeapSegments segments;
  SegmentWriter writer(segments);
  const EncodedMessageView view{kIds, message, 0x08000004, 17};
  if (encodeBody(writer, view) != EncodeOutcome::kDone) return "no form";
  std::string frame(kMessageHeaderBytes, '\0');
  putMessageHeader(frame.data(), writer.position());
  return frame + segments.join(writer.position());
}
// Returns the frame of an ordinary dictionary, which is encoded when it is sent.
std::string frameOf(const Dictionary& message) {
  const Request request = makeRequest(MessageView{kIds, message, 0x08000004, 17});
  const auto* frame = std::get_if<std::string>(&request);
  return frame != nullptr ? *frame : "no form";
}
std::span<const std::byte> bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

// Fixture: a message of ten fields, and the same message as an ordinary dictionary.
void fill(EncodedDictionary& message) {
  message.set("frame_counter", std::int64_t{1});
  message.set("flags", std::uint8_t{3});
  message.set("is_running", true);
  message.set("channels", std::int16_t{-2});
  message.set("route", "Speaker");
  message.set("mask", std::uint16_t{7});
  message.set("since", Date{1.5});
  message.set("bytes", bytesOf("abc"));
  message.set("gain", -1);
  message.set("latency_ms", 10.67F);
}
Dictionary filled() {
  return {{"frame_counter", std::int64_t{1}},
          {"flags", std::uint8_t{3}},
          {"is_running", true},
          {"channels", std::int16_t{-2}},
          {"route", "Speaker"},
          {"mask", std::uint16_t{7}},
          {"since", Date{1.5}},
          {"bytes", Data(bytesOf("abc"))},
          {"gain", -1},
          {"latency_ms", 10.67F}};
}

TEST(EncodedDictionaryTest, AnEmptyOneIsTheSameFrame) {
  EXPECT_EQ(frameOf(EncodedDictionary()), frameOf(Dictionary()));
}

TEST(EncodedDictionaryTest, ScalarsAreTheSameFrame) {
  EncodedDictionary message;

  fill(message);

  EXPECT_EQ(message.size(), 10U);
  EXPECT_EQ(frameOf(message), frameOf(filled()));
}

TEST(EncodedDictionaryTest, AValueOfTheSameTypeReplacesTheOldOneInPlace) {
  EncodedDictionary message;
  Dictionary expected = filled();
  fill(message);
  const char* const before = message.wireForm().entries.data();

  message.set("frame_counter", std::numeric_limits<std::int64_t>::min());
  expected.set("frame_counter", std::numeric_limits<std::int64_t>::min());
  message.set("flags", std::uint8_t{255});
  expected.set("flags", std::uint8_t{255});
  message.set("is_running", false);
  expected.set("is_running", false);
  message.set("channels", std::int16_t{300});
  expected.set("channels", std::int16_t{300});
  message.set("since", Date{-2});
  expected.set("since", Date{-2});
  message.set("route", "Headset");
  expected.set("route", "Headset");
  message.set("gain", 77);
  expected.set("gain", 77);

  EXPECT_EQ(message.wireForm().entries.data(), before);
  EXPECT_EQ(frameOf(message), frameOf(expected));
}

// Replaces the value at each place by shorter and by longer values.
TEST(EncodedDictionaryTest, AValueOfAnotherSizeMovesTheOthers) {
  for (const auto& [key, old] : filled()) {
    for (std::size_t size = 0; size < 40; ++size) {
      EncodedDictionary message;
      Dictionary expected = filled();
      fill(message);
      const std::string text(size, 'x');

      EXPECT_TRUE(message.set(key.text(), text));
      expected.set(key, text);
      EXPECT_EQ(frameOf(message), frameOf(expected)) << key.text() << " " << size;
      message.set(key.text(), std::uint8_t{1});
      expected.set(key, std::uint8_t{1});
      message.set("frame_counter", std::int64_t{2});
      expected.set("frame_counter", std::int64_t{2});
      EXPECT_EQ(frameOf(message), frameOf(expected)) << key.text() << " " << size;
    }
  }
}

TEST(EncodedDictionaryTest, ARemovedKeyLeavesNothing) {
  for (const auto& [key, old] : filled()) {
    EncodedDictionary message;
    Dictionary expected = filled();
    fill(message);

    EXPECT_TRUE(message.remove(key.text()));
    EXPECT_FALSE(message.remove(key.text()));
    expected.remove(key);
    EXPECT_EQ(frameOf(message), frameOf(expected)) << key.text();
    message.set("after", 1.0);
    expected.set("after", 1.0);
    EXPECT_EQ(frameOf(message), frameOf(expected)) << key.text();
  }
}

// Places every element at each of the eight alignments.
TEST(EncodedDictionaryTest, ContainersAreTheSameFrameWhereverTheyBegin) {
  for (std::size_t size = 0; size < 16; ++size) {
    const std::string key(size, 'k');
    EncodedDictionary inner;
    EncodedArray innermost;
    EncodedArray array;
    EncodedDictionary message;
    inner.set(key, 2.5);
    innermost.append(std::uint8_t{1});
    innermost.append(0.5);
    EXPECT_TRUE(array.append(key));
    array.append(innermost);
    array.append(true);
    array.append(inner);
    array.append(EncodedDictionary());
    array.append(EncodedArray());
    array.append(Date{3});
    array.append(bytesOf(key));
    array.append(innermost);
    message.set(key, array);
    message.set("dictionary", inner);
    message.set("last", EncodedArray());
    const Dictionary innerValue{{key, 2.5}};
    const Array innermostValue{std::uint8_t{1}, 0.5};
    const Array arrayValue{key,        innermostValue,     true,
                           innerValue, Dictionary(),       Array(),
                           Date{3},    Data(bytesOf(key)), innermostValue};

    EXPECT_EQ(array.size(), 9U);
    EXPECT_EQ(
        frameOf(message),
        frameOf(Dictionary{{key, arrayValue}, {"dictionary", innerValue}, {"last", Array()}}));
  }
}

TEST(EncodedDictionaryTest, ContainersCanBeStoredInThemselves) {
  EncodedDictionary message;
  EncodedArray array;
  Dictionary dictionaryValue = filled();
  Value arrayValue = Array();
  fill(message);
  for (int times = 0; times < 8; ++times) {
    message.set("route", message);
    dictionaryValue.set("route", dictionaryValue);
    std::vector<Value> elements(arrayValue.array().begin(), arrayValue.array().end());
    array.append(1.5);
    elements.emplace_back(1.5);
    arrayValue = Array(elements);
    array.append(array);
    elements.emplace_back(arrayValue);
    arrayValue = Array(elements);
  }
  message.set("array", array);
  dictionaryValue.set("array", arrayValue);

  EXPECT_EQ(frameOf(message), frameOf(dictionaryValue));
}

TEST(EncodedDictionaryTest, RefusesTextThatIsNotUtf8AndChangesNothing) {
  EncodedDictionary message;
  EncodedArray array;
  fill(message);

  EXPECT_FALSE(message.set("\xFF", 1));
  EXPECT_FALSE(message.set("text", "\xFF"));
  EXPECT_FALSE(message.set("route", std::string_view("a\0b", 3)));
  EXPECT_FALSE(array.append("\xFF"));

  EXPECT_EQ(array.size(), 0U);
  EXPECT_EQ(frameOf(message), frameOf(filled()));
}

// Puts an invalid byte at every place of texts whose lengths are near the multiples of a word's
// size.
TEST(EncodedDictionaryTest, FindsNulsAndBytesThatAreNotUtf8AtAnyPlace) {
  for (std::size_t size = 1; size <= 50; ++size) {
    const std::string good(size, 'x');
    EncodedDictionary message;
    EXPECT_TRUE(message.set(good, good));
    for (std::size_t place = 0; place < size; ++place) {
      for (const char bad : {'\0', '\xFF', '\x80'}) {
        std::string text = good;
        text[place] = bad;
        EXPECT_FALSE(message.set(text, 1)) << size << " " << place;
        EXPECT_FALSE(message.set("text", text)) << size << " " << place;
      }
    }
    EXPECT_EQ(message.size(), 1U);
    EXPECT_TRUE(message.set(good + "\xC3\xA4", "\xC3\xA4"));
  }
}

// The keys differ only in the place of one byte.
TEST(EncodedDictionaryTest, KeysThatDifferInOneByteAreDifferent) {
  for (std::size_t size = 1; size <= 50; ++size) {
    EncodedDictionary message;
    Dictionary expected;
    for (std::size_t place = 0; place < size; ++place) {
      std::string key(size, 'x');
      key[place] = 'y';
      message.set(key, static_cast<std::int64_t>(place));
      expected.set(key, static_cast<std::int64_t>(place));
    }
    EXPECT_EQ(message.size(), size);
    EXPECT_EQ(frameOf(message), frameOf(expected));
  }
}

// There are 64 levels: 32 dictionaries and the variants in them.
TEST(EncodedDictionaryTest, NestingIsTakenUpToTheWiresLimit) {
  EncodedDictionary message;
  EncodedDictionary flat;
  flat.set("d", true);
  message.set("d", 1);
  Dictionary expected{{"d", 1}};
  for (int level = 2; level <= 32; ++level) {
    message.set("d", message);
    expected = {{"d", expected}};
  }
  EXPECT_EQ(frameOf(message), frameOf(expected));
  EXPECT_NE(frameOf(message), "no form");

  message.set("d", message);
  EXPECT_EQ(frameOf(message), "no form");
  EXPECT_EQ(message.decode(), std::nullopt);
  for (int level = 0; level < 500; ++level) {
    EncodedArray array;
    array.append(message);
    message.set("d", array);
    EXPECT_EQ(frameOf(message), "no form");
    if (message.wireForm().entries.size() > 100'000) break;
  }
  message.set("d", true);

  EXPECT_EQ(frameOf(message), frameOf(flat));
}

TEST(EncodedDictionaryTest, AMessageLongerThanTheWiresLimitHasNoForm) {
  EncodedDictionary message;
  const std::vector<std::byte> half(std::size_t{33} << 20U);
  message.set("first", half);
  EXPECT_NE(frameOf(message), "no form");

  message.set("second", half);

  EXPECT_EQ(frameOf(message), "no form");
}

TEST(EncodedDictionaryTest, DecodesToTheSameDictionary) {
  EncodedDictionary message;
  EncodedArray array;
  array.append(1);
  fill(message);
  message.set("array", array);
  Dictionary expected = filled();
  expected.set("array", Array{1});

  EXPECT_EQ(message.decode(), expected);
  EXPECT_EQ(EncodedDictionary().decode(), Dictionary());
}

// There are more keys than a dictionary compares one by one.
TEST(EncodedDictionaryTest, AnyNumberOfKeysIsFoundAgain) {
  constexpr int kKeys = 1000;
  EncodedDictionary message;
  Dictionary expected;
  const auto set = [&](int key, auto value) {
    message.set(std::to_string(key), value);
    expected.set(std::to_string(key), value);
  };
  for (int key = 0; key < kKeys; ++key) set(key, key);
  for (int key = 0; key < kKeys; key += 3) set(key, -key);
  for (int key = 1; key < kKeys; key += 7) set(key, "a text");
  for (int key = 2; key < kKeys; key += 5) {
    EXPECT_TRUE(message.remove(std::to_string(key)));
    expected.remove(std::to_string(key));
  }
  for (int key = 0; key < kKeys; key += 11) set(key, 1.5);

  EXPECT_EQ(message.size(), expected.size());
  EXPECT_EQ(frameOf(message), frameOf(expected));
}

// A message that was changed many times must be equal to a message that was made with the final
// values.
TEST(EncodedDictionaryTest, ChangesInAnyOrderGiveTheFrameOfTheResult) {
  std::mt19937 random(1);
  const auto below = [&](unsigned end) { return static_cast<unsigned>(random() % end); };
  for (int round = 0; round < 200; ++round) {
    EncodedDictionary message;
    Dictionary expected;
    const auto set = [&](const std::string& key, auto value) {
      message.set(key, value);
      expected.set(key, value);
    };
    for (int change = 0; change < 60; ++change) {
      const std::string key(1 + below(12), static_cast<char>('a' + below(3)));
      switch (below(6)) {
        case 0:
          set(key, std::int64_t{change});
          break;
        case 1:
          set(key, std::uint8_t{1});
          break;
        case 2:
          set(key, std::string(below(60), 't'));
          break;
        case 3:
          set(key, Date{1.0 * change});
          break;
        case 4:
          EXPECT_EQ(message.remove(key), expected.remove(key));
          break;
        case 5:
          set(key, change % 2 == 0);
          break;
      }
    }
    ASSERT_EQ(frameOf(message), frameOf(expected)) << round;
  }
}

}  // namespace
}  // namespace halvox::client
