#pragma once

#include <memory>

#include <pipewire/pipewire.h>

// Owners of the library's objects; each belongs to the thread of its loop.
namespace halvox::pipewire {

struct ContextDeleter {
  void operator()(pw_context* context) const { pw_context_destroy(context); }
};
struct CoreDeleter {
  void operator()(pw_core* core) const { pw_core_disconnect(core); }
};
struct RegistryDeleter {
  void operator()(pw_registry* registry) const {
    pw_proxy_destroy(reinterpret_cast<pw_proxy*>(registry));
  }
};

using UniqueContext = std::unique_ptr<pw_context, ContextDeleter>;
using UniqueCore = std::unique_ptr<pw_core, CoreDeleter>;
using UniqueRegistry = std::unique_ptr<pw_registry, RegistryDeleter>;

}  // namespace halvox::pipewire
