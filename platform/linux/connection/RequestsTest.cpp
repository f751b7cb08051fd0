#include <array>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

TEST(RequestsTest, BusClientIsAnswered) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.call("echo", "hello").text, "hello");
}

TEST(RequestsTest, PeerThatSaysNoHelloIsAnswered) {
  const ServiceUnderTest service;
  BusClient client(service.address(), BusClient::Kind::kPeer);

  EXPECT_EQ(client.call("echo", "hello").text, "hello");
}

TEST(RequestsTest, InterfaceIsOptional) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.callAt(kTestPath, "", "echo", {"hello"}).text, "hello");
}

TEST(RequestsTest, ReplyOfAnotherThreadArrives) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.call("away", "hello").text, "hello");
}

TEST(RequestsTest, ErrorOfServiceIsNamedAfterDomainAndCode) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.call("fail");

  EXPECT_EQ(answer.errorName, "com.tarno.audio.reporting.Code1");
  EXPECT_EQ(answer.errorText, "disabled");
}

TEST(RequestsTest, MethodWithoutResultAnswersEmpty) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());
  const std::array arguments = {Value(Dictionary{}), Value(1U), Value(std::uint16_t{1}),
                                Value(Array{})};

  client.authenticate(client.call("take", "a{sv}uqaax", arguments));

  const auto answer = client.receive();
  ASSERT_TRUE(answer.has_value());
  EXPECT_EQ(answer->type, dbus::MessageType::kMethodReturn);
  EXPECT_TRUE(answer->values.empty());
}

TEST(RequestsTest, ConnectionAndRequestAreCurrentWhileDelivered) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.call("pid").text, std::to_string(getpid()));
}

TEST(RequestsTest, SecondReplyIsDroppedAndLoggedAtDebugLevel) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate(client.callWithText("twice", "a"));
  client.send(client.callWithText("echo", "b"));

  EXPECT_EQ(client.receive()->values[0].string(), "a");
  EXPECT_EQ(client.receive()->values[0].string(), "b");

  EXPECT_EQ(service.count("replies dropped: second"), 1U);
  EXPECT_EQ(service.countLines(LogLevel::kDebug, "dropped a second reply"), 1U);
}

TEST(RequestsTest, NoReplyIsSentWhenNoneIsExpected) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate(withoutReply(client.callWithText("echo", "a")));
  client.send(withoutReply(client.call("fail")));
  client.send(withoutReply(client.call("nonesuch")));
  client.send(client.callWithText("echo", "b"));

  EXPECT_EQ(client.receive()->values[0].string(), "b");
  EXPECT_EQ(service.delegate.object->delivered, 3U);
}

TEST(RequestsTest, RepliesComeInTheOrderOfRequests) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  std::string calls;
  constexpr std::uint32_t kCalls = 500;
  for (std::uint32_t call = 0; call < kCalls; ++call) calls += client.callWithText("echo", "a");

  client.send(calls);

  for (std::uint32_t call = 1; call <= kCalls; ++call) {
    ASSERT_EQ(client.receive()->replySerial, call);
  }
}

TEST(RequestsTest, RequestsWhoseRepliesAreHeldBackDoNotCountAsOpen) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  const std::array argument = {Value(std::int64_t{1})};
  constexpr std::uint32_t kCalls = 3000;
  for (std::uint32_t call = 0; call < kCalls; ++call)
    client.send(client.call("hold", "x", argument));
  client.send(client.callWithText("echo", "a"));

  EXPECT_EQ(client.receive()->values[0].string(), "a");
  service.delegate.object->answerHeld();

  for (std::uint32_t call = 1; call <= kCalls; ++call) {
    ASSERT_EQ(client.receive()->replySerial, call);
  }
}

TEST(RequestsTest, RepliesToAClientThatHasDisconnectedAreDropped) {
  ServiceUnderTest service;
  const std::array argument = {Value(std::int64_t{1})};
  {
    RawClient client(service.socketPath());
    client.authenticate(client.call("hold", "x", argument));
    ASSERT_TRUE(eventually([&] { return service.delegate.object->delivered == 1U; }));
  }
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));

  service.delegate.object->answerHeld();

  EXPECT_TRUE(eventually([&] { return service.count("replies dropped: client gone") == 1U; }));
}

TEST(RequestsTest, RepliesAreCountedByWhatBecameOfThem) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate(client.callWithText("twice", "a") + client.call("fail") +
                      client.call("nonesuch") + client.callWithText("echo", "b"));
  for (int answer = 0; answer < 4; ++answer) ASSERT_TRUE(client.receive().has_value());
  service.stop();

  EXPECT_EQ(service.count("requests received"), 4U);
  EXPECT_EQ(service.count("requests delivered"), 3U);
  EXPECT_EQ(service.count("requests refused: unknown method"), 1U);
  EXPECT_EQ(service.count("replies given"), 5U);
  EXPECT_EQ(service.count("replies sent"), 4U);
}

}  // namespace
}  // namespace halvox::platform::linux_
