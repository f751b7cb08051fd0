#include "platform/linux/drivers/textfile/RemovedFiles.h"

#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class RemovedFilesTest : public ::testing::Test {
 protected:
  void write(const std::string& name) { std::ofstream(directory_.path() / name) << "1"; }
  void remove(const std::string& name) { std::filesystem::remove(directory_.path() / name); }

  FakePlatform platform_;
  ScratchDirectory directory_;
  RemovedFiles removed_{directory_.path(), driversCategory(platform_.log)};
};

TEST_F(RemovedFilesTest, AFileThatWasDeletedIsNamedOnceEvenWhenItIsThereAgain) {
  write("a");
  write("b");
  EXPECT_THAT(removed_.take().names, IsEmpty());

  remove("a");
  write("a");

  EXPECT_THAT(removed_.take().names, ElementsAre("a"));
  EXPECT_THAT(removed_.take().names, IsEmpty());
}

TEST_F(RemovedFilesTest, AFileThatIsReplacedOrWrittenToWasNotDeleted) {
  write("a");
  static_cast<void>(removed_.take());

  write("a");
  write("a.new");
  std::filesystem::rename(directory_.path() / "a.new", directory_.path() / "a");

  const auto removed = removed_.take();
  EXPECT_THAT(removed.names, IsEmpty());
  EXPECT_FALSE(removed.areAll);
}

TEST_F(RemovedFilesTest, WithTheDirectoryAllFilesGoAndTheNextOneIsWatched) {
  const auto place = directory_.path() / "place";
  RemovedFiles removed(place, driversCategory(platform_.log));
  EXPECT_FALSE(removed.take().areAll);
  std::filesystem::create_directory(place);
  EXPECT_FALSE(removed.take().areAll);

  std::filesystem::remove(place);
  std::filesystem::create_directory(place);
  EXPECT_TRUE(removed.take().areAll);
  std::filesystem::rename(place, directory_.path() / "elsewhere");
  std::filesystem::create_directory(place);
  EXPECT_TRUE(removed.take().areAll);

  write("place/a");
  remove("place/a");
  const auto last = removed.take();
  EXPECT_FALSE(last.areAll);
  EXPECT_THAT(last.names, ElementsAre("a"));
  EXPECT_THAT(platform_.log.texts(LogLevel::kError), IsEmpty());
}

TEST_F(RemovedFilesTest, ManyAreAllNamed) {
  static_cast<void>(removed_.take());
  for (int file = 0; file < 500; ++file) {
    write(std::to_string(file));
    remove(std::to_string(file));
  }

  EXPECT_EQ(removed_.take().names.size(), 500U);
}

}  // namespace
}  // namespace halvox::platform::linux_
