#pragma once

#include <optional>
#include <string>

#include <CLI/CLI.hpp>

#include "tools/StoreRun.h"

namespace halvox::tools {

// Adds --since and --until. `records` is the word for the records in the help. The targets of this
// and of the next two functions must live as long as `app`.
void addTimes(CLI::App& app, std::optional<double>& since, std::optional<double>& until,
              const char* records);
// Adds --database.
void addDatabase(CLI::App& app, std::string& database);
// Adds the options that all commands for stored records share, from --since to --database. If
// `names` is not null, it is the name of an option for the names of the records. `records` is the
// word for the records in the help. The options are parsed into `selection`.
void addSelection(CLI::App& app, RecordSelection& selection, const char* records,
                  const char* names);

}  // namespace halvox::tools
