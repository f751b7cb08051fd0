#include "platform/linux/store/StoreExtent.h"

#include <string>

#include "platform/linux/store/StoreFixture.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

// A fixture with a database of 1,000 events, and the extent that the database had after the first
// 600.
class StoreExtentTest : public StoreFixture {
 protected:
  StoreExtentTest() {
    start();
    for (std::int64_t number = 1; number <= 600; ++number) send(number);
    stop();
    Database old;
    EXPECT_EQ(old.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
    EXPECT_EQ(StoreExtent::read(old, extent), SQLITE_OK);
    old.close();
    start();
    for (std::int64_t number = 601; number <= 1000; ++number) {
      send(number, number % 2 == 0 ? "com.tarno.even" : "com.tarno.odd");
    }
    stop();
    std::filesystem::rename(database(), oldFile);
    start();
    stop();
    EXPECT_EQ(fresh.open(database(), DatabaseAccess::kReadWrite), SQLITE_OK);
  }

  const std::string oldFile = scratch.path() / "old.db";
  StoreExtent extent;
  Database fresh;
  std::string problem;
};

TEST_F(StoreExtentTest, CopiesTheRecordsThatAreNewerWithTheirNames) {
  EXPECT_EQ(copyRecordsAfter(extent, oldFile, fresh, problem), 400U);

  EXPECT_EQ(problem, "");
  EXPECT_THAT(rows(database(), "SELECT count(*) FROM analytics_events"), ElementsAre("400"));
  EXPECT_THAT(rows(database(),
                   "SELECT name, min(json_extract(payload, '$.number')),"
                   " max(json_extract(payload, '$.number')) FROM analytics_events GROUP BY name"),
              ElementsAre("com.tarno.even|602|1000", "com.tarno.odd|601|999"));
}

TEST_F(StoreExtentTest, CopiesTheSpansThatCoverThoseRecords) {
  static_cast<void>(copyRecordsAfter(extent, oldFile, fresh, problem));

  EXPECT_THAT(rows(database(), "SELECT min(span) > 600 FROM message_spans"), ElementsAre("1"));
}

TEST_F(StoreExtentTest, LeavesTheOtherFileAsItIs) {
  static_cast<void>(copyRecordsAfter(extent, oldFile, fresh, problem));

  EXPECT_THAT(rows(oldFile, "SELECT count(*) FROM analytics_events"), ElementsAre("1000"));
}

TEST_F(StoreExtentTest, SaysWhatCannotBeCopied) {
  execute(oldFile, "DROP VIEW issue_metrics; DROP TABLE issue_metric_records");

  EXPECT_EQ(copyRecordsAfter(extent, oldFile, fresh, problem), 400U);
  EXPECT_THAT(problem, HasSubstr("issue_metric_records"));
}

TEST_F(StoreExtentTest, SaysThatTheFileCannotBeReadAtAll) {
  writeFile(oldFile, "no database");

  EXPECT_EQ(copyRecordsAfter(extent, oldFile, fresh, problem), 0U);
  EXPECT_THAT(problem, HasSubstr(oldFile));
}

}  // namespace
}  // namespace halvox::platform::linux_
