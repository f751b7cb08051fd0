#include <memory>
#include <string>

#include "tools/OfferedValues.h"
#include "tools/TimeText.h"
#include "tools/Vacuum.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {
namespace {

platform::linux_::Result<double> parsePastTime(std::string_view text) {
  const double now = timeNow();
  auto time = parseTime(text, now);
  if (time && *time > now) {
    return platform::linux_::Failure<>{"\"" + std::string(text) +
                                       "\" is in the future; expected a time that has passed"};
  }
  return time;
}

}  // namespace

void addStorageCommands(CommandSet& commands) {
  const auto request = std::make_shared<VacuumStore>();
  CLI::App& vacuum = commands.add(
      {.name = "vacuum",
       .summary = "Delete old records and give their space back",
       .example = "halvoxctl vacuum --older 7d --to 100M",
       .details =
           "The running service does the work and goes on storing records; only root and its own "
           "user may ask it. If no service runs, halvoxctl does it. Records of sessions that still "
           "run are deleted like others. Captures and summary files stay."});
  auto* older = addParsed(vacuum, "--older", request->before, parsePastTime,
                          "Delete records that are older: 7d, 2h, 2026-11-21")
                    ->type_name("TIME");
  offerWords(older, {"today", "yesterday", "1d", "1w", "30d"});
  auto* size = addParsed(vacuum, "--to", request->toBytes, parseBytes,
                         "Then delete the oldest until the database file has at most this size: "
                         "100M, 2G")
                   ->type_name("SIZE");
  commands.onRun(
      vacuum,
      [request, older, size] {
        if (older->empty() && size->empty()) {
          throw CLI::ValidationError("expected --older, --to or both");
        }
        return *request;
      },
      vacuumStore);
}

}  // namespace halvox::tools
