#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "platform/connection.h"
#include "platform/value.h"
#include "session/MessageHistory.h"
#include "session/VolumeMessages.h"

namespace halvox {

// The volume messages of a session's current run, made while its messages are recorded. A stop then
// takes time in proportion to the volume messages, of which a run has at most two a second, and not
// to the history.
//
// Most messages have none of the keys that matter. The messages of one form have the same keys, so
// that for most messages nothing more than their form is looked at.
//
// Owned by the session's SessionHistory, whose lock guards it.
class VolumeHistory {
 public:
  VolumeHistory();

  // Takes the next message that was recorded, and the number of its form if it has one.
  void add(const platform::Dictionary& message, std::optional<std::uint32_t> form);
  // Returns the volume messages in the order in which their intervals ended, and forgets them.
  [[nodiscard]] std::unique_ptr<const MessageHistory> take();

  // The bytes that this keeps in memory for its messages. Constant time.
  [[nodiscard]] std::size_t memorySize() const;
  // The part of memorySize() that can be moved out.
  [[nodiscard]] std::size_t movableSize() const;
  [[nodiscard]] std::optional<platform::Error> moveOut();

 private:
  enum class Concern : std::uint8_t { kUnknown, kNone, kVolume };

  [[nodiscard]] bool isConcerned(const platform::Dictionary& message,
                                 std::optional<std::uint32_t> form);

  VolumeIntervals intervals_;
  std::size_t sizeOfIntervals_ = 0;        // in memory
  std::vector<Concern> concerns_;          // of each form
  std::unique_ptr<MessageHistory> ended_;  // null until an interval ends: most runs have none
};

}  // namespace halvox
