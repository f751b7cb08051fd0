#include "platform/linux/store/EventNames.h"

#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(EventNamesTest, WantsNamesThatMatchOneOfThePatterns) {
  EventNames names({"com.tarno.halvox.*", "*.Stop"});
  EXPECT_TRUE(names.find("com.tarno.halvox.Session.Start")->isWanted);
  EXPECT_TRUE(names.find("com.tarno.haptics.Session.Stop")->isWanted);
  EXPECT_FALSE(names.find("com.tarno.haptics.Session.Start")->isWanted);
}

TEST(EventNamesTest, WantsNothingWithoutPatterns) {
  EventNames names({});
  EXPECT_FALSE(names.find("com.tarno.halvox.Session.Start")->isWanted);
}

TEST(EventNamesTest, UnderstandsSetsAndSingleCharacters) {
  EventNames names({"event.[ab].?"});
  EXPECT_TRUE(names.matches("event.a.1"));
  EXPECT_FALSE(names.matches("event.c.1"));
  EXPECT_FALSE(names.matches("event.a.12"));
}

TEST(EventNamesTest, GivesTheSameEntryForTheSameName) {
  EventNames names({"*"});
  EXPECT_EQ(names.find("one"), names.find("one"));
  EXPECT_NE(names.find("one"), names.find("two"));
}

TEST(EventNamesTest, GivesNoEntryToANewNameOnceItIsFull) {
  EventNames names({"*"});
  for (std::size_t index = 0; index < EventNames::kMostNames; ++index) {
    ASSERT_NE(names.find("name" + std::to_string(index)), nullptr);
  }
  EXPECT_EQ(names.find("one too many"), nullptr);
  EXPECT_NE(names.find("name0"), nullptr);
}

TEST(EventNamesTest, GivesAllThreadsTheSameEntries) {
  constexpr std::size_t kNames = 500;
  EventNames names({"*"});
  std::vector<std::vector<EventName*>> found(4, std::vector<EventName*>(kNames));
  std::vector<std::thread> threads;
  for (auto& mine : found) {
    threads.emplace_back([&names, &mine] {
      for (std::size_t index = 0; index < kNames; ++index) {
        mine[index] = names.find("name" + std::to_string(index));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (const auto& mine : found) EXPECT_EQ(mine, found.front());
}

}  // namespace
}  // namespace halvox::platform::linux_
