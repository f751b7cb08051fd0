#include "platform/fake/FakeClockService.h"

namespace halvox::platform {

void FakeClockService::setCurrentDate(Date date) {
  const std::lock_guard lock(mutex_);
  date_ = date;
}

void FakeClockService::setSystemUptime(std::chrono::duration<double> uptime) {
  const std::lock_guard lock(mutex_);
  systemUptime_ = uptime;
}

void FakeClockService::setProcessUptime(std::chrono::milliseconds uptime) {
  const std::lock_guard lock(mutex_);
  processUptime_ = uptime;
}

void FakeClockService::setOffsetFromUTC(std::chrono::minutes offset) {
  const std::lock_guard lock(mutex_);
  offsetFromUTC_ = offset;
}

void FakeClockService::advance(std::chrono::nanoseconds by) {
  const std::lock_guard lock(mutex_);
  const std::chrono::duration<double> seconds = by;
  date_.secondsSince1970 += seconds.count();
  systemUptime_ += seconds;
  processUptime_ += by;
}

Date FakeClockService::currentDate() const {
  const std::lock_guard lock(mutex_);
  return date_;
}

LocalTime FakeClockService::localTime(Date date) const {
  using namespace std::chrono;
  const std::lock_guard lock(mutex_);
  const sys_seconds time{seconds(static_cast<std::int64_t>(date.secondsSince1970)) +
                         offsetFromUTC_};
  const auto day = floor<days>(time);
  const year_month_day calendar{day};
  const hh_mm_ss clock{time - day};
  return {.year = static_cast<int>(calendar.year()),
          .month = static_cast<int>(static_cast<unsigned>(calendar.month())),
          .day = static_cast<int>(static_cast<unsigned>(calendar.day())),
          .hour = static_cast<int>(clock.hours().count()),
          .minute = static_cast<int>(clock.minutes().count()),
          .second = static_cast<int>(clock.seconds().count()),
          .offsetFromUTC = offsetFromUTC_};
}

std::chrono::duration<double> FakeClockService::systemUptime() const {
  const std::lock_guard lock(mutex_);
  return systemUptime_;
}

std::chrono::milliseconds FakeClockService::processUptime() const {
  const std::lock_guard lock(mutex_);
  return std::chrono::duration_cast<std::chrono::milliseconds>(processUptime_);
}

}  // namespace halvox::platform
