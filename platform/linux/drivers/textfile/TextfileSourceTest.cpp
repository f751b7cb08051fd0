#include "platform/linux/drivers/textfile/TextfileSource.h"

#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testing::samplesOf;
using ::testing::SizeIs;

constexpr const char* kPulses = "# TYPE pulses counter\npulses_total{group=\"Haptics\"} ";

class TextfileSourceTest : public ::testing::Test {
 protected:
  // Writes the file as a daemon should, so that it appears complete or not at all.
  void write(const std::string& name, const std::string& text) {
    const auto file = directory_.path() / name;
    std::ofstream(file.string() + ".new") << text;
    std::filesystem::rename(file.string() + ".new", file);
  }
  void writePulses(const std::string& name, int count) {
    write(name, kPulses + std::to_string(count) + "\n");
  }
  std::vector<std::string> show() { return testing::describe(samplesOf(source_.read())); }
  std::vector<std::string> errors() { return platform_.log.texts(LogLevel::kError); }
  std::string complaint(const std::string& file, const std::string& what) {
    return "driver counters of " + (directory_.path() / file).string() + what +
           "; skipping the file";
  }

  FakePlatform platform_;
  ScratchDirectory directory_;
  TextfileSource source_{directory_.path(), driversCategory(platform_.log)};
};

TEST_F(TextfileSourceTest, FilesOfTheDirectoryAreChannels) {
  writePulses("b.prom", 3);
  write("a.prom", "# TYPE level gauge\nlevel 5\n# EOF\n");
  writePulses("other.txt", 4);

  EXPECT_THAT(show(), ElementsAre("-/-/-/level  = 5", "-/Haptics/-/pulses  = 3"));
}

TEST_F(TextfileSourceTest, AChannelKeepsItsIdentityWhileItsFileChanges) {
  writePulses("a.prom", 3);
  const auto before = source_.read();

  writePulses("a.prom", 10);
  const auto after = source_.read();

  EXPECT_EQ(after->channels, before->channels);
  EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(after))),
              ElementsAre("-/Haptics/-/pulses  = 7"));
}

TEST_F(TextfileSourceTest, AFileThatIsWrittenInPlaceIsNoticedEvenWithinOneTick) {
  const auto file = directory_.path() / "a.prom";
  for (int count = 1; count < 9; ++count) {
    std::ofstream(file) << kPulses << count << "\n";  // always the same size
    EXPECT_THAT(show(), ElementsAre("-/Haptics/-/pulses  = " + std::to_string(count)));
  }
}

TEST_F(TextfileSourceTest, FilesBeyondTheRoomAreSkippedUntilThereIsRoom) {
  // Each is as large as a file may be. Together they reach the total size.
  for (int number = 0; number < 8; ++number) {
    const std::string name = "level" + std::to_string(number);
    std::string text = "# TYPE " + name + " gauge\n" + name + " 5\n";
    for (int line = 0; text.size() < OpenMetricsText::kLargestText; ++line) {
      const std::string help = "# HELP other" + std::to_string(line) + " ";
      const std::size_t left = OpenMetricsText::kLargestText - text.size();
      text += help + std::string(left < 400 ? left - help.size() - 1 : 100, 'x') + "\n";
    }
    write(name + ".prom", text);
  }
  writePulses("z.prom", 3);

  EXPECT_THAT(show(), SizeIs(8));
  EXPECT_THAT(show(), SizeIs(8));
  EXPECT_THAT(
      errors(),
      ElementsAre(complaint(
          "z.prom", ": this file and those before it are larger than 8388608 bytes together")));

  std::filesystem::remove(directory_.path() / "level3.prom");
  EXPECT_THAT(show(), ::testing::Contains("-/Haptics/-/pulses  = 3"));
}

TEST_F(TextfileSourceTest, AWrongFileIsSkippedAndLoggedOnceWithItsLine) {
  writePulses("a.prom", 3);
  write("b.prom", "# TYPE x counter\nx_total -1\n");

  for (int round = 0; round < 3; ++round) EXPECT_THAT(show(), SizeIs(1));

  EXPECT_THAT(errors(), ElementsAre(complaint("b.prom",
                                              ":2: expected a count, from 0 to "
                                              "9223372036854775807")));
}

TEST_F(TextfileSourceTest, AFileThatIsWrongAgainIsNamedAgain) {
  write("a.prom", "wrong\n");
  static_cast<void>(source_.read());
  writePulses("a.prom", 1);
  EXPECT_THAT(show(), SizeIs(1));
  write("a.prom", "wrong again\n");
  static_cast<void>(source_.read());

  EXPECT_THAT(errors(), SizeIs(2));
}

TEST_F(TextfileSourceTest, AChannelSurvivesItsFileBeingHalfWritten) {
  writePulses("a.prom", 3);
  const auto before = source_.read();
  write("a.prom", kPulses);
  EXPECT_THAT(show(), IsEmpty());

  writePulses("a.prom", 10);

  EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read()))),
              ElementsAre("-/Haptics/-/pulses  = 7"));
}

TEST_F(TextfileSourceTest, ChannelsOfADeletedFileVanishAndAreNewWhenTheyReturn) {
  writePulses("a.prom", 3);
  const auto before = source_.read();
  std::filesystem::remove(directory_.path() / "a.prom");
  EXPECT_THAT(show(), IsEmpty());

  writePulses("a.prom", 10);

  EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read()))),
              IsEmpty());
}

// The result is the same whether or not the directory was read in between.
TEST_F(TextfileSourceTest, AFileThatIsDeletedAndWrittenAgainBetweenTwoReadingsHasOtherChannels) {
  for (const int count : {2, 10}) {
    writePulses("a.prom", 3);
    const auto before = source_.read();
    std::filesystem::remove(directory_.path() / "a.prom");

    writePulses("a.prom", count);

    EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read()))),
                IsEmpty());
  }
}

TEST_F(TextfileSourceTest, ADirectoryThatIsReplacedHasOtherChannels) {
  const auto place = directory_.path() / "place";
  std::filesystem::create_directory(place);
  TextfileSource source(place, driversCategory(platform_.log));
  writePulses("place/a.prom", 3);
  const auto before = source.read();
  std::filesystem::rename(place, directory_.path() / "old");
  std::filesystem::create_directory(place);

  writePulses("place/a.prom", 10);

  EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source.read()))),
              IsEmpty());
}

TEST_F(TextfileSourceTest, AChannelWhoseUnitOrTypeChangesIsAnother) {
  write("a.prom", "# TYPE x counter\nx_total{unit=\"s\"} 7\n");
  const auto before = source_.read();
  for (const char* text :
       {"# TYPE x counter\nx_total{unit=\"ms\"} 9\n", "# TYPE x gauge\nx{unit=\"s\"} 9\n"}) {
    write("a.prom", text);

    EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read()))),
                IsEmpty());
  }
}

TEST_F(TextfileSourceTest, AChannelOfAFileThatWasHalfWrittenIsNotInThatReading) {
  writePulses("a.prom", 3);
  EXPECT_THAT(show(), SizeIs(1));
  write("a.prom", kPulses);
  const auto before = source_.read();

  writePulses("a.prom", 10);

  EXPECT_THAT(testing::describe(*makeDelta(samplesOf(before), samplesOf(source_.read()))),
              IsEmpty());
}

TEST_F(TextfileSourceTest, OfAChannelInTwoFilesTheFirstCounts) {
  writePulses("a.prom", 3);
  writePulses("b.prom", 4);

  for (int round = 0; round < 2; ++round) {
    EXPECT_THAT(show(), ElementsAre("-/Haptics/-/pulses  = 3"));
  }

  EXPECT_THAT(errors(), SizeIs(1));
}

TEST_F(TextfileSourceTest, WhatIsNoFileNeitherBlocksNorCounts) {
  ASSERT_EQ(::mkfifo((directory_.path() / "fifo.prom").c_str(), 0600), 0);
  std::filesystem::create_directory(directory_.path() / "folder.prom");
  std::filesystem::create_symlink("loop.prom", directory_.path() / "loop.prom");
  std::filesystem::create_symlink("/dev/zero", directory_.path() / "zero.prom");
  std::filesystem::create_symlink("nowhere", directory_.path() / "dangling.prom");
  writePulses("a.prom", 1);

  EXPECT_THAT(show(), SizeIs(1));
  EXPECT_THAT(show(), SizeIs(1));

  EXPECT_THAT(errors(), ElementsAre(complaint("fifo.prom", ": expected a regular file"),
                                    complaint("folder.prom", ": expected a regular file"),
                                    complaint("loop.prom", ": Too many levels of symbolic links"),
                                    complaint("zero.prom", ": expected a regular file")));
}

TEST_F(TextfileSourceTest, AHugeFileIsNotRead) {
  writePulses("a.prom", 1);
  std::ofstream(directory_.path() / "huge.prom") << "";
  ASSERT_EQ(::truncate((directory_.path() / "huge.prom").c_str(), 100 << 20), 0);

  EXPECT_THAT(show(), SizeIs(1));
  EXPECT_THAT(errors(),
              ElementsAre(complaint("huge.prom", ": the file is larger than 1048576 bytes")));
}

TEST_F(TextfileSourceTest, ADirectoryThatIsMissingIsEmptyAndMayComeLater) {
  TextfileSource source(directory_.path() / "later", driversCategory(platform_.log));
  EXPECT_EQ(source.read()->channels->size(), 0U);

  std::filesystem::create_directory(directory_.path() / "later");
  writePulses("later/a.prom", 1);

  EXPECT_EQ(source.read()->channels->size(), 1U);
}

}  // namespace
}  // namespace halvox::platform::linux_
