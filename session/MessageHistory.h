#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

// The messages that a session accepted in its current run, in order of acceptance.
//
// Each message has an identifier "base_n": the base names the category and the type, and n counts
// the accepted messages of that base from 1. A base is stored once and an identifier is built only
// when it is needed, so an entry takes 24 bytes in addition to its message.
//
// The newest entry of a base is found without a walk, so the time for a message does not grow with
// the history. Owned by the session's SessionHistory, whose lock guards it.
class MessageHistory {
 public:
  // The name of a category and type, and where their newest message is.
  class Base {
   public:
    explicit Base(std::string text) : text_(std::move(text)) {}
    [[nodiscard]] const std::string& text() const { return text_; }
    // The number of accepted messages.
    [[nodiscard]] std::uint64_t count() const { return count_; }

   private:
    friend class MessageHistory;
    std::string text_;
    std::uint64_t count_ = 0;
    std::size_t newest_ = 0;  // position of the newest message; only if count_ > 0
  };

  // One accepted message.
  class Entry {
   public:
    Entry(const Base& base, std::uint64_t count, platform::Dictionary message)
        : base_(&base), count_(count), message_(std::move(message)) {}
    [[nodiscard]] std::string identifier() const;
    [[nodiscard]] const platform::Dictionary& message() const { return message_; }

   private:
    const Base* base_;  // owned by the history
    std::uint64_t count_;
    platform::Dictionary message_;
  };

  using Iterator = std::deque<Entry>::const_iterator;

  MessageHistory() = default;
  MessageHistory(MessageHistory&&) = default;
  MessageHistory& operator=(MessageHistory&&) = default;
  MessageHistory(const MessageHistory&) = delete;
  MessageHistory& operator=(const MessageHistory&) = delete;
  ~MessageHistory() = default;

  [[nodiscard]] bool empty() const { return entries_.empty(); }
  [[nodiscard]] std::size_t size() const { return entries_.size(); }
  [[nodiscard]] Iterator begin() const { return entries_.begin(); }
  [[nodiscard]] Iterator end() const { return entries_.end(); }
  [[nodiscard]] const Entry& operator[](std::size_t position) const { return entries_[position]; }

  // The number of accepted messages of the base with this text.
  [[nodiscard]] std::uint64_t count(const std::string& base) const;

  // The base of a category and type; creates it if needed. Valid as long as the history, even if
  // the history is moved.
  Base& base(AudioEventCategory category, AudioEventType type);
  // The newest message of a base, or null if there is none. Valid until the next append().
  [[nodiscard]] const platform::Dictionary* newestMessage(const Base& base) const;
  // Adds a message under the next identifier of the base.
  void append(Base& base, platform::Dictionary message);

  // The bytes that the history keeps alive. Constant time.
  [[nodiscard]] std::size_t memorySize() const { return memorySize_; }

 private:
  Base& baseWithText(std::string text);

  std::unordered_map<std::string, Base> bases_;
  std::unordered_map<std::uint64_t, Base*> basesByCode_;  // saves building a text for each message
  std::deque<Entry> entries_;
  std::size_t memorySize_ = 0;
};

// True if the messages have the same entries in any order, apart from the keys that the service
// stamps into each message: "processuptime_ms", "systemuptime_sec" and "hvreporting_timestamp".
// Copies neither message.
[[nodiscard]] bool equalApartFromVolatileKeys(const platform::Dictionary& left,
                                              const platform::Dictionary& right);

}  // namespace halvox
