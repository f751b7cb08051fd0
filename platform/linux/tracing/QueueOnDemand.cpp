#include "platform/linux/tracing/QueueOnDemand.h"

#include "platform/services.h"

namespace halvox::platform::linux_ {

std::shared_ptr<DispatchQueue> QueueOnDemand::get() {
  const MutexLock lock(mutex_);
  if (queue_ == nullptr) {
    queue_ = platform::dispatch().createSerialQueue(options_.label, options_.quality,
                                                    options_.threading);
  }
  return queue_;
}

void QueueOnDemand::release() {
  const MutexLock lock(mutex_);
  queue_.reset();
}

}  // namespace halvox::platform::linux_
