#include "platform/linux/store/spool/SpoolRow.h"

#include <array>
#include <new>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

// The fastest level. Most of the gain comes from the texts that all messages of a session share.
constexpr int kLevel = 1;
// A body has at most the 64 MiB of a request and its encoding as JSON.
constexpr unsigned long long kLongestRow = 1ULL << 30U;
// zstd cannot make more than about 32,000 bytes of one byte. A damaged length must not make the
// reader allocate more than a row can hold.
constexpr unsigned long long kMostBytesOfOne = 1ULL << 17U;
constexpr std::size_t kLengthBytes = 4;

// Takes a text from the front of `rest`. Returns false if `rest` is too short.
bool takeText(std::string_view& rest, std::string& text) {
  if (rest.size() < kLengthBytes) return false;
  std::size_t length = 0;
  for (std::size_t index = 0; index < kLengthBytes; ++index) {
    length |= std::size_t{static_cast<unsigned char>(rest[index])} << (8 * index);
  }
  rest.remove_prefix(kLengthBytes);
  if (rest.size() < length) return false;
  text = rest.substr(0, length);
  rest.remove_prefix(length);
  return true;
}

std::optional<std::string> unpack(std::string_view row) {
  const unsigned long long length = ZSTD_getFrameContentSize(row.data(), row.size());
  if (length > kLongestRow || length > row.size() * kMostBytesOfOne) return std::nullopt;
  std::string bytes;
  try {
    bytes.resize(length);
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
  const std::size_t unpacked = ZSTD_decompress(bytes.data(), bytes.size(), row.data(), row.size());
  if (ZSTD_isError(unpacked) != 0 || unpacked != length) return std::nullopt;
  return bytes;
}

}  // namespace

void SpoolRowWriter::addText(std::string_view text) {
  std::array<char, kLengthBytes> length;
  for (std::size_t index = 0; index < kLengthBytes; ++index) {
    length[index] = static_cast<char>((text.size() >> (8 * index)) & 0xFFU);
  }
  bytes_.append(length.data(), length.size());
  bytes_ += text;
}

void SpoolRowWriter::add(const SpooledMessage& message) {
  addText(message.subject);
  addText(message.identifier);
  addText(message.body);
  ++messages_;
}

std::optional<std::string_view> SpoolRowWriter::finish() {
  if (!compressor_) {
    compressor_.reset(ZSTD_createCCtx());
    if (!compressor_) return std::nullopt;
    ZSTD_CCtx_setParameter(compressor_.get(), ZSTD_c_compressionLevel, kLevel);
    ZSTD_CCtx_setParameter(compressor_.get(), ZSTD_c_checksumFlag, 1);
  }
  packed_.resize(ZSTD_compressBound(bytes_.size()));
  const std::size_t length = ZSTD_compress2(compressor_.get(), packed_.data(), packed_.size(),
                                            bytes_.data(), bytes_.size());
  bytes_.clear();
  messages_ = 0;
  if (ZSTD_isError(length) != 0) return std::nullopt;
  return std::string_view(packed_).substr(0, length);
}

std::optional<std::vector<SpooledMessage>> readSpoolRow(std::string_view row,
                                                        std::size_t messages) {
  const std::optional<std::string> bytes = unpack(row);
  if (!bytes) return std::nullopt;
  return readSpoolTexts(*bytes, messages);
}

std::optional<std::vector<SpooledMessage>> readSpoolTexts(std::string_view bytes,
                                                          std::size_t messages) {
  if (messages > SpoolRowWriter::kMostMessages) return std::nullopt;
  std::vector<SpooledMessage> read(messages);
  for (SpooledMessage& message : read) {
    if (!takeText(bytes, message.subject) || !takeText(bytes, message.identifier) ||
        !takeText(bytes, message.body)) {
      return std::nullopt;
    }
  }
  if (!bytes.empty()) return std::nullopt;
  return read;
}

}  // namespace halvox::platform::linux_
