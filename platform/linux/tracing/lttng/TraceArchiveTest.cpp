#include "platform/linux/tracing/lttng/TraceArchive.h"

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

class TraceArchiveTest : public testing::Test {
 protected:
  TraceArchiveTest() {
    fs::create_directories(directory_);
    fs::create_directories(archives_);
    // Random digits compress little, so that the archive exceeds the limit that a test sets.
    std::ofstream file(directory_ / "stream");
    std::mt19937_64 random(1);
    for (int word = 0; word < 100'000; ++word) file << random();
  }

  // No file of this process can grow beyond the limit.
  static void limitFiles() {
    const rlimit limit{.rlim_cur = 65'536, .rlim_max = 65'536};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  }
  static bool isEmpty(const fs::path& directory) { return fs::is_empty(directory); }

  const ScratchDirectory scratch_;
  const fs::path directory_ = scratch_.path() / "recordings/one";
  const fs::path archives_ = scratch_.path() / "archives";
  const fs::path archive_ = archives_ / "one.tar.zst";
};

TEST_F(TraceArchiveTest, WholeArchiveHasItsNameAndNothingElseIsLeft) {
  EXPECT_TRUE(packDirectory(directory_, archive_));

  EXPECT_GT(fs::file_size(archive_), 100'000U);
  EXPECT_EQ(std::distance(fs::directory_iterator(archives_), {}), 1);
  EXPECT_EQ(std::distance(fs::directory_iterator(directory_.parent_path()), {}), 1);
}

TEST_F(TraceArchiveTest, ProcessThatIsKilledLeavesNothingBesideTheFinishedArchives) {
  const auto packAndBeKilled = [this] {
    limitFiles();
    static_cast<void>(packDirectory(directory_, archive_));
  };

  EXPECT_EXIT(packAndBeKilled(), testing::KilledBySignal(SIGXFSZ), "");

  EXPECT_TRUE(isEmpty(archives_));
}

TEST_F(TraceArchiveTest, FileThatCannotBeWrittenIsAnErrorAndLeavesNothing) {
  const auto fail = [this] {
    std::signal(SIGXFSZ, SIG_IGN);
    limitFiles();
    const auto packed = packDirectory(directory_, archive_);
    const bool isTold = !packed && !packed.error().message.empty();
    std::_Exit(isTold && isEmpty(archives_) ? 0 : 1);
  };

  EXPECT_EXIT(fail(), testing::ExitedWithCode(0), "");

  EXPECT_EQ(std::distance(fs::directory_iterator(directory_.parent_path()), {}), 1);
}

TEST_F(TraceArchiveTest, MissingDirectoryIsAnError) {
  EXPECT_FALSE(packDirectory(scratch_.path() / "recordings/none", archive_));

  EXPECT_TRUE(isEmpty(archives_));
}

}  // namespace
}  // namespace halvox::platform::linux_
