#pragma once

#include <string>

#include "tools/reference/CommandTree.h"

// The parts of the completions that depend on the commands. Each takes the place of the line
// "@tables@" in the file for that shell in packaging/completions/.
namespace halvox::tools {

std::string bashTables(const DescribedCommand& program);
std::string zshTables(const DescribedCommand& program);
std::string fishTables(const DescribedCommand& program);

// Returns `text` between single quotes, as bash and zsh read it.
std::string shellQuoted(const std::string& text);
// The words with blanks between them, each quoted if it needs quotes.
std::string shellWords(const std::vector<std::string>& words);

}  // namespace halvox::tools
