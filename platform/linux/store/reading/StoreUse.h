#pragma once

#include <cstdint>
#include <filesystem>
#include <string_view>

namespace halvox::platform::linux_ {

enum class StoreUse : std::uint8_t {
  kServed,     // a service has the store open
  kNotServed,  // no service has
  kUnknown,    // the store has no lock file, as a copy of a database, or the kernel does not say
};

// Returns whether a service has the store in `directory` open. Reads the kernel's list of locks and
// takes no lock itself: a service that starts at this moment would fail. Blocks on procfs.
[[nodiscard]] StoreUse storeUse(const std::filesystem::path& directory);

// The same from the text of /proc/locks; `inode` is that of the lock file.
[[nodiscard]] bool isLocked(std::string_view locks, std::uint64_t inode);

}  // namespace halvox::platform::linux_
