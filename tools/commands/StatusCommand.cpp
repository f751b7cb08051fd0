#include "tools/Status.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {

void addStatusCommand(CommandSet& commands) {
  CLI::App& status =
      commands.add({.name = "status",
                    .summary = "Show how the service is, where its files are and what is off",
                    .example = "halvoxctl status --json",
                    .details = "Without a service it shows what the files say, and ends with the "
                               "exit status 69. Rates are means since the service started.",
                    .reach = CommandReach::kService});
  commands.onRun(
      status, [] { return ShowStatus{}; }, showStatus);
}

}  // namespace halvox::tools
