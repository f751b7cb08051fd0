#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The data that the shared queues with one label share. It helps to find a stuck queue, whose label
// has more jobs added than run.
struct QueueLabel {
  QueueLabel(Counter& addedJobs, Counter& ranJobs) : added(addedJobs), run(ranJobs) {}

  std::string_view text{};  // owned by the QueueLabels
  Counter& added;
  Counter& run;
  // How many of the queues have a turn now. Relaxed, because it is read only to name stuck queues.
  std::atomic<int> atWork{0};
};

// The labels of the shared queues, one for each text. Labels are never removed. They stay few,
// because their texts are constants of the code, and the queues of all sessions share them. Owns
// the labels. Owned by the pool. Any thread may use it.
class QueueLabels {
 public:
  // `statistics` must outlive this.
  explicit QueueLabels(StatisticsService& statistics) : statistics_(statistics) {}

  // Returns the label with that text, and makes it at the first call. The label is valid as long as
  // this object exists.
  QueueLabel& label(std::string_view text) HALVOX_EXCLUDES(mutex_);
  // The numbers of jobs of all labels together.
  struct Jobs {
    std::uint64_t added = 0;
    std::uint64_t run = 0;
  };
  [[nodiscard]] Jobs jobs() HALVOX_EXCLUDES(mutex_);
  // Returns the texts of the labels that have a queue with a turn.
  [[nodiscard]] std::vector<std::string> atWork() HALVOX_EXCLUDES(mutex_);

 private:
  StatisticsService& statistics_;
  Mutex mutex_;
  std::map<std::string, QueueLabel, std::less<>> labels_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
