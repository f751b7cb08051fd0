#include "platform/linux/connection/testing/ChildProcess.h"

#include <array>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/connection/testing/ServiceUnderTest.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kPassedFd = 3;

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

}  // namespace

ChildProcess::ChildProcess(const std::vector<std::string>& command, const Options& options) {
  std::vector<std::string> arguments = command;
  std::vector<std::string> environment;
  for (char** entry = environ; *entry != nullptr; ++entry) environment.emplace_back(*entry);
  environment.insert(environment.end(), options.environment.begin(), options.environment.end());
  std::array<int, 2> pipe{};
  if (pipe2(pipe.data(), O_CLOEXEC) != 0) throw std::runtime_error("pipe2");
  output_.reset(pipe[0]);
  const UniqueFd input(pipe[1]);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, input.get(), STDOUT_FILENO);
  if (options.passedFd >= 0) {
    posix_spawn_file_actions_adddup2(&actions, options.passedFd, kPassedFd);
  }
  const int result = posix_spawnp(&pid_, arguments[0].c_str(), &actions, nullptr,
                                  pointersTo(arguments).data(), pointersTo(environment).data());
  posix_spawn_file_actions_destroy(&actions);
  if (result != 0) throw std::runtime_error("cannot start " + arguments[0]);
}

ChildProcess::~ChildProcess() {
  if (ended_) return;
  signal(SIGKILL);
  waitpid(pid_, nullptr, 0);
}

void ChildProcess::signal(int number) const { kill(pid_, number); }

std::string ChildProcess::firstLine() {
  std::string line;
  char byte = 0;
  while (read(output_.get(), &byte, 1) == 1 && byte != '\n') line += byte;
  return line;
}

std::optional<int> ChildProcess::waitForExit() {
  if (!ended_) {
    ended_ = eventually([this] { return waitpid(pid_, &status_, WNOHANG) == pid_; });
  }
  if (!ended_ || !WIFEXITED(status_)) return std::nullopt;
  return WEXITSTATUS(status_);
}

long ChildProcess::statusNumber(const std::string& name) const {
  std::ifstream status("/proc/" + std::to_string(pid_) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(name + ":")) return std::stol(line.substr(name.size() + 1));
  }
  return -1;
}

double ChildProcess::processorSeconds() const {
  std::ifstream file("/proc/" + std::to_string(pid_) + "/stat");
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
