#pragma once

// What the tests of this folder share.

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/linux/Mutex.h"
#include "platform/linux/runtime/LogSink.h"

namespace halvox::platform::linux_ {

// Longer than any test waits for what should happen at once.
inline constexpr std::chrono::seconds kTestDeadline{20};

// Waits until the condition holds; false when it does not in time. Looks again and again, since
// conditions are made of whatever the test can see.
inline bool waitFor(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kTestDeadline;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::microseconds(200));
  }
  return true;
}

// Keeps the lines; can be held up like a reader that does not read.
class MemoryLogSink final : public LogSink {
 public:
  std::size_t write(std::span<const LogEntry> entries) override {
    const MutexLock lock(mutex_);
    isWriting_ = true;
    changed_.notifyAll();
    while (isHeld_) changed_.wait(mutex_);
    for (const LogEntry& entry : entries) lines_.push_back(logLineText(entry));
    isWriting_ = false;
    return entries.size();
  }
  void finish() override { release(); }

  void hold() {
    const MutexLock lock(mutex_);
    isHeld_ = true;
  }
  void release() {
    const MutexLock lock(mutex_);
    isHeld_ = false;
    changed_.notifyAll();
  }
  void waitUntilWriting() {
    const MutexLock lock(mutex_);
    while (!isWriting_) changed_.wait(mutex_);
  }
  [[nodiscard]] std::vector<std::string> lines() const {
    const MutexLock lock(mutex_);
    return lines_;
  }

 private:
  mutable Mutex mutex_;
  Condition changed_;
  bool isHeld_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isWriting_ HALVOX_GUARDED_BY(mutex_) = false;
  std::vector<std::string> lines_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
