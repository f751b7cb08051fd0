#include "tools/CommandLine.h"

#include <algorithm>
#include <memory>
#include <sstream>
#include <utility>

#include <CLI/CLI.hpp>

#include "tools/CommandSet.h"
#include "tools/JsonText.h"
#include "tools/commands/Commands.h"
#include "tools/reference/CommandTree.h"

namespace halvox::tools {
namespace {

constexpr const char* kExitStatusNote =
    "Exit status: 0 done, 1 refused or failed, 2 bad arguments, 69 no service or no store, "
    "74 the output or a file cannot be written, 78 bad configuration.";

// Where the commands of a group may be used.
enum class GroupPlace : std::uint8_t { kAnywhere, kArguments, kScriptLines };

struct CommandGroup {
  const char* heading;
  void (*add)(CommandSet& commands);
  GroupPlace place;
};

// All commands, in the order of the help.
constexpr CommandGroup kGroups[] = {
    {"Requests to the service", addRequestCommands, GroupPlace::kAnywhere},
    {"Waiting", addScriptRequests, GroupPlace::kScriptLines},
    {"Requests that belong together", addScriptCommands, GroupPlace::kArguments},
    {"What happens now", addStatusCommand, GroupPlace::kArguments},
    {"What happens now", addTopCommand, GroupPlace::kArguments},
    {"What the service stored", addStreamCommands, GroupPlace::kArguments},
    {"What the service stored", addRecordCommands, GroupPlace::kArguments},
    {"What the service stored", addSnapshotCommands, GroupPlace::kArguments},
    {"What the service stored", addSummaryCommand, GroupPlace::kArguments},
    {"What the service stored", addReportCommand, GroupPlace::kArguments},
    {"What the service stored", addExplainCommand, GroupPlace::kArguments},
    {"What the service stored", addFieldCommand, GroupPlace::kArguments},
    {"What the service stored", addQueryCommands, GroupPlace::kArguments},
    {"What the service stored", addExportCommand, GroupPlace::kArguments},
    {"What the service stored", addVerifyCommand, GroupPlace::kArguments},
    {"What the service stored", addStorageCommands, GroupPlace::kArguments},
    {"Traces and drivers", addTraceCommands, GroupPlace::kArguments},
    {"Traces and drivers", addDriverCommand, GroupPlace::kArguments},
    {"Settings", addSettingsCommands, GroupPlace::kArguments},
};

bool isFor(GroupPlace place, CommandSource source) {
  switch (place) {
    case GroupPlace::kAnywhere:
      return true;
    case GroupPlace::kArguments:
      return source == CommandSource::kArguments;
    case GroupPlace::kScriptLines:
      return source == CommandSource::kScriptLine;
  }
  return false;
}

// Removes the library's type name TEXT from the help, because the name of an argument already says
// what the argument is.
void removeTypeNames(CLI::App& app) {
  for (CLI::Option* option : app.get_options()) {
    if (option->get_positional()) option->type_name("");
  }
  for (CLI::App* below : app.get_subcommands([](const CLI::App*) { return true; })) {
    removeTypeNames(*below);
  }
}

void addGroups(CommandSet& commands, CommandSource source) {
  for (const CommandGroup& group : kGroups) {
    if (!isFor(group.place, source)) continue;
    commands.beginGroup(group.heading);
    group.add(commands);
  }
}

// The library's usage line shows options before the command. A line of a script has no options
// there.
class HelpFormatter final : public CLI::Formatter {
 public:
  std::string make_usage(const CLI::App* app, std::string name) const override {
    if (app->get_parent() != nullptr || !name.empty()) return Formatter::make_usage(app, name);
    return "Usage: COMMAND [ARGUMENT]...\n";
  }
};

// Replaces the library's headings with ours. Commands inherit them from the program.
void nameThings(CLI::App& app) {
  // Set before any command is added, because commands copy these settings.
  app.set_help_flag("-h,--help", "Print this help");
  const auto formatter = std::make_shared<HelpFormatter>();
  formatter->label("SUBCOMMAND", "COMMAND");
  formatter->label("Positionals", "Arguments");
  formatter->label("REQUIRED", "(required)");
  formatter->label("Excludes", "not with");
  app.formatter(formatter);
}

// Returns the command that was given and its sub-command, as far as the arguments name them.
std::vector<const CLI::App*> chosenOf(const CLI::App& app) {
  std::vector<const CLI::App*> chosen;
  for (auto below = app.get_subcommands(); !below.empty();
       below = below.front()->get_subcommands()) {
    chosen.push_back(below.front());
  }
  return chosen;
}

// Returns the names of the program and of the given commands, such as "halvoxctl trace show"; in a
// script without the program.
std::string nameOf(const CLI::App& app, const std::vector<const CLI::App*>& chosen) {
  std::string name = app.get_name();
  for (const CLI::App* command : chosen) {
    name += (name.empty() ? "" : " ") + command->get_name();
  }
  return name;
}

// Wraps long lines, and removes the gap that the library leaves for hidden options.
std::string laidOut(const std::string& help) {
  constexpr std::size_t kWidth = 100;
  constexpr std::size_t kDescriptions = 30;  // the column they stand in
  std::string text;
  std::istringstream lines(help);
  bool isGap = false;
  for (std::string line; std::getline(lines, line);) {
    if (line.empty() && isGap) continue;
    isGap = line.empty();
    const bool isEntry = line.starts_with("  ") && line.size() > kDescriptions;
    const std::size_t indent = isEntry ? kDescriptions : 0;
    while (line.size() > kWidth) {
      const std::size_t end = line.rfind(' ', kWidth);
      if (end == std::string::npos || end <= indent) break;
      text += line.substr(0, end) + '\n';
      line.replace(0, end + 1, indent, ' ');
    }
    text += line + '\n';
  }
  return text;
}

std::string helpOf(const CLI::App& app) {
  auto chosen = chosenOf(app);
  if (chosen.empty()) return laidOut(app.help());
  const CLI::App* command = chosen.back();
  chosen.pop_back();
  return laidOut(command->help(nameOf(app, chosen)));
}

std::string listCommands(const CLI::App& app) {
  std::string list;
  for (const auto* command : app.get_subcommands([](const CLI::App*) { return true; })) {
    list += (list.empty() ? "" : ", ") + command->get_name();
  }
  return list;
}

// Returns what is wrong: the library's message, or our own if a command is missing or unknown.
std::string reasonOf(const CLI::ParseError& error, const CLI::App& app, const CLI::App& command) {
  // The library answers a missing and an unknown sub-command alike, with "A subcommand is
  // required", and names neither.
  const bool isWithoutCommand = dynamic_cast<const CLI::RequiredError*>(&error) != nullptr &&
                                command.get_require_subcommand_min() > 0 &&
                                command.get_subcommands().empty();
  // The library's message quotes the arguments, which may come from a script.
  if (!isWithoutCommand) return harmlessText(error.what());
  const auto rest = app.remaining(true);
  const std::string what = rest.empty()
                               ? "a command is missing"
                               : "there is no command \"" + harmlessText(rest.front()) + "\"";
  return what + "; expected " + listCommands(command);
}

// Returns "halvoxctl send: --type: …": the command, the argument, and what is wrong with it.
CommandLineText describe(const CLI::ParseError& error, const CLI::App& app, CommandSource source) {
  auto chosen = chosenOf(app);
  const std::string prefix = nameOf(app, chosen);
  const std::string reason = reasonOf(error, app, chosen.empty() ? app : *chosen.back());
  std::string text = prefix.empty() ? "" : prefix + ": ";
  text += reason + '\n';
  // The prefix of a script's line is its file and number, which is not a command to try.
  if (source == CommandSource::kArguments) text += "Try '" + prefix + " --help'.\n";
  std::string command;
  for (const CLI::App* part : chosen) command += (command.empty() ? "" : " ") + part->get_name();
  return {ExitStatus::kBadArguments, std::move(text), std::move(command), reason};
}

// Adds all commands of `source` to `app`, which has the parser's settings but no commands yet.
void addEverything(CLI::App& app, CommandSet& commands, CommandSource source,
                   const std::string& version) {
  if (source == CommandSource::kScriptLine) {
    app.description(
        "Requests to the Halvox reporting service, one on each line, over one connection.");
    app.footer(
        "'COMMAND --help' explains a command; 'quit' or the end of the input ends the shell.");
  } else {
    app.name("halvoxctl");
    app.set_version_flag("--version", version,
                         "Print the version, the commit and the optional parts");
    app.footer(kExitStatusNote);
  }
  app.require_subcommand(1);
  addGroups(commands, source);
  removeTypeNames(app);
}

constexpr const char* kWhatItIs =
    "Talks to the Halvox reporting service, and shows what it stored.";

}  // namespace

bool asksForJson(const std::vector<std::string>& arguments) {
  // What follows "--" belongs to another program (trace record) and may have a --json of its own.
  const auto end = std::ranges::find(arguments, "--");
  return std::find(arguments.begin(), end, "--json") != end;
}

DescribedCommand describeCommandLine() {
  CLI::App app(kWhatItIs);
  nameThings(app);
  std::istringstream noInput;
  CommandSet commands(app, CommandSource::kArguments, noInput);
  addEverything(app, commands, CommandSource::kArguments, "");
  return describeCommands(app);
}

std::variant<Command, CommandLineText> parseCommandLine(std::vector<std::string> arguments,
                                                        CommandSource source, std::istream& input,
                                                        const std::string& version) {
  CLI::App app(kWhatItIs);
  nameThings(app);
  CommandSet commands(app, source, input);
  addEverything(app, commands, source, version);

  std::ranges::reverse(arguments);  // as the library wants them
  // The library reports everything with exceptions. None leaves this function.
  try {
    app.parse(std::move(arguments));
  } catch (const CLI::CallForHelp&) {
    return CommandLineText{ExitStatus::kDone, helpOf(app)};
  } catch (const CLI::CallForVersion& shown) {
    return CommandLineText{ExitStatus::kDone, std::string(shown.what()) + "\n"};
  } catch (const CLI::ParseError& error) {
    return describe(error, app, source);
  }
  return commands.take();
}

}  // namespace halvox::tools
