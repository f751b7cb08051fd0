#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/drivers/ReadingMaker.h"
#include "platform/linux/drivers/pipewire/NodeStatistics.h"
#include "platform/linux/pipewire/ProfileDecoder.h"

namespace halvox::platform::linux_ {

// Counts what the sinks and sources of a PipeWire server do, across restarts of the server.
//
// Nodes are identified by the server's IDs; an ID that is used again is another node. When a node
// disappears, its channels do too. When a node of the same class and name appears, on this server
// or the next, it gets the same channels and their counts continue. A session therefore does not
// lose what was counted before. Counts can continue on another server because they are made here
// and not by the server.
//
// This class uses neither PipeWire nor a clock, and its tests need neither, because the caller
// passes events and times. Not thread-safe; SharedGraph owns and guards it. Cannot fail.
class GraphStatistics {
 public:
  using Time = NodeStatistics::Time;
  using NodeID = std::uint32_t;

  // Further sinks and sources are ignored, because any client can create nodes.
  static constexpr std::size_t kMostNodes = 256;
  static constexpr std::size_t kLongestName = 128;  // bytes; longer names are cut

  GraphStatistics();

  void serverReached() { ++connections_; }
  // The connection has ended. All nodes have disappeared with it.
  void serverLost(Time now);
  // The profiler begins to report cycles. Cycles before this call were not reported.
  void profilingBegan();

  // Returns false if the node is neither sink nor source, or if there are kMostNodes already. The
  // caller then need not pass its later events. If two nodes would have the same key in a report,
  // the later one is called "name#id".
  bool nodeAdded(NodeID id, std::string_view mediaClass, std::string_view name);
  void nodeRemoved(NodeID id, Time now);
  void nodeStateChanged(NodeID id, std::optional<NodeState> state, Time now);
  // PipeWire reports a cycle twice in a row if one was missed; the second report is ignored.
  void cycleEnded(const pipewire::ProfiledCycle& cycle);

  // Adds all channels: the connections, then those of the nodes by ID.
  void addTo(ReadingMaker& maker, Time now) const;

 private:
  struct Driver {
    std::chrono::nanoseconds lastCycle{};
    std::uint32_t xruns = 0;
  };

  [[nodiscard]] NodeStatistics* find(NodeID id);
  [[nodiscard]] std::string nameFor(NodeID id, std::string_view group, std::string_view name) const;
  [[nodiscard]] std::unique_ptr<NodeStatistics> statisticsOf(std::string_view group,
                                                             const std::string& name);
  void keep(std::unique_ptr<NodeStatistics> node, Time now);
  std::array<ChannelList::Channel, 2> connectionsChannels_;
  std::uint64_t connections_ = 0;
  std::map<NodeID, std::unique_ptr<NodeStatistics>> nodes_;
  // The statistics of nodes that have disappeared, the latest last. At most kMostNodes. If there
  // are more, the oldest one is removed.
  std::deque<std::unique_ptr<NodeStatistics>> gone_;
  std::map<NodeID, Driver> drivers_;  // including nodes that are neither sink nor source
};

}  // namespace halvox::platform::linux_
