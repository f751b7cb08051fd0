#include "platform/linux/link/nats/OutgoingMessage.h"

#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kErrorDomain = "com.tarno.halvox.link";

}  // namespace

natsStatus makeMessage(const char* subject, const std::string& identifier, const std::string& body,
                       OutgoingMessage& outgoing) {
  const natsStatus status = natsMsg_Create(outgoing.message.out(), subject, nullptr, body.data(),
                                           static_cast<int>(body.size()));
  if (status != NATS_OK) return status;
  outgoing.bytes = body.size() + kHeaderBytes;
  return natsMsgHeader_Set(outgoing.message.get(), kMessageIdHeader, identifier.c_str());
}

Error refusedByLink(std::string description) {
  return {.domain = kErrorDomain, .code = 1, .description = std::move(description)};
}

}  // namespace halvox::platform::linux_
