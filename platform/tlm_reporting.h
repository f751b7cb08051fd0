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

// Keys of the session info. A back-end that writes keys out writes these texts.
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

// Keys of the user info.
inline constexpr std::string_view kTLMReportingUserInfoClientName =
    "TLMReportingUserInfoClientName";
inline constexpr std::string_view kTLMReportingUserInfoServiceName =
    "TLMReportingUserInfoServiceName";

// The identity of an agent: one for each framework session, as the text that stands for it in the
// session info. Immutable; shared by the session and the framework.
class TLMSecureHierarchyToken {
 public:
  explicit TLMSecureHierarchyToken(std::string text) : text_(std::move(text)) {}
  [[nodiscard]] const std::string& text() const { return text_; }

 private:
  const std::string text_;
};

// A session of the framework: what its back-ends need to know of it. Made by the framework, held
// by whoever asked for it; letting go of it ends it.
class TLMReportingSession {
 public:
  virtual ~TLMReportingSession() = default;
  // For log lines.
  [[nodiscard]] virtual std::string description() const = 0;
};

// What became of a message that was given to the framework: taken, or not, with the reason when
// there is one to tell.
struct TLMReportingOutcome {
  bool sent = false;
  std::optional<Error> error{};
};

// One message for the framework.
struct TLMReportingMessage {
  std::uint16_t category;
  std::uint16_t type;
  const Dictionary& payload;
};

// The real-time reporting framework: forwards messages to the servers that collect them. Any thread
// may call; one session is used by one thread at a time. Nothing here waits for a server: what
// takes its time ends in a callback, which must not wait either.
class TLMReportingService {
 public:
  // The back-ends that were found, or none.
  using BackendsCallback = std::function<void(const std::optional<Array>&)>;
  using Token = std::shared_ptr<const TLMSecureHierarchyToken>;
  using Session = std::shared_ptr<TLMReportingSession>;

  virtual ~TLMReportingService() = default;

  // A new token, unlike any other; tokens have no parent here.
  virtual Token TLMHierarchyTokenCreate() = 0;
  virtual Session TLMReportingCreateSession(const Dictionary& sessionInfo,
                                            const Dictionary& userInfo) = 0;
  // Begins to look for back-ends and returns. The callback is called exactly once, on a thread of
  // the framework's own: never from inside this call or on the queue of a caller's job. It may come
  // before this has returned, and also when nobody holds the session any more. It must own what it
  // uses.
  virtual void TLMReportingStartConfiguration(const Session& session, BackendsCallback found) = 0;
  virtual TLMReportingOutcome TLMReportingSendMessage(const Session& session,
                                                      const TLMReportingMessage& message) = 0;
  // Sends what the framework still holds for the session; `flushed` is called exactly once when
  // that is done or given up, which may be before this returns.
  virtual void TLMReportingFlushMessages(const Session& session, std::function<void()> flushed) = 0;
  // Sends one message outside any session.
  virtual TLMReportingOutcome TLMReportingSendOneMessage(const Dictionary& sessionInfo,
                                                         const Dictionary& userInfo,
                                                         const TLMReportingMessage& message) = 0;
};

}  // namespace halvox::platform
