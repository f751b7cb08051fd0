#pragma once

#include <cstdint>

namespace halvox::platform::linux_ {

// Why a store could not be opened or read. The message of the failure is one line for the user,
// with the file and the reason.
enum class StoreError : std::uint8_t {
  kDirectory,     // the directory or a file in it cannot be created or written to
  kInUse,         // another service writes to this store
  kNewerVersion,  // a newer version made the store; it was left unchanged
  kMissing,       // there is no store (readers only)
  kDamaged,       // the file is not a database, or is a broken one
  kCannotOpen,    // any other error of the system or of SQLite
};

}  // namespace halvox::platform::linux_
