#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

namespace halvox::client {

// A piece of memory into which a frame is written. Its address and its size are multiples of 8.
struct Segment {
  char* begin = nullptr;
  char* end = nullptr;
};

// Provides the memory of a SegmentWriter. The caller owns the source.
class SegmentSource {
 public:
  SegmentSource() = default;
  virtual ~SegmentSource() = default;
  SegmentSource(const SegmentSource&) = delete;
  SegmentSource& operator=(const SegmentSource&) = delete;

  // Returns the next segment, or an empty one if no memory remains.
  virtual Segment next() = 0;
};

// Writes a frame of the wire, in the byte order of this machine, into one or several segments. The
// frame starts with the first segment. Because segments are multiples of 8, no number crosses from
// one segment into the next, and an address has the same alignment as its position in the frame.
//
// When the source has no segment left, the writer writes nothing more and isFull() returns true.
// Belongs to one thread. Does not own `source`, which must outlive it.
class SegmentWriter {
 public:
  explicit SegmentWriter(SegmentSource& source) : source_(source) { extend(); }

  [[nodiscard]] bool isFull() const { return full_; }
  // Returns the number of bytes written so far.
  [[nodiscard]] std::size_t position() const {
    return before_ + static_cast<std::size_t>(at_ - begin_);
  }

  // Appends zeros up to the next multiple of `alignment`, which is at most 8.
  void align(std::size_t alignment) {
    while ((reinterpret_cast<std::uintptr_t>(at_) & (alignment - 1)) != 0) *at_++ = 0;
  }
  // Appends padding, then the number. The alignment of a number is its size.
  template <typename Number>
  void number(Number number) {
    align(sizeof number);
    if (at_ == end_ && !extend()) return;
    std::memcpy(at_, &number, sizeof number);
    at_ += sizeof number;
  }
  void bytes(const void* from, std::size_t size);
  // Appends a length of 0, which replaceLength() replaces later. Returns the place of the length,
  // which is valid as long as the segments.
  [[nodiscard]] char* length() {
    align(sizeof(std::uint32_t));
    if (at_ == end_ && !extend()) return spare_;
    std::memset(at_, 0, sizeof(std::uint32_t));
    at_ += sizeof(std::uint32_t);
    return at_ - sizeof(std::uint32_t);
  }
  static void replaceLength(char* at, std::size_t length) {
    const auto number = static_cast<std::uint32_t>(length);
    std::memcpy(at, &number, sizeof number);
  }

  // For the common case that a part fits into the current segment. Returns where to write the part,
  // or null if fewer than `size` bytes are left in the segment. commit() ends the part.
  [[nodiscard]] char* reserve(std::size_t size) {
    return static_cast<std::size_t>(end_ - at_) >= size ? at_ : nullptr;
  }
  void commit(char* end) { at_ = end; }

 private:
  bool extend();

  SegmentSource& source_;
  char* begin_ = nullptr;
  char* at_ = nullptr;
  char* end_ = nullptr;
  std::size_t before_ = 0;  // bytes in earlier segments
  bool full_ = false;
  alignas(8) char spare_[8] = {};  // the place of a length for which no memory remains
};

// Segments on the heap, for frames whose allocation does not matter.
class HeapSegments final : public SegmentSource {
 public:
  Segment next() override;
  // Returns the first `size` bytes of all segments in one piece.
  [[nodiscard]] std::string join(std::size_t size) const;

 private:
  std::vector<std::vector<std::uint64_t>> segments_;
};

}  // namespace halvox::client
