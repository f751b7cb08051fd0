#include "platform/linux/base/ProcessStat.h"

#include <csignal>
#include <cstdint>
#include <ctime>
#include <limits>
#include <optional>
#include <string>

#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

// The text of a process with that name, up to and after the start time.
std::string textOf(const std::string& name, const std::string& start = "4711") {
  return "12 (" + name + ") S 1 12 12 0 -1 4194560 95 0 0 0 3 4 0 0 20 0 1 0 " + start +
         " 2703360 200 18446744073709551615 1 1 0 0 0\n";
}

// The start time of the process with that name.
std::optional<std::uint64_t> startOf(const std::string& name) {
  const auto stat = parseProcessStat(textOf(name));
  return stat.has_value() ? std::optional(stat->startTicks) : std::nullopt;
}

TEST(ProcessStatTest, ReadsTheStateAndTheStartTime) {
  const auto stat = parseProcessStat(textOf("bash"));

  ASSERT_TRUE(stat.has_value());
  EXPECT_EQ(stat->state, 'S');
  EXPECT_EQ(stat->startTicks, 4711U);
}

TEST(ProcessStatTest, NameMayContainBlanks) {
  EXPECT_EQ(startOf("tmux: server"), 4711U);
  EXPECT_EQ(startOf(" "), 4711U);
  EXPECT_EQ(startOf("1 2 3 4 5 6 7 8"), 4711U);
}

TEST(ProcessStatTest, NameMayContainParentheses) {
  EXPECT_EQ(startOf("(sd-pam)"), 4711U);
  EXPECT_EQ(startOf(")"), 4711U);
  EXPECT_EQ(startOf("a) Z 1 (b"), 4711U);
  EXPECT_EQ(startOf(") R 9 9 9"), 4711U);
}

TEST(ProcessStatTest, NameMayContainALineEndOrBeEmpty) {
  EXPECT_EQ(startOf("a\nb"), 4711U);
  EXPECT_EQ(startOf(""), 4711U);
}

TEST(ProcessStatTest, NameCannotPretendAState) {
  const auto stat = parseProcessStat(textOf("a) Z 1 (b"));

  ASSERT_TRUE(stat.has_value());
  EXPECT_EQ(stat->state, 'S');
}

TEST(ProcessStatTest, LargestStartTimeIsRead) {
  const auto stat = parseProcessStat(textOf("a", "18446744073709551615"));

  ASSERT_TRUE(stat.has_value());
  EXPECT_EQ(stat->startTicks, std::numeric_limits<std::uint64_t>::max());
}

TEST(ProcessStatTest, TextThatEndsBeforeTheEndOfTheStartTimeIsRefused) {
  const std::string whole = textOf("a b");
  const std::size_t end = whole.find("4711") + 4;  // the blank after the number

  for (std::size_t size = 0; size <= end; ++size) {
    EXPECT_FALSE(parseProcessStat(whole.substr(0, size)).has_value()) << whole.substr(0, size);
  }
  EXPECT_TRUE(parseProcessStat(whole.substr(0, end + 1)).has_value());
}

TEST(ProcessStatTest, StartTimeThatIsNoNumberIsRefused) {
  EXPECT_FALSE(parseProcessStat(textOf("a", "-1")).has_value());
  EXPECT_FALSE(parseProcessStat(textOf("a", "")).has_value());
  EXPECT_FALSE(parseProcessStat(textOf("a", "12x")).has_value());
  EXPECT_FALSE(parseProcessStat(textOf("a", "18446744073709551616")).has_value());
}

TEST(ProcessStatTest, TextWithoutANameIsRefused) {
  EXPECT_FALSE(parseProcessStat("").has_value());
  EXPECT_FALSE(parseProcessStat("12 bash S 1 12 12 0 -1 4194560 95 0 0 0 3 4 0 0 20 0 1 0 4711 2")
                   .has_value());
}

TEST(ProcessStatTest, ThisProcessStartedBeforeNow) {
  timespec now{};
  ASSERT_EQ(::clock_gettime(CLOCK_BOOTTIME, &now), 0);
  const long ticksPerSecond = ::sysconf(_SC_CLK_TCK);

  const auto stat = readOwnProcessStat();

  ASSERT_TRUE(stat.has_value());
  EXPECT_GT(stat->startTicks, 0U);
  EXPECT_LE(stat->startTicks, static_cast<std::uint64_t>((now.tv_sec + 1) * ticksPerSecond));
  const auto byNumber = readProcessStat(::getpid());
  ASSERT_TRUE(byNumber.has_value());
  EXPECT_EQ(byNumber->startTicks, stat->startTicks);
}

// A child with that name, which waits until the test ends it. It does not outlive this process.
class NamedChild {
 public:
  explicit NamedChild(const char* name) {
    EXPECT_EQ(::pipe(pipe_), 0);
    pid_ = ::fork();
    if (pid_ == 0) run(name);
    ::close(pipe_[1]);
  }
  NamedChild(const NamedChild&) = delete;
  NamedChild& operator=(const NamedChild&) = delete;
  ~NamedChild() {
    end();
    ::waitpid(pid_, nullptr, 0);
    ::close(pipe_[0]);
  }

  // Waits until the child has its name.
  [[nodiscard]] bool waitUntilNamed() const {
    char ready = 0;
    return ::read(pipe_[0], &ready, 1) == 1;
  }
  // Ends the child, which stays as a zombie because its parent has not waited for it.
  void end() const {
    ::kill(pid_, SIGKILL);
    siginfo_t info{};
    ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOWAIT);
  }
  [[nodiscard]] pid_t pid() const { return pid_; }

 private:
  [[noreturn]] void run(const char* name) const {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::prctl(PR_SET_NAME, name);
    const char ready = 'r';
    if (::write(pipe_[1], &ready, 1) == 1) ::pause();
    ::_exit(1);
  }

  int pipe_[2]{-1, -1};
  pid_t pid_ = -1;
};

TEST(ProcessStatTest, ProcessWithAnUnusualNameIsRead) {
  const NamedChild child("a) Z 1 2 (b");
  ASSERT_TRUE(child.waitUntilNamed());
  const auto own = readOwnProcessStat();

  const auto stat = readProcessStat(child.pid());

  ASSERT_TRUE(own.has_value());
  ASSERT_TRUE(stat.has_value());
  EXPECT_NE(stat->state, 'Z');
  EXPECT_GE(stat->startTicks, own->startTicks);
}

TEST(ProcessStatTest, ProcessThatHasEndedIsThereUntilItsParentHasWaited) {
  pid_t pid = 0;
  {
    const NamedChild child("ended");
    ASSERT_TRUE(child.waitUntilNamed());
    pid = child.pid();
    child.end();

    const auto stat = readProcessStat(pid);

    ASSERT_TRUE(stat.has_value());
    EXPECT_EQ(stat->state, 'Z');
  }
  EXPECT_FALSE(readProcessStat(pid).has_value());
}

}  // namespace
}  // namespace halvox::platform::linux_
