#include "platform/linux/store/blocks/MessageBlockReader.h"

#include <bit>
#include <limits>
#include <new>

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kKeptBytes = std::size_t{4} << 20U;
constexpr unsigned kMostShift = 63;

}  // namespace

void MessageBlockReader::open(std::string_view block, std::int64_t records) {
  if (unpacked_.capacity() > kKeptBytes) std::string().swap(unpacked_);
  if (payload_.capacity() > kKeptBytes) std::string().swap(payload_);
  heads_.clear();
  payload_.clear();
  lastTime_ = 0;
  records_ = records;
  index_ = -1;
  isDamaged_ = records < 0 || !unpack(block);
}

// Unpacks a block, whose zstd frame says how long its content is. A damaged length must not make
// this function allocate much memory. It is compared with the length of the frame, because zstd
// cannot make more than about 32,000 bytes of one byte.
bool MessageBlockReader::unpack(std::string_view block) {
  constexpr std::uint64_t kMostBytesOfOne = std::uint64_t{1} << 17U;
  if (block.empty()) return records_ == 0;
  rest_ = block.substr(1);
  const auto packing = static_cast<BlockPacking>(block.front());
  if (packing == BlockPacking::kPlain) return true;
  if (packing != BlockPacking::kZstd) return false;
  const unsigned long long length = ZSTD_getFrameContentSize(rest_.data(), rest_.size());
  if (length > kLongestBlock || length > rest_.size() * kMostBytesOfOne) return false;
  if (!decompressor_) decompressor_.reset(ZSTD_createDCtx());
  if (!decompressor_) return false;
  try {
    unpacked_.resize(length);
  } catch (const std::bad_alloc&) {
    return false;
  }
  const std::size_t unpacked = ZSTD_decompressDCtx(decompressor_.get(), unpacked_.data(),
                                                   unpacked_.size(), rest_.data(), rest_.size());
  rest_ = unpacked_;
  return ZSTD_isError(unpacked) == 0 && unpacked == length;
}

bool MessageBlockReader::next() {
  if (isDamaged_) return false;
  if (index_ + 1 >= records_) {
    // If bytes remain after the last record, the number of records is wrong.
    isDamaged_ = !rest_.empty();
    return false;
  }
  ++index_;
  isDamaged_ = !readRecord();
  return !isDamaged_;
}

bool MessageBlockReader::readRecord() {
  std::uint64_t number = 0;
  if (!readNumber(number)) return false;
  record_ = {};
  if (number == static_cast<std::uint64_t>(BlockRecordKind::kGap)) return true;
  std::int64_t step = 0;
  std::uint64_t shared = 0;
  std::string_view rest;
  if (!readHead(number) || !readSigned(step) || !readNumber(shared) || !readText(rest)) {
    return false;
  }
  if (shared > payload_.size()) return false;
  lastTime_ += static_cast<std::uint64_t>(step);
  record_.time = std::bit_cast<double>(lastTime_);
  payload_.replace(shared, std::string::npos, rest);
  record_.payload = payload_;
  return true;
}

bool MessageBlockReader::readHead(std::uint64_t number) {
  const std::uint64_t reference = number >> kBlockKindBits;
  const auto kind = static_cast<BlockRecordKind>(number & ((1U << kBlockKindBits) - 1U));
  if (kind != BlockRecordKind::kEvent && kind != BlockRecordKind::kLink) return false;
  if (reference > heads_.size()) return false;
  if (reference == 0) {
    Head head{.kind = kind};
    if (kind == BlockRecordKind::kEvent) {
      if (!readText(head.name) || !readText(head.secondName)) return false;
    } else {
      std::uint64_t category = 0;
      std::uint64_t type = 0;
      if (!readSigned(head.sessionID) || !readText(head.name) || !readText(head.secondName) ||
          !readNumber(category) || !readNumber(type)) {
        return false;
      }
      constexpr auto kMost = std::numeric_limits<std::uint16_t>::max();
      if (category > kMost || type > kMost) return false;
      head.category = static_cast<std::int64_t>(category);
      head.type = static_cast<std::int64_t>(type);
    }
    heads_.push_back(head);
  }
  const Head& head = reference == 0 ? heads_.back() : heads_[reference - 1];
  if (head.kind != kind) return false;
  record_.kind = kind;
  if (kind == BlockRecordKind::kEvent) {
    record_.name = head.name;
    record_.application = head.secondName;
    return true;
  }
  record_.sessionID = head.sessionID;
  record_.clientName = head.name;
  record_.serviceName = head.secondName;
  record_.category = head.category;
  record_.type = head.type;
  return true;
}

bool MessageBlockReader::readNumber(std::uint64_t& number) {
  number = 0;
  for (unsigned shift = 0; shift <= kMostShift && !rest_.empty(); shift += 7) {
    const auto byte = static_cast<std::uint8_t>(rest_.front());
    rest_.remove_prefix(1);
    number |= static_cast<std::uint64_t>(byte & 0x7FU) << shift;
    if ((byte & 0x80U) == 0) return true;
  }
  return false;
}

bool MessageBlockReader::readSigned(std::int64_t& number) {
  std::uint64_t zigzag = 0;
  if (!readNumber(zigzag)) return false;
  number = static_cast<std::int64_t>(zigzag >> 1U ^ (~(zigzag & 1U) + 1U));
  return true;
}

bool MessageBlockReader::readText(std::string_view& text) {
  std::uint64_t length = 0;
  if (!readNumber(length) || length > rest_.size()) return false;
  text = rest_.substr(0, length);
  rest_.remove_prefix(length);
  return true;
}

}  // namespace halvox::platform::linux_
