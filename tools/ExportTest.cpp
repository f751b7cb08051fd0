#include "tools/Export.h"

#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>

#include <gmock/gmock.h>

#include "tools/StoredEventsFixture.h"

namespace halvox::tools {
namespace {

using ::testing::HasSubstr;

class ExportTest : public StoredEventsFixture {
 protected:
  ExportTest() { store("com.a", {{"n", 1}}); }

  ExitStatus run(bool replace = false) {
    output_.str("");
    errors_.str("");
    std::istringstream none;
    return exportRecords({.to = file(), .replace = replace, .database = directory()}, options_,
                         {none, output_, errors_});
  }
  [[nodiscard]] std::string file() const { return scratch_.path("plain.db"); }
  [[nodiscard]] std::string output() const { return output_.str(); }
  [[nodiscard]] std::string errors() const { return errors_.str(); }

  CommonOptions options_;

 private:
  std::ostringstream output_;
  std::ostringstream errors_;
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
  std::ofstream(file()) << "mine";
  EXPECT_EQ(run(), ExitStatus::kBadArguments);
  EXPECT_THAT(errors(), HasSubstr(file() + " exists; --force replaces it"));
  EXPECT_EQ(std::filesystem::file_size(file()), 4U);
  EXPECT_EQ(run(true), ExitStatus::kDone);
  EXPECT_GT(std::filesystem::file_size(file()), 4U);
}

}  // namespace
}  // namespace halvox::tools
