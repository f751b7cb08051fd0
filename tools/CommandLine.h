#pragma once

#include <cstdint>
#include <istream>
#include <string>
#include <variant>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// What halvoxctl prints instead of carrying out a command: help or version (kDone), or an error in
// the arguments (kBadArguments).
struct CommandLineText {
  ExitStatus status = ExitStatus::kDone;
  std::string text;
  // For an error: the given command, empty if it was not recognised, and the reason without it.
  std::string command{};
  std::string reason{};
};

// Returns true if these arguments ask for JSON output, even if they are otherwise wrong: the error
// is then printed as JSON too.
bool asksForJson(const std::vector<std::string>& arguments);

enum class CommandSource : std::uint8_t {
  kArguments,   // the arguments of the program: all commands
  kScriptLine,  // a line of a script: only requests, over the script's connection
};

// Parses the arguments without the program's name. Reads `input` to its end if a JSON argument is
// "-". `version` is the text of --version, without a line end; lines of a script have no such
// option. Throws nothing.
std::variant<Command, CommandLineText> parseCommandLine(std::vector<std::string> arguments,
                                                        CommandSource source, std::istream& input,
                                                        const std::string& version = {});

}  // namespace halvox::tools
