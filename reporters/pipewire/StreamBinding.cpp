#include "reporters/pipewire/StreamBinding.h"

#include <array>

#include "reporters/pipewire/DictDecoder.h"

namespace halvox::pipewire_reporter {

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
  // The server sends the current values at once, and new ones when they change. Therefore nothing
  // has to be polled.
  std::array<std::uint32_t, 2> params{SPA_PARAM_Format, SPA_PARAM_Props};
  auto* node = reinterpret_cast<pw_node*>(binding_.proxy());
  pw_node_subscribe_params(node, params.data(), params.size());
}

void StreamBinding::onInfo(void* data, const pw_node_info* info) {
  auto* self = static_cast<StreamBinding*>(data);
  // The properties are passed before the state. The tracker learns of a stream by its properties,
  // and ignores the state of streams that it does not know.
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
