#include "tracing/TraceRunner.h"

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace halvox {
namespace {

using platform::FakeResultsFileService;
using platform::JournalKind;
using platform::LogLevel;
using Texts = std::vector<std::string>;

constexpr std::uint32_t kBegin = 0x21040001;
constexpr std::uint32_t kEnd = 0x21040002;

TraceParams params(const char* name, TraceType type = TraceType::kKernelTrace) {
  return {
      .name = name,
      .type = type,
      .tracePoints = {
          {.name = "IO", .kind = TracePointKind::kInterval, .beginCode = kBegin, .endCode = kEnd}}};
}

class TraceRunnerTest : public testing::Test {
 protected:
  void add(const TraceParams& one) { runner_.createTraceFromTraceParams(&one); }
  void record(std::vector<platform::trace_point> events) {
    platform_.ktrace.setEvents(std::move(events));
  }
  // Runs the runner and lets the tracer start.
  void run() {
    runner_.runTraces();
    platform_.dispatch.runUntilIdle();
  }
  void runAndStop() {
    runner_.runTraces();
    runner_.stopTracingandProcessResults();
  }
  static platform::trace_point event(std::uint32_t code, std::uint64_t tick) {
    return {.timestamp = tick, .debugid = code};
  }
  Texts errors() const { return platform_.log.texts(LogLevel::kError); }
  FakeResultsFileService::File onlyFile() const {
    const auto files = platform_.resultsFiles.files();
    EXPECT_EQ(files.size(), 1U);
    return files.empty() ? FakeResultsFileService::File{} : files[0];
  }

  platform::FakePlatform platform_;
  TraceRunner runner_;
};

TEST_F(TraceRunnerTest, RecordsProcessesAndWritesInThisOrder) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 35)});

  runAndStop();

  EXPECT_EQ(platform_.journal.texts(JournalKind::kNote),
            (Texts{"ktrace create", "ktrace completion handler", "ktrace wall times on",
                   "ktrace range 0x21040000 to 0x2104408A", "ktrace start", "ktrace end 0",
                   "ktrace destroy", "results open", "results close"}));
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo),
            (Texts{"Number of traces to perform: 1", "Performing trace : Startup",
                   "Setting up tracing: Startup", "Starting tracing: Startup",
                   "Tearing down trace :  Startup", "Completed trace.... 1,   1 ",
                   "Completed trace....In write perf data.... 1",
                   "Writing out 1 result for IO, min: 25, max: 25 "}));
  const auto file = onlyFile();
  EXPECT_EQ(file.path,
            "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces/"
            "tracing_results.ssj");
  EXPECT_EQ(file.productName, "HVReporting");
  EXPECT_EQ(file.version, 4U);
  EXPECT_EQ(file.flags, 0U);
  EXPECT_TRUE(file.isClosed);
  EXPECT_EQ(file.measurements, (std::vector<FakeResultsFileService::Measurement>{
                                   {"IO", platform::ssunit::ssunit_nanoseconds, 25.0}}));
  EXPECT_EQ(TraceRunner::getResultsVersion(), 4U);
}

TEST_F(TraceRunnerTest, TracesRunOnAQueueOfTheirOwnWithAThreadOfItsOwn) {
  const auto queues = platform_.dispatch.createdQueues();
  ASSERT_EQ(queues.size(), 1U);
  EXPECT_EQ(queues[0].label, "Tracing Queue");
  EXPECT_EQ(queues[0].quality, platform::QualityOfService::kUserInteractive);
  EXPECT_EQ(queues[0].threading, platform::QueueThreading::kOwnThread);

  add(params("Startup"));
  runAndStop();

  // The jobs that start and stop a trace may wait for the tracer.
  EXPECT_EQ(platform_.dispatch.weights("Tracing Queue"),
            (std::vector<platform::JobWeight>{platform::JobWeight::kMayBlock,
                                              platform::JobWeight::kMayBlock,
                                              platform::JobWeight::kMayBlock}));
}

TEST_F(TraceRunnerTest, WithoutTracesAnEmptyFileIsWritten) {
  runAndStop();

  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo)[0], "Number of traces to perform: 0");
  EXPECT_TRUE(onlyFile().measurements.empty());
  EXPECT_TRUE(onlyFile().isClosed);
}

TEST_F(TraceRunnerTest, NoParametersAreLoggedAndAddNothing) {
  runner_.createTraceFromTraceParams(nullptr);

  EXPECT_EQ(platform_.log.texts(LogLevel::kDefault),
            Texts{"Attempted to add nullptr to trace runner"});
  EXPECT_EQ(runner_.getNumTraces(), 0U);
}

TEST_F(TraceRunnerTest, SignpostsAreNotRecordedAndHaveNoResults) {
  add(params("Signs", TraceType::kSignpost));

  runAndStop();

  EXPECT_EQ(platform_.journal.texts(JournalKind::kNote), (Texts{"results open", "results close"}));
  EXPECT_TRUE(onlyFile().measurements.empty());
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo),
            (Texts{"Number of traces to perform: 1", "Performing trace : Signs",
                   "Tearing down trace :  Signs", "Completed trace.... 1,   1 ",
                   "Completed trace....In write perf data.... 0"}));
}

TEST_F(TraceRunnerTest, ImpulsesAndLevelsBecomeIntervalsToo) {
  TraceParams all = params("All");
  all.tracePoints = {
      {.name = "impulse", .beginCode = kBegin, .endCode = kBegin},
      {.name = "level", .kind = TracePointKind::kLevel, .beginCode = kBegin, .endCode = kEnd}};
  add(all);
  record({event(kBegin, 10), event(kEnd, 35)});

  runAndStop();

  ASSERT_EQ(onlyFile().measurements.size(), 1U);
  EXPECT_EQ(onlyFile().measurements[0].name, "level");
}

TEST_F(TraceRunnerTest, FailedRangeIsLoggedAndTheSessionStartsAllTheSame) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 35)});
  platform_.ktrace.failRange(22);

  runAndStop();

  EXPECT_EQ(errors(), Texts{"Could not set up ktrace range, error: 22"});
  EXPECT_THAT(platform_.journal.texts(JournalKind::kNote), testing::Contains("ktrace start"));
  EXPECT_TRUE(onlyFile().measurements.empty());
}

TEST_F(TraceRunnerTest, FailedStartIsLoggedAndTheTraceCompletesWithoutResults) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 35)});
  platform_.ktrace.failStart(5);

  runAndStop();

  EXPECT_EQ(errors(), Texts{"Could not start ktrace session, error: 5"});
  EXPECT_TRUE(onlyFile().measurements.empty());
}

TEST_F(TraceRunnerTest, TracesAreStoppedOneAfterTheOther) {
  add(params("First"));
  add(params("Second"));
  run();
  platform_.journal.clear();

  runner_.stopTracingandProcessResults();

  EXPECT_EQ(platform_.journal.texts(),
            (Texts{"Tearing down trace :  First", "ktrace end 0", "ktrace destroy",
                   "Completed trace.... 1,   2 ", "Tearing down trace :  Second", "ktrace end 0",
                   "ktrace destroy", "Completed trace.... 2,   2 ",
                   "Completed trace....In write perf data.... 2",
                   "directory " + std::string(HVReportingTracingLogsDirectory) + " 511",
                   "results open", "results close"}));
}

TEST_F(TraceRunnerTest, ValuesOfOneNameAreAllWrittenAndSummedUpInOneLine) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 40), event(kBegin, 50), event(kEnd, 60), event(kBegin, 70),
          event(kEnd, 90)});

  runAndStop();

  std::vector<double> values;
  for (const auto& measurement : onlyFile().measurements) values.push_back(measurement.value);
  EXPECT_EQ(values, (std::vector<double>{30, 10, 20}));
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).back(),
            "Writing out 3 result for IO, min: 10, max: 30 ");
}

TEST_F(TraceRunnerTest, MeasurementsOfOneNameAreWrittenUnderItInTheOrderOfTheResults) {
  TraceParams two = params("Startup");
  two.tracePoints.push_back({.name = "IO", .beginCode = kBegin + 8, .endCode = kEnd + 8});
  two.tracePoints.push_back({.name = "First", .beginCode = kBegin, .endCode = kEnd + 8});
  add(two);
  record({event(kBegin + 8, 1), event(kBegin, 10), event(kEnd, 40), event(kEnd + 8, 50)});

  runAndStop();

  constexpr auto kNanoseconds = platform::ssunit::ssunit_nanoseconds;
  EXPECT_EQ(onlyFile().measurements,
            (std::vector<FakeResultsFileService::Measurement>{
                {"First", kNanoseconds, 40}, {"IO", kNanoseconds, 30}, {"IO", kNanoseconds, 49}}));
  const Texts lines = platform_.log.texts(LogLevel::kInfo);
  EXPECT_EQ(Texts(lines.end() - 2, lines.end()),
            (Texts{"Writing out 1 result for First, min: 40, max: 40 ",
                   "Writing out 2 result for IO, min: 30, max: 49 "}));
}

TEST_F(TraceRunnerTest, ValuesAreWrittenAsTheNearestDouble) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 9)});

  runAndStop();

  ASSERT_EQ(onlyFile().measurements.size(), 1U);
  EXPECT_EQ(onlyFile().measurements[0].value, 18446744073709551616.0);
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).back(),
            "Writing out 1 result for IO, min: 18446744073709551615, max: 18446744073709551615 ");
}

TEST_F(TraceRunnerTest, EventsOutsideTheRangeAreNotRecorded) {
  TraceParams outside = params("Startup");
  outside.tracePoints[0].beginCode = 0x2103FFFF;
  outside.tracePoints[0].endCode = 0x2104408B;
  add(outside);
  record({event(0x2103FFFF, 10), event(0x2104408B, 35)});

  runAndStop();

  EXPECT_TRUE(onlyFile().measurements.empty());
}

TEST_F(TraceRunnerTest, DirectoryIsMadeForEverybody) {
  runAndStop();

  const auto directories = platform_.files.directories();
  ASSERT_EQ(directories.size(), 1U);
  EXPECT_EQ(directories.begin()->first, HVReportingTracingLogsDirectory);
  EXPECT_EQ(directories.begin()->second, 0777U);
}

// --- A runner records once -----------------------------------------------------------------------

TEST_F(TraceRunnerTest, RunnerThatHasFinishedIsNotStoppedAgain) {
  add(params("Startup"));
  record({event(kBegin, 10), event(kEnd, 35)});
  runAndStop();
  platform_.journal.clear();

  runner_.stopTracingandProcessResults();

  EXPECT_TRUE(platform_.journal.texts().empty());
  EXPECT_EQ(onlyFile().measurements.size(), 1U);
}

TEST_F(TraceRunnerTest, RunnerThatNeverRanIsNotStopped) {
  add(params("Startup"));

  runner_.stopTracingandProcessResults();

  EXPECT_TRUE(platform_.journal.texts().empty());
  EXPECT_TRUE(platform_.resultsFiles.files().empty());
  EXPECT_TRUE(runner_.canRun());
}

TEST_F(TraceRunnerTest, RunnerRunsOnce) {
  add(params("Startup"));
  runAndStop();
  platform_.journal.clear();

  runner_.runTraces();
  add(params("Late"));

  EXPECT_TRUE(platform_.journal.texts().empty());
  EXPECT_EQ(runner_.getNumTraces(), 1U);
  EXPECT_FALSE(runner_.canRun());
}

TEST_F(TraceRunnerTest, RunnerThatRecordsDoesNotRunAgain) {
  add(params("Startup"));
  run();
  platform_.journal.clear();

  run();
  add(params("Late"));

  EXPECT_TRUE(platform_.journal.texts().empty());
  runner_.stopTracingandProcessResults();
  EXPECT_EQ(platform_.resultsFiles.files().size(), 1U);
}

// --- A start that takes its time -----------------------------------------------------------------

TEST_F(TraceRunnerTest, TracerIsStartedByTheTracingQueue) {
  add(params("Startup"));
  bool hasStarted = false;
  platform_.ktrace.setTracerDelay([&] { hasStarted = true; });

  runner_.runTraces();

  EXPECT_FALSE(hasStarted);
  EXPECT_EQ(platform_.dispatch.weights("Tracing Queue").size(), 1U);
  platform_.dispatch.runUntilIdle();
  EXPECT_TRUE(hasStarted);
}

TEST_F(TraceRunnerTest, StopWaitsForTheStartAndIsLoggedAfterIt) {
  add(params("Startup"));
  platform_.ktrace.failStart(5);
  runner_.runTraces();

  runner_.stopTracingandProcessResults();

  const Texts all = platform_.journal.texts();
  const auto failed = std::ranges::find(all, "Could not start ktrace session, error: 5");
  EXPECT_NE(std::find(failed, all.end(), "Tearing down trace :  Startup"), all.end());
}

TEST_F(TraceRunnerTest, RunnerDestroyedBeforeTheTracerHasStartedLeavesNoRecording) {
  auto runner = std::make_unique<TraceRunner>();
  const TraceParams one = params("Startup");
  runner->createTraceFromTraceParams(&one);
  runner->runTraces();

  runner.reset();
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.ktrace.recordings(), 0U);
  EXPECT_EQ(platform_.journal.texts().back(), "ktrace destroy");
}

// --- Failures and early ends --------------------------------------------------------------------

TEST_F(TraceRunnerTest, DirectoryThatCannotBeMadeIsLoggedAndTheFileIsTried) {
  platform_.files.setDirectoryError(platform::Error{.description = "read-only"});

  runAndStop();

  EXPECT_EQ(errors(), Texts{"can't create logging directory at " +
                            std::string(HVReportingTracingLogsDirectory) + ": read-only"});
  EXPECT_TRUE(onlyFile().isClosed);
}

TEST_F(TraceRunnerTest, ResultsFileThatCannotBeOpenedEndsTheProcessWithStatusOne) {
  add(params("Startup"));
  platform_.resultsFiles.failToOpen();

  EXPECT_THROW(runAndStop(), platform::FakeTermination);

  EXPECT_EQ(platform_.process.terminations(), std::vector<int>{1});
  EXPECT_EQ(platform_.log.texts(LogLevel::kInfo).back(), "Failed to open scoresheet writer");
  EXPECT_TRUE(errors().empty());
}

TEST_F(TraceRunnerTest, RunnerDestroyedUnstoppedDestroysItsRecordings) {
  auto runner = std::make_unique<TraceRunner>();
  const TraceParams one = params("Startup");
  runner->createTraceFromTraceParams(&one);
  runner->createTraceFromTraceParams(&one);
  runner->runTraces();
  platform_.dispatch.runUntilIdle();
  platform_.journal.clear();

  runner.reset();
  platform_.dispatch.runUntilIdle();

  EXPECT_EQ(platform_.journal.texts(), (Texts{"ktrace destroy", "ktrace destroy"}));
  EXPECT_EQ(platform_.ktrace.recordings(), 0U);
  EXPECT_TRUE(platform_.resultsFiles.files().empty());
}

TEST_F(TraceRunnerTest, RunnerThatWasStoppedDestroysNothingMore) {
  auto runner = std::make_unique<TraceRunner>();
  const TraceParams one = params("Startup");
  runner->createTraceFromTraceParams(&one);
  runner->runTraces();
  runner->stopTracingandProcessResults();
  platform_.journal.clear();

  runner.reset();
  platform_.dispatch.runUntilIdle();

  EXPECT_TRUE(platform_.journal.texts().empty());
}

TEST_F(TraceRunnerTest, LinesGoToTheTracesCategoryUnderTheRunnersName) {
  runner_.runTraces();

  const auto line = platform_.log.lines().at(0);
  EXPECT_EQ(line.category, "hvrt");
  EXPECT_EQ(line.line.substr(0, 26), "              TraceRunner:");
}

}  // namespace
}  // namespace halvox
