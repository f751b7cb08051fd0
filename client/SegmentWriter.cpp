#include "client/SegmentWriter.h"

#include <algorithm>

namespace halvox::client {
namespace {

constexpr std::size_t kFirstSegmentBytes = 1024;

}  // namespace

[[gnu::hot]] void SegmentWriter::bytes(const void* from, std::size_t size) {
  const char* rest = static_cast<const char*>(from);
  while (size > 0) {
    if (at_ == end_ && !extend()) return;
    const std::size_t part = std::min(size, static_cast<std::size_t>(end_ - at_));
    std::memcpy(at_, rest, part);
    at_ += part;
    rest += part;
    size -= part;
  }
}

[[gnu::hot]] bool SegmentWriter::extend() {
  if (full_) return false;
  const Segment segment = source_.next();
  if (segment.begin == segment.end) {
    full_ = true;
    return false;
  }
  before_ = position();
  begin_ = at_ = segment.begin;
  end_ = segment.end;
  return true;
}

Segment HeapSegments::next() {
  // Each segment is as large as all earlier ones together. A large frame therefore takes only a few
  // segments.
  std::size_t bytes = 0;
  for (const auto& segment : segments_) bytes += segment.size() * sizeof(std::uint64_t);
  bytes = std::max(bytes, kFirstSegmentBytes);
  auto& made = segments_.emplace_back(bytes / sizeof(std::uint64_t));
  char* begin = reinterpret_cast<char*>(made.data());
  return {begin, begin + bytes};
}

std::string HeapSegments::join(std::size_t size) const {
  std::string joined;
  joined.reserve(size);
  for (const auto& segment : segments_) {
    const std::size_t bytes = segment.size() * sizeof(std::uint64_t);
    joined.append(reinterpret_cast<const char*>(segment.data()),
                  std::min(bytes, size - joined.size()));
  }
  return joined;
}

}  // namespace halvox::client
