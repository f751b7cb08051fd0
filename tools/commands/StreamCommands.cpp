#include <memory>

#include "tools/Streams.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

CLI::Option* addGlobs(CLI::App& app, const char* name, std::vector<std::string>& patterns,
                      const char* description) {
  return app.add_option(name, patterns, description)->type_name("GLOB")->expected(1)->take_all();
}

void addShow(CommandSet& commands, CLI::App& streams, const std::shared_ptr<ShowStreams>& list) {
  const auto request = std::make_shared<ShowStream>();
  CLI::App& show =
      commands.addBelow(streams, {.name = "show",
                                  .summary = "Tell the story of one stream or session in order",
                                  .example = "halvoxctl streams show 1204",
                                  .reach = CommandReach::kFiles});
  addParsed(show, "ID", request->id, parseNumber,
            "The ID in the first column of the list, or that of a session")
      ->required();
  addDatabase(show, request->database);
  commands.onRun(
      show,
      [request, list] {
        ShowStream asked = *request;
        // It may stand before "show", too.
        if (asked.database.empty()) asked.database = list->database;
        return asked;
      },
      [](const ShowStream& asked, const CommonOptions& options, const ToolStreams& toolStreams) {
        return showStream(asked, options.form(), toolStreams.output, toolStreams.errors);
      });
}

}  // namespace

void addStreamCommands(CommandSet& commands) {
  const auto list = std::make_shared<ShowStreams>();
  CLI::App& streams = commands.add(
      {.name = "streams",
       .summary = "Show what played and recorded: devices, volumes, glitches, ends",
       .example = "halvoxctl streams --since today --glitched\n  halvoxctl streams show 1204",
       .details = "One line for each stream or session, the newest last. At a terminal, values are "
                  "cut and columns are left out to fit its width; --json has everything.",
       .reach = CommandReach::kFiles});
  streams.require_subcommand(0, 1);
  offerLive(
      addGlobs(
          streams, "--app", list->applications,
          "Only streams of applications that match this glob pattern; may be given several times"),
      "applications");
  addGlobs(streams, "--device", list->devices,
           "Only streams that used a device whose description or node name matches this glob "
           "pattern; may be given several times");
  streams.add_flag("--glitched", list->glitched, "Only streams with an xrun");
  addTimes(streams, list->since, list->until, "streams that ran");
  addParsed(streams, "-n,--last", list->last, parseCount, "Only the newest N")->type_name("N");
  addDatabase(streams, list->database);
  // Without a sub-command it lists.
  commands.onRun(
      streams, [list] { return *list; },
      [](const ShowStreams& asked, const CommonOptions& options, const ToolStreams& toolStreams) {
        return showStreams(asked, options.form(), toolStreams.output, toolStreams.outputDescriptor,
                           toolStreams.errors);
      });
  addShow(commands, streams, list);
}

}  // namespace halvox::tools
