#include "platform/linux/tracing/lttng/TracerKeeper.h"

#include <cerrno>
#include <charconv>
#include <csignal>
#include <string_view>
#include <system_error>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds kAnswersWithin{10'000};
constexpr milliseconds kLookEvery{10};  // flock() has no time-out

// A build that is not installed has the keeper in the directory of the service's program.
std::string keeperPath() {
  const std::filesystem::path installed(HALVOX_TRACER_KEEPER);
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  const auto beside = program.parent_path() / installed.filename();
  return !error && std::filesystem::exists(beside, error) ? beside : installed;
}

// Reads one line, without its end. Empty if it does not arrive in time or the writer has closed the
// pipe. Reads byte by byte, because the line is short, and nothing after it may be consumed.
std::string readLine(int descriptor, milliseconds within) {
  const auto deadline = steady_clock::now() + within;
  std::string line;
  while (true) {
    const auto left =
        std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now()).count();
    pollfd readable{.fd = descriptor, .events = POLLIN, .revents = 0};
    const int ready = left > 0 ? ::poll(&readable, 1, static_cast<int>(left)) : 0;
    if (ready < 0 && errno == EINTR) continue;
    if (ready <= 0) return {};
    char byte = 0;
    const ssize_t count = ::read(descriptor, &byte, 1);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return {};
    if (byte == '\n') return line;
    line += byte;
  }
}

}  // namespace

Result<DaemonProcess> TracerKeeper::launch(const Ward& ward, DaemonProcess daemon) {
  release();
  const std::string path = keeperPath();
  const std::string failed = "cannot start " + path + ": ";
  auto life = makePipe();
  if (!life) return Failure<>{failed + life.error().message};
  auto answer = makePipe();
  if (!answer) return Failure<>{failed + answer.error().message};
  // The keeper runs in a session of its own, because a Ctrl-C in the service's terminal must not
  // end the keeper before the traces are read.
  ChildProgram program{.command = {path, ward.noteFile.string(), ward.ownSessions},
                       .descriptors = {{.number = STDIN_FILENO, .ours = life->reader.get()},
                                       {.number = STDOUT_FILENO, .ours = answer->writer.get()},
                                       {.number = STDERR_FILENO}},
                       .group = ChildProgram::Group::kOwnSession,
                       .blockedSignals = {SIGTERM, SIGINT, SIGHUP, SIGQUIT}};
  if (daemon.pid != 0) {
    program.command.insert(program.command.end(), {std::to_string(daemon.pid), daemon.startTime});
  }
  auto started = ChildProcess::start(program);
  if (!started) return Failure<>{started.error().message};
  keeper_ = *std::move(started);
  // Only this process has the writing end. The kernel closes it, however the process ends.
  whileWeLive_ = std::move(life->writer);
  // Close our copy of the writing end. Otherwise our reading would not end when the keeper ends.
  answer->writer.reset();
  const std::string line = readLine(answer->reader.get(), kAnswersWithin);
  const std::string_view text = line;
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), daemon.pid);
  const auto numberEnd = static_cast<std::size_t>(parsed.ptr - text.data());
  if (parsed.ec == std::errc() && text.substr(numberEnd).starts_with(' ')) {
    daemon.startTime = text.substr(numberEnd + 1);
    return daemon;
  }
  release();
  return Failure<>{line.empty() ? path + " does not answer" : line};
}

void TracerKeeper::awaitEarlier(const std::filesystem::path& noteFile, milliseconds within) {
  const UniqueFd note(::open(noteFile.c_str(), O_RDONLY | O_CLOEXEC));
  if (!note) return;
  const auto deadline = steady_clock::now() + within;
  while (::flock(note.get(), LOCK_EX | LOCK_NB) != 0 && steady_clock::now() < deadline) {
    std::this_thread::sleep_for(kLookEvery);
  }
}

bool TracerKeeper::release() {
  whileWeLive_.reset();
  if (!keeper_) return false;
  // The closed pipe makes the keeper clean up and end.
  const ChildEnd end = keeper_->wait();
  keeper_.reset();
  return end.status >= 0;
}

}  // namespace halvox::platform::linux_
