#pragma once

// The shared nodes that values refer to. Only the sources of value.h include this header.
//
// Each node begins with its reference count, and its content follows the struct in the same block
// of memory. A node then needs one allocation, and reading it costs one cache miss less than with a
// pointer to the content.

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <new>

#include "platform/value.h"

namespace halvox::platform::detail {

using ReferenceCount = std::atomic<std::uint32_t>;

// Relaxed, because the caller copies a reference that it already holds.
inline void retain(ReferenceCount& references) noexcept {
  references.fetch_add(1, std::memory_order_relaxed);
}

// Removes one reference. Returns true if it was the last one: the caller must then destroy the
// node. All use of the node by other threads happens before a return of true. For a node without
// other holders, which is the common case, the load replaces the more expensive fetch_sub.
inline bool releaseLast(ReferenceCount& references) noexcept {
  return references.load(std::memory_order_acquire) == 1 ||
         references.fetch_sub(1, std::memory_order_acq_rel) == 1;
}

// Memory for a node and its content.
template <typename Node>
void* allocateNode(std::size_t tailBytes) {
  return ::operator new(sizeof(Node) + tailBytes);
}

// A key's text. `hash` and `blank` are computed once, when the node is made.
struct KeyNode {
  ReferenceCount references;
  std::uint32_t hash;
  std::uint32_t length;
  bool interned;
  bool blank;

  [[nodiscard]] char* text() { return reinterpret_cast<char*>(this + 1); }
  [[nodiscard]] std::string_view view() { return {text(), length}; }
};

// A string that is too long to be stored inside its Value.
struct StringRep {
  ReferenceCount references;
  std::uint32_t length;

  [[nodiscard]] char* text() { return reinterpret_cast<char*>(this + 1); }
};

struct DataRep {
  ReferenceCount references;
  std::size_t length;

  [[nodiscard]] std::byte* bytes() { return reinterpret_cast<std::byte*>(this + 1); }
};

// An array's values. An empty array has no node.
struct ArrayRep {
  ReferenceCount references;
  std::uint32_t count;

  [[nodiscard]] Value* values() { return reinterpret_cast<Value*>(this + 1); }
};

// The entries of dictionaries, in the order of setting. Several dictionaries may share a node. Each
// of them has the first entries of the node, as many as its own `count_`. An entry that was added
// while the node was shared belongs only to the dictionary that added it and to copies of that. If
// the node has an index, every dictionary that shares it has all entries.
//
// The texts that the node was made with follow the room for the entries. They stay until the node
// is destroyed, even if their entries are replaced.
struct DictionaryRep {
  ReferenceCount references;
  // The number of entries that exist. Relaxed, because it only decides which dictionary may add the
  // next entry. It need not publish the entries, because a thread that reads an entry has received
  // the dictionary from the thread that added the entry.
  std::atomic<std::uint32_t> used;
  std::uint32_t capacity;
  std::uint32_t indexSize;  // a power of two; 0 while the dictionary is small
  std::uint32_t* index;     // a slot holds the number of its entry plus 1; 0 if it is free
  std::size_t textBytes;

  [[nodiscard]] Dictionary::Entry* entries() {
    return reinterpret_cast<Dictionary::Entry*>(this + 1);
  }
  [[nodiscard]] char* texts() { return reinterpret_cast<char*>(entries() + capacity); }
};

// A hash with a secret that each process chooses for itself. It is for tables whose keys come from
// clients: a client that does not know the secret cannot choose keys that collide.
std::uint32_t secretHash(std::string_view text);

}  // namespace halvox::platform::detail
