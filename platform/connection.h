#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/process.h"
#include "platform/value.h"

namespace halvox::platform {

// An error that is sent to a client. Domain and code identify it; the description is for people.
struct Error {
  std::string domain{};
  std::int64_t code = 0;
  std::string description{};
  // The error's name on the wire. If it is empty, the name is made from the domain and the code.
  std::string name{};
  friend bool operator==(const Error&, const Error&) = default;
};

// Answers one request with an error or with the value that the method returns.
//
// It may be called from any thread, at any time, or never. It does not block. It does nothing after
// the client has disconnected. The protocol allows one answer to a request. A second call is
// therefore dropped and logged at debug level.
using ReplyCallback = std::function<void(const std::optional<Error>&, const Value&)>;

// What the service holds because of one client's requests: the content of its sessions, and
// messages that wait in queues. A message counts as soon as its request is delivered. Before the
// connection's thread delivers a request, it compares this use with the configured limits.
struct ResourceUse {
  std::uint64_t bytes = 0;  // on the heap
  std::uint64_t sessions = 0;
};

// The object that receives the requests of one client. A connection exports one.
//
// Shared: the connection holds the object until the connection is invalidated. Each job that the
// object has queued holds it until the job has run.
class ExportedObject {
 public:
  virtual ~ExportedObject() = default;
  // The connection calls this on its thread after a series of calls of InterfaceMethod::post, when
  // it delivers no further request in this turn of the event loop.
  virtual void endOfRequests() {}
  // What the service holds for this client now. Called on the connection's thread; never blocks.
  [[nodiscard]] virtual ResourceUse resourceUse() const { return {}; }
};

// Stands for one request that has not been carried out. The job that carries the request out holds
// a copy. When the last copy is destroyed, the request counts as carried out, whether it was
// answered or not. The connection reads from its client only while few of its tokens exist, which
// limits the work that a client can have pending.
using RequestToken = std::shared_ptr<void>;

// What a request has besides its arguments.
struct RequestContext {
  ProcessID sender = 0;  // the process at the other end of the connection; 0 if it is unknown
  RequestToken token{};  // code that queues work for the request keeps it in the job
};

// One request, decoded and checked against the method's signature. The arguments belong to the
// caller of `invoke` and are valid until it returns; copying a value is cheap.
struct Invocation {
  std::span<const Value> arguments;
  ReplyCallback reply;  // never empty; does nothing if the client wants no answer
  RequestContext context;
};

// What a connection must know about one of its open requests to answer it and to count it.
struct RequestMark {
  std::uint32_t serial = 0;
  bool wantsAnswer = false;
  std::string_view signature{};  // of the answer; a constant
  std::size_t weight = 1;        // how many requests it counts as
  std::size_t bytes = 0;
};

// Answers the requests of one connection. Outlives the connection, because some of its requests may
// still be open when it ends. Shared by the connection and its open requests. Any thread may call.
class RequestSource {
 public:
  virtual ~RequestSource() = default;
  // Answers the request, like a ReplyCallback.
  virtual void answer(const RequestMark& mark, const std::optional<Error>& error,
                      const Value& value) = 0;
  // Counts the request as carried out, like the destruction of the last copy of a RequestToken.
  virtual void carriedOut(const RequestMark& mark) = 0;
};

// A ReplyCallback and a RequestToken in one, which needs no allocation. Used for the most frequent
// requests. The request counts as open as long as this object exists. Belongs to one thread at a
// time.
class PostedRequest {
 public:
  PostedRequest() = default;
  PostedRequest(std::shared_ptr<RequestSource> source, const RequestMark& mark)
      : source_(std::move(source)), mark_(mark) {}
  PostedRequest(PostedRequest&&) noexcept = default;
  PostedRequest& operator=(PostedRequest&& other) noexcept {
    PostedRequest taken(std::move(other));
    std::swap(source_, taken.source_);
    std::swap(mark_, taken.mark_);
    return *this;
  }
  PostedRequest(const PostedRequest&) = delete;
  PostedRequest& operator=(const PostedRequest&) = delete;
  ~PostedRequest() {
    if (source_ != nullptr) source_->carriedOut(mark_);
  }

  // Call it at most once. Does nothing if the client wants no answer.
  void answer(const std::optional<Error>& error, const Value& value) const {
    if (source_ != nullptr && mark_.wantsAnswer) source_->answer(mark_, error, value);
  }

 private:
  std::shared_ptr<RequestSource> source_;
  RequestMark mark_;
};

// Whether a request can make the service hold more memory for its client. While a client is over
// its limit of bytes, the connection refuses its requests with kMayHoldMore and kMakesSession. It
// accepts those with kHoldsNoMore, so that the client can always stop and destroy sessions. It also
// refuses kMakesSession while the client has too many sessions.
enum class MethodEffect : std::uint8_t { kMayHoldMore, kHoldsNoMore, kMakesSession };

// Who may make a request: anyone who can connect, or only the owner, which is root or the user that
// the service runs as. The connection decides by the credentials that the kernel or the bus reports
// for the other end, never by what a message says. It answers a request that is not allowed with
// org.freedesktop.DBus.Error.AccessDenied. The object never sees that request.
enum class MethodAccess : std::uint8_t { kAnybody, kOwner };

// One method of an interface. `in` and `out` are D-Bus signatures. `invoke` hands a request to the
// object; it runs on the connection's thread and must not block, because it would hold up every
// client.
struct InterfaceMethod {
  std::string_view name;
  std::string_view in;
  std::string_view out;
  MethodEffect effect = MethodEffect::kHoldsNoMore;
  void (*invoke)(ExportedObject& object, Invocation&& invocation) = nullptr;
  // The number of reporter IDs that a request names; null for a method without a list of them. The
  // connection layer refuses a request that names more than the configuration allows, because one
  // small message could otherwise reach any number of sessions.
  std::size_t (*reporterIDs)(std::span<const Value> arguments) = nullptr;
  MethodAccess access = MethodAccess::kAnybody;
  // The number of entries that the object adds to a dictionary among the arguments. The connection
  // allocates memory for them when it decodes the dictionary, because adding them then needs no
  // second block of memory.
  std::size_t addedEntries = 0;
  // If `post` is not null, the connection calls it instead of `invoke`. The object may keep the
  // request until endOfRequests() or another of its methods is called. One job can then carry out a
  // series of requests. `arguments` are valid until `post` returns.
  void (*post)(ExportedObject& object, std::span<const Value> arguments, PostedRequest&& request,
               ProcessID sender) = nullptr;
};

// A protocol that objects export. All members are constants that live as long as the process. The
// name of the type is part of the interface.
struct NSXPCInterface {
  std::string_view name;
  std::string_view objectPath;
  std::span<const InterfaceMethod> methods;
};

// One client's connection.
//
//   made --resume--> open --> invalidated
//                     └--> interrupted --> open or invalidated
//
// Shared by the service that made it and by code that needs it to answer a request. Handlers and
// requests run on the connection's thread, one at a time. Every failure on the wire ends in the
// invalidation handler; no call here fails.
class NSXPCConnection {
 public:
  virtual ~NSXPCConnection() = default;

  // The process at the other end, as the kernel or the bus reports it; never taken from a message.
  [[nodiscard]] virtual ProcessID processIdentifier() const = 0;
  // Names the connection in log lines.
  [[nodiscard]] virtual std::string description() const = 0;

  // Call the following four functions before resume(), each at most once.
  virtual void setExportedInterface(const NSXPCInterface& interface) = 0;
  // The connection holds the object until it is invalidated.
  virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
  // The handler is called when the other end has disconnected but the connection may be restored.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  // The handler is called once, after all other calls, when the connection has ended and will not
  // be restored.
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  // Starts delivery. Requests arrive in later turns of the thread's loop, never inside this call.
  virtual void resume() = 0;
};

// Decides which new connections are accepted. Implemented by the service. The delegate must outlive
// the listener.
class NSXPCListenerDelegate {
 public:
  virtual ~NSXPCListenerDelegate() = default;
  // Prepares and resumes a new connection, or returns false to refuse it. Runs on the connection's
  // thread.
  virtual bool listenerShouldAcceptNewConnection(
      const std::shared_ptr<NSXPCConnection>& connection) = 0;
};

// The listener that the platform hands to the service. ConnectionService owns it.
class NSXPCListener {
 public:
  virtual ~NSXPCListener() = default;
  // Does not own the delegate, which must outlive the listener.
  virtual void setDelegate(NSXPCListenerDelegate& delegate) = 0;
  // Accepts and serves connections on the calling thread. Returns only after the process was asked
  // to end. If accepting a connection fails, logs the error and tries again.
  virtual void resume() = 0;
};

// Where connections come from. The composition root owns the service.
class ConnectionService {
 public:
  virtual ~ConnectionService() = default;
  // The process's own listener.
  virtual NSXPCListener& serviceListener() = 0;
};

}  // namespace halvox::platform
