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

// A bug-capture service that captures nothing: it keeps what its reporters were asked for, and the
// test gives the replies. Any thread may call; the test calls from its own.
class FakeDiagnosticReporterService final : public DiagnosticReporterService {
 public:
  struct Request {
    const AILDiagnosticReporter* reporter;  // only to be compared; it may be gone
    Dictionary signature;
    double durationSeconds;
    std::optional<Dictionary> event;
    std::optional<Dictionary> payload;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeDiagnosticReporterService(Journal& journal);
  ~FakeDiagnosticReporterService() override;

  // How many reporters were made.
  [[nodiscard]] std::size_t reportersMade() const;
  // The snapshots that were asked for, in order, answered or not.
  [[nodiscard]] std::vector<Request> requests() const;
  // Gives the reply to the request of that index, on this thread; throws when there is none, or
  // when it has been given.
  void reply(std::size_t index, const Dictionary& response);
  // The state of the service, as the source that was set gives it; none when no source was set or
  // when it did not answer before it returned.
  [[nodiscard]] std::optional<Dictionary> state() const;
  // The same for a source that answers later; nothing happens when no source was set.
  void askState(std::function<void(const Dictionary& state)> callback) const;

  [[nodiscard]] std::shared_ptr<AILDiagnosticReporter> createReporter() override;
  void setStateSource(StateSource source) override;

 private:
  class Reporter;
  struct Requests;

  mutable std::mutex mutex_;
  std::size_t made_ = 0;
  StateSource stateSource_;
  // Shared with the reporters, which may live longer.
  std::shared_ptr<Requests> requests_;
};

}  // namespace halvox::platform
