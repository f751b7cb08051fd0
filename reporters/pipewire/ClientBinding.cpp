#include "reporters/pipewire/ClientBinding.h"

#include <utility>

#include "reporters/pipewire/DictDecoder.h"

namespace halvox::pipewire_reporter {

ClientBinding::ClientBinding(pw_registry* registry, std::uint32_t id, std::function<void()> changed)
    : changed_(std::move(changed)),
      binding_(registry, id, PW_TYPE_INTERFACE_Client, PW_VERSION_CLIENT) {
  static const pw_client_events kEvents = {
      .version = PW_VERSION_CLIENT_EVENTS, .info = &ClientBinding::onInfo, .permissions = nullptr};
  if (binding_.isBound()) {
    binding_.listen(&kEvents, this);
  }
}

void ClientBinding::onInfo(void* data, const pw_client_info* info) {
  auto* self = static_cast<ClientBinding*>(data);
  // The event comes for other changes too, with the same properties.
  if ((info->change_mask & PW_CLIENT_CHANGE_MASK_PROPS) != 0) {
    self->properties_ = makeProperties(info->props);
    self->changed_();
  }
}

}  // namespace halvox::pipewire_reporter
