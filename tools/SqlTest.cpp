#include "tools/Sql.h"

#include <memory>
#include <string>

#include <gmock/gmock.h>

#include "tools/StoreCommandFixture.h"

namespace halvox::tools {
namespace {

using ::testing::HasSubstr;

// A store with two events, 100 and 101 seconds after 1970.
class SqlTest : public StoreCommandFixture {
 protected:
  SqlTest() {
    for (int number = 0; number < 2; ++number) store("com.a\x1b[2J", {{"n", number}});
  }

  ExitStatus run(const std::string& query, const std::string& input = "", bool isTerminal = false) {
    ToolStreams used = streams(input);
    used.isInputTerminal = isTerminal;
    return runSql({.query = query, .database = directory()}, options_, used);
  }
};

TEST_F(SqlTest, PrintsTheNamesOfTheColumnsAndTheRows) {
  EXPECT_EQ(run("SELECT time, payload, NULL AS absent FROM analytics_events"), ExitStatus::kDone);
  EXPECT_EQ(output(), "time\tpayload\tabsent\n100\t{\"n\":0}\t\n101\t{\"n\":1}\t\n");
}

TEST_F(SqlTest, PrintsAnObjectForEachRow) {
  options_.json = true;
  EXPECT_EQ(run("SELECT time, 'a\tb' AS text, NULL AS absent, 1 AS n, x'0aff' AS bytes"
                " FROM analytics_events LIMIT 1"),
            ExitStatus::kDone);
  EXPECT_EQ(output(),
            "{\"time\":100.0,\"text\":\"a\\tb\",\"absent\":null,\"n\":1,\"bytes\":\"0aff\"}\n");
}

TEST_F(SqlTest, EscapesWhatCouldControlTheTerminal) {
  run("SELECT name FROM analytics_events");
  EXPECT_THAT(output(), testing::Not(HasSubstr("\x1b")));
}

TEST_F(SqlTest, ReadsStatementsFromTheInput) {
  EXPECT_EQ(run("", "SELECT 1 AS a;\nSELECT 2\n AS b;\n"), ExitStatus::kDone);
  EXPECT_EQ(output(), "a\n1\nb\n2\n");
  EXPECT_EQ(errors(), "");
}

TEST_F(SqlTest, EndsWithTheFirstError) {
  EXPECT_EQ(run("SELECT 1 AS a; SELECT b; SELECT 3 AS c"), ExitStatus::kBadArguments);
  EXPECT_EQ(output(), "a\n1\n");
  EXPECT_THAT(errors(), HasSubstr("halvoxctl sql: no such column: b"));
}

TEST_F(SqlTest, AsksAtATerminalAndContinuesAfterAnError) {
  EXPECT_EQ(run("", "SELECT b;\nSELECT 2\nAS b;\nquit\nSELECT 3 AS c;\n", true), ExitStatus::kDone);
  EXPECT_EQ(output(), "b\n2\n");
  EXPECT_THAT(errors(), HasSubstr("no such column: b"));
  EXPECT_THAT(errors(), HasSubstr("halvox>    ...> halvox> "));
}

TEST_F(SqlTest, RefusesToChangeTheStore) {
  EXPECT_EQ(run("DELETE FROM message_blocks"), ExitStatus::kBadArguments);
  EXPECT_THAT(errors(), HasSubstr("only SELECT is allowed"));
}

}  // namespace
}  // namespace halvox::tools
