// halvox-tracer-keeper NOTE SESSIONS [PID STARTTIME]
//
// Keeps a session daemon of LTTng for as long as standard input stays open, that is as long as the
// service lives that started the keeper. The daemon is the one of the process that is named, else
// one that the keeper starts. It is named in the file NOTE and, in the same form, on standard
// output; or there is one line on standard output that says why there is none, and exit status 1.
//
// At the end of input, whatever brought it about, the sessions whose names start with SESSIONS are
// destroyed. The daemon is then ended, unless sessions of others are in it.

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

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/tracing/lttng/DaemonProcess.h"
#include "platform/linux/tracing/lttng/TracerSessions.h"

namespace {

using namespace halvox::platform::linux_;

constexpr unsigned kSecondsToAnswer = 10;
constexpr std::chrono::seconds kEndsWithin{5};  // of a signal; then it is killed

volatile std::sig_atomic_t silentDaemon = 0;  // while it is asked

// The library waits for a daemon without end. One that hangs serves nobody, so it is killed, which
// ends the wait too, unless it is another daemon that was asked.
void onSilence(int /*signal*/) {
  const pid_t daemon = silentDaemon;
  if (daemon == 0) ::_exit(EXIT_FAILURE);
  silentDaemon = 0;
  ::kill(daemon, SIGKILL);
  ::alarm(kSecondsToAnswer);
}

void say(const std::string& line) {
  const std::string text = line + "\n";
  // A service that is gone already needs no answer; what follows then is its end.
  if (::write(STDOUT_FILENO, text.data(), text.size()) < 0) return;
}

void awaitEndOfService() {
  char byte = 0;
  while (true) {
    const ssize_t count = ::read(STDIN_FILENO, &byte, 1);
    if (count == 0 || (count < 0 && errno != EINTR)) return;
  }
}

std::optional<DaemonProcess> startDaemon(std::string& failure) {
  pid_t pid = 0;
  if (const int error = startApart({.command = {"lttng-sessiond", "--no-kernel"}}, pid)) {
    failure = "cannot start lttng-sessiond: " + errnoText(error);
    return std::nullopt;
  }
  return DaemonProcess::withNumber(pid);
}

// Whether the daemon has sessions that are not the service's. Leaves none that are.
bool isUsedByOthers(const DaemonProcess& daemon, std::string_view ownSessions) {
  silentDaemon = daemon.pid;
  std::signal(SIGALRM, onSilence);
  ::alarm(kSecondsToAnswer);
  destroyTracerSessions(ownSessions);
  const std::vector<std::string> left = tracerSessionNames();
  ::alarm(0);
  // A session that is being destroyed may still be listed.
  return std::ranges::any_of(
      left, [&](const std::string& name) { return !name.starts_with(ownSessions); });
}

int keep(const std::filesystem::path& noteFile, std::string_view ownSessions,
         std::optional<DaemonProcess> daemon) {
  // The lock is the keeper's: the daemon and what it starts do not get the descriptor.
  const UniqueFd note(::open(noteFile.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
  if (!note || ::flock(note.get(), LOCK_EX) != 0) {
    say("cannot lock " + noteFile.string() + ": " + errnoText(errno));
    return EXIT_FAILURE;
  }
  std::string failure;
  if (!daemon) daemon = startDaemon(failure);
  std::error_code ignored;
  if (!daemon) {
    std::filesystem::remove(noteFile, ignored);
    say(failure);
    return EXIT_FAILURE;
  }
  // A note that cannot be written is missed only by a service that starts after a keeper was
  // killed.
  static_cast<void>(daemon->write(noteFile));
  say(std::to_string(daemon->pid) + " " + daemon->startTime);
  awaitEndOfService();
  if (daemon->isAlive() && isUsedByOthers(*daemon, ownSessions)) return EXIT_SUCCESS;
  daemon->end(kEndsWithin);
  std::filesystem::remove(noteFile, ignored);
  return EXIT_SUCCESS;
}

}  // namespace

int main(int count, char** arguments) {
  const std::vector<std::string> words(arguments, arguments + count);
  if ((words.size() != 3 && words.size() != 5) || words[2].empty()) return EXIT_FAILURE;
  // Nobody waits for the daemon when it ends, so it must leave without that.
  std::signal(SIGCHLD, SIG_IGN);
  std::signal(SIGPIPE, SIG_IGN);
  std::optional<DaemonProcess> daemon;
  if (words.size() == 5) {
    daemon = DaemonProcess{.pid = 0, .startTime = words[4]};
    const std::string& number = words[3];
    std::from_chars(number.data(), number.data() + number.size(), daemon->pid);
    if (daemon->pid <= 1) return EXIT_FAILURE;
  }
  return keep(words[1], words[2], std::move(daemon));
}
