#include "platform/linux/connection/SocketStream.h"

#include <cerrno>
#include <span>
#include <utility>

#include <sys/epoll.h>
#include <unistd.h>

#include "platform/linux/connection/ConnectionHost.h"

namespace halvox::platform::linux_ {

SocketStream::SocketStream(UniqueFd fd, ConnectionHost& host, StreamOwner& owner)
    : fd_(std::move(fd)),
      host_(host),
      owner_(owner),
      input_(host.options().maxFrameBytes),
      output_(host.outputBuffers()) {}

std::uint32_t SocketStream::nextSerial() {
  // D-Bus forbids the serial 0. The counter wraps around after 2^32 frames.
  if (++lastSerial_ == 0) ++lastSerial_;
  return lastSerial_;
}

SocketStream::Read SocketStream::read() {
  const std::span<std::byte> room = input_.readInto(host_.scratch());
  const ssize_t count = ::read(fd_.get(), room.data(), room.size());
  // Store errno before received(), which may allocate and change it.
  const int error = errno;
  // Call received() even if nothing arrived, because readInto() may have moved the unused bytes.
  input_.received(count > 0 ? static_cast<std::size_t>(count) : 0);
  if (count > 0) {
    host_.statistics().bytesReceived.add(static_cast<std::uint64_t>(count));
    return Read::kBytes;
  }
  const bool nothingYet = count < 0 && (error == EAGAIN || error == EINTR);
  return nothingYet ? Read::kNothing : Read::kEnded;
}

void SocketStream::setReading(bool reading) {
  if (reading_ == reading) return;
  reading_ = reading;
  updateInterest();
}

void SocketStream::outputAdded() {
  // While the socket is full, a write would fail. The loop calls onReady() when the socket is
  // writable.
  if (flushing_ || blocked_) return;
  flushing_ = true;
  host_.turn().flushLater(*this);
}

void SocketStream::flush() {
  flushing_ = false;
  const std::size_t before = output_.unsentFrames();
  std::size_t sentBytes = 0;
  std::size_t dropped = 0;
  const OutputQueue::Flush result = output_.flush(fd_.get(), sentBytes, dropped);
  host_.statistics().bytesSent.add(sentBytes);
  host_.statistics().repliesSent.add(before - dropped - output_.unsentFrames());
  if (dropped > 0) host_.statistics().repliesDroppedGone.add(dropped);
  const bool wasBlocked = std::exchange(blocked_, result == OutputQueue::Flush::kBlocked);
  if (wasBlocked != blocked_) updateInterest();
  // Notify the owner after a failure, too: dropped output no longer counts against the bounds.
  owner_.onOutputProgress();
}

bool SocketStream::close() {
  if (!fd_) return false;
  if (const std::size_t dropped = output_.clear(); dropped > 0) {
    host_.statistics().repliesDroppedGone.add(dropped);
  }
  reading_ = false;
  blocked_ = false;
  // Remove the descriptor from the loop before closing it, because another connection can get the
  // same number at once.
  updateInterest();
  fd_.reset();
  return true;
}

void SocketStream::onReady(std::uint32_t events) {
  if (!fd_) return;
  // Treat EPOLLHUP and EPOLLERR like EPOLLOUT. The write then fails and drops the output.
  if (blocked_ && (events & ~std::uint32_t{EPOLLIN}) != 0 && !flushing_) {
    flushing_ = true;
    host_.turn().flushLater(*this);
  }
  if (reading_ && (events & ~std::uint32_t{EPOLLOUT}) != 0) owner_.onReadable();
}

// A descriptor is removed from the loop while the stream waits for nothing. An empty event mask is
// not enough: epoll reports a hang-up even then, and the loop would spin while flow control holds
// the client back.
void SocketStream::updateInterest() {
  const std::uint32_t wanted =
      (reading_ ? std::uint32_t{EPOLLIN} : 0U) | (blocked_ ? std::uint32_t{EPOLLOUT} : 0U);
  if (wanted == watched_) return;
  if (wanted == 0) {
    host_.loop().forget(fd_.get());
  } else if (watched_ == 0) {
    static_cast<void>(host_.loop().watch(fd_.get(), wanted, *this));
  } else {
    host_.loop().change(fd_.get(), wanted, *this);
  }
  watched_ = wanted;
}

}  // namespace halvox::platform::linux_
