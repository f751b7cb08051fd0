#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <unordered_map>
#include <vector>

#include "reporters/pipewire/StreamProperties.h"

namespace halvox::pipewire_reporter {

// PipeWire's ID of a global object. The server may give the ID to another object after this one was
// removed.
using GlobalID = std::uint32_t;

// The devices that a stream is linked to: each once, sorted by name.
struct Route {
  struct Device {
    std::string name;         // the stable node name
    std::string description;  // for people; the name if the node has none
    // NOLINTNEXTLINE(modernize-use-nullptr): the comparison hides a literal 0
    friend auto operator<=>(const Device&, const Device&) = default;
  };
  std::vector<Device> devices;
  friend bool operator==(const Route&, const Route&) = default;
};

// A connection from a port of the node `output` to a port of the node `input`.
struct Link {
  GlobalID output = 0;
  GlobalID input = 0;
};

// Keeps the devices and the links between nodes, to find the devices of a stream. Events may repeat
// or name unknown objects. Holds one entry for each device and link of the server. A plain value
// that belongs to the loop thread.
class RouteGraph {
 public:
  // Do not add streams: a recorder that listens to a playback stream is not its device.
  void addDevice(GlobalID id, Route::Device device);
  // No route contains the device from then on. An unknown ID is ignored.
  void removeDevice(GlobalID id);
  void addLink(GlobalID id, Link link);
  // Returns the nodes that the link connected; both are 0 if the link is unknown.
  Link removeLink(GlobalID id);
  void clear();

  // Returns the devices that a stream plays to or records from; empty while it has none.
  [[nodiscard]] Route routeOf(GlobalID stream, Direction direction) const;
  // Returns whether a link connects the two nodes, in either direction.
  [[nodiscard]] bool areLinked(GlobalID node, GlobalID other) const;

 private:
  // The nodes at the other end, each with the number of links to it. Each channel has a link.
  using Peers = std::map<GlobalID, unsigned>;
  using PeerMap = std::unordered_map<GlobalID, Peers>;
  // Removes one link from `from` to `peer`.
  static void release(PeerMap& map, GlobalID from, GlobalID peer);

  std::unordered_map<GlobalID, Route::Device> devices_;
  std::unordered_map<GlobalID, Link> links_;
  PeerMap sinks_;    // by output node
  PeerMap sources_;  // by input node
};

}  // namespace halvox::pipewire_reporter
