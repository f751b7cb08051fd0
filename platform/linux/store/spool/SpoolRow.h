#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <zstd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

// An erasure leaves an empty message in the place of one that it has erased.
[[nodiscard]] inline bool isErased(const SpooledMessage& message) {
  return message.subject.empty();
}

// A row of the table link_spool holds consecutive messages. They resemble each other, and zstd
// makes about a tenth of them:
//
//   one zstd frame of: for each message its subject, identifier and body, each as its length
//   (32 bits, little-endian) and its bytes
class SpoolRowWriter {
 public:
  // Bounds what is read back at once, and what a reader must skip to find a number.
  static constexpr std::size_t kMostMessages = 1024;
  // A row ends with the message that reaches this length.
  static constexpr std::size_t kEnoughBytes = 256U << 10U;

  // Call only while hasRoom().
  void add(const SpooledMessage& message);
  [[nodiscard]] bool hasRoom() const {
    return messages_ < kMostMessages && bytes_.size() < kEnoughBytes;
  }
  [[nodiscard]] std::size_t messages() const { return messages_; }
  // The length of the row before it is packed.
  [[nodiscard]] std::size_t bytes() const { return bytes_.size(); }
  // Returns the packed row and begins a new one; std::nullopt if there is no memory. The bytes are
  // valid until the next call.
  [[nodiscard]] std::optional<std::string_view> finish();
  // Frees all memory.
  void release() { *this = SpoolRowWriter(); }

 private:
  void addText(std::string_view text);

  UniqueHandle<ZSTD_CCtx*, ZSTD_freeCCtx> compressor_;
  std::string bytes_;
  std::string packed_;
  std::size_t messages_ = 0;
};

// Unpacks a row. Returns std::nullopt if it is damaged or does not hold that many messages.
[[nodiscard]] std::optional<std::vector<SpooledMessage>> readSpoolRow(std::string_view row,
                                                                      std::size_t messages);
// Reads the content of an unpacked row, in the same way.
[[nodiscard]] std::optional<std::vector<SpooledMessage>> readSpoolTexts(std::string_view bytes,
                                                                        std::size_t messages);

}  // namespace halvox::platform::linux_
