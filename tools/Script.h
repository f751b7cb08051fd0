#pragma once

#include <istream>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "tools/Arguments.h"
#include "tools/Command.h"

namespace halvox::tools {

// One request per line, over one connection.
struct RunScript {
  std::string file;  // "-": standard input
  bool keepGoing = false;
};
struct RunShell {};

// The words of a line, by the shell's rules for blanks, quotes and backslashes, without any of its
// expansions. A word that begins with "{" outside of quotes is the rest of the line as it stands,
// so JSON needs no quotes. "#" at the beginning of a word ends the line.
Parsed<std::vector<std::string>> splitLine(std::string_view line);

// Where a script's lines come from and what they are called in complaints.
struct ScriptSource {
  std::istream& lines;
  std::string name;
  bool isPrompting = false;
  bool keepsGoing = false;
};

// Carries out one request per line over one connection. The status is that of the first line that
// failed; a lost connection ends the script in any case.
ExitStatus runScript(const ScriptSource& source, const CommonOptions& options, std::ostream& out,
                     std::ostream& errors);

}  // namespace halvox::tools
