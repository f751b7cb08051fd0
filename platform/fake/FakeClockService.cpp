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

std::chrono::duration<double> FakeClockService::systemUptime() const {
  const std::lock_guard lock(mutex_);
  return systemUptime_;
}

std::chrono::milliseconds FakeClockService::processUptime() const {
  const std::lock_guard lock(mutex_);
  return std::chrono::duration_cast<std::chrono::milliseconds>(processUptime_);
}

}  // namespace halvox::platform
