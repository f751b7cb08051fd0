#include "platform/linux/link/local/NoneTlmReportingService.h"

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox::platform::linux_ {
namespace {

struct NoneTlmReportingServiceTest : ::testing::Test {
  FakePlatform platform;
  CallbackThread callbacks{platform.dispatch};
  NoneTlmReportingService service{platform.statistics, callbacks};
};

TEST_F(NoneTlmReportingServiceTest, FindsNoBackend) {
  int calls = 0;
  std::optional<Array> found = Array{"something"};

  service.TLMReportingStartConfiguration(service.TLMReportingCreateSession({}, {}),
                                         [&](const std::optional<Array>& backends) {
                                           ++calls;
                                           found = backends;
                                         });
  callbacks.stop();  // waits for the answer

  EXPECT_EQ(calls, 1);
  EXPECT_FALSE(found.has_value());
}

TEST_F(NoneTlmReportingServiceTest, RefusesAndCountsWhatIsSent) {
  const auto session = service.TLMReportingCreateSession({}, {});

  const auto first = service.TLMReportingSendMessage(session, {1, 2, {}});
  const auto second = service.TLMReportingSendOneMessage({}, {}, {1, 2, {}});

  EXPECT_FALSE(first.sent);
  EXPECT_TRUE(first.error.has_value());
  EXPECT_FALSE(second.sent);
  EXPECT_EQ(platform.statistics.value("link none", "received"), 2U);
  EXPECT_EQ(platform.statistics.value("link none", "dropped: no back-end"), 2U);
}

TEST_F(NoneTlmReportingServiceTest, FlushIsDoneOnce) {
  int flushes = 0;
  service.TLMReportingFlushMessages(service.TLMReportingCreateSession({}, {}), [&] { ++flushes; });
  EXPECT_EQ(flushes, 1);
}

}  // namespace
}  // namespace halvox::platform::linux_
