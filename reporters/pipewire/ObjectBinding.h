#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <utility>

#include <pipewire/pipewire.h>

#include "reporters/pipewire/StreamProperties.h"

namespace halvox::pipewire_reporter {

Properties makeProperties(const spa_dict* dict);

// Our end of one object of the server: owns the proxy and the hooks on it.
// Belongs to the loop thread; it is destroyed when the object goes or the server does, never from
// within a callback of its own.
class ObjectBinding {
 public:
  ObjectBinding(pw_registry* registry, std::uint32_t id, const char* type, std::uint32_t version)
      : proxy_(static_cast<pw_proxy*>(pw_registry_bind(registry, id, type, version, 0))) {}
  ~ObjectBinding() {
    if (proxy_ != nullptr) {
      spa_hook_remove(&hook_);
      pw_proxy_destroy(proxy_);
    }
  }
  ObjectBinding(const ObjectBinding&) = delete;
  ObjectBinding& operator=(const ObjectBinding&) = delete;

  [[nodiscard]] bool isBound() const { return proxy_ != nullptr; }
  [[nodiscard]] pw_proxy* proxy() const { return proxy_; }
  // Once, and only when bound. `events` is static, `data` outlives this binding.
  void listen(const void* events, void* data) {
    pw_proxy_add_object_listener(proxy_, &hook_, events, data);
  }

 private:
  pw_proxy* proxy_;
  spa_hook hook_{};
};

// A client of the server: tells its properties whenever they change.
class ClientBinding {
 public:
  ClientBinding(pw_registry* registry, std::uint32_t id, std::function<void()> changed);

  [[nodiscard]] const Properties& properties() const { return properties_; }

 private:
  static void onInfo(void* data, const pw_client_info* info);

  std::function<void()> changed_;
  Properties properties_;
  ObjectBinding binding_;
};

// What a StreamBinding tells, on the loop thread.
class StreamListener {
 public:
  StreamListener() = default;
  virtual ~StreamListener() = default;
  StreamListener(const StreamListener&) = delete;
  StreamListener& operator=(const StreamListener&) = delete;

  virtual void onStreamProperties(std::uint32_t id, const Properties& properties) = 0;
  virtual void onStreamState(std::uint32_t id, pw_node_state state) = 0;
  virtual void onStreamParam(std::uint32_t id, std::uint32_t param, const spa_pod* value) = 0;
};

// A stream node of the server: tells its properties first, then its state and parameters, and each
// again when it changes. Borrows the listener, which must outlive it.
class StreamBinding {
 public:
  StreamBinding(pw_registry* registry, std::uint32_t id, StreamListener& listener);

  // Empty until the server has told them.
  [[nodiscard]] const Properties& properties() const { return properties_; }

 private:
  static void onInfo(void* data, const pw_node_info* info);
  static void onParam(void* data, int sequence, std::uint32_t param, std::uint32_t index,
                      std::uint32_t next, const spa_pod* value);

  std::uint32_t id_;
  StreamListener& listener_;
  Properties properties_;
  ObjectBinding binding_;
};

// The profiler of the server: hands on each of its events, which come many times a second while
// streams run. Lives only while they are wanted.
class ProfilerBinding {
 public:
  using ProfileHandler = std::function<void(const spa_pod* profile)>;

  ProfilerBinding(pw_registry* registry, std::uint32_t id, ProfileHandler profiled);

 private:
  static void onProfile(void* data, const spa_pod* profile);

  ProfileHandler profiled_;
  ObjectBinding binding_;
};

}  // namespace halvox::pipewire_reporter
