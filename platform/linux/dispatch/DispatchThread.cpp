#include "platform/linux/dispatch/DispatchThread.h"

#include <cstddef>

#include "platform/linux/dispatch/OwnThreadQueue.h"
#include "platform/linux/dispatch/SharedQueue.h"

namespace halvox::platform::linux_ {
namespace {

// How many jobs one endHelping() runs before it leaves the others to the queues' own threads. These
// jobs can add jobs, and without a bound the I/O thread might never read a socket again. The bound
// is far above the number of requests that one turn of the loop delivers for a few clients, 64 for
// each.
constexpr std::size_t kHelpedJobsLimit = 1000;

}  // namespace

DispatchThread& DispatchThread::current() {
  static thread_local DispatchThread thread;
  return thread;
}

DispatchThread::~DispatchThread() {
  // End helping first, because the jobs that it runs may note turns.
  endHelping();
  wakePool();
}

void DispatchThread::endHelping() {
  std::size_t left = kHelpedJobsLimit;
  // Use an index, because the jobs can note further queues, which moves the elements.
  for (std::size_t index = 0; index < queuesToHelp_.size(); ++index) {
    const std::shared_ptr<OwnThreadQueue> queue = std::move(queuesToHelp_[index]);
    left -= queue->help(*this, left);
  }
  queuesToHelp_.clear();
  // Set this to false only after the loop. If a job in the loop adds a brief job to another queue,
  // the loop then helps that queue, too.
  isHelping_ = false;
}

void DispatchThread::wakePool() {
  isHoldingPool_ = false;
  for (const std::shared_ptr<SharedQueue>& queue : turns_) queue->beginTurn();
  turns_.clear();
}

}  // namespace halvox::platform::linux_
