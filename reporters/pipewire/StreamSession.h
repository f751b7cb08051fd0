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
//   made: session created, typed and configured
//     └─ first run: session started ─┬─ runs: Start, volume (playing), xruns
//                                    └─ idles: volume (not playing), Stop
//   destroyed: as for idling if it runs; session stopped if it was started, then destroyed
//
// What is told before the first run is kept and sent with the start. What is told again without a
// change is sent once. Belongs to the loop thread; borrows the client, which must outlive it.
class StreamSession {
 public:
  struct Identity {
    ReporterID reporterID = 0;
    std::uint64_t serial = 0;
    Direction direction = Direction::kPlayback;
  };

  StreamSession(ReportingClient& client, Identity identity, const Properties& properties);
  ~StreamSession();
  StreamSession(const StreamSession&) = delete;
  StreamSession& operator=(const StreamSession&) = delete;

  void setProperties(const Properties& properties);
  void setRunning(bool running);
  void setFormat(const StreamFormat& format);
  // An empty route is no news: a stream that is being moved has none for a moment.
  void setRoute(const Route& route);
  void changeVolume(const VolumeChange& change);
  // The stream missed the cycle of that time and length; reported by the next reportXruns() that is
  // due.
  void addXrun(XrunMeter::Time cycle, XrunMeter::Seconds lost);
  // Reports what the stream lost, at most once a second.
  void reportXruns(XrunMeter::Time now);
  // Says again what holds now; for a service that has lost what it was told.
  void restate();

  [[nodiscard]] Direction direction() const { return identity_.direction; }

 private:
  void beginRun();
  void endRun();
  void sendFormat();
  void sendRoute();
  void sendVolumeIfChanged();
  void sendXrun(XrunMeter::Seconds lost);
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
};

}  // namespace halvox::pipewire_reporter
