#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/connection.h"

namespace halvox::platform {

// What a performance trace records. Immutable, shared.
class KQTraceConfig {
 public:
  virtual ~KQTraceConfig() = default;
};

// Hears how a performance trace goes on. Called on a thread of the service, never by a call to the
// session before it has returned. A trace that was started ends in exactly one completion, with an
// error when recording or saving failed; only one whose start failed never completes.
class KQTraceSessionDelegate {
 public:
  virtual ~KQTraceSessionDelegate() = default;

  virtual void kqTraceDidStart(const std::optional<Error>& error) = 0;
  virtual void kqTraceDidStop(const std::optional<Error>& error) = 0;
  // Where the finished trace is; the token means nothing here.
  virtual void kqTraceDidComplete(const std::string& url, std::uint64_t token,
                                  const std::optional<Error>& error) = 0;
};

// One performance trace.
//
//   made --start--> recording --stop--> saved, its completion is heard
//        --start fails--> made
//
// Shared by whoever started it and by the service while it works on it. When nobody holds it any
// more while it records, the recording ends and is dropped, and nothing is heard of it. A start
// while it records and a stop while it does not do nothing. Any thread may call.
class KQTraceSession {
 public:
  virtual ~KQTraceSession() = default;

  // Keeps the delegate weakly; none ends the calls to it.
  virtual void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) = 0;
  // Both return at once, whatever the tracer does, and are carried out in their order; the delegate
  // hears the rest.
  virtual void startKQTrace() = 0;
  virtual void stopKQTrace() = 0;
};

// Records and packages traces by itself. Any thread may call.
class PerformanceTraceService {
 public:
  // The standard template.
  static constexpr std::int32_t kStandardTemplate = 1;

  virtual ~PerformanceTraceService() = default;

  virtual std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t number) = 0;
  virtual std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> configuration) = 0;
};

}  // namespace halvox::platform
