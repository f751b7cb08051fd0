#include "tools/Drivers.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <iostream>
#include <mutex>
#include <set>
#include <string>
#include <variant>

#include <poll.h>

#include "platform/linux/drivers/ConfiguredSources.h"
#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::IOReportChannel;
using platform::IOReportFormat;
using platform::IOReportService;

// Prints errors of the sources as errors of this program. Any thread.
class ErrorLog final : public platform::LogCategory {
 public:
  ErrorLog() : LogCategory(platform::LogLevel::kError) {}
  void write(platform::LogLevel /*level*/, std::string_view line) override {
    constexpr std::size_t kPrefix = 32;  // the unit and its line
    // Locked, because sources log on threads of their own.
    const std::lock_guard lock(mutex_);
    std::cerr << "halvoxctl drivers: " << harmlessText(line.substr(std::min(kPrefix, line.size())))
              << std::endl;
  }

 private:
  std::mutex mutex_;
};

std::string numberText(double value) { return toJson(platform::Value(value)); }

template <typename Number>
std::string count(Number value, std::optional<double> seconds) {
  return seconds ? numberText(static_cast<double>(value) / *seconds) : std::to_string(value);
}

// A rate for people, with no more digits than the measured time justifies.
std::string rateText(double rate) {
  constexpr double kNoFractionFrom = 1000;
  constexpr double kThreeDecimals = 1000;
  if (std::abs(rate) >= kNoFractionFrom) return shortNumber(std::round(rate));
  return shortNumber(std::round(rate * kThreeDecimals) / kThreeDecimals);
}

template <typename Number>
std::string shownCount(Number value, std::optional<double> seconds) {
  return seconds ? rateText(static_cast<double>(value) / *seconds) : std::to_string(value);
}

std::string textOf(const IOReportChannel& channel, std::optional<double> seconds) {
  if (channel.format == IOReportFormat::kSimple) {
    return " " + shownCount(channel.integerValue, seconds);
  }
  std::string text;
  for (const auto& state : channel.states) {
    // Only what has counts is shown to people. JSON has all states and buckets, so that a program
    // finds the same fields in each line.
    if (state.inTransitions == 0 && state.residency == 0) continue;
    text += " " + harmlessText(state.name) + "=" + shownCount(state.residency, seconds) + "(" +
            shownCount(state.inTransitions, seconds) + "x)";
  }
  for (const auto& bucket : channel.buckets) {
    if (bucket.hits == 0) continue;
    const bool isOpen = bucket.upper == platform::kIOReportNoUpperBound;
    text += " " + std::to_string(bucket.lower) + "-" +
            (isOpen ? "+Inf" : std::to_string(bucket.upper)) + ":" +
            shownCount(bucket.hits, seconds);
  }
  return text.empty() ? " 0" : text;
}

std::string textLine(const IOReportChannel& channel, std::optional<double> seconds) {
  std::string line;
  for (const auto& name : {channel.driverName, channel.group, channel.subGroup}) {
    line += (name ? harmlessText(*name) : "-") + "  ";
  }
  line += channel.channelName ? harmlessText(*channel.channelName) : "-";
  line += " " + textOf(channel, seconds);
  if (!channel.unitLabel.empty()) line += " " + harmlessText(channel.unitLabel);
  return seconds ? line + "/s" : line;
}

std::string statesJson(const IOReportChannel& channel, std::optional<double> seconds) {
  std::string json;
  for (const auto& state : channel.states) {
    json += (json.empty() ? "{\"name\":" : ",{\"name\":") + quoted(state.name) +
            ",\"transitions\":" + count(state.inTransitions, seconds) +
            ",\"residency\":" + count(state.residency, seconds) +
            ",\"duty_cycle\":" + numberText(state.dutyCycle) + "}";
  }
  return "\"format\":\"state\",\"states\":[" + json + "]";
}

std::string bucketsJson(const IOReportChannel& channel, std::optional<double> seconds) {
  std::string json;
  for (const auto& bucket : channel.buckets) {
    json += (json.empty() ? "{\"lower\":" : ",{\"lower\":") + std::to_string(bucket.lower) +
            ",\"upper\":" + std::to_string(bucket.upper) +
            ",\"hits\":" + count(bucket.hits, seconds) + "}";
  }
  return "\"format\":\"histogram\",\"buckets\":[" + json +
         "],\"min\":" + std::to_string(channel.minValue) +
         ",\"max\":" + std::to_string(channel.maxValue);
}

std::string jsonLine(const IOReportChannel& channel, std::optional<double> seconds) {
  const auto name = [](const std::optional<std::string_view>& text) {
    return text ? quoted(*text) : std::string("null");
  };
  std::string json =
      "{\"driver\":" + name(channel.driverName) + ",\"group\":" + name(channel.group) +
      ",\"subgroup\":" + name(channel.subGroup) + ",\"channel\":" + name(channel.channelName) +
      ",\"unit\":" + quoted(channel.unitLabel) + ",";
  if (seconds) json += "\"seconds\":" + numberText(*seconds) + ",";
  if (channel.format == IOReportFormat::kState) {
    json += statesJson(channel, seconds);
  } else if (channel.format == IOReportFormat::kHistogram) {
    json += bucketsJson(channel, seconds);
  } else {
    json += "\"format\":\"simple\",\"value\":" + count(channel.integerValue, seconds);
  }
  return harmlessJson(json + "}");
}

// Samples the channels that the request selected.
class DriverPrinter {
 public:
  DriverPrinter(IOReportService& service, const ShowDrivers& request, OutputForm form,
                std::ostream& out)
      : service_(service), form_(form), out_(out) {
    std::optional<platform::IOReportError> error;
    IOReportService::Name group;
    if (!request.group.empty()) group = request.group;
    channels_ = service_.IOReportCopyChannelsInGroup(group, std::nullopt, error);
    // Errors are not tested here: the sources log their own errors, and hasChannels() shows whether
    // there is anything to sample.
    subscription_ = service_.IOReportCreateSubscription(channels_, channels_, error);
  }

  [[nodiscard]] bool hasChannels() const { return service_.IOReportGetChannelCount(channels_) > 0; }

  IOReportService::Samples sample() {
    std::optional<platform::IOReportError> error;
    // Each sample has a moment of its own, because samples of one moment have the same values.
    return service_.IOReportCreateSamples(subscription_, channels_, *service_.makeMoment(), error);
  }

  void print(const IOReportService::Samples& samples, std::optional<double> seconds) {
    service_.IOReportIterate(samples, [&](const IOReportChannel& channel) {
      out_ << formatChannel(channel, seconds, form_) << '\n';
      return 0;
    });
    if (seconds && form_ == OutputForm::kText) out_ << '\n';
    out_.flush();
  }

  // Ends when the output is closed.
  void watch(std::chrono::milliseconds interval, int outputDescriptor) {
    using Clock = std::chrono::steady_clock;
    auto before = sample();
    auto time = Clock::now();
    // poll() notices during the pause that the pipe was closed. A write would notice it only after
    // the pause.
    while (out_ && isReadFor(interval, outputDescriptor)) {
      auto now = sample();
      const auto nowTime = Clock::now();
      std::optional<platform::IOReportError> error;
      print(service_.IOReportCreateSamplesDelta(before, now, error),
            std::chrono::duration<double>(nowTime - time).count());
      before = std::move(now);
      time = nowTime;
    }
  }

 private:
  static bool isReadFor(std::chrono::milliseconds time, int descriptor) {
    pollfd output{descriptor, 0, 0};
    // Requests no events, because errors and hang-ups are always reported. This is a pause that
    // ends early when the reader closes the pipe.
    const int polled = poll(&output, 1, static_cast<int>(time.count()));
    return polled <= 0 || (output.revents & (POLLERR | POLLHUP | POLLNVAL)) == 0;
  }

  IOReportService& service_;
  OutputForm form_;
  std::ostream& out_;
  IOReportService::Channels channels_;
  IOReportService::Subscription subscription_;
};

// Returns "the groups are Rx, Tx" for the current channels.
std::string groupsOf(IOReportService& service) {
  std::optional<platform::IOReportError> error;
  auto channels = service.IOReportCopyChannelsInGroup(std::nullopt, std::nullopt, error);
  const auto subscription = service.IOReportCreateSubscription(channels, channels, error);
  std::set<std::string> groups;
  service.IOReportIterate(
      service.IOReportCreateSamples(subscription, channels, *service.makeMoment(), error),
      [&](const IOReportChannel& channel) {
        if (channel.group) groups.emplace(*channel.group);
        return 0;
      });
  if (groups.empty()) return "there are no channels now";
  std::string list;
  for (const std::string& group : groups) list += (list.empty() ? "" : ", ") + group;
  return (groups.size() == 1 ? "the only group is " : "the groups are ") + list;
}

}  // namespace

std::string formatChannel(const IOReportChannel& channel, std::optional<double> seconds,
                          OutputForm form) {
  return form == OutputForm::kJson ? jsonLine(channel, seconds) : textLine(channel, seconds);
}

ExitStatus showDrivers(const ShowDrivers& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors) {
  const Complaint complain("drivers", form, out, errors);
  const auto configuration = serviceConfiguration(complain);
  if (const auto* status = std::get_if<ExitStatus>(&configuration)) return *status;
  ErrorLog errorLog;
  // The sources need a place to count what they refuse, although nobody reads the counters of this
  // program.
  platform::linux_::CounterStatisticsService statistics;
  platform::linux_::LinuxIOReportService service(
      platform::linux_::makeDriverSources(
          std::get<platform::linux_::Configuration>(configuration).drivers, errorLog),
      errorLog, statistics);
  service.open();
  DriverPrinter printer(service, request, form, out);
  if (!request.group.empty() && !printer.hasChannels()) {
    // An empty output would look as if the group had no counts.
    return complain(ExitStatus::kRefused, "nothing to show: there is no group \"" + request.group +
                                              "\"; " + groupsOf(service));
  }
  if (request.watch) {
    printer.watch(*request.watch, outputDescriptor);
  } else {
    printer.print(printer.sample(), std::nullopt);
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
