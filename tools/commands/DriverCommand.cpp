#include <chrono>
#include <memory>

#include "tools/Drivers.h"
#include "tools/commands/Commands.h"

namespace halvox::tools {

void addDriverCommand(CommandSet& commands) {
  const auto request = std::make_shared<ShowDrivers>();
  CLI::App& drivers =
      commands.add({.name = "drivers",
                    .summary = "Show what the audio drivers count, without the service",
                    .example = "halvoxctl drivers --group Tx --watch 2",
                    .reach = CommandReach::kFiles});
  drivers.add_option("--group", request->group, "Only the channels of this group")
      ->type_name("GROUP");
  addOptionalSeconds(
      drivers, "--watch",
      [request](std::optional<std::chrono::milliseconds> interval) {
        request->watch = interval.value_or(std::chrono::seconds(1));
      },
      "Keep showing the changes per second, every SECONDS (default: 1)");
  commands.onRun(
      drivers, [request] { return *request; },
      [](const ShowDrivers& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showDrivers(asked, options.form(), streams.output, streams.outputDescriptor,
                           streams.errors);
      });
}

}  // namespace halvox::tools
