#pragma once

#include <map>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// Puts a source's readings together and keeps the identity of its channels from one reading to the
// next: the same name and the same description give the same channel, and as long as the channels
// are the same, readings share their list. A channel that is not in a reading is forgotten.
// Belongs to the source's thread.
class ReadingMaker {
 public:
  using Channel = ChannelList::Channel;

  // Adds a channel that the source knows under that name.
  void add(const std::string& name, ChannelDescription description,
           std::span<const std::uint64_t> values);
  // Adds a channel whose identity the source keeps itself.
  void add(Channel channel, std::span<const std::uint64_t> values);
  // The reading of all that was added since the last one; it holds the lease. Never null.
  [[nodiscard]] std::shared_ptr<const Reading> finish(std::shared_ptr<void> lease = nullptr);

 private:
  std::map<std::string, Channel> known_;
  std::map<std::string, Channel> added_;
  std::vector<Channel> channels_;
  std::vector<std::uint64_t> values_;
  std::shared_ptr<const ChannelList> list_;  // of the last reading
};

}  // namespace halvox::platform::linux_
