#pragma once

#include "platform/property_list.h"

namespace halvox::platform::linux_ {

// Reads property lists in XML and binary form with libplist; the content decides which form it is.
//
// Everything is bounded before the library sees it, because clients name the files. Only regular
// files of at most 16 MiB are read, without waiting for another process such as the writer of a
// pipe. More than 64 levels, 500,000 values or 32 MiB of text are errors, also if a binary list
// reaches them by using one value many times.
//
// Any thread may call; reading waits for the disk. The composition root owns the service.
class PlistPropertyListService final : public PropertyListService {
 public:
  static constexpr std::size_t kMostFileBytes = 16U << 20U;

  [[nodiscard]] std::string currentDirectory() const override;
  // Errors name the path and the system's reason.
  [[nodiscard]] std::optional<Data> readFile(std::string_view path,
                                             std::optional<Error>& error) const override;
  // In keys and texts, bytes that are not UTF-8 are replaced. A unique identifier becomes its
  // number.
  [[nodiscard]] std::optional<Value> parse(const std::optional<Data>& bytes,
                                           std::optional<Error>& error) const override;
};

}  // namespace halvox::platform::linux_
