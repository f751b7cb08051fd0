#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "bench/load/Process.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::bench {

// rsyslog as a reference: reads datagrams from a Unix socket and appends each as a line of JSON
// with time, name and payload to a file. Runs with a directory of its own, which is deleted
// afterwards.
class Rsyslog {
 public:
  // Throws std::runtime_error when rsyslogd is not installed or does not start.
  Rsyslog();

  [[nodiscard]] const Process& process() const { return *process_; }
  // Blocks until the file has that many lines. Throws after a minute without a new line.
  void waitForLines(std::int64_t count);

  // Sends `count` messages of the same ten fields as RawClient, as JSON. Blocks while
  // the socket is full: no message is lost. Any thread may call this.
  void send(std::int64_t count, bool variesTexts) const;

 private:
  platform::linux_::ScratchDirectory directory_;
  std::string socket_;
  std::string file_;
  std::unique_ptr<Process> process_;
  std::int64_t lines_ = 0;
  std::uint64_t offset_ = 0;
};

}  // namespace halvox::bench
