#pragma once

#include <atomic>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What the shared queues with one label have in common. It helps to find a stuck queue, whose label
// counts more jobs added than run.
struct QueueLabel {
  QueueLabel(Counter& addedJobs, Counter& ranJobs) : added(addedJobs), run(ranJobs) {}

  std::string_view text{};  // owned by the QueueLabels
  Counter& added;
  Counter& run;
  // How many of the queues have a turn. Relaxed: it is only read to name stuck queues.
  std::atomic<int> atWork{0};
};

// The labels of the shared queues, one for each text. Labels are never removed: their texts are
// constants of the code, which all sessions share. Owns the labels; belongs to the pool. Any thread
// may use it.
class QueueLabels {
 public:
  // `statistics` must outlive this.
  explicit QueueLabels(StatisticsService& statistics) : statistics_(statistics) {}

  // Returns the label with that text. Makes it at the first call. Valid as long as this object
  // exists.
  QueueLabel& label(std::string_view text) HALVOX_EXCLUDES(mutex_);
  // Returns the texts of the labels that have a queue with a turn.
  [[nodiscard]] std::vector<std::string> atWork() HALVOX_EXCLUDES(mutex_);

 private:
  StatisticsService& statistics_;
  Mutex mutex_;
  std::map<std::string, QueueLabel, std::less<>> labels_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
