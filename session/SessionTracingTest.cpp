#include <algorithm>
#include <memory>
#include <semaphore>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "session/HVReportingSession.h"
#include "session/TraceConstants.h"
#include "tracing/TraceRunner.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::JournalKind;
using platform::LogLevel;
using platform::Value;
using Texts = std::vector<std::string>;

constexpr const char* kFile = "/params.plist";

class SessionTracingTest : public testing::Test {
 protected:
  SessionTracingTest() {
    platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOn);
    platform_.propertyLists.setFile(
        kFile, Dictionary{{"Children", Array{Dictionary{{"Name", "T"}, {"Children", Array{}}}}}});
    session_->setServiceType(AudioServiceType::kTest);
    forgetWhatHappened();
  }
  void forgetWhatHappened() {
    platform_.journal.clear();
    platform_.log.clear();
  }
  void chooseRunner() {
    session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace},
                                          {HVReportingMeridelPlistFilePath, kFile}});
  }
  void chooseFramework() {
    session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeArtrace}});
  }
  static Dictionary paramsOf(const char* name, const char* begin, const char* end) {
    const Dictionary point{{"Name", name},
                           {"Type", "Interval"},
                           {"KTraceCodeBegin", begin},
                           {"KTraceCodeEnd", end},
                           {"EventsMatchedBy", "Thread"}};
    return {{"Children", Array{Dictionary{{"Name", "T"}, {"Children", Array{point}}}}}};
  }
  void recordInterval(std::uint64_t begin, std::uint64_t end) {
    platform_.ktrace.setEvents(
        {{.timestamp = begin, .debugid = 0x21040010}, {.timestamp = end, .debugid = 0x21040014}});
  }
  // Runs what the back-ends do on their own queues.
  void letRun() { platform_.dispatch.runUntilIdle(); }
  // The operations that both back-ends were asked for.
  Texts operations() const { return platform_.journal.texts(JournalKind::kNote); }
  // The lines of one level and category.
  Texts lines(LogLevel level, std::string_view category) const {
    Texts texts;
    for (const auto& line : platform_.log.lines(level)) {
      if (line.category == category) texts.push_back(line.text);
    }
    return texts;
  }

  platform::FakePlatform platform_;
  std::shared_ptr<HVReportingSession> session_ = std::make_shared<HVReportingSession>(
      ReporterID{7}, HVReportingSession::ProcessIdentifiers{12});
};

const Texts kFrameworkStart{"trace configuration", "trace session", "trace delegate",
                            "trace start"};

// --- Choosing -----------------------------------------------------------------------------------

TEST_F(SessionTracingTest, WithoutTheFeatureNothingIsTraced) {
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOff);
  chooseRunner();

  session_->start();
  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_FALSE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, OnlyTestSessionsTrace) {
  for (const auto type : {AudioServiceType::kHaptics, AudioServiceType::kUnknown}) {
    session_->setServiceType(type);
    chooseRunner();

    session_->start();
    session_->stop();
  }
  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, WithoutATraceTypeTheFrameworkIsChosen) {
  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
  EXPECT_EQ(platform_.performanceTraces.templates(), std::vector<std::int32_t>{1});
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, AnyOtherTraceTypeChoosesTheFramework) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeArtrace},
                                        {HVReportingMeridelPlistFilePath, kFile}});

  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
  EXPECT_EQ(session_->tracing().traceRunner(), nullptr);
}

TEST_F(SessionTracingTest, ATypeInsideAnArrayChoosesTheFramework) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, Array{HVReportingTraceTypeKtrace}}});

  session_->start();

  EXPECT_EQ(operations(), kFrameworkStart);
}

// --- The runner ---------------------------------------------------------------------------------

TEST_F(SessionTracingTest, RunnerRecordsFromStartToStop) {
  chooseRunner();

  session_->start();
  EXPECT_TRUE(session_->tracing().startedTracing());
  EXPECT_EQ(session_->tracing().tracingFileName(), kFile);
  EXPECT_EQ(session_->tracing().traceParams()->name, "T");
  EXPECT_EQ(session_->tracing().traceRunner()->getNumTraces(), 1U);
  session_->stop();

  EXPECT_FALSE(session_->tracing().startedTracing());
  EXPECT_EQ(operations(),
            (Texts{"ktrace create", "ktrace completion handler", "ktrace wall times on",
                   "ktrace range 0x21040000 to 0x2104408A", "ktrace start", "ktrace end 0",
                   "ktrace destroy", "results open", "results close"}));
  EXPECT_EQ(platform_.resultsFiles.files().size(), 1U);
}

TEST_F(SessionTracingTest, LinkIsAskedForBeforeTheTraceIsSetUp) {
  chooseRunner();
  session_->setTlmReportingEnabled(true);

  session_->start();

  std::vector<std::string> labels;
  for (const auto& queue : platform_.dispatch.createdQueues()) labels.push_back(queue.label);
  ASSERT_GE(labels.size(), 2U);
  EXPECT_EQ(labels[0], "com.tarno.halvox.session.tlmreporting");
  EXPECT_EQ(labels[1], "Tracing Queue");
  session_->stop();
}

// A trace may begin and fail before the call that starts it returns.
TEST_F(SessionTracingTest, SessionIsMarkedAsTracedBeforeTheTraceIsAskedToStart) {
  std::vector<std::string> asked;
  platform_.journal.whenRecorded([&](const platform::JournalEntry& entry) {
    if (entry.text != "trace start" && entry.text != "ktrace create") return;
    EXPECT_TRUE(session_->tracing().startedTracing()) << entry.text;
    asked.push_back(entry.text);
  });

  session_->start();
  platform_.performanceTraces.completeAtStop("file:///one");
  session_->stop();
  EXPECT_EQ(asked, Texts{"trace start"});
  chooseRunner();
  session_->start();
  session_->stop();

  EXPECT_EQ(asked, (Texts{"trace start", "ktrace create"}));
}

TEST_F(SessionTracingTest, SettingUpTheRunnerIsLoggedByTheSession) {
  chooseRunner();

  session_->start();

  EXPECT_THAT(lines(LogLevel::kDebug, "hvrr"),
              testing::Contains("Got the tracefile /params.plist, setting up trace"));
  EXPECT_THAT(lines(LogLevel::kInfo, "hvrr"), testing::Contains("Setting up tracing for test"));
  session_->stop();
}

TEST_F(SessionTracingTest, WithoutAPathTheRunnerDoesNotStart) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace}});

  session_->start();
  EXPECT_FALSE(session_->tracing().startedTracing());
  session_->stop();

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, EmptyPathIsLoggedAndNothingStarts) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace},
                                        {HVReportingMeridelPlistFilePath, ""}});

  session_->start();

  EXPECT_THAT(lines(LogLevel::kError, "hvrr"),
              testing::ElementsAre("TracefileName empty. Failed to setup tracing"));
  EXPECT_FALSE(session_->tracing().startedTracing());
  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, SecondStartDoesNotTraceAgain) {
  chooseRunner();
  session_->start();
  forgetWhatHappened();

  session_->start();

  EXPECT_TRUE(operations().empty());
  session_->stop();
}

TEST_F(SessionTracingTest, NextRunMakesANewRunner) {
  chooseRunner();
  session_->start();
  const auto first = session_->tracing().traceRunner();
  session_->stop();

  session_->start();

  EXPECT_NE(session_->tracing().traceRunner(), first);
  session_->stop();
}

TEST_F(SessionTracingTest, EmptyPathOfALaterRunRecordsTheSameWithANewRunner) {
  chooseRunner();
  session_->start();
  const auto first = session_->tracing().traceRunner();
  const auto params = session_->tracing().traceParams();
  session_->stop();
  session_->setConfiguration(Dictionary{{HVReportingMeridelPlistFilePath, ""}});
  forgetWhatHappened();

  session_->start();
  EXPECT_TRUE(session_->tracing().startedTracing());
  session_->stop();

  EXPECT_NE(session_->tracing().traceRunner(), first);
  EXPECT_EQ(session_->tracing().traceParams(), params);
  EXPECT_EQ(session_->tracing().tracingFileName(), kFile);
  EXPECT_THAT(operations(), testing::Contains("ktrace start"));
  EXPECT_THAT(operations(), testing::Contains("ktrace destroy"));
  EXPECT_EQ(lines(LogLevel::kError, "hvrr"), Texts{"TracefileName empty. Failed to setup tracing"});
}

TEST_F(SessionTracingTest, ResultsHoldTheValuesOfTheirOwnRunOnly) {
  platform_.propertyLists.setFile(kFile, paramsOf("IO", "0x21040010", "0x21040014"));
  chooseRunner();
  recordInterval(10, 35);
  session_->start();
  session_->stop();
  session_->setConfiguration(Dictionary{{HVReportingMeridelPlistFilePath, ""}});
  recordInterval(100, 160);

  session_->start();
  session_->stop();

  const auto files = platform_.resultsFiles.files();
  ASSERT_EQ(files.size(), 2U);
  ASSERT_EQ(files[0].measurements.size(), 1U);
  EXPECT_EQ(files[0].measurements[0].value, 25);
  ASSERT_EQ(files[1].measurements.size(), 1U);
  EXPECT_EQ(files[1].measurements[0].value, 60);
}

TEST_F(SessionTracingTest, RunnerAndParametersStayWithTheSessionAfterTheStop) {
  chooseRunner();
  session_->start();
  const auto runner = session_->tracing().traceRunner();
  session_->stop();

  EXPECT_EQ(session_->tracing().traceRunner(), runner);
  EXPECT_EQ(session_->tracing().traceParams()->name, "T");
}

// --- The framework ------------------------------------------------------------------------------

TEST_F(SessionTracingTest, FrameworkTraceEndsWithItsURL) {
  platform_.performanceTraces.completeAtStop("file:///traces/one");
  session_->start();
  letRun();
  forgetWhatHappened();

  session_->stop();

  EXPECT_EQ(operations(), (Texts{"trace stop", "trace without delegate"}));
  EXPECT_EQ(session_->tracing().getKQTraceFileURL(), "file:///traces/one");
  EXPECT_EQ(session_->tracing().traceSession(), nullptr);
  EXPECT_FALSE(session_->tracing().startedTracing());
  EXPECT_EQ(lines(LogLevel::kInfo, "hvrt"),
            (Texts{"Performance Trace Stopped", "Performance Trace Completed: /traces/one"}));
}

// The signal wakes the thread that waits for the trace. The trace is released before the signal and
// the URL is stored after it.
TEST_F(SessionTracingTest, CompletionForgetsTheTraceThenSignalsThenStoresTheURL) {
  session_->start();
  forgetWhatHappened();
  std::vector<std::optional<std::string>> urls;
  platform_.dispatch.whenSignalled([&] {
    urls.push_back(session_->tracing().getKQTraceFileURL());
    EXPECT_EQ(session_->tracing().traceSession(), nullptr);
    EXPECT_EQ(operations(), Texts{"trace without delegate"});
    EXPECT_TRUE(platform_.log.lines().empty());
  });

  platform_.performanceTraces.delegate()->kqTraceDidComplete("file:///one", 0, std::nullopt);

  EXPECT_EQ(urls, (std::vector<std::optional<std::string>>{std::nullopt}));
  EXPECT_EQ(session_->tracing().getKQTraceFileURL(), "file:///one");
}

TEST_F(SessionTracingTest, StartOfATraceIsWrittenToTheGeneralLogToo) {
  session_->start();
  EXPECT_TRUE(lines(LogLevel::kInfo, "hvrt").empty());

  letRun();

  EXPECT_EQ(lines(LogLevel::kInfo, "hvrt"), Texts{"Performance Trace Started"});
  ASSERT_EQ(lines(LogLevel::kDefault, "general").size(), 1U);
  EXPECT_EQ(platform_.log.lines(LogLevel::kDefault).back().line, "started performance trace.");
}

TEST_F(SessionTracingTest, FailedStartClearsTheTraceButStaysStarted) {
  platform_.performanceTraces.failStarts("no recorder");
  session_->start();

  letRun();

  EXPECT_EQ(session_->tracing().traceSession(), nullptr);
  EXPECT_EQ(session_->tracing().traceConfig(), nullptr);
  EXPECT_TRUE(session_->tracing().startedTracing());
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidStart no recorder"});
}

TEST_F(SessionTracingTest, StopAfterAFailedStartWaitsForWhatNeverComes) {
  platform_.performanceTraces.failStarts("no recorder");
  session_->start();
  letRun();
  forgetWhatHappened();

  // The fake throws where a thread would wait for ever.
  EXPECT_THROW(session_->stop(), std::logic_error);

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, FailedStopClearsTheTrace) {
  session_->start();

  platform_.performanceTraces.delegate()->kqTraceDidStop(Error{.description = "disk"});

  EXPECT_EQ(session_->tracing().traceSession(), nullptr);
  EXPECT_NE(session_->tracing().traceConfig(), nullptr);
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidStop disk"});
}

// The end of a trace is the last thing that a stop waits for. From there on this thread holds the
// history: the stop cannot take it, and the session must stay marked as started.
TEST_F(SessionTracingTest, StopClearsTheFlagAfterTheHistory) {
  constexpr int kRounds = 10;
  constexpr int kYields = 50;
  platform_.performanceTraces.completeAtStop("file:///one");
  for (int round = 0; round < kRounds; ++round) {
    session_->start();
    std::binary_semaphore traceEnds{0};
    std::binary_semaphore historyIsHeld{0};
    platform_.dispatch.whenSignalled([&] {
      traceEnds.release();
      historyIsHeld.acquire();
    });
    const std::jthread stopper([session = session_] { session->stop(); });

    traceEnds.acquire();
    const auto history = session_->nestedAggregatedPayloadData();
    historyIsHeld.release();

    for (int turn = 0; turn < kYields; ++turn) {
      ASSERT_TRUE(session_->started());
      std::this_thread::yield();
    }
    EXPECT_TRUE(history->has_value());
  }
}

TEST_F(SessionTracingTest, CompletionWithAnErrorEndsTheWaitWithoutAURL) {
  platform_.performanceTraces.failSaves("not saved");
  session_->start();

  session_->stop();  // would never return without the signal

  EXPECT_EQ(session_->tracing().getKQTraceFileURL(), std::nullopt);
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidComplete not saved"});
}

TEST_F(SessionTracingTest, BackEndIsChosenAgainAtTheStop) {
  session_->start();
  chooseRunner();  // the framework records, but the stop looks for a runner, and there is none
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_FALSE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, FinishedRunnerIsNotStoppedInPlaceOfTheFrameworksTrace) {
  chooseRunner();
  session_->start();
  session_->stop();
  chooseFramework();
  session_->start();
  letRun();
  chooseRunner();
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_FALSE(session_->started());
  EXPECT_FALSE(session_->tracing().startedTracing());
  EXPECT_EQ(platform_.resultsFiles.files().size(), 1U);
}

TEST_F(SessionTracingTest, ATraceThatNoStopEndedIsGivenUpForTheNextOne) {
  session_->start();
  letRun();
  chooseRunner();
  session_->stop();
  EXPECT_EQ(platform_.performanceTraces.recordings(), 1U);
  chooseFramework();

  session_->start();
  letRun();
  EXPECT_EQ(platform_.performanceTraces.recordings(), 1U);
  session_->stop();

  EXPECT_EQ(platform_.performanceTraces.recordings(), 0U);
}

TEST_F(SessionTracingTest, CallbacksOfAReplacedTraceAreIgnored) {
  platform_.performanceTraces.failStarts("no recorder");
  session_->start();
  chooseRunner();
  session_->stop();
  chooseFramework();
  session_->start();  // neither callback of the two starts has run yet
  const auto second = session_->tracing().traceSession();
  platform_.performanceTraces.failStarts("");

  letRun();

  EXPECT_EQ(session_->tracing().traceSession(), second);
  EXPECT_EQ(lines(LogLevel::kInfo, "hvrt"), Texts{"Performance Trace Started"});
  session_->stop();
}

TEST_F(SessionTracingTest, StopOfTheFrameworkWhileTheRunnerRecordsWaitsForATrace) {
  chooseRunner();
  session_->start();
  letRun();
  chooseFramework();

  // The framework has no trace, so none completes and the wait never ends. This is required.
  EXPECT_THROW(session_->stop(), std::logic_error);

  EXPECT_TRUE(session_->started());
}

TEST_F(SessionTracingTest, NothingRecordsForADestroyedSession) {
  for (const bool isRunner : {true, false}) {
    isRunner ? chooseRunner() : chooseFramework();
    session_->start();
    letRun();
    EXPECT_EQ(platform_.ktrace.recordings() + platform_.performanceTraces.recordings(), 1U);
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->stop();

    session_ = std::make_shared<HVReportingSession>(ReporterID{8},
                                                    HVReportingSession::ProcessIdentifiers{12});
    letRun();

    EXPECT_EQ(platform_.ktrace.recordings() + platform_.performanceTraces.recordings(), 0U);
    session_->setServiceType(AudioServiceType::kTest);
  }
}

// --- Hooks --------------------------------------------------------------------------------------

TEST_F(SessionTracingTest, FeatureSwitchedOffMeanwhileLeavesTheTraceAlone) {
  session_->start();
  platform_.featureFlags.set("Acoustat", "Tracing", platform::FakeFeatureFlagService::State::kOff);
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, SessionThatIsNoTestAnyMoreLeavesTheTraceAlone) {
  session_->start();
  session_->setServiceType(AudioServiceType::kHaptics);
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_TRUE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingTest, NextRunDoesNotTraceAgainWhatIsStillTraced) {
  session_->start();
  session_->setServiceType(AudioServiceType::kHaptics);
  session_->stop();
  session_->setServiceType(AudioServiceType::kTest);
  forgetWhatHappened();

  session_->start();

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingTest, StopWaitsForTheTraceAfterTheLinkBeforeTheRunEnds) {
  session_->setTlmReportingEnabled(true);
  session_->start();
  session_->sendMessage(Dictionary{{"a", 1}}, AudioEventCategory::kPlayback, AudioEventType::kStart,
                        nullptr);
  forgetWhatHappened();

  platform_.performanceTraces.hang();

  EXPECT_THROW(session_->stop(), std::logic_error);  // waits for ever

  const Texts all = platform_.journal.texts();
  const auto summary = std::ranges::find(all, "sending summary event for reporter 7");
  EXPECT_NE(std::find(summary, all.end(), "trace stop"), all.end());
  // The link's last job was added before the wait, during which the fake runs it.
  EXPECT_NE(std::ranges::find(all, "entering tlmreporting -[HVReportingSession stop]_block_invoke"),
            all.end());
  EXPECT_TRUE(session_->started());
  EXPECT_TRUE(session_->nestedAggregatedPayloadData()->has_value());
}

}  // namespace
}  // namespace halvox
