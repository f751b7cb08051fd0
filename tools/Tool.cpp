#include "tools/Tool.h"

#include <utility>
#include <variant>

#include "tools/CommandLine.h"
#include "tools/Complaint.h"

namespace halvox::tools {
ExitStatus runTool(std::vector<std::string> arguments, const std::string& version,
                   const ToolStreams& streams) {
  const bool isJson = asksForJson(arguments);
  auto parsed =
      parseCommandLine(std::move(arguments), CommandSource::kArguments, streams.input, version);
  ExitStatus status = ExitStatus::kDone;
  if (const auto* text = std::get_if<CommandLineText>(&parsed)) {
    (text->status == ExitStatus::kDone ? streams.output : streams.errors) << text->text;
    status = text->status;
    if (isJson && status != ExitStatus::kDone) {
      streams.output << failureJson(text->command, {failureKind(status), "", text->reason}) << '\n';
    }
  } else {
    status = std::get<Command>(parsed).run(streams);
  }
  // A full disk may show only here, after everything was printed.
  if (!streams.output.flush() && status != ExitStatus::kCannotWrite) {
    streams.errors << "halvoxctl: the output cannot be written\n";
    return status == ExitStatus::kDone ? ExitStatus::kCannotWrite : status;
  }
  return status;
}

}  // namespace halvox::tools
