#include "reporters/pipewire/RouteGraph.h"

#include <algorithm>
#include <utility>

namespace halvox::pipewire_reporter {

void RouteGraph::addDevice(GlobalID id, Route::Device device) { devices_[id] = std::move(device); }

void RouteGraph::removeDevice(GlobalID id) { devices_.erase(id); }

void RouteGraph::addLink(GlobalID id, Link link) {
  // A link that is announced twice must not be counted twice, because its removal is announced
  // once.
  if (!links_.emplace(id, link).second) {
    return;
  }
  ++sinks_[link.output][link.input];
  ++sources_[link.input][link.output];
}

Link RouteGraph::removeLink(GlobalID id) {
  const auto found = links_.find(id);
  if (found == links_.end()) {
    return {};
  }
  const Link link = found->second;
  links_.erase(found);
  release(sinks_, link.output, link.input);
  release(sources_, link.input, link.output);
  return link;
}

void RouteGraph::clear() { *this = {}; }

Route RouteGraph::routeOf(GlobalID stream, Direction direction) const {
  const PeerMap& map = direction == Direction::kPlayback ? sinks_ : sources_;
  Route route;
  const auto peers = map.find(stream);
  if (peers == map.end()) {
    return route;
  }
  for (const auto& [peer, count] : peers->second) {
    if (const auto device = devices_.find(peer); device != devices_.end()) {
      route.devices.push_back(device->second);
    }
  }
  std::ranges::sort(route.devices);
  // Sorted and without repeats, so that a route that is the same compares equal whatever the order
  // of the links.
  route.devices.erase(std::unique(route.devices.begin(), route.devices.end()), route.devices.end());
  return route;
}

bool RouteGraph::areLinked(GlobalID node, GlobalID other) const {
  const auto connects = [](const PeerMap& map, GlobalID from, GlobalID peer) {
    const auto peers = map.find(from);
    return peers != map.end() && peers->second.contains(peer);
  };
  return connects(sinks_, node, other) || connects(sources_, node, other);
}

void RouteGraph::release(PeerMap& map, GlobalID from, GlobalID peer) {
  Peers& peers = map[from];
  // A stereo stream has two links to its device; the device stays until the last one is removed.
  if (--peers[peer] == 0) {
    peers.erase(peer);
  }
  if (peers.empty()) {
    map.erase(from);
  }
}

}  // namespace halvox::pipewire_reporter
