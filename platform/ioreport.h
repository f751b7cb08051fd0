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

// What a channel counts. A source may have formats of its own beyond these.
enum class IOReportFormat : std::uint8_t {
  kInvalid = 0,
  kSimple = 1,
  kState = 2,
  kHistogram = 3,
  kSimpleArray = 4,
};

// What the value of a simple channel does: a counter only grows, until it is reset and begins at
// zero again; a gauge goes up and down.
enum class IOReportKind : std::uint8_t { kGauge, kCounter };

struct IOReportError {
  std::int64_t code = 0;
};

// One state of a state channel.
struct IOReportState {
  std::string_view name;
  std::uint64_t inTransitions = 0;  // how often it was entered
  std::uint64_t residency = 0;      // how long it held, in the channel's unit
  double dutyCycle = 0;
};

// The upper bound of a bucket that has none.
inline constexpr std::int64_t kIOReportNoUpperBound = std::numeric_limits<std::int64_t>::max();

// One bucket of a histogram channel: how often a value was from `lower` on and below `upper`.
struct IOReportBucket {
  std::int64_t lower = 0;
  std::int64_t upper = 0;
  std::uint64_t hits = 0;
  std::int32_t boundsResult = 0;  // not 0: the source cannot tell the bounds
};

// One channel as it is seen while samples are walked through. Refers to what the samples own: valid
// only inside the callback. Only the values of its own format mean anything.
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

// What is known of one channel, read under the names of the driver reporting interface.
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
// Sets the bounds and returns 0, or returns why the source cannot tell them and leaves them alone.
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

// A set of channels: which these were when the set was made. Immutable, shared.
class IOReportChannels {
 public:
  virtual ~IOReportChannels() = default;
};

// What is sampled together. Shared by whoever samples it.
class IOReportSubscription {
 public:
  virtual ~IOReportSubscription() = default;
};

// The values of a subscription's channels at one moment, or their change between two. Immutable,
// shared.
class IOReportSamples {
 public:
  virtual ~IOReportSamples() = default;
};

// One moment at which several subscriptions are sampled. Owned by its maker and used by one thread
// at a time. Samples may outlive it; it must not outlive the service.
class IOReportMoment {
 public:
  IOReportMoment() = default;
  IOReportMoment(const IOReportMoment&) = delete;
  IOReportMoment& operator=(const IOReportMoment&) = delete;
  virtual ~IOReportMoment() = default;
};

// What the drivers count. Any thread may call. What comes back is null when there is nothing; then
// `error` may tell why, and is left alone otherwise.
//
// A channel is the same in two samples when its names, format, unit, states and buckets are the
// same and the driver did not withdraw it in between. A simple channel is a counter or a gauge, by
// what the driver says of it, and that is part of what it is.
class IOReportService {
 public:
  using Channels = std::shared_ptr<const IOReportChannels>;
  using Subscription = std::shared_ptr<IOReportSubscription>;
  using Samples = std::shared_ptr<const IOReportSamples>;
  using Moment = std::unique_ptr<IOReportMoment>;
  using Name = std::optional<std::string_view>;  // none: any
  // Returns 0 to go on.
  using Visitor = std::function<int(const IOReportChannel&)>;

  virtual ~IOReportService() = default;

  // The channels that all drivers have now in that group and subgroup; null or an empty set when
  // there are none.
  virtual Channels IOReportCopyChannelsInGroup(Name group, Name subGroup,
                                               std::optional<IOReportError>& error) = 0;
  [[nodiscard]] virtual std::int32_t IOReportGetChannelCount(const Channels& channels) const = 0;
  // Subscribes to the channels; sets which it subscribed, or null.
  virtual Subscription IOReportCreateSubscription(const Channels& channels,
                                                  Channels& subscribedChannels,
                                                  std::optional<IOReportError>& error) = 0;
  // Never null. Reads nothing by itself.
  [[nodiscard]] virtual Moment makeMoment() = 0;
  // The values of those of the channels that there are. A channel that comes later than the set was
  // made is not sampled; one of the set that goes and comes again, by its names and format, is.
  // The first samples of a moment read the counters, and no reading is used that was begun before
  // that call; all other samples of the moment are of the same reading. May take as long as the
  // slowest source is allowed to.
  virtual Samples IOReportCreateSamples(const Subscription& subscription, const Channels& channels,
                                        IOReportMoment& moment,
                                        std::optional<IOReportError>& error) = 0;
  // What changed from the previous samples to the current ones, of the channels that are in both; a
  // channel that is in one only is left out. The difference
  //   of a gauge      is the current value less the previous one, at most what 64 bits hold;
  //   of a counter    is that too, and, when it is lower than before, the current value: it was
  //                   reset and has counted that since;
  //   of a state      are those of its transitions and residencies; the duty cycle is the state's
  //                   share of all residencies between the two;
  //   of a histogram  are those of its hits; minimum and maximum are the lower bound of the lowest
  //                   and the upper bound of the highest bucket with hits between the two, of an
  //                   open bucket its lower bound.
  // When one number of a state or histogram channel is lower than before, all of it was reset.
  // Null without previous samples.
  virtual Samples IOReportCreateSamplesDelta(const Samples& previous, const Samples& current,
                                             std::optional<IOReportError>& error) = 0;
  // Shows the visitor each channel until it returns something else than 0.
  virtual void IOReportIterate(const Samples& samples, const Visitor& visitor) const = 0;
};

}  // namespace halvox::platform
