#pragma once

#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// Returns two lower-case digits for each byte: "00ff" for the bytes 0 and 255.
[[nodiscard]] std::string hexadecimal(std::string_view bytes);

}  // namespace halvox::platform::linux_
