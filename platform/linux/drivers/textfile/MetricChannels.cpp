#include "platform/linux/drivers/textfile/MetricChannels.h"

#include <algorithm>
#include <map>
#include <optional>
#include <tuple>
#include <unordered_map>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

// Limits for what one file can add to a report. Real state sets and histograms are far smaller.
constexpr std::size_t kMostStates = 64;
constexpr std::size_t kMostBuckets = 256;

// Thrown if the metrics contradict each other, and caught in this file.
struct Contradiction {
  MetricError error;
};

[[noreturn]] void refuse(std::size_t line, std::string what) {
  throw Contradiction{{line, std::move(what)}};
}

using SamplesByLabels = std::map<MetricLabels, std::vector<const MetricSample*>>;

// The samples of a family, grouped by their labels except `left`.
SamplesByLabels byLabelsWithout(std::string_view left, const std::vector<MetricSample>& samples) {
  SamplesByLabels result;
  for (const MetricSample& sample : samples) {
    MetricLabels labels = sample.labels;
    std::erase_if(labels, [left](const MetricLabel& label) { return label.name == left; });
    result[std::move(labels)].push_back(&sample);
  }
  return result;
}

const std::string& labelOf(const MetricSample& sample, std::string_view name) {
  const auto found = std::ranges::find(sample.labels, name, &MetricLabel::name);
  if (found == sample.labels.end()) {
    refuse(sample.line, "expected the label " + std::string(name));
  }
  return found->value;
}

std::uint64_t countOf(const MetricSample& sample) {
  const auto count = sample.number.cutDown();
  if (!count.has_value() || *count < 0) {
    refuse(sample.line, "expected a count, from 0 to 9223372036854775807");
  }
  return static_cast<std::uint64_t>(*count);
}

ChannelDescription describe(const MetricFamily& family, const MetricLabels& labels,
                            IOReportFormat format) {
  ChannelDescription channel;
  channel.format = format;
  channel.channelName = family.name;
  channel.unitLabel = family.unit;
  std::string others;
  for (const auto& [name, value] : labels) {
    if (name == "driver") {
      channel.driverName = value;
    } else if (name == "group") {
      channel.group = value;
    } else if (name == "subgroup") {
      channel.subGroup = value;
    } else if (name == "channel") {
      channel.channelName = value;
    } else if (name == "unit") {
      channel.unitLabel = value;
    } else {
      others.append(" ").append(name).append("=").append(value);
    }
  }
  *channel.channelName += others;
  return channel;
}

// True for the sample with the time of creation, which OpenMetrics allows for a counter and a
// histogram.
bool isCreationTime(const MetricSample& sample) { return sample.suffix == "_created"; }

// Makes the channels of one text. Used once.
class ChannelMaker {
 public:
  explicit ChannelMaker(const OpenMetricsText::Families& families) : families_(families) {
    for (const MetricFamily& family : families) byName_.emplace(family.name, &family);
    for (const MetricFamily& family : families) claimStateCounters(family);
  }

  std::vector<MetricChannel> make() {
    for (const MetricFamily& family : families_) add(family);
    refuseDoubles();
    return std::move(channels_);
  }

 private:
  // Returns the counter of that name. OpenMetrics names the family without "_total", the older
  // format with it.
  const MetricFamily* counterNamed(const std::string& name) const {
    for (const std::string& form : {name, name + "_total"}) {
      const auto found = byName_.find(form);
      if (found != byName_.end() && found->second->type == MetricType::kCounter) {
        return found->second;
      }
    }
    return nullptr;
  }

  // The counters of a state set become part of its channel. They get no channels of their own.
  void claimStateCounters(const MetricFamily& family) {
    if (family.type != MetricType::kStateset) return;
    // A missing counter inserts null, which is not the address of any family. addStateChannel()
    // reports the error.
    claimed_[counterNamed(family.name + "_residency")] = true;
    claimed_[counterNamed(family.name + "_transitions")] = true;
  }

  void add(const MetricFamily& family) {
    switch (family.type) {
      case MetricType::kCounter:
        if (!claimed_.contains(&family)) addCounter(family);
        return;
      case MetricType::kGauge:
        return addGauge(family);
      case MetricType::kHistogram:
        return addHistograms(family);
      case MetricType::kStateset:
        return addStates(family);
      case MetricType::kUnknown:
      case MetricType::kOther:
        return;
    }
  }

  void addCounter(const MetricFamily& family) {
    for (const MetricSample& sample : family.samples) {
      if (isCreationTime(sample)) continue;
      ChannelDescription channel = describe(family, sample.labels, IOReportFormat::kSimple);
      channel.kind = IOReportKind::kCounter;
      channels_.push_back({std::move(channel), {countOf(sample)}, sample.line});
    }
  }

  // NaN means that the gauge has no value at the moment. It then gets no channel.
  void addGauge(const MetricFamily& family) {
    for (const MetricSample& sample : family.samples) {
      const auto value = sample.number.cutDown();
      if (!value.has_value()) continue;
      channels_.push_back({describe(family, sample.labels, IOReportFormat::kSimple),
                           {static_cast<std::uint64_t>(*value)},
                           sample.line});
    }
  }

  void addHistograms(const MetricFamily& family) {
    for (const auto& [labels, samples] : byLabelsWithout("le", family.samples)) {
      addHistogram(describe(family, labels, IOReportFormat::kHistogram), samples);
    }
  }

  void addHistogram(ChannelDescription description,
                    const std::vector<const MetricSample*>& samples);
  void addStates(const MetricFamily& family);
  void addStateChannel(const MetricFamily& family, const MetricLabels& labels,
                       const std::vector<const MetricSample*>& samples);
  std::uint64_t stateCount(const MetricFamily& counter, const MetricSample& state);
  // Two channels with the same name would have the same key in a report, and one of them would be
  // lost.
  void refuseDoubles() const;

  const OpenMetricsText::Families& families_;
  std::unordered_map<std::string, const MetricFamily*> byName_;
  std::unordered_map<const MetricFamily*, bool> claimed_;
  // The samples of each state set's counters by their labels. Searching the list for every state
  // took ten times as long for a file of 5,800 state channels.
  std::unordered_map<const MetricFamily*, std::map<MetricLabels, const MetricSample*>> counts_;
  std::vector<MetricChannel> channels_;
};

// Reads the buckets of one histogram in order. The file has cumulative counts; channels have the
// hits of each bucket.
class BucketReader {
 public:
  void take(const MetricSample& sample) {
    if (isComplete_) refuse(sample.line, "expected no bucket after the one with le=\"+Inf\"");
    if (buckets_.size() == kMostBuckets) {
      refuse(sample.line, "expected at most " + std::to_string(kMostBuckets) + " buckets");
    }
    const std::int64_t upper = bound(sample);
    const std::uint64_t hits = countOf(sample);
    if (!buckets_.empty() && upper <= lower_) {
      refuse(sample.line, "expected a greater bound than that of the previous bucket");
    }
    // The count of a bucket includes those of all lower buckets. If it were smaller than the
    // previous one, the difference would be negative.
    if (hits < total_) refuse(sample.line, "expected at least the hits of the previous bucket");
    buckets_.push_back({lower_, upper});
    values_.push_back(hits - total_);
    lower_ = upper;
    total_ = hits;
  }

  // Moves the bounds into the description and returns the hits.
  std::vector<std::uint64_t> finish(std::size_t line, const MetricSample* count,
                                    ChannelDescription& description) {
    if (!isComplete_) refuse(line, "expected a bucket with le=\"+Inf\"");
    if (count != nullptr && countOf(*count) != total_) {
      refuse(count->line, "expected the same count as the bucket with le=\"+Inf\"");
    }
    description.buckets = std::move(buckets_);
    return std::move(values_);
  }

 private:
  std::int64_t bound(const MetricSample& sample) {
    const std::string& text = labelOf(sample, "le");
    isComplete_ = text == "+Inf";
    if (isComplete_) return kIOReportNoUpperBound;
    const auto number = MetricNumber::parse(text);
    const auto whole = number.has_value() ? number->cutDown() : std::nullopt;
    // The bounds of a report's buckets are integers. Rounding a fraction would move hits to another
    // bucket.
    if (!whole.has_value() || *whole < 0 || static_cast<double>(*whole) != number->value) {
      refuse(sample.line, "expected a whole number or +Inf as the bucket's bound");
    }
    return *whole;
  }

  std::vector<BucketBounds> buckets_;
  std::vector<std::uint64_t> values_;
  std::int64_t lower_ = 0;
  std::uint64_t total_ = 0;
  bool isComplete_ = false;
};

void ChannelMaker::addHistogram(ChannelDescription description,
                                const std::vector<const MetricSample*>& samples) {
  BucketReader buckets;
  const MetricSample* count = nullptr;
  for (const MetricSample* sample : samples) {
    if (sample->suffix == "_bucket") buckets.take(*sample);
    if (sample->suffix == "_count") count = sample;
  }
  const std::size_t line = samples.front()->line;
  auto values = buckets.finish(line, count, description);
  channels_.push_back({std::move(description), std::move(values), line});
}

void ChannelMaker::addStates(const MetricFamily& family) {
  for (const auto& [labels, samples] : byLabelsWithout(family.name, family.samples)) {
    addStateChannel(family, labels, samples);
  }
}

// Returns the counter's value for a state, from the sample that has the state's labels.
std::uint64_t ChannelMaker::stateCount(const MetricFamily& counter, const MetricSample& state) {
  const auto [found, isNew] = counts_.try_emplace(&counter);
  if (isNew) {
    for (const MetricSample& sample : counter.samples) {
      if (!isCreationTime(sample)) found->second.emplace(sample.labels, &sample);
    }
  }
  const auto count = found->second.find(state.labels);
  if (count == found->second.end()) {
    refuse(state.line, "expected a value of " + counter.name + " for this state");
  }
  return countOf(*count->second);
}

void ChannelMaker::addStateChannel(const MetricFamily& family, const MetricLabels& labels,
                                   const std::vector<const MetricSample*>& samples) {
  const MetricFamily* residency = counterNamed(family.name + "_residency");
  const MetricFamily* transitions = counterNamed(family.name + "_transitions");
  // The current state is not a count. Without the two counters there is nothing to report.
  if (residency == nullptr && transitions == nullptr) return;
  const std::size_t line = samples.front()->line;
  if (residency == nullptr) refuse(line, "expected a counter " + family.name + "_residency");
  if (transitions == nullptr) refuse(line, "expected a counter " + family.name + "_transitions");
  if (samples.size() > kMostStates) {
    refuse(line, "expected at most " + std::to_string(kMostStates) + " states");
  }

  MetricChannel channel{describe(family, labels, IOReportFormat::kState), {}, line};
  if (channel.description.unitLabel.empty()) channel.description.unitLabel = residency->unit;
  for (const MetricSample* sample : samples) {
    if (sample->number.value != 0 && sample->number.value != 1) {
      refuse(sample->line, "expected 0 or 1 as the value of a state");
    }
    channel.description.states.push_back(labelOf(*sample, family.name));
    // Keep this order, in which a reading holds the numbers of a state.
    channel.values.push_back(stateCount(*transitions, *sample));
    channel.values.push_back(stateCount(*residency, *sample));
  }
  channels_.push_back(std::move(channel));
}

void ChannelMaker::refuseDoubles() const {
  using Name = std::tuple<IOReportFormat, std::optional<std::string>, std::optional<std::string>,
                          std::optional<std::string>, std::optional<std::string>>;
  std::map<Name, std::size_t> lines;
  for (const auto& [description, values, line] : channels_) {
    const auto [found, isNew] =
        lines.try_emplace(Name(description.format, description.driverName, description.group,
                               description.subGroup, description.channelName),
                          line);
    if (!isNew) {
      refuse(line, "this channel is already in line " + std::to_string(found->second));
    }
  }
}

}  // namespace

std::variant<std::vector<MetricChannel>, MetricError> MetricChannels::from(std::string_view text) {
  auto families = OpenMetricsText::parse(text);
  if (auto* error = std::get_if<MetricError>(&families)) return std::move(*error);
  try {
    return ChannelMaker(std::get<OpenMetricsText::Families>(families)).make();
  } catch (const Contradiction& contradiction) {
    return contradiction.error;
  }
}

}  // namespace halvox::platform::linux_
