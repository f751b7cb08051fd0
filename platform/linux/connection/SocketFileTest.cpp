#include "platform/linux/connection/SocketFile.h"

#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <variant>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

using Kind = ConnectionOpenError;
using std::filesystem::path;

class SocketFileTest : public testing::Test {
 protected:
  [[nodiscard]] path socketPath() const { return directory_.path() / "s"; }
  ScratchDirectory directory_;
};

Kind kindOf(const Result<BoundSocket, Kind>& result) {
  EXPECT_FALSE(result);
  return result ? Kind::kSystem : result.error().code;
}

TEST_F(SocketFileTest, AnybodyMayConnect) {
  const auto bound = listenOn(socketPath());

  ASSERT_TRUE(bound);
  const auto permissions = std::filesystem::status(socketPath()).permissions();
  EXPECT_EQ(static_cast<unsigned>(permissions) & 0777U, 0666U);
}

TEST_F(SocketFileTest, OnlyThoseMayConnectWhomTheModeLetsIn) {
  const mode_t before = umask(0);

  const auto bound = listenOn(socketPath(), {.mode = 0640, .group = {}});

  umask(before);
  ASSERT_TRUE(bound);
  const auto permissions = std::filesystem::status(socketPath()).permissions();
  EXPECT_EQ(static_cast<unsigned>(permissions) & 0777U, 0640U);
}

TEST_F(SocketFileTest, UnknownGroupIsAnErrorAndNoFileIsLeft) {
  const auto result = listenOn(socketPath(), {.mode = 0660, .group = "no such group"});

  EXPECT_EQ(kindOf(result), Kind::kUnknownGroup);
  EXPECT_NE(result.error().message.find("\"no such group\""), std::string::npos);
  EXPECT_FALSE(std::filesystem::exists(socketPath()));
}

// Starts a process that tries to connect, again and again. The process exits with status 1 when it
// succeeds; otherwise the test kills it. The process needs the rights of root at its start, to give
// them up.
pid_t startIntruder(const path& socket) {
  const pid_t child = fork();
  if (child != 0) return child;
  constexpr uid_t kNobody = 65534;
  if (setresgid(kNobody, kNobody, kNobody) != 0 || setresuid(kNobody, kNobody, kNobody) != 0) {
    _exit(2);
  }
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socket.native().copy(address.sun_path, sizeof address.sun_path - 1);
  for (;;) {
    const UniqueFd fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    if (connect(fd.get(), generic, sizeof address) == 0) _exit(1);
  }
}

TEST_F(SocketFileTest, NobodyWhomTheModeKeepsOutGetsInWhileTheSocketIsMade) {
  if (geteuid() != 0) GTEST_SKIP() << "needs the right to become another user";
  constexpr int kRounds = 2000;
  std::filesystem::permissions(directory_.path(), std::filesystem::perms(0755));
  const mode_t before = umask(0);
  const pid_t intruder = startIntruder(socketPath());

  for (int round = 0; round < kRounds; ++round) {
    ASSERT_TRUE(listenOn(socketPath(), {.mode = 0600, .group = {}}));
  }

  umask(before);
  int status = 0;
  EXPECT_EQ(waitpid(intruder, &status, WNOHANG), 0) << "the intruder got in";
  kill(intruder, SIGKILL);
  waitpid(intruder, &status, 0);
}

TEST_F(SocketFileTest, FileIsRemovedAtTheEnd) {
  { const auto bound = listenOn(socketPath()); }

  EXPECT_FALSE(std::filesystem::exists(socketPath()));
}

TEST_F(SocketFileTest, FileOfSomebodyElseIsLeftAtTheEnd) {
  {
    const auto bound = listenOn(socketPath());
    std::filesystem::rename(socketPath(), directory_.path() / "moved");
    std::ofstream(socketPath()) << "somebody else's";
  }

  EXPECT_TRUE(std::filesystem::exists(socketPath()));
}

TEST_F(SocketFileTest, SocketOfALiveServiceIsLeftAlone) {
  const auto live = listenOn(socketPath());

  EXPECT_EQ(kindOf(listenOn(socketPath())), Kind::kAlreadyServed);
  EXPECT_TRUE(std::filesystem::is_socket(socketPath()));
}

TEST_F(SocketFileTest, SocketThatNobodyServesIsReplaced) {
  auto dead = listenOn(socketPath());
  dead->fd.reset();
  ASSERT_TRUE(std::filesystem::is_socket(socketPath()));

  EXPECT_TRUE(listenOn(socketPath()));
}

TEST_F(SocketFileTest, OtherFileIsLeftAlone) {
  std::ofstream(socketPath()) << "precious";

  EXPECT_EQ(kindOf(listenOn(socketPath())), Kind::kNotASocket);
  EXPECT_TRUE(std::filesystem::is_regular_file(socketPath()));
}

TEST_F(SocketFileTest, MissingDirectoryIsAnError) {
  EXPECT_EQ(kindOf(listenOn(directory_.path() / "missing" / "s")), Kind::kDirectoryMissing);
}

TEST_F(SocketFileTest, DirectoryThatCannotBeWrittenIsAnError) {
  std::filesystem::permissions(directory_.path(), std::filesystem::perms(0555));

  // Runs in a child process, which first gives up the rights of root.
  const pid_t child = fork();
  if (child == 0) {
    constexpr uid_t kNobody = 65534;
    if (geteuid() == 0 && setresuid(kNobody, kNobody, kNobody) != 0) _exit(2);
    const auto result = listenOn(socketPath());
    _exit(!result && result.error().code == Kind::kDirectoryNotWritable ? 0 : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  std::filesystem::permissions(directory_.path(), std::filesystem::perms(0755));

  EXPECT_EQ(status, 0);
}

TEST_F(SocketFileTest, PathThatIsTooLongForAnAddressIsAnError) {
  EXPECT_EQ(kindOf(listenOn(directory_.path() / std::string(200, 'a'))), Kind::kPathTooLong);
  EXPECT_EQ(kindOf(listenOn("")), Kind::kPathTooLong);
}

}  // namespace
}  // namespace halvox::platform::linux_
