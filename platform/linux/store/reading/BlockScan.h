#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/blocks/BlockKeys.h"
#include "platform/linux/store/blocks/MessageBlockReader.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// One pass over the events, the link messages or both in blocks that pass a filter. Copies one
// block at a time and holds no snapshot while its records are used; StoreReader says why. In that
// time the store may join blocks, but the pass still reads each record once, because records keep
// their numbers. The pass ends with the last record that was stored when it began. Belongs to the
// thread of its database and does not own its arguments. After an error the scan is over.
//
//   begin(); bool found = false; then nextBlock(found), and nextRecord() while it is true, until
//   nothing is found; or, from the newest record to the oldest, previousBlock() and
//   previousRecord()
class BlockScan {
 public:
  // Reads both kinds, in the order of storing, if `kind` is empty. Of the filter only the times and
  // `after` count then.
  BlockScan(Database& database, std::optional<BlockRecordKind> kind, const RecordFilter& filter)
      : database_(database), kind_(kind), filter_(filter) {}

  // Finds the first and the last record to read. Call once.
  [[nodiscard]] SqliteCode begin();
  // Returns how many of the RecordFilter::newest records the blocks do not have. They must come
  // from the old tables.
  [[nodiscard]] std::uint64_t missing() const { return missing_; }

  // Loads the next block that may have records to read, and sets `found` to whether there is one.
  // Pass false to the first call, and to each later call the value that the previous call has set.
  [[nodiscard]] SqliteCode nextBlock(bool& found);
  // Moves to the next record of the block that passes the filter. The record's views are valid
  // until the next call.
  [[nodiscard]] bool nextRecord();
  // The same in the opposite order. A block can be unpacked only from its beginning:
  // previousBlock() unpacks it once to find the records that pass, and fails with SQLITE_CORRUPT if
  // it is damaged. previousRecord() unpacks it again for each megabyte of them, because a block of
  // repetitive messages may be hundreds of times as long unpacked.
  [[nodiscard]] SqliteCode previousBlock(bool& found);
  [[nodiscard]] bool previousRecord();
  [[nodiscard]] const BlockRecord& record() const {
    return copies_.empty() ? reader_.record() : copies_.back().record;
  }
  [[nodiscard]] StoredRecordID id() const { return copies_.empty() ? number() : copies_.back().id; }
  // Returns true if reading a block has found damage. The scan is over then.
  [[nodiscard]] bool isDamaged() const { return reader_.isDamaged(); }

  // Returns true if records between the first and the last one that nextBlock() looked at, or after
  // RecordFilter::after, were removed from the store before they were read.
  [[nodiscard]] bool hasGap() const { return hasGap_; }

  // Returns the number of the last record that the pass looks at, whether or not it passes the
  // filter. Known after begin(). 0 if there are no blocks.
  [[nodiscard]] StoredRecordID last() const { return stored_; }

 private:
  // The record numbers from `from` up to, but not including, `to`.
  struct Range {
    std::int64_t from;
    std::int64_t to;
  };
  // A record of the loaded block that passes, and the length of its texts.
  struct Passing {
    StoredRecordID id;
    std::size_t bytes;
  };
  // A record with texts of its own, which its views show.
  struct Copy {
    StoredRecordID id;
    BlockRecord record;
    std::unique_ptr<char[]> texts;
  };
  // Each block with records that pass has at least one of these keys.
  using Alternatives = std::vector<BlockKey>;

  [[nodiscard]] std::vector<Alternatives> wantedKeys() const;
  [[nodiscard]] SqliteCode findRanges();
  [[nodiscard]] SqliteCode addRanges(Statement& spans, std::int64_t& newestSpan);
  [[nodiscard]] SqliteCode skipToNewest(std::uint64_t count);
  [[nodiscard]] bool countNewest();
  [[nodiscard]] SqliteCode readNumber(std::string_view sql, std::optional<std::int64_t> argument,
                                      std::int64_t& number);
  void load(const Statement& row);
  void copyNewest();
  // Returns the number of the record that the block's reader is at.
  [[nodiscard]] StoredRecordID number() const { return blockID_ + reader_.index(); }
  [[nodiscard]] bool passes(const BlockRecord& record);
  [[nodiscard]] bool hasName(std::string_view name);

  Database& database_;
  const std::optional<BlockRecordKind> kind_;
  const RecordFilter& filter_;
  // The record numbers to read are those from next_ to last_ that are in ranges_. The ranges are in
  // ascending order. Those before range_ have been read.
  std::int64_t next_ = 1;
  std::int64_t last_ = 0;
  std::vector<Range> ranges_;
  std::size_t range_ = 0;
  StoredRecordID stored_ = 0;
  std::uint64_t missing_ = 0;
  bool hasBegun_ = false;
  bool hasGap_ = false;
  Statement read_;
  std::string block_;
  std::int64_t blockID_ = 0;
  std::int64_t records_ = 0;
  MessageBlockReader reader_;
  // For the opposite order: the records that previousRecord() has yet to copy, and those that it
  // has copied, both oldest first.
  std::vector<Passing> passing_;
  std::vector<Copy> copies_;
  std::map<std::string, bool, std::less<>> names_;  // which names pass
};

// Returns a link message of a block in the form that the records of all kinds have.
[[nodiscard]] StoredRecord linkRecord(StoredRecordID id, const BlockRecord& record);

}  // namespace halvox::platform::linux_
