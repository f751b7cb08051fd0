#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ioreport.h"

namespace halvox::platform::linux_ {

// The bounds of one bucket: values from `lower` on and below `upper`.
struct BucketBounds {
  std::int64_t lower;
  std::int64_t upper;
  friend bool operator==(const BucketBounds&, const BucketBounds&) = default;
};

// What does not change about a channel. Its address is the channel's identity: a source makes one
// description for each of its channels and gives the same one as long as the channel is there.
// Immutable; shared by the source and all readings.
struct ChannelDescription {
  IOReportFormat format = IOReportFormat::kSimple;
  // Of a simple channel. What says nothing else is a gauge, of which a fall is never taken for a
  // reset.
  IOReportKind kind = IOReportKind::kGauge;
  std::optional<std::string> driverName{};
  std::optional<std::string> group{};
  std::optional<std::string> subGroup{};
  std::optional<std::string> channelName{};
  std::string unitLabel{};
  std::vector<std::string> states{};    // of a state channel
  std::vector<BucketBounds> buckets{};  // of a histogram channel

  // How many numbers a channel's value is: one of a simple channel; transitions and residency of
  // each state; the hits of each bucket.
  [[nodiscard]] std::size_t valueCount() const;
  // The format and the four names in one text, which no two channels of a report share.
  [[nodiscard]] std::string fullName() const;
  friend bool operator==(const ChannelDescription&, const ChannelDescription&) = default;
};

// The channels of one source, in its order, and where the values of each begin in a reading.
// Immutable; shared by readings, so that a reading costs no more than its numbers.
class ChannelList {
 public:
  using Channel = std::shared_ptr<const ChannelDescription>;

  explicit ChannelList(std::vector<Channel> channels);

  [[nodiscard]] std::size_t size() const { return channels_.size(); }
  [[nodiscard]] const Channel& operator[](std::size_t index) const { return channels_[index]; }
  [[nodiscard]] std::size_t offset(std::size_t index) const { return offsets_[index]; }
  // Of all channels together.
  [[nodiscard]] std::size_t valueCount() const { return valueCount_; }

 private:
  std::vector<Channel> channels_;
  std::vector<std::uint32_t> offsets_;
  std::size_t valueCount_ = 0;
};

// What one source counted up to one moment. Signed numbers are kept as their two's complement.
struct Reading {
  std::shared_ptr<const ChannelList> channels;
  std::vector<std::uint64_t> values;
  // Tells the source that somebody still holds its readings; may be null.
  std::shared_ptr<void> lease{};
};

}  // namespace halvox::platform::linux_
