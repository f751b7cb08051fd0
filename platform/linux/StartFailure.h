#pragma once

#include <cstdint>

#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

enum class ConnectionOpenError : std::uint8_t;
enum class StoreError : std::uint8_t;

// Why the service cannot start: one line for the user. The code is an exit status of sysexits.h,
// which lets scripts distinguish the kinds of reasons.
[[nodiscard]] Failure<int> startFailure(const Failure<StoreError>& failure);
[[nodiscard]] Failure<int> startFailure(const Failure<ConnectionOpenError>& failure);

}  // namespace halvox::platform::linux_
