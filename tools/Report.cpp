#include "tools/Report.h"

#include <chrono>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>
#include <variant>

#include "platform/linux/runtime/Version.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/value.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ReportFiles.h"
#include "tools/ReportJson.h"
#include "tools/ReportPage.h"
#include "tools/ServiceConfiguration.h"
#include "tools/StoreRun.h"
#include "tools/TimeText.h"
#include "tools/TraceResults.h"

namespace halvox::tools {
namespace {

using analysis::ReportData;
using platform::Dictionary;

constexpr std::string_view kStandardOutput = "-";

double timeOf(const std::filesystem::path& file) {
  std::error_code ignored;
  const auto written = std::filesystem::last_write_time(file, ignored);
  const auto time = std::chrono::file_clock::to_sys(written).time_since_epoch();
  return std::chrono::duration<double>(time).count();
}

ReportTraceInterval intervalOf(std::string name, std::vector<double> nanoseconds) {
  constexpr double kNanosecondsPerMicrosecond = 1000;
  ReportTraceInterval interval;
  interval.name = std::move(name);
  for (double& value : nanoseconds) {
    value /= kNanosecondsPerMicrosecond;
    interval.counts.addValue(value);
  }
  const TraceStatistics statistics = statisticsOf(std::move(nanoseconds));
  interval.count = statistics.count;
  interval.median = statistics.median;
  interval.percentile95 = statistics.percentile95;
  interval.percentile99 = statistics.percentile99;
  interval.maximum = statistics.maximum;
  return interval;
}

// Returns the newest results of a trace. Without any, or if they cannot be read, there are none: a
// report is about the records, and most services trace nothing.
std::optional<ReportTrace> newestTrace(const Complaint& complain) {
  const auto configuration = serviceConfiguration(complain);
  if (std::holds_alternative<ExitStatus>(configuration)) return std::nullopt;
  const auto file =
      traceResultsFile(std::get<platform::linux_::Configuration>(configuration).storage.root);
  auto results = readTraceResults(file.native());
  if (!results) return std::nullopt;
  ReportTrace trace{.file = file.native(), .when = timeOf(file)};
  for (auto& [name, values] : results->values) {
    if (!values.empty()) trace.intervals.push_back(intervalOf(name, std::move(values)));
  }
  if (trace.intervals.empty()) return std::nullopt;
  return trace;
}

// What a reader must know about what is not in the report.
std::vector<std::string> notesOf(const ReportData& data) {
  const analysis::ReportTotals& totals = data.totals;
  std::vector<std::string> notes{
      "Each message is recorded as two events, under com.tarno.halvox and under its service's "
      "name: " +
          std::to_string(totals.messages) + " messages, " + std::to_string(totals.events) +
          " events. Pictures and sums count a message once.",
      std::to_string(totals.linkMessages) +
          " messages went through the real-time link into this store. A session does not pass on a "
          "message that repeats the one before it; a message outside a started session goes out "
          "once, and none does if the link is disabled or leads to another server.",
      "What the service drops, suppresses or refuses, it records at most once a minute, with the "
      "next records that it stores, and at its end: the table has what was recorded in this "
      "period. A service that was killed could not record the last of it, and an earlier version "
      "recorded none.",
      "The store keeps records as long as [storage] of the configuration says. What it has deleted "
      "is not in this report.",
  };
  return notes;
}

// The whole page.
std::string pageOf(const ReportData& data, const ReportFrame& frame) {
  std::string page(reportPageBeforeData());
  appendReportJson(data, frame, page);
  page += reportPageAfterData();
  return page;
}

}  // namespace

ExitStatus writeReport(const WriteReport& request, const CommonOptions& options,
                       const ToolStreams& streams) {
  const Complaint complain("report", options.form(), streams.output, streams.errors);
  if (reportPageBeforeData().empty()) {
    return complain(ExitStatus::kRefused, kNoReportPage);
  }
  const auto directory = storeDirectory(request.database, complain);
  if (const auto* status = std::get_if<ExitStatus>(&directory)) return *status;
  const auto& path = std::get<std::filesystem::path>(directory);
  auto data = readReportData({.directory = path, .since = request.since, .until = request.until});
  if (!data) return complain(ExitStatus::kNoService, data.error().message, "no-store");
  ReportFrame frame{.program = "halvoxctl " + std::string(platform::linux_::halvoxVersion()),
                    .store = (path / platform::linux_::kStoreFileName).native(),
                    .made = timeNow(),
                    .since = request.since,
                    .until = request.until};
  // A named store need not be that of the service whose traces the configuration leads to.
  if (request.database.empty()) frame.trace = newestTrace(complain);
  frame.notes = notesOf(*data);
  const std::string page = pageOf(*data, frame);
  if (request.to == kStandardOutput) {
    streams.output << page;
    return ExitStatus::kDone;
  }
  const auto written = writeReportFile(request.to, page);
  if (!written) return complain(ExitStatus::kCannotWrite, written.error().message);
  const analysis::ReportTotals& totals = data->totals;
  if (options.form() == OutputForm::kJson) {
    streams.output << toJson(Dictionary{{"file", request.to},
                                        {"streams", totals.streams},
                                        {"xruns", totals.xruns},
                                        {"messages", totals.messages}})
                   << '\n';
  } else {
    streams.output << harmlessText(request.to) << ": " << totals.streams << " streams, "
                   << totals.xruns << " xruns, " << totals.messages << " messages\n";
  }
  return ExitStatus::kDone;
}

}  // namespace halvox::tools
