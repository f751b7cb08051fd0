#include "platform/linux/link/nats/NatsLink.h"

#include <chrono>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/testing/NoThreadsToHave.h"

namespace halvox::platform::linux_ {
namespace {

TEST(NatsLinkTest, WithoutAThreadThereAreNoServersAndMessagesAreRefused) {
  FakePlatform platform;
  const auto link = std::make_shared<NatsLink>(
      Configuration::Link{}, NatsEnvironment{platform.dispatch, platform.statistics});
  int answers = 0;
  std::optional<Array> servers = Array{"not asked"};
  std::optional<Error> error;

  {
    const NoThreadsToHave none;
    link->discover([&](const std::optional<Array>& found) {
      ++answers;
      servers = found;
    });
    EXPECT_EQ(answers, 0) << "answered from inside the call";
    error = link->send(OutgoingMessage());
  }
  platform.dispatch.advance(std::chrono::nanoseconds(0));
  const bool isEnded = link->close();

  EXPECT_EQ(answers, 1);
  EXPECT_FALSE(servers.has_value());
  ASSERT_TRUE(error.has_value());
  EXPECT_THAT(error->description, testing::HasSubstr("cannot start the thread of the NATS link"));
  EXPECT_TRUE(isEnded);
}

}  // namespace
}  // namespace halvox::platform::linux_
