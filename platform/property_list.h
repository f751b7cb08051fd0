#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/value.h"

namespace halvox::platform {

// Property-list files. Any thread may call; reading waits for the disk.
class PropertyListService {
 public:
  virtual ~PropertyListService() = default;

  // The directory that relative paths start from.
  [[nodiscard]] virtual std::string currentDirectory() const = 0;
  // The bytes of a file; none, with `error` set, when it cannot be read whole.
  [[nodiscard]] virtual std::optional<Data> readFile(std::string_view path,
                                                     std::optional<Error>& error) const = 0;
  // The root of a property list in XML or binary form; none, with `error` set, when the bytes are
  // none or there are no bytes.
  [[nodiscard]] virtual std::optional<Value> parse(const std::optional<Data>& bytes,
                                                   std::optional<Error>& error) const = 0;
};

}  // namespace halvox::platform
