#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/connection.h"

namespace halvox::platform {

// What a performance trace records. Immutable, shared by its sessions.
class KQTraceConfig {
 public:
  virtual ~KQTraceConfig() = default;
};

// Receives the progress of a performance trace.
//
// The service calls these functions on one of its threads, never inside a call to the session. A
// trace that was started ends in exactly one completion, with an error if recording or saving
// failed. A trace whose start failed never completes.
class KQTraceSessionDelegate {
 public:
  virtual ~KQTraceSessionDelegate() = default;

  virtual void kqTraceDidStart(const std::optional<Error>& error) = 0;
  virtual void kqTraceDidStop(const std::optional<Error>& error) = 0;
  // The finished trace is at `url`. `token` has no meaning.
  virtual void kqTraceDidComplete(const std::string& url, std::uint64_t token,
                                  const std::optional<Error>& error) = 0;
};

// One performance trace.
//
//   made --start--> recording --stop--> saved, its completion is reported
//        --start fails--> made
//
// Shared by the code that started it and, while it works, by the service. If all others release a
// session that records, the service ends the recording, deletes its data and does not call the
// delegate.
//
// Any thread may call. A start during a recording and a stop without a recording do nothing. Every
// failure is reported to the delegate.
class KQTraceSession {
 public:
  virtual ~KQTraceSession() = default;

  // Keeps a weak reference to the delegate. An empty pointer ends the calls to it. A caller that
  // replaces a trace passes one, because the delegate could not tell the calls of the old trace
  // from those of the new one.
  virtual void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) = 0;
  // Both return at once, whatever the tracer does. The service carries them out in the order of the
  // calls and reports the results to the delegate.
  virtual void startKQTrace() = 0;
  virtual void stopKQTrace() = 0;
};

// Records and packages performance traces. Any thread may call. The composition root owns the
// service. The spelling of the functions is part of the interface.
class PerformanceTraceService {
 public:
  // The template for standard performance traces.
  static constexpr std::int32_t kStandardTemplate = 1;

  virtual ~PerformanceTraceService() = default;

  virtual std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) = 0;
  virtual std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) = 0;
};

}  // namespace halvox::platform
