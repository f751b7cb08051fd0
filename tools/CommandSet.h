#pragma once

#include <chrono>
#include <functional>
#include <istream>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>

#include "tools/Arguments.h"
#include "tools/Command.h"
#include "tools/CommandLine.h"
#include "tools/OfferedValues.h"

// Helpers with which the files in tools/commands/ define the arguments of commands.
namespace halvox::tools {

// Whether a command sends requests to the service or works on its files. Options for the connection
// are shown only for the former.
enum class CommandReach : std::uint8_t { kService, kFiles };

// The help of a command: `summary` stands in the list of commands, the rest in the command's own
// help.
struct CommandText {
  const char* name;
  const char* summary;
  const char* example;
  std::string details{};
  CommandReach reach = CommandReach::kService;
};

// All commands that a command line may name, and the one that it did name. The function that
// defines a command also owns the object that its options are parsed into; see onRun(). Throws the
// exceptions of the parsing library, which parseCommandLine() catches.
class CommandSet {
 public:
  // `app` and `input` must outlive it.
  CommandSet(CLI::App& app, CommandSource source, std::istream& input);

  // Sets the heading under which the commands that are added next are listed.
  void beginGroup(const char* heading) { heading_ = heading; }
  // Adds a command. The result lives as long as the parser; add the command's arguments to it.
  CLI::App& add(const CommandText& text);
  // Adds a sub-command: halvoxctl PARENT NAME.
  CLI::App& addBelow(CLI::App& parent, const CommandText& text);

  // Sets what happens if `app` is the command that was given. make() is called after all arguments
  // were parsed; it returns the request, or throws if the arguments do not fit together. run()
  // carries the request out.
  template <typename Make, typename Run>
  void onRun(CLI::App& app, Make make, Run run) {
    app.callback([this, make, run] {
      // Only the first call counts. The library calls the callback of a sub-command before that of
      // its parent, and the sub-command is the command that was given.
      if (!command_) command_.emplace(make(), Command::Run<decltype(make())>(run));
    });
  }

  // The common options, whether they stand before or after the command.
  [[nodiscard]] const CommonOptions& options() const { return options_; }
  // Returns the standard input, for an argument "-". Throws in a script, whose lines are the input.
  std::string readInput();

  // Returns the command that was given. Call once, and only after parsing succeeded.
  Command take();

 private:
  void addCommonOptions(CLI::App& app, CommandReach reach);

  CLI::App& app_;
  CommandSource source_;
  std::istream& input_;
  std::string heading_;
  CommonOptions options_;
  std::optional<Command> command_;
};

// Returns the value of `parsed`. Throws an error about the argument `shown` if it has none.
template <typename T>
T valueOf(platform::linux_::Result<T> parsed, const std::string& shown) {
  if (!parsed) throw CLI::ValidationError(shown, parsed.error().message);
  return *std::move(parsed);
}

// Adds an argument or option that a function of tools/Arguments.h parses into `target`, which must
// live as long as `app`.
template <typename T, typename Target>
CLI::Option* addParsed(CLI::App& app, const std::string& name, Target& target,
                       platform::linux_::Result<T> (*parse)(std::string_view),
                       const std::string& description) {
  // An error shows the long one of "-n,--last".
  const std::string shown = name.substr(name.rfind(',') + 1);
  return app.add_option_function<std::string>(
      name,
      [&target, parse, shown](const std::string& text) { target = valueOf(parse(text), shown); },
      description);
}

// Does the same for an option that may be given several times; appends each value to `targets`.
template <typename T, typename Targets>
CLI::Option* addEach(CLI::App& app, const std::string& name, Targets& targets,
                     platform::linux_::Result<T> (*parse)(std::string_view),
                     const std::string& description) {
  return app
      .add_option_function<std::vector<std::string>>(
          name,
          [&targets, parse, name](const std::vector<std::string>& texts) {
            for (const auto& text : texts) targets.push_back(valueOf(parse(text), name));
          },
          description + "; may be given several times")
      ->expected(1)
      ->take_all();
}

// Adds an option with an optional number of seconds. Calls `given` if the option is used, with the
// number or nothing.
CLI::Option* addOptionalSeconds(CLI::App& app, const std::string& name,
                                std::function<void(std::optional<std::chrono::milliseconds>)> given,
                                const std::string& description);

}  // namespace halvox::tools
