#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/performance_trace.h"

namespace halvox::platform {

// Performance traces whose course a test decides by calling the delegate of the newest one. Notes
// each operation in the journal. Any thread may call.
class FakePerformanceTraceService final : public PerformanceTraceService {
 public:
  // Does not own the journal, which must outlive it.
  explicit FakePerformanceTraceService(Journal& journal) : journal_(journal) {}

  // The delegate of the newest session; null when it has none.
  [[nodiscard]] std::shared_ptr<KQTraceSessionDelegate> delegate() const;
  // The templates that configurations were asked for.
  [[nodiscard]] std::vector<std::int32_t> templates() const;
  // Whether a stop at once completes with that URL.
  void completeAtStop(std::string url);

  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) override;
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) override;

 private:
  class Session;

  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<std::int32_t> templates_;
  std::weak_ptr<Session> newest_;
  std::optional<std::string> urlAtStop_;
};

}  // namespace halvox::platform
