#pragma once

#include <cstdint>

#include <pipewire/pipewire.h>

#include "platform/linux/pipewire/ObjectBinding.h"
#include "reporters/pipewire/StreamProperties.h"

namespace halvox::pipewire_reporter {

// Receives the events of a StreamBinding on the loop thread.
class StreamListener {
 public:
  StreamListener() = default;
  virtual ~StreamListener() = default;
  StreamListener(const StreamListener&) = delete;
  StreamListener& operator=(const StreamListener&) = delete;

  // All properties, not only those that have changed.
  virtual void onStreamProperties(std::uint32_t id, const Properties& properties) = 0;
  virtual void onStreamState(std::uint32_t id, pw_node_state state) = 0;
  // `value` belongs to the library and is valid until the call returns. It comes from another
  // process.
  virtual void onStreamParam(std::uint32_t id, std::uint32_t param, const spa_pod* value) = 0;
};

// Follows one stream node of the server. Passes its properties, then its state and parameters to
// the listener, and each of them again when it changes. Belongs to the loop thread. Does not own
// the listener, which must outlive it. If the server refuses the binding, no event comes.
class StreamBinding {
 public:
  StreamBinding(pw_registry* registry, std::uint32_t id, StreamListener& listener);

  // Empty until the server has sent them.
  [[nodiscard]] const Properties& properties() const { return properties_; }

 private:
  static void onInfo(void* data, const pw_node_info* info);
  static void onParam(void* data, int sequence, std::uint32_t param, std::uint32_t index,
                      std::uint32_t next, const spa_pod* value);

  std::uint32_t id_;
  StreamListener& listener_;
  Properties properties_;
  pipewire::ObjectBinding binding_;
};

}  // namespace halvox::pipewire_reporter
