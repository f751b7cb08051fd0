#include "tools/SnapshotFiles.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/diagnostics/SnapshotArchive.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::tools {
namespace {

namespace fs = std::filesystem;

using ::testing::HasSubstr;
using ::testing::Not;

constexpr const char* kManifest =
    R"({"version":1,"time":"2026-03-01T12:00:00Z","seconds":0.25,"items":[)"
    R"({"name":"log.txt","collected":true,"bytes":7,"seconds":0.001,"cut":true},)"
    R"({"name":"pw-dump.json","collected":false,"bytes":0,"seconds":0,"reason":"no pw-dump"}]})";

class SnapshotFilesTest : public ::testing::Test {
 protected:
  SnapshotFilesTest() {
    fs::create_directories(directory_ / "state/snapshots");
    std::ofstream(directory_ / "halvox.toml")
        << "[storage]\ndirectory = \"" << (directory_ / "state").native() << "\"\n";
    ::setenv("HALVOX_CONFIG", (directory_ / "halvox.toml").c_str(), 1);
  }
  ~SnapshotFilesTest() override { ::unsetenv("HALVOX_CONFIG"); }

  fs::path archive(const std::string& stamp, const std::string& process = "player",
                   const std::string& manifest = kManifest) {
    fs::path path = directory_ / "state/snapshots" / (stamp + "-haptics-Generic.tar.zst");
    platform::linux_::SnapshotArchive archive(path, 1'000'000);
    EXPECT_TRUE(archive.open());
    EXPECT_TRUE(archive.add("signature.json", "{\"DetectedProcess\":\"" + process + "\"}\n"));
    EXPECT_TRUE(archive.add("asound/cards", "none\n"));
    EXPECT_TRUE(archive.add("manifest.json", manifest));
    EXPECT_TRUE(archive.finish());
    archive.keep();
    return path;
  }
  ExitStatus show(const std::string& file, OutputForm form = OutputForm::kText) {
    return showSnapshot({.file = file}, form, out_, errors_);
  }
  ExitStatus extract(const std::string& file, bool force = false) {
    return extractSnapshot(
        {.file = file, .directory = (directory_ / "to").native(), .force = force},
        OutputForm::kText, out_, errors_);
  }

  const platform::linux_::ScratchDirectory scratch_;
  const fs::path directory_ = scratch_.path();
  std::ostringstream out_;
  std::ostringstream errors_;
};

TEST_F(SnapshotFilesTest, ShowsSignatureAndWhatWasAndWasNotCollected) {
  EXPECT_EQ(show(archive("20260301T120000Z")), ExitStatus::kDone);

  EXPECT_THAT(out_.str(), HasSubstr("taken 2026-03-01T12:00:00Z in 0.250 s"));
  EXPECT_THAT(out_.str(), HasSubstr("  DetectedProcess  player\n"));
  EXPECT_THAT(out_.str(), HasSubstr("  log.txt                7 bytes  0.001 s  (cut)\n"));
  EXPECT_THAT(out_.str(), HasSubstr("  pw-dump.json  missing: no pw-dump\n"));
}

TEST_F(SnapshotFilesTest, NewestMeansTheNewestOfTheServicesStore) {
  archive("20260301T120000Z", "older");
  archive("20260302T120000Z", "newer");

  EXPECT_EQ(show("newest", OutputForm::kJson), ExitStatus::kDone);

  EXPECT_THAT(out_.str(), HasSubstr(R"("signature":{"DetectedProcess":"newer"})"));
  EXPECT_THAT(out_.str(), HasSubstr(R"("reason":"no pw-dump")"));
}

TEST_F(SnapshotFilesTest, WithoutSnapshotsThereIsNoNewest) {
  EXPECT_EQ(show("newest"), ExitStatus::kNoService);
  EXPECT_THAT(errors_.str(), HasSubstr("halvoxctl snapshots show: there is no snapshot in "));
}

TEST_F(SnapshotFilesTest, AnUnreadableDirectoryOfSnapshotsIsReportedWithTheReason) {
  fs::remove_all(directory_ / "state/snapshots");
  std::ofstream(directory_ / "state/snapshots") << "in the way";

  EXPECT_EQ(show("newest"), ExitStatus::kNoService);
  EXPECT_THAT(errors_.str(), HasSubstr("state/snapshots: Not a directory"));
}

TEST_F(SnapshotFilesTest, FilesThatAreNotSnapshotsAreNamed) {
  EXPECT_EQ(show((directory_ / "none").native()), ExitStatus::kBadArguments);
  EXPECT_EQ(show((directory_ / "halvox.toml").native()), ExitStatus::kBadArguments);
  EXPECT_EQ(show(archive("20260301T120000Z", "x", "[1")), ExitStatus::kBadArguments);

  EXPECT_THAT(errors_.str(), HasSubstr("No such file or directory"));
  EXPECT_THAT(errors_.str(), HasSubstr("manifest.json in it: "));
}

TEST_F(SnapshotFilesTest, AnEmptyNameIsABadArgument) {
  EXPECT_EQ(show(""), ExitStatus::kBadArguments);
  EXPECT_EQ(extract(""), ExitStatus::kBadArguments);

  EXPECT_THAT(errors_.str(), HasSubstr("extract: FILE: \"\" is not a file; expected an archive"));
}

TEST_F(SnapshotFilesTest, ALongNameDoesNotWidenTheOtherLines) {
  const std::string longName(1000, 'n');
  EXPECT_EQ(show(archive("20260301T120000Z", "x",
                         R"({"items":[{"name":")" + longName +
                             R"(","reason":"r"},{"name":"b","reason":"s"}]})")),
            ExitStatus::kDone);

  EXPECT_THAT(out_.str(), HasSubstr(longName + "  missing: r\n"));
  EXPECT_THAT(out_.str(), HasSubstr("\n  b" + std::string(39, ' ') + "  missing: s\n"));
}

TEST_F(SnapshotFilesTest, NamesFromAnArchiveCannotDriveATerminal) {
  EXPECT_EQ(show(archive("20260301T120000Z", R"(a\u001b[2Jb)")), ExitStatus::kDone);

  EXPECT_THAT(out_.str(), Not(HasSubstr("\x1b")));
}

TEST_F(SnapshotFilesTest, ExtractsAndRefusesToOverwriteUnlessForced) {
  const std::string file = archive("20260301T120000Z");

  EXPECT_EQ(extract(file), ExitStatus::kDone);
  EXPECT_TRUE(fs::exists(directory_ / "to/asound/cards"));
  EXPECT_THAT(out_.str(), HasSubstr("to/manifest.json\n"));
  EXPECT_EQ(extract(file), ExitStatus::kRefused);
  EXPECT_THAT(errors_.str(), HasSubstr("the file already exists"));
  EXPECT_EQ(extract("newest", true), ExitStatus::kDone);
}

}  // namespace
}  // namespace halvox::tools
