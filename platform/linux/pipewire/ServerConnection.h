#pragma once

#include <cstdint>
#include <string_view>

#include <pipewire/pipewire.h>

#include "platform/linux/pipewire/Handles.h"

namespace halvox::pipewire {

using GlobalID = std::uint32_t;

// An object that a server announces. Valid during the call that passes it.
struct Global {
  GlobalID id;
  std::string_view type;       // such as PW_TYPE_INTERFACE_Node
  const spa_dict* properties;  // may be null
};

// Receives the events of a server, on the loop's thread. No function may disconnect the connection
// that calls it, because the library still uses the connection then.
class ServerListener {
 public:
  ServerListener() = default;
  virtual ~ServerListener() = default;
  ServerListener(const ServerListener&) = delete;
  ServerListener& operator=(const ServerListener&) = delete;

  // The server has answered for the first time on this connection.
  virtual void onServerReached(const pw_core_info& server) = 0;
  // The server has ended the connection. Call disconnect() later, from a timer.
  virtual void onServerLost() = 0;
  virtual void onGlobal(const Global& global) = 0;
  virtual void onGlobalRemoved(GlobalID id) = 0;
  // The server has refused a request about an object. Not called when the object vanished before
  // the request reached it, which is normal.
  virtual void onRefused(GlobalID id, const char* message) = 0;
  // The server has answered the last requestAnswer().
  virtual void onAnswered() {}
};

// One connection to a PipeWire server with the registry of its objects.
//
//   disconnected --connect()--> connected --disconnect()--> disconnected
//
// When the server ends the connection, the state does not change until the owner calls
// disconnect(), after it has destroyed its bindings to the server's objects. Belongs to the loop's
// thread.
class ServerConnection {
 public:
  // Owns neither argument; both must outlive the connection.
  ServerConnection(pw_context* context, ServerListener& listener)
      : context_(context), listener_(listener) {}
  ~ServerConnection() { disconnect(); }
  ServerConnection(const ServerConnection&) = delete;
  ServerConnection& operator=(const ServerConnection&) = delete;

  // Connects, and asks for the server's objects. Takes `properties` over. Returns false, with the
  // reason in `errno`, when no server listens. Does not wait for the server's answer.
  [[nodiscard]] bool connect(pw_properties* properties);
  // Does nothing when disconnected.
  void disconnect();
  [[nodiscard]] bool isConnected() const { return core_ != nullptr; }

  // The registry through which objects are bound. Call only when connected.
  [[nodiscard]] pw_registry* registry() const { return registry_.get(); }
  // Requests an answer. onAnswered() is called for it after all events that the server has sent
  // before the answer. Call only when connected.
  void requestAnswer();

 private:
  static void onCoreInfo(void* data, const pw_core_info* info);
  static void onCoreDone(void* data, std::uint32_t id, int sequence);
  static void onCoreError(void* data, std::uint32_t id, int sequence, int result,
                          const char* message);
  static void onRegistryGlobal(void* data, std::uint32_t id, std::uint32_t permissions,
                               const char* type, std::uint32_t version, const spa_dict* properties);
  static void onRegistryGlobalRemove(void* data, std::uint32_t id);

  pw_context* const context_;
  ServerListener& listener_;
  bool isReached_ = false;
  bool isLost_ = false;
  int request_ = 0;  // the number of the last requestAnswer()
  UniqueCore core_;
  UniqueRegistry registry_;
  spa_hook coreHook_{};
  spa_hook registryHook_{};
};

}  // namespace halvox::pipewire
