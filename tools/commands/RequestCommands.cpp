#include <memory>
#include <optional>

#include "tools/JsonText.h"
#include "tools/RequestRunner.h"
#include "tools/Requests.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {
namespace {

constexpr const char* kSessionNote =
    "A session lives as long as the connection that made it, and a single command ends its "
    "connection. Use 'halvoxctl run' or 'halvoxctl shell' for commands that belong "
    "together.";

// The parsed arguments, from which the request is then made.
struct Arguments {
  ReporterID id = 0;
  ServiceType serviceType = 0;
  Category category = 0;
  EventType eventType = 0;
  Dictionary dictionary{};
  std::vector<ReporterID> ids{};
  bool isToAll = false;
  bool isWaiting = false;
  std::optional<std::chrono::milliseconds> time{};
};
using SharedArguments = std::shared_ptr<Arguments>;

ExitStatus runRequest(const Request& request, const CommonOptions& options,
                      const ToolStreams& streams) {
  RequestRunner runner(options, streams.output, streams.errors);
  return runner.run(request, options.json, "halvoxctl ");
}

// `make` returns the request for `arguments`.
template <typename Make>
void onRequest(CommandSet& commands, CLI::App& app, const SharedArguments& arguments, Make make) {
  commands.onRun(
      app, [arguments, make] { return Request(make(*arguments)); }, runRequest);
}

void addID(CLI::App& app, const SharedArguments& arguments) {
  offerLive(
      addParsed(app, "ID", arguments->id, parseReporterID, "The session's reporter ID")->required(),
      "sessions");
}

void addJson(CommandSet& commands, CLI::App& app, const SharedArguments& arguments,
             const std::string& what) {
  app.add_option_function<std::string>(
         "JSON",
         [&commands, arguments](const std::string& text) {
           const std::string json = text == "-" ? commands.readInput() : text;
           arguments->dictionary = valueOf(parseDictionary(json), "JSON");
         },
         what + " as a JSON object; \"-\" reads standard input")
      ->required();
}

// Adds a request with a session's reporter ID as its only argument.
template <typename R>
void addForSession(CommandSet& commands, const CommandText& text) {
  // Shared with the callbacks of the parser, which outlive this function.
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& app = commands.add(text);
  addID(app, arguments);
  onRequest(commands, app, arguments, [](const Arguments& given) { return R{given.id}; });
}

void addSetType(CommandSet& commands) {
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& app = commands.add({.name = "set-type",
                                .summary = "Set a session's service type",
                                .example = "halvoxctl set-type 7 telephony"});
  addID(app, arguments);
  offerServiceTypes(addParsed(app, "TYPE", arguments->serviceType, parseServiceType,
                              "A service type: name or number")
                        ->required());
  onRequest(commands, app, arguments, [](const Arguments& given) {
    return SetType{given.id, given.serviceType};
  });
}

void addConfigure(CommandSet& commands) {
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& app = commands.add(
      {.name = "configure",
       .summary = "Merge a dictionary into a session's configuration",
       .example =
           "halvoxctl configure 7 '{\"HostApplicationDisplayID\": \"org.example.player\"}'"});
  addID(app, arguments);
  addJson(commands, app, arguments, "The configuration");
  onRequest(commands, app, arguments, [](const Arguments& given) {
    return Configure{given.id, given.dictionary};
  });
}

void addStart(CommandSet& commands) {
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& app = commands.add(
      {.name = "start", .summary = "Start a session", .example = "halvoxctl start 7 --wait 10"});
  addID(app, arguments);
  addOptionalSeconds(
      app, "--wait",
      [arguments](std::optional<std::chrono::milliseconds> time) {
        arguments->isWaiting = true;
        arguments->time = time;
      },
      "Wait for the service's answer, which comes when the session is stopped; at most SECONDS, or "
      "--timeout if there is no number");
  onRequest(commands, app, arguments, [&commands](const Arguments& given) {
    if (!given.isWaiting) return Start{given.id, std::nullopt};
    return Start{given.id, given.time.value_or(commands.options().timeout)};
  });
}

Send makeSend(const Arguments& given) {
  // --all is not the default without --id, because the command cannot know which sessions are
  // meant.
  if (given.isToAll == !given.ids.empty()) {
    throw CLI::ValidationError(
        "--id",
        given.isToAll
            ? "cannot be combined with --all; expected one of the two"
            : "is missing; expected --id ID for some sessions or --all for all active ones");
  }
  Send send{
      .ids = {}, .category = given.category, .type = given.eventType, .message = given.dictionary};
  if (!given.isToAll) send.ids = given.ids;
  return send;
}

void addSend(CommandSet& commands) {
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& app =
      commands.add({.name = "send",
                    .summary = "Send a message to sessions, also to those of other clients",
                    .example = "halvoxctl send --id 7 --category Session_Playback --type "
                               "Start '{\"sample_rate\": 48000}'"});
  offerLive(
      addEach(app, "--id", arguments->ids, parseReporterID, "A session that the message is for")
          ->type_name("ID"),
      "sessions");
  app.add_flag("--all", arguments->isToAll, "The message is for all active sessions");
  offerCategories(addParsed(app, "--category", arguments->category, parseCategory,
                            "Name or number, such as Session_Playback")
                      ->type_name("CATEGORY")
                      ->required());
  offerEventTypes(addParsed(app, "--type", arguments->eventType, parseEventType,
                            "Name or number, such as Start")
                      ->type_name("TYPE")
                      ->required());
  addJson(commands, app, arguments, "The message");
  onRequest(commands, app, arguments, makeSend);
}

// Adds a request without arguments.
template <typename R>
void addBare(CommandSet& commands, const CommandText& text) {
  onRequest(commands, commands.add(text), std::make_shared<Arguments>(),
            [](const Arguments& /*given*/) { return R{}; });
}

}  // namespace

void addRequestCommands(CommandSet& commands) {
  addForSession<Create>(commands, {.name = "create",
                                   .summary = "Create a session",
                                   .example = "halvoxctl create 7",
                                   .details = kSessionNote});
  addSetType(commands);
  addConfigure(commands);
  addStart(commands);
  addSend(commands);
  addForSession<Stop>(commands,
                      {.name = "stop", .summary = "Stop a session", .example = "halvoxctl stop 7"});
  addForSession<Destroy>(
      commands,
      {.name = "destroy", .summary = "Destroy a session", .example = "halvoxctl destroy 7"});
  addForSession<GetType>(
      commands,
      {.name = "type", .summary = "Show a session's service type", .example = "halvoxctl type 7"});
  addForSession<Valid>(commands,
                       {.name = "valid",
                        .summary = "Show whether a session exists; exit status 1 when it does not",
                        .example = "halvoxctl valid 7 && echo there"});
  addBare<List>(commands, {.name = "list",
                           .summary = "List the reporter IDs of all sessions",
                           .example = "halvoxctl list --json"});
  addBare<Kill>(commands,
                {.name = "kill",
                 .summary = "End the service at once, without cleanup; only root and its user may",
                 .example = "halvoxctl kill"});
}

void addScriptRequests(CommandSet& commands) {
  const auto arguments = std::make_shared<Arguments>();
  CLI::App& wait = commands.add({.name = "wait",
                                 .summary = "Wait for the answer to the last start of a session",
                                 .example = "wait 7 10"});
  addID(wait, arguments);
  addParsed(wait, "SECONDS", arguments->time, parseSeconds,
            "The longest time to wait (default: that of --timeout)");
  onRequest(commands, wait, arguments, [](const Arguments& given) {
    return WaitForStart{given.id, given.time.value_or(std::chrono::milliseconds::zero())};
  });

  CLI::App& sleep = commands.add(
      {.name = "sleep", .summary = "Wait; the connection stays open", .example = "sleep 0.5"});
  addParsed(sleep, "SECONDS", arguments->time, parseSeconds, "How long")->required();
  onRequest(commands, sleep, arguments, [](const Arguments& given) { return Sleep{*given.time}; });
}

}  // namespace halvox::tools
