#include <array>
#include <cstdint>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::uint32_t kManyCalls = 3000;

// Calls that the service answers only when the test releases them.
std::string manyCalls(RawClient& client, std::string_view member) {
  const std::array argument = {Value(std::int64_t{1})};
  std::string calls;
  for (std::uint32_t call = 0; call < kManyCalls; ++call) {
    calls += client.call(member, "x", argument);
  }
  return calls;
}

std::uint64_t unreadReplies(const ServiceUnderTest& service) {
  return service.count("replies given") - service.count("replies sent");
}

// Sends calls and reads nothing, until the service waits for the client to read.
bool stopReading(RawClient& client, const ServiceUnderTest& service) {
  client.authenticate();
  std::string unsent;
  return eventually([&] {
    for (std::size_t sent = 1; sent > 0;) {
      if (unsent.empty()) unsent = client.callWithText("echo", std::string(100, 'a'));
      sent = client.trySend(unsent);
      unsent.erase(0, sent);
    }
    return unreadReplies(service) >= kMaxUnreadReplies;
  });
}

// Lets the object answer the open calls, again and again, until every call has its answer.
void answerUntilAllAreRead(TestObject& object, RawClient& client) {
  const std::jthread answering([&](const std::stop_token& stop) {
    while (!stop.stop_requested()) object.answerBusy();
  });
  for (std::uint32_t call = 1; call <= kManyCalls; ++call) {
    const auto answer = client.receive();
    ASSERT_TRUE(answer.has_value());
    ASSERT_EQ(answer->replySerial, call);
  }
}

TEST(FlowTest, ClientIsNotReadFromWhileItHasTheMostOpenRequests) {
  ServiceUnderTest service;
  TestObject& object = *service.delegate.object;
  RawClient client(service.socketPath());
  BusClient other(service.address());
  client.authenticate();
  const std::jthread writer([&] { client.send(manyCalls(client, "busy")); });

  ASSERT_TRUE(eventually([&] { return object.delivered == kMaxOpenRequests; }));
  // Other clients continue. During all turns of the loop that serve them, no further request of the
  // full client is delivered.
  for (int call = 0; call < 50; ++call) ASSERT_EQ(other.call("echo", "a").text, "a");

  EXPECT_EQ(object.delivered, kMaxOpenRequests + 50);
  answerUntilAllAreRead(object, client);
}

TEST(FlowTest, ClientIsReadFromAgainWhenItsRequestsAreCarriedOut) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  const std::jthread writer([&] { client.send(manyCalls(client, "busy")); });

  answerUntilAllAreRead(*service.delegate.object, client);

  EXPECT_EQ(service.delegate.object->delivered, kManyCalls);
}

TEST(FlowTest, RequestsForListsAreHeldBackEarlier) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  std::string calls;
  for (int call = 0; call < 200; ++call) calls += client.call("list");
  client.send(calls);

  for (std::uint32_t call = 1; call <= 200; ++call) {
    ASSERT_EQ(client.receive()->replySerial, call);
  }
}

TEST(FlowTest, ClientThatDoesNotReadIsNotReadFromAndLosesNothing) {
  ServiceUnderTest service;
  TestObject& object = *service.delegate.object;
  RawClient client(service.socketPath());
  BusClient other(service.address());
  client.authenticate();
  constexpr std::uint32_t kCalls = 100'000;
  std::jthread writer([&] {
    std::string calls;
    for (std::uint32_t call = 0; call < kCalls; ++call) calls += client.callWithText("echo", "a");
    client.send(calls);
  });

  // The client reads nothing. The service stops reading from it when the socket's buffers are full.
  ASSERT_TRUE(eventually([&] { return object.delivered > kMaxUnreadReplies; }));
  for (int call = 0; call < 200; ++call) ASSERT_EQ(other.call("echo", "a").text, "a");
  EXPECT_LT(object.delivered, kCalls / 2);

  for (std::uint32_t call = 1; call <= kCalls; ++call) {
    ASSERT_EQ(client.receive()->replySerial, call);
  }
}

TEST(FlowTest, UnreadRepliesStayWithinTheirBound) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());

  ASSERT_TRUE(stopReading(client, service));

  BusClient other(service.address());
  for (int call = 0; call < 50; ++call) ASSERT_EQ(other.call("echo", "a").text, "a");
  EXPECT_LE(unreadReplies(service), kMaxUnreadReplies + kTurnRequests);
}

TEST(FlowTest, ClientThatVanishesWithUnreadRepliesIsLetGo) {
  ServiceUnderTest service;
  {
    RawClient client(service.socketPath());
    ASSERT_TRUE(stopReading(client, service));
  }

  EXPECT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));
  EXPECT_EQ(unreadReplies(service), service.count("replies dropped: client gone"));
}

TEST(FlowTest, UnderPressureTheBusiestClientWaitsAndQuietOnesGoOn) {
  ServiceUnderTest service;
  TestObject& object = *service.delegate.object;
  service.backpressure.raise();
  RawClient busy(service.socketPath());
  BusClient quiet(service.address());
  busy.authenticate();
  const std::jthread writer([&] { busy.send(manyCalls(busy, "hold")); });

  ASSERT_TRUE(eventually([&] { return object.delivered >= kShortTurnRequests; }));
  for (int call = 0; call < 50; ++call) ASSERT_EQ(quiet.call("echo", "a").text, "a");
  EXPECT_EQ(object.delivered, kShortTurnRequests + 50);
  service.backpressure.relieve();

  EXPECT_TRUE(eventually([&] { return object.delivered == kManyCalls + 50; }));
}

TEST(FlowTest, ClientThatVanishesUnderPressureIsNoticedAfterRelief) {
  ServiceUnderTest service;
  TestObject& object = *service.delegate.object;
  service.backpressure.raise();
  {
    RawClient busy(service.socketPath());
    std::string calls;
    for (int call = 0; call < 100; ++call) calls += withoutReply(busy.callWithText("echo", "a"));
    busy.authenticate(calls);
    ASSERT_TRUE(eventually([&] { return object.delivered >= kShortTurnRequests; }));
  }
  service.backpressure.relieve();

  EXPECT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));
  EXPECT_EQ(object.delivered, 100U);
}

}  // namespace
}  // namespace halvox::platform::linux_
