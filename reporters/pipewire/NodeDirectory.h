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

// Knows the names, serials and processes of a server's nodes, to identify the nodes that were late.
//
// The profiler reports a cycle up to a second later. A program that stalls and is then killed has
// no node any more by then, and the server may have given the node's ID to another node. The
// directory therefore also remembers the last nodes that have disappeared, and compares the names.
// A plain value that belongs to the loop thread. Its size is bounded, because any client can create
// nodes.
class NodeDirectory {
 public:
  static constexpr std::size_t kMaxNodes = 16384;  // further ones stay unknown
  static constexpr std::size_t kMaxGone = 64;      // the oldest is forgotten

  // Stores the properties of a node. Replaces what was known of this ID.
  void set(GlobalID id, std::uint64_t serial, const Properties& properties);
  // The node has disappeared. An unknown ID is ignored.
  void remove(GlobalID id);
  void clear();

  // Returns what is known of the node that had this ID when the profiler called it `name`. Without
  // a name, returns what is known of the node that has the ID now.
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
