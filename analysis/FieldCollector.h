#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "analysis/RecordSource.h"

namespace halvox::analysis {

// The types of values in stored payloads. Times and data are texts there; whole numbers and others
// are kept apart, because the service writes 1.0 for a floating-point 1.
enum class FieldType : std::uint8_t { kInteger, kNumber, kBoolean, kText, kArray, kDictionary };
inline constexpr std::size_t kFieldTypes = 6;
[[nodiscard]] std::string_view fieldTypeName(FieldType type);

// Where a key occurs: "Session_Playback.Start" for messages of that category and type, otherwise
// the name of the event or power event, or "snapshot".
struct FieldPlace {
  std::string name;
  std::uint64_t count = 0;
};

// What the stored records say about one key.
struct Field {
  std::string key;
  std::array<std::uint64_t, kFieldTypes> types{};  // how many values of each type
  // How many records have the key. The two events of a message count as one.
  std::uint64_t events = 0;
  std::uint64_t linkMessages = 0;
  std::uint64_t powerEvents = 0;
  std::uint64_t snapshots = 0;
  double first = 0;  // when the oldest and the newest of them were stored, in seconds since 1970
  double last = 0;
  // The newest value: a text without quotes, or the JSON of any other value. A long one is cut.
  std::string example;
  FieldType exampleType = FieldType::kText;
  bool isExampleCut = false;
  std::vector<FieldPlace> places;  // the most frequent first
  std::uint64_t otherPlaces = 0;   // records of further places

  [[nodiscard]] std::uint64_t records() const {
    return events + linkMessages + powerEvents + snapshots;
  }
};

// Collects the keys of stored records, in one pass. Issue metrics have numbered fields instead of
// keys and are skipped, as are keys inside of values, and the keys that the summary of a session
// repeats.
//
// Clients choose keys, so everything is bounded: the first kMostKeys keys are kept, of each the
// first kMostPlaces places and kMostExampleBytes of an example. What exceeds the bounds is counted.
// A full collector takes about 20 MiB. Belongs to one thread.
class FieldCollector {
 public:
  static constexpr std::size_t kMostKeys = 10'000;
  static constexpr std::size_t kMostKeyBytes = 256;
  static constexpr std::size_t kMostPlaces = 64;
  static constexpr std::size_t kMostPlaceNames = 4096;  // of all keys together
  static constexpr std::size_t kMostExampleBytes = 256;

  // Takes the next record. Records of a message must come in the order of storing.
  void add(const Record& record);

  // Returns the keys in the order of their bytes. Call once, after the last record.
  [[nodiscard]] std::vector<Field> take();

  // Values under keys that are not listed: keys beyond kMostKeys, and keys that are too long.
  [[nodiscard]] std::uint64_t valuesOfOtherKeys() const { return valuesOfOtherKeys_; }
  [[nodiscard]] std::uint64_t valuesOfLongKeys() const { return valuesOfLongKeys_; }

 private:
  struct Hash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const {
      return std::hash<std::string_view>()(text);
    }
  };
  template <typename T>
  using ByText = std::unordered_map<std::string, T, Hash, std::equal_to<>>;
  struct Counted {
    std::size_t name = 0;  // index into names_
    std::uint64_t count = 0;
  };
  struct Entry {
    Field field;
    std::vector<Counted> places;
    std::size_t newestPlace = 0;  // index into `places`; the next record is often of the same one
  };
  // The last event under the name that all services share. Its twin is not counted again.
  struct LastEvent {
    bool isThere = false;
    std::string category;
    std::string type;
    std::string payload;
  };
  class Values;  // receives the members of one payload from the parser

  [[nodiscard]] bool completesTwin(const Record& record);
  [[nodiscard]] std::size_t placeOf(const Record& record);
  [[nodiscard]] Entry* find(std::string_view key);
  void addValue(const Record& record, std::size_t place, std::string_view key, FieldType type,
                std::string_view text);
  static void countPlace(Entry& entry, std::size_t place);

  ByText<Entry> entries_;
  ByText<std::size_t> placeNumbers_;
  std::vector<std::string> names_;
  std::string placeText_;  // kept for its memory
  LastEvent lastEvent_;
  std::uint64_t valuesOfOtherKeys_ = 0;
  std::uint64_t valuesOfLongKeys_ = 0;
};

}  // namespace halvox::analysis
