#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/dispatch.h"
#include "platform/fake/Journal.h"
#include "platform/performance_trace.h"

namespace halvox::platform {

// Performance traces that record nothing. They succeed unless the test decides otherwise. Jobs of
// the service's own queue call the delegates. Nothing is therefore reported before the test runs
// jobs. The journal has the calls that sessions receive. Any thread may call. FakePlatform owns it.
class FakePerformanceTraceService final : public PerformanceTraceService {
 public:
  // Does not own its arguments, which must outlive it and its sessions.
  FakePerformanceTraceService(Journal& journal, DispatchService& dispatch)
      : journal_(journal), dispatch_(dispatch) {}

  // Make starts, the stops of recordings, or the saving of finished traces fail with that
  // description. An empty description ends the failures.
  void failStarts(std::string description);
  void failStops(std::string description);
  void failSaves(std::string description);
  // Leaves later starts and stops without an answer, like a recorder that hangs.
  void hang();
  // Sets the URL of all traces that complete later. Without it, each trace has a URL of its own.
  void completeAtStop(std::string url);

  // The delegate of the newest session; null if it has none.
  [[nodiscard]] std::shared_ptr<KQTraceSessionDelegate> delegate() const;
  // The numbers of the templates that were requested.
  [[nodiscard]] std::vector<std::int32_t> templates() const;
  // The number of sessions that record now.
  [[nodiscard]] std::size_t recordings() const;

  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) override;
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) override;

 private:
  class Session;

  // How a stopped recording ends.
  struct Outcome {
    std::optional<Error> stopError{};
    std::optional<Error> error{};  // of the whole trace
    std::string url{};             // empty with an error
  };
  [[nodiscard]] std::shared_ptr<DispatchQueue> queue();
  [[nodiscard]] std::optional<Error> begin();
  [[nodiscard]] bool isHanging() const;
  [[nodiscard]] Outcome end();
  void giveUp();

  Journal& journal_;
  DispatchService& dispatch_;
  mutable std::mutex mutex_;
  std::shared_ptr<DispatchQueue> queue_;  // made when needed
  std::vector<std::int32_t> templates_;
  std::weak_ptr<Session> newest_;
  std::string startFailure_;
  std::string stopFailure_;
  std::string saveFailure_;
  bool hangs_ = false;
  std::string url_;
  std::size_t recordings_ = 0;
  std::size_t completed_ = 0;
};

}  // namespace halvox::platform
