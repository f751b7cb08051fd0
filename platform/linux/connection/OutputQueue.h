#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace halvox::platform::linux_ {

// The bytes that wait for one socket, and where each frame in them ends.
struct OutputBuffer {
  std::string bytes;
  std::vector<std::size_t> frameEnds;
  std::size_t sentBytes = 0;
  std::size_t sentFrames = 0;
};

// Buffers that no connection uses at the moment, so that an idle connection holds none and a busy
// one allocates none. Belongs to one thread.
class OutputBufferPool {
 public:
  std::unique_ptr<OutputBuffer> take();
  // Keeps a few of ordinary size.
  void give(std::unique_ptr<OutputBuffer> buffer);

 private:
  std::vector<std::unique_ptr<OutputBuffer>> spare_;
};

// What one connection has to send. Frames are appended at the end and leave in order, all that are
// there with one write; writing never blocks. Belongs to one thread.
class OutputQueue {
 public:
  enum class Flush : std::uint8_t { kEmpty, kBlocked, kPeerGone };

  // Does not own the pool, which must outlive this.
  explicit OutputQueue(OutputBufferPool& pool) : pool_(pool) {}

  // Where to append. Call frameAppended() after each frame that counts as a reply; other bytes,
  // such as those of a handshake, are sent all the same.
  std::string& bytes();
  void frameAppended();

  [[nodiscard]] bool isEmpty() const { return buffer_ == nullptr; }
  // Frames of which the socket has not taken the last byte.
  [[nodiscard]] std::size_t unsentFrames() const;
  [[nodiscard]] std::size_t unsentBytes() const;

  // Offers all to the socket, once. Adds what it took to `sentBytes`. When the peer is gone, all is
  // dropped and `droppedFrames` says how many frames that were.
  Flush flush(int fd, std::size_t& sentBytes, std::size_t& droppedFrames);
  // Drops all; returns how many frames that were.
  std::size_t clear();

 private:
  void noteSent(std::size_t count);

  OutputBufferPool& pool_;
  std::unique_ptr<OutputBuffer> buffer_;  // none while there is nothing to send
};

}  // namespace halvox::platform::linux_
