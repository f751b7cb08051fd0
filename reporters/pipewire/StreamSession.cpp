#include "reporters/pipewire/StreamSession.h"

#include <vector>

#include "reporters/pipewire/ReportingVocabulary.h"

namespace halvox::pipewire_reporter {
namespace {

constexpr std::string_view kRoleProperty = "media.role";

// Returns the entries of `now` that are new or differ from those of `before`.
platform::Dictionary changedEntries(const platform::Dictionary& before,
                                    const platform::Dictionary& now) {
  platform::Dictionary changed;
  for (const auto& [key, value] : now) {
    const platform::Value* old = before.find(key);
    if (old == nullptr || !(*old == value)) {
      changed.set(key, value);
    }
  }
  return changed;
}

std::string describeRoute(const Route& route) {
  std::string text;
  for (const auto& device : route.devices) {
    text += (text.empty() ? "" : ", ") + device.description;
  }
  return text;
}

// Unknown values are not sent.
void setUnlessEmpty(platform::Dictionary& message, const char* key, const std::string& text) {
  if (!text.empty()) {
    message.set(key, text);
  }
}

void setUnlessZero(platform::Dictionary& message, const char* key, std::int64_t number) {
  if (number != 0) {
    message.set(key, number);
  }
}

// Returns the name of a role; empty if it is unknown.
std::string nameOf(XrunRole role) {
  switch (role) {
    case XrunRole::kUnknown:
      return {};
    case XrunRole::kCulprit:
      return "culprit";
    case XrunRole::kVictim:
      return "victim";
    case XrunRole::kDevice:
      return "device";
  }
  return {};
}

platform::Array deviceNames(const Route& route) {
  std::vector<platform::Value> names;
  for (const auto& device : route.devices) {
    names.emplace_back(device.name);
  }
  return platform::Array(names);
}

}  // namespace

StreamSession::StreamSession(ReportingClient& client, Identity identity,
                             const Properties& properties)
    : client_(client),
      identity_(identity),
      serviceType_(serviceTypeForRole(property(properties, kRoleProperty))),
      configuration_(makeConfiguration(properties)),
      process_(processName(properties)),
      node_(nodeName(properties, identity.serial)),
      xruns_(identity.node) {
  client_.createSession(identity_.reporterID);
  client_.setServiceType(identity_.reporterID, serviceType_);
  client_.setConfiguration(identity_.reporterID, configuration_);
}

StreamSession::~StreamSession() {
  // Ends the run first, so that its Stop and its volume reach the session before it is stopped.
  setRunning(false);
  if (started_) {
    client_.stop(identity_.reporterID);
  }
  client_.destroySession(identity_.reporterID);
}

void StreamSession::setProperties(const Properties& properties) {
  process_ = processName(properties);
  node_ = nodeName(properties, identity_.serial);
  const ServiceType type = serviceTypeForRole(property(properties, kRoleProperty));
  if (type != serviceType_) {
    serviceType_ = type;
    client_.setServiceType(identity_.reporterID, type);
  }
  const platform::Dictionary changed =
      changedEntries(configuration_, makeConfiguration(properties));
  if (!changed.empty()) {
    // A configuration can only grow, because the service never removes a key. A property that
    // disappears keeps its last value here too.
    configuration_.merge(changed);
    client_.setConfiguration(identity_.reporterID, changed);
  }
}

void StreamSession::setRunning(bool running) {
  if (running == running_) {
    return;
  }
  running_ = running;
  if (running) {
    beginRun();
  } else {
    endRun();
  }
}

void StreamSession::setFormat(const StreamFormat& format) {
  std::string text = describeFormat(format);
  if (text.empty() || text == format_) {
    return;
  }
  format_ = std::move(text);
  if (started_) {
    sendFormat();
  }
}

void StreamSession::setRoute(const Route& route) {
  if (route.devices.empty() || route == route_) {
    return;
  }
  route_ = route;
  if (started_) {
    sendRoute();
  }
}

void StreamSession::changeVolume(const VolumeChange& change) {
  volume_.apply(change);
  if (started_) {
    sendVolumeIfChanged();
  }
}

void StreamSession::addXrun(const DeviceXrun& xrun) {
  if (running_) {
    xruns_.add(xrun);
  }
}

void StreamSession::reportXruns(XrunMeter::Time now) {
  if (const auto report = xruns_.takeDue(now)) {
    sendXrun(*report);
  }
}

void StreamSession::restate() {
  if (!started_) {
    return;
  }
  // The service has lost its sessions and their histories. It needs the volume even if the volume
  // has not changed.
  sentVolume_.reset();
  sendFormat();
  sendRoute();
  sendVolumeIfChanged();
}

void StreamSession::beginRun() {
  ++run_;
  if (!started_) {
    started_ = true;
    client_.start(identity_.reporterID);
    sendFormat();
    sendRoute();
  }
  sendRun(kTypeStart);
  sendVolumeIfChanged();
}

void StreamSession::endRun() {
  // Sent before the Stop, because what was lost belongs to this run.
  if (const auto report = xruns_.takeRest()) {
    sendXrun(*report);
  }
  // Send the volume before the Stop, so that the time played at this volume ends within the run.
  sendVolumeIfChanged();
  sendRun(kTypeStop);
}

void StreamSession::sendFormat() {
  if (!format_.empty()) {
    send({{kFormatKey, format_}}, kCategorySessionSetup, kTypeSetup);
  }
}

void StreamSession::sendRoute() {
  if (!route_.devices.empty()) {
    send({{kDevicesKey, describeRoute(route_)}, {kDeviceNamesKey, deviceNames(route_)}},
         kCategoryRouteChange, kTypeState);
  }
}

void StreamSession::sendVolumeIfChanged() {
  const auto volume = volume_.effective();
  if (!volume) {
    return;
  }
  const VolumeState state{.volume = *volume, .playing = running_};
  if (sentVolume_ == state) {
    return;
  }
  sentVolume_ = state;
  // PipeWire does not say which process changed a volume. Report the process of the stream.
  send({{kVolumeKey, state.volume},
        {kPlayingKey, state.playing ? 1 : 0},
        {kVolumeProcessKey, process_}},
       kCategoryVolume, kTypeState);
}

void StreamSession::sendXrun(const XrunReport& report) {
  platform::Dictionary issue{
      {kIssueTypeKey, kIssueXrun},        {kNodeKey, node_},
      {kSilenceKey, report.lost.count()}, {kXrunMillisecondsKey, report.lost.count() * 1000},
      {kMissedCyclesKey, report.cycles},  {kXrunReportKey, ++xrunReport_}};
  if (const platform::Value* application = configuration_.find(kApplicationKey)) {
    issue.set(kIssueClientKey, *application);
  }
  setUnlessEmpty(issue, kXrunDeviceKey, report.device);
  setUnlessZero(issue, kQuantumKey, report.quantum);
  setUnlessZero(issue, kRateKey, report.rate);
  setUnlessEmpty(issue, kXrunRoleKey, nameOf(report.role));
  setUnlessEmpty(issue, kLateNodeKey, report.late.name);
  setUnlessEmpty(issue, kLateProcessKey, report.late.process);
  if (report.late.serial.has_value()) {
    issue.set(kLateSerialKey, *report.late.serial);
  }
  send(std::move(issue), category(), kTypeIssueDetector);
}

void StreamSession::sendRun(EventType type) { send({{kRunKey, run_}}, category(), type); }

void StreamSession::send(platform::Dictionary message, Category category, EventType type) {
  // An event in the store names the application but not the session. The serial distinguishes the
  // streams of the application.
  message.set(kSerialKey, identity_.serial);
  client_.send(identity_.reporterID, message, category, type);
}

Category StreamSession::category() const {
  return identity_.direction == Direction::kPlayback ? kCategorySessionPlayback
                                                     : kCategorySessionRecord;
}

}  // namespace halvox::pipewire_reporter
