#pragma once

#include <cstdint>
#include <string>

#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

enum class ConnectionOpenError : std::uint8_t;
enum class StoreError : std::uint8_t;

// Why the service cannot start: one line for the user, and an exit status of sysexits.h, by which
// scripts distinguish the kinds of reasons.
struct StartFailure {
  int exitStatus;
  std::string description;
};

[[nodiscard]] StartFailure startFailure(const Failure<StoreError>& failure);
[[nodiscard]] StartFailure startFailure(const Failure<ConnectionOpenError>& failure);

}  // namespace halvox::platform::linux_
