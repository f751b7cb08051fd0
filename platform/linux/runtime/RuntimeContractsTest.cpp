// The contracts of the platform services, run on the adapters of this folder.

#include <array>
#include <chrono>
#include <csignal>
#include <string>
#include <thread>

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/fake/contracts/ClockContract.h"
#include "platform/fake/contracts/ProcessContract.h"
#include "platform/fake/contracts/StatisticsContract.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/runtime/LibcClockService.h"
#include "platform/linux/runtime/ProcfsProcessService.h"

namespace halvox::platform::contract {

using linux_::UniqueFd;

namespace adapters {

class LibcClockHarness {
 public:
  ClockService& service() { return service_; }
  // The clock under test is the real one, which only real time moves.
  void letPass(std::chrono::milliseconds time) { std::this_thread::sleep_for(time); }

 private:
  linux_::LibcClockService service_;
};

// Child processes that do nothing but have a name.
class ProcfsHarness {
 public:
  ProcessService& service() { return service_; }
  ProcessID startProcess(const std::string& commandName) {
    std::array<int, 2> names{};
    std::array<int, 2> done{};
    if (::pipe2(names.data(), O_CLOEXEC) != 0 || ::pipe2(done.data(), O_CLOEXEC) != 0) return -1;
    const UniqueFd namesToRead(names[0]);
    const UniqueFd doneToWrite(done[1]);
    names_.reset(names[1]);
    done_.reset(done[0]);
    const pid_t child = ::fork();
    if (child == 0) bearNames(namesToRead.get(), doneToWrite.get());
    renameProcess(child, commandName);
    return child;
  }
  void renameProcess(ProcessID /*pid*/, const std::string& commandName) {
    char byte = 0;
    ASSERT_GT(::write(names_.get(), commandName.c_str(), commandName.size() + 1), 0);
    ASSERT_EQ(::read(done_.get(), &byte, 1), 1);
  }
  void endProcess(ProcessID pid) {
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
  }
  int exitStatusOf(int status) {
    const pid_t child = ::fork();
    if (child == 0) service_.terminate(status);
    int ended = 0;
    ::waitpid(child, &ended, 0);
    return WIFEXITED(ended) ? WEXITSTATUS(ended) : -1;
  }

 private:
  [[noreturn]] static void bearNames(int names, int done) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    std::array<char, 64> name{};
    while (::read(names, name.data(), name.size() - 1) > 0) {
      ::prctl(PR_SET_NAME, name.data());
      if (::write(done, "d", 1) != 1) break;
    }
    ::_exit(1);
  }

  UniqueFd names_;
  UniqueFd done_;
  linux_::ProcfsProcessService service_;
};

}  // namespace adapters

INSTANTIATE_TYPED_TEST_SUITE_P(Libc, ClockContract, adapters::LibcClockHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Procfs, ProcessContract, adapters::ProcfsHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Counter, StatisticsContract, linux_::CounterStatisticsService);

}  // namespace halvox::platform::contract
