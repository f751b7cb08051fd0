#pragma once

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <sys/types.h>

namespace halvox::pipewire_reporter {

// For tests: a child process with pipes to its standard input and from its standard output.
// Its destruction ends it, by closing the first and a signal, and waits for it.
class ChildProcess {
 public:
  explicit ChildProcess(const std::vector<std::string>& command);
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  void writeLine(const std::string& line) const;
  // The next line of its output; empty when it has ended.
  std::string readLine() const;
  void signal(int number) const;
  // Waits for its end and returns its exit status.
  int wait();

 private:
  pid_t pid_ = -1;
  int input_ = -1;
  int output_ = -1;
};

// For tests: a PipeWire of our own with WirePlumber and a null sink, without hardware, in a scratch
// directory. This process and its children use it as long as it lives.
class PrivatePipeWire {
 public:
  // The tools that it needs and that are not installed; empty when it can run.
  static std::string missingTools();

  PrivatePipeWire();
  ~PrivatePipeWire();
  PrivatePipeWire(const PrivatePipeWire&) = delete;
  PrivatePipeWire& operator=(const PrivatePipeWire&) = delete;

  [[nodiscard]] bool isReady() const { return ready_; }
  // Stops and starts the servers; true when streams can run again.
  [[nodiscard]] bool restart() const;
  // A file with that many seconds of a tone.
  [[nodiscard]] std::string makeTone(double seconds) const;
  [[nodiscard]] const std::filesystem::path& directory() const { return directory_; }

 private:
  void enterEnvironment() const;

  std::filesystem::path directory_;
  std::unique_ptr<ChildProcess> server_;
  bool ready_ = false;
};

}  // namespace halvox::pipewire_reporter
