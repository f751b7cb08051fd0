#include "analysis/StreamBuilder.h"

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include "analysis/OpenStream.h"

namespace halvox::analysis {
namespace {

using ServiceTimes = StreamBuilder::ServiceTimes;

constexpr std::string_view kClientGoneEvent = "com.tarno.halvox.hvreportingclientuptime";
constexpr std::string_view kSerialKey = "object_serial";
// The kernel keeps the first 15 bytes of a program's name.
constexpr std::string_view kReporterProcess = "halvox-pipewire";
constexpr std::string_view kStandalone = "standalone";
constexpr std::int64_t kNoSession = -1;
// The records of a lost connection and of the ends of its sessions are written by different
// threads.
constexpr double kSameMoment = 1;

// True for what the service itself sends at the end of a session. It says nothing new of a stream.
// Some of it has no stamp: its event and its link message cannot be brought together.
bool isEndReport(const Message& message) {
  return message.category == "IOReporting" || message.type == "Summary" ||
         message.type == "Unknown";
}

bool isAnotherProcess(const ServiceTimes& last, const ServiceTimes& now) {
  constexpr double kRounding = 1.1;  // of the difference of two rounded times
  constexpr double kDisorder = 0.1;
  constexpr double kTick = 0.02;  // the kernel counts the start of a process in these
  const double startChange = now.start - last.start;
  if (now.uptime < last.uptime - kDisorder || std::abs(startChange) > 2 * kRounding) return true;
  // The process began after the last message. If only the clock was set, the start by the machine's
  // uptime did not change with it. A process that was younger than a tick at the last message also
  // seems to have begun after it, but its start by the wall clock has not changed.
  const double passed = now.stamp - last.stamp;
  const double wallChange = passed - (now.uptime - last.uptime);
  return wallChange > kTick && now.uptime <= passed + kTick &&
         std::abs(wallChange - startChange) <= kRounding;
}

// True if the stream is, as far as is known, of this application.
bool mayBeOf(const OpenStream& stream, std::string_view application) {
  const std::string_view known = stream.story().application;
  if (application.empty() || known.empty()) return true;
  return stream.isApplicationCut ? application.starts_with(known) : application == known;
}

std::uint64_t programOf(std::string_view application, std::string_view service) {
  const std::hash<std::string_view> hash;
  return hash(application.substr(0, kLongestStoryText)) * 0x9E3779B97F4A7C15U ^ hash(service);
}

}  // namespace

StreamBuilder::StreamBuilder(StoryCallback onStory, MomentCallback onMoment)
    : onStory_(std::move(onStory)),
      onMoment_(std::move(onMoment)),
      join_([this](const Message& message) { onMessage(message); }) {}

StreamBuilder::~StreamBuilder() = default;

void StreamBuilder::onMessage(const Message& message) {
  const double before = std::exchange(lastTime_, message.time);
  payload_.show(message.payload);
  settleUndecided(message.time);
  if (message.category.empty()) {
    if (message.name == kClientGoneEvent) onClientGone(message);
    return;
  }
  noticeRestart(message, before);
  OpenStream* const stream = streamOf(message);
  if (stream == nullptr) return;
  if (message.sessionID && !stream->story().sessionID) {
    stream->setSessionID(*message.sessionID);
    bySession_.insert_or_assign(*message.sessionID, stream);
  }
  if (message.isSummary) {
    endSession(*stream, message);
    return;
  }
  if (isEndReport(message)) return;
  streams_.splice(streams_.end(), streams_, stream->place);
  stream->add(message, payload_);
  if (!message.application.empty()) {
    stream->isApplicationCut = message.application.size() > kLongestStoryText;
  }
  noteProgram(*stream, message);
}

// Each message says when the service's process started: by the wall clock, which may be set, and by
// the machine's uptime, which is rounded to seconds.
void StreamBuilder::noticeRestart(const Message& message, double before) {
  const auto system = payload_.number("systemuptime_sec");
  const auto process = payload_.number("processuptime_ms");
  const auto stamp = payload_.number("hvreporting_timestamp");
  if (!system || !process || !stamp || !message.isEvent) return;
  const double uptime = *process / 1000;
  const ServiceTimes times{.stamp = *stamp, .uptime = uptime, .start = *system - uptime};
  const bool isRestart = service_.has_value() && isAnotherProcess(*service_, times);
  service_ = times;
  // The store does not say when the service ended. It was still running at the record before.
  if (isRestart) closeAll(StreamEnd::kServiceGone, before);
}

OpenStream* StreamBuilder::streamOf(const Message& message) {
  if (message.sessionID == kNoSession) return nullptr;
  const bool mayBegin = !isEndReport(message);
  if (const auto serial = payload_.integer(kSerialKey)) {
    if (OpenStream* const found = findBySerial(*serial, message)) return found;
    if (!mayBegin) return nullptr;
    OpenStream& opened = open(message);
    opened.setSerial(*serial);
    bySerial_.emplace(*serial, &opened);
    return &opened;
  }
  if (message.sessionID) {
    const auto found = bySession_.find(*message.sessionID);
    if (found == bySession_.end()) return mayBegin ? &open(message) : nullptr;
    if (!found->second->undecidedSince || !mayBegin) return found->second;
    // The session was started again.
    close(*found->second, StreamEnd::kStopped, *found->second->undecidedSince);
    return &open(message);
  }
  if (message.service == kStandalone) return nullptr;
  if (OpenStream* const found = findByProgram(message)) return found;
  return mayBegin ? &open(message) : nullptr;
}

OpenStream* StreamBuilder::findBySerial(std::int64_t serial, const Message& message) {
  const auto [begin, end] = bySerial_.equal_range(serial);
  for (auto place = begin; place != end; ++place) {
    OpenStream& stream = *place->second;
    const StreamStory& story = stream.story();
    if (message.sessionID && story.sessionID && message.sessionID != story.sessionID) continue;
    if (!mayBeOf(stream, message.application)) continue;
    // A session that has ended takes no more messages. A first run after another run belongs to
    // another stream, which got the same serial after a restart of PipeWire.
    const bool isFirstRun = message.type == "Start" && payload_.integer("run") == 1;
    if (stream.undecidedSince || (isFirstRun && stream.hasStarted())) {
      close(stream, StreamEnd::kStopped, stream.undecidedSince.value_or(0));
      return nullptr;
    }
    return &stream;
  }
  return nullptr;
}

OpenStream* StreamBuilder::findByProgram(const Message& message) const {
  const auto found = byProgram_.find(programOf(message.application, message.service));
  if (found == byProgram_.end() || found->second->undecidedSince) return nullptr;
  return found->second;
}

OpenStream& StreamBuilder::open(const Message& message) {
  if (streams_.size() == kMostOpen) close(*streams_.front(), StreamEnd::kStillRunning, 0);
  streams_.push_back(std::make_unique<OpenStream>(message, onMoment_));
  streams_.back()->place = std::prev(streams_.end());
  return *streams_.back();
}

void StreamBuilder::endSession(OpenStream& stream, const Message& message) {
  if (stream.undecidedSince) return;
  if (!stream.runs() || stream.saysItPaused()) {
    close(stream, StreamEnd::kStopped, message.time);
  } else if (lastClientGone_ && message.time - *lastClientGone_ <= kSameMoment) {
    close(stream, StreamEnd::kClientGone, message.time);
  } else {
    stream.undecidedSince = message.time;
    undecided_.push_back(&stream);
  }
}

void StreamBuilder::onClientGone(const Message& message) {
  lastClientGone_ = message.time;
  const bool isReporter =
      payload_.text("processName").value_or(std::string_view()).starts_with(kReporterProcess);
  std::vector<OpenStream*> gone;
  for (const auto& stream : streams_) {
    // Without a link, nothing but the end of the reporter's connection marks the end of its
    // sessions.
    const bool isReporters =
        isReporter && stream->story().objectSerial && !stream->story().sessionID;
    if (stream->undecidedSince || isReporters) gone.push_back(stream.get());
  }
  for (OpenStream* const stream : gone) {
    close(*stream, stream->runs() ? StreamEnd::kClientGone : StreamEnd::kStopped,
          stream->undecidedSince.value_or(message.time));
  }
}

void StreamBuilder::settleUndecided(double now) {
  const std::vector<OpenStream*> undecided = undecided_;
  for (OpenStream* const stream : undecided) {
    // The absolute difference also settles streams after the clock was set back.
    if (std::abs(now - *stream->undecidedSince) <= kSameMoment) continue;
    close(*stream, StreamEnd::kStopped, *stream->undecidedSince);
  }
}

void StreamBuilder::close(OpenStream& stream, StreamEnd end, double time) {
  stream.end(end, time);
  const StreamStory& story = stream.story();
  if (story.sessionID) {
    const auto found = bySession_.find(*story.sessionID);
    if (found != bySession_.end() && found->second == &stream) bySession_.erase(found);
  }
  if (story.objectSerial) {
    const auto [begin, last] = bySerial_.equal_range(*story.objectSerial);
    for (auto place = begin; place != last; ++place) {
      if (place->second != &stream) continue;
      bySerial_.erase(place);
      break;
    }
  }
  forgetProgram(stream);
  std::erase(undecided_, &stream);
  onStory_(story);
  streams_.erase(stream.place);
}

void StreamBuilder::noteProgram(OpenStream& stream, const Message& message) {
  // A message that only the link recorded does not name its application.
  if (!message.isEvent) return;
  const std::uint64_t program = programOf(message.application, message.service);
  if (program != stream.program) forgetProgram(stream);
  stream.program = program;
  byProgram_.insert_or_assign(program, &stream);
}

void StreamBuilder::forgetProgram(const OpenStream& stream) {
  const auto found = byProgram_.find(stream.program);
  if (found != byProgram_.end() && found->second == &stream) byProgram_.erase(found);
}

void StreamBuilder::closeAll(StreamEnd end, double time) {
  while (!streams_.empty()) {
    OpenStream& stream = *streams_.front();
    // A session that had ended before did not lose its service.
    if (stream.undecidedSince) {
      close(stream, StreamEnd::kStopped, *stream.undecidedSince);
    } else {
      close(stream, stream.runs() || end != StreamEnd::kServiceGone ? end : StreamEnd::kStopped,
            stream.runs() ? time : 0);
    }
  }
}

void StreamBuilder::settle(double time) {
  join_.deliverBefore(time);
  settleUndecided(time);
}

void StreamBuilder::finish(const Finish& finish) {
  join_.finish();
  settleUndecided(lastTime_ + 2 * kSameMoment);
  // A service that was started anew may not have recorded anything yet.
  const bool isAnother = finish.service && service_ && isAnotherProcess(*service_, *finish.service);
  if (finish.serviceIsGone || isAnother) {
    closeAll(StreamEnd::kServiceGone, lastTime_);
  } else {
    closeAll(StreamEnd::kStillRunning, finish.now.value_or(lastTime_));
  }
}

}  // namespace halvox::analysis
