#include <algorithm>
#include <array>
#include <functional>
#include <mutex>

#include "platform/value_detail.h"

namespace halvox::platform {
namespace {

using detail::KeyNode;

// The number of interned keys must be bounded, because they are never freed and clients choose
// them. Real vocabularies have a few hundred keys. Long texts are not interned, because their
// memory would never be freed.
constexpr std::size_t kMaxInternedKeys = 4096;
constexpr std::size_t kMaxInternedLength = 128;
constexpr std::size_t kTableSlots = 4 * kMaxInternedKeys;  // at most a quarter full
// A client can choose texts that collide, because std::hash has no secret. After this many probes a
// text is not interned, which bounds the cost of a look-up.
constexpr std::size_t kMaxProbes = 16;

KeyNode* makeNode(std::string_view text, std::uint32_t hash, bool interned) {
  void* memory = detail::allocateNode<KeyNode>(text.size());
  const bool blank = text.find(' ') != std::string_view::npos;
  auto* node =
      new (memory) KeyNode{{1}, hash, static_cast<std::uint32_t>(text.size()), interned, blank};
  std::copy(text.begin(), text.end(), node->text());
  return node;
}

// The table of interned keys. Any thread may call. Readers need no lock, because a slot that was
// filled never changes again.
class InternTable {
 public:
  // Returns the shared node of that text. Makes one if there is none yet. Returns null if the text
  // cannot be interned because the table is full or too many of its slots are occupied.
  KeyNode* intern(std::string_view text, std::uint32_t hash) {
    const Probe found = probe(text, hash);
    if (found.node != nullptr || found.freeSlot == nullptr) return found.node;
    return insert(text, hash);
  }

 private:
  struct Probe {
    KeyNode* node;
    std::atomic<KeyNode*>* freeSlot;
  };

  Probe probe(std::string_view text, std::uint32_t hash) {
    for (std::size_t step = 0; step < kMaxProbes; ++step) {
      auto& slot = slots_[(hash + step) % kTableSlots];
      // Pairs with the release in insert(), so that a node that is seen here is complete.
      KeyNode* node = slot.load(std::memory_order_acquire);
      if (node == nullptr) return {nullptr, &slot};
      if (node->hash == hash && node->view() == text) return {node, nullptr};
    }
    return {nullptr, nullptr};
  }

  KeyNode* insert(std::string_view text, std::uint32_t hash) {
    const std::lock_guard lock(mutex_);
    if (count_ >= kMaxInternedKeys) return nullptr;
    const Probe found = probe(text, hash);  // another thread may have inserted it meanwhile
    if (found.node != nullptr || found.freeSlot == nullptr) return found.node;
    KeyNode* node = makeNode(text, hash, true);
    found.freeSlot->store(node, std::memory_order_release);
    ++count_;
    return node;
  }

  std::mutex mutex_;
  std::size_t count_ = 0;
  std::array<std::atomic<KeyNode*>, kTableSlots> slots_{};
};

InternTable& internTable() {
  // Never destroyed, because keys with static storage live longer than any static of this file.
  static auto* table = new InternTable;
  return *table;
}

KeyNode* nodeFor(std::string_view text) {
  const auto hash = static_cast<std::uint32_t>(std::hash<std::string_view>{}(text));
  if (text.size() <= kMaxInternedLength) {
    if (KeyNode* shared = internTable().intern(text, hash)) return shared;
  }
  return makeNode(text, hash, false);
}

}  // namespace

Key::Key(std::string_view text) : node_(nodeFor(text)) {}

void detail::retain(KeyNode& node) noexcept {
  if (!node.interned) retain(node.references);
}

void detail::release(KeyNode& node) noexcept {
  if (node.interned || !releaseLast(node.references)) return;
  node.~KeyNode();
  ::operator delete(&node);
}

std::string_view Key::text() const { return node_->view(); }
std::uint32_t Key::hash() const { return node_->hash; }
bool Key::hasBlank() const { return node_->blank; }
bool Key::isInterned() const { return node_->interned; }

std::size_t Key::memorySize() const {
  return node_->interned ? 0 : sizeof(KeyNode) + node_->length;
}

// Call only for different nodes. If one of the nodes is interned, their texts differ, because all
// keys with its text share it. A text that the table has once refused is never interned later,
// because a full table stays full and occupied slots stay occupied.
bool Key::equalNodes(KeyNode& left, KeyNode& right) {
  if (left.interned || right.interned) return false;
  return left.hash == right.hash && left.view() == right.view();
}

}  // namespace halvox::platform
