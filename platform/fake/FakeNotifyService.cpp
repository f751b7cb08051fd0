#include "platform/fake/FakeNotifyService.h"

#include <utility>

namespace halvox::platform {

void FakeNotifyService::failRegistration(std::string_view name, NotifyStatus status) {
  const std::lock_guard lock(mutex_);
  failures_.insert_or_assign(std::string(name), status);
}

void FakeNotifyService::post(std::string_view name) {
  const std::lock_guard lock(mutex_);
  for (const Registration& one : registrations_) {
    if (one.name != name) continue;
    one.queue->async(JobWeight::kMayBlock,
                     [handler = one.handler, token = one.token] { handler(token); });
  }
}

void FakeNotifyService::clear() {
  std::vector<Registration> dropped;
  const std::lock_guard lock(mutex_);
  dropped.swap(registrations_);
}

std::vector<std::string> FakeNotifyService::registeredNames() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::string> names;
  for (const Registration& one : registrations_) names.push_back(one.name);
  return names;
}

NotifyStatus FakeNotifyService::notify_register_dispatch(std::string_view name, NotifyToken& token,
                                                         std::shared_ptr<DispatchQueue> queue,
                                                         Handler handler) {
  const std::lock_guard lock(mutex_);
  if (const auto failure = failures_.find(name); failure != failures_.end()) {
    return failure->second;
  }
  if (name.empty() || name == "." || name == ".." || name.find('/') != std::string_view::npos ||
      name.find('\0') != std::string_view::npos) {
    return kInvalidName;
  }
  token = static_cast<NotifyToken>(registrations_.size()) + 1;
  registrations_.push_back({std::string(name), token, std::move(queue), std::move(handler)});
  return 0;
}

}  // namespace halvox::platform
