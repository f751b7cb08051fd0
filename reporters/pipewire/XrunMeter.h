#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "reporters/pipewire/RouteGraph.h"

namespace halvox::pipewire_reporter {

// A node that was late: it did not finish its part of a cycle in time.
struct LateNode {
  GlobalID id = 0;
  std::string name{};                     // empty if unknown
  std::optional<std::uint64_t> serial{};  // unknown if the node is
  std::string process{};                  // its binary; empty if unknown
};

// Cycles that a device missed at one time. All streams that ran on it lost the same.
struct DeviceXrun {
  using Seconds = std::chrono::duration<double>;

  GlobalID driver = 0;  // the device's node
  std::string device{};
  std::int64_t cycles = 0;
  Seconds lost{};            // of all these cycles
  std::int64_t quantum = 0;  // of each cycle, in frames
  std::int64_t rate = 0;     // in Hz; 0 if unknown
  std::vector<LateNode>
      late{};  // empty if nobody knows who was late; the driver may be one of them
};

// What a stream was when cycles were missed.
enum class XrunRole : std::uint8_t {
  kUnknown,  // nobody knows who was late
  kCulprit,  // it was late itself
  kVictim,   // another node was late
  kDevice,   // the device was
};

// What one stream has lost since the report before.
//
// A report names one late node: the one that was late in most of the missed cycles. If two nodes
// were late equally often, it names the stream itself, or else the node that was late first.
// Device, quantum and rate are those of the last cycle in which that node was late.
struct XrunReport {
  DeviceXrun::Seconds lost{};
  std::int64_t cycles = 0;
  std::string device{};
  std::int64_t quantum = 0;
  std::int64_t rate = 0;
  XrunRole role = XrunRole::kUnknown;
  LateNode late{};  // meaningful unless the role is kUnknown
};

// Adds up what one stream lost, and decides when to report it: at once, but at most once a second.
// A plain value that belongs to the loop thread. All times are of one clock.
class XrunMeter {
 public:
  using Time = std::chrono::nanoseconds;
  using Seconds = DeviceXrun::Seconds;

  static constexpr std::chrono::seconds kDistance{1};
  // The late nodes among which a report chooses. Any client of PipeWire can create nodes that are
  // late; further ones only count as lost cycles.
  static constexpr std::size_t kMaxLateNodes = 64;

  // `stream` is the ID of the stream's node.
  explicit XrunMeter(GlobalID stream) : stream_(stream) {}

  // The stream ran on a device that missed cycles.
  void add(const DeviceXrun& xrun);
  // Returns what was lost since the last report, if anything was and a report is due. A report is
  // also due when the clock was set back, which would otherwise delay it for an unknown time.
  [[nodiscard]] std::optional<XrunReport> takeDue(Time now);
  // Returns what was lost since the last report, due or not. For a stream that ends.
  [[nodiscard]] std::optional<XrunReport> takeRest();

 private:
  // In how many of the missed cycles a node was late.
  struct Tally {
    XrunRole role = XrunRole::kUnknown;
    LateNode node{};
    std::int64_t cycles = 0;
    std::string device{};
    std::int64_t quantum = 0;
    std::int64_t rate = 0;
  };

  void count(const DeviceXrun& xrun, XrunRole role, const LateNode& node);
  [[nodiscard]] XrunRole roleOf(const LateNode& node, GlobalID driver) const;

  const GlobalID stream_;
  Seconds lost_{0};
  std::int64_t cycles_ = 0;
  std::vector<Tally> tallies_;  // in the order in which the nodes were first late
  std::optional<Time> lastReport_;
};

}  // namespace halvox::pipewire_reporter
