#pragma once

#include <string>

namespace halvox::platform::linux_ {

struct ConnectionOpenError;
struct StoreError;

// Why the service cannot start: one line for the user, and the exit status that tells scripts
// which kind of reason it was (those of sysexits.h).
struct StartFailure {
  int exitStatus;
  std::string description;
};

[[nodiscard]] StartFailure startFailure(const StoreError& error);
[[nodiscard]] StartFailure startFailure(const ConnectionOpenError& error);

}  // namespace halvox::platform::linux_
