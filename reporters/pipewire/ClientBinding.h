#pragma once

#include <cstdint>
#include <functional>

#include <pipewire/pipewire.h>

#include "platform/linux/pipewire/ObjectBinding.h"
#include "reporters/pipewire/StreamProperties.h"

namespace halvox::pipewire_reporter {

// Follows the properties of one client of the server, and calls `changed` when they change. Belongs
// to the loop thread. If the server refuses the binding, `changed` is never called.
class ClientBinding {
 public:
  ClientBinding(pw_registry* registry, std::uint32_t id, std::function<void()> changed);

  [[nodiscard]] const Properties& properties() const { return properties_; }

 private:
  static void onInfo(void* data, const pw_client_info* info);

  std::function<void()> changed_;
  Properties properties_;
  pipewire::ObjectBinding binding_;
};

}  // namespace halvox::pipewire_reporter
