#include "platform/dispatch.h"

#include <stdexcept>

namespace halvox::platform {

void DispatchQueue::waitOn(std::shared_ptr<DispatchSemaphore> /*semaphore*/,
                           std::optional<std::chrono::nanoseconds> /*timeout*/,
                           std::function<void(WaitOutcome)> /*then*/) {
  throw std::logic_error("this queue cannot wait");
}

std::shared_ptr<DispatchSemaphore> DispatchService::createSemaphore(std::uint64_t /*signals*/) {
  throw std::logic_error("this dispatch service has no semaphores");
}

}  // namespace halvox::platform
