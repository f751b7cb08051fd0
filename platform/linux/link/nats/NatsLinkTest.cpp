#include "platform/linux/link/nats/NatsLink.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pthread.h>

#include "platform/fake/FakePlatform.h"

namespace halvox::platform::linux_ {
namespace {

// While it lives, new threads are to have stacks larger than any address space.
class NoThreadsToHave {
 public:
  NoThreadsToHave() {
    pthread_getattr_default_np(&usual_);
    pthread_attr_t huge;
    pthread_attr_init(&huge);
    pthread_attr_setstacksize(&huge, std::size_t{1} << 50U);
    pthread_setattr_default_np(&huge);
    pthread_attr_destroy(&huge);
  }
  NoThreadsToHave(const NoThreadsToHave&) = delete;
  NoThreadsToHave& operator=(const NoThreadsToHave&) = delete;
  ~NoThreadsToHave() {
    pthread_setattr_default_np(&usual_);
    pthread_attr_destroy(&usual_);
  }

 private:
  pthread_attr_t usual_{};
};

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
    error = link->send(OutgoingMessage());
  }
  const bool isEnded = link->close();

  EXPECT_EQ(answers, 1);
  EXPECT_FALSE(servers.has_value());
  ASSERT_TRUE(error.has_value());
  EXPECT_THAT(error->description, testing::HasSubstr("no thread for the link"));
  EXPECT_TRUE(isEnded);
}

}  // namespace
}  // namespace halvox::platform::linux_
