#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Asks the bug-capture service for diagnostics. Any thread may call; nothing blocks.
class AILDiagnosticReporter {
 public:
  using Reply = std::function<void(const Dictionary& response)>;

  virtual ~AILDiagnosticReporter() = default;

  // What identifies a kind of problem. What is not known, or not given, is not in it.
  [[nodiscard]] virtual Dictionary makeSignature(
      std::string_view domain, std::string_view type, std::string_view subType,
      std::string_view subtypeContext, std::optional<std::string_view> detectedProcess,
      const std::optional<Dictionary>& triggerThresholdValues) const = 0;
  // Asks for a capture of diagnostics for the signature. The reply is called once, later, on a
  // thread of the service, with what became of it.
  virtual void requestSnapshot(const Dictionary& signature, double durationSeconds,
                               const std::optional<Dictionary>& event,
                               const std::optional<Dictionary>& payload, Reply reply) = 0;
};

// Where diagnostic reporters come from. Any thread may call.
class DiagnosticReporterService {
 public:
  // Asks for the state of the service as a dictionary; it is given to the callback, perhaps later
  // and on another thread.
  using StateSource = std::function<void(std::function<void(const Dictionary& state)>)>;

  virtual ~DiagnosticReporterService() = default;

  [[nodiscard]] virtual std::shared_ptr<AILDiagnosticReporter> createReporter() = 0;
  // Who knows the service's own state, to be part of each capture. At most once, at the start.
  virtual void setStateSource(StateSource source) = 0;
};

}  // namespace halvox::platform
