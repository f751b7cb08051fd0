#include "reporters/pipewire/StreamTracker.h"

#include <utility>

namespace halvox::pipewire_reporter {
namespace {

constexpr std::uint64_t kNamespace = 0x5057;  // "PW"; its top bit is clear, so IDs are positive

Route::Device makeDevice(const StreamTracker::Node& node) {
  Route::Device device;
  device.name = cleanText(property(node.properties, "node.name"));
  device.description = cleanText(property(node.properties, "node.description"));
  if (device.name.empty()) {
    device.name = "node-" + std::to_string(node.serial);
  }
  if (device.description.empty()) {
    device.description = device.name;
  }
  return device;
}

}  // namespace

std::optional<Direction> streamDirection(std::string_view mediaClass) {
  if (mediaClass == "Stream/Output/Audio") {
    return Direction::kPlayback;
  }
  if (mediaClass == "Stream/Input/Audio") {
    return Direction::kRecord;
  }
  return std::nullopt;
}

ReporterID reporterIDFor(std::uint32_t serverCookie, std::uint64_t serial) {
  return static_cast<ReporterID>(kNamespace << 48U |
                                 static_cast<std::uint64_t>(serverCookie & 0xFFFFU) << 32U |
                                 (serial & 0xFFFFFFFFU));
}

void StreamTracker::serverConnected(std::uint32_t cookie) { cookie_ = cookie; }

void StreamTracker::serverLost() {
  // The destructor of each session sends its end.
  streams_.clear();
  reporterIDs_.clear();
  graph_.clear();
}

void StreamTracker::serviceRestarted() {
  for (auto& [id, entry] : streams_) {
    entry.session->restate();
  }
}

void StreamTracker::nodeAdded(const Node& node) {
  if (const auto direction = streamDirection(node.mediaClass)) {
    addStream(node, *direction);
    // Streams of video or MIDI are neither streams for us nor devices.
  } else if (!node.mediaClass.starts_with("Stream/")) {
    graph_.addDevice(node.id, makeDevice(node));
  }
}

void StreamTracker::nodeRemoved(GlobalID id) {
  graph_.removeDevice(id);
  removeStream(id);
}

void StreamTracker::linkAdded(GlobalID id, Link link) {
  graph_.addLink(id, link);
  updateRoute(link.output);
  updateRoute(link.input);
}

void StreamTracker::linkRemoved(GlobalID id) {
  const Link link = graph_.removeLink(id);
  updateRoute(link.output);
  updateRoute(link.input);
}

void StreamTracker::streamPropertiesChanged(GlobalID id, const Properties& properties) {
  if (StreamSession* session = findStream(id)) {
    session->setProperties(properties);
  }
}

void StreamTracker::streamRunningChanged(GlobalID id, bool running) {
  if (StreamSession* session = findStream(id)) {
    session->setRunning(running);
  }
}

void StreamTracker::streamFormatChanged(GlobalID id, const StreamFormat& format) {
  if (StreamSession* session = findStream(id)) {
    session->setFormat(format);
  }
}

void StreamTracker::streamVolumeChanged(GlobalID id, const VolumeChange& change) {
  if (StreamSession* session = findStream(id)) {
    session->changeVolume(change);
  }
}

void StreamTracker::cycleEnded(XrunMeter::Time time, XrunMeter::Seconds length,
                               std::span<const GlobalID> lateNodes) {
  for (const GlobalID id : lateNodes) {
    if (StreamSession* session = findStream(id)) {
      session->addXrun(time, length);
    }
  }
  // At the end of every cycle, whichever nodes missed it, all reports that are due are sent. This
  // saves a timer.
  for (auto& [id, entry] : streams_) {
    entry.session->reportXruns(time);
  }
}

StreamSession* StreamTracker::findStream(GlobalID id) {
  const auto found = streams_.find(id);
  return found == streams_.end() ? nullptr : found->second.session.get();
}

void StreamTracker::addStream(const Node& node, Direction direction) {
  // The server uses an ID again only after it removed the object, even if no removal was received.
  removeStream(node.id);
  const ReporterID reporterID = reporterIDFor(cookie_, node.serial);
  // Any client of PipeWire can create streams without limit. Equal identifiers are possible,
  // because an identifier has only the lower 32 bits of a serial.
  if (streams_.size() >= kMaxStreams || !reporterIDs_.insert(reporterID).second) {
    ++refusedStreams_;
    return;
  }
  auto session = std::make_unique<StreamSession>(
      client_,
      StreamSession::Identity{
          .reporterID = reporterID, .serial = node.serial, .direction = direction},
      node.properties);
  streams_.emplace(node.id, Entry{.reporterID = reporterID, .session = std::move(session)});
  // The links of a stream may have been announced before the stream itself.
  updateRoute(node.id);
}

void StreamTracker::removeStream(GlobalID id) {
  const auto found = streams_.find(id);
  if (found != streams_.end()) {
    reporterIDs_.erase(found->second.reporterID);
    streams_.erase(found);
  }
}

void StreamTracker::updateRoute(GlobalID id) {
  if (StreamSession* session = findStream(id)) {
    session->setRoute(graph_.routeOf(id, session->direction()));
  }
}

}  // namespace halvox::pipewire_reporter
