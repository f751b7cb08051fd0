#include "platform/linux/log/LogMemory.h"

#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/log/LogLineFormatter.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Le;

LogEntry entryOf(std::string_view line, LogLevel level = LogLevel::kInfo) {
  return {.time = std::chrono::system_clock::time_point{},
          .level = level,
          .subsystem = "com.tarno.halvox",
          .category = "test",
          .text = {},
          .wholeLength = line.size()};
}

void add(LogMemory& memory, std::string_view line) { memory.add(entryOf(line), line); }

// The text after the last blank of each line.
std::vector<std::string> words(const LogMemory& memory) {
  const std::string text = memory.contents().text;
  std::vector<std::string> found;
  for (std::size_t begin = 0; begin < text.size();) {
    const std::size_t end = text.find('\n', begin);
    const std::size_t blank = text.rfind(' ', end);
    found.push_back(text.substr(blank + 1, end - blank - 1));
    begin = end + 1;
  }
  return found;
}

TEST(LogMemoryTest, ShowsLinesAsALogFileDoesOldestFirst) {
  LogMemory memory(LogLevel::kInfo);

  add(memory, "the first");
  memory.add(entryOf("the\tsecond", LogLevel::kError), "the\tsecond");

  const LogMemory::Contents contents = memory.contents();
  EXPECT_EQ(contents.lines, 2U);
  EXPECT_THAT(contents.text, AllOf(HasSubstr(" info [com.tarno.halvox:test] the first\n"),
                                   EndsWith(" error [com.tarno.halvox:test] the\\tsecond\n")));
}

TEST(LogMemoryTest, KeepsOnlyTheNewestLines) {
  LogMemory memory(LogLevel::kInfo, {.lines = 3, .bytes = 1000});

  for (const char* line : {"a", "b", "c", "d", "e"}) add(memory, line);

  EXPECT_THAT(words(memory), ElementsAre("c", "d", "e"));
  EXPECT_EQ(memory.contents().added, 5U);
}

TEST(LogMemoryTest, KeepsTenThousandLinesByDefault) {
  LogMemory memory(LogLevel::kInfo);
  const std::string line(200, 'a');

  for (int count = 0; count < 10'001; ++count) add(memory, line);

  EXPECT_EQ(memory.contents().lines, 10'000U);
}

TEST(LogMemoryTest, OldestLinesMakeRoomWhenTheBytesAreUsedUp) {
  LogMemory memory(LogLevel::kInfo, {.lines = 100, .bytes = 10});

  for (const char* line : {"aaaa", "bbbb", "cccc"}) add(memory, line);

  // The third text overwrites the first one at the start of the ring. The second one stays as it
  // is.
  EXPECT_THAT(words(memory), ElementsAre("bbbb", "cccc"));
}

TEST(LogMemoryTest, LineLongerThanAllTheRoomIsCutAndSaysSo) {
  LogMemory memory(LogLevel::kInfo, {.lines = 100, .bytes = 4});

  add(memory, "abcdefgh");

  EXPECT_THAT(memory.contents().text, EndsWith("abcd… (4 bytes more)\n"));
}

TEST(LogMemoryTest, EmptyLinesAndLinesOfEveryLengthKeepTheirTexts) {
  LogMemory memory(LogLevel::kInfo, {.lines = 50, .bytes = 97});
  std::vector<std::string> added;

  for (std::size_t number = 0; number < 1000; ++number) {
    added.push_back(std::string(number * 7 % 31, static_cast<char>('a' + number % 26)));
    add(memory, added.back());
    const std::vector<std::string> kept = words(memory);
    ASSERT_FALSE(kept.empty());
    ASSERT_TRUE(std::equal(kept.rbegin(), kept.rend(), added.rbegin())) << number;
  }
}

TEST(LogMemoryTest, ManyThreadsAddWhileAnotherReads) {
  LogMemory memory(LogLevel::kDebug, {.lines = 1000, .bytes = 20'000});
  std::vector<std::thread> threads;

  for (int number = 0; number < 4; ++number) {
    threads.emplace_back([&memory, number] {
      const std::string line(static_cast<std::size_t>(10 + number * 10), 'x');
      for (int count = 0; count < 5000; ++count) add(memory, line);
    });
  }
  for (int count = 0; count < 20; ++count) EXPECT_THAT(memory.contents().lines, Le(1000U));
  for (std::thread& thread : threads) thread.join();

  EXPECT_EQ(memory.contents().added, 20'000U);
}

}  // namespace
}  // namespace halvox::platform::linux_
