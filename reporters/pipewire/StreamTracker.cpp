#include "reporters/pipewire/StreamTracker.h"

#include <algorithm>
#include <utility>

namespace halvox::pipewire_reporter {
namespace {

constexpr std::uint64_t kNamespace = 0x5057;  // "PW"; its top bit is clear, so IDs are positive

// The ID of a driver that the profiler does not name. No node has it.
constexpr GlobalID kNoNode = 0xFFFFFFFF;

Route::Device makeDevice(const StreamTracker::Node& node) {
  Route::Device device;
  device.name = nodeName(node.properties, node.serial);
  device.description = cleanText(property(node.properties, "node.description"));
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
  nodes_.clear();
  missed_.clear();
}

void StreamTracker::serviceRestarted() {
  for (auto& [id, entry] : streams_) {
    entry.session->restate();
  }
}

void StreamTracker::nodeAdded(const Node& node) {
  nodes_.set(node.id, node.serial, node.properties);
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
  nodes_.remove(id);
  missed_.forget(id);
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
    nodes_.set(id, session->serial(), properties);
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

void StreamTracker::cycleEnded(const pipewire::ProfiledCycle& cycle) {
  if (const auto loss = missed_.add(cycle); loss.count > 0) {
    addXrun(cycle, makeXrun(cycle, loss));
  }
  // At the end of every cycle, whichever nodes missed it, all reports that are due are sent. This
  // saves a timer.
  for (auto& [id, entry] : streams_) {
    entry.session->reportXruns(cycle.time);
  }
}

DeviceXrun StreamTracker::makeXrun(const pipewire::ProfiledCycle& cycle,
                                   const pipewire::MissedCycles::Loss& loss) const {
  DeviceXrun xrun{.driver = kNoNode,
                  .cycles = loss.count,
                  .lost = loss.count * cycle.length,
                  .quantum = cycle.quantum,
                  .rate = cycle.rate};
  LateNode driver;
  if (cycle.driver.has_value()) {
    driver = nodes_.describe(cycle.driver->id, cycle.driverName);
    xrun.driver = driver.id;
    xrun.device = driver.name;
  }
  switch (loss.fault) {
    case pipewire::CycleFault::kUnknown:
      break;
    case pipewire::CycleFault::kFollowers:
      for (const auto& late : cycle.late) {
        xrun.late.push_back(nodes_.describe(late.id, late.name));
      }
      break;
    case pipewire::CycleFault::kDriver:
      if (cycle.driver.has_value()) {
        xrun.late.push_back(std::move(driver));
      }
      break;
  }
  return xrun;
}

void StreamTracker::addXrun(const pipewire::ProfiledCycle& cycle, const DeviceXrun& xrun) {
  if (cycle.followers.empty() && cycle.waiting.empty()) {
    for (auto& [id, entry] : streams_) {
      if (id == xrun.driver || graph_.areLinked(id, xrun.driver)) {
        entry.session->addXrun(xrun);
      }
    }
    return;
  }
  const auto addTo = [&](GlobalID id) {
    if (StreamSession* session = findStream(id)) {
      session->addXrun(xrun);
    }
  };
  // A stream can drive the graph itself, and is then not one of the followers.
  addTo(xrun.driver);
  for (const auto& follower : cycle.followers) {
    addTo(follower.id);
  }
  std::ranges::for_each(cycle.waiting, addTo);
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
          .reporterID = reporterID, .node = node.id, .serial = node.serial, .direction = direction},
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
