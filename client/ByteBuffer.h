#pragma once

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <memory>
#include <span>

namespace halvox::client {

// A buffer that grows at its end. The first `kInline` bytes need no allocation. The address of the
// first byte is a multiple of 8. Belongs to one thread at a time.
template <std::size_t kInline>
class ByteBuffer {
 public:
  ByteBuffer() = default;
  ByteBuffer(const ByteBuffer&) = delete;
  ByteBuffer& operator=(const ByteBuffer&) = delete;

  [[nodiscard]] char* data() { return data_; }
  [[nodiscard]] const char* data() const { return data_; }
  [[nodiscard]] std::size_t size() const { return size_; }
  [[nodiscard]] std::span<const char> bytes() const { return {data_, size_}; }

  // Makes space for `extra` bytes after the content, and returns the end of the content. If it
  // throws std::bad_alloc, the buffer is unchanged.
  char* reserve(std::size_t extra) {
    if (extra > capacity_ - size_) grow(extra);
    return data_ + size_;
  }
  // Sets the end of the content. It must be within the reserved space.
  void setEnd(const char* end) { size_ = static_cast<std::size_t>(end - data_); }
  void setSize(std::size_t size) { size_ = size; }

 private:
  void grow(std::size_t extra) {
    const std::size_t capacity = std::max(size_ + extra, 2 * capacity_);
    std::unique_ptr<char[]> grown(new char[capacity]);
    std::memcpy(grown.get(), data_, size_);
    heap_ = std::move(grown);
    data_ = heap_.get();
    capacity_ = capacity;
  }

  char* data_ = inline_;
  std::size_t size_ = 0;
  std::size_t capacity_ = kInline;
  std::unique_ptr<char[]> heap_;
  alignas(8) char inline_[kInline];
};

}  // namespace halvox::client
