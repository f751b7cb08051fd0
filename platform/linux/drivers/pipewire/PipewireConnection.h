#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <unordered_map>

#include <pipewire/pipewire.h>

#include "platform/linux/drivers/pipewire/SharedGraph.h"
#include "platform/linux/pipewire/Handles.h"
#include "platform/linux/pipewire/ObjectBinding.h"

namespace halvox::platform::linux_ {

// Follows a PipeWire server and writes what it tells into the graph. All of it runs on the loop's
// thread, except construction and destruction, while that thread does not run. Borrows loop and
// graph. A server that goes or is not there is no error; it is looked for again as PipewireSource
// says.
class PipewireConnection {
 public:
  PipewireConnection(pw_loop* loop, SharedGraph& graph, std::chrono::milliseconds retry);
  ~PipewireConnection();
  PipewireConnection(const PipewireConnection&) = delete;
  PipewireConnection& operator=(const PipewireConnection&) = delete;

  // False when the library cannot be used at all, which is logged.
  [[nodiscard]] bool isUsable() const { return context_ != nullptr; }
  // Connects, or binds or lets go of the profiler, as the graph's lease says. Never from within a
  // callback of the server's objects, because it may destroy them.
  void update();

 private:
  using Clock = std::chrono::steady_clock;
  using GlobalID = std::uint32_t;
  class Node;

  [[nodiscard]] bool isLeased();
  void connectWhenDue();
  void connect();
  void listen();
  void disconnect();
  void settle();
  // Has update() run after that time, or not any more.
  void updateAfter(std::optional<Clock::duration> pause);
  void updateProfiler(bool isWanted);
  void onProfile(const spa_pod* profile);

  static void onTimer(void* data, std::uint64_t expirations);
  static void onCoreInfo(void* data, const pw_core_info* info);
  static void onCoreDone(void* data, std::uint32_t id, int sequence);
  static void onCoreError(void* data, std::uint32_t id, int sequence, int result,
                          const char* message);
  static void onGlobal(void* data, std::uint32_t id, std::uint32_t permissions, const char* type,
                       std::uint32_t version, const spa_dict* properties);
  static void onGlobalRemove(void* data, std::uint32_t id);

  pw_loop* const loop_;
  SharedGraph& graph_;
  const Clock::duration retry_;
  spa_source* timer_ = nullptr;
  std::optional<Clock::time_point> lastAttempt_;  // or when the server went
  bool isLost_ = false;
  bool isReached_ = false;
  bool isMissingTold_ = false;
  int sync_ = 0;
  int roundTrips_ = 0;
  pipewire::UniqueContext context_;
  pipewire::UniqueCore core_;
  pipewire::UniqueRegistry registry_;
  spa_hook coreHook_{};
  spa_hook registryHook_{};
  std::unordered_map<GlobalID, std::unique_ptr<Node>> nodes_;
  std::optional<GlobalID> profilerID_;
  std::unique_ptr<pipewire::ProfilerBinding> profiler_;
};

}  // namespace halvox::platform::linux_
