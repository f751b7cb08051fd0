#pragma once

#include <cstddef>
#include <optional>
#include <string_view>
#include <vector>

#include "platform/linux/store/JsonText.h"
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
// Most payloads resemble the one before. The events and the link message of one message share all
// entries but the last. The next message of a client has the same keys and mostly the same values.
// The encoder therefore remembers the last payload and where its entries are in the text. It copies
// the text of what is the same, and encodes only what differs.
//
// Belongs to one thread. Holds a reference to the last payload, and keeps its memory, until the
// next call. After a text longer than 256 KiB, the next giveBack() or encode() frees the memory.
class PayloadEncoder {
 public:
  // Returns the text of a dictionary. If `added` is not null, this entry follows those of the
  // dictionary, which must not have its key. The text is valid until the next call. Cannot fail.
  [[nodiscard]] std::string_view encode(const Dictionary& payload,
                                        const Dictionary::Entry* added = nullptr);
  // Returns true if the last call of encode() had the payload of the call before it, or an equal
  // one, and therefore returned the same text.
  [[nodiscard]] bool isRepeated() const { return isRepeated_; }
  // Forgets the last payload, and frees the memory that only a long text needed. The last text is
  // no longer valid.
  void giveBack();
  // Does the same if the last text is longer than 256 KiB. For users that encode payload after
  // payload without an end that they know of.
  void giveBackIfLong();

 private:
  // The text of one entry, with the comma before it, ends at `end`, and its key with the colon at
  // `keyEnd`.
  struct Place {
    std::size_t keyEnd;
    std::size_t end;
  };

  void encodeFrom(std::size_t first);
  bool encodeLike(const Dictionary& previous);
  void appendKey(const Dictionary::Entry& entry, std::size_t position);

  JsonText text_;
  JsonText previousText_;  // memory for the next text
  Dictionary payload_;     // what text_ encodes, without the added entry
  std::optional<Dictionary::Entry> added_;
  std::vector<Place> places_;  // of the entries of payload_
  bool isRepeated_ = false;
};

// Compares two dictionaries without encoding them. Returns true only if both encode to the same
// text. May return false although the texts are equal; the encoder then encodes the payload twice.
// The operator == would be wrong, because 1 and true are equal values with different texts.
[[nodiscard]] bool encodeAlike(const Dictionary& left, const Dictionary& right);

}  // namespace halvox::platform::linux_
