#include "platform/linux/drivers/LinuxIOReportService.h"

#include <algorithm>
#include <optional>
#include <string>
#include <unordered_set>
#include <utility>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/DriverSamples.h"

namespace halvox::platform::linux_ {
namespace {

using Readers = std::vector<std::unique_ptr<SourceReader>>;
using Readings = std::vector<std::shared_ptr<const Reading>>;  // by source; null: late

// Requests the readings of all sources before it waits for the first. It then waits only as long as
// the slowest source takes, and not for the sum.
Readings read(const Readers& readers, std::chrono::milliseconds longestWait,
              SourceReader::Use use) {
  std::vector<SourceReader::Asked> asked;
  asked.reserve(readers.size());
  for (const auto& reader : readers) asked.push_back(reader->ask(longestWait, use));
  Readings readings;
  readings.reserve(readers.size());
  for (std::size_t source = 0; source < readers.size(); ++source) {
    readings.push_back(readers[source]->take(asked[source]));
  }
  return readings;
}

struct GroupName {
  std::optional<std::string> group;
  std::optional<std::string> subGroup;

  [[nodiscard]] bool has(const ChannelDescription& channel) const {
    return (!group.has_value() || channel.group == group) &&
           (!subGroup.has_value() || channel.subGroup == subGroup);
  }
};

// The channels of a group that existed when the set was made, identified by their full names.
// Immutable except for the positions in the sources' readings, which are computed again when the
// channels of a source change. Shared by the samples' users; any thread may use it.
class GroupChannels final : public IOReportChannels {
 public:
  GroupChannels(GroupName group, const Readings& readings)
      : group_(std::move(group)), found_(readings.size()) {
    for (const auto& reading : readings) {
      if (reading == nullptr) continue;
      for (std::size_t position = 0; position < reading->channels->size(); ++position) {
        const ChannelDescription& channel = *(*reading->channels)[position];
        if (group_.has(channel)) names_.insert(channel.fullName());
      }
    }
  }

  [[nodiscard]] std::int32_t count() const { return static_cast<std::int32_t>(names_.size()); }

  // Returns the part of a source's reading that belongs to the set.
  [[nodiscard]] DriverSamples::Part select(std::size_t source,
                                           std::shared_ptr<const Reading> reading) const {
    const MutexLock lock(mutex_);
    Found& found = found_[source];
    // Sources keep their list while their channels stay the same. Most samples reuse the positions
    // that the previous sample has computed.
    if (found.channels != reading->channels) {
      found = {reading->channels, find(*reading->channels)};
    }
    return {std::move(reading), found.selection};
  }

 private:
  struct Found {
    std::shared_ptr<const ChannelList> channels{};
    std::shared_ptr<const ChannelSelection> selection{};
  };

  [[nodiscard]] std::shared_ptr<const ChannelSelection> find(const ChannelList& channels) const {
    auto selection = std::make_shared<ChannelSelection>();
    for (std::uint32_t position = 0; position < channels.size(); ++position) {
      const ChannelDescription& channel = *channels[position];
      // Compare the group first, which allocates no text.
      if (group_.has(channel) && names_.contains(channel.fullName())) {
        selection->push_back(position);
      }
    }
    return selection;
  }

  const GroupName group_;
  std::unordered_set<std::string> names_;
  mutable Mutex mutex_;
  mutable std::vector<Found> found_ HALVOX_GUARDED_BY(mutex_);  // by source
};

// Empty, because the set of channels has everything that a sample needs. IOReportService requires
// the object.
class GroupSubscription final : public IOReportSubscription {};

// Reads the sources when the first sample is requested. A moment without samples costs nothing.
class ReadMoment final : public IOReportMoment {
 public:
  ReadMoment(const Readers& readers, std::chrono::milliseconds longestWait)
      : readers_(readers), longestWait_(longestWait) {}

  [[nodiscard]] const Readings& readings() {
    // Read once for all groups. With a reading for each group, the median report took 0.98 ms.
    if (!readings_.has_value())
      readings_ = read(readers_, longestWait_, SourceReader::Use::kSample);
    return *readings_;
  }

 private:
  const Readers& readers_;  // owned by the service
  const std::chrono::milliseconds longestWait_;
  std::optional<Readings> readings_;
};

const DriverSamples& samplesOf(const IOReportService::Samples& samples) {
  return static_cast<const DriverSamples&>(*samples);
}

}  // namespace

LinuxIOReportService::LinuxIOReportService(std::vector<std::unique_ptr<DriverSource>> sources,
                                           LogCategory& log, StatisticsService& statistics,
                                           std::chrono::milliseconds longestWait)
    : longestWait_(longestWait) {
  for (auto& source : sources) {
    readers_.push_back(
        std::make_unique<SourceReader>(std::move(source), log, statistics, longestWait));
  }
}

LinuxIOReportService::~LinuxIOReportService() = default;

void LinuxIOReportService::open() {
  // Start to open all sources before waiting for the first. The start of the service then waits
  // only as long as the slowest source takes, and not for the sum.
  for (const auto& reader : readers_) reader->startOpening();
  for (const auto& reader : readers_) reader->waitUntilOpen();
}

IOReportService::Channels LinuxIOReportService::IOReportCopyChannelsInGroup(
    Name group, Name subGroup, std::optional<IOReportError>& /*error*/) {
  // A channel that is missed here is missing until the service restarts. The search may therefore
  // take longer than a sample.
  const Readings readings = read(readers_, std::max(longestWait_, SourceReader::kLongestOpening),
                                 SourceReader::Use::kFindChannels);
  GroupName names{std::optional<std::string>(group), std::optional<std::string>(subGroup)};
  return std::make_shared<GroupChannels>(std::move(names), readings);
}

std::int32_t LinuxIOReportService::IOReportGetChannelCount(const Channels& channels) const {
  return static_cast<const GroupChannels&>(*channels).count();
}

IOReportService::Subscription LinuxIOReportService::IOReportCreateSubscription(
    const Channels& channels, Channels& subscribedChannels,
    std::optional<IOReportError>& /*error*/) {
  // A subscription allocates nothing, because it refers to the channels that its set has found.
  subscribedChannels = channels;
  return std::make_shared<GroupSubscription>();
}

IOReportService::Moment LinuxIOReportService::makeMoment() {
  return std::make_unique<ReadMoment>(readers_, longestWait_);
}

IOReportService::Samples LinuxIOReportService::IOReportCreateSamples(
    const Subscription& /*subscription*/, const Channels& channels, IOReportMoment& moment,
    std::optional<IOReportError>& /*error*/) {
  const auto& group = static_cast<const GroupChannels&>(*channels);
  const Readings& readings = static_cast<ReadMoment&>(moment).readings();
  std::vector<DriverSamples::Part> parts;
  for (std::size_t source = 0; source < readings.size(); ++source) {
    // The samples do not have the channels of a source that is late, and a difference then does not
    // have them either. Taking zero as their value instead would report everything since the driver
    // was loaded.
    if (readings[source] == nullptr) continue;
    DriverSamples::Part part = group.select(source, readings[source]);
    if (!part.selection->empty()) parts.push_back(std::move(part));
  }
  return std::make_shared<DriverSamples>(std::move(parts));
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
