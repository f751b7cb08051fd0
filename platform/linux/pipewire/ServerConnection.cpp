#include "platform/linux/pipewire/ServerConnection.h"

#include <cerrno>
#include <utility>

namespace halvox::pipewire {

bool ServerConnection::connect(pw_properties* properties) {
  // Static, because the library keeps a pointer to each table.
  static const pw_core_events kCoreEvents = [] {
    pw_core_events events{};
    events.version = PW_VERSION_CORE_EVENTS;
    events.info = &ServerConnection::onCoreInfo;
    events.done = &ServerConnection::onCoreDone;
    events.error = &ServerConnection::onCoreError;
    return events;
  }();
  static const pw_registry_events kRegistryEvents = {
      .version = PW_VERSION_REGISTRY_EVENTS,
      .global = &ServerConnection::onRegistryGlobal,
      .global_remove = &ServerConnection::onRegistryGlobalRemove};
  core_.reset(pw_context_connect(context_, properties, 0));
  if (core_ == nullptr) return false;
  isReached_ = false;
  isLost_ = false;
  pw_core_add_listener(core_.get(), &coreHook_, &kCoreEvents, this);
  registry_.reset(pw_core_get_registry(core_.get(), PW_VERSION_REGISTRY, 0));
  pw_registry_add_listener(registry_.get(), &registryHook_, &kRegistryEvents, this);
  return true;
}

void ServerConnection::disconnect() {
  if (core_ == nullptr) return;
  // Remove each hook before the object that contains it, and the registry before the core that made
  // it.
  spa_hook_remove(&registryHook_);
  registry_.reset();
  spa_hook_remove(&coreHook_);
  core_.reset();
}

void ServerConnection::requestAnswer() { request_ = pw_core_sync(core_.get(), PW_ID_CORE, 0); }

void ServerConnection::onCoreInfo(void* data, const pw_core_info* info) {
  auto* self = static_cast<ServerConnection*>(data);
  // The server sends this event again when its properties change.
  if (!std::exchange(self->isReached_, true)) self->listener_.onServerReached(*info);
}

void ServerConnection::onCoreDone(void* data, std::uint32_t id, int sequence) {
  auto* self = static_cast<ServerConnection*>(data);
  // Answers to earlier requests do not count.
  if (id == PW_ID_CORE && sequence == self->request_) self->listener_.onAnswered();
}

void ServerConnection::onCoreError(void* data, std::uint32_t id, int /*sequence*/, int result,
                                   const char* message) {
  auto* self = static_cast<ServerConnection*>(data);
  // The library reports the end of the connection as EPIPE for the core. Any other error concerns
  // one object.
  if (id != PW_ID_CORE || result != -EPIPE) {
    if (result != -ENOENT) self->listener_.onRefused(id, message);
    return;
  }
  if (!std::exchange(self->isLost_, true)) self->listener_.onServerLost();
}

void ServerConnection::onRegistryGlobal(void* data, std::uint32_t id, std::uint32_t /*permissions*/,
                                        const char* type, std::uint32_t /*version*/,
                                        const spa_dict* properties) {
  static_cast<ServerConnection*>(data)->listener_.onGlobal(
      {.id = id, .type = type, .properties = properties});
}

void ServerConnection::onRegistryGlobalRemove(void* data, std::uint32_t id) {
  static_cast<ServerConnection*>(data)->listener_.onGlobalRemoved(id);
}

}  // namespace halvox::pipewire
