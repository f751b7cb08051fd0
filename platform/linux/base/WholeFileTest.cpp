#include "platform/linux/base/WholeFile.h"

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

using Outcome = FileContent::Outcome;

class WholeFileTest : public ::testing::Test {
 protected:
  WholeFileTest() {
    std::string pattern = std::filesystem::temp_directory_path() / "halvox-base-XXXXXX";
    directory_ = ::mkdtemp(pattern.data());
  }
  ~WholeFileTest() override { std::filesystem::remove_all(directory_); }

  std::string write(const std::string& name, const std::string& text) const {
    std::ofstream(directory_ / name) << text;
    return directory_ / name;
  }
  std::string makePipe() const {
    std::string path = directory_ / "pipe";
    EXPECT_EQ(::mkfifo(path.c_str(), 0600), 0);
    return path;
  }

  std::filesystem::path directory_;
};

// Waits until everything in the pipe has been read.
bool waitUntilEmpty(int pipe) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  int waiting = 1;
  while (::ioctl(pipe, FIONREAD, &waiting) == 0 && waiting > 0) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return waiting == 0;
}

TEST_F(WholeFileTest, ReadsAFileWithItsSizeAndMode) {
  const std::string text(40'000, 'x');  // more than one piece
  const std::string path = write("file", text);
  ASSERT_EQ(::chmod(path.c_str(), 0640), 0);

  const FileContent content = readWholeFile({.path = path.c_str(), .most = 100'000});

  EXPECT_EQ(content.outcome, Outcome::kRead);
  EXPECT_EQ(content.bytes, text);
  EXPECT_EQ(content.size, text.size());
  EXPECT_EQ(content.mode & 07777U, 0640U);
}

TEST_F(WholeFileTest, ReadsBelowADirectory) {
  write("file", "text");
  const UniqueFd directory = openDirectory(directory_.c_str());

  EXPECT_EQ(readWholeFile({.path = "file", .most = 10, .directory = directory.get()}).bytes,
            "text");
  EXPECT_FALSE(openDirectory("file", directory.get()));
}

TEST_F(WholeFileTest, WhatIsNotThereIsMissing) {
  const std::string file = write("file", "text");
  const std::string below = file + "/x";
  const std::string none = directory_ / "none";

  EXPECT_EQ(readWholeFile({.path = none.c_str(), .most = 10}).outcome, Outcome::kMissing);
  EXPECT_EQ(readWholeFile({.path = none.c_str(), .most = 10}).error, ENOENT);
  EXPECT_EQ(readWholeFile({.path = below.c_str(), .most = 10}).error, ENOTDIR);
  EXPECT_TRUE(readWholeFile({.path = below.c_str(), .most = 10}).isMissing());
  EXPECT_TRUE(readWholeFile({.path = none.c_str(), .most = 10, .kinds = FileToRead::Kinds::kAny})
                  .isMissing());
}

TEST_F(WholeFileTest, BoundIsInclusive) {
  const std::string path = write("file", "12345");

  EXPECT_EQ(readWholeFile({.path = path.c_str(), .most = 5}).bytes, "12345");
  EXPECT_EQ(readWholeFile({.path = path.c_str(), .most = 4}).outcome, Outcome::kTooLarge);
  EXPECT_EQ(readWholeFile({.path = path.c_str(), .most = 4}).bytes, "");
}

TEST_F(WholeFileTest, CutsALargerFileOnDemand) {
  const std::string path = write("file", "12345");

  const FileContent content =
      readWholeFile({.path = path.c_str(), .most = 4, .excess = FileToRead::Excess::kCut});

  EXPECT_EQ(content.outcome, Outcome::kTooLarge);
  EXPECT_EQ(content.bytes, "1234");
}

TEST_F(WholeFileTest, ReadsKernelFilesThatClaimToBeEmpty) {
  const FileContent content = readWholeFile({.path = "/proc/self/status", .most = 100'000});

  EXPECT_EQ(content.outcome, Outcome::kRead);
  EXPECT_EQ(content.size, 0U);
  EXPECT_NE(content.bytes.find("Pid:"), std::string::npos);
  EXPECT_EQ(readWholeFile({.path = "/proc/self/status", .most = 3}).outcome, Outcome::kTooLarge);
}

TEST_F(WholeFileTest, NeitherPipesNorDevicesNorDirectoriesAreRead) {
  const std::string pipe = makePipe();

  EXPECT_EQ(readWholeFile({.path = pipe.c_str(), .most = 10}).outcome, Outcome::kNotRegular);
  EXPECT_EQ(readWholeFile({.path = "/dev/zero", .most = 10}).outcome, Outcome::kNotRegular);
  const FileContent directory = readWholeFile({.path = directory_.c_str(), .most = 10});
  EXPECT_EQ(directory.outcome, Outcome::kNotRegular);
  EXPECT_TRUE(S_ISDIR(directory.mode));
}

TEST_F(WholeFileTest, AnyKindReadsWhatIsWrittenIntoAPipe) {
  const std::string pipe = makePipe();
  // Open the pipe for reading and writing, so that it has a writer before the reader opens it.
  UniqueFd writer(::open(pipe.c_str(), O_RDWR | O_CLOEXEC));
  ASSERT_EQ(::write(writer.get(), "first ", 6), 6);
  FileContent content;
  {
    const std::jthread reader([&] {
      content =
          readWholeFile({.path = pipe.c_str(), .most = 100, .kinds = FileToRead::Kinds::kAny});
    });
    EXPECT_TRUE(waitUntilEmpty(writer.get()));
    EXPECT_EQ(::write(writer.get(), "second", 6), 6);
    EXPECT_TRUE(waitUntilEmpty(writer.get()));
    writer.reset();  // the reader sees the end
  }

  EXPECT_EQ(content.bytes, "first second");
}

TEST_F(WholeFileTest, AnyKindDoesNotWaitForAWriterAndBoundsADevice) {
  const std::string pipe = makePipe();

  const FileContent none =
      readWholeFile({.path = pipe.c_str(), .most = 10, .kinds = FileToRead::Kinds::kAny});
  const FileContent endless =
      readWholeFile({.path = "/dev/zero", .most = 10, .kinds = FileToRead::Kinds::kAny});

  EXPECT_TRUE(none.isRead());
  EXPECT_EQ(none.bytes, "");
  EXPECT_EQ(endless.outcome, Outcome::kTooLarge);
}

TEST_F(WholeFileTest, FollowsLinksUnlessTheyAreRefused) {
  const std::string path = write("file", "text");
  const std::string link = directory_ / "link";
  ASSERT_EQ(::symlink(path.c_str(), link.c_str()), 0);

  EXPECT_EQ(readWholeFile({.path = link.c_str(), .most = 10}).bytes, "text");
  const FileContent refused =
      readWholeFile({.path = link.c_str(), .most = 10, .links = FileToRead::Links::kRefused});
  EXPECT_EQ(refused.outcome, Outcome::kFailed);
  EXPECT_EQ(refused.error, ELOOP);
}

TEST_F(WholeFileTest, ReportsAnErrorOfReading) {
  // The kernel allows opening this file, but a read at address 0 fails.
  const FileContent content = readWholeFile({.path = "/proc/self/mem", .most = 10});

  EXPECT_EQ(content.outcome, Outcome::kFailed);
  EXPECT_EQ(content.error, EIO);
}

}  // namespace
}  // namespace halvox::platform::linux_
