#pragma once

#include <cstdint>
#include <functional>

#include <pipewire/pipewire.h>

#include "platform/linux/pipewire/ObjectBinding.h"

namespace halvox::pipewire {

// Loads the module without which the library cannot decode the profiler's events. Returns false
// when it is not installed. Must be called before the context connects.
[[nodiscard]] bool loadProfilerModule(pw_context* context);

// Follows the profiler of the server and passes on each of its events. Events arrive many times a
// second while streams run, and wake this process. Make a binding only while events are wanted.
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
