#pragma once

#include <map>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// Makes the readings of a source and keeps the identity of its channels: if the name and the
// description are the same as in the previous reading, the channel is the same. While all channels
// are the same, readings share one list. A channel that is missing from a reading is forgotten.
//
// Belongs to the source's thread; the source owns it.
class ReadingMaker {
 public:
  using Channel = ChannelList::Channel;

  // Adds a channel that the source identifies by this name.
  void add(const std::string& name, ChannelDescription description,
           std::span<const std::uint64_t> values);
  // Adds a channel for which the source itself keeps the description.
  void add(Channel channel, std::span<const std::uint64_t> values);
  // Returns a reading of everything that was added since the last one. The reading holds the lease.
  // Never null.
  [[nodiscard]] std::shared_ptr<const Reading> finish(std::shared_ptr<void> lease = nullptr);

 private:
  std::map<std::string, Channel> known_;
  std::map<std::string, Channel> added_;
  std::vector<Channel> channels_;
  std::vector<std::uint64_t> values_;
  std::shared_ptr<const ChannelList> list_;  // of the latest reading
};

}  // namespace halvox::platform::linux_
