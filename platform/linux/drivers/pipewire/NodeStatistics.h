#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/linux/drivers/DriverChannel.h"
#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/pipewire/ProfileDecoder.h"

namespace halvox::platform::linux_ {

// Counts durations in microseconds in fixed buckets; the last bucket is open. A plain value.
class DurationHistogram {
 public:
  static constexpr std::size_t kBuckets = 11;
  // The lower bound of each bucket. It ends at the lower bound of the next one.
  static constexpr std::array<std::int64_t, kBuckets> kLowerBounds{
      0, 50, 100, 200, 500, 1'000, 2'000, 5'000, 10'000, 20'000, 50'000};

  [[nodiscard]] static std::vector<BucketBounds> bounds();

  // A negative duration counts as 0.
  void add(std::chrono::nanoseconds duration);
  // The values of its channel.
  [[nodiscard]] const std::array<std::uint64_t, kBuckets>& values() const { return hits_; }

 private:
  std::array<std::uint64_t, kBuckets> hits_{};
};

enum class NodeState : std::uint8_t { kRunning, kIdle, kSuspended };

// Counts how often and how long a node was in each state. A plain value. All times must come from
// one clock that does not go back.
class StateResidency {
 public:
  using Time = std::chrono::steady_clock::time_point;
  static constexpr std::size_t kStates = 3;

  [[nodiscard]] static std::vector<std::string> names();

  // std::nullopt stands for a state that is not counted. Setting the current state again is not a
  // transition, and neither is the first known state.
  void change(std::optional<NodeState> state, Time now);
  // The node has disappeared. The first state after its return is not a transition.
  void leave(Time now);
  // The values of its channel: transitions and microseconds of each state, up to now.
  [[nodiscard]] std::array<std::uint64_t, 2 * kStates> values(Time now) const;

 private:
  struct Total {
    std::uint64_t transitions = 0;
    std::chrono::nanoseconds time{0};
  };
  std::array<Total, kStates> totals_{};
  std::optional<NodeState> state_;
  bool isKnown_ = false;
  Time since_{};
};

// The counts of one sink or source and its channels. GraphStatistics owns and calls it.
class NodeStatistics {
 public:
  using Time = StateResidency::Time;

  // `group` and `driverName` are those of the channels.
  NodeStatistics(const std::string& group, const std::string& driverName);

  void cycleEnded(const pipewire::ProfiledNode& node);
  // The length of a cycle in frames, and the frames per second.
  void clockIs(std::int64_t quantum, std::int64_t rate);
  void xrunsHappened(std::uint32_t count) { xruns_ += count; }
  void stateChanged(std::optional<NodeState> state, Time now) { states_.change(state, now); }
  // The node has disappeared. Its counts continue if a node of the same name appears.
  void left(Time now) { states_.leave(now); }
  void addTo(ReadingMaker& maker, Time now) const;
  [[nodiscard]] const std::string& driverName() const { return *cyclesChannel_->driverName; }
  [[nodiscard]] const std::string& group() const { return *cyclesChannel_->group; }

 private:
  ChannelList::Channel cyclesChannel_;
  ChannelList::Channel xrunsChannel_;
  ChannelList::Channel busyChannel_;
  ChannelList::Channel waitChannel_;
  ChannelList::Channel stateChannel_;
  ChannelList::Channel quantumChannel_;
  ChannelList::Channel rateChannel_;
  std::uint64_t cycles_ = 0;
  std::uint64_t xruns_ = 0;
  DurationHistogram busy_;
  DurationHistogram wait_;
  StateResidency states_;
  std::uint64_t quantum_ = 0;  // unknown
  std::uint64_t rate_ = 0;
};

}  // namespace halvox::platform::linux_
