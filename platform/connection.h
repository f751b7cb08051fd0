#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/process.h"
#include "platform/value.h"

namespace halvox::platform {

// An error that goes back to a client.
struct Error {
  std::string domain{};
  std::int64_t code = 0;
  std::string description{};
  // The error's name on the wire as it stands; when empty, the name is made of domain and code.
  std::string name{};
  friend bool operator==(const Error&, const Error&) = default;
};

// Answers one request: an error, or the value that the method gives. Whoever holds it may call it
// from any thread, at any time, or never; it never blocks and does nothing once the client is gone.
// The wire has room for one answer: a second call is dropped and logged at debug level.
using ReplyCallback = std::function<void(const std::optional<Error>&, const Value&)>;

// What a client's requests made the service hold on to: what its sessions keep, and messages that
// wait, from the delivery of their request on. Read by the connection's thread before it delivers a
// request.
struct ResourceUse {
  std::uint64_t bytes = 0;
  std::uint64_t sessions = 0;
};

// The object behind a connection that the client's requests reach. The connection and the jobs that
// it queued share it.
class ExportedObject {
 public:
  virtual ~ExportedObject() = default;
  // What is held for this client now. Called on the connection's thread; never blocks.
  [[nodiscard]] virtual ResourceUse resourceUse() const { return {}; }
};

// Held by the job that carries a request out; when the last copy goes, the request counts as
// carried out, answered or not. A connection is read from only while few of its requests are open,
// so a client cannot pile up work.
using RequestToken = std::shared_ptr<void>;

// One request as it came from the wire, decoded and of the method's signature.
struct Invocation {
  std::span<const Value> arguments;
  ReplyCallback reply;  // never empty; does nothing when the client wants no answer
};

// Whether a request can make the service hold more. Such requests are refused while too many bytes
// are held for the client; those that make a session also while it has too many of these.
enum class MethodEffect : std::uint8_t { kMayHoldMore, kHoldsNoMore, kMakesSession };

// Who may make a request. The connection decides by what the system says about the other end; a
// request that is not allowed is answered with org.freedesktop.DBus.Error.AccessDenied, and the
// object never sees it. The owner is the user that the service runs as, and root.
enum class MethodAccess : std::uint8_t { kAnybody, kOwner };

// One method of an interface: its name, the D-Bus signatures of what goes in and out, the function
// that hands a request to the object, and who may ask. `invoke` runs on the connection's thread.
struct InterfaceMethod {
  std::string_view name;
  std::string_view in;
  std::string_view out;
  MethodEffect effect = MethodEffect::kHoldsNoMore;
  void (*invoke)(ExportedObject& object, Invocation&& invocation) = nullptr;
  // How many reporter IDs a request names; null for a method that takes no list of them. The
  // connection layer refuses a request that names more than it is configured for.
  std::size_t (*reporterIDs)(std::span<const Value> arguments) = nullptr;
  MethodAccess access = MethodAccess::kAnybody;
};

// A protocol that objects export. Made of constants; lives as long as the process.
struct NSXPCInterface {
  std::string_view name;
  std::string_view objectPath;
  std::span<const InterfaceMethod> methods;
};

// One client's connection. Handlers and requests come on the connection's thread, one at a time.
class NSXPCConnection {
 public:
  virtual ~NSXPCConnection() = default;

  // The process at the other end, as the kernel names it; never taken from a message.
  [[nodiscard]] virtual ProcessID processIdentifier() const = 0;
  // The connection in words, for the log.
  [[nodiscard]] virtual std::string description() const = 0;

  // The following are set before resume().
  virtual void setExportedInterface(const NSXPCInterface& interface) = 0;
  // The connection holds the object until it is invalidated.
  virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
  // Called when the other end is gone though the connection might come back.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  // Called once, last of all, when the connection has ended for good.
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  // Starts delivery.
  virtual void resume() = 0;
};

// Decides about new connections.
class NSXPCListenerDelegate {
 public:
  virtual ~NSXPCListenerDelegate() = default;
  // Prepares and resumes a new connection; false refuses it. Runs on the connection's thread.
  virtual bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<NSXPCConnection>& connection) = 0;
};

// The listener that the platform hands to the service.
class NSXPCListener {
 public:
  virtual ~NSXPCListener() = default;
  // Does not own the delegate, which must outlive the listener.
  virtual void setDelegate(NSXPCListenerDelegate& delegate) = 0;
  // Accepts and serves connections on the calling thread, for good. Returns only when the process
  // was asked to end.
  virtual void resume() = 0;
};

// Where connections come from.
class ConnectionService {
 public:
  virtual ~ConnectionService() = default;
  // The process's own listener.
  virtual NSXPCListener& serviceListener() = 0;
  // The connection whose request or handler is running on this thread, or null.
  [[nodiscard]] virtual const NSXPCConnection* currentConnection() const = 0;
  // The request that is being delivered on this thread, or null. Whoever queues its work keeps the
  // token in the job.
  [[nodiscard]] virtual RequestToken currentRequest() const = 0;
};

}  // namespace halvox::platform
