// The contracts of the ports, kept by the adapters of this folder.

#include <array>
#include <chrono>
#include <csignal>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/fake/contracts/ClockContract.h"
#include "platform/fake/contracts/DispatchContract.h"
#include "platform/fake/contracts/DispatchWaitContract.h"
#include "platform/fake/contracts/LogContract.h"
#include "platform/fake/contracts/ProcessContract.h"
#include "platform/fake/contracts/StatisticsContract.h"
#include "platform/fake/contracts/SwitchesContract.h"
#include "platform/linux/UniqueHandle.h"
#include "platform/linux/runtime/AsioDispatchService.h"
#include "platform/linux/runtime/ConfiguredDevicePropertyService.h"
#include "platform/linux/runtime/ConfiguredFeatureFlagService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/runtime/LibcClockService.h"
#include "platform/linux/runtime/ProcfsProcessService.h"
#include "platform/linux/runtime/SpdlogLogService.h"
#include "platform/linux/runtime/TestSupport.h"

namespace halvox::platform::contract {

using linux_::UniqueFd;

namespace adapters {

class AsioHarness {
 public:
  DispatchService& service() { return service_; }
  bool letRunUntil(const std::function<bool()>& condition) { return linux_::waitFor(condition); }

 private:
  linux_::CounterStatisticsService statistics_;
  linux_::SpdlogLogService log_{LogLevel::kError, std::make_unique<linux_::MemoryLogSink>(),
                                statistics_};
  linux_::AsioDispatchService service_{log_, statistics_};
};

class LibcClockHarness {
 public:
  ClockService& service() { return service_; }
  void letPass(std::chrono::milliseconds time) { std::this_thread::sleep_for(time); }

 private:
  linux_::LibcClockService service_;
};

// Children that do nothing but bear the names that they are told.
class ProcfsHarness {
 public:
  ProcessService& service() { return service_; }
  ProcessID startProcess(const std::string& commandName) {
    std::array<int, 2> names{};
    std::array<int, 2> done{};
    if (::pipe2(names.data(), O_CLOEXEC) != 0 || ::pipe2(done.data(), O_CLOEXEC) != 0) return -1;
    const UniqueFd namesToRead(names[0]);
    const UniqueFd doneToWrite(done[1]);
    names_.reset(names[1]);
    done_.reset(done[0]);
    const pid_t child = ::fork();
    if (child == 0) bearNames(namesToRead.get(), doneToWrite.get());
    renameProcess(child, commandName);
    return child;
  }
  void renameProcess(ProcessID /*pid*/, const std::string& commandName) {
    char byte = 0;
    ASSERT_GT(::write(names_.get(), commandName.c_str(), commandName.size() + 1), 0);
    ASSERT_EQ(::read(done_.get(), &byte, 1), 1);
  }
  void endProcess(ProcessID pid) {
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
  }
  int exitStatusOf(int status) {
    const pid_t child = ::fork();
    if (child == 0) service_.terminate(status);
    int ended = 0;
    ::waitpid(child, &ended, 0);
    return WIFEXITED(ended) ? WEXITSTATUS(ended) : -1;
  }

 private:
  [[noreturn]] static void bearNames(int names, int done) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    std::array<char, 64> name{};
    while (::read(names, name.data(), name.size() - 1) > 0) {
      ::prctl(PR_SET_NAME, name.data());
      if (::write(done, "d", 1) != 1) break;
    }
    ::_exit(1);
  }

  UniqueFd names_;
  UniqueFd done_;
  linux_::ProcfsProcessService service_;
};

struct ConfiguredFeatureFlags {
  static std::unique_ptr<FeatureFlagService> make(const std::vector<SwitchSetting>& settings) {
    linux_::FeatureSwitches switches;
    for (const auto& [domain, feature, isOn] : settings) switches[domain][feature] = isOn;
    return std::make_unique<linux_::ConfiguredFeatureFlagService>(std::move(switches));
  }
};

struct ConfiguredDeviceProperties {
  static std::unique_ptr<DevicePropertyService> make(const Dictionary& properties) {
    return std::make_unique<linux_::ConfiguredDevicePropertyService>(properties);
  }
};

class SpdlogHarness {
 public:
  explicit SpdlogHarness(LogLevel threshold) {
    auto sink = std::make_unique<linux_::MemoryLogSink>();
    sink_ = sink.get();
    service_ = std::make_unique<linux_::SpdlogLogService>(threshold, std::move(sink), statistics_);
  }
  LogService& service() { return *service_; }
  std::vector<std::string> lines() {
    service_->stop();
    return sink_->lines();
  }

 private:
  linux_::CounterStatisticsService statistics_;
  linux_::MemoryLogSink* sink_ = nullptr;
  std::unique_ptr<linux_::SpdlogLogService> service_;
};

}  // namespace adapters

INSTANTIATE_TYPED_TEST_SUITE_P(Asio, DispatchContract, adapters::AsioHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Asio, DispatchWaitContract, adapters::AsioHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Libc, ClockContract, adapters::LibcClockHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Procfs, ProcessContract, adapters::ProcfsHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Configured, FeatureFlagContract, adapters::ConfiguredFeatureFlags);
INSTANTIATE_TYPED_TEST_SUITE_P(Configured, DevicePropertyContract,
                               adapters::ConfiguredDeviceProperties);
INSTANTIATE_TYPED_TEST_SUITE_P(Counter, StatisticsContract, linux_::CounterStatisticsService);
INSTANTIATE_TYPED_TEST_SUITE_P(Spdlog, LogContract, adapters::SpdlogHarness);

}  // namespace halvox::platform::contract
