#include "platform/linux/base/ChildProcess.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;

// The descriptors of this process that become the child's descriptors (the sources). Setting up a
// descriptor of the child replaces the source that has the same number. Such a source is therefore
// copied to another number first.
class DescriptorSources {
 public:
  explicit DescriptorSources(const std::vector<ChildProgram::Descriptor>& descriptors) {
    for (const auto& descriptor : descriptors) largest_ = std::max(largest_, descriptor.number);
    for (const auto& [number, ours] : descriptors) sources_.push_back({number, sourceOf(ours)});
  }
  // 0, or the errno if a source could not be copied.
  [[nodiscard]] int error() const { return error_; }
  // The largest number of a descriptor in the child; -1 if there is none.
  [[nodiscard]] int largest() const { return largest_; }
  [[nodiscard]] const std::vector<ChildProgram::Descriptor>& get() const { return sources_; }

 private:
  int sourceOf(int ours) {
    // The copy gets a number above all numbers that the child uses. Setting up the child's
    // descriptors then cannot replace the copy.
    if (ours == ChildProgram::Descriptor::kNull || ours > largest_) return ours;
    UniqueFd& copy = copies_.emplace_back(::fcntl(ours, F_DUPFD_CLOEXEC, largest_ + 1));
    if (!copy) error_ = errno;
    return copy.get();
  }

  int largest_ = -1;
  int error_ = 0;
  std::vector<UniqueFd> copies_;
  std::vector<ChildProgram::Descriptor> sources_;
};

class SpawnActions {
 public:
  SpawnActions(const ChildProgram& program, const DescriptorSources& sources) {
    ::posix_spawn_file_actions_init(&actions_);
    for (const auto& [number, ours] : sources.get()) {
      if (ours == ChildProgram::Descriptor::kNull) {
        ::posix_spawn_file_actions_addopen(&actions_, number, "/dev/null", O_RDWR, 0);
      } else {
        ::posix_spawn_file_actions_adddup2(&actions_, ours, number);
      }
    }
    if (program.otherDescriptors == ChildProgram::OtherDescriptors::kClosed) {
      // This action comes last, because it also closes the sources of the child's descriptors.
      ::posix_spawn_file_actions_addclosefrom_np(&actions_, sources.largest() + 1);
    }
  }
  ~SpawnActions() { ::posix_spawn_file_actions_destroy(&actions_); }
  SpawnActions(const SpawnActions&) = delete;
  SpawnActions& operator=(const SpawnActions&) = delete;
  [[nodiscard]] const posix_spawn_file_actions_t* get() const { return &actions_; }

 private:
  posix_spawn_file_actions_t actions_{};
};

class SpawnAttributes {
 public:
  explicit SpawnAttributes(const ChildProgram& program) {
    ::posix_spawnattr_init(&attributes_);
    int flags = 0;
    if (program.signals == ChildProgram::Signals::kReset) {
      sigset_t signals;
      ::sigemptyset(&signals);
      for (const int signal : program.blockedSignals) ::sigaddset(&signals, signal);
      ::posix_spawnattr_setsigmask(&attributes_, &signals);
      // Without this, the child would also ignore the signals that this process ignores.
      ::sigfillset(&signals);
      ::posix_spawnattr_setsigdefault(&attributes_, &signals);
      flags |= POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF;
    }
    switch (program.group) {
      case ChildProgram::Group::kOurs:
        break;
      case ChildProgram::Group::kOwnGroup:
        ::posix_spawnattr_setpgroup(&attributes_, 0);
        flags |= POSIX_SPAWN_SETPGROUP;
        break;
      case ChildProgram::Group::kOwnSession:
        flags |= POSIX_SPAWN_SETSID;
        break;
    }
    ::posix_spawnattr_setflags(&attributes_, static_cast<short>(flags));
  }
  ~SpawnAttributes() { ::posix_spawnattr_destroy(&attributes_); }
  SpawnAttributes(const SpawnAttributes&) = delete;
  SpawnAttributes& operator=(const SpawnAttributes&) = delete;
  [[nodiscard]] const posix_spawnattr_t* get() const { return &attributes_; }

 private:
  posix_spawnattr_t attributes_{};
};

// Returns the null-terminated array of pointers into `texts` that posix_spawn() takes.
// posix_spawn() does not change the texts.
std::vector<char*> pointersTo(const std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (const std::string& text : texts) pointers.push_back(const_cast<char*>(text.c_str()));
  pointers.push_back(nullptr);
  return pointers;
}

UniqueFd openProcess(pid_t pid) {
  // Use the number of the system call: <sys/pidfd.h> of Debian 12's C library declares the function
  // pidfd_open() without C linkage for C++.
  return UniqueFd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
}

// A time-out for poll(): rounded up, and at most a day, because poll() takes an int.
int millisecondsUntil(ChildProcess::Clock::time_point deadline) {
  const auto now = ChildProcess::Clock::now();
  if (deadline <= now) return 0;
  constexpr milliseconds kLongest = std::chrono::hours(24);
  if (deadline - now >= kLongest) return static_cast<int>(kLongest.count());
  return static_cast<int>(std::chrono::ceil<milliseconds>(deadline - now).count());
}

}  // namespace

std::string ChildEnd::text() const {
  if (signal != 0) return "killed by signal " + std::to_string(signal);
  return "ended with status " + std::to_string(status);
}

Result<ChildProcess, int> ChildProcess::start(const ChildProgram& program) {
  const auto failure = [&](int error) {
    return Failure<int>{
        .code = error,
        .message = "cannot start " + program.command.front() + ": " + errnoText(error)};
  };
  const DescriptorSources sources(program.descriptors);
  if (sources.error() != 0) return failure(sources.error());
  const SpawnActions actions(program, sources);
  const SpawnAttributes attributes(program);
  const std::vector<char*> arguments = pointersTo(program.command);
  const std::vector<char*> variables =
      program.environment ? pointersTo(*program.environment) : std::vector<char*>();
  pid_t pid = 0;
  // Use posix_spawn() instead of fork(), because a program with threads may call hardly any
  // function between fork() and exec().
  const int error =
      ::posix_spawnp(&pid, arguments.front(), actions.get(), attributes.get(), arguments.data(),
                     program.environment ? variables.data() : environ);
  if (error != 0) return failure(error);
  return ChildProcess(pid, program.group);
}

ChildProcess::ChildProcess(pid_t pid, ChildProgram::Group group)
    : pid_(pid), group_(group), descriptor_(openProcess(pid)) {}

ChildProcess::ChildProcess(ChildProcess&& other) noexcept
    : pid_(std::exchange(other.pid_, 0)),
      group_(other.group_),
      descriptor_(std::move(other.descriptor_)),
      end_(other.end_) {}

ChildProcess& ChildProcess::operator=(ChildProcess&& other) noexcept {
  if (this == &other) return *this;
  kill();
  pid_ = std::exchange(other.pid_, 0);
  group_ = other.group_;
  descriptor_ = std::move(other.descriptor_);
  end_ = other.end_;
  return *this;
}

void ChildProcess::signal(int number) const {
  // Signal only a child that has not been reaped, because afterwards another process may have its
  // ID.
  if (pid_ != 0) ::kill(pid_, number);
}

void ChildProcess::signalGroup(int number) const {
  // If the child is in our group, signal only the child, because the group includes this process.
  if (pid_ != 0) ::kill(group_ == ChildProgram::Group::kOurs ? pid_ : -pid_, number);
}

bool ChildProcess::reap(int options) {
  if (pid_ == 0) return true;
  int status = 0;
  pid_t reaped = 0;
  do {
    reaped = ::waitpid(pid_, &status, options);
  } while (reaped < 0 && errno == EINTR);
  if (reaped == 0) return false;
  // waitpid() fails only if other code has waited for the child. How the child ended is then
  // unknown.
  if (reaped == pid_) {
    end_ = WIFSIGNALED(status) ? ChildEnd{.status = -1, .signal = WTERMSIG(status)}
                               : ChildEnd{.status = WEXITSTATUS(status), .signal = 0};
  }
  pid_ = 0;
  descriptor_.reset();
  return true;
}

std::optional<ChildEnd> ChildProcess::waitUntil(Clock::time_point deadline) {
  constexpr int kLookEvery = 10;  // milliseconds between checks if the child has no pidfd
  while (!reap(WNOHANG)) {
    const int left = millisecondsUntil(deadline);
    if (left == 0) return std::nullopt;
    // A pidfd becomes readable when its process ends. Without one, poll() ignores the negative
    // number and serves as a pause.
    pollfd polled{.fd = descriptor_.get(), .events = POLLIN, .revents = 0};
    ::poll(&polled, 1, descriptor_ ? left : std::min(left, kLookEvery));
  }
  return end_;
}

ChildEnd ChildProcess::wait() {
  static_cast<void>(reap(0));
  return end_;
}

ChildEnd ChildProcess::kill() {
  signalGroup(SIGKILL);
  return wait();
}

pid_t ChildProcess::detach() {
  descriptor_.reset();
  return std::exchange(pid_, 0);
}

Result<Pipe, int> makePipe() {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
    const int error = errno;
    return Failure<int>{.code = error, .message = "cannot create a pipe: " + errnoText(error)};
  }
  return Pipe{.reader = UniqueFd(ends[0]), .writer = UniqueFd(ends[1])};
}

std::vector<std::string> environmentWith(const std::vector<std::string>& changes) {
  const auto nameOf = [](std::string_view variable) {
    return variable.substr(0, variable.find('='));
  };
  std::vector<std::string> environment = changes;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    const auto isSame = [&](const std::string& change) {
      return nameOf(change) == nameOf(*variable);
    };
    if (std::ranges::none_of(changes, isSame)) environment.emplace_back(*variable);
  }
  return environment;
}

}  // namespace halvox::platform::linux_
