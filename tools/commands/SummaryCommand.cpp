#include <memory>

#include "tools/Summary.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {

void addSummaryCommand(CommandSet& commands) {
  const auto request = std::make_shared<ShowSummaries>();
  CLI::App& summary =
      commands.add({.name = "summary",
                    .summary = "Show summaries of sessions, which internal builds write",
                    .example = "halvoxctl summary --last 5",
                    .details = "A single FILE is shown with its messages.",
                    .reach = CommandReach::kFiles});
  auto* last = addParsed(summary, "--last", request->last, parseCount,
                         "Without a FILE: the newest N (default: 10)");
  last->type_name("N");
  offerFiles(summary
                 .add_option("FILE", request->files,
                             "Summary files (default: the newest of the service's)")
                 ->excludes(last));
  commands.onRun(
      summary, [request] { return *request; },
      [](const ShowSummaries& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showSummaries(asked, options.form(), streams.output, streams.errors);
      });
}

}  // namespace halvox::tools
