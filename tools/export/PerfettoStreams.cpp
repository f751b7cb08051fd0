#include "tools/export/PerfettoStreams.h"

#include <algorithm>
#include <functional>

#include "tools/Globs.h"

namespace halvox::tools {
namespace {

using analysis::StreamMoment;
using analysis::StreamStory;
using Annotation = PerfettoTrace::Annotation;
using TrackID = PerfettoTrace::TrackID;
using TrackKind = PerfettoTrace::TrackKind;

constexpr std::string_view kUnknownApplication = "an unknown application";
constexpr std::string_view kOtherApplications = "other applications";
constexpr std::string_view kOfStreams = "stream";
constexpr std::string_view kOfXruns = "xrun";

TrackID streamTrack(const StreamStory& story) {
  return PerfettoTrace::track(TrackKind::kStream, story.id);
}
TrackID volumeTrack(const StreamStory& story) {
  return PerfettoTrace::track(TrackKind::kVolume, story.id);
}

// Tracks of one name in one process are drawn as one, so the name must tell streams apart. It has
// what is known when the stream is first shown.
std::string nameOf(const StreamStory& story) {
  std::string name = "stream " + std::to_string(story.id);
  if (story.objectSerial) name += ", object " + std::to_string(*story.objectSerial);
  if (story.sessionID) name += ", session " + std::to_string(*story.sessionID);
  return name;
}

// Collects annotations; leaves out those that are not known.
class Notes {
 public:
  Notes& add(std::string_view name, std::string_view text) {
    if (!text.empty()) notes_.push_back({name, text});
    return *this;
  }
  Notes& add(std::string_view name, double number) {
    notes_.push_back({name, number});
    return *this;
  }
  Notes& add(std::string_view name, std::int64_t number) {
    notes_.push_back({name, number});
    return *this;
  }
  Notes& add(std::string_view name, std::uint64_t number) {
    return add(name, static_cast<std::int64_t>(number));
  }
  Notes& add(std::string_view name, const std::optional<std::int64_t>& number) {
    return number ? add(name, *number) : *this;
  }
  Notes& addUnlessZero(std::string_view name, std::int64_t number) {
    return number == 0 ? *this : add(name, number);
  }
  [[nodiscard]] PerfettoTrace::Annotations all() const { return notes_; }

 private:
  std::vector<Annotation> notes_;
};

}  // namespace

void PerfettoStreams::onMoment(const StreamStory& story, const StreamMoment& moment) {
  const auto found = open_.try_emplace(story.id).first;
  Open& stream = found->second;
  stream.time = std::max(stream.time, moment.time);
  if (!stream.isShown && isShownNow(story, moment, stream)) show(story, stream);
  follow(story, moment, stream);
}

void PerfettoStreams::onStory(const StreamStory& story) { open_.erase(story.id); }

// A stream is shown with its first moment in the time that was asked for, but not before its
// application is known: a track cannot move to another process. A moment that would be lost, such
// as an xrun, does not wait for that.
bool PerfettoStreams::isShownNow(const StreamStory& story, const StreamMoment& moment,
                                 const Open& stream) const {
  if (selection_.since && stream.time < *selection_.since) return false;
  const bool mustShow =
      moment.kind == StreamMoment::Kind::kXrun || moment.kind == StreamMoment::Kind::kEnded;
  if (story.application.empty() && !mustShow) return false;
  const auto& patterns = selection_.applications;
  return patterns.empty() || matchesAnyGlob(patterns, story.application);
}

void PerfettoStreams::show(const StreamStory& story, Open& stream) {
  stream.isShown = true;
  ++streams_;
  const double earliest = selection_.since.value_or(0);
  const double from = std::max(story.started, earliest);
  trace_.describeTrack(streamTrack(story), processOf(story.application), nameOf(story));
  const std::string_view service = story.service.empty() ? kOfStreams : story.service;
  trace_.beginSlice({.track = streamTrack(story),
                     .time = PerfettoTrace::timeOf(from),
                     .name = service,
                     .category = kOfStreams,
                     .annotations = Notes()
                                        .add("stream", story.id)
                                        .add("application", story.application)
                                        .add("started", story.started)
                                        .all()});
  if (!stream.format.empty()) writeFormat(story, stream, from);
  if (!stream.route.empty()) writeRoute(story, stream, from);
  if (stream.volume) writeVolume(story, stream, from, *stream.volume);
  if (stream.runs()) {
    trace_.beginSlice({.track = streamTrack(story),
                       .time = PerfettoTrace::timeOf(std::max(stream.runsSince, from)),
                       .name = "runs",
                       .category = kOfStreams});
  }
}

void PerfettoStreams::follow(const StreamStory& story, const StreamMoment& moment, Open& stream) {
  const double time = stream.time;
  switch (moment.kind) {
    case StreamMoment::Kind::kBegan:
      break;
    case StreamMoment::Kind::kStart:
      setRuns(story, stream, true, stream.isPlaying);
      break;
    case StreamMoment::Kind::kStop:
      setRuns(story, stream, false, false);
      break;
    case StreamMoment::Kind::kFormat:
      stream.format = moment.text;
      if (stream.isShown) writeFormat(story, stream, time);
      break;
    case StreamMoment::Kind::kRoute:
      stream.route = moment.text;
      stream.routeNames = moment.names;
      if (stream.isShown) writeRoute(story, stream, time);
      break;
    case StreamMoment::Kind::kVolume:
      setRuns(story, stream, stream.isInRun, moment.playing);
      stream.volume = moment.volume;
      if (stream.isShown) writeVolume(story, stream, time, moment.volume);
      break;
    case StreamMoment::Kind::kXrun:
      if (stream.isShown) writeXrun(story, moment, time);
      break;
    case StreamMoment::Kind::kMessage:
      if (!stream.isShown) break;
      trace_.addInstant({.track = streamTrack(story),
                         .time = PerfettoTrace::timeOf(time),
                         .name = moment.text,
                         .category = "message",
                         .annotations = Notes().add("message", moment.messageID).all()});
      break;
    case StreamMoment::Kind::kEnded:
      if (stream.isShown) writeEnd(story, stream);
      break;
  }
}

void PerfettoStreams::setRuns(const StreamStory& story, Open& stream, bool isInRun,
                              bool isPlaying) {
  const bool ran = stream.runs();
  stream.isInRun = isInRun;
  stream.isPlaying = isPlaying;
  if (stream.runs() == ran) return;
  if (!ran) stream.runsSince = stream.time;
  if (!stream.isShown) return;
  if (ran) {
    trace_.endSlice({.track = streamTrack(story), .time = PerfettoTrace::timeOf(stream.time)});
  } else {
    trace_.beginSlice({.track = streamTrack(story),
                       .time = PerfettoTrace::timeOf(stream.time),
                       .name = "runs",
                       .category = kOfStreams});
  }
}

void PerfettoStreams::writeVolume(const StreamStory& story, Open& stream, double time,
                                  double volume) {
  if (!stream.hasCounter) {
    trace_.describeCounter(volumeTrack(story), streamTrack(story), "volume of " + nameOf(story),
                           "linear");
    stream.hasCounter = true;
  }
  trace_.setCounter(volumeTrack(story), PerfettoTrace::timeOf(time), volume);
}

void PerfettoStreams::writeXrun(const StreamStory& story, const StreamMoment& moment, double time) {
  ++xruns_;
  const StreamMoment::Xrun& xrun = moment.xrun;
  trace_.addInstant({.track = streamTrack(story),
                     .time = PerfettoTrace::timeOf(time),
                     .name = kOfXruns,
                     .category = kOfXruns,
                     .annotations = Notes()
                                        .add("milliseconds", xrun.milliseconds)
                                        .addUnlessZero("missed_cycles",
                                                       static_cast<std::int64_t>(xrun.missedCycles))
                                        .addUnlessZero("quantum", xrun.quantum)
                                        .addUnlessZero("rate", xrun.rate)
                                        .add("role", xrun.role)
                                        .add("device", xrun.device)
                                        .add("late_process", xrun.lateProcess)
                                        .add("late_node", xrun.lateNode)
                                        .add("late_object_serial", xrun.lateObjectSerial)
                                        .add("message", moment.messageID)
                                        .all()});
}

void PerfettoStreams::writeRoute(const StreamStory& story, const Open& stream, double time) {
  trace_.addInstant(
      {.track = streamTrack(story),
       .time = PerfettoTrace::timeOf(time),
       .name = "device: " + stream.route,
       .category = "device",
       .annotations =
           Notes().add("devices", stream.route).add("device_node_names", stream.routeNames).all()});
}

void PerfettoStreams::writeFormat(const StreamStory& story, const Open& stream, double time) {
  trace_.addInstant({.track = streamTrack(story),
                     .time = PerfettoTrace::timeOf(time),
                     .name = "format: " + stream.format,
                     .category = "format"});
}

void PerfettoStreams::writeEnd(const StreamStory& story, Open& stream) {
  setRuns(story, stream, false, false);
  // A counter keeps its last value until the end of the trace.
  if (stream.hasCounter) {
    trace_.setCounter(volumeTrack(story), PerfettoTrace::timeOf(stream.time), 0);
  }
  // Most of this may become known only after the beginning. A viewer shows it with the rest.
  trace_.endSlice({.track = streamTrack(story),
                   .time = PerfettoTrace::timeOf(stream.time),
                   .annotations = Notes()
                                      .add("service", story.service)
                                      .add("direction", analysis::directionName(story.direction))
                                      .add("session_id", story.sessionID)
                                      .add("object_serial", story.objectSerial)
                                      .add("end", analysis::endName(story.end))
                                      .add("ran_seconds", story.ranSeconds)
                                      .add("xruns", story.xruns.reports)
                                      .add("xrun_milliseconds", story.xruns.milliseconds)
                                      .add("messages", story.messages)
                                      .all()});
}

// Describes the process for each stream again. That changes nothing in the trace, and nobody has to
// remember which ones were described.
TrackID PerfettoStreams::processOf(const std::string& application) {
  constexpr std::int32_t kOthers = 1;
  constexpr std::int32_t kFirst = 2;
  std::int32_t pid = kOthers;
  const auto found = processes_.find(application);
  if (found != processes_.end()) {
    pid = found->second;
  } else if (processes_.size() < kMostApplications) {
    pid = kFirst + static_cast<std::int32_t>(processes_.size());
    processes_.emplace(application, pid);
  }
  const TrackID process = PerfettoTrace::track(TrackKind::kProcess, pid);
  const std::string_view known = application.empty() ? kUnknownApplication : application;
  trace_.describeProcess(process, pid, pid == kOthers ? kOtherApplications : known);
  return process;
}

}  // namespace halvox::tools
