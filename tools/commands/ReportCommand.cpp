#include <memory>

#include "tools/Report.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {

void addReportCommand(CommandSet& commands) {
  const auto request = std::make_shared<WriteReport>();
  CLI::App& report =
      commands.add({.name = "report",
                    .summary = "Write a page that shows what played, and what glitched",
                    .example = "halvoxctl report --since today -o report.html",
                    .details = "The page is one HTML file for any browser and needs no network: a "
                               "time line of the streams and their xruns, times of the devices, "
                               "messages over time, and a table for each picture.",
                    .reach = CommandReach::kFiles});
  report
      .add_option("-o,--output", request->to,
                  "The file to write, replaced if it exists; - is the standard output")
      ->type_name("FILE")
      ->required();
  addTimes(report, request->since, request->until, "records");
  addDatabase(report, request->database);
  commands.onRun(
      report, [request] { return *request; }, writeReport);
}

}  // namespace halvox::tools
