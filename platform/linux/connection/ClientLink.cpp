#include "platform/linux/connection/ClientLink.h"

#include <utility>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/ConnectionLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "ReplyTicket"};

}  // namespace

void ClientLink::answer(const RequestMark& mark, const std::optional<Error>& error,
                        const Value& value) {
  if (inbox_->isLoopThread()) {
    statistics_->repliesGiven.add();
    deliver(mark.serial, mark.signature, error.has_value() ? &*error : nullptr, value);
    return;
  }
  ReplyTicket::answer(
      std::make_shared<ReplyTicket>(shared_from_this(), mark.serial, mark.signature), error, value);
}

void ClientLink::deliver(std::uint32_t serial, std::string_view signature, const Error* error,
                         const Value& value) {
  if (connection_ == nullptr) {
    statistics_->repliesDroppedGone.add();
  } else if (error != nullptr) {
    connection_->sendServiceError(serial, *error);
  } else {
    connection_->sendReturn(serial, signature, value);
  }
}

void ReplyTicket::answer(const std::shared_ptr<ReplyTicket>& ticket,
                         const std::optional<Error>& error, const Value& value) {
  ConnectionStatistics& statistics = ticket->client_->statistics();
  statistics.repliesGiven.add();
  if (ticket->answered_.exchange(true, std::memory_order_relaxed)) {
    statistics.repliesDroppedSecond.add();
    kLog.debug("dropped a second reply to request ", ticket->serial_, ": D-Bus allows only one");
    return;
  }
  Inbox& inbox = ticket->client_->inbox();
  // In the usual case the I/O thread itself has run the job that answers. The reply then needs no
  // copy and no lock.
  if (inbox.isLoopThread()) {
    ticket->deliver(error.has_value() ? &*error : nullptr, value);
    return;
  }
  inbox.postReply({.ticket = ticket,
                   .error = error.has_value() ? std::make_unique<Error>(*error) : nullptr,
                   .value = value});
}

void ReplyTicket::deliver(const Error* error, const Value& value) {
  client_->deliver(serial_, signature_, error, value);
}

}  // namespace halvox::platform::linux_
