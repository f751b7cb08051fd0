#include "reporters/pipewire/StreamWatcher.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <stdexcept>
#include <unordered_map>
#include <utility>

#include <fmt/format.h>
#include <pipewire/extensions/profiler.h>
#include <pipewire/pipewire.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/pipewire/Handles.h"
#include "platform/linux/pipewire/ProfileDecoder.h"
#include "platform/linux/pipewire/ProfilerBinding.h"
#include "platform/linux/pipewire/ServerConnection.h"
#include "reporters/pipewire/ClientBinding.h"
#include "reporters/pipewire/DictDecoder.h"
#include "reporters/pipewire/ParamDecoder.h"
#include "reporters/pipewire/StreamBinding.h"

namespace halvox::pipewire_reporter {
namespace {

using pipewire::ProfiledCycle;
using pipewire::ProfilerBinding;
using std::chrono::milliseconds;
// Not 0, which would disarm the timer.
constexpr milliseconds kReconnectSoon{1};
constexpr milliseconds kReconnectMin{100};
constexpr milliseconds kReconnectMax{5000};
constexpr std::string_view kClientIDProperty = "client.id";
constexpr std::string_view kSerialProperty = "object.serial";
constexpr const char* kPortalProperty = "pipewire.access.portal.app_id";

// Returns the number under a key, or 0 when there is none or it is too large.
GlobalID idProperty(const Properties& properties, std::string_view key) {
  const auto number = parseNumber(property(properties, key)).value_or(0);
  return number <= UINT32_MAX ? static_cast<GlobalID>(number) : 0;
}

void fillIn(Properties& properties, std::string_view key, std::string_view value) {
  std::string& text = properties[std::string(key)];
  if (text.empty()) {
    text = value;
  }
}

// Returns a stream's properties, completed by what its client says about the application. The
// stream's own properties take precedence.
Properties withClient(const Properties& stream, const Properties& client) {
  Properties all = stream;
  // The server determines the application of a sandbox. A stream must not claim to be in one.
  all.erase(kPortalProperty);
  if (const auto application = property(client, kPortalProperty); !application.empty()) {
    fillIn(all, kPortalProperty, application);
  }
  for (const auto& [key, value] : client) {
    if (key.starts_with("application.") || key == "client.api") {
      fillIn(all, key, value);
    }
  }
  // The server took this process ID from the socket's credentials.
  if (const auto pid = property(client, "pipewire.sec.pid"); !pid.empty()) {
    fillIn(all, "application.process.id", pid);
  }
  return all;
}

}  // namespace

// The timer and all callbacks run on the loop thread. A callback may destroy bindings of other
// objects, but not the binding that called it, which the library still uses.
class StreamWatcher::Impl final : public StreamListener, private pipewire::ServerListener {
 public:
  Impl(pw_loop* loop, StreamTracker& tracker, Options options)
      : loop_(loop),
        tracker_(tracker),
        options_(std::move(options)),
        retry_(pw_loop_add_timer(loop, &Impl::onRetry, this)),
        context_(pw_context_new(loop, nullptr, 0)),
        server_(context_.get(), *this) {
    if (context_ == nullptr || retry_ == nullptr) {
      throw std::runtime_error(
          fmt::format("cannot set up PipeWire's library: {}", platform::linux_::errnoText(errno)));
    }
    // Loaded before the connection, because the library must know the profiler's interface when the
    // profiler is bound.
    if (options_.xruns && !pipewire::loadProfilerModule(context_.get())) {
      options_.xruns = false;
      options_.log("xruns are not reported: PipeWire's profiler module is not installed");
    }
    connect();
  }
  ~Impl() override {
    disconnect();
    pw_loop_destroy_source(loop_, retry_);
  }

 private:
  void connect();
  void disconnect();
  void retryAfter(milliseconds pause);
  void addNode(GlobalID id, const Properties& properties);
  void passNode(GlobalID id, const Properties& announced);
  void addLink(GlobalID id, const Properties& properties);
  void clientChanged(GlobalID id);
  void updateProfiler();
  void onProfile(const spa_pod* profile);
  [[nodiscard]] Properties fullProperties(const Properties& stream) const;

  void onStreamProperties(GlobalID id, const Properties& properties) override;
  void onStreamState(GlobalID id, pw_node_state state) override;
  void onStreamParam(GlobalID id, std::uint32_t param, const spa_pod* value) override;

  void onServerReached(const pw_core_info& server) override;
  void onServerLost() override;
  void onGlobal(const pipewire::Global& global) override;
  void onGlobalRemoved(GlobalID id) override;
  void onRefused(GlobalID id, const char* message) override;

  static void onRetry(void* data, std::uint64_t expirations);

  struct Stream {
    Properties announced;  // from the registry; the stream's client cannot change these
    bool isKnown = false;  // to the tracker
    std::unique_ptr<StreamBinding> binding;
  };

  pw_loop* loop_;
  StreamTracker& tracker_;
  Options options_;
  spa_source* const retry_;
  milliseconds pause_ = kReconnectMin;
  bool waitingLogged_ = false;
  pipewire::UniqueContext context_;
  pipewire::ServerConnection server_;
  std::unordered_map<GlobalID, Stream> streams_;
  std::unordered_map<GlobalID, Properties> others_;  // nodes that are not streams, as announced
  std::unordered_map<GlobalID, std::unique_ptr<ClientBinding>> clients_;
  std::optional<GlobalID> profilerID_;  // set while the server has a profiler
  std::unique_ptr<ProfilerBinding> profiler_;
};

void StreamWatcher::Impl::connect() {
  pw_properties* properties =
      pw_properties_new(PW_KEY_APP_NAME, "halvox-pipewire-reporter", nullptr);
  if (!options_.remote.empty()) {
    pw_properties_set(properties, PW_KEY_REMOTE_NAME, options_.remote.c_str());
  }
  if (server_.connect(properties)) {
    return;
  }
  // Logged once for each time without a server, not at each attempt.
  if (!std::exchange(waitingLogged_, true)) {
    options_.log(fmt::format("waiting for PipeWire: {}", platform::linux_::errnoText(errno)));
  }
  retryAfter(pause_);
  pause_ = std::min(pause_ * 2, kReconnectMax);
}

void StreamWatcher::Impl::disconnect() {
  if (!server_.isConnected()) {
    return;
  }
  // Bindings are destroyed before the connection that they belong to.
  profiler_.reset();
  profilerID_.reset();
  streams_.clear();
  others_.clear();
  clients_.clear();
  server_.disconnect();
  tracker_.serverLost();
}

void StreamWatcher::Impl::retryAfter(milliseconds pause) {
  const auto seconds = std::chrono::floor<std::chrono::seconds>(pause);
  timespec value{.tv_sec = seconds.count(),
                 .tv_nsec = std::chrono::nanoseconds(pause - seconds).count()};
  pw_loop_update_timer(loop_, retry_, &value, nullptr, false);
}

void StreamWatcher::Impl::addNode(GlobalID id, const Properties& properties) {
  if (!streamDirection(property(properties, PW_KEY_MEDIA_CLASS))) {
    passNode(id, others_.insert_or_assign(id, properties).first->second);
    return;
  }
  Stream& stream = streams_[id];
  stream.announced = properties;
  stream.isKnown = false;
  stream.binding = std::make_unique<StreamBinding>(server_.registry(), id, *this);
  updateProfiler();
}

void StreamWatcher::Impl::passNode(GlobalID id, const Properties& announced) {
  // The process of a node is a property of its client.
  tracker_.nodeAdded({.id = id,
                      .serial = idProperty(announced, kSerialProperty),
                      .mediaClass = std::string(property(announced, PW_KEY_MEDIA_CLASS)),
                      .properties = fullProperties(announced)});
}

void StreamWatcher::Impl::addLink(GlobalID id, const Properties& properties) {
  tracker_.linkAdded(id, {.output = idProperty(properties, PW_KEY_LINK_OUTPUT_NODE),
                          .input = idProperty(properties, PW_KEY_LINK_INPUT_NODE)});
}

// Follows the profiler only while there are streams, because the profiler wakes this process. Must
// not be called from a callback of the profiler, whose binding this function may destroy.
void StreamWatcher::Impl::updateProfiler() {
  if (!profilerID_.has_value() || streams_.empty()) {
    profiler_.reset();
  } else if (profiler_ == nullptr) {
    // What drivers have counted until now is not a loss of these streams.
    tracker_.profilingBegan();
    profiler_ = std::make_unique<ProfilerBinding>(
        server_.registry(), *profilerID_, [this](const spa_pod* profile) { onProfile(profile); });
  }
}

void StreamWatcher::Impl::onProfile(const spa_pod* profile) {
  for (const ProfiledCycle& cycle : pipewire::decodeProfile(profile)) {
    tracker_.cycleEnded(cycle);
  }
}

void StreamWatcher::Impl::clientChanged(GlobalID id) {
  for (const auto& [streamID, stream] : streams_) {
    // The properties of a client may arrive after those of its streams.
    if (stream.isKnown && idProperty(stream.binding->properties(), kClientIDProperty) == id) {
      tracker_.streamPropertiesChanged(streamID, fullProperties(stream.binding->properties()));
    }
  }
  for (const auto& [nodeID, announced] : others_) {
    if (idProperty(announced, kClientIDProperty) == id) {
      passNode(nodeID, announced);
    }
  }
}

Properties StreamWatcher::Impl::fullProperties(const Properties& stream) const {
  const auto client = clients_.find(idProperty(stream, kClientIDProperty));
  return client == clients_.end() ? stream : withClient(stream, client->second->properties());
}

void StreamWatcher::Impl::onStreamProperties(GlobalID id, const Properties& properties) {
  const auto found = streams_.find(id);
  if (found == streams_.end()) {
    return;
  }
  Stream& stream = found->second;
  const Properties all = fullProperties(properties);
  if (std::exchange(stream.isKnown, true)) {
    tracker_.streamPropertiesChanged(id, all);
    return;
  }
  // Take class and serial from the registry: the client of the stream can change the copies in the
  // stream's own properties, and the serial is part of the session's identifier.
  tracker_.nodeAdded({.id = id,
                      .serial = idProperty(stream.announced, kSerialProperty),
                      .mediaClass = std::string(property(stream.announced, PW_KEY_MEDIA_CLASS)),
                      .properties = all});
}

void StreamWatcher::Impl::onStreamState(GlobalID id, pw_node_state state) {
  tracker_.streamRunningChanged(id, state == PW_NODE_STATE_RUNNING);
}

void StreamWatcher::Impl::onStreamParam(GlobalID id, std::uint32_t param, const spa_pod* value) {
  if (param == SPA_PARAM_Format) {
    if (const auto format = decodeFormat(value)) {
      tracker_.streamFormatChanged(id, *format);
    }
  } else if (param == SPA_PARAM_Props) {
    tracker_.streamVolumeChanged(id, decodeVolume(value));
  }
}

void StreamWatcher::Impl::onRetry(void* data, std::uint64_t /*expirations*/) {
  auto* self = static_cast<Impl*>(data);
  self->disconnect();
  self->connect();
}

void StreamWatcher::Impl::onServerReached(const pw_core_info& server) {
  pause_ = kReconnectMin;
  waitingLogged_ = false;
  options_.log(fmt::format("following PipeWire {} ({})", server.version, server.name));
  tracker_.serverConnected(server.cookie);
}

void StreamWatcher::Impl::onServerLost() {
  options_.log("PipeWire has disconnected; ending its sessions and trying to reconnect");
  // Let the timer disconnect, because the library does not allow a disconnect within this call.
  retryAfter(kReconnectSoon);
}

void StreamWatcher::Impl::onGlobal(const pipewire::Global& global) {
  if (global.type == PW_TYPE_INTERFACE_Node) {
    addNode(global.id, makeProperties(global.properties));
  } else if (global.type == PW_TYPE_INTERFACE_Link) {
    addLink(global.id, makeProperties(global.properties));
  } else if (global.type == PW_TYPE_INTERFACE_Client) {
    clients_[global.id] = std::make_unique<ClientBinding>(
        server_.registry(), global.id, [this, id = global.id] { clientChanged(id); });
  } else if (global.type == PW_TYPE_INTERFACE_Profiler && options_.xruns) {
    profilerID_ = global.id;
    updateProfiler();
  }
}

void StreamWatcher::Impl::onGlobalRemoved(GlobalID id) {
  // The removed object can be of any kind, because the event has only its ID.
  streams_.erase(id);
  others_.erase(id);
  clients_.erase(id);
  if (profilerID_ == id) {
    profilerID_.reset();
  }
  updateProfiler();
  tracker_.linkRemoved(id);
  tracker_.nodeRemoved(id);
}

void StreamWatcher::Impl::onRefused(GlobalID id, const char* message) {
  options_.log(
      fmt::format("PipeWire refused a request: {} (object {}); it is ignored", message, id));
}

StreamWatcher::StreamWatcher(pw_loop* loop, StreamTracker& tracker, Options options)
    : impl_(std::make_unique<Impl>(loop, tracker, std::move(options))) {}
StreamWatcher::~StreamWatcher() = default;

}  // namespace halvox::pipewire_reporter
