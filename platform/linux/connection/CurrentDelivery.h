#pragma once

#include "platform/connection.h"

namespace halvox::platform::linux_ {

// What is running on this thread for a client, while it runs: a request or a handler.
class CurrentDelivery {
 public:
  // `request` is null for handlers. Both must outlive this.
  CurrentDelivery(const NSXPCConnection& connection, const RequestToken* request)
      : connection_(connection), request_(request), outer_(current_) {
    current_ = this;
  }
  CurrentDelivery(const CurrentDelivery&) = delete;
  CurrentDelivery& operator=(const CurrentDelivery&) = delete;
  ~CurrentDelivery() { current_ = outer_; }

  [[nodiscard]] static const NSXPCConnection* connection() {
    return current_ != nullptr ? &current_->connection_ : nullptr;
  }
  [[nodiscard]] static RequestToken request() {
    return current_ != nullptr && current_->request_ != nullptr ? *current_->request_ : nullptr;
  }

 private:
  const NSXPCConnection& connection_;
  const RequestToken* request_;
  const CurrentDelivery* outer_;
  static inline thread_local const CurrentDelivery* current_ = nullptr;
};

}  // namespace halvox::platform::linux_
