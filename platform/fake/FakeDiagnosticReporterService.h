#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/diagnostic_reporter.h"
#include "platform/fake/Journal.h"

namespace halvox::platform {

// A bug-capture service that captures nothing. It keeps the requests of its reporters, and the test
// gives the replies. Any thread may call the service and its reporters; only the test's thread
// calls the other functions. FakePlatform owns it.
class FakeDiagnosticReporterService final : public DiagnosticReporterService {
 public:
  struct Request {
    const AILDiagnosticReporter* reporter;  // for comparing only; it may have been destroyed
    Dictionary signature;
    double durationSeconds;
    std::optional<Dictionary> event;
    std::optional<Dictionary> payload;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeDiagnosticReporterService(Journal& journal);
  ~FakeDiagnosticReporterService() override;

  // The number of reporters that were made.
  [[nodiscard]] std::size_t reportersMade() const;
  // All requests in order, answered or not.
  [[nodiscard]] std::vector<Request> requests() const;
  // Calls the reply of the request with that index, on this thread. Throws if there is no such
  // request or it has been answered.
  void reply(std::size_t index, const Dictionary& response);
  // Asks the source for the state of the service and returns the answer; none if there is no
  // source, or if the source does not answer before it returns.
  [[nodiscard]] std::optional<Dictionary> state() const;
  // Passes the callback to the source, which may call it later. Does nothing without a source.
  void askState(std::function<void(const Dictionary& state)> callback) const;

  [[nodiscard]] std::shared_ptr<AILDiagnosticReporter> createReporter() override;
  void setStateSource(StateSource source) override;

 private:
  class Reporter;
  struct Requests;

  mutable std::mutex mutex_;
  std::size_t made_ = 0;
  StateSource stateSource_;
  // Shared with the reporters, which may outlive the service.
  std::shared_ptr<Requests> requests_;
};

}  // namespace halvox::platform
