#include <array>
#include <filesystem>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include "platform/linux/connection/testing/AnotherUser.h"
#include "platform/linux/connection/testing/BusClient.h"
#include "platform/linux/connection/testing/RawClient.h"
#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

using testing::HasSubstr;

constexpr std::string_view kErrors = "org.freedesktop.DBus.Error.";

std::string standardError(std::string_view name) {
  return std::string(kErrors) + std::string(name);
}

// A call of the method "echo" with the text "hi", in big-endian order and built by hand.
std::string bigEndianEcho() {
  const auto number = [](std::uint32_t value) {
    return std::string{static_cast<char>(value >> 24), static_cast<char>(value >> 16),
                       static_cast<char>(value >> 8), static_cast<char>(value)};
  };
  const auto pad = [](std::string& bytes) { bytes.resize((bytes.size() + 7) & ~std::size_t{7}); };
  const auto field = [&](std::string& fields, char code, char type, const std::string& text) {
    pad(fields);
    fields += code;
    fields += '\1';
    fields += type;
    fields += '\0';
    fields += type == 'g' ? std::string(1, static_cast<char>(text.size()))
                          : number(static_cast<std::uint32_t>(text.size()));
    fields += text;
    fields += '\0';
  };
  std::string fields;
  field(fields, 1, 'o', kTestPath);
  field(fields, 2, 's', kTestInterface);
  field(fields, 3, 's', "echo");
  field(fields, 8, 'g', "s");
  const std::string body = number(2) + std::string("hi\0", 3);
  std::string message = std::string("B\1\0\1", 4) +
                        number(static_cast<std::uint32_t>(body.size())) + number(7) +
                        number(static_cast<std::uint32_t>(fields.size())) + fields;
  pad(message);
  return message + body;
}

std::ptrdiff_t openDescriptors() {
  return std::distance(std::filesystem::directory_iterator("/proc/self/fd"),
                       std::filesystem::directory_iterator());
}

// Sends the bytes together with a descriptor.
void sendWithDescriptor(int socket, std::string bytes, int descriptor) {
  iovec part{.iov_base = bytes.data(), .iov_len = bytes.size()};
  std::array<char, CMSG_SPACE(sizeof(int))> control{};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  cmsghdr* header = CMSG_FIRSTHDR(&message);
  header->cmsg_level = SOL_SOCKET;
  header->cmsg_type = SCM_RIGHTS;
  header->cmsg_len = CMSG_LEN(sizeof descriptor);
  std::copy_n(reinterpret_cast<const char*>(&descriptor), sizeof descriptor,
              reinterpret_cast<char*>(CMSG_DATA(header)));
  ASSERT_GT(sendmsg(socket, &message, MSG_NOSIGNAL), 0);
}

TEST(RefusalsTest, UnknownObjectIsNamed) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.callAt("/com/tarno/other", kTestInterface, "echo", {"a"});

  EXPECT_EQ(answer.errorName, standardError("UnknownObject"));
  EXPECT_THAT(answer.errorText, HasSubstr("/com/tarno/other"));
}

TEST(RefusalsTest, UnknownInterfaceIsNamed) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.callAt(kTestPath, "com.tarno.Other", "echo", {"a"});

  EXPECT_EQ(answer.errorName, standardError("UnknownInterface"));
  EXPECT_THAT(answer.errorText, HasSubstr("com.tarno.Other"));
}

TEST(RefusalsTest, UnknownMethodIsNamed) {
  const ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.call("nonesuch");

  EXPECT_EQ(answer.errorName, standardError("UnknownMethod"));
  EXPECT_THAT(answer.errorText, HasSubstr("nonesuch"));
}

TEST(RefusalsTest, WrongSignatureIsNamed) {
  ServiceUnderTest service;
  BusClient client(service.address());

  const BusAnswer answer = client.call("echo");

  EXPECT_EQ(answer.errorName, standardError("InvalidArgs"));
  EXPECT_THAT(answer.errorText, HasSubstr("echo"));
  EXPECT_EQ(service.delegate.object->delivered, 0U);
}

TEST(RefusalsTest, UnsupportedValueIsNamedWithItsKeyAndSignature) {
  ServiceUnderTest service;
  BusClient client(service.address());
  BusMessage call;
  sd_bus_message_new_method_call(client.get(), call.out(), nullptr, kTestPath, kTestInterface,
                                 "take");
  sd_bus_message_append(call.get(), "a{sv}uqaax", 1, "bad key", "(ii)", 1, 2, 1, 1, 0);
  sd_bus_error error = SD_BUS_ERROR_NULL;

  EXPECT_LT(sd_bus_call(client.get(), call.get(), 0, &error, nullptr), 0);

  EXPECT_EQ(error.name, standardError("InvalidArgs"));
  EXPECT_THAT(error.message, HasSubstr("bad key"));
  EXPECT_THAT(error.message, HasSubstr("(ii)"));
  EXPECT_EQ(service.delegate.object->delivered, 0U);
  sd_bus_error_free(&error);
}

TEST(RefusalsTest, WhatIsForTheOwnerIsDeliveredFromRootAndTheServicesUser) {
  ServiceUnderTest service;
  BusClient client(service.address());

  EXPECT_EQ(client.call("end").text, "true");
  EXPECT_EQ(service.delegate.object->delivered, 1U);
}

TEST(RefusalsTest, WhatIsForTheOwnerIsRefusedToOthersWhoMayDoAllElse) {
  if (!AnotherUser::isPossible()) GTEST_SKIP() << "needs the right to become another user";
  ServiceUnderTest service;
  std::filesystem::permissions(service.socketPath().parent_path(), std::filesystem::perms(0755));
  std::optional<BusClient> client;
  {
    const AnotherUser other;
    client.emplace(service.address());
  }

  const BusAnswer refused = client->call("end");

  EXPECT_EQ(refused.errorName, standardError("AccessDenied"));
  EXPECT_THAT(refused.errorText, HasSubstr("\"end\""));
  EXPECT_THAT(refused.errorText, HasSubstr("uid 65534"));
  EXPECT_EQ(service.delegate.object->delivered, 0U);
  EXPECT_EQ(service.count("requests refused: not allowed"), 1U);
  EXPECT_EQ(client->call("echo", "a").text, "a");
}

TEST(RefusalsTest, RefusalsOfOneKindAreLoggedOnceAConnectionAndCounted) {
  ServiceUnderTest service;
  {
    BusClient client(service.address());
    for (int call = 0; call < 5; ++call) client.call("nonesuch");
    client.call("echo");
  }
  ASSERT_TRUE(eventually([&] { return service.count("connections ended") == 1U; }));

  EXPECT_EQ(service.countLines(LogLevel::kDefault, "nonesuch"), 1U);
  EXPECT_EQ(service.countLines(LogLevel::kDefault, "refused 4 more requests"), 1U);
  EXPECT_EQ(service.count("requests refused: unknown method"), 5U);
  EXPECT_EQ(service.count("requests refused: wrong signature"), 1U);
}

TEST(RefusalsTest, BigEndianClientIsAnswered) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());

  client.authenticate(bigEndianEcho());

  const auto answer = client.receive();
  ASSERT_TRUE(answer.has_value());
  EXPECT_EQ(answer->replySerial, 7U);
  EXPECT_EQ(answer->values[0].string(), "hi");
}

TEST(RefusalsTest, BytesThatAreNoMessageCloseOnlyThatConnection) {
  ServiceUnderTest service;
  BusClient other(service.address());
  RawClient client(service.socketPath());

  client.authenticate("this is no message at all");

  EXPECT_TRUE(client.isClosedByService());
  EXPECT_TRUE(eventually([&] { return service.count("connections closed: malformed") == 1U; }));
  EXPECT_EQ(service.countLines(LogLevel::kError, "not a valid D-Bus message"), 1U);
  EXPECT_EQ(other.call("echo", "still here").text, "still here");
}

TEST(RefusalsTest, BrokenBodyClosesTheConnection) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  std::string call = client.callWithText("echo", "\x31\x32\x33");
  call[call.size() - 2] = '\xFF';  // not UTF-8

  client.authenticate(call);

  EXPECT_TRUE(client.isClosedByService());
  EXPECT_EQ(service.delegate.object->delivered, 0U);
}

TEST(RefusalsTest, TooLargeMessageIsAnsweredAndSkipped) {
  ServiceUnderTest service([](ConnectionOptions& options) { options.maxFrameBytes = 1 * kMiB; });
  RawClient client(service.socketPath());
  client.authenticate(client.callWithText("echo", std::string(3 * kMiB, 'a')));
  client.send(client.callWithText("echo", "b"));

  EXPECT_EQ(client.receive()->errorName, standardError("LimitsExceeded"));
  EXPECT_EQ(client.receive()->values[0].string(), "b");
  EXPECT_EQ(service.count("requests refused: message too large"), 1U);
}

TEST(RefusalsTest, LargeMessageWithinTheLimitIsTaken) {
  const ServiceUnderTest service;
  RawClient client(service.socketPath());
  const std::string text(5 * kMiB, 'a');
  client.authenticate(client.callWithText("echo", text));
  client.send(client.callWithText("echo", "b"));

  EXPECT_EQ(client.receive()->values[0].string(), text);
  EXPECT_EQ(client.receive()->values[0].string(), "b");
}

TEST(RefusalsTest, DescriptorsThatComeWithAMessageAreClosed) {
  ServiceUnderTest service;
  RawClient client(service.socketPath());
  client.authenticate();
  client.send(client.callWithText("echo", "a"));
  ASSERT_TRUE(client.receive().has_value());
  const std::ptrdiff_t before = openDescriptors();

  for (int call = 0; call < 20; ++call) {
    sendWithDescriptor(client.fd(), client.callWithText("echo", "b"), client.fd());
    ASSERT_TRUE(client.receive().has_value());
  }

  EXPECT_EQ(openDescriptors(), before);
}

TEST(RefusalsTest, RequestsThatMayHoldMoreAreRefusedPastTheHistoryLimit) {
  ServiceUnderTest service([](ConnectionOptions& options) { options.clientHistoryMegabytes = 3; });
  BusClient client(service.address());
  service.delegate.object->heldBytes = 3 * kMiB;

  const BusAnswer refused = client.call("grow");

  EXPECT_EQ(refused.errorName, standardError("LimitsExceeded"));
  EXPECT_THAT(refused.errorText, HasSubstr("client_history_megabytes = 3"));
  EXPECT_EQ(client.call("echo", "a").text, "a");
  service.delegate.object->heldBytes = 3 * kMiB - 1;
  EXPECT_EQ(client.call("grow").text, "true");
}

TEST(RefusalsTest, OnlyRequestsThatMakeSessionsAreRefusedPastTheSessionLimit) {
  ServiceUnderTest service([](ConnectionOptions& options) { options.clientSessions = 2; });
  RawClient client(service.socketPath());
  service.delegate.object->sessions = 2;
  const std::array argument = {Value(std::int64_t{1})};

  client.authenticate(client.call("create", "x", argument) + client.call("grow"));

  const auto refused = client.receive();
  EXPECT_EQ(refused->errorName, standardError("LimitsExceeded"));
  EXPECT_THAT(std::string(refused->values[0].string()), HasSubstr("client_sessions = 2"));
  EXPECT_TRUE(client.receive()->values[0].toBool());
}

TEST(RefusalsTest, RequestThatNamesMoreReportersThanTheLimitIsRefusedAndCounted) {
  ServiceUnderTest service([](ConnectionOptions& options) { options.messageReporterIDs = 2; });
  RawClient client(service.socketPath());
  const std::array two = {Value(Array{1, 2})};
  const std::array three = {Value(Array{1, 2, 3})};

  client.authenticate(client.call("name", "ax", three) + client.call("name", "ax", two));

  const auto refused = client.receive();
  EXPECT_EQ(refused->errorName, standardError("LimitsExceeded"));
  EXPECT_THAT(std::string(refused->values[0].string()),
              HasSubstr("message_reporter_ids = 2 is exceeded: the message names 3"));
  EXPECT_TRUE(client.receive()->values[0].toBool());
}

}  // namespace
}  // namespace halvox::platform::linux_
