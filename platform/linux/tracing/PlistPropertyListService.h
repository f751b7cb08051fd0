#pragma once

#include "platform/property_list.h"

namespace halvox::platform::linux_ {

// Property lists in XML and binary form, told apart by their content, read by libplist.
// Only regular files of at most 16 MiB are read, and nothing waits for another process, such as the
// writer of a pipe. Lists of more than 64 levels, 500,000 values or 32 MiB of text are errors, also
// when a binary list gets so large by using a value many times. Any thread may call.
class PlistPropertyListService final : public PropertyListService {
 public:
  static constexpr std::size_t kMostFileBytes = 16U << 20U;

  [[nodiscard]] std::string currentDirectory() const override;
  // Errors name the path.
  [[nodiscard]] std::optional<Data> readFile(std::string_view path,
                                             std::optional<Error>& error) const override;
  // A text becomes a string, a key of a dictionary too, with what is not UTF-8 replaced; a unique
  // identifier becomes its number.
  [[nodiscard]] std::optional<Value> parse(const std::optional<Data>& bytes,
                                           std::optional<Error>& error) const override;
};

}  // namespace halvox::platform::linux_
