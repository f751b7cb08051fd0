#pragma once

#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>

#include "reporters/pipewire/RouteGraph.h"
#include "reporters/pipewire/StreamProperties.h"
#include "reporters/pipewire/XrunMeter.h"

namespace halvox::pipewire_reporter {

// Knows who the nodes of a server are, to name the ones that were late.
//
// The profiler reports up to a second later. A program that stalls and is then killed has no node
// any more, and the server may have given the ID to another. The directory therefore also remembers
// the last nodes that have disappeared, and compares the names.
// A plain value that belongs to the loop thread. Bounded: any client can create nodes.
class NodeDirectory {
 public:
  static constexpr std::size_t kMaxNodes = 16384;  // further ones stay unknown
  static constexpr std::size_t kMaxGone = 64;      // the oldest is forgotten

  // A node has these properties. Replaces what was known of the ID.
  void set(GlobalID id, std::uint64_t serial, const Properties& properties);
  // An unknown ID is ignored.
  void remove(GlobalID id);
  void clear();

  // Returns what is known of the node that had this ID when the profiler called it `name`. Without
  // a name, it is the node that has the ID now.
  [[nodiscard]] LateNode describe(GlobalID id, std::string_view name) const;

 private:
  struct Node {
    GlobalID id = 0;
    std::uint64_t serial = 0;
    std::string name;
    std::string process;
  };

  std::unordered_map<GlobalID, Node> nodes_;
  std::deque<Node> gone_;  // the latest last
};

}  // namespace halvox::pipewire_reporter
