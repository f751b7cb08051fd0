#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "client/Vocabulary.h"
#include "tools/Events.h"
#include "tools/Records.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

using Kind = ShowRecords::Kind;

ExitStatus runEvents(const ShowEvents& request, const CommonOptions& options,
                     const ToolStreams& streams) {
  return showEvents(request, options.form(), streams.output, streams.outputDescriptor,
                    streams.errors);
}

ExitStatus runRecords(const ShowRecords& request, const CommonOptions& options,
                      const ToolStreams& streams) {
  return showRecords(request, options.form(), streams.output, streams.outputDescriptor,
                     streams.errors);
}

CLI::Option* addNumbers(CLI::App& app, const char* name, std::vector<std::int64_t>& numbers,
                        const char* description) {
  return addEach(app, name, numbers, parseNumber, description)->type_name("N");
}

template <typename Targets>
void addCategories(CLI::App& app, Targets& categories, const std::string& records) {
  offerCategories(
      addEach(
          app, "--category", categories, parseCategory,
          "Only " + records +
              " of this category: a name such as Session_Playback, or a number. A category without "
              "a domain, such as Playback, stands for all domains")
          ->type_name("CATEGORY"));
}

template <typename Targets>
void addTypes(CLI::App& app, Targets& types, const std::string& records) {
  offerEventTypes(addEach(app, "--type", types, parseEventType,
                          "Only " + records + " of this type: a name such as Start, or a number")
                      ->type_name("TYPE"));
}

// Adds a command that shows the records of one kind. Its options are parsed into `request`.
CLI::App& addRecords(CommandSet& commands, const CommandText& text,
                     const std::shared_ptr<ShowRecords>& request) {
  CLI::App& app = commands.add(text);
  commands.onRun(
      app, [request] { return *request; }, runRecords);
  return app;
}

std::shared_ptr<ShowRecords> makeRequest(Kind kind) {
  auto request = std::make_shared<ShowRecords>();
  request->kind = kind;
  return request;
}

void addEvents(CommandSet& commands) {
  const auto request = std::make_shared<ShowEvents>();
  CLI::App& events =
      commands.add({.name = "events",
                    .summary = "Show the events that the service stored, newest last",
                    .example = "halvoxctl events --name 'com.tarno.*' --since 5m --follow",
                    .details = "The service stores each message under two names, one with "
                               "\"halvox\" and one with the service type. Lines show the second; "
                               "--all-names shows both. Lines leave out what the service recorded "
                               "about connections of halvoxctl itself; --own shows it. --json has "
                               "everything.",
                    .reach = CommandReach::kFiles});
  auto* applications =
      events
          .add_option(
              "--app", request->applications,
              "Only events of applications that match this glob pattern; may be given several "
              "times")
          ->type_name("GLOB")
          ->expected(1)
          ->take_all();
  offerLive(applications, "applications");
  offerLive(
      addNumbers(
          events, "--session", request->sessions,
          "Only events of messages that the link's local back-end stored for this session (-1: "
          "outside any session)"),
      "stored_sessions");
  addCategories(events, request->categories, "events");
  addTypes(events, request->types, "events");
  events.add_flag("--all-names", request->hasAllNames, "Show both events of each message");
  events.add_flag("--own", request->hasOwnEvents,
                  "Also show events about connections of halvoxctl itself");
  addSelection(events, request->selection, "events", "--name");
  offerLive(events.get_option("--name"), "event_names");
  // The link stores a message later than its events.
  events.get_option("--session")->excludes(events.get_option("--follow"));
  commands.onRun(
      events, [request] { return *request; }, runEvents);
}

void addMetrics(CommandSet& commands) {
  const auto request = makeRequest(Kind::kMetrics);
  CLI::App& metrics = addRecords(commands,
                                 {.name = "metrics",
                                  .summary = "Show the issue metrics that the service stored",
                                  .example = "halvoxctl metrics --id 0x5B0003 --last 5",
                                  .reach = CommandReach::kFiles},
                                 request);
  addNumbers(metrics, "--id", request->ids, "Only metrics of this identifier");
  addSelection(metrics, request->selection, "metrics", nullptr);
}

void addPower(CommandSet& commands) {
  const auto request = makeRequest(Kind::kPower);
  CLI::App& power = addRecords(commands,
                               {.name = "power",
                                .summary = "Show the power events that the service stored",
                                .example = "halvoxctl power --name 'Oxbow*' --since 1h",
                                .reach = CommandReach::kFiles},
                               request);
  addNumbers(power, "--category", request->categories, "Only events of this category");
  addSelection(power, request->selection, "power events", "--name");
  offerLive(power.get_option("--name"), "power_event_names");
}

void addLink(CommandSet& commands) {
  const auto request = makeRequest(Kind::kLink);
  CLI::App& link = addRecords(commands,
                              {.name = "link",
                               .summary = "Show the messages that the link's local back-end stored",
                               .example = "halvoxctl link --session 7 --follow",
                               .reach = CommandReach::kFiles},
                              request);
  offerLive(addNumbers(link, "--session", request->ids,
                       "Only messages of this session (-1: those outside any session)"),
            "stored_sessions");
  addCategories(link, request->categories, "messages");
  addTypes(link, request->types, "messages");
  addSelection(link, request->selection, "messages", "--service");
  std::vector<std::string> services;
  for (const auto& type : client::serviceTypes()) {
    services.emplace_back(type.name);
    services.push_back(std::string(type.name) + "_session");
  }
  offerWords(link.get_option("--service"), services);
}

}  // namespace

void addRecordCommands(CommandSet& commands) {
  addEvents(commands);
  addMetrics(commands);
  addPower(commands);
  addLink(commands);
}

}  // namespace halvox::tools
