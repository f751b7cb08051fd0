#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "session/TracingFixture.h"
#include "tracing/TraceRunner.h"

namespace halvox::tracing_test {
namespace {

class SessionTracingRunnerTest : public TracingFixture {};

TEST_F(SessionTracingRunnerTest, RunnerRecordsFromStartToStop) {
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

TEST_F(SessionTracingRunnerTest, LinkIsAskedForBeforeTheTraceIsSetUp) {
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
TEST_F(SessionTracingRunnerTest, SessionIsMarkedAsTracedBeforeTheTraceIsAskedToStart) {
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

TEST_F(SessionTracingRunnerTest, SettingUpTheRunnerIsLoggedByTheSession) {
  chooseRunner();

  session_->start();

  EXPECT_THAT(lines(LogLevel::kDebug, "hvrr"),
              testing::Contains("Got the tracefile /params.plist, setting up trace"));
  EXPECT_THAT(lines(LogLevel::kInfo, "hvrr"), testing::Contains("Setting up tracing for test"));
  session_->stop();
}

TEST_F(SessionTracingRunnerTest, WithoutAPathTheRunnerDoesNotStart) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace}});

  session_->start();
  EXPECT_FALSE(session_->tracing().startedTracing());
  session_->stop();

  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingRunnerTest, EmptyPathIsLoggedAndNothingStarts) {
  session_->setConfiguration(Dictionary{{HVReportingTraceType, HVReportingTraceTypeKtrace},
                                        {HVReportingMeridelPlistFilePath, ""}});

  session_->start();

  EXPECT_THAT(lines(LogLevel::kError, "hvrr"),
              testing::ElementsAre("TracefileName empty. Failed to setup tracing"));
  EXPECT_FALSE(session_->tracing().startedTracing());
  EXPECT_TRUE(operations().empty());
}

TEST_F(SessionTracingRunnerTest, SecondStartDoesNotTraceAgain) {
  chooseRunner();
  session_->start();
  forgetWhatHappened();

  session_->start();

  EXPECT_TRUE(operations().empty());
  session_->stop();
}

TEST_F(SessionTracingRunnerTest, NextRunMakesANewRunner) {
  chooseRunner();
  session_->start();
  const auto first = session_->tracing().traceRunner();
  session_->stop();

  session_->start();

  EXPECT_NE(session_->tracing().traceRunner(), first);
  session_->stop();
}

TEST_F(SessionTracingRunnerTest, EmptyPathOfALaterRunRecordsTheSameWithANewRunner) {
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

TEST_F(SessionTracingRunnerTest, ResultsHoldTheValuesOfTheirOwnRunOnly) {
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

TEST_F(SessionTracingRunnerTest, RunnerAndParametersStayWithTheSessionAfterTheStop) {
  chooseRunner();
  session_->start();
  const auto runner = session_->tracing().traceRunner();
  session_->stop();

  EXPECT_EQ(session_->tracing().traceRunner(), runner);
  EXPECT_EQ(session_->tracing().traceParams()->name, "T");
}

}  // namespace
}  // namespace halvox::tracing_test
