#include "platform/linux/tracing/QueueOnDemand.h"

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox::platform::linux_ {
namespace {

class QueueOnDemandTest : public ::testing::Test {
 protected:
  FakePlatform platform;
  QueueOnDemand queue{{"Trace Reading", QualityOfService::kUtility, QueueThreading::kShared}};
};

TEST_F(QueueOnDemandTest, IsMadeOnce) {
  const auto first = queue.get();

  ASSERT_NE(first, nullptr);
  EXPECT_EQ(queue.get(), first);
}

TEST_F(QueueOnDemandTest, IsHeldUntilItIsReleased) {
  const std::weak_ptr<DispatchQueue> made = queue.get();
  EXPECT_FALSE(made.expired());

  queue.release();

  EXPECT_TRUE(made.expired());
}

}  // namespace
}  // namespace halvox::platform::linux_
