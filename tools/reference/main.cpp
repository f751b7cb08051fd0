#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <string_view>

#include "tools/CommandLine.h"
#include "tools/reference/Completions.h"

namespace {

using halvox::tools::DescribedCommand;

std::string tablesFor(std::string_view form, const DescribedCommand& program) {
  if (form == "bash") return bashTables(program);
  if (form == "zsh") return zshTables(program);
  if (form == "fish") return fishTables(program);
  throw std::runtime_error("expected bash, zsh or fish, found \"" + std::string(form) + "\"");
}

std::string filled(const std::string& path, const std::string& tables) {
  std::ifstream file(path);
  std::string text{std::istreambuf_iterator<char>(file), {}};
  constexpr std::string_view kPlace = "\n@tables@\n";
  const auto place = text.find(kPlace);
  if (place == std::string::npos) throw std::runtime_error(path + ": has no line @tables@");
  return text.replace(place + 1, kPlace.size() - 1, tables);
}

}  // namespace

// Runs during the build: halvoxctl-reference FORM TEMPLATE. Prints the template with the commands
// of halvoxctl in it.
int main(int argc, char** argv) {
  try {
    if (argc != 3) throw std::runtime_error("usage: halvoxctl-reference FORM TEMPLATE");
    const auto program = halvox::tools::describeCommandLine();
    std::cout << filled(argv[2], tablesFor(argv[1], program)) << std::flush;
    return std::cout ? 0 : 1;
  } catch (const std::exception& error) {
    std::cerr << "halvoxctl-reference: " << error.what() << '\n';
    return 1;
  }
}
