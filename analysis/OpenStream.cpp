#include "analysis/OpenStream.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "analysis/XrunFigures.h"

#include "platform/linux/base/Utf8.h"

namespace halvox::analysis {
namespace {

constexpr std::string_view kStampKey = "hvreporting_timestamp";
constexpr std::string_view kUptimeKey = "processuptime_ms";
constexpr std::string_view kFormatKey = "session_selected_format";
constexpr std::string_view kDevicesKey = "active_devices";
constexpr std::string_view kDeviceNamesKey = "device_node_names";
constexpr std::string_view kVolumeKey = "RQSessionVolume";
constexpr std::string_view kPlayingKey = "RQSessionVolumePlayingState";
constexpr double kMillisecondsPerSecond = 1000;

std::string storyText(std::string_view text) {
  return std::string(platform::linux_::utf8Prefix(text, kLongestStoryText));
}

bool isStampLike(double time) { return std::isfinite(time) && time > 0; }

// The direction in which a stream of this category runs; none if the category, whatever its domain,
// is not about running.
std::optional<StreamDirection> directionOf(std::string_view category) {
  const std::size_t domain = category.rfind('_');
  if (domain != std::string_view::npos) category.remove_prefix(domain + 1);
  if (category == "Playback" || category == "Output") return StreamDirection::kPlayback;
  if (category == "Record" || category == "Input") return StreamDirection::kCapture;
  if (category == "PlaybackAndRecord") return StreamDirection::kBoth;
  return std::nullopt;
}

// Records a change unless the value is the same as before. Beyond the bound, changes are only
// counted. Returns true if the value has changed.
bool addChange(std::vector<StreamChange>& changes, std::uint64_t& notKept, StreamChange change) {
  if (!changes.empty() && changes.back().text == change.text &&
      changes.back().names == change.names) {
    return false;
  }
  if (changes.size() < kMostStoryChanges) {
    changes.push_back(std::move(change));
  } else {
    ++notKept;
  }
  return true;
}

// A count of samples. A number that is out of range is a client's mistake.
std::int64_t count(const Payload& payload, std::string_view key) {
  constexpr std::int64_t kMost = std::int64_t{1} << 40U;
  return std::clamp<std::int64_t>(payload.integer(key).value_or(0), 0, kMost);
}

}  // namespace

OpenStream::OpenStream(const Message& first, const StreamBuilder::MomentCallback& onMoment)
    : onMoment_(onMoment) {
  story_.id = first.id;
  story_.started = first.time;
  story_.ended = first.time;
}

void OpenStream::report(StreamMoment::Kind kind, const Message& message) {
  if (!onMoment_) return;
  StreamMoment moment;
  moment.kind = kind;
  moment.time = last_.stamp;
  moment.messageID = message.id;
  report(moment);
}

void OpenStream::report(const StreamMoment& moment) const {
  if (onMoment_) onMoment_(story_, moment);
}

void OpenStream::add(const Message& message, const Payload& payload) {
  const double stamp = payload.number(kStampKey).value_or(message.time);
  Moment now{.stamp = isStampLike(stamp) ? stamp : message.time};
  if (const auto uptime = payload.number(kUptimeKey)) now.uptime = *uptime / kMillisecondsPerSecond;
  describe(message);
  if (story_.messages++ == 0) {
    last_ = now;
    story_.started = now.stamp;
    report(StreamMoment::Kind::kBegan, message);
  }
  advanceTo(now);
  if (const auto direction = directionOf(message.category)) {
    if (story_.direction == StreamDirection::kUnknown) story_.direction = *direction;
    if (message.type == "Start" || message.type == "Stop") {
      return onRun(message, message.type == "Start");
    }
  }
  if (isXrun(message.type, payload)) return onXrun(message, payload);
  // One message may have several of these keys.
  const bool hasState =
      payload.text(kFormatKey) || payload.text(kDevicesKey) || payload.has(kVolumeKey);
  if (hasState && message.type != "Summary") {
    onFormat(message, payload);
    onRoute(message, payload);
    onVolume(message, payload);
  } else if (onMoment_) {
    StreamMoment moment;
    moment.time = last_.stamp;
    moment.messageID = message.id;
    moment.text = message.category + " " + message.type;
    report(moment);
  }
}

void OpenStream::describe(const Message& message) {
  if (!message.application.empty() && message.application != story_.application) {
    story_.application = storyText(message.application);
  }
  if (!message.service.empty() && message.service != story_.service) {
    story_.service = storyText(message.service);
  }
}

// Counts the time since the last message for all that was in force meanwhile.
void OpenStream::advanceTo(const Moment& now) {
  // The clocks of a machine drift by less than this, and its messages arrive within a second.
  constexpr double kTolerance = 1;
  constexpr double kDrift = 0.001;
  double seconds = now.stamp - last_.stamp;
  if (now.uptime && last_.uptime) {
    const double byUptime = *now.uptime - *last_.uptime;
    if (std::abs(seconds - byUptime) > kTolerance + kDrift * std::abs(byUptime)) {
      seconds = byUptime;
    }
  }
  seconds = std::max(0.0, seconds);
  if (runs()) story_.ranSeconds += seconds;
  if (isPlaying_ && volume_) addVolumeTime(seconds);
  last_.stamp = now.stamp;
  if (now.uptime) last_.uptime = now.uptime;
  story_.ended = now.stamp;
}

void OpenStream::addVolumeTime(double seconds) {
  const auto known = std::ranges::find(story_.volumes, *volume_, &VolumeTime::volume);
  if (known != story_.volumes.end()) {
    known->seconds += seconds;
  } else if (story_.volumes.size() < kMostStoryVolumes) {
    story_.volumes.push_back({.volume = *volume_, .seconds = seconds});
  } else {
    story_.otherVolumeSeconds += seconds;
  }
}

void OpenStream::onRun(const Message& message, bool starts) {
  isInRun_ = starts;
  hasStarted_ = hasStarted_ || starts;
  // A client that stops plays no longer, whether or not it reports that.
  if (!starts) isPlaying_ = false;
  report(starts ? StreamMoment::Kind::kStart : StreamMoment::Kind::kStop, message);
}

void OpenStream::onXrun(const Message& message, const Payload& payload) {
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kXrun;
  moment.time = last_.stamp;
  moment.messageID = message.id;
  StreamMoment::Xrun& xrun = moment.xrun;
  const XrunFigures figures = xrunFigures(payload);
  xrun.milliseconds = figures.milliseconds;
  xrun.missedCycles = figures.missedCycles;
  const std::string_view role = payload.text("xrun_role").value_or(std::string_view());
  XrunTotals& totals = story_.xruns;
  ++totals.reports;
  totals.missedCycles += xrun.missedCycles;
  totals.milliseconds += xrun.milliseconds;
  totals.asCulprit += role == "culprit" ? 1 : 0;
  totals.asVictim += role == "victim" ? 1 : 0;
  totals.byDevice += role == "device" ? 1 : 0;
  if (!onMoment_) return;
  const auto text = [&](std::string_view key) {
    return storyText(payload.text(key).value_or(std::string_view()));
  };
  xrun.quantum = count(payload, "quantum");
  xrun.rate = count(payload, "rate");
  xrun.role = storyText(role);
  xrun.device = text("device_node_name");
  xrun.lateNode = text("late_node");
  xrun.lateProcess = text("late_process");
  xrun.lateObjectSerial = payload.integer("late_object_serial");
  report(moment);
}

void OpenStream::onVolume(const Message& message, const Payload& payload) {
  if (!payload.has(kVolumeKey)) return;
  // The service counts a volume that is not a number as 0, too.
  const auto volume = payload.number(kVolumeKey).value_or(0);
  const bool plays = payload.number(kPlayingKey).value_or(0) != 0;
  const bool isChange = volume_ != volume || isPlaying_ != plays;
  volume_ = volume;
  isPlaying_ = plays;
  if (!isChange || !onMoment_) return;
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kVolume;
  moment.time = last_.stamp;
  moment.messageID = message.id;
  moment.volume = volume;
  moment.playing = plays;
  report(moment);
}

void OpenStream::onFormat(const Message& message, const Payload& payload) {
  const auto format = payload.text(kFormatKey);
  if (!format) return;
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kFormat;
  moment.time = last_.stamp;
  moment.messageID = message.id;
  moment.text = storyText(*format);
  const bool isChange = addChange(story_.formats, story_.formatsNotKept,
                                  {.time = moment.time, .text = moment.text, .names = {}});
  if (isChange) report(moment);
}

void OpenStream::onRoute(const Message& message, const Payload& payload) {
  const auto devices = payload.text(kDevicesKey);
  if (!devices) return;
  std::string names;
  payload.forEachText(kDeviceNamesKey, [&](std::string_view name) {
    if (names.size() > kLongestStoryText) return;
    names.append(names.empty() ? "" : ", ").append(name);
  });
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kRoute;
  moment.time = last_.stamp;
  moment.messageID = message.id;
  moment.text = storyText(*devices);
  moment.names = storyText(names);
  const bool isChange =
      addChange(story_.routes, story_.routesNotKept,
                {.time = moment.time, .text = moment.text, .names = moment.names});
  if (isChange) report(moment);
}

void OpenStream::end(StreamEnd end, double time) {
  // A story never ends before its last message, although the clock may have been set back since.
  if (time > last_.stamp) {
    const std::optional<double> uptime =
        last_.uptime ? std::optional(*last_.uptime + time - last_.stamp) : std::nullopt;
    advanceTo({.stamp = time, .uptime = uptime});
  }
  story_.end = end;
  StreamMoment moment;
  moment.kind = StreamMoment::Kind::kEnded;
  moment.time = story_.ended;
  report(moment);
}

}  // namespace halvox::analysis
