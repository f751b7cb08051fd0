#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "tools/CommandLine.h"
#include "tools/reference/CommandPage.h"
#include "tools/reference/Completions.h"

namespace {

using halvox::tools::DescribedCommand;

// What takes the place of a line "@NAME@" in a template.
struct Part {
  std::string name;
  std::string text;
};

std::vector<Part> partsFor(std::string_view form, const DescribedCommand& program) {
  using namespace halvox::tools;
  if (form == "bash") return {{"tables", bashTables(program)}};
  if (form == "zsh") return {{"tables", zshTables(program)}};
  if (form == "fish") return {{"tables", fishTables(program)}};
  if (form == "man") {
    return {{"options", commonOptionsPage(program)}, {"commands", commandsPage(program)}};
  }
  throw std::runtime_error("expected bash, zsh, fish or man, found \"" + std::string(form) + "\"");
}

std::string filled(const std::string& path, const std::vector<Part>& parts) {
  std::ifstream file(path);
  std::string text{std::istreambuf_iterator<char>(file), {}};
  for (const Part& part : parts) {
    const std::string place = "\n@" + part.name + "@\n";
    const auto found = text.find(place);
    if (found == std::string::npos) {
      throw std::runtime_error(path + ": has no line @" + part.name + "@");
    }
    text.replace(found + 1, place.size() - 1, part.text);
  }
  return text;
}

}  // namespace

// Runs during the build: halvoxctl-reference FORM TEMPLATE. Prints the template with the commands
// of halvoxctl in it.
int main(int argc, char** argv) {
  try {
    if (argc != 3) throw std::runtime_error("usage: halvoxctl-reference FORM TEMPLATE");
    const auto program = halvox::tools::describeCommandLine();
    std::cout << filled(argv[2], partsFor(argv[1], program)) << std::flush;
    return std::cout ? 0 : 1;
  } catch (const std::exception& error) {
    std::cerr << "halvoxctl-reference: " << error.what() << '\n';
    return 1;
  }
}
