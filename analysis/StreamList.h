#pragma once

#include <cstdint>
#include <set>
#include <tuple>
#include <unordered_map>
#include <vector>

#include "analysis/ReportData.h"

namespace halvox::analysis {

// The streams of a period that a report shows one by one: those that lost most to xruns, then those
// that ran longest. Belongs to one thread.
//
//   onMoment() and onStory() as StreamBuilder calls them; take()
class StreamList {
 public:
  // Owns nothing; the bounds must outlive it.
  explicit StreamList(const ReportBounds& bounds) : bounds_(bounds) {}

  void onMoment(const StreamStory& story, const StreamMoment& moment);
  void onStory(const StreamStory& story);

  [[nodiscard]] std::uint64_t notKept() const { return notKept_; }
  [[nodiscard]] std::uint64_t changesNotKept() const { return changesNotKept_; }

  // Returns the streams in the order of their starts. Call once, before changesNotKept().
  [[nodiscard]] std::vector<ReportStream> take();

 private:
  using Rank = std::tuple<double, double, std::int64_t>;  // lost, ran, the story's ID
  void addStep(std::int64_t story, const VolumeStep& step);
  // Keeps `most` of the changes, evenly chosen, with the first and the last one.
  template <typename Change>
  void thinOut(std::vector<Change>& changes, std::size_t most);
  void thinOut(ReportStream& stream, std::size_t most);

  const ReportBounds& bounds_;
  std::unordered_map<std::int64_t, std::vector<VolumeStep>> open_;  // by the story's ID
  std::unordered_map<std::int64_t, ReportStream> streams_;
  std::set<Rank> ranks_;  // of streams_
  std::uint64_t notKept_ = 0;
  std::uint64_t changesNotKept_ = 0;
};

}  // namespace halvox::analysis
