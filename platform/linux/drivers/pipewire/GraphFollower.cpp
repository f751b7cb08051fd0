#include "platform/linux/drivers/pipewire/GraphFollower.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <string>
#include <string_view>
#include <utility>

#include <pipewire/extensions/profiler.h>
#include <pipewire/impl-module.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/pipewire/ObjectBinding.h"
#include "platform/linux/pipewire/ProfileDecoder.h"

namespace halvox::platform::linux_ {
namespace {

// The server has announced all objects before the first answer, and sent their states before the
// second.
constexpr int kRoundTrips = 2;

// A socket appears before it accepts connections, and a server that ends may still accept some.
// Therefore make a few attempts after a socket has appeared or a connection has ended.
constexpr int kAttempts = 5;
constexpr auto kPauseBetweenAttempts = std::chrono::milliseconds(200);

std::string_view lookUp(const spa_dict* properties, const char* key) {
  const char* value = properties == nullptr ? nullptr : spa_dict_lookup(properties, key);
  return value == nullptr ? std::string_view() : value;
}

std::optional<NodeState> nodeState(pw_node_state state) {
  switch (state) {
    case PW_NODE_STATE_RUNNING:
      return NodeState::kRunning;
    case PW_NODE_STATE_IDLE:
      return NodeState::kIdle;
    case PW_NODE_STATE_SUSPENDED:
      return NodeState::kSuspended;
    // Reports have no state for either of these.
    case PW_NODE_STATE_CREATING:
    case PW_NODE_STATE_ERROR:
      break;
  }
  return std::nullopt;
}

// Load only what is needed: no user configuration, no real-time scheduling, no bus.
pipewire::UniqueContext makeContext(pw_loop* loop, const ObjectLog& log) {
  // The library warns about the missing parts. They are missing on purpose.
  if (std::getenv("PIPEWIRE_DEBUG") == nullptr) pw_log_set_level(SPA_LOG_LEVEL_ERROR);
  pipewire::UniqueContext context(
      pw_context_new(loop, pw_properties_new(PW_KEY_CONFIG_NAME, "null", nullptr), 0));
  if (context == nullptr) return nullptr;
  if (pw_context_load_module(context.get(), "libpipewire-module-protocol-native", nullptr,
                             nullptr) == nullptr) {
    return nullptr;
  }
  if (!pipewire::loadProfilerModule(context.get())) {
    log.error("PipeWire's profiler module is not installed; cycles and xruns are not counted");
  }
  return context;
}

}  // namespace

// Follows the states of one sink or source.
class GraphFollower::Node {
 public:
  Node(GraphFollower& connection, GlobalID id)
      : graph_(connection.graph_),
        id_(id),
        binding_(connection.server_.registry(), id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE) {
    static const pw_node_events kEvents = {
        .version = PW_VERSION_NODE_EVENTS, .info = &Node::onInfo, .param = nullptr};
    if (binding_.isBound()) binding_.listen(&kEvents, this);
  }

 private:
  static void onInfo(void* data, const pw_node_info* info) {
    auto* self = static_cast<Node*>(data);
    if ((info->change_mask & PW_NODE_CHANGE_MASK_STATE) == 0) return;
    const MutexLock lock(self->graph_.mutex);
    self->graph_.statistics.nodeStateChanged(self->id_, nodeState(info->state), Clock::now());
  }

  SharedGraph& graph_;
  const GlobalID id_;
  pipewire::ObjectBinding binding_;
};

GraphFollower::GraphFollower(pw_loop* loop, SharedGraph& graph, LogCategory& log)
    : loop_(loop),
      graph_(graph),
      log_(log, "GraphFollower"),
      timer_(pw_loop_add_timer(loop, &GraphFollower::onTimer, this)),
      watch_(loop, [this] { serverAppeared(); }),
      context_(timer_ != nullptr ? makeContext(loop, log_) : nullptr),
      server_(context_.get(), *this) {
  if (context_ == nullptr) {
    log_.error("cannot set up PipeWire's library: ", errnoText(errno),
               "; PipeWire counters are disabled until the service restarts");
  }
}

GraphFollower::~GraphFollower() {
  disconnect();
  if (timer_ != nullptr) pw_loop_destroy_source(loop_, timer_);
}

void GraphFollower::update() {
  attempts_ = std::max(attempts_, 1);
  proceed();
}

void GraphFollower::serverAppeared() {
  attempts_ = kAttempts;
  proceed();
}

bool GraphFollower::isLeased() {
  const MutexLock lock(graph_.mutex);
  return !graph_.lease.expired();
}

void GraphFollower::proceed() {
  // Disable the timer, because it would cause a second attempt.
  proceedAfter(std::nullopt);
  const bool isWanted = isLeased();
  // Disconnect first, because everything below would otherwise use the connection that has ended.
  if (std::exchange(isLost_, false)) {
    disconnect();
    if (isWanted) {
      watch_.begin();
      proceedAfter(kPauseBetweenAttempts);
    }
    return;
  }
  // Try once even if no session needs the server, because the service looks for channels at its
  // start, when no session runs yet.
  if (!server_.isConnected() && (isWanted || !isTried_)) lookForServer();
  // Stop watching, because nothing may wake this thread while no session runs or while the server
  // is connected.
  if (server_.isConnected() || !isWanted) watch_.end();
  updateProfiler(isWanted);
}

void GraphFollower::lookForServer() {
  // Watch before the attempt, because a socket that appears after the attempt must be noticed.
  watch_.begin();
  if (attempts_ == 0) return;
  --attempts_;
  connect();
  if (!server_.isConnected() && attempts_ > 0) proceedAfter(kPauseBetweenAttempts);
}

void GraphFollower::connect() {
  isTried_ = true;
  if (server_.connect(pw_properties_new(PW_KEY_APP_NAME, "halvox-reportingd", nullptr))) {
    roundTrips_ = 0;
    server_.requestAnswer();
    return;
  }
  if (!std::exchange(isMissingLogged_, true)) {
    log_.info("cannot connect to PipeWire: ", errnoText(errno),
              "; waiting for it while sessions run");
  }
  settle();
}

void GraphFollower::disconnect() {
  if (!server_.isConnected()) return;
  updateProfiler(false);
  profilerID_.reset();
  // Destroy the bindings before the connection, which they use to release the server's objects.
  nodes_.clear();
  server_.disconnect();
  settle();
  const MutexLock lock(graph_.mutex);
  graph_.statistics.serverLost(Clock::now());
}

void GraphFollower::settle() {
  {
    const MutexLock lock(graph_.mutex);
    graph_.isSettled = true;
  }
  graph_.settled.notifyAll();
}

void GraphFollower::proceedAfter(std::optional<Clock::duration> pause) {
  timespec value{};
  if (pause.has_value()) {
    // A time of 0 would stop the timer instead.
    const auto positive = std::max<Clock::duration>(*pause, std::chrono::milliseconds(1));
    const auto seconds = std::chrono::floor<std::chrono::seconds>(positive);
    value.tv_sec = seconds.count();
    value.tv_nsec = std::chrono::nanoseconds(positive - seconds).count();
  }
  pw_loop_update_timer(loop_, timer_, &value, nullptr, false);
}

void GraphFollower::updateProfiler(bool isWanted) {
  const bool isPossible = server_.isConnected() && profilerID_.has_value();
  if (isWanted && isPossible && profiler_ == nullptr) {
    {
      const MutexLock lock(graph_.mutex);
      // Do this before binding, because what the driver has counted until now must not count for
      // this session.
      graph_.statistics.profilingBegan();
    }
    profiler_ = std::make_unique<pipewire::ProfilerBinding>(
        server_.registry(), *profilerID_, [this](const spa_pod* profile) { onProfile(profile); });
  } else if (!isWanted || !isPossible) {
    profiler_.reset();
  }
  const MutexLock lock(graph_.mutex);
  graph_.isProfiling = profiler_ != nullptr;
}

void GraphFollower::onProfile(const spa_pod* profile) {
  // Decode before taking the lock, for which readings may wait.
  const auto cycles = pipewire::decodeProfile(profile);
  const MutexLock lock(graph_.mutex);
  for (const pipewire::ProfiledCycle& cycle : cycles) graph_.statistics.cycleEnded(cycle);
}

void GraphFollower::onTimer(void* data, std::uint64_t /*expirations*/) {
  static_cast<GraphFollower*>(data)->proceed();
}

void GraphFollower::onServerReached(const pw_core_info& server) {
  isMissingLogged_ = false;
  attempts_ = kAttempts;
  log_.notice("following PipeWire ", server.version, " (", server.name, ")");
  const MutexLock lock(graph_.mutex);
  graph_.statistics.serverReached();
}

void GraphFollower::onServerLost() {
  isLost_ = true;
  log_.notice("the connection to PipeWire ended; waiting for the server while sessions run");
  // Let the timer's callback disconnect, because the library does not allow that inside this call.
  proceedAfter(Clock::duration::zero());
}

void GraphFollower::onGlobal(const pipewire::Global& global) {
  if (global.type == PW_TYPE_INTERFACE_Node) {
    bool isWanted = false;
    {
      const MutexLock lock(graph_.mutex);
      isWanted =
          graph_.statistics.nodeAdded(global.id, lookUp(global.properties, PW_KEY_MEDIA_CLASS),
                                      lookUp(global.properties, PW_KEY_NODE_NAME));
    }
    if (isWanted) nodes_[global.id] = std::make_unique<Node>(*this, global.id);
  } else if (global.type == PW_TYPE_INTERFACE_Profiler) {
    profilerID_ = global.id;
    updateProfiler(isLeased());
  }
}

void GraphFollower::onGlobalRemoved(GlobalID id) {
  if (profilerID_ == id) {
    profilerID_.reset();
    updateProfiler(false);
  }
  nodes_.erase(id);
  const MutexLock lock(graph_.mutex);
  graph_.statistics.nodeRemoved(id, Clock::now());
}

void GraphFollower::onRefused(GlobalID id, const char* message) {
  log_.info("PipeWire refused a request: ", message, " (object ", id, "); continuing without it");
}

void GraphFollower::onAnswered() {
  ++roundTrips_ < kRoundTrips ? server_.requestAnswer() : settle();
}

}  // namespace halvox::platform::linux_
