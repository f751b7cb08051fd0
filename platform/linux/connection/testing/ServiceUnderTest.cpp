#include "platform/linux/connection/testing/ServiceUnderTest.h"

#include <algorithm>
#include <utility>

namespace halvox::platform::linux_ {

ServiceUnderTest::ServiceUnderTest(const std::function<void(ConnectionOptions&)>& configure) {
  ConnectionOptions options;
  options.socket = socketPath();
  options.signals = EndSignals::kLeaveAlone;
  if (configure) configure(options);
  service_.emplace(std::move(options), backpressure);
  if (const auto opened = service_->open(); !opened) {
    throw std::runtime_error(opened.error().message);
  }
  service_->serviceListener().setDelegate(delegate);
  thread_ = std::jthread([this] { service_->serviceListener().resume(); });
}

ServiceUnderTest::~ServiceUnderTest() { stop(); }

std::size_t ServiceUnderTest::countLines(LogLevel level, std::string_view part) const {
  const std::vector<std::string> texts = platform.log.texts(level);
  return static_cast<std::size_t>(std::count_if(
      texts.begin(), texts.end(),
      [part](const std::string& text) { return text.find(part) != std::string::npos; }));
}

void ServiceUnderTest::stop() {
  service_->requestStop();
  if (thread_.joinable()) thread_.join();
}

}  // namespace halvox::platform::linux_
