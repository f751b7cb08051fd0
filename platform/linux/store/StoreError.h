#pragma once

#include <cstdint>
#include <string>

namespace halvox::platform::linux_ {

// Why the store could not be opened; `description` names the file and the reason, for the user.
struct StoreError {
  enum class Kind : std::uint8_t {
    kDirectory,     // the directory cannot be made or written to
    kInUse,         // another service writes this store
    kNewerVersion,  // a newer version of the system made it; it was left alone
    kMissing,       // there is none (when reading)
    kDamaged,       // it is no database, or a broken one (when reading)
    kCannotOpen,    // anything else the system or the database library had to say
  };
  Kind kind;
  std::string description;
};

}  // namespace halvox::platform::linux_
