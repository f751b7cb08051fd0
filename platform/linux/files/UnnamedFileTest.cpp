#include "platform/linux/files/UnnamedFile.h"

#include <cerrno>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

int removeNothing(const char* /*name*/) {
  errno = EACCES;
  return -1;
}

// Succeeds while no file has the name. Fails once the file exists.
int removeNothingThatExists(const char* name) {
  errno = ::access(name, F_OK) == 0 ? EACCES : ENOENT;
  return -1;
}

class UnnamedFileTest : public ::testing::Test {
 protected:
  [[nodiscard]] auto names() const {
    return std::distance(std::filesystem::directory_iterator(directory_),
                         std::filesystem::directory_iterator());
  }

  const ScratchDirectory scratch_;
  const std::filesystem::path& directory_ = scratch_.path();
  UniqueFd file_;
};

TEST_F(UnnamedFileTest, HasNoNameAndNobodyElseReadsIt) {
  ASSERT_EQ(createUnnamedFile(directory_, file_), 0);

  EXPECT_EQ(names(), 0);
  struct stat status {};
  ASSERT_EQ(::fstat(file_.get(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(UnnamedFileTest, ANameThatCannotBeRemovedIsAnErrorAndLeavesNoDescriptor) {
  EXPECT_EQ(createUnnamedFile(directory_, file_, removeNothingThatExists), EACCES);

  EXPECT_FALSE(file_);
}

TEST_F(UnnamedFileTest, ManyAttemptsLeaveOneFileAtMost) {
  for (int attempt = 0; attempt < 5; ++attempt) {
    EXPECT_EQ(createUnnamedFile(directory_, file_, removeNothingThatExists), EACCES);
  }
  EXPECT_EQ(names(), 1);

  EXPECT_EQ(createUnnamedFile(directory_, file_, removeNothing), EACCES);
  EXPECT_EQ(names(), 1);
}

TEST_F(UnnamedFileTest, AFileThatRemainedIsReplaced) {
  { std::ofstream(directory_ / ".halvox-overflow") << "of a process that was killed"; }

  ASSERT_EQ(createUnnamedFile(directory_, file_), 0);

  EXPECT_EQ(names(), 0);
  EXPECT_EQ(::lseek(file_.get(), 0, SEEK_END), 0);
}

TEST_F(UnnamedFileTest, AFileThatAnotherProcessCreatesMeanwhileIsReplaced) {
  static int calls;
  calls = 0;
  // After the first removal, another process creates its file.
  const auto remove = [](const char* name) {
    const int result = ::unlink(name);
    if (calls++ == 0) std::ofstream(name) << "of another process";
    return result;
  };

  ASSERT_EQ(createUnnamedFile(directory_, file_, remove), 0);

  EXPECT_EQ(calls, 3);
  EXPECT_EQ(names(), 0);
  EXPECT_EQ(::lseek(file_.get(), 0, SEEK_END), 0);
}

TEST_F(UnnamedFileTest, ADirectoryThatHasTheNameDoesNotMatter) {
  std::filesystem::create_directory(directory_ / ".halvox-overflow");

  ASSERT_EQ(createUnnamedFile(directory_, file_), 0);

  EXPECT_TRUE(file_);
  EXPECT_EQ(names(), 1);
}

TEST_F(UnnamedFileTest, SaysWhyThereIsNoFile) {
  EXPECT_EQ(createUnnamedFile(directory_ / "missing", file_), ENOENT);

  EXPECT_FALSE(file_);
}

}  // namespace
}  // namespace halvox::platform::linux_
