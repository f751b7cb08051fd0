#pragma once

#include <string_view>

namespace halvox::platform::linux_ {

// Returns true if the text is one JSON object and nothing else. It may be nested to any depth.
[[nodiscard]] bool isJsonObject(std::string_view text);

}  // namespace halvox::platform::linux_
