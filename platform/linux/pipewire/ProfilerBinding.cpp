#include "platform/linux/pipewire/ProfilerBinding.h"

#include <utility>

#include <pipewire/extensions/profiler.h>
#include <pipewire/impl-module.h>

namespace halvox::pipewire {

bool loadProfilerModule(pw_context* context) {
  return pw_context_load_module(context, PW_EXTENSION_MODULE_PROFILER, nullptr, nullptr) != nullptr;
}

ProfilerBinding::ProfilerBinding(pw_registry* registry, std::uint32_t id, ProfileHandler profiled)
    : profiled_(std::move(profiled)),
      binding_(registry, id, PW_TYPE_INTERFACE_Profiler, PW_VERSION_PROFILER) {
  static const pw_profiler_events kEvents = {.version = PW_VERSION_PROFILER_EVENTS,
                                             .profile = &ProfilerBinding::onProfile};
  if (binding_.isBound()) {
    binding_.listen(&kEvents, this);
  }
}

void ProfilerBinding::onProfile(void* data, const spa_pod* profile) {
  static_cast<ProfilerBinding*>(data)->profiled_(profile);
}

}  // namespace halvox::pipewire
