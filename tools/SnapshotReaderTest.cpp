#include "tools/SnapshotReader.h"

#include <sys/stat.h>

#include "platform/linux/diagnostics/SnapshotFixture.h"

namespace halvox::tools {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Pair;

using platform::linux_::readText;
using platform::linux_::ScratchDirectory;
using platform::linux_::TestEntry;
using platform::linux_::writeArchive;
using platform::linux_::writeText;

class SnapshotReaderTest : public ::testing::Test {
 protected:
  // Returns the error of unpacking an archive with these entries; empty if it succeeds.
  std::string unpack(const std::vector<TestEntry>& entries,
                     ExistingFiles existing = ExistingFiles::kRefuse) {
    writeArchive(archive, entries);
    const auto result = unpackSnapshot(archive, target, existing);
    return result ? "" : result.error().message;
  }

  ScratchDirectory scratch;
  const std::filesystem::path archive = scratch.path() / "a.tar.zst";
  const std::filesystem::path target = scratch.path() / "out";
};

TEST_F(SnapshotReaderTest, UnpacksWhatWasPacked) {
  EXPECT_EQ(unpack({{"manifest.json", "{}"}, {"asound/card0/id", "Dummy"}}), "");

  EXPECT_EQ(readText(target / "manifest.json"), "{}");
  EXPECT_EQ(readText(target / "asound/card0/id"), "Dummy");
}

TEST_F(SnapshotReaderTest, ReadsTheRequestedFilesThatExist) {
  writeArchive(archive, {{"a", "1"}, {"b", "2"}});

  const auto texts = readSnapshotFiles(archive, {"b", "c"});

  ASSERT_TRUE(texts);
  EXPECT_THAT(*texts, ElementsAre(Pair("b", "2")));
}

TEST_F(SnapshotReaderTest, NamesAndLinksThatLeadOutAreRefused) {
  const std::string absolute = (scratch.path() / "absolute").native();

  EXPECT_THAT(unpack({{"../up", "x"}}), HasSubstr("expected only plain files"));
  EXPECT_THAT(unpack({{"a/../../up", "x"}}), HasSubstr("expected only plain files"));
  EXPECT_THAT(unpack({{absolute, "x"}}), HasSubstr("expected only plain files"));
  EXPECT_THAT(unpack({{"link", "", scratch.path().native()}, {"link/up", "x"}}),
              HasSubstr("expected only plain files"));
  EXPECT_FALSE(std::filesystem::exists(scratch.path() / "up"));
  EXPECT_FALSE(std::filesystem::exists(absolute));
}

TEST_F(SnapshotReaderTest, LinksOnTheWayAreNotFollowed) {
  std::filesystem::create_directories(target);
  std::filesystem::create_directory(scratch.path() / "elsewhere");
  std::filesystem::create_directory_symlink(scratch.path() / "elsewhere", target / "asound");

  EXPECT_NE(unpack({{"asound/cards", "x"}}, ExistingFiles::kReplace), "");
  EXPECT_TRUE(std::filesystem::is_empty(scratch.path() / "elsewhere"));
}

TEST_F(SnapshotReaderTest, ExistingFileIsRefusedBeforeAnythingIsUnpacked) {
  writeText(target / "b", "mine");

  EXPECT_THAT(unpack({{"a", "1"}, {"b", "2"}}), HasSubstr("the file already exists"));
  EXPECT_EQ(readText(target / "b"), "mine");
  EXPECT_FALSE(std::filesystem::exists(target / "a"));

  EXPECT_EQ(unpack({{"a", "1"}, {"b", "2"}}, ExistingFiles::kReplace), "");
  EXPECT_EQ(readText(target / "b"), "2");
}

TEST_F(SnapshotReaderTest, ForcedUnpackingReplacesALinkNotItsTarget) {
  writeText(scratch.path() / "mine", "mine");
  std::filesystem::create_directories(target);
  std::filesystem::create_symlink(scratch.path() / "mine", target / "a");

  EXPECT_EQ(unpack({{"a", "1"}}, ExistingFiles::kReplace), "");

  EXPECT_EQ(readText(scratch.path() / "mine"), "mine");
  EXPECT_EQ(readText(target / "a"), "1");
}

TEST_F(SnapshotReaderTest, BrokenAndMissingArchivesAreNamed) {
  writeText(archive, "this is not an archive");
  const auto broken = readSnapshotFiles(archive, {"a"});
  const auto missing = readSnapshotFiles(scratch.path() / "none", {"a"});

  ASSERT_FALSE(broken);
  EXPECT_THAT(broken.error().message, HasSubstr("a.tar.zst: not a snapshot"));
  ASSERT_FALSE(missing);
  EXPECT_THAT(missing.error().message, HasSubstr("No such file or directory"));
}

TEST_F(SnapshotReaderTest, ArchiveThatIsTooLargeIsRefusedBeforeAnythingIsUnpacked) {
  const std::string zeros(257U << 20U, '\0');

  EXPECT_THAT(unpack({{"a", "1"}, {"zeros", zeros}}), HasSubstr("too large when unpacked"));
  EXPECT_FALSE(readSnapshotFiles(archive, {"a"}));
}

TEST_F(SnapshotReaderTest, RefusedArchiveLeavesNoFilesAndNoDirectory) {
  EXPECT_NE(unpack({{"a", "1"}, {"../up", "x"}}), "");
  EXPECT_FALSE(std::filesystem::exists(target));

  std::filesystem::create_directories(target);
  EXPECT_NE(unpack({{"a", "1"}, {"../up", "x"}}, ExistingFiles::kReplace), "");
  EXPECT_TRUE(std::filesystem::is_empty(target));
}

TEST_F(SnapshotReaderTest, EntryThatCannotBeUnpackedIsNamedWithTheReason) {
  EXPECT_THAT(unpack({{"a", "1"}, {"a/b", "2"}}), HasSubstr("out/a/b: "));
  EXPECT_THAT(unpack({{"a", "1"}, {"a/b", "2"}}, ExistingFiles::kReplace),
              HasSubstr("Not a directory"));
}

TEST_F(SnapshotReaderTest, EmptyNameIsAMissingFile) {
  EXPECT_FALSE(unpackSnapshot("", target, ExistingFiles::kRefuse));
  const auto read = readSnapshotFiles("", {"a"});

  ASSERT_FALSE(read);
  EXPECT_THAT(read.error().message, HasSubstr("No such file or directory"));
}

TEST_F(SnapshotReaderTest, DeletedWorkingDirectoryIsAnError) {
  const std::filesystem::path before = std::filesystem::current_path();
  const std::filesystem::path gone = scratch.path() / "gone";
  std::filesystem::create_directories(gone);
  std::filesystem::current_path(gone);
  std::filesystem::remove(gone);

  const auto result = unpackSnapshot("a.tar.zst", target, ExistingFiles::kRefuse);
  std::filesystem::current_path(before);

  ASSERT_FALSE(result);
  EXPECT_THAT(result.error().message, HasSubstr("a.tar.zst: No such file or directory"));
}

TEST_F(SnapshotReaderTest, PipeInPlaceOfAnArchiveIsRefusedWithoutWaiting) {
  ASSERT_EQ(::mkfifo(archive.c_str(), 0600), 0);

  const auto read = readSnapshotFiles(archive, {"a"});

  ASSERT_FALSE(read);
  EXPECT_THAT(read.error().message, HasSubstr("expected a snapshot, found a special file"));
}

TEST_F(SnapshotReaderTest, TruncatedArchiveIsAnError) {
  writeArchive(archive, {{"a", std::string(100'000, 'x')}, {"b", "2"}});
  std::filesystem::resize_file(archive, std::filesystem::file_size(archive) / 2);

  EXPECT_FALSE(readSnapshotFiles(archive, {"a", "b"}));
  EXPECT_FALSE(unpackSnapshot(archive, target, ExistingFiles::kRefuse));
}

}  // namespace
}  // namespace halvox::tools
