#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "reporters/pipewire/StreamTracker.h"

struct pw_loop;

namespace halvox::pipewire_reporter {

// Follows the nodes, links and clients of a PipeWire server and passes their changes to a
// StreamTracker.
//
//   waiting ──connected──► watching ──disconnected──► waiting (without streams)
//
// Without a server it tries to connect after 0.1 s, then after twice as long each time, up to 5 s.
// Belongs to the loop thread. Does not own the loop and the tracker, which must outlive it. An
// object that cannot be followed, for example for lack of permission, is logged and ignored.
class StreamWatcher {
 public:
  struct Options {
    std::string remote;  // the server's socket name; empty: PipeWire's default
    // Receives log lines for a person. Called on the loop thread.
    std::function<void(std::string_view line)> log;
    // Whether to follow the server's profiler, which reports missed cycles, while there are
    // streams. The profiler wakes this process several times a second while streams run.
    bool xruns = true;
  };

  // Throws std::runtime_error when PipeWire's library cannot be set up. A missing server is not an
  // error.
  StreamWatcher(pw_loop* loop, StreamTracker& tracker, Options options);
  ~StreamWatcher();
  StreamWatcher(const StreamWatcher&) = delete;
  StreamWatcher& operator=(const StreamWatcher&) = delete;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::pipewire_reporter
