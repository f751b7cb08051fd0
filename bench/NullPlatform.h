#pragma once

#include <deque>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "bench/AbsentServices.h"
#include "platform/analytics.h"
#include "platform/clock.h"
#include "platform/connection.h"
#include "platform/device_properties.h"
#include "platform/dispatch.h"
#include "platform/fake/ServicesOf.h"
#include "platform/feature_flags.h"
#include "platform/kdebug.h"
#include "platform/linux/files/FileOverflowService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/log.h"
#include "platform/privacy.h"
#include "platform/process.h"
#include "platform/services.h"
#include "platform/statistics.h"

namespace halvox::bench {

// Platform services that cost as little as possible, so that a benchmark measures the inner ring
// alone. No event, trace or log line is wanted. Queued jobs wait in one list until the benchmark
// runs them. Belongs to one thread.

class NullAnalytics final : public platform::AnalyticsService {
 public:
  bool isAnalyticsEventUsed(std::string_view /*eventName*/) override { return false; }
  void sendAnalyticsEventLazy(std::string_view /*name*/,
                              platform::AnalyticsPayloadBuilder /*builder*/) override {}
};

// Advances by one millisecond at each call of currentDate().
class SteppingClock final : public platform::ClockService {
 public:
  platform::Date currentDate() const override { return {1.7e9 + 0.001 * ++looks_}; }
  platform::LocalTime localTime(platform::Date /*date*/) const override { return {}; }
  std::chrono::duration<double> systemUptime() const override {
    return std::chrono::duration<double>(0.001 * looks_);
  }
  std::chrono::milliseconds processUptime() const override {
    return std::chrono::milliseconds(static_cast<std::int64_t>(looks_));
  }

 private:
  mutable double looks_ = 0;
};

// The benchmarks make connections of their own; nothing may ask for a listener.
class NullConnections final : public platform::ConnectionService {
 public:
  [[noreturn]] platform::NSXPCListener& serviceListener() override { std::abort(); }
};

// No property: the build is not internal.
class NullDeviceProperties final : public platform::DevicePropertyService {
 public:
  std::optional<platform::Value> copyDeviceProperty(std::string_view /*key*/) const override {
    return std::nullopt;
  }
};

// All queues share one list, in which jobs run in the order of their submission.
class ListQueue final : public platform::DispatchQueue {
 public:
  explicit ListQueue(std::deque<platform::Job>& jobs) : jobs_(jobs) {}
  void async(platform::JobWeight /*weight*/, platform::Job job) override {
    jobs_.push_back(std::move(job));
  }
  // Does not wait, because no measured code signals the semaphore. Continues at the queue's next
  // turn.
  void waitOn(std::shared_ptr<platform::DispatchSemaphore> /*semaphore*/,
              std::optional<std::chrono::nanoseconds> /*timeout*/,
              std::function<void(platform::WaitOutcome)> then) override {
    jobs_.push_front([then = std::move(then)] { then(platform::WaitOutcome::kSignalled); });
  }
  bool isCurrent() const override { return true; }

 private:
  std::deque<platform::Job>& jobs_;  // owned by the ListDispatch
};

// A wait would hang the only thread. It therefore ends the program.
class NullSemaphore final : public platform::DispatchSemaphore {
 public:
  void signal() override {}
  [[noreturn]] void wait() override { std::abort(); }
};

class ListDispatch final : public platform::DispatchService {
 public:
  std::shared_ptr<platform::DispatchQueue> createSerialQueue(
      std::string_view /*label*/, platform::QualityOfService /*quality*/,
      platform::QueueThreading /*threading*/) override {
    return std::make_shared<ListQueue>(jobs_);
  }
  std::shared_ptr<platform::DispatchSemaphore> createSemaphore(std::uint64_t /*signals*/) override {
    return std::make_shared<NullSemaphore>();
  }
  void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds /*delay*/,
                                   platform::Job /*job*/) override {}
  void runAll() {
    while (!jobs_.empty()) {
      const platform::Job job = std::move(jobs_.front());
      jobs_.pop_front();
      job();
    }
  }

 private:
  std::deque<platform::Job> jobs_;
};

// No feature is enabled, and nothing is traced.
class NullFeatureFlags final : public platform::FeatureFlagService {
 public:
  bool _os_feature_enabled_impl(std::string_view /*domain*/,
                                std::string_view /*feature*/) const override {
    return false;
  }
};

class NullKdebug final : public platform::KdebugService {
 public:
  void kdebug_trace(std::uint32_t /*code*/, std::uint64_t /*first*/, std::uint64_t /*second*/,
                    std::uint64_t /*third*/, std::uint64_t /*fourth*/) override {}
};

// Counts the bytes of the lines instead of writing them.
class NullLogCategory final : public platform::LogCategory {
 public:
  explicit NullLogCategory(platform::LogLevel level) : LogCategory(level) {}
  void write(platform::LogLevel /*level*/, std::string_view line) override {
    bytes_ += line.size();
  }
  void setLevel(platform::LogLevel level) { threshold_.store(level, std::memory_order_relaxed); }
  [[nodiscard]] std::size_t bytes() const { return bytes_; }

 private:
  std::size_t bytes_ = 0;
};

class NullLog final : public platform::LogService {
 public:
  explicit NullLog(platform::LogLevel level) : category_(level) {}
  platform::LogCategory& createCategory(std::string_view /*subsystem*/,
                                        std::string_view /*category*/) override {
    return category_;
  }
  void setLevel(platform::LogLevel level) { category_.setLevel(level); }
  // The total length of all lines so far.
  [[nodiscard]] std::size_t bytes() const { return category_.bytes(); }

 private:
  NullLogCategory category_;
};

class NullPrivacy final : public platform::PrivacyService {
 public:
  NullPrivacy() : PrivacyService(KeyRules::kNone) {}
  [[nodiscard]] bool dropsKey(std::string_view /*key*/) const override { return false; }
};

class NullProcess final : public platform::ProcessService {
 public:
  std::optional<platform::ProcessRecord> processRecord(platform::ProcessID pid) const override {
    return platform::ProcessRecord{.pid = pid, .commandName = "bench"};
  }
  platform::ProcessID ownProcessIdentifier() const override { return 1; }
  std::string ownProcessName() const override { return "bench"; }
  [[noreturn]] void terminate(int /*exitStatus*/) override { std::abort(); }
};

// Owns all services and installs them. Must live as long as the process: the code under test keeps
// references to log categories in static variables.
struct NullPlatform {
  explicit NullPlatform(platform::LogLevel level) : log(level) {
    platform::installServices(platform::servicesOf(*this, analytics));
  }

  NullAnalytics analytics;
  AbsentDiagnosticReporters diagnosticReporters;
  AbsentFiles files;
  AbsentMetrics metrics;
  AbsentNotify notify;
  AbsentPowerLog powerLog;
  AbsentPreferences preferences;
  AbsentTlmReporting tlmReporting;
  SteppingClock clock;
  NullConnections connections;
  NullDeviceProperties deviceProperties;
  ListDispatch dispatch;
  NullFeatureFlags featureFlags;
  NullKdebug kdebug;
  AbsentIOReport ioReport;
  AbsentKtrace ktrace;
  AbsentPerformanceTraces performanceTraces;
  AbsentPropertyLists propertyLists;
  AbsentResultsFiles resultsFiles;
  NullLog log;
  NullPrivacy privacy;
  NullProcess process;
  // Real counters, because counting is part of the cost of a message.
  platform::linux_::CounterStatisticsService statistics;
  // The real service. Without it, a long history would lose messages and cost less than in the
  // service.
  platform::linux_::FileOverflowService overflow{
      {.directory = std::filesystem::temp_directory_path()}, statistics};
};

// The instance of the program, which is never destroyed. Only errors are enabled in its log.
inline NullPlatform& nullPlatform() {
  static auto* instance = new NullPlatform(platform::LogLevel::kError);
  return *instance;
}

}  // namespace halvox::bench
