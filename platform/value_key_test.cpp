#include <cstdlib>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/value.h"

namespace halvox::platform {
namespace {

// Made before any test, because some tests fill the table of interned keys.
const Key kUsual("a key of some length");
const Key kLongestInterned(std::string(128, 'x'));

TEST(KeyTest, EqualTextsShareOneNode) {
  const Key first("a key of some length");
  const Key second(std::string("a key of some length"));
  EXPECT_EQ(first, second);
  EXPECT_EQ(first.text().data(), second.text().data());
  EXPECT_EQ(first.text().data(), kUsual.text().data());
  EXPECT_TRUE(first.isInterned());
  EXPECT_EQ(first.memorySize(), 0U);
}

TEST(KeyTest, DifferentTextsAreDifferent) {
  EXPECT_NE(Key("a"), Key("b"));
  EXPECT_NE(Key("a"), Key("A"));
  EXPECT_NE(Key("a"), Key(std::string("a\0", 2)));
  EXPECT_NE(Key(""), Key(" "));
}

TEST(KeyTest, KnowsWhetherItHasABlank) {
  EXPECT_TRUE(Key("a b").hasBlank());
  EXPECT_TRUE(Key(" ").hasBlank());
  EXPECT_FALSE(Key("a\tb").hasBlank());
  EXPECT_FALSE(Key("").hasBlank());
  EXPECT_TRUE(Key(std::string(500, 'x') + " ").hasBlank());
}

TEST(KeyTest, LongTextsOwnTheirMemory) {
  const std::string text(129, 'x');
  const Key first(text);
  const Key second(text);
  EXPECT_FALSE(first.isInterned());
  EXPECT_GE(first.memorySize(), text.size());
  EXPECT_EQ(first, second);
  EXPECT_EQ(first.hash(), second.hash());
  EXPECT_NE(first.text().data(), second.text().data());
  EXPECT_TRUE(kLongestInterned.isInterned());
}

TEST(KeyTest, CopiesOfALongKeyShareItsText) {
  const Key key(std::string(200, 'x'));
  const Key copy = key;  // NOLINT(performance-unnecessary-copy-initialization): tested
  EXPECT_EQ(copy.text().data(), key.text().data());
}

TEST(KeyTest, MovedFromKeysCanBeAssignedAndDestroyed) {
  for (const std::size_t length : {3U, 200U}) {
    Key key(std::string(length, 'x'));
    const Key moved = std::move(key);
    key = moved;  // NOLINT(bugprone-use-after-move): tested
    EXPECT_EQ(key, moved);
    const Key movedAgain = std::move(key);
    EXPECT_EQ(movedAgain.text().size(), length);
  }
}

TEST(KeyTest, SelfAssignmentKeepsTheText) {
  Key key(std::string(200, 'x'));
  Key& alias = key;
  key = alias;
  EXPECT_EQ(key.text(), std::string(200, 'x'));
}

// Runs in a child process, because it fills the table, which all tests of a process share. Exits
// with 0 if all checks hold.
[[noreturn]] void fillTheTable() {
  const Key early("early");
  std::size_t interned = 0;
  std::vector<Key> keys;
  for (int number = 0; number < 20'000; ++number) {
    keys.emplace_back("filling key " + std::to_string(number));
    if (keys.back().isInterned()) ++interned;
  }
  const Key late("late");
  const Key lateAgain("late");
  const Dictionary dictionary{{late, 1}, {early, 2}};
  const std::vector<bool> facts = {
      interned >= 2048 && interned <= 4096,  // bounded, but still useful
      !late.isInterned(),
      late == lateAgain && late != early,
      Key("early").isInterned() && Key("early") == early,
      *dictionary.find("late") == Value(1) && *dictionary.find(lateAgain) == Value(1),
      *dictionary.find("early") == Value(2),
  };
  int wrong = 0;
  for (std::size_t fact = 0; fact < facts.size(); ++fact) {
    if (!facts[fact]) wrong |= 1 << fact;
  }
  std::_Exit(wrong);
}

TEST(KeyDeathTest, AFullTableIsBoundedAndLaterKeysWorkTheSame) {
  EXPECT_EXIT(fillTheTable(), testing::ExitedWithCode(0), "");
}

TEST(KeyTest, AnInternedKeyDiffersFromALongerOneThatIsNot) {
  const Key longer(std::string(129, 'x'));
  EXPECT_NE(kLongestInterned, longer);
  EXPECT_NE(longer, kLongestInterned);
}

}  // namespace
}  // namespace halvox::platform
