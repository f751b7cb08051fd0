#include "tools/NewFile.h"

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include "client/testing/TestService.h"

namespace halvox::tools {
namespace {

using Existing = NewFile::Existing;

class NewFileTest : public testing::Test {
 protected:
  [[nodiscard]] std::filesystem::path target() const { return scratch_.path("records"); }
  [[nodiscard]] std::string content() const {
    std::ifstream file(target());
    return {std::istreambuf_iterator<char>(file), {}};
  }
  [[nodiscard]] auto filesInDirectory() const {
    const auto directory = std::filesystem::directory_iterator(target().parent_path());
    return std::distance(begin(directory), end(directory));
  }

 private:
  client::ScratchDirectory scratch_;
};

TEST_F(NewFileTest, AFileWithoutItsNameLeavesNothing) {
  {
    NewFile file(target());
    ASSERT_TRUE(file.append("half"));
  }
  EXPECT_EQ(filesInDirectory(), 0);
}

TEST_F(NewFileTest, PartsComeOneAfterTheOther) {
  NewFile file(target());
  ASSERT_TRUE(file.append("one "));
  ASSERT_TRUE(file.append("two"));
  ASSERT_TRUE(file.complete(0640));
  ASSERT_TRUE(file.keepAs(target(), Existing::kAnError));

  EXPECT_EQ(content(), "one two");
  EXPECT_EQ(filesInDirectory(), 1);
  EXPECT_EQ(std::filesystem::status(target()).permissions(), std::filesystem::perms(0640));
}

TEST_F(NewFileTest, AnExistingFileIsReplacedOnlyIfThatIsWanted) {
  std::ofstream(target()) << "old";
  NewFile file(target());
  ASSERT_TRUE(file.write("new", 0644));

  EXPECT_FALSE(file.keepAs(target(), Existing::kAnError));
  EXPECT_EQ(errno, EEXIST);
  EXPECT_EQ(content(), "old");
  EXPECT_TRUE(file.keepAs(target()));
  EXPECT_EQ(content(), "new");
  EXPECT_EQ(filesInDirectory(), 1);
}

TEST_F(NewFileTest, ADirectoryThatDoesNotExistIsAnError) {
  NewFile file("/nowhere/records");
  EXPECT_FALSE(file.write("x", 0644));
  EXPECT_EQ(errno, ENOENT);
  errno = 0;
  EXPECT_FALSE(file.complete(0644)) << "although nothing was written";
  EXPECT_EQ(errno, ENOENT);
}

}  // namespace
}  // namespace halvox::tools
