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
// Every message has an identifier, "base_n": the base names the category and the type, n counts the
// accepted messages of that base from 1 on. Bases are kept once and identifiers are put together
// only when somebody asks, so an entry costs 24 bytes beside its message.
//
// The newest entry of a base is found without a walk: the time that a message takes does not grow
// with the history. Belongs to its session, which guards it.
class MessageHistory {
 public:
  // The texts of a category and a type, and where the newest message with them is.
  class Base {
   public:
    explicit Base(std::string text) : text_(std::move(text)) {}
    [[nodiscard]] const std::string& text() const { return text_; }
    // Number of accepted messages.
    [[nodiscard]] std::uint64_t count() const { return count_; }

   private:
    friend class MessageHistory;
    std::string text_;
    std::uint64_t count_ = 0;
    std::size_t newest_ = 0;  // position in the history of base_count; only when count_ > 0
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

  // Number of accepted messages of the base with that text.
  [[nodiscard]] std::uint64_t count(const std::string& base) const;

  // The base of that category and type; made with a count of 0 at first sight. Valid as long as the
  // history, also when the history is moved.
  Base& base(AudioEventCategory category, AudioEventType type);
  // The newest message of a base, or null when there is none. Valid until the next append.
  [[nodiscard]] const platform::Dictionary* newestMessage(const Base& base) const;
  // Adds a message under the next identifier of the base.
  void append(Base& base, platform::Dictionary message);

  // Bytes that the history keeps alive. Constant time.
  [[nodiscard]] std::size_t memorySize() const { return memorySize_; }

 private:
  Base& baseWithText(std::string text);

  std::unordered_map<std::string, Base> bases_;
  std::unordered_map<std::uint64_t, Base*> basesByCode_;  // saves making the text for each message
  std::deque<Entry> entries_;
  std::size_t memorySize_ = 0;
};

// True when the two messages have the same entries, whatever they have under the keys that the
// service stamps into every message: "processuptime_ms", "systemuptime_sec" and
// "hvreporting_timestamp". Copies neither.
[[nodiscard]] bool equalApartFromVolatileKeys(const platform::Dictionary& left,
                                              const platform::Dictionary& right);

}  // namespace halvox
