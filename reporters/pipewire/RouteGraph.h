#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <unordered_map>
#include <vector>

#include "reporters/pipewire/StreamProperties.h"

namespace halvox::pipewire_reporter {

// What PipeWire calls a global's ID: it is reused after the object has gone.
using GlobalID = std::uint32_t;

// The devices that a stream is linked to, each once, ordered by name.
struct Route {
  struct Device {
    std::string name;         // the stable node name
    std::string description;  // for people; the name when there is none
    // The comparison hides a literal 0. NOLINTNEXTLINE(modernize-use-nullptr)
    friend auto operator<=>(const Device&, const Device&) = default;
  };
  std::vector<Device> devices;
  friend bool operator==(const Route&, const Route&) = default;
};

struct Link {
  GlobalID output = 0;
  GlobalID input = 0;
};

// Which nodes are linked to which, to find the devices behind a stream.
// Belongs to one thread. Holds one entry per device and link that PipeWire has.
class RouteGraph {
 public:
  // Other streams are no devices: they are not to be added here.
  void addDevice(GlobalID id, Route::Device device);
  void removeDevice(GlobalID id);
  void addLink(GlobalID id, Link link);
  // The nodes that it linked; both 0 when there is no such link.
  Link removeLink(GlobalID id);
  void clear();

  // Where a stream plays to or records from; empty while it is linked to no device.
  [[nodiscard]] Route routeOf(GlobalID stream, Direction direction) const;

 private:
  // The nodes at the other end, each with the number of links to it (one a channel).
  using Peers = std::map<GlobalID, unsigned>;
  using PeerMap = std::unordered_map<GlobalID, Peers>;
  static void release(PeerMap& map, GlobalID from, GlobalID peer);

  std::unordered_map<GlobalID, Route::Device> devices_;
  std::unordered_map<GlobalID, Link> links_;
  PeerMap sinks_;    // of an output node
  PeerMap sources_;  // of an input node
};

}  // namespace halvox::pipewire_reporter
