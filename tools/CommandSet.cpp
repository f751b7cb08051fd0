#include "tools/CommandSet.h"

#include <iterator>

namespace halvox::tools {

CommandSet::CommandSet(CLI::App& app, CommandSource source, std::istream& input)
    : app_(app), source_(source), input_(input) {
  if (source_ == CommandSource::kArguments) addCommonOptions(app_, CommandReach::kService);
}

CLI::App& CommandSet::add(const CommandText& text) {
  CLI::App& app = addBelow(app_, text);
  app.group(heading_);
  return app;
}

CLI::App& CommandSet::addBelow(CLI::App& parent, const CommandText& text) {
  CLI::App* app = parent.add_subcommand(text.name, text.summary);
  app->group("Commands");
  addCommonOptions(*app, text.reach);
  // Every command's help has an example; a test checks that it is there.
  app->footer((text.details.empty() ? "" : text.details + "\n\n") + "Example:\n  " + text.example);
  return *app;
}

void CommandSet::addCommonOptions(CLI::App& app, CommandReach reach) {
  app.add_flag("--json", options_.json, "Print JSON, one object on each line");
  // All lines of a script share the connection of the script.
  if (source_ == CommandSource::kScriptLine) return;
  auto* socket = app.add_option("--socket", options_.socket,
                                "The service's socket (default: $HALVOX_SOCKET, else what the "
                                "configuration names, else the user's, "
                                "$XDG_RUNTIME_DIR/halvox/reporting.sock, if a service is there, "
                                "else the system's, /run/halvox/reporting.sock)")
                     ->type_name("PATH");
  offerFiles(socket);
  auto* timeout = addParsed(app, "--timeout", options_.timeout, parseSeconds,
                            "How long to wait for an answer (default: 5)")
                      ->type_name("SECONDS");
  if (reach == CommandReach::kService) return;
  // All commands accept these options, so that a shell alias may contain them. Only the help of
  // commands for which they matter shows them.
  socket->group("");
  timeout->group("");
}

std::string CommandSet::readInput() {
  if (source_ == CommandSource::kScriptLine) {
    // The standard input may be the script itself.
    throw CLI::ValidationError("JSON",
                               "\"-\" cannot be used in a script; write the JSON into the line");
  }
  return {std::istreambuf_iterator<char>(input_), {}};
}

Command CommandSet::take() {
  Command command = *std::move(command_);
  command_.reset();
  command.options = options_;
  return command;
}

CLI::Option* addOptionalSeconds(CLI::App& app, const std::string& name,
                                std::function<void(std::optional<std::chrono::milliseconds>)> given,
                                const std::string& description) {
  return app
      .add_option_function<std::vector<std::string>>(
          name,
          [given = std::move(given), name](const std::vector<std::string>& texts) {
            const bool isBare = texts.empty() || texts.front().empty();
            given(isBare ? std::nullopt
                         : std::optional(valueOf(parseSeconds(texts.front()), name)));
          },
          description)
      ->expected(0, 1)
      ->type_name("[SECONDS]");
}

}  // namespace halvox::tools
