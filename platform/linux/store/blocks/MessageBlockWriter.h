#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <zstd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/LinkParty.h"
#include "platform/linux/store/blocks/BlockKeys.h"
#include "platform/linux/store/blocks/MessageBlock.h"

namespace halvox::platform::linux_ {

// What the events of one name and application have in common.
struct EventHead {
  std::string_view name;
  std::string_view application{};  // empty if the payload does not name it
};

// What the link messages of one session, category and type have in common.
struct LinkHead {
  const LinkParty& party;  // must live until the call returns
  std::uint16_t category;
  std::uint16_t type;
};

// Packs events and link messages into blocks (MessageBlock.h).
//
//   addEvent(), addLink(), addGap() ...; finish(); clear(); and again
//
// Belongs to one thread. Cannot fail: if there is no memory for compression, the block is stored
// uncompressed.
class MessageBlockWriter {
 public:
  MessageBlockWriter() { clear(); }
  MessageBlockWriter(const MessageBlockWriter&) = delete;
  MessageBlockWriter& operator=(const MessageBlockWriter&) = delete;

  // `time` is seconds since 1970, `payload` is JSON text. The writer does not keep references to
  // the arguments.
  void addEvent(double time, const EventHead& head, std::string_view payload);
  void addLink(double time, const LinkHead& head, std::string_view payload);
  // Adds a deleted record.
  void addGap();

  // Return the number of records since the last clear(), and their bytes before compression.
  [[nodiscard]] std::uint64_t records() const { return records_; }
  [[nodiscard]] std::uint64_t bytes() const { return bytes_.size(); }

  // Returns the keys of the block, to be stored in its span. Valid until any other call.
  [[nodiscard]] std::string_view keys() { return keys_.bytes(); }
  // Returns the block, valid until any other call except keys(). Use kPlain for blocks that are
  // soon replaced.
  [[nodiscard]] std::string_view finish(BlockPacking packing);
  // Begins the next block. Frees memory that only a long payload needed.
  void clear();
  // Frees the memory for compression, about 550 KB. The next finish() allocates it again.
  void release();

 private:
  void addNumber(std::uint64_t number);
  void addSigned(std::int64_t number);
  void addText(std::string_view text);
  // Adds the reference to a head. Returns false if the head is new; the caller then adds the head
  // itself.
  bool addHead(BlockRecordKind kind, std::string_view head);
  void addTimeAndPayload(double time, std::string_view payload);

  std::string bytes_;  // begins with the byte kPlain: a plain block need not be copied
  std::string packed_;
  std::string lastPayload_;
  BlockKeys keys_;
  std::vector<std::string> heads_;  // the heads of this block, each with its kind at the end
  std::string head_;
  std::uint64_t records_ = 0;
  std::uint64_t lastTime_ = 0;  // the bits of the last record's time
  UniqueHandle<ZSTD_CCtx*, ZSTD_freeCCtx> compressor_;
};

}  // namespace halvox::platform::linux_
