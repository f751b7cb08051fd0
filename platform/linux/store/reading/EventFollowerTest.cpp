#include "platform/linux/store/reading/EventFollower.h"

#include <string>
#include <vector>

#include <poll.h>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class EventFollowerTest : public StoreFixture {
 protected:
  // Calls deliver() until `count` events were seen in all. Returns false if they do not arrive in
  // time.
  bool follow(std::size_t count) {
    bool isReadable = true;
    const auto deliver = [&] {
      const auto done =
          follower.deliver([this](const StoredEvent& event) { seen.emplace_back(event.payload); });
      EXPECT_TRUE(done) << done.error().message;
      isReadable = done.has_value();
      return !isReadable || seen.size() >= count;
    };
    const auto awaitChange = [this] {
      pollfd waiting{follower.descriptor(), POLLIN, 0};
      ::poll(&waiting, 1, 1000);
    };
    return eventually(deliver, awaitChange) && isReadable;
  }

  EventFollower follower;
  std::vector<std::string> seen;
};

TEST_F(EventFollowerTest, DeliversStoredEventsFirstThenNewOnes) {
  start();
  for (std::int64_t number = 0; number < 5; ++number) send(number);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(follower.open(options.directory, {.newest = 1}));
  ASSERT_TRUE(follow(1));
  send(5);
  ASSERT_TRUE(follow(2));
  send(6);
  ASSERT_TRUE(follow(3));
  EXPECT_THAT(seen, ElementsAre(numbered(4), numbered(5), numbered(6)));
}

TEST_F(EventFollowerTest, DeliversOnlyWhatComesWhenNoneOfTheNewestAreWanted) {
  start();
  for (std::int64_t number = 0; number < 5; ++number) send(number);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(follower.open(options.directory, {.newest = 0}));
  ASSERT_TRUE(follow(0));
  send(5);
  ASSERT_TRUE(follow(1));
  EXPECT_THAT(seen, ElementsAre(numbered(5)));
}

TEST_F(EventFollowerTest, LosesAndRepeatsNothingUnderLoad) {
  constexpr std::size_t kEvents = 20'000;
  start();
  ASSERT_TRUE(follower.open(options.directory, {}));
  for (std::size_t number = 0; number < kEvents; ++number) {
    send(static_cast<std::int64_t>(number));
    if (number % 1000 == 0) {
      ASSERT_TRUE(follow(0));
    }
  }
  ASSERT_TRUE(follow(kEvents));
  ASSERT_EQ(seen.size(), kEvents);
  for (std::size_t number = 0; number < kEvents; ++number) {
    ASSERT_EQ(seen[number], numbered(static_cast<std::int64_t>(number)));
  }
}

TEST_F(EventFollowerTest, KnowsThatTheStoreRemovedEventsBeforeItsDelivery) {
  start();
  for (std::int64_t number = 0; number < 3; ++number) {
    send(number);
    ASSERT_TRUE(allIsStored());
  }
  ASSERT_TRUE(follower.open(options.directory, {.after = 1}));
  ASSERT_TRUE(follow(2));
  EXPECT_FALSE(follower.hasGap());
  // One that was delivered is removed.
  execute(database(), "DELETE FROM message_blocks WHERE id <= 3");
  send(3);
  ASSERT_TRUE(follow(3));
  EXPECT_FALSE(follower.hasGap());

  send(4);
  ASSERT_TRUE(allIsStored());
  execute(database(), "DELETE FROM message_blocks WHERE id <= 5");
  send(5);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(follow(4));
  EXPECT_TRUE(follower.hasGap());
  EXPECT_THAT(seen, ElementsAre(numbered(1), numbered(2), numbered(3), numbered(5)));
}

TEST_F(EventFollowerTest, AppliesItsFilterToWhatComes) {
  start();
  ASSERT_TRUE(follower.open(options.directory, {.names = {"wanted"}}));
  send(1, "other");
  send(2, "wanted");
  ASSERT_TRUE(follow(1));
  EXPECT_THAT(seen, ElementsAre(numbered(2)));
}

TEST_F(EventFollowerTest, ContinuesAfterARestartOfTheService) {
  start();
  ASSERT_TRUE(follower.open(options.directory, {}));
  send(1);
  ASSERT_TRUE(follow(1));
  start();
  send(2);
  ASSERT_TRUE(follow(2));
  EXPECT_THAT(seen, ElementsAre(numbered(1), numbered(2)));
}

TEST_F(EventFollowerTest, ContinuesWithADatabaseThatReplacedTheOldOne) {
  start();
  ASSERT_TRUE(follower.open(options.directory, {}));
  send(1);
  ASSERT_TRUE(follow(1));
  for (const char* suffix : {"", "-wal", "-shm"}) {
    std::filesystem::remove(database().native() + suffix);
  }
  send(2);
  ASSERT_TRUE(follow(2));
  EXPECT_THAT(seen, ElementsAre(numbered(1), numbered(2)));
}

TEST_F(EventFollowerTest, DeliversTheLastEventsOfADatabaseThatWasReplaced) {
  start();
  ASSERT_TRUE(follower.open(options.directory, {}));
  send(1);
  ASSERT_TRUE(follow(1));
  send(2);
  ASSERT_TRUE(allIsStored());
  for (const char* suffix : {"", "-wal", "-shm"}) {
    std::filesystem::remove(database().native() + suffix);
  }
  send(3);
  ASSERT_TRUE(follow(3));
  EXPECT_THAT(seen, ElementsAre(numbered(1), numbered(2), numbered(3)));
}

TEST_F(EventFollowerTest, WaitsForTheNewDatabaseWhileThereIsNone) {
  start();
  ASSERT_TRUE(follower.open(options.directory, {}));
  send(1);
  ASSERT_TRUE(follow(1));
  stop();
  std::filesystem::remove(database());
  for (int look = 0; look < 3; ++look) {
    writeFile(options.directory / "halvox.db-other", "wakes the follower");
    ASSERT_TRUE(follow(0));
  }
  start();
  send(2);
  ASSERT_TRUE(follow(2));
  EXPECT_THAT(seen, ElementsAre(numbered(1), numbered(2)));
}

TEST_F(EventFollowerTest, IsQuietWhileNothingIsWritten) {
  start();
  send(1);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(follower.open(options.directory, {}));
  ASSERT_TRUE(follow(1));
  pollfd waiting{follower.descriptor(), POLLIN, 0};
  EXPECT_EQ(::poll(&waiting, 1, 300), 0);  // would return at once if the follower were woken
}

TEST_F(EventFollowerTest, SaysThatThereIsNothingToFollow) {
  const auto opened = follower.open(options.directory, {});
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kMissing);
}

}  // namespace
}  // namespace halvox::platform::linux_
