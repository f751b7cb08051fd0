#include "tools/top/DeviceSampler.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace halvox::tools {
namespace {

using platform::IOReportChannel;
using platform::IOReportFormat;
using platform::IOReportService;

using Devices = std::map<std::string, DeviceReading, std::less<>>;

// The device of a channel. A sound card has channels for both directions under one driver.
std::optional<std::string> deviceOf(const IOReportChannel& channel) {
  if (!channel.driverName || channel.driverName->empty()) return std::nullopt;
  std::string device(*channel.driverName);
  if (channel.channelName != "frames") return device;
  if (channel.group == "Tx") return device + " (playback)";
  if (channel.group == "Rx") return device + " (capture)";
  return device;
}

// The seconds in one unit of a channel; 0 if the unit is not one of time.
double secondsOf(std::string_view unit) {
  if (unit == "ns") return 1e-9;
  if (unit == "us") return 1e-6;
  if (unit == "ms") return 1e-3;
  return unit == "s" ? 1 : 0;
}

// The time in a histogram, by the middle of each bucket. Nothing is known about where in its bucket
// a value was.
double busySeconds(const IOReportChannel& channel) {
  double sum = 0;
  for (const auto& bucket : channel.buckets) {
    const auto lower = static_cast<double>(bucket.lower);
    const bool isOpen = bucket.upper == platform::kIOReportNoUpperBound;
    const double middle = isOpen ? lower : (lower + static_cast<double>(bucket.upper)) / 2;
    sum += middle * static_cast<double>(bucket.hits);
  }
  return sum * secondsOf(channel.unitLabel);
}

std::uint64_t countOf(const IOReportChannel& channel) {
  return channel.integerValue < 0 ? 0 : static_cast<std::uint64_t>(channel.integerValue);
}

void takeCount(const IOReportChannel& channel, Devices& devices) {
  const auto device = deviceOf(channel);
  if (!device || !channel.channelName) return;
  const std::string_view name = *channel.channelName;
  if (channel.format == IOReportFormat::kHistogram) {
    if (name == "busy time") devices[*device].busySeconds = busySeconds(channel);
    return;
  }
  if (channel.format != IOReportFormat::kSimple) return;
  if (name == "cycles") devices[*device].cycles = countOf(channel);
  if (name == "xruns") devices[*device].xruns = countOf(channel);
  // The counter of a card that does not run says nothing.
  if (name == "frames" && channel.integerValue > 0) devices[*device].frames = countOf(channel);
}

void takeGauge(const IOReportChannel& channel, Devices& devices) {
  if (channel.format != IOReportFormat::kSimple || !channel.channelName) return;
  const bool isQuantum = *channel.channelName == "quantum";
  if ((!isQuantum && *channel.channelName != "rate") || channel.integerValue <= 0) return;
  const auto device = deviceOf(channel);
  if (!device) return;
  DeviceReading& reading = devices[*device];
  (isQuantum ? reading.quantum : reading.rate) = channel.integerValue;
}

}  // namespace

std::vector<DeviceReading> DeviceSampler::read() {
  std::optional<platform::IOReportError> error;  // the sources log their own
  // Asked anew each time, because a subscription never gets the channels of a device that appears.
  IOReportService::Channels channels =
      service_.IOReportCopyChannelsInGroup(std::nullopt, std::nullopt, error);
  const auto subscription = service_.IOReportCreateSubscription(channels, channels, error);
  IOReportService::Samples samples =
      service_.IOReportCreateSamples(subscription, channels, *service_.makeMoment(), error);
  Devices devices;
  const auto visit = [&](const IOReportService::Samples& visited, auto take) {
    if (visited == nullptr) return;
    service_.IOReportIterate(visited, [&](const IOReportChannel& channel) {
      take(channel, devices);
      return 0;
    });
  };
  visit(samples, takeGauge);
  visit(service_.IOReportCreateSamplesDelta(last_, samples, error), takeCount);
  last_ = std::move(samples);
  std::vector<DeviceReading> readings;
  readings.reserve(devices.size());
  for (auto& [name, reading] : devices) {
    reading.name = name;
    readings.push_back(std::move(reading));
  }
  return readings;
}

}  // namespace halvox::tools
