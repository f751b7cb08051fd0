#include "tools/Tool.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <utility>

#include "tools/CommandLine.h"
#include "tools/Drivers.h"
#include "tools/Events.h"
#include "tools/JsonText.h"
#include "tools/Notify.h"
#include "tools/Preferences.h"
#include "tools/Records.h"
#include "tools/RequestRunner.h"
#include "tools/Script.h"
#include "tools/SnapshotFiles.h"
#include "tools/Summary.h"
#include "tools/Traces.h"

namespace halvox::tools {
namespace {

ExitStatus runFile(const RunScript& script, const CommonOptions& options,
                   const ToolStreams& streams) {
  if (script.file == "-") {
    return runScript({streams.input, "standard input", false, script.keepGoing}, options,
                     streams.output, streams.errors);
  }
  std::ifstream file(script.file);
  // A directory opens but cannot be read.
  if (file) (void)file.peek();
  if (file.bad() || !file.is_open()) {
    streams.errors << "halvoxctl run: FILE: cannot read " << harmlessText(script.file) << ": "
                   << std::strerror(errno) << '\n';
    return ExitStatus::kBadArguments;
  }
  return runScript({file, harmlessText(script.file), false, script.keepGoing}, options,
                   streams.output, streams.errors);
}

ExitStatus runCommand(const Command& command, const ToolStreams& streams) {
  const CommonOptions& options = command.options;
  if (const auto* request = std::get_if<Request>(&command.what)) {
    RequestRunner runner(options, streams.output, streams.errors);
    return runner.run(*request, options.json, "halvoxctl: ");
  }
  if (const auto* script = std::get_if<RunScript>(&command.what)) {
    return runFile(*script, options, streams);
  }
  if (std::holds_alternative<RunShell>(command.what)) {
    return runScript({streams.input, "line", streams.isInputTerminal, true}, options,
                     streams.output, streams.errors);
  }
  if (const auto* preferences = std::get_if<Preferences>(&command.what)) {
    return showOrChangePreferences(*preferences, options.json, streams.output, streams.errors);
  }
  if (const auto* notification = std::get_if<PostNotification>(&command.what)) {
    return postNotification(*notification, streams.errors);
  }
  const EventForm form = options.json ? EventForm::kJson : EventForm::kText;
  if (const auto* show = std::get_if<ShowSnapshot>(&command.what)) {
    return showSnapshot(*show, form, streams.output, streams.errors);
  }
  if (const auto* extract = std::get_if<ExtractSnapshot>(&command.what)) {
    return extractSnapshot(*extract, form, streams.output, streams.errors);
  }
  if (const auto* record = std::get_if<RecordTrace>(&command.what)) {
    return recordTrace(*record, options, streams.output, streams.errors);
  }
  if (const auto* trace = std::get_if<ShowTrace>(&command.what)) {
    return showTrace(*trace, form, streams.output, streams.errors);
  }
  if (const auto* trace = std::get_if<ExportTrace>(&command.what)) {
    return exportTrace(*trace, streams.errors);
  }
  if (const auto* records = std::get_if<ShowRecords>(&command.what)) {
    return showRecords(*records, form, streams.output, streams.outputDescriptor, streams.errors);
  }
  if (const auto* drivers = std::get_if<ShowDrivers>(&command.what)) {
    return showDrivers(*drivers, form, streams.output, streams.outputDescriptor, streams.errors);
  }
  if (const auto* summaries = std::get_if<ShowSummaries>(&command.what)) {
    return showSummaries(*summaries, form, streams.output, streams.errors);
  }
  return showEvents(std::get<ShowEvents>(command.what), form, streams.output,
                    streams.outputDescriptor, streams.errors);
}

}  // namespace

ExitStatus runTool(std::vector<std::string> arguments, const ToolStreams& streams) {
  auto parsed = parseCommandLine(std::move(arguments), CommandSource::kArguments, streams.input);
  ExitStatus status = ExitStatus::kDone;
  if (const auto* text = std::get_if<CommandLineText>(&parsed)) {
    (text->status == ExitStatus::kDone ? streams.output : streams.errors) << text->text;
    status = text->status;
  } else {
    status = runCommand(std::get<Command>(parsed), streams);
  }
  if (!streams.output.flush()) {
    streams.errors << "halvoxctl: the output cannot be written\n";
    return status == ExitStatus::kDone ? ExitStatus::kCannotWrite : status;
  }
  return status;
}

}  // namespace halvox::tools
