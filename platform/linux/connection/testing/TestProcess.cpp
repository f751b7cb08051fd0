#include "platform/linux/connection/testing/TestProcess.h"

#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

#include <unistd.h>

#include "platform/linux/testing/Eventually.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kPassedFd = 3;

}  // namespace

TestProcess::TestProcess(const std::vector<std::string>& command, const Options& options) {
  auto pipe = makePipe();
  if (!pipe) throw std::runtime_error(pipe.error().message);
  ChildProgram program{.command = command,
                       .environment = environmentWith(options.environment),
                       .descriptors = {{.number = STDOUT_FILENO, .ours = pipe->writer.get()}}};
  if (options.passedFd >= 0) {
    program.descriptors.push_back({.number = kPassedFd, .ours = options.passedFd});
  }
  auto child = ChildProcess::start(program);
  if (!child) throw std::runtime_error(child.error().message);
  output_ = std::move(pipe->reader);
  child_ = *std::move(child);
}

std::string TestProcess::firstLine() {
  std::string line;
  char byte = 0;
  while (read(output_.get(), &byte, 1) == 1 && byte != '\n') line += byte;
  return line;
}

std::optional<int> TestProcess::waitForExit() {
  const auto end = child_->waitUntil(ChildProcess::Clock::now() + kTestDeadline);
  if (!end || end->signal != 0) return std::nullopt;
  return end->status;
}

long TestProcess::statusNumber(const std::string& name) const {
  std::ifstream status("/proc/" + std::to_string(pid()) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(name + ":")) return std::stol(line.substr(name.size() + 1));
  }
  return -1;
}

double TestProcess::processorSeconds() const {
  std::ifstream file("/proc/" + std::to_string(pid()) + "/stat");
  const std::string text{std::istreambuf_iterator<char>(file), {}};
  std::istringstream fields(text.substr(text.rfind(')') + 1));
  std::string skipped;
  constexpr int kFieldsBeforeTimes = 11;
  for (int field = 0; field < kFieldsBeforeTimes; ++field) fields >> skipped;
  double user = 0;
  double system = 0;
  fields >> user >> system;
  return (user + system) / static_cast<double>(sysconf(_SC_CLK_TCK));
}

}  // namespace halvox::platform::linux_
