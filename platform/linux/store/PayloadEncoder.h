#pragma once

#include <memory>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Turns dictionaries into JSON text that always parses: dates are RFC 3339 text in UTC, data is
// base64, no value is null, numbers have their shortest decimal form, numbers that JSON cannot hold
// are the texts "NaN", "Infinity" and "-Infinity", a date outside the years 1 to 9999 is its number
// of seconds since 1970, and bytes that are not UTF-8 are replaced by U+FFFD.
// Belongs to one thread; keeps its buffer from one text to the next unless a text was very large.
class PayloadEncoder {
 public:
  PayloadEncoder();
  PayloadEncoder(const PayloadEncoder&) = delete;
  PayloadEncoder& operator=(const PayloadEncoder&) = delete;
  ~PayloadEncoder();

  // The text; valid until the next call. Never fails.
  [[nodiscard]] std::string_view encode(const Dictionary& payload);

 private:
  class Text;
  std::unique_ptr<Text> text_;
};

// Whether both give the same text, judged without making it. May say no where the texts are equal,
// never yes where they differ: values that are equal as values can differ as text (1 and true).
[[nodiscard]] bool encodeAlike(const Dictionary& left, const Dictionary& right);

}  // namespace halvox::platform::linux_
