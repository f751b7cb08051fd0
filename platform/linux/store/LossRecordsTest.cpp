#include "platform/linux/store/LossRecords.h"

#include <string>
#include <vector>

#include <gmock/gmock.h>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr double kNow = 1'700'000'000;

class LossRecordsTest : public StoreFixture {
 protected:
  LossRecordsTest() { platform.clock.setCurrentDate({kNow}); }

  void count(const char* piece, const char* name, std::uint64_t number = 1) {
    platform.statistics.counter(piece, name).add(number);
  }
  // Stores an event and waits until it is stored.
  void storeOne() {
    send(1);
    ASSERT_TRUE(eventually([&] { return allIsStored(); }));
  }
  // Counts a loss that is due with the next transaction, and lets that transaction fail.
  void loseInFailedTransaction() {
    storeOne();
    count("session", "dropped: a", 5);
    platform.clock.setCurrentDate({kNow + 60});
    Database other;
    ASSERT_EQ(other.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
    ASSERT_TRUE(eventually([&] { return other.execute("BEGIN IMMEDIATE") == SQLITE_OK; }));
    send(2);
    ASSERT_TRUE(eventually([&] { return counted("dropped: database locked") == 1; }));
  }
  [[nodiscard]] std::vector<std::string> losses() const {
    return rows(database(), "SELECT piece, reason, count FROM losses");
  }
};

TEST_F(LossRecordsTest, AnEndRecordsWhatWasLost) {
  start();
  count("session", "suppressed: redundant", 5);
  count("requests", "refused: limits", 2);
  count("session", "delivered", 9);

  stop();

  EXPECT_THAT(rows(database(), "SELECT * FROM losses"),
              ElementsAre("1700000000.0|requests|refused: limits|2",
                          "1700000000.0|session|suppressed: redundant|5"));
}

TEST_F(LossRecordsTest, NothingLostIsNotRecorded) {
  start();
  storeOne();

  stop();

  EXPECT_THAT(losses(), IsEmpty());
}

TEST_F(LossRecordsTest, AMinuteLaterTheNextTransactionTakesThemAlong) {
  start();
  count("session", "dropped: a", 5);
  storeOne();
  EXPECT_THAT(losses(), IsEmpty());

  platform.clock.setCurrentDate({kNow + 60});
  storeOne();

  EXPECT_THAT(losses(), ElementsAre("session|dropped: a|5"));
}

TEST_F(LossRecordsTest, EachRecordHasWhatCameSinceTheLastOne) {
  start();
  count("session", "dropped: a", 5);
  platform.clock.setCurrentDate({kNow + 60});
  storeOne();
  count("session", "dropped: a", 2);
  platform.clock.setCurrentDate({kNow + 120});
  storeOne();

  stop();

  EXPECT_THAT(losses(), ElementsAre("session|dropped: a|5", "session|dropped: a|2"));
}

TEST_F(LossRecordsTest, AClockThatWasSetBackDoesNotDelayThem) {
  start();
  count("session", "dropped: a");
  platform.clock.setCurrentDate({kNow - 3600});
  storeOne();

  EXPECT_THAT(losses(), ElementsAre("session|dropped: a|1"));
}

TEST_F(LossRecordsTest, WhatAFailedTransactionHadComesWithTheNextOne) {
  start();
  loseInFailedTransaction();
  platform.clock.setCurrentDate({kNow + 120});
  storeOne();

  stop();

  EXPECT_THAT(losses(),
              ElementsAre("analytics|dropped: database locked|1", "session|dropped: a|5"));
}

TEST_F(LossRecordsTest, AFailedTransactionDoesNotDelayThem) {
  start();
  loseInFailedTransaction();

  storeOne();  // at the same time

  EXPECT_THAT(losses(),
              ElementsAre("analytics|dropped: database locked|1", "session|dropped: a|5"));
  stop();
}

TEST_F(LossRecordsTest, TheyAgeLikeAllRecords) {
  start();
  count("session", "dropped: a");
  stop();
  platform.statistics.clear();
  platform.clock.setCurrentDate({kNow + 31.0 * 24 * 3600});

  start();
  stop();

  EXPECT_THAT(losses(), IsEmpty());
}

TEST_F(LossRecordsTest, ReadersGetThem) {
  start();
  count("session", "dropped: a", 3);
  stop();
  StoreReader reader;
  ASSERT_TRUE(reader.open(options.directory));
  std::vector<std::string> read;

  ASSERT_TRUE(
      reader.forEachItem({.messages = false, .losses = true}, {}, [&](const StoredItem& item) {
        read.push_back(std::string(item.name) + ' ' + std::string(item.payload) + ' ' +
                       std::to_string(item.number));
      }));

  EXPECT_THAT(read, ElementsAre("session dropped: a 3"));
}

}  // namespace
}  // namespace halvox::platform::linux_
