#pragma once

#include <cstdint>

#include <pipewire/pipewire.h>

namespace halvox::pipewire {

// This program's end of one object of the server: owns the proxy and its hook. If the server
// refuses the binding, no event arrives. Belongs to the loop's thread. Destroy it when the object
// disappears or the connection ends, but never within one of its own events, because the library
// still uses it then.
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
  // Call it at most once, and only when bound. Both arguments must outlive the binding.
  void listen(const void* events, void* data) {
    pw_proxy_add_object_listener(proxy_, &hook_, events, data);
  }

 private:
  pw_proxy* proxy_;
  spa_hook hook_{};
};

}  // namespace halvox::pipewire
