#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/connection/ConnectionStatistics.h"
#include "platform/linux/connection/FlowControl.h"
#include "platform/linux/connection/Inbox.h"

namespace halvox::platform::linux_ {

class ClientConnection;

// The link from requests and replies to their client's connection. Requests and replies can outlive
// the connection, and other threads hold them. They therefore refer to this object and not to the
// connection itself.
//
//   attached (the connection exists) --detach()--> detached: replies are dropped and counted
//
// Shared by the connection and its open requests and replies.
class ClientLink final : public RequestSource, public std::enable_shared_from_this<ClientLink> {
 public:
  ClientLink(std::shared_ptr<Inbox> inbox, std::shared_ptr<ConnectionStatistics> statistics)
      : inbox_(std::move(inbox)), statistics_(std::move(statistics)) {}

  [[nodiscard]] FlowControl& flow() { return flow_; }
  [[nodiscard]] Inbox& inbox() { return *inbox_; }
  [[nodiscard]] ConnectionStatistics& statistics() { return *statistics_; }

  // Called when a request has been carried out. Any thread may call it.
  void requestDone(FlowControl::Cost cost) {
    if (flow_.close(cost)) inbox_->postRoom(shared_from_this());
  }

  // On the I/O thread, encodes the reply at once; the reply is written at the end of the turn. On
  // any other thread, posts the reply to the I/O thread.
  void answer(const RequestMark& mark, const std::optional<Error>& error,
              const Value& value) override;
  void carriedOut(const RequestMark& mark) override {
    requestDone({.requests = mark.weight, .bytes = mark.bytes});
  }

  // Passes a reply to the connection, or drops and counts the reply if the connection has finished.
  // Only for the I/O thread.
  void deliver(std::uint32_t serial, std::string_view signature, const Error* error,
               const Value& value);
  // Returns the connection, or null after it has finished. Only for the I/O thread.
  [[nodiscard]] ClientConnection* connection() const { return connection_; }
  void attach(ClientConnection& connection) { connection_ = &connection; }
  void detach() { connection_ = nullptr; }

 private:
  std::shared_ptr<Inbox> inbox_;
  std::shared_ptr<ConnectionStatistics> statistics_;
  FlowControl flow_;
  ClientConnection* connection_ = nullptr;
};

// The object that a RequestToken points to. The request is open while this object exists. Any
// thread may destroy it.
class OpenRequest {
 public:
  OpenRequest(std::shared_ptr<ClientLink> client, FlowControl::Cost cost)
      : client_(std::move(client)), cost_(cost) {
    client_->flow().open(cost_);
  }
  OpenRequest(const OpenRequest&) = delete;
  OpenRequest& operator=(const OpenRequest&) = delete;
  ~OpenRequest() { client_->requestDone(cost_); }

 private:
  std::shared_ptr<ClientLink> client_;
  FlowControl::Cost cost_;
};

// The right to answer one request once. All copies of the request's ReplyCallback share one ticket.
class ReplyTicket {
 public:
  // `signature` is the signature of the reply. It must be a constant, because it is not copied.
  ReplyTicket(std::shared_ptr<ClientLink> client, std::uint32_t serial, std::string_view signature)
      : client_(std::move(client)), serial_(serial), signature_(signature) {}

  // Any thread may call it. On the I/O thread, encodes the reply at once; the reply is written at
  // the end of the turn. On any other thread, posts the reply to the I/O thread. Drops and counts
  // every reply after the first.
  static void answer(const std::shared_ptr<ReplyTicket>& ticket, const std::optional<Error>& error,
                     const Value& value);
  // Passes the reply to the connection, or drops and counts it if the connection has finished. Only
  // for the I/O thread.
  void deliver(const Error* error, const Value& value);

 private:
  std::shared_ptr<ClientLink> client_;
  std::uint32_t serial_;
  std::string_view signature_;
  std::atomic<bool> answered_{false};  // relaxed: it only decides which call is the first
};

}  // namespace halvox::platform::linux_
