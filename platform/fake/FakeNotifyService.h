#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/notify.h"

namespace halvox::platform {

// Notifications that the test posts. Tokens count from 1. Any thread may call. FakePlatform owns
// it.
class FakeNotifyService final : public NotifyService {
 public:
  static constexpr NotifyStatus kInvalidName = 1;  // for a name that cannot exist

  // Makes registrations of that name fail with that status.
  void failRegistration(std::string_view name, NotifyStatus status);
  // Adds the handlers of that name to their queues, in the order of registration.
  void post(std::string_view name);
  // Forgets all registrations and releases what their handlers hold.
  void clear();
  // The names whose registration succeeded, in order.
  [[nodiscard]] std::vector<std::string> registeredNames() const;

  NotifyStatus notify_register_dispatch(std::string_view name, NotifyToken& token,
                                        std::shared_ptr<DispatchQueue> queue,
                                        Handler handler) override;

 private:
  struct Registration {
    std::string name;
    NotifyToken token;
    std::shared_ptr<DispatchQueue> queue;
    Handler handler;
  };

  mutable std::mutex mutex_;
  std::map<std::string, NotifyStatus, std::less<>> failures_;
  std::vector<Registration> registrations_;
};

}  // namespace halvox::platform
