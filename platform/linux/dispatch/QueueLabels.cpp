#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

QueueLabel& QueueLabels::label(std::string_view text) {
  constexpr std::string_view kPiece = "queues";
  const MutexLock lock(mutex_);
  if (const auto known = labels_.find(text); known != labels_.end()) return known->second;
  const std::string name(text);
  const auto place = labels_
                         .try_emplace(name, statistics_.counter(kPiece, name + ": jobs added"),
                                      statistics_.counter(kPiece, name + ": jobs run"))
                         .first;
  // A view of the key is enough, because a map does not move its keys.
  place->second.text = place->first;
  return place->second;
}

QueueLabels::Jobs QueueLabels::jobs() {
  const MutexLock lock(mutex_);
  Jobs jobs;
  for (const auto& [text, label] : labels_) {
    // Read in this order, because a job is counted as added before it is counted as run.
    jobs.run += label.run.value();
    jobs.added += label.added.value();
  }
  return jobs;
}

std::vector<std::string> QueueLabels::atWork() {
  const MutexLock lock(mutex_);
  std::vector<std::string> texts;
  for (const auto& [text, label] : labels_) {
    if (label.atWork.load(std::memory_order_relaxed) > 0) texts.push_back(text);
  }
  return texts;
}

}  // namespace halvox::platform::linux_
