#include <string>

#include "tools/reference/Completions.h"

namespace halvox::tools {
namespace {

using Kind = OfferedValues::Kind;

// Puts a backslash before what _arguments and _describe would take as the end of a description.
std::string escaped(const std::string& text) {
  std::string result;
  for (const char c : text) {
    if (c == '[' || c == ']' || c == ':' || c == '\\') result += '\\';
    result += c;
  }
  return result;
}

std::string actionFor(const OfferedValues& offered) {
  switch (offered.kind) {
    case Kind::kNothing:
      return " ";
    case Kind::kFiles:
      if (offered.words.empty()) return "_files";
      return "_halvoxctl_words_or_files " + shellWords(offered.words);
    case Kind::kDirectories:
      return "_path_files -/";
    case Kind::kPrograms:
      return "_normal";
    case Kind::kWords:
      return "(" + shellWords(offered.words) + ")";
    case Kind::kLive:
      return "_halvoxctl_" + offered.words.front();
  }
  return " ";
}

// ":N:action" for each value.
std::string valuesOf(const DescribedArgument& option) {
  std::string text;
  for (int i = 0; i < option.count; ++i) {
    text += (option.isValueOptional ? "::" : ":") + escaped(option.value) + ":" +
            actionFor(option.offered);
  }
  return text;
}

std::string optionSpecs(const DescribedArgument& option) {
  std::string all;
  for (const auto& name : option.names) all += (all.empty() ? "" : " ") + name;
  const std::string others = option.isRepeatable ? "*" : "(" + all + ")";
  std::string text;
  for (const auto& name : option.names) {
    std::string spec = others;
    spec += name;
    // "=" permits both "--last 5" and "--last=5". "=-" would refuse the former.
    if (option.count == 1 && name.starts_with("--")) spec += '=';
    spec += "[" + escaped(briefly(option.description)) + "]" + valuesOf(option);
    text += " \\\n    ";
    text += shellQuoted(spec);
  }
  return text;
}

std::string argumentSpec(const DescribedArgument& argument, int place) {
  const bool runs = argument.offered.kind == Kind::kPrograms;
  std::string start = std::to_string(place) + (argument.isRequired ? ":" : "::");
  if (argument.isRepeatable) start = runs ? "*::" : "*:";
  return " \\\n    " +
         shellQuoted(start + escaped(argument.value) + ":" + actionFor(argument.offered));
}

std::string functionName(const DescribedCommand& command) {
  std::string name = "_halvoxctl_command_" + command.path;
  for (char& c : name) {
    if (c == ' ') c = '-';
  }
  return name;
}

// Continues with the sub-command that was given; completes its name if none was.
std::string belowOf(const DescribedCommand& command) {
  std::string list;
  std::string cases;
  for (const auto& below : command.commands) {
    list += "        " + shellQuoted(below.name + ":" + escaped(briefly(below.summary))) + "\n";
    cases += "        " + below.name + ") " + functionName(below) + " ;;\n";
  }
  return "  case $state in\n    command)\n      list=(\n" + list +
         "      )\n      _describe -t commands command list\n      ;;\n"
         "    below)\n      case $words[1] in\n" +
         cases + "      esac\n      ;;\n  esac\n";
}

std::string functionFor(const DescribedCommand& command) {
  std::string specs;
  for (const auto& option : command.options) {
    if (!option.isHidden) specs += optionSpecs(option);
  }
  int place = 0;
  for (const auto& argument : command.arguments) specs += argumentSpec(argument, ++place);
  if (command.commands.empty()) {
    return functionName(command) + "() {\n  _arguments -s -S" + specs + "\n}\n";
  }
  return functionName(command) +
         "() {\n  local curcontext=$curcontext state line\n  local -a list\n"
         "  typeset -A opt_args\n  _arguments -s -C" +
         specs + " \\\n    '(-): :->command' '(-)*:: :->below' && return\n" + belowOf(command) +
         "}\n";
}

std::string liveFunctions() {
  std::string text;
  for (const auto& names : liveNames()) {
    text += std::string("_halvoxctl_") + names.name + "() {\n  local -a asked=(" +
            shellWords(names.arguments) + ")\n  _halvoxctl_live " + names.placeOption +
            " \"$@\"\n}\n";
  }
  return text;
}

}  // namespace

std::string zshTables(const DescribedCommand& program) {
  std::string text = liveFunctions();
  for (const DescribedCommand* command : allCommandsOf(program)) {
    text += "\n" + functionFor(*command);
  }
  return text;
}

}  // namespace halvox::tools
