// Tests what happens if the system refuses a file or a directory, and which files a killed service
// leaves.

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/files/FilesFixture.h"
#include "platform/linux/files/UnfinishedFile.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;

constexpr uid_t kNobody = 65534;

class RootedFileFailureTest : public FilesFixture {
 protected:
  RootedFileFailureTest() { fs::create_directories(root_ / "a"); }
  ~RootedFileFailureTest() override {
    if (isMounted_) ::umount2((root_ / "a").c_str(), MNT_DETACH);
  }

  // Mounts a small file system on the directory. Returns false if this process may not mount.
  bool mountSmall(unsigned long flags) {
    isMounted_ = ::mount("halvox-test", (root_ / "a").c_str(), "tmpfs", flags, "size=256k") == 0;
    return isMounted_;
  }
  UniqueFd openDirectory() const {
    return UniqueFd(::open((root_ / "a").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  }

  bool isMounted_ = false;
};

TEST_F(RootedFileFailureTest, FullDiskIsAnErrorThatLeavesNothingAndGivesTheSpaceBack) {
  if (!mountSmall(0)) GTEST_SKIP() << "this process may not mount a file system";
  const auto file = service_.createJsonArrayFile("/a", "f.json");
  for (int number = 0; number < 1000; ++number) {
    file->appendObject("key", {{"text", std::string(1000, 'x')}});
  }

  std::string path;
  const auto error = file->commit(path);
  const auto next = service_.createJsonArrayFile("/a", "next.json");

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code, ENOSPC);
  EXPECT_EQ(error->description,
            "cannot write " + (root_ / "a/f.json").string() + ": No space left on device");
  EXPECT_EQ(codeOf(*next), 0);
  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre("next.json"));
  EXPECT_EQ(count("files that failed"), 1U);
}

TEST_F(RootedFileFailureTest, ReadOnlyFileSystemIsAnError) {
  if (!mountSmall(MS_RDONLY)) GTEST_SKIP() << "this process may not mount a file system";

  EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", "f.json")), EROFS);
  const auto error = service_.createDirectory("/a/b", 0777);
  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description,
            "cannot create directory " + (root_ / "a/b").string() + ": Read-only file system");
}

TEST_F(RootedFileFailureTest, DirectoryThatIsMissingIsAnError) {
  std::string path;
  const auto error = service_.createJsonArrayFile("/b", "f.json")->commit(path);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->description,
            "cannot open directory " + (root_ / "b").string() + ": No such file or directory");
  EXPECT_EQ(path, "");
}

TEST_F(RootedFileFailureTest, FileInTheWayOfADirectoryIsAnError) {
  std::ofstream(root_ / "f") << "x";

  const auto error = service_.createDirectory("/f/b", 0777);

  ASSERT_TRUE(error.has_value());
  EXPECT_EQ(error->code, ENOTDIR);
}

TEST_F(RootedFileFailureTest, DirectoryInTheWayOfAFileIsAnError) {
  fs::create_directories(root_ / "a/f.json/b");

  EXPECT_NE(codeOf(*service_.createJsonArrayFile("/a", "f.json")), 0);

  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre("f.json"));
}

TEST_F(RootedFileFailureTest, DirectoryThatMayNotBeWrittenIsAnError) {
  fs::permissions(root_ / "a", fs::perms(0555));
  fs::permissions(scratch_, fs::perms(0755));
  const pid_t child = ::fork();
  if (child == 0) {
    // Become another user, because root may write everywhere.
    if (::geteuid() == 0 && ::setresuid(kNobody, kNobody, kNobody) != 0) ::_exit(99);
    ::_exit(codeOf(*service_.createJsonArrayFile("/a", "f.json")) == EACCES &&
                    service_.createDirectory("/a/b", 0777)->code == EACCES
                ? 0
                : 1);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  if (WIFEXITED(status) && WEXITSTATUS(status) == 99) GTEST_SKIP() << "cannot be another user";

  EXPECT_EQ(status, 0);
}

TEST_F(RootedFileFailureTest, LeftOversOfAKilledServiceAreRemovedAndNothingElse) {
  for (const char* name : {".halvox-1-0.tmp", ".halvox-1-1.tmp", ".other.tmp", "f.tmp"}) {
    std::ofstream(root_ / "a" / name) << "x";
    const timespec longAgo[2] = {{.tv_sec = 1000, .tv_nsec = 0}, {.tv_sec = 1000, .tv_nsec = 0}};
    ASSERT_EQ(::utimensat(AT_FDCWD, (root_ / "a" / name).c_str(), longAgo, 0), 0);
  }
  std::ofstream(root_ / "a/.halvox-1-2.tmp") << "just begun";

  EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", "f.json")), 0);

  EXPECT_THAT(namesIn(root_ / "a"),
              ElementsAre(".halvox-1-2.tmp", ".other.tmp", "f.json", "f.tmp"));
}

TEST_F(RootedFileFailureTest, FileWithANameOfItsOwnIsFinishedOrLeavesNothing) {
  UnfinishedFile unfinished;
  ASSERT_EQ(unfinished.begin(openDirectory(), UnfinishedFile::Naming::kOwnName), 0);
  ASSERT_EQ(namesIn(root_ / "a").size(), 1U);
  {
    UnfinishedFile letGo;
    ASSERT_EQ(letGo.begin(openDirectory(), UnfinishedFile::Naming::kOwnName), 0);
    ASSERT_EQ(namesIn(root_ / "a").size(), 2U);
  }
  ASSERT_EQ(unfinished.write("text"), 0);

  EXPECT_EQ(unfinished.finish("f.json"), 0);

  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre("f.json"));
  EXPECT_EQ(textOf(root_ / "a/f.json"), "text");
}

TEST_F(RootedFileFailureTest, FileThatIsBeingWrittenIsNotALeftOver) {
  UnfinishedFile making;
  ASSERT_EQ(making.begin(openDirectory(), UnfinishedFile::Naming::kOwnName), 0);
  const std::string name = namesIn(root_ / "a").front();
  const timespec longAgo[2] = {{.tv_sec = 1000, .tv_nsec = 0}, {.tv_sec = 1000, .tv_nsec = 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (root_ / "a" / name).c_str(), longAgo, 0), 0);

  EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", "f.json")), 0);

  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre(name, "f.json"));
}

}  // namespace
}  // namespace halvox::platform::linux_
