#include "platform/linux/store/reading/verify/StoreVerifier.h"

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

class StoreVerifierTest : public StoreFixture {
 protected:
  // Returns the differences, each as "PLACE: WHAT".
  [[nodiscard]] std::vector<std::string> verify() const {
    std::vector<std::string> found;
    Differences differences([&](const StoreDifference& difference) {
      found.push_back(difference.place + ": " + difference.what);
    });
    StoreVerifier verifier(differences);
    const auto verified = verifier.verify(options.directory);
    if (!verified) found.push_back("error: " + verified.error().message);
    return found;
  }
  // Adds records of all kinds: `count` link messages, twice as many events, and one of each other.
  void addRecords(std::int64_t count) {
    const auto party = std::make_shared<const LinkParty>(LinkParty{7, "client", "music_session"});
    for (std::int64_t number = 0; number < count; ++number) {
      send(number, "com.tarno.halvox.Session.Start");
      send(number, "com.tarno.music.Session.Start");
      store->linkMessages().add(
          {.time = 100, .party = party, .category = 3, .type = 9, .payload = {{"n", number}}});
    }
    store->powerEvents().add({.time = 100, .categoryID = 28, .eventName = "power", .payload = {}});
    store->snapshots().add({.time = 100, .signature = {}, .path = "/nowhere"});
    ASSERT_TRUE(allIsStored());
  }
  // A closed store with at least two sealed blocks.
  void makeStore() {
    start();
    addRecords(500);
    addRecords(500);
    stop();
    ASSERT_GE(std::stoi(rows(database(), "SELECT count(*) FROM message_spans").front()), 2);
    ASSERT_THAT(verify(), IsEmpty());
  }
  // Copies the files of the open store, as a kill would leave them, and makes the copy the store.
  void copyOpenStore() {
    const std::filesystem::path copy = scratch.path() / "copy";
    std::filesystem::copy(options.directory, copy);
    stop();
    options.directory = copy;
  }
  [[nodiscard]] std::filesystem::path log() const { return database().native() + "-wal"; }
  void flipBit(const std::filesystem::path& file, std::size_t offset) {
    std::string content = readFile(file);
    ASSERT_LT(offset, content.size());
    content[offset] = static_cast<char>(content[offset] ^ 4);
    writeFile(file, content);
  }
};

TEST_F(StoreVerifierTest, AStoreWithoutRecordsIsInOrder) {
  start();
  stop();
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(StoreVerifierTest, AStoreThatIsServedIsInOrder) {
  start();
  addRecords(10);
  addRecords(700);
  addRecords(1);
  EXPECT_THAT(verify(), IsEmpty());
  stop();
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(StoreVerifierTest, AStoreOfAKilledServiceIsInOrder) {
  start();
  addRecords(20);
  copyOpenStore();
  EXPECT_THAT(verify(), IsEmpty());
  start();
  stop();
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(StoreVerifierTest, AStoreAtItsSizeLimitIsInOrder) {
  options.maxMegabytes = 1;
  start();
  for (std::uint64_t number = 0; number < 3000; ++number) {
    service->sendAnalyticsEventLazy("com.tarno.test", [number] {
      return Dictionary{{"text", noise(number, 1000)}};
    });
  }
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(verify(), IsEmpty());
  stop();
  ASSERT_NE(rows(database(), "SELECT min(id) FROM message_blocks"), std::vector<std::string>{"1"});
  EXPECT_THAT(verify(), IsEmpty());
}

TEST_F(StoreVerifierTest, AStoreFromWhichOldRecordsWereDeletedIsInOrder) {
  options.retentionDays = 1;
  platform.clock.setCurrentDate({1'000'000});
  start();
  addRecords(600);
  platform.clock.setCurrentDate({1'060'000});
  addRecords(600);
  send(1);
  stop();
  platform.clock.setCurrentDate({1'100'000});
  start();
  send(2);
  stop();
  EXPECT_THAT(verify(), IsEmpty());
}

// Makes an empty database of a version.
void makeVersion(const std::filesystem::path& database, std::int64_t version) {
  std::filesystem::create_directories(database.parent_path());
  writeFile(database, "");
  Database connection;
  ASSERT_EQ(connection.open(database, DatabaseAccess::kReadWrite), SQLITE_OK);
  ASSERT_EQ(connection.execute("PRAGMA journal_mode = WAL"), SQLITE_OK);
  ASSERT_EQ(migrateTo(connection, version), SQLITE_OK);
  ASSERT_EQ(connection.execute(
                "INSERT INTO event_names VALUES (1, 'com.tarno.a');"
                "INSERT INTO analytics_records VALUES (4, 1700000000.0, 1, 1700000001.0, 1, '{}');"
                "INSERT INTO analytics_spans VALUES (0, 1700000000.0, 1700000001.0);"),
            SQLITE_OK);
}

TEST_F(StoreVerifierTest, StoresOfEachVersionAreInOrderBeforeAndAfterTheirMigration) {
  for (std::int64_t version = 1; version <= kStoreSchemaVersion; ++version) {
    std::filesystem::remove_all(options.directory);
    makeVersion(database(), version);
    EXPECT_THAT(verify(), IsEmpty()) << version;
    start();
    send(1);
    stop();
    EXPECT_THAT(verify(), IsEmpty()) << version;
  }
}

TEST_F(StoreVerifierTest, AMissingStoreIsAnError) {
  EXPECT_THAT(verify(), ElementsAre(StartsWith("error: ")));
}

TEST_F(StoreVerifierTest, FindsAMissingSpanOfABlock) {
  makeStore();
  execute(database(), "DELETE FROM message_spans WHERE span = 1");
  EXPECT_THAT(verify(), ElementsAre("message_blocks, row 1: has no row in message_spans"));
}

TEST_F(StoreVerifierTest, FindsThatTheNewestSpanIsMissing) {
  makeStore();
  execute(database(),
          "DELETE FROM message_spans WHERE span = (SELECT max(span) FROM message_spans)");
  EXPECT_THAT(verify(), Contains(HasSubstr("is too long for a row that needs none")));
}

TEST_F(StoreVerifierTest, FindsAMissingSpanOfRows) {
  makeStore();
  execute(database(), "DELETE FROM power_event_spans");
  EXPECT_THAT(verify(), Contains("power_event_records, row 2: has no row in power_event_spans"));
}

TEST_F(StoreVerifierTest, FindsAMissingBlock) {
  makeStore();
  execute(database(), "DELETE FROM message_blocks WHERE id = 1");
  EXPECT_THAT(verify(), Contains("message_spans, row 1: has no row in message_blocks: a block was "
                                 "deleted"));
}

TEST_F(StoreVerifierTest, FindsABlockThatIsThereTwice) {
  makeStore();
  execute(database(),
          "INSERT INTO message_blocks SELECT id + 1, records, first_time, last_time, block"
          " FROM message_blocks WHERE id = 1");
  EXPECT_THAT(verify(), Contains(StartsWith("message_blocks, row 2: uses numbers that the row "
                                            "before uses too, up to ")));
}

TEST_F(StoreVerifierTest, FindsAFlippedBitInABlock) {
  makeStore();
  // The first bytes of a zstd frame.
  const std::size_t frame = readFile(database()).find("\x28\xB5\x2F\xFD");
  ASSERT_NE(frame, std::string::npos);
  flipBit(database(), frame + 40);
  EXPECT_THAT(verify(), Contains(HasSubstr("the block is damaged and cannot be unpacked")));
  EXPECT_THAT(verify(), Contains(StartsWith("message_blocks, row ")));
}

TEST_F(StoreVerifierTest, FindsAFlippedBitInAPage) {
  makeStore();
  const int page = std::stoi(rows(database(),
                                  "SELECT rootpage FROM sqlite_schema"
                                  " WHERE name = 'power_event_records'")
                                 .front());
  // The kind of the page.
  flipBit(database(), static_cast<std::size_t>(page - 1) * 8192);
  EXPECT_THAT(verify(), Contains(::testing::ContainsRegex("[Pp]age " + std::to_string(page))));
}

TEST_F(StoreVerifierTest, FindsAFileThatIsNotADatabase) {
  makeStore();
  flipBit(database(), 3);
  EXPECT_THAT(verify(), ElementsAre(StartsWith(database().native() + ": ")));
}

TEST_F(StoreVerifierTest, FindsWrongKeysAndTimesOfASpan) {
  makeStore();
  execute(database(),
          "UPDATE message_spans SET keys = x'0102' WHERE span = 1;"
          "UPDATE message_blocks SET first_time = first_time - 1 WHERE id > 1;"
          "UPDATE message_spans SET last_time = last_time + 1 WHERE span > 1;"
          "UPDATE power_event_spans SET first_time = 101, last_time = 102");
  const auto found = verify();
  EXPECT_THAT(found,
              Contains("message_spans, row 1: has other keys than the records of its block"));
  EXPECT_THAT(found, Contains(HasSubstr(": has other times than its records")));
  EXPECT_THAT(found, Contains(HasSubstr(": has other times than the records of its block")));
  EXPECT_THAT(found, Contains("power_event_records, row 2: has a time that is not within that of "
                              "its row in power_event_spans"));
}

TEST_F(StoreVerifierTest, FindsOrphans) {
  makeStore();
  execute(database(),
          "INSERT INTO power_event_records VALUES (5000, 100, 28, 'a', '{}');"
          "INSERT INTO analytics_records VALUES (1, 100, 77, NULL, NULL, '{}');"
          "INSERT INTO analytics_spans VALUES (0, 100, 100)");
  const auto found = verify();
  EXPECT_THAT(found, Contains("power_event_records, row 5000: has no row in power_event_spans"));
  EXPECT_THAT(found, Contains("analytics_records, row 1: has a name that is not in event_names"));
}

TEST_F(StoreVerifierTest, FindsAPayloadThatIsNotJson) {
  makeStore();
  execute(database(), "UPDATE power_event_records SET payload = '{\"a\":' WHERE id = 2");
  EXPECT_THAT(verify(), Contains("power_event_records, row 2: has a payload that is not a JSON "
                                 "object"));
}

TEST_F(StoreVerifierTest, FindsAChangedSchema) {
  makeStore();
  execute(database(),
          "DROP VIEW losses; CREATE VIEW losses AS SELECT 1 AS time;"
          "DROP VIEW power_events; CREATE TABLE mine(a)");
  const std::string version = std::to_string(kStoreSchemaVersion);
  EXPECT_THAT(verify(),
              ElementsAre("the schema, view losses: has another definition than version " +
                              version + " has",
                          "the schema, view power_events: is missing",
                          "the schema, table mine: does not belong to version " + version));
}

TEST_F(StoreVerifierTest, FindsATableThatIsMissing) {
  makeStore();
  execute(database(), "DROP TABLE power_event_records");
  EXPECT_THAT(verify(), Contains("the schema, table power_event_records: is missing"));
}

TEST_F(StoreVerifierTest, FindsARunThatDoesNotSayHowItEnded) {
  makeStore();
  start();
  stop();
  execute(database(), "UPDATE run_records SET ending = NULL WHERE id = 1");
  EXPECT_THAT(verify(), ElementsAre("run_records, row 1: does not say how the run ended"));
}

TEST_F(StoreVerifierTest, FindsDamagedRowsOfTheSpool) {
  start();
  for (const char* const identifier : {"1", "2", "3", "4"}) {
    ASSERT_NE(store->spooledMessages().append({"s", identifier, ""}), 0U);
    ASSERT_TRUE(eventually([&] { return !store->spooledMessages().hasUnstored(); }));
  }
  stop();
  ASSERT_THAT(verify(), IsEmpty());
  execute(database(),
          "UPDATE link_spool SET block = x'00' WHERE first = 1;"
          "UPDATE link_spool SET sent = 1 WHERE first = 2;"
          "UPDATE link_spool SET messages = 2 WHERE first = 4;");

  EXPECT_THAT(verify(), ElementsAre("link_spool, row 1: cannot be read as 1 messages",
                                    "link_spool, row 2: says that 1 of its 1 messages were sent",
                                    "link_spool, row 4: cannot be read as 2 messages"));
}

TEST_F(StoreVerifierTest, FindsNumbersOfTheSpoolThatAreUsedTwice) {
  start();
  for (std::int64_t number = 0; number < 500; ++number) {
    ASSERT_NE(store->spooledMessages().append({"s", "i", ""}), 0U);
  }
  stop();
  execute(database(),
          "INSERT INTO link_spool SELECT first + messages - 1, messages, 0, time, block"
          " FROM link_spool WHERE messages > 1 ORDER BY first DESC LIMIT 1");

  EXPECT_THAT(verify(), ElementsAre(HasSubstr("has numbers of the row before")));
}

TEST_F(StoreVerifierTest, ShowsTheFirstDifferencesOfATable) {
  makeStore();
  execute(database(),
          "INSERT INTO power_event_records WITH RECURSIVE n(i) AS (SELECT 5000 UNION ALL"
          " SELECT i + 1 FROM n WHERE i < 6000) SELECT i, 100, 28, 'a', '{}' FROM n");
  const auto found = verify();
  EXPECT_THAT(found, ::testing::SizeIs(Differences::kMostOfOne + 1));
  EXPECT_EQ(found.back(), "power_event_records: has more differences, which are not shown");
}

}  // namespace
}  // namespace halvox::platform::linux_
