#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

// The memory into which all connections read, one after the other. They share one buffer because a
// buffer of its own would cost each idle client 128 KiB, and because one buffer stays in the
// processor's cache. It holds the unused bytes of one connection and one more read. Owned by the
// host.
class ReadScratch {
 public:
  ReadScratch() : bytes_(std::make_unique_for_overwrite<std::byte[]>(kBytes)) {}
  [[nodiscard]] std::span<std::byte> bytes() const { return {bytes_.get(), kBytes}; }

 private:
  static constexpr std::size_t kBytes = 2 * kReadBytes;
  std::unique_ptr<std::byte[]> bytes_;
};

// The bytes that one connection has received and not yet used, cut into frames.
//
//   readInto() --> read(2) --> received() --> next(), consume() ... --> settle()
//
// Frames are decoded in place, in the shared scratch. settle() copies the unused bytes into storage
// of this buffer; in most turns there are none. An idle connection holds no storage. A frame that
// is larger than one read gets storage that grows with the bytes that have arrived. It does not
// grow with the size that the header claims, because a client could otherwise reserve memory by
// announcing a large frame. Belongs to one thread. Owned by its connection.
class FrameBuffer {
 public:
  enum class State : std::uint8_t {
    kEmpty,
    kPartial,    // a part of a frame
    kFrame,      // `bytes` is one whole frame of `totalBytes`
    kOversized,  // a frame over the limit; `bytes` is its header alone
    kBroken,     // not a frame; `error` says why
  };
  struct Next {
    State state = State::kEmpty;
    std::size_t totalBytes = 0;
    std::span<const std::byte> bytes;
    dbus::WireError error;
  };

  explicit FrameBuffer(std::size_t maxFrameBytes) : maxFrameBytes_(maxFrameBytes) {}
  FrameBuffer(const FrameBuffer&) = delete;
  FrameBuffer& operator=(const FrameBuffer&) = delete;

  // Returns the memory for the next read. Call received() after it, even if nothing arrived.
  // Nothing else may use the scratch before settle().
  [[nodiscard]] std::span<std::byte> readInto(const ReadScratch& scratch);
  void received(std::size_t count);
  // Moves the remaining bytes out of the scratch, and frees storage that is not needed any more.
  void settle();

  // Adds bytes that were not received through readInto(). Must not be called between readInto() and
  // settle().
  void append(std::span<const std::byte> bytes);

  // Returns all unused bytes, whether or not they are a whole frame.
  [[nodiscard]] std::span<const std::byte> unused() const { return view_; }
  // Returns the next frame or part of a frame. The result points into this buffer and is valid
  // until the buffer is changed.
  [[nodiscard]] Next next() const;
  // Marks the next `count` bytes as used. Bytes among them that have not arrived yet are dropped
  // when they arrive.
  void consume(std::size_t count);

  // Returns a frame that has the header of a kOversized frame and no body.
  [[nodiscard]] static std::vector<std::byte> withoutBody(const Next& oversized);

 private:
  [[nodiscard]] std::size_t bytesThatDoNotFitScratch() const;

  std::size_t maxFrameBytes_;
  std::vector<std::byte> own_;
  std::span<const std::byte> view_;  // what is unused, in own_ or in the scratch
  std::span<std::byte> readSpan_;    // what readInto() returned
  std::size_t skip_ = 0;             // bytes to drop as they arrive
  bool inScratch_ = false;
};

}  // namespace halvox::platform::linux_
