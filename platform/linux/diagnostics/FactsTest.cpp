#include <sys/stat.h>

#include "platform/linux/diagnostics/FileTree.h"
#include "platform/linux/diagnostics/ProcessFacts.h"
#include "platform/linux/diagnostics/SnapshotFixture.h"

// Tests of processFacts() and readTree().

namespace halvox::platform::linux_ {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

class FactsTest : public ::testing::Test {
 protected:
  Dictionary facts(std::string_view name) const {
    return processFacts(root.path(), name, deadline);
  }
  void addProcess(const std::string& pid, const std::string& comm) const {
    writeText(root.path() / pid / "comm", comm + "\n");
  }
  Tree tree(const TreeBounds& bounds = {}) const { return readTree(root.path(), bounds, deadline); }

  ScratchDirectory root;
  WaitableFlag stop;
  CaptureDeadline deadline{stop, CaptureDeadline::Clock::now() + std::chrono::seconds(30)};
};

TEST_F(FactsTest, ProcessesAreFoundByTheirNameAndDescribed) {
  addProcess("30", "player");
  addProcess("4", "other");
  addProcess("7", "player");
  writeText(root.path() / "7/cmdline", std::string_view("play\0a b\0", 9));
  writeText(root.path() / "7/environ", "SECRET=1");
  writeText(root.path() / "7/maps",
            "1000-3000 r-xp 00000000 08:01 12 /usr/lib/a b.so\n3000-4000 rw-p 0 00:00 0 \n"
            "5000-6000 r--p 00000000 08:01 12 /usr/lib/a b.so\n");
  writeText(root.path() / "7/task/7/comm", "player\n");
  writeText(root.path() / "7/fd/0", "");

  const Dictionary found = facts("player");

  EXPECT_EQ(found.find("found")->toInt64(), 2);
  const Dictionary first = found.find("processes")->array()[0].dictionary();
  EXPECT_EQ(first.find("pid")->toInt64(), 7);
  EXPECT_EQ(*first.find("cmdline"), Value(Array{"play", "a b"}));
  EXPECT_EQ(first.find("open_files")->toInt64(), 1);
  EXPECT_EQ(first.find("thread_count")->toInt64(), 1);
  const Dictionary maps = first.find("maps")->dictionary();
  EXPECT_EQ(maps.find("bytes")->toInt64(), 0x4000);
  EXPECT_EQ(maps.find("largest")->array()[0],
            Value(Dictionary{{"name", "/usr/lib/a b.so"}, {"bytes", 0x3000}, {"mappings", 2}}));
  EXPECT_TRUE(first.find("not_readable")->dictionary().contains("status"));
  EXPECT_THAT(describe(found), Not(HasSubstr("SECRET")));
}

TEST_F(FactsTest, OurOwnProcessIsReadable) {
  std::string name = readText("/proc/self/comm");
  name.pop_back();

  const Dictionary found = processFacts("/proc", name, deadline);

  ASSERT_GE(found.find("found")->toInt64(), 1);
  EXPECT_THAT(describe(found), HasSubstr("VmRSS"));
}

TEST_F(FactsTest, TreeIsReadWithoutLinksAndInOrder) {
  writeText(root.path() / "b/c", "2");
  writeText(root.path() / "a", "1");
  std::filesystem::create_symlink("/etc/passwd", root.path() / "link");
  std::filesystem::create_directory_symlink("b", root.path() / "again");

  const Tree found = tree();

  ASSERT_EQ(found.files.size(), 2U);
  EXPECT_EQ(found.files[0].path, "a");
  EXPECT_EQ(found.files[1].path, "b/c");
  EXPECT_EQ(found.files[1].bytes, "2");
  EXPECT_FALSE(found.isCut);
}

TEST_F(FactsTest, TreeKeepsItsBounds) {
  for (const char* name : {"a", "b", "c", "d/e/f"}) writeText(root.path() / name, "0123456789");

  EXPECT_EQ(tree({.depth = 2}).files.size(), 3U);
  EXPECT_EQ(tree({.files = 2}).files.size(), 2U);
  EXPECT_TRUE(tree({.files = 2}).isCut);
  EXPECT_EQ(tree({.bytesOfFile = 4}).files[0].bytes, "0123");
  EXPECT_EQ(tree({.bytes = 15}).files.size(), 2U);
}

TEST_F(FactsTest, PipeInATreeIsSkippedWithoutWaiting) {
  ASSERT_EQ(::mkfifo((root.path() / "pipe").c_str(), 0600), 0);

  EXPECT_TRUE(tree().files.empty());
  EXPECT_EQ(readBounded(root.path() / "pipe", 10).failure, "not a regular file");
}

}  // namespace
}  // namespace halvox::platform::linux_
