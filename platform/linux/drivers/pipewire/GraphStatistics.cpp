#include "platform/linux/drivers/pipewire/GraphStatistics.h"

#include <algorithm>
#include <span>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/drivers/pipewire/NodeChannel.h"

namespace halvox::platform::linux_ {
namespace {

// The group for a media class; empty if it is neither sink nor source. A node that is both counts
// as a sink.
std::string_view groupOf(std::string_view mediaClass) {
  if (mediaClass == "Audio/Sink" || mediaClass == "Audio/Duplex") return kSinkGroup;
  if (mediaClass == "Audio/Source" || mediaClass == "Audio/Source/Virtual") return kSourceGroup;
  return {};
}

// Returns at most the first kLongestName bytes, cut between characters.
std::string cleanName(std::string_view name) {
  std::size_t length = 0;
  while (length < name.size()) {
    const std::size_t next = length + nextUtf8(name.substr(length)).length;
    if (next > GraphStatistics::kLongestName) break;
    length = next;
  }
  return replaceInvalidUtf8(name.substr(0, length));
}

// The part of a driver's name that the keys of a report contain.
std::string readName(std::string_view name) {
  std::string read(name.substr(0, name.find('<')));
  std::erase_if(read, [](char letter) { return letter == '_' || letter == ' '; });
  return read;
}

}  // namespace

GraphStatistics::GraphStatistics()
    : connectionsChannels_{
          makeChannel(describeNodeChannel(kSinkGroup, "pipewire", "connections")),
          makeChannel(describeNodeChannel(kSourceGroup, "pipewire", "connections"))} {}

void GraphStatistics::serverLost(Time now) {
  // Keep the statistics, because this process has made the counts itself, and continues them after
  // the server has restarted.
  for (auto& [id, node] : nodes_) keep(std::move(node), now);
  nodes_.clear();
  drivers_.clear();
}

void GraphStatistics::profilingBegan() { drivers_.clear(); }

bool GraphStatistics::nodeAdded(NodeID id, std::string_view mediaClass, std::string_view name) {
  const std::string_view group = groupOf(mediaClass);
  if (group.empty() || nodes_.size() >= kMostNodes) return false;
  nodes_[id] = statisticsOf(group, nameFor(id, group, name));
  return true;
}

void GraphStatistics::nodeRemoved(NodeID id, Time now) {
  if (const auto found = nodes_.find(id); found != nodes_.end()) {
    keep(std::move(found->second), now);
    nodes_.erase(found);
  }
  drivers_.erase(id);
}

void GraphStatistics::keep(std::unique_ptr<NodeStatistics> node, Time now) {
  node->left(now);
  // Bounded, because programs can make nodes of new names without end.
  if (gone_.size() == kMostNodes) gone_.pop_front();
  gone_.push_back(std::move(node));
}

// Returns the statistics of the node of that name that has disappeared, or new ones if there is
// none.
std::unique_ptr<NodeStatistics> GraphStatistics::statisticsOf(std::string_view group,
                                                              const std::string& name) {
  const auto found = std::ranges::find_if(gone_, [&](const auto& node) {
    return node->group() == group && node->driverName() == name;
  });
  if (found == gone_.end()) {
    return std::make_unique<NodeStatistics>(std::string(group), name);
  }
  auto node = std::move(*found);
  gone_.erase(found);
  return node;
}

void GraphStatistics::nodeStateChanged(NodeID id, std::optional<NodeState> state, Time now) {
  if (auto* node = find(id)) node->stateChanged(state, now);
}

void GraphStatistics::cycleEnded(const pipewire::ProfiledCycle& cycle) {
  if (!cycle.driver.has_value()) return;
  const auto [found, isFirst] = drivers_.try_emplace(cycle.driver->id);
  Driver& driver = found->second;
  const bool isRepeated = !isFirst && driver.lastCycle == cycle.time;
  // A driver that restarts may begin its count again.
  const bool hasXruns = !isFirst && cycle.driverXruns > driver.xruns;
  const std::uint32_t xruns = hasXruns ? cycle.driverXruns - driver.xruns : 0;
  driver = {.lastCycle = cycle.time, .xruns = cycle.driverXruns};
  if (auto* node = find(cycle.driver->id)) {
    if (!isRepeated) node->cycleEnded(*cycle.driver);
    node->clockIs(cycle.quantum, cycle.rate);
    node->xrunsHappened(xruns);
  }
  if (isRepeated) return;
  for (const pipewire::ProfiledNode& follower : cycle.followers) {
    auto* const node = find(follower.id);
    if (node == nullptr) continue;
    node->cycleEnded(follower);
    node->clockIs(cycle.quantum, cycle.rate);
  }
  for (const pipewire::ProfiledLateNode& late : cycle.late) {
    if (auto* node = find(late.id)) node->xrunsHappened(1);
  }
}

void GraphStatistics::addTo(ReadingMaker& maker, Time now) const {
  for (const auto& channel : connectionsChannels_) {
    maker.add(channel, std::span(&connections_, 1));
  }
  for (const auto& [id, node] : nodes_) node->addTo(maker, now);
}

NodeStatistics* GraphStatistics::find(NodeID id) {
  const auto found = nodes_.find(id);
  return found == nodes_.end() ? nullptr : found->second.get();
}

// Inserts the ID before any "<", because the keys of a report omit everything after it.
std::string GraphStatistics::nameFor(NodeID id, std::string_view group,
                                     std::string_view name) const {
  std::string own = cleanName(name);
  const auto isTaken = [&] {
    return std::ranges::any_of(nodes_, [&](const auto& entry) {
      return entry.second->group() == group &&
             readName(entry.second->driverName()) == readName(own);
    });
  };
  while (isTaken()) own.insert(std::min(own.find('<'), own.size()), "#" + std::to_string(id));
  return own;
}

}  // namespace halvox::platform::linux_
