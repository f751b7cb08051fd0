#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

#include "platform/dispatch.h"

namespace halvox::platform {

// Status 0 is success.
using NotifyStatus = std::uint32_t;
using NotifyToken = std::int32_t;

// Notifications by name: somebody posts a name, and everybody who registered for it hears of it.
// Any thread may call.
class NotifyService {
 public:
  using Handler = std::function<void(NotifyToken)>;

  virtual ~NotifyService() = default;

  // From now on the handler is called on the queue, with the token of this registration, after
  // each post of that name, for the life of the process. Sets `token` and returns 0, or returns
  // why not and leaves `token` alone.
  virtual NotifyStatus notify_register_dispatch(std::string_view name, NotifyToken& token,
                                                std::shared_ptr<DispatchQueue> queue,
                                                Handler handler) = 0;
};

}  // namespace halvox::platform
