#include "tools/export/PerfettoTrace.h"

#include <algorithm>
#include <cmath>

#include <protozero/pbf_builder.hpp>

#include "platform/linux/base/Utf8.h"

namespace halvox::tools {
namespace {

using platform::linux_::replaceInvalidUtf8;

// The numbers of the fields, as in perfetto_trace.proto.
enum class Trace : protozero::pbf_tag_type { kPacket = 1 };
enum class Packet : protozero::pbf_tag_type {
  kClockSnapshot = 6,
  kTimestamp = 8,
  kSequenceID = 10,
  kTrackEvent = 11,
  kSequenceFlags = 13,
  kClockID = 58,
  kTrackDescriptor = 60,
};
enum class Clocks : protozero::pbf_tag_type { kClock = 1, kPrimary = 2 };
enum class Clock : protozero::pbf_tag_type { kID = 1, kTimestamp = 2 };
enum class Track : protozero::pbf_tag_type {
  kUuid = 1,
  kName = 2,
  kProcess = 3,
  kParentUuid = 5,
  kCounter = 8,
};
enum class Process : protozero::pbf_tag_type { kPid = 1, kName = 6 };
enum class Counter : protozero::pbf_tag_type { kUnitName = 6 };
enum class TrackEvent : protozero::pbf_tag_type {
  kAnnotation = 4,
  kType = 9,
  kTrackUuid = 11,
  kCategory = 22,
  kName = 23,
  kDoubleCounterValue = 44,
};
enum class DebugAnnotation : protozero::pbf_tag_type {
  kInteger = 4,
  kDouble = 5,
  kText = 6,
  kName = 10,
};

enum EventType : std::uint8_t { kSliceBegin = 1, kSliceEnd = 2, kInstant = 3, kCounter = 4 };
constexpr std::uint32_t kRealTime = 1;
// Packets refer to earlier ones of the same sequence, of which there is only one here.
constexpr std::uint32_t kSequence = 1;
constexpr std::uint32_t kStateCleared = 1;

std::uint64_t count(PerfettoTrace::Time time) { return static_cast<std::uint64_t>(time.count()); }

using PacketBuilder = protozero::pbf_builder<Packet>;

template <typename Fill>
void addPacket(std::string& text, Fill fill) {
  protozero::pbf_builder<Trace> trace(text);
  PacketBuilder packet(trace, Trace::kPacket);
  packet.add_uint32(Packet::kSequenceID, kSequence);
  fill(packet);
}

template <typename Fill>
void addTrack(std::string& text, PerfettoTrace::TrackID track, Fill fill) {
  addPacket(text, [&](PacketBuilder& packet) {
    protozero::pbf_builder<Track> descriptor(packet, Packet::kTrackDescriptor);
    descriptor.add_uint64(Track::kUuid, static_cast<std::uint64_t>(track));
    fill(descriptor);
  });
}

void addAnnotation(protozero::pbf_builder<TrackEvent>& event,
                   const PerfettoTrace::Annotation& annotation) {
  protozero::pbf_builder<DebugAnnotation> added(event, TrackEvent::kAnnotation);
  added.add_string(DebugAnnotation::kName, annotation.name.data(), annotation.name.size());
  if (const auto* whole = std::get_if<std::int64_t>(&annotation.value)) {
    added.add_int64(DebugAnnotation::kInteger, *whole);
  } else if (const auto* number = std::get_if<double>(&annotation.value)) {
    added.add_double(DebugAnnotation::kDouble, *number);
  } else {
    added.add_string(DebugAnnotation::kText,
                     replaceInvalidUtf8(std::get<std::string_view>(annotation.value)));
  }
}

template <typename Fill>
void addEvent(std::string& text, const PerfettoTrace::Event& event, EventType type, Fill fill) {
  addPacket(text, [&](PacketBuilder& packet) {
    packet.add_uint64(Packet::kTimestamp, count(event.time));
    packet.add_uint32(Packet::kClockID, kRealTime);
    protozero::pbf_builder<TrackEvent> added(packet, Packet::kTrackEvent);
    added.add_enum(TrackEvent::kType, type);
    added.add_uint64(TrackEvent::kTrackUuid, static_cast<std::uint64_t>(event.track));
    if (!event.category.empty()) {
      added.add_string(TrackEvent::kCategory, event.category.data(), event.category.size());
    }
    if (!event.name.empty()) added.add_string(TrackEvent::kName, replaceInvalidUtf8(event.name));
    for (const auto& annotation : event.annotations) addAnnotation(added, annotation);
    fill(added);
  });
}

void addEvent(std::string& text, const PerfettoTrace::Event& event, EventType type) {
  addEvent(text, event, type, [](const auto& /*added*/) {});
}

}  // namespace

PerfettoTrace::Time PerfettoTrace::timeOf(double secondsSince1970) {
  constexpr double kLast = 9.2e9;  // what 63 bits can count
  constexpr double kNanosecondsPerSecond = 1e9;
  if (!(secondsSince1970 > 0)) return {};
  // A double has fewer digits than nanoseconds since 1970. The whole seconds are kept exact.
  const double clamped = std::min(secondsSince1970, kLast);
  const double whole = std::floor(clamped);
  return std::chrono::seconds(static_cast<std::int64_t>(whole)) +
         Time(std::llround((clamped - whole) * kNanosecondsPerSecond));
}

PerfettoTrace::TrackID PerfettoTrace::track(TrackKind kind, std::int64_t number) {
  constexpr unsigned kKindShift = 60;
  constexpr std::uint64_t kNumbers = (std::uint64_t{1} << kKindShift) - 1;
  return TrackID{static_cast<std::uint64_t>(kind) << kKindShift |
                 (static_cast<std::uint64_t>(number) & kNumbers)};
}

void PerfettoTrace::begin(Time time) {
  addPacket(text_, [&](PacketBuilder& packet) {
    packet.add_uint32(Packet::kSequenceFlags, kStateCleared);
    protozero::pbf_builder<Clocks> clocks(packet, Packet::kClockSnapshot);
    {
      protozero::pbf_builder<Clock> clock(clocks, Clocks::kClock);
      clock.add_uint32(Clock::kID, kRealTime);
      clock.add_uint64(Clock::kTimestamp, count(time));
    }
    clocks.add_enum(Clocks::kPrimary, kRealTime);
  });
}

void PerfettoTrace::describeProcess(TrackID track, std::int32_t pid, std::string_view name) {
  addTrack(text_, track, [&](protozero::pbf_builder<Track>& descriptor) {
    protozero::pbf_builder<Process> process(descriptor, Track::kProcess);
    process.add_int32(Process::kPid, pid);
    process.add_string(Process::kName, replaceInvalidUtf8(name));
  });
}

void PerfettoTrace::describeTrack(TrackID track, TrackID parent, std::string_view name) {
  addTrack(text_, track, [&](protozero::pbf_builder<Track>& descriptor) {
    descriptor.add_uint64(Track::kParentUuid, static_cast<std::uint64_t>(parent));
    descriptor.add_string(Track::kName, replaceInvalidUtf8(name));
  });
}

void PerfettoTrace::describeCounter(TrackID track, TrackID parent, std::string_view name,
                                    std::string_view unit) {
  addTrack(text_, track, [&](protozero::pbf_builder<Track>& descriptor) {
    descriptor.add_uint64(Track::kParentUuid, static_cast<std::uint64_t>(parent));
    descriptor.add_string(Track::kName, replaceInvalidUtf8(name));
    protozero::pbf_builder<Counter> counter(descriptor, Track::kCounter);
    counter.add_string(Counter::kUnitName, unit.data(), unit.size());
  });
}

void PerfettoTrace::beginSlice(const Event& event) { addEvent(text_, event, kSliceBegin); }

void PerfettoTrace::endSlice(const Event& event) { addEvent(text_, event, kSliceEnd); }

void PerfettoTrace::addInstant(const Event& event) { addEvent(text_, event, kInstant); }

void PerfettoTrace::setCounter(TrackID track, Time time, double value) {
  addEvent(text_, {.track = track, .time = time}, kCounter,
           [&](protozero::pbf_builder<TrackEvent>& added) {
             added.add_double(TrackEvent::kDoubleCounterValue, value);
           });
}

}  // namespace halvox::tools
