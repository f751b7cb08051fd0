#include "platform/linux/tracing/lttng/SessionDaemon.h"

#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>
#include <lttng/lttng.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/linux/base/ProcessStat.h"
#include "platform/linux/testing/ScratchDirectory.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kOwnSessions = "halvox-test-";

// Hides root's daemon from this process and the programs that it starts. Returns false if the
// system does not permit that.
bool hideRootsDaemon() {
  static const bool isHidden = [] {
    const int user = ::geteuid() == 0 ? 0 : CLONE_NEWUSER;
    return ::unshare(CLONE_NEWNS | user) == 0 &&
           ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
           ::mount("tmpfs", "/run", "tmpfs", 0, nullptr) == 0;
  }();
  return isHidden;
}

// Tests with scripts instead of the daemon. PATH contains only their directory, so that the tests
// never start a tracer.
class SessionDaemonTest : public testing::Test {
 protected:
  void SetUp() override {
    ::setenv("PATH", scratch_.c_str(), 1);
    ::setenv("LTTNG_HOME", scratch_.c_str(), 1);
    ::setenv("HOME", scratch_.c_str(), 1);
    if (!hideRootsDaemon() && ::lttng_session_daemon_alive() == 1) {
      GTEST_SKIP() << "a tracer of root runs, and this process may not mount over its directory";
    }
  }
  ~SessionDaemonTest() override { ::setenv("PATH", path_.c_str(), 1); }

  // The script notes its process and then does what `rest` says.
  void writeProgram(const std::string& rest) {
    const fs::path program = scratch_ / "lttng-sessiond";
    std::ofstream(program) << "#!/bin/sh\necho $$ >" << pidFile_.string() << "\n" << rest << "\n";
    fs::permissions(program, fs::perms::owner_all);
  }
  pid_t pid() const {
    pid_t read = 0;
    std::ifstream(pidFile_) >> read;
    return read;
  }
  static bool isThere(pid_t pid) { return ::kill(pid, 0) == 0; }
  static std::string startTimeOf(pid_t pid) {
    const auto stat = readProcessStat(pid);
    return stat.has_value() ? std::to_string(stat->startTicks) : "none";
  }
  // The keeper that was started last; 0 if none runs.
  static pid_t keeper() {
    pid_t found = 0;
    for (const auto& entry : fs::directory_iterator("/proc")) {
      std::ifstream file(entry.path() / "stat");
      pid_t pid = 0;
      pid_t parent = 0;
      std::string name;
      std::string state;
      if (file >> pid >> name >> state >> parent && parent == ::getpid() &&
          name.starts_with("(halvox-tracer") && state != "Z") {
        found = pid;
      }
    }
    return found;
  }
  void noteAndAdopt(pid_t process) {
    std::ofstream(note_) << process << ' ' << startTimeOf(process) << '\n';
    daemon_.adopt(kOwnSessions);
  }
  // A child process that waits until a signal ends it.
  static pid_t startSleeper() {
    const pid_t child = ::fork();
    if (child == 0) {
      ::execl("/bin/sleep", "sleep", "1000", nullptr);
      ::_exit(127);
    }
    return child;
  }

  const std::string path_ = ::getenv("PATH");
  const ScratchDirectory directory_;
  const fs::path scratch_ = directory_.path();
  const fs::path note_ = scratch_ / "note";
  const fs::path pidFile_ = scratch_ / "pid";
  SessionDaemon daemon_{note_,
                        {.answersWithin = std::chrono::milliseconds(300),
                         .endsWithin = std::chrono::milliseconds(100)}};
};

TEST_F(SessionDaemonTest, MissingProgramIsAnError) {
  EXPECT_EQ(daemon_.start(kOwnSessions).error().message,
            "cannot start lttng-sessiond: No such file or directory");

  EXPECT_FALSE(daemon_.isOurs());
  EXPECT_FALSE(daemon_.isNoted());
}

TEST_F(SessionDaemonTest, DaemonThatEndsAtOnceIsReportedBeforeTheTimeLimit) {
  writeProgram("exit 1");
  SessionDaemon patient(note_, {.answersWithin = std::chrono::hours(1)});

  EXPECT_EQ(patient.start(kOwnSessions).error().message, "lttng-sessiond ended at once");

  EXPECT_FALSE(patient.isOurs());
  EXPECT_FALSE(patient.isNoted());
}

TEST_F(SessionDaemonTest, DaemonThatDoesNotAnswerIsEndedAndReported) {
  writeProgram("exec /bin/sleep 1000");

  EXPECT_EQ(daemon_.start(kOwnSessions).error().message, "lttng-sessiond does not answer");

  EXPECT_FALSE(daemon_.isOurs());
  EXPECT_FALSE(daemon_.isNoted());
  ASSERT_GT(pid(), 1);
  EXPECT_FALSE(isThere(pid()));
}

TEST_F(SessionDaemonTest, DaemonThatDoesNotHeedItsSignalIsKilled) {
  writeProgram("trap '' TERM; exec /bin/sleep 1000");

  EXPECT_EQ(daemon_.start(kOwnSessions).error().message, "lttng-sessiond does not answer");

  ASSERT_GT(pid(), 1);
  EXPECT_FALSE(isThere(pid()));
}

TEST_F(SessionDaemonTest, DaemonThatWasNotedIsKnownAgainAndEnded) {
  const pid_t sleeper = startSleeper();
  std::ofstream(note_) << sleeper << ' ' << startTimeOf(sleeper) << '\n';

  daemon_.adopt(kOwnSessions);
  EXPECT_TRUE(daemon_.isOurs());
  daemon_.end();

  EXPECT_FALSE(daemon_.isOurs());
  EXPECT_FALSE(daemon_.isNoted());
  int status = 0;
  ASSERT_EQ(::waitpid(sleeper, &status, 0), sleeper);
  EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGTERM);
}

TEST_F(SessionDaemonTest, DaemonThatIsLeftIsEndedByItsKeeper) {
  const pid_t sleeper = startSleeper();
  noteAndAdopt(sleeper);

  daemon_.leave();

  EXPECT_FALSE(daemon_.isOurs());
  EXPECT_FALSE(daemon_.isNoted());
  EXPECT_EQ(keeper(), 0);
  EXPECT_EQ(::waitpid(sleeper, nullptr, WNOHANG), sleeper);
}

TEST_F(SessionDaemonTest, KeeperThatWasKilledIsReplaced) {
  const pid_t sleeper = startSleeper();
  noteAndAdopt(sleeper);
  ASSERT_GT(keeper(), 1);
  ::kill(keeper(), SIGKILL);

  daemon_.leave();

  EXPECT_FALSE(daemon_.isNoted());
  EXPECT_EQ(::waitpid(sleeper, nullptr, WNOHANG), sleeper);
}

TEST_F(SessionDaemonTest, KeeperDoesNotHeedTheSignalsOfATerminal) {
  const pid_t sleeper = startSleeper();
  noteAndAdopt(sleeper);
  const pid_t first = keeper();
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGQUIT}) ::kill(first, signal);

  EXPECT_EQ(keeper(), first);
  daemon_.leave();

  EXPECT_EQ(::waitpid(sleeper, nullptr, WNOHANG), sleeper);
}

TEST_F(SessionDaemonTest, DaemonThatDoesNotAnswerAnyMoreIsEndedBeforeAnotherIsStarted) {
  const pid_t sleeper = startSleeper();
  std::ofstream(note_) << sleeper << ' ' << startTimeOf(sleeper) << '\n';
  daemon_.adopt(kOwnSessions);

  EXPECT_FALSE(daemon_.start(kOwnSessions));

  EXPECT_EQ(::waitpid(sleeper, nullptr, WNOHANG), sleeper);
}

TEST_F(SessionDaemonTest, OtherProcessThatGotTheNumberIsLeftAlone) {
  const pid_t sleeper = startSleeper();
  std::ofstream(note_) << sleeper << " 1\n";

  daemon_.adopt(kOwnSessions);
  EXPECT_FALSE(daemon_.isOurs());
  EXPECT_FALSE(daemon_.isNoted());
  daemon_.end();

  EXPECT_EQ(::waitpid(sleeper, nullptr, WNOHANG), 0);
  ::kill(sleeper, SIGKILL);
  ::waitpid(sleeper, nullptr, 0);
}

TEST_F(SessionDaemonTest, NoteThatNamesNoProcessGoes) {
  for (const char* text : {"", "x", "0 1", "-1 1", "1 1", "5"}) {
    std::ofstream(note_) << text;

    daemon_.adopt(kOwnSessions);

    EXPECT_FALSE(daemon_.isOurs()) << text;
    EXPECT_FALSE(daemon_.isNoted()) << text;
  }
}

}  // namespace
}  // namespace halvox::platform::linux_
