#include "tools/Export.h"

#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>

#include <gmock/gmock.h>

#include "client/testing/TestService.h"
#include "platform/fake/FakePlatform.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::tools {
namespace {

using platform::linux_::Backpressure;
using platform::linux_::SqliteAnalyticsService;
using platform::linux_::SqliteStore;
using platform::linux_::StoreOptions;
using ::testing::HasSubstr;

class ExportTest : public testing::Test {
 protected:
  ExportTest() {
    StoreOptions options;
    options.directory = scratch_.path("state");
    store_ = std::make_unique<SqliteStore>(
        options, SqliteStore::Environment{platform_.clock, platform_.statistics, backpressure_});
    EXPECT_TRUE(store_->open());
    SqliteAnalyticsService service(*store_, platform_.clock);
    service.sendAnalyticsEventLazy("com.a", [] { return platform::Dictionary{{"n", 1}}; });
    EXPECT_TRUE(client::eventually([this] { return store_->waiting() == 0; }));
  }

  ExitStatus run(bool replace = false) {
    output_.str("");
    errors_.str("");
    std::istringstream none;
    return exportRecords({.to = file(), .replace = replace, .database = scratch_.path("state")},
                         options_, {none, output_, errors_});
  }
  [[nodiscard]] std::string file() const { return scratch_.path("plain.db"); }
  [[nodiscard]] std::string output() const { return output_.str(); }
  [[nodiscard]] std::string errors() const { return errors_.str(); }

  CommonOptions options_;

 private:
  client::ScratchDirectory scratch_;
  platform::FakePlatform platform_;
  Backpressure backpressure_;
  std::unique_ptr<SqliteStore> store_;
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
