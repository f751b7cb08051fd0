#include "platform/linux/runtime/LibcClockService.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <optional>
#include <string_view>

#include <unistd.h>

#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

std::chrono::nanoseconds read(clockid_t clock) {
  timespec time{};
  ::clock_gettime(clock, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

// The start time in the text of /proc/self/stat, in clock ticks after the start of the system.
std::optional<std::int64_t> startTicks(std::string_view stat) {
  // The command name may contain spaces and parentheses, so the fields are counted from its end.
  constexpr int kFieldsAfterName = 20;  // the start time is field 22
  const std::size_t end = stat.rfind(')');
  if (end == std::string_view::npos) return std::nullopt;
  std::string_view rest = stat.substr(end + 1);
  for (int field = 0; field < kFieldsAfterName; ++field) {
    const std::size_t blank = rest.find(' ');
    if (blank == std::string_view::npos) return std::nullopt;
    rest.remove_prefix(blank + 1);
  }
  std::int64_t ticks = 0;
  const auto result = std::from_chars(rest.data(), rest.data() + rest.size(), ticks);
  if (result.ec != std::errc{}) return std::nullopt;
  return ticks;
}

std::chrono::nanoseconds ownStart() {
  // The kernel counts the start of a process by this clock, which includes the time that the
  // machine was suspended.
  const std::chrono::nanoseconds now = read(CLOCK_BOOTTIME);
  const FileContent stat =
      readWholeFile({.path = "/proc/self/stat", .most = 1024, .excess = FileToRead::Excess::kCut});
  const std::int64_t ticksPerSecond = ::sysconf(_SC_CLK_TCK);
  if (stat.bytes.empty() || ticksPerSecond <= 0) return now;
  const auto ticks = startTicks(stat.bytes);
  if (!ticks.has_value()) return now;
  const std::chrono::nanoseconds tick =
      std::chrono::nanoseconds(std::chrono::seconds(1)) / ticksPerSecond;
  return std::min(now, *ticks * tick);
}

}  // namespace

LibcClockService::LibcClockService() : processStart_(ownStart()) {}

Date LibcClockService::currentDate() const {
  return {std::chrono::duration<double>(read(CLOCK_REALTIME)).count()};
}

LocalTime LibcClockService::localTime(Date date) const {
  constexpr double kFarthest = 1e15;  // some 31 million years, which time_t and tm can represent
  // Negated, so that NaN is refused too.
  if (!(std::abs(date.secondsSince1970) <= kFarthest)) return {};
  // Rounded down and not towards zero, which would differ before 1970.
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
