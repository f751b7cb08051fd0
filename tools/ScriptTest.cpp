#include "tools/Script.h"

#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "client/testing/TestService.h"

namespace halvox::tools {
namespace {

using Words = std::vector<std::string>;

Words wordsOf(std::string_view line) {
  auto words = splitLine(line);
  return words ? *words : Words{"error", words.error().message};
}

TEST(SplitLineTest, SplitsAtBlanksAsAShellDoes) {
  EXPECT_EQ(wordsOf("  create\t7 \r"), (Words{"create", "7"}));
  EXPECT_EQ(wordsOf(R"(a 'b c' "d \"e\\" f\ g ''x)"), (Words{"a", "b c", "d \"e\\", "f g", "x"}));
  EXPECT_EQ(wordsOf(""), Words{});
}

TEST(SplitLineTest, LeavesCommentsOut) {
  EXPECT_EQ(wordsOf("# all of it"), Words{});
  EXPECT_EQ(wordsOf("stop 7 # a comment"), (Words{"stop", "7"}));
  EXPECT_EQ(wordsOf("a#b '#' "), (Words{"a#b", "#"}));
}

TEST(SplitLineTest, JsonAtTheEndNeedsNoQuotes) {
  EXPECT_EQ(wordsOf(R"(configure 7 {"a b": "c # d"}  )"),
            (Words{"configure", "7", R"({"a b": "c # d"})"}));
  EXPECT_EQ(wordsOf(R"(configure 7 '{"a": 1}' --json)"),
            (Words{"configure", "7", R"({"a": 1})", "--json"}));
}

TEST(SplitLineTest, RefusesWhatIsNotClosed) {
  EXPECT_EQ(wordsOf("a 'b"), (Words{"error", "the quote ' is not closed"}));
  EXPECT_EQ(wordsOf("a \"b\\\""), (Words{"error", "the quote \" is not closed"}));
  EXPECT_EQ(wordsOf("a \\"), (Words{"error", "a backslash ends the line"}));
}

class ScriptTest : public testing::Test {
 protected:
  ExitStatus run(const std::string& script, bool keepsGoing = false) {
    std::istringstream lines(script);
    CommonOptions options;
    options.socket = scratch_.path("reporting.sock");
    return runScript({lines, "file", false, keepsGoing}, options, out_, errors_);
  }

  client::ScratchDirectory scratch_;
  client::TestService service_{scratch_.path("reporting.sock")};
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(ScriptTest, SessionsLiveFromLineToLine) {
  EXPECT_EQ(run("# one life\ncreate 7\nset-type 7 telephony\n\nstart 7\nlist\ntype 7\nvalid 7\n"
                "stop 7\nwait 7\ndestroy 7\n"),
            ExitStatus::kDone);

  EXPECT_EQ(out_.str(), "7\ntelephony\nsession 7: telephony\n");
  EXPECT_EQ(errors_.str(), "");
}

TEST_F(ScriptTest, EndsAtTheFirstLineThatFailsAndNamesIt) {
  EXPECT_EQ(run("create 7\n\nvalid 8\ncreate 9\n"), ExitStatus::kRefused);

  EXPECT_EQ(service_.members(), "createReportingSession reporterIDValid");
}

TEST_F(ScriptTest, NamesTheLineOfABadArgument) {
  EXPECT_EQ(run("create 7\ncreate x\n"), ExitStatus::kBadArguments);

  EXPECT_EQ(errors_.str().substr(0, 26), "file:2: create: ID: \"x\" is");
}

TEST_F(ScriptTest, NamesTheLineOfARefusal) {
  service_.refuse("sendMessage");

  EXPECT_EQ(run("\nsend --all --category 1 --type 1 {}\n"), ExitStatus::kRefused);

  EXPECT_EQ(errors_.str(), "file:2: send: refused by the test (com.tarno.audio.reporting.Code1)\n");
}

TEST_F(ScriptTest, MayContinueAfterFailuresAndReturnsTheFirst) {
  EXPECT_EQ(run("create x\nvalid 8\ncreate 9\n", true), ExitStatus::kBadArguments);

  EXPECT_EQ(service_.members(), "reporterIDValid createReportingSession");
}

TEST_F(ScriptTest, ALostConnectionEndsItInAnyCase) {
  EXPECT_EQ(run("create 7\nkill\ncreate 8\ncreate 9\n", true), ExitStatus::kNoService);

  EXPECT_EQ(errors_.str(), "file:3: create: the service ended the connection\n");
}

TEST_F(ScriptTest, AStartThatStillRunsIsNotAnsweredInTime) {
  EXPECT_EQ(run("create 7\nstart 7 --wait 0.05\n"), ExitStatus::kRefused);

  EXPECT_NE(errors_.str().find("file:2: start: the start was not answered in time"),
            std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
