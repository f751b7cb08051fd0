#pragma once

#include <cstdint>
#include <istream>
#include <string>
#include <variant>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// What halvoxctl prints instead of carrying out a command: the help or the version that was asked
// for (kDone), or what is wrong with the arguments (kBadArguments).
struct CommandLineText {
  ExitStatus status = ExitStatus::kDone;
  std::string text;
  // Of what is wrong: the command, as far as it was given, and the reason alone.
  std::string command{};
  std::string reason{};
};

// Whether these arguments ask for JSON, even when they are wrong otherwise.
bool asksForJson(const std::vector<std::string>& arguments);

enum class CommandSource : std::uint8_t {
  kArguments,   // of the program
  kScriptLine,  // requests only; the connection is there already
};

// Reads the arguments without the program's name. `input` is read when a JSON argument is "-".
std::variant<Command, CommandLineText> parseCommandLine(std::vector<std::string> arguments,
                                                        CommandSource source, std::istream& input);

}  // namespace halvox::tools
