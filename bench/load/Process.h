#pragma once

#include <chrono>
#include <string>
#include <vector>

#include "platform/linux/base/ChildProcess.h"

namespace halvox::bench {

// A server process to measure. The constructor starts it, the destructor ends it and waits.
class Process {
 public:
  // Runs a program, given by its path or found in $PATH, with arguments and additional environment
  // variables ("NAME=value"). Throws std::runtime_error when it cannot be started.
  Process(const std::vector<std::string>& command, const std::vector<std::string>& environment);
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  // Waits until the socket accepts connections. Throws when the process ends before, or after ten
  // seconds.
  void waitForSocket(const std::string& path);
  // The CPU time of all threads so far.
  [[nodiscard]] std::chrono::nanoseconds cpuTime() const;
  // Waits until the process uses no CPU for 100 ms and returns its CPU time. This includes work
  // that was still queued, which belongs to what was measured.
  [[nodiscard]] std::chrono::nanoseconds settledCpuTime() const;
  // Waits until the process uses less than 5 % of one CPU for 200 ms.
  void waitForRest() const;
  [[nodiscard]] long residentKib() const;
  // The peak resident memory since the start or the last forgetPeak().
  [[nodiscard]] long peakKib() const;
  void forgetPeak() const;
  // What the process has caused to be written to disks so far, in bytes. Data that is written twice
  // before it reaches the disk counts once.
  [[nodiscard]] long writtenBytes() const;
  // How often threads of the process went to sleep so far. Each time is one wake-up.
  [[nodiscard]] long sleeps() const;

 private:
  platform::linux_::ChildProcess child_;
};

}  // namespace halvox::bench
