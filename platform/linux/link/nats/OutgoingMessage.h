#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>

#include "platform/connection.h"
#include "platform/linux/link/nats/AckLedger.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

inline constexpr const char* kMessageIdHeader = "Nats-Msg-Id";
// About how many bytes the header adds to a message. Servers count the header as part of the
// message's size.
inline constexpr std::size_t kHeaderBytes = 80;

// A message that was not passed to the client library yet.
struct OutgoingMessage {
  NatsMessage message;
  std::size_t bytes = 0;              // body and headers
  std::shared_ptr<AckLedger> ledger;  // null when no flush waits for the message
  AckLedger::Number number = 0;
  LinkSpool::Number spooled = 0;                  // its number in the spool, or 0
  std::chrono::steady_clock::time_point taken{};  // by the queue; only if there is a spool
};

// Makes the library's form of a message. The library must be open.
[[nodiscard]] natsStatus makeMessage(const char* subject, const std::string& identifier,
                                     const std::string& body, OutgoingMessage& outgoing);

// Returns the error for the sender of a message that the link refuses.
[[nodiscard]] Error refusedByLink(std::string description);

}  // namespace halvox::platform::linux_
