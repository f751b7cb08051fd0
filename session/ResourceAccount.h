#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>

#include "platform/connection.h"

namespace halvox {

// What the service holds for one client at this moment: its sessions with their histories and
// configurations, its requests that are not carried out yet, and the messages of its requests that
// wait to go out over the real-time link. Shared by the client object, by its sessions and by the
// charges below, so it outlives a client whose messages still wait. Any thread may use it.
class ResourceAccount {
 public:
  void addBytes(std::size_t bytes) { bytes_.fetch_add(bytes, std::memory_order_relaxed); }
  void removeBytes(std::size_t bytes) { bytes_.fetch_sub(bytes, std::memory_order_relaxed); }
  void setSessions(std::size_t sessions) { sessions_.store(sessions, std::memory_order_relaxed); }

  [[nodiscard]] platform::ResourceUse use() const {
    return {.bytes = bytes_.load(std::memory_order_relaxed),
            .sessions = sessions_.load(std::memory_order_relaxed)};
  }

 private:
  // They order with nothing: a reader that is a little late only lets one more request in.
  std::atomic<std::uint64_t> bytes_{0};
  std::atomic<std::uint64_t> sessions_{0};
};

// Bytes that are charged to an account while this lives. A copy charges them once more: jobs are
// copyable, and a copied job holds its own. Charges nobody when it has no account.
class ResourceCharge {
 public:
  ResourceCharge() = default;
  ResourceCharge(std::shared_ptr<ResourceAccount> account, std::size_t bytes)
      : account_(std::move(account)), bytes_(bytes) {
    if (account_ != nullptr) account_->addBytes(bytes_);
  }
  ResourceCharge(const ResourceCharge& other) : ResourceCharge(other.account_, other.bytes_) {}
  ResourceCharge(ResourceCharge&& other) noexcept
      : account_(std::move(other.account_)), bytes_(std::exchange(other.bytes_, 0)) {}
  ResourceCharge& operator=(ResourceCharge other) noexcept {
    std::swap(account_, other.account_);
    std::swap(bytes_, other.bytes_);
    return *this;
  }
  ~ResourceCharge() {
    if (account_ != nullptr) account_->removeBytes(bytes_);
  }

 private:
  std::shared_ptr<ResourceAccount> account_;  // null: nobody is charged
  std::size_t bytes_ = 0;
};

}  // namespace halvox
