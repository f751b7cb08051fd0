#include "platform/linux/tracing/lttng/TracerKeeper.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <string_view>
#include <system_error>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds kAnswersWithin{10'000};
constexpr milliseconds kLookEvery{10};  // flock() has no time-out

// A build that is not installed has the keeper beside the service's program.
std::string keeperPath() {
  const std::filesystem::path installed(HALVOX_TRACER_KEEPER);
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  const auto beside = program.parent_path() / installed.filename();
  return !error && std::filesystem::exists(beside, error) ? beside : installed;
}

struct Pipe {
  UniqueFd reading;
  UniqueFd writing;
};

std::optional<Pipe> makePipe() {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) return std::nullopt;
  return Pipe{.reading = UniqueFd(ends[0]), .writing = UniqueFd(ends[1])};
}

// Reads one line, without its end. Empty if it does not come in time or the writer has gone. Byte
// by byte: the line is short, and nothing after it may be consumed.
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

std::optional<std::string> TracerKeeper::launch(const Ward& ward, DaemonProcess& daemon) {
  release();
  const std::string program = keeperPath();
  const std::string failed = "cannot start " + program + ": ";
  auto life = makePipe();
  auto answer = makePipe();
  if (!life || !answer) return failed + errnoText(errno);
  ProgramApart keeper{.command = {program, ward.noteFile.string(), ward.ownSessions},
                      .input = life->reading.get(),
                      .output = answer->writing.get(),
                      .endSignals = ProgramApart::EndSignals::kBlocked};
  if (daemon.pid != 0) {
    keeper.command.insert(keeper.command.end(), {std::to_string(daemon.pid), daemon.startTime});
  }
  if (const int error = startApart(keeper, pid_)) {
    pid_ = 0;
    return failed + errnoText(error);
  }
  whileWeLive_ = std::move(life->writing);
  // Our copy of the writing end must go, or the end of the keeper would not end the reading.
  answer->writing.reset();
  const std::string line = readLine(answer->reading.get(), kAnswersWithin);
  const std::string_view text = line;
  const auto parsed = std::from_chars(text.data(), text.data() + text.size(), daemon.pid);
  const auto numberEnd = static_cast<std::size_t>(parsed.ptr - text.data());
  if (parsed.ec == std::errc() && text.substr(numberEnd).starts_with(' ')) {
    daemon.startTime = text.substr(numberEnd + 1);
    return std::nullopt;
  }
  release();
  return line.empty() ? program + " does not answer" : line;
}

std::optional<std::string> TracerKeeper::start(const Ward& ward, DaemonProcess& daemon) {
  daemon = {};
  return launch(ward, daemon);
}

std::optional<std::string> TracerKeeper::keep(const Ward& ward, const DaemonProcess& daemon) {
  DaemonProcess kept = daemon;
  return launch(ward, kept);
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
  const pid_t pid = std::exchange(pid_, 0);
  whileWeLive_.reset();
  if (pid == 0) return false;
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) return false;
  }
  return WIFEXITED(status);
}

}  // namespace halvox::platform::linux_
