#include "platform/linux/store/Retention.h"

#include <string>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::SizeIs;

constexpr double kDay = 86'400;
constexpr double kNow = 1'700'000'000;

class RetentionTest : public StoreFixture {
 protected:
  [[nodiscard]] std::uintmax_t bytesOnDisk() const {
    std::uintmax_t bytes = 0;
    for (const char* suffix : {"", "-wal"}) {
      std::error_code missing;
      const auto size = std::filesystem::file_size(database().native() + suffix, missing);
      if (!missing) bytes += size;
    }
    return bytes;
  }
};

TEST_F(RetentionTest, DeletesExpiredEventsAtTheStart) {
  start();
  sendAt(kNow - 31 * kDay, 1);
  sendAt(kNow - 29 * kDay, 2);
  sendAt(kNow, 3);
  stop();
  start();
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(2), numbered(3)));
}

TEST_F(RetentionTest, DeletesManyOldEvents) {
  start();
  for (std::int64_t number = 0; number < 20'000; ++number) sendAt(kNow - 40 * kDay, number);
  sendAt(kNow, -1);
  stop();
  start();
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(-1)));
}

TEST_F(RetentionTest, KeepsNewEventsThatWereStoredBeforeOldOnes) {
  start();
  sendAt(kNow, 1);
  sendAt(kNow - 40 * kDay, 2);
  sendAt(kNow, 3);
  stop();
  start();
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(1), numbered(3)));
}

TEST_F(RetentionTest, NumbersGrowAfterEverythingWasDeleted) {
  start();
  for (std::int64_t number = 0; number < 5000; ++number) sendAt(kNow - 40 * kDay, number);
  stop();
  platform.clock.setCurrentDate({kNow});
  start();
  stop();
  ASSERT_THAT(payloads(), SizeIs(0));
  start();
  send(1);
  stop();
  EXPECT_THAT(rows(database(), "SELECT id FROM message_blocks"), ElementsAre("5001"));
}

TEST_F(RetentionTest, StaysWithinOneMegabyteAndKeepsTheNewest) {
  options.maxMegabytes = 1;
  start();
  std::uintmax_t largest = 0;
  for (int round = 0; round < 50; ++round) {
    sendLong(400);
    ASSERT_TRUE(allIsStored());
    largest = std::max(largest, bytesOnDisk());
  }
  stop();
  EXPECT_LE(largest, 1024U * 1024U);
  EXPECT_GE(payloads().size(), 500U);
  EXPECT_TRUE(payloads().back().starts_with("{\"n\":399,"));
  EXPECT_EQ(dropped(), 0U);
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(RetentionTest, StaysWithinItsSizeUnderAFlood) {
  options.maxMegabytes = 2;
  start();
  std::uintmax_t largest = 0;
  for (int round = 0; round < 60; ++round) {
    sendLong(1000);
    largest = std::max(largest, bytesOnDisk());
  }
  stop();
  EXPECT_LE(largest, 2U * 1024U * 1024U);
  EXPECT_EQ(dropped(), 0U);
}

TEST_F(RetentionTest, ShrinksTheFileWhenTheLimitWasLowered) {
  options.maxMegabytes = 32;
  start();
  sendLong(26'000);
  stop();
  ASSERT_GT(bytesOnDisk(), 8U * 1024U * 1024U);

  options.maxMegabytes = 1;
  start();
  ASSERT_TRUE(eventually([this] { return bytesOnDisk() <= 1024U * 1024U; }));
  stop();
  EXPECT_LE(bytesOnDisk(), 1024U * 1024U);
  EXPECT_TRUE(payloads().back().starts_with("{\"n\":25999,"));
}

// A trigger makes the step fail. RAISE(ROLLBACK) ends the transaction, RAISE(ABORT) leaves it open.
TEST_F(RetentionTest, LogsWhyAStepFailedAndUndoesTheStep) {
  for (const std::string how : {"ABORT", "ROLLBACK"}) {
    SCOPED_TRACE(how);
    options.directory = scratch.path() / how;
    start();
    sendAt(kNow - 40 * kDay, 1);
    stop();
    std::string trigger = "CREATE TRIGGER keep BEFORE DELETE ON message_blocks BEGIN SELECT RAISE(";
    trigger.append(how).append(", 'kept by a test (").append(how).append(")'); END");
    execute(database(), trigger);
    start();
    stop();

    EXPECT_THAT(platform.log.texts(LogLevel::kError),
                Contains(HasSubstr("cannot delete old records: kept by a test (" + how)));
    EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
