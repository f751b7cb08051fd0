#pragma once

#include <cstddef>
#include <string>
#include <unordered_map>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

// Puts a session's summary event together: for each key, the texts of all values that it had,
// joined by ",". Strings stand as they are, numbers in their shortest decimal form, everything else
// as log lines show it.
//
// One growing text a key, so that a long history costs its texts and no list of values. Keys keep
// the order in which they came up, the service type first. Belongs to one thread.
class SummaryEvent {
 public:
  explicit SummaryEvent(AudioServiceType serviceType);

  void add(const platform::Dictionary& message);
  // The event; leaves nothing behind.
  [[nodiscard]] platform::Dictionary take();

 private:
  struct Column {
    platform::Key key;
    std::string text;
  };
  struct KeyHash {
    std::size_t operator()(const platform::Key& key) const { return key.hash(); }
  };

  Column& columnOf(const platform::Key& key);

  std::vector<Column> columns_;
  std::unordered_map<platform::Key, std::size_t, KeyHash> positions_;
  // Messages of a kind have the same keys in the same order, so the next column is mostly right.
  std::size_t likely_ = 0;
};

}  // namespace halvox
