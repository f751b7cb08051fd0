#include "platform/linux/diagnostics/Child.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string_view>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::array kPassedVariables{
    "PATH", "HOME", "LANG", "XDG_RUNTIME_DIR", "PIPEWIRE_REMOTE", "PIPEWIRE_RUNTIME_DIR"};

class SpawnActions {
 public:
  SpawnActions() { ::posix_spawn_file_actions_init(&actions_); }
  ~SpawnActions() { ::posix_spawn_file_actions_destroy(&actions_); }
  SpawnActions(const SpawnActions&) = delete;
  SpawnActions& operator=(const SpawnActions&) = delete;
  [[nodiscard]] posix_spawn_file_actions_t* get() { return &actions_; }

 private:
  posix_spawn_file_actions_t actions_{};
};

class SpawnAttributes {
 public:
  SpawnAttributes() {
    ::posix_spawnattr_init(&attributes_);
    // The service's threads block all signals, and the service ignores some. A program that
    // inherits this may not end when it should. The process group of its own lets one kill() reach
    // everything that the program started.
    sigset_t signals;
    ::sigemptyset(&signals);
    ::posix_spawnattr_setsigmask(&attributes_, &signals);
    ::sigfillset(&signals);
    ::posix_spawnattr_setsigdefault(&attributes_, &signals);
    ::posix_spawnattr_setpgroup(&attributes_, 0);
    ::posix_spawnattr_setflags(
        &attributes_, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP);
  }
  ~SpawnAttributes() { ::posix_spawnattr_destroy(&attributes_); }
  SpawnAttributes(const SpawnAttributes&) = delete;
  SpawnAttributes& operator=(const SpawnAttributes&) = delete;
  [[nodiscard]] posix_spawnattr_t* get() { return &attributes_; }

 private:
  posix_spawnattr_t attributes_{};
};

// Owns texts and their null-terminated array of pointers, as posix_spawn() takes them.
class TextVector {
 public:
  explicit TextVector(std::vector<std::string> texts) : texts_(std::move(texts)) {
    for (std::string& text : texts_) pointers_.push_back(text.data());
    pointers_.push_back(nullptr);
  }
  [[nodiscard]] char** get() { return pointers_.data(); }

 private:
  std::vector<std::string> texts_;
  std::vector<char*> pointers_;
};

TextVector passedEnvironment() {
  std::vector<std::string> texts;
  for (const char* name : kPassedVariables) {
    if (const char* value = std::getenv(name)) texts.push_back(std::string(name) + "=" + value);
  }
  return TextVector(std::move(texts));
}

// Returns 0 or an errno.
int spawn(const std::vector<std::string>& command, int output, pid_t& pid) {
  SpawnActions actions;
  SpawnAttributes attributes;
  ::posix_spawn_file_actions_addopen(actions.get(), STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  ::posix_spawn_file_actions_adddup2(actions.get(), output, STDOUT_FILENO);
  ::posix_spawn_file_actions_addopen(actions.get(), STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  ::posix_spawn_file_actions_addclosefrom_np(actions.get(), STDERR_FILENO + 1);
  TextVector arguments(command);
  TextVector environment = passedEnvironment();
  return ::posix_spawnp(&pid, command.front().c_str(), actions.get(), attributes.get(),
                        arguments.get(), environment.get());
}

enum class ReadEnd : std::uint8_t { kAllRead, kTooMuch, kTimeOver };

ReadEnd readOutput(int descriptor, std::size_t most, const Deadline& deadline,
                   std::string& output) {
  std::array<char, 16'384> buffer;
  for (;;) {
    std::array<pollfd, 2> polled{
        {{descriptor, POLLIN, 0}, {deadline.stop().descriptor(), POLLIN, 0}}};
    const int ready = ::poll(polled.data(), polled.size(), deadline.millisecondsLeft());
    if (ready < 0 && errno == EINTR) continue;
    if (ready <= 0 || polled[1].revents != 0) return ReadEnd::kTimeOver;
    const ssize_t count = ::read(descriptor, buffer.data(), buffer.size());
    if (count < 0 && (errno == EINTR || errno == EAGAIN)) continue;
    if (count <= 0) return ReadEnd::kAllRead;
    output.append(buffer.data(), static_cast<std::size_t>(count));
    if (output.size() > most) {
      output.resize(most);
      return ReadEnd::kTooMuch;
    }
    // poll() never times out while a program prints without a pause, so test the time here too.
    if (deadline.hasPassed()) return ReadEnd::kTimeOver;
  }
}

// Waits for the end of a program that has closed its output. Returns false at the deadline.
bool awaitEnd(pid_t pid, const Deadline& deadline, int& status) {
  // The number instead of the function: <sys/pidfd.h> of Debian 12's C library declares it without
  // C linkage for C++.
  const UniqueFd process(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  std::array<pollfd, 2> polled{
      {{process.get(), POLLIN, 0}, {deadline.stop().descriptor(), POLLIN, 0}}};
  int ready = 0;
  do {
    ready = ::poll(polled.data(), polled.size(), deadline.millisecondsLeft());
  } while (ready < 0 && errno == EINTR);
  return ::waitpid(pid, &status, WNOHANG) == pid;
}

void killAndReap(pid_t pid) {
  ::kill(-pid, SIGKILL);
  while (::waitpid(pid, nullptr, 0) < 0 && errno == EINTR) {
  }
}

std::string endText(int status) {
  if (WIFSIGNALED(status)) return "killed by signal " + std::to_string(WTERMSIG(status));
  return "ended with status " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

Finding runProgram(const std::vector<std::string>& command, std::size_t most,
                   const Deadline& deadline) {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) return Finding::failed(errnoText(errno));
  const UniqueFd reader(ends[0]);
  UniqueFd writer(ends[1]);
  pid_t pid = 0;
  if (const int error = spawn(command, writer.get(), pid); error != 0) {
    return Finding::failed(error == ENOENT ? command.front() + " is not installed"
                                           : errnoText(error));
  }
  writer.reset();
  Finding finding;
  const ReadEnd end = readOutput(reader.get(), most, deadline, finding.bytes);
  int status = 0;
  if (end == ReadEnd::kAllRead && awaitEnd(pid, deadline, status)) {
    if (status == 0) return finding;
    return Finding::failed(command.front() + ": " + endText(status));
  }
  killAndReap(pid);
  if (end == ReadEnd::kTooMuch) {
    finding.isCut = true;
    return finding;
  }
  return Finding::failed(command.front() + ": did not end in time and was killed");
}

}  // namespace halvox::platform::linux_
