#pragma once

#include <functional>
#include <optional>

#include "platform/connection.h"

namespace halvox {

// The callbacks that answer requests. The first argument is the error; none means success. A
// callback may be empty only where an operation says so; then no answer is wanted.
using ErrorReply = std::function<void(const std::optional<platform::Error>& error)>;
using BoolReply = std::function<void(const std::optional<platform::Error>& error, bool value)>;

}  // namespace halvox
