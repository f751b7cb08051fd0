#include "tools/Report.h"

#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>

#include "tools/ReportPage.h"
#include "tools/StoreCommandFixture.h"

namespace halvox::tools {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

class ReportTest : public StoreCommandFixture {
 protected:
  void SetUp() override {
    if (reportPageBeforeData().empty()) GTEST_SKIP() << "this build has no page (HALVOX_REPORT)";
    store("com.tarno.halvox.Session_Playback.Start", {{"run", 1}});
  }

  ExitStatus run(const std::string& to) {
    return writeReport({.to = to, .database = directory()}, options_, streams());
  }
  [[nodiscard]] std::string file() const { return scratch_.path("report.html"); }
  [[nodiscard]] std::string content() const {
    std::ifstream stream(file());
    return {std::istreambuf_iterator<char>(stream), {}};
  }
};

TEST_F(ReportTest, WritesAPageAndSaysWhatIsInIt) {
  EXPECT_EQ(run(file()), ExitStatus::kDone);

  EXPECT_EQ(output(), file() + ": 1 streams, 0 xruns, 1 messages\n");
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(content(), StartsWith("<!doctype html>"));
  EXPECT_THAT(content(), EndsWith("</html>\n"));
}

TEST_F(ReportTest, SaysItInJson) {
  options_.json = true;

  EXPECT_EQ(run(file()), ExitStatus::kDone);

  EXPECT_EQ(output(), "{\"file\":\"" + file() + "\",\"streams\":1,\"xruns\":0,\"messages\":1}\n");
}

TEST_F(ReportTest, WritesToTheStandardOutput) {
  EXPECT_EQ(run("-"), ExitStatus::kDone);

  EXPECT_THAT(output(), StartsWith("<!doctype html>"));
}

TEST_F(ReportTest, ReplacesAnOlderReport) {
  std::ofstream(file()) << "old";

  EXPECT_EQ(run(file()), ExitStatus::kDone);

  EXPECT_THAT(content(), StartsWith("<!doctype html>"));
}

TEST_F(ReportTest, DoesNotReplaceADirectory) {
  std::filesystem::create_directory(file());

  EXPECT_EQ(run(file()), ExitStatus::kCannotWrite);

  EXPECT_THAT(errors(), HasSubstr(file() + " is a directory; expected a file to write"));
  EXPECT_TRUE(std::filesystem::is_directory(file()));
}

TEST_F(ReportTest, LeavesNothingBehindWhenItCannotWrite) {
  const std::string missing = scratch_.path("missing/report.html");

  EXPECT_EQ(run(missing), ExitStatus::kCannotWrite);

  EXPECT_THAT(errors(), HasSubstr(missing + ": "));
  EXPECT_THAT(errors(), HasSubstr("No such file or directory"));
}

TEST_F(ReportTest, WithoutAStoreThereIsNoReport) {
  std::filesystem::remove(directory() + "/halvox.db");

  EXPECT_EQ(run(file()), ExitStatus::kNoService);

  EXPECT_FALSE(std::filesystem::exists(file()));
}

}  // namespace
}  // namespace halvox::tools
