#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace halvox::platform::linux_ {

// The bytes that wait for one socket, and the offsets at which the frames in them end.
struct OutputBuffer {
  std::string bytes;
  std::vector<std::size_t> frameEnds;
  std::size_t sentBytes = 0;
  std::size_t sentFrames = 0;
};

// Spare buffers. With them, an idle connection need not hold a buffer, and a busy connection need
// not allocate one. Belongs to one thread. Owned by the host, which outlives the connections.
class OutputBufferPool {
 public:
  std::unique_ptr<OutputBuffer> take();
  // Keeps up to 16 buffers of at most 256 KiB, and frees the others.
  void give(std::unique_ptr<OutputBuffer> buffer);

 private:
  std::vector<std::unique_ptr<OutputBuffer>> spare_;
};

// The frames that one connection has to send, in order. One write sends all of them, and the
// replies of a turn therefore cost one system call. Writing never blocks. Belongs to one thread.
// Owned by its stream.
class OutputQueue {
 public:
  enum class Flush : std::uint8_t { kEmpty, kBlocked, kPeerGone };

  // Does not own the pool, which must outlive this.
  explicit OutputQueue(OutputBufferPool& pool) : pool_(pool) {}

  // Returns the buffer to append to. Call frameAppended() after each reply. Bytes without that
  // call, such as those of the handshake, are sent but do not count as replies.
  std::string& bytes();
  void frameAppended();

  [[nodiscard]] bool isEmpty() const { return buffer_ == nullptr; }
  // Returns the number of frames of which the socket has not yet taken the last byte.
  [[nodiscard]] std::size_t unsentFrames() const;
  [[nodiscard]] std::size_t unsentBytes() const;

  // Writes once. Adds the number of bytes that the socket took to `sentBytes`. If the peer is gone,
  // drops everything and adds the number of dropped frames to `droppedFrames`.
  Flush flush(int fd, std::size_t& sentBytes, std::size_t& droppedFrames);
  // Drops everything. Returns the number of dropped frames.
  std::size_t clear();

 private:
  void noteSent(std::size_t count);

  OutputBufferPool& pool_;
  std::unique_ptr<OutputBuffer> buffer_;  // null while there is nothing to send
};

}  // namespace halvox::platform::linux_
