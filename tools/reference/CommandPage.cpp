#include "tools/reference/CommandPage.h"

#include <algorithm>
#include <cctype>
#include <sstream>

namespace halvox::tools {
namespace {

// Puts a backslash before what Markdown would take as markup.
std::string escapedMarkdown(const std::string& text) {
  std::string result;
  for (const char c : text) {
    if (std::string_view("\\`*_[]<>|~^").find(c) != std::string_view::npos) result += '\\';
    result += c;
  }
  return result;
}

std::string bold(const std::string& text) { return "**" + escapedMarkdown(text) + "**"; }
std::string italic(const std::string& text) { return "*" + escapedMarkdown(text) + "*"; }

// "*FILE*", "[*SECONDS*]" or "*COMMAND*...".
std::string valueText(const DescribedArgument& argument) {
  std::string text = italic(argument.value);
  if (argument.isValueOptional) text.insert(0, "\\[").append("\\]");
  return text;
}

// "**-n**, **--last** *N*": what stands before the description.
std::string termFor(const DescribedArgument& argument) {
  std::string text;
  for (const auto& name : argument.names) text += (text.empty() ? "" : ", ") + bold(name);
  for (int i = 0; i < argument.count; ++i) text += (text.empty() ? "" : " ") + valueText(argument);
  return text;
}

// The descriptions of the help have no full stop.
std::string sentence(const std::string& text) {
  const std::string escaped = escapedMarkdown(text);
  return escaped.ends_with('.') ? escaped : escaped + '.';
}

std::string definitionsOf(const std::vector<DescribedArgument>& arguments) {
  std::string text;
  for (const auto& argument : arguments) {
    if (argument.isHidden || argument.description.empty()) continue;
    text += "\n" + termFor(argument) + "\n: " + sentence(argument.description) + "\n";
  }
  return text;
}

// The options that the command has beyond those of the program.
std::vector<DescribedArgument> ownOptions(const DescribedCommand& command,
                                          const DescribedCommand& program) {
  std::vector<DescribedArgument> own;
  std::ranges::copy_if(command.options, std::back_inserter(own), [&](const auto& option) {
    return !option.isHidden && std::ranges::none_of(program.options, [&](const auto& common) {
      return common.names == option.names;
    });
  });
  return own;
}

// "**halvoxctl streams** [*OPTION*]... *ID*", with the options that must be given.
std::string synopsisOf(const DescribedCommand& command, const DescribedCommand& program) {
  std::string text = bold("halvoxctl " + command.path);
  const auto options = ownOptions(command, program);
  bool hasOthers = false;
  for (const auto& option : options) {
    if (option.isRequired) text += " " + termFor(option);
    hasOthers = hasOthers || !option.isRequired;
  }
  if (hasOthers) text += " \\[*OPTION*\\]...";
  for (const auto& argument : command.arguments) {
    std::string place = italic(argument.value) + (argument.isRepeatable ? "..." : "");
    if (!argument.isRequired) place.insert(0, "\\[").append("\\]");
    text += " " + place;
  }
  if (!command.commands.empty()) {
    text += command.needsCommand ? " *COMMAND*" : " \\[*COMMAND*\\]";
  }
  return text;
}

// The help puts a blank line between paragraphs, and lines that belong together below each other.
std::string paragraphsOf(const std::string& text) {
  return text.empty() ? "" : "\n" + escapedMarkdown(text) + "\n";
}

std::string exampleOf(const DescribedCommand& command) {
  if (command.example.empty()) return "";
  std::string text = "\nExample:\n\n";
  std::istringstream lines(command.example);
  for (std::string line; std::getline(lines, line);) {
    text += "    " + line.substr(std::min(line.find_first_not_of(' '), line.size())) + "\n";
  }
  return text;
}

std::string sectionFor(const DescribedCommand& command, const DescribedCommand& program) {
  return "\n## " + command.path + "\n\n" + synopsisOf(command, program) + "\n\n" +
         sentence(command.summary) + "\n" + paragraphsOf(command.details) +
         definitionsOf(command.arguments) + definitionsOf(ownOptions(command, program)) +
         "\n@notes " + command.path + "@\n" + exampleOf(command);
}

std::string upperCase(std::string text) {
  for (char& c : text) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  return text;
}

}  // namespace

std::string commonOptionsPage(const DescribedCommand& program) {
  return definitionsOf(program.options);
}

std::string commandsPage(const DescribedCommand& program) {
  std::string text;
  std::string heading;
  for (const auto& command : program.commands) {
    if (command.heading != heading) {
      heading = command.heading;
      text += "\n# " + upperCase(heading) + "\n";
    }
    for (const DescribedCommand* each : allCommandsOf(command)) {
      text += sectionFor(*each, program);
    }
  }
  return text;
}

}  // namespace halvox::tools
