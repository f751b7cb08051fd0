#pragma once

#include <string>

#include <sys/types.h>

namespace halvox::bench {

// A server that does the least for each request: reads frames, skips them by their length, and
// sends an empty reply for each, in one write for all that one read brought. It shares no code with
// the service or the client library. Serves one connection after another, on the calling thread,
// until a signal ends the process. Returns 1 if it cannot listen.
int serveSink(const std::string& socketPath);

// Runs serveSink() in a process of its own, which the destructor ends. Make it before the first
// thread, because it forks. The constructor waits until the server listens.
class SinkProcess {
 public:
  explicit SinkProcess(const std::string& socketPath);
  ~SinkProcess();
  SinkProcess(const SinkProcess&) = delete;
  SinkProcess& operator=(const SinkProcess&) = delete;

 private:
  pid_t child_;
};

}  // namespace halvox::bench
