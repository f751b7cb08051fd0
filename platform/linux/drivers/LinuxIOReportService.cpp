#include "platform/linux/drivers/LinuxIOReportService.h"

#include <string>
#include <utility>

#include "platform/linux/Mutex.h"
#include "platform/linux/drivers/DriverSamples.h"

namespace halvox::platform::linux_ {
namespace {

// The channels of a group that a source has, found anew only when the source's channels change.
class GroupSelection {
 public:
  GroupSelection(IOReportService::Name group, IOReportService::Name subGroup, std::size_t sources)
      : group_(group), subGroup_(subGroup), found_(sources) {}

  // The part of a source's reading that is in the group.
  DriverSamples::Part select(std::size_t source, std::shared_ptr<const Reading> reading) {
    const MutexLock lock(mutex_);
    Found& found = found_[source];
    if (found.channels != reading->channels) {
      found = {reading->channels, find(*reading->channels)};
    }
    return {std::move(reading), found.selection, source};
  }

 private:
  struct Found {
    std::shared_ptr<const ChannelList> channels{};
    std::shared_ptr<const ChannelSelection> selection{};
  };

  [[nodiscard]] bool has(const ChannelDescription& channel) const {
    return (!group_.has_value() || channel.group == group_) &&
           (!subGroup_.has_value() || channel.subGroup == subGroup_);
  }
  [[nodiscard]] std::shared_ptr<const ChannelSelection> find(const ChannelList& channels) const {
    auto selection = std::make_shared<ChannelSelection>();
    for (std::uint32_t position = 0; position < channels.size(); ++position) {
      if (has(*channels[position])) selection->push_back(position);
    }
    return selection;
  }

  const std::optional<std::string> group_;
  const std::optional<std::string> subGroup_;
  Mutex mutex_;
  std::vector<Found> found_ HALVOX_GUARDED_BY(mutex_);  // by source
};

// The set of a group's channels is the group, with how many there were when it was asked for.
class GroupChannels final : public IOReportChannels {
 public:
  GroupChannels(std::shared_ptr<GroupSelection> groupSelection, std::int32_t channelCount)
      : selection(std::move(groupSelection)), count(channelCount) {}
  const std::shared_ptr<GroupSelection> selection;
  const std::int32_t count;
};

class GroupSubscription final : public IOReportSubscription {};

std::shared_ptr<const DriverSamples> sample(
    const std::vector<std::unique_ptr<SourceReader>>& readers,
    std::chrono::milliseconds longestWait, GroupSelection& group) {
  std::vector<SourceReader::Asked> asked;
  asked.reserve(readers.size());
  for (const auto& reader : readers) asked.push_back(reader->ask());
  const auto deadline = SourceReader::Clock::now() + longestWait;
  std::vector<DriverSamples::Part> parts;
  DriverSamples::Sources late;
  for (std::size_t source = 0; source < readers.size(); ++source) {
    auto reading = readers[source]->take(std::move(asked[source]), deadline);
    if (reading == nullptr) {
      late.push_back(source);
      continue;
    }
    DriverSamples::Part part = group.select(source, std::move(reading));
    if (!part.selection->empty()) parts.push_back(std::move(part));
  }
  return std::make_shared<DriverSamples>(std::move(parts), std::move(late));
}

const DriverSamples& samplesOf(const IOReportService::Samples& samples) {
  return static_cast<const DriverSamples&>(*samples);
}

}  // namespace

LinuxIOReportService::LinuxIOReportService(std::vector<std::unique_ptr<DriverSource>> sources,
                                           StatisticsService& statistics,
                                           std::chrono::milliseconds longestWait)
    : longestWait_(longestWait) {
  for (auto& source : sources) {
    readers_.push_back(std::make_unique<SourceReader>(std::move(source), statistics, longestWait));
  }
}

LinuxIOReportService::~LinuxIOReportService() = default;

void LinuxIOReportService::open() {
  for (const auto& reader : readers_) reader->startOpening();
  for (const auto& reader : readers_) reader->waitUntilOpen();
}

IOReportService::Channels LinuxIOReportService::IOReportCopyChannelsInGroup(
    Name group, Name subGroup, std::optional<IOReportError>& /*error*/) {
  auto selection = std::make_shared<GroupSelection>(group, subGroup, readers_.size());
  std::size_t count = 0;
  const auto samples = sample(readers_, longestWait_, *selection);
  for (const auto& part : samples->parts()) count += part.selection->size();
  return std::make_shared<GroupChannels>(std::move(selection), static_cast<std::int32_t>(count));
}

std::int32_t LinuxIOReportService::IOReportGetChannelCount(const Channels& channels) const {
  return static_cast<const GroupChannels&>(*channels).count;
}

IOReportService::Subscription LinuxIOReportService::IOReportCreateSubscription(
    const Channels& channels, Channels& subscribedChannels,
    std::optional<IOReportError>& /*error*/) {
  subscribedChannels = channels;
  return std::make_shared<GroupSubscription>();
}

IOReportService::Samples LinuxIOReportService::IOReportCreateSamples(
    const Subscription& /*subscription*/, const Channels& channels,
    std::optional<IOReportError>& /*error*/) {
  return sample(readers_, longestWait_, *static_cast<const GroupChannels&>(*channels).selection);
}

IOReportService::Samples LinuxIOReportService::IOReportCreateSamplesDelta(
    const Samples& previous, const Samples& current, std::optional<IOReportError>& /*error*/) {
  if (previous == nullptr || current == nullptr) return nullptr;
  return makeDelta(samplesOf(previous), samplesOf(current));
}

void LinuxIOReportService::IOReportIterate(const Samples& samples, const Visitor& visitor) const {
  samplesOf(samples).iterate(visitor);
}

}  // namespace halvox::platform::linux_
