#include "platform/linux/runtime/LibcClockService.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <ctime>

#include <unistd.h>

#include "platform/linux/base/ProcessStat.h"

namespace halvox::platform::linux_ {
namespace {

std::chrono::nanoseconds read(clockid_t clock) {
  timespec time{};
  ::clock_gettime(clock, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

std::chrono::nanoseconds ownStart() {
  // The kernel counts the start of a process by this clock, which includes the time that the
  // machine was suspended.
  const std::chrono::nanoseconds now = read(CLOCK_BOOTTIME);
  const auto stat = readOwnProcessStat();
  const std::int64_t ticksPerSecond = ::sysconf(_SC_CLK_TCK);
  if (!stat.has_value() || ticksPerSecond <= 0) return now;
  const std::chrono::nanoseconds tick =
      std::chrono::nanoseconds(std::chrono::seconds(1)) / ticksPerSecond;
  return std::min(now, static_cast<std::int64_t>(stat->startTicks) * tick);
}

}  // namespace

LibcClockService::LibcClockService() : processStart_(ownStart()) {}

Date LibcClockService::currentDate() const {
  return {std::chrono::duration<double>(read(CLOCK_REALTIME)).count()};
}

LocalTime LibcClockService::localTime(Date date) const {
  constexpr double kFarthest = 1e15;  // about 31 million years, which time_t and tm can represent
  // The condition is negated so that NaN is refused, too.
  if (!(std::abs(date.secondsSince1970) <= kFarthest)) return {};
  // Round down and not towards zero, because the two differ for dates before 1970.
  const auto time = static_cast<std::time_t>(std::floor(date.secondsSince1970));
  std::tm local{};
  if (::localtime_r(&time, &local) == nullptr) return {};
  return {.year = local.tm_year + 1900,
          .month = local.tm_mon + 1,
          .day = local.tm_mday,
          .hour = local.tm_hour,
          .minute = local.tm_min,
          .second = local.tm_sec,
          .offsetFromUTC = std::chrono::minutes(local.tm_gmtoff / 60)};
}

std::chrono::duration<double> LibcClockService::systemUptime() const {
  return read(CLOCK_BOOTTIME);
}

std::chrono::milliseconds LibcClockService::processUptime() const {
  return std::chrono::duration_cast<std::chrono::milliseconds>(read(CLOCK_BOOTTIME) -
                                                               processStart_);
}

}  // namespace halvox::platform::linux_
