#include <array>
#include <memory>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "tools/Report.h"
#include "tools/ReportComparison.h"
#include "tools/TimeText.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

// The arguments as they were given.
struct ReportArguments {
  WriteReport report{};
  std::vector<std::string> compared{};  // two, or none
};

using ReportRequest = std::variant<WriteReport, CompareReports>;

ReportRequest requestOf(const ReportArguments& arguments) {
  const WriteReport& report = arguments.report;
  if (arguments.compared.empty()) {
    if (report.to.empty()) throw CLI::RequiredError("--output");
    return report;
  }
  constexpr const char* kCompare = "--compare";
  return CompareReports{
      .before = valueOf(parseComparedPeriod(arguments.compared.at(0), timeNow()), kCompare),
      .after = valueOf(parseComparedPeriod(arguments.compared.at(1), timeNow()), kCompare),
      .to = report.to,
      .since = report.since,
      .until = report.until,
      .database = report.database};
}

ExitStatus carryOut(const ReportRequest& request, const CommonOptions& options,
                    const ToolStreams& streams) {
  if (const auto* report = std::get_if<WriteReport>(&request)) {
    return writeReport(*report, options, streams);
  }
  return compareReports(std::get<CompareReports>(request), options, streams);
}

}  // namespace

void addReportCommand(CommandSet& commands) {
  const auto arguments = std::make_shared<ReportArguments>();
  CLI::App& report = commands.add(
      {.name = "report",
       .summary = "Write a page that shows what played, and what glitched",
       .example = "halvoxctl report --since today -o report.html",
       .details = "The page is one HTML file for any browser and needs no network: a time line of "
                  "the streams and their xruns, times of the devices, messages over time, and a "
                  "table for each picture. With --compare it shows what got worse between two "
                  "days, periods or stores, and how sure that is; without -o that is a table.",
       .reach = CommandReach::kFiles});
  offerFiles(report
                 .add_option("-o,--output", arguments->report.to,
                             "The file to write, replaced if it exists; - is the standard output")
                 ->type_name("FILE"),
             {"-"});
  auto* compare =
      report
          .add_option(
              "--compare", arguments->compared,
              "Compare AFTER with BEFORE. Each is a day (yesterday, 2026-11-21), SINCE..UNTIL "
              "with times as below, or the path of a store (./before/halvox.db)")
          ->type_name("BEFORE AFTER")
          // Two texts of one value. With expected(2), the help would say "BEFORE AFTER x 2".
          ->type_size(2)
          ->expected(1);
  offerFiles(compare, {"yesterday", "today"});
  addTimes(report, arguments->report.since, arguments->report.until, "records");
  addDatabase(report, arguments->report.database);
  commands.onRun(
      report, [arguments] { return requestOf(*arguments); }, carryOut);
}

}  // namespace halvox::tools
