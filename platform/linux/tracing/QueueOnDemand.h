#pragma once

#include <memory>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// A serial queue that is made when it is first needed, because most runs of the service record no
// trace, and need neither its queue nor its thread. Threads: any may call; nothing blocks. Owner:
// the service that works on the queue.
class QueueOnDemand {
 public:
  struct Options {
    const char* label;
    QualityOfService quality;
    QueueThreading threading;
  };
  explicit QueueOnDemand(const Options& options) : options_(options) {}

  // Returns the queue; the first call, and the first one after release(), makes it.
  [[nodiscard]] std::shared_ptr<DispatchQueue> get() HALVOX_EXCLUDES(mutex_);
  // Releases the queue. Call it after the queues have ended.
  void release() HALVOX_EXCLUDES(mutex_);

 private:
  const Options options_;
  Mutex mutex_;
  std::shared_ptr<DispatchQueue> queue_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
