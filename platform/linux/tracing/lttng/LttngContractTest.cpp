// The contracts of kernel traces and performance traces, run on LTTng.
//
// The program never runs as root, because root's tracer belongs to the whole machine. It starts a
// session daemon of its own. It is also the program whose events are recorded: with --emit it emits
// events and ends.

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <iterator>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include <grp.h>
#include <gtest/gtest.h>
#include <lttng/lttng.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "client/halvox_trace.h"
#include "platform/fake/FakePlatform.h"
#include "platform/fake/contracts/KtraceContract.h"
#include "platform/fake/contracts/PerformanceTraceContract.h"
#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/testing/Eventually.h"
#include "platform/linux/testing/ScratchDirectory.h"
#include "platform/linux/tracing/lttng/LttngControl.h"
#include "platform/linux/tracing/lttng/LttngKtraceService.h"
#include "platform/linux/tracing/lttng/LttngPerformanceTraceService.h"
#include "platform/linux/tracing/lttng/TracerSessions.h"

namespace halvox::platform::contract {
namespace {

namespace fs = std::filesystem;

// A session daemon for this test, with its own home directory. It ends with the test.
class TestDaemon {
 public:
  TestDaemon() {
    ::setenv("LTTNG_HOME", home_.path().c_str(), 1);
    ::setenv("HOME", home_.path().c_str(), 1);
    process_ = ::fork();
    if (process_ == 0) {
      ::prctl(PR_SET_PDEATHSIG, SIGKILL);
      ::execlp("lttng-sessiond", "lttng-sessiond", "--no-kernel", "--quiet", nullptr);
      ::_exit(127);
    }
    isAnswering_ =
        linux_::eventually([this] { return ::lttng_session_daemon_alive() == 1 || !runs(); }) &&
        ::lttng_session_daemon_alive() == 1;
  }
  TestDaemon(const TestDaemon&) = delete;
  TestDaemon& operator=(const TestDaemon&) = delete;
  ~TestDaemon() { end(SIGTERM); }

  [[nodiscard]] bool isAnswering() const { return isAnswering_; }
  void end(int signal) {
    if (process_ <= 0) return;
    ::kill(process_, signal);
    ::waitpid(process_, nullptr, 0);
    process_ = 0;
  }

 private:
  bool runs() {
    if (process_ > 0 && ::waitpid(process_, nullptr, WNOHANG) == process_) process_ = 0;
    return process_ > 0;
  }

  const linux_::ScratchDirectory home_;
  pid_t process_ = 0;
  bool isAnswering_ = false;
};

// Both services over one control, with real queues.
class LttngHarness {
 public:
  LttngHarness() {
    EXPECT_TRUE(daemon_.isAnswering());
    installServices({.analytics = fakes_.analytics,
                     .clock = fakes_.clock,
                     .connections = fakes_.connections,
                     .deviceProperties = fakes_.deviceProperties,
                     .diagnosticReporters = fakes_.diagnosticReporters,
                     .dispatch = dispatch_,
                     .featureFlags = fakes_.featureFlags,
                     .files = fakes_.files,
                     .ioReport = fakes_.ioReport,
                     .kdebug = fakes_.kdebug,
                     .ktrace = ktrace_,
                     .log = fakes_.log,
                     .metrics = fakes_.metrics,
                     .notify = fakes_.notify,
                     .overflow = fakes_.overflow,
                     .performanceTraces = performanceTraces_,
                     .powerLog = fakes_.powerLog,
                     .preferences = fakes_.preferences,
                     .privacy = fakes_.privacy,
                     .process = fakes_.process,
                     .propertyLists = fakes_.propertyLists,
                     .resultsFiles = fakes_.resultsFiles,
                     .statistics = fakes_.statistics,
                     .tlmReporting = fakes_.tlmReporting});
  }
  LttngHarness(const LttngHarness&) = delete;
  LttngHarness& operator=(const LttngHarness&) = delete;
  ~LttngHarness() {
    std::error_code ignored;  // the directory may not exist
    fs::permissions(traces_, fs::perms::owner_all, ignored);
    ktrace_.stop();
    EXPECT_TRUE(dispatch_.stop(linux_::kTestDeadline));
    control_.close();
    ktrace_.close();
    performanceTraces_.close();
    EXPECT_TRUE(linux_::tracerSessionNames().empty());
    ::setenv("PATH", path_.c_str(), 1);
  }

  bool letRunUntil(const std::function<bool()>& condition) { return linux_::eventually(condition); }
  // The files of a recording exist until it has been read back, packed or discarded.
  std::size_t recordings() {
    std::error_code ignored;
    const auto found = fs::directory_iterator(traces_ / "scratch", ignored);
    return static_cast<std::size_t>(std::distance(begin(found), end(found)));
  }
  void breakTracer() {
    daemon_.end(SIGTERM);
    ::setenv("PATH", "/nonexistent", 1);  // so that no other daemon can be started
  }
  void breakRecorder() { daemon_.end(SIGKILL); }
  void breakSaving() { fs::permissions(traces_, fs::perms::owner_read | fs::perms::owner_exec); }

 protected:
  TestDaemon daemon_;
  const std::string path_ = ::getenv("PATH");
  FakePlatform fakes_;
  const linux_::ScratchDirectory directory_;
  const fs::path traces_ = directory_.path() / "traces";
  linux_::AsioDispatchService dispatch_{fakes_.log, fakes_.statistics};
  linux_::LttngControl control_{traces_};
  linux_::LttngKtraceService ktrace_{control_, fakes_.log, fakes_.statistics};
  linux_::LttngPerformanceTraceService performanceTraces_{control_, fakes_.log, fakes_.statistics};
};

class LttngKtraceHarness : public LttngHarness {
 public:
  KtraceService& service() { return ktrace_; }
  std::shared_ptr<DispatchQueue> createQueue() {
    return dispatch_.createSerialQueue("Tracing", QualityOfService::kUtility,
                                       QueueThreading::kOwnThread);
  }
  void emit(const std::vector<std::uint32_t>& codes) {
    std::vector<std::string> words{"/proc/self/exe", "--emit"};
    for (const std::uint32_t code : codes) words.push_back(std::to_string(code));
    auto emitter = linux_::ChildProcess::start({.command = std::move(words)});
    ASSERT_TRUE(emitter) << emitter.error().message;
    ASSERT_TRUE(emitter->wait().isSuccess());
  }
};

class LttngPerformanceTraceHarness : public LttngHarness {
 public:
  PerformanceTraceService& service() { return performanceTraces_; }
};

}  // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Lttng, KtraceContract, LttngKtraceHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Lttng, PerformanceTraceContract, LttngPerformanceTraceHarness);

}  // namespace halvox::platform::contract

namespace {

void giveUpRoot() {
  constexpr uid_t kNobody = 65534;
  if (::getuid() != 0) return;
  if (::setgroups(0, nullptr) != 0 || ::setgid(kNobody) != 0 || ::setuid(kNobody) != 0) {
    std::exit(EXIT_FAILURE);
  }
}

int emitAll(int count, char** arguments) {
  for (int index = 2; index < count; ++index) {
    halvox_trace(static_cast<std::uint32_t>(std::stoul(arguments[index])), 1, 2, 3, 4);
  }
  return EXIT_SUCCESS;
}

bool hasProgram(const std::string& name) {
  return std::system(("command -v " + name + " >/dev/null").c_str()) == 0;
}

}  // namespace

// AddressSanitizer calls this. LTTng's thread still holds memory when the program ends, and we
// cannot free it.
extern "C" const char* __lsan_default_suppressions() { return "leak:/liblttng-ust.so.1\n"; }

int main(int count, char** arguments) {
  if (count > 1 && std::string_view(arguments[1]) == "--emit") return emitAll(count, arguments);
  testing::InitGoogleTest(&count, arguments);
  giveUpRoot();
  // Wait for the tracer before emitting, because events that it does not listen to yet are lost.
  ::setenv("LTTNG_UST_REGISTER_TIMEOUT", "10000", 1);
  if (!hasProgram("lttng-sessiond")) {
    std::puts("skipped: there is no lttng-sessiond");
    return EXIT_SUCCESS;
  }
  return RUN_ALL_TESTS();
}
