// A plugin for a private PipeWire: its null sink, but one that has an xrun if a cycle was not
// finished in time, as a device without a reserve of samples has. The null sink itself counts none.
//
// PipeWire loads it as factory "halvox.counting-sink". It can be made once in a process. PipeWire's
// thread of the cycles makes the calls after the construction. Other threads call only while that
// thread does not use the sink.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include <dlfcn.h>
#include <spa/node/node.h>
#include <spa/node/utils.h>
#include <spa/support/plugin.h>
#include <spa/utils/names.h>
#include <unistd.h>

namespace {

constexpr const char* kFactory = "halvox.counting-sink";

const spa_handle_factory* innerFactory = nullptr;
const spa_node_methods* innerMethods = nullptr;
spa_node_methods methods{};  // the inner ones, some of them replaced
spa_callbacks listener{};    // what PipeWire wants to be called
// Whether the sink got its samples since the last cycle began.
bool wasProcessed = true;

// Whether a test wants the device itself to be late. It then makes the file, once for each xrun.
bool isXrunWanted() {
  static const char* const file = std::getenv("HALVOX_AUDIO_XRUN");
  return file != nullptr && unlink(file) == 0;
}

int onReady(void* /*data*/, int status) {
  if (!wasProcessed || isXrunWanted()) spa_node_call_xrun(&listener, 0, 0, nullptr);
  const int result = spa_node_call_ready(&listener, status);
  // Cleared after the call, in which PipeWire processes what an unfinished cycle has.
  wasProcessed = false;
  return result;
}

int onReuseBuffer(void* /*data*/, std::uint32_t port, std::uint32_t buffer) {
  return spa_node_call_reuse_buffer(&listener, port, buffer);
}

int setCallbacks(void* object, const spa_node_callbacks* callbacks, void* data) {
  static const spa_node_callbacks kCallbacks = {.version = SPA_VERSION_NODE_CALLBACKS,
                                                .ready = onReady,
                                                .reuse_buffer = onReuseBuffer,
                                                .xrun = nullptr};
  listener = SPA_CALLBACKS_INIT(callbacks, data);
  return innerMethods->set_callbacks(object, callbacks == nullptr ? nullptr : &kCallbacks, nullptr);
}

int sendCommand(void* object, const spa_command* command) {
  // The first cycle after a start has no cycle before it.
  wasProcessed = true;
  return innerMethods->send_command(object, command);
}

int process(void* object) {
  wasProcessed = true;
  return innerMethods->process(object);
}

int initialize(const spa_handle_factory* /*factory*/, spa_handle* handle, const spa_dict* info,
               const spa_support* support, std::uint32_t supports) {
  const int result = innerFactory->init(innerFactory, handle, info, support, supports);
  if (result < 0) return result;
  void* interface = nullptr;
  spa_handle_get_interface(handle, SPA_TYPE_INTERFACE_Node, &interface);
  auto* node = static_cast<spa_node*>(interface);
  innerMethods = static_cast<const spa_node_methods*>(node->iface.cb.funcs);
  methods = *innerMethods;
  methods.set_callbacks = setCallbacks;
  methods.send_command = sendCommand;
  methods.process = process;
  node->iface.cb.funcs = &methods;
  return result;
}

std::size_t sizeOf(const spa_handle_factory* /*factory*/, const spa_dict* parameters) {
  return innerFactory->get_size(innerFactory, parameters);
}

int enumInterfaces(const spa_handle_factory* /*factory*/, const spa_interface_info** info,
                   std::uint32_t* index) {
  return innerFactory->enum_interface_info(innerFactory, info, index);
}

const spa_handle_factory* findInnerFactory() {
  // The library is never closed, because the sink's code must stay loaded.
  void* library = dlopen(HALVOX_SPA_PLUGINS "/support/libspa-support.so", RTLD_NOW);
  if (library == nullptr) return nullptr;
  const auto list = reinterpret_cast<spa_handle_factory_enum_func_t>(
      dlsym(library, SPA_HANDLE_FACTORY_ENUM_FUNC_NAME));
  const spa_handle_factory* factory = nullptr;
  for (std::uint32_t index = 0; list != nullptr && list(&factory, &index) > 0;) {
    if (std::strcmp(factory->name, "support.null-audio-sink") == 0) return factory;
  }
  return nullptr;
}

}  // namespace

extern "C" SPA_EXPORT int spa_handle_factory_enum(const spa_handle_factory** factory,
                                                  std::uint32_t* index) {
  static const spa_handle_factory kCountingSink = {.version = SPA_VERSION_HANDLE_FACTORY,
                                                   .name = kFactory,
                                                   .info = nullptr,
                                                   .get_size = sizeOf,
                                                   .init = initialize,
                                                   .enum_interface_info = enumInterfaces};
  if (*index > 0) return 0;
  innerFactory = findInnerFactory();
  if (innerFactory == nullptr) return 0;
  *factory = &kCountingSink;
  ++*index;
  return 1;
}
