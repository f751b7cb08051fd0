#pragma once

#include <string>

#include "tools/Command.h"

namespace halvox::tools {

struct RunSql {
  std::string query{};     // empty: read statements from the standard input
  std::string database{};  // empty: as the service's configuration says
};

// Runs SQL statements that read the store and prints their rows: a line with the names of the
// columns and a line for each row, with tabs between; as JSON, an object for each row. Rows are
// printed after their statement has ended, because a snapshot that waits for a slow reader of the
// output would make the service's log grow. At a terminal, asks for one statement after the other
// and continues after an error; otherwise ends with the first error.
ExitStatus runSql(const RunSql& request, const CommonOptions& options, const ToolStreams& streams);

}  // namespace halvox::tools
