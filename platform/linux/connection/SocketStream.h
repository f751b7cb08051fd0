#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/OutputQueue.h"

namespace halvox::platform::linux_ {

class ConnectionHost;

// Handles the bytes of a SocketStream.
class StreamOwner {
 public:
  virtual ~StreamOwner() = default;
  // There is something to read, or the peer has closed the connection.
  virtual void onReadable() = 0;
  // The output was written as far as the socket took it, or dropped because the peer is gone.
  virtual void onOutputProgress() = 0;
};

// A connected socket with its unused input and unsent output. Never blocks. The owner calls read().
// The host calls flush() once, at the end of a turn, for everything that was added during the turn.
// Belongs to the I/O thread. Owned by its connection.
class SocketStream final : public EventSource {
 public:
  enum class Read : std::uint8_t { kBytes, kNothing, kEnded };

  // Does not own `host` and `owner`, which must outlive this.
  SocketStream(UniqueFd fd, ConnectionHost& host, StreamOwner& owner);
  ~SocketStream() override { close(); }

  [[nodiscard]] FrameBuffer& input() { return input_; }
  [[nodiscard]] OutputQueue& output() { return output_; }
  [[nodiscard]] std::uint32_t nextSerial();
  // Sets the last serial that was used on the socket. nextSerial() continues after it.
  void skipSerials(std::uint32_t last) { lastSerial_ = last; }

  // Reads once into input(). The caller must settle the input before another stream reads, because
  // all streams share one scratch.
  Read read();
  // Sets whether the stream calls onReadable() of its owner.
  void setReading(bool reading);
  // The owner calls this after adding to output().
  void outputAdded();
  // Writes the output once. The host calls this at the end of the turn.
  void flush();
  // Closes the descriptor, and drops the output and whatever is added later. Returns false if it
  // was already closed.
  bool close();

  void onReady(std::uint32_t events) override;

 private:
  void updateInterest();

  UniqueFd fd_;
  ConnectionHost& host_;
  StreamOwner& owner_;
  FrameBuffer input_;
  OutputQueue output_;
  std::uint32_t lastSerial_ = 0;
  std::uint32_t watched_ = 0;  // the events that the loop watches for; 0: not watched
  bool reading_ = false;
  bool blocked_ = false;  // the socket did not take everything
  bool flushing_ = false;
};

}  // namespace halvox::platform::linux_
