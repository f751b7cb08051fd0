#include "bench/load/Process.h"

#include <csignal>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"

extern char** environ;

namespace halvox::bench {
namespace {

using std::chrono::milliseconds;
using std::chrono::nanoseconds;

std::vector<char*> pointers(std::vector<std::string>& texts) {
  std::vector<char*> result;
  for (std::string& text : texts) result.push_back(text.data());
  result.push_back(nullptr);
  return result;
}

bool isServed(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) throw std::runtime_error("socket path too long");
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const bool served = ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
  ::close(fd);
  return served;
}

long statusNumber(const std::string& path, const std::string& name) {
  std::ifstream status(path);
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with(name + ":")) return std::stol(line.substr(name.size() + 1));
  }
  return 0;
}

}  // namespace

Process::Process(const std::vector<std::string>& command,
                 const std::vector<std::string>& environment)
    : pid_(-1) {
  std::vector<std::string> arguments = command;
  std::vector<std::string> settings = environment;
  std::vector<char*> variables = pointers(settings);
  variables.pop_back();
  for (char** variable = environ; *variable != nullptr; ++variable) variables.push_back(*variable);
  variables.push_back(nullptr);
  const int error = ::posix_spawnp(&pid_, arguments.front().c_str(), nullptr, nullptr,
                                   pointers(arguments).data(), variables.data());
  if (error != 0)
    throw std::runtime_error(command.front() + ": " + platform::linux_::errnoText(error));
}

Process::~Process() {
  ::kill(pid_, SIGTERM);
  ::waitpid(pid_, nullptr, 0);
}

void Process::waitForSocket(const std::string& path) const {
  for (int attempt = 0; attempt < 1000; ++attempt) {
    if (isServed(path)) return;
    if (::waitpid(pid_, nullptr, WNOHANG) == pid_) break;
    std::this_thread::sleep_for(milliseconds(10));
  }
  throw std::runtime_error("the server does not accept connections on " + path);
}

nanoseconds Process::cpuTime() const {
  clockid_t clock{};
  timespec time{};
  if (::clock_getcpuclockid(pid_, &clock) != 0 || ::clock_gettime(clock, &time) != 0) return {};
  return std::chrono::seconds(time.tv_sec) + nanoseconds(time.tv_nsec);
}

nanoseconds Process::settledCpuTime() const {
  nanoseconds before = cpuTime();
  for (;;) {
    std::this_thread::sleep_for(milliseconds(100));
    const nanoseconds now = cpuTime();
    if (now == before) return now;
    before = now;
  }
}

void Process::waitForRest() const {
  constexpr milliseconds kLook{200};
  nanoseconds before = cpuTime();
  for (;;) {
    std::this_thread::sleep_for(kLook);
    const nanoseconds now = cpuTime();
    if (now - before < kLook / 20) return;
    before = now;
  }
}

long Process::residentKib() const {
  return statusNumber("/proc/" + std::to_string(pid_) + "/status", "VmRSS");
}

long Process::peakKib() const {
  return statusNumber("/proc/" + std::to_string(pid_) + "/status", "VmHWM");
}

void Process::forgetPeak() const {
  std::ofstream("/proc/" + std::to_string(pid_) + "/clear_refs") << "5";
}

long Process::sleeps() const {
  long count = 0;
  const std::string tasks = "/proc/" + std::to_string(pid_) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    count += statusNumber(task.path().string() + "/status", "voluntary_ctxt_switches");
  }
  return count;
}

ScratchDirectory::ScratchDirectory() {
  std::string pattern = (std::filesystem::temp_directory_path() / "halvox-load-XXXXXX").string();
  if (::mkdtemp(pattern.data()) == nullptr)
    throw std::runtime_error("cannot create a scratch directory");
  path_ = pattern;
}

ScratchDirectory::~ScratchDirectory() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

}  // namespace halvox::bench
