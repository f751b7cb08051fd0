#include "tools/CommandLine.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <iterator>
#include <utility>

#include <CLI/CLI.hpp>

#include "tools/Arguments.h"
#include "tools/HalvoxVersion.h"
#include "tools/JsonText.h"

namespace halvox::tools {
namespace {

constexpr const char* kSessionNote =
    "A session lives as long as the connection that made it: of its own, this command makes a "
    "connection and ends it. Use 'halvoxctl run' or 'halvoxctl shell' for commands that belong "
    "together.";

constexpr const char* kScriptNote =
    "The lines are as the arguments of halvoxctl, quoted as in a shell; a JSON object at the end "
    "of "
    "a line needs no quotes. # begins a comment line.\nBesides the requests there are 'wait ID "
    "[SECONDS]' (for the answer to a start) and 'sleep SECONDS'.\nEnds at the first line that "
    "fails, with its status.";

constexpr const char* kExitStatusNote =
    "Exit status: 0 done, 1 the service said no, 2 bad arguments, 69 no service or no store, "
    "74 the output or a file cannot be written, 78 bad configuration.";

double secondsSince1970() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

Parsed<double> parseTimeNow(std::string_view text) { return parseTime(text, secondsSince1970()); }

// Builds the parser for one command line and holds what it reads. Exceptions are the parsing
// library's own way to report; none leaves parse().
class CommandLineParser {
 public:
  CommandLineParser(CommandSource source, std::istream& input) : source_(source), input_(input) {
    app_.name(source == CommandSource::kArguments ? "halvoxctl" : "");
    app_.description("Talks to the Halvox reporting service.");
    app_.require_subcommand(1);
    // Built by hand: the library's own text for bad arguments repeats the whole usage.
    app_.footer(kExitStatusNote);
    addSessionRequests();
    addMessageRequest();
    addQueries();
    if (source == CommandSource::kArguments) {
      app_.set_version_flag("--version", std::string("halvoxctl ") + kHalvoxVersion);
      addConnectionOptions(app_);
      addScripts();
      addEvents();
      addSummary();
      addRecords();
      addSnapshots();
      addTrace();
      addSettings();
      addDrivers();
    } else {
      addScriptRequests();
    }
  }

  std::variant<Command, CommandLineText> parse(std::vector<std::string> arguments) {
    std::ranges::reverse(arguments);  // as the library wants them
    try {
      app_.parse(std::move(arguments));
    } catch (const CLI::CallForHelp&) {
      return CommandLineText{ExitStatus::kDone, helpOf(app_)};
    } catch (const CLI::CallForVersion& version) {
      return CommandLineText{ExitStatus::kDone, std::string(version.what()) + "\n"};
    } catch (const CLI::ParseError& error) {
      return CommandLineText{ExitStatus::kBadArguments, describe(error)};
    }
    return std::move(command_);
  }

 private:
  // An argument or option whose text one of the functions above understands.
  template <typename T, typename Target>
  CLI::Option* add(CLI::App& app, const std::string& name, Target& target,
                   Parsed<T> (*parseText)(std::string_view), const std::string& description) {
    const std::string shown = name.substr(name.rfind(',') + 1);
    return app.add_option_function<std::string>(
        name,
        [&target, parseText, shown](const std::string& text) {
          auto parsed = parseText(text);
          if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
            throw CLI::ValidationError(shown, error->message);
          }
          target = std::move(std::get<T>(parsed));
        },
        description);
  }

  // `summary` is the line in the list of commands; `details` stand in the command's own help only.
  CLI::App& addCommand(const char* name, const char* summary, const std::string& example,
                       const std::string& details = "") {
    CLI::App* app = app_.add_subcommand(name, summary);
    addConnectionOptions(*app);
    app->footer((details.empty() ? "" : details + "\n\n") + "Example:\n  " + example);
    return *app;
  }

  // Every command has these, and the program before the command too.
  void addConnectionOptions(CLI::App& app) {
    app.add_flag("--json", command_.options.json, "Print JSON, one object a line");
    if (source_ == CommandSource::kScriptLine) return;
    app.add_option("--socket", command_.options.socket,
                   "The service's socket (default: $HALVOX_SOCKET, else "
                   "$XDG_RUNTIME_DIR/halvox/reporting.sock, else /run/halvox/reporting.sock)")
        ->type_name("PATH");
    add(app, "--timeout", command_.options.timeout, parseSeconds,
        "How long to wait for an answer (default: 5)")
        ->type_name("SECONDS");
  }

  CLI::Option* addID(CLI::App& app) {
    return add(app, "ID", id_, parseReporterID, "The session's reporter ID")->required();
  }

  void addJson(CLI::App& app, const char* what) {
    app.add_option_function<std::string>(
           "JSON",
           [this](const std::string& text) {
             auto parsed = parseDictionary(text == "-" ? readInput() : text);
             if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
               throw CLI::ValidationError("JSON", error->message);
             }
             dictionary_ = std::get<Dictionary>(parsed);
           },
           std::string(what) + " as a JSON object; \"-\" reads standard input")
        ->required();
  }

  std::string readInput() {
    if (source_ == CommandSource::kScriptLine) {
      throw CLI::ValidationError("JSON", "\"-\" is for single commands; in a script, write it out");
    }
    return {std::istreambuf_iterator<char>(input_), {}};
  }

  template <typename Make>
  void onRun(CLI::App& app, Make make) {
    app.callback([this, make] { command_.what = make(); });
  }

  void addSessionRequests();
  void addMessageRequest();
  void addQueries();
  void addScriptRequests();
  void addScripts();
  void addEvents();
  void addSummary();
  void addRecords();
  void addSnapshots();
  void addTrace();
  void addSelection(CLI::App& app, const char* records, const char* names);
  static void addNumbers(CLI::App& app, const char* name, std::vector<std::int64_t>& numbers,
                         const char* description);
  void addSettings();
  void addDrivers();
  [[nodiscard]] Preferences makePreferences() const;
  [[nodiscard]] Send makeSend() const;
  static std::string helpOf(const CLI::App& app);
  [[nodiscard]] std::string describe(const CLI::ParseError& error) const;
  [[nodiscard]] std::string listCommands() const;

  CommandSource source_;
  std::istream& input_;
  CLI::App app_;
  Command command_;
  // What single arguments come to, for the command that is then made of them.
  ReporterID id_ = 0;
  ServiceType serviceType_ = 0;
  Category category_ = 0;
  EventType eventType_ = 0;
  Dictionary dictionary_;
  std::vector<ReporterID> ids_;
  bool toAll_ = false;
  bool isWaiting_ = false;
  std::optional<std::chrono::milliseconds> time_;
  RunScript script_;
  ShowEvents events_;
  ShowSummaries summaries_;
  RecordTrace recordTrace_;
  ExportTrace exportTrace_;
  ShowRecords records_;
  ExtractSnapshot snapshot_;
  Preferences preferences_;
  PostNotification notification_;
  ShowDrivers drivers_;
};

void CommandLineParser::addSessionRequests() {
  auto& create = addCommand("create", "Create a session", "halvoxctl create 7", kSessionNote);
  addID(create);
  onRun(create, [this] { return Create{id_}; });

  auto& setType =
      addCommand("set-type", "Set a session's service type", "halvoxctl set-type 7 telephony");
  addID(setType);
  add(setType, "TYPE", serviceType_, parseServiceType, "A service type: name or number")
      ->required();
  onRun(setType, [this] { return SetType{id_, serviceType_}; });

  auto& configure =
      addCommand("configure", "Merge a dictionary into a session's configuration",
                 "halvoxctl configure 7 '{\"HostApplicationDisplayID\": \"org.example.player\"}'");
  addID(configure);
  addJson(configure, "The configuration");
  onRun(configure, [this] { return Configure{id_, dictionary_}; });

  auto& start = addCommand("start", "Start a session", "halvoxctl start 7 --wait 10");
  addID(start);
  // A wait without a number waits as long as for any answer.
  start
      .add_option_function<std::vector<std::string>>(
          "--wait",
          [this](const std::vector<std::string>& texts) {
            isWaiting_ = true;
            if (texts.empty() || texts.front().empty()) return;
            const auto parsed = parseSeconds(texts.front());
            if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
              throw CLI::ValidationError("--wait", error->message);
            }
            time_ = std::get<std::chrono::milliseconds>(parsed);
          },
          "Wait for the service's answer, which it holds back until the session "
          "is stopped; without a number, as long as --timeout says")
      ->expected(0, 1)
      ->type_name("SECONDS");
  onRun(start, [this] {
    if (!isWaiting_) return Start{id_, std::nullopt};
    return Start{id_, time_.value_or(command_.options.timeout)};
  });

  auto& stop = addCommand("stop", "Stop a session", "halvoxctl stop 7");
  addID(stop);
  onRun(stop, [this] { return Stop{id_}; });

  auto& destroy = addCommand("destroy", "Destroy a session", "halvoxctl destroy 7");
  addID(destroy);
  onRun(destroy, [this] { return Destroy{id_}; });
}

void CommandLineParser::addMessageRequest() {
  auto& send = addCommand("send", "Send a message to sessions, its own and those of others",
                          "halvoxctl send --id 7 --category Session_Playback --type Start "
                          "'{\"sample_rate\": 48000}'");
  send.add_option_function<std::vector<std::string>>(
          "--id",
          [this](const std::vector<std::string>& texts) {
            for (const auto& text : texts) {
              const auto parsed = parseReporterID(text);
              if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
                throw CLI::ValidationError("--id", error->message);
              }
              ids_.push_back(std::get<ReporterID>(parsed));
            }
          },
          "A session that the message is for; may be given several times")
      ->type_name("ID")
      ->expected(1)
      ->take_all();
  send.add_flag("--all", toAll_, "The message is for all active sessions");
  add(send, "--category", category_, parseCategory, "Name or number, such as Session_Playback")
      ->type_name("CATEGORY")
      ->required();
  add(send, "--type", eventType_, parseEventType, "Name or number, such as Start")
      ->type_name("TYPE")
      ->required();
  addJson(send, "The message");
  onRun(send, [this] { return makeSend(); });
}

Send CommandLineParser::makeSend() const {
  if (toAll_ == !ids_.empty()) {
    throw CLI::ValidationError(
        "--id", toAll_ ? "goes with no --all; expected one of the two"
                       : "is missing; expected --id ID for some sessions or --all for the active");
  }
  Send send{.ids = {}, .category = category_, .type = eventType_, .message = dictionary_};
  if (!toAll_) send.ids = ids_;
  return send;
}

void CommandLineParser::addQueries() {
  auto& type = addCommand("type", "Show a session's service type", "halvoxctl type 7");
  addID(type);
  onRun(type, [this] { return GetType{id_}; });

  auto& valid = addCommand("valid", "Show whether a session exists; exit status 1 when it does not",
                           "halvoxctl valid 7 && echo there");
  addID(valid);
  onRun(valid, [this] { return Valid{id_}; });

  auto& list = addCommand("list", "List the reporter IDs of all sessions", "halvoxctl list --json");
  onRun(list, [] { return List{}; });

  auto& kill = addCommand("kill", "End the service at once, without an answer or any tidying up",
                          "halvoxctl kill");
  onRun(kill, [] { return Kill{}; });
}

void CommandLineParser::addScriptRequests() {
  auto& wait =
      addCommand("wait", "Wait for the answer to the last start of a session", "wait 7 10");
  addID(wait);
  add(wait, "SECONDS", time_, parseSeconds, "How long at most (default: the time-out)");
  onRun(wait, [this] { return WaitForStart{id_, time_.value_or(std::chrono::milliseconds(0))}; });

  auto& sleep = addCommand("sleep", "Let time pass with the connection open", "sleep 0.5");
  add(sleep, "SECONDS", time_, parseSeconds, "How long")->required();
  onRun(sleep, [this] { return Sleep{time_.value_or(std::chrono::milliseconds(0))}; });
}

void CommandLineParser::addScripts() {
  auto& run = addCommand("run", "Carry out a file of commands, one a line, over one connection",
                         "printf 'create 7\\nstart 7\\nstop 7\\n' | halvoxctl run -", kScriptNote);
  run.add_option("FILE", script_.file, "The file; \"-\" reads standard input")->required();
  run.add_flag("--keep-going", script_.keepGoing, "Go on behind lines that fail");
  onRun(run, [this] { return script_; });

  auto& shell =
      addCommand("shell", "Read commands as you type them, over one connection", "halvoxctl shell",
                 "Sessions live until you leave. 'help' lists the commands, 'quit' or the "
                 "end of the input leaves.");
  onRun(shell, [] { return RunShell{}; });
}

// What all commands that show stored records take; a null `names` where records have no name.
void CommandLineParser::addSelection(CLI::App& app, const char* records, const char* names) {
  const std::string only = std::string("Only ") + records;
  if (names != nullptr) {
    app.add_option(names, events_.names,
                   only + " of names that match this glob pattern; may be given several times")
        ->type_name("GLOB")
        ->expected(1)
        ->take_all();
  }
  add(app, "--since", events_.since, parseTimeNow,
      only + " since then: a date (RFC 3339), seconds since 1970, or an age (90s, 5m, 2h, 3d)")
      ->type_name("TIME");
  add(app, "--until", events_.until, parseTimeNow, only + " before then")->type_name("TIME");
  app.add_option("--last", events_.last, "Only so many, the newest")
      ->type_name("N")
      ->check(CLI::NonNegativeNumber);
  app.add_flag("--follow", events_.follow,
               std::string("Go on showing ") + records +
                   " as they come; begins with the last 10 unless --since or --last say otherwise");
  app.add_option("--database", events_.database,
                 "The store: a halvox.db or its directory (default: where the service's "
                 "configuration puts it)")
      ->type_name("FILE");
}

void CommandLineParser::addEvents() {
  auto& events = addCommand("events", "Show the events that the service stored, newest last",
                            "halvoxctl events --name 'com.tarno.*' --since 5m --follow");
  addSelection(events, "events", "--name");
  onRun(events, [this] { return events_; });
}

// An option of whole numbers, decimal or hexadecimal, that may be given several times.
void CommandLineParser::addNumbers(CLI::App& app, const char* name,
                                   std::vector<std::int64_t>& numbers, const char* description) {
  app.add_option_function<std::vector<std::string>>(
         name,
         [&numbers, name](const std::vector<std::string>& texts) {
           for (const auto& text : texts) {
             const auto parsed = parseReporterID(text);
             if (std::holds_alternative<ArgumentError>(parsed)) {
               throw CLI::ValidationError(
                   name, "\"" + harmlessText(text) + "\" is no number; expected a whole number");
             }
             numbers.push_back(std::get<ReporterID>(parsed));
           }
         },
         description)
      ->type_name("N")
      ->expected(1)
      ->take_all();
}

void CommandLineParser::addRecords() {
  const auto finish = [this](CLI::App& app, ShowRecords::Kind kind) {
    onRun(app, [this, kind] {
      records_.kind = kind;
      records_.selection = events_;
      return records_;
    });
  };
  auto& metrics = addCommand("metrics", "Show the issue metrics that the service stored",
                             "halvoxctl metrics --id 0x5B0003 --last 5");
  addNumbers(metrics, "--id", records_.ids, "Only metrics of this identifier");
  addSelection(metrics, "metrics", nullptr);
  finish(metrics, ShowRecords::Kind::kMetrics);

  auto& power = addCommand("power", "Show the power events that the service stored",
                           "halvoxctl power --name 'Oxbow*' --since 1h");
  addNumbers(power, "--category", records_.categories, "Only events of this category");
  addSelection(power, "power events", "--name");
  finish(power, ShowRecords::Kind::kPower);

  auto& link = addCommand("link", "Show the messages that the link's local back-end stored",
                          "halvoxctl link --session 7 --follow");
  addNumbers(link, "--session", records_.ids, "Only messages of this session; -1: single ones");
  addNumbers(link, "--category", records_.categories, "Only messages of this category");
  addNumbers(link, "--type", records_.types, "Only messages of this type");
  addSelection(link, "messages", "--service");
  finish(link, ShowRecords::Kind::kLink);
}

void CommandLineParser::addSummary() {
  auto& summary =
      addCommand("summary", "Show what sessions of internal builds came to",
                 "halvoxctl summary --last 5", "A single FILE is shown with its messages.");
  auto* last = summary.add_option("--last", summaries_.last,
                                  "Without a FILE: so many, the newest (default: 10)");
  last->type_name("N")->check(CLI::NonNegativeNumber);
  summary
      .add_option("FILE", summaries_.files, "Summary files (default: the newest of the service's)")
      ->excludes(last);
  onRun(summary, [this] { return summaries_; });
}

void CommandLineParser::addDrivers() {
  auto& drivers = addCommand("drivers", "Show what the audio drivers count, without the service",
                             "halvoxctl drivers --group Tx --watch 2");
  drivers.add_option("--group", drivers_.group, "Only the channels of this group")
      ->type_name("GROUP");
  drivers
      .add_option_function<std::vector<std::string>>(
          "--watch",
          [this](const std::vector<std::string>& texts) {
            drivers_.watch = std::chrono::seconds(1);
            if (texts.empty() || texts.front().empty()) return;
            const auto parsed = parseSeconds(texts.front());
            if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
              throw CLI::ValidationError("--watch", error->message);
            }
            drivers_.watch = std::get<std::chrono::milliseconds>(parsed);
          },
          "Show what they change by per second, again and again (default: every second)")
      ->expected(0, 1)
      ->type_name("SECONDS");
  onRun(drivers, [this] { return drivers_; });
}

void CommandLineParser::addSettings() {
  using Action = Preferences::Action;
  auto& preferences =
      addCommand("preferences", "Show or change settings that the service follows while it runs",
                 "halvoxctl preferences set com.tarno.halvox device_name Kitchen",
                 "A set or unset leaves everything else in the file as it is, comments too. Tables "
                 "with lines of their own cannot be changed so; edit the file instead.\nA VALUE "
                 "that begins with - comes behind a -- of its own.");
  preferences.add_option("ACTION", preferences_.action, "get, set or unset")
      ->required()
      ->transform(CLI::CheckedTransformer(std::vector<std::pair<std::string, Action>>{
          {"get", Action::kGet}, {"set", Action::kSet}, {"unset", Action::kUnset}}));
  preferences.add_option("DOMAIN", preferences_.domain, "A domain, such as com.tarno.halvox")
      ->required();
  preferences.add_option("KEY", preferences_.key, "A key; to get all, none");
  preferences.add_option("VALUE", preferences_.value,
                         "A TOML value; what is none is taken as a string");
  preferences.add_flag("--string", preferences_.isString, "Take VALUE as a string in any case");
  preferences.add_option("--user", preferences_.user, "Whose settings (default: mobile)")
      ->type_name("USER");
  preferences
      .add_option("--directory", preferences_.directory,
                  "Where the preferences are (default: as the service's configuration says)")
      ->type_name("DIRECTORY");
  onRun(preferences, [this] { return makePreferences(); });

  auto& notify = addCommand("notify", "Post a notification to the service",
                            "halvoxctl notify com.tarno.halvox.reporting");
  notify.add_option("NAME", notification_.name, "The notification")->required();
  notify
      .add_option("--directory", notification_.directory,
                  "Where the service looks for notifications (default: as its configuration says)")
      ->type_name("DIRECTORY");
  onRun(notify, [this] { return notification_; });
}

Preferences CommandLineParser::makePreferences() const {
  using Action = Preferences::Action;
  if (preferences_.action != Action::kGet && !preferences_.key.has_value()) {
    throw CLI::ValidationError("KEY", "is missing; expected the key to change");
  }
  if ((preferences_.action == Action::kSet) != preferences_.value.has_value()) {
    throw CLI::ValidationError("VALUE", preferences_.value.has_value()
                                            ? "goes with set only"
                                            : "is missing; expected what to set the key to");
  }
  return preferences_;
}

void CommandLineParser::addSnapshots() {
  auto& snapshots = addCommand("snapshots", "List, show or unpack what the service captured",
                               "halvoxctl snapshots --last 5\n  halvoxctl snapshots show newest");
  snapshots.require_subcommand(0, 1);
  addSelection(snapshots, "snapshots", nullptr);
  snapshots.callback([this, &snapshots] {
    // Runs behind the command that may have been chosen below this one.
    if (snapshots.get_subcommands().empty()) {
      command_.what = ShowRecords{ShowRecords::Kind::kSnapshots, events_, {}, {}, {}};
    }
  });
  const auto addFor = [&](const char* name, const char* summary, const char* example) {
    CLI::App* app = snapshots.add_subcommand(name, summary);
    addConnectionOptions(*app);
    app->footer(std::string("Example:\n  ") + example);
    app->add_option("FILE", snapshot_.file,
                    "The archive; \"newest\" is the newest of the service's")
        ->required();
    return app;
  };
  auto* show = addFor("show", "Show what a snapshot is about and what is in it",
                      "halvoxctl snapshots show newest --json");
  onRun(*show, [this] { return ShowSnapshot{snapshot_.file}; });

  auto* extract = addFor("extract", "Unpack a snapshot",
                         "halvoxctl snapshots extract newest --to /tmp/snapshot");
  extract
      ->add_option("--to", snapshot_.directory,
                   "The directory; made when it is missing (default: one named as the archive)")
      ->type_name("DIR");
  extract->add_flag("--force", snapshot_.force, "Replace files that are there");
  onRun(*extract, [this] { return snapshot_; });
}

void CommandLineParser::addTrace() {
  auto& trace = addCommand("trace", "Have the service trace a program, or show its results",
                           "halvoxctl trace record --params params.plist -- pw-play tone.wav");
  trace.require_subcommand(1);
  const auto addFor = [&](const char* name, const char* summary, const char* example) {
    CLI::App* app = trace.add_subcommand(name, summary);
    addConnectionOptions(*app);
    app->footer(std::string("Example:\n  ") + example);
    return app;
  };
  auto* record = addFor("record", "Trace while a program runs, then show what was measured",
                        "halvoxctl trace record --params params.plist -- pw-play tone.wav");
  record->add_option("--params", recordTrace_.params, "The trace parameters file, a property list")
      ->type_name("FILE")
      ->required();
  record->add_option("COMMAND", recordTrace_.command, "The program and its arguments, behind --")
      ->required();
  onRun(*record, [this] { return recordTrace_; });

  constexpr const char* kFile = "A results file of the service";
  auto* show = addFor("show", "Show what a results file comes to",
                      "halvoxctl trace show tracing_results.ssj");
  show->add_option("FILE", exportTrace_.file, kFile)->required();
  onRun(*show, [this] { return ShowTrace{exportTrace_.file}; });

  auto* exporting = addFor("export", "Write the intervals for trace viewers",
                           "halvoxctl trace export tracing_results.ssj --to trace.json");
  exporting->add_option("FILE", exportTrace_.file, kFile)->required();
  exporting->add_option("--to", exportTrace_.to, "The file to write")
      ->type_name("FILE")
      ->required();
  onRun(*exporting, [this] { return exportTrace_; });
}

std::string CommandLineParser::helpOf(const CLI::App& app) {
  const auto chosen = app.get_subcommands();
  if (chosen.empty()) return app.help();
  const auto inner = chosen.front()->get_subcommands();
  if (inner.empty()) return chosen.front()->help("halvoxctl");
  return inner.front()->help("halvoxctl " + chosen.front()->get_name());
}

// "halvoxctl send: --type: …": which command, which argument, what is wrong with it.
std::string CommandLineParser::describe(const CLI::ParseError& error) const {
  std::string prefix = app_.get_name();
  const auto chosen = app_.get_subcommands();
  const auto rest = app_.remaining();
  if (!chosen.empty()) prefix += (prefix.empty() ? "" : " ") + chosen.front()->get_name();
  if (!chosen.empty() && !chosen.front()->get_subcommands().empty()) {
    prefix += " " + chosen.front()->get_subcommands().front()->get_name();
  }
  std::string text = prefix.empty() ? "" : prefix + ": ";
  if (chosen.empty() && !rest.empty()) {
    text +=
        "there is no command \"" + harmlessText(rest.front()) + "\"; expected " + listCommands();
  } else {
    text += harmlessText(error.what());
  }
  text += '\n';
  if (source_ == CommandSource::kArguments) text += "Try '" + prefix + " --help'.\n";
  return text;
}

std::string CommandLineParser::listCommands() const {
  std::string list;
  for (const auto* command : app_.get_subcommands([](const CLI::App*) { return true; })) {
    list += (list.empty() ? "" : ", ") + command->get_name();
  }
  return list;
}

}  // namespace

std::variant<Command, CommandLineText> parseCommandLine(std::vector<std::string> arguments,
                                                        CommandSource source, std::istream& input) {
  CommandLineParser parser(source, input);
  return parser.parse(std::move(arguments));
}

}  // namespace halvox::tools
