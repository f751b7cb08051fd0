#pragma once

#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A program that a test runs. The destructor kills it if it has not ended.
class TestProcess {
 public:
  struct Options {
    std::vector<std::string> environment{};  // added to the test's own, NAME=value
    int passedFd = -1;                       // what the child gets as descriptor 3
  };

  // Throws if the program cannot be started. firstLine() reads the program's standard output.
  TestProcess(const std::vector<std::string>& command, const Options& options);
  explicit TestProcess(const std::vector<std::string>& command) : TestProcess(command, Options()) {}
  TestProcess(const TestProcess&) = delete;
  TestProcess& operator=(const TestProcess&) = delete;
  ~TestProcess() = default;

  [[nodiscard]] pid_t pid() const { return child_->pid(); }
  void signal(int number) const { child_->signal(number); }
  // Returns the first line that the child prints.
  std::string firstLine();
  // Waits for the end of the program and returns its exit status; std::nullopt if a signal ended
  // the program or it does not end in time.
  std::optional<int> waitForExit();
  // Returns the number in a line of /proc/<pid>/status.
  [[nodiscard]] long statusNumber(const std::string& name) const;
  // Returns the processor time that the program has used, in seconds.
  [[nodiscard]] double processorSeconds() const;

 private:
  UniqueFd output_;
  std::optional<ChildProcess> child_;  // never empty
};

}  // namespace halvox::platform::linux_
