#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "reporters/pipewire/ReportingClient.h"
#include "reporters/pipewire/RouteGraph.h"
#include "reporters/pipewire/StreamProperties.h"
#include "reporters/pipewire/StreamSession.h"
#include "reporters/pipewire/StreamValues.h"

namespace halvox::pipewire_reporter {

// The direction of a stream node by its media class; nothing for any other node.
std::optional<Direction> streamDirection(std::string_view mediaClass);

// The identifier of a stream's session: 0x5057 ("PW") in the upper 16 bits, then the lower 16 bits
// of the PipeWire server's cookie, then the lower 32 bits of the stream's object.serial. All can be
// read with `pw-cli info 0` and `pw-dump`. So identifiers are never 0, do not meet those of other
// reporters, and streams of two servers (two users, or one server before and after its restart)
// with equal serials differ by the cookie.
ReporterID reporterIDFor(std::uint32_t serverCookie, std::uint64_t serial);

// Turns what happens in PipeWire into reporting sessions: one for each stream node, while it
// exists. Knows nothing of PipeWire's library; whoever watches PipeWire tells it the events, in
// their order. Events about nodes that are not known, or are no streams, change nothing. Belongs to
// the loop thread; borrows the client, which must outlive it. Its destruction ends all sessions.
class StreamTracker {
 public:
  // How many streams are followed at once; further ones are counted and left alone.
  static constexpr std::size_t kMaxStreams = 4096;

  struct Node {
    GlobalID id = 0;
    std::uint64_t serial = 0;
    std::string mediaClass;
    Properties properties;
  };

  explicit StreamTracker(ReportingClient& client) : client_(client) {}

  // A server is there; its objects follow.
  void serverConnected(std::uint32_t cookie);
  // The server and all its objects are gone: ends all sessions.
  void serverLost();
  // The reporting service came back without its history: each started session says how things are.
  void serviceRestarted();

  void nodeAdded(const Node& node);
  void nodeRemoved(GlobalID id);
  void linkAdded(GlobalID id, Link link);
  void linkRemoved(GlobalID id);

  void streamPropertiesChanged(GlobalID id, const Properties& properties);
  void streamRunningChanged(GlobalID id, bool running);
  void streamFormatChanged(GlobalID id, const StreamFormat& format);
  void streamVolumeChanged(GlobalID id, const VolumeChange& change);
  // A driver of the server went through a cycle of that length, which those nodes missed.
  void cycleEnded(XrunMeter::Time time, XrunMeter::Seconds length,
                  std::span<const GlobalID> lateNodes);

  [[nodiscard]] std::size_t streamCount() const { return streams_.size(); }
  // Streams that got no session: too many, or with a serial that is taken.
  [[nodiscard]] std::uint64_t refusedStreams() const { return refusedStreams_; }

 private:
  [[nodiscard]] StreamSession* findStream(GlobalID id);
  void addStream(const Node& node, Direction direction);
  void removeStream(GlobalID id);
  void updateRoute(GlobalID id);

  struct Entry {
    ReporterID reporterID;
    std::unique_ptr<StreamSession> session;
  };

  ReportingClient& client_;
  std::uint32_t cookie_ = 0;
  RouteGraph graph_;
  std::unordered_map<GlobalID, Entry> streams_;
  std::unordered_set<ReporterID> reporterIDs_;
  std::uint64_t refusedStreams_ = 0;
};

}  // namespace halvox::pipewire_reporter
