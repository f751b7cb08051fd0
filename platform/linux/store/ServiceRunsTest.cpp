#include "platform/linux/store/ServiceRuns.h"

#include <filesystem>
#include <string>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class ServiceRunsTest : public StoreFixture {
 protected:
  ServiceRunsTest() { options.bootID = "boot-1"; }

  [[nodiscard]] std::vector<std::string> runs() const {
    return rows(database(), "SELECT run, start, last_commit, ending FROM runs");
  }
  [[nodiscard]] std::vector<std::string> reports() const {
    return rows(database(), "SELECT payload FROM analytics_events WHERE name = '" +
                                std::string(kLastRunEvent) + "'");
  }
  // Starts a run that begins at 100 and commits last at `lastCommit`, and ends it as a kill does:
  // the next run gets the files as they are while this one still has them open.
  void startAndKillRun(double lastCommit) {
    platform.clock.setCurrentDate({100});
    start();
    ASSERT_TRUE(eventually([this] { return runs().size() == 1; }));
    platform.clock.setCurrentDate({lastCommit});
    send(1);
    ASSERT_TRUE(allIsStored());
    const std::filesystem::path copy = scratch.path() / "copy";
    std::filesystem::copy(options.directory, copy);
    stop();
    options.directory = copy;
  }
};

TEST_F(ServiceRunsTest, TheFirstRunOfAStoreIsNotedAtOnceAndReportsNothing) {
  platform.clock.setCurrentDate({100});
  start();
  ASSERT_TRUE(eventually([this] { return runs().size() == 1; }));
  EXPECT_THAT(runs(), ElementsAre("1|100.0|100.0|"));
  stop();
  EXPECT_THAT(reports(), IsEmpty());
}

TEST_F(ServiceRunsTest, ARunThatClosesTheStoreHasACleanEndWhichIsNoEvent) {
  platform.clock.setCurrentDate({100});
  start();
  platform.clock.setCurrentDate({160});
  stop();
  EXPECT_THAT(runs(), ElementsAre("1|100.0|160.0|clean"));

  start();
  stop();
  EXPECT_THAT(rows(database(), "SELECT run, ending FROM runs"), ElementsAre("1|clean", "2|clean"));
  EXPECT_THAT(reports(), IsEmpty());
}

TEST_F(ServiceRunsTest, AKilledRunHasCrashedIfTheSystemHasNotRestarted) {
  startAndKillRun(150);
  platform.clock.setCurrentDate({200});
  start();
  stop();
  EXPECT_THAT(reports(), ElementsAre(R"({"run":1,"end":"crash","start":100,"last_commit":150,)"
                                     R"("missing_seconds":0.5})"));
  EXPECT_THAT(runs(), ElementsAre("1|100.0|150.0|crash", "2|200.0|200.0|clean"));
}

TEST_F(ServiceRunsTest, AKilledRunHadAPowerCutIfTheSystemHasRestarted) {
  startAndKillRun(150);
  options.bootID = "boot-2";
  start();
  stop();
  // How much of what came after the last commit is missing is not known.
  EXPECT_THAT(reports(),
              ElementsAre(R"({"run":1,"end":"power cut","start":100,"last_commit":150})"));
}

TEST_F(ServiceRunsTest, WithoutABootIDTheEndOfAKilledRunIsUnknown) {
  startAndKillRun(150);
  options.bootID.clear();
  start();
  stop();
  EXPECT_THAT(reports(), ElementsAre(HasSubstr(R"("end":"unknown")")));
}

TEST_F(ServiceRunsTest, EachEndIsReportedOnce) {
  startAndKillRun(150);
  for (int run = 0; run < 2; ++run) {
    start();
    stop();
  }
  EXPECT_THAT(reports(), ElementsAre(HasSubstr("crash")));
}

TEST_F(ServiceRunsTest, TheReportIsRecordedWhateverEventsAreWanted) {
  options.wantedEvents = {"nothing"};
  startAndKillRun(150);
  start();
  stop();
  EXPECT_THAT(reports(), SizeIs(1));
}

TEST_F(ServiceRunsTest, ARunWhoseDatabaseIsReplacedIsNotedInTheNewOne) {
  start();
  ASSERT_TRUE(eventually([this] { return runs().size() == 1; }));
  for (const char* const suffix : {"", "-wal", "-shm"}) {
    std::filesystem::remove(database().native() + suffix);
  }
  send(1);
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(runs(), SizeIs(1));
  stop();
  EXPECT_THAT(rows(database(), "SELECT run, ending FROM runs"), ElementsAre("1|clean"));
}

TEST_F(ServiceRunsTest, KeepsTheNewestRuns) {
  start();
  stop();
  execute(database(),
          "INSERT INTO run_records WITH RECURSIVE n(i) AS (SELECT 2 UNION ALL SELECT i + 1 FROM n"
          " WHERE i < 1500) SELECT i, 'boot-1', 0, 0, 'clean' FROM n");
  start();
  stop();
  EXPECT_THAT(rows(database(), "SELECT min(run), max(run) FROM runs"), ElementsAre("502|1501"));
}

TEST_F(ServiceRunsTest, TheSystemGivesABootID) {
  EXPECT_THAT(currentBootID(), SizeIs(36));
  EXPECT_EQ(currentBootID(), currentBootID());
}

}  // namespace
}  // namespace halvox::platform::linux_
