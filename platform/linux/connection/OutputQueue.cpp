#include "platform/linux/connection/OutputQueue.h"

#include <cerrno>
#include <utility>

#include <sys/socket.h>

#include "platform/linux/connection/ConnectionLimits.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kSpareBuffers = 16;
constexpr std::size_t kMaxSpareBytes = 256 * kKiB;
// Sent bytes are removed from the front of a buffer only if they are at least this many and at
// least half of the buffer. Removing them moves the rest, which would be too slow after every
// partial write.
constexpr std::size_t kCompactBytes = 64 * kKiB;

}  // namespace

std::unique_ptr<OutputBuffer> OutputBufferPool::take() {
  if (spare_.empty()) return std::make_unique<OutputBuffer>();
  std::unique_ptr<OutputBuffer> buffer = std::move(spare_.back());
  spare_.pop_back();
  return buffer;
}

void OutputBufferPool::give(std::unique_ptr<OutputBuffer> buffer) {
  // Free the buffer of a large answer. Its memory would otherwise stay in use until the service
  // ends.
  if (spare_.size() >= kSpareBuffers || buffer->bytes.capacity() > kMaxSpareBytes) return;
  buffer->bytes.clear();
  buffer->frameEnds.clear();
  buffer->sentBytes = 0;
  buffer->sentFrames = 0;
  spare_.push_back(std::move(buffer));
}

std::string& OutputQueue::bytes() {
  if (!buffer_) buffer_ = pool_.take();
  return buffer_->bytes;
}

void OutputQueue::frameAppended() { buffer_->frameEnds.push_back(buffer_->bytes.size()); }

std::size_t OutputQueue::unsentFrames() const {
  return buffer_ ? buffer_->frameEnds.size() - buffer_->sentFrames : 0;
}

std::size_t OutputQueue::unsentBytes() const {
  return buffer_ ? buffer_->bytes.size() - buffer_->sentBytes : 0;
}

OutputQueue::Flush OutputQueue::flush(int fd, std::size_t& sentBytes, std::size_t& droppedFrames) {
  // The queue may be empty, because close() can drop the output after the flush was requested.
  if (unsentBytes() == 0) {
    clear();
    return Flush::kEmpty;
  }
  // Without MSG_NOSIGNAL, a client that disconnects would end the service with SIGPIPE.
  const ssize_t count = send(fd, buffer_->bytes.data() + buffer_->sentBytes, unsentBytes(),
                             MSG_NOSIGNAL | MSG_DONTWAIT);
  if (count < 0) {
    // Treat EINTR like a full socket. The loop calls flush() again as soon as the socket is
    // writable.
    if (errno == EAGAIN || errno == EINTR || errno == ENOBUFS) return Flush::kBlocked;
    droppedFrames += clear();
    return Flush::kPeerGone;
  }
  sentBytes += static_cast<std::size_t>(count);
  noteSent(static_cast<std::size_t>(count));
  return buffer_ ? Flush::kBlocked : Flush::kEmpty;
}

std::size_t OutputQueue::clear() {
  const std::size_t dropped = unsentFrames();
  if (buffer_) pool_.give(std::exchange(buffer_, nullptr));
  return dropped;
}

void OutputQueue::noteSent(std::size_t count) {
  OutputBuffer& buffer = *buffer_;
  buffer.sentBytes += count;
  if (buffer.sentBytes == buffer.bytes.size()) {
    clear();
    return;
  }
  while (buffer.sentFrames < buffer.frameEnds.size() &&
         buffer.frameEnds[buffer.sentFrames] <= buffer.sentBytes) {
    ++buffer.sentFrames;
  }
  if (buffer.sentBytes < kCompactBytes || buffer.sentBytes < buffer.bytes.size() / 2) return;
  const std::size_t cut = buffer.sentBytes;
  buffer.bytes.erase(0, cut);
  buffer.frameEnds.erase(buffer.frameEnds.begin(),
                         buffer.frameEnds.begin() + static_cast<std::ptrdiff_t>(buffer.sentFrames));
  // The ends are offsets from the start of the buffer, from which `cut` bytes were removed.
  for (std::size_t& end : buffer.frameEnds) end -= cut;
  buffer.sentBytes = 0;
  buffer.sentFrames = 0;
}

}  // namespace halvox::platform::linux_
