#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

#include "platform/dispatch.h"

namespace halvox::platform {

// The result of a call: 0 is success. The caller logs anything else.
using NotifyStatus = std::uint32_t;
using NotifyToken = std::int32_t;

// Notifications by name. A program posts a name, and every handler registered for that name is
// called. A post carries no data; the receiver reads the new state itself.
//
// Any thread may call. The composition root owns the service.
class NotifyService {
 public:
  using Handler = std::function<void(NotifyToken)>;

  virtual ~NotifyService() = default;

  // Registers a handler for the life of the process. After a post of that name, the handler runs on
  // the queue with the token of this registration. It may run only once for several posts in quick
  // succession. Sets `token` and returns 0. If registration fails, for example because the name is
  // not valid, returns an error and leaves `token` unchanged.
  virtual NotifyStatus notify_register_dispatch(std::string_view name, NotifyToken& token,
                                                std::shared_ptr<DispatchQueue> queue,
                                                Handler handler) = 0;
};

}  // namespace halvox::platform
