#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// What is known about one stream or session. Plain values; texts are as clients wrote them, cut at
// kLongestStoryText bytes. Times are seconds since 1970.
namespace halvox::analysis {

constexpr std::size_t kLongestStoryText = 1024;
// Changes and volumes beyond these bounds are counted and not kept, because a client may send
// millions.
constexpr std::size_t kMostStoryChanges = 256;
constexpr std::size_t kMostStoryVolumes = 256;

enum class StreamDirection : std::uint8_t { kUnknown, kPlayback, kCapture, kBoth };

enum class StreamEnd : std::uint8_t {
  kStillRunning,  // no record shows an end
  kStopped,       // the client stopped it, or it had stopped before its session ended
  kClientGone,    // the client disconnected while it ran
  kServiceGone,   // the service ended while it ran
};

// A format or a route, and from when on it was in force.
struct StreamChange {
  double time = 0;
  std::string text;   // a format such as "F32LE 48000 Hz 2 ch", or descriptions of the devices
  std::string names;  // of a route: the devices' node names, joined by ", "; may be empty
};

struct VolumeTime {
  double volume = 0;  // linear; 0 is muted
  double seconds = 0;
};

// What was lost in missed cycles. Every report of an xrun covers all cycles that were missed since
// the one before.
struct XrunTotals {
  std::uint64_t reports = 0;
  std::uint64_t missedCycles = 0;  // 0 if the client does not count them
  double milliseconds = 0;
  // How many of the reports say that the stream was late, that another one was late, and that the
  // device was late. The other reports do not say.
  std::uint64_t asCulprit = 0;
  std::uint64_t asVictim = 0;
  std::uint64_t byDevice = 0;
};

struct StreamStory {
  // The ID of the first message. It does not change while the store keeps that message.
  std::int64_t id = 0;
  std::optional<std::int64_t> sessionID;  // what its client chose; unknown if no link recorded it
  std::optional<std::int64_t> objectSerial;  // of a PipeWire stream
  std::string application;                   // empty if unknown
  std::string service;                       // the name of the service type; empty if unknown
  StreamDirection direction = StreamDirection::kUnknown;

  double started = 0;  // the first message
  double ended = 0;    // its end, or the last moment that is known
  StreamEnd end = StreamEnd::kStillRunning;
  double ranSeconds = 0;  // without pauses

  // The time at each volume while it ran, in the order of first use. The rest of ranSeconds is time
  // at a volume that the client did not report.
  std::vector<VolumeTime> volumes;
  double otherVolumeSeconds = 0;  // at volumes beyond kMostStoryVolumes

  // Each list begins with the first value that the client reported.
  std::vector<StreamChange> formats;
  std::vector<StreamChange> routes;
  std::uint64_t formatsNotKept = 0;
  std::uint64_t routesNotKept = 0;

  XrunTotals xruns;
  std::uint64_t messages = 0;
};

// One thing that happened to a stream.
struct StreamMoment {
  enum class Kind : std::uint8_t {
    kBegan,    // the first message
    kStart,    // it runs
    kStop,     // it pauses or ends
    kFormat,   // `text`
    kRoute,    // `text` has descriptions, `names` node names
    kVolume,   // `volume`, `playing`
    kXrun,     // `xrun`
    kMessage,  // any other message: `text` is its category and type
    kEnded,    // the story's `end` says how
  };
  struct Xrun {
    double milliseconds = 0;
    std::uint64_t missedCycles = 0;  // 0: unknown
    std::int64_t quantum = 0;        // samples; 0: unknown
    std::int64_t rate = 0;           // samples a second; 0: unknown
    std::string role;                // "culprit", "victim", "device", or empty
    std::string device;              // the node name of the device
    std::string lateNode;
    std::string lateProcess;
    std::optional<std::int64_t> lateObjectSerial;
  };

  Kind kind = Kind::kMessage;
  double time = 0;
  std::int64_t messageID = 0;  // the record's; 0 for an end that no record marks
  std::string text;
  std::string names;
  double volume = 0;
  bool playing = false;
  Xrun xrun;
};

// "playback", "capture", "both", or "" if unknown.
[[nodiscard]] std::string_view directionName(StreamDirection direction);
// "still running", "stopped", "client gone", "service gone".
[[nodiscard]] std::string_view endName(StreamEnd end);
// The seconds that it ran before its client reported a volume.
[[nodiscard]] double unknownVolumeSeconds(const StreamStory& story);

}  // namespace halvox::analysis
