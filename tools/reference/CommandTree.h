#pragma once

#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "tools/OfferedValues.h"

// What the parser of the command line knows about the commands, in a form from which completions
// and the man page are written.
namespace halvox::tools {

struct DescribedArgument {
  std::vector<std::string> names{};  // "-n" and "--last"; empty if the argument has only a place
  std::string value{};               // "N"; empty for a flag
  std::string description{};
  OfferedValues offered{};
  int count = 0;  // of values; 0 for a flag
  bool isValueOptional = false;
  bool isRepeatable = false;
  bool isRequired = false;
  bool isHidden = false;
};

struct DescribedCommand {
  std::string name{};  // "show"
  std::string path{};  // "streams show"; empty for the program
  std::string heading{};
  std::string summary{};
  std::string details{};
  std::string example{};
  std::vector<DescribedArgument> options{};
  std::vector<DescribedArgument> arguments{};
  std::vector<DescribedCommand> commands{};
  bool needsCommand = false;
};

// Throws std::logic_error if an option takes a value in one command and none in another: shells
// skip the values of options before they know the command.
DescribedCommand describeCommands(CLI::App& program);

// The commands of halvoxctl.
DescribedCommand describeCommandLine();

// `command` and everything below it, in the order of the help.
std::vector<const DescribedCommand*> allCommandsOf(const DescribedCommand& command);

// The part of a description that fits beside a word in a list.
std::string briefly(const std::string& description);

}  // namespace halvox::tools
