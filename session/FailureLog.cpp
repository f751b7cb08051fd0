#include "session/FailureLog.h"

#include <utility>

#include "platform/clock.h"
#include "platform/services.h"

namespace halvox {
namespace {

constexpr std::chrono::seconds kPause{1};

}  // namespace

std::optional<std::string> FailureLog::note() {
  const std::chrono::milliseconds now = platform::clock().processUptime();
  const auto state = state_.lock();
  if (state->last.has_value() && now - *state->last < kPause) {
    ++state->unlogged;
    return std::nullopt;
  }
  state->last = now;
  const std::uint64_t unlogged = std::exchange(state->unlogged, 0);
  if (unlogged == 0) return std::string();
  return " (" + std::to_string(unlogged) + " more since the previous line)";
}

}  // namespace halvox
