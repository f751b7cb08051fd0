#include "analysis/XrunList.h"

#include <algorithm>
#include <unordered_set>

namespace halvox::analysis {

void XrunList::addMessage(std::shared_ptr<const ReportMessage> message) {
  for (auto& [messageID, missing] : following_) {
    --missing;
    if (ReportXrun* const xrun = find(messageID); xrun != nullptr && !xrun->around.empty()) {
      xrun->around.push_back(message);
    }
  }
  while (!following_.empty() && following_.front().second == 0) following_.pop_front();
  newest_.push_back(std::move(message));
  // The xrun's own message and those before it.
  if (newest_.size() > bounds_.around + 1) newest_.pop_front();
}

void XrunList::addXrun(ReportXrun xrun) {
  const Rank rank = rankOf(xrun);
  if (ranks_.size() >= bounds_.xruns) {
    ++notKept_;
    if (rank < *ranks_.begin()) return;
    const Rank least = *ranks_.begin();
    ranks_.erase(least);
    contexts_.erase(least);
    xruns_.erase(-least.second);
  }
  if (contexts_.size() < bounds_.contexts || *contexts_.begin() < rank) {
    xrun.around.assign(newest_.begin(), newest_.end());
    contexts_.insert(rank);
    following_.emplace_back(xrun.messageID, bounds_.around);
  }
  ranks_.insert(rank);
  xruns_.insert_or_assign(xrun.messageID, std::move(xrun));
  if (contexts_.size() > bounds_.contexts) dropContext();
}

void XrunList::dropContext() {
  const std::int64_t messageID = -contexts_.begin()->second;
  contexts_.erase(contexts_.begin());
  if (ReportXrun* const xrun = find(messageID)) xrun->around.clear();
}

ReportXrun* XrunList::find(std::int64_t messageID) {
  const auto found = xruns_.find(messageID);
  return found == xruns_.end() ? nullptr : &found->second;
}

void XrunList::limitContexts() {
  std::unordered_set<std::int64_t> counted;
  std::size_t bytes = 0;
  std::for_each(contexts_.rbegin(), contexts_.rend(), [&](const Rank& rank) {
    ReportXrun* const xrun = find(-rank.second);
    if (xrun == nullptr) return;
    for (const auto& message : xrun->around) {
      if (counted.insert(message->id).second) bytes += message->payload.size();
    }
    if (bytes > bounds_.aroundBytes) xrun->around.clear();
  });
}

std::vector<ReportXrun> XrunList::take() {
  limitContexts();
  std::vector<ReportXrun> list;
  list.reserve(xruns_.size());
  for (auto& [messageID, xrun] : xruns_) {
    if (xrun.around.empty()) ++withoutContext_;
    list.push_back(std::move(xrun));
  }
  xruns_.clear();
  std::ranges::sort(list, [](const ReportXrun& one, const ReportXrun& other) {
    return std::pair(one.time, one.messageID) < std::pair(other.time, other.messageID);
  });
  return list;
}

}  // namespace halvox::analysis
