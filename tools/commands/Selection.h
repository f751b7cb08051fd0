#pragma once

#include <CLI/CLI.hpp>

#include "tools/StoreRun.h"

namespace halvox::tools {

// The options that all commands that show stored records have: --since, --until, --last, --follow,
// --database, and with `names`, the name of an option, one for the names of the records. `records`
// is what the help calls them. They are read into `selection`, which must live as long as `app`.
void addSelection(CLI::App& app, RecordSelection& selection, const char* records,
                  const char* names);

}  // namespace halvox::tools
