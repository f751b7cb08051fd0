#pragma once

#include <cstdint>
#include <list>
#include <memory>
#include <optional>
#include <string_view>

#include "analysis/MessageJoin.h"
#include "analysis/Payload.h"
#include "analysis/StreamBuilder.h"
#include "analysis/StreamStory.h"

namespace halvox::analysis {

// A stream whose story is being made: takes its messages in order. Owned by a StreamBuilder.
class OpenStream {
 public:
  // `onMoment` may be empty, and must outlive this object.
  OpenStream(const Message& first, const StreamBuilder::MomentCallback& onMoment);

  // Takes the next message. `payload` shows the message's payload.
  void add(const Message& message, const Payload& payload);
  // Ends the story. A stream that runs is taken to have run until `time`.
  void end(StreamEnd end, double time);

  [[nodiscard]] const StreamStory& story() const { return story_; }
  [[nodiscard]] bool runs() const { return isInRun_ || isPlaying_; }
  // True if the client's last word on its volume was that it does not play.
  [[nodiscard]] bool saysItPaused() const { return volume_.has_value() && !isPlaying_; }
  // True after a Start.
  [[nodiscard]] bool hasStarted() const { return hasStarted_; }

  void setSessionID(std::int64_t sessionID) { story_.sessionID = sessionID; }
  void setSerial(std::int64_t serial) { story_.objectSerial = serial; }

  // The builder's notes: the place of this stream in the builder's list, its key in the index by
  // program, whether the story has only the beginning of the application's name, and the time at
  // which its session ended. The time is set only if the session ended while the stream ran and the
  // reason is not known yet.
  std::list<std::unique_ptr<OpenStream>>::iterator place{};
  std::uint64_t program = 0;
  bool isApplicationCut = false;
  std::optional<double> undecidedSince{};

 private:
  // A moment by two clocks. The service's uptime is unknown for messages without it.
  struct Moment {
    double stamp = 0;
    std::optional<double> uptime{};
  };

  void describe(const Message& message);
  void advanceTo(const Moment& now);
  void onRun(const Message& message, bool starts);
  void onXrun(const Message& message, const Payload& payload);
  void onVolume(const Message& message, const Payload& payload);
  void onFormat(const Message& message, const Payload& payload);
  void onRoute(const Message& message, const Payload& payload);
  void addVolumeTime(double seconds);
  void report(StreamMoment::Kind kind, const Message& message);
  void report(const StreamMoment& moment) const;

  const StreamBuilder::MomentCallback& onMoment_;  // the builder's
  StreamStory story_;
  Moment last_;
  bool isInRun_ = false;
  bool isPlaying_ = false;
  bool hasStarted_ = false;
  std::optional<double> volume_;
};

}  // namespace halvox::analysis
