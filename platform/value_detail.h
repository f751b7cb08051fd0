#pragma once

// The shared nodes behind values. Included by the sources of value.h only.

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <new>

#include "platform/value.h"

namespace halvox::platform::detail {

using ReferenceCount = std::atomic<std::uint32_t>;

inline void retain(ReferenceCount& references) noexcept {
  references.fetch_add(1, std::memory_order_relaxed);
}

// True when the caller gave up the last reference and must destroy the node. Orders all use of the
// node by other threads before its destruction.
inline bool releaseLast(ReferenceCount& references) noexcept {
  return references.load(std::memory_order_acquire) == 1 ||
         references.fetch_sub(1, std::memory_order_acq_rel) == 1;
}

// Memory for a node followed by a variable tail, with no second allocation for the tail.
template <typename Node>
void* allocateNode(std::size_t tailBytes) {
  return ::operator new(sizeof(Node) + tailBytes);
}

struct KeyNode {
  ReferenceCount references;
  std::uint32_t hash;
  std::uint32_t length;
  bool interned;
  bool blank;

  [[nodiscard]] char* text() { return reinterpret_cast<char*>(this + 1); }
  [[nodiscard]] std::string_view view() { return {text(), length}; }
};

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

struct ArrayRep {
  ReferenceCount references;
  std::uint32_t count;

  [[nodiscard]] Value* values() { return reinterpret_cast<Value*>(this + 1); }
};

struct DictionaryRep {
  ReferenceCount references;
  std::uint32_t count;
  std::uint32_t capacity;
  std::uint32_t indexSize;  // a power of two, 0 while the dictionary is small
  std::uint32_t* index;     // slots hold entry number + 1, 0 when free

  [[nodiscard]] Dictionary::Entry* entries() {
    return reinterpret_cast<Dictionary::Entry*>(this + 1);
  }
};

// A hash that differs from process to process, for tables whose keys come from clients.
std::uint32_t secretHash(std::string_view text);

void releaseData(DataRep* rep) noexcept;
void releaseArray(ArrayRep* rep) noexcept;
void releaseDictionary(DictionaryRep* rep) noexcept;

}  // namespace halvox::platform::detail
