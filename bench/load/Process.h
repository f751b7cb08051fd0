#pragma once

#include <chrono>
#include <string>
#include <vector>

#include <sys/types.h>

namespace halvox::bench {

// A server process under measurement. Started by the constructor, ended by the destructor.
class Process {
 public:
  // Runs a program, by its path or as found in $PATH, with these arguments and additional
  // environment ("NAME=value").
  Process(const std::vector<std::string>& command, const std::vector<std::string>& environment);
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  // Waits until somebody serves the socket; throws when the process ends first.
  void waitForSocket(const std::string& path) const;
  // CPU time of all its threads so far.
  [[nodiscard]] std::chrono::nanoseconds cpuTime() const;
  // CPU time once it has come to rest: what is still queued belongs to the work that was measured.
  [[nodiscard]] std::chrono::nanoseconds settledCpuTime() const;
  // Waits until it does next to nothing: less than a twentieth of what it could, for 200 ms.
  void waitForRest() const;
  [[nodiscard]] long residentKib() const;
  // The most resident memory since the start, or since it was told to forget that.
  [[nodiscard]] long peakKib() const;
  void forgetPeak() const;
  // How often its threads went to sleep so far; each time is one wake-up.
  [[nodiscard]] long sleeps() const;

 private:
  pid_t pid_;
};

// A directory that goes with its object.
class ScratchDirectory {
 public:
  ScratchDirectory();
  ~ScratchDirectory();
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;
  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  std::string path_;
};

}  // namespace halvox::bench
