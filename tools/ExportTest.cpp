#include "tools/Export.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>

#include <gmock/gmock.h>

#include "tools/StoreCommandFixture.h"

namespace halvox::tools {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class ExportTest : public StoreCommandFixture {
 protected:
  ExportTest() { store("com.a", {{"n", 1}}); }

  ExitStatus run(ExportRecords request = {}) {
    if (request.to == "-" && request.format == ExportFormat::kSqlite) request.to = file();
    request.database = directory();
    return exportRecords(request, options_, streams());
  }
  [[nodiscard]] std::string file() const { return scratch_.path("plain.db"); }
  [[nodiscard]] std::string content() const {
    std::ifstream stream(file());
    return {std::istreambuf_iterator<char>(stream), {}};
  }
};

TEST_F(ExportTest, SaysHowManyRecordsItWrote) {
  EXPECT_EQ(run(), ExitStatus::kDone);
  EXPECT_EQ(output(), file() + ": 1 records\n");
  EXPECT_GT(std::filesystem::file_size(file()), 0U);
}

TEST_F(ExportTest, SaysItInJson) {
  options_.json = true;
  EXPECT_EQ(run(), ExitStatus::kDone);
  EXPECT_EQ(output(), "{\"file\":\"" + file() + "\",\"records\":1}\n");
}

TEST_F(ExportTest, ReplacesAFileOnlyIfAsked) {
  for (const auto format : {ExportFormat::kSqlite, ExportFormat::kJsonl}) {
    std::ofstream(file()) << "mine";
    EXPECT_EQ(run({.format = format, .to = file()}), ExitStatus::kBadArguments);
    EXPECT_THAT(errors(), HasSubstr(file() + " exists; --force replaces it"));
    EXPECT_EQ(content(), "mine");
    EXPECT_EQ(run({.format = format, .to = file(), .replace = true}), ExitStatus::kDone);
    EXPECT_GT(content().size(), 4U);
  }
}

TEST_F(ExportTest, TheStandardOutputHasTheRecordsAlone) {
  options_.json = true;
  EXPECT_EQ(run({.format = ExportFormat::kJsonl}), ExitStatus::kDone);
  EXPECT_THAT(output(), StartsWith("{\"kind\":\"events\",\"id\":"));
  EXPECT_THAT(output(), HasSubstr("\"time\":100,\"name\":\"com.a\",\"application\":\"\","
                                  "\"payload\":{\"n\":1}}\n"));
  EXPECT_EQ(output().find('\n'), output().size() - 1);
  EXPECT_EQ(errors(), "");
}

TEST_F(ExportTest, KindsTimesAndApplicationsSelect) {
  store("com.b", {{"HostApplicationDisplayID", "org.player"}});
  const auto linesOf = [&](ExportRecords request) {
    request.format = ExportFormat::kCsv;
    EXPECT_EQ(run(request), ExitStatus::kDone);
    const std::string text = output();
    return std::count(text.begin(), text.end(), '\n') - 1;
  };
  EXPECT_EQ(linesOf({}), 2);
  EXPECT_EQ(linesOf({.since = 101}), 1);
  EXPECT_EQ(linesOf({.until = 101}), 1);
  EXPECT_EQ(linesOf({.applications = {"org.*"}}), 1);
  EXPECT_EQ(linesOf({.kinds = {.events = false}}), 0);
  EXPECT_EQ(linesOf({.kinds = {.link = false}}), 2);
}

TEST_F(ExportTest, AFileThatCannotBeWrittenIsAnError) {
  EXPECT_EQ(run({.format = ExportFormat::kJsonl, .to = "/nowhere/records"}),
            ExitStatus::kCannotWrite);
  EXPECT_THAT(errors(), HasSubstr("/nowhere/records: No such file or directory"));
  EXPECT_EQ(run({.format = ExportFormat::kJsonl, .to = directory()}), ExitStatus::kBadArguments);
  EXPECT_THAT(errors(), HasSubstr("is a directory; expected a file to write"));
  EXPECT_EQ(run({.to = "/dev/null"}), ExitStatus::kBadArguments);
  EXPECT_THAT(errors(), HasSubstr("/dev/null is not a file"));
}

TEST_F(ExportTest, AFullDiskIsAnErrorAndLeavesNothing) {
  EXPECT_EQ(run({.format = ExportFormat::kCsv, .to = "/dev/full"}), ExitStatus::kCannotWrite);
  EXPECT_THAT(errors(), HasSubstr("/dev/full: No space left on device"));
}

}  // namespace
}  // namespace halvox::tools
