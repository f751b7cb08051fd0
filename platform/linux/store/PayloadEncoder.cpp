#include "platform/linux/store/PayloadEncoder.h"

#include <algorithm>
#include <bit>
#include <cstdint>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kKeptBufferBytes = 256 * 1024;
constexpr std::size_t kKeptPlaces = 4096;

bool alike(const Value& left, const Value& right);

bool alikeNumbers(const Value& left, const Value& right) {
  if (left.numberKind() != right.numberKind()) return false;
  switch (left.numberKind()) {
    case NumberKind::kFloat:
    case NumberKind::kDouble:
      // Compare the bits, because 0.0 and -0.0 are equal but have different texts.
      return std::bit_cast<std::uint64_t>(left.toDouble()) ==
             std::bit_cast<std::uint64_t>(right.toDouble());
    case NumberKind::kUInt64:
      return left.toUInt64() == right.toUInt64();
    case NumberKind::kBool:
    case NumberKind::kUInt8:
    case NumberKind::kInt16:
    case NumberKind::kUInt16:
    case NumberKind::kInt32:
    case NumberKind::kUInt32:
    case NumberKind::kInt64:
      return left.toInt64() == right.toInt64();
  }
  return false;
}

bool alike(const Value& left, const Value& right) {
  if (left.isIdenticalTo(right)) return true;
  if (left.kind() != right.kind()) return false;
  switch (left.kind()) {
    case ValueKind::kNone:
      return true;
    case ValueKind::kNumber:
      return alikeNumbers(left, right);
    case ValueKind::kString:
      return left.string() == right.string();
    case ValueKind::kDate:
      return left.date() == right.date();
    case ValueKind::kData:
      return left.data() == right.data();
    case ValueKind::kArray:
      return std::ranges::equal(left.array(), right.array(), alike);
    case ValueKind::kDictionary:
      return encodeAlike(left.dictionary(), right.dictionary());
  }
  return false;
}

bool alikeEntries(const Dictionary::Entry& left, const Dictionary::Entry& right) {
  return left.key == right.key && alike(left.value, right.value);
}

void giveBackText(JsonText& text) {
  if (text.capacity() > kKeptBufferBytes) text.free();
}

}  // namespace

std::string_view PayloadEncoder::encode(const Dictionary& payload, const Dictionary::Entry* added) {
  const std::size_t shared = payload.sharedEntries(payload_);
  const bool hasSameEnd =
      added == nullptr ? !added_.has_value() : added_ && alikeEntries(*added_, *added);
  const bool mayBeSame = text_.size() > 0 && hasSameEnd && payload.size() == payload_.size();
  isRepeated_ = mayBeSame && shared == payload.size();
  if (isRepeated_) return text_.view();
  if (shared > 0) {
    // The events and the link message of one message.
    payload_ = payload;
    places_.resize(shared);
    text_.truncate(places_.back().end);
    encodeFrom(shared);
  } else {
    const Dictionary previous = std::exchange(payload_, payload);
    // The events of a message that has an application of its own are two dictionaries with equal
    // entries.
    const bool hasSameEntries = encodeLike(previous);
    isRepeated_ = mayBeSame && hasSameEntries;
  }
  added_.reset();
  if (added != nullptr) {
    appendKey(*added, payload_.size());
    text_.append(added->value);
    added_.emplace(*added);
  }
  text_.append('}');
  return text_.view();
}

// Encodes the entries from the position `first` on. The text must end after the entry before it.
void PayloadEncoder::encodeFrom(std::size_t first) {
  for (std::size_t position = first; position < payload_.size(); ++position) {
    const Dictionary::Entry& entry = payload_.begin()[position];
    appendKey(entry, position);
    const std::size_t keyEnd = text_.size();
    text_.append(entry.value);
    places_.push_back({keyEnd, text_.size()});
  }
}

void PayloadEncoder::appendKey(const Dictionary::Entry& entry, std::size_t position) {
  if (position > 0) text_.append(',');
  text_.append(entry.key.text());
  text_.append(':');
}

// Copies what the payload has at the same position as the previous one: runs of equal entries, and
// the key of an entry whose value has changed. Encodes the rest. Returns true if all entries of the
// payload are in the previous one, at the same positions.
bool PayloadEncoder::encodeLike(const Dictionary& previous) {
  std::swap(text_, previousText_);
  text_.truncate(0);
  const std::string_view old = previousText_.view();
  const std::size_t both = std::min(payload_.size(), previous.size());
  if (both == 0) text_.append('{');
  bool isSame = both == payload_.size();
  std::size_t copied = 0;    // where the current run begins in the old text
  std::size_t oldStart = 1;  // where the entry begins in the old text, after the brace
  for (std::size_t position = 0; position < both; ++position) {
    const Dictionary::Entry& entry = payload_.begin()[position];
    const Dictionary::Entry& oldEntry = previous.begin()[position];
    Place& place = places_[position];
    const Place oldPlace = place;
    const bool hasSameKey = entry.key.sharesNode(oldEntry.key);
    if (hasSameKey && alike(entry.value, oldEntry.value)) {
      // The entry belongs to a run, which will be copied to the end of the text. Unsigned
      // arithmetic is right even if the run moves towards the beginning.
      const std::size_t offset = text_.size() - copied;
      place = {oldPlace.keyEnd + offset, oldPlace.end + offset};
    } else {
      isSame = false;
      const std::size_t runEnd = hasSameKey ? oldPlace.keyEnd : oldStart;
      text_.appendPart(old.substr(copied, runEnd - copied));
      if (!hasSameKey) appendKey(entry, position);
      place.keyEnd = text_.size();
      text_.append(entry.value);
      place.end = text_.size();
      copied = oldPlace.end;
    }
    oldStart = oldPlace.end;
  }
  if (both > 0) text_.appendPart(old.substr(copied, oldStart - copied));
  places_.resize(both);
  encodeFrom(both);
  // Free the memory of a large payload. It would otherwise stay allocated until the service ends.
  giveBackText(previousText_);
  return isSame;
}

void PayloadEncoder::giveBack() {
  payload_ = {};
  added_.reset();
  text_.truncate(0);
  places_.clear();
  if (places_.capacity() > kKeptPlaces) places_.shrink_to_fit();
  giveBackText(text_);
  giveBackText(previousText_);
}

void PayloadEncoder::giveBackIfLong() {
  if (text_.size() > kKeptBufferBytes) giveBack();
}

bool encodeAlike(const Dictionary& left, const Dictionary& right) {
  if (left.isIdenticalTo(right)) return true;
  return std::ranges::equal(left, right, alikeEntries);
}

}  // namespace halvox::platform::linux_
