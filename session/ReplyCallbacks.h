#pragma once

#include <functional>
#include <optional>

#include "platform/connection.h"

namespace halvox {

// The callbacks with which requests are answered: the error first, or none. An empty one means that
// nobody wants an answer, where an operation says that it may be empty.
using ErrorReply = std::function<void(const std::optional<platform::Error>& error)>;
using BoolReply = std::function<void(const std::optional<platform::Error>& error, bool value)>;

}  // namespace halvox
