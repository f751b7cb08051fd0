#include "session/HistoryBytes.h"

#include "platform/services.h"

namespace halvox {
namespace {

// Large enough that moving a piece out costs little more than copying its bytes, and small compared
// with what one session may hold.
constexpr std::size_t kPieceBytes = 64 * 1024;
// A piece with less room than this is full. Few entries take more.
constexpr std::size_t kRoomForEntry = 512;

}  // namespace

HistoryBytes::~HistoryBytes() {
  for (const Piece& piece : pieces_) {
    if (piece.place.has_value()) platform::overflow().release(*piece.place);
  }
}

std::vector<std::byte>& HistoryBytes::last() {
  const bool isRoomLeft = !pieces_.empty() && !pieces_.back().place.has_value() &&
                          pieces_.back().bytes.size() + kRoomForEntry <= kPieceBytes;
  if (!isRoomLeft) startPiece();
  return pieces_.back().bytes;
}

// Trims the full piece if its capacity exceeds kPieceBytes, because a growing vector doubles its
// capacity. A smaller waste is not worth a copy.
void HistoryBytes::startPiece() {
  if (!pieces_.empty() && !pieces_.back().place.has_value()) {
    std::vector<std::byte>& full = pieces_.back().bytes;
    if (full.capacity() > kPieceBytes) full.shrink_to_fit();
    fullInMemory_ += full.capacity();
  }
  pieces_.emplace_back();
}

std::optional<platform::Error> HistoryBytes::read(std::size_t piece,
                                                  std::vector<std::byte>& bytes) const {
  const platform::OverflowPlace& place = *pieces_[piece].place;
  bytes.resize(place.length);
  return platform::overflow().read(place, bytes);
}

std::optional<platform::Error> HistoryBytes::moveOut() {
  for (; firstInMemory_ < pieces_.size(); ++firstInMemory_) {
    Piece& piece = pieces_[firstInMemory_];
    if (piece.bytes.empty()) break;  // the last one, before its first entry
    platform::OverflowPlace place;
    if (auto error = platform::overflow().write(piece.bytes, place)) return error;
    if (isFull(firstInMemory_)) fullInMemory_ -= piece.bytes.capacity();
    piece.place = place;
    std::vector<std::byte>().swap(piece.bytes);
  }
  return std::nullopt;
}

}  // namespace halvox
