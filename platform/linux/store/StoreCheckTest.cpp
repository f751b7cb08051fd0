#include "platform/linux/store/StoreCheck.h"

#include <algorithm>
#include <functional>
#include <string>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/testing/NoThreadsToHave.h"

// Tests what the store does with a database that the last run did not close.

namespace halvox::platform::linux_ {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;

constexpr std::int64_t kEvents = 4000;

class StoreCheckTest : public StoreFixture {
 protected:
  // Leaves the files of a run that stored events and was then killed.
  void leaveKilledStore() {
    start();
    sendMany();
    ASSERT_TRUE(allIsStored());
    // Copy the log into the database. The log then has only the next record, which is so long that
    // the database file does not have all pages.
    ASSERT_TRUE(eventually([this] { return isLogCopied(); }));
    service->sendAnalyticsEventLazy("com.tarno.test", [] {
      return Dictionary{{"f", noise(kEvents, 20'000)}};
    });
    ASSERT_TRUE(allIsStored());
    const std::string content = readFile(database());
    const std::string log = readFile(logFile());
    stop();
    writeFile(database(), content);
    writeFile(logFile(), log);
  }
  // Sends events that fill many pages.
  void sendMany() {
    for (std::int64_t number = 0; number < kEvents; ++number) {
      service->sendAnalyticsEventLazy("com.tarno.test", [number] {
        return Dictionary{{"f", noise(static_cast<std::uint64_t>(number), 100)}};
      });
    }
  }
  // Overwrites pages that hold records, as a failing disk does.
  void damage() {
    std::string content = readFile(database());
    content.replace(content.size() / 2, 20'000, std::string(20'000, '\xA5'));
    writeFile(database(), content);
  }
  // Changes four bytes of the first block. For SQLite, the database stays sound.
  void damageBlock() {
    const std::string block = rows(database(), "SELECT block FROM message_blocks LIMIT 1").front();
    std::string content = readFile(database());
    // Change the middle of a long block, because it is on pages that hold nothing else.
    const std::size_t at = content.find(block.substr(block.size() / 2, 64));
    ASSERT_NE(at, std::string::npos);
    content.replace(at, 4, "\xA5\xA5\xA5\xA5");
    writeFile(database(), content);
  }
  // The number of pages of a database, with those that only its log has. Whoever closes the last
  // connection to a database copies the log into it. This reads a copy of both files, and gives the
  // same number before and after.
  std::string pagesOf(const std::filesystem::path& file) const {
    const std::filesystem::path copy = scratch.path() / "copy" / file.filename();
    for (const std::string suffix : {"", "-wal"}) {
      writeFile(copy.native() + suffix, readFile(file.native() + suffix));
    }
    return rows(copy, "PRAGMA page_count").front();
  }
  // These functions have long time limits, because the check has a low priority and is slow on a
  // busy machine.
  bool eventuallySetAside() {
    return patiently([this] { return !setAsideFiles().empty(); });
  }
  bool eventuallyLogged(LogLevel level, const std::string& text) {
    return patiently([&] {
      return std::ranges::any_of(platform.log.texts(level), [&](const auto& line) {
        return line.find(text) != std::string::npos;
      });
    });
  }

 private:
  // Copies the log into the database. Returns true if all pages were copied. The pages that stay in
  // the log would hide damage to the database file, and a checkpoint copies nothing while the
  // writer makes one of its own.
  [[nodiscard]] bool isLogCopied() const {
    Database connection;
    Statement checkpoint;
    if (connection.open(database(), DatabaseAccess::kReadWrite) != SQLITE_OK ||
        connection.prepare("PRAGMA wal_checkpoint(FULL)", checkpoint) != SQLITE_OK ||
        checkpoint.step() != SQLITE_ROW) {
      return false;
    }
    const bool isBusy = checkpoint.integer(0) != 0;
    const std::int64_t pages = checkpoint.integer(1);
    const std::int64_t copiedPages = checkpoint.integer(2);
    return !isBusy && pages == copiedPages;
  }
  static bool patiently(const std::function<bool()>& holds) {
    constexpr int kTries = 6;
    for (int attempt = 0; attempt < kTries; ++attempt) {
      if (eventually(holds)) return true;
    }
    return false;
  }
  [[nodiscard]] std::filesystem::path logFile() const { return database().native() + "-wal"; }
};

TEST_F(StoreCheckTest, FindsNoDamageInADatabaseWhoseServiceWasKilled) {
  leaveKilledStore();
  start();
  EXPECT_TRUE(eventuallyLogged(LogLevel::kInfo, "found no damage"));
  stop();
  EXPECT_THAT(setAsideFiles(), IsEmpty());
  EXPECT_THAT(payloads(), SizeIs(kEvents + 1));
}

TEST_F(StoreCheckTest, SaysHowManyRecordsItRead) {
  leaveKilledStore();
  start();
  EXPECT_TRUE(eventuallyLogged(LogLevel::kInfo, "read 4001 records"))
      << ::testing::PrintToString(platform.log.texts(LogLevel::kInfo));
}

TEST_F(StoreCheckTest, SetsADatabaseWithABrokenPageAside) {
  leaveKilledStore();
  damage();
  start();
  ASSERT_TRUE(eventuallySetAside());
  stop();
  EXPECT_THAT(platform.log.texts(LogLevel::kError),
              Contains(AllOf(HasSubstr("was set aside as " + setAsideFiles().front().native()),
                             HasSubstr("message_blocks"))));
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(StoreCheckTest, SetsADatabaseWithABrokenBlockAsideAndKeepsWhatWasStoredMeanwhile) {
  leaveKilledStore();
  damageBlock();
  ASSERT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
  start();
  send(-1, "com.tarno.one");
  ASSERT_TRUE(eventuallySetAside());
  send(-2, "com.tarno.two");
  stop();

  EXPECT_THAT(platform.log.texts(LogLevel::kError),
              Contains(AllOf(HasSubstr("was set aside as " + setAsideFiles().front().native()),
                             HasSubstr("message_blocks: a row is damaged"))));
  EXPECT_THAT(payloads(), ElementsAre(numbered(-1), numbered(-2)));
  EXPECT_EQ(dropped(), 0U);
}

TEST_F(StoreCheckTest, KeepsWhatWasStoredBeforeTheDamageWasFound) {
  leaveKilledStore();
  damage();
  start();
  send(-1, "com.tarno.one");
  send(-2, "com.tarno.two");
  ASSERT_TRUE(eventuallySetAside());
  send(-3, "com.tarno.one");
  stop();

  EXPECT_THAT(rows(database(),
                   "SELECT name, payload FROM analytics_events WHERE name LIKE"
                   " 'com.tarno.___' ORDER BY payload"),
              ElementsAre("com.tarno.one|" + numbered(-1), "com.tarno.two|" + numbered(-2),
                          "com.tarno.one|" + numbered(-3)));
  EXPECT_EQ(dropped(), 0U);
}

TEST_F(StoreCheckTest, KeepsRecordsOfEveryKindStoredBeforeTheDamageWasFound) {
  leaveKilledStore();
  damage();
  start();
  const double now = platform.clock.currentDate().secondsSince1970;
  const Dictionary payload{{"f", 1}};
  store->issueMetrics().add({.time = now, .metricID = 1, .message = std::vector<std::byte>(3)});
  store->powerEvents().add({.time = now, .eventName = "e", .payload = payload});
  store->linkMessages().add(
      {.time = now, .party = std::make_shared<LinkParty>(), .payload = payload});
  store->snapshots().add({.time = now, .signature = payload, .path = "/s"});
  ASSERT_TRUE(eventuallySetAside());
  stop();

  for (const std::string view : {"issue_metrics", "power_events", "link_messages", "snapshots"}) {
    EXPECT_THAT(rows(database(), "SELECT count(*) FROM " + view), ElementsAre("1")) << view;
  }
  for (const std::string spans : {"issue_metric_spans", "power_event_spans", "snapshot_spans"}) {
    EXPECT_THAT(rows(database(), "SELECT count(*) FROM " + spans), ElementsAre("1")) << spans;
  }
}

TEST_F(StoreCheckTest, KeepsTheDamagedDatabaseWithItsLog) {
  leaveKilledStore();
  damage();
  const std::string pages = pagesOf(database());
  start();
  ASSERT_TRUE(eventuallySetAside())
      << ::testing::PrintToString(platform.log.texts(LogLevel::kInfo))
      << ::testing::PrintToString(platform.log.texts(LogLevel::kError));
  stop();
  const std::filesystem::path setAside = setAsideFiles().front();
  EXPECT_EQ(pagesOf(setAside), pages);
  EXPECT_THAT(readFile(setAside), HasSubstr(std::string(4096, '\xA5')));
}

TEST_F(StoreCheckTest, ReadsNothingAfterAnOrderlyEnd) {
  start();
  sendMany();
  stop();
  damage();
  start();
  send(kEvents);
  ASSERT_TRUE(allIsStored());
  stop();
  EXPECT_THAT(setAsideFiles(), IsEmpty());
  EXPECT_THAT(platform.log.texts(LogLevel::kInfo), Not(Contains(HasSubstr("in the background"))));
}

TEST_F(StoreCheckTest, ChecksAgainAfterARunThatEndedBeforeItsCheck) {
  leaveKilledStore();
  damage();
  start();
  stop();
  start();
  EXPECT_TRUE(eventuallySetAside());
}

TEST_F(StoreCheckTest, LeavesTheCheckToTheNextRunWhenThereIsNoThread) {
  StoreCheck check;
  {
    const NoThreadsToHave noThreads;
    check.begin(database(), {}, [] {});
  }
  EXPECT_FALSE(check.stop());
  EXPECT_TRUE(check.stop());
  EXPECT_THAT(platform.log.texts(LogLevel::kError), ElementsAre(HasSubstr("cannot check")));
}

TEST_F(StoreCheckTest, ReadsNothingAfterARunThatFinishedItsCheck) {
  leaveKilledStore();
  start();
  ASSERT_TRUE(eventuallyLogged(LogLevel::kInfo, "found no damage"));
  stop();
  damage();
  start();
  stop();
  EXPECT_THAT(setAsideFiles(), IsEmpty());
  EXPECT_THAT(platform.log.texts(LogLevel::kInfo),
              Contains(HasSubstr("in the background")).Times(1));
}

TEST_F(StoreCheckTest, StartsWithANewDatabaseWhenTheNewestRecordsCannotBeRead) {
  start();
  send(1);
  stop();
  const auto root =
      rows(database(), "SELECT rootpage FROM sqlite_schema WHERE name = 'message_blocks'");
  ASSERT_THAT(root, SizeIs(1));
  std::string content = readFile(database());
  const std::size_t page = 8192;
  content.replace((std::stoul(root.front()) - 1) * page, page, std::string(page, '\xA5'));
  writeFile(database(), content);
  start();
  send(2);
  stop();
  EXPECT_THAT(setAsideFiles(), Not(IsEmpty()));
  EXPECT_THAT(payloads(), ElementsAre(numbered(2)));
}

TEST_F(StoreCheckTest, FindsADamagedTableOfNames) {
  // Adds the names to which the events of an earlier version refer.
  start();
  stop();
  execute(database(), "INSERT INTO event_names VALUES (1, 'com.tarno.old')");
  leaveKilledStore();
  // The pages of the table and of its index are among the first.
  const auto root = rows(
      database(), "SELECT rootpage FROM sqlite_schema WHERE name LIKE 'sqlite_autoindex_event%'");
  ASSERT_THAT(root, SizeIs(1));
  std::string content = readFile(database());
  const std::size_t page = 8192;
  content.replace((std::stoul(root.front()) - 1) * page + 8, 64, std::string(64, '\x7F'));
  writeFile(database(), content);
  start();
  EXPECT_TRUE(eventuallySetAside());
}

TEST_F(StoreCheckTest, StopsInTheMiddleWhenTheStoreCloses) {
  leaveKilledStore();
  for (int run = 0; run < 20; ++run) {
    ASSERT_TRUE(open());
    stop();
    writeFile(database().native() + "-wal", std::string(32, '\0'));
  }
  EXPECT_THAT(setAsideFiles(), IsEmpty());
}

}  // namespace
}  // namespace halvox::platform::linux_
