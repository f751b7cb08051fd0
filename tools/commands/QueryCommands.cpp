#include <memory>
#include <string>

#include "tools/Export.h"
#include "tools/Sql.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

void addSql(CommandSet& commands) {
  const auto request = std::make_shared<RunSql>();
  CLI::App& sql = commands.add(
      {.name = "sql",
       .summary = "Ask the store questions in SQL",
       .example = "halvoxctl sql 'SELECT name, count(*) FROM analytics_events GROUP BY name'",
       .details =
           "The tables are analytics_events(time, name, payload), issue_metrics(time, metric_id, "
           "message), power_events(time, category_id, event_name, payload), link_messages(time, "
           "session_id, client_name, service_name, category, type, payload) and snapshots(time, "
           "signature, path). Only reading is allowed. Without a query, reads statements from the "
           "standard input.",
       .reach = CommandReach::kFiles});
  sql.add_option("QUERY", request->query, "One or more statements");
  addDatabase(sql, request->database);
  commands.onRun(
      sql, [request] { return *request; }, runSql);
}

void addExport(CommandSet& commands) {
  const auto request = std::make_shared<ExportRecords>();
  const auto format = std::make_shared<std::string>("sqlite");
  CLI::App& exporting =
      commands.add({.name = "export",
                    .summary = "Write the stored records into a plain SQLite database",
                    .example = "halvoxctl export --format sqlite --to records.db --since today",
                    .reach = CommandReach::kFiles});
  exporting
      .add_option("--format", *format,
                  "The form of the file: sqlite, a database with five plain tables (default)")
      ->type_name("FORM")
      ->check(CLI::IsMember({"sqlite"}));
  exporting.add_option("--to", request->to, "The file to write")->type_name("FILE")->required();
  exporting.add_flag("--force", request->replace, "Replace the file if it exists");
  addTimes(exporting, request->since, request->until, "records");
  addDatabase(exporting, request->database);
  commands.onRun(
      exporting, [request, format] { return *request; }, exportRecords);
}

}  // namespace

void addQueryCommands(CommandSet& commands) {
  addSql(commands);
  addExport(commands);
}

}  // namespace halvox::tools
