#include "platform/linux/diagnostics/Child.h"

#include <csignal>
#include <cstdlib>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace halvox::platform::linux_ {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

class ChildTest : public ::testing::Test {
 protected:
  Finding run(const std::vector<std::string>& command, std::size_t most = 1000,
              std::chrono::milliseconds within = std::chrono::seconds(30)) {
    return runProgram(command, most,
                      CaptureDeadline(stop_, CaptureDeadline::Clock::now() + within));
  }
  WaitableFlag stop_;
};

TEST_F(ChildTest, ReturnsWhatAProgramPrints) {
  const Finding finding = run({"echo", "a b", "$HOME; x"});

  EXPECT_EQ(finding.bytes, "a b $HOME; x\n");
  EXPECT_TRUE(finding.isCollected());
}

TEST_F(ChildTest, MissingProgramAndFailingProgramAreNamed) {
  EXPECT_EQ(run({"no-such-program"}).failure, "no-such-program is not installed");
  EXPECT_EQ(run({"sh", "-c", "exit 3"}).failure, "sh: ended with status 3");
  EXPECT_EQ(run({"sh", "-c", "kill -TERM $$"}).failure, "sh: killed by signal 15");
}

TEST_F(ChildTest, KillsASlowProgramWithItsChildren) {
  const auto begun = CaptureDeadline::Clock::now();

  const Finding finding =
      run({"sh", "-c", "sleep 60 & sleep 60"}, 1000, std::chrono::milliseconds(100));

  EXPECT_EQ(finding.failure, "sh: did not end in time and was killed");
  EXPECT_LT(CaptureDeadline::Clock::now() - begun, std::chrono::seconds(20));
}

TEST_F(ChildTest, ProgramThatClosesItsOutputAndStaysIsKilled) {
  const Finding finding =
      run({"sh", "-c", "exec >&-; exec sleep 60"}, 1000, std::chrono::milliseconds(100));

  EXPECT_EQ(finding.failure, "sh: did not end in time and was killed");
}

TEST_F(ChildTest, EndlessOutputIsCut) {
  const Finding finding = run({"yes"}, 1000);

  EXPECT_EQ(finding.bytes.size(), 1000U);
  EXPECT_TRUE(finding.isCut);
}

TEST_F(ChildTest, RaisedFlagEndsTheProgram) {
  stop_.raise();

  EXPECT_EQ(run({"sleep", "60"}).failure, "sleep: did not end in time and was killed");
}

TEST_F(ChildTest, GetsNeitherOurSignalsNorOurVariables) {
  const auto before = std::signal(SIGPIPE, SIG_IGN);
  ::setenv("HALVOX_SECRET", "x", 1);

  const Finding status = run({"grep", "^Sig[BI]", "/proc/self/status"});
  const Finding environment = run({"env"});

  ::unsetenv("HALVOX_SECRET");
  std::signal(SIGPIPE, before);
  const std::size_t ignored = status.bytes.find("SigIgn:");
  ASSERT_NE(ignored, std::string::npos);
  EXPECT_THAT(status.bytes, HasSubstr("SigBlk:\t0000000000000000"));
  // Test only one signal, because two signals that the C library uses itself are always ignored.
  EXPECT_EQ(std::stoull(status.bytes.substr(ignored + 8), nullptr, 16) & (1U << (SIGPIPE - 1)), 0U);
  EXPECT_THAT(environment.bytes, Not(HasSubstr("HALVOX_SECRET")));
}

}  // namespace
}  // namespace halvox::platform::linux_
