#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>

#include "platform/connection.h"

namespace halvox {

// Counts what the service holds for one client: the histories and configurations of its sessions,
// its requests that have not been carried out, and its messages that wait for the real-time link.
// The connection layer refuses the client's requests while the account is over its limit.
//
// Shared by the client object, its sessions and the charges below. It outlives a client whose
// messages still wait. Any thread may use it.
class ResourceAccount {
 public:
  // Every byte that is added must be removed once; the classes below do so.
  void addBytes(std::size_t bytes) { bytes_.fetch_add(bytes, std::memory_order_relaxed); }
  void removeBytes(std::size_t bytes) { bytes_.fetch_sub(bytes, std::memory_order_relaxed); }
  void setSessions(std::size_t sessions) { sessions_.store(sessions, std::memory_order_relaxed); }

  [[nodiscard]] platform::ResourceUse use() const {
    return {.bytes = bytes_.load(std::memory_order_relaxed),
            .sessions = sessions_.load(std::memory_order_relaxed)};
  }

 private:
  // They order nothing else: a reader that sees an old value only admits one request too many.
  std::atomic<std::uint64_t> bytes_{0};
  std::atomic<std::uint64_t> sessions_{0};
};

// Charges a fixed number of bytes to an account for as long as it lives. Without an account it
// charges nobody. A copy charges the bytes again, because a copied job holds a copy of its message.
// Belongs to one thread at a time; usually part of a job.
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

// Charges to an account what one session holds, and follows every change of the amount. The
// destructor removes from the account what is still charged. Without an account it charges nobody.
//
// Owned by the session, whose parts report their changes to it from any thread.
class ResourceTally {
 public:
  ResourceTally() = default;
  ResourceTally(const ResourceTally&) = delete;
  ResourceTally& operator=(const ResourceTally&) = delete;
  ~ResourceTally() {
    if (account_ != nullptr) account_->removeBytes(bytes_.load(std::memory_order_relaxed));
  }

  // Call at most once, before the first change and before other threads know the owner.
  void chargeTo(std::shared_ptr<ResourceAccount> account) { account_ = std::move(account); }
  // The account, or null.
  [[nodiscard]] const std::shared_ptr<ResourceAccount>& account() const { return account_; }
  // Call when something that the session holds has changed its size from `before` to `after` bytes.
  void change(std::size_t before, std::size_t after) {
    if (account_ == nullptr) return;
    // The numbers are unsigned: if less is held now, the difference wraps around, and adding it
    // subtracts.
    const std::size_t difference = after - before;
    // The usual case: most messages fit into memory that the history has already reserved.
    if (difference == 0) return;
    account_->addBytes(difference);
    bytes_.fetch_add(difference, std::memory_order_relaxed);
  }

 private:
  std::shared_ptr<ResourceAccount> account_;
  std::atomic<std::size_t> bytes_{0};  // orders nothing else: only the sum matters
};

}  // namespace halvox
