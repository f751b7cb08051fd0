#include "platform/linux/tracing/lttng/SessionDaemon.h"

#include <array>
#include <chrono>
#include <csignal>
#include <cstring>
#include <fstream>
#include <iterator>
#include <system_error>
#include <thread>

#include <fcntl.h>
#include <lttng/lttng.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

constexpr std::chrono::milliseconds kLookEvery{10};  // at a process that tells nobody

// 0 and the process, or the system's error.
int spawnDaemon(pid_t& pid) {
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  for (const int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    ::posix_spawn_file_actions_addopen(&actions, descriptor, "/dev/null", O_RDWR, 0);
  }
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  // Our threads block all signals and the service ignores some; the daemon expects neither. A
  // session of its own, so that a terminal does not end it before the traces are read.
  sigset_t signals;
  ::sigemptyset(&signals);
  ::posix_spawnattr_setsigmask(&attributes, &signals);
  ::sigfillset(&signals);
  ::posix_spawnattr_setsigdefault(&attributes, &signals);
  constexpr int kFlags = POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSID;
  ::posix_spawnattr_setflags(&attributes, kFlags);
  std::string name = "lttng-sessiond";
  std::string noKernel = "--no-kernel";
  std::array<char*, 3> arguments{name.data(), noKernel.data(), nullptr};
  const int error =
      ::posix_spawnp(&pid, name.c_str(), &actions, &attributes, arguments.data(), environ);
  ::posix_spawnattr_destroy(&attributes);
  ::posix_spawn_file_actions_destroy(&actions);
  return error;
}

}  // namespace

std::string SessionDaemon::startTimeOf(pid_t pid) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
  std::string text((std::istreambuf_iterator<char>(file)), {});
  // The name, which may hold anything, ends at the last bracket; the start time is the 22nd field.
  const std::size_t name = text.rfind(')');
  if (name == std::string::npos) return {};
  constexpr int kFieldsBetween = 20;
  std::size_t at = name;
  for (int field = 0; field < kFieldsBetween && at != std::string::npos; ++field) {
    at = text.find(' ', at + 1);
  }
  if (at == std::string::npos || text.compare(name, 3, ") Z") == 0) return {};
  return text.substr(at + 1, text.find(' ', at + 1) - at - 1);
}

bool SessionDaemon::isAlive() const {
  if (process_->isChild) {
    int status = 0;
    if (::waitpid(process_->pid, &status, WNOHANG) != 0) return false;
  }
  return startTimeOf(process_->pid) == process_->startTime;
}

bool SessionDaemon::isNoted() const {
  std::error_code ignored;
  return std::filesystem::exists(noteFile_, ignored);
}

void SessionDaemon::adopt() {
  Process process;
  std::ifstream file(noteFile_);
  if (file >> process.pid >> process.startTime && process.pid > 1) {
    process_ = std::move(process);
    if (isAlive()) return;
    process_.reset();
  }
  std::error_code ignored;
  std::filesystem::remove(noteFile_, ignored);
}

void SessionDaemon::note() const {
  std::ofstream(noteFile_) << process_->pid << ' ' << process_->startTime << '\n';
}

std::optional<std::string> SessionDaemon::start() {
  end();
  Process process{.pid = 0, .startTime = {}, .isChild = true};
  if (const int error = spawnDaemon(process.pid)) {
    return std::string("cannot start lttng-sessiond: ") + std::generic_category().message(error);
  }
  process.startTime = startTimeOf(process.pid);
  process_ = std::move(process);
  note();
  const auto deadline = std::chrono::steady_clock::now() + limits_.answersWithin;
  while (::lttng_session_daemon_alive() != 1) {
    const bool isGone = !isAlive();
    if (isGone || std::chrono::steady_clock::now() > deadline) {
      end();
      return isGone ? "lttng-sessiond ended at once" : "lttng-sessiond does not answer";
    }
    std::this_thread::sleep_for(kLookEvery);
  }
  return std::nullopt;
}

bool SessionDaemon::isGoneSoon() const {
  const auto deadline = std::chrono::steady_clock::now() + limits_.endsWithin;
  while (isAlive()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(kLookEvery);
  }
  return true;
}

void SessionDaemon::end() {
  if (!process_.has_value()) return;
  for (const int signal : {SIGTERM, SIGKILL}) {
    if (isAlive()) ::kill(process_->pid, signal);
    if (isGoneSoon()) break;
  }
  process_.reset();
  std::error_code ignored;
  std::filesystem::remove(noteFile_, ignored);
}

}  // namespace halvox::platform::linux_
