#include "tools/PreferenceWriting.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/settings/SettingsFixture.h"
#include "platform/linux/testing/FileSizeLimit.h"

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::FileSizeLimit;
using platform::linux_::Result;
using platform::linux_::SettingsFixture;

class PreferenceWritingTest : public SettingsFixture {
 protected:
  static PreferenceEdit to(std::string text) {
    return [text = std::move(text)](std::string_view, const std::filesystem::path&) {
      return Result<std::string>(text);
    };
  }
  std::size_t filesBeside() const {
    const std::filesystem::directory_iterator all(file_.parent_path());
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
  }
  static unsigned modeOf(const std::filesystem::path& path) {
    struct stat status {};
    ::stat(path.c_str(), &status);
    return status.st_mode & 07777U;
  }

  const std::filesystem::path file_ = domainFile("domain");
};

TEST_F(PreferenceWritingTest, MakesFileAndDirectories) {
  EXPECT_TRUE(changePreferenceFile(file_, to("a = 1\n")));

  EXPECT_EQ(read(file_), "a = 1\n");
  EXPECT_EQ(filesBeside(), 1U);
}

TEST_F(PreferenceWritingTest, TheEditSeesWhatIsThere) {
  write(file_, "a = 1\n");
  std::string seen;
  const auto edit = [&seen](std::string_view text, const std::filesystem::path&) {
    seen = text;
    return Result<std::string>(seen + "b = 2\n");
  };

  EXPECT_TRUE(changePreferenceFile(file_, edit));

  EXPECT_EQ(seen, "a = 1\n");
  EXPECT_EQ(read(file_), "a = 1\nb = 2\n");
}

TEST_F(PreferenceWritingTest, KeepsThePermissions) {
  write(file_, "a = 1\n");
  ::chmod(file_.c_str(), 0640);

  EXPECT_TRUE(changePreferenceFile(file_, to("a = 2\n")));

  EXPECT_EQ(modeOf(file_), 0640U);
}

TEST_F(PreferenceWritingTest, ALinkStaysALink) {
  write(scratch_ / "real.toml", "a = 1\n");
  std::filesystem::create_directories(file_.parent_path());
  std::filesystem::create_symlink(scratch_ / "real.toml", file_);

  EXPECT_TRUE(changePreferenceFile(file_, to("a = 2\n")));

  EXPECT_TRUE(std::filesystem::is_symlink(file_));
  EXPECT_EQ(read(scratch_ / "real.toml"), "a = 2\n");
}

TEST_F(PreferenceWritingTest, ALinkToAFileThatIsMissingStaysALinkToo) {
  std::filesystem::create_directories(file_.parent_path());
  std::filesystem::create_symlink(scratch_ / "elsewhere" / "real.toml", file_);

  EXPECT_TRUE(changePreferenceFile(file_, to("a = 2\n")));

  EXPECT_TRUE(std::filesystem::is_symlink(file_));
  EXPECT_EQ(read(scratch_ / "elsewhere" / "real.toml"), "a = 2\n");
}

TEST_F(PreferenceWritingTest, AFailedWriteLeavesTheOldFileAndNothingElse) {
  write(file_, "a = 1\n");
  const auto changed = [this] {
    const FileSizeLimit limit(8);
    return changePreferenceFile(file_, to("a = \"much too long\"\n"));
  }();

  ASSERT_FALSE(changed);
  EXPECT_EQ(changed.error().message, file_.native() + ": File too large");
  EXPECT_EQ(read(file_), "a = 1\n");
  EXPECT_EQ(filesBeside(), 1U);
}

TEST_F(PreferenceWritingTest, ADirectoryThatStaysLockedIsAnError) {
  write(file_, "a = 1\n");
  const int directory = ::open(file_.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  ASSERT_EQ(::flock(directory, LOCK_EX), 0);

  const auto changed = changePreferenceFile(file_, to("a = 2\n"), std::chrono::milliseconds(20));
  ::close(directory);

  ASSERT_FALSE(changed);
  EXPECT_EQ(changed.error().message,
            file_.parent_path().native() +
                ": another program has locked this directory; try again later");
  EXPECT_EQ(read(file_), "a = 1\n");
}

TEST_F(PreferenceWritingTest, ARefusedEditLeavesTheFileAlone) {
  write(file_, "a = 1\n");

  const auto changed = changePreferenceFile(
      file_, [](auto, const auto&) { return Result<std::string>(Failure<>{"no"}); });

  ASSERT_FALSE(changed);
  EXPECT_EQ(changed.error().message, "no");
  EXPECT_EQ(read(file_), "a = 1\n");
  EXPECT_EQ(filesBeside(), 1U);
}

TEST_F(PreferenceWritingTest, ADirectoryThatCannotBeMadeIsNamed) {
  write(preferences(), "a file");

  const auto changed = changePreferenceFile(file_, to("a = 1\n"));

  ASSERT_FALSE(changed);
  EXPECT_NE(changed.error().message.find(file_.parent_path().native()), std::string::npos);
}

TEST_F(PreferenceWritingTest, SpecialFilesAreNotChanged) {
  std::filesystem::create_directories(file_.parent_path());
  ASSERT_EQ(::mkfifo(file_.c_str(), 0600), 0);

  const auto changed = changePreferenceFile(file_, to("a = 1\n"));

  ASSERT_FALSE(changed);
  EXPECT_TRUE(std::filesystem::is_fifo(file_));
}

}  // namespace
}  // namespace halvox::tools
