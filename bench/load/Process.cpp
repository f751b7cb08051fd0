#include "bench/load/Process.h"

#include <csignal>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace halvox::bench {
namespace {

using std::chrono::milliseconds;
using std::chrono::nanoseconds;

platform::linux_::ChildProcess start(const std::vector<std::string>& command,
                                     const std::vector<std::string>& environment) {
  auto child = platform::linux_::ChildProcess::start(
      {.command = command, .environment = platform::linux_::environmentWith(environment)});
  if (!child) throw std::runtime_error(child.error().message);
  return *std::move(child);
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
    : child_(start(command, environment)) {}

Process::~Process() {
  child_.signal(SIGTERM);
  child_.wait();
}

void Process::waitForSocket(const std::string& path) {
  for (int attempt = 0; attempt < 1000; ++attempt) {
    if (isServed(path)) return;
    if (child_.poll()) break;
    std::this_thread::sleep_for(milliseconds(10));
  }
  throw std::runtime_error("the server does not accept connections on " + path);
}

nanoseconds Process::cpuTime() const {
  clockid_t clock{};
  timespec time{};
  if (::clock_getcpuclockid(child_.pid(), &clock) != 0 || ::clock_gettime(clock, &time) != 0)
    return {};
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
    // 5 % of one processor.
    if (now - before < kLook / 20) return;
    before = now;
  }
}

long Process::residentKib() const {
  return statusNumber("/proc/" + std::to_string(child_.pid()) + "/status", "VmRSS");
}

long Process::peakKib() const {
  return statusNumber("/proc/" + std::to_string(child_.pid()) + "/status", "VmHWM");
}

void Process::forgetPeak() const {
  std::ofstream("/proc/" + std::to_string(child_.pid()) + "/clear_refs") << "5";
}

long Process::writtenBytes() const {
  return statusNumber("/proc/" + std::to_string(child_.pid()) + "/io", "write_bytes");
}

long Process::sleeps() const {
  long count = 0;
  const std::string tasks = "/proc/" + std::to_string(child_.pid()) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    count += statusNumber(task.path().string() + "/status", "voluntary_ctxt_switches");
  }
  return count;
}

}  // namespace halvox::bench
