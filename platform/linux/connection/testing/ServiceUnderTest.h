#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <thread>

#include "platform/fake/FakePlatform.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/connection/testing/TestInterface.h"
#include "platform/linux/dispatch/Backpressure.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {

// The service with the test's object, serving on a thread of its own in a scratch directory.
class ServiceUnderTest {
 public:
  // Called before the service is made, to change its options.
  explicit ServiceUnderTest(const std::function<void(ConnectionOptions&)>& configure = {});
  ServiceUnderTest(const ServiceUnderTest&) = delete;
  ServiceUnderTest& operator=(const ServiceUnderTest&) = delete;
  ~ServiceUnderTest();

  [[nodiscard]] std::filesystem::path socketPath() const { return directory_.path() / "s"; }
  [[nodiscard]] std::string address() const { return "unix:path=" + socketPath().string(); }
  [[nodiscard]] std::uint64_t count(std::string_view name) const {
    return platform.statistics.value("connection", name);
  }
  // Returns how many log lines of that level contain the text.
  [[nodiscard]] std::size_t countLines(LogLevel level, std::string_view part) const;
  // Ends the service's resume().
  void stop();

  FakePlatform platform;
  Backpressure backpressure;
  TestDelegate delegate;

 private:
  ScratchDirectory directory_;
  std::optional<LinuxConnectionService> service_;
  std::jthread thread_;
};

}  // namespace halvox::platform::linux_
