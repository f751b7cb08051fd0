#pragma once

#include <optional>
#include <string>

#include "reporters/pipewire/ReportingClient.h"
#include "reporters/pipewire/RouteGraph.h"
#include "reporters/pipewire/StreamProperties.h"
#include "reporters/pipewire/StreamValues.h"
#include "reporters/pipewire/XrunMeter.h"

namespace halvox::pipewire_reporter {

// The reporting session of one stream.
//
//   constructor: creates the session, sets its service type and configuration
//     └─ first run: starts the session ─┬─ runs: sends Start, volume (playing), xruns
//                                       └─ idles: sends volume (not playing), Stop
//   destructor: as for idling if the stream runs; stops a started session; destroys the session
//
// Format, route and volume that come before the first run are kept and sent with the start. A value
// that has not changed is not sent again.
// Owned by the StreamTracker; belongs to the loop thread. Does not own the client, which must
// outlive it. Cannot fail: the client queues every operation.
class StreamSession {
 public:
  struct Identity {
    ReporterID reporterID = 0;
    GlobalID node = 0;
    std::uint64_t serial = 0;
    Direction direction = Direction::kPlayback;
  };

  StreamSession(ReportingClient& client, Identity identity, const Properties& properties);
  ~StreamSession();
  StreamSession(const StreamSession&) = delete;
  StreamSession& operator=(const StreamSession&) = delete;

  // The stream has these properties now. Sends those that have changed.
  void setProperties(const Properties& properties);
  // Begins or ends a run. The first run starts the session.
  void setRunning(bool running);
  // The stream has this format now; a format without any known value is ignored.
  void setFormat(const StreamFormat& format);
  // Ignores an empty route, because a stream that is being moved has no device for a moment.
  void setRoute(const Route& route);
  // Volume controls of the stream have changed. Sends the volume if it or the playing
  // state differs from the last message.
  void changeVolume(const VolumeChange& change);
  // Call when a device on which the stream ran has missed cycles. A later reportXruns() reports
  // them. Ignored while the stream does not run.
  void addXrun(const DeviceXrun& xrun);
  // Reports what the stream has lost, at most once a second.
  void reportXruns(XrunMeter::Time now);
  // Sends format, route and volume again. For a service that restarted and has lost them.
  void restate();

  [[nodiscard]] Direction direction() const { return identity_.direction; }
  [[nodiscard]] std::uint64_t serial() const { return identity_.serial; }

 private:
  // These send the messages with which a run begins and ends.
  void beginRun();
  void endRun();
  void sendFormat();
  void sendRoute();
  // Sends nothing while no volume is known.
  void sendVolumeIfChanged();
  void sendXrun(const XrunReport& report);
  void sendRun(EventType type);
  void send(platform::Dictionary message, Category category, EventType type);
  [[nodiscard]] Category category() const;

  struct VolumeState {
    double volume = 0;
    bool playing = false;
    friend bool operator==(const VolumeState&, const VolumeState&) = default;
  };

  ReportingClient& client_;
  const Identity identity_;
  ServiceType serviceType_;
  platform::Dictionary configuration_;
  std::string process_;
  std::string node_;
  std::string format_;
  Route route_;
  StreamVolume volume_;
  XrunMeter xruns_;
  std::optional<VolumeState> sentVolume_;
  bool started_ = false;
  bool running_ = false;
  std::int64_t run_ = 0;
  std::int64_t xrunReport_ = 0;
};

}  // namespace halvox::pipewire_reporter
