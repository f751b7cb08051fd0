#include <memory>

#include "tools/Sql.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {

void addQueryCommands(CommandSet& commands) {
  const auto request = std::make_shared<RunSql>();
  CLI::App& sql = commands.add(
      {.name = "sql",
       .summary = "Ask the store questions in SQL",
       .example = "halvoxctl sql 'SELECT name, count(*) FROM analytics_events GROUP BY name'",
       .details =
           "The tables are analytics_events(time, name, payload), issue_metrics(time, metric_id, "
           "message), power_events(time, category_id, event_name, payload), link_messages(time, "
           "session_id, client_name, service_name, category, type, payload), snapshots(time, "
           "signature, path) and losses(time, piece, reason, count). Only reading is allowed. "
           "Without a query, reads statements from the "
           "standard input.",
       .reach = CommandReach::kFiles});
  sql.add_option("QUERY", request->query, "One or more statements");
  addDatabase(sql, request->database);
  commands.onRun(
      sql, [request] { return *request; }, runSql);
}

}  // namespace halvox::tools
