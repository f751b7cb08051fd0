#include "platform/fake/FakeIOReportService.h"

#include <algorithm>
#include <utility>

#include "platform/fake/FakeIOReportDelta.h"

namespace halvox::platform {
namespace {

using ChannelList = FakeIOReportService::ChannelList;

// Channels, subscriptions and samples of the fake carry the name of their group.
class NamedChannels final : public IOReportChannels {
 public:
  NamedChannels(std::string group, ChannelList content)
      : name(std::move(group)), channels(std::move(content)) {}
  const std::string name;
  const ChannelList channels;
};

class NamedSubscription final : public IOReportSubscription {
 public:
  explicit NamedSubscription(std::string group) : name(std::move(group)) {}
  const std::string name;
};

class NamedSamples final : public IOReportSamples {
 public:
  NamedSamples(std::string group, ChannelList content)
      : name(std::move(group)), channels(std::move(content)) {}
  const std::string name;
  const ChannelList channels;
};

template <typename Named, typename Pointer>
const Named& named(const Pointer& pointer) {
  return dynamic_cast<const Named&>(*pointer);
}

std::optional<std::string_view> view(const std::optional<std::string>& text) {
  if (!text.has_value()) return std::nullopt;
  return *text;
}

}  // namespace

// The values that all groups had when the first of them was sampled.
class FakeIOReportService::ReadMoment final : public IOReportMoment {
 public:
  std::optional<Groups> groups;
};

IOReportChannel FakeIOReportService::Channel::view() const {
  return {.format = format,
          .driverName = platform::view(driverName),
          .group = platform::view(group),
          .subGroup = platform::view(subGroup),
          .channelName = platform::view(channelName),
          .unitLabel = unitLabel,
          .integerValue = integerValue,
          .states = states,
          .buckets = buckets,
          .minValue = minValue,
          .maxValue = maxValue};
}

void FakeIOReportService::setGroup(std::string_view name, ChannelList channels) {
  const std::lock_guard lock(mutex_);
  groups_.insert_or_assign(std::string(name), std::move(channels));
}

void FakeIOReportService::afterSamples(std::function<void(const std::string& group)> change) {
  const std::lock_guard lock(mutex_);
  afterSamples_ = std::move(change);
}

void FakeIOReportService::failChannels(std::string_view name, Failure failure) {
  const std::lock_guard lock(mutex_);
  channelFailures_.insert_or_assign(std::string(name), failure);
}

void FakeIOReportService::failSubscription(std::string_view name, Failure failure) {
  const std::lock_guard lock(mutex_);
  subscriptionFailures_.insert_or_assign(std::string(name), failure);
}

void FakeIOReportService::failSamples(std::string_view name, Failure failure) {
  const std::lock_guard lock(mutex_);
  sampleFailures_.insert_or_assign(std::string(name), failure);
}

void FakeIOReportService::failDelta(std::string_view name, Failure failure) {
  const std::lock_guard lock(mutex_);
  deltaFailures_.insert_or_assign(std::string(name), failure);
}

void FakeIOReportService::addErrorToChannels(std::string_view name, std::int64_t code) {
  const std::lock_guard lock(mutex_);
  addedErrors_.insert_or_assign(std::string(name), code);
}

bool FakeIOReportService::fails(const Failures& failures, const std::string& name,
                                std::optional<IOReportError>& error) const {
  const auto failure = failures.find(name);
  if (failure == failures.end()) return false;
  if (failure->second.code.has_value()) error = IOReportError{*failure->second.code};
  return true;
}

IOReportService::Channels FakeIOReportService::IOReportCopyChannelsInGroup(
    Name group, Name subGroup, std::optional<IOReportError>& error) {
  const std::string name =
      std::string(group.value_or("(null)")) + "-" + std::string(subGroup.value_or("(null)"));
  journal_.note("channels " + name);
  const std::lock_guard lock(mutex_);
  if (fails(channelFailures_, name, error)) return nullptr;
  if (const auto added = addedErrors_.find(name); added != addedErrors_.end()) {
    error = IOReportError{added->second};
  }
  const auto found = groups_.find(name);
  if (found == groups_.end()) return nullptr;
  return std::make_shared<NamedChannels>(name, found->second);
}

std::int32_t FakeIOReportService::IOReportGetChannelCount(const Channels& channels) const {
  return static_cast<std::int32_t>(named<NamedChannels>(channels).channels.size());
}

IOReportService::Subscription FakeIOReportService::IOReportCreateSubscription(
    const Channels& channels, Channels& subscribedChannels, std::optional<IOReportError>& error) {
  const std::string& name = named<NamedChannels>(channels).name;
  journal_.note("subscription " + name);
  const std::lock_guard lock(mutex_);
  if (fails(subscriptionFailures_, name, error)) return nullptr;
  subscribedChannels = channels;
  return std::make_shared<NamedSubscription>(name);
}

IOReportService::Moment FakeIOReportService::makeMoment() { return std::make_unique<ReadMoment>(); }

IOReportService::Samples FakeIOReportService::IOReportCreateSamples(
    const Subscription& subscription, const Channels& channels, IOReportMoment& moment,
    std::optional<IOReportError>& error) {
  const std::string& name = named<NamedSubscription>(subscription).name;
  const auto& subscribed = named<NamedChannels>(channels);
  journal_.note("samples " + subscribed.name);
  std::unique_lock lock(mutex_);
  if (fails(sampleFailures_, name, error)) return nullptr;
  auto& read = dynamic_cast<ReadMoment&>(moment).groups;
  if (!read.has_value()) read = groups_;
  ChannelList sampled;
  for (const Channel& channel : read->at(name)) {
    const auto isIt = [&channel](const Channel& one) { return areNamedAlike(one, channel); };
    if (std::ranges::any_of(subscribed.channels, isIt)) sampled.push_back(channel);
  }
  const auto change = afterSamples_;
  lock.unlock();
  if (change) change(name);
  return std::make_shared<NamedSamples>(name, std::move(sampled));
}

IOReportService::Samples FakeIOReportService::IOReportCreateSamplesDelta(
    const Samples& previous, const Samples& current, std::optional<IOReportError>& error) {
  const auto& now = named<NamedSamples>(current);
  journal_.note("delta " + now.name);
  const std::lock_guard lock(mutex_);
  if (fails(deltaFailures_, now.name, error) || previous == nullptr) return nullptr;
  return std::make_shared<NamedSamples>(
      now.name, differences(named<NamedSamples>(previous).channels, now.channels));
}

void FakeIOReportService::IOReportIterate(const Samples& samples, const Visitor& visitor) const {
  const auto& content = named<NamedSamples>(samples);
  journal_.note("iterate " + content.name);
  for (const Channel& channel : content.channels) {
    if (visitor(channel.view()) != 0) return;
  }
}

}  // namespace halvox::platform
