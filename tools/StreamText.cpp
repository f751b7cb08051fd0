#include "tools/StreamText.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <string_view>

#include "tools/JsonText.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

using analysis::StreamChange;
using analysis::StreamEnd;
using analysis::StreamMoment;
using analysis::StreamStory;
using analysis::XrunTotals;

constexpr const char* kNothing = "-";
constexpr const char* kThen = " → ";
constexpr std::size_t kUpToSeconds = 19;  // of "2026-11-21 22:44:05.123"

template <typename... Values>
std::string formatted(const char* format, Values... values) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), format, values...);
  return text.data();
}

std::string orNothing(const std::string& text) {
  return text.empty() ? kNothing : harmlessText(text);
}

std::string joined(const std::vector<StreamChange>& changes, std::uint64_t notKept) {
  std::string text;
  std::string_view last;
  for (const StreamChange& change : changes) {
    // A route may change its node names alone.
    if (!text.empty() && change.text == last) continue;
    last = change.text;
    text += (text.empty() ? "" : kThen) + harmlessText(change.text);
  }
  if (notKept > 0) text += kThen + formatted("%llu more", static_cast<unsigned long long>(notKept));
  return text.empty() ? kNothing : text;
}

std::string volumeText(double volume) {
  return volume == 0 ? std::string("muted") : formatted("%.2f", volume);
}

std::string volumesText(const StreamStory& story) {
  const double unknown = analysis::unknownVolumeSeconds(story);
  std::vector<std::pair<std::string, double>> parts;
  for (const auto& time : story.volumes) parts.emplace_back(volumeText(time.volume), time.seconds);
  if (story.otherVolumeSeconds > 0) parts.emplace_back("others", story.otherVolumeSeconds);
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

// "; 2 because it was late, 1 because another stream was late"
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

std::string number(double value) { return toJson(platform::Value(value)); }

std::string changesJson(const std::vector<StreamChange>& changes, const char* name,
                        const char* namesName) {
  std::string json = "[";
  for (const StreamChange& change : changes) {
    json += (json.size() == 1 ? "" : ",");
    json += "{\"time\":" + number(change.time) + ",\"" + name + "\":" + tools::quoted(change.text);
    if (namesName != nullptr) {
      json += std::string(",\"") + namesName + "\":" + tools::quoted(change.names);
    }
    json += "}";
  }
  return json + "]";
}

std::string volumesJson(const StreamStory& story) {
  std::string json = "[";
  for (const auto& time : story.volumes) {
    json += (json.size() == 1 ? "" : ",");
    json += "{\"volume\":" + number(time.volume) + ",\"seconds\":" + number(time.seconds) + "}";
  }
  return json + "]";
}

std::string xrunsJson(const XrunTotals& xruns) {
  return "{\"reports\":" + std::to_string(xruns.reports) +
         ",\"missed_cycles\":" + std::to_string(xruns.missedCycles) +
         ",\"milliseconds\":" + number(xruns.milliseconds) +
         ",\"as_culprit\":" + std::to_string(xruns.asCulprit) +
         ",\"as_victim\":" + std::to_string(xruns.asVictim) +
         ",\"by_device\":" + std::to_string(xruns.byDevice) + "}";
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
          joined(story.routes, story.routesNotKept),
          durationText(story.ranSeconds),
          volumesText(story),
          joined(story.formats, story.formatsNotKept),
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
  if (story.volumes.size() > 1) text += "Volumes: " + volumesText(story) + ".\n";
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
  const auto optional = [](const std::optional<std::int64_t>& value) {
    return value ? std::to_string(*value) : std::string("null");
  };
  const bool hasEnded = story.end != StreamEnd::kStillRunning;
  std::string json = "{\"id\":" + std::to_string(story.id);
  json += ",\"session_id\":" + optional(story.sessionID);
  json += ",\"object_serial\":" + optional(story.objectSerial);
  json += ",\"application\":" + tools::quoted(story.application);
  json += ",\"service\":" + tools::quoted(story.service);
  json += ",\"direction\":" + tools::quoted(analysis::directionName(story.direction));
  json += ",\"started\":" + number(story.started);
  json += ",\"ended\":" + (hasEnded ? number(story.ended) : "null");
  json += ",\"end\":" + tools::quoted(analysis::endName(story.end));
  json += ",\"ran_seconds\":" + number(story.ranSeconds);
  json += ",\"volumes\":" + volumesJson(story);
  json += ",\"other_volume_seconds\":" + number(story.otherVolumeSeconds);
  json += ",\"unknown_volume_seconds\":" + number(analysis::unknownVolumeSeconds(story));
  json += ",\"formats\":" + changesJson(story.formats, "format", nullptr);
  json += ",\"routes\":" + changesJson(story.routes, "devices", "device_node_names");
  json += ",\"xruns\":" + xrunsJson(story.xruns);
  json += ",\"messages\":" + std::to_string(story.messages);
  if (momentsNotShown) json += ",\"moments_not_shown\":" + std::to_string(*momentsNotShown);
  json += "}";
  return harmlessJson(json);
}

std::string momentJson(const StreamMoment& moment) {
  std::string json = "{\"time\":" + number(moment.time);
  json += ",\"moment\":" + tools::quoted(momentName(moment.kind));
  json += ",\"message_id\":" + std::to_string(moment.messageID);
  switch (moment.kind) {
    case StreamMoment::Kind::kFormat:
    case StreamMoment::Kind::kMessage:
      json += ",\"text\":" + tools::quoted(moment.text);
      break;
    case StreamMoment::Kind::kRoute:
      json += ",\"devices\":" + tools::quoted(moment.text);
      json += ",\"device_node_names\":" + tools::quoted(moment.names);
      break;
    case StreamMoment::Kind::kVolume:
      json += ",\"volume\":" + number(moment.volume);
      json += std::string(",\"playing\":") + (moment.playing ? "true" : "false");
      break;
    case StreamMoment::Kind::kXrun:
      json += ",\"milliseconds\":" + number(moment.xrun.milliseconds);
      json += ",\"missed_cycles\":" + std::to_string(moment.xrun.missedCycles);
      json += ",\"quantum\":" + std::to_string(moment.xrun.quantum);
      json += ",\"rate\":" + std::to_string(moment.xrun.rate);
      json += ",\"role\":" + tools::quoted(moment.xrun.role);
      json += ",\"device\":" + tools::quoted(moment.xrun.device);
      json += ",\"late_node\":" + tools::quoted(moment.xrun.lateNode);
      json += ",\"late_process\":" + tools::quoted(moment.xrun.lateProcess);
      json +=
          ",\"late_object_serial\":" +
          (moment.xrun.lateObjectSerial ? std::to_string(*moment.xrun.lateObjectSerial) : "null");
      break;
    case StreamMoment::Kind::kBegan:
    case StreamMoment::Kind::kStart:
    case StreamMoment::Kind::kStop:
    case StreamMoment::Kind::kEnded:
      break;
  }
  return harmlessJson(json + "}");
}

}  // namespace halvox::tools
