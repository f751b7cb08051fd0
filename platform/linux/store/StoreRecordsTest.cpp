#include "platform/linux/store/StoreRecords.h"

#include <string>
#include <utility>

#include "platform/linux/store/SqliteMetricService.h"
#include "platform/linux/store/SqlitePowerLogService.h"
#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/EventFollower.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr double kNow = 1'700'000'000;
constexpr double kDay = 86'400;

// A metric message with one field, in the encoding that the metric back-end uses.
class OneField final : public ProtoBase {
 public:
  bool readFrom(ProtoReader& /*reader*/) override { return true; }
  void writeTo(ProtoWriter& writer) const override { writer.writeString("hi", 3); }
  void formatText(ProtoTextFormatter& /*formatter*/, const char* /*name*/) const override {}
};

class NoField final : public ProtoBase {
 public:
  bool readFrom(ProtoReader& /*reader*/) override { return true; }
  void writeTo(ProtoWriter& /*writer*/) const override {}
  void formatText(ProtoTextFormatter& /*formatter*/, const char* /*name*/) const override {}
};

class StoreRecordsTest : public StoreFixture {
 protected:
  StoreRecordsTest() { platform.clock.setCurrentDate({kNow}); }

  void sendLink(std::int64_t session, std::int64_t number, double time = kNow,
                const std::string& filler = "") {
    Dictionary payload{{"n", number}};
    if (!filler.empty()) payload.set("f", filler);
    store->linkMessages().add(
        {.time = time,
         .party = std::make_shared<LinkParty>(LinkParty{session, "client", "music_session"}),
         .category = 3,
         .type = 9,
         .payload = payload});
  }
  [[nodiscard]] std::vector<std::string> stored(std::string_view sql) const {
    return rows(database(), sql);
  }
  // Returns the payloads of the link messages that pass the filter.
  std::vector<std::string> readLink(const RecordFilter& filter) {
    std::vector<std::string> texts;
    StoreReader reader;
    EXPECT_TRUE(reader.open(options.directory));
    EXPECT_TRUE(reader.forEachRecord(kLinkMessages, filter, [&](const StoredRecord& record) {
      texts.push_back(record.text(kLinkPayload));
    }));
    return texts;
  }
  [[nodiscard]] std::uint64_t value(std::string_view piece, std::string_view name) const {
    return platform.statistics.value(piece, name);
  }
};

TEST_F(StoreRecordsTest, MetricIsStoredAsItsEncodedBytes) {
  start();
  SqliteMetricService metrics(*store, platform.clock);

  metrics.postIssueMetric(0x5B0003, OneField());
  metrics.postIssueMetric(4'294'967'295, NoField());
  stop();

  EXPECT_THAT(stored("SELECT time, metric_id, hex(message) FROM issue_metrics"),
              ElementsAre("1700000000.0|5963779|1A026869", "1700000000.0|4294967295|"));
}

TEST_F(StoreRecordsTest, PowerEventIsStoredWithItsPayload) {
  start();
  SqlitePowerLogService power(*store, platform.clock);

  power.logPowerEvent(28, "Oxbow", {{"a", 1}}, std::nullopt);
  power.logPowerEvent(28, "Both", {{"a", 1}}, Dictionary{{"a", 2}, {"b", 3}});
  stop();

  EXPECT_THAT(
      stored("SELECT time, category_id, event_name, payload FROM power_events"),
      ElementsAre("1700000000.0|28|Oxbow|{\"a\":1}", "1700000000.0|28|Both|{\"a\":1,\"b\":3}"));
}

TEST_F(StoreRecordsTest, LinkMessageIsStoredWithItsParty) {
  start();
  sendLink(-1, 5);
  stop();
  EXPECT_THAT(stored("SELECT * FROM link_messages"),
              ElementsAre("1700000000.0|-1|client|music_session|3|9|{\"n\":5}"));
}

TEST_F(StoreRecordsTest, SnapshotIsStoredWithItsPath) {
  start();
  store->snapshots().add({.time = kNow, .signature = {{"type", "x"}}, .path = "/s/1.tar.zst"});
  stop();
  EXPECT_THAT(stored("SELECT * FROM snapshots"),
              ElementsAre("1700000000.0|{\"type\":\"x\"}|/s/1.tar.zst"));
}

TEST_F(StoreRecordsTest, OrderIsKeptOverManyTransactions) {
  start();
  for (std::int64_t number = 0; number < 20'000; ++number) sendLink(7, number);
  stop();
  EXPECT_THAT(stored("SELECT count(*), count(DISTINCT payload), sum(json_extract(payload, '$.n')"
                     " = rowid - 1) FROM (SELECT row_number() OVER () AS rowid, payload FROM"
                     " link_messages)"),
              ElementsAre("20000|20000|20000"));
}

TEST_F(StoreRecordsTest, CountersBalanceForEachKind) {
  options.maxMegabytes = 1;  // a payload may be a quarter of this
  start();
  sendLink(1, 1);
  sendLink(1, 2, kNow, std::string(300'000, 'x'));
  stop();
  EXPECT_EQ(value("link local", "received"), 2U);
  EXPECT_EQ(value("link local", "stored"), 1U);
  EXPECT_EQ(value("link local", "dropped: too large"), 1U);
  EXPECT_EQ(value("analytics", "received"), 0U);
  EXPECT_THAT(stored("SELECT json_extract(payload, '$.n') FROM link_messages"), ElementsAre("1"));
}

TEST_F(StoreRecordsTest, RecordsAfterClosingAreCountedAsDropped) {
  start();
  store->close();
  sendLink(1, 1);
  EXPECT_EQ(value("link local", "dropped: store closed"), 1U);
}

TEST_F(StoreRecordsTest, PayloadIsReleasedAfterItWasStored) {
  start();
  Dictionary payload{{"text", std::string(300'000, 'x')}};
  store->powerEvents().add(
      {.time = kNow, .categoryID = 1, .eventName = "long", .payload = payload});
  store->close();
  ASSERT_THAT(stored("SELECT count(*) FROM power_events"), ElementsAre("1"));

  // If another object shared the entries, changing one would copy them first.
  const Dictionary::Entry* const before = payload.begin();
  payload.setAt(0, 1);

  EXPECT_EQ(payload.begin(), before);
}

TEST_F(StoreRecordsTest, LockedDatabaseDropsAndCountsAllKinds) {
  start();
  ASSERT_TRUE(allIsStored());
  {
    Database other;
    ASSERT_EQ(other.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
    // Try repeatedly, because the store may hold the lock itself for a moment after its start.
    ASSERT_TRUE(eventually([&] { return other.execute("BEGIN IMMEDIATE") == SQLITE_OK; }));
    sendLink(1, 1);
    send(1);
    ASSERT_TRUE(eventually([&] {
      return value("link local", "dropped: database locked") == 1 &&
             counted("dropped: database locked") == 1;
    }));
  }
  sendLink(1, 2);
  stop();
  EXPECT_THAT(readLink({}), ElementsAre("{\"n\":2}"));
  EXPECT_EQ(value("link local", "stored"), 1U);
}

TEST_F(StoreRecordsTest, AgeAppliesToEveryKind) {
  start();
  sendLink(1, 1, kNow - 31 * kDay);
  sendLink(1, 2, kNow - 29 * kDay);
  store->powerEvents().add({.time = kNow - 31 * kDay, .categoryID = 1, .eventName = "old"});
  store->snapshots().add({.time = kNow - 31 * kDay, .path = "/old"});
  store->issueMetrics().add({.time = kNow - 31 * kDay, .metricID = 1});
  stop();
  start();
  stop();
  EXPECT_THAT(readLink({}), ElementsAre("{\"n\":2}"));
  EXPECT_THAT(stored("SELECT (SELECT count(*) FROM power_events),"
                     " (SELECT count(*) FROM snapshots), (SELECT count(*) FROM issue_metrics)"),
              ElementsAre("0|0|0"));
}

TEST_F(StoreRecordsTest, FloodOfOneKindDoesNotDisplaceNewerRecordsOfAnother) {
  options.maxMegabytes = 1;
  start();
  store->powerEvents().add({.time = kNow - 10, .categoryID = 1, .eventName = "old"});
  store->snapshots().add({.time = kNow + 10, .path = "/young"});
  for (std::int64_t number = 0; number < 5000; ++number) {
    sendLink(1, number, kNow, noise(static_cast<std::uint64_t>(number), 1000));
  }
  stop();

  EXPECT_THAT(stored("SELECT count(*) FROM power_events"), ElementsAre("0"));
  EXPECT_THAT(stored("SELECT path FROM snapshots"), ElementsAre("/young"));
  const auto numbers = stored("SELECT json_extract(payload, '$.n') FROM link_messages");
  ASSERT_FALSE(numbers.empty());
  EXPECT_LT(numbers.size(), 1000U);
  EXPECT_EQ(numbers.back(), "4999");
  EXPECT_LE(std::filesystem::file_size(database()), 1U << 20U);
}

TEST_F(StoreRecordsTest, NumbersGrowAfterAllRecordsWereDeleted) {
  start();
  sendLink(1, 1, kNow - 31 * kDay);
  stop();
  start();
  ASSERT_TRUE(eventually([&] { return readLink({}).empty(); }));
  sendLink(1, 2);
  stop();
  EXPECT_THAT(stored("SELECT id FROM message_blocks"), ElementsAre("2"));
}

TEST_F(StoreRecordsTest, FiltersBySessionNameTimeAndCount) {
  start();
  for (std::int64_t number = 1; number <= 6; ++number) {
    sendLink(number % 2, number, kNow + static_cast<double>(number));
  }
  stop();

  EXPECT_THAT(readLink({.numbers = {{kLinkSessionID, {1}}}}),
              ElementsAre("{\"n\":1}", "{\"n\":3}", "{\"n\":5}"));
  EXPECT_THAT(readLink({.newest = 2, .numbers = {{kLinkSessionID, {1, 8}}}}),
              ElementsAre("{\"n\":3}", "{\"n\":5}"));
  EXPECT_THAT(readLink({.since = kNow + 2, .until = kNow + 4}),
              ElementsAre("{\"n\":2}", "{\"n\":3}"));
  EXPECT_THAT(readLink({.names = {"music*"}, .after = 4}), ElementsAre("{\"n\":5}", "{\"n\":6}"));
  EXPECT_THAT(readLink({.names = {"voice*"}}), IsEmpty());
}

TEST_F(StoreRecordsTest, ReadsRecordsOfManyPieces) {
  start();
  for (std::int64_t number = 0; number < 3000; ++number) sendLink(1, number);
  stop();
  EXPECT_THAT(readLink({}), SizeIs(3000));
}

TEST_F(StoreRecordsTest, FollowerDeliversEachRecordOnce) {
  start();
  sendLink(1, 1);
  ASSERT_TRUE(allIsStored());
  EventFollower follower;
  ASSERT_TRUE(follower.open(options.directory, {}));
  std::vector<std::string> delivered;
  const auto deliver = [&] {
    const auto done = follower.deliver(kLinkMessages, [&](const StoredRecord& record) {
      delivered.push_back(record.text(kLinkPayload));
    });
    return done.has_value();
  };

  ASSERT_TRUE(deliver());
  sendLink(1, 2);

  EXPECT_TRUE(eventually([&] { return deliver() && delivered.size() >= 2; }));
  EXPECT_THAT(delivered, ElementsAre("{\"n\":1}", "{\"n\":2}"));
}

// A store of schema version 1 with one event.
constexpr const char* kVersion1 = HALVOX_STORE_TESTDATA "/version-1.sql";

TEST_F(StoreRecordsTest, StoreOfTheFirstVersionIsMigrated) {
  writeFile(database(), "");
  execute(database(), readFile(kVersion1));

  start();
  send(2);
  sendLink(1, 3);
  stop();

  EXPECT_THAT(setAsideFiles(), IsEmpty());
  EXPECT_THAT(stored("PRAGMA user_version"), ElementsAre(std::to_string(kStoreSchemaVersion)));
  EXPECT_THAT(payloads(), ElementsAre(numbered(1), numbered(2)));
  EXPECT_THAT(readLink({}), ElementsAre("{\"n\":3}"));
}

TEST_F(StoreRecordsTest, ReaderFindsNoneInAStoreOfTheFirstVersion) {
  writeFile(database(), "");
  execute(database(), readFile(kVersion1));

  EXPECT_THAT(readLink({}), IsEmpty());

  StoreReader reader;
  std::vector<std::string> events;
  ASSERT_TRUE(reader.open(options.directory));
  ASSERT_TRUE(reader.forEachEvent(
      {}, [&](const StoredEvent& event) { events.emplace_back(event.payload); }));
  EXPECT_THAT(events, ElementsAre(numbered(1)));
}

TEST_F(StoreRecordsTest, ViewsHaveTheNamesThatOtherProgramsUse) {
  start();
  stop();
  EXPECT_THAT(stored("SELECT time, name, payload FROM analytics_events"
                     " UNION ALL SELECT time, metric_id, message FROM issue_metrics"
                     " UNION ALL SELECT time, category_id, event_name || payload FROM power_events"
                     " UNION ALL SELECT time, session_id, client_name || service_name || category"
                     " || type || payload FROM link_messages"
                     " UNION ALL SELECT time, signature, path FROM snapshots"),
              IsEmpty());
}

}  // namespace
}  // namespace halvox::platform::linux_
