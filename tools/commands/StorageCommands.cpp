#include <memory>
#include <string>

#include "tools/Erase.h"
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

void addVacuumCommand(CommandSet& commands) {
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

void addEraseCommand(CommandSet& commands) {
  const auto request = std::make_shared<EraseStored>();
  CLI::App& erase = commands.add(
      {.name = "erase",
       .summary = "Erase an application, a session or a time from all files of the service",
       .example = "halvoxctl erase --app org.example.player",
       .details =
           "Afterwards, none of the erased bytes is in the database, its log, summaries of "
           "sessions "
           "or captures. Captures hold lines of every client: --app and --session delete all of "
           "them. Databases that were set aside because they were damaged are deleted too. The "
           "running service does the work and goes on storing records; only root and its own user "
           "may ask it. If no service runs, halvoxctl does it. Not reached: what was sent to NATS "
           "servers, the system's journal, exports, reports, traces, and what running sessions "
           "still hold in memory and report when they stop."});
  auto* app = addParsed(erase, "--app", request->application, parseErasedApplication,
                        "Erase what has this name of an application (HostApplicationDisplayID)")
                  ->type_name("NAME");
  offerLive(app, "applications");
  auto* session = addParsed(erase, "--session", request->session, parseErasedSession,
                            "Erase the link messages of this session and the events of the same "
                            "messages")
                      ->type_name("ID");
  offerLive(session, "stored_sessions");
  auto* before = addParsed(erase, "--before", request->before, parsePastTime,
                           "Erase what is older: 7d, 2h, 2026-11-21")
                     ->type_name("TIME");
  offerWords(before, {"today", "yesterday", "1d", "1w", "30d"});
  commands.onRun(
      erase,
      [request, app, session, before] {
        if (app->count() + session->count() + before->count() != 1) {
          throw CLI::ValidationError("expected one of --app, --session and --before");
        }
        return *request;
      },
      eraseStored);
}

}  // namespace

void addStorageCommands(CommandSet& commands) {
  addVacuumCommand(commands);
  addEraseCommand(commands);
}

}  // namespace halvox::tools
