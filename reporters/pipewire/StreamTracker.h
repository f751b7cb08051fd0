#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

#include "platform/linux/pipewire/MissedCycles.h"
#include "reporters/pipewire/NodeDirectory.h"
#include "reporters/pipewire/ReportingClient.h"
#include "reporters/pipewire/RouteGraph.h"
#include "reporters/pipewire/StreamProperties.h"
#include "reporters/pipewire/StreamSession.h"
#include "reporters/pipewire/StreamValues.h"

namespace halvox::pipewire_reporter {

// Returns the direction that the media class of a stream's node implies; std::nullopt if the node
// is not a stream.
std::optional<Direction> streamDirection(std::string_view mediaClass);

// Makes the identifier of a stream's session: 0x5057 ("PW") in the upper 16 bits, then the lower 16
// bits of the PipeWire server's cookie, then the lower 32 bits of the stream's object.serial. Users
// can look the parts up with `pw-cli info 0` and `pw-dump`.
//
// The prefix keeps the identifier from being 0 and from colliding with those of other reporters.
// The cookie distinguishes equal serials of two servers: of two users, or of one server before and
// after its restart.
ReporterID reporterIDFor(std::uint32_t serverCookie, std::uint64_t serial);

// Turns PipeWire's events into reporting sessions: each stream node has one while it exists. Does
// not use PipeWire's library; StreamWatcher passes the events in their order. Ignores events about
// unknown nodes and nodes that are not streams.
// Belongs to the loop thread. Does not own the client, which must outlive it. The destructor ends
// all sessions. Cannot fail: the client queues every operation.
class StreamTracker {
 public:
  // The most streams at once. Further streams are counted and not followed.
  static constexpr std::size_t kMaxStreams = 4096;

  struct Node {
    GlobalID id = 0;
    std::uint64_t serial = 0;
    std::string mediaClass;
    Properties properties;
  };

  explicit StreamTracker(ReportingClient& client) : client_(client) {}

  // A server is connected. Its objects follow as events.
  void serverConnected(std::uint32_t cookie);
  // The server has disconnected, and all its objects with it. Ends all sessions.
  void serverLost();
  // The reporting service restarted and lost its history. Each started session sends its current
  // state again.
  void serviceRestarted();

  // A node has appeared. A stream gets a session; a device is remembered for routes. Replaces a
  // stream that has this ID. A node that is not a stream may be added again with other properties.
  void nodeAdded(const Node& node);
  // Ends the session of a stream. Any object may be named.
  void nodeRemoved(GlobalID id);
  // A link connects two nodes, or is removed. Both update the routes of their streams.
  void linkAdded(GlobalID id, Link link);
  void linkRemoved(GlobalID id);

  // Changes of one stream; see StreamSession for what each of them sends.
  void streamPropertiesChanged(GlobalID id, const Properties& properties);
  void streamRunningChanged(GlobalID id, bool running);
  void streamFormatChanged(GlobalID id, const StreamFormat& format);
  void streamVolumeChanged(GlobalID id, const VolumeChange& change);
  // The profiler begins to report cycles. Xruns before this call were not reported.
  void profilingBegan() { missed_.clear(); }
  // Call when a driver of the server has ended a cycle. If the driver missed the cycle, each
  // running stream that took part has lost it, whether the stream was late or suffered from
  // another. If the profiler does not list the nodes that took part, the streams that are linked to
  // the driver have lost it.
  void cycleEnded(const pipewire::ProfiledCycle& cycle);

  [[nodiscard]] std::size_t streamCount() const { return streams_.size(); }
  // The number of streams that got no session, because there were too many or another stream has
  // the same identifier.
  [[nodiscard]] std::uint64_t refusedStreams() const { return refusedStreams_; }

 private:
  [[nodiscard]] StreamSession* findStream(GlobalID id);
  void addStream(const Node& node, Direction direction);
  void removeStream(GlobalID id);
  void updateRoute(GlobalID id);
  [[nodiscard]] DeviceXrun makeXrun(const pipewire::ProfiledCycle& cycle,
                                    const pipewire::MissedCycles::Loss& loss) const;
  void addXrun(const pipewire::ProfiledCycle& cycle, const DeviceXrun& xrun);

  struct Entry {
    ReporterID reporterID;
    std::unique_ptr<StreamSession> session;
  };

  ReportingClient& client_;
  std::uint32_t cookie_ = 0;
  RouteGraph graph_;
  NodeDirectory nodes_;
  pipewire::MissedCycles missed_;
  std::unordered_map<GlobalID, Entry> streams_;
  std::unordered_set<ReporterID> reporterIDs_;
  std::uint64_t refusedStreams_ = 0;
};

}  // namespace halvox::pipewire_reporter
