#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

struct spa_pod;

namespace halvox::pipewire {

// What a node did in one cycle. A time that was not measured in this cycle is absent.
struct ProfiledNode {
  std::uint32_t id = 0;
  std::optional<std::chrono::nanoseconds> wait{};  // from its call to the start of its work
  std::optional<std::chrono::nanoseconds> busy{};  // from there to the end of its work
  friend bool operator==(const ProfiledNode&, const ProfiledNode&) = default;
};

// A node that had not finished when the cycle ended. The name is what the profiler calls it, which
// is its node.name: events arrive up to a second late, and the node may not exist any more.
struct ProfiledLateNode {
  std::uint32_t id = 0;
  std::string name{};  // as the node's client chose it; empty if the profiler does not say
  friend bool operator==(const ProfiledLateNode&, const ProfiledLateNode&) = default;
};

// What PipeWire's profiler reports about one cycle of a driver. Has only the fields that we use.
struct ProfiledCycle {
  std::chrono::nanoseconds time{};         // of the driver's clock
  std::chrono::duration<double> length{};  // what each node had to produce or take
  std::int64_t quantum = 0;                // the length in frames
  std::int64_t rate = 0;                   // of the driver's clock, in Hz
  std::uint32_t driverXruns = 0;           // so far, since the driver started
  std::optional<ProfiledNode> driver{};
  std::string driverName{};  // the driver's node.name; empty if the profiler does not say
  // The nodes that follow the driver and whose turn it was.
  std::vector<ProfiledNode> followers{};
  // The followers that had not finished when the cycle ended.
  std::vector<ProfiledLateNode> late{};
  // The followers whose turn it was not: they still waited for another node when the cycle ended,
  // or joined the driver during the cycle.
  std::vector<std::uint32_t> waiting{};
  friend bool operator==(const ProfiledCycle&, const ProfiledCycle&) = default;
};

// The cycles of one event of the profiler, in order. Skips those that cannot be read or whose clock
// has no plausible length.
std::vector<ProfiledCycle> decodeProfile(const spa_pod* profile);

}  // namespace halvox::pipewire
