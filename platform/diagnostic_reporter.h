#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Asks the bug-capture service for diagnostics of one kind of problem.
//
// Any thread may call; nothing blocks. Shared by everything that reports problems. A capture that
// fails is reported in the reply.
class AILDiagnosticReporter {
 public:
  // `response` says where the capture is, or why there is none.
  using Reply = std::function<void(const Dictionary& response)>;

  virtual ~AILDiagnosticReporter() = default;

  // A dictionary that identifies one kind of problem. Arguments that are absent add no entry.
  [[nodiscard]] virtual Dictionary makeSignature(
      std::string_view domain, std::string_view type, std::string_view subType,
      std::string_view subtypeContext, std::optional<std::string_view> detectedProcess,
      const std::optional<Dictionary>& triggerThresholdValues) const = 0;
  // Asks for a capture for the signature. `durationSeconds`, `event` and `payload` describe the
  // problem and are recorded with the capture. The reply is called exactly once, on a thread of the
  // service, after this call has returned.
  virtual void requestSnapshot(const Dictionary& signature, double durationSeconds,
                               const std::optional<Dictionary>& event,
                               const std::optional<Dictionary>& payload, Reply reply) = 0;
};

// Where diagnostic reporters come from. Any thread may call. The composition root owns the service.
class DiagnosticReporterService {
 public:
  // A source passes the state of the service, as a dictionary, to the callback that it receives. It
  // may do so later and on another thread, because the service reads its state on its reporting
  // queue.
  using StateSource = std::function<void(std::function<void(const Dictionary& state)>)>;

  virtual ~DiagnosticReporterService() = default;

  [[nodiscard]] virtual std::shared_ptr<AILDiagnosticReporter> createReporter() = 0;
  // Installs the source of the service's own state, which becomes part of each capture. Called at
  // most once, before the first client connects.
  virtual void setStateSource(StateSource source) = 0;
};

}  // namespace halvox::platform
