#pragma once

#include <memory>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Encodes dictionaries as compact JSON text that always parses, whatever a client has sent:
//
//   date             RFC 3339 text in UTC; outside the years 1 to 9999, its seconds since 1970
//   data             base64
//   no value         null
//   number           the shortest decimal form that reads back as the same number
//   NaN, infinities  the texts "NaN", "Infinity" and "-Infinity", which JSON has no numbers for
//   text             as it is; each byte that is not part of valid UTF-8 becomes U+FFFD
//
// Belongs to one thread. Keeps its buffer between texts. After a text longer than 256 KiB, the next
// giveBack() or encode() frees the buffer.
class PayloadEncoder {
 public:
  PayloadEncoder();
  PayloadEncoder(const PayloadEncoder&) = delete;
  PayloadEncoder& operator=(const PayloadEncoder&) = delete;
  ~PayloadEncoder();

  // Returns the text, valid until the next call. Cannot fail.
  [[nodiscard]] std::string_view encode(const Dictionary& payload);
  // Frees the buffer if the last text was long. That text is no longer valid.
  void giveBack();

 private:
  class Text;
  std::unique_ptr<Text> text_;
};

// Compares two dictionaries without encoding them. Returns true only if both encode to the same
// text. May return false although the texts are equal; the store then encodes the payload twice.
// The operator == would be wrong, because 1 and true are equal values with different texts.
[[nodiscard]] bool encodeAlike(const Dictionary& left, const Dictionary& right);

}  // namespace halvox::platform::linux_
