#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <zstd.h>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/blocks/MessageBlock.h"

namespace halvox::platform::linux_ {

// One record of a block. Its views are valid until the next call of next() or open().
struct BlockRecord {
  BlockRecordKind kind = BlockRecordKind::kGap;
  double time = 0;               // seconds since 1970
  std::string_view name;         // this and the next member: of an event
  std::string_view application;  // empty if the payload does not name it
  std::int64_t sessionID = 0;    // this and the next four members: of a link message
  std::string_view clientName;
  std::string_view serviceName;
  std::int64_t category = 0;
  std::int64_t type = 0;
  std::string_view payload;  // JSON text
};

// Reads the records of a block (MessageBlock.h), from the first to the last.
//
//   open(); next() while it is true; then isDamaged()
//
// The bytes may be damaged in any way. Reading then ends early and isDamaged() is true. Belongs to
// one thread. Keeps its memory from block to block.
class MessageBlockReader {
 public:
  MessageBlockReader() = default;
  MessageBlockReader(const MessageBlockReader&) = delete;
  MessageBlockReader& operator=(const MessageBlockReader&) = delete;

  // Begins to read a block of `records` records. `block` must exist until the last record has been
  // read.
  void open(std::string_view block, std::int64_t records);
  // Moves to the next record. Returns false after the last record, or if the block is damaged.
  [[nodiscard]] bool next();
  [[nodiscard]] const BlockRecord& record() const { return record_; }
  // Returns the position of the record in the block, counted from 0.
  [[nodiscard]] std::int64_t index() const { return index_; }
  [[nodiscard]] bool isDamaged() const { return isDamaged_; }

 private:
  struct Head {
    BlockRecordKind kind;
    std::string_view name{};        // of an event, or of a link message's client
    std::string_view secondName{};  // of an event's application, or of a link message's service
    std::int64_t sessionID = 0;
    std::int64_t category = 0;
    std::int64_t type = 0;
  };

  [[nodiscard]] bool unpack(std::string_view block);
  [[nodiscard]] bool readRecord();
  [[nodiscard]] bool readHead(std::uint64_t number);
  [[nodiscard]] bool readNumber(std::uint64_t& number);
  [[nodiscard]] bool readSigned(std::int64_t& number);
  [[nodiscard]] bool readText(std::string_view& text);

  std::string_view rest_;  // what is not read yet, in unpacked_ or in the block
  std::string unpacked_;
  std::string payload_;
  std::vector<Head> heads_;
  BlockRecord record_;
  std::uint64_t lastTime_ = 0;
  std::int64_t records_ = 0;
  std::int64_t index_ = -1;
  bool isDamaged_ = false;
  UniqueHandle<ZSTD_DCtx*, ZSTD_freeDCtx> decompressor_;
};

}  // namespace halvox::platform::linux_
