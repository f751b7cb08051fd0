#include <algorithm>
#include <cassert>

#include "platform/value_detail.h"

namespace halvox::platform {

using detail::DictionaryRep;

namespace {

using Reference = detail::Reference<DictionaryRep>;

// Up to this number of entries, comparing all keys is faster than an index, because interned keys
// are compared as pointers.
constexpr std::uint32_t kMaxWithoutIndex = 16;
constexpr std::uint32_t kFirstCapacity = 4;

Reference allocateRep(std::size_t capacity, std::size_t textBytes) {
  void* memory =
      detail::allocateNode<DictionaryRep>(capacity * sizeof(Dictionary::Entry) + textBytes);
  return Reference(new (memory) DictionaryRep{
      {1}, {0}, static_cast<std::uint32_t>(capacity), 0, nullptr, textBytes});
}

void addToIndex(DictionaryRep& rep, std::uint32_t entry) {
  const std::uint32_t mask = rep.indexSize - 1;
  // Do not use the key's own hash, because a client can choose keys that collide in it.
  std::uint32_t slot = detail::secretHash(rep.entries()[entry].key.text()) & mask;
  while (rep.index[slot] != 0) slot = (slot + 1) & mask;
  rep.index[slot] = entry + 1;
}

void buildIndex(DictionaryRep& rep, std::uint32_t count) {
  delete[] rep.index;
  rep.index = nullptr;
  rep.indexSize = 0;
  if (count <= kMaxWithoutIndex) return;
  // At most half full, which keeps the sequences of occupied slots short.
  rep.indexSize = 64;
  while (rep.indexSize < 2 * count) rep.indexSize *= 2;
  rep.index = new std::uint32_t[rep.indexSize]();
  for (std::uint32_t entry = 0; entry < count; ++entry) addToIndex(rep, entry);
}

void noteAppended(DictionaryRep& rep, std::uint32_t count) {
  if (rep.indexSize >= 2 * count) {
    addToIndex(rep, count - 1);
  } else if (count > kMaxWithoutIndex) {
    buildIndex(rep, count);
  }
}

// Copies an index for a copy of its entries in the same order.
void copyIndex(DictionaryRep& rep, const DictionaryRep& other) {
  if (other.indexSize == 0) return;
  rep.index = new std::uint32_t[other.indexSize];
  rep.indexSize = other.indexSize;
  std::copy_n(other.index, other.indexSize, rep.index);
}

template <typename Matches>
Dictionary::Entry* findEntry(const Reference& rep, std::size_t count, const Matches& matches) {
  Dictionary::Entry* const entries = rep->entries();
  Dictionary::Entry* const end = entries + count;
  Dictionary::Entry* const found = std::find_if(entries, end, matches);
  return found == end ? nullptr : found;
}

template <typename Matches>
Dictionary::Entry* findIndexedEntry(const Reference& rep, std::string_view key,
                                    const Matches& matches) {
  const std::uint32_t mask = rep->indexSize - 1;
  std::uint32_t slot = detail::secretHash(key) & mask;
  for (; rep->index[slot] != 0; slot = (slot + 1) & mask) {
    Dictionary::Entry& entry = rep->entries()[rep->index[slot] - 1];
    if (matches(entry)) return &entry;
  }
  return nullptr;
}

Dictionary::Entry* findEntry(const Reference& rep, std::size_t count, std::string_view key) {
  if (rep == nullptr) return nullptr;
  const auto matches = [key](const Dictionary::Entry& entry) { return entry.key.text() == key; };
  return rep->indexSize == 0 ? findEntry(rep, count, matches) : findIndexedEntry(rep, key, matches);
}

Dictionary::Entry* findEntry(const Reference& rep, std::size_t count, const Key& key) {
  if (rep == nullptr) return nullptr;
  const auto matches = [&key](const Dictionary::Entry& entry) { return entry.key == key; };
  if (rep->indexSize != 0) return findIndexedEntry(rep, key.text(), matches);
  if (!key.isInterned()) return findEntry(rep, count, matches);
  // Compare nodes without reading texts, because each message is searched for several keys, and has
  // almost none of them.
  return findEntry(rep, count,
                   [&key](const Dictionary::Entry& entry) { return entry.key.sharesNode(key); });
}

}  // namespace

void detail::retain(DictionaryRep& node) noexcept { retain(node.references); }

void detail::release(DictionaryRep& node) noexcept {
  if (!releaseLast(node.references)) return;
  std::destroy_n(node.entries(), node.used.load(std::memory_order_relaxed));
  delete[] node.index;
  node.~DictionaryRep();
  ::operator delete(&node);
}

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  reserve(entries.size());
  for (const Entry& entry : entries) set(entry.key, entry.value);
}

Dictionary::Dictionary(std::span<Entry> entries, std::size_t more) {
  if (entries.empty()) return;
  const std::size_t count = entries.size();
  rep_ = allocateRep(count + more, lentBytes(entries.data(), count));
  count_ = static_cast<std::uint32_t>(count);
  transfer(entries.data(), count, Leaving::kYes, *rep_);
  buildIndex(*rep_, count_);
}

// How many bytes the lent texts of the entries have.
std::size_t Dictionary::lentBytes(const Entry* entries, std::size_t count) {
  std::size_t bytes = 0;
  for (std::size_t position = 0; position < count; ++position) {
    const Value& value = entries[position].value;
    if (value.isLent()) bytes += value.string().size();
  }
  return bytes;
}

// Makes entries in a node that has none yet, and has room for them and for their lent texts.
void Dictionary::transfer(Entry* from, std::size_t count, Leaving leaving, DictionaryRep& to) {
  char* texts = to.texts();
  for (std::size_t position = 0; position < count; ++position) {
    Entry& entry = from[position];
    Entry* const place = to.entries() + position;
    if (entry.value.isLent()) {
      const std::string_view text = entry.value.string();
      std::copy(text.begin(), text.end(), texts);
      new (place) Entry{entry.key, Value()};
      place->value.lend(texts, text.size());
      texts += text.size();
    } else if (leaving == Leaving::kYes) {
      new (place) Entry(std::move(entry));
    } else {
      new (place) Entry(entry);
    }
  }
  to.used.store(static_cast<std::uint32_t>(count), std::memory_order_relaxed);
}

const Dictionary::Entry* Dictionary::begin() const {
  return rep_ == nullptr ? nullptr : rep_->entries();
}

const Value* Dictionary::find(const Key& key) const {
  const Entry* entry = findEntry(rep_, count_, key);
  return entry == nullptr ? nullptr : &entry->value;
}

const Value* Dictionary::find(std::string_view key) const {
  const Entry* entry = findEntry(rep_, count_, key);
  return entry == nullptr ? nullptr : &entry->value;
}

bool Dictionary::isAlone() const { return rep_->references.load(std::memory_order_acquire) == 1; }

// Ensures that no other dictionary shares the content, and that memory for `entries` entries in
// total is allocated.
void Dictionary::makeRoomFor(std::size_t entries) {
  if (rep_ == nullptr) {
    rep_ = allocateRep(std::max<std::size_t>(entries, kFirstCapacity), 0);
    count_ = 0;
    return;
  }
  const bool alone = isAlone();
  if (alone) {
    // Destroy the entries that other dictionaries had added. These dictionaries no longer exist.
    const std::uint32_t used = rep_->used.exchange(count_, std::memory_order_relaxed);
    std::destroy_n(rep_->entries() + count_, used - count_);
    if (entries <= rep_->capacity) return;
  }
  // The copy of a shared dictionary gets exactly the capacity that it needs, because it is usually
  // changed once and then kept. A dictionary that grows entry by entry grows by half of its size.
  const std::size_t capacity =
      alone ? std::max<std::size_t>(entries, rep_->capacity + rep_->capacity / 2) : entries;
  Entry* const old = rep_->entries();
  Reference grown = allocateRep(capacity, rep_->textBytes == 0 ? 0 : lentBytes(old, count_));
  transfer(old, count_, alone ? Leaving::kYes : Leaving::kNo, *grown);
  if (alone) {
    std::swap(grown->index, rep_->index);
    std::swap(grown->indexSize, rep_->indexSize);
  } else {
    copyIndex(*grown, *rep_);
  }
  rep_ = std::move(grown);
}

void Dictionary::reserve(std::size_t entries) {
  if (entries > 0) makeRoomFor(std::max(entries, size()));
}

void Dictionary::set(const Key& key, Value value) {
  if (value.isLent()) value.onCopied();
  const Entry* existing = findEntry(rep_, count_, key);
  if (existing == nullptr) return add(key, std::move(value));
  const auto position = existing - rep_->entries();
  makeRoomFor(count_);
  rep_->entries()[position].value = std::move(value);
}

void Dictionary::add(const Key& key, Value value) {
  if (value.isLent()) value.onCopied();
  if (tryAddShared(key, value)) return;
  makeRoomFor(size() + 1);
  new (rep_->entries() + count_) Entry{key, std::move(value)};
  rep_->used.store(++count_, std::memory_order_relaxed);
  noteAppended(*rep_, count_);
}

// Adds an entry after all entries of the node, without copying the node even if others share it.
// The other holders do not see the entry. Returns false and changes nothing if it cannot add the
// entry in this way.
bool Dictionary::tryAddShared(const Key& key, Value& value) {
  if (rep_ == nullptr || count_ >= rep_->capacity || count_ >= kMaxWithoutIndex) return false;
  std::uint32_t expected = count_;
  if (isAlone()) {
    if (rep_->used.load(std::memory_order_relaxed) != expected) return false;
    rep_->used.store(expected + 1, std::memory_order_relaxed);
  } else {
    // The value may contain this dictionary. The node would then refer to itself and never be
    // freed.
    if (value.isArray() || value.isDictionary()) return false;
    // Claim the position first, because another holder may try to add its own entry there at the
    // same time.
    if (!rep_->used.compare_exchange_strong(expected, count_ + 1, std::memory_order_relaxed)) {
      return false;
    }
  }
  new (rep_->entries() + count_) Entry{key, std::move(value)};
  ++count_;
  return true;
}

void Dictionary::setAt(std::size_t position, Value value) {
  if (value.isLent()) value.onCopied();
  makeRoomFor(count_);
  rep_->entries()[position].value = std::move(value);
}

bool Dictionary::remove(const Key& key) {
  const Entry* existing = findEntry(rep_, count_, key);
  if (existing == nullptr) return false;
  const auto position = existing - rep_->entries();
  makeRoomFor(count_);
  Entry* entries = rep_->entries();
  std::move(entries + position + 1, entries + count_, entries + position);
  std::destroy_at(entries + count_ - 1);
  rep_->used.store(--count_, std::memory_order_relaxed);
  buildIndex(*rep_, count_);
  return true;
}

void Dictionary::merge(const Dictionary& other) {
  // Do not share the block of `other` if it has texts. Merged dictionaries are configurations,
  // whose values are copied for each message, and each copy of a text in the block would allocate
  // memory.
  if (rep_ == nullptr && (other.rep_ == nullptr || other.rep_->textBytes == 0)) {
    *this = other;
    return;
  }
  // This copy keeps the entries alive in case `other` is this dictionary.
  // NOLINTNEXTLINE(performance-unnecessary-copy-initialization): the copy is the point
  const Dictionary source = other;
  for (const Entry& entry : source) set(entry.key, entry.value);
}

std::size_t Dictionary::memorySize() const {
  if (rep_ == nullptr) return 0;
  std::size_t bytes = sizeof(DictionaryRep) + rep_->capacity * sizeof(Entry) +
                      rep_->indexSize * sizeof(std::uint32_t) + rep_->textBytes;
  for (const Entry& entry : *this) {
    bytes += entry.key.memorySize();
    if (!entry.value.isLent()) bytes += entry.value.memorySize();
  }
  return bytes;
}

bool operator==(const Dictionary& left, const Dictionary& right) {
  if (left.size() != right.size()) return false;
  if (left.rep_ == right.rep_) return true;
  // Try the same position first, because repeated messages have their keys in the same order.
  const Dictionary::Entry* other = right.begin();
  for (const Dictionary::Entry& entry : left) {
    const Value* counterpart = other->key == entry.key ? &other->value : right.find(entry.key);
    if (counterpart == nullptr || !(*counterpart == entry.value)) return false;
    ++other;
  }
  return true;
}

}  // namespace halvox::platform
