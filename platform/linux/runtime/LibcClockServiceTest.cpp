#include "platform/linux/runtime/LibcClockService.h"

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <fstream>
#include <string>

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

TEST(LibcClockServiceTest, LocalTimeFollowsTheTimeZone) {
  const char* before = std::getenv("TZ");
  const std::string saved = before == nullptr ? "" : before;
  ::setenv("TZ", "TEST-5:30", 1);  // five and a half hours east of Greenwich
  ::tzset();

  const LocalTime local = LibcClockService().localTime({1'700'000'000});

  if (before == nullptr) {
    ::unsetenv("TZ");
  } else {
    ::setenv("TZ", saved.c_str(), 1);
  }
  ::tzset();
  const LocalTime expected{.year = 2023,
                           .month = 11,
                           .day = 15,
                           .hour = 3,
                           .minute = 43,
                           .second = 20,
                           .offsetFromUTC = std::chrono::minutes(330)};
  EXPECT_EQ(local, expected);
}

TEST(LibcClockServiceTest, ADateBeyondTheCalendarIs1970) {
  EXPECT_EQ(LibcClockService().localTime({1e300}), LocalTime());
  EXPECT_EQ(LibcClockService().localTime({std::nan("")}), LocalTime());
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
