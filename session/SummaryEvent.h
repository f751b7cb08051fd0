#pragma once

#include <cstddef>
#include <string>
#include <unordered_map>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

// Builds a session's summary event: for each key, the texts of all its values, joined by ",".
// Strings are unchanged, numbers have their shortest decimal form, and other values look as in log
// lines.
//
// Keeps one growing text for each key instead of lists of values: a long history then takes only
// the memory of the texts. Keys keep the order of their first use; the service type is first.
// Belongs to one thread. Each stop makes its own.
class SummaryEvent {
 public:
  explicit SummaryEvent(AudioServiceType serviceType);

  // Appends the text of each value to those of its key.
  void add(const platform::Dictionary& message);
  // Returns the event and empties this object.
  [[nodiscard]] platform::Dictionary take();

 private:
  struct Column {
    platform::Key key;
    std::string text;
    platform::Value last;       // the last value of the text
    std::size_t lastBegin = 0;  // where its text begins
  };
  struct KeyHash {
    std::size_t operator()(const platform::Key& key) const { return key.hash(); }
  };

  Column& columnOf(const platform::Key& key);
  static void append(Column& column, const platform::Value& value);

  std::vector<Column> columns_;
  std::unordered_map<platform::Key, std::size_t, KeyHash> positions_;
  // The column after the last one used. Messages of one kind have the same keys in the same order.
  // This column is therefore usually the next one that is needed, which saves a look-up.
  std::size_t likely_ = 0;
};

}  // namespace halvox
