#include "platform/linux/diagnostics/Child.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <optional>
#include <string_view>

#include <poll.h>
#include <unistd.h>

#include "platform/linux/base/ChildProcess.h"

namespace halvox::platform::linux_ {
namespace {

// The variables that the programs need to find PipeWire and to print text. They get nothing else
// from the service's environment.
constexpr std::array kPassedVariables{
    "PATH", "HOME", "LANG", "XDG_RUNTIME_DIR", "PIPEWIRE_REMOTE", "PIPEWIRE_RUNTIME_DIR"};

std::vector<std::string> passedEnvironment() {
  std::vector<std::string> variables;
  for (const char* name : kPassedVariables) {
    if (const char* value = std::getenv(name)) variables.push_back(std::string(name) + "=" + value);
  }
  return variables;
}

enum class ReadEnd : std::uint8_t { kAllRead, kTooMuch, kTimeOver };

ReadEnd readOutput(int descriptor, std::size_t most, const CaptureDeadline& deadline,
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
    // Test the time here, too, because poll() never times out while a program prints without a
    // pause.
    if (deadline.hasPassed()) return ReadEnd::kTimeOver;
  }
}

// Waits for the end of a program that has closed its output. Returns std::nullopt at the deadline.
std::optional<ChildEnd> awaitEnd(ChildProcess& child, const CaptureDeadline& deadline) {
  std::array<pollfd, 2> polled{
      {{child.descriptor(), POLLIN, 0}, {deadline.stop().descriptor(), POLLIN, 0}}};
  int ready = 0;
  do {
    ready = ::poll(polled.data(), polled.size(), deadline.millisecondsLeft());
  } while (ready < 0 && errno == EINTR);
  return child.poll();
}

}  // namespace

Finding runProgram(const std::vector<std::string>& command, std::size_t most,
                   const CaptureDeadline& deadline) {
  auto pipe = makePipe();
  if (!pipe) return Finding::failed(pipe.error().message);
  auto child =
      ChildProcess::start({.command = command,
                           .environment = passedEnvironment(),
                           .descriptors = {{.number = STDIN_FILENO},
                                           {.number = STDOUT_FILENO, .ours = pipe->writer.get()},
                                           {.number = STDERR_FILENO}},
                           .otherDescriptors = ChildProgram::OtherDescriptors::kClosed,
                           // The program gets a group of its own, so that one signal reaches
                           // everything that it has started.
                           .group = ChildProgram::Group::kOwnGroup});
  if (!child) {
    const bool isMissing = child.error().code == ENOENT;
    return Finding::failed(isMissing ? command.front() + " is not installed"
                                     : child.error().message);
  }
  // Close our copy of the writing end, because while it is open, reading never reaches the end.
  pipe->writer.reset();
  Finding finding;
  const ReadEnd end = readOutput(pipe->reader.get(), most, deadline, finding.bytes);
  if (end == ReadEnd::kAllRead) {
    if (const auto ended = awaitEnd(*child, deadline)) {
      if (ended->isSuccess()) return finding;
      return Finding::failed(command.front() + ": " + ended->text());
    }
  }
  // Kill the whole group, because the program may have started others that hold the pipe.
  child->kill();
  if (end == ReadEnd::kTooMuch) {
    finding.isCut = true;
    return finding;
  }
  return Finding::failed(command.front() + ": did not end in time and was killed");
}

}  // namespace halvox::platform::linux_
