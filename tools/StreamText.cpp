#include "tools/StreamText.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <string_view>

#include "platform/linux/base/Utf8.h"
#include "platform/value.h"
#include "tools/JsonText.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::StreamChange;
using analysis::StreamEnd;
using analysis::StreamMoment;
using analysis::StreamStory;
using analysis::XrunTotals;
using platform::Array;
using platform::Dictionary;
using platform::Value;

constexpr const char* kNothing = "-";
constexpr const char* kThen = " → ";
constexpr std::size_t kUpToSeconds = 19;  // of "2026-11-21 22:44:05.123"
// The volumes, formats and routes that a row shows. One long row makes all rows wide; the story of
// the stream has everything.
constexpr std::size_t kMostInRow = 8;

template <typename... Values>
std::string formatted(const char* format, Values... values) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), format, values...);
  return text.data();
}

std::string orNothing(const std::string& text) {
  return text.empty() ? kNothing : harmlessText(text);
}

// The first `most` values, and how many others came after them.
std::string joined(const std::vector<StreamChange>& changes, std::uint64_t notKept,
                   std::size_t most) {
  std::string text;
  std::string_view last;
  std::size_t shown = 0;
  for (const StreamChange& change : changes) {
    // A route may change its node names alone.
    if (shown > 0 && change.text == last) continue;
    last = change.text;
    if (shown == most) {
      ++notKept;
      continue;
    }
    ++shown;
    text += (text.empty() ? "" : kThen) + harmlessText(change.text);
  }
  if (notKept > 0) text += kThen + formatted("%llu more", static_cast<unsigned long long>(notKept));
  return text.empty() ? kNothing : text;
}

std::string volumeText(double volume) {
  return volume == 0 ? std::string("muted") : formatted("%.2f", volume);
}

// The volumes in the order of first use. Those beyond the first `most` are "others".
std::string volumesText(const StreamStory& story, std::size_t most) {
  const double unknown = analysis::unknownVolumeSeconds(story);
  std::vector<std::pair<std::string, double>> parts;
  double others = story.otherVolumeSeconds;
  for (const auto& time : story.volumes) {
    if (parts.size() < most) {
      parts.emplace_back(volumeText(time.volume), time.seconds);
    } else {
      others += time.seconds;
    }
  }
  if (others > 0) parts.emplace_back("others", others);
  if (parts.empty()) return kNothing;
  if (unknown > 0) parts.emplace_back("unknown", unknown);
  if (parts.size() == 1) return parts.front().first;
  std::string text;
  for (const auto& [volume, seconds] : parts) {
    text += (text.empty() ? "" : ", ") + volume + " " + durationText(seconds);
  }
  return text;
}

std::string xrunsText(const XrunTotals& xruns) {
  if (xruns.reports == 0) return kNothing;
  // Some clients report an xrun without its length.
  if (xruns.milliseconds == 0) return std::to_string(xruns.reports);
  return std::to_string(xruns.reports) + " (" + lostText(xruns.milliseconds) + ")";
}

std::string counted(std::uint64_t number, const char* one, const char* several) {
  return std::to_string(number) + " " + (number == 1 ? one : several);
}

// ": 2 because this stream was late, 1 because another one was late"
std::string rolesText(const XrunTotals& xruns) {
  std::string text;
  const auto add = [&](std::uint64_t number, const char* reason) {
    if (number == 0) return;
    text += (text.empty() ? ": " : ", ") + std::to_string(number) + " " + reason;
  };
  add(xruns.asCulprit, "because this stream was late");
  add(xruns.asVictim, "because another one was late");
  add(xruns.byDevice, "because the device was late");
  return text;
}

std::string endSentence(const StreamStory& story) {
  switch (story.end) {
    case StreamEnd::kStillRunning:
      return "No record shows its end.";
    case StreamEnd::kStopped:
      return "It was stopped.";
    case StreamEnd::kClientGone:
      return "It ended because its client disconnected while it ran.";
    case StreamEnd::kServiceGone:
      return "The service ended while it ran; what happened later is not recorded.";
  }
  return {};
}

std::string xrunSentence(const StreamMoment::Xrun& xrun) {
  std::string text = xrun.milliseconds == 0 ? "It missed cycles, for an unknown time"
                                            : "It lost " + lostText(xrun.milliseconds);
  if (xrun.missedCycles > 0) text += " in " + counted(xrun.missedCycles, "cycle", "cycles");
  if (!xrun.device.empty()) text += " on " + harmlessText(xrun.device);
  if (xrun.quantum > 0 && xrun.rate > 0) {
    text +=
        " (quantum " + std::to_string(xrun.quantum) + " at " + std::to_string(xrun.rate) + " Hz)";
  }
  if (xrun.role == "culprit") {
    text += ": this stream was late";
  } else if (xrun.role == "device") {
    text += ": the device was late";
  } else if (xrun.role == "victim" || !xrun.lateNode.empty()) {
    text +=
        ": " + (xrun.lateNode.empty() ? "another node" : harmlessText(xrun.lateNode)) + " was late";
    if (!xrun.lateProcess.empty()) text += ", of process " + harmlessText(xrun.lateProcess);
    // Tells two streams of one program apart.
    if (xrun.lateObjectSerial) text += ", object " + std::to_string(*xrun.lateObjectSerial);
  }
  return text + ".";
}

const char* momentName(StreamMoment::Kind kind) {
  switch (kind) {
    case StreamMoment::Kind::kBegan:
      return "began";
    case StreamMoment::Kind::kStart:
      return "start";
    case StreamMoment::Kind::kStop:
      return "stop";
    case StreamMoment::Kind::kFormat:
      return "format";
    case StreamMoment::Kind::kRoute:
      return "route";
    case StreamMoment::Kind::kVolume:
      return "volume";
    case StreamMoment::Kind::kXrun:
      return "xrun";
    case StreamMoment::Kind::kMessage:
      return "message";
    case StreamMoment::Kind::kEnded:
      return "ended";
  }
  return "";
}

// Bytes that are not UTF-8 become U+FFFD, because a value must be UTF-8.
Value textValue(std::string_view text) { return Value(platform::linux_::replaceInvalidUtf8(text)); }

Value optionalValue(const std::optional<std::int64_t>& number) {
  return number ? Value(*number) : Value();
}

Array formatValues(const std::vector<StreamChange>& changes) {
  std::vector<Value> values;
  values.reserve(changes.size());
  for (const StreamChange& change : changes) {
    values.emplace_back(Dictionary{{"time", change.time}, {"format", textValue(change.text)}});
  }
  return Array(values);
}

Array routeValues(const std::vector<StreamChange>& changes) {
  std::vector<Value> values;
  values.reserve(changes.size());
  for (const StreamChange& change : changes) {
    values.emplace_back(Dictionary{{"time", change.time},
                                   {"devices", textValue(change.text)},
                                   {"device_node_names", textValue(change.names)}});
  }
  return Array(values);
}

Array volumeValues(const StreamStory& story) {
  std::vector<Value> values;
  values.reserve(story.volumes.size());
  for (const auto& time : story.volumes) {
    values.emplace_back(Dictionary{{"volume", time.volume}, {"seconds", time.seconds}});
  }
  return Array(values);
}

Dictionary xrunValues(const XrunTotals& xruns) {
  return {{"reports", xruns.reports},           {"missed_cycles", xruns.missedCycles},
          {"milliseconds", xruns.milliseconds}, {"as_culprit", xruns.asCulprit},
          {"as_victim", xruns.asVictim},        {"by_device", xruns.byDevice}};
}

void addXrun(Dictionary& json, const StreamMoment::Xrun& xrun) {
  json.set("milliseconds", xrun.milliseconds);
  json.set("missed_cycles", xrun.missedCycles);
  json.set("quantum", xrun.quantum);
  json.set("rate", xrun.rate);
  json.set("role", textValue(xrun.role));
  json.set("device", textValue(xrun.device));
  json.set("late_node", textValue(xrun.lateNode));
  json.set("late_process", textValue(xrun.lateProcess));
  json.set("late_object_serial", optionalValue(xrun.lateObjectSerial));
}

}  // namespace

std::string durationText(double seconds) {
  constexpr std::int64_t kMinute = 60;
  constexpr std::int64_t kHour = 3600;
  // Rounded first: 59.96 s would otherwise be "60.0s".
  const auto tenths = static_cast<std::int64_t>(std::llround(std::clamp(seconds, 0.0, 1e12) * 10));
  if (tenths < kMinute * 10) {
    return std::to_string(tenths / 10) + "." + std::to_string(tenths % 10) + "s";
  }
  const auto whole = static_cast<std::int64_t>(std::llround(std::clamp(seconds, 0.0, 1e12)));
  if (whole < kHour) {
    return formatted("%lldm%02llds", static_cast<long long>(whole / kMinute),
                     static_cast<long long>(whole % kMinute));
  }
  return formatted("%lldh%02lldm%02llds", static_cast<long long>(whole / kHour),
                   static_cast<long long>(whole % kHour / kMinute),
                   static_cast<long long>(whole % kMinute));
}

std::string lostText(double milliseconds) {
  if (milliseconds < 10) return formatted("%.1f ms", milliseconds);
  if (milliseconds < 10'000) return formatted("%.0f ms", milliseconds);
  return formatted("%.1f s", milliseconds / 1000);
}

std::vector<TextTable::Column> streamColumns() {
  using Align = TextTable::Align;
  return {{.heading = "ID", .align = Align::kRight},
          {.heading = "STARTED", .least = kUpToSeconds},
          {.heading = "APP", .least = 8},
          {.heading = "SERVICE", .least = 8, .rank = 7},
          {.heading = "DIRECTION", .rank = 6},
          {.heading = "DEVICE", .least = 8, .rank = 3},
          {.heading = "RAN", .align = Align::kRight, .rank = 1},
          {.heading = "VOLUME", .least = 10, .rank = 5},
          {.heading = "FORMAT", .least = 12, .rank = 8},
          {.heading = "XRUNS", .rank = 2},
          {.heading = "END", .rank = 4}};
}

std::vector<std::string> streamRow(const StreamStory& story) {
  return {std::to_string(story.id),
          localTime(story.started).substr(0, kUpToSeconds),
          orNothing(story.application),
          orNothing(story.service),
          orNothing(std::string(analysis::directionName(story.direction))),
          joined(story.routes, story.routesNotKept, kMostInRow),
          durationText(story.ranSeconds),
          volumesText(story, kMostInRow),
          joined(story.formats, story.formatsNotKept, kMostInRow),
          xrunsText(story.xruns),
          std::string(analysis::endName(story.end))};
}

std::string describeStream(const StreamStory& story) {
  std::string text =
      "Stream " + std::to_string(story.id) + ": " +
      (story.application.empty() ? "an unknown application" : harmlessText(story.application));
  if (!story.service.empty()) text += ", " + harmlessText(story.service);
  if (story.direction != analysis::StreamDirection::kUnknown) {
    text += ", " + std::string(analysis::directionName(story.direction));
  }
  if (story.sessionID) text += ", session " + std::to_string(*story.sessionID);
  if (story.objectSerial) text += ", PipeWire object " + std::to_string(*story.objectSerial);
  text += ".\nIt began at " + localTime(story.started) + " and ran " +
          durationText(story.ranSeconds) + ". " + endSentence(story) + "\n";
  if (story.xruns.reports > 0) {
    const bool isLengthKnown = story.xruns.milliseconds > 0;
    text += "It lost " + (isLengthKnown ? lostText(story.xruns.milliseconds) : "an unknown time") +
            " in " + counted(story.xruns.reports, "xrun", "xruns") + rolesText(story.xruns) + ".\n";
  } else if (story.ranSeconds > 0) {
    text += "No xrun was reported.\n";
  }
  if (story.volumes.size() > 1) {
    text += "Volumes: " + volumesText(story, analysis::kMostStoryVolumes) + ".\n";
  }
  return text;
}

std::string describeMoment(const StreamStory& story, const StreamMoment& moment) {
  switch (moment.kind) {
    case StreamMoment::Kind::kBegan:
      return "The first message.";
    case StreamMoment::Kind::kStart:
      return "It starts.";
    case StreamMoment::Kind::kStop:
      return "It stops.";
    case StreamMoment::Kind::kFormat:
      return "The format is " + harmlessText(moment.text) + ".";
    case StreamMoment::Kind::kRoute:
      return "The device is " + harmlessText(moment.text) +
             (moment.names.empty() ? "" : " (" + harmlessText(moment.names) + ")") + ".";
    case StreamMoment::Kind::kVolume:
      return std::string(moment.playing ? "It plays" : "It does not play") +
             (moment.volume == 0 ? ", muted" : "; the volume is " + volumeText(moment.volume)) +
             ".";
    case StreamMoment::Kind::kXrun:
      return xrunSentence(moment.xrun);
    case StreamMoment::Kind::kMessage:
      return "Another message: " + harmlessText(moment.text) + ".";
    case StreamMoment::Kind::kEnded:
      return endSentence(story);
  }
  return {};
}

std::string streamJson(const StreamStory& story, std::optional<std::size_t> momentsNotShown) {
  const bool hasEnded = story.end != StreamEnd::kStillRunning;
  Dictionary json{{"id", story.id},
                  {"session_id", optionalValue(story.sessionID)},
                  {"object_serial", optionalValue(story.objectSerial)},
                  {"application", textValue(story.application)},
                  {"service", textValue(story.service)},
                  {"direction", analysis::directionName(story.direction)},
                  {"started", story.started},
                  {"ended", hasEnded ? Value(story.ended) : Value()},
                  {"end", analysis::endName(story.end)},
                  {"ran_seconds", story.ranSeconds},
                  {"volumes", volumeValues(story)},
                  {"other_volume_seconds", story.otherVolumeSeconds},
                  {"unknown_volume_seconds", analysis::unknownVolumeSeconds(story)},
                  {"formats", formatValues(story.formats)},
                  {"routes", routeValues(story.routes)},
                  {"xruns", xrunValues(story.xruns)},
                  {"messages", story.messages}};
  if (momentsNotShown) json.set("moments_not_shown", std::uint64_t{*momentsNotShown});
  return harmlessJson(toJson(json));
}

std::string momentJson(const StreamMoment& moment) {
  Dictionary json{
      {"time", moment.time}, {"moment", momentName(moment.kind)}, {"message_id", moment.messageID}};
  switch (moment.kind) {
    case StreamMoment::Kind::kFormat:
    case StreamMoment::Kind::kMessage:
      json.set("text", textValue(moment.text));
      break;
    case StreamMoment::Kind::kRoute:
      json.set("devices", textValue(moment.text));
      json.set("device_node_names", textValue(moment.names));
      break;
    case StreamMoment::Kind::kVolume:
      json.set("volume", moment.volume);
      json.set("playing", moment.playing);
      break;
    case StreamMoment::Kind::kXrun:
      addXrun(json, moment.xrun);
      break;
    case StreamMoment::Kind::kBegan:
    case StreamMoment::Kind::kStart:
    case StreamMoment::Kind::kStop:
    case StreamMoment::Kind::kEnded:
      break;
  }
  return harmlessJson(toJson(json));
}

}  // namespace halvox::tools
