#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <utility>

namespace halvox::platform::linux_ {

// One thing in a store that is not as it must be.
struct StoreDifference {
  std::string place;  // the file, the table and the row, or the file and the offset
  std::string what;   // what is wrong, in one line
};

// Collects the differences that a verification finds. Passes each to a callback, but of one object,
// such as a table, at most kMostOfOne: a damaged table can have millions. Belongs to one thread.
class Differences {
 public:
  using Callback = std::function<void(const StoreDifference&)>;
  static constexpr std::uint64_t kMostOfOne = 100;

  explicit Differences(Callback callback) : callback_(std::move(callback)) {}

  // Adds a difference of an object. `where` is its place in the object, such as "row 7"; empty for
  // the object as a whole.
  void add(const std::string& object, const std::string& where, const std::string& what) {
    ++total_;
    const std::uint64_t count = ++counts_[object];
    if (count <= kMostOfOne) {
      callback_({where.empty() ? object : object + ", " + where, what});
    } else if (count == kMostOfOne + 1) {
      callback_({object, "has more differences, which are not shown"});
    }
  }
  // How many there are, including those that were not passed on.
  [[nodiscard]] std::uint64_t total() const { return total_; }

 private:
  Callback callback_;
  std::map<std::string, std::uint64_t> counts_;
  std::uint64_t total_ = 0;
};

// The place of a row in its table.
[[nodiscard]] inline std::string rowPlace(std::int64_t row) { return "row " + std::to_string(row); }

}  // namespace halvox::platform::linux_
