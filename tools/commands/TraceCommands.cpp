#include <memory>

#include "tools/Traces.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {
namespace {

constexpr const char* kFile = "A results file of the service";

void addRecord(CommandSet& commands, CLI::App& trace) {
  const auto request = std::make_shared<RecordTrace>();
  CLI::App& record = commands.addBelow(
      trace, {.name = "record",
              .summary = "Trace while a program runs, then show what was measured",
              .example = "halvoxctl trace record --params params.plist -- pw-play tone.wav"});
  offerFiles(
      record.add_option("--params", request->params, "The trace parameters file, a property list")
          ->type_name("FILE")
          ->required());
  offerPrograms(
      record.add_option("COMMAND", request->command, "The program and its arguments, after --")
          ->required());
  commands.onRun(
      record, [request] { return *request; },
      [](const RecordTrace& asked, const CommonOptions& options, const ToolStreams& streams) {
        return recordTrace(asked, options, streams.output, streams.errors);
      });
}

void addShow(CommandSet& commands, CLI::App& trace) {
  const auto request = std::make_shared<ShowTrace>();
  CLI::App& show = commands.addBelow(trace, {.name = "show",
                                             .summary = "Show statistics of a results file",
                                             .example = "halvoxctl trace show tracing_results.ssj",
                                             .reach = CommandReach::kFiles});
  offerFiles(show.add_option("FILE", request->file, kFile)->required());
  commands.onRun(
      show, [request] { return *request; },
      [](const ShowTrace& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showTrace(asked, options.form(), streams.output, streams.errors);
      });
}

void addExport(CommandSet& commands, CLI::App& trace) {
  const auto request = std::make_shared<ExportTrace>();
  CLI::App& exporting = commands.addBelow(
      trace, {.name = "export",
              .summary = "Write the intervals for trace viewers",
              .example = "halvoxctl trace export tracing_results.ssj --to trace.json",
              .reach = CommandReach::kFiles});
  offerFiles(exporting.add_option("FILE", request->file, kFile)->required());
  offerFiles(exporting.add_option("--to", request->to, "The file to write")
                 ->type_name("FILE")
                 ->required());
  commands.onRun(
      exporting, [request] { return *request; },
      [](const ExportTrace& asked, const CommonOptions& options, const ToolStreams& streams) {
        return exportTrace(asked, options.form(), streams.output, streams.errors);
      });
}

}  // namespace

void addTraceCommands(CommandSet& commands) {
  CLI::App& trace =
      commands.add({.name = "trace",
                    .summary = "Let the service trace a program, or show its results",
                    .example = "halvoxctl trace record --params params.plist -- pw-play tone.wav"});
  trace.require_subcommand(1);
  addRecord(commands, trace);
  addShow(commands, trace);
  addExport(commands, trace);
}

}  // namespace halvox::tools
