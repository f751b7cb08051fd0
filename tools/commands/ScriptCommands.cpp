#include <cerrno>
#include <fstream>
#include <memory>

#include "platform/linux/base/ErrnoText.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/Script.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {
namespace {

constexpr const char* kScriptNote =
    "Each line has the arguments of halvoxctl, quoted as in a shell; a JSON object at the end "
    "of a line needs no quotes. # starts a comment.\nBesides the requests there are 'wait ID "
    "[SECONDS]' (for the answer to a start) and 'sleep SECONDS'.\nEnds at the first line that "
    "fails, with its status.";

ExitStatus runFile(const RunScript& script, const CommonOptions& options,
                   const ToolStreams& streams) {
  if (script.file == "-") {
    return runScript({streams.input, "standard input", false, script.keepGoing}, options,
                     streams.output, streams.errors);
  }
  std::ifstream file(script.file);
  // Opening a directory succeeds. Only reading shows the error.
  if (file) static_cast<void>(file.peek());
  if (file.bad() || !file.is_open()) {
    return Complaint("run", options.form(), streams.output, streams.errors)(
        ExitStatus::kBadArguments,
        "FILE: cannot read " + script.file + ": " + platform::linux_::errnoText(errno));
  }
  return runScript({file, harmlessText(script.file), false, script.keepGoing}, options,
                   streams.output, streams.errors);
}

ExitStatus runTypedLines(const RunShell& /*shell*/, const CommonOptions& options,
                         const ToolStreams& streams) {
  // Continues after errors, because a person at the terminal can correct a line.
  return runScript({streams.input, "line", streams.isInputTerminal, true}, options, streams.output,
                   streams.errors);
}

}  // namespace

void addScriptCommands(CommandSet& commands) {
  const auto script = std::make_shared<RunScript>();
  CLI::App& run = commands.add(
      {.name = "run",
       .summary = "Carry out the commands in a file, one on each line, over one connection",
       .example = "printf 'create 7\\nstart 7\\nstop 7\\n' | halvoxctl run -",
       .details = kScriptNote});
  offerFiles(
      run.add_option("FILE", script->file, "The file; \"-\" reads standard input")->required(),
      {"-"});
  run.add_flag("--keep-going", script->keepGoing, "Continue after lines that fail");
  commands.onRun(
      run, [script] { return *script; }, runFile);

  CLI::App& shell =
      commands.add({.name = "shell",
                    .summary = "Read commands as you type them, over one connection",
                    .example = "halvoxctl shell",
                    .details = "Sessions live until you leave. 'help' lists the commands, 'quit' "
                               "or the end of the input leaves."});
  commands.onRun(
      shell, [] { return RunShell{}; }, runTypedLines);
}

}  // namespace halvox::tools
