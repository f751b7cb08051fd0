#pragma once

#include <cstdint>
#include <future>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/testing/MemoryLogSink.h"

namespace halvox::platform::linux_ {

// A fixture with a dispatch service that logs into memory.
class DispatchFixture : public ::testing::Test {
 protected:
  DispatchFixture() {
    auto sink = std::make_unique<MemoryLogSink>();
    sink_ = sink.get();
    log_ = std::make_unique<QueuedLogService>(LogLevel::kDebug, std::move(sink), statistics_);
    service_ = std::make_unique<AsioDispatchService>(*log_, statistics_);
  }

  std::uint64_t count(const char* name) { return statistics_.counter("dispatch", name).value(); }
  // Stops the log and returns its lines.
  std::vector<std::string> logLines() {
    log_->stop();
    return sink_->lines();
  }

  CounterStatisticsService statistics_;
  MemoryLogSink* sink_ = nullptr;  // owned by log_
  std::unique_ptr<QueuedLogService> log_;
  std::unique_ptr<AsioDispatchService> service_;
};

// A queue with a job that has begun and does not end before release().
class StuckQueue {
 public:
  StuckQueue(DispatchService& service, std::string_view label, QueueThreading threading)
      : queue_(service.createSerialQueue(label, QualityOfService::kUtility, threading)) {
    const auto started = std::make_shared<std::promise<void>>();
    queue_->async(JobWeight::kMayBlock, [started, released = release_.get_future().share()] {
      started->set_value();
      released.wait();
    });
    started->get_future().wait();
  }

  void release() { release_.set_value(); }

 private:
  std::promise<void> release_;
  std::shared_ptr<DispatchQueue> queue_;
};

}  // namespace halvox::platform::linux_
