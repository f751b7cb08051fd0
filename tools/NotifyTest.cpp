#include "tools/Notify.h"

#include <filesystem>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "client/testing/TestService.h"

namespace halvox::tools {
namespace {

const std::string kName = "com.tarno.halvox.reporting";
const std::string kOther = "com.tarno.pavisk.spatial-audio-accessory-feature.changed";

class NotifyTest : public testing::Test {
 protected:
  ExitStatus post(const std::string& name) {
    errors_.str("");
    return postNotification({.name = name, .directory = directory_}, OutputForm::kText, out_,
                            errors_);
  }

  client::ScratchDirectory scratch_;
  std::string directory_ = scratch_.path("a/notify");
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(NotifyTest, MakesTheDirectoryAndTheFile) {
  EXPECT_EQ(post("com.tarno.halvox.reporting"), ExitStatus::kDone);

  EXPECT_TRUE(std::filesystem::is_regular_file(directory_ + "/com.tarno.halvox.reporting"));
  EXPECT_EQ(errors_.str(), "");
}

TEST_F(NotifyTest, TouchesAFileThatIsThereAndLeavesItsContent) {
  ASSERT_EQ(post(kName), ExitStatus::kDone);
  const std::string file = directory_ + "/" + kName;
  std::ofstream(file) << "text";
  const auto longAgo = std::filesystem::file_time_type::clock::now() - std::chrono::hours(1);
  std::filesystem::last_write_time(file, longAgo);

  EXPECT_EQ(post(kName), ExitStatus::kDone);

  EXPECT_GT(std::filesystem::last_write_time(file), longAgo + std::chrono::minutes(59));
  EXPECT_EQ(std::filesystem::file_size(file), 4U);
}

TEST_F(NotifyTest, NamesThatLeaveTheDirectoryAreBadArguments) {
  for (const std::string name : {"", "..", "a/b", "/tmp/x"}) {
    EXPECT_EQ(post(name), ExitStatus::kBadArguments) << name;
    EXPECT_NE(errors_.str().find("halvoxctl notify: NAME:"), std::string::npos);
  }
  EXPECT_FALSE(std::filesystem::exists(directory_));
}

TEST_F(NotifyTest, NamesThatTheServiceDoesNotWatchAreRefused) {
  EXPECT_EQ(post("bogus"), ExitStatus::kBadArguments);

  EXPECT_EQ(errors_.str(),
            "halvoxctl notify: NAME: nothing was posted: the service does not listen "
            "for \"bogus\"; expected " +
                kName + " or " + kOther + "\n");
  EXPECT_FALSE(std::filesystem::exists(directory_));
}

TEST_F(NotifyTest, ASpecialFileIsReportedWithoutBlocking) {
  ASSERT_EQ(post(kOther), ExitStatus::kDone);
  ASSERT_EQ(::mkfifo((directory_ + "/" + kName).c_str(), 0600), 0);

  EXPECT_EQ(post(kName), ExitStatus::kCannotWrite);
  EXPECT_NE(errors_.str().find(directory_ + "/" + kName + ": "), std::string::npos);
}

}  // namespace
}  // namespace halvox::tools
