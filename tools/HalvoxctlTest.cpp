#include <array>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include "client/TestService.h"
#include "platform/linux/UniqueHandle.h"

// The built program, run against a service that plays along.
namespace halvox::tools {
namespace {

using platform::linux_::UniqueFd;

struct Outcome {
  int status = -1;  // negative: the signal that ended it
  std::string out;
};

// Runs halvoxctl with its standard error thrown away and these words on its standard input.
Outcome runProgram(std::vector<std::string> arguments, const std::string& input = "",
                   const char* output = nullptr) {
  arguments.insert(arguments.begin(), HALVOXCTL);
  std::vector<char*> pointers;
  pointers.reserve(arguments.size() + 1);
  for (auto& argument : arguments) pointers.push_back(argument.data());
  pointers.push_back(nullptr);
  int in[2];
  int out[2];
  if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0) return {};
  UniqueFd inRead(in[0]), inWrite(in[1]), outRead(out[0]), outWrite(out[1]);

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, inRead.get(), STDIN_FILENO);
  if (output == nullptr) {
    posix_spawn_file_actions_adddup2(&actions, outWrite.get(), STDOUT_FILENO);
  } else {
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output, O_WRONLY, 0);
  }
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  pid_t pid = 0;
  const int spawned = posix_spawn(&pid, HALVOXCTL, &actions, nullptr, pointers.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (spawned != 0) return {};

  outWrite.reset();
  static_cast<void>(!write(inWrite.get(), input.data(), input.size()));
  inWrite.reset();
  Outcome outcome;
  std::array<char, 4096> buffer{};
  for (ssize_t size = 0; (size = read(outRead.get(), buffer.data(), buffer.size())) > 0;) {
    outcome.out.append(buffer.data(), static_cast<std::size_t>(size));
  }
  int status = 0;
  waitpid(pid, &status, 0);
  outcome.status = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  return outcome;
}

class HalvoxctlTest : public testing::Test {
 protected:
  std::vector<std::string> with(std::vector<std::string> arguments) const {
    arguments.insert(arguments.end(), {"--socket", scratch_.path("reporting.sock")});
    return arguments;
  }

  client::ScratchDirectory scratch_;
  client::TestService service_{scratch_.path("reporting.sock")};
};

TEST_F(HalvoxctlTest, DoneIsStatus0AndSaysNothing) {
  const auto outcome = runProgram(with({"create", "7"}));

  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.out, "");
  EXPECT_EQ(service_.members(), "createReportingSession");
}

TEST_F(HalvoxctlTest, ANoOfTheServiceIsStatus1) {
  EXPECT_EQ(runProgram(with({"valid", "7"})).status, 1);
  service_.refuse("createReportingSession", "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(runProgram(with({"create", "7"})).status, 1);
}

TEST_F(HalvoxctlTest, BadArgumentsAreStatus2) {
  EXPECT_EQ(runProgram({"create", "seven"}).status, 2);
  EXPECT_EQ(runProgram({}).status, 2);
  EXPECT_EQ(runProgram({"run", "/nonexistent"}).status, 2);
  EXPECT_EQ(service_.members(), "");
}

TEST_F(HalvoxctlTest, NoServiceIsStatus69) {
  service_.vanish();

  EXPECT_EQ(runProgram(with({"list"})).status, 69);
  EXPECT_EQ(runProgram({"events", "--database", scratch_.path("halvox.db")}).status, 69);
}

TEST_F(HalvoxctlTest, AStalledServiceRunsIntoTheTimeOutWithStatus69) {
  service_.setStalled(true);

  EXPECT_EQ(runProgram(with({"list", "--timeout", "0.1"})).status, 69);
  service_.setStalled(false);
}

TEST_F(HalvoxctlTest, HelpAndVersionAreStatus0) {
  EXPECT_EQ(runProgram({"--help"}).status, 0);
  EXPECT_EQ(runProgram({"send", "--help"}).status, 0);
  EXPECT_EQ(runProgram({"--version"}).out.substr(0, 10), "halvoxctl ");
}

TEST_F(HalvoxctlTest, AnOutputThatTakesNothingIsStatus74) {
  EXPECT_EQ(runProgram({"--help"}, "", "/dev/full").status, 74);
}

TEST_F(HalvoxctlTest, SendsWhatItReadsFromItsInput) {
  const auto outcome = runProgram(
      with({"send", "--all", "--category", "Volume", "--type", "State", "-"}), R"({"gain": 0.5})");

  EXPECT_EQ(outcome.status, 0);
  const auto calls = service_.calls();
  ASSERT_EQ(calls.size(), 1U);
  EXPECT_EQ(calls[0].arguments, (std::vector<client::Value>{client::Dictionary{{"gain", 0.5}}, 14,
                                                            18, platform::Array{}}));
}

TEST_F(HalvoxctlTest, RunsAScriptOverOneConnection) {
  const auto outcome = runProgram(with({"run", "-", "--json"}), "create 7\nlist\nvalid 7\n");

  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.out,
            "{\"command\":\"create\",\"id\":7,\"result\":true}\n"
            "{\"command\":\"list\",\"reporters\":[7]}\n"
            "{\"command\":\"valid\",\"id\":7,\"result\":true,"
            "\"answer\":{\"reporterID\":7,\"serviceType\":65535}}\n");
}

TEST_F(HalvoxctlTest, TheShellGoesOnBehindMistakes) {
  const auto outcome = runProgram(with({"shell"}), "create x\ncreate 7\nlist\nquit\nlist\n");

  EXPECT_EQ(outcome.status, 2);
  EXPECT_EQ(outcome.out, "7\n");
}

}  // namespace
}  // namespace halvox::tools
