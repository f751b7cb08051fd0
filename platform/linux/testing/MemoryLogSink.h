#pragma once

#include <span>
#include <string>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/log/LogLineFormatter.h"
#include "platform/linux/log/LogSink.h"

namespace halvox::platform::linux_ {

// Keeps the lines. A test can make it block, like a reader that does not read.
class MemoryLogSink final : public LogSink {
 public:
  std::size_t write(std::span<const LogEntry> entries) override {
    const MutexLock lock(mutex_);
    isWriting_ = true;
    changed_.notifyAll();
    while (isHeld_) changed_.wait(mutex_);
    for (const LogEntry& entry : entries) appendLogLineText(lines_.emplace_back(), entry);
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
