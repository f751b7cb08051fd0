#include "reporters/pipewire/StreamBinding.h"

#include <array>
#include <utility>

namespace halvox::pipewire_reporter {

Properties makeProperties(const spa_dict* dict) {
  Properties properties;
  if (dict == nullptr) {
    return properties;
  }
  const spa_dict_item* item = nullptr;
  spa_dict_for_each(item, dict) {
    if (item->key != nullptr && item->value != nullptr) {
      properties.insert_or_assign(item->key, item->value);
    }
  }
  return properties;
}

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
  if ((info->change_mask & PW_CLIENT_CHANGE_MASK_PROPS) != 0) {
    self->properties_ = makeProperties(info->props);
    self->changed_();
  }
}

StreamBinding::StreamBinding(pw_registry* registry, std::uint32_t id, StreamListener& listener)
    : id_(id),
      listener_(listener),
      binding_(registry, id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE) {
  static const pw_node_events kEvents = {.version = PW_VERSION_NODE_EVENTS,
                                         .info = &StreamBinding::onInfo,
                                         .param = &StreamBinding::onParam};
  if (!binding_.isBound()) {
    return;
  }
  binding_.listen(&kEvents, this);
  std::array<std::uint32_t, 2> params{SPA_PARAM_Format, SPA_PARAM_Props};
  auto* node = reinterpret_cast<pw_node*>(binding_.proxy());
  pw_node_subscribe_params(node, params.data(), params.size());
}

void StreamBinding::onInfo(void* data, const pw_node_info* info) {
  auto* self = static_cast<StreamBinding*>(data);
  if ((info->change_mask & PW_NODE_CHANGE_MASK_PROPS) != 0) {
    self->properties_ = makeProperties(info->props);
    self->listener_.onStreamProperties(self->id_, self->properties_);
  }
  if ((info->change_mask & PW_NODE_CHANGE_MASK_STATE) != 0) {
    self->listener_.onStreamState(self->id_, info->state);
  }
}

void StreamBinding::onParam(void* data, int /*sequence*/, std::uint32_t param,
                            std::uint32_t /*index*/, std::uint32_t /*next*/, const spa_pod* value) {
  auto* self = static_cast<StreamBinding*>(data);
  self->listener_.onStreamParam(self->id_, param, value);
}

}  // namespace halvox::pipewire_reporter
