#include <string>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/testing/NoThreadsToHave.h"

namespace halvox::platform::linux_ {
namespace {

// The service has an encoder for each thread, which remembers the last payload. The summary of a
// long session has many megabytes.
TEST(NatsTlmReportingServiceTest, LongMessageIsReleasedAfterItWasSent) {
  FakePlatform platform;
  const auto link = makeNatsTlmReporting(Configuration::Link{},
                                         NatsEnvironment{platform.dispatch, platform.statistics});
  const auto session = link->TLMReportingCreateSession({}, {});
  Dictionary payload{{"text", std::string(300'000, 'x')}};
  {
    const NoThreadsToHave none;
    EXPECT_FALSE(
        link->TLMReportingSendMessage(session, {.category = 1, .type = 1, .payload = payload})
            .sent);
  }

  // If another object shared the entries, changing one would copy them first.
  const Dictionary::Entry* const before = payload.begin();
  payload.setAt(0, 1);

  EXPECT_EQ(payload.begin(), before);
}

}  // namespace
}  // namespace halvox::platform::linux_
