#include <memory>

#include "tools/Explain.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {

void addExplainCommand(CommandSet& commands) {
  const auto request = std::make_shared<Explain>();
  CLI::App& app = commands.add(
      {.name = "explain",
       .summary = "Explain where messages went and why",
       .example = "halvoxctl explain Session_Playback.Start\n  halvoxctl explain 1204",
       .details = "Says how an event got its name, whether sessions dropped messages as "
                  "repetitions, and which sinks took them: the events, the link, the summary of "
                  "the session, the power log, the issue metrics, captures and traces. A sink is "
                  "said to have taken a message only if the store shows it. Shows the settings "
                  "that decide, as they are in the configuration file now, and what the store "
                  "does not show."});
  offerLive(
      app.add_option("TARGET", request->target,
                     "The name of an event, such as com.tarno.halvox.Session_Playback.Start or "
                     "Session_Playback.Start, or the ID of a session or of a stored message")
          ->required(),
      "event_names");
  addTimes(app, request->since, request->until, "records");
  addDatabase(app, request->database);
  commands.onRun(
      app, [request] { return *request; }, explain);
}

}  // namespace halvox::tools
