#include "session/LinkDiscovery.h"

#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::Array;
using testing::ElementsAre;
using testing::IsEmpty;

class LinkDiscoveryTest : public testing::Test {
 protected:
  platform::FakePlatform platform_;
  std::vector<LinkDiscovery::Backends> reported_;
  LinkDiscovery discovery_{[this](const auto& backends) { reported_.push_back(backends); }};
};

TEST_F(LinkDiscoveryTest, AnswerThatIsAwaitedIsReportedAtOnce) {
  discovery_.awaitAnswer();
  EXPECT_THAT(reported_, IsEmpty());

  discovery_.answer(Array{"server"});

  EXPECT_THAT(reported_, ElementsAre(Array{"server"}));
  EXPECT_THAT(platform_.dispatch.createdQueues(), IsEmpty());
}

TEST_F(LinkDiscoveryTest, EarlyAnswerIsReportedByAQueueOfItsOwn) {
  discovery_.answer(Array{"server"});
  discovery_.awaitAnswer();
  EXPECT_THAT(reported_, IsEmpty());

  platform_.dispatch.runUntilIdle();

  EXPECT_THAT(reported_, ElementsAre(Array{"server"}));
  ASSERT_EQ(platform_.dispatch.createdQueues().size(), 1U);
  EXPECT_EQ(platform_.dispatch.createdQueues()[0].label, "com.tarno.halvox.session.discovery");
}

TEST_F(LinkDiscoveryTest, AnswerWithoutAWaitIsNotReported) {
  discovery_.answer(std::nullopt);
  platform_.dispatch.runUntilIdle();

  EXPECT_THAT(reported_, IsEmpty());
}

}  // namespace
}  // namespace halvox
