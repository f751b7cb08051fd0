#include "platform/fake/FakeOverflowService.h"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace halvox::platform {

void FakeOverflowService::setMemoryPerClient(std::size_t bytes) {
  const std::lock_guard lock(mutex_);
  memoryPerClient_ = bytes;
}

void FakeOverflowService::setWriteError(std::optional<Error> error, std::size_t writes) {
  const std::lock_guard lock(mutex_);
  writeError_ = std::move(error);
  writesBeforeError_ = writes;
}

void FakeOverflowService::setReadError(std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  readError_ = std::move(error);
}

void FakeOverflowService::damage(std::size_t position, std::byte value) {
  const std::lock_guard lock(mutex_);
  for (auto& [offset, piece] : pieces_) {
    if (position < piece.size()) piece[position] = value;
  }
}

std::size_t FakeOverflowService::keptBytes() const {
  const std::lock_guard lock(mutex_);
  std::size_t bytes = 0;
  for (const auto& [offset, piece] : pieces_) bytes += piece.size();
  return bytes;
}

std::size_t FakeOverflowService::keptPieces() const {
  const std::lock_guard lock(mutex_);
  return pieces_.size();
}

std::size_t FakeOverflowService::failedWrites() const {
  const std::lock_guard lock(mutex_);
  return failedWrites_;
}

std::size_t FakeOverflowService::memoryPerClient() const {
  const std::lock_guard lock(mutex_);
  return memoryPerClient_;
}

std::optional<Error> FakeOverflowService::write(std::span<const std::byte> bytes,
                                                OverflowPlace& place) {
  const std::lock_guard lock(mutex_);
  if (writeError_.has_value()) {
    if (writesBeforeError_ == 0) {
      ++failedWrites_;
      return writeError_;
    }
    --writesBeforeError_;
  }
  pieces_.emplace(next_, std::vector<std::byte>(bytes.begin(), bytes.end()));
  place = {.offset = next_, .length = bytes.size()};
  next_ += bytes.size() + 1;  // so that even pieces without bytes have places of their own
  return std::nullopt;
}

std::optional<Error> FakeOverflowService::read(OverflowPlace place, std::span<std::byte> bytes) {
  const std::lock_guard lock(mutex_);
  if (readError_.has_value()) return readError_;
  const auto found = pieces_.find(place.offset);
  if (found == pieces_.end() || found->second.size() != bytes.size()) {
    throw std::logic_error("read() needs a place that write() returned");
  }
  std::ranges::copy(found->second, bytes.begin());
  return std::nullopt;
}

void FakeOverflowService::release(OverflowPlace place) {
  const std::lock_guard lock(mutex_);
  if (pieces_.erase(place.offset) == 0) {
    throw std::logic_error("release() needs a place that write() returned");
  }
}

}  // namespace halvox::platform
