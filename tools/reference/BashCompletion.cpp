#include <map>
#include <set>
#include <vector>

#include "tools/reference/Completions.h"

namespace halvox::tools {
namespace {

using Kind = OfferedValues::Kind;

// Returns the commands of the shell that offer values.
std::string actionFor(const OfferedValues& offered) {
  std::string words = offered.words.empty() ? "" : "_halvoxctl_words " + shellWords(offered.words);
  switch (offered.kind) {
    case Kind::kNothing:
      return ":";
    case Kind::kFiles:
      return (words.empty() ? "" : words + "; ") + "_halvoxctl_paths -f";
    case Kind::kDirectories:
      return "_halvoxctl_paths -d";
    case Kind::kPrograms:
      return "_halvoxctl_paths -c";
    case Kind::kWords:
      return words;
    case Kind::kLive:
      return "_halvoxctl_" + offered.words.front();
  }
  return ":";
}

// The patterns of a case statement, by what is done for them.
using Cases = std::map<std::string, std::vector<std::string>>;

std::string caseStatement(const std::string& subject, const Cases& cases) {
  std::string text = "  case " + subject + " in\n";
  for (const auto& [action, patterns] : cases) {
    std::string list;
    for (const auto& pattern : patterns) list += (list.empty() ? "" : " | ") + pattern;
    text.append("    ").append(list).append(") ").append(action).append(" ;;\n");
  }
  return text + "  esac\n";
}

// Sets the options and sub-commands of the command $1.
std::string commandTable(const DescribedCommand& program) {
  std::string text = "_halvoxctl_describe() {\n  options=\"\" commands=\"\"\n  case $1 in\n";
  for (const DescribedCommand* command : allCommandsOf(program)) {
    std::string options;
    std::string commands;
    for (const auto& option : command->options) {
      if (option.isHidden) continue;
      for (const auto& name : option.names) options += (options.empty() ? "" : " ") + name;
    }
    for (const auto& below : command->commands) {
      commands += (commands.empty() ? "" : " ") + below.name;
    }
    text += "    \"" + command->path + "\")\n      options=\"" + options + "\"\n";
    if (!commands.empty()) text += "      commands=\"" + commands + "\"\n";
    text += "      ;;\n";
  }
  return text + "  esac\n}\n";
}

// Sets how many values the option $1 takes, in any command, and whether it can do without.
std::string countTable(const DescribedCommand& program) {
  std::set<std::string> seen;
  Cases cases;
  for (const DescribedCommand* command : allCommandsOf(program)) {
    for (const auto& option : command->options) {
      for (const auto& name : option.names) {
        if (option.count == 0 || !seen.insert(name).second) continue;
        cases["count=" + std::to_string(option.count) +
              (option.isValueOptional ? " optional=1" : "")]
            .push_back(name);
      }
    }
  }
  return "_halvoxctl_count() {\n  count=0 optional=\"\"\n" + caseStatement("$1", cases) + "}\n";
}

// Offers the values of an option or argument; $1 is "COMMAND --option" or "COMMAND #1".
std::string valueTable(const DescribedCommand& program) {
  Cases cases;
  for (const DescribedCommand* command : allCommandsOf(program)) {
    for (const auto& option : command->options) {
      const std::string action = actionFor(option.offered);
      if (option.count == 0 || action == ":") continue;
      for (const auto& name : option.names) {
        cases[action].push_back("\"" + command->path + " " + name + "\"");
      }
    }
    int place = 0;
    for (const auto& argument : command->arguments) {
      ++place;
      const std::string action = actionFor(argument.offered);
      if (action == ":") continue;
      cases[action].push_back("\"" + command->path + " #" +
                              (argument.isRepeatable ? "\"*" : std::to_string(place) + "\""));
    }
  }
  return "_halvoxctl_value() {\n" + caseStatement("$1", cases) + "}\n";
}

std::string liveFunctions() {
  std::string text;
  for (const auto& names : liveNames()) {
    text += std::string("_halvoxctl_") + names.name + "() { _halvoxctl_live " + names.placeOption +
            " " + shellWords(names.arguments) + "; }\n";
  }
  return text;
}

}  // namespace

std::string shellQuoted(const std::string& text) {
  std::string quoted = "'";
  for (const char c : text) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
}

std::string shellWords(const std::vector<std::string>& words) {
  std::string text;
  for (const auto& word : words) {
    const bool isPlain = !word.empty() && word.find_first_not_of(
                                              "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVW"
                                              "XYZ0123456789_.-") == std::string::npos;
    text += (text.empty() ? "" : " ") + (isPlain ? word : shellQuoted(word));
  }
  return text;
}

std::string bashTables(const DescribedCommand& program) {
  return commandTable(program) + "\n" + countTable(program) + "\n" + liveFunctions() + "\n" +
         valueTable(program);
}

}  // namespace halvox::tools
