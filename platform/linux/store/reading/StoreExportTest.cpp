#include "platform/linux/store/reading/StoreExport.h"

#include <memory>
#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class StoreExportTest : public StoreFixture {
 protected:
  StoreExportTest() { platform.clock.setCurrentDate({1'700'000'000}); }

  // Stores two records of each kind, the second one a second later.
  void storeAll() {
    start();
    for (int number = 1; number <= 2; ++number) {
      const double time = 1'700'000'000 + number;
      platform.clock.setCurrentDate({time});
      send(number);
      const Dictionary payload{{"n", number}};
      store->issueMetrics().add({.time = time, .metricID = 7, .message = {std::byte{0}}});
      store->powerEvents().add(
          {.time = time, .categoryID = 5, .eventName = "power", .payload = payload});
      store->linkMessages().add(
          {.time = time,
           .party = std::make_shared<LinkParty>(LinkParty{-7, "client", "music_session"}),
           .category = 3,
           .type = 9,
           .payload = payload});
      store->snapshots().add({.time = time, .signature = payload, .path = "/s"});
    }
    ASSERT_TRUE(allIsStored());
  }
  Result<void> exportTo(const std::filesystem::path& file, const RecordFilter& filter) const {
    StoreReader reader;
    EXPECT_TRUE(reader.open(options.directory));
    StoreExport exported(file);
    auto done = exported.create();
    if (!done) return done;
    const StoredKinds all{
        .messages = true, .metrics = true, .power = true, .snapshots = true, .losses = true};
    EXPECT_TRUE(reader.forEachItem(
        all, filter, [&](const StoredItem& item) { EXPECT_TRUE(exported.add(item)); }));
    done = exported.finish();
    return done;
  }
  // Runs a query with plain SQLite, without the tables that unpack messages.
  [[nodiscard]] std::string plainValue(const std::string& sql) const {
    Database database;
    Statement statement;
    if (database.open(file(), DatabaseAccess::kReadOnly) != SQLITE_OK ||
        database.prepare(sql, statement) != SQLITE_OK || statement.step() != SQLITE_ROW) {
      return database.errorText();
    }
    return std::string(statement.text(0));
  }
  [[nodiscard]] std::filesystem::path file() const { return scratch.path() / "plain.db"; }
  static const std::vector<std::string>& names() {
    static const std::vector<std::string> all{"analytics_events", "issue_metrics", "power_events",
                                              "link_messages", "snapshots"};
    return all;
  }
};

TEST_F(StoreExportTest, WritesTheRecordsOfEveryKindAsTheStoreShowsThem) {
  storeAll();
  ASSERT_TRUE(exportTo(file(), {}));
  for (const std::string& name : names()) {
    const std::string all = "SELECT * FROM " + name + " ORDER BY time";
    EXPECT_EQ(rows(file(), all), rows(database(), all)) << name;
    EXPECT_EQ(plainValue("SELECT count(*) FROM " + name), "2") << name;
  }
}

TEST_F(StoreExportTest, WritesTheRecordsOfARangeOfTime) {
  storeAll();
  ASSERT_TRUE(exportTo(file(), {.since = 1'700'000'002}));
  for (const std::string& name : names()) {
    EXPECT_EQ(plainValue("SELECT count(*) || ' ' || min(time) FROM " + name), "1 1700000002.0")
        << name;
  }
}

TEST_F(StoreExportTest, WritesWhatTheServiceLost) {
  start();
  platform.statistics.counter("session", "dropped: a").add(5);
  stop();

  ASSERT_TRUE(exportTo(file(), {}));

  EXPECT_EQ(rows(file(), "SELECT * FROM losses"),
            std::vector<std::string>{"1700000000.0|session|dropped: a|5"});
}

TEST_F(StoreExportTest, LeavesNothingWhenItIsNotFinished) {
  start();
  {
    StoreExport exported(file());
    ASSERT_TRUE(exported.create());
    EXPECT_TRUE(std::filesystem::exists(file().native() + ".part"));
  }
  EXPECT_FALSE(std::filesystem::exists(file().native() + ".part"));
  EXPECT_FALSE(std::filesystem::exists(file()));
}

TEST_F(StoreExportTest, ReportsAFileThatCannotBeWritten) {
  start();
  const auto done = exportTo("/nowhere/plain.db", {});
  ASSERT_FALSE(done);
  EXPECT_THAT(done.error().message, HasSubstr("/nowhere/plain.db.part: No such file"));
}

}  // namespace
}  // namespace halvox::platform::linux_
