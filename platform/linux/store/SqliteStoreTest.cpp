#include "platform/linux/store/SqliteStore.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <sys/stat.h>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ContainsRegex;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

class SqliteStoreTest : public StoreFixture {};

TEST_F(SqliteStoreTest, StoresTimeNameAndPayloadInTheOrderOfSending) {
  start();
  platform.clock.setCurrentDate({100.5});
  send(1, "b");
  platform.clock.setCurrentDate({99.5});
  send(2, "a");
  stop();

  EXPECT_THAT(rows(database(), "SELECT * FROM analytics_events"),
              ElementsAre("100.5|b|{\"number\":1}", "99.5|a|{\"number\":2}"));
}

TEST_F(SqliteStoreTest, NamesTheColumnsOfTheEvents) {
  start();
  stop();
  EXPECT_THAT(rows(database(), "SELECT name FROM pragma_table_info('analytics_events')"),
              ElementsAre("time", "name", "payload"));
}

TEST_F(SqliteStoreTest, StoresThePayloadOfTheTwoEventsOfAMessageOnce) {
  start();
  send(7, "com.tarno.halvox.Session.Start");
  send(7, "com.tarno.haptics.Session.Start");
  send(8, "com.tarno.halvox.Session.Stop");
  stop();

  EXPECT_THAT(rows(database(), "SELECT name, payload FROM analytics_events"),
              ElementsAre("com.tarno.halvox.Session.Start|{\"number\":7}",
                          "com.tarno.haptics.Session.Start|{\"number\":7}",
                          "com.tarno.halvox.Session.Stop|{\"number\":8}"));
  // The block has the text of the equal payloads only once. The second event refers to the first.
  const auto blocks = rows(database(), "SELECT block FROM message_blocks");
  EXPECT_THAT(blocks, Each(Not(ContainsRegex("number.*7.*number.*7"))));
}

TEST_F(SqliteStoreTest, KeepsApartPayloadsThatAreEqualButReadDifferently) {
  start();
  service->sendAnalyticsEventLazy("a", [] { return Dictionary{{"k", 1}}; });
  service->sendAnalyticsEventLazy("a", [] { return Dictionary{{"k", true}}; });
  stop();
  EXPECT_THAT(payloads(), ElementsAre(R"({"k":1})", R"({"k":true})"));
}

TEST_F(SqliteStoreTest, AnEmptyBuilderMakesAnEmptyPayload) {
  start();
  service->sendAnalyticsEventLazy("a", nullptr);
  stop();
  EXPECT_THAT(payloads(), ElementsAre("{}"));
}

TEST_F(SqliteStoreTest, BuildsPayloadsOnTheWriterThread) {
  start();
  std::atomic<std::thread::id> builder;
  service->sendAnalyticsEventLazy("a", [&builder] {
    builder = std::this_thread::get_id();
    return Dictionary{};
  });
  ASSERT_TRUE(allIsStored());
  EXPECT_NE(builder.load(), std::this_thread::get_id());
  EXPECT_NE(builder.load(), std::thread::id{});
}

TEST_F(SqliteStoreTest, KeepsTheOrderOfManyEventsOfOneThread) {
  constexpr std::int64_t kEvents = 30'000;
  start();
  for (std::int64_t number = 0; number < kEvents; ++number) send(number);
  stop();

  const std::vector<std::string> stored = payloads();
  ASSERT_EQ(stored.size(), static_cast<std::size_t>(kEvents));
  for (std::int64_t number = 0; number < kEvents; ++number) {
    ASSERT_EQ(stored[static_cast<std::size_t>(number)], numbered(number));
  }
}

// The store releases memory after every 4 MiB of payloads and must be able to continue.
TEST_F(SqliteStoreTest, ContinuesAfterItHasReleasedMemory) {
  constexpr int kRounds = 3;
  constexpr int kEventsOfRound = 5000;
  start();
  const std::string text(1000, 't');

  for (int round = 0; round < kRounds; ++round) {
    for (int number = 0; number < kEventsOfRound; ++number) {
      service->sendAnalyticsEventLazy("com.tarno.test", [text, number] {
        return Dictionary{{"number", number}, {"text", text}};
      });
    }
    ASSERT_TRUE(allIsStored());
  }

  EXPECT_EQ(rows(database(), "SELECT count(*) FROM analytics_events"),
            (std::vector<std::string>{std::to_string(kRounds * kEventsOfRound)}));
}

TEST_F(SqliteStoreTest, KeepsTheOrderOfEachOfSeveralThreads) {
  constexpr std::int64_t kEvents = 3000;
  start();
  std::vector<std::thread> senders;
  for (int sender = 0; sender < 4; ++sender) {
    senders.emplace_back([this, sender] {
      for (std::int64_t number = 0; number < kEvents; ++number) {
        send(number, "sender" + std::to_string(sender));
      }
    });
  }
  for (std::thread& sender : senders) sender.join();
  stop();

  for (int sender = 0; sender < 4; ++sender) {
    const auto stored =
        rows(database(), "SELECT payload FROM analytics_events WHERE name = 'sender" +
                             std::to_string(sender) + "'");
    ASSERT_EQ(stored.size(), static_cast<std::size_t>(kEvents));
    for (std::int64_t number = 0; number < kEvents; ++number) {
      ASSERT_EQ(stored[static_cast<std::size_t>(number)], numbered(number));
    }
  }
}

TEST_F(SqliteStoreTest, AnEventIsInTheDatabaseWithinHalfASecondWhileTheStoreRuns) {
  start();
  std::vector<std::chrono::steady_clock::duration> delays;
  for (std::int64_t number = 0; number < 20; ++number) {
    send(number);
    const auto sent = std::chrono::steady_clock::now();
    ASSERT_TRUE(
        eventually([&] { return payloads().size() == static_cast<std::size_t>(number + 1); }));
    delays.push_back(std::chrono::steady_clock::now() - sent);
  }

  // Compare the median. A store that gathers records for too long delays all of them, whereas a
  // busy machine delays only some.
  std::ranges::sort(delays);
  EXPECT_LT(delays[delays.size() / 2], std::chrono::milliseconds(500));
}

TEST_F(SqliteStoreTest, WantsWhatThePatternsMatch) {
  options.wantedEvents = {"com.tarno.halvox.*"};
  start();
  EXPECT_TRUE(service->isAnalyticsEventUsed("com.tarno.halvox.Session.Start"));
  EXPECT_FALSE(service->isAnalyticsEventUsed("com.tarno.haptics.Session.Start"));
}

TEST_F(SqliteStoreTest, StoresEventsOfMoreNamesThanItRemembers) {
  start();
  constexpr std::size_t kNames = EventNames::kMostNames + 100;
  for (std::size_t number = 0; number < kNames; ++number) {
    const std::string name = "name" + std::to_string(number);
    EXPECT_TRUE(service->isAnalyticsEventUsed(name));
    send(1, name);
  }
  stop();
  EXPECT_THAT(rows(database(), "SELECT count(DISTINCT name) FROM analytics_events"),
              ElementsAre(std::to_string(kNames)));
}

TEST_F(SqliteStoreTest, CountsWhatItReceivedAndStored) {
  start();
  for (std::int64_t number = 0; number < 100; ++number) send(number);
  stop();
  EXPECT_EQ(counted("received"), 100U);
  EXPECT_EQ(counted("stored"), 100U);
  EXPECT_EQ(dropped(), 0U);
}

TEST_F(SqliteStoreTest, DropsAndCountsWhatComesAfterClosing) {
  start();
  store->close();
  send(1);
  EXPECT_EQ(counted("received"), 1U);
  EXPECT_EQ(counted("dropped: store closed"), 1U);
}

TEST_F(SqliteStoreTest, DropsAndCountsAPayloadThatIsTooLarge) {
  options.maxMegabytes = 1;
  start();
  const std::string large(600'000, 'x');
  service->sendAnalyticsEventLazy("a", [large] { return Dictionary{{"k", large}}; });
  send(1);
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
  EXPECT_EQ(counted("dropped: too large"), 1U);
  EXPECT_EQ(counted("stored"), 1U);
}

TEST_F(SqliteStoreTest, ClosingCopiesTheLogIntoTheDatabase) {
  start();
  send(1);
  stop();
  EXPECT_FALSE(std::filesystem::exists(database().native() + "-wal"));
}

TEST_F(SqliteStoreTest, ContinuesAStoreThatWasThereBefore) {
  start();
  send(1, "one");
  stop();
  start();
  send(2, "two");
  stop();
  EXPECT_THAT(rows(database(), "SELECT name FROM analytics_events"), ElementsAre("one", "two"));
}

TEST_F(SqliteStoreTest, TheDatabaseIsReadableByOwnerAndGroupOnly) {
  start();
  struct stat status {};
  ASSERT_EQ(::stat(database().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777U, 0640U);
}

// Returns how often the writer's thread has gone to sleep so far.
long writerSleeps() {
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    if (readFile(task.path() / "comm") != "halvox-store\n") continue;
    const std::string status = readFile(task.path() / "status");
    constexpr std::string_view kName = "\nvoluntary_ctxt_switches:";
    return std::stol(status.substr(status.find(kName) + kName.size()));
  }
  ADD_FAILURE() << "there is no thread of that name";
  return 0;
}

TEST_F(SqliteStoreTest, DoesNotWakeUpWhileNothingIsSent) {
  start();
  send(1);
  ASSERT_TRUE(allIsStored());
  EXPECT_TRUE(staysQuiet(writerSleeps, std::chrono::milliseconds(500)));
}

TEST_F(SqliteStoreTest, RaisesBackpressureUnderAFloodAndRelievesItAfterwards) {
  options.queue.softRecords = 1000;
  std::atomic<int> reliefs{0};
  backpressure.setReliefHandler([&] { ++reliefs; });
  start();
  bool raised = false;
  for (std::int64_t number = 0; number < 200'000 && !raised; ++number) {
    send(number);
    raised = backpressure.isHigh();
  }
  ASSERT_TRUE(raised);
  ASSERT_TRUE(allIsStored());
  EXPECT_TRUE(eventually([&] { return !backpressure.isHigh(); }));
  EXPECT_GE(reliefs, 1);
}

}  // namespace
}  // namespace halvox::platform::linux_
