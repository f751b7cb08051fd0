#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A program to start as a child process, without a shell.
struct ChildProgram {
  // The child's descriptor `number` is a copy of this process's `ours`, or /dev/null.
  struct Descriptor {
    static constexpr int kNull = -1;
    int number;
    int ours = kNull;
  };
  // Which descriptors the child has in addition to those in `descriptors`.
  enum class OtherDescriptors : std::uint8_t {
    kWithoutCloseOnExec,  // those without the close-on-exec flag, including the standard streams
    kClosed               // none above the largest number in `descriptors`
  };
  // The process group and session of the child. With a group of its own, one signal reaches all
  // processes that it starts. With a session of its own, it also gets no signals of our terminal.
  enum class Group : std::uint8_t { kOurs, kOwnGroup, kOwnSession };
  // Threads of this program block all signals, and the program ignores some. A child that inherits
  // this may not end when it should. Use kInherited only to pass on the settings with which this
  // program was started, such as those of nohup.
  enum class Signals : std::uint8_t { kReset, kInherited };

  std::vector<std::string> command;  // the program is searched for in PATH unless it has a slash
  std::optional<std::vector<std::string>> environment{};  // NAME=value; ours if there is none
  std::vector<Descriptor> descriptors{};                  // in any order, and of any numbers
  OtherDescriptors otherDescriptors = OtherDescriptors::kWithoutCloseOnExec;
  Group group = Group::kOurs;
  Signals signals = Signals::kReset;
  std::vector<int> blockedSignals{};  // with kReset: blocked when the child starts
};

// How a child process ended.
struct ChildEnd {
  int status = -1;  // the exit status; -1 if a signal ended the child
  int signal = 0;   // the signal that ended the child; 0 if it exited

  [[nodiscard]] bool isSuccess() const { return status == 0; }
  // "ended with status 3" or "killed by signal 15"
  [[nodiscard]] std::string text() const;
};

// A running child process, which this object ends and reaps:
//
//   start() --> running --waitUntil(), wait(), kill()--> ended
//
// The destructor kills a running child. This object sends no signal to a child that was reaped,
// because another process may then have its process ID. Movable; one thread at a time may use it.
class ChildProcess {
 public:
  using Clock = std::chrono::steady_clock;

  // The code is an errno, ENOENT if there is no such program; the message is
  // "cannot start PROGRAM: " with the errno's text.
  [[nodiscard]] static Result<ChildProcess, int> start(const ChildProgram& program);

  ChildProcess(ChildProcess&& other) noexcept;
  ChildProcess& operator=(ChildProcess&& other) noexcept;
  ~ChildProcess() { kill(); }

  // 0 after the child was reaped or detached.
  [[nodiscard]] pid_t pid() const { return pid_; }
  // Readable (poll) when the child has ended. A caller can wait for it together with other
  // descriptors. Owned by this object; -1 if the process had no free descriptor.
  [[nodiscard]] int descriptor() const { return descriptor_.get(); }

  // signal() sends a signal to the child. signalGroup() sends it to all processes of the child's
  // group if the child has a group of its own, and otherwise only to the child. Both do nothing
  // after a function of this class has returned how the child ended.
  void signal(int number) const;
  void signalGroup(int number) const;

  // Waits until the child ends, at most until `deadline`, without a busy loop. Returns std::nullopt
  // if the child is still running at the deadline.
  [[nodiscard]] std::optional<ChildEnd> waitUntil(Clock::time_point deadline);
  // Returns std::nullopt if the child is running.
  [[nodiscard]] std::optional<ChildEnd> poll() { return waitUntil(Clock::time_point::min()); }
  // Waits until the child ends.
  ChildEnd wait();
  // Sends SIGKILL to the child, and to its group if it has one of its own, and waits until the
  // child has ended. Sends no signal after the end. Returns how the child ended.
  ChildEnd kill();

  // Gives up the child, which keeps running. Returns its process ID; the caller may wait for it.
  [[nodiscard]] pid_t detach();

 private:
  ChildProcess(pid_t pid, ChildProgram::Group group);
  [[nodiscard]] bool reap(int options);

  pid_t pid_ = 0;
  ChildProgram::Group group_ = ChildProgram::Group::kOurs;
  UniqueFd descriptor_;
  ChildEnd end_;
};

// Both ends of a pipe, closed on exec. The code is an errno.
struct Pipe {
  UniqueFd reader;
  UniqueFd writer;
};
[[nodiscard]] Result<Pipe, int> makePipe();

// Returns a copy of our own environment, as NAME=value, in which `changes` replace the variables of
// the same names.
[[nodiscard]] std::vector<std::string> environmentWith(const std::vector<std::string>& changes);

}  // namespace halvox::platform::linux_
