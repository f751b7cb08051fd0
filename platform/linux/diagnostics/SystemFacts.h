#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The places of facts about the system. Tests set paths of their own.
struct SystemPaths {
  std::filesystem::path proc = "/proc";
  std::filesystem::path alsa = "/proc/asound";
  std::filesystem::path osRelease = "/etc/os-release";
  std::vector<std::string> pipeWireVersion{"pipewire", "--version"};
  std::vector<std::string> pipeWireDump{"pw-dump", "--no-colors"};
};

// Collects the versions of the kernel, the distribution and the sound servers. Those that cannot be
// found are listed under "not_readable" with the reason. Runs a program, and therefore blocks for
// up to one second, or until the deadline if that is earlier.
[[nodiscard]] Dictionary systemFacts(const SystemPaths& paths, const CaptureDeadline& deadline);

}  // namespace halvox::platform::linux_
