#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <functional>
#include <map>
#include <random>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

std::vector<std::string> keysOf(const Dictionary& dictionary) {
  std::vector<std::string> keys;
  for (const Dictionary::Entry& entry : dictionary) keys.emplace_back(entry.key.text());
  return keys;
}

// A dictionary with the keys "key 0", "key 1" and so on, and their numbers as values.
Dictionary numbered(int count) {
  Dictionary dictionary;
  for (int number = 0; number < count; ++number) {
    dictionary.set("key " + std::to_string(number), number);
  }
  return dictionary;
}

// --- Content ------------------------------------------------------------------------------------

TEST(DictionaryTest, FindsWhatWasSet) {
  const Dictionary dictionary{{"a", 1}, {"b", "text"}};
  ASSERT_NE(dictionary.find("a"), nullptr);
  EXPECT_EQ(*dictionary.find("a"), Value(1));
  EXPECT_EQ(*dictionary.find(Key("b")), Value("text"));
  EXPECT_EQ(dictionary.find("c"), nullptr);
  EXPECT_EQ(dictionary.find(Key("c")), nullptr);
  EXPECT_TRUE(dictionary.contains("a"));
  EXPECT_FALSE(dictionary.contains("A"));
}

TEST(DictionaryTest, AnEmptyOneHasNothing) {
  const Dictionary dictionary;
  EXPECT_TRUE(dictionary.empty());
  EXPECT_EQ(dictionary.begin(), dictionary.end());
  EXPECT_EQ(dictionary.find("a"), nullptr);
  EXPECT_EQ(dictionary.memorySize(), 0U);
}

TEST(DictionaryTest, EntriesKeepTheOrderInWhichTheirKeysWereFirstSet) {
  Dictionary dictionary{{"c", 1}, {"a", 2}, {"b", 3}};
  dictionary.set("a", 4);
  dictionary.set("d", 5);
  EXPECT_EQ(keysOf(dictionary), (std::vector<std::string>{"c", "a", "b", "d"}));
  EXPECT_EQ(*dictionary.find("a"), Value(4));
}

TEST(DictionaryTest, ALaterEntryOfAListReplacesAnEarlierOne) {
  EXPECT_EQ((Dictionary{{"a", 1}, {"a", 2}}), (Dictionary{{"a", 2}}));
}

TEST(DictionaryTest, RemovingKeepsTheOrderOfTheRest) {
  Dictionary dictionary{{"a", 1}, {"b", 2}, {"c", 3}};
  EXPECT_TRUE(dictionary.remove("b"));
  EXPECT_FALSE(dictionary.remove("b"));
  EXPECT_EQ(keysOf(dictionary), (std::vector<std::string>{"a", "c"}));
  dictionary.set("b", 4);
  EXPECT_EQ(keysOf(dictionary), (std::vector<std::string>{"a", "c", "b"}));
}

TEST(DictionaryTest, TheEmptyTextAndTextsWithZeroBytesAreKeys) {
  const std::string zero("a\0b", 3);
  const Dictionary dictionary{{"", 1}, {zero, 2}, {"a", 3}};
  EXPECT_EQ(*dictionary.find(""), Value(1));
  EXPECT_EQ(*dictionary.find(zero), Value(2));
  EXPECT_EQ(*dictionary.find("a"), Value(3));
}

// --- Equality -----------------------------------------------------------------------------------

TEST(DictionaryTest, ComparesEntriesInAnyOrder) {
  EXPECT_EQ((Dictionary{{"a", 1}, {"b", 2}}), (Dictionary{{"b", 2.0}, {"a", true}}));
  EXPECT_NE((Dictionary{{"a", 1}, {"b", 2}}), (Dictionary{{"a", 1}, {"b", 3}}));
  EXPECT_NE((Dictionary{{"a", 1}, {"b", 2}}), (Dictionary{{"a", 1}, {"c", 2}}));
  EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"a", 1}, {"b", 2}}));
}

TEST(DictionaryTest, LargeOnesCompareInAnyOrder) {
  const Dictionary forward = numbered(1000);
  Dictionary backward;
  for (const Dictionary::Entry* entry = forward.end(); entry != forward.begin();) {
    --entry;
    backward.set(entry->key, entry->value);
  }
  EXPECT_EQ(forward, backward);
  backward.set("key 500", 0);
  EXPECT_NE(forward, backward);
}

// --- Sharing ------------------------------------------------------------------------------------

TEST(DictionaryTest, CopiesShareUntilOneIsChanged) {
  const Dictionary original{{"a", 1}};
  Dictionary copy = original;
  EXPECT_TRUE(copy.isIdenticalTo(original));

  copy.set("a", 2);

  EXPECT_FALSE(copy.isIdenticalTo(original));
  EXPECT_EQ(*original.find("a"), Value(1));
  EXPECT_EQ(*copy.find("a"), Value(2));
}

TEST(DictionaryTest, NoChangeOfACopyIsSeenInTheOriginal) {
  for (const int size : {1, 16, 17, 100}) {
    const Dictionary original = numbered(size);
    Dictionary added = original;
    added.set("new", 1);
    Dictionary removed = original;
    removed.remove("key 0");
    Dictionary merged = original;
    merged.merge({{"key 0", "other"}, {"x", 1}});
    EXPECT_EQ(original, numbered(size));
    EXPECT_EQ(added.size(), original.size() + 1);
    EXPECT_EQ(removed.size(), original.size() - 1);
    EXPECT_EQ(*merged.find("key 0"), Value("other"));
  }
}

TEST(DictionaryTest, ADictionaryCanHoldAnOlderStateOfItself) {
  Dictionary dictionary{{"a", 1}};
  dictionary.set("self", dictionary);
  EXPECT_EQ(dictionary, (Dictionary{{"a", 1}, {"self", Dictionary{{"a", 1}}}}));
}

TEST(DictionaryTest, AKeyOrValueOfItsOwnCanBeSet) {
  Dictionary dictionary = numbered(4);  // no capacity for a fifth entry
  dictionary.set("copy", *dictionary.find("key 3"));
  dictionary.set(dictionary.begin()->key, (dictionary.begin() + 1)->value);
  EXPECT_EQ(*dictionary.find("copy"), Value(3));
  EXPECT_EQ(*dictionary.find("key 0"), Value(1));
}

TEST(DictionaryTest, AnEntryBehindAllOthersNeedsNoCopy) {
  Dictionary original;
  original.reserve(3);
  original.set("a", 1);
  original.set("b", 2);
  Dictionary tagged = original;

  tagged.set("c", "a text that is too long to be in its value");

  EXPECT_EQ(tagged.begin(), original.begin());
  EXPECT_EQ(original, (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_FALSE(original.contains("c"));
  EXPECT_EQ(keysOf(tagged), (std::vector<std::string>{"a", "b", "c"}));
  EXPECT_FALSE(tagged.isIdenticalTo(original));
  EXPECT_NE(tagged, original);
}

TEST(DictionaryTest, OnlyOneHolderGetsTheEntryBehindAllOthers) {
  Dictionary original;
  original.reserve(3);
  original.set("a", 1);
  Dictionary first = original;
  Dictionary second = original;

  first.set("b", 1);
  second.set("b", 2);
  original.set("c", 3);

  EXPECT_EQ(first, (Dictionary{{"a", 1}, {"b", 1}}));
  EXPECT_EQ(second, (Dictionary{{"a", 1}, {"b", 2}}));
  EXPECT_EQ(original, (Dictionary{{"a", 1}, {"c", 3}}));
}

TEST(DictionaryTest, TheEntryOfAHolderThatIsGoneIsReplaced) {
  Dictionary original;
  original.reserve(3);
  original.set("a", 1);
  {
    Dictionary tagged = original;
    tagged.set("b", "a text that is too long to be in its value");
  }
  original.set("c", 3);
  EXPECT_EQ(original, (Dictionary{{"a", 1}, {"c", 3}}));
}

TEST(DictionaryTest, AValueKeepsHowManyEntriesAreItsOwn) {
  Dictionary original;
  original.reserve(2);
  original.set("a", 1);
  const Value value = original;
  original.set("b", 2);
  EXPECT_EQ(value, Value(Dictionary{{"a", 1}}));
  EXPECT_EQ(value.dictionary().size(), 1U);
  EXPECT_EQ(Value(original).dictionary().size(), 2U);
}

// AddressSanitizer reports a leak here.
TEST(DictionaryTest, AnOlderStateOfItselfIsNotPutIntoTheSameMemory) {
  Dictionary dictionary;
  dictionary.reserve(4);
  dictionary.set("a", 1);
  dictionary.set("self", dictionary);
  dictionary.set("list", Array{dictionary});
  EXPECT_EQ(dictionary.find("self")->dictionary(), (Dictionary{{"a", 1}}));
  EXPECT_EQ(dictionary.find("list")->array()[0].dictionary().size(), 2U);
}

TEST(DictionaryTest, ManyHoldersUnderRandomChangesKeepTheirOwnContent) {
  using Model = std::map<std::string, int>;
  std::mt19937 random(5);  // the same values in every run
  std::vector<std::pair<Dictionary, Model>> holders(8);
  for (int round = 0; round < 20'000; ++round) {
    auto& [dictionary, model] = holders[random() % holders.size()];
    const std::string key = std::to_string(random() % 20);
    switch (random() % 5) {
      case 0:
        holders[random() % holders.size()] = std::pair(dictionary, model);
        break;
      case 1:
        ASSERT_EQ(dictionary.remove(key), model.erase(key) == 1);
        break;
      case 2:
        dictionary.reserve(dictionary.size() + 4);
        break;
      default:
        dictionary.set(key, round);
        model[key] = round;
    }
    for (const auto& [held, expected] : holders) {
      ASSERT_EQ(held.size(), expected.size());
      for (const Dictionary::Entry& entry : held) {
        ASSERT_EQ(entry.value, Value(expected.at(std::string(entry.key.text()))));
      }
    }
  }
}

// --- Merging ------------------------------------------------------------------------------------

TEST(DictionaryTest, MergingSetsEveryEntryOfTheOther) {
  Dictionary dictionary{{"a", 1}, {"b", 2}};
  dictionary.merge({{"c", 3}, {"b", 4}});
  EXPECT_EQ(dictionary, (Dictionary{{"a", 1}, {"b", 4}, {"c", 3}}));
  EXPECT_EQ(keysOf(dictionary), (std::vector<std::string>{"a", "b", "c"}));
}

TEST(DictionaryTest, MergingWithItselfChangesNothing) {
  for (const int size : {0, 1, 16, 17, 1000}) {
    Dictionary dictionary = numbered(size);
    dictionary.merge(dictionary);
    EXPECT_EQ(dictionary, numbered(size));
  }
}

TEST(DictionaryTest, MergingIntoAnEmptyOneSharesTheOther) {
  const Dictionary other{{"a", 1}};
  Dictionary dictionary;
  dictionary.merge(other);
  EXPECT_TRUE(dictionary.isIdenticalTo(other));
}

// --- Large dictionaries -------------------------------------------------------------------------

TEST(DictionaryTest, EverySizeAroundTheIndexFindsAllKeys) {
  for (int size = 0; size <= 70; ++size) {
    const Dictionary dictionary = numbered(size);
    for (int number = 0; number < size; ++number) {
      const std::string key = "key " + std::to_string(number);
      ASSERT_NE(dictionary.find(key), nullptr) << size << " " << key;
      ASSERT_EQ(*dictionary.find(Key(key)), Value(number));
    }
    ASSERT_EQ(dictionary.find("key " + std::to_string(size)), nullptr);
  }
}

TEST(DictionaryTest, TenThousandKeysAreAllFoundInACopyToo) {
  constexpr int kKeys = 10'000;
  const Dictionary original = numbered(kKeys);
  Dictionary copy = original;
  copy.set("one more", 1);
  for (int number = 0; number < kKeys; ++number) {
    const std::string key = "key " + std::to_string(number);
    ASSERT_EQ(*original.find(key), Value(number));
    ASSERT_EQ(*copy.find(key), Value(number));
  }
  EXPECT_EQ(copy.size(), kKeys + 1U);
}

TEST(DictionaryTest, RemovalFromALargeOneBringsItBelowTheIndexAndBack) {
  Dictionary dictionary = numbered(40);
  for (int number = 0; number < 35; ++number) {
    ASSERT_TRUE(dictionary.remove("key " + std::to_string(number)));
    ASSERT_FALSE(dictionary.contains("key " + std::to_string(number)));
    ASSERT_TRUE(dictionary.contains("key 39"));
  }
  EXPECT_EQ(keysOf(dictionary),
            (std::vector<std::string>{"key 35", "key 36", "key 37", "key 38", "key 39"}));
  dictionary.merge(numbered(40));
  EXPECT_EQ(dictionary, numbered(40));
}

TEST(DictionaryTest, BehavesAsAMapUnderRandomChanges) {
  std::mt19937 random(3);  // the same values in every run
  Dictionary dictionary;
  std::map<std::string, int> model;
  std::vector<Dictionary> holders;  // hold earlier states, so that changes have to copy
  for (int round = 0; round < 20'000; ++round) {
    const std::string key = std::to_string(random() % 60);
    if (random() % 3 == 0) {
      ASSERT_EQ(dictionary.remove(key), model.erase(key) == 1);
    } else {
      dictionary.set(key, round);
      model[key] = round;
    }
    if (random() % 10 == 0) holders.assign(1, dictionary);
    ASSERT_EQ(dictionary.size(), model.size());
    const auto expected = model.find(key);
    const Value* found = dictionary.find(key);
    ASSERT_EQ(found != nullptr, expected != model.end());
    if (found != nullptr) {
      ASSERT_EQ(*found, Value(expected->second));
    }
  }
}

// Texts that all have the same std::hash: the first half is arbitrary, and the second half cancels
// it. The hash is MurmurHash64A with the seed of this standard library. All of its steps but the
// last can be inverted.
std::string collidingKey(std::uint64_t number) {
  constexpr std::uint64_t kFactor = 0xc6a4a7935bd1e995U;
  constexpr std::uint64_t kInverse = 0x5f7a0ea7e59b19bdU;
  static_assert(kFactor * kInverse == 1);
  constexpr std::uint64_t kLength = 16;
  constexpr std::uint64_t kStart = 0xc70f6907U ^ (kLength * kFactor);
  const auto mix = [](std::uint64_t word) {
    word *= kFactor;
    word ^= word >> 47U;
    return word * kFactor;
  };
  const auto undoMix = [](std::uint64_t word) {
    word *= kInverse;
    word ^= word >> 47U;
    return word * kInverse;
  };
  const std::uint64_t afterFirst = (kStart ^ mix(number)) * kFactor;
  const std::uint64_t second = undoMix(afterFirst);  // brings the state to 0
  std::string key(kLength, '\0');
  std::memcpy(key.data(), &number, sizeof number);
  std::memcpy(key.data() + sizeof number, &second, sizeof second);
  return key;
}

TEST(DictionaryTest, KeysThatWereMadeToCollideCostAboutWhatOthersCost) {
  constexpr std::uint64_t kKeys = 20'000;
  const auto timeToFill = [](const auto& keyOf) {
    const auto begin = std::chrono::steady_clock::now();
    Dictionary dictionary;
    for (std::uint64_t number = 0; number < kKeys; ++number) dictionary.set(keyOf(number), 1);
    return std::chrono::steady_clock::now() - begin;
  };
  ASSERT_EQ(std::hash<std::string>{}(collidingKey(1)), std::hash<std::string>{}(collidingKey(2)));

  const auto ordinary =
      timeToFill([](std::uint64_t number) { return "ordinary " + std::to_string(number); });
  const auto colliding = timeToFill(collidingKey);

  // Comparing each key with all colliding keys would take hundreds of times as long.
  EXPECT_LT(colliding, 20 * ordinary);
}

// --- Memory -------------------------------------------------------------------------------------

TEST(DictionaryTest, RoomThatWasReservedIsEnough) {
  Dictionary dictionary;
  dictionary.reserve(10);
  const std::size_t before = dictionary.memorySize();
  for (int number = 0; number < 10; ++number) dictionary.set(std::to_string(number), number);
  EXPECT_EQ(dictionary.memorySize(), before);
}

TEST(DictionaryTest, ReservingLessThanThereIsChangesNothing) {
  Dictionary dictionary = numbered(20);
  dictionary.reserve(0);
  dictionary.reserve(5);
  EXPECT_EQ(dictionary, numbered(20));
}

// Made before any test, because some tests fill the table of interned keys.
const std::vector<Key> kFields = {"field 1", "field 2", "field 3", "field 4", "field 5",
                                  "field 6", "field 7", "field 8", "field 9", "session_name"};
const Key kTimestamp("hvreporting_timestamp");
const Key kSystemUptime("systemuptime_sec");
const Key kProcessUptime("processuptime_ms");
const Key kTag("audiotag");

TEST(DictionaryTest, ATenFieldMessageWithStampsAndTagTakesFourHundredBytes) {
  Dictionary message;
  message.reserve(10);
  for (const Key& field : kFields) message.set(field, 1.5);
  message.set("session_name", "a short text");
  Dictionary stamped = message;
  stamped.reserve(13);
  stamped.set(kTimestamp, 1'700'000'000.25);
  stamped.set(kSystemUptime, 86'400);
  stamped.set(kProcessUptime, std::int64_t{60'000});
  Dictionary tagged = stamped;
  tagged.set(kTag, "Session_PlaybackStart");

  EXPECT_EQ(tagged.size(), 14U);
  EXPECT_LE(tagged.memorySize(), 400U);
}

TEST(DictionaryTest, SharedEntriesAreThoseThatBothHaveInOneBlock) {
  Dictionary message;
  message.reserve(4);
  message.set("a", 1);
  message.set("b", 2);
  Dictionary tagged = message;
  tagged.set("c", 3);
  const Dictionary equal{{"a", 1}, {"b", 2}};
  Dictionary changed = message;
  changed.set("a", 5);

  EXPECT_EQ(message.sharedEntries(tagged), 2U);
  EXPECT_EQ(tagged.sharedEntries(message), 2U);
  EXPECT_EQ(message.sharedEntries(message), 2U);
  EXPECT_EQ(message.sharedEntries(equal), 0U);
  EXPECT_EQ(message.sharedEntries(changed), 0U);
  EXPECT_EQ(Dictionary().sharedEntries(Dictionary()), 0U);
}

// --- Texts in the memory of the dictionary ------------------------------------------------------

// Makes a dictionary from lent texts, which are gone when it returns.
Dictionary withTexts(std::size_t more) {
  std::string first = "a text of twenty-odd bytes";
  std::string second = "a second text of the same kind";
  std::vector<Dictionary::Entry> entries;
  entries.push_back({"number", 1});
  entries.push_back({"first", Value::lending(first)});
  entries.push_back({"short", Value::lending("short")});
  entries.push_back({"second", Value::lending(second)});
  Dictionary dictionary(entries, more);
  first.assign(first.size(), '-');
  second.assign(second.size(), '-');
  return dictionary;
}

void expectTexts(const Dictionary& dictionary) {
  ASSERT_NE(dictionary.find("first"), nullptr);
  ASSERT_NE(dictionary.find("second"), nullptr);
  EXPECT_EQ(dictionary.find("first")->string(), "a text of twenty-odd bytes");
  EXPECT_EQ(dictionary.find("second")->string(), "a second text of the same kind");
}

TEST(DictionaryTextsTest, AreCopiedIntoTheDictionary) {
  const Dictionary dictionary = withTexts(0);

  expectTexts(dictionary);
  EXPECT_EQ(keysOf(dictionary), (std::vector<std::string>{"number", "first", "short", "second"}));
  const auto* const end = reinterpret_cast<const char*>(dictionary.end());
  EXPECT_EQ(static_cast<const void*>(dictionary.find("first")->string().data()), end);
}

TEST(DictionaryTextsTest, StayWhenEntriesAreAddedInTheRoomThatWasMade) {
  Dictionary dictionary = withTexts(2);
  const Dictionary::Entry* const before = dictionary.begin();

  dictionary.add("more", 1);
  dictionary.add("and more", 2);

  EXPECT_EQ(dictionary.begin(), before);
  expectTexts(dictionary);
}

TEST(DictionaryTextsTest, MoveWithADictionaryThatGrows) {
  Dictionary dictionary = withTexts(0);

  for (int number = 0; number < 40; ++number) dictionary.set("key " + std::to_string(number), 1);

  expectTexts(dictionary);
  EXPECT_EQ(dictionary.size(), 44U);
}

TEST(DictionaryTextsTest, AreCopiedWithASharedDictionary) {
  Dictionary copy;
  {
    const Dictionary original = withTexts(0);
    copy = original;
    copy.set("number", 2);
    EXPECT_EQ(original.find("number")->toInt64(), 1);
    EXPECT_NE(copy.find("first")->string().data(), original.find("first")->string().data());
  }
  expectTexts(copy);
}

TEST(DictionaryTextsTest, OutliveTheirEntryAndTheirDictionary) {
  Dictionary dictionary = withTexts(0);
  const Value copy = *dictionary.find("first");

  dictionary.remove("first");
  EXPECT_EQ(dictionary.find("second")->string(), "a second text of the same kind");
  dictionary.set("second", "other");
  dictionary = {};

  EXPECT_EQ(copy.string(), "a text of twenty-odd bytes");
}

TEST(DictionaryTextsTest, AreMergedAsTextsOfTheirOwn) {
  Dictionary merged;
  {
    const Dictionary dictionary = withTexts(0);
    merged.merge(dictionary);
    EXPECT_FALSE(merged.isIdenticalTo(dictionary));
  }
  expectTexts(merged);
  // Copies of such a value share its text.
  const Value copy = *merged.find("first");
  EXPECT_TRUE(copy.isIdenticalTo(*merged.find("first")));
}

TEST(DictionaryTextsTest, CountOnceAsMemory) {
  const Dictionary dictionary = withTexts(0);
  Dictionary owning;
  owning.reserve(4);
  for (const Dictionary::Entry& entry : dictionary) owning.set(entry.key, entry.value);

  EXPECT_GE(dictionary.memorySize(), 4 * sizeof(Dictionary::Entry) + 56);
  EXPECT_LE(dictionary.memorySize(), owning.memorySize());
}

TEST(DictionaryTextsTest, DictionaryOfManyEntriesHasAnIndex) {
  std::string text(20, 't');
  std::vector<Dictionary::Entry> entries;
  for (int number = 0; number < 100; ++number) {
    entries.push_back({"key " + std::to_string(number), Value::lending(text)});
  }
  const Dictionary dictionary(entries, 3);
  text.assign(20, '-');

  for (int number = 0; number < 100; ++number) {
    const Value* const found = dictionary.find("key " + std::to_string(number));
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(found->string(), std::string(20, 't'));
  }
  EXPECT_TRUE(Dictionary(std::span<Dictionary::Entry>(), 3).empty());
}

}  // namespace
}  // namespace halvox::platform
