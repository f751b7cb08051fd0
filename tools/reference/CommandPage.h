#pragma once

#include <string>

#include "tools/reference/CommandTree.h"

// The parts of the man page of halvoxctl that depend on its commands, in Markdown. They take the
// places of the lines "@options@" and "@commands@" in packaging/man/halvoxctl.1.md.
namespace halvox::tools {

// The options that stand before or after any command.
std::string commonOptionsPage(const DescribedCommand& program);

// A section for each command: how it is written, what it does, its arguments and options, the line
// "@notes PATH@" and an example. packaging/man/make_page.py puts what is written by hand about a
// command in the place of that line.
std::string commandsPage(const DescribedCommand& program);

}  // namespace halvox::tools
