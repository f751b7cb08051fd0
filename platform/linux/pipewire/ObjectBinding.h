#pragma once

#include <cstdint>
#include <functional>

#include <pipewire/pipewire.h>

namespace halvox::pipewire {

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

}  // namespace halvox::pipewire
