#include "session/MessageHistory.h"

#include <algorithm>
#include <utility>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Key;
using platform::Value;

// Bounds the table of codes, because a client can invent any number of categories and types. A base
// whose code is not in the table is found by its text. No honest client needs so many codes.
constexpr std::size_t kMaxBasesByCode = 4096;
// Bounds the number of forms. Each form costs the memory of its last message, and the time of
// comparing its keys with those of a new message. At the bound, a message whose keys match no form
// gets none and is written with its keys.
constexpr std::size_t kMaxForms = 256;
constexpr std::size_t kMaxFormsOfBase = 8;
// Estimated bytes of a node and a bucket of a hash table.
constexpr std::size_t kTableEntryOverhead = 48;

// Each entry begins with one of these numbers. The number of form n is kFirstForm + n.
constexpr std::uint64_t kLoss = 0;
constexpr std::uint64_t kSingle = 1;
constexpr std::uint64_t kFirstForm = 2;

constexpr std::size_t kBitsOfByte = 8;

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
    const Value* counterpart = right.find(entry.key);
    return counterpart != nullptr && *counterpart == entry.value;
  });
}

bool haveSameKeys(const Dictionary& left, const Dictionary& right) {
  const std::size_t size = left.size();
  if (size != right.size()) return false;
  return std::equal(left.begin(), left.begin() + size, right.begin(),
                    [](const Dictionary::Entry& one, const Dictionary::Entry& other) {
                      return one.key == other.key;
                    });
}

// The size in bytes of a mask with one bit for each key.
std::size_t maskSizeFor(std::size_t keys) { return (keys + kBitsOfByte - 1) / kBitsOfByte; }

// The keys of a message without their values.
Dictionary keysOf(const Dictionary& message) {
  Dictionary keys;
  keys.reserve(message.size());
  for (const Dictionary::Entry& entry : message) keys.set(entry.key, Value());
  return keys;
}

}  // namespace

std::string MessageHistory::Entry::identifier() const {
  return base_->text() + "_" + std::to_string(count_);
}

std::uint64_t MessageHistory::count(const std::string& base) const {
  const auto found = basesByText_.find(base);
  return found == basesByText_.end() ? 0 : found->second->count();
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
  const auto [place, isNew] = basesByText_.try_emplace(text, nullptr);
  if (isNew) {
    // The text is stored twice: as the key and in the base.
    memorySize_ += sizeof(Base) + 2 * text.size() + kTableEntryOverhead;
    place->second =
        &bases_.emplace_back(std::move(text), static_cast<std::uint32_t>(bases_.size()));
  }
  return *place->second;
}

const Dictionary* MessageHistory::newestMessage(const Base& base) const {
  if (base.count_ == 0) return nullptr;
  return base.isNewestInForm_ ? &forms_[base.forms_.front()].previous : &base.newest_;
}

void MessageHistory::setNewest(Base& base, Dictionary message) {
  base.isNewestInForm_ = false;
  const std::size_t memorySize = message.memorySize();
  memorySize_ += memorySize - std::exchange(base.newestSize_, memorySize);
  base.newest_ = std::move(message);
}

std::optional<std::uint32_t> MessageHistory::append(Base& base, Dictionary message) {
  std::vector<std::byte>& bytes = bytes_.last();
  if (base.lost_ > 0) {
    CompactWriter writer(bytes);
    writer.append(kLoss);
    writer.append(std::uint64_t{base.number_});
    writer.append(std::exchange(base.lost_, 0));
  }
  ++size_;
  ++base.count_;
  if (const auto form = formOf(base, message)) {
    if (base.newestSize_ > 0) setNewest(base, Dictionary());
    base.isNewestInForm_ = true;
    writeForm(*form, std::move(message));
    return form;
  }
  CompactWriter writer(bytes);
  writer.append(kSingle);
  writer.append(std::uint64_t{base.number_});
  writer.append(message);
  setNewest(base, std::move(message));
  return std::nullopt;
}

void MessageHistory::lose(Base& base, Dictionary message) {
  ++lost_;
  ++base.lost_;
  ++base.count_;
  setNewest(base, std::move(message));
}

std::optional<std::uint32_t> MessageHistory::formOf(Base& base, const Dictionary& message) {
  const auto hasItsKeys = [&](std::uint32_t number) {
    return haveSameKeys(forms_[number].previous, message);
  };
  const auto found = std::ranges::find_if(base.forms_, hasItsKeys);
  if (found == base.forms_.begin() && found != base.forms_.end()) return *found;
  if (found != base.forms_.end()) {
    // Moved to the front, where the next message finds it first.
    std::rotate(base.forms_.begin(), found, found + 1);
    return base.forms_.front();
  }
  if (forms_.size() >= kMaxForms || base.forms_.size() >= kMaxFormsOfBase) return std::nullopt;
  const auto number = static_cast<std::uint32_t>(forms_.size());
  const Form& form = forms_.emplace_back(Form{.base = &base, .previous = keysOf(message)});
  base.forms_.insert(base.forms_.begin(), number);
  memorySize_ += sizeof(Form) + sizeof(number) + form.previous.memorySize();
  return number;
}

// Writes a mask with one bit for each key, set if its value differs from the previous one, and then
// the values that differ.
void MessageHistory::writeForm(std::uint32_t number, Dictionary message) {
  std::vector<std::byte>& bytes = bytes_.last();
  CompactWriter writer(bytes);
  writer.append(kFirstForm + number);
  const std::span<const Dictionary::Entry> entries(message.begin(), message.size());
  const std::size_t bits = bytes.size();
  for (std::size_t size = maskSizeFor(entries.size()); size > 0; --size) bytes.emplace_back();
  Form& form = forms_[number];
  const Dictionary::Entry* previous = form.previous.begin();
  for (std::size_t position = 0; position < entries.size(); ++position, ++previous) {
    const Value& value = entries[position].value;
    if (isRepetition(previous->value, value)) continue;
    bytes[bits + position / kBitsOfByte] |= std::byte{1} << (position % kBitsOfByte);
    writer.append(previous->value, value);
    // Only the change is added: adding up the memory of all entries for each message cost more than
    // comparing them.
    memorySize_ += value.memorySize() - previous->value.memorySize();
  }
  form.previous = std::move(message);
}

const MessageHistory::Entry* MessageHistory::Reader::next() {
  while (!error_.has_value()) {
    const std::span<const std::byte> rest = restOfPiece();
    if (rest.empty()) {
      if (error_.has_value() || !history_->bytes_.isFull(piece_)) break;
      ++piece_;
      position_ = 0;
      continue;
    }
    CompactReader reader(rest);
    const bool isMessage = read(reader);
    if (!reader.isIntact()) {
      giveUp();
      break;
    }
    position_ += reader.position();
    if (isMessage) return &entry_;
  }
  return nullptr;
}

std::span<const std::byte> MessageHistory::Reader::restOfPiece() {
  const HistoryBytes& bytes = history_->bytes_;
  if (piece_ >= bytes.pieces()) return {};
  if (!bytes.isMovedOut(piece_)) return bytes.inMemory(piece_).subspan(position_);
  if (buffered_ != piece_) {
    error_ = bytes.read(piece_, buffer_);
    if (error_.has_value()) return {};
    buffered_ = piece_;
  }
  return std::span<const std::byte>(buffer_).subspan(position_);
}

void MessageHistory::Reader::giveUp() {
  error_ = platform::Error{.description = "piece " + std::to_string(piece_) +
                                          " of the history is damaged from byte " +
                                          std::to_string(position_) + " on"};
}

// Returns true if the entry was a message. If the bytes are damaged, `reader` is not intact, and
// what this returns or sets has no meaning.
bool MessageHistory::Reader::read(CompactReader& reader) {
  const std::uint64_t kind = reader.number();
  if (kind >= kFirstForm) {
    readForm(reader, kind - kFirstForm);
    return true;
  }
  const std::uint64_t number = reader.number();
  if (number >= history_->bases_.size()) {
    reader.giveUp();
    return false;
  }
  const Base& base = history_->bases_[number];
  if (kind == kLoss) {
    countOf(base) += reader.number();
    return false;
  }
  single_ = reader.dictionary();
  entry_.form_.reset();
  setEntry(base, single_);
  return true;
}

void MessageHistory::Reader::readForm(CompactReader& reader, std::size_t number) {
  if (number >= history_->forms_.size()) return reader.giveUp();
  const Form& form = history_->forms_[number];
  if (previous_.size() <= number) previous_.resize(number + 1);
  Dictionary& message = previous_[number];
  if (message.empty()) message = keysOf(form.previous);
  const std::size_t size = message.size();
  const std::span<const std::byte> mask = reader.bytes(maskSizeFor(size));
  if (!reader.isIntact()) return;
  for (std::size_t position = 0; position < size; ++position) {
    const std::byte bit = std::byte{1} << (position % kBitsOfByte);
    if ((mask[position / kBitsOfByte] & bit) == std::byte{0}) continue;
    message.setAt(position, reader.value(message.begin()[position].value));
  }
  entry_.form_ = static_cast<std::uint32_t>(number);
  entry_.changes_ = mask;
  setEntry(*form.base, message);
}

void MessageHistory::Reader::setEntry(const Base& base, const Dictionary& message) {
  entry_.base_ = &base;
  entry_.count_ = ++countOf(base);
  entry_.message_ = &message;
}

std::uint64_t& MessageHistory::Reader::countOf(const Base& base) {
  if (counts_.size() <= base.number_) counts_.resize(base.number_ + std::size_t{1});
  return counts_[base.number_];
}

bool equalApartFromVolatileKeys(const Dictionary& left, const Dictionary& right) {
  if (left.isIdenticalTo(right)) return true;
  // Repeated messages nearly always have the same keys in the same order. This loop compares them
  // without a look-up.
  if (left.size() == right.size()) {
    const Dictionary::Entry* other = right.begin();
    const Dictionary::Entry* entry = left.begin();
    while (entry != left.end() && entry->key == other->key) {
      // Values are compared first: a benchmark showed that testing every entry for a volatile key
      // cost most of a comparison.
      if (!(entry->value == other->value) && !isVolatile(*entry)) return false;
      ++entry;
      ++other;
    }
    if (entry == left.end()) return true;
  }
  return equalInAnyOrder(left, right);
}

}  // namespace halvox
