#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ioreport.h"

namespace halvox::platform::linux_ {

// The bounds of one bucket: values of at least `lower` and less than `upper`.
struct BucketBounds {
  std::int64_t lower;
  std::int64_t upper;
  friend bool operator==(const BucketBounds&, const BucketBounds&) = default;
};

// The properties of a channel that never change. Its address is the channel's identity: a source
// makes one description for each of its channels, and uses the same one as long as the channel
// exists. Comparing addresses makes a report cheap. Immutable; shared by the source and all
// readings.
struct ChannelDescription {
  IOReportFormat format = IOReportFormat::kSimple;
  // Only for a simple channel. The default is the gauge, because a fall of a gauge never counts as
  // a reset.
  IOReportKind kind = IOReportKind::kGauge;
  std::optional<std::string> driverName{};
  std::optional<std::string> group{};
  std::optional<std::string> subGroup{};
  std::optional<std::string> channelName{};
  std::string unitLabel{};
  std::vector<std::string> states{};    // of a state channel
  std::vector<BucketBounds> buckets{};  // of a histogram channel

  // How many numbers the channel's value has: one for a simple channel, transitions and residency
  // for each state, hits for each bucket.
  [[nodiscard]] std::size_t valueCount() const;
  // The format and the four names as one text. No two channels of a reading have the same text.
  [[nodiscard]] std::string fullName() const;
  friend bool operator==(const ChannelDescription&, const ChannelDescription&) = default;
};

// The channels of one source in order, and the position in a reading at which the values of each
// channel begin. Immutable. Readings share a list and store only their own numbers.
class ChannelList {
 public:
  using Channel = std::shared_ptr<const ChannelDescription>;

  explicit ChannelList(std::vector<Channel> channels);

  [[nodiscard]] std::size_t size() const { return channels_.size(); }
  [[nodiscard]] const Channel& operator[](std::size_t index) const { return channels_[index]; }
  [[nodiscard]] std::size_t offset(std::size_t index) const { return offsets_[index]; }
  // The number of values of all channels.
  [[nodiscard]] std::size_t valueCount() const { return valueCount_; }

 private:
  std::vector<Channel> channels_;
  std::vector<std::uint32_t> offsets_;
  std::size_t valueCount_ = 0;
};

// The values that one source has counted up to one moment. Signed numbers are kept as their two's
// complement. Immutable after its source has made it; sessions share it from their start to their
// stop.
struct Reading {
  std::shared_ptr<const ChannelList> channels;
  std::vector<std::uint64_t> values;
  // A source that must know whether any of its readings is held keeps a weak pointer to this
  // object. May be null.
  std::shared_ptr<void> lease{};
};

}  // namespace halvox::platform::linux_
