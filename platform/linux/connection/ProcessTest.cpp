#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "platform/linux/connection/SocketFile.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"
#include "platform/linux/connection/testing/TestProcess.h"

namespace halvox::platform::linux_ {
namespace {

using std::filesystem::path;

class ProcessTest : public testing::Test {
 protected:
  [[nodiscard]] path socketPath() const { return directory_.path() / "s"; }
  [[nodiscard]] std::string address() const { return "unix:path=" + socketPath().string(); }
  [[nodiscard]] std::vector<std::string> command() const {
    return {HALVOX_TEST_SERVER, socketPath().string()};
  }
  void waitForSocket() const {
    ASSERT_TRUE(eventually([&] {
      try {
        return BusClient(address()).call("echo", "a").text == "a";
      } catch (const std::exception&) {
        return false;
      }
    }));
  }
  ScratchDirectory directory_;
};

int statusFor(ConnectionOpenError kind) { return 10 + static_cast<int>(kind); }

TEST_F(ProcessTest, EndSignalsEndItInOrder) {
  for (const int number : {SIGTERM, SIGINT}) {
    TestProcess service(command());
    waitForSocket();

    service.signal(number);

    EXPECT_EQ(service.waitForExit(), EXIT_SUCCESS);
    EXPECT_FALSE(std::filesystem::exists(socketPath()));
  }
}

TEST_F(ProcessTest, SecondServiceIsTurnedAwayAndTheFirstGoesOn) {
  TestProcess first(command());
  waitForSocket();

  TestProcess second(command());

  EXPECT_EQ(second.waitForExit(), statusFor(ConnectionOpenError::kAlreadyServed));
  waitForSocket();
}

TEST_F(ProcessTest, SocketOfAKilledServiceIsReplaced) {
  {
    TestProcess killed(command());
    waitForSocket();
  }
  ASSERT_TRUE(std::filesystem::is_socket(socketPath()));

  TestProcess service(command());

  waitForSocket();
}

// The shell replaces itself with the service, which inherits the descriptor.
std::vector<std::string> activated(const std::vector<std::string>& command) {
  std::vector<std::string> shell = {"sh", "-c", "LISTEN_PID=$$ LISTEN_FDS=1 exec \"$0\" \"$@\""};
  shell.insert(shell.end(), command.begin(), command.end());
  return shell;
}

TEST_F(ProcessTest, PassedSocketTakesThePlaceOfItsOwn) {
  auto bound = listenOn(socketPath());
  const BoundSocket& socket = *bound;
  RawClient early(socketPath());  // connects before the service runs
  early.authenticate(early.callWithText("echo", "early"));
  const std::vector<std::string> other = {HALVOX_TEST_SERVER,
                                          (directory_.path() / "unused").string()};

  TestProcess service(activated(other), {.passedFd = socket.fd.get()});

  EXPECT_EQ(early.receive()->values[0].string(), "early");
  waitForSocket();
  EXPECT_FALSE(std::filesystem::exists(directory_.path() / "unused"));
  service.signal(SIGTERM);
  EXPECT_EQ(service.waitForExit(), EXIT_SUCCESS);
  EXPECT_TRUE(std::filesystem::exists(socketPath()));  // the file is not the service's to remove
}

TEST_F(ProcessTest, PassedDescriptorThatDoesNotListenIsRefused) {
  const UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM, 0));

  TestProcess service(activated(command()), {.passedFd = socket.get()});

  EXPECT_EQ(service.waitForExit(), statusFor(ConnectionOpenError::kBadActivation));
}

TEST_F(ProcessTest, ManagerIsNotifiedWhenItServes) {
  const path notifyPath = directory_.path() / "notify";
  const UniqueFd notify(socket(AF_UNIX, SOCK_DGRAM, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  notifyPath.native().copy(address.sun_path, sizeof address.sun_path - 1);
  ASSERT_EQ(bind(notify.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  timeval timeout{.tv_sec = kTestDeadline.count(), .tv_usec = 0};
  setsockopt(notify.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);

  const TestProcess service(command(), {.environment = {"NOTIFY_SOCKET=" + notifyPath.string()}});

  std::array<char, 256> text{};
  ASSERT_GT(recv(notify.get(), text.data(), text.size() - 1, 0), 0);
  EXPECT_STREQ(text.data(), "READY=1\nSTATUS=Serving 1 sockets and 0 buses");
  EXPECT_NO_THROW(RawClient{socketPath()});
}

TEST_F(ProcessTest, ClientsWaitWithoutCostWhenDescriptorsRunOut) {
#ifdef HALVOX_UNDEFINED_SANITIZER
  GTEST_SKIP() << "the sanitizer needs descriptors itself to look at an object's type";
#endif
  std::vector<std::string> limited = command();
  limited.emplace_back("32");
  TestProcess service(limited);
  waitForSocket();
  std::vector<std::unique_ptr<RawClient>> clients;
  for (int client = 0; client < 60; ++client) {
    clients.push_back(std::make_unique<RawClient>(socketPath()));
    clients.back()->authenticate(clients.back()->callWithText("echo", "a"));
  }
  ASSERT_TRUE(clients.front()->receive().has_value());
  const double before = service.processorSeconds();
  const auto isSpinning = [&] { return service.processorSeconds() - before >= 0.1 ? 1L : 0L; };
  EXPECT_EQ(isSpinning(), 0);
  EXPECT_TRUE(staysQuiet(isSpinning, std::chrono::milliseconds(500)));

  // When a client leaves, a waiting client takes its place. No client is refused.
  for (const auto& client : clients) {
    if (client != clients.front()) {
      EXPECT_TRUE(client->receive().has_value());
    }
    client->close();
  }
}

TEST_F(ProcessTest, IdleServiceMakesNoWakeUps) {
  TestProcess service(command());
  waitForSocket();
  std::vector<std::unique_ptr<BusClient>> clients;
  for (int client = 0; client < 20; ++client) {
    clients.push_back(std::make_unique<BusClient>(address()));
    ASSERT_EQ(clients.back()->call("echo", "a").text, "a");
  }
  const auto wakeUps = [&] { return service.statusNumber("voluntary_ctxt_switches"); };

  EXPECT_TRUE(staysQuiet(wakeUps, std::chrono::seconds(2)));
}

}  // namespace
}  // namespace halvox::platform::linux_
