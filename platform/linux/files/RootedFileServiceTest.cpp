#include "platform/linux/files/RootedFileService.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include "platform/linux/files/FilesFixture.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class RootedFileServiceTest : public FilesFixture {
 protected:
  static fs::perms permissionsOf(const fs::path& path) { return fs::status(path).permissions(); }
};

TEST_F(RootedFileServiceTest, MakesADirectoryWithItsParentsBelowTheRoot) {
  EXPECT_EQ(service_.createDirectory("/a/b/c", 0777), std::nullopt);

  EXPECT_TRUE(fs::is_directory(root_ / "a/b/c"));
}

TEST_F(RootedFileServiceTest, GivesExactlyThesePermissionsToTheDirectoryAlone) {
  const mode_t before = ::umask(0077);
  const auto open = service_.createDirectory("/a/open", 0777);
  ::umask(0);
  const auto closed = service_.createDirectory("/b/closed", 0500);
  ::umask(before);

  EXPECT_EQ(open, std::nullopt);
  EXPECT_EQ(closed, std::nullopt);
  EXPECT_EQ(permissionsOf(root_ / "a/open"), fs::perms(0777));
  EXPECT_EQ(permissionsOf(root_ / "b/closed"), fs::perms(0500));
  EXPECT_EQ(permissionsOf(root_ / "b"), fs::perms(0755));
}

TEST_F(RootedFileServiceTest, LeavesADirectoryThatExistsAsItIs) {
  ASSERT_EQ(service_.createDirectory("/a", 0700), std::nullopt);

  EXPECT_EQ(service_.createDirectory("/a", 0777), std::nullopt);

  EXPECT_EQ(permissionsOf(root_ / "a"), fs::perms(0700));
}

TEST_F(RootedFileServiceTest, FollowsNoLinkBelowTheRoot) {
  fs::create_directories(root_ / "a");
  fs::create_directory(outside_);
  fs::create_directory_symlink(outside_, root_ / "a/link");

  const auto made = service_.createDirectory("/a/link/b", 0777);
  auto file = service_.createJsonArrayFile("/a/link", "f.json");

  ASSERT_TRUE(made.has_value());
  EXPECT_EQ(made->code, ELOOP);
  EXPECT_THAT(made->description, HasSubstr((root_ / "a/link").string() + ": Too many levels"));
  EXPECT_EQ(codeOf(*file), ELOOP);
  EXPECT_THAT(namesIn(outside_), IsEmpty());
}

TEST_F(RootedFileServiceTest, RefusesToGoUp) {
  EXPECT_TRUE(service_.createDirectory("/a/../../b", 0777).has_value());
  EXPECT_TRUE(service_.createDirectory(std::string_view("/a\0/b", 5), 0777).has_value());
  EXPECT_TRUE(service_.createDirectory("..", 0777).has_value());
  EXPECT_NE(codeOf(*service_.createJsonArrayFile("/..", "f.json")), 0);
}

TEST_F(RootedFileServiceTest, RootMayBeALink) {
  fs::create_directory(outside_);
  fs::create_directory_symlink(outside_, root_);

  EXPECT_EQ(service_.createDirectory("/a", 0777), std::nullopt);

  EXPECT_THAT(namesIn(outside_), ElementsAre("a"));
}

TEST_F(RootedFileServiceTest, CommitMakesTheWholeFileAppearAndReturnsItsPath) {
  ASSERT_EQ(service_.createDirectory("/a", 0777), std::nullopt);
  auto file = service_.createJsonArrayFile("/a", "f.json");
  file->appendObject("key", {{"number", 1}});
  EXPECT_THAT(namesIn(root_ / "a"), IsEmpty());

  std::string path;
  EXPECT_EQ(file->commit(path), std::nullopt);

  EXPECT_EQ(path, (root_ / "a/f.json").string());
  EXPECT_EQ(textOf(path), "[\n  {\n    \"key\": {\n      \"number\": 1\n    }\n  }\n]\n");
  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre("f.json"));
}

TEST_F(RootedFileServiceTest, AbandonedFileLeavesNothing) {
  ASSERT_EQ(service_.createDirectory("/a", 0777), std::nullopt);

  for (int number = 0; number < 5; ++number) {
    const auto file = service_.createJsonArrayFile("/a", "f.json");
    for (int object = 0; object < 5000; ++object) file->appendObject("key", {{"number", object}});
  }

  EXPECT_THAT(namesIn(root_ / "a"), IsEmpty());
  EXPECT_EQ(count("files begun"), 5U);
  EXPECT_EQ(count("files let go unfinished"), 5U);
}

TEST_F(RootedFileServiceTest, ReplacesAFileOfThatName) {
  ASSERT_EQ(service_.createDirectory("/a", 0777), std::nullopt);
  for (const int number : {1, 2}) {
    auto file = service_.createJsonArrayFile("/a", "f.json");
    file->appendObject("key", {{"number", number}});
    EXPECT_EQ(codeOf(*file), 0);
  }

  EXPECT_THAT(textOf(root_ / "a/f.json"), HasSubstr("\"number\": 2"));
  EXPECT_THAT(namesIn(root_ / "a"), ElementsAre("f.json"));
  EXPECT_EQ(count("files written"), 2U);
}

TEST_F(RootedFileServiceTest, NamesThatNoFileCanHaveAreErrors) {
  ASSERT_EQ(service_.createDirectory("/a", 0777), std::nullopt);
  const std::vector<std::string> names = {"", ".", "..", "b/c", std::string("b\0c", 3)};

  for (const std::string& name : names) {
    EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", name)), EINVAL) << name;
  }
  EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", std::string(256, 'x'))), ENAMETOOLONG);
  EXPECT_EQ(codeOf(*service_.createJsonArrayFile("/a", std::string(255, 'x'))), 0);
  EXPECT_EQ(count("files that failed"), 6U);
  EXPECT_EQ(count("files begun"), 7U);
}

TEST_F(RootedFileServiceTest, AMillionObjectsNeedNoMoreMemoryThanAFew) {
  ASSERT_EQ(service_.createDirectory("/a", 0777), std::nullopt);
  constexpr int kObjects = 1'000'000;
  constexpr long kGrowthKilobytes = 16 * 1024;
  const auto peak = [] {
    rusage usage{};
    ::getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
  };
  const auto file = service_.createJsonArrayFile("/a", "f.json");
  const Dictionary message{{"volume", 0.5}, {"state", "playing"}};
  file->appendObject("key", message);
  const long before = peak();

  for (int number = 1; number < kObjects; ++number) file->appendObject("key", message);
  EXPECT_EQ(codeOf(*file), 0);

  EXPECT_LT(peak() - before, kGrowthKilobytes);
  EXPECT_GT(fs::file_size(root_ / "a/f.json"), std::uintmax_t{kObjects} * 60);
}

}  // namespace
}  // namespace halvox::platform::linux_
