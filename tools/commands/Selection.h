#pragma once

#include <CLI/CLI.hpp>

#include "tools/StoreRun.h"

namespace halvox::tools {

// Adds the options that all commands for stored records share: --since, --until, --last, --follow
// and
// --database. If `names` is not null, it is the name of an option for the names of the records.
// `records` is the word for the records in the help. The options are parsed into `selection`, which
// must live as long as `app`.
void addSelection(CLI::App& app, RecordSelection& selection, const char* records,
                  const char* names);

}  // namespace halvox::tools
