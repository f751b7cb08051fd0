#pragma once

#include <memory>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Writes a JSON array of objects as indented text. The caller takes the text in pieces. An array of
// any length therefore needs only the memory of one object. Values have the form that
// PayloadEncoder documents. Belongs to one thread. Cannot fail.
class IndentedJsonArray {
 public:
  IndentedJsonArray();
  IndentedJsonArray(const IndentedJsonArray&) = delete;
  IndentedJsonArray& operator=(const IndentedJsonArray&) = delete;
  ~IndentedJsonArray();

  // Appends `{key: value}` and the separator before it. `key` must be UTF-8.
  void appendObject(std::string_view key, const Dictionary& value);
  // Closes the array. Nothing may be appended after this.
  void end();
  // Returns the text that was appended since the last takeText(). Valid until the next call of any
  // function.
  [[nodiscard]] std::string_view takeText();

 private:
  class Text;
  std::unique_ptr<Text> text_;
};

}  // namespace halvox::platform::linux_
