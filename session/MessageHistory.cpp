#include "session/MessageHistory.h"

#include <algorithm>
#include <utility>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Key;

// Bounds the table of codes, because a client can invent any number of categories and types. A base
// whose code is not in the table is found by its text. No honest client needs so many codes.
constexpr std::size_t kMaxBasesByCode = 4096;
// Estimated bytes of a node and a bucket of a hash table.
constexpr std::size_t kTableEntryOverhead = 48;

const Key kProcessUptimeKey("processuptime_ms");
const Key kSystemUptimeKey("systemuptime_sec");
const Key kTimestampKey("hvreporting_timestamp");

bool isVolatile(const Dictionary::Entry& entry) {
  return entry.key == kTimestampKey || entry.key == kSystemUptimeKey ||
         entry.key == kProcessUptimeKey;
}

std::uint64_t codeOf(AudioEventCategory category, AudioEventType type) {
  return std::uint64_t{static_cast<std::uint32_t>(category)} << 16U |
         static_cast<std::uint16_t>(type);
}

std::size_t countLastingEntries(const Dictionary& message) {
  return message.size() -
         static_cast<std::size_t>(std::count_if(message.begin(), message.end(), isVolatile));
}

// Keys are unique within a dictionary. If both have the same number of compared entries and each
// entry of the left one is in the right one, the right one has no others.
bool equalInAnyOrder(const Dictionary& left, const Dictionary& right) {
  if (countLastingEntries(left) != countLastingEntries(right)) return false;
  return std::all_of(left.begin(), left.end(), [&right](const Dictionary::Entry& entry) {
    if (isVolatile(entry)) return true;
    const platform::Value* counterpart = right.find(entry.key);
    return counterpart != nullptr && *counterpart == entry.value;
  });
}

}  // namespace

std::string MessageHistory::Entry::identifier() const {
  return base_->text() + "_" + std::to_string(count_);
}

std::uint64_t MessageHistory::count(const std::string& base) const {
  const auto found = bases_.find(base);
  return found == bases_.end() ? 0 : found->second.count();
}

MessageHistory::Base& MessageHistory::base(AudioEventCategory category, AudioEventType type) {
  // Several codes can have one text: all unlisted types are "Generic". They share a base, and with
  // it a count.
  const std::uint64_t code = codeOf(category, type);
  if (const auto known = basesByCode_.find(code); known != basesByCode_.end()) {
    return *known->second;
  }
  std::string text(HVReportingUtilityCategoryString(category));
  text += '_';
  text += HVReportingUtilityTypeString(type);
  Base& base = baseWithText(std::move(text));
  if (basesByCode_.size() < kMaxBasesByCode) {
    basesByCode_.emplace(code, &base);
    memorySize_ += sizeof(code) + sizeof(&base) + kTableEntryOverhead;
  }
  return base;
}

MessageHistory::Base& MessageHistory::baseWithText(std::string text) {
  const auto [place, isNew] = bases_.try_emplace(text, text);
  // The text is stored twice: as the key and in the base.
  if (isNew) memorySize_ += sizeof(Base) + 2 * text.size() + kTableEntryOverhead;
  return place->second;
}

const Dictionary* MessageHistory::newestMessage(const Base& base) const {
  return base.count_ == 0 ? nullptr : &entries_[base.newest_].message();
}

void MessageHistory::append(Base& base, Dictionary message) {
  memorySize_ += sizeof(Entry) + message.memorySize();
  // The position of the entry that is added below.
  base.newest_ = entries_.size();
  ++base.count_;
  entries_.emplace_back(base, base.count_, std::move(message));
}

bool equalApartFromVolatileKeys(const Dictionary& left, const Dictionary& right) {
  if (left.isIdenticalTo(right)) return true;
  // Repeated messages nearly always have the same keys in the same order: this loop needs no
  // look-up.
  if (left.size() == right.size()) {
    const Dictionary::Entry* other = right.begin();
    const Dictionary::Entry* entry = left.begin();
    while (entry != left.end() && entry->key == other->key) {
      // Values first: a benchmark showed that looking up the volatile keys for every entry cost
      // most of a comparison.
      if (!(entry->value == other->value) && !isVolatile(*entry)) return false;
      ++entry;
      ++other;
    }
    if (entry == left.end()) return true;
  }
  return equalInAnyOrder(left, right);
}

}  // namespace halvox
