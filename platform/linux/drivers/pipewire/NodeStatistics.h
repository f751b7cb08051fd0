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

// How long the work of a node took, in microseconds: hits of fixed buckets, of which the last is
// open.
class DurationHistogram {
 public:
  static constexpr std::size_t kBuckets = 11;
  // Where each bucket starts; it ends where the next one starts.
  static constexpr std::array<std::int64_t, kBuckets> kLowerBounds{
      0, 50, 100, 200, 500, 1'000, 2'000, 5'000, 10'000, 20'000, 50'000};

  [[nodiscard]] static std::vector<BucketBounds> bounds();

  // Negative durations count as none.
  void add(std::chrono::nanoseconds duration);
  // The numbers of its channel.
  [[nodiscard]] const std::array<std::uint64_t, kBuckets>& values() const { return hits_; }

 private:
  std::array<std::uint64_t, kBuckets> hits_{};
};

enum class NodeState : std::uint8_t { kRunning, kIdle, kSuspended };

// How often and how long a node was in each state. Times are those of one clock that never goes
// back.
class StateResidency {
 public:
  using Time = std::chrono::steady_clock::time_point;
  static constexpr std::size_t kStates = 3;

  [[nodiscard]] static std::vector<std::string> names();

  // None: it is in no state that counts. The state it is in already is no transition, nor is the
  // first one that is known.
  void change(std::optional<NodeState> state, Time now);
  // It is not there any more; the state in which it is when it comes again is the first one.
  void leave(Time now);
  // The numbers of its channel: for each state transitions and microseconds, up to now.
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

// What is counted of one sink or source, and the channels that it is read as.
// Belongs to GraphStatistics.
class NodeStatistics {
 public:
  using Time = StateResidency::Time;

  // `group` is that of the channels, `driverName` their driver.
  NodeStatistics(const std::string& group, const std::string& driverName);

  void cycleEnded(const pipewire::ProfiledNode& node);
  void xrunsHappened(std::uint32_t count) { xruns_ += count; }
  void stateChanged(std::optional<NodeState> state, Time now) { states_.change(state, now); }
  // The node is gone. Its counts go on when one of its name comes.
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
  std::uint64_t cycles_ = 0;
  std::uint64_t xruns_ = 0;
  DurationHistogram busy_;
  DurationHistogram wait_;
  StateResidency states_;
};

}  // namespace halvox::platform::linux_
