#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/OutputQueue.h"

namespace halvox::platform::linux_ {

class ConnectionHost;

// Who works with the bytes of a SocketStream.
class StreamOwner {
 public:
  virtual ~StreamOwner() = default;
  // There is something to read, or the peer is gone.
  virtual void onReadable() = 0;
  // The socket was offered what waited for it; or the peer is gone and all was dropped.
  virtual void onOutputProgress() = 0;
};

// A connected socket with its unread input and unsent output; never blocks. Reads are asked for by
// the owner, writes happen at the end of a turn, one for all that has come together.
// Belongs to the I/O thread and to its owner.
class SocketStream final : public EventSource {
 public:
  enum class Read : std::uint8_t { kBytes, kNothing, kEnded };

  // Neither is owned; both must outlive this.
  SocketStream(UniqueFd fd, ConnectionHost& host, StreamOwner& owner);
  ~SocketStream() override { close(); }

  [[nodiscard]] FrameBuffer& input() { return input_; }
  [[nodiscard]] OutputQueue& output() { return output_; }
  [[nodiscard]] std::uint32_t nextSerial();
  // Serials up to that one were used before this took the socket over.
  void skipSerials(std::uint32_t last) { lastSerial_ = last; }

  // One read into input(), which must be settled before the turn goes on to others.
  Read read();
  // Whether onReadable() is wanted.
  void setReading(bool reading);
  // Call it after adding to output().
  void outputAdded();
  // By the host, at the end of the turn.
  void flush();
  // Drops what is unsent, and what is added later. False when there was no descriptor to give back.
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
  std::uint32_t watched_ = 0;  // the events that the loop watches for; 0 when it does not know us
  bool reading_ = false;
  bool blocked_ = false;  // the socket took less than there was
  bool flushing_ = false;
};

}  // namespace halvox::platform::linux_
