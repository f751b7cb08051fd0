#include "platform/linux/store/StoreVacuum.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr double kNow = 1'700'000'000;
constexpr double kHour = 3600;
constexpr std::uint64_t kMebibyte = std::uint64_t{1024} * 1024;

class StoreVacuumTest : public StoreFixture {
 protected:
  // Vacuums the open store and waits for the end.
  VacuumState vacuum(const VacuumRequest& request) {
    EXPECT_TRUE(allIsStored());
    EXPECT_TRUE(store->beginVacuum(request));
    EXPECT_TRUE(eventually([this] { return !store->vacuumState().isRunning; }));
    return store->vacuumState();
  }
  Result<VacuumState, StoreError> vacuumClosed(const VacuumRequest& request) {
    return vacuumStore(options.directory, StoreSizes::of(options.maxMegabytes), request, {});
  }
  [[nodiscard]] std::uintmax_t bytesOf(const char* suffix) const {
    std::error_code missing;
    const auto size = std::filesystem::file_size(database().native() + suffix, missing);
    return missing ? 0 : size;
  }
};

TEST_F(StoreVacuumTest, DeletesOnlyOlderRecords) {
  start();
  sendAt(kNow - 2 * kHour, 1);
  sendAt(kNow - kHour, 2);
  sendAt(kNow, 3);

  const VacuumState state = vacuum({.before = kNow - kHour});

  EXPECT_THAT(state.problem, IsEmpty());
  EXPECT_THAT(payloads(), ElementsAre(numbered(2), numbered(3)));
}

TEST_F(StoreVacuumTest, DeletesTheOldestDownToASizeAndEmptiesTheLog) {
  start();
  sendLong(8000);
  const VacuumState state = vacuum({.toBytes = kMebibyte});

  EXPECT_THAT(state.problem, IsEmpty());
  EXPECT_GT(state.bytesBefore, 2 * kMebibyte);
  EXPECT_LE(state.bytes, kMebibyte);
  EXPECT_GT(state.bytes, kMebibyte / 2);
  EXPECT_EQ(bytesOf("-wal"), 0U);
  EXPECT_EQ(bytesOf(""), state.bytes);
  EXPECT_THAT(payloads().back(), HasSubstr("{\"n\":7999,"));
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(StoreVacuumTest, GivesTheSpaceOfOldRecordsBack) {
  start();
  platform.clock.setCurrentDate({kNow - kHour});
  sendLong(6000);
  ASSERT_TRUE(allIsStored());
  sendAt(kNow, 1);

  const VacuumState state = vacuum({.before = kNow});

  EXPECT_GT(state.bytesBefore, 2 * kMebibyte);
  EXPECT_LT(state.bytes, kMebibyte);
  EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
}

TEST_F(StoreVacuumTest, StoresRecordsThatComeMeanwhile) {
  start();
  sendLong(8000);
  ASSERT_TRUE(allIsStored());
  ASSERT_TRUE(store->beginVacuum({.toBytes = kMebibyte / 2}));
  for (std::int64_t number = 0; number < 100; ++number) send(number);
  ASSERT_TRUE(eventually([this] { return !store->vacuumState().isRunning; }));
  send(100);
  stop();

  EXPECT_EQ(dropped(), 0U);
  EXPECT_THAT(
      rows(database(), "SELECT count(*) FROM analytics_events WHERE name = 'com.tarno.test'"),
      ElementsAre("101"));
}

TEST_F(StoreVacuumTest, OnlyOneRunsAtATime) {
  StoreVacuum vacuum(database());

  EXPECT_TRUE(vacuum.begin({}));
  EXPECT_FALSE(vacuum.begin({}));
  vacuum.fail("a test");
  EXPECT_EQ(vacuum.state().problem, "a test");
  EXPECT_TRUE(vacuum.begin({}));
}

TEST_F(StoreVacuumTest, ClosingTheStoreEndsIt) {
  StoreVacuum vacuum(database());
  ASSERT_TRUE(vacuum.begin({}));

  vacuum.cancel();

  EXPECT_FALSE(vacuum.state().isRunning);
  EXPECT_THAT(vacuum.state().problem, HasSubstr("before the vacuum was complete"));
  EXPECT_FALSE(vacuum.begin({}));
}

TEST_F(StoreVacuumTest, ReportsThatAReaderHoldsTheLog) {
  start();
  sendLong(1000);
  ASSERT_TRUE(allIsStored());
  Database reader;
  ASSERT_EQ(reader.open(database(), DatabaseAccess::kReadOnly), SQLITE_OK);
  ASSERT_EQ(reader.execute("BEGIN; SELECT count(*) FROM message_blocks"), SQLITE_OK);

  EXPECT_TRUE(vacuum({.toBytes = kMebibyte / 2}).isLogHeld);
  EXPECT_EQ(reader.execute("COMMIT"), SQLITE_OK);
  EXPECT_FALSE(vacuum({.toBytes = kMebibyte / 2}).isLogHeld);
  EXPECT_EQ(dropped(), 0U);
}

TEST_F(StoreVacuumTest, VacuumsAStoreWithoutAService) {
  start();
  sendAt(kNow - kHour, 1);
  sendAt(kNow, 2);
  stop();

  const auto state = vacuumClosed({.before = kNow});

  ASSERT_TRUE(state) << state.error().message;
  EXPECT_THAT(payloads(), ElementsAre(numbered(2)));
}

// The service runs as a user of its own, and must be able to open what root has made.
TEST_F(StoreVacuumTest, FilesThatRootMakesBelongToTheOwnerOfTheDirectory) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs the right to give files away";
  constexpr uid_t kUser = 65'534;
  constexpr gid_t kGroup = 65'533;
  start();
  sendAt(kNow, 1);
  stop();
  const auto lock = options.directory / "halvox.lock";
  for (const auto& path : {options.directory, database()}) {
    ASSERT_EQ(::chown(path.c_str(), kUser, kGroup), 0) << path;
  }
  ASSERT_TRUE(std::filesystem::remove(lock));

  const auto state = vacuumClosed({.before = kNow - kHour});

  ASSERT_TRUE(state) << state.error().message;
  for (const auto& entry : std::filesystem::directory_iterator(options.directory)) {
    struct stat status {};
    ASSERT_EQ(::stat(entry.path().c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, kUser) << entry.path();
    EXPECT_EQ(status.st_gid, kGroup) << entry.path();
  }
  EXPECT_TRUE(std::filesystem::exists(lock));
}

TEST_F(StoreVacuumTest, LeavesTheStoreOfAServiceAlone) {
  start();
  sendAt(kNow - kHour, 1);
  ASSERT_TRUE(allIsStored());

  const auto state = vacuumClosed({.before = kNow});

  ASSERT_FALSE(state);
  EXPECT_EQ(state.error().code, StoreError::kInUse);
  EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
}

TEST_F(StoreVacuumTest, LeavesADamagedStoreAsItIs) {
  std::filesystem::create_directories(options.directory);
  const std::string content(10'000, 'x');
  writeFile(database(), content);

  const auto state = vacuumClosed({.before = kNow});

  ASSERT_FALSE(state);
  EXPECT_EQ(state.error().code, StoreError::kDamaged);
  EXPECT_EQ(readFile(database()), content);
}

}  // namespace
}  // namespace halvox::platform::linux_
