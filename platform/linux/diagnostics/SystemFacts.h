#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Where facts about the system are found; a test has its own.
struct SystemPaths {
  std::filesystem::path proc = "/proc";
  std::filesystem::path alsa = "/proc/asound";
  std::filesystem::path osRelease = "/etc/os-release";
  std::vector<std::string> pipeWireVersion{"pipewire", "--version"};
  std::vector<std::string> pipeWireDump{"pw-dump", "--no-colors"};
};

// The kernel, the distribution, and the versions of the sound servers: each one's fields or, under
// "not_readable", why it is missing.
[[nodiscard]] Dictionary systemFacts(const SystemPaths& paths, const Deadline& deadline);

}  // namespace halvox::platform::linux_
