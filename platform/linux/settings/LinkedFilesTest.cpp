#include "platform/linux/settings/LinkedFiles.h"

#include <gmock/gmock.h>

#include "platform/linux/settings/SettingsFixture.h"

namespace halvox::platform::linux_ {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class LinkedFilesTest : public SettingsFixture {
 protected:
  LinkedFilesTest() { scratch_ = std::filesystem::canonical(scratch_); }
};

TEST_F(LinkedFilesTest, PathsWithoutLinksDependOnNothingElse) {
  write(scratch_ / "file", "");

  EXPECT_THAT(linkedFiles(scratch_ / "file"), IsEmpty());
  EXPECT_THAT(linkedFiles(scratch_ / "missing" / "file"), IsEmpty());
}

TEST_F(LinkedFilesTest, ReturnsEachLinkAndThenItsTargetInOrder) {
  std::filesystem::create_directory(scratch_ / "real");
  std::filesystem::create_symlink("second", scratch_ / "first");
  std::filesystem::create_symlink(scratch_ / "real" / ".." / "real" / "file", scratch_ / "second");

  EXPECT_THAT(linkedFiles(scratch_ / "first"),
              ElementsAre(scratch_ / "first", scratch_ / "second", scratch_ / "real" / "file"));
}

TEST_F(LinkedFilesTest, LinkedDirectoriesOnTheWayCount) {
  std::filesystem::create_directory(scratch_ / "one");
  std::filesystem::create_directory_symlink("one", scratch_ / "data");
  std::filesystem::create_symlink("data/file", scratch_ / "file");

  EXPECT_THAT(linkedFiles(scratch_ / "file"),
              ElementsAre(scratch_ / "file", scratch_ / "data", scratch_ / "one" / "file"));
}

TEST_F(LinkedFilesTest, LinksInACircleEnd) {
  std::filesystem::create_symlink("b", scratch_ / "a");
  std::filesystem::create_symlink("a", scratch_ / "b");

  EXPECT_LT(linkedFiles(scratch_ / "a").size(), 100U);
}

}  // namespace
}  // namespace halvox::platform::linux_
