#include "platform/linux/store/reading/StoreReader.h"

#include <algorithm>
#include <string>
#include <vector>

#include <sys/stat.h>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class StoreReaderTest : public StoreFixture {
 protected:
  // Stores events 0 to count - 1, named "even" or "odd". Their times begin at 1,000 and are one
  // second apart.
  void store1000(std::int64_t count) {
    start();
    for (std::int64_t number = 0; number < count; ++number) {
      platform.clock.setCurrentDate({1000.0 + static_cast<double>(number)});
      send(number, number % 2 == 0 ? "even" : "odd");
    }
    ASSERT_TRUE(allIsStored());
  }

  std::vector<std::string> read(const RecordFilter& filter) {
    StoreReader reader;
    std::vector<std::string> found;
    auto done = reader.open(options.directory);
    if (done) {
      done = reader.forEachEvent(
          filter, [&](const StoredEvent& event) { found.emplace_back(event.payload); });
    }
    EXPECT_TRUE(done) << done.error().message;
    return found;
  }

  StoreError openError() {
    StoreReader reader;
    const auto opened = reader.open(options.directory);
    EXPECT_FALSE(opened);
    return opened ? StoreError{} : opened.error().code;
  }
};

TEST_F(StoreReaderTest, ReadsAllEventsInOrderWhileTheServiceRuns) {
  store1000(3);
  EXPECT_THAT(read({}), ElementsAre(numbered(0), numbered(1), numbered(2)));
}

TEST_F(StoreReaderTest, ReadsWhenNoServiceRuns) {
  store1000(3);
  stop();
  EXPECT_THAT(read({}), SizeIs(3));
}

TEST_F(StoreReaderTest, GivesTimeAndName) {
  store1000(2);
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  std::vector<std::string> found;
  const auto read = reader.forEachEvent({}, [&](const StoredEvent& event) {
    found.push_back(std::to_string(event.time) + " " + std::string(event.name));
  });
  EXPECT_TRUE(read);
  EXPECT_THAT(found, ElementsAre("1000.000000 even", "1001.000000 odd"));
}

TEST_F(StoreReaderTest, FiltersByNamePattern) {
  store1000(6);
  EXPECT_THAT(read({.names = {"o*"}}), ElementsAre(numbered(1), numbered(3), numbered(5)));
  EXPECT_THAT(read({.names = {"x*"}}), IsEmpty());
}

TEST_F(StoreReaderTest, FiltersByTime) {
  store1000(5000);
  EXPECT_THAT(read({.since = 5997.0}), ElementsAre(numbered(4997), numbered(4998), numbered(4999)));
  EXPECT_THAT(read({.until = 1002.0}), ElementsAre(numbered(0), numbered(1)));
  EXPECT_THAT(read({.since = 3000.0, .until = 3002.0}),
              ElementsAre(numbered(2000), numbered(2001)));
  EXPECT_THAT(read({.since = 9999.0}), IsEmpty());
  EXPECT_THAT(read({.until = 5.0}), IsEmpty());
}

TEST_F(StoreReaderTest, FindsEventsByTimeThoughTheClockWasSetBack) {
  start();
  for (std::int64_t number = 0; number < 2000; ++number) {
    platform.clock.setCurrentDate({5000.0});
    send(number);
  }
  platform.clock.setCurrentDate({100.0});
  send(-1);
  for (std::int64_t number = 0; number < 2000; ++number) {
    platform.clock.setCurrentDate({5001.0});
    send(number);
  }
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(read({.until = 101.0}), ElementsAre(numbered(-1)));
}

TEST_F(StoreReaderTest, GivesTheNewestOnesNewestLast) {
  store1000(3000);
  EXPECT_THAT(read({.newest = 2}), ElementsAre(numbered(2998), numbered(2999)));
  EXPECT_THAT(read({.names = {"even"}, .newest = 2}), ElementsAre(numbered(2996), numbered(2998)));
  EXPECT_THAT(read({.newest = 10'000}), SizeIs(3000));
  EXPECT_THAT(read({.newest = 0}), IsEmpty());
}

TEST_F(StoreReaderTest, GivesOneOfTheTwoEventsOfAMessage) {
  start();
  send(7, "first");
  send(7, "second");
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(read({.newest = 1}), SizeIs(1));
  EXPECT_THAT(read({.names = {"second"}}), SizeIs(1));
}

TEST_F(StoreReaderTest, ReadsTheNewestEventFirstIfAskedFor) {
  store1000(3000);
  auto expected = read({});
  std::ranges::reverse(expected);
  const auto reversed = RecordOrder::kNewestFirst;

  EXPECT_EQ(read({.order = reversed}), expected);
  EXPECT_THAT(read({.newest = 2, .order = reversed}), ElementsAre(numbered(2999), numbered(2998)));
  EXPECT_THAT(read({.names = {"odd"}, .since = 1500.0, .until = 1504.0, .order = reversed}),
              ElementsAre(numbered(503), numbered(501)));
  EXPECT_THAT(read({.names = {"x"}, .order = reversed}), IsEmpty());
}

TEST_F(StoreReaderTest, ReadsTheEventsBetweenTwoNumbersInBothOrders) {
  store1000(3000);

  EXPECT_THAT(read({.after = 1000, .before = 1003}), ElementsAre(numbered(1000), numbered(1001)));
  EXPECT_THAT(read({.after = 1000, .before = 1003, .order = RecordOrder::kNewestFirst}),
              ElementsAre(numbered(1001), numbered(1000)));
  EXPECT_THAT(read({.before = 3, .newest = 1}), ElementsAre(numbered(1)));
  EXPECT_THAT(read({.before = 1}), IsEmpty());
}

TEST_F(StoreReaderTest, EndsWhenTheCallerHasEnough) {
  store1000(3000);
  for (const auto order : {RecordOrder::kOldestFirst, RecordOrder::kNewestFirst}) {
    int count = 0;
    RecordFilter filter{.order = order, .isEnough = [&count] { return count >= 3; }};
    StoreReader reader;
    ASSERT_TRUE(reader.open(options.directory));

    ASSERT_TRUE(reader.forEachEvent(filter, [&count](const StoredEvent&) { ++count; }));

    EXPECT_EQ(count, 3);
  }
}

// Long payloads that are alike make a block that is many times as long when it is unpacked, and is
// copied in several pieces.
TEST_F(StoreReaderTest, ReadsBlocksOfLongPayloadsInBothOrders) {
  start();
  const std::string text(50'000, 'x');
  for (std::int64_t number = 0; number < 300; ++number) {
    service->sendAnalyticsEventLazy("long", [&text, number] {
      return Dictionary{{"text", text}, {"n", number}};
    });
    ASSERT_TRUE(allIsStored());
  }
  auto expected = read({});
  ASSERT_THAT(expected, SizeIs(300));
  std::ranges::reverse(expected);

  EXPECT_TRUE(read({.order = RecordOrder::kNewestFirst}) == expected);
}

TEST_F(StoreReaderTest, ReadsFromAGivenEventOn) {
  store1000(5);
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  std::vector<StoredRecordID> ids;
  ASSERT_TRUE(reader.forEachEvent({}, [&](const StoredEvent& event) { ids.push_back(event.id); }));
  EXPECT_THAT(read({.after = ids[2]}), ElementsAre(numbered(3), numbered(4)));
  EXPECT_THAT(read({.after = ids[4]}), IsEmpty());
}

TEST_F(StoreReaderTest, DoesNotHoldASnapshotDuringTheCallback) {
  store1000(3);
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  bool checkpointed = false;
  ASSERT_TRUE(reader.forEachEvent({.newest = 1}, [&](const StoredEvent&) {
    checkpointed = rows(database(), "PRAGMA wal_checkpoint(PASSIVE)").size() == 1;
    send(99);
    EXPECT_TRUE(allIsStored());
  }));
  EXPECT_TRUE(checkpointed);
  EXPECT_THAT(read({.newest = 1}), ElementsAre(numbered(99)));
}

TEST_F(StoreReaderTest, ReadsNothingAfterAFailedOpening) {
  StoreReader reader;
  ASSERT_FALSE(reader.open(options.directory));
  const auto read =
      reader.forEachEvent({}, [](const StoredEvent&) { FAIL() << "there is no event"; });
  ASSERT_FALSE(read);
  EXPECT_EQ(read.error().code, StoreError::kMissing);
}

TEST_F(StoreReaderTest, SaysThatThereIsNoStore) { EXPECT_EQ(openError(), StoreError::kMissing); }

TEST_F(StoreReaderTest, SaysThatNothingWasStoredYet) {
  writeFile(database(), "");
  EXPECT_EQ(openError(), StoreError::kMissing);
}

TEST_F(StoreReaderTest, RefusesAPipeInPlaceOfTheFileWithoutWaiting) {
  std::filesystem::create_directories(options.directory);
  ASSERT_EQ(::mkfifo((options.directory / "halvox.db").c_str(), 0600), 0);

  EXPECT_EQ(openError(), StoreError::kCannotOpen);
}

TEST_F(StoreReaderTest, SaysThatTheFileIsDamagedAndLeavesItThere) {
  writeFile(database(), "this is not a database, whatever its name says");
  EXPECT_EQ(openError(), StoreError::kDamaged);
  EXPECT_TRUE(std::filesystem::exists(database()));
}

TEST_F(StoreReaderTest, SaysThatTheDatabaseIsOfANewerVersion) {
  store1000(1);
  stop();
  execute(database(), "PRAGMA user_version = 7");
  EXPECT_EQ(openError(), StoreError::kNewerVersion);
}

TEST_F(StoreReaderTest, NoticesThatTheDatabaseWasReplaced) {
  store1000(1);
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  EXPECT_FALSE(reader.isReplaced());
  std::filesystem::rename(database(), database().native() + ".old");
  EXPECT_TRUE(reader.isReplaced());
}

}  // namespace
}  // namespace halvox::platform::linux_
