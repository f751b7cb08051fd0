#include "platform/linux/store/StoreOpening.h"

#include <string>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class StoreOpeningTest : public StoreFixture {
 protected:
  // Makes a store with 4,000 events and closes it properly.
  void makeStore() {
    start();
    for (std::int64_t number = 0; number < 4000; ++number) send(number);
    stop();
  }

  void expectNewStoreAndOldOneSetAside() {
    start();
    send(1);
    stop();
    EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
    EXPECT_THAT(setAsideFiles(), Not(IsEmpty()));
    EXPECT_THAT(platform.log.texts(LogLevel::kError),
                ElementsAre(HasSubstr("was set aside as " + setAsideFiles().front().native())));
  }
};

TEST_F(StoreOpeningTest, MakesDirectoriesThatAreMissing) {
  options.directory = scratch.path() / "a" / "b" / "c";
  start();
  EXPECT_TRUE(std::filesystem::exists(database()));
}

TEST_F(StoreOpeningTest, SaysThatTheDirectoryCannotBeMade) {
  writeFile(scratch.path() / "file", "");
  options.directory = scratch.path() / "file" / "state";
  const auto opened = open();
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kDirectory);
  EXPECT_THAT(opened.error().message, HasSubstr((scratch.path() / "file").native()));
}

TEST_F(StoreOpeningTest, SaysThatTheDirectoryCannotBeWritten) {
  options.directory = "/proc/self";
  const auto opened = open();
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kDirectory);
}

TEST_F(StoreOpeningTest, RefusesAStoreThatAnotherServiceWrites) {
  start();
  SqliteStore second(options, {platform.clock, platform.statistics, backpressure});
  const auto opened = second.open();
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kInUse);
  EXPECT_THAT(opened.error().message, HasSubstr("another service"));
}

TEST_F(StoreOpeningTest, TakesTheStoreOverOnceTheOtherServiceHasEnded) {
  start();
  stop();
  start();
}

TEST_F(StoreOpeningTest, LeavesADatabaseOfANewerVersionAsItIs) {
  makeStore();
  execute(database(), "PRAGMA user_version = 99");
  const std::string before = readFile(database());

  const auto opened = open();
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kNewerVersion);
  EXPECT_THAT(opened.error().message, HasSubstr("99"));
  EXPECT_EQ(readFile(database()), before);
  EXPECT_THAT(setAsideFiles(), IsEmpty());
}

TEST_F(StoreOpeningTest, SetsAFileOfRandomBytesAsideAndKeepsIt) {
  std::string garbage(50'000, '\0');
  for (std::size_t index = 0; index < garbage.size(); ++index) {
    garbage[index] = static_cast<char>(index * 2'654'435'761U >> 13U);
  }
  writeFile(database(), garbage);

  expectNewStoreAndOldOneSetAside();
  EXPECT_EQ(readFile(setAsideFiles().front()), garbage);
}

TEST_F(StoreOpeningTest, SetsATextFileAside) {
  writeFile(database(), "not a database at all\n");
  expectNewStoreAndOldOneSetAside();
}

TEST_F(StoreOpeningTest, SetsATruncatedDatabaseAside) {
  makeStore();
  std::filesystem::resize_file(database(), std::filesystem::file_size(database()) / 2);
  expectNewStoreAndOldOneSetAside();
}

TEST_F(StoreOpeningTest, SetsTwoDamagedFilesAsideUnderTwoNames) {
  writeFile(database(), "not a database");
  start();
  stop();
  writeFile(database(), "not a database either");
  start();
  stop();
  EXPECT_THAT(setAsideFiles(), SizeIs(2));
}

TEST_F(StoreOpeningTest, TakesAnEmptyFileForANewStore) {
  writeFile(database(), "");
  start();
  send(1);
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
  EXPECT_THAT(setAsideFiles(), IsEmpty());
}

TEST_F(StoreOpeningTest, KeepsTheEventsWhenTheLogIsGarbage) {
  makeStore();
  writeFile(database().native() + "-wal", std::string(100'000, '\x5A'));
  start();
  stop();
  EXPECT_THAT(payloads(), SizeIs(4000));
  EXPECT_THAT(rows(database(), "PRAGMA integrity_check"), ElementsAre("ok"));
}

TEST_F(StoreOpeningTest, SetsALogWithoutItsDatabaseAside) {
  writeFile(database().native() + "-wal", "the log of a database that is gone");
  start();
  send(1);
  stop();
  EXPECT_THAT(payloads(), ElementsAre(numbered(1)));
  EXPECT_THAT(setAsideFiles(), SizeIs(1));
}

TEST_F(StoreOpeningTest, RefusesADirectoryInPlaceOfTheDatabase) {
  std::filesystem::create_directories(database());
  const auto opened = open();
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kCannotOpen);
}

TEST_F(StoreOpeningTest, MarksTheDatabaseWithItsVersion) {
  start();
  stop();
  EXPECT_THAT(rows(database(), "PRAGMA user_version"),
              ElementsAre(std::to_string(kStoreSchemaVersion)));
  EXPECT_THAT(rows(database(), "PRAGMA journal_mode"), ElementsAre("wal"));
}

}  // namespace
}  // namespace halvox::platform::linux_
