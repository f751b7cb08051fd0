#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string_view>

#include <sys/types.h>

namespace halvox::platform::linux_ {

enum class StoreUse : std::uint8_t {
  kServed,     // a service has the store open
  kNotServed,  // no service has
  kUnknown,    // the store has no lock file, as a copy of a database, or the kernel does not say
};

// The service that has a store open.
struct StoreServer {
  StoreUse use = StoreUse::kUnknown;
  // When its process started, in seconds by CLOCK_BOOTTIME. Empty unless the store is served, and
  // if the process is hidden from this one.
  std::optional<double> start{};
  // The process. Empty unless the store is served, and if the kernel does not say which one it is.
  std::optional<pid_t> process{};
};

// Returns which service has the store in `directory` open. Reads the kernel's list of locks and
// takes no lock itself: a service that starts at this moment would fail. Blocks on procfs.
[[nodiscard]] StoreServer storeServer(const std::filesystem::path& directory);

// Returns the process that holds the lock on a file, by the text of /proc/locks. `inode` is that of
// the lock file. The process is 0 if the text does not say which one it is.
[[nodiscard]] std::optional<pid_t> lockHolder(std::string_view locks, std::uint64_t inode);

}  // namespace halvox::platform::linux_
