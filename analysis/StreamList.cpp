#include "analysis/StreamList.h"

#include <algorithm>
#include <utility>

namespace halvox::analysis {

void StreamList::onMoment(const StreamStory& story, const StreamMoment& moment) {
  using Kind = StreamMoment::Kind;
  const auto lastVolume = [&]() -> std::optional<double> {
    const auto found = open_.find(story.id);
    return found == open_.end() || found->second.empty() ? std::nullopt
                                                         : found->second.back().volume;
  };
  switch (moment.kind) {
    case Kind::kStart:
      return addStep(story.id, {moment.time, lastVolume(), true});
    case Kind::kStop:
      return addStep(story.id, {moment.time, lastVolume(), false});
    case Kind::kVolume:
      return addStep(story.id, {moment.time, moment.volume, moment.playing});
    case Kind::kBegan:
    case Kind::kFormat:
    case Kind::kRoute:
    case Kind::kXrun:
    case Kind::kMessage:
    case Kind::kEnded:
      return;
  }
}

void StreamList::addStep(std::int64_t story, const VolumeStep& step) {
  std::vector<VolumeStep>& steps = open_[story];
  if (!steps.empty() && steps.back().volume == step.volume &&
      steps.back().isPlaying == step.isPlaying) {
    return;
  }
  if (steps.size() >= bounds_.changes) {
    ++changesNotKept_;
    return;
  }
  steps.push_back(step);
}

void StreamList::onStory(const StreamStory& story) {
  auto steps = open_.extract(story.id);
  const Rank rank{story.xruns.milliseconds, story.ranSeconds, story.id};
  if (streams_.size() >= bounds_.streams) {
    ++notKept_;
    const Rank least = *ranks_.begin();
    if (rank < least) return;
    ranks_.erase(least);
    streams_.erase(std::get<2>(least));
  }
  ranks_.insert(rank);
  ReportStream& kept = streams_[story.id];
  kept.story = story;
  if (!steps.empty()) kept.volumeSteps = std::move(steps.mapped());
}

template <typename Change>
void StreamList::thinOut(std::vector<Change>& changes, std::size_t most) {
  if (changes.size() <= most) return;
  changesNotKept_ += changes.size() - most;
  std::vector<Change> kept;
  kept.reserve(most);
  for (std::size_t index = 0; index < most; ++index) {
    kept.push_back(std::move(changes[index * (changes.size() - 1) / (most - 1)]));
  }
  changes = std::move(kept);
}

void StreamList::thinOut(ReportStream& stream, std::size_t most) {
  StreamStory& story = stream.story;
  thinOut(stream.volumeSteps, most);
  thinOut(story.formats, most);
  thinOut(story.routes, most);
  while (story.volumes.size() > bounds_.volumes) {
    story.otherVolumeSeconds += story.volumes.back().seconds;
    story.volumes.pop_back();
  }
}

std::vector<ReportStream> StreamList::take() {
  constexpr std::size_t kFewestChanges = 2;  // the first and the last one
  std::size_t all = 0;
  for (const auto& [id, stream] : streams_) {
    all += stream.volumeSteps.size() + stream.story.formats.size() + stream.story.routes.size();
  }
  const std::size_t share =
      all <= bounds_.allChanges ? bounds_.changes : bounds_.allChanges / streams_.size();
  std::vector<ReportStream> list;
  list.reserve(streams_.size());
  for (auto& [id, stream] : streams_) {
    thinOut(stream, std::clamp(share, kFewestChanges, bounds_.changes));
    list.push_back(std::move(stream));
  }
  streams_.clear();
  std::ranges::sort(list, [](const ReportStream& one, const ReportStream& other) {
    return std::pair(one.story.started, one.story.id) <
           std::pair(other.story.started, other.story.id);
  });
  return list;
}

}  // namespace halvox::analysis
