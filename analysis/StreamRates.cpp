#include "analysis/StreamRates.h"

#include "platform/linux/base/Utf8.h"

namespace halvox::analysis {
namespace {

// A stream that changes its device more often has its further devices counted with the last one.
constexpr std::size_t kMostDevicesOfAStream = 64;

}  // namespace

// The time since the last call belongs to the device that was in force meanwhile.
StreamRates::Part& StreamRates::countTime(Open& open, const StreamStory& story) {
  Part& part = open.parts[open.device];
  part.seconds += story.ranSeconds - open.secondsCounted;
  open.secondsCounted = story.ranSeconds;
  return part;
}

void StreamRates::onMoment(const StreamStory& story, const StreamMoment& moment) {
  if (moment.kind == StreamMoment::Kind::kRoute) {
    Open& open = open_[story.id];
    countTime(open, story);
    const std::string_view device = moment.text.empty() ? moment.names : moment.text;
    const std::string name(platform::linux_::utf8Prefix(device, text_));
    if (open.parts.size() < kMostDevicesOfAStream || open.parts.contains(name)) open.device = name;
  } else if (moment.kind == StreamMoment::Kind::kXrun) {
    Part& part = countTime(open_[story.id], story);
    ++part.xruns;
    part.milliseconds += moment.xrun.milliseconds;
  }
}

void StreamRates::onStory(const StreamStory& story) {
  const Part whole{.seconds = story.ranSeconds,
                   .xruns = static_cast<double>(story.xruns.reports),
                   .milliseconds = story.xruns.milliseconds};
  add(StreamRate::Of::kAll, "", whole);
  add(StreamRate::Of::kApplication, platform::linux_::utf8Prefix(story.application, text_), whole);
  Open& open = open_[story.id];
  countTime(open, story);
  for (const auto& [device, part] : open.parts) add(StreamRate::Of::kDevice, device, part);
  open_.erase(story.id);
}

void StreamRates::add(StreamRate::Of of, std::string_view name, const Part& part) {
  constexpr double kSecondsPerHour = 3600;
  if (part.seconds <= 0 && part.xruns <= 0) return;
  const std::pair key(of, std::string(name));
  auto found = rates_.find(key);
  if (found == rates_.end()) {
    if (rates_.size() >= rows_) return void(++notKept_);
    found = rates_.try_emplace(key).first;
    found->second.of = of;
    found->second.name = name;
  }
  const double hours = part.seconds / kSecondsPerHour;
  found->second.xruns.add(hours, part.xruns);
  found->second.milliseconds.add(hours, part.milliseconds);
}

std::vector<StreamRate> StreamRates::take() {
  std::vector<StreamRate> list;
  list.reserve(rates_.size());
  for (auto& [key, rate] : rates_) list.push_back(std::move(rate));
  rates_.clear();
  return list;
}

}  // namespace halvox::analysis
