#include "tools/TextPattern.h"

#include <algorithm>
#include <array>
#include <utility>

#include <regex.h>

namespace halvox::tools {

struct TextPattern::Compiled {
  Compiled() = default;
  Compiled(const Compiled&) = delete;
  Compiled& operator=(const Compiled&) = delete;
  ~Compiled() {
    if (isValid) ::regfree(&expression);
  }

  regex_t expression{};
  bool isValid = false;
};

// The expressions of libc: those of the standard library overflow the stack on long texts, which
// clients can send.
platform::linux_::Result<TextPattern> TextPattern::compile(std::string_view pattern) {
  const bool hasUpper =
      std::ranges::any_of(pattern, [](char one) { return one >= 'A' && one <= 'Z'; });
  auto compiled = std::make_shared<Compiled>();
  const int code = ::regcomp(&compiled->expression, std::string(pattern).c_str(),
                             REG_EXTENDED | REG_NOSUB | (hasUpper ? 0 : REG_ICASE));
  if (code != 0) {
    std::array<char, 256> reason{};
    ::regerror(code, &compiled->expression, reason.data(), reason.size());
    return platform::linux_::Failure<>{"expected a regular expression, found \"" +
                                       std::string(pattern) + "\": " + reason.data()};
  }
  compiled->isValid = true;
  return TextPattern(std::move(compiled));
}

bool TextPattern::matches(std::string_view text) const {
  // REG_STARTEND: the text has no NUL at its end.
  regmatch_t range{.rm_so = 0, .rm_eo = static_cast<regoff_t>(text.size())};
  return ::regexec(&compiled_->expression, text.data(), 1, &range, REG_STARTEND) == 0;
}

}  // namespace halvox::tools
