#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <unordered_map>

#include <pipewire/pipewire.h>

#include "platform/linux/drivers/pipewire/ServerWatch.h"
#include "platform/linux/drivers/pipewire/SharedGraph.h"
#include "platform/linux/pipewire/Handles.h"
#include "platform/linux/pipewire/ProfilerBinding.h"
#include "platform/linux/pipewire/ServerConnection.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// Follows a PipeWire server and writes its events into the graph.
//
//   waiting --a connection succeeds--> following --the connection ends--> waiting
//
// Threads: everything runs on the loop's thread, except construction and destruction, which happen
// while that thread does not run. PipeWireDriverSource owns the follower, which borrows the loop
// and the graph. Failure: a server that is missing or disconnects is not an error. The comment of
// PipeWireDriverSource says when a server is searched for.
class GraphFollower final : private pipewire::ServerListener {
 public:
  // Does not own its arguments, which must outlive it.
  GraphFollower(pw_loop* loop, SharedGraph& graph, LogCategory& log);
  ~GraphFollower() override;

  // Returns false and logs an error if the library cannot be used at all.
  [[nodiscard]] bool isUsable() const { return context_ != nullptr; }
  // Connects to the server or waits for it, and binds or releases the profiler, depending on the
  // graph's lease. Must not be called from a callback of the server's objects, because it may
  // destroy them.
  void update();

 private:
  using Clock = std::chrono::steady_clock;
  using GlobalID = pipewire::GlobalID;
  class Node;

  [[nodiscard]] bool isLeased();
  // Does the work of update(), but allows no additional attempt to connect.
  void proceed();
  void lookForServer();
  void connect();
  void disconnect();
  void settle();
  // Runs proceed() after `pause`. std::nullopt cancels the run.
  void proceedAfter(std::optional<Clock::duration> pause);
  void serverAppeared();
  void updateProfiler(bool isWanted);
  void onProfile(const spa_pod* profile);

  void onServerReached(const pw_core_info& server) override;
  void onServerLost() override;
  void onGlobal(const pipewire::Global& global) override;
  void onGlobalRemoved(GlobalID id) override;
  void onRefused(GlobalID id, const char* message) override;
  void onAnswered() override;
  static void onTimer(void* data, std::uint64_t expirations);

  pw_loop* const loop_;
  SharedGraph& graph_;
  const ObjectLog log_;
  spa_source* timer_ = nullptr;
  ServerWatch watch_;
  int attempts_ = 0;  // remaining attempts to connect
  bool isTried_ = false;
  bool isLost_ = false;
  bool isMissingLogged_ = false;
  int roundTrips_ = 0;
  pipewire::UniqueContext context_;
  pipewire::ServerConnection server_;
  std::unordered_map<GlobalID, std::unique_ptr<Node>> nodes_;
  std::optional<GlobalID> profilerID_;
  std::unique_ptr<pipewire::ProfilerBinding> profiler_;
};

}  // namespace halvox::platform::linux_
