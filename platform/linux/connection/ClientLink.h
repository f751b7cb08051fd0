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

// What requests and replies know of the client that they belong to. They may outlive the connection
// and live on any thread, so this is all that they share with it.
class ClientLink : public std::enable_shared_from_this<ClientLink> {
 public:
  ClientLink(std::shared_ptr<Inbox> inbox, std::shared_ptr<ConnectionStatistics> statistics)
      : inbox_(std::move(inbox)), statistics_(std::move(statistics)) {}

  [[nodiscard]] FlowControl& flow() { return flow_; }
  [[nodiscard]] Inbox& inbox() { return *inbox_; }
  [[nodiscard]] ConnectionStatistics& statistics() { return *statistics_; }

  // Any thread: a request has been carried out.
  void requestDone(FlowControl::Cost cost) {
    if (flow_.close(cost)) inbox_->postRoom(shared_from_this());
  }

  // On the I/O thread: the connection, or null once it is gone.
  [[nodiscard]] ClientConnection* connection() const { return connection_; }
  void attach(ClientConnection& connection) { connection_ = &connection; }
  void detach() { connection_ = nullptr; }

 private:
  std::shared_ptr<Inbox> inbox_;
  std::shared_ptr<ConnectionStatistics> statistics_;
  FlowControl flow_;
  ClientConnection* connection_ = nullptr;
};

// What a RequestToken stands for: the request is open as long as this lives.
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

// The right to answer one request once. All copies of its ReplyCallback share it.
class ReplyTicket {
 public:
  // `signature` is that of the answer and lives as long as the process.
  ReplyTicket(std::shared_ptr<ClientLink> client, std::uint32_t serial, std::string_view signature)
      : client_(std::move(client)), serial_(serial), signature_(signature) {}

  // Any thread. On the I/O thread the answer is written at the end of this turn; from others it is
  // posted there.
  static void answer(const std::shared_ptr<ReplyTicket>& ticket, const std::optional<Error>& error,
                     const Value& value);
  // On the I/O thread: hands the answer to the connection, if it is still there.
  void deliver(const Error* error, const Value& value);

 private:
  std::shared_ptr<ClientLink> client_;
  std::uint32_t serial_;
  std::string_view signature_;
  std::atomic<bool> answered_{false};  // orders with nothing: only who comes first counts
};

}  // namespace halvox::platform::linux_
