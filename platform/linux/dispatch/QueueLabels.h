#pragma once

#include <atomic>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What the shared queues of one label have in common, for whoever looks for a queue that is stuck:
// how many jobs were added to them and were run, and how many of them are at work right now.
struct QueueLabel {
  QueueLabel(Counter& addedJobs, Counter& ranJobs) : added(addedJobs), run(ranJobs) {}

  std::string_view text{};  // owned by the labels
  Counter& added;
  Counter& run;
  std::atomic<int> atWork{0};  // orders with nothing: it is only looked at
};

// The labels of the shared queues. There is one for each text, and texts are constants of the
// code, so they are few. Owns the labels; any thread may call. `statistics` must outlive it.
class QueueLabels {
 public:
  explicit QueueLabels(StatisticsService& statistics) : statistics_(statistics) {}

  // The label of that text, made at the first call; lives as long as this.
  QueueLabel& label(std::string_view text) HALVOX_EXCLUDES(mutex_);
  // The texts of those whose queues are at work.
  [[nodiscard]] std::vector<std::string> atWork() HALVOX_EXCLUDES(mutex_);

 private:
  StatisticsService& statistics_;
  Mutex mutex_;
  std::map<std::string, QueueLabel, std::less<>> labels_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
