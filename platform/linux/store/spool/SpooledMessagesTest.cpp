#include "platform/linux/store/spool/SpooledMessages.h"

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/spool/SqliteLinkSpool.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr double kNow = 1'700'000'000;

class SpooledMessagesTest : public StoreFixture {
 protected:
  SpooledMessagesTest() { platform.clock.setCurrentDate({kNow}); }

  void begin() {
    start();
    spool = std::make_unique<SqliteLinkSpool>(*store);
  }
  void end() {
    spool.reset();
    stop();
  }
  void append(std::int64_t number, const std::string& body = "{}") {
    ASSERT_NE(spool->append({.subject = "s", .identifier = std::to_string(number), .body = body}),
              0U);
  }
  void appendStored(std::int64_t first, std::int64_t count) {
    for (std::int64_t number = first; number < first + count; ++number) append(number);
    ASSERT_TRUE(eventually([&] { return !spool->hasUnstored(); }));
  }
  std::vector<std::string> identifiers() {
    std::vector<std::string> found;
    for (LinkSpool::Number after = 0;;) {
      const auto read = spool->readAfter(after);
      EXPECT_TRUE(read) << read.error().message;
      if (!read || read->through == after) return found;
      for (const auto& [number, message] : read->messages) found.push_back(message.identifier);
      after = read->through;
    }
  }
  [[nodiscard]] std::uint64_t spooled(std::string_view name) const {
    return platform.statistics.value("link spool", name);
  }

  std::unique_ptr<SqliteLinkSpool> spool;
};

TEST_F(SpooledMessagesTest, KeepsMessagesFromOneRunToTheNext) {
  begin();
  appendStored(1, 3);
  end();
  begin();

  EXPECT_EQ(spool->lastAppended(), 3U);
  EXPECT_FALSE(spool->hasUnstored());
  appendStored(4, 1);
  EXPECT_THAT(identifiers(), ElementsAre("1", "2", "3", "4"));
}

TEST_F(SpooledMessagesTest, KnowsAfterARestartWhatWasSentOfARow) {
  begin();
  appendStored(1, 5);
  spool->removeThrough(2);
  end();

  EXPECT_THAT(rows(database(),
                   "SELECT first + messages - 1 - sent FROM link_spool"
                   " WHERE first + sent <= 3 ORDER BY first LIMIT 1"),
              ::testing::SizeIs(1));
  begin();
  EXPECT_THAT(identifiers(), ElementsAre("3", "4", "5"));
}

TEST_F(SpooledMessagesTest, LeavesNoRowWhenEverythingWasSent) {
  begin();
  appendStored(1, 2000);
  spool->removeThrough(spool->lastAppended());
  end();

  EXPECT_THAT(rows(database(), "SELECT count(*) FROM link_spool"), ElementsAre("0"));
}

TEST_F(SpooledMessagesTest, ForgetsMessagesThatAreNotStoredYet) {
  begin();
  for (std::int64_t number = 1; number <= 9000; ++number) {
    append(number);
    if (number % 1000 == 0) spool->removeThrough(static_cast<LinkSpool::Number>(number));
  }
  end();

  EXPECT_THAT(rows(database(), "SELECT count(*) FROM link_spool"), ElementsAre("0"));
}

TEST_F(SpooledMessagesTest, PacksManyMessagesIntoOneRow) {
  begin();
  for (std::int64_t number = 0; number < 3000; ++number) append(number);
  ASSERT_TRUE(eventually([&] { return !spool->hasUnstored(); }));

  EXPECT_EQ(identifiers().size(), 3000U);
  EXPECT_LT(std::stoi(rows(database(), "SELECT count(*) FROM link_spool").front()), 1000);
  EXPECT_EQ(spooled("stored"), 3000U);
}

TEST_F(SpooledMessagesTest, DropsAndCountsWhatCannotBeWritten) {
  begin();
  appendStored(1, 1);
  Database other;
  ASSERT_EQ(other.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
  ASSERT_TRUE(eventually([&] { return other.execute("BEGIN IMMEDIATE") == SQLITE_OK; }));

  append(2);

  ASSERT_TRUE(eventually([&] { return spooled("dropped: database locked") == 1; }));
  EXPECT_FALSE(spool->canKeep());
  EXPECT_FALSE(spool->hasUnstored()) << "nobody must wait for a dropped message";
  ASSERT_EQ(other.execute("ROLLBACK"), SQLITE_OK);
  appendStored(3, 1);
  EXPECT_TRUE(spool->canKeep());
  EXPECT_THAT(identifiers(), ElementsAre("1", "3"));
}

TEST_F(SpooledMessagesTest, DropsOnlyTheMessageThatIsTooLong) {
  options.maxMegabytes = 16;
  begin();
  append(1);
  append(2, std::string(StoreSizes::of(options.maxMegabytes).payloadBytes, 'x'));
  append(3);
  ASSERT_TRUE(eventually([&] { return !spool->hasUnstored(); }));

  EXPECT_THAT(identifiers(), ElementsAre("1", "3"));
  EXPECT_EQ(spooled("dropped: too large"), 1U);
}

TEST_F(SpooledMessagesTest, CountsTheUnsentMessagesThatRetentionDeletes) {
  options.retentionDays = 1;
  begin();
  appendStored(1, 4);
  spool->removeThrough(1);
  end();
  platform.clock.setCurrentDate({kNow + 2 * 86'400});

  begin();

  ASSERT_TRUE(eventually([&] { return spooled("dropped: too old") == 3; }));
  EXPECT_THAT(identifiers(), IsEmpty());
}

TEST_F(SpooledMessagesTest, AFullStoreDropsTheOldestFirst) {
  options.maxMegabytes = 16;
  begin();
  const std::string body = noise(1, 300'000);  // a row of its own
  constexpr std::int64_t kMessages = 80;
  for (std::int64_t number = 1; number <= kMessages; ++number) {
    append(number, body);
    if (number % 10 == 0) {
      ASSERT_TRUE(eventually([&] { return !spool->hasUnstored(); }));
    }
  }

  ASSERT_TRUE(eventually([&] { return spooled("dropped: store full") > 0; }));
  end();
  const std::uint64_t dropped = spooled("dropped: store full");
  begin();
  const std::vector<std::string> left = identifiers();
  EXPECT_EQ(left.size() + dropped, static_cast<std::size_t>(kMessages));
  EXPECT_EQ(left.back(), std::to_string(kMessages));
  EXPECT_EQ(left.front(), std::to_string(dropped + 1));
}

TEST_F(SpooledMessagesTest, ADamagedRowLosesOnlyItsOwnMessages) {
  begin();
  appendStored(1, 1);
  appendStored(2, 1);
  end();
  execute(database(), "UPDATE link_spool SET block = x'00' WHERE first = 1");
  begin();

  EXPECT_THAT(identifiers(), ElementsAre("2"));
}

TEST_F(SpooledMessagesTest, ReadsTheDatabaseThatTakesThePlaceOfAnother) {
  begin();
  appendStored(1, 1);
  EXPECT_THAT(identifiers(), ElementsAre("1"));
  std::filesystem::remove(database());
  std::filesystem::remove(database().native() + "-wal");
  std::filesystem::remove(database().native() + "-shm");

  appendStored(2, 1);

  EXPECT_THAT(identifiers(), ElementsAre("2"));
}

}  // namespace
}  // namespace halvox::platform::linux_
