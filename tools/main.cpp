#include <csignal>
#include <iostream>
#include <string>
#include <vector>

#include <unistd.h>

#include "tools/Tool.h"

int main(int argc, char** argv) {
  // End quietly when the reader closes the output, even if our parent made us ignore SIGPIPE.
  std::signal(SIGPIPE, SIG_DFL);
  // This program does not mix streams with stdio. Therefore they need not be synchronised.
  std::ios::sync_with_stdio(false);
  return static_cast<int>(
      halvox::tools::runTool(std::vector<std::string>(argv + 1, argv + argc),
                             {std::cin, std::cout, std::cerr, STDOUT_FILENO,
                              isatty(STDIN_FILENO) != 0, isatty(STDERR_FILENO) != 0}));
}
