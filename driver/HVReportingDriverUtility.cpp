#include "driver/HVReportingDriverUtility.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <optional>
#include <utility>

#include "backends/HVReportingTallyhubBridge.h"
#include "backends/HVReportingVocabulary.h"
#include "backends/PrivacyFilter.h"
#include "driver/DriverLog.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"

namespace halvox {
namespace {

using platform::IOReportChannel;
using platform::IOReportError;
using platform::IOReportFormat;
using platform::IOReportService;
using Name = std::optional<std::string_view>;

struct DriverNames {
  Name group;
  Name subGroup;
};

// The channel groups that are reported, in the order of their reports. The list is part of the
// interface; sources on this platform file their channels under these names.
constexpr std::array kDrivers{
    DriverNames{"TarnoQ7AMP", std::nullopt},
    DriverNames{"Speaker", std::nullopt},
    DriverNames{std::nullopt, "MCA"},
    DriverNames{"Haptics", "Stats"},
    DriverNames{"StateTransitionTimes_ms", std::nullopt},
    DriverNames{"Rx", std::nullopt},
    DriverNames{"Tx", std::nullopt},
    DriverNames{std::nullopt, "IOSndFam2"},
};

constexpr std::string_view kSimpleType = "Simple";
constexpr std::string_view kHistogramType = "Histogram";
constexpr std::string_view kStateType = "State";

std::string_view shown(Name name) { return name.value_or("(null)"); }

void logSampleError(const std::optional<IOReportError>& error) {
  if (error.has_value()) kDriverLog.error("IOReportCreateSamples error ", error->code);
}

IOReportService::Samples createSamples(const HVReportingIOChannelSubscription& subscription,
                                       platform::IOReportMoment& moment,
                                       std::optional<IOReportError>& error) {
  return platform::ioReport().IOReportCreateSamples(
      subscription.subscription(), subscription.subscribedChannels(), moment, error);
}

// The change since the snapshot, or null. A failed delta is logged with the text of a failed
// sample; the text is part of the interface.
IOReportService::Samples createDelta(const DriverSnapShot& snapShot, const std::string& description,
                                     const IOReportService::Samples& current) {
  const auto found = snapShot.find(description);
  // Null if the group could not be sampled at the start; then there is no difference.
  const IOReportService::Samples previous = found == snapShot.end() ? nullptr : found->second;
  std::optional<IOReportError> error;
  auto delta = platform::ioReport().IOReportCreateSamplesDelta(previous, current, error);
  if (delta == nullptr) logSampleError(error);
  return delta;
}

// If the session reports one of several streams of a program, its messages say which: an event in
// the store has the application, but not the session.
void addStream(HVReportingDriverUtility::DriverStats& stats, const HVReportingSession& session) {
  static const platform::Key key("object_serial");
  const platform::Dictionary configuration = session.configuration();
  if (const platform::Value* serial = configuration.find(key)) stats.set(key, *serial);
}

void send(HVReportingDriverUtility::DriverStats& stats, AudioEventType type,
          const std::shared_ptr<HVReportingSession>& session) {
  applyPrivacy(stats);
  // Tested before the stream is added, because a stream without statistics is not worth a message.
  if (stats.empty()) return;
  addStream(stats, *session);
  session->sendMessage(stats, AudioEventCategory::kIOReporting, type, nullptr);
  HVReportingTallyhubBridge::handleEvent(stats, AudioEventCategory::kIOReporting, type, session);
}

// Removes what keys use as separators, so that a key has a fixed number of parts.
void appendCleaned(std::string& text, std::string_view part) {
  std::ranges::copy_if(part, std::back_inserter(text),
                       [](char letter) { return letter != '_' && letter != ' '; });
}

void appendKeyPart(std::string& key, Name part) {
  if (!part.has_value()) return;
  appendCleaned(key, *part);
  key += '_';
}

struct HistogramText {
  std::int64_t lower = 0;
  std::int64_t upper = 0;
  std::string buckets;
};

// `lower` never rises above 0 and `upper` never falls below 0; this arithmetic is required. A
// bucket whose bounds cannot be read is not skipped: it takes the bounds of the bucket before it,
// which is required as well.
HistogramText describeBuckets(const IOReportChannel& channel, std::int32_t count) {
  HistogramText text;
  std::int64_t lower = 0;
  std::int64_t upper = 0;
  for (std::int32_t index = 0; index < count; ++index) {
    const auto result = IOReportHistogramGetBucketBounds(channel, index, lower, upper);
    if (result != 0) kDriverLog.info("Error in getting the bucket bounds : ", result);
    text.lower = std::min(text.lower, lower);
    text.upper = std::max(text.upper, upper);
    const std::uint64_t hits = IOReportHistogramGetBucketHits(channel, index);
    // A bucket without hits still widens the bounds above.
    if (hits == 0) continue;
    // The format prints hits as a signed number.
    text.buckets += std::to_string(lower) + "-" + std::to_string(upper) + ":" +
                    std::to_string(static_cast<std::int64_t>(hits)) + ";";
  }
  return text;
}

}  // namespace

HVReportingDriverUtility::HVReportingDriverUtility() {
  kDriverLog.info("creating ioreporting driver utility");
  for (const DriverNames& names : kDrivers) {
    subscribe(HVReportingDriver::driverWithGroupName(names.group, names.subGroup));
  }
}

void HVReportingDriverUtility::subscribe(const HVReportingDriver& driver) {
  const Name group = driver.groupName();
  const Name subGroup = driver.subGroupName();
  IOReportService& reports = platform::ioReport();
  std::optional<IOReportError> error;
  const auto channels = reports.IOReportCopyChannelsInGroup(group, subGroup, error);
  // Logged even if channels came back with the error.
  if (error.has_value()) {
    kDriverLog.error("error ", error->code, " getting channels for driver ", shown(group), "-",
                     shown(subGroup));
  }
  if (channels == nullptr) return;
  if (reports.IOReportGetChannelCount(channels) < 1) {
    kDriverLog.info("couldn't find any channels for driver group ", shown(group), "-",
                    shown(subGroup));
    return;
  }
  HVReportingIOChannelSubscription subscription(driver);
  IOReportService::Channels subscribed;
  error.reset();
  subscription.setSubscription(reports.IOReportCreateSubscription(channels, subscribed, error));
  if (subscribed != nullptr) {
    subscription.setSubscribedChannels(std::move(subscribed));
    ioChannelSubscriptions_.push_back(std::move(subscription));
    // The doubled word is part of the interface.
    kDriverLog.info("subscribed to group group ", shown(group), "-", shown(subGroup));
  } else if (error.has_value()) {
    kDriverLog.error("error ", error->code, " creating subscription for ", shown(group), "-",
                     shown(subGroup));
  }
}

DriverSnapShot HVReportingDriverUtility::getSnapShot() const {
  DriverSnapShot snapShot;
  // All groups share one moment. The drivers are therefore read once, after the session has
  // started.
  const auto moment = platform::ioReport().makeMoment();
  for (const auto& subscription : ioChannelSubscriptions_) {
    std::string description = subscription.driver().description();
    kDriverLog.info("sampling driver ", description);
    std::optional<IOReportError> error;
    if (auto samples = createSamples(subscription, *moment, error)) {
      snapShot.insert_or_assign(std::move(description), std::move(samples));
    } else {
      logSampleError(error);
    }
  }
  return snapShot;
}

void HVReportingDriverUtility::sendDriverLogsForSession(
    const std::shared_ptr<HVReportingSession>& session) const {
  Stats stats;
  const auto snapShot = session->driverSnapShot();
  // All groups share one moment here too. With a reading for each group, the median time of a
  // report was 0.98 ms with 500 channels.
  const auto moment = platform::ioReport().makeMoment();
  for (const auto& subscription : ioChannelSubscriptions_) {
    kDriverLog.info("getting latest samples");
    std::optional<IOReportError> error;
    const auto current = createSamples(subscription, *moment, error);
    kDriverLog.info("done getting latest samples");
    // Sampled even for a session without a snapshot, because an error of the sample must be logged.
    if (current == nullptr) logSampleError(error);
    if (current == nullptr || !snapShot.has_value()) continue;
    const auto delta = createDelta(*snapShot, subscription.driver().description(), current);
    if (delta == nullptr) continue;
    platform::ioReport().IOReportIterate(delta, [&stats](const IOReportChannel& channel) {
      addChannel(channel, stats);
      return 0;
    });
  }
  send(stats.simple, AudioEventType::kSimple, session);
  send(stats.histogram, AudioEventType::kHistogram, session);
  send(stats.state, AudioEventType::kState, session);
}

void HVReportingDriverUtility::addChannel(const IOReportChannel& channel, Stats& stats) {
  const IOReportFormat format = IOReportChannelGetFormat(channel);
  const auto number = static_cast<std::uint32_t>(format);
  switch (format) {
    case IOReportFormat::kSimple:
      return processSimpleData(channel, stats.simple);
    case IOReportFormat::kState:
      return processStateData(channel, stats.state);
    case IOReportFormat::kHistogram:
      return processHistogramData(channel, stats.histogram);
    case IOReportFormat::kInvalid:
    case IOReportFormat::kSimpleArray:
      kDriverLog.debug("Dropping sample of type : ", number,
                       " for group : ", shown(IOReportChannelGetGroup(channel)),
                       " subgroup : ", shown(IOReportChannelGetSubGroup(channel)));
      return;
  }
  // Reached only for a number that no enumerator has: sources may have formats of their own.
  kDriverLog.error("The IOReportingFormat ", number,
                   " is not supported group : ", shown(IOReportChannelGetGroup(channel)),
                   " subgroup : ", shown(IOReportChannelGetSubGroup(channel)));
}

void HVReportingDriverUtility::processSimpleData(const IOReportChannel& channel,
                                                 DriverStats& driverStats) {
  // Zero and negative counts are dropped; this is required.
  const std::int64_t value = IOReportSimpleGetIntegerValue(channel);
  if (value < 1) return;
  driverStats.set(platform::Key(getDriverStatsKey(channel, kSimpleType)), value);
}

void HVReportingDriverUtility::processHistogramData(const IOReportChannel& channel,
                                                    DriverStats& driverStats) {
  const std::int32_t count = IOReportHistogramGetBucketCount(channel);
  HistogramText histogram = describeBuckets(channel, count);
  if (histogram.buckets.empty()) return;
  histogram.buckets.pop_back();  // the last ";"
  std::string text = "count=" + std::to_string(count) +
                     ",lower=" + std::to_string(histogram.lower) +
                     ",upper=" + std::to_string(histogram.upper) +
                     ",min=" + std::to_string(IOReportHistogramGetMinValue(channel)) +
                     ",max=" + std::to_string(IOReportHistogramGetMaxValue(channel)) + ",unit=";
  text += IOReportChannelGetUnitLabel(channel);
  text += "::";
  text += histogram.buckets;
  driverStats.set(platform::Key(getDriverStatsKey(channel, kHistogramType)), text);
}

void HVReportingDriverUtility::processStateData(const IOReportChannel& channel,
                                                DriverStats& driverStats) {
  const platform::Key key(getDriverStatsKey(channel, kStateType));
  // Tested here too, not only before the message is sent, because the value is logged below.
  if (isDropped(key.text())) return;
  std::string text;
  const std::int32_t count = IOReportStateGetCount(channel);
  for (std::int32_t index = 0; index < count; ++index) {
    const std::uint64_t residency = IOReportStateGetResidency(channel, index);
    if (residency == 0) continue;
    text += "name:";
    text += IOReportStateGetNameForIndex(channel, index);
    text += ",transition:" + std::to_string(IOReportStateGetInTransitions(channel, index)) +
            ",residency:" + std::to_string(residency) +
            ",duty_cycle:" + std::to_string(IOReportStateGetDutyCycle(channel, index)) + ";";
  }
  kDriverLog.debug("the current reported data is : ", text);
  // Reported even if the text is empty, so that the receiver sees that the channel exists.
  driverStats.set(key, text);
}

std::string HVReportingDriverUtility::getDriverStatsKey(const IOReportChannel& channel,
                                                        std::string_view type) {
  std::string key;
  if (const Name driver = IOReportChannelGetDriverName(channel)) {
    // What follows the "<" distinguishes instances of one driver. All of them share a key.
    appendKeyPart(key, driver->substr(0, driver->find('<')));
  }
  appendKeyPart(key, IOReportChannelGetGroup(channel));
  appendKeyPart(key, IOReportChannelGetSubGroup(channel));
  key += type;
  key += '_';
  if (const Name name = IOReportChannelGetChannelName(channel)) appendCleaned(key, *name);
  return key;
}

}  // namespace halvox
