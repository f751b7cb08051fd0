#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include "platform/connection.h"
#include "platform/overflow.h"

namespace halvox {

// The bytes of a history: pieces in order, the last of which grows. Full pieces can be moved out of
// memory.
//
// Owned by a MessageHistory, whose lock guards it. The destructor releases the storage of the
// pieces that were moved out.
class HistoryBytes {
 public:
  HistoryBytes() = default;
  HistoryBytes(HistoryBytes&& other) noexcept { swap(other); }
  HistoryBytes& operator=(HistoryBytes&& other) noexcept {
    swap(other);
    return *this;
  }
  HistoryBytes(const HistoryBytes&) = delete;
  HistoryBytes& operator=(const HistoryBytes&) = delete;
  ~HistoryBytes();

  // The piece to which the next entry must be appended. An entry is never split.
  [[nodiscard]] std::vector<std::byte>& last();

  [[nodiscard]] std::size_t pieces() const { return pieces_.size(); }
  [[nodiscard]] bool isMovedOut(std::size_t piece) const {
    return pieces_[piece].place.has_value();
  }
  // A piece that was not moved out; valid until the next entry is appended or pieces are moved.
  [[nodiscard]] std::span<const std::byte> inMemory(std::size_t piece) const {
    return pieces_[piece].bytes;
  }
  // Reads a piece that was moved out.
  [[nodiscard]] std::optional<platform::Error> read(std::size_t piece,
                                                    std::vector<std::byte>& bytes) const;
  // True if no more entries are appended to the piece.
  [[nodiscard]] bool isFull(std::size_t piece) const { return piece + 1 < pieces_.size(); }

  // Bytes in memory, including the room that is reserved for further entries.
  [[nodiscard]] std::size_t memorySize() const {
    return movableSize() + pieces_.size() * sizeof(Piece);
  }
  // The part of memorySize() that can be moved out.
  [[nodiscard]] std::size_t movableSize() const { return fullInMemory_ + lastCapacity(); }
  // Moves all pieces out of memory. After an error the remaining ones are still in memory.
  [[nodiscard]] std::optional<platform::Error> moveOut();

 private:
  struct Piece {
    std::vector<std::byte> bytes;  // empty once the piece has been moved out
    std::optional<platform::OverflowPlace> place;
  };

  [[nodiscard]] std::size_t lastCapacity() const {
    return pieces_.empty() ? 0 : pieces_.back().bytes.capacity();
  }
  void startPiece();
  void swap(HistoryBytes& other) noexcept {
    pieces_.swap(other.pieces_);
    std::swap(firstInMemory_, other.firstInMemory_);
    std::swap(fullInMemory_, other.fullInMemory_);
  }

  std::vector<Piece> pieces_;
  std::size_t firstInMemory_ = 0;
  std::size_t fullInMemory_ = 0;  // capacity of the full pieces that are in memory
};

}  // namespace halvox
