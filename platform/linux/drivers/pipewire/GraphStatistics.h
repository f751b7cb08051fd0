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

// What is counted of the sinks and sources of one PipeWire server after another, by what the server
// tells. Nodes are known by the server's ids; an id that comes again is another node. A node that
// goes has no channels any more. When one of its class and name comes, of this server or the next,
// it has the same channels and their counts go on, so what a session counted before is not lost.
// Knows no PipeWire and no clock: whoever tells gives the time. Not thread-safe.
class GraphStatistics {
 public:
  using Time = NodeStatistics::Time;
  using NodeID = std::uint32_t;

  // More sinks and sources than that are left out: a client may make any number.
  static constexpr std::size_t kMostNodes = 256;
  static constexpr std::size_t kLongestName = 128;  // bytes; names are cut there

  GraphStatistics();

  void serverReached() { ++connections_; }
  // All of its nodes are gone.
  void serverLost(Time now);
  // Measuring begins, after a time in which nothing was told of cycles.
  void profilingBegan();

  // False when the node is neither sink nor source, or one too many; nothing more need be told of
  // it then. A node whose name would be read like that of another is called "name#id".
  bool nodeAdded(NodeID id, std::string_view mediaClass, std::string_view name);
  void nodeRemoved(NodeID id, Time now);
  void nodeStateChanged(NodeID id, std::optional<NodeState> state, Time now);
  // A cycle that is told twice in a row, as PipeWire does when one was missed, counts once.
  void cycleEnded(const pipewire::ProfiledCycle& cycle);

  // All channels: the connections, then those of the nodes by their ids.
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
  // Of nodes that are gone, the newest last; at most kMostNodes.
  std::deque<std::unique_ptr<NodeStatistics>> gone_;
  std::map<NodeID, Driver> drivers_;  // also those that are neither sink nor source
};

}  // namespace halvox::platform::linux_
