#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/connection/ClientLink.h"
#include "platform/linux/connection/ConnectionStatistics.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/PeerCredentials.h"
#include "platform/linux/connection/SocketStream.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

class ConnectionHost;

// The connection of one client. Delivers the requests in its input buffer as fast as the bounds
// allow, and sends the replies. Subclasses provide the bytes.
//
//   not resumed ──resume()──► reading ◄──► due: had more than its share, continues in the next turn
//                               │  ▲
//                               │  └─────► waiting for one of three things, not read from:
//                               │            room: half of its open requests are carried out
//                               │            its reader: the client has read half of its replies
//                               │            relief: the store has caught up
//                               └────────► ended ──next turn──► finished
//
// Belongs to the I/O thread. Shared by the host, the lists of the turn and the delegate.
// A client that breaks the rules of the wire is disconnected, with an error in the log. A request
// that is valid on the wire but wrong is answered with an error. Only the first of each kind is
// logged, because a client in a loop must not fill the log.
class ClientConnection : public NSXPCConnection,
                         public std::enable_shared_from_this<ClientConnection> {
 public:
  enum class Why : std::uint8_t { kPeerVanished, kClosedHere };

  // Does not own the host, which must exist until the connection has finished or was abandoned.
  ClientConnection(ConnectionHost& host, std::uint64_t number, const PeerCredentials& credentials);
  ClientConnection(const ClientConnection&) = delete;
  ClientConnection& operator=(const ClientConnection&) = delete;
  ~ClientConnection() override = default;

  [[nodiscard]] ProcessID processIdentifier() const override { return credentials_.pid; }
  void setExportedInterface(const NSXPCInterface& interface) override;
  void setExportedObject(std::shared_ptr<ExportedObject> object) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void resume() override;

  // Delivers the requests that have arrived, at most the client's share of this turn.
  void deliver();
  // Called when half of the open requests have been carried out.
  void onRoom();
  // The store has caught up.
  void onRelief();
  // Ends the connection. Reads nothing more. The schedule calls finish() in the next turn, after
  // the last replies have been written.
  void end(Why why);
  // Calls the handlers and releases everything. Called by TurnSchedule.
  void finish();
  // Releases everything without calling the handlers. Called if the delegate refuses the connection
  // and when the service ends.
  void abandon();
  // The serial of the last request that was delivered or refused; 0 before the first one. The
  // dispatcher sets it.
  [[nodiscard]] std::uint32_t lastRequest() const { return lastRequest_; }
  void setLastRequest(std::uint32_t serial) { lastRequest_ = serial; }

  // These functions are for the code that answers requests.
  [[nodiscard]] std::uint64_t number() const { return number_; }
  [[nodiscard]] const PeerCredentials& credentials() const { return credentials_; }
  [[nodiscard]] const NSXPCInterface* exportedInterface() const { return interface_; }
  [[nodiscard]] ExportedObject* exportedObject() const { return object_.get(); }
  [[nodiscard]] const std::shared_ptr<ClientLink>& link() const { return link_; }
  void sendReturn(std::uint32_t serial, std::string_view signature, const Value& value);
  void sendServiceError(std::uint32_t serial, const Error& error);
  void sendError(std::uint32_t serial, std::string_view name, std::string_view text);
  // Counts a refused request, logs the first of its kind, and sends an error if the client wants a
  // reply.
  void refuse(const dbus::MessageHeader& request, Refusal reason, std::string_view errorName,
              const std::string& text);
  // Called when the client broke the rules of the wire. `what` says which rule and at which byte.
  virtual void onMalformed(const std::string& what);

  // Returns true for a client on our own socket. Such a client has no bus, and the service answers
  // the calls that it sends to the bus.
  [[nodiscard]] virtual bool isPeerToPeer() const = 0;
  // Returns true only at the first call, because a client must send Hello exactly once.
  [[nodiscard]] bool takeHello();

 protected:
  [[nodiscard]] virtual FrameBuffer& input() = 0;
  [[nodiscard]] virtual SocketStream& stream() = 0;
  // The bus name of the client; empty without a bus.
  [[nodiscard]] virtual std::string_view replyDestination() const = 0;
  // Starts or stops reading from this client.
  virtual void setReading(bool reading) = 0;
  // Called when all whole frames have been delivered. `begun` is true if a part of another frame
  // has arrived, `progress` if this delivery had at least one frame.
  virtual void onDelivered(bool begun, bool progress) = 0;
  // Called when the connection has ended or was abandoned. The subclass stops its input.
  virtual void onEnded() = 0;
  virtual void onFinished() = 0;

  // The subclass calls this when the socket has taken some of the output.
  void onOutputRoom();
  // Refuses a request that is larger than the limit.
  void refuseOversized(const FrameBuffer::Next& next);
  [[nodiscard]] bool hasEnded() const { return state_ == State::kEnded; }
  [[nodiscard]] bool wantsInput() const { return state_ == State::kReading; }
  [[nodiscard]] ConnectionHost& host() { return host_; }
  void setCredentials(const PeerCredentials& credentials) { credentials_ = credentials; }

 private:
  enum class State : std::uint8_t {
    kNotResumed,
    kReading,
    kDue,
    kWaitingForRoom,
    kWaitingForReader,
    kWaitingForRelief,
    kEnded,
  };
  enum class Step : std::uint8_t { kGoOn, kStop };

  Step deliverFrame(const FrameBuffer::Next& next);
  [[nodiscard]] bool mustWait();
  void waitInState(State state);
  void becomeDue();
  void letGo();

  ConnectionHost& host_;
  std::uint64_t number_;
  PeerCredentials credentials_;
  std::shared_ptr<ClientLink> link_;
  const NSXPCInterface* interface_ = nullptr;
  std::shared_ptr<ExportedObject> object_;
  std::function<void()> interruptionHandler_;
  std::function<void()> invalidationHandler_;
  State state_ = State::kNotResumed;
  Why why_ = Why::kClosedHere;
  bool saidHello_ = false;
  std::uint32_t lastRequest_ = 0;
  std::uint32_t loggedRefusals_ = 0;  // one bit for each Refusal that was logged
  std::uint64_t unloggedRefusals_ = 0;
};

}  // namespace halvox::platform::linux_
