#include <memory>
#include <optional>
#include <semaphore>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/TracingFixture.h"

namespace halvox::tracing_test {
namespace {

class SessionTracingFrameworkTest : public TracingFixture {};

TEST_F(SessionTracingFrameworkTest, FrameworkTraceEndsWithItsURL) {
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
TEST_F(SessionTracingFrameworkTest, CompletionForgetsTheTraceThenSignalsThenStoresTheURL) {
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

TEST_F(SessionTracingFrameworkTest, StartOfATraceIsWrittenToTheGeneralLogToo) {
  session_->start();
  EXPECT_TRUE(lines(LogLevel::kInfo, "hvrt").empty());

  letRun();

  EXPECT_EQ(lines(LogLevel::kInfo, "hvrt"), Texts{"Performance Trace Started"});
  ASSERT_EQ(lines(LogLevel::kDefault, "general").size(), 1U);
  EXPECT_EQ(platform_.log.lines(LogLevel::kDefault).back().line, "started performance trace.");
}

TEST_F(SessionTracingFrameworkTest, FailedStartClearsTheTraceButStaysStarted) {
  platform_.performanceTraces.failStarts("no recorder");
  session_->start();

  letRun();

  EXPECT_EQ(session_->tracing().traceSession(), nullptr);
  EXPECT_EQ(session_->tracing().traceConfig(), nullptr);
  EXPECT_TRUE(session_->tracing().startedTracing());
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidStart no recorder"});
}

TEST_F(SessionTracingFrameworkTest, StopAfterAFailedStartWaitsForWhatNeverComes) {
  platform_.performanceTraces.failStarts("no recorder");
  session_->start();
  letRun();
  forgetWhatHappened();

  // The fake throws where a thread would wait for ever.
  EXPECT_THROW(session_->stop(), std::logic_error);

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingFrameworkTest, FailedStopClearsTheTrace) {
  session_->start();

  platform_.performanceTraces.delegate()->kqTraceDidStop(Error{.description = "disk"});

  EXPECT_EQ(session_->tracing().traceSession(), nullptr);
  EXPECT_NE(session_->tracing().traceConfig(), nullptr);
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidStop disk"});
}

// The end of the trace is the last event that a stop waits for before it takes the history. This
// test then holds the history's lock: the stop cannot take the history, and the session must stay
// marked as started.
TEST_F(SessionTracingFrameworkTest, StopClearsTheFlagAfterTheHistory) {
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

TEST_F(SessionTracingFrameworkTest, CompletionWithAnErrorEndsTheWaitWithoutAURL) {
  platform_.performanceTraces.failSaves("not saved");
  session_->start();

  session_->stop();  // would never return without the signal

  EXPECT_EQ(session_->tracing().getKQTraceFileURL(), std::nullopt);
  EXPECT_EQ(lines(LogLevel::kError, "hvrt"), Texts{"kqTraceDidComplete not saved"});
}

TEST_F(SessionTracingFrameworkTest, BackEndIsChosenAgainAtTheStop) {
  session_->start();
  chooseRunner();  // the framework records, but the stop looks for a runner, and there is none
  forgetWhatHappened();

  session_->stop();

  EXPECT_TRUE(operations().empty());
  EXPECT_FALSE(session_->tracing().startedTracing());
}

TEST_F(SessionTracingFrameworkTest, FinishedRunnerIsNotStoppedInPlaceOfTheFrameworksTrace) {
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

TEST_F(SessionTracingFrameworkTest, AnUnstoppedTraceIsReplacedByTheNextOne) {
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

TEST_F(SessionTracingFrameworkTest, CallbacksOfAReplacedTraceAreIgnored) {
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

TEST_F(SessionTracingFrameworkTest, StopOfTheFrameworkWhileTheRunnerRecordsWaitsForATrace) {
  chooseRunner();
  session_->start();
  letRun();
  chooseFramework();

  // The framework has no trace. Therefore none completes, and the wait never ends. This is
  // required.
  EXPECT_THROW(session_->stop(), std::logic_error);

  EXPECT_TRUE(session_->started());
}

TEST_F(SessionTracingFrameworkTest, NothingRecordsForADestroyedSession) {
  for (const bool isRunner : {true, false}) {
    isRunner ? chooseRunner() : chooseFramework();
    session_->start();
    letRun();
    EXPECT_EQ(platform_.ktrace.recordings() + platform_.performanceTraces.recordings(), 1U);
    session_->setServiceType(AudioServiceType::kHaptics);
    session_->stop();

    session_ = std::make_shared<HVReportingSession>(ReporterID{8},
                                                    HVReportingSession::ProcessIdentifiers{12},
                                                    SessionCounters::make(platform_.statistics));
    letRun();

    EXPECT_EQ(platform_.ktrace.recordings() + platform_.performanceTraces.recordings(), 0U);
    session_->setServiceType(AudioServiceType::kTest);
  }
}

}  // namespace
}  // namespace halvox::tracing_test
