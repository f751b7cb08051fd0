#include "session/MessageHistory.h"

#include <algorithm>
#include <utility>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Key;

// A client can name more categories and types than there are texts for them: what does not fit here
// is found by its text. No honest client comes near.
constexpr std::size_t kMaxBasesByCode = 4096;
// A hash table's node and bucket, about.
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

}  // namespace

std::string MessageHistory::Entry::identifier() const {
  return base_->text() + "_" + std::to_string(count_);
}

std::uint64_t MessageHistory::count(const std::string& base) const {
  const auto found = bases_.find(base);
  return found == bases_.end() ? 0 : found->second.count();
}

MessageHistory::Base& MessageHistory::base(AudioEventCategory category, AudioEventType type) {
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
  if (isNew) memorySize_ += sizeof(Base) + 2 * text.size() + kTableEntryOverhead;
  return place->second;
}

const Dictionary* MessageHistory::newestMessage(const Base& base) const {
  return base.count_ == 0 ? nullptr : &entries_[base.newest_].message();
}

void MessageHistory::append(Base& base, Dictionary message) {
  memorySize_ += sizeof(Entry) + message.memorySize();
  base.newest_ = entries_.size();
  ++base.count_;
  entries_.emplace_back(base, base.count_, std::move(message));
}

bool equalApartFromVolatileKeys(const Dictionary& left, const Dictionary& right) {
  if (left.isIdenticalTo(right)) return true;
  const auto volatileEntries = [](const Dictionary& message) {
    return static_cast<std::size_t>(std::count_if(message.begin(), message.end(), isVolatile));
  };
  if (left.size() - volatileEntries(left) != right.size() - volatileEntries(right)) return false;
  // Repeated messages have their keys in the same order, so the same place is tried first.
  const Dictionary::Entry* other = right.begin();
  for (const Dictionary::Entry& entry : left) {
    const bool samePlace = other != right.end() && other->key == entry.key;
    const platform::Value* counterpart = samePlace ? &other->value : nullptr;
    if (other != right.end()) ++other;
    if (isVolatile(entry)) continue;
    if (counterpart == nullptr) counterpart = right.find(entry.key);
    if (counterpart == nullptr || !(*counterpart == entry.value)) return false;
  }
  return true;
}

}  // namespace halvox
