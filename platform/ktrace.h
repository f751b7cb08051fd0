#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>

#include "platform/dispatch.h"

namespace halvox::platform {

// One event of a kernel trace.
struct trace_point {
  std::uint64_t timestamp = 0;  // ticks of the trace clock
  std::uint64_t arg1 = 0;
  std::uint64_t arg2 = 0;
  std::uint64_t arg3 = 0;
  std::uint64_t arg4 = 0;
  std::uint64_t threadid = 0;
  std::uint32_t debugid = 0;  // the whole identifier, function qualifiers included
  std::uint32_t cpu = 0;
  double walltime = 0;             // seconds since 1970; 0 when not asked for
  std::array<char, 16> command{};  // ends with a NUL
  std::int32_t pid = 0;
};

// A kernel-trace session. Made by the service; whoever holds it must destroy it there.
class KtraceSession {
 public:
  virtual ~KtraceSession() = default;
};

// Records the trace points that processes emit.
//
//   made --ktrace_start--> recording --ktrace_end--> ended --its completion--> complete
//        --destroy from any state--> destroyed
//
// A session belongs to whoever sets it up until it is started, and then to the queue that it was
// started with: its handlers are called there, and there it is ended and destroyed (but not by an
// event handler). A start that fails counts as a start. Calls that do not suit the state of the
// session, among them all calls after it was destroyed, do nothing, and so do calls with no
// session: a client can cause either. Those that have a result return an error.
class KtraceService {
 public:
  using Session = std::shared_ptr<KtraceSession>;
  // The event is the handler's to read until it returns.
  using EventHandler = std::function<void(const trace_point&)>;

  virtual ~KtraceService() = default;

  virtual Session ktrace_session_create() = 0;
  // Called once after all events of the session have been delivered, however it ended. Before the
  // start only, like the next two.
  virtual void ktrace_set_completion_handler(const Session& session,
                                             std::function<void()> handler) = 0;
  virtual void ktrace_set_walltimes_enabled(const Session& session, bool enabled) = 0;
  // Subscribes to events whose identifier is from `low` to `high`, both included. 0 or an error.
  virtual int ktrace_events_range(const Session& session, std::uint32_t low, std::uint32_t high,
                                  EventHandler handler) = 0;
  // Begins to record. 0 or an error; after an error nothing will be delivered but the completion,
  // once the session is ended. May wait for the tracer for many seconds.
  virtual int ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) = 0;
  // Ends the recording and returns at once; the events and the completion follow.
  virtual void ktrace_end(const Session& session, int reason) = 0;
  // What was recorded goes, and a session that still records ends without a completion: no handler
  // is called any more, and what the handlers held is released. May wait for the tracer.
  virtual void ktrace_session_destroy(const Session& session) = 0;
  // Nanoseconds since a moment that is the same for all events of the session. Without a session
  // the timestamp as it is.
  [[nodiscard]] virtual std::uint64_t ktrace_convert_timestamp_to_nanoseconds(
      const Session& session, std::uint64_t timestamp) const = 0;
};

}  // namespace halvox::platform
