#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/value.h"

namespace halvox::platform {

// Keys of the session info. Their texts are part of the interface, because a back-end writes them
// out.
inline constexpr std::string_view kTLMReportingSessionInfoClientType =
    "TLMReportingSessionInfoClientType";
inline constexpr std::string_view kTLMReportingSessionInfoClientVersion =
    "TLMReportingSessionInfoClientVersion";
inline constexpr std::string_view kTLMReportingSessionInfoSessionID =
    "TLMReportingSessionInfoSessionID";
inline constexpr std::string_view kTLMReportingSessionInfoBatchEvent =
    "TLMReportingSessionInfoBatchEvent";
inline constexpr std::string_view kTLMReportingSessionInfoHierarchyToken =
    "TLMReportingSessionInfoHierarchyToken";
inline constexpr std::string_view kTLMReportingSessionInfoContainsRealtimeEvents =
    "TLMReportingSessionInfoContainsRealtimeEvents";
inline constexpr std::string_view kTLMReportingSessionInfoClientBundleID =
    "TLMReportingSessionInfoClientBundleID";

// Keys of the user info. Their texts are also part of the interface.
inline constexpr std::string_view kTLMReportingUserInfoClientName =
    "TLMReportingUserInfoClientName";
inline constexpr std::string_view kTLMReportingUserInfoServiceName =
    "TLMReportingUserInfoServiceName";

// The identity of an agent, as a text in the session info. Each framework session has its own.
// Immutable; shared by the session and the framework.
class TLMSecureHierarchyToken {
 public:
  explicit TLMSecureHierarchyToken(std::string text) : text_(std::move(text)) {}
  [[nodiscard]] const std::string& text() const { return text_; }

 private:
  const std::string text_;
};

// A session of the framework: what its back-ends need to know about it. The framework makes it. The
// code that asked for it holds it, and ends the session by releasing it.
class TLMReportingSession {
 public:
  virtual ~TLMReportingSession() = default;
  // Names the session in log lines.
  [[nodiscard]] virtual std::string description() const = 0;
};

// Whether the framework took a message. If it did not, `error` may say why.
struct TLMReportingOutcome {
  bool sent = false;
  std::optional<Error> error{};
};

// One message for the framework. It refers to the payload, which must live until the call returns.
struct TLMReportingMessage {
  std::uint16_t category;
  std::uint16_t type;
  const Dictionary& payload;
};

// The real-time reporting framework: forwards messages to the servers that collect them.
//
// Any thread may call; one session is used by one thread at a time. No call waits for a server. A
// call that takes time reports its end to a callback, which must not block either. The composition
// root owns the service. The spelling of the functions is part of the interface.
class TLMReportingService {
 public:
  // Called with the back-ends that were found, or with std::nullopt if none was.
  using BackendsCallback = std::function<void(const std::optional<Array>&)>;
  using Token = std::shared_ptr<const TLMSecureHierarchyToken>;
  using Session = std::shared_ptr<TLMReportingSession>;

  virtual ~TLMReportingService() = default;

  // A new token with a text that no other token has. Tokens have no parent here.
  virtual Token TLMHierarchyTokenCreate() = 0;
  virtual Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                            const Dictionary& userInfo) = 0;
  // Begins to look for back-ends and returns. The callback is called exactly once, on a thread of
  // the framework: never inside this call, and never on the queue of the caller's job, which may be
  // waiting for it. The callback may run before this call returns. It may also run after all other
  // holders have released the session, and must therefore own what it uses.
  virtual void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) = 0;
  virtual TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                                      const TLMReportingMessage& message) = 0;
  // True if TLMReportingSendMessage() would now only put the message into a queue, and would not
  // wait until the queue has space. A thread that must not block, such as the I/O thread, can then
  // call it.
  [[nodiscard]] virtual bool onlyNotesMessages() const { return false; }
  // Sends the messages that the framework still holds for the session. Calls `flushed` exactly
  // once, when they are sent or the framework gives up. That may be before this call returns.
  virtual void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) = 0;
  // Sends one message outside any session.
  virtual TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                         const Dictionary& userInfo,
                                                         const TLMReportingMessage& message) = 0;
};

}  // namespace halvox::platform
