#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// Runs queries in SQL on a store, whether or not a service writes to it. The tables that unpack
// messages are compiled in. Allows only reading: SELECT, and the pragmas that describe tables.
// Belongs to one thread and one owner.
//
// While a statement runs, it holds a snapshot, which keeps the service from reusing its write-ahead
// log. The callbacks must therefore not wait for anything slow, such as a person who reads the
// output in a pager.
class StoreQueries {
 public:
  // One value of a row; a null is std::monostate. Views are valid during the callback only.
  using Value = std::variant<std::monostate, std::int64_t, double, std::string_view,
                             std::span<const std::byte>>;
  using ColumnsCallback = std::function<void(const std::vector<std::string>& names)>;
  using RowCallback = std::function<void(const std::vector<Value>& values)>;

  // Opens the store in `directory`. Fails as StoreReader::open() does.
  Result<void, StoreError> open(const std::filesystem::path& directory);

  // Runs the first statement of `sql` and removes it from `sql`. Calls `columns` before the first
  // row, even if there are no rows. The error says why the statement failed; the rows before it
  // have been delivered. A text of only blanks and comments is not an error.
  Result<void> runFirst(std::string_view& sql, const ColumnsCallback& columns,
                        const RowCallback& row);

  // Returns true if the text ends with the end of a statement.
  [[nodiscard]] static bool isComplete(const std::string& sql);

 private:
  StoreReader reader_;
};

}  // namespace halvox::platform::linux_
