#pragma once

#include <chrono>
#include <functional>
#include <istream>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include <CLI/CLI.hpp>

#include "tools/Arguments.h"
#include "tools/Command.h"
#include "tools/CommandLine.h"

// What the groups of commands in tools/commands/ build their arguments with.
namespace halvox::tools {

// Whether a command speaks to the service or works on its files.
enum class CommandReach : std::uint8_t { kService, kFiles };

// What a command says of itself: `summary` in the list of commands, the rest in its own help.
struct CommandText {
  const char* name;
  const char* summary;
  const char* example;
  std::string details{};
  CommandReach reach = CommandReach::kService;
};

// The commands of one command line, and the one that it turned out to ask for. What a command's
// options are read into belongs to that command's functions; see onRun(). Throws the exceptions of
// the parsing library, which parseCommandLine() catches.
class CommandSet {
 public:
  // `app` and `input` must outlive it.
  CommandSet(CLI::App& app, CommandSource source, std::istream& input);

  // The commands that follow stand under this heading in the list of commands.
  void beginGroup(const char* heading) { heading_ = heading; }
  CLI::App& add(const CommandText& text);
  // A command of a command: halvoxctl PARENT NAME.
  CLI::App& addBelow(CLI::App& parent, const CommandText& text);

  // Says what `app` comes to when it is the command that was given: make() returns what is asked
  // for, once all arguments have been read, or throws when they do not go together.
  template <typename Make, typename Run>
  void onRun(CLI::App& app, Make make, Run run) {
    app.callback([this, make, run] {
      // A command below another is called first, and is the one that is meant.
      if (!command_) command_.emplace(make(), Command::Run<decltype(make())>(run));
    });
  }

  // What stands before the command and behind it.
  [[nodiscard]] const CommonOptions& options() const { return options_; }
  // What "-" stands for; a script's lines have no input of their own.
  std::string readInput();

  // What was asked for; once, and only after a line was read without an exception.
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

// The value of `parsed`; throws, in the name of the argument `shown`, when it is none.
template <typename T>
T valueOf(Parsed<T> parsed, const std::string& shown) {
  if (const auto* error = std::get_if<ArgumentError>(&parsed)) {
    throw CLI::ValidationError(shown, error->message);
  }
  return std::get<T>(std::move(parsed));
}

// An argument or option that one of the functions of tools/Arguments.h understands. It is read into
// `target`, which must live as long as `app`.
template <typename T, typename Target>
CLI::Option* addParsed(CLI::App& app, const std::string& name, Target& target,
                       Parsed<T> (*parse)(std::string_view), const std::string& description) {
  return app.add_option_function<std::string>(
      name,
      [&target, parse, name](const std::string& text) { target = valueOf(parse(text), name); },
      description);
}

// The same for an option that may be given several times; adds to `targets`.
template <typename T, typename Targets>
CLI::Option* addEach(CLI::App& app, const std::string& name, Targets& targets,
                     Parsed<T> (*parse)(std::string_view), const std::string& description) {
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

// An option with or without a number of seconds; `given` hears of it with the number or none.
CLI::Option* addOptionalSeconds(CLI::App& app, const std::string& name,
                                std::function<void(std::optional<std::chrono::milliseconds>)> given,
                                const std::string& description);

}  // namespace halvox::tools
