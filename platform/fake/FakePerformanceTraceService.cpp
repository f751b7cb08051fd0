#include "platform/fake/FakePerformanceTraceService.h"

#include <utility>

namespace halvox::platform {

class FakePerformanceTraceService::Session final : public KQTraceSession {
 public:
  explicit Session(FakePerformanceTraceService& service) : service_(service) {}

  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    service_.journal_.note(delegate.expired() ? "trace without delegate" : "trace delegate");
    const std::lock_guard lock(service_.mutex_);
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override { service_.journal_.note("trace start"); }
  void stopKQTrace() override {
    service_.journal_.note("trace stop");
    std::optional<std::string> url;
    std::shared_ptr<KQTraceSessionDelegate> delegate;
    {
      const std::lock_guard lock(service_.mutex_);
      url = service_.urlAtStop_;
      delegate = delegate_.lock();
    }
    if (!url.has_value() || delegate == nullptr) return;
    delegate->kqTraceDidStop(std::nullopt);
    delegate->kqTraceDidComplete(*url, 0, std::nullopt);
  }
  // The caller holds the service's lock.
  [[nodiscard]] std::shared_ptr<KQTraceSessionDelegate> delegate() const {
    return delegate_.lock();
  }

 private:
  FakePerformanceTraceService& service_;
  std::weak_ptr<KQTraceSessionDelegate> delegate_;
};

std::shared_ptr<KQTraceSessionDelegate> FakePerformanceTraceService::delegate() const {
  const std::lock_guard lock(mutex_);
  const auto session = newest_.lock();
  return session == nullptr ? nullptr : session->delegate();
}

std::vector<std::int32_t> FakePerformanceTraceService::templates() const {
  const std::lock_guard lock(mutex_);
  return templates_;
}

void FakePerformanceTraceService::completeAtStop(std::string url) {
  const std::lock_guard lock(mutex_);
  urlAtStop_ = std::move(url);
}

std::shared_ptr<KQTraceConfig> FakePerformanceTraceService::configWithTemplate(
    std::int32_t number) {
  journal_.note("trace configuration");
  const std::lock_guard lock(mutex_);
  templates_.push_back(number);
  return std::make_shared<KQTraceConfig>();
}

std::shared_ptr<KQTraceSession> FakePerformanceTraceService::initWithConfig(
    std::shared_ptr<KQTraceConfig> /*configuration*/) {
  journal_.note("trace session");
  auto session = std::make_shared<Session>(*this);
  const std::lock_guard lock(mutex_);
  newest_ = session;
  return session;
}

}  // namespace halvox::platform
