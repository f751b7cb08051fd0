#include "platform/linux/connection/Watchdog.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

// Stands for the service manager, which sets these variables and receives the messages.
class WatchdogTest : public testing::Test {
 protected:
  void SetUp() override {
    const std::string path = (directory_.path() / "notify").string();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    socket_.reset(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(bind(socket_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ::setenv("NOTIFY_SOCKET", path.c_str(), 1);
  }
  void TearDown() override {
    for (const char* name : {"NOTIFY_SOCKET", "WATCHDOG_USEC", "WATCHDOG_PID"}) ::unsetenv(name);
  }
  static void setLimit(const char* microseconds) { ::setenv("WATCHDOG_USEC", microseconds, 1); }

  // Returns the number of messages with that text that have arrived since the last call.
  [[nodiscard]] int received(const std::string& text) const {
    std::array<char, 256> message{};
    int found = 0;
    for (ssize_t size = 0; size >= 0;) {
      size = recv(socket_.get(), message.data(), message.size(), MSG_DONTWAIT);
      if (size > 0 && std::string(message.data(), static_cast<std::size_t>(size)) == text) ++found;
    }
    return found;
  }

  ScratchDirectory directory_;
  UniqueFd socket_;
};

constexpr const char* kKeepAlive = "WATCHDOG=1";

TEST_F(WatchdogTest, KeepAlivesAreSentAgainAndAgain) {
  setLimit("90000");
  const ServiceUnderTest service;

  int keepAlives = 0;
  EXPECT_TRUE(eventually([&] { return (keepAlives += received(kKeepAlive)) >= 3; }));
}

TEST_F(WatchdogTest, StuckServiceSendsNoneUntilItGoesOn) {
  setLimit("90000");
  std::atomic<bool> progresses = true;
  std::atomic<int> stuckLooks = 0;
  const ServiceUnderTest service([&](ConnectionOptions& options) {
    options.hasProgressed = [&] {
      if (!progresses) ++stuckLooks;
      return progresses.load();
    };
  });
  ASSERT_TRUE(eventually([&] { return received(kKeepAlive) > 0; }));

  progresses = false;
  ASSERT_TRUE(eventually([&] { return stuckLooks > 0; }));
  static_cast<void>(received(kKeepAlive));  // one of a look before it was stuck
  const int before = stuckLooks;
  ASSERT_TRUE(eventually([&] { return stuckLooks >= before + 3; }));
  EXPECT_EQ(received(kKeepAlive), 0);
  EXPECT_EQ(service.countLines(LogLevel::kError, "is stuck"), 1U) << "one line for each time";

  progresses = true;
  EXPECT_TRUE(eventually([&] { return received(kKeepAlive) > 0; }));
}

TEST_F(WatchdogTest, ThereAreThreeLooksInTheLimit) {
  setLimit("300000000");

  EXPECT_EQ(Watchdog({}).looks().delay(), std::chrono::seconds(100));
}

TEST_F(WatchdogTest, WithoutALimitThereIsNoLook) {
  Watchdog watchdog({});

  watchdog.start();

  EXPECT_FALSE(watchdog.looks().first().has_value());
}

TEST_F(WatchdogTest, LimitOfAnotherProcessIsIgnored) {
  setLimit("90000");
  ::setenv("WATCHDOG_PID", "1", 1);
  Watchdog watchdog({});

  watchdog.start();

  EXPECT_FALSE(watchdog.looks().first().has_value());
}

}  // namespace
}  // namespace halvox::platform::linux_
