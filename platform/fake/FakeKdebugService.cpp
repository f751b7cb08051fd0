#include "platform/fake/FakeKdebugService.h"

#include <cstdio>

namespace halvox::platform {

std::vector<FakeKdebugService::Point> FakeKdebugService::points() const {
  const std::lock_guard lock(mutex_);
  return points_;
}

std::vector<std::uint32_t> FakeKdebugService::codes() const {
  std::vector<std::uint32_t> result;
  for (const Point& point : points()) result.push_back(point.code);
  return result;
}

void FakeKdebugService::clear() {
  const std::lock_guard lock(mutex_);
  points_.clear();
}

void FakeKdebugService::kdebug_trace(std::uint32_t code, std::uint64_t argument1,
                                     std::uint64_t argument2, std::uint64_t argument3,
                                     std::uint64_t argument4) {
  std::array<char, 16> text;
  std::snprintf(text.data(), text.size(), "0x%08X", code);
  journal_.record(JournalKind::kTracePoint, text.data());
  const std::lock_guard lock(mutex_);
  points_.push_back({code, {argument1, argument2, argument3, argument4}});
}

}  // namespace halvox::platform
