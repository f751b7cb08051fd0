#include "tools/top/TopModel.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "platform/counter_kinds.h"

namespace halvox::tools {
namespace {

using analysis::StreamMoment;
using analysis::StreamStory;

constexpr std::string_view kSeparator = ", ";

// Calls `use` with each of the texts that are joined by ", ".
template <typename Use>
void forEachName(std::string_view names, Use use) {
  while (!names.empty()) {
    const std::size_t end = std::min(names.find(kSeparator), names.size());
    use(names.substr(0, end));
    names.remove_prefix(std::min(names.size(), end + kSeparator.size()));
  }
}

// The node names of a stream's devices, or their descriptions if it has no names.
const std::string& deviceKeys(const TopStream& stream) {
  return stream.deviceNames.empty() ? stream.device : stream.deviceNames;
}

struct CounterName {
  std::string_view piece;
  std::string_view name;
};

// "link local, dropped: disk full" has the piece "link local". No piece has a comma.
CounterName splitCounter(std::string_view counter) {
  const std::size_t end = counter.find(kSeparator);
  if (end == std::string_view::npos) return {.piece = {}, .name = counter};
  return {.piece = counter.substr(0, end), .name = counter.substr(end + kSeparator.size())};
}

std::uint64_t valueOf(const CounterValues& counters, const std::string& name) {
  const auto found = counters.find(name);
  return found == counters.end() ? 0 : found->second;
}

// What is left of `whole`. The counters are read one after the other while the service counts on.
std::uint64_t rest(std::uint64_t whole, std::uint64_t part) {
  return whole - std::min(whole, part);
}

// The jobs that were added to the queues and have not run.
std::uint64_t waitingJobs(const CounterValues& counters) {
  constexpr std::string_view kAdded = ": jobs added";
  std::uint64_t waiting = 0;
  for (const auto& [counter, added] : counters) {
    if (!counter.starts_with("queues, ") || !counter.ends_with(kAdded)) continue;
    const std::string label = counter.substr(0, counter.size() - kAdded.size());
    waiting += rest(added, valueOf(counters, label + ": jobs run"));
  }
  return waiting;
}

// The records that the store has received and neither stored nor dropped.
std::uint64_t waitingRecords(const CounterValues& counters) {
  std::uint64_t waiting = 0;
  for (const auto& [counter, stored] : counters) {
    const CounterName name = splitCounter(counter);
    if (name.name != "stored") continue;
    const std::string piece(name.piece);
    std::uint64_t done = stored;
    for (auto other = counters.lower_bound(piece + ", dropped");
         other != counters.end() && other->first.starts_with(piece + ", dropped"); ++other) {
      done += other->second;
    }
    waiting += rest(valueOf(counters, piece + ", received"), done);
  }
  return waiting;
}

std::uint64_t storedRecords(const CounterValues& counters) {
  std::uint64_t stored = 0;
  for (const auto& [counter, value] : counters) {
    if (splitCounter(counter).name == "stored") stored += value;
  }
  return stored;
}

}  // namespace

const char* stateName(TopStreamState state) {
  switch (state) {
    case TopStreamState::kOpen:
      return "open";
    case TopStreamState::kRunning:
      return "running";
    case TopStreamState::kPaused:
      return "paused";
  }
  return "";
}

TopModel::TopModel() { makeBuilder(); }

void TopModel::makeBuilder() {
  builder_ = std::make_unique<analysis::StreamBuilder>(
      [this](const StreamStory& story) { streams_.erase(story.id); },
      [this](const StreamStory& story, const StreamMoment& moment) { onMoment(story, moment); });
}

void TopModel::forget() {
  makeBuilder();
  streams_.clear();
  before_.reset();
  readings_.counters.reset();
}

void TopModel::onMoment(const StreamStory& story, const StreamMoment& moment) {
  Stream& stream = streams_[story.id];
  TopStream& shown = stream.shown;
  shown.id = story.id;
  shown.sessionID = story.sessionID;
  // Most moments change neither text.
  if (shown.application != story.application) shown.application = story.application;
  if (shown.service != story.service) shown.service = story.service;
  shown.direction = story.direction;
  shown.started = story.started;
  shown.xrunsInAll = story.xruns.reports;
  switch (moment.kind) {
    case StreamMoment::Kind::kStart:
      stream.isInRun = true;
      break;
    case StreamMoment::Kind::kStop:
      // A client that stops plays no longer, whether or not it reports that.
      stream.isInRun = false;
      stream.isPlaying = false;
      break;
    case StreamMoment::Kind::kVolume:
      shown.volume = moment.volume;
      stream.isPlaying = moment.playing;
      break;
    case StreamMoment::Kind::kRoute:
      onRoute(stream, moment);
      break;
    case StreamMoment::Kind::kXrun:
      onXrun(stream, moment);
      break;
    case StreamMoment::Kind::kBegan:
    case StreamMoment::Kind::kFormat:
    case StreamMoment::Kind::kMessage:
    case StreamMoment::Kind::kEnded:
      break;
  }
  const bool runs = stream.isInRun || stream.isPlaying;
  stream.hasRun = stream.hasRun || runs;
  shown.state = runs            ? TopStreamState::kRunning
                : stream.hasRun ? TopStreamState::kPaused
                                : TopStreamState::kOpen;
}

void TopModel::onRoute(Stream& stream, const StreamMoment& moment) {
  stream.shown.device = moment.text;
  stream.shown.deviceNames = moment.names;
  // Of several devices nothing says which description belongs to which name, because a description
  // may contain a comma.
  if (moment.names.empty() || moment.names.find(kSeparator) != std::string::npos) return;
  if (Device* const known = device(moment.names)) known->description = moment.text;
}

void TopModel::onXrun(Stream& stream, const StreamMoment& moment) {
  stream.xruns.add(moment.time, 1, moment.xrun.milliseconds);
  if (moment.xrun.device.empty()) return;
  Device* const known = device(moment.xrun.device);
  if (known == nullptr) return;
  if (moment.xrun.quantum > 0) known->quantum = moment.xrun.quantum;
  if (moment.xrun.rate > 0) known->rate = moment.xrun.rate;
}

TopModel::Device* TopModel::device(std::string_view name) {
  const auto found = devices_.find(name);
  if (found != devices_.end()) return &found->second;
  if (devices_.size() >= kMostDevices) return nullptr;
  return &devices_.try_emplace(std::string(name)).first->second;
}

void TopModel::onTurn(TopReadings readings) {
  builder_->settle(readings.now - kLongestWait);
  seconds_ = hasTurned_ ? std::max(0.0, readings.steady - readings_.steady) : 0;
  hasTurned_ = true;
  before_ = std::move(readings_.counters);
  readings_ = std::move(readings);
  constexpr const char* kAccepted = "connection, connections accepted";
  // This process has its connection since before the first turn. A smaller number is that of a
  // service that was started anew.
  if (before_ && readings_.counters &&
      valueOf(*readings_.counters, kAccepted) < valueOf(*before_, kAccepted)) {
    before_.reset();
  }
  takeDevices(readings_.now, seconds_);
}

void TopModel::takeDevices(double now, double seconds) {
  for (auto& [name, known] : devices_) {
    known.isPresent = false;
    known.reading = {};
  }
  for (DeviceReading& reading : readings_.devices) {
    Device* const known = device(reading.name);
    if (known == nullptr) continue;
    if (reading.xruns) {
      known->isCounted = true;
      if (*reading.xruns > 0) known->xruns.add(now, *reading.xruns, 0);
    }
    if (!reading.rate && reading.frames.value_or(0) > 0 && seconds > 0) {
      reading.rate = std::llround(static_cast<double>(*reading.frames) / seconds);
    }
    known->isPresent = true;
    known->reading = std::move(reading);
  }
}

std::optional<double> TopModel::rate(std::uint64_t grown) const {
  if (seconds_ <= 0) return std::nullopt;
  return static_cast<double>(grown) / seconds_;
}

std::optional<double> TopModel::ratePerSecond(const std::string& counter) const {
  if (!before_ || !readings_.counters) return std::nullopt;
  return rate(rest(valueOf(*readings_.counters, counter), valueOf(*before_, counter)));
}

TopService TopModel::service() const {
  TopService service;
  service.isConnected = readings_.isConnected;
  service.problem = readings_.problem;
  service.uptimeSeconds = readings_.uptimeSeconds;
  service.sessions = readings_.sessions;
  service.storeBytes = readings_.storeBytes;
  if (!readings_.counters) return service;
  const CounterValues& counters = *readings_.counters;
  const std::uint64_t connections = rest(valueOf(counters, "connection, connections accepted"),
                                         valueOf(counters, "connection, connections ended"));
  service.clients = rest(connections, 1);
  service.messagesPerSecond = ratePerSecond("messages, received");
  if (before_)
    service.storedPerSecond = rate(rest(storedRecords(counters), storedRecords(*before_)));
  service.waitingJobs = waitingJobs(counters);
  service.waitingRecords = waitingRecords(counters);
  return service;
}

std::vector<TopLoss> TopModel::losses() const {
  std::vector<TopLoss> losses;
  if (!readings_.counters) return losses;
  for (const auto& [counter, value] : *readings_.counters) {
    const CounterName name = splitCounter(counter);
    if (value == 0 || !platform::isLoss(name.name)) continue;
    losses.push_back({.piece = std::string(name.piece),
                      .reason = std::string(name.name),
                      .total = value,
                      .perSecond = ratePerSecond(counter)});
  }
  // What grows now comes first.
  std::ranges::stable_sort(losses, [](const TopLoss& left, const TopLoss& right) {
    return std::pair(left.perSecond.value_or(0), left.total) >
           std::pair(right.perSecond.value_or(0), right.total);
  });
  return losses;
}

std::vector<TopStream> TopModel::streams() const {
  std::vector<TopStream> streams;
  streams.reserve(streams_.size());
  for (const auto& [id, stream] : streams_) {
    TopStream& shown = streams.emplace_back(stream.shown);
    const MinuteCount::Total xruns = stream.xruns.total(readings_.now);
    shown.xruns = xruns.events;
    shown.lostMilliseconds = xruns.amount;
  }
  return streams;
}

std::vector<TopDevice> TopModel::devices(const std::vector<TopStream>& streams) const {
  struct Use {
    std::uint64_t running = 0;
    std::uint64_t xruns = 0;
  };
  std::map<std::string, Use, std::less<>> used;
  for (const TopStream& stream : streams) {
    forEachName(deviceKeys(stream), [&](std::string_view name) {
      Use& use = used[std::string(name)];
      if (stream.state == TopStreamState::kRunning) ++use.running;
      // Each stream of a device reports the cycles that the device missed. Their sum would count
      // these cycles several times.
      use.xruns = std::max(use.xruns, stream.xruns);
    });
  }
  for (const auto& [name, known] : devices_) {
    if (known.isPresent) used.try_emplace(name);
  }
  std::vector<TopDevice> devices;
  for (const auto& [name, use] : used) {
    TopDevice& shown = devices.emplace_back();
    shown.name = name;
    shown.streams = use.running;
    shown.xruns = use.xruns;
    const auto found = devices_.find(name);
    if (found == devices_.end()) continue;
    const Device& known = found->second;
    shown.description = known.description;
    shown.quantum = known.reading.quantum ? known.reading.quantum : known.quantum;
    shown.rate = known.reading.rate ? known.reading.rate : known.rate;
    if (known.reading.busySeconds && seconds_ > 0) {
      shown.busy = *known.reading.busySeconds / seconds_;
    }
    if (known.isCounted) shown.xruns = known.xruns.total(readings_.now).events;
  }
  return devices;
}

TopSnapshot TopModel::snapshot() const {
  TopSnapshot snapshot;
  snapshot.time = readings_.now;
  snapshot.seconds = seconds_;
  snapshot.service = service();
  snapshot.losses = losses();
  snapshot.streams = streams();
  snapshot.devices = devices(snapshot.streams);
  return snapshot;
}

}  // namespace halvox::tools
