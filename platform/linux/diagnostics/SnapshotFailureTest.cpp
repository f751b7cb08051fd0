#include <sched.h>
#include <sys/mount.h>

#include "platform/linux/diagnostics/SnapshotFixture.h"
#include "platform/linux/testing/FileSizeLimit.h"

// Tests what happens to snapshots if the disk refuses them.

namespace halvox::platform::linux_ {
namespace {

using ::testing::Contains;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class SnapshotFailureTest : public SnapshotFixture {
 protected:
  SnapshotFailureTest() {
    // Text that does not compress, so that the archive needs the disk.
    std::string noise;
    std::uint32_t state = 1;
    for (int count = 0; count < 600'000; ++count) {
      state = state * 1664525U + 1013904223U;
      noise += static_cast<char>('!' + (state >> 24U) % 90U);
    }
    log = [noise] { return LogMemory::Contents{.text = noise, .lines = 1, .added = 1}; };
    start();
  }

  void expectFailure(const std::string& why) {
    const Dictionary response = snapshot();

    EXPECT_THAT(textOf(response, "error"), HasSubstr(why));
    EXPECT_FALSE(response.contains("path"));
    EXPECT_THAT(platform.log.texts(LogLevel::kError),
                Contains(HasSubstr("cannot take a snapshot")));
    expectBalance();
  }
  void expectSuccess() {
    EXPECT_THAT(archiveFiles(textOf(snapshot(), "path")), SizeIs(testing::Ge(4U)));
  }
};

class SmallDisk {
 public:
  explicit SmallDisk(std::filesystem::path where) : where_(std::move(where)) {
    std::filesystem::create_directories(where_);
    isMounted_ = ::mount("none", where_.c_str(), "tmpfs", 0, "size=64k") == 0;
  }
  SmallDisk(const SmallDisk&) = delete;
  SmallDisk& operator=(const SmallDisk&) = delete;
  ~SmallDisk() { unmount(); }
  void unmount() {
    if (isMounted_) ::umount2(where_.c_str(), MNT_DETACH);
    isMounted_ = false;
  }
  [[nodiscard]] bool isMounted() const { return isMounted_; }

 private:
  const std::filesystem::path where_;
  bool isMounted_ = false;
};

TEST_F(SnapshotFailureTest, FileThatMayNotGrowLeavesNothingAndTheNextWorks) {
  {
    const FileSizeLimit limit(100'000);
    expectFailure("File too large");
  }
  EXPECT_THAT(names(), IsEmpty());

  expectSuccess();
}

TEST_F(SnapshotFailureTest, FullDiskLeavesNothingAndTheNextWorks) {
  SmallDisk disk(directory());
  if (!disk.isMounted()) GTEST_SKIP() << "no file system can be mounted here";

  expectFailure("No space left on device");
  EXPECT_THAT(names(), IsEmpty());
  disk.unmount();

  expectSuccess();
}

TEST_F(SnapshotFailureTest, FileInPlaceOfTheDirectoryIsAnErrorUntilItIsRemoved) {
  writeText(directory(), "in the way");
  expectFailure("Not a directory");
  std::filesystem::remove(directory());

  expectSuccess();
}

TEST_F(SnapshotFailureTest, DeletedDirectoryIsMadeAgain) {
  expectSuccess();
  std::filesystem::remove_all(directory());

  expectSuccess();
}

TEST_F(SnapshotFailureTest, MissingStorageDirectoryIsAnErrorUntilItIsBack) {
  std::filesystem::remove_all(options.storageDirectory);
  expectFailure("No such file or directory");
  std::filesystem::create_directories(options.storageDirectory);

  expectSuccess();
}

TEST_F(SnapshotFailureTest, FailuresInARowAreLoggedOnceASecond) {
  writeText(directory(), "in the way");
  const auto begun = std::chrono::steady_clock::now();

  for (int count = 0; count < 50; ++count) EXPECT_NE(textOf(snapshot(), "error"), "");

  const auto seconds =
      std::chrono::ceil<std::chrono::seconds>(std::chrono::steady_clock::now() - begun);
  EXPECT_LE(platform.log.texts(LogLevel::kError).size(),
            static_cast<std::size_t>(seconds.count()) + 1);
  EXPECT_EQ(counted("dropped: cannot be written"), 50U);
}

TEST_F(SnapshotFailureTest, LeftoversOfAKilledServiceAreRemoved) {
  writeText(directory() / ".snapshot-in-work.tmp", "half an archive");
  writeText(directory() / "notes.txt", "mine");

  service->removeLeftovers();

  EXPECT_THAT(names(), testing::ElementsAre("notes.txt"));
}

}  // namespace
}  // namespace halvox::platform::linux_
