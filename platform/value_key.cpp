#include <algorithm>
#include <array>
#include <functional>
#include <mutex>

#include "platform/value_detail.h"

namespace halvox::platform {
namespace {

using detail::KeyNode;

// Interned keys stay for the life of the process, so their number is bounded; real vocabularies
// have some hundreds. Long texts are never worth it.
constexpr std::size_t kMaxInternedKeys = 4096;
constexpr std::size_t kMaxInternedLength = 128;
constexpr std::size_t kTableSlots = 4 * kMaxInternedKeys;
// Texts that hash alike would make each look-up walk; past this many the text is not interned.
constexpr std::size_t kMaxProbes = 16;

KeyNode* makeNode(std::string_view text, std::uint32_t hash, bool interned) {
  void* memory = detail::allocateNode<KeyNode>(text.size());
  const bool blank = text.find(' ') != std::string_view::npos;
  auto* node =
      new (memory) KeyNode{{1}, hash, static_cast<std::uint32_t>(text.size()), interned, blank};
  std::copy(text.begin(), text.end(), node->text());
  return node;
}

// Open addressing; slots are only ever filled, so readers need no lock.
class InternTable {
 public:
  // The shared node of that text, made when there is room; null when there is none.
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
      // Pairs with the release in insert(): a node seen here is complete.
      KeyNode* node = slot.load(std::memory_order_acquire);
      if (node == nullptr) return {nullptr, &slot};
      if (node->hash == hash && node->view() == text) return {node, nullptr};
    }
    return {nullptr, nullptr};
  }

  KeyNode* insert(std::string_view text, std::uint32_t hash) {
    const std::lock_guard lock(mutex_);
    if (count_ >= kMaxInternedKeys) return nullptr;
    const Probe found = probe(text, hash);  // another thread may have been faster
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
  // Never destroyed: keys with static storage outlive everything.
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

Key::Key(const Key& other) noexcept : node_(other.node_) {
  if (node_ != nullptr && !node_->interned) detail::retain(node_->references);
}

Key::~Key() {
  if (node_ == nullptr || node_->interned) return;
  if (detail::releaseLast(node_->references)) {
    node_->~KeyNode();
    ::operator delete(node_);
  }
}

std::string_view Key::text() const { return node_->view(); }
std::uint32_t Key::hash() const { return node_->hash; }
bool Key::hasBlank() const { return node_->blank; }
bool Key::isInterned() const { return node_->interned; }

std::size_t Key::memorySize() const {
  return node_->interned ? 0 : sizeof(KeyNode) + node_->length;
}

bool operator==(const Key& left, const Key& right) {
  if (left.node_ == right.node_) return true;
  if (left.node_->interned && right.node_->interned) return false;
  return left.node_->hash == right.node_->hash && left.text() == right.text();
}

}  // namespace halvox::platform
