#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/testing/AnotherUser.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"
#include "platform/linux/connection/testing/TestProcess.h"

namespace halvox::platform::linux_ {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* kName = "com.tarno.halvox.reporting";

constexpr const char* kBusConfiguration = R"(
<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig>
  <type>session</type>
  <listen>unix:path=SOCKET</listen>
  <auth>EXTERNAL</auth>
  <policy context="default">
    <allow user="*"/>
    <allow send_destination="*" eavesdrop="true"/>
    <allow eavesdrop="true"/>
    <allow own="*"/>
  </policy>
</busconfig>
)";

// Starts a private bus, and sets the environment variables that name it.
class PrivateBus {
 public:
  PrivateBus() {
    std::string configuration = kBusConfiguration;
    const std::string placeholder = "SOCKET";
    configuration.replace(configuration.find(placeholder), placeholder.size(),
                          (directory_.path() / "bus").string());
    const std::string file = (directory_.path() / "bus.conf").string();
    std::filesystem::permissions(directory_.path(), std::filesystem::perms(0755));
    std::ofstream(file) << configuration;
    daemon_.emplace(std::vector<std::string>{"dbus-daemon", "--config-file=" + file, "--nofork",
                                             "--print-address=1"});
    address_ = daemon_->firstLine();
    setenv("DBUS_SESSION_BUS_ADDRESS", address_.c_str(), 1);
  }
  PrivateBus(const PrivateBus&) = delete;
  PrivateBus& operator=(const PrivateBus&) = delete;
  ~PrivateBus() { unsetenv("DBUS_SESSION_BUS_ADDRESS"); }

  [[nodiscard]] const std::string& address() const { return address_; }
  void kill() { daemon_.reset(); }

 private:
  ScratchDirectory directory_;
  std::optional<TestProcess> daemon_;
  std::string address_;
};

void onSessionBus(ConnectionOptions& options) { options.bus = BusKind::kSession; }

class BusTest : public testing::Test {
 protected:
  BusClient connect() {
    BusClient client(bus_.address());
    client.setDestination(kName);
    return client;
  }
  static std::string own(const std::string& event) {
    return event + " " + std::to_string(getpid());
  }
  PrivateBus bus_;
  ServiceUnderTest service_{onSessionBus};
};

TEST_F(BusTest, RequestOverTheBusIsAnswered) {
  BusClient client = connect();

  EXPECT_EQ(client.call("echo", "hello").text, "hello");
  EXPECT_EQ(client.call("away", "hello").text, "hello");
  EXPECT_EQ(client.call("fail").errorName, "com.tarno.audio.reporting.Code1");
  EXPECT_EQ(client.call("nonesuch").errorName, "org.freedesktop.DBus.Error.UnknownMethod");
}

TEST_F(BusTest, ProcessOfASenderIsKnownBeforeItIsAccepted) {
  BusClient client = connect();

  EXPECT_EQ(client.call("pid").text, std::to_string(getpid()));
  EXPECT_THAT(service_.delegate.events(), ElementsAre(own("accepted")));
}

TEST_F(BusTest, WhatIsForTheOwnerIsRefusedToSendersOfOtherUsers) {
  if (!AnotherUser::isPossible()) GTEST_SKIP() << "needs the right to become another user";
  BusClient owner = connect();
  std::optional<BusClient> other;
  {
    const AnotherUser user;
    other.emplace(connect());
  }

  EXPECT_EQ(other->call("end").errorName, "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_EQ(other->call("echo", "a").text, "a");
  EXPECT_EQ(owner.call("end").text, "true");
}

TEST_F(BusTest, EverySenderIsAConnectionOfItsOwn) {
  BusClient first = connect();
  BusClient second = connect();
  first.call("echo", "a");
  second.call("echo", "a");
  first.call("echo", "a");

  EXPECT_THAT(service_.delegate.events(), ElementsAre(own("accepted"), own("accepted")));
}

TEST_F(BusTest, SenderThatVanishesIsInterruptedThenInvalidatedOnce) {
  {
    BusClient client = connect();
    client.call("echo", "a");
  }
  ASSERT_TRUE(eventually([&] { return service_.count("connections ended") == 1U; }));
  service_.stop();

  EXPECT_THAT(service_.delegate.events(),
              ElementsAre(own("accepted"), own("interrupted"), own("invalidated")));
}

TEST_F(BusTest, RequestsOfASenderThatLeftAtOnceAreCarriedOut) {
  {
    BusClient client = connect();
    for (int call = 0; call < 10; ++call) {
      BusMessage message;
      sd_bus_message_new_method_call(client.get(), message.out(), kName, kTestPath, kTestInterface,
                                     "echo");
      sd_bus_message_append(message.get(), "s", "a");
      sd_bus_message_set_expect_reply(message.get(), 0);
      ASSERT_GE(sd_bus_send(client.get(), message.get(), nullptr), 0);
    }
  }

  EXPECT_TRUE(eventually([&] { return service_.count("connections ended") == 1U; }));
  EXPECT_EQ(service_.delegate.object->delivered, 10U);
}

TEST_F(BusTest, BothWaysInAreServedAtOnce) {
  BusClient onBus = connect();
  BusClient onSocket(service_.address());

  EXPECT_EQ(onBus.call("echo", "a").text, "a");
  EXPECT_EQ(onSocket.call("echo", "b").text, "b");
}

TEST_F(BusTest, TakenNameIsAnError) {
  const ScratchDirectory directory;
  Backpressure backpressure;
  ConnectionOptions options;
  options.socket = directory.path() / "s";
  options.bus = BusKind::kSession;
  options.signals = EndSignals::kLeaveAlone;
  LinuxConnectionService second(options, backpressure);

  const auto opened = second.open();

  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, ConnectionOpenError::kBusNameTaken);
  EXPECT_THAT(opened.error().message, HasSubstr(kName));
}

TEST_F(BusTest, LossOfTheBusEndsItsSendersAndNothingElse) {
  BusClient onBus = connect();
  ASSERT_EQ(onBus.call("echo", "a").text, "a");
  BusClient onSocket(service_.address());

  bus_.kill();

  EXPECT_TRUE(eventually([&] { return service_.delegate.hasSeen(own("invalidated")); }));
  EXPECT_EQ(service_.countLines(LogLevel::kError, "lost the bus"), 1U);
  EXPECT_EQ(onSocket.call("echo", "b").text, "b");
}

// Sends calls that the service answers only when the test releases them. Does not wait for the
// answers.
void flood(BusClient& client, std::size_t calls, const std::string& member) {
  for (std::size_t call = 0; call < calls; ++call) {
    BusMessage message;
    sd_bus_message_new_method_call(client.get(), message.out(), kName, kTestPath, kTestInterface,
                                   member.c_str());
    sd_bus_message_append(message.get(), "x", std::int64_t{1});
    ASSERT_GE(sd_bus_send(client.get(), message.get(), nullptr), 0);
  }
  ASSERT_GE(sd_bus_flush(client.get()), 0);
}

TEST_F(BusTest, SenderWithTheMostOpenRequestsWaitsAloneAndLosesNothing) {
  constexpr std::size_t kCalls = 3000;
  TestObject& object = *service_.delegate.object;
  BusClient busy = connect();
  BusClient other = connect();
  flood(busy, kCalls, "busy");

  ASSERT_TRUE(eventually([&] { return object.delivered == kMaxOpenRequests; }));
  for (int call = 0; call < 50; ++call) ASSERT_EQ(other.call("echo", "a").text, "a");
  EXPECT_EQ(object.delivered, kMaxOpenRequests + 50);

  EXPECT_TRUE(eventually([&] {
    object.answerBusy();
    return object.delivered == kCalls + 50;
  }));
}

TEST_F(BusTest, WhatASenderSendsBeyondWhatMayWaitIsRefused) {
  BusClient busy = connect();
  flood(busy, kMaxOpenRequests, "busy");
  const std::string megabyte(1 * kMiB, 'a');

  // The bus forwards all of these requests. None is delivered while the first ones are open.
  for (int call = 0; call < 6; ++call) {
    BusMessage message;
    sd_bus_message_new_method_call(busy.get(), message.out(), kName, kTestPath, kTestInterface,
                                   "echo");
    sd_bus_message_append(message.get(), "s", megabyte.c_str());
    ASSERT_GE(sd_bus_send(busy.get(), message.get(), nullptr), 0);
  }
  ASSERT_GE(sd_bus_flush(busy.get()), 0);

  EXPECT_TRUE(
      eventually([&] { return service_.count("requests refused: too many waiting") == 3U; }));
}

TEST(BusStartTest, MissingBusIsAnError) {
  const ScratchDirectory directory;
  FakePlatform platform;
  Backpressure backpressure;
  ConnectionOptions options;
  options.socket = directory.path() / "s";
  options.bus = BusKind::kSession;
  options.signals = EndSignals::kLeaveAlone;
  const std::string address = "unix:path=" + (directory.path() / "missing").string();
  setenv("DBUS_SESSION_BUS_ADDRESS", address.c_str(), 1);
  LinuxConnectionService service(options, backpressure);

  const auto opened = service.open();
  unsetenv("DBUS_SESSION_BUS_ADDRESS");

  ASSERT_FALSE(opened);
  EXPECT_EQ(opened.error().code, ConnectionOpenError::kBusUnreachable);
  EXPECT_THAT(opened.error().message, HasSubstr("missing"));
}

}  // namespace
}  // namespace halvox::platform::linux_
