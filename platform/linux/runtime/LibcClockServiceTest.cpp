#include "platform/linux/runtime/LibcClockService.h"

#include <chrono>
#include <fstream>

#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

TEST(LibcClockServiceTest, DateIsThatOfTheSystemClock) {
  const auto before = std::chrono::system_clock::now().time_since_epoch();
  const double date = LibcClockService().currentDate().secondsSince1970;
  const auto after = std::chrono::system_clock::now().time_since_epoch();

  EXPECT_GE(date, std::chrono::duration<double>(before).count() - 0.001);
  EXPECT_LE(date, std::chrono::duration<double>(after).count() + 0.001);
}

TEST(LibcClockServiceTest, SystemUptimeIsThatOfTheKernel) {
  double kernel = 0;
  std::ifstream("/proc/uptime") >> kernel;

  EXPECT_NEAR(LibcClockService().systemUptime().count(), kernel, 1.0);
}

TEST(LibcClockServiceTest, ProcessUptimeCountsFromTheStartOfTheProcess) {
  const LibcClockService first;
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(50);
  while (std::chrono::steady_clock::now() < deadline) continue;

  const LibcClockService second;

  EXPECT_GE(second.processUptime(), std::chrono::milliseconds(50));
  EXPECT_NEAR(static_cast<double>(second.processUptime().count()),
              static_cast<double>(first.processUptime().count()), 20);
}

}  // namespace
}  // namespace halvox::platform::linux_
