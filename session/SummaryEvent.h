#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"
#include "session/MessageHistory.h"

namespace halvox {

// Builds a session's summary event: for each key, the texts of all its values, joined by ",".
// Strings are unchanged, numbers have their shortest decimal form, and other values look as in log
// lines.
//
// Keeps one growing text for each key instead of lists of values: a long history then takes only
// the memory of the texts. Most values of a session repeat the previous one. Repetitions are only
// counted at first, and their texts are then copied together. Keys keep the order of their first
// use; the service type is first. Belongs to one thread. Each stop makes its own.
class SummaryEvent {
 public:
  explicit SummaryEvent(AudioServiceType serviceType);

  // Appends the text of each value to those of its key. All messages must be of one history, in
  // order.
  void add(const MessageHistory::Entry& entry);
  // Returns the event and empties this object.
  [[nodiscard]] platform::Dictionary take();

 private:
  struct Column {
    platform::Key key;
    std::string text{};
    platform::Value last{};               // the last value of the text
    std::size_t lastBegin = 0;            // where its text begins
    std::uint64_t repetitions = 0;        // of the last value, that are not in the text yet
    std::optional<std::uint32_t> form{};  // the form of the message that the last value is from
    bool isEmpty = true;                  // the text of a value can be empty too
  };
  struct KeyHash {
    std::size_t operator()(const platform::Key& key) const { return key.hash(); }
  };
  // Positions in columns_.
  using Positions = std::vector<std::uint32_t>;

  std::uint32_t positionOf(const platform::Key& key);
  const Positions& positionsOf(std::uint32_t form, const platform::Dictionary& message);
  static void append(Column& column, const platform::Value& value);
  static void writeRepetitions(Column& column);

  std::vector<Column> columns_;
  std::unordered_map<platform::Key, std::uint32_t, KeyHash> positions_;
  // For each form the columns of its keys. Looking them up for each message cost a quarter of the
  // time of a summary.
  std::vector<Positions> positionsOfForms_;
};

}  // namespace halvox
