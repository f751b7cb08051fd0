#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "client/testing/TestService.h"
#include "platform/fake/FakePlatform.h"
#include "platform/linux/base/ChildProcess.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/diagnostics/SnapshotArchive.h"
#include "platform/linux/store/SqliteStore.h"

// The built program, run against a fake service.
namespace halvox::tools {
namespace {

using platform::linux_::ChildEnd;
using platform::linux_::ChildProcess;
using platform::linux_::makePipe;
using platform::linux_::UniqueFd;

struct Outcome {
  int status = -1;  // negative: the signal that ended it
  std::string out;
};

// Runs halvoxctl with its standard error thrown away and these words on its standard input.
Outcome runProgram(std::vector<std::string> arguments, const std::string& input = "",
                   const char* output = nullptr) {
  arguments.insert(arguments.begin(), HALVOXCTL);
  auto in = makePipe();
  auto out = makePipe();
  if (!in || !out) return {};
  const UniqueFd file(output == nullptr ? -1 : open(output, O_WRONLY | O_CLOEXEC));
  auto child = ChildProcess::start(
      {.command = arguments,
       .descriptors = {
           {.number = STDIN_FILENO, .ours = in->reader.get()},
           {.number = STDOUT_FILENO, .ours = output == nullptr ? out->writer.get() : file.get()},
           {.number = STDERR_FILENO}}});
  if (!child) return {};

  out->writer.reset();
  static_cast<void>(!write(in->writer.get(), input.data(), input.size()));
  in->writer.reset();
  Outcome outcome;
  std::array<char, 4096> buffer{};
  for (ssize_t size = 0; (size = read(out->reader.get(), buffer.data(), buffer.size())) > 0;) {
    outcome.out.append(buffer.data(), static_cast<std::size_t>(size));
  }
  const ChildEnd end = child->wait();
  outcome.status = end.signal == 0 ? end.status : -end.signal;
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

TEST_F(HalvoxctlTest, SuccessIsStatus0WithoutOutput) {
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

TEST_F(HalvoxctlTest, TheShellContinuesAfterErrors) {
  const auto outcome = runProgram(with({"shell"}), "create x\ncreate 7\nlist\nquit\nlist\n");

  EXPECT_EQ(outcome.status, 2);
  EXPECT_EQ(outcome.out, "7\n");
}

// A configuration whose storage has one capture, archive and record.
class HalvoxctlSnapshotsTest : public testing::Test {
 protected:
  HalvoxctlSnapshotsTest() {
    std::filesystem::create_directories(scratch_.path("state/snapshots"));
    std::ofstream(scratch_.path("halvox.toml"))
        << "[storage]\ndirectory = \"" << scratch_.path("state") << "\"\n";
    setenv("HALVOX_CONFIG", scratch_.path("halvox.toml").c_str(), 1);
    makeArchive();
    storeRecord();
  }
  ~HalvoxctlSnapshotsTest() override { unsetenv("HALVOX_CONFIG"); }

  void makeArchive() const {
    platform::linux_::SnapshotArchive archive(archive_, 1'000'000);
    EXPECT_TRUE(archive.open());
    EXPECT_TRUE(archive.add("signature.json", R"({"Type":"haptics"})"));
    EXPECT_TRUE(archive.add("manifest.json",
                            R"({"version":1,"time":"2026-03-01T12:00:00Z","seconds":1,)"
                            R"("items":[]})"));
    EXPECT_TRUE(archive.finish());
    archive.keep();
  }
  void storeRecord() const {
    platform::FakePlatform platform;
    platform::linux_::Backpressure backpressure;
    platform::linux_::StoreOptions options;
    options.directory = scratch_.path("state");
    platform::linux_::SqliteStore store(options,
                                        {platform.clock, platform.statistics, backpressure});
    EXPECT_TRUE(store.open());
    store.snapshots().add({.time = platform.clock.currentDate().secondsSince1970,
                           .signature = {{"Type", "haptics"}},
                           .path = archive_});
  }

  client::ScratchDirectory scratch_;
  std::string archive_ = scratch_.path("state/snapshots/20260301T120000Z-haptics-Generic.tar.zst");
};

TEST_F(HalvoxctlSnapshotsTest, SnapshotsOfThemselvesAreListed) {
  const auto outcome = runProgram({"snapshots"});

  EXPECT_EQ(outcome.status, 0);
  EXPECT_NE(outcome.out.find("  " + archive_ + "  Type=haptics\n"), std::string::npos)
      << outcome.out;
}

TEST_F(HalvoxctlSnapshotsTest, ShowsTheNewest) {
  const auto outcome = runProgram({"snapshots", "show", "newest"});

  EXPECT_EQ(outcome.status, 0);
  EXPECT_NE(outcome.out.find("taken 2026-03-01T12:00:00Z"), std::string::npos) << outcome.out;
  EXPECT_NE(outcome.out.find("  Type  haptics\n"), std::string::npos) << outcome.out;
}

TEST_F(HalvoxctlSnapshotsTest, ExtractsAFile) {
  const std::string to = scratch_.path("to");

  EXPECT_EQ(runProgram({"snapshots", "extract", archive_, "--to", to}).status, 0);

  EXPECT_TRUE(std::filesystem::exists(to + "/signature.json"));
  EXPECT_TRUE(std::filesystem::exists(to + "/manifest.json"));
}

}  // namespace
}  // namespace halvox::tools
