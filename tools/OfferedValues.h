#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

// What a shell offers for the value of an option or argument. The files in tools/commands/ declare
// it beside the option; the completions of all shells are generated from it.
namespace halvox::tools {

struct OfferedValues {
  enum class Kind : std::uint8_t {
    kNothing,
    kFiles,
    kDirectories,
    kPrograms,
    kWords,  // a fixed list
    kLive,   // what halvoxctl finds when the shell asks; `words` has the name of a LiveNames
  };
  Kind kind = Kind::kNothing;
  // For kFiles: words that may stand for a file, such as "-".
  std::vector<std::string> words{};
};

// Names that only the running service or its store knows, and how halvoxctl prints them.
struct LiveNames {
  const char* name;
  // The option that says where to look. A completion repeats it if the command line has it.
  const char* placeOption;
  // Prints one name on each line.
  std::vector<std::string> arguments;
};
const std::vector<LiveNames>& liveNames();

// These functions declare what is offered for `option`, and return it.
CLI::Option* offerFiles(CLI::Option* option, std::vector<std::string> words = {});
CLI::Option* offerDirectories(CLI::Option* option);
CLI::Option* offerPrograms(CLI::Option* option);
CLI::Option* offerWords(CLI::Option* option, std::vector<std::string> words);
// `name` is that of one of liveNames().
CLI::Option* offerLive(CLI::Option* option, const std::string& name);

CLI::Option* offerCategories(CLI::Option* option);
CLI::Option* offerEventTypes(CLI::Option* option);
CLI::Option* offerServiceTypes(CLI::Option* option);

// Returns what was declared; kNothing if nothing was.
OfferedValues offeredFor(CLI::Option& option);

}  // namespace halvox::tools
