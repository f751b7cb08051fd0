#include <memory>
#include <string>

#include "tools/Fields.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

void addFilters(CLI::App& app, ShowFields& request) {
  offerLive(app.add_option(
                   "--app", request.applications,
                   "Only events of applications that match this glob pattern; may be given several "
                   "times")
                ->type_name("GLOB")
                ->expected(1)
                ->take_all(),
            "applications");
  offerCategories(
      addEach(app, "--category", request.categories, parseCategory,
              "Only messages of this category: a name such as Session_Playback, or a number. A "
              "category without a domain, such as Playback, stands for all domains")
          ->type_name("CATEGORY"));
  offerEventTypes(addEach(app, "--type", request.types, parseEventType,
                          "Only messages of this type: a name such as Start, or a number")
                      ->type_name("TYPE"));
  addTimes(app, request.since, request.until, "records");
  addDatabase(app, request.database);
}

}  // namespace

void addFieldCommand(CommandSet& commands) {
  const auto request = std::make_shared<ShowFields>();
  CLI::App& fields = commands.add(
      {.name = "fields",
       .summary = "List the keys of the stored records, with types and examples",
       .example = "halvoxctl fields --category Volume --since today",
       .details = "One line for each key: the types of its values, the number of records that have "
                  "it, its newest value, and the messages and events in which it occurs. The two "
                  "events of a message count as one record. Issue metrics have no keys and are "
                  "skipped, as are the keys that the summary of a session repeats. At most 10000 "
                  "keys are shown. At a terminal, values are cut and "
                  "columns are omitted to fit its width; --json has everything.",
       .reach = CommandReach::kFiles});
  addFilters(fields, *request);
  commands.onRun(
      fields, [request] { return *request; },
      [](const ShowFields& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showFields(asked, options.form(), streams.output, streams.outputDescriptor,
                          streams.errors);
      });
}

}  // namespace halvox::tools
