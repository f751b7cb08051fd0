#include "platform/linux/drivers/ReadingMaker.h"

#include <utility>

namespace halvox::platform::linux_ {
namespace {

bool isListOf(const ChannelList& list, const std::vector<ChannelList::Channel>& channels) {
  if (list.size() != channels.size()) return false;
  for (std::size_t index = 0; index < channels.size(); ++index) {
    if (list[index] != channels[index]) return false;
  }
  return true;
}

}  // namespace

void ReadingMaker::add(const std::string& name, ChannelDescription description,
                       std::span<const std::uint64_t> values) {
  const auto found = known_.find(name);
  // If nothing has changed, use the same object as in the last reading, because differences
  // identify channels by address.
  Channel channel = found != known_.end() && *found->second == description
                        ? found->second
                        : std::make_shared<const ChannelDescription>(std::move(description));
  added_.insert_or_assign(name, channel);
  add(std::move(channel), values);
}

void ReadingMaker::add(Channel channel, std::span<const std::uint64_t> values) {
  channels_.push_back(std::move(channel));
  values_.insert(values_.end(), values.begin(), values.end());
}

std::shared_ptr<const Reading> ReadingMaker::finish(std::shared_ptr<void> lease) {
  // Share the list of the last reading. A set of channels can then keep the positions that it has
  // computed.
  if (list_ == nullptr || !isListOf(*list_, channels_)) {
    list_ = std::make_shared<const ChannelList>(channels_);
  }
  // A channel that was missing from one reading gets a new object, and is not compared with its
  // earlier values.
  known_ = std::exchange(added_, {});
  channels_.clear();
  auto reading = std::make_shared<Reading>();
  reading->channels = list_;
  reading->values = values_;
  values_.clear();
  reading->lease = std::move(lease);
  return reading;
}

}  // namespace halvox::platform::linux_
