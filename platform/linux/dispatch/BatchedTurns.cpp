#include "platform/linux/dispatch/BatchedTurns.h"

#include "platform/linux/dispatch/SharedQueue.h"

namespace halvox::platform::linux_ {

BatchedTurns& BatchedTurns::current() {
  static thread_local BatchedTurns turns;
  return turns;
}

void BatchedTurns::end() {
  isActive_ = false;
  for (const std::shared_ptr<SharedQueue>& queue : queues_) queue->beginTurn();
  queues_.clear();
}

}  // namespace halvox::platform::linux_
