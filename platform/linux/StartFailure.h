#pragma once

#include <string>

namespace halvox::platform::linux_ {

struct ConnectionOpenError;
struct StoreError;

// Why the service cannot start: one line for the user, and an exit status of sysexits.h, by which
// scripts distinguish the kinds of reasons.
struct StartFailure {
  int exitStatus;
  std::string description;
};

[[nodiscard]] StartFailure startFailure(const StoreError& error);
[[nodiscard]] StartFailure startFailure(const ConnectionOpenError& error);

}  // namespace halvox::platform::linux_
