#pragma once

#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace halvox::platform {

// What a channel counts. The numbers are part of the interface. A source may send other numbers,
// and readers must expect them.
enum class IOReportFormat : std::uint8_t {
  kInvalid = 0,
  kSimple = 1,
  kState = 2,
  kHistogram = 3,
  kSimpleArray = 4,
};

// How the value of a simple channel changes. A counter only grows, until a reset sets it to zero. A
// gauge goes up and down. A value that falls is therefore a reset of a counter and an ordinary
// change of a gauge.
enum class IOReportKind : std::uint8_t { kGauge, kCounter };

// Why an operation returned nothing.
struct IOReportError {
  std::int64_t code = 0;
};

// One state of a state channel.
struct IOReportState {
  std::string_view name;
  std::uint64_t inTransitions = 0;  // how often the state was entered
  std::uint64_t residency = 0;      // how long the state held, in the channel's unit
  double dutyCycle = 0;             // this state's share of all residencies, 0 to 1
};

// The upper bound of an open bucket, which counts everything from its lower bound on.
inline constexpr std::int64_t kIOReportNoUpperBound = std::numeric_limits<std::int64_t>::max();

// One bucket of a histogram channel: how often a value was at least `lower` and less than `upper`.
struct IOReportBucket {
  std::int64_t lower = 0;
  std::int64_t upper = 0;
  std::uint64_t hits = 0;
  std::int32_t boundsResult = 0;  // not 0 if the source does not know the bounds
};

// One channel during a walk through samples. The texts and spans refer to the samples and are valid
// only inside the callback. Only the values of the channel's own format are set.
struct IOReportChannel {
  IOReportFormat format = IOReportFormat::kInvalid;
  std::optional<std::string_view> driverName{};
  std::optional<std::string_view> group{};
  std::optional<std::string_view> subGroup{};
  std::optional<std::string_view> channelName{};
  std::string_view unitLabel{};
  std::int64_t integerValue = 0;              // simple
  std::span<const IOReportState> states{};    // state
  std::span<const IOReportBucket> buckets{};  // histogram
  std::int64_t minValue = 0;                  // histogram
  std::int64_t maxValue = 0;                  // histogram
};

// Accessors with the names of the driver reporting interface. They do not check an index, which
// must be less than the count.
inline IOReportFormat IOReportChannelGetFormat(const IOReportChannel& channel) {
  return channel.format;
}
inline std::optional<std::string_view> IOReportChannelGetDriverName(
    const IOReportChannel& channel) {
  return channel.driverName;
}
inline std::optional<std::string_view> IOReportChannelGetGroup(const IOReportChannel& channel) {
  return channel.group;
}
inline std::optional<std::string_view> IOReportChannelGetSubGroup(const IOReportChannel& channel) {
  return channel.subGroup;
}
inline std::optional<std::string_view> IOReportChannelGetChannelName(
    const IOReportChannel& channel) {
  return channel.channelName;
}
inline std::string_view IOReportChannelGetUnitLabel(const IOReportChannel& channel) {
  return channel.unitLabel;
}
inline std::int64_t IOReportSimpleGetIntegerValue(const IOReportChannel& channel) {
  return channel.integerValue;
}
inline std::int32_t IOReportStateGetCount(const IOReportChannel& channel) {
  return static_cast<std::int32_t>(channel.states.size());
}
inline std::string_view IOReportStateGetNameForIndex(const IOReportChannel& channel,
                                                     std::int32_t index) {
  return channel.states[static_cast<std::size_t>(index)].name;
}
inline std::uint64_t IOReportStateGetInTransitions(const IOReportChannel& channel,
                                                   std::int32_t index) {
  return channel.states[static_cast<std::size_t>(index)].inTransitions;
}
inline std::uint64_t IOReportStateGetResidency(const IOReportChannel& channel, std::int32_t index) {
  return channel.states[static_cast<std::size_t>(index)].residency;
}
inline double IOReportStateGetDutyCycle(const IOReportChannel& channel, std::int32_t index) {
  return channel.states[static_cast<std::size_t>(index)].dutyCycle;
}
inline std::int32_t IOReportHistogramGetBucketCount(const IOReportChannel& channel) {
  return static_cast<std::int32_t>(channel.buckets.size());
}
// Sets the bounds and returns 0. If the source does not know them, returns its error and leaves the
// bounds unchanged.
inline std::int32_t IOReportHistogramGetBucketBounds(const IOReportChannel& channel,
                                                     std::int32_t index, std::int64_t& lower,
                                                     std::int64_t& upper) {
  const IOReportBucket& bucket = channel.buckets[static_cast<std::size_t>(index)];
  if (bucket.boundsResult == 0) {
    lower = bucket.lower;
    upper = bucket.upper;
  }
  return bucket.boundsResult;
}
inline std::uint64_t IOReportHistogramGetBucketHits(const IOReportChannel& channel,
                                                    std::int32_t index) {
  return channel.buckets[static_cast<std::size_t>(index)].hits;
}
inline std::int64_t IOReportHistogramGetMinValue(const IOReportChannel& channel) {
  return channel.minValue;
}
inline std::int64_t IOReportHistogramGetMaxValue(const IOReportChannel& channel) {
  return channel.maxValue;
}

// A set of channels, fixed when the set was made. Immutable, shared.
class IOReportChannels {
 public:
  virtual ~IOReportChannels() = default;
};

// Channels that are sampled together. Shared by all code that samples them.
class IOReportSubscription {
 public:
  virtual ~IOReportSubscription() = default;
};

// The values of a subscription's channels at one moment, or their change between two moments.
// Immutable, shared. A session keeps the samples of its start until its stop.
class IOReportSamples {
 public:
  virtual ~IOReportSamples() = default;
};

// One moment at which several subscriptions are sampled. All samples of a moment come from the same
// reading of the counters. A report samples eight groups. With a reading for each group, a report
// took 0.98 ms at the median (docs/decisions/0008).
//
// The caller of makeMoment() owns it and uses it on one thread at a time. Samples may outlive their
// moment. A moment must not outlive the service.
class IOReportMoment {
 public:
  IOReportMoment() = default;
  IOReportMoment(const IOReportMoment&) = delete;
  IOReportMoment& operator=(const IOReportMoment&) = delete;
  virtual ~IOReportMoment() = default;
};

// The counters of the drivers.
//
// Any thread may call. The composition root owns the service. An operation that has nothing to
// return returns null; it sets `error` if it knows why, and leaves it unchanged otherwise.
//
// A channel is the same in two samples if its names, format, kind, unit, states and bucket bounds
// are equal and the driver did not withdraw it in between. With a weaker condition, a difference
// could be taken between counts of different things.
class IOReportService {
 public:
  using Channels = std::shared_ptr<const IOReportChannels>;
  using Subscription = std::shared_ptr<IOReportSubscription>;
  using Samples = std::shared_ptr<const IOReportSamples>;
  using Moment = std::unique_ptr<IOReportMoment>;
  using Name = std::optional<std::string_view>;  // none: any name
  // Returns 0 to continue with the next channel.
  using Visitor = std::function<int(const IOReportChannel&)>;

  virtual ~IOReportService() = default;

  // The channels that exist now in that group and subgroup, of all drivers. Null or an empty set if
  // there are none.
  virtual Channels IOReportCopyChannelsInGroup(Name group, Name subGroup,
                                               std::optional<IOReportError>& error) = 0;
  [[nodiscard]] virtual std::int32_t IOReportGetChannelCount(const Channels& channels) const = 0;
  // Subscribes to the channels. Sets `subscribedChannels` to those that it subscribed to, or to
  // null.
  virtual Subscription IOReportCreateSubscription(const Channels& channels,
                                                  Channels& subscribedChannels,
                                                  std::optional<IOReportError>& error) = 0;
  // Makes a moment; never null. Does not read the counters. The first call of
  // IOReportCreateSamples() for the moment reads them.
  [[nodiscard]] virtual Moment makeMoment() = 0;
  // The current values of the channels in the set. A channel that appears after the set was made is
  // not sampled. A channel of the set that disappears is skipped until a channel with its names and
  // format exists again. The first call for a moment reads the counters. It never uses a reading
  // that began before the call. Further calls for the same moment use the reading of the first. May
  // block until the slowest source has answered or its time limit has passed.
  virtual Samples IOReportCreateSamples(const Subscription& subscription, const Channels& channels,
                                        IOReportMoment& moment,
                                        std::optional<IOReportError>& error) = 0;
  // What changed from the previous samples to the current ones. The result has only the channels
  // that are in both, because what a new channel counted before its first sample is unknown.
  // Returns null without previous samples.
  //
  // The difference
  //   of a gauge      is the current value minus the previous one, limited to what 64 bits hold;
  //   of a counter    is the same, unless the value fell: then the counter was reset, and the
  //                   current value is what it has counted since;
  //   of a state      is that of its transitions and residencies; the duty cycle is the state's
  //                   share of all residencies between the two samples;
  //   of a histogram  is that of its hits; minimum and maximum are the lower bound of the lowest
  //                   and the upper bound of the highest bucket with new hits, or the lower bound
  //                   of that bucket if it is open.
  //
  // If one number of a state or histogram channel fell, all of its numbers were reset.
  virtual Samples IOReportCreateSamplesDelta(const Samples& previous, const Samples& current,
                                             std::optional<IOReportError>& error) = 0;
  // Passes each channel to the visitor until the visitor returns something other than 0.
  virtual void IOReportIterate(const Samples& samples, const Visitor& visitor) const = 0;
};

}  // namespace halvox::platform
