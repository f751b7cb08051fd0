#include "tools/commands/Selection.h"

#include <string>
#include <vector>

#include "platform/linux/base/Result.h"
#include "tools/Arguments.h"
#include "tools/CommandSet.h"
#include "tools/TimeText.h"

namespace halvox::tools {
namespace {

platform::linux_::Result<double> parseTimeNow(std::string_view text) {
  return parseTime(text, timeNow());
}

void addCursors(CLI::App& app, RecordSelection& selection, const std::string& records) {
  auto* at = addParsed(app, "--cursor", selection.cursor, parseCursor,
                       "Begin with the row that this cursor names; cursors are in the JSON output")
                 ->type_name("CURSOR");
  addParsed(app, "--after-cursor", selection.afterCursor, parseCursor,
            "Only " + records + " that come after the row that this cursor names")
      ->type_name("CURSOR")
      ->excludes(at);
  app.add_flag("--show-cursor", selection.showCursor,
               "Print the cursor of the last row after it, for --after-cursor of the next run");
}

}  // namespace

void addTimes(CLI::App& app, std::optional<double>& since, std::optional<double>& until,
              const char* records) {
  const std::vector<std::string> times{"today", "yesterday", "now", "5min", "1h", "1d", "1w"};
  offerWords(
      addParsed(
          app, "--since", since, parseTimeNow,
          "Only " + std::string(records) +
              " since TIME: a time that a command printed, \"2026-11-21 22:44\", 2026-11-21, RFC "
              "3339 with an "
              "offset, today, yesterday, how long ago (90s, 5min, 2h, 3d, 1w, also -5min), or "
              "@SECONDS since 1970")
          ->type_name("TIME"),
      times);
  offerWords(addParsed(app, "--until", until, parseTimeNow,
                       "Only " + std::string(records) + " before TIME, in the forms of --since")
                 ->type_name("TIME"),
             times);
}

void addDatabase(CLI::App& app, std::string& database) {
  offerFiles(
      app.add_option(
             "--database", database,
             "The store: a halvox.db or its directory (default: what the configuration names, "
             "else the user's, $XDG_STATE_HOME/halvox or ~/.local/state/halvox, if there is "
             "one, else the system's, /var/lib/halvox)")
          ->type_name("FILE"));
}

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
  addTimes(app, selection.since, selection.until, records);
  addParsed(app, "-n,--last", selection.last, parseCount,
            "Only the newest N; 0 with --follow shows new ones only")
      ->type_name("N");
  addParsed(app, "--grep", selection.grep, TextPattern::compile,
            only +
                " with a text that matches this extended regular expression; ignores case unless "
                "the expression has an upper-case letter")
      ->type_name("REGEX");
  auto* reverse = app.add_flag("-r,--reverse", selection.isReversed, "Newest first");
  app.add_flag("-f,--follow", selection.follow,
               std::string("Keep showing ") + records +
                   " as they come; starts with the last 10 unless --since, --last or a cursor is "
                   "given")
      ->excludes(reverse);
  addCursors(app, selection, records);
  app.add_flag("--utc", selection.isUtc, "Show times in UTC instead of local time");
  app.add_flag("-l,--full", selection.isFull,
               "Show long values whole; at a terminal they are otherwise cut to its width");
  app.add_flag_callback(
      "--no-pager", [&selection] { selection.usePager = false; },
      "Print directly; at a terminal, what does not follow is otherwise shown by "
      "$HALVOX_PAGER, $PAGER or less");
  addDatabase(app, selection.database);
}

}  // namespace halvox::tools
