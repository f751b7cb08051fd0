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

// One client: delivers the requests that are in its input buffer, as fast as the bounds allow, and
// answers them. Where the bytes come from is up to the subclasses.
//
//   waiting to be resumed ──resume()──► reading ◄──► due (more than its share: next turn)
//                                        │  ▲──────► waiting for room, for the peer to read, or for
//                                        │           a consumer to catch up
//                                        └─────────► ended ──next turn──► finished
//
// Belongs to the I/O thread. Shared by the host, by the lists of its turn and by the delegate.
// A client that breaks the rules of the wire is closed with an error line; requests that make no
// sense are answered with an error, and logged once a client and kind.
class ClientConnection : public NSXPCConnection,
                         public std::enable_shared_from_this<ClientConnection> {
 public:
  enum class Why : std::uint8_t { kPeerVanished, kClosedHere };

  // Does not own the host, which must outlive the connection's end.
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

  // Delivers what is there, within this turn's share.
  void deliver();
  // There is room for more requests.
  void onRoom();
  // The consumer that was behind has caught up.
  void onRelief();
  // Ends the connection: nothing is read from it any more. The rest follows in finish().
  void end(Why why);
  // Runs the handlers and lets go of everything. By the schedule, after the last replies.
  void finish();
  // Lets go without the handlers: the connection was refused, or the service itself ends.
  void abandon();

  // For whoever answers requests.
  [[nodiscard]] std::uint64_t number() const { return number_; }
  [[nodiscard]] const PeerCredentials& credentials() const { return credentials_; }
  [[nodiscard]] const NSXPCInterface* exportedInterface() const { return interface_; }
  [[nodiscard]] ExportedObject* exportedObject() const { return object_.get(); }
  [[nodiscard]] const std::shared_ptr<ClientLink>& link() const { return link_; }
  void sendReturn(std::uint32_t serial, std::string_view signature, const Value& value);
  void sendServiceError(std::uint32_t serial, const Error& error);
  void sendError(std::uint32_t serial, std::string_view name, std::string_view text);
  // Counts a refused request, logs the first of its kind, and answers if an answer is wanted.
  void refuse(const dbus::MessageHeader& request, Refusal reason, std::string_view errorName,
              const std::string& text);
  // Something that the client sent breaks the rules of the wire.
  virtual void onMalformed(const std::string& what);

  // True when the client speaks to us without a bus between, so that we answer for the bus too.
  [[nodiscard]] virtual bool isPeerToPeer() const = 0;
  // True the first time: whether the client has just introduced itself to the bus that we stand
  // for.
  [[nodiscard]] bool takeHello();

 protected:
  [[nodiscard]] virtual FrameBuffer& input() = 0;
  [[nodiscard]] virtual SocketStream& stream() = 0;
  // Where replies go; empty when there is no bus.
  [[nodiscard]] virtual std::string_view replyDestination() const = 0;
  // Whether more input is wanted.
  virtual void setReading(bool reading) = 0;
  // All whole frames are delivered; `begun` when a part of another is there, `progress` when some
  // frame was used up this time.
  virtual void onDelivered(bool begun, bool progress) = 0;
  // The connection ended or was abandoned; its source of input has to be let go.
  virtual void onEnded() = 0;
  virtual void onFinished() = 0;

  // The stream has taken some of its output.
  void onOutputRoom();
  // Answers a request that is too large to be taken.
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
  std::uint32_t loggedRefusals_ = 0;  // one bit a kind
  std::uint64_t unloggedRefusals_ = 0;
};

}  // namespace halvox::platform::linux_
