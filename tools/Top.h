#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "tools/Command.h"
#include "tools/top/TopLayout.h"
#include "tools/top/TopModel.h"
#include "tools/top/TopSort.h"
#include "tools/top/TopView.h"

namespace halvox::tools {

// A request for the view of what happens now.
struct ShowTop {
  std::chrono::milliseconds interval{2000};
  std::optional<std::uint64_t> count{};  // of batches or turns; empty: without an end
  bool isBatch = false;
  TopSortKey sort = TopSortKey::kXruns;
  std::string database{};  // empty: as the service's configuration says
};

// Shows a screen that is renewed at each interval, until a key ends it. Prints batches instead with
// isBatch, with --json, and if standard input or output is not a terminal; the first comes after
// one interval, because rates need two readings. Batches end with the count or when the output is
// closed.
ExitStatus showTop(const ShowTop& request, const CommonOptions& options,
                   const ToolStreams& streams);

// Runs the screen. `readTurn` reads what is new into the model.
void runTopScreen(const ShowTop& request, TopView& view,
                  const std::function<void(TopModel& model)>& readTurn);

}  // namespace halvox::tools
