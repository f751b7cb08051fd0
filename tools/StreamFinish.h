#pragma once

#include <filesystem>

#include "analysis/StreamBuilder.h"

namespace halvox::tools {

// Returns how streams end that nothing in the store in `directory` ended. Call after the store was
// read: a service that was started in between is not mistaken for an older one. Blocks on procfs.
[[nodiscard]] analysis::StreamBuilder::Finish streamFinish(const std::filesystem::path& directory);

}  // namespace halvox::tools
