#include "platform/linux/LinuxPlatform.h"

#include <string_view>

#include <gtest/gtest.h>

#include "platform/counter_kinds.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/testing/ScratchDirectory.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {
namespace {

// Losses are recorded and shown by the kinds of their counters. A counter without a kind is never
// recorded as a loss.
TEST(LinuxPlatformTest, EveryCounterOfTheAdaptersHasAKind) {
  const ScratchDirectory scratch;
  Configuration configuration;
  configuration.storage.directory = scratch.path();
  configuration.listener.socket = scratch.path() / "socket";
  LinuxPlatform adapters(configuration);

  int counters = 0;
  adapters.services().statistics.forEachCounter(
      [&](std::string_view piece, std::string_view name, std::uint64_t) {
        ++counters;
        EXPECT_TRUE(counterKind(name).has_value())
            << piece << ", " << name << ": add the name to platform/counter_kinds.cpp";
      });
  EXPECT_GT(counters, 50);
}

}  // namespace
}  // namespace halvox::platform::linux_
