#include "analysis/FieldCollector.h"

#include <algorithm>
#include <utility>

#include "analysis/MessageJoin.h"
#include "analysis/MessageNames.h"
#include "analysis/TwinEvents.h"
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include "platform/linux/base/Utf8.h"

namespace halvox::analysis {
namespace {

constexpr std::size_t kNoPlace = FieldCollector::kMostPlaceNames;
// Iterative, because a payload may be nested deeply. Numbers stay texts: only their form is needed.
constexpr unsigned kParseFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;

// Returns the beginning of a text, at most that many bytes and not the half of a character.
std::string_view beginningOf(std::string_view text, std::size_t bytes) {
  if (text.size() <= bytes) return text;
  std::size_t length = 0;
  while (true) {
    const std::size_t step = platform::linux_::nextUtf8(text.substr(length)).length;
    if (length + step > bytes) return text.substr(0, length);
    length += step;
  }
}

FieldType typeOfNumber(std::string_view text) {
  return text.find_first_of(".eE") == std::string_view::npos ? FieldType::kInteger
                                                             : FieldType::kNumber;
}

}  // namespace

std::string_view fieldTypeName(FieldType type) {
  switch (type) {
    case FieldType::kInteger:
      return "integer";
    case FieldType::kNumber:
      return "number";
    case FieldType::kBoolean:
      return "boolean";
    case FieldType::kText:
      return "text";
    case FieldType::kArray:
      return "array";
    case FieldType::kDictionary:
      return "dictionary";
  }
  return {};
}

// The parser calls this for each part of the payload. Values inside of values are skipped.
class FieldCollector::Values
    : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, FieldCollector::Values> {
 public:
  Values(FieldCollector& collector, const Record& record, std::size_t place)
      : collector_(collector),
        record_(record),
        place_(place),
        json_(record.payload->json()),
        isSummary_(isSummary(record)),
        stream_(json_.data(), json_.size()) {}

  void read() {
    rapidjson::Reader reader;
    reader.Parse<kParseFlags>(stream_, *this);
  }

  // NOLINTBEGIN(readability-identifier-naming): the parser's names.
  bool Default() { return true; }
  bool Bool(bool value) { return add(FieldType::kBoolean, value ? "true" : "false"); }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    const std::string_view number(text, length);
    return add(typeOfNumber(number), number);
  }
  bool String(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return add(FieldType::kText, {text, length});
  }
  bool Key(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    if (depth_ == 1) key_.assign(text, length);
    return true;
  }
  // The stream is at the bracket itself.
  bool StartObject() { return begin(); }
  bool EndObject(rapidjson::SizeType /*count*/) { return end(FieldType::kDictionary); }
  bool StartArray() { return depth_ > 0 && begin(); }
  bool EndArray(rapidjson::SizeType /*count*/) { return end(FieldType::kArray); }
  // NOLINTEND(readability-identifier-naming)

 private:
  bool begin() {
    if (depth_++ == 1) begin_ = stream_.Tell();
    return true;
  }
  bool end(FieldType type) {
    if (--depth_ == 1) add(type, json_.substr(begin_, stream_.Tell() + 1 - begin_));
    return true;
  }
  bool add(FieldType type, std::string_view text) {
    // The summary of a session has all keys of its messages, with all values in one text. Only its
    // own key says something new.
    if (depth_ != 1 || (isSummary_ && key_ != kSummaryKey)) return true;
    collector_.addValue(record_, place_, key_, type, text);
    return true;
  }

  FieldCollector& collector_;
  const Record& record_;
  std::size_t place_;
  std::string_view json_;  // of the record
  bool isSummary_;
  rapidjson::MemoryStream stream_;
  std::string key_;
  int depth_ = 0;
  std::size_t begin_ = 0;
};

void FieldCollector::add(const Record& record) {
  if (record.kind == RecordKind::kIssueMetric || completesTwin(record)) return;
  Values(*this, record, placeOf(record)).read();
}

bool FieldCollector::completesTwin(const Record& record) {
  if (record.kind != RecordKind::kEvent) return false;
  if (record.service != kCommonService) {
    return std::exchange(lastEvent_.isThere, false) && isTwin({.category = lastEvent_.category,
                                                               .type = lastEvent_.type,
                                                               .payload = lastEvent_.payload},
                                                              record);
  }
  lastEvent_.isThere = true;
  lastEvent_.category = record.category;
  lastEvent_.type = record.type;
  lastEvent_.payload = record.payload->json();
  return false;
}

std::size_t FieldCollector::placeOf(const Record& record) {
  if (!record.category.empty()) {
    placeText_.assign(record.category).append(".").append(record.type);
  } else if (record.kind == RecordKind::kSnapshot) {
    placeText_ = "snapshot";
  } else {
    placeText_ = record.name;
  }
  if (const auto found = placeNumbers_.find(std::string_view(placeText_));
      found != placeNumbers_.end()) {
    return found->second;
  }
  if (names_.size() == kMostPlaceNames) return kNoPlace;
  placeNumbers_.emplace(placeText_, names_.size());
  names_.push_back(placeText_);
  return names_.size() - 1;
}

FieldCollector::Entry* FieldCollector::find(std::string_view key) {
  if (const auto found = entries_.find(key); found != entries_.end()) return &found->second;
  if (key.size() > kMostKeyBytes) {
    ++valuesOfLongKeys_;
    return nullptr;
  }
  if (entries_.size() == kMostKeys) {
    ++valuesOfOtherKeys_;
    return nullptr;
  }
  Entry& entry = entries_.emplace(key, Entry()).first->second;
  entry.field.key = key;
  return &entry;
}

void FieldCollector::addValue(const Record& record, std::size_t place, std::string_view key,
                              FieldType type, std::string_view text) {
  Entry* const entry = find(key);
  if (entry == nullptr) return;
  Field& field = entry->field;
  const bool isFirst = field.records() == 0;
  switch (record.kind) {
    case RecordKind::kEvent:
      ++field.events;
      break;
    case RecordKind::kLinkMessage:
      ++field.linkMessages;
      break;
    case RecordKind::kPowerEvent:
      ++field.powerEvents;
      break;
    case RecordKind::kSnapshot:
      ++field.snapshots;
      break;
    case RecordKind::kIssueMetric:
    case RecordKind::kLoss:
      break;
  }
  ++field.types[static_cast<std::size_t>(type)];
  countPlace(*entry, place);
  field.first = isFirst ? record.time : std::min(field.first, record.time);
  // Records come in the order of storing: if the clock was set back, the last record is still the
  // newest one.
  field.last = isFirst ? record.time : std::max(field.last, record.time);
  field.exampleType = type;
  field.example = beginningOf(text, kMostExampleBytes);
  field.isExampleCut = field.example.size() < text.size();
}

void FieldCollector::countPlace(Entry& entry, std::size_t place) {
  auto& places = entry.places;
  if (place == kNoPlace) {
    ++entry.field.otherPlaces;
    return;
  }
  if (entry.newestPlace < places.size() && places[entry.newestPlace].name == place) {
    ++places[entry.newestPlace].count;
    return;
  }
  const auto found = std::ranges::find(places, place, &Counted::name);
  if (found != places.end()) {
    ++found->count;
    entry.newestPlace = static_cast<std::size_t>(found - places.begin());
  } else if (places.size() < kMostPlaces) {
    entry.newestPlace = places.size();
    places.push_back({.name = place, .count = 1});
  } else {
    ++entry.field.otherPlaces;
  }
}

std::vector<Field> FieldCollector::take() {
  std::vector<Field> fields;
  fields.reserve(entries_.size());
  for (auto& [key, entry] : entries_) {
    for (const Counted& counted : entry.places) {
      entry.field.places.push_back({.name = names_[counted.name], .count = counted.count});
    }
    std::ranges::stable_sort(entry.field.places, std::greater(), &FieldPlace::count);
    fields.push_back(std::move(entry.field));
  }
  entries_.clear();
  std::ranges::sort(fields, {}, &Field::key);
  return fields;
}

}  // namespace halvox::analysis
