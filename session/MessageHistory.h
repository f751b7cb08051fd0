#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <limits>
#include <optional>
#include <span>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/connection.h"
#include "platform/value.h"
#include "session/CompactValue.h"
#include "session/HistoryBytes.h"

namespace halvox {

// The messages that a session accepted in its current run, in order of acceptance.
//
// Each message has an identifier "base_n": the base names the category and the type, and n counts
// the accepted messages of that base from 1. The newest message of each base is kept as it came,
// because the next one is compared with it. The time for a message does not grow with the history.
//
// All messages are kept compactly, as bytes. Messages of one base usually have the same keys: such
// a sequence of keys is a form, and a message is written as its difference from the previous
// message of its form. A message of ten fields, three of which change, takes about 20 bytes; as
// values it would take 460. The bytes can be moved out of memory.
//
// Owned by the session's SessionHistory, whose lock guards it.
class MessageHistory {
 public:
  // The name of a category and type, and its newest message.
  class Base {
   public:
    Base(std::string text, std::uint32_t number) : text_(std::move(text)), number_(number) {}
    [[nodiscard]] const std::string& text() const { return text_; }
    // The number of accepted messages.
    [[nodiscard]] std::uint64_t count() const { return count_; }

   private:
    friend class MessageHistory;
    std::string text_;
    std::uint32_t number_;  // position in bases_
    std::uint64_t count_ = 0;
    std::uint64_t lost_ = 0;            // messages that were counted since the last recorded one
    std::vector<std::uint32_t> forms_;  // positions in forms_, the one used last in front
    // If true, the newest message is `previous` of the form in front. Otherwise it is in newest_.
    bool isNewestInForm_ = false;
    platform::Dictionary newest_;
    std::size_t newestSize_ = 0;  // in memory
  };

  // One accepted message. A part of the Reader that read it.
  class Entry {
   public:
    [[nodiscard]] std::string identifier() const;
    [[nodiscard]] const platform::Dictionary& message() const { return *message_; }
    // The number of the message's form, if it has one.
    [[nodiscard]] std::optional<std::uint32_t> form() const { return form_; }
    // Only for a message with a form: false if the value at this position is the same as in the
    // previous message of the form.
    [[nodiscard]] bool isChanged(std::size_t position) const {
      return (changes_[position / kPositionsOfByte] >> (position % kPositionsOfByte) &
              std::byte{1}) != std::byte{0};
    }

   private:
    friend class MessageHistory;
    static constexpr std::size_t kPositionsOfByte = 8;
    const Base* base_ = nullptr;  // owned by the history
    std::uint64_t count_ = 0;
    const platform::Dictionary* message_ = nullptr;  // owned by the reader
    std::optional<std::uint32_t> form_;
    std::span<const std::byte> changes_;  // a bit for each key; owned by the reader or the history
  };

  // Reads the messages of a history from the first one on, including messages that are added during
  // the reading. The history must stay where it is. Belongs to one thread, which holds the
  // history's lock during each call.
  class Reader {
   public:
    explicit Reader(const MessageHistory& history) : history_(&history) {}

    // The next message, valid until the next call; null at the end, or if the remaining messages
    // cannot be read.
    const Entry* next();
    // Why the remaining messages cannot be read, if they cannot.
    [[nodiscard]] const std::optional<platform::Error>& error() const { return error_; }

   private:
    std::span<const std::byte> restOfPiece();
    bool read(CompactReader& reader);
    void readForm(CompactReader& reader, std::size_t number);
    void giveUp();
    void setEntry(const Base& base, const platform::Dictionary& message);
    std::uint64_t& countOf(const Base& base);

    const MessageHistory* history_;
    std::size_t piece_ = 0;
    std::size_t position_ = 0;       // in the piece
    std::vector<std::byte> buffer_;  // holds a piece that was moved out
    std::size_t buffered_ = std::numeric_limits<std::size_t>::max();  // its number
    std::vector<platform::Dictionary> previous_;                      // of each form
    std::vector<std::uint64_t> counts_;                               // of each base
    platform::Dictionary single_;
    Entry entry_;
    std::optional<platform::Error> error_;
  };

  MessageHistory() = default;
  MessageHistory(MessageHistory&&) = default;
  MessageHistory& operator=(MessageHistory&&) = default;
  MessageHistory(const MessageHistory&) = delete;
  MessageHistory& operator=(const MessageHistory&) = delete;
  ~MessageHistory() = default;

  [[nodiscard]] bool empty() const { return size_ == 0; }
  // The number of messages that were kept.
  [[nodiscard]] std::size_t size() const { return size_; }
  // The number of messages that were counted, but not kept.
  [[nodiscard]] std::uint64_t lost() const { return lost_; }

  // The number of accepted messages of the base with this text.
  [[nodiscard]] std::uint64_t count(const std::string& base) const;

  // The base of a category and type; creates it if needed. Valid as long as the history, even if
  // the history is moved.
  Base& base(AudioEventCategory category, AudioEventType type);
  // The newest message of a base, or null if there is none. Valid until the next append() or
  // lose().
  [[nodiscard]] const platform::Dictionary* newestMessage(const Base& base) const;
  // Adds a message under the next identifier of the base. Returns the number of its form, if it has
  // one: messages with the same number have the same keys in the same order.
  std::optional<std::uint32_t> append(Base& base, platform::Dictionary message);
  // Does not keep the message, because there is no room. Counts it under the next identifier of the
  // base. The next message of the base is compared with it.
  void lose(Base& base, platform::Dictionary message);

  // The bytes that the history keeps in memory. Constant time.
  [[nodiscard]] std::size_t memorySize() const { return memorySize_ + bytes_.memorySize(); }
  // The part of memorySize() that can be moved out.
  [[nodiscard]] std::size_t movableSize() const { return bytes_.movableSize(); }
  // Moves what was recorded out of memory. After an error the history is as it was.
  [[nodiscard]] std::optional<platform::Error> moveOut() { return bytes_.moveOut(); }

 private:
  // A sequence of keys that messages of a base have.
  struct Form {
    const Base* base;
    platform::Dictionary previous;  // the last message; its keys are the form's
  };

  Base& baseWithText(std::string text);
  void setNewest(Base& base, platform::Dictionary message);
  std::optional<std::uint32_t> formOf(Base& base, const platform::Dictionary& message);
  void writeForm(std::uint32_t number, platform::Dictionary message);

  std::unordered_map<std::string, Base*> basesByText_;
  std::unordered_map<std::uint64_t, Base*> basesByCode_;  // saves building a text for each message
  std::deque<Base> bases_;
  std::vector<Form> forms_;
  HistoryBytes bytes_;
  std::size_t size_ = 0;
  std::uint64_t lost_ = 0;
  std::size_t memorySize_ = 0;  // of all but bytes_
};

// True if the messages have the same entries in any order, apart from the keys that the service
// stamps into each message: "processuptime_ms", "systemuptime_sec" and "hvreporting_timestamp".
// Copies neither message.
[[nodiscard]] bool equalApartFromVolatileKeys(const platform::Dictionary& left,
                                              const platform::Dictionary& right);

}  // namespace halvox
