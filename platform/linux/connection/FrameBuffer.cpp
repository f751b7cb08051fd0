#include "platform/linux/connection/FrameBuffer.h"

#include <algorithm>
#include <cstring>
#include <string>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kBodyLengthOffset = 4;

// The longest header that a frame over the limit may have. The service reads such a header, to
// answer it with a refusal, and the header must therefore fit into the scratch.
constexpr std::size_t kMaxSkippableHeader = kReadBytes - 8;

// The size of a header: its fixed part, the array of fields and the padding to 8 bytes.
std::size_t headerBytes(std::span<const std::byte> frame) {
  std::uint32_t fieldBytes = 0;
  std::memcpy(&fieldBytes, &frame[dbus::kFrameStartBytes - sizeof fieldBytes], sizeof fieldBytes);
  if (frame[0] == std::byte{'B'}) fieldBytes = __builtin_bswap32(fieldBytes);
  return (dbus::kFrameStartBytes + fieldBytes + 7) & ~std::size_t{7};
}

}  // namespace

std::span<std::byte> FrameBuffer::readInto(const ReadScratch& scratch) {
  // The unused bytes are always at the end of own_. Everything before them has been used.
  if (const std::size_t wanted = bytesThatDoNotFitScratch(); wanted > 0) {
    // Add at most as many bytes as have arrived, or one read. The size in the header cannot be
    // trusted.
    const std::size_t offset = own_.size() - view_.size();
    const std::size_t grow = std::min(wanted, std::max(view_.size(), kReadBytes));
    own_.erase(own_.begin(), own_.begin() + static_cast<std::ptrdiff_t>(offset));
    const std::size_t used = own_.size();
    own_.resize(used + grow);
    view_ = std::span<const std::byte>(own_).first(used);
    readSpan_ = std::span<std::byte>(own_).subspan(used);
    return readSpan_;
  }
  const std::span<std::byte> bytes = scratch.bytes();
  // If the last read ended inside a frame, put the beginning of the frame in front of the new
  // bytes, because frames are decoded in place.
  if (!view_.empty()) std::memcpy(bytes.data(), view_.data(), view_.size());
  view_ = bytes.first(view_.size());
  inScratch_ = true;
  readSpan_ = bytes.subspan(view_.size(), kReadBytes);
  return readSpan_;
}

void FrameBuffer::received(std::size_t count) {
  // Remove what readInto() added for bytes that did not arrive. This does not move the other bytes.
  if (!inScratch_) own_.resize(view_.size() + count);
  const std::byte* start = inScratch_ ? readSpan_.data() - view_.size() : own_.data();
  view_ = {start, view_.size() + count};
  const std::size_t dropped = std::min(skip_, view_.size());
  skip_ -= dropped;
  view_ = view_.subspan(dropped);
}

void FrameBuffer::settle() {
  if (inScratch_) {
    inScratch_ = false;
    own_.assign(view_.begin(), view_.end());
    view_ = own_;
  }
  if (!view_.empty()) return;
  // Free the memory, because most connections are idle most of the time. clear() would keep it.
  own_ = std::vector<std::byte>();
  view_ = {};
}

void FrameBuffer::append(std::span<const std::byte> bytes) {
  const std::size_t usedUp = own_.size() - view_.size();
  // Erasing moves the remaining bytes. Erase only when more than half has been used: on average
  // each byte is then moved at most once.
  if (usedUp > own_.size() / 2) {
    own_.erase(own_.begin(), own_.begin() + static_cast<std::ptrdiff_t>(usedUp));
  }
  const std::size_t offset = own_.size() - view_.size();
  own_.insert(own_.end(), bytes.begin(), bytes.end());
  view_ = std::span<const std::byte>(own_).subspan(offset);
}

FrameBuffer::Next FrameBuffer::next() const {
  Next next;
  if (view_.empty()) {
    next.state = skip_ > 0 ? State::kPartial : State::kEmpty;
    return next;
  }
  // Measure with the limit of D-Bus, not with our lower limit. A frame between the two limits is
  // answered with an error and skipped, and the connection continues.
  dbus::FrameMeasure measure = dbus::measureFrame(view_, dbus::kMaxMessageBytes);
  next.state = State::kPartial;
  if (measure.state == dbus::FrameMeasure::State::kNeedMoreBytes) return next;
  if (measure.state == dbus::FrameMeasure::State::kBroken) {
    next.state = State::kBroken;
    next.error = std::move(measure.error);
    return next;
  }
  next.totalBytes = measure.totalBytes;
  if (measure.totalBytes > maxFrameBytes_) {
    const std::size_t header = headerBytes(view_);
    if (header > kMaxSkippableHeader) {
      next.state = State::kBroken;
      next.error = {"a message of " + std::to_string(measure.totalBytes) +
                        " bytes is over the limit, and its header of " + std::to_string(header) +
                        " bytes is too long to be answered",
                    0};
    } else if (view_.size() >= header) {
      next.state = State::kOversized;
      next.bytes = view_.first(header);
    }
    return next;
  }
  if (view_.size() < measure.totalBytes) return next;
  next.state = State::kFrame;
  next.bytes = view_.first(measure.totalBytes);
  return next;
}

void FrameBuffer::consume(std::size_t count) {
  const std::size_t present = std::min(count, view_.size());
  // When a frame over the limit is consumed, most of its bytes have not arrived yet.
  skip_ += count - present;
  view_ = view_.subspan(present);
}

std::vector<std::byte> FrameBuffer::withoutBody(const Next& oversized) {
  std::vector<std::byte> frame(oversized.bytes.begin(), oversized.bytes.end());
  std::memset(&frame[kBodyLengthOffset], 0, sizeof(std::uint32_t));
  return frame;
}

// Returns 0 if the next read may go to the scratch. Otherwise returns how many bytes may be read
// into own_: the missing bytes of a large frame, or the size of one read if the unused bytes do not
// fit into the scratch.
std::size_t FrameBuffer::bytesThatDoNotFitScratch() const {
  if (view_.size() >= dbus::kFrameStartBytes) {
    const dbus::FrameMeasure measure = dbus::measureFrame(view_, dbus::kMaxMessageBytes);
    const bool isLarge = measure.state == dbus::FrameMeasure::State::kKnown &&
                         measure.totalBytes > kReadBytes && measure.totalBytes <= maxFrameBytes_;
    if (isLarge && measure.totalBytes > view_.size()) return measure.totalBytes - view_.size();
  }
  return view_.size() > kReadBytes ? kReadBytes : 0;
}

}  // namespace halvox::platform::linux_
