#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/value.h"

namespace halvox::platform {

// Reads property-list files. Nothing in the files is trusted, because clients name them.
//
// Any thread may call; reading waits for the disk. A failure sets `error`. The composition root
// owns the service.
class PropertyListService {
 public:
  virtual ~PropertyListService() = default;

  // The directory that relative paths start from.
  [[nodiscard]] virtual std::string currentDirectory() const = 0;
  // The whole content of a file; none, with `error` set, if it cannot be read completely. Reading
  // and parsing are two calls because the caller logs each failure separately and continues.
  [[nodiscard]] virtual std::optional<Data> readFile(std::string_view path,
                                                     std::optional<Error>& error) const = 0;
  // The root of a property list in XML or binary form; none, with `error` set, if the bytes are not
  // a property list or there are no bytes.
  [[nodiscard]] virtual std::optional<Value> parse(const std::optional<Data>& bytes,
                                                   std::optional<Error>& error) const = 0;
};

}  // namespace halvox::platform
