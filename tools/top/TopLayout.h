#pragma once

#include <cstddef>
#include <vector>

#include "tools/top/TopSnapshot.h"
#include "tools/top/TopSort.h"
#include "tools/top/TopView.h"

namespace halvox::tools {

// What the keys have chosen.
struct TopChoice {
  TopSort sort{};
  bool isPaused = false;
  bool showsHelp = false;
  std::size_t firstStream = 0;  // the first stream that is shown
};

// Returns the lines of a screen of that size: the service, what was lost, the devices, the streams,
// and the keys in the last line. `snapshot` must be sorted. A screen that is too small shows the
// beginning of each. Limits `choice.firstStream` to what the screen can show. A pure function.
[[nodiscard]] std::vector<TopLine> layOut(const TopSnapshot& snapshot, TopChoice& choice,
                                          TopSize size);

// Changes `choice` for a key. `pageLines` is how many streams a page has. Returns false if the key
// ends the program.
[[nodiscard]] bool onKey(const TopKey& key, std::size_t pageLines, TopChoice& choice);

}  // namespace halvox::tools
