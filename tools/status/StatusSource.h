#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/version/VersionText.h"
#include "tools/status/ServiceStatus.h"

namespace halvox::tools {

// Reads the status of the service: asks it for two answers, and reads the sizes of its files and
// what the kernel counted for its process. Takes the service that has the configured store open for
// the one on the socket. Blocks on the disk, and for at most `timeout` on the service. `socket` is
// empty for the usual places.
[[nodiscard]] ServiceStatus readStatus(const platform::linux_::Configuration& configuration,
                                       const std::string& socket,
                                       std::chrono::milliseconds timeout);

// Returns what a configuration switches off, with the settings that do, and what a build with these
// `parts` lacks. Of two reasons it gives the setting.
[[nodiscard]] std::vector<SwitchedOff> switchedOff(
    const platform::linux_::Configuration& configuration,
    std::span<const platform::linux_::OptionalPart> parts);

// Returns the processor time of a process in clock ticks, from the text of /proc/PID/stat; nothing
// if the text is malformed.
[[nodiscard]] std::optional<std::uint64_t> cpuTicks(std::string_view stat);

// Returns the number of a line "NAME: NUMBER" in a text of procfs.
[[nodiscard]] std::optional<std::uint64_t> numberAfter(std::string_view text,
                                                       std::string_view name);

}  // namespace halvox::tools
