#include <set>
#include <string>

#include "tools/reference/Completions.h"

namespace halvox::tools {
namespace {

using Kind = OfferedValues::Kind;

std::string quoted(const std::string& text) {
  std::string result = "'";
  for (const char c : text) {
    if (c == '\'' || c == '\\') result += '\\';
    result += c;
  }
  return result + "'";
}

std::string joined(const std::vector<std::string>& words) {
  std::string text;
  for (const auto& word : words) text += (text.empty() ? "" : " ") + word;
  return text;
}

// Returns the options of `complete` that offer values.
std::string actionFor(const OfferedValues& offered) {
  switch (offered.kind) {
    case Kind::kNothing:
      return "";
    case Kind::kFiles:
      return offered.words.empty() ? " -F" : " -F -a " + quoted(joined(offered.words));
    case Kind::kDirectories:
      return " -a '(__fish_complete_directories (commandline -ct))'";
    case Kind::kPrograms:
      return " -a '(__fish_complete_command)'";
    case Kind::kWords:
      return " -a " + quoted(joined(offered.words));
    case Kind::kLive:
      return " -a '(__halvoxctl_" + offered.words.front() + ")'";
  }
  return "";
}

// A line for `command`; with `place`, one for its argument at that place.
std::string start(const DescribedCommand& command, const std::string& place = "") {
  return "complete -c halvoxctl -n " +
         quoted("__halvoxctl_is " + quoted(command.path) + (place.empty() ? "" : " " + place));
}

std::string lineFor(const DescribedCommand& command, const DescribedArgument& option) {
  std::string line = start(command);
  for (const auto& name : option.names) {
    line += name.starts_with("--") ? " -l " + name.substr(2) : " -s " + name.substr(1);
  }
  line += " -d " + quoted(briefly(option.description));
  // The next word is the value, and for -x not a file. An optional value may be missing there.
  const bool isFile = option.offered.kind == Kind::kFiles;
  if (option.count > 0 && !option.isValueOptional) line += isFile ? " -r" : " -x";
  return line + actionFor(option.offered) + "\n";
}

std::string linesFor(const DescribedCommand& command) {
  std::string text;
  for (const auto& option : command.options) {
    if (!option.isHidden) text += lineFor(command, option);
  }
  int place = 0;
  for (const auto& argument : command.arguments) {
    ++place;
    const std::string action = actionFor(argument.offered);
    if (action.empty()) continue;
    text += start(command, argument.isRepeatable ? "any" : std::to_string(place)) + action + "\n";
  }
  for (const auto& below : command.commands) {
    text +=
        start(command, "1") + " -a " + below.name + " -d " + quoted(briefly(below.summary)) + "\n";
  }
  return text;
}

// The paths of all commands, and how many values the options take.
std::string variables(const DescribedCommand& program) {
  std::string paths;
  std::set<std::string> one;
  std::set<std::string> two;
  for (const DescribedCommand* command : allCommandsOf(program)) {
    if (!command->path.empty()) paths += " " + quoted(command->path);
    for (const auto& option : command->options) {
      if (option.count == 0 || option.isValueOptional) continue;
      (option.count == 1 ? one : two).insert(option.names.begin(), option.names.end());
    }
  }
  std::string text = "set -g __halvoxctl_paths" + paths + "\nset -g __halvoxctl_one_value";
  for (const auto& name : one) text += " " + name;
  text += "\nset -g __halvoxctl_two_values";
  for (const auto& name : two) text += " " + name;
  return text + "\n";
}

std::string liveFunctions() {
  std::string text;
  for (const auto& names : liveNames()) {
    std::string arguments;
    for (const auto& argument : names.arguments) arguments += " " + quoted(argument);
    text += std::string("function __halvoxctl_") + names.name + "\n  __halvoxctl_live " +
            names.placeOption + arguments + "\nend\n";
  }
  return text;
}

}  // namespace

std::string fishTables(const DescribedCommand& program) {
  std::string text = variables(program) + "\n" + liveFunctions() + "\n";
  for (const DescribedCommand* command : allCommandsOf(program)) text += linesFor(*command);
  return text;
}

}  // namespace halvox::tools
