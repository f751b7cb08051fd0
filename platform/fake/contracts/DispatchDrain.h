#pragma once

#include <atomic>
#include <memory>

#include "platform/dispatch.h"

namespace halvox::platform::contract {

// Lets jobs run until every job that was added to the queue before this call has run. Returns false
// if that never happens. `Harness` is that of DispatchContract.
template <typename Harness>
[[nodiscard]] bool drainBy(Harness& harness, DispatchQueue& queue) {
  const auto done = std::make_shared<std::atomic<bool>>(false);
  queue.async(JobWeight::kBrief, [done] { *done = true; });
  return harness.letRunUntil([&done] { return done->load(); });
}

}  // namespace halvox::platform::contract
