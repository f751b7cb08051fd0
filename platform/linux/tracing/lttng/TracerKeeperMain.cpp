// halvox-tracer-keeper NOTE SESSIONS [PID STARTTIME]
//
// Keeps a session daemon of LTTng as long as standard input stays open, which is as long as the
// service that started the keeper lives. If PID and STARTTIME name a process, that is the daemon;
// otherwise the keeper starts one.
//
// It records the daemon in the file NOTE and prints the same line on standard output. If there is
// no daemon, it prints a line with the reason and exits with status 1.
//
// At the end of input it destroys the sessions whose names begin with SESSIONS. Then it ends the
// daemon, unless others have sessions in it.

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/tracing/lttng/DaemonProcess.h"
#include "platform/linux/tracing/lttng/TracerSessions.h"

namespace {

using namespace halvox::platform::linux_;

constexpr unsigned kSecondsToAnswer = 10;
constexpr std::chrono::seconds kEndsWithin{5};  // after SIGTERM; then it is killed

volatile std::sig_atomic_t silentDaemon = 0;  // the daemon whose answer is awaited; 0: none

// The library waits for a daemon without limit. A daemon that hangs is of no use to other programs
// either. It is killed, which also ends the wait. If the library then still waits, it waits for
// another daemon, and the second alarm ends the keeper.
void onSilence(int /*signal*/) {
  const pid_t daemon = silentDaemon;
  if (daemon == 0) ::_exit(EXIT_FAILURE);
  silentDaemon = 0;
  ::kill(daemon, SIGKILL);
  ::alarm(kSecondsToAnswer);
}

void say(const std::string& line) {
  const std::string text = line + "\n";
  // A service that has ended needs no answer. The keeper continues and cleans up after it.
  if (::write(STDOUT_FILENO, text.data(), text.size()) < 0) return;
}

void awaitEndOfService() {
  char byte = 0;
  while (true) {
    const ssize_t count = ::read(STDIN_FILENO, &byte, 1);
    if (count == 0 || (count < 0 && errno != EINTR)) return;
  }
}

Result<DaemonProcess> startDaemon() {
  // Runs in a session of its own, like the keeper, because Ctrl-C in a terminal must not end the
  // daemon before its traces are read.
  auto started = ChildProcess::start({.command = {"lttng-sessiond", "--no-kernel"},
                                      .descriptors = {{.number = STDIN_FILENO},
                                                      {.number = STDOUT_FILENO},
                                                      {.number = STDERR_FILENO}},
                                      .group = ChildProgram::Group::kOwnSession});
  if (!started) return Failure<>{started.error().message};
  return DaemonProcess::withNumber(started->detach());
}

// Destroys the service's sessions. Returns whether the daemon has sessions of others.
bool isUsedByOthers(const DaemonProcess& daemon, std::string_view ownSessions) {
  silentDaemon = daemon.pid;
  std::signal(SIGALRM, onSilence);
  ::alarm(kSecondsToAnswer);
  destroyTracerSessions(ownSessions);
  const std::vector<std::string> left = tracerSessionNames();
  ::alarm(0);
  // One of our sessions that is being destroyed may still be listed.
  return std::ranges::any_of(
      left, [&](const std::string& name) { return !name.starts_with(ownSessions); });
}

int keep(const std::filesystem::path& noteFile, std::string_view ownSessions,
         const std::optional<DaemonProcess>& named) {
  // Only the keeper holds the lock, because the daemon does not inherit the descriptor.
  const UniqueFd note(::open(noteFile.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
  if (!note || ::flock(note.get(), LOCK_EX) != 0) {
    say("cannot lock " + noteFile.string() + ": " + errnoText(errno));
    return EXIT_FAILURE;
  }
  std::error_code ignored;
  const Result<DaemonProcess> daemon = named ? *named : startDaemon();
  if (!daemon) {
    std::filesystem::remove(noteFile, ignored);
    say(daemon.error().message);
    return EXIT_FAILURE;
  }
  // Errors are ignored, because the note is needed only by a service that starts after this keeper
  // was killed.
  static_cast<void>(daemon->write(noteFile));
  // Answer only after the note is written. If the service is then killed, the next one still finds
  // the daemon.
  say(std::to_string(daemon->pid) + " " + daemon->startTime);
  awaitEndOfService();
  // Keep the note, through which the next service finds the daemon and gives it a keeper.
  if (daemon->isAlive() && isUsedByOthers(*daemon, ownSessions)) return EXIT_SUCCESS;
  daemon->end(kEndsWithin);
  std::filesystem::remove(noteFile, ignored);
  return EXIT_SUCCESS;
}

}  // namespace

int main(int count, char** arguments) {
  const std::vector<std::string> words(arguments, arguments + count);
  if ((words.size() != 3 && words.size() != 5) || words[2].empty()) return EXIT_FAILURE;
  // The keeper never calls wait() for the daemon. With SIGCHLD ignored, the kernel removes the
  // daemon when it ends.
  std::signal(SIGCHLD, SIG_IGN);
  std::signal(SIGPIPE, SIG_IGN);
  std::optional<DaemonProcess> daemon;
  if (words.size() == 5) {
    daemon = DaemonProcess{.pid = 0, .startTime = words[4]};
    const std::string& number = words[3];
    std::from_chars(number.data(), number.data() + number.size(), daemon->pid);
    // kill() takes 0 and -1 for whole groups of processes, and 1 is init.
    if (daemon->pid <= 1) return EXIT_FAILURE;
  }
  return keep(words[1], words[2], daemon);
}
