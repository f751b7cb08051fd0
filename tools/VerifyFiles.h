#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/store/reading/verify/Differences.h"

// The part of `halvoxctl verify` that concerns files beside the database. All functions block on
// the disk.
namespace halvox::tools {

// Verifies that the recorded captures exist and can be read. `recorded` are their paths in the
// order of recording, `directory` is where the store has its captures now, if it was moved. The
// service deletes the oldest captures: a missing one is a difference only if it is the newest, or
// if an older one exists. Returns how many it has read.
std::uint64_t verifyCaptures(const std::vector<std::string>& recorded,
                             const std::filesystem::path& directory,
                             platform::linux_::Differences& differences);

// Verifies that the summary files in a directory can be read to their ends. Returns how many it has
// read. A directory that does not exist has none.
std::uint64_t verifySummaries(const std::filesystem::path& directory,
                              platform::linux_::Differences& differences);

}  // namespace halvox::tools
