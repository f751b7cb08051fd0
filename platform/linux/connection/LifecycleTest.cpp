#include <array>
#include <chrono>
#include <memory>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;
using testing::ElementsAre;

std::string own(const std::string& event) { return event + " " + std::to_string(getpid()); }

TEST(LifecycleTest, PeerThatVanishesIsInterruptedThenInvalidatedOnce) {
  ServiceUnderTest service;
  { const BusClient client(service.address()); }
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));
  service.stop();

  EXPECT_THAT(service.delegate.events(),
              ElementsAre(own("accepted"), own("interrupted"), own("invalidated")));
}

TEST(LifecycleTest, ConnectionIsAcceptedBeforeItsHandshake) {
  ServiceUnderTest service;
  const RawClient client(service.socketPath());

  EXPECT_TRUE(eventually([&] { return service.delegate.hasSeen(own("accepted")); }));
}

TEST(LifecycleTest, ExportedObjectIsLetGoAfterTheEnd) {
  ServiceUnderTest service;
  {
    BusClient client(service.address());
    client.call("echo", "a");
  }
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));

  EXPECT_TRUE(eventually([&] { return service.delegate.object.use_count() == 1; }));
}

TEST(LifecycleTest, RefusedConnectionIsClosedWithoutHandlers) {
  ServiceUnderTest service;
  service.delegate.refuses = true;
  RawClient client(service.socketPath());

  EXPECT_TRUE(client.isClosedByService());
  EXPECT_EQ(service.count("connections refused"), 1U);
  EXPECT_TRUE(service.delegate.events().empty());
}

// Returns the number in the signal of an orderly end; nothing if the connection ends without it.
std::optional<std::uint64_t> lastRequestInGoodbye(RawClient& client) {
  while (const auto answer = client.receive()) {
    if (answer->type == dbus::MessageType::kSignal) return answer->values.at(0).toUInt64();
  }
  return std::nullopt;
}

TEST(LifecycleTest, AnOrderlyEndTellsAClientItsLastRequestThatWasTaken) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  client.send(client.callWithText("echo", "a"));
  client.send(client.callWithText("echo", "b"));
  client.send(client.callWithText("noSuchMethod", "c"));
  for (int answers = 0; answers < 3; ++answers) ASSERT_TRUE(client.receive().has_value());

  service.stop();

  EXPECT_EQ(lastRequestInGoodbye(client), client.lastSerial());
  EXPECT_TRUE(client.isClosedByService());
}

TEST(LifecycleTest, AnOrderlyEndTellsAClientWithoutRequestsThatNoneWasTaken) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  ASSERT_TRUE(eventually([&] { return service.count("connections accepted") == 1U; }));
  client.send(withoutReply(client.callWithText("echo", "a")).substr(0, 20));

  service.stop();

  EXPECT_EQ(lastRequestInGoodbye(client), 0U);
}

TEST(LifecycleTest, RequestsSentBeforeTheClientWentAwayAreDelivered) {
  ServiceUnderTest service;
  {
    RawClient client(service.socketPath());
    std::string calls;
    for (int call = 0; call < 1000; ++call) calls += withoutReply(client.callWithText("echo", "a"));
    client.authenticate(calls);
  }
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));

  EXPECT_EQ(service.delegate.object->delivered, 1000U);
}

TEST(LifecycleTest, HandshakeAndRequestsMayComeInOneWrite) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());

  client.authenticate(client.callWithText("echo", "a") + client.callWithText("echo", "b"));

  EXPECT_EQ(client.receive()->values[0].string(), "a");
  EXPECT_EQ(client.receive()->values[0].string(), "b");
}

TEST(LifecycleTest, RequestMayComeByteByByte) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  const std::string call = client.callWithText("echo", "a");

  for (const char byte : call) client.send(std::string(1, byte));

  EXPECT_EQ(client.receive()->values[0].string(), "a");
}

TEST(LifecycleTest, FailedHandshakeIsClosedWithALine) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());

  client.send("GET / HTTP/1.1\r\n\r\n");

  EXPECT_TRUE(client.isClosedByService());
  EXPECT_TRUE(
      eventually([&] { return service.countLines(LogLevel::kDefault, "handshake failed") == 1U; }));
}

class StallTest : public testing::TestWithParam<int> {
 protected:
  // The bytes that each client sends before it stalls.
  static std::string begin(RawClient& client, int kind) {
    const std::string call = client.callWithText("echo", "some text");
    const std::string handshake = std::string(1, '\0') + "AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n";
    switch (kind) {
      case 0:
        return "";
      case 1:
        return handshake.substr(0, 10);
      case 2:
        return handshake + call.substr(0, 10);
      default:
        return handshake + call.substr(0, call.size() - 4);
    }
  }
};

TEST_P(StallTest, IsClosedInTimeWithALineAndNobodyElseNotices) {
  ServiceUnderTest service([](ConnectionOptions& options) {
    options.handshakeTimeout = milliseconds(150);
    options.messageTimeout = milliseconds(150);
  });
  BusClient other(service.address());
  ASSERT_EQ(other.call("echo", "a").text, "a");
  RawClient client(service.socketPath());
  const std::string bytes = begin(client, GetParam());
  if (!bytes.empty()) client.send(bytes);

  EXPECT_TRUE(client.isClosedByService());

  const std::string awaited = GetParam() < 2 ? "its handshake" : "a message that it has begun";
  EXPECT_TRUE(eventually([&] { return service.count("connections closed: timed out") == 1U; }));
  EXPECT_EQ(service.countLines(LogLevel::kDefault, awaited), 1U);
  EXPECT_EQ(service.countLines(LogLevel::kDefault, "pid " + std::to_string(getpid())), 1U);
  EXPECT_EQ(other.call("echo", "a").text, "a");  // idle all the time, and not closed
}

INSTANTIATE_TEST_SUITE_P(Kinds, StallTest, testing::Range(0, 4));

TEST(LifecycleTest, TimedOutConnectionIsInvalidatedWithoutInterruption) {
  ServiceUnderTest service(
      [](ConnectionOptions& options) { options.handshakeTimeout = milliseconds(50); });
  RawClient client(service.socketPath());
  ASSERT_TRUE(client.isClosedByService());
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));

  EXPECT_THAT(service.delegate.events(), ElementsAre(own("accepted"), own("invalidated")));
}

TEST(LifecycleTest, BatchHooksSurroundDeliveriesAndRepliesOfTheEndAreWritten) {
  std::vector<ReplyCallback> kept;
  std::vector<std::string> calls;
  std::shared_ptr<TestObject> object;
  ServiceUnderTest service([&](ConnectionOptions& options) {
    options.beginBatch = [&] { calls.emplace_back("begin"); };
    options.endBatch = [&] {
      calls.emplace_back("end");
      if (object) object->answerHeld();
    };
    options.afterReplies = [&] { calls.emplace_back("replies written"); };
  });
  object = service.delegate.object;
  const std::array argument = {Value(std::int64_t{1})};
  RawClient client(service.socketPath());

  client.authenticate(client.call("hold", "x", argument));
  const auto answer = client.receive();
  service.stop();

  ASSERT_TRUE(answer.has_value());
  ASSERT_GE(calls.size(), 3U);
  for (std::size_t call = 0; call < calls.size(); ++call) {
    const std::array expected = {"begin", "end", "replies written"};
    EXPECT_EQ(calls[call], expected.at(call % expected.size()));
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
