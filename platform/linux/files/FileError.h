#pragma once

#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {

// Makes the error of an operation on a file or directory, "cannot <what> <path>: <system's text>".
// `systemError` is an errno and becomes the error's code.
inline Error fileError(std::string_view what, std::string_view path, int systemError) {
  std::string text = "cannot ";
  text += what;
  text += ' ';
  text += path;
  text += ": ";
  text += errnoText(systemError);
  return {.domain = "com.tarno.halvox.files", .code = systemError, .description = std::move(text)};
}

}  // namespace halvox::platform::linux_
