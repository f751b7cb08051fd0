#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "tools/Command.h"

namespace halvox::tools {

// One side of a comparison, as somebody named it.
struct ComparedPeriod {
  std::string database{};         // empty: that of the whole comparison
  std::optional<double> since{};  // seconds since 1970
  std::optional<double> until{};
};

// Parses one side of a comparison:
//   yesterday, today, 2026-11-21: that day in local time
//   SINCE..UNTIL: times as parseTime() has them; either may be missing
//   a path with a "/" or one that ends in ".db": that store
platform::linux_::Result<ComparedPeriod> parseComparedPeriod(std::string_view text, double now);

struct CompareReports {
  ComparedPeriod before{};
  ComparedPeriod after{};
  // The HTML file to write, or "-" for the standard output. Empty: print a table instead.
  std::string to{};
  // For the sides that do not say it themselves.
  std::optional<double> since{};
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Compares two periods or two stores: what got worse or better, and how sure that is. Services may
// write to the stores meanwhile.
ExitStatus compareReports(const CompareReports& request, const CommonOptions& options,
                          const ToolStreams& streams);

}  // namespace halvox::tools
