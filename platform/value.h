#pragma once

#include <algorithm>
#include <atomic>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

namespace halvox::platform {

class Array;
class Dictionary;

// A point in time: seconds since 1970-01-01 00:00 UTC. Any double is possible, including NaN and
// the infinities, because dates come from clients.
struct Date {
  double secondsSince1970 = 0;
  friend bool operator==(const Date&, const Date&) = default;
};

// A program constant whose identity is kept: a value made from a text that equals a constant is
// that very constant, even if the text came from another process. The service tests some values by
// identity; a client selects one by sending its text.
//
// Make constants only with static storage and before the first thread starts, because the table of
// constants has no lock. Each constant has at most 64 bytes, and no two have the same text.
class StringConstant {
 public:
  explicit StringConstant(std::string_view text);
  StringConstant(const StringConstant&) = delete;
  StringConstant& operator=(const StringConstant&) = delete;

  [[nodiscard]] std::string_view text() const { return text_; }

 private:
  friend class Value;
  std::string_view text_;
  StringConstant* next_ = nullptr;
};

namespace detail {

struct KeyNode;
struct DataRep;
struct ArrayRep;
struct DictionaryRep;

void retain(KeyNode& node) noexcept;
void retain(DataRep& node) noexcept;
void retain(ArrayRep& node) noexcept;
void retain(DictionaryRep& node) noexcept;
// Each removes one reference and destroys the node if it was the last.
void release(KeyNode& node) noexcept;
void release(DataRep& node) noexcept;
void release(ArrayRep& node) noexcept;
void release(DictionaryRep& node) noexcept;

// One counted reference to a node that copies share; null if there is no content. Different threads
// may use different references to one node; one reference belongs to one thread at a time.
template <typename Node>
class Reference {
 public:
  Reference() noexcept = default;
  // Takes over a reference that is already counted.
  explicit Reference(Node* node) noexcept : node_(node) {}
  Reference(const Reference& other) noexcept : node_(other.node_) {
    if (node_ != nullptr) retain(*node_);
  }
  Reference(Reference&& other) noexcept : node_(other.take()) {}
  Reference& operator=(Reference other) noexcept {
    std::swap(node_, other.node_);
    return *this;
  }
  ~Reference() {
    if (node_ != nullptr) release(*node_);
  }

  Node& operator*() const { return *node_; }
  Node* operator->() const { return node_; }
  friend bool operator==(const Reference&, const Reference&) = default;
  friend bool operator==(const Reference& reference, std::nullptr_t) {
    return reference.node_ == nullptr;
  }

  // Returns the node without changing its count, and sets this reference to null.
  [[nodiscard]] Node* take() { return std::exchange(node_, nullptr); }

 private:
  Node* node_ = nullptr;
};

}  // namespace detail

// The key of a dictionary entry: an immutable text. Keys are interned: equal keys share one node of
// a table, and comparing them means comparing pointers.
//
// The table is bounded, because clients choose the keys. A key that the table cannot take is not
// interned: it works in the same way, but has a node of its own and is compared by its text. Any
// thread may make and copy keys; one key object belongs to one thread at a time.
class Key {
 public:
  Key(std::string_view text);
  Key(const char* text) : Key(std::string_view(text)) {}
  Key(const std::string& text) : Key(std::string_view(text)) {}

  // Valid while a copy of this key exists.
  [[nodiscard]] std::string_view text() const;
  // Clients can make keys with equal hashes, because this hash has no secret. Tables of keys from
  // clients use secretHash().
  [[nodiscard]] std::uint32_t hash() const;
  // True if the text has a space (U+0020). Stored in the node, because it is read for every key of
  // every message.
  [[nodiscard]] bool hasBlank() const;
  // True if all equal keys share this key's node for the life of the process.
  [[nodiscard]] bool isInterned() const;
  // Bytes that this key alone keeps in memory; 0 for an interned key.
  [[nodiscard]] std::size_t memorySize() const;

  // True if both share one node. If one of the keys is interned, this means that they are equal.
  [[nodiscard]] bool sharesNode(const Key& other) const { return node_ == other.node_; }
  friend bool operator==(const Key& left, const Key& right) {
    return left.node_ == right.node_ || equalNodes(*left.node_, *right.node_);
  }

 private:
  static bool equalNodes(detail::KeyNode& left, detail::KeyNode& right);
  detail::Reference<detail::KeyNode> node_;
};

// An immutable sequence of bytes, shared by all copies. Copies may be used by different threads.
class Data {
 public:
  explicit Data(std::span<const std::byte> bytes);

  // Valid while a copy of this object exists.
  [[nodiscard]] std::span<const std::byte> bytes() const;

  friend bool operator==(const Data& left, const Data& right);

 private:
  friend class Value;
  explicit Data(detail::DataRep* rep) : rep_(rep) {}
  detail::Reference<detail::DataRep> rep_;
};

// The type that a number was made from. Comparison ignores it; encoders use it to write the number
// in its original form.
enum class NumberKind : std::uint8_t {
  kBool,
  kUInt8,
  kInt16,
  kUInt16,
  kInt32,
  kUInt32,
  kInt64,
  kUInt64,
  kFloat,
  kDouble,
};

// The types that a number can be made from.
template <typename Number>
concept ArithmeticNumber = std::integral<Number> || std::floating_point<Number>;

enum class ValueKind : std::uint8_t { kNone, kNumber, kString, kDate, kData, kArray, kDictionary };

// One property-list value: a number, a string, a date, data, an array or a dictionary.
//
// Values are immutable and shared: a copy costs at most one increment of a reference count, and
// numbers and short strings live in the value itself. Up to six consumers and a history hold the
// same message, which is why sharing must be cheap. It needs no lock. Different threads may use
// different copies at once; one value object belongs to one thread at a time.
//
// Two values are equal if their contents are equal. Numbers compare by value, whatever type they
// were made from: 1, 1.0 and true are equal. A NaN equals every NaN, so that a repeated message
// with a NaN is recognised as a repetition. Dates compare by their number, strings and data byte
// for byte, arrays element by element, and dictionaries entry by entry in any order.
//
// Strings are UTF-8. Code that makes a value from outside bytes checks that first.
class Value {
 public:
  Value() noexcept = default;  // no value; equal only to another value without content
  template <ArithmeticNumber Number>
  Value(Number number) noexcept;
  Value(std::string_view text);
  Value(const char* text) : Value(std::string_view(text)) {}
  Value(const std::string& text) : Value(std::string_view(text)) {}
  Value(const StringConstant& constant) noexcept;
  // Makes a string that only refers to the text, which is lent to it and must outlive it. A short
  // text and a constant are stored as in any other value. A copy of the value owns its text. A
  // dictionary that is made from such values copies the texts into its own block of memory, which
  // saves an allocation for each.
  [[nodiscard]] static Value lending(std::string_view text);
  Value(Date date) noexcept;
  Value(Data data) noexcept;
  Value(Array array) noexcept;
  Value(Dictionary dictionary) noexcept;
  // Copying, moving and destroying are inline because every message does dozens of each.
  Value(const Value& other) noexcept {
    std::memcpy(storage_, other.storage_, sizeof storage_);
    if (tag() >= Tag::kLentString) onCopied();
  }
  Value(Value&& other) noexcept {
    std::memcpy(storage_, other.storage_, sizeof storage_);
    other.setTag(Tag::kNone);
  }
  // Copies the new content before it releases the old one, because `other` may be this value or a
  // part of it. NOLINTNEXTLINE(bugprone-unhandled-self-assignment): the copy handles it
  Value& operator=(const Value& other) noexcept {
    Value taken(other);
    std::swap(storage_, taken.storage_);
    return *this;
  }
  Value& operator=(Value&& other) noexcept {
    Value taken(std::move(other));
    std::swap(storage_, taken.storage_);
    return *this;
  }
  ~Value() {
    if (isCounted()) release();
  }

  // Relies on the order of the tags. Inline because encoders call it for each value.
  [[nodiscard]] ValueKind kind() const {
    const Tag current = tag();
    if (current == Tag::kNone) return ValueKind::kNone;
    if (current <= Tag::kLastNumber) return ValueKind::kNumber;
    if (current == Tag::kDate) return ValueKind::kDate;
    if (current <= Tag::kSharedString) return ValueKind::kString;
    if (current == Tag::kData) return ValueKind::kData;
    return current == Tag::kArray ? ValueKind::kArray : ValueKind::kDictionary;
  }
  [[nodiscard]] bool isNumber() const { return kind() == ValueKind::kNumber; }
  [[nodiscard]] bool isString() const { return kind() == ValueKind::kString; }
  [[nodiscard]] bool isArray() const { return kind() == ValueKind::kArray; }
  [[nodiscard]] bool isDictionary() const { return kind() == ValueKind::kDictionary; }

  // Only for numbers.
  [[nodiscard]] NumberKind numberKind() const {
    return static_cast<NumberKind>(storage_[0] - static_cast<unsigned char>(Tag::kFirstNumber));
  }
  // The number converted to the type: a fraction is cut off, a number outside the type's range
  // becomes the nearest end of the range, and a NaN becomes 0 as an integer. As a bool every number
  // but 0 is true. Anything that is not a number gives 0.
  [[nodiscard]] std::int64_t toInt64() const;
  [[nodiscard]] std::uint64_t toUInt64() const;
  [[nodiscard]] double toDouble() const;
  [[nodiscard]] bool toBool() const;

  // The text of a string; empty for anything else. It is part of this value: valid until the value
  // is changed, moved from or destroyed.
  [[nodiscard]] std::string_view string() const;
  // True if the values have the same type and the same bytes: the same number, short text or shared
  // content. Costs a comparison of 16 bytes. Long texts and containers that are equal but not
  // shared are not identical.
  [[nodiscard]] bool isIdenticalTo(const Value& other) const noexcept {
    return std::memcmp(storage_, other.storage_, sizeof storage_) == 0;
  }
  // True if this string is that very constant (see StringConstant).
  [[nodiscard]] bool isIdenticalTo(const StringConstant& constant) const;

  // The content; empty if the value is of another kind.
  [[nodiscard]] Date date() const;
  [[nodiscard]] Data data() const;
  [[nodiscard]] Array array() const;
  [[nodiscard]] Dictionary dictionary() const;

  // Bytes on the heap that this value keeps in memory. Shared bytes count for every holder, which
  // makes the sum an upper bound. The value's own 16 bytes do not count.
  [[nodiscard]] std::size_t memorySize() const {
    return tag() >= Tag::kLentString ? heapSize() : 0;
  }

  friend bool operator==(const Value& left, const Value& right);

 private:
  friend class Dictionary;
  enum class Tag : std::uint8_t {
    kNone,
    // One tag for each NumberKind, in its order.
    kFirstNumber,
    kLastNumber = kFirstNumber + static_cast<std::uint8_t>(NumberKind::kDouble),
    kDate,
    kInlineString,
    kConstantString,
    // A text that the value does not own: its address is the payload, its length is in bytes 4 to
    // 7. The text is in the block of the dictionary that the value is in, or in a message that is
    // being decoded.
    kLentString,
    // From here on the payload is a counted reference; isCounted() relies on the order.
    kSharedString,
    kData,
    kArray,
    kDictionary,
  };
  static constexpr std::size_t kInlineCapacity = 14;

  [[nodiscard]] Tag tag() const { return static_cast<Tag>(storage_[0]); }
  [[nodiscard]] bool isCounted() const { return tag() >= Tag::kSharedString; }
  void setTag(Tag tag) { storage_[0] = static_cast<unsigned char>(tag); }
  template <typename T>
  void setPayload(T payload) {
    static_assert(sizeof(T) == 8);
    std::memcpy(&storage_[8], &payload, sizeof payload);
  }
  template <typename T>
  [[nodiscard]] T payload() const {
    static_assert(sizeof(T) == 8);
    T result;
    std::memcpy(&result, &storage_[8], sizeof result);
    return result;
  }
  [[nodiscard]] bool isLent() const { return tag() == Tag::kLentString; }
  void lend(const char* text, std::size_t length);
  // Call after the bytes of another value were copied into this one. Counts the reference, or gives
  // this value a text of its own instead of a lent one.
  void onCopied() noexcept;
  void retain() const noexcept;
  void release() noexcept;
  // The constant with that text, or null.
  static const StringConstant* constantWith(std::string_view text);
  [[nodiscard]] std::size_t heapSize() const;
  void setNumber(NumberKind kind, std::int64_t number) noexcept;
  void setNumber(NumberKind kind, std::uint64_t number) noexcept;
  void setNumber(NumberKind kind, double number) noexcept;
  static bool equalNumbers(const Value& left, const Value& right);

  // Byte 0 is the tag. A number, date or reference is in bytes 8 to 15. A dictionary's number of
  // entries and the length of a lent text are in bytes 4 to 7. An inline string has its length in
  // byte 1 and its text from byte 2 on. A value has only 16 bytes, because each entry of a
  // dictionary has one and messages have dozens of entries.
  alignas(8) unsigned char storage_[16] = {};
};

// An immutable list of values, shared by all copies. Copies may be used by different threads.
class Array {
 public:
  Array() noexcept = default;
  Array(std::initializer_list<Value> values) : Array(std::span(values.begin(), values.size())) {}
  explicit Array(std::span<const Value> values);

  [[nodiscard]] std::size_t size() const;
  [[nodiscard]] bool empty() const { return size() == 0; }
  [[nodiscard]] const Value* begin() const;
  [[nodiscard]] const Value* end() const { return begin() + size(); }
  [[nodiscard]] const Value& operator[](std::size_t index) const { return begin()[index]; }
  [[nodiscard]] std::size_t memorySize() const;

  friend bool operator==(const Array& left, const Array& right);

 private:
  friend class Value;
  explicit Array(detail::ArrayRep* rep) : rep_(rep) {}
  detail::Reference<detail::ArrayRep> rep_;
};

// A dictionary from texts to values.
//
// Copies share their content until one of them is changed. A change copies the content first.
// Therefore no holder sees the change of another. Different threads may use different copies at
// once; one object belongs to one thread at a time.
//
// One change needs no copy: adding an entry after all others, if reserve() has allocated memory for
// it. Each holder knows how many of the shared entries are its own. The service can therefore add
// time stamps and a tag to a message within one block of memory, although some consumers hold the
// message without the tag.
//
// Entries are enumerated in the order in which their keys were first set. A small dictionary is
// searched key by key, a large one by an index with a secret hash. The time that the keys of a
// client cost is therefore proportional to their total length, even if the client sends many keys
// or chooses keys that collide.
class Dictionary {
 public:
  struct Entry {
    Key key;
    Value value;
  };

  Dictionary() noexcept = default;
  Dictionary(std::initializer_list<Entry> entries);
  // Moves the entries, whose keys must differ, into a new dictionary with room for `more` others.
  // Copies lent texts into the block of memory that holds the entries. Allocates only this block.
  Dictionary(std::span<Entry> entries, std::size_t more);

  [[nodiscard]] std::size_t size() const { return rep_ == nullptr ? 0 : count_; }
  [[nodiscard]] bool empty() const { return size() == 0; }
  [[nodiscard]] const Entry* begin() const;
  [[nodiscard]] const Entry* end() const { return begin() + size(); }

  // The value under a key, or null. It is part of this dictionary: valid until the dictionary is
  // changed or destroyed.
  [[nodiscard]] const Value* find(const Key& key) const;
  [[nodiscard]] const Value* find(std::string_view key) const;
  [[nodiscard]] const Value* find(const char* key) const { return find(std::string_view(key)); }
  [[nodiscard]] const Value* find(const std::string& key) const {
    return find(std::string_view(key));
  }
  [[nodiscard]] bool contains(std::string_view key) const { return find(key) != nullptr; }

  // Allocates memory for that many entries in total. Setting them then allocates no further memory
  // for entries.
  void reserve(std::size_t entries);
  // Sets the value under a key. An existing key keeps its position; a new one goes to the end.
  void set(const Key& key, Value value);
  // Like set(), but does not search for the key. The caller must know that the key is absent.
  void add(const Key& key, Value value);
  // Sets the value of the entry at a position, which must be less than size().
  void setAt(std::size_t position, Value value);
  // Removes the entry under a key; returns false if there was none.
  bool remove(const Key& key);
  // Sets every entry of `other`, in its order.
  void merge(const Dictionary& other);

  [[nodiscard]] bool isIdenticalTo(const Dictionary& other) const {
    return rep_ == other.rep_ && size() == other.size();
  }
  // Returns how many entries at the beginning the two dictionaries share. Entries that are only
  // equal do not count. Takes constant time.
  [[nodiscard]] std::size_t sharedEntries(const Dictionary& other) const {
    return rep_ == other.rep_ ? std::min(size(), other.size()) : 0;
  }
  // Bytes on the heap that this dictionary keeps in memory, including shared ones.
  [[nodiscard]] std::size_t memorySize() const;

  friend bool operator==(const Dictionary& left, const Dictionary& right);

 private:
  friend class Value;
  Dictionary(detail::DictionaryRep* rep, std::uint32_t count) : rep_(rep), count_(count) {}
  // kYes moves entries out of their block of memory, kNo copies them.
  enum class Leaving : bool { kNo, kYes };
  static void transfer(Entry* from, std::size_t count, Leaving leaving, detail::DictionaryRep& to);
  static std::size_t lentBytes(const Entry* entries, std::size_t count);
  void makeRoomFor(std::size_t entries);
  [[nodiscard]] bool isAlone() const;
  [[nodiscard]] bool tryAddShared(const Key& key, Value& value);
  detail::Reference<detail::DictionaryRep> rep_;
  std::uint32_t count_ = 0;  // meaningless without a node
};

// A message as the components pass it on. It may be absent, because a client can send none.
using Message = std::optional<Dictionary>;

// The text of a value as log lines show it: strings as they are, numbers in their shortest decimal
// form, containers in braces or parentheses, data as hexadecimal digits, dates in UTC, and "(null)"
// for no value.
std::string describe(const Value& value);
std::string describe(const Dictionary& dictionary);
std::string describe(const Message& message);

template <ArithmeticNumber Number>
Value::Value(Number number) noexcept {
  if constexpr (std::same_as<Number, bool>) {
    setNumber(NumberKind::kBool, static_cast<std::uint64_t>(number));
  } else if constexpr (std::same_as<Number, float>) {
    setNumber(NumberKind::kFloat, static_cast<double>(number));
  } else if constexpr (std::floating_point<Number>) {
    setNumber(NumberKind::kDouble, static_cast<double>(number));
  } else if constexpr (std::signed_integral<Number>) {
    constexpr auto kKind = sizeof(Number) <= 2   ? NumberKind::kInt16
                           : sizeof(Number) == 4 ? NumberKind::kInt32
                                                 : NumberKind::kInt64;
    setNumber(kKind, static_cast<std::int64_t>(number));
  } else {
    constexpr auto kKind = sizeof(Number) == 1   ? NumberKind::kUInt8
                           : sizeof(Number) == 2 ? NumberKind::kUInt16
                           : sizeof(Number) == 4 ? NumberKind::kUInt32
                                                 : NumberKind::kUInt64;
    setNumber(kKind, static_cast<std::uint64_t>(number));
  }
}

}  // namespace halvox::platform
