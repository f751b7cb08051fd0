#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"

namespace halvox::tools {

// An extended regular expression, as of grep -E. A pattern without an upper-case letter ignores
// case. Copies share one compiled form. Any thread may match.
class TextPattern {
 public:
  // Compiles a pattern. The message of a failure says what is wrong with it.
  [[nodiscard]] static platform::linux_::Result<TextPattern> compile(std::string_view pattern);

  // Whether a part of the text matches.
  [[nodiscard]] bool matches(std::string_view text) const;

 private:
  struct Compiled;
  explicit TextPattern(std::shared_ptr<const Compiled> compiled) : compiled_(std::move(compiled)) {}

  std::shared_ptr<const Compiled> compiled_;
};

}  // namespace halvox::tools
