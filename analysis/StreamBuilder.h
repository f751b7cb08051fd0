#pragma once

#include <cstdint>
#include <functional>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "analysis/MessageJoin.h"
#include "analysis/Payload.h"
#include "analysis/RecordSource.h"
#include "analysis/StreamStory.h"

namespace halvox::analysis {

class OpenStream;

// Makes the stories of streams and sessions from the messages of a store, in one pass.
//
//   add() each record, from the oldest; finish(); each story comes once, when it has ended
//
// Whose message it is:
// - A message with `object_serial` belongs to the PipeWire stream with that serial and application.
// - Any other message belongs to the session of its link message.
// - A message with neither (because the link was disabled, or because the message repeats the one
//   before) belongs to the newest open story of the same application and service type. If there is
//   none, it begins a story.
// - Messages outside sessions belong to no story.
//
// What ends a story: the summary that a session leaves on the link; the first run of another stream
// with the same serial; the end of the reporter's connection; another start of the service. A story
// that ends while its stream runs is "client gone" if a client disconnected within a second, or
// "service gone" if the service started anew; otherwise "stopped".
//
// Times: a stream runs from its Start to its Stop, and while it says that it plays. Time at a
// volume is counted as the service counts it, from a volume message that says "playing" to the next
// one that changes it. Distances are those of the service's stamps, or of its own uptime if the
// clock was set in between.
//
// Memory: at most kMostOpen stories are open; the one that was quiet for longest is delivered as
// "still running". Belongs to one thread.
class StreamBuilder {
 public:
  static constexpr std::size_t kMostOpen = 4096;

  using StoryCallback = std::function<void(const StreamStory&)>;
  // What has happened to a stream; the story is as it is after that. Every story begins with kBegan
  // and ends with kEnded, directly before it is delivered.
  using MomentCallback = std::function<void(const StreamStory&, const StreamMoment&)>;

  // What a message says of the service's process: its time stamp, the process's uptime, and when it
  // started by the machine's uptime, all in seconds.
  struct ServiceTimes {
    double stamp = 0;
    double uptime = 0;
    double start = 0;
  };

  // What is known when all records are read.
  struct Finish {
    // Streams that run, run until then; empty: until the last record.
    std::optional<double> now{};
    // True if no service runs that could still write. Whatever is open has then lost its service.
    bool serviceIsGone = false;
    // The service that runs now. If it is another process than that of the last message, whatever
    // is open has lost its service, too.
    std::optional<ServiceTimes> service{};
  };

  explicit StreamBuilder(StoryCallback onStory, MomentCallback onMoment = nullptr);
  StreamBuilder(const StreamBuilder&) = delete;
  StreamBuilder& operator=(const StreamBuilder&) = delete;
  ~StreamBuilder();

  // Takes the next record; ignores kinds other than events and link messages.
  void add(const Record& record) { join_.add(record); }
  // Takes the messages that were recorded before that time, although their other record may be
  // missing. Only for a view of what happens now, which must not wait for the next record.
  void settle(double time);
  // Delivers the stories that are open. Call once, after the last record.
  void finish(const Finish& finish);

 private:
  // In front is the stream whose last message is the oldest.
  using Streams = std::list<std::unique_ptr<OpenStream>>;
  void onMessage(const Message& message);
  void onClientGone(const Message& message);
  // Ends all stories if the message is the first one of another start of the service. `before` is
  // the time of the record before it.
  void noticeRestart(const Message& message, double before);
  [[nodiscard]] OpenStream* streamOf(const Message& message);
  [[nodiscard]] OpenStream* findBySerial(std::int64_t serial, const Message& message);
  [[nodiscard]] OpenStream* findByProgram(const Message& message) const;
  OpenStream& open(const Message& message);
  void noteProgram(OpenStream& stream, const Message& message);
  void forgetProgram(const OpenStream& stream);
  void endSession(OpenStream& stream, const Message& message);
  void close(OpenStream& stream, StreamEnd end, double time);
  void closeAll(StreamEnd end, double time);
  void settleUndecided(double now);

  StoryCallback onStory_;
  MomentCallback onMoment_;
  MessageJoin join_;
  Payload payload_;
  Streams streams_;
  std::vector<OpenStream*> undecided_;
  std::unordered_multimap<std::int64_t, OpenStream*> bySerial_;
  std::unordered_map<std::int64_t, OpenStream*> bySession_;
  // The newest stream of an application and service type, by the hash of both.
  std::unordered_map<std::uint64_t, OpenStream*> byProgram_;
  std::optional<ServiceTimes> service_;  // of the last message that has them
  double lastTime_ = 0;                  // of the newest record
  std::optional<double> lastClientGone_;
};

}  // namespace halvox::analysis
