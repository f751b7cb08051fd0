#pragma once

#include <istream>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Result.h"
#include "tools/Command.h"

namespace halvox::tools {

// A request to run a script: one request on each line, over one connection.
struct RunScript {
  std::string file;  // "-": standard input
  bool keepGoing = false;
};
struct RunShell {};

// Splits a line into words by the shell's rules for blanks, quotes and backslashes, without the
// shell's expansions. A word that begins with "{" outside of quotes is the unchanged rest of the
// line, so that JSON needs no quotes. "#" at the beginning of a word starts a comment.
platform::linux_::Result<std::vector<std::string>> splitLine(std::string_view line);

// The lines of a script, and their name in error messages.
struct ScriptSource {
  std::istream& lines;
  std::string name;
  bool isPrompting = false;
  bool keepsGoing = false;
};

// Carries out one request for each line over one connection. Returns the status of the first line
// that failed. A lost connection always ends the script.
ExitStatus runScript(const ScriptSource& source, const CommonOptions& options, std::ostream& out,
                     std::ostream& errors);

}  // namespace halvox::tools
