#include <algorithm>
#include <cassert>

#include "platform/value_detail.h"

namespace halvox::platform {

using detail::DictionaryRep;

namespace {

using Reference = detail::Reference<DictionaryRep>;

// Up to this number of entries, comparing all keys is faster than an index: interned keys compare
// as pointers.
constexpr std::uint32_t kMaxWithoutIndex = 16;
constexpr std::uint32_t kFirstCapacity = 4;

Reference allocateRep(std::size_t capacity) {
  void* memory = detail::allocateNode<DictionaryRep>(capacity * sizeof(Dictionary::Entry));
  return Reference(new (memory)
                       DictionaryRep{{1}, 0, static_cast<std::uint32_t>(capacity), 0, nullptr});
}

void addToIndex(DictionaryRep& rep, std::uint32_t entry) {
  const std::uint32_t mask = rep.indexSize - 1;
  // Do not use the key's own hash: a client can choose keys that collide in it.
  std::uint32_t slot = detail::secretHash(rep.entries()[entry].key.text()) & mask;
  while (rep.index[slot] != 0) slot = (slot + 1) & mask;
  rep.index[slot] = entry + 1;
}

void buildIndex(DictionaryRep& rep) {
  delete[] rep.index;
  rep.index = nullptr;
  rep.indexSize = 0;
  if (rep.count <= kMaxWithoutIndex) return;
  // At most half full, which keeps the sequences of occupied slots short.
  rep.indexSize = 64;
  while (rep.indexSize < 2 * rep.count) rep.indexSize *= 2;
  rep.index = new std::uint32_t[rep.indexSize]();
  for (std::uint32_t entry = 0; entry < rep.count; ++entry) addToIndex(rep, entry);
}

void noteAppended(DictionaryRep& rep) {
  if (rep.indexSize >= 2 * rep.count) {
    addToIndex(rep, rep.count - 1);
  } else if (rep.count > kMaxWithoutIndex) {
    buildIndex(rep);
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
Dictionary::Entry* findEntry(const Reference& rep, std::string_view key, const Matches& matches) {
  if (rep == nullptr) return nullptr;
  Dictionary::Entry* entries = rep->entries();
  if (rep->indexSize == 0) {
    Dictionary::Entry* const end = entries + rep->count;
    Dictionary::Entry* const found = std::find_if(entries, end, matches);
    return found == end ? nullptr : found;
  }
  const std::uint32_t mask = rep->indexSize - 1;
  std::uint32_t slot = detail::secretHash(key) & mask;
  for (; rep->index[slot] != 0; slot = (slot + 1) & mask) {
    Dictionary::Entry& entry = entries[rep->index[slot] - 1];
    if (matches(entry)) return &entry;
  }
  return nullptr;
}

Dictionary::Entry* findEntry(const Reference& rep, const Key& key) {
  return findEntry(rep, key.text(),
                   [&key](const Dictionary::Entry& entry) { return entry.key == key; });
}

}  // namespace

void detail::retain(DictionaryRep& node) noexcept { retain(node.references); }

void detail::release(DictionaryRep& node) noexcept {
  if (!releaseLast(node.references)) return;
  std::destroy_n(node.entries(), node.count);
  delete[] node.index;
  node.~DictionaryRep();
  ::operator delete(&node);
}

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  reserve(entries.size());
  for (const Entry& entry : entries) set(entry.key, entry.value);
}

std::size_t Dictionary::size() const { return rep_ == nullptr ? 0 : rep_->count; }

const Dictionary::Entry* Dictionary::begin() const {
  return rep_ == nullptr ? nullptr : rep_->entries();
}

const Value* Dictionary::find(const Key& key) const {
  const Entry* entry = findEntry(rep_, key);
  return entry == nullptr ? nullptr : &entry->value;
}

const Value* Dictionary::find(std::string_view key) const {
  const Entry* entry =
      findEntry(rep_, key, [key](const Entry& candidate) { return candidate.key.text() == key; });
  return entry == nullptr ? nullptr : &entry->value;
}

// Ensures that no other dictionary shares the content, and that there is room for `entries` entries
// in total.
void Dictionary::makeRoomFor(std::size_t entries) {
  if (rep_ == nullptr) {
    rep_ = allocateRep(std::max<std::size_t>(entries, kFirstCapacity));
    return;
  }
  const bool alone = rep_->references.load(std::memory_order_acquire) == 1;
  if (alone && entries <= rep_->capacity) return;
  // The copy of a shared dictionary gets exactly the room that it needs, because it is usually
  // changed once and then kept. A dictionary that grows entry by entry grows by half of its size.
  const std::size_t capacity =
      alone ? std::max<std::size_t>(entries, rep_->capacity + rep_->capacity / 2) : entries;
  Reference grown = allocateRep(capacity);
  if (alone) {
    std::uninitialized_move_n(rep_->entries(), rep_->count, grown->entries());
    std::swap(grown->index, rep_->index);
    std::swap(grown->indexSize, rep_->indexSize);
    grown->count = rep_->count;
  } else {
    std::uninitialized_copy_n(rep_->entries(), rep_->count, grown->entries());
    grown->count = rep_->count;
    copyIndex(*grown, *rep_);
  }
  rep_ = std::move(grown);
}

void Dictionary::reserve(std::size_t entries) {
  if (entries > 0) makeRoomFor(std::max(entries, size()));
}

void Dictionary::set(const Key& key, Value value) {
  if (const Entry* existing = findEntry(rep_, key)) {
    const auto position = existing - rep_->entries();
    makeRoomFor(rep_->count);
    rep_->entries()[position].value = std::move(value);
    return;
  }
  makeRoomFor(size() + 1);
  new (rep_->entries() + rep_->count) Entry{key, std::move(value)};
  ++rep_->count;
  noteAppended(*rep_);
}

void Dictionary::setAt(std::size_t position, Value value) {
  makeRoomFor(rep_->count);
  rep_->entries()[position].value = std::move(value);
}

bool Dictionary::remove(const Key& key) {
  const Entry* existing = findEntry(rep_, key);
  if (existing == nullptr) return false;
  const auto position = existing - rep_->entries();
  makeRoomFor(rep_->count);
  Entry* entries = rep_->entries();
  std::move(entries + position + 1, entries + rep_->count, entries + position);
  std::destroy_at(entries + rep_->count - 1);
  --rep_->count;
  buildIndex(*rep_);
  return true;
}

void Dictionary::merge(const Dictionary& other) {
  if (rep_ == nullptr) {
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
                      rep_->indexSize * sizeof(std::uint32_t);
  for (const Entry& entry : *this) bytes += entry.key.memorySize() + entry.value.memorySize();
  return bytes;
}

bool operator==(const Dictionary& left, const Dictionary& right) {
  if (left.rep_ == right.rep_) return true;
  if (left.size() != right.size()) return false;
  // Try the same position first: repeated messages have their keys in the same order.
  const Dictionary::Entry* other = right.begin();
  for (const Dictionary::Entry& entry : left) {
    const Value* counterpart = other->key == entry.key ? &other->value : right.find(entry.key);
    if (counterpart == nullptr || !(*counterpart == entry.value)) return false;
    ++other;
  }
  return true;
}

}  // namespace halvox::platform
