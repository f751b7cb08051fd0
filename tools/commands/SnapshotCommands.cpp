#include <memory>

#include "tools/Records.h"
#include "tools/SnapshotFiles.h"
#include "tools/commands/Commands.h"
#include "tools/commands/Selection.h"

namespace halvox::tools {
namespace {

void addFile(CLI::App& app, std::string& file) {
  offerFiles(app.add_option("FILE", file,
                            "The archive; \"newest\" stands for the newest one of the service")
                 ->required(),
             {"newest"});
}

void addShow(CommandSet& commands, CLI::App& snapshots) {
  const auto request = std::make_shared<ShowSnapshot>();
  CLI::App& show =
      commands.addBelow(snapshots, {.name = "show",
                                    .summary = "Show the signature and the contents of a snapshot",
                                    .example = "halvoxctl snapshots show newest --json",
                                    .reach = CommandReach::kFiles});
  addFile(show, request->file);
  commands.onRun(
      show, [request] { return *request; },
      [](const ShowSnapshot& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showSnapshot(asked, options.form(), streams.output, streams.errors);
      });
}

void addExtract(CommandSet& commands, CLI::App& snapshots) {
  const auto request = std::make_shared<ExtractSnapshot>();
  CLI::App& extract = commands.addBelow(
      snapshots, {.name = "extract",
                  .summary = "Unpack a snapshot",
                  .example = "halvoxctl snapshots extract newest --to /tmp/snapshot",
                  .reach = CommandReach::kFiles});
  addFile(extract, request->file);
  offerDirectories(
      extract
          .add_option(
              "--to", request->directory,
              "The directory to unpack into, created if needed (default: named like the archive)")
          ->type_name("DIRECTORY"));
  extract.add_flag("--force", request->force, "Replace existing files");
  commands.onRun(
      extract, [request] { return *request; },
      [](const ExtractSnapshot& asked, const CommonOptions& options, const ToolStreams& streams) {
        return extractSnapshot(asked, options.form(), streams.output, streams.errors);
      });
}

}  // namespace

void addSnapshotCommands(CommandSet& commands) {
  const auto list = std::make_shared<ShowRecords>();
  list->kind = ShowRecords::Kind::kSnapshots;
  CLI::App& snapshots =
      commands.add({.name = "snapshots",
                    .summary = "List, show or unpack snapshots that the service took",
                    .example = "halvoxctl snapshots --last 5\n  halvoxctl snapshots show newest",
                    .reach = CommandReach::kFiles});
  snapshots.require_subcommand(0, 1);
  addSelection(snapshots, list->selection, "snapshots", nullptr);
  // Without a sub-command, the command lists the snapshots.
  commands.onRun(
      snapshots, [list] { return *list; },
      [](const ShowRecords& asked, const CommonOptions& options, const ToolStreams& streams) {
        return showRecords(asked, options.form(), streams.output, streams.outputDescriptor,
                           streams.errors);
      });
  addShow(commands, snapshots);
  addExtract(commands, snapshots);
}

}  // namespace halvox::tools
