#include "platform/linux/drivers/pipewire/ServerWatch.h"

#include <filesystem>
#include <fstream>
#include <memory>

#include <gtest/gtest.h>
#include <stdlib.h>

#include "platform/linux/drivers/testing/MadeReadings.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

struct LoopDeleter {
  void operator()(pw_loop* loop) const {
    pw_loop_leave(loop);
    pw_loop_destroy(loop);
    pw_deinit();
  }
};

class ServerWatchTest : public ::testing::Test {
 protected:
  ServerWatchTest() {
    setenv("XDG_RUNTIME_DIR", directory.path().c_str(), 1);
    unsetenv("PIPEWIRE_RUNTIME_DIR");
    unsetenv("PIPEWIRE_REMOTE");
    pw_init(nullptr, nullptr);
    loop.reset(pw_loop_new(nullptr));
    pw_loop_enter(loop.get());
  }
  ~ServerWatchTest() override { unsetenv("PIPEWIRE_REMOTE"); }

  // The number of calls so far.
  int reports() {
    while (pw_loop_iterate(loop.get(), 0) > 0) {
    }
    return reports_;
  }
  [[nodiscard]] ServerWatch makeWatch() {
    return {loop.get(), [this] { ++reports_; }};
  }
  [[nodiscard]] std::filesystem::path inDirectory(std::string_view name) const {
    return directory.path() / name;
  }
  static void create(const std::filesystem::path& path) { std::ofstream(path) << "."; }

  const ScratchDirectory directory;
  std::unique_ptr<pw_loop, LoopDeleter> loop;

 private:
  int reports_ = 0;
};

TEST_F(ServerWatchTest, ReportsTheSocketsNameAndNoOther) {
  ServerWatch watch = makeWatch();
  watch.begin();

  create(inDirectory("pipewire-0.lock"));
  EXPECT_EQ(reports(), 0);
  create(inDirectory("pipewire-0"));
  EXPECT_EQ(reports(), 1);
}

TEST_F(ServerWatchTest, ReportsANameThatWasMovedIn) {
  create(inDirectory("elsewhere"));
  ServerWatch watch = makeWatch();
  watch.begin();

  std::filesystem::rename(inDirectory("elsewhere"), inDirectory("pipewire-0"));

  EXPECT_EQ(reports(), 1);
}

TEST_F(ServerWatchTest, AnAbsoluteNameIsWatchedWhereItIs) {
  const ScratchDirectory other;
  setenv("PIPEWIRE_REMOTE", (other.path() / "audio").c_str(), 1);
  ServerWatch watch = makeWatch();
  watch.begin();

  create(inDirectory("audio"));
  EXPECT_EQ(reports(), 0);
  create(other.path() / "audio");
  EXPECT_GE(reports(), 1);
}

TEST_F(ServerWatchTest, ReportsNothingAfterItsEndAndAgainAfterAnotherBeginning) {
  ServerWatch watch = makeWatch();
  watch.begin();
  watch.end();
  create(inDirectory("pipewire-0"));
  EXPECT_EQ(reports(), 0);

  std::filesystem::remove(inDirectory("pipewire-0"));
  watch.begin();
  create(inDirectory("pipewire-0"));
  EXPECT_EQ(reports(), 1);
}

TEST_F(ServerWatchTest, ADirectoryThatIsMissingIsFoundAtTheNextBeginning) {
  setenv("XDG_RUNTIME_DIR", inDirectory("missing").c_str(), 1);
  ServerWatch watch = makeWatch();
  watch.begin();
  std::filesystem::create_directory(inDirectory("missing"));
  create(inDirectory("missing") / "other");
  EXPECT_EQ(reports(), 0);

  watch.end();
  watch.begin();
  create(inDirectory("missing") / "pipewire-0");
  EXPECT_EQ(reports(), 1);
}

TEST_F(ServerWatchTest, ADirectoryThatGoesEndsItsWatchQuietly) {
  const auto gone = inDirectory("gone");
  std::filesystem::create_directory(gone);
  setenv("XDG_RUNTIME_DIR", gone.c_str(), 1);
  ServerWatch watch = makeWatch();
  watch.begin();

  std::filesystem::remove(gone);
  EXPECT_EQ(reports(), 0);
  // Nothing remains that would wake the loop.
  EXPECT_EQ(pw_loop_iterate(loop.get(), 0), 0);

  std::filesystem::create_directory(gone);
  watch.end();
  watch.begin();
  create(gone / "pipewire-0");
  EXPECT_EQ(reports(), 1);
}

}  // namespace
}  // namespace halvox::platform::linux_
