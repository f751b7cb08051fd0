#include "platform/fake/FakeLogService.h"

#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/services.h"

namespace halvox::platform {
namespace {

LogCategory& testCategory() {
  static LogCategory& category = log().createCategory("subsystem", "category");
  return category;
}
constexpr UnitLog kLog(&testCategory, "Unit");

struct Described {
  int& asked;
  [[nodiscard]] std::string description() const {
    ++asked;
    return "described";
  }
};

class FakeLogServiceTest : public testing::Test {
 protected:
  FakePlatform platform_;
};

TEST_F(FakeLogServiceTest, LinesHaveTheirUnitAndSourceLineBeforeTheText) {
  kLog.info("found ", 7);
  const std::uint32_t source = __LINE__ - 1;

  const FakeLogService::Line line = platform_.log.lines().front();
  std::string expected = std::string(21, ' ') + "Unit:" + std::to_string(source);
  expected.resize(32, ' ');
  EXPECT_EQ(line.line, expected + "found 7");
  EXPECT_EQ(line.text, "found 7");
  EXPECT_EQ(line.level, LogLevel::kInfo);
  EXPECT_EQ(line.subsystem, "subsystem");
  EXPECT_EQ(line.category, "category");
}

TEST_F(FakeLogServiceTest, TheTextIsFoundBehindLongPrefixesToo) {
  LogCategory& category = testCategory();
  category.write(LogLevel::kError, detail::logPrefix(std::string(40, 'u'), 1234567) + "a: b 7");
  category.write(LogLevel::kError, detail::logPrefix("u", 1) + "");
  category.write(LogLevel::kError, detail::logPrefix("u", 12345) + " 12: text");
  category.write(LogLevel::kError, "no prefix");

  EXPECT_EQ(platform_.log.texts(),
            (std::vector<std::string>{"a: b 7", "", " 12: text", "no prefix"}));
}

TEST_F(FakeLogServiceTest, LevelsAreKeptApart) {
  kLog.debug("d");
  kLog.info("i");
  kLog.notice("n");
  kLog.error("e");

  EXPECT_EQ(platform_.log.texts(), (std::vector<std::string>{"d", "i", "n", "e"}));
  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault), std::vector<std::string>{"n"});
  EXPECT_TRUE(platform_.log.containsText("i"));
  EXPECT_FALSE(platform_.log.containsText("x"));
}

TEST_F(FakeLogServiceTest, PartsAreJoinedAsTheyStand) {
  int asked = 0;
  kLog.info("a", std::string("b"), std::string_view("c"), 'd' == 'd', std::int64_t{-5},
            Described{asked}, Dictionary{{"k", 1}}, Message());

  EXPECT_EQ(platform_.log.texts().front(), "abc1-5described{k = 1}(null)");
}

TEST_F(FakeLogServiceTest, UnwantedLinesAreNotWrittenAndTheirPartsNotAsked) {
  int asked = 0;
  platform_.log.setLevel(LogLevel::kError);

  kLog.notice("n", Described{asked});
  kLog.error("e");

  EXPECT_EQ(platform_.log.texts(), std::vector<std::string>{"e"});
  EXPECT_EQ(asked, 0);
  EXPECT_FALSE(kLog.isDebugEnabled());
}

TEST_F(FakeLogServiceTest, ALineCanGoToACategoryOfTheCallersChoice) {
  UnitLog::logTo(log().createCategory("s", "chosen"), "Unit", LogLevel::kInfo, "text ", 1);

  EXPECT_EQ(platform_.log.lines().front().category, "chosen");
  EXPECT_EQ(platform_.log.lines().front().text, "text 1");
}

TEST_F(FakeLogServiceTest, OneNameIsOneCategory) {
  EXPECT_EQ(&log().createCategory("a", "b"), &log().createCategory("a", "b"));
  EXPECT_NE(&log().createCategory("a", "b"), &log().createCategory("a", "c"));
}

TEST_F(FakeLogServiceTest, LinesAreInTheJournalWithoutPrefix) {
  kLog.info("line");
  EXPECT_EQ(platform_.journal.entries(),
            (std::vector<JournalEntry>{{JournalKind::kLogLine, "line"}}));
}

TEST_F(FakeLogServiceTest, AHandlerOfTheJournalMayLog) {
  platform_.journal.whenRecorded([](const JournalEntry& entry) {
    if (entry.text == "outer") kLog.info("inner");
  });

  kLog.info("outer");
  platform_.journal.whenRecorded(nullptr);

  EXPECT_EQ(platform_.journal.texts(), (std::vector<std::string>{"outer", "inner"}));
}

TEST_F(FakeLogServiceTest, ClearForgetsTheLines) {
  kLog.info("line");
  platform_.log.clear();
  EXPECT_TRUE(platform_.log.lines().empty());
}

TEST_F(FakeLogServiceTest, AnyThreadMayLog) {
  {
    std::vector<std::jthread> threads;
    threads.reserve(4);
    for (int thread = 0; thread < 4; ++thread) {
      threads.emplace_back([] {
        for (int line = 0; line < 100; ++line) kLog.info("line ", line);
      });
    }
  }
  EXPECT_EQ(platform_.log.lines().size(), 400U);
}

TEST(FakeLogServiceLifeTest, ARememberedCategoryWritesToTheNextTestsService) {
  auto first = std::make_unique<FakePlatform>();
  kLog.info("of the first");
  first->log.setLevel(LogLevel::kError);
  first.reset();
  kLog.error("of none");

  const FakePlatform second;
  kLog.debug("of the second");

  EXPECT_EQ(second.log.texts(), std::vector<std::string>{"of the second"});
}

}  // namespace
}  // namespace halvox::platform
