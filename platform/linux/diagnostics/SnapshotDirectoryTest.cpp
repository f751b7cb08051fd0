#include "platform/linux/diagnostics/SnapshotDirectory.h"

#include "platform/linux/diagnostics/SnapshotFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;

class SnapshotDirectoryTest : public ::testing::Test {
 protected:
  SnapshotDirectoryTest() { EXPECT_TRUE(directory.prepare()); }

  std::string publish(double time, const std::string& type = "haptics",
                      const std::string& subType = "Generic") {
    writeText(directory.temporaryPath(), "x");
    const auto published = directory.publish(Date{time}, type, subType);
    return published ? published->filename().string() : "";
  }
  std::vector<std::string> newestFirst() const {
    std::vector<std::string> names;
    for (const auto& path : directory.newestFirst()) names.push_back(path.filename().string());
    return names;
  }

  ScratchDirectory scratch;
  SnapshotDirectory directory{scratch.path()};
};

TEST_F(SnapshotDirectoryTest, SnapshotsOfOneSecondGetNumbersAndNoneIsReplaced) {
  EXPECT_EQ(publish(0), "19700101T000000Z-haptics-Generic.tar.zst");
  EXPECT_EQ(publish(0.9), "19700101T000000Z-2-haptics-Generic.tar.zst");
  EXPECT_EQ(publish(0), "19700101T000000Z-3-haptics-Generic.tar.zst");
}

TEST_F(SnapshotDirectoryTest, NameOfADeletedSnapshotIsNotUsedAgain) {
  publish(0);
  publish(0);
  directory.keepNewest(1, directory.path() / "19700101T000000Z-2-haptics-Generic.tar.zst");

  EXPECT_EQ(publish(0), "19700101T000000Z-3-haptics-Generic.tar.zst");
}

TEST_F(SnapshotDirectoryTest, NamesCannotLeadOutOfTheDirectory) {
  EXPECT_EQ(publish(0, "../../etc", "a/b\nc"), "19700101T000000Z-_._.._etc-a_b_c.tar.zst");
  EXPECT_EQ(namePart(""), "unknown");
  EXPECT_EQ(namePart(".hidden"), "_hidden");
  EXPECT_EQ(namePart(std::string(500, 'x')).size(), 64U);
}

TEST_F(SnapshotDirectoryTest, NewestComesFirstAndOtherFilesAreNoSnapshots) {
  const std::string old = publish(1000);
  const std::string newest = publish(3000);
  const std::string middle = publish(2000);
  writeText(directory.path() / "copy.tar.zst", "x");
  std::filesystem::create_directory(directory.path() / "20260301T120000Z-a-b.tar.zst");

  EXPECT_THAT(newestFirst(), ElementsAre(newest, middle, old));
}

TEST_F(SnapshotDirectoryTest, JustWrittenSnapshotStaysAfterTheClockWasSetBack) {
  const std::string newest = publish(3000);
  publish(2000);
  const std::string justWritten = publish(1000);

  directory.keepNewest(2, directory.path() / justWritten);

  EXPECT_THAT(newestFirst(), ElementsAre(newest, justWritten));
}

}  // namespace
}  // namespace halvox::platform::linux_
