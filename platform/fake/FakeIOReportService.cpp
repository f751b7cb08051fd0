#include "platform/fake/FakeIOReportService.h"

#include <utility>

namespace halvox::platform {
namespace {

// Channels, subscriptions and samples of the fake are all the name of the group that they are of.
class NamedChannels final : public IOReportChannels {
 public:
  explicit NamedChannels(std::string group) : name(std::move(group)) {}
  const std::string name;
};

class NamedSubscription final : public IOReportSubscription {
 public:
  explicit NamedSubscription(std::string group) : name(std::move(group)) {}
  const std::string name;
};

class NamedSamples final : public IOReportSamples {
 public:
  NamedSamples(std::string group, std::vector<FakeIOReportService::Channel> content)
      : name(std::move(group)), channels(std::move(content)) {}
  const std::string name;
  const std::vector<FakeIOReportService::Channel> channels;
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

void FakeIOReportService::setGroup(std::string_view name, std::vector<Channel> channels) {
  const std::lock_guard lock(mutex_);
  groups_.insert_or_assign(std::string(name), std::move(channels));
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
  if (!groups_.contains(name)) return nullptr;
  return std::make_shared<NamedChannels>(name);
}

std::int32_t FakeIOReportService::IOReportGetChannelCount(const Channels& channels) const {
  const std::lock_guard lock(mutex_);
  return static_cast<std::int32_t>(groups_.at(named<NamedChannels>(channels).name).size());
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

IOReportService::Samples FakeIOReportService::IOReportCreateSamples(
    const Subscription& subscription, const Channels& channels,
    std::optional<IOReportError>& error) {
  const std::string& name = named<NamedSubscription>(subscription).name;
  journal_.note("samples " + named<NamedChannels>(channels).name);
  const std::lock_guard lock(mutex_);
  if (fails(sampleFailures_, name, error)) return nullptr;
  return std::make_shared<NamedSamples>(name, groups_.at(name));
}

IOReportService::Samples FakeIOReportService::IOReportCreateSamplesDelta(
    const Samples& previous, const Samples& current, std::optional<IOReportError>& error) {
  const std::string& name = named<NamedSamples>(current).name;
  journal_.note("delta " + name);
  const std::lock_guard lock(mutex_);
  if (fails(deltaFailures_, name, error) || previous == nullptr) return nullptr;
  return current;
}

void FakeIOReportService::IOReportIterate(const Samples& samples, const Visitor& visitor) const {
  const auto& content = named<NamedSamples>(samples);
  journal_.note("iterate " + content.name);
  for (const Channel& channel : content.channels) {
    if (visitor(channel.view()) != 0) return;
  }
}

}  // namespace halvox::platform
