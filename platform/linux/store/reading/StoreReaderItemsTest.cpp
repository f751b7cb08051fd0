#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class StoreReaderItemsTest : public StoreFixture {
 protected:
  void sendAt(double time, std::int64_t number) {
    platform.clock.setCurrentDate({time});
    send(number);
  }
  void linkAt(double time, std::int64_t session) {
    static const auto party = std::make_shared<const LinkParty>(
        LinkParty{.sessionID = 7, .clientName = "client", .serviceName = "service"});
    EXPECT_TRUE(store->linkMessages().add({.time = time,
                                           .party = party,
                                           .category = 4,
                                           .type = static_cast<std::uint16_t>(session),
                                           .payload = Dictionary{}}));
  }

  std::vector<std::string> read(const StoredKinds& kinds, const RecordFilter& filter = {}) {
    StoreReader reader;
    std::vector<std::string> found;
    auto done = reader.open(options.directory);
    if (done) {
      done = reader.forEachItem(kinds, filter, [&](const StoredItem& item) {
        found.push_back(item.table == nullptr
                            ? std::string(item.payload)
                            : std::string(item.table->records) + std::to_string(item.type));
      });
    }
    EXPECT_TRUE(done) << done.error().message;
    return found;
  }
};

TEST_F(StoreReaderItemsTest, ReadsEventsAndLinkMessagesInTheOrderOfStoring) {
  start();
  sendAt(1000, 1);
  linkAt(1001, 2);
  sendAt(1002, 3);
  ASSERT_TRUE(allIsStored());

  EXPECT_THAT(read({}), ElementsAre(numbered(1), "link_message_records2", numbered(3)));
}

TEST_F(StoreReaderItemsTest, ReadsOnlyTheRangeOfTime) {
  start();
  for (int number = 0; number < 2000; ++number) sendAt(1000 + number, number);
  ASSERT_TRUE(allIsStored());

  EXPECT_THAT(read({}, {.since = 1100, .until = 1102}), ElementsAre(numbered(100), numbered(101)));
  EXPECT_THAT(read({}, {.since = 5000}), IsEmpty());
}

TEST_F(StoreReaderItemsTest, ReadsOnlyTheMessagesThatWereStoredSince) {
  start();
  sendAt(1000, 1);
  linkAt(1001, 2);
  ASSERT_TRUE(allIsStored());
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  std::vector<std::string> found;
  const auto readMore = [&] {
    found.clear();
    EXPECT_TRUE(reader.forEachItem({}, {.after = reader.lastRead()}, [&](const StoredItem& item) {
      found.emplace_back(item.payload);
    }));
  };
  readMore();
  EXPECT_THAT(found, SizeIs(2));

  readMore();
  EXPECT_THAT(found, IsEmpty());

  // More than a block holds, so that rows are joined between the calls.
  for (int number = 0; number < 3000; ++number) sendAt(1002, number);
  ASSERT_TRUE(allIsStored());
  readMore();
  EXPECT_THAT(found, SizeIs(3000));
  sendAt(999, 4);
  ASSERT_TRUE(allIsStored());
  readMore();
  EXPECT_THAT(found, ElementsAre(numbered(4)));
}

TEST_F(StoreReaderItemsTest, StopsAfterTheRecordThatWasEnough) {
  start();
  for (int number = 1; number <= 3; ++number) sendAt(1000 + number, number);
  ASSERT_TRUE(allIsStored());
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  const auto readUpTo = [&](std::size_t most) {
    std::vector<std::string> found;
    EXPECT_TRUE(reader.forEachItem({}, {}, [&](const StoredItem& item) {
      found.emplace_back(item.payload);
      if (found.size() == most) reader.stopReading();
    }));
    return found;
  };
  EXPECT_THAT(readUpTo(2), ElementsAre(numbered(1), numbered(2)));
  EXPECT_THAT(readUpTo(10), SizeIs(3));
}

TEST_F(StoreReaderItemsTest, ReadsOldEventsAndRowsOfOtherKindsInTheirPlaces) {
  start();
  sendAt(1003, 3);
  ASSERT_TRUE(store->issueMetrics().add({.time = 1002, .metricID = 5, .message = {}}));
  ASSERT_TRUE(allIsStored());
  execute(database(),
          "INSERT INTO event_names VALUES (1, 'a'), (2, 'b');"
          "INSERT INTO analytics_records VALUES (1, 1000.0, 1, 1001.0, 2, '{}')");

  EXPECT_THAT(read({.metrics = true}),
              ElementsAre("{}", "{}", "issue_metric_records0", numbered(3)));
}

TEST_F(StoreReaderItemsTest, ReadsNoMessagesUnlessAsked) {
  start();
  sendAt(1000, 1);
  ASSERT_TRUE(allIsStored());

  EXPECT_THAT(read({.messages = false, .metrics = true, .power = true, .snapshots = true}),
              IsEmpty());
}

}  // namespace
}  // namespace halvox::platform::linux_
