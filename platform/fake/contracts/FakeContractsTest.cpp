// The contracts of the platform services, run on the fakes.

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/fake/FakeClockService.h"
#include "platform/fake/FakeDevicePropertyService.h"
#include "platform/fake/FakeDispatchService.h"
#include "platform/fake/FakeFeatureFlagService.h"
#include "platform/fake/FakeLogService.h"
#include "platform/fake/FakeProcessService.h"
#include "platform/fake/FakeStatisticsService.h"
#include "platform/fake/Journal.h"
#include "platform/fake/contracts/ClockContract.h"
#include "platform/fake/contracts/DispatchContract.h"
#include "platform/fake/contracts/DispatchWaitContract.h"
#include "platform/fake/contracts/LogContract.h"
#include "platform/fake/contracts/ProcessContract.h"
#include "platform/fake/contracts/StatisticsContract.h"
#include "platform/fake/contracts/SwitchesContract.h"

namespace halvox::platform::contract {
namespace fakes {

class DispatchHarness {
 public:
  DispatchService& service() { return service_; }
  bool letRunUntil(const std::function<bool()>& condition) {
    constexpr int kSteps = 1000;
    for (int step = 0; step < kSteps && !condition(); ++step) {
      service_.advance(std::chrono::milliseconds(1));
    }
    return condition();
  }

 private:
  FakeClockService clock_;
  FakeDispatchService service_{clock_};
};

class ClockHarness {
 public:
  ClockService& service() { return service_; }
  void letPass(std::chrono::milliseconds time) { service_.advance(time); }

 private:
  FakeClockService service_;
};

class ProcessHarness {
 public:
  ProcessService& service() { return service_; }
  ProcessID startProcess(const std::string& commandName) {
    service_.addProcess(kPID, commandName);
    return kPID;
  }
  void renameProcess(ProcessID pid, const std::string& commandName) {
    service_.addProcess(pid, commandName);
  }
  void endProcess(ProcessID pid) { service_.removeProcess(pid); }
  int exitStatusOf(int status) {
    try {
      service_.terminate(status);
    } catch (const FakeTermination& termination) {
      return termination.exitStatus;
    }
  }

 private:
  static constexpr ProcessID kPID = 12;
  Journal journal_;
  FakeProcessService service_{journal_};
};

struct FeatureFlags {
  static std::unique_ptr<FeatureFlagService> make(const std::vector<SwitchSetting>& settings) {
    auto service = std::make_unique<FakeFeatureFlagService>();
    for (const auto& [domain, feature, isOn] : settings) {
      using State = FakeFeatureFlagService::State;
      service->set(domain, feature, isOn ? State::kOn : State::kOff);
    }
    return service;
  }
};

struct DeviceProperties {
  static std::unique_ptr<DevicePropertyService> make(const Dictionary& properties) {
    auto service = std::make_unique<FakeDevicePropertyService>();
    for (const auto& [key, value] : properties) service->set(key.text(), value);
    return service;
  }
};

class LogHarness {
 public:
  explicit LogHarness(LogLevel threshold) { service_.setLevel(threshold); }
  LogService& service() { return service_; }
  std::vector<std::string> lines() {
    std::vector<std::string> lines;
    for (const FakeLogService::Line& line : service_.lines()) lines.push_back(line.line);
    return lines;
  }

 private:
  Journal journal_;
  FakeLogService service_{journal_};
};

}  // namespace fakes

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DispatchContract, fakes::DispatchHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DispatchWaitContract, fakes::DispatchHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ClockContract, fakes::ClockHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ProcessContract, fakes::ProcessHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, FeatureFlagContract, fakes::FeatureFlags);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DevicePropertyContract, fakes::DeviceProperties);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, StatisticsContract, FakeStatisticsService);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, LogContract, fakes::LogHarness);

}  // namespace halvox::platform::contract
