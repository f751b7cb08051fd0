#pragma once

#include <memory>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// A JSON array of objects as indented text, made piece by piece, so that it needs the memory of one
// object at a time. Values have the form that PayloadEncoder gives them. Belongs to one thread.
class IndentedJsonArray {
 public:
  IndentedJsonArray();
  IndentedJsonArray(const IndentedJsonArray&) = delete;
  IndentedJsonArray& operator=(const IndentedJsonArray&) = delete;
  ~IndentedJsonArray();

  // Appends `{key: value}`, and the text before it. The key is UTF-8.
  void appendObject(std::string_view key, const Dictionary& value);
  // Ends the array; nothing may be appended any more.
  void end();
  // What was appended since the text was taken last; valid until the next call.
  [[nodiscard]] std::string_view takeText();

 private:
  class Text;
  std::unique_ptr<Text> text_;
};

}  // namespace halvox::platform::linux_
