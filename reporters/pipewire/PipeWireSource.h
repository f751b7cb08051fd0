#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "reporters/pipewire/StreamTracker.h"

struct pw_loop;

namespace halvox::pipewire_reporter {

// Watches a PipeWire server and tells a StreamTracker what its nodes, links and clients do.
//
//   waiting ──connected──► watching ──server gone──► waiting (all streams gone)
//
// While no server is there it tries again, first after a tenth of a second, then at doubling
// distances up to five seconds. Belongs to the loop thread and lives no longer than the loop and
// the tracker, which it borrows. Failures of single objects (no permission, gone before they could
// be asked) are logged; the object is left alone.
class PipeWireSource {
 public:
  struct Options {
    std::string remote;  // the server's socket name; empty: PipeWire's own choice
    // Told lines for a person: what it connects to, loses and cannot follow.
    std::function<void(std::string_view line)> log;
    // Whether to follow the server's profiler while there are streams, which tells what they miss.
    // It wakes the process several times a second while streams run.
    bool xruns = true;
  };

  // Throws std::runtime_error when the library cannot be set up at all.
  PipeWireSource(pw_loop* loop, StreamTracker& tracker, Options options);
  ~PipeWireSource();
  PipeWireSource(const PipeWireSource&) = delete;
  PipeWireSource& operator=(const PipeWireSource&) = delete;

 private:
  class Impl;
  std::unique_ptr<Impl> impl_;
};

}  // namespace halvox::pipewire_reporter
