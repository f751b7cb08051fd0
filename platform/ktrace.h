#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>

#include "platform/dispatch.h"

namespace halvox::platform {

// One event of a kernel trace. The names of the type and its fields are part of the interface.
struct trace_point {
  std::uint64_t timestamp = 0;  // ticks of the trace clock; convert them before subtracting
  std::uint64_t arg1 = 0;
  std::uint64_t arg2 = 0;
  std::uint64_t arg3 = 0;
  std::uint64_t arg4 = 0;
  std::uint64_t threadid = 0;
  std::uint32_t debugid = 0;  // the whole identifier, including its function qualifier
  std::uint32_t cpu = 0;
  double walltime = 0;             // seconds since 1970; 0 unless wall times were enabled
  std::array<char, 16> command{};  // NUL-terminated
  std::int32_t pid = 0;
};

// A kernel-trace session, opaque to its users. The service makes it. Its holder must pass it to
// ktrace_session_destroy(), which releases the tracer's resources.
class KtraceSession {
 public:
  virtual ~KtraceSession() = default;
};

// Records the trace points that processes emit, and delivers them to handlers.
//
//   made --ktrace_start--> recording --ktrace_end--> ended --its completion--> complete
//        --destroy from any state--> destroyed
//
// Threads: a session belongs to the code that sets it up until it is started, and then to the queue
// that it was started with. Its handlers run on that queue. It is also ended and destroyed there,
// but not inside an event handler.
//
// Failure: a start that fails still counts as a start. A call that is not allowed in the session's
// state does nothing. A call for a null or destroyed session does nothing either. If such a call
// has a result, it returns an error. These calls must be harmless, because requests of clients can
// cause them.
//
// The composition root owns the service.
class KtraceService {
 public:
  using Session = std::shared_ptr<KtraceSession>;
  // The event is valid until the handler returns; the handler copies what it keeps.
  using EventHandler = std::function<void(const trace_point&)>;

  virtual ~KtraceService() = default;

  virtual Session ktrace_session_create() = 0;
  // The handler is called once, after all events of the session have been delivered, however the
  // recording ended. This call and the next two are for a session that has not been started.
  virtual void ktrace_set_completion_handler(const Session& session,
                                             std::function<void()> handler) = 0;
  virtual void ktrace_set_walltimes_enabled(const Session& session, bool enabled) = 0;
  // Subscribes to events whose identifier is from `low` to `high`, both included. Returns 0 or an
  // error.
  virtual int ktrace_events_range(const Session& session, std::uint32_t low, std::uint32_t high,
                                  EventHandler handler) = 0;
  // Begins to record. Returns 0 or an error. After an error no event is delivered, and the
  // completion follows when the session is ended. May block for many seconds while the tracer
  // starts.
  virtual int ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) = 0;
  // Ends the recording and returns at once. The events and then the completion follow on the queue.
  // `reason` is not used.
  virtual void ktrace_end(const Session& session, int reason) = 0;
  // Discards what was recorded. If the session still records, the recording ends without a
  // completion. No handler is called any more, and what the handlers held is released. May block
  // while the tracer ends.
  virtual void ktrace_session_destroy(const Session& session) = 0;
  // Converts ticks to nanoseconds since a moment that is the same for all events of the session.
  // Without a session it returns the timestamp unchanged.
  [[nodiscard]] virtual std::uint64_t ktrace_convert_timestamp_to_nanoseconds(
      const Session& session, std::uint64_t timestamp) const = 0;
};

}  // namespace halvox::platform
