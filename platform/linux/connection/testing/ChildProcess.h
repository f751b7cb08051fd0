#pragma once

#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A process of the test's own, killed at the latest when this goes.
class ChildProcess {
 public:
  struct Options {
    std::vector<std::string> environment{};  // beside the test's own, NAME=value
    int passedFd = -1;                       // what the child gets as descriptor 3
  };

  // Throws when the program cannot be started. Its standard output can be read by firstLine().
  ChildProcess(const std::vector<std::string>& command, const Options& options);
  explicit ChildProcess(const std::vector<std::string>& command)
      : ChildProcess(command, Options()) {}
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;
  ~ChildProcess();

  [[nodiscard]] pid_t pid() const { return pid_; }
  void signal(int number) const;
  // What the child prints first, up to the end of the line.
  std::string firstLine();
  // Its exit status, once it has ended; none when a signal ended it or it does not end in time.
  std::optional<int> waitForExit();
  // A number from a line of /proc/<pid>/status.
  [[nodiscard]] long statusNumber(const std::string& name) const;
  // The processor time that it has used, in seconds.
  [[nodiscard]] double processorSeconds() const;

 private:
  pid_t pid_ = -1;
  bool ended_ = false;
  int status_ = 0;
  UniqueFd output_;
};

}  // namespace halvox::platform::linux_
