#include "platform/linux/store/reading/StoreQueries.h"

#include <memory>
#include <string>
#include <vector>

#include "platform/linux/store/StoreFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class StoreQueriesTest : public StoreFixture {
 protected:
  StoreQueriesTest() { platform.clock.setCurrentDate({1'700'000'000}); }

  void openQueries() {
    const auto opened = queries.open(options.directory);
    ASSERT_TRUE(opened) << opened.error().message;
  }
  // Runs the first statement of `sql` and removes it. Returns one line with the names of the
  // columns and one line for each row, with '|' between the columns. If there is an error, the last
  // line is its message.
  std::vector<std::string> lines(std::string_view& sql) {
    std::vector<std::string> result;
    const auto ran = queries.runFirst(
        sql,
        [&](const std::vector<std::string>& names) {
          std::string line;
          for (const std::string& name : names) line += name + '|';
          result.push_back(line);
        },
        [&](const std::vector<StoreQueries::Value>& values) {
          std::string line;
          for (const auto& value : values) line += textOf(value) + '|';
          result.push_back(line);
        });
    if (!ran) result.push_back(ran.error().message);
    return result;
  }
  std::vector<std::string> ask(std::string_view sql) { return lines(sql); }

  StoreQueries queries;

 private:
  static std::string textOf(const StoreQueries::Value& value) {
    if (const auto* number = std::get_if<std::int64_t>(&value)) return std::to_string(*number);
    if (const auto* real = std::get_if<double>(&value)) return std::to_string(*real);
    if (const auto* text = std::get_if<std::string_view>(&value)) return std::string(*text);
    if (const auto* bytes = std::get_if<std::span<const std::byte>>(&value)) {
      return std::to_string(bytes->size()) + " bytes";
    }
    return "null";
  }
};

TEST_F(StoreQueriesTest, ReadsViewsWhileTheServiceWrites) {
  start();
  send(1, "com.tarno.one");
  ASSERT_TRUE(allIsStored());
  openQueries();
  send(2, "com.tarno.two");
  ASSERT_TRUE(allIsStored());
  EXPECT_THAT(ask("SELECT name, time FROM analytics_events"),
              ElementsAre("name|time|", "com.tarno.one|1700000000.000000|",
                          "com.tarno.two|1700000000.000000|"));
}

// The first statement of a connection makes the tables that unpack messages.
TEST_F(StoreQueriesTest, ReadsTheApplicationsOfEvents) {
  start();
  service->sendAnalyticsEventLazy("com.tarno.test", [] {
    return Dictionary{{"HostApplicationDisplayID", "org.app"}};
  });
  stop();
  openQueries();
  EXPECT_THAT(ask("SELECT application AS a FROM halvox_events"), ElementsAre("a|", "org.app|"));
}

TEST_F(StoreQueriesTest, TakesPayloadsApartWithTheTablesOfJson) {
  start();
  openQueries();
  EXPECT_THAT(ask("SELECT key, value FROM json_each('{\"a\": 1}')"),
              ElementsAre("key|value|", "a|1|"));
  EXPECT_THAT(ask("SELECT path FROM json_tree('[2]') WHERE atom = 2"), ElementsAre("path|", "$|"));
}

TEST_F(StoreQueriesTest, GivesEachValueItsType) {
  start();
  stop();
  openQueries();
  EXPECT_THAT(ask("SELECT NULL AS a, 7, 0.5, 'text', x'0102', x''"),
              ElementsAre("a|7|0.5|'text'|x'0102'|x''|", "null|7|0.500000|text|2 bytes|0 bytes|"));
}

TEST_F(StoreQueriesTest, RunsOneStatementAfterTheOther) {
  start();
  stop();
  openQueries();
  std::string_view sql = "SELECT 1 AS a; -- more\n SELECT 2 AS b;\n -- the end\n";
  EXPECT_THAT(lines(sql), ElementsAre("a|", "1|"));
  EXPECT_THAT(lines(sql), ElementsAre("b|", "2|"));
  EXPECT_THAT(lines(sql), IsEmpty());
  EXPECT_THAT(sql, IsEmpty());
}

TEST_F(StoreQueriesTest, AllowsOnlyReading) {
  start();
  send(1);
  stop();
  openQueries();
  for (const char* const sql :
       {"DELETE FROM message_blocks", "BEGIN", "ATTACH '/tmp/other' AS other",
        "PRAGMA user_version", "CREATE TEMP TABLE t(a)", "VACUUM INTO '/tmp/other'"}) {
    EXPECT_THAT(ask(sql).back(), HasSubstr("only SELECT is allowed")) << sql;
  }
  EXPECT_THAT(ask("PRAGMA table_info(analytics_events)").size(), 4U);
}

TEST_F(StoreQueriesTest, ReportsWhatIsWrongInAStatement) {
  start();
  stop();
  openQueries();
  EXPECT_THAT(ask("SELECT missing FROM analytics_events"),
              ElementsAre(HasSubstr("no such column: missing")));
}

TEST_F(StoreQueriesTest, ReportsThatThereIsNoStore) {
  const auto opened = queries.open(options.directory);
  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, StoreError::kMissing);
}

TEST_F(StoreQueriesTest, KnowsTheEndOfAStatement) {
  EXPECT_TRUE(StoreQueries::isComplete("SELECT ';' ;\n"));
  EXPECT_FALSE(StoreQueries::isComplete("SELECT ';'\n"));
}

}  // namespace
}  // namespace halvox::platform::linux_
