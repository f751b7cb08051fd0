#include <csignal>
#include <iostream>
#include <string>
#include <vector>

#include <unistd.h>

#include "platform/linux/drivers/ConfiguredSources.h"
#include "platform/linux/version/Commit.h"
#include "platform/linux/version/VersionText.h"
#include "tools/ReportPage.h"
#include "tools/Tool.h"

namespace {

// Only here, because what links the commit is linked again after each commit.
std::string version() {
  namespace linux_ = halvox::platform::linux_;
  const linux_::OptionalPart parts[] = {
      {"report page", "HALVOX_REPORT", !halvox::tools::reportPageBeforeData().empty()},
      {"screen", "HALVOX_SCREEN", HALVOX_HAS_SCREEN != 0},
      {"ALSA counters", "HALVOX_ALSA", linux_::hasAlsaSource()},
      {"PipeWire counters", "HALVOX_PIPEWIRE", HALVOX_HAS_PIPEWIRE != 0},
  };
  return linux_::versionText("halvoxctl", linux_::halvoxCommit(), parts);
}

}  // namespace

int main(int argc, char** argv) {
  // End quietly when the reader closes the output, even if our parent made us ignore SIGPIPE.
  std::signal(SIGPIPE, SIG_DFL);
  // This program does not mix streams with stdio. Therefore they need not be synchronised.
  std::ios::sync_with_stdio(false);
  return static_cast<int>(
      halvox::tools::runTool(std::vector<std::string>(argv + 1, argv + argc), version(),
                             {std::cin, std::cout, std::cerr, STDOUT_FILENO,
                              isatty(STDIN_FILENO) != 0, isatty(STDERR_FILENO) != 0}));
}
