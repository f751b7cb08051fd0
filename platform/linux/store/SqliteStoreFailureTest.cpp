#include <cstdio>
#include <filesystem>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/testing/FileSizeLimit.h"

// Tests what the store does if its file is locked, removed, damaged or cannot grow while the store
// runs.

namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Ge;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;
using ::testing::SizeIs;

class SqliteStoreFailureTest : public StoreFixture {
 protected:
  // Sends events until one is stored. Returns false after ten seconds.
  bool storesAgain() {
    const std::uint64_t before = counted("stored");
    return eventually([&] {
      send(-1);
      return counted("stored") > before;
    });
  }
  // Adds one record of every kind except events.
  void addOneOfEachKind() {
    const double now = platform.clock.currentDate().secondsSince1970;
    const Dictionary payload{{"f", noise(counted("received"), 1000)}};
    store->issueMetrics().add(
        {.time = now, .metricID = 1, .message = std::vector<std::byte>(1000)});
    store->powerEvents().add({.time = now, .eventName = "e", .payload = payload});
    store->linkMessages().add(
        {.time = now, .party = std::make_shared<LinkParty>(), .payload = payload});
    store->snapshots().add({.time = now, .signature = payload, .path = "/s"});
  }
  // Stores one event, and begins a transaction that reads the event and does not end.
  void holdOneEvent(Database& reader) {
    send(1);
    ASSERT_TRUE(allIsStored());
    ASSERT_EQ(reader.open(database(), DatabaseAccess::kReadOnly), SQLITE_OK);
    ASSERT_EQ(reader.execute("BEGIN; SELECT count(*) FROM message_blocks"), SQLITE_OK);
  }
  void expectBalance() {
    EXPECT_EQ(counted("received"), counted("stored") + dropped());
    EXPECT_THAT(payloads(), SizeIs(counted("stored")));
  }
};

TEST_F(SqliteStoreFailureTest, DropsAndCountsEventsWhileTheDiskIsFullThenStoresAgain) {
  start();
  {
    const FileSizeLimit limit(200'000);
    for (std::int64_t number = 0; number < 20'000; ++number) send(number);
    ASSERT_TRUE(allIsStored());
    EXPECT_GT(counted("dropped: disk full"), 0U);
  }
  const auto freed = std::chrono::steady_clock::now();
  EXPECT_TRUE(storesAgain());
  EXPECT_LT(std::chrono::steady_clock::now() - freed, std::chrono::seconds(5));
  stop();

  expectBalance();
  EXPECT_THAT(platform.log.texts(LogLevel::kDefault), Contains(HasSubstr("storing again")));
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
}

// Records of all kinds share transactions, and on a full disk they fail together. Each kind must
// count its own losses.
TEST_F(SqliteStoreFailureTest, RecordsOfEveryKindAreCountedWhileTheDiskIsFullAndStoredAgainLater) {
  start();
  const auto count = [this](std::string_view piece, std::string_view name) {
    return platform.statistics.value(piece, name);
  };
  const RecordTable* tables[] = {&kIssueMetrics, &kPowerEvents, &kLinkMessages, &kSnapshots};
  const std::string_view views[] = {"issue_metrics", "power_events", "link_messages", "snapshots"};
  {
    const FileSizeLimit limit(200'000);
    for (int number = 0; number < 2000; ++number) addOneOfEachKind();
    ASSERT_TRUE(allIsStored());
  }
  std::vector<std::uint64_t> before;
  for (const auto* table : tables) {
    EXPECT_GT(count(table->piece, "dropped: disk full"), 0U) << table->piece;
    before.push_back(count(table->piece, "stored"));
  }
  EXPECT_TRUE(storesAgain());
  addOneOfEachKind();
  stop();

  for (std::size_t kind = 0; kind < std::size(tables); ++kind) {
    const std::string_view piece = tables[kind]->piece;
    EXPECT_EQ(count(piece, "stored"), before[kind] + 1) << piece;
    EXPECT_EQ(count(piece, "received"), count(piece, "stored") + count(piece, "dropped: disk full"))
        << piece;
    EXPECT_THAT(rows(database(), "SELECT count(*) FROM " + std::string(views[kind])),
                ElementsAre(std::to_string(count(piece, "stored"))))
        << piece;
  }
}

TEST_F(SqliteStoreFailureTest, LogsAtMostOneErrorLineASecond) {
  start();
  const auto begun = std::chrono::steady_clock::now();
  {
    const FileSizeLimit limit(100'000);
    for (std::int64_t number = 0; number < 40'000; ++number) send(number);
    ASSERT_TRUE(allIsStored());
  }
  // The lines come first: another one may be logged while the time is read.
  const std::size_t lines = platform.log.lines(LogLevel::kError).size();
  const auto seconds =
      std::chrono::duration_cast<std::chrono::seconds>(std::chrono::steady_clock::now() - begun);
  EXPECT_LE(lines, static_cast<std::size_t>(seconds.count()) + 1);
  EXPECT_THAT(platform.log.texts(LogLevel::kError), Contains(HasSubstr("records dropped")));
}

TEST_F(SqliteStoreFailureTest, DropsAndCountsEventsWhileAnotherProcessLocksTheFile) {
  start();
  Database other;
  ASSERT_EQ(other.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
  // Try repeatedly, because the store may hold the lock itself for a moment after its start.
  ASSERT_TRUE(eventually([&] { return other.execute("BEGIN IMMEDIATE") == SQLITE_OK; }));
  send(1);
  ASSERT_TRUE(allIsStored());
  EXPECT_EQ(counted("dropped: database locked"), 1U);

  ASSERT_EQ(other.execute("ROLLBACK"), SQLITE_OK);
  const auto freed = std::chrono::steady_clock::now();
  EXPECT_TRUE(storesAgain());
  EXPECT_LT(std::chrono::steady_clock::now() - freed, std::chrono::seconds(5));
  stop();
  expectBalance();
}

TEST_F(SqliteStoreFailureTest, StoresWhileAReaderHoldsAnOldSnapshot) {
  start();
  Database reader;
  ASSERT_NO_FATAL_FAILURE(holdOneEvent(reader));
  for (std::int64_t number = 0; number < 20'000; ++number) send(number);
  ASSERT_TRUE(allIsStored());
  EXPECT_EQ(dropped(), 0U);
  reader.close();
  stop();
  expectBalance();
}

TEST_F(SqliteStoreFailureTest, DropsAndCountsEventsWhenAReaderThatNeverEndsMakesTheLogTooLarge) {
  options.maxMegabytes = 1;
  start();
  Database reader;
  ASSERT_NO_FATAL_FAILURE(holdOneEvent(reader));
  EXPECT_TRUE(eventually([this] {
    for (std::int64_t number = 0; number < 10'000; ++number) send(number);
    return counted("dropped: log held by a reader") > 0;
  }));
  EXPECT_LT(std::filesystem::file_size(database().native() + "-wal"), 2U << 20U);

  reader.close();
  EXPECT_TRUE(storesAgain());
  stop();
  EXPECT_EQ(counted("received"), counted("stored") + dropped());
}

TEST_F(SqliteStoreFailureTest, BeginsANewDatabaseWhenTheFileIsDeleted) {
  start();
  send(1);
  ASSERT_TRUE(allIsStored());
  for (const char* suffix : {"", "-wal", "-shm"}) {
    std::filesystem::remove(database().native() + suffix);
  }
  send(2);
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(payloads(), ElementsAre(numbered(2)));
  EXPECT_THAT(platform.log.texts(LogLevel::kError), Contains(HasSubstr("removed or replaced")));
}

TEST_F(SqliteStoreFailureTest, BeginsANewDatabaseWhenItsWholeDirectoryIsDeleted) {
  start();
  send(1);
  ASSERT_TRUE(allIsStored());
  std::filesystem::remove_all(options.directory);
  send(2);
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(payloads(), ElementsAre(numbered(2)));
}

TEST_F(SqliteStoreFailureTest, ContinuesWithADatabaseThatReplacedItsOwn) {
  start();
  send(1);
  stop();
  const std::string copy = readFile(database());
  start();
  send(2);
  ASSERT_TRUE(allIsStored());
  for (const char* suffix : {"", "-wal", "-shm"}) {
    std::filesystem::remove(database().native() + suffix);
  }
  writeFile(database(), copy);
  send(3);
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(1), numbered(3)));
}

TEST_F(SqliteStoreFailureTest, SetsAsideAFileThatIsDestroyedWhileItRunsAndContinues) {
  options.maxMegabytes = 4;
  start();
  std::uint64_t sent = 0;
  const auto sendLong = [&] {
    service->sendAnalyticsEventLazy("a", [number = ++sent] {
      return Dictionary{{"k", noise(number, 500)}};
    });
  };
  for (int number = 0; number < 10'000; ++number) sendLong();
  ASSERT_TRUE(allIsStored());
  // Overwrite the database and its log in place, as a failing disk or a stray program would. Open
  // both files first, because the store may rename them as soon as one of them is damaged.
  using File = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;
  std::vector<std::pair<File, std::size_t>> files;
  for (const char* suffix : {"", "-wal"}) {
    const std::string path = database().native() + suffix;
    files.emplace_back(File(std::fopen(path.c_str(), "r+"), &std::fclose),
                       std::filesystem::file_size(path));
    ASSERT_NE(files.back().first, nullptr) << path;
  }
  for (auto& [file, size] : files) {
    const std::string garbage(size, '\x33');
    ASSERT_EQ(std::fwrite(garbage.data(), 1, garbage.size(), file.get()), garbage.size());
    ASSERT_EQ(std::fflush(file.get()), 0);
  }
  EXPECT_TRUE(eventually([&] {
    sendLong();
    return !setAsideFiles().empty();
  }));
  EXPECT_TRUE(storesAgain());
  stop();
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_THAT(payloads(), Contains(numbered(-1)));
  EXPECT_EQ(counted("received"), counted("stored") + dropped());
}

}  // namespace
}  // namespace halvox::platform::linux_
