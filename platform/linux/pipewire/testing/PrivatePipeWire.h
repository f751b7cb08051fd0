#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::pipewire_testing {

// For tests: a child process with pipes to its standard input and output. The destructor closes the
// input, sends SIGTERM and waits for the process. A program that cannot be started counts as one
// that has ended.
class PipedProcess {
 public:
  explicit PipedProcess(const std::vector<std::string>& command);
  ~PipedProcess();
  PipedProcess(const PipedProcess&) = delete;
  PipedProcess& operator=(const PipedProcess&) = delete;

  void writeLine(const std::string& line) const;
  // Waits for the next line of output; returns an empty text when the process has ended.
  std::string readLine() const;
  void signal(int number) const;
  // Waits for the end of the process. Returns its exit status, or -1 after a signal.
  int wait();

 private:
  platform::linux_::UniqueFd input_;
  platform::linux_::UniqueFd output_;
  std::optional<platform::linux_::ChildProcess> child_;  // none if it did not start
};

// For tests: a private PipeWire server with WirePlumber and a null sink, without hardware, in a
// scratch directory. Changes the environment so that this process and its children use it.
class PrivatePipeWire {
 public:
  // Names the required tools that are not installed; empty if there are none.
  static std::string missingTools();

  PrivatePipeWire();
  ~PrivatePipeWire();
  PrivatePipeWire(const PrivatePipeWire&) = delete;
  PrivatePipeWire& operator=(const PrivatePipeWire&) = delete;

  [[nodiscard]] bool isReady() const { return ready_; }
  // Stops and starts the servers. Returns true when streams can run again.
  [[nodiscard]] bool restart() const;
  // Writes a WAV file with a tone and returns its path.
  [[nodiscard]] std::string makeTone(double seconds) const;
  [[nodiscard]] const std::filesystem::path& directory() const { return scratch_.path(); }

 private:
  void enterEnvironment() const;

  const platform::linux_::ScratchDirectory scratch_;  // outlives the server
  std::unique_ptr<PipedProcess> server_;
  bool ready_ = false;
};

}  // namespace halvox::pipewire_testing
