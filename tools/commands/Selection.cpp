#include "tools/commands/Selection.h"

#include <chrono>
#include <string>

#include "tools/Arguments.h"
#include "tools/CommandSet.h"

namespace halvox::tools {
namespace {

Parsed<double> parseTimeNow(std::string_view text) {
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  return parseTime(text, std::chrono::duration<double>(now).count());
}

}  // namespace

void addSelection(CLI::App& app, RecordSelection& selection, const char* records,
                  const char* names) {
  const std::string only = std::string("Only ") + records;
  if (names != nullptr) {
    app.add_option(names, selection.names,
                   only + " with a name that matches this glob pattern; may be given several times")
        ->type_name("GLOB")
        ->expected(1)
        ->take_all();
  }
  addParsed(
      app, "--since", selection.since, parseTimeNow,
      only + " since then: a date (RFC 3339), seconds since 1970, or an age (90s, 5m, 2h, 3d)")
      ->type_name("TIME");
  addParsed(app, "--until", selection.until, parseTimeNow, only + " before then")
      ->type_name("TIME");
  addParsed(app, "--last", selection.last, parseCount, "Only so many, the newest")->type_name("N");
  app.add_flag("--follow", selection.follow,
               std::string("Go on showing ") + records +
                   " as they come; begins with the last 10 unless --since or --last say otherwise");
  app.add_option("--database", selection.database,
                 "The store: a halvox.db or its directory (default: what the configuration names, "
                 "else the user's, $XDG_STATE_HOME/halvox or ~/.local/state/halvox, if there is "
                 "one, else the system's, /var/lib/halvox)")
      ->type_name("FILE");
}

}  // namespace halvox::tools
