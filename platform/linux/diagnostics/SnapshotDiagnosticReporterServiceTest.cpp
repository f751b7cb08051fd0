#include "platform/linux/diagnostics/SnapshotDiagnosticReporterService.h"

#include <future>
#include <thread>

#include <sys/stat.h>

#include "platform/linux/diagnostics/SnapshotFixture.h"

namespace halvox::platform::linux_ {
namespace {

using ::testing::AllOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Key;
using ::testing::Not;
using ::testing::SizeIs;

// 2026-03-01 12:00:00 UTC
constexpr double kNoon = 1'772'366'400;

class SnapshotDiagnosticReporterServiceTest : public SnapshotFixture {
 protected:
  SnapshotDiagnosticReporterServiceTest() { platform.clock.setCurrentDate({kNoon}); }

  // A state source that answers only when the test releases it.
  void holdState() {
    service->setStateSource([this](const auto& callback) { asked_.set_value(callback); });
  }
  void answerState(const Dictionary& state) { waitUntilAsked()(state); }
  std::function<void(const Dictionary&)> waitUntilAsked() {
    auto asked = asked_.get_future();
    EXPECT_EQ(asked.wait_for(std::chrono::seconds(30)), std::future_status::ready);
    return asked.get();
  }

  std::promise<std::function<void(const Dictionary&)>> asked_;
};

TEST_F(SnapshotDiagnosticReporterServiceTest, SignatureHasItsFieldsAndValuesOnlyWhenThereAreAny) {
  start();
  const auto reporter = service->createReporter();

  const Dictionary plain{{"Domain", "a"},
                         {"Type", "b"},
                         {"SubType", "c"},
                         {"SubtypeContext", "d"},
                         {"DetectedProcess", "e"}};
  Dictionary withValues = plain;
  withValues.set("TriggerThresholdValues", Dictionary{{"x", 1}});

  EXPECT_EQ(reporter->makeSignature("a", "b", "c", "d", "e", std::nullopt), plain);
  EXPECT_EQ(reporter->makeSignature("a", "b", "c", "d", "e", Dictionary{{"x", 1}}), withValues);
}

TEST_F(SnapshotDiagnosticReporterServiceTest, ResponseNamesTheFileByTimeTypeAndSubType) {
  start();

  const Dictionary response = snapshot();

  const std::filesystem::path file = textOf(response, "path");
  EXPECT_EQ(file, directory() / "20260301T120000Z-haptics-Session_Generic.tar.zst");
  EXPECT_EQ(response.find("size_bytes")->toUInt64(), std::filesystem::file_size(file));
  EXPECT_GT(response.find("seconds")->toDouble(), 0);
  EXPECT_FALSE(response.contains("error"));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, ArchiveIsForItsOwnerAloneAndNothingElseIsLeft) {
  start();

  const std::string file = textOf(snapshot(), "path");

  struct stat status {};
  ASSERT_EQ(::stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_THAT(names(), SizeIs(1));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, ArchiveHasThePartsAndNamesTheMissingOnes) {
  log = [] { return LogMemory::Contents{.text = "a line\n", .lines = 1, .added = 1}; };
  writeText(options.paths.alsa / "cards", "0 [Dummy]\n");
  writeText(options.paths.alsa / "version", "Driver Version k1\n");
  options.paths.pipeWireDump = {"/nowhere/pw-dump"};
  start();
  service->setStateSource([](const auto& callback) { callback({{"clients", Array{}}}); });

  auto files = archiveFiles(textOf(snapshot(), "path"));

  EXPECT_EQ(files["signature.json"],
            R"({"Domain":"Acoustat","Type":"haptics","SubType":"Session_Generic",)"
            R"("SubtypeContext":"Joulebook","DetectedProcess":"player"})"
            "\n");
  EXPECT_EQ(files["state.json"], "{\"clients\":[]}\n");
  EXPECT_EQ(files["log.txt"], "a line\n");
  EXPECT_EQ(files["asound/cards"], "0 [Dummy]\n");
  EXPECT_THAT(files["system.json"],
              AllOf(HasSubstr("Driver Version k1"), HasSubstr("version 1"), HasSubstr("release")));
  EXPECT_THAT(files, Not(Contains(Key("pw-dump.json"))));
  EXPECT_THAT(files["manifest.json"], AllOf(HasSubstr("/nowhere/pw-dump is not installed"),
                                            HasSubstr("no process of that name is running"),
                                            HasSubstr(R"("name":"log.txt")")));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, EventAndPayloadOfTheRequestAreInTheArchive) {
  start();
  std::promise<Dictionary> response;

  service->createReporter()->requestSnapshot(
      {}, 1.5, Dictionary{{"e", 1}}, Dictionary{{"p", 2}},
      [&](const Dictionary& got) { response.set_value(got); });
  const std::string file = textOf(responseOf(response.get_future()), "path");

  EXPECT_THAT(file, EndsWith("Z-unknown-unknown.tar.zst"));
  EXPECT_EQ(archiveFiles(file)["request.json"],
            "{\"duration_seconds\":1.5,\"event\":{\"e\":1},\"payload\":{\"p\":2}}\n");
}

TEST_F(SnapshotDiagnosticReporterServiceTest, RequestDuringAnotherIsRefusedAtOnceAndCounted) {
  start();
  holdState();
  auto first = request();
  const auto answer = waitUntilAsked();

  auto second = request();
  EXPECT_NE(second.wait_for(std::chrono::seconds(0)), std::future_status::ready);
  platform.dispatch.advance(std::chrono::nanoseconds(0));

  EXPECT_EQ(textOf(responseOf(std::move(second)), "error"), "another snapshot is being taken");
  EXPECT_EQ(counted("dropped: another in progress"), 1U);
  answer({});
  EXPECT_FALSE(responseOf(std::move(first)).contains("error"));
  expectBalance();
}

TEST_F(SnapshotDiagnosticReporterServiceTest, ReplyMayAskForTheNextSnapshot) {
  start();
  std::promise<Dictionary> second;
  const auto reporter = service->createReporter();

  reporter->requestSnapshot({}, 0, std::nullopt, std::nullopt, [&](const Dictionary&) {
    reporter->requestSnapshot({}, 0, std::nullopt, std::nullopt,
                              [&](const Dictionary& got) { second.set_value(got); });
  });

  EXPECT_THAT(textOf(responseOf(second.get_future()), "path"), HasSubstr("20260301T120000Z-2-"));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, OnlyTheNewestAreKept) {
  options.keep = 3;
  start();
  std::vector<std::string> all;

  for (int second = 0; second < 5; ++second) {
    platform.clock.setCurrentDate({kNoon + second});
    all.push_back(std::filesystem::path(textOf(snapshot(), "path")).filename().string());
  }

  EXPECT_THAT(names(), ElementsAre(all[2], all[3], all[4]));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, MissingStateCostsABoundedTimeAndIsNamed) {
  options.stateWithin = std::chrono::milliseconds(50);
  start();
  service->setStateSource([](const auto&) {});

  auto files = archiveFiles(textOf(snapshot(), "path"));

  EXPECT_THAT(files, Not(Contains(Key("state.json"))));
  EXPECT_THAT(files["manifest.json"], HasSubstr("the service did not answer in time"));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, SlowProgramsCostABoundedTime) {
  options.dumpWithin = std::chrono::milliseconds(100);
  options.paths.pipeWireDump = {"sleep", "60"};
  start();
  const auto begun = std::chrono::steady_clock::now();

  auto files = archiveFiles(textOf(snapshot(), "path"));

  EXPECT_LT(std::chrono::steady_clock::now() - begun, std::chrono::seconds(10));
  EXPECT_THAT(files["manifest.json"], HasSubstr("sleep: did not end in time"));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, PartsBeyondTheSizeLimitAreOmitted) {
  options.mostBytes = (1U << 20U) + 4000;  // of which 1 MiB is reserved for the manifest
  log = [] { return LogMemory::Contents{.text = std::string(5000, 'x'), .lines = 1, .added = 1}; };
  start();

  auto files = archiveFiles(textOf(snapshot(), "path"));

  EXPECT_THAT(files, Not(Contains(Key("log.txt"))));
  EXPECT_THAT(files["manifest.json"], HasSubstr("the size limit of the archive was reached"));
}

TEST_F(SnapshotDiagnosticReporterServiceTest, EachSnapshotIsRecordedOnce) {
  struct : SnapshotRecorder {
    void recordSnapshot(Date time, const Dictionary& signature,
                        const std::filesystem::path& path) override {
      records.push_back(std::to_string(static_cast<std::int64_t>(time.secondsSince1970)) + " " +
                        std::string(signature.find("Type")->string()) + " " +
                        path.filename().string());
    }
    std::vector<std::string> records;
  } journal;
  recorder = &journal;
  start();

  const Dictionary response = snapshot();
  service.reset();

  EXPECT_THAT(journal.records,
              ElementsAre("1772366400 haptics 20260301T120000Z-haptics-Session_Generic.tar.zst"));
  EXPECT_EQ(counted("delivered"), 1U);
}

TEST_F(SnapshotDiagnosticReporterServiceTest, StopDuringASnapshotAnswersAndLeavesNoFile) {
  options.stateWithin = std::chrono::seconds(60);
  options.collectWithin = std::chrono::seconds(60);
  start();
  holdState();
  auto response = request();
  const auto answer = waitUntilAsked();

  const auto begun = std::chrono::steady_clock::now();
  service->stop();

  EXPECT_LT(std::chrono::steady_clock::now() - begun, std::chrono::seconds(5));
  EXPECT_EQ(textOf(responseOf(std::move(response)), "error"), "the service is ending");
  EXPECT_THAT(names(), IsEmpty());
  answer({});  // a late answer must do no harm
  expectBalance();
}

TEST_F(SnapshotDiagnosticReporterServiceTest, StopKillsAProgramThatRuns) {
  options.dumpWithin = std::chrono::seconds(60);
  options.collectWithin = std::chrono::seconds(60);
  const std::filesystem::path pipe = scratch.path() / "running";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  options.paths.pipeWireDump = {"sh", "-c", "echo x > '" + pipe.native() + "'; exec sleep 60"};
  start();
  auto response = request();
  ASSERT_EQ(readText(pipe), "x\n");

  service->stop();

  EXPECT_EQ(textOf(responseOf(std::move(response)), "error"), "the service is ending");
  EXPECT_THAT(names(), IsEmpty());
}

TEST_F(SnapshotDiagnosticReporterServiceTest, RequestAfterTheStopIsRefused) {
  start();
  service->stop();

  auto response = request();
  platform.dispatch.advance(std::chrono::nanoseconds(0));

  EXPECT_EQ(textOf(responseOf(std::move(response)), "error"), "the service is ending");
  expectBalance();
}

TEST_F(SnapshotDiagnosticReporterServiceTest, RequestsOfManyThreadsAreAllAnswered) {
  start();
  std::vector<std::future<Dictionary>> responses(40);
  std::vector<std::thread> threads;

  for (std::size_t thread = 0; thread < 4; ++thread) {
    threads.emplace_back([&, thread] {
      for (std::size_t at = thread; at < responses.size(); at += 4) responses[at] = request();
    });
  }
  for (std::thread& thread : threads) thread.join();
  platform.dispatch.advance(std::chrono::nanoseconds(0));

  for (auto& response : responses) EXPECT_FALSE(responseOf(std::move(response)).empty());
  service.reset();
  EXPECT_EQ(counted("received"), 40U);
  EXPECT_GT(counted("delivered"), 0U);
  expectBalance();
}

}  // namespace
}  // namespace halvox::platform::linux_
