#pragma once

#include <cstdint>
#include <string>

namespace halvox::platform::linux_ {

// Why a store could not be opened or read. `description` is a line for the user that names the
// file and the reason.
struct StoreError {
  enum class Kind : std::uint8_t {
    kDirectory,     // the directory or a file in it cannot be created or written to
    kInUse,         // another service writes to this store
    kNewerVersion,  // a newer version of the program made the store, which was not touched
    kMissing,       // there is no store (readers only)
    kDamaged,       // the file is not a database, or a broken one (readers only)
    kCannotOpen,    // any other error of the system or of SQLite
  };
  Kind kind;
  std::string description;
};

}  // namespace halvox::platform::linux_
