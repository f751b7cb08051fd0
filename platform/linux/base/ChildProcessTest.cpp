#include "platform/linux/base/ChildProcess.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>
#include <utility>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

using namespace std::chrono_literals;
using ::testing::HasSubstr;
using Clock = ChildProcess::Clock;

// A child whose standard output the test reads.
class ChildProcessTest : public ::testing::Test {
 protected:
  // Fails the test if the program does not start.
  ChildProcess start(ChildProgram program) {
    auto pipe = makePipe();
    program.descriptors.push_back({.number = STDOUT_FILENO, .ours = pipe->writer.get()});
    output_ = std::move(pipe->reader);
    auto child = ChildProcess::start(program);
    EXPECT_TRUE(child) << (child ? "" : child.error().message);
    return *std::move(child);
  }
  // Returns what is printed until no process has the pipe open for writing.
  std::string output() const {
    std::string text;
    std::array<char, 1024> piece;
    for (ssize_t count = 0; (count = ::read(output_.get(), piece.data(), piece.size())) > 0;) {
      text.append(piece.data(), static_cast<std::size_t>(count));
    }
    return text;
  }
  std::string outputOf(ChildProgram program) {
    ChildProcess child = start(std::move(program));
    std::string text = output();
    EXPECT_TRUE(child.wait().isSuccess());
    return text;
  }
  std::string firstLine() const {
    std::string line;
    for (char byte = 0; ::read(output_.get(), &byte, 1) == 1 && byte != '\n';) line += byte;
    return line;
  }

  UniqueFd output_;
};

ChildProgram shell(const std::string& script) { return {.command = {"sh", "-c", script}}; }

TEST_F(ChildProcessTest, RunsAProgramWithItsArgumentsAndWithoutAShell) {
  EXPECT_EQ(outputOf({.command = {"echo", "a b", "$HOME; x"}}), "a b $HOME; x\n");
}

TEST_F(ChildProcessTest, MissingProgramIsAnErrorThatNamesIt) {
  const auto child = ChildProcess::start({.command = {"no-such-program"}});

  ASSERT_FALSE(child);
  EXPECT_EQ(child.error().code, ENOENT);
  EXPECT_EQ(child.error().message, "cannot start no-such-program: No such file or directory");
}

TEST_F(ChildProcessTest, ReportsHowTheChildEnded) {
  const ChildEnd exited = start(shell("exit 3")).wait();
  const ChildEnd killed = start(shell("kill -TERM $$")).wait();

  EXPECT_EQ(exited.status, 3);
  EXPECT_EQ(exited.text(), "ended with status 3");
  EXPECT_EQ(killed.status, -1);
  EXPECT_EQ(killed.signal, SIGTERM);
  EXPECT_EQ(killed.text(), "killed by signal 15");
  EXPECT_FALSE(killed.isSuccess());
}

TEST_F(ChildProcessTest, EndIsKnownAfterTheChildIsReapedToo) {
  ChildProcess child = start(shell("exit 3"));

  child.wait();

  EXPECT_EQ(child.pid(), 0);
  EXPECT_EQ(child.wait().status, 3);
  EXPECT_EQ(child.kill().status, 3);
  EXPECT_EQ(child.poll()->status, 3);
}

TEST_F(ChildProcessTest, WaitsUntilTheDeadlineAndNoLonger) {
  ChildProcess child = start({.command = {"sleep", "60"}});

  EXPECT_FALSE(child.poll());
  EXPECT_FALSE(child.waitUntil(Clock::now() + 20ms));
  child.signal(SIGTERM);
  const auto end = child.waitUntil(Clock::now() + 30s);

  ASSERT_TRUE(end);
  EXPECT_EQ(end->signal, SIGTERM);
}

TEST_F(ChildProcessTest, DescriptorIsReadableWhenTheChildHasEnded) {
  ChildProcess child = start({.command = {"sleep", "60"}});
  pollfd polled{.fd = child.descriptor(), .events = POLLIN, .revents = 0};

  EXPECT_EQ(::poll(&polled, 1, 0), 0);
  child.signal(SIGKILL);

  EXPECT_EQ(::poll(&polled, 1, 30'000), 1);
}

TEST_F(ChildProcessTest, EnvironmentIsOursUnlessOneIsGiven) {
  ::setenv("HALVOX_OURS", "1", 1);

  const std::string ours = outputOf({.command = {"env"}});
  const std::string given =
      outputOf({.command = {"env"}, .environment = std::vector<std::string>{"A=b"}});

  ::unsetenv("HALVOX_OURS");
  EXPECT_THAT(ours, HasSubstr("HALVOX_OURS=1\n"));
  EXPECT_EQ(given, "A=b\n");
}

TEST_F(ChildProcessTest, EnvironmentWithChangesHasEachVariableOnce) {
  ::setenv("HALVOX_OURS", "1", 1);

  const std::string text = outputOf(
      {.command = {"env"}, .environment = environmentWith({"HALVOX_OURS=2", "HALVOX_NEW=3"})});

  ::unsetenv("HALVOX_OURS");
  EXPECT_THAT(text, HasSubstr("HALVOX_OURS=2\n"));
  EXPECT_THAT(text, HasSubstr("HALVOX_NEW=3\n"));
  EXPECT_EQ(text.find("HALVOX_OURS=1"), std::string::npos);
  EXPECT_THAT(text, HasSubstr("PATH="));
}

TEST_F(ChildProcessTest, DescriptorsAreThoseGiven) {
  auto pipe = makePipe();
  ASSERT_TRUE(pipe);
  ASSERT_EQ(::write(pipe->writer.get(), "x\n", 2), 2);
  pipe->writer.reset();
  ChildProgram program = shell("cat; cat <&5; echo gone >&2");
  program.descriptors = {{.number = STDIN_FILENO},
                         {.number = STDERR_FILENO},
                         {.number = 5, .ours = pipe->reader.get()}};

  EXPECT_EQ(outputOf(program), "x\n");
}

TEST_F(ChildProcessTest, DescriptorsOfOneNumberAreNotTakenForEachOther) {
  auto first = makePipe();
  auto second = makePipe();
  ASSERT_TRUE(first && second);
  ASSERT_EQ(::write(first->writer.get(), "first\n", 6), 6);
  ASSERT_EQ(::write(second->writer.get(), "second\n", 7), 7);
  first->writer.reset();
  second->writer.reset();
  const int one = first->reader.get();
  const int two = second->reader.get();
  ChildProgram program = shell("cat <&" + std::to_string(one) + "; cat <&" + std::to_string(two));
  program.descriptors = {{.number = one, .ours = two}, {.number = two, .ours = one}};

  EXPECT_EQ(outputOf(program), "second\nfirst\n");
}

TEST_F(ChildProcessTest, OtherDescriptorsCanBeClosed) {
  const UniqueFd kept(::fcntl(STDERR_FILENO, F_DUPFD, 50));  // not closed on exec
  ChildProgram program =
      shell("test -e /proc/self/fd/" + std::to_string(kept.get()) + " && echo open || echo closed");

  EXPECT_EQ(outputOf(program), "open\n");
  program.otherDescriptors = ChildProgram::OtherDescriptors::kClosed;
  program.descriptors = {{.number = STDERR_FILENO}};
  EXPECT_EQ(outputOf(program), "closed\n");
}

// Ignores one signal and blocks another while this object exists.
class Signals {
 public:
  Signals() : before_(std::signal(SIGPIPE, SIG_IGN)) {
    sigset_t blocked;
    ::sigemptyset(&blocked);
    ::sigaddset(&blocked, SIGUSR1);
    ::pthread_sigmask(SIG_BLOCK, &blocked, &mask_);
  }
  Signals(const Signals&) = delete;
  Signals& operator=(const Signals&) = delete;
  ~Signals() {
    ::pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
    std::signal(SIGPIPE, before_);
  }
  // Returns whether that line of /proc/self/status has the signal.
  static bool has(const std::string& status, const std::string& name, int signal) {
    const std::size_t at = status.find(name + ":");
    return (std::stoull(status.substr(at + name.size() + 1), nullptr, 16) >> (signal - 1) & 1U) !=
           0;
  }

 private:
  void (*before_)(int);
  sigset_t mask_{};
};

TEST_F(ChildProcessTest, SignalsAreResetUnlessTheyAreToBeInherited) {
  const Signals signals;
  ChildProgram program{.command = {"cat", "/proc/self/status"}};

  const std::string reset = outputOf(program);
  program.blockedSignals = {SIGTERM};
  const std::string blocked = outputOf(program);
  program.signals = ChildProgram::Signals::kInherited;
  const std::string inherited = outputOf(program);

  EXPECT_FALSE(Signals::has(reset, "SigIgn", SIGPIPE));
  EXPECT_FALSE(Signals::has(reset, "SigBlk", SIGUSR1));
  EXPECT_TRUE(Signals::has(blocked, "SigBlk", SIGTERM));
  EXPECT_FALSE(Signals::has(blocked, "SigBlk", SIGUSR1));
  EXPECT_TRUE(Signals::has(inherited, "SigIgn", SIGPIPE));
  EXPECT_TRUE(Signals::has(inherited, "SigBlk", SIGUSR1));
}

TEST_F(ChildProcessTest, GroupOfItsOwnIsKilledWithAllThatTheChildStarted) {
  ChildProgram program = shell("sleep 60 & echo ready; wait");
  program.group = ChildProgram::Group::kOwnGroup;
  ChildProcess child = start(program);
  ASSERT_EQ(firstLine(), "ready");
  ASSERT_EQ(::getpgid(child.pid()), child.pid());

  EXPECT_EQ(child.kill().signal, SIGKILL);

  EXPECT_EQ(output(), "");  // returns when neither process can print any more
}

TEST_F(ChildProcessTest, SessionOfItsOwnIsOnDemand) {
  ChildProgram program{.command = {"sleep", "60"}};
  ChildProcess ours = start(program);
  program.group = ChildProgram::Group::kOwnSession;
  ChildProcess own = start(program);

  EXPECT_EQ(::getsid(ours.pid()), ::getsid(0));
  EXPECT_EQ(::getsid(own.pid()), own.pid());
}

TEST_F(ChildProcessTest, DestructorKillsAChildThatRuns) {
  pid_t pid = 0;
  {
    const ChildProcess child = start({.command = {"sleep", "60"}});
    pid = child.pid();
  }

  EXPECT_EQ(output(), "");
  EXPECT_EQ(::waitpid(pid, nullptr, WNOHANG), -1) << "nobody reaped it";
}

TEST_F(ChildProcessTest, MovingKeepsOneOwner) {
  ChildProcess first = start({.command = {"sleep", "60"}});
  const pid_t pid = first.pid();

  ChildProcess second = std::move(first);

  EXPECT_EQ(second.pid(), pid);
  EXPECT_EQ(second.kill().signal, SIGKILL);
}

TEST_F(ChildProcessTest, DetachedChildKeepsRunning) {
  pid_t pid = 0;
  {
    ChildProcess child = start({.command = {"sleep", "60"}});
    pid = child.detach();
  }

  EXPECT_EQ(::waitpid(pid, nullptr, WNOHANG), 0);
  ::kill(pid, SIGKILL);
  EXPECT_EQ(::waitpid(pid, nullptr, 0), pid);
}

TEST(PipeTest, BothEndsAreClosedOnExec) {
  const auto pipe = makePipe();

  ASSERT_TRUE(pipe);
  EXPECT_NE(::fcntl(pipe->reader.get(), F_GETFD) & FD_CLOEXEC, 0);
  EXPECT_NE(::fcntl(pipe->writer.get(), F_GETFD) & FD_CLOEXEC, 0);
}

}  // namespace
}  // namespace halvox::platform::linux_
