// Feeds arbitrary bytes to the decoder of PipeWire's profiler events.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <vector>

#include <spa/pod/pod.h>

#include "platform/linux/drivers/pipewire/GraphStatistics.h"
#include "platform/linux/pipewire/MissedCycles.h"
#include "platform/linux/pipewire/ProfileDecoder.h"

namespace {

using namespace halvox;

void count(const std::vector<pipewire::ProfiledCycle>& cycles) {
  constexpr std::uint32_t kDriver = 30;
  constexpr std::uint32_t kFollower = 40;
  platform::linux_::GraphStatistics graph;
  graph.nodeAdded(kDriver, "Audio/Sink", "speakers");
  graph.nodeAdded(kFollower, "Audio/Source", "microphone");
  pipewire::MissedCycles missed;
  for (const auto& cycle : cycles) {
    graph.cycleEnded(cycle);
    // Only followers that were late can be at fault.
    const auto loss = missed.add(cycle);
    if (loss.fault == pipewire::CycleFault::kFollowers && cycle.late.empty()) std::abort();
  }
  platform::linux_::ReadingMaker maker;
  graph.addTo(maker, {});
  static_cast<void>(maker.finish());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < sizeof(spa_pod)) return 0;
  // Aligned, as the library passes it.
  const auto bytes = std::make_unique<std::uint8_t[]>(size);
  std::memcpy(bytes.get(), data, size);
  const auto* pod = reinterpret_cast<const spa_pod*>(bytes.get());
  // The library passes only objects that are complete.
  if (SPA_POD_SIZE(pod) > size) return 0;
  const auto cycles = pipewire::decodeProfile(pod);
  for (const auto& cycle : cycles) {
    if (!(cycle.length.count() > 0) || cycle.late.size() > cycle.followers.size()) std::abort();
    if (cycle.quantum <= 0 || cycle.rate < 0) std::abort();
    for (const auto& node : cycle.followers) {
      if (node.wait.has_value() && node.wait->count() < 0) std::abort();
      if (node.busy.has_value() && (node.busy->count() < 0 || !node.wait.has_value())) std::abort();
    }
  }
  count(cycles);
  return 0;
}
