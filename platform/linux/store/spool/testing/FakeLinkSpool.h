#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

// A spool in memory. Messages are stored at once, or by store() after hold().
class FakeLinkSpool final : public LinkSpool {
 public:
  // How many messages readAfter() returns at most.
  static constexpr std::size_t kMessagesAtOnce = 4;

  // The messages that come from now on stay unstored until store().
  void hold() {
    const MutexLock lock(mutex_);
    isHolding_ = true;
  }
  void store() {
    {
      const MutexLock lock(mutex_);
      isHolding_ = false;
      stored_ = last_.load();
    }
    if (onStored_) onStored_();
  }
  void close() {
    const MutexLock lock(mutex_);
    isClosed_ = true;
  }
  void setCanKeep(bool canKeep) { canKeep_ = canKeep; }
  // Loses a stored message, as a full store does.
  void lose(Number number) {
    const MutexLock lock(mutex_);
    messages_.erase(number);
  }
  [[nodiscard]] std::vector<std::string> identifiers() {
    const MutexLock lock(mutex_);
    std::vector<std::string> found;
    for (const auto& [number, message] : messages_) found.push_back(message.identifier);
    return found;
  }

  [[nodiscard]] bool canKeep() const override { return canKeep_; }
  [[nodiscard]] Number append(SpooledMessage message) override {
    Number number = 0;
    bool isStored = false;
    {
      const MutexLock lock(mutex_);
      if (isClosed_) return 0;
      number = ++last_;
      messages_.emplace(number, std::move(message));
      isStored = !isHolding_;
      if (isStored) stored_ = number;
    }
    if (isStored && onStored_) onStored_();
    return number;
  }
  [[nodiscard]] Number lastAppended() const override { return last_; }
  [[nodiscard]] bool hasUnstored() const override { return stored_ < last_; }
  [[nodiscard]] Result<Read, StoreError> readAfter(Number after) override {
    const MutexLock lock(mutex_);
    Read read{.messages = {}, .through = after};
    for (auto next = messages_.upper_bound(after); next != messages_.end(); ++next) {
      if (next->first > stored_ || read.messages.size() == kMessagesAtOnce) break;
      read.messages.emplace_back(*next);
      read.through = next->first;
    }
    return read;
  }
  void removeThrough(Number number) override {
    const MutexLock lock(mutex_);
    messages_.erase(messages_.begin(), messages_.upper_bound(number));
  }
  void onStored(std::function<void()> stored) override { onStored_ = std::move(stored); }

 private:
  Mutex mutex_;
  std::map<Number, SpooledMessage> messages_ HALVOX_GUARDED_BY(mutex_);
  std::atomic<Number> last_{0};
  std::atomic<Number> stored_{0};
  std::function<void()> onStored_;  // set before the first append()
  bool isHolding_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isClosed_ HALVOX_GUARDED_BY(mutex_) = false;
  std::atomic<bool> canKeep_{true};
};

}  // namespace halvox::platform::linux_
